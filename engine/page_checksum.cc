// Page and header checksums of ESE database files.
//
// Where the checksum fields sit (all little-endian):
//
//   database header and shadow (file blocks 0 and 1)
//     offset  width  meaning
//     0       4      XOR checksum: 0x89ABCDEF ^ every u32 of [4, page_size)
//     4       4      signature 0x89ABCDEF
//
//   small page (2, 4, 8 KiB), flag 0x2000 clear (kXor)
//     0       4      XOR checksum: 0x89ABCDEF ^ every u32 of [4, page_size)
//     4       4      page number
//
//   small page, flag 0x2000 set (kXorEcc); the page is one block
//     0       4      block XOR ^ page number
//     4       4      block ECC
//
//   large page (16, 32 KiB, kLargePage); four blocks of page_size / 4
//     0       8      block 0: u32 XOR ^ page number, u32 ECC
//     36      4      page flags (as on small pages)
//     40      8      block 1, same layout
//     48      8      block 2
//     56      8      block 3
//     64      4      page number
//
// The block XOR is the XOR of the block's u32 words, without the seed. Block
// XOR and ECC cover the whole block, except that block 0 (the one that holds
// the page header) leaves out its own first 8 bytes. Block 0 is computed
// last, so it also protects the checksums of blocks 1 to 3.
//
// The ECC treats the block as a bit array and is, in effect, the XOR over all
// set bits of (b | ~b << 16), where b is the bit's offset in the block, masked
// to the bits the block size needs: the low half holds b, the high half its
// complement. When one bit flips, stored ECC ^ computed ECC is exactly the term
// of that bit, which names it; a damaged ECC or XOR word instead differs from
// the computed one in a single bit. Computed per u32 word w at index i, with
// set-bit counts folded into parity:
//   row part    low  bits 5..15  = XOR of i over odd-parity words
//               high bits 21..31 = XOR of ~i over the same words
//   column part low  bits 0..4   = XOR of c over set bits c of (XOR of all w)
//               high bits 16..20 = XOR of ~c over the same bits
//   mask        (block_size << 19) - 1 (16 index bits for 8 KiB blocks)
#include "engine/page_checksum.h"

#include <algorithm>
#include <bit>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::engine {

namespace {

constexpr uint32_t kXorSeed = 0x89ABCDEF;
constexpr size_t kChecksumOffset = 0;
constexpr size_t kPageNumberOffset = 4;  // kXor pages
constexpr size_t kEccOffset = 4;         // kXorEcc pages and every block checksum
constexpr size_t kMinPageSize = 2048;
constexpr size_t kLargePageSize = 16384;  // from here on, pages are split into blocks
constexpr size_t kMaxPageSize = 32768;
constexpr size_t kLargePageBlocks = 4;
constexpr size_t kBlockChecksumOffset[kLargePageBlocks] = {0, 40, 48, 56};
constexpr size_t kLargePageNumberOffset = 64;
constexpr size_t kBlockChecksumSize = 8;  // u32 XOR + u32 ECC
constexpr size_t kWordSize = 4;
constexpr size_t kBitsPerByte = 8;

// Low five bits of an ECC half index a bit in a word, the rest the word.
constexpr int kWordIndexShift = 5;
constexpr uint32_t kColumnMask = 0x1F;
constexpr uint32_t kRowMask = 0x7FF;  // 2048 words: an 8 KiB block
constexpr int kComplementShift = 16;
constexpr uint32_t kHalfMask = 0xFFFF;

struct BlockChecksum {
  uint32_t xor_value = 0;  // already combined with the page number
  uint32_t ecc = 0;
};

// The XOR/ECC checksum of one block. `skip_checksum_words` leaves out the
// block's first 8 bytes, where block 0 keeps its own checksum.
BlockChecksum ComputeBlockChecksum(const uint8_t* block, size_t block_size, uint32_t page_number,
                                   bool skip_checksum_words) {
  const uint32_t words = static_cast<uint32_t>(block_size / kWordSize);
  uint32_t column_parity = 0;  // XOR of all words: bit c is the parity of column c
  uint32_t odd_rows = 0;       // XOR of the indexes of odd-parity words
  uint32_t odd_row_count = 0;
  for (uint32_t i = skip_checksum_words ? kBlockChecksumSize / kWordSize : 0; i < words; ++i) {
    const uint32_t w = LoadU32LE(block + i * kWordSize);
    column_parity ^= w;
    if (std::popcount(w) & 1) {
      odd_rows ^= i;
      ++odd_row_count;
    }
  }
  uint32_t set_columns = 0;
  for (uint32_t c = 0; c < 32; ++c) {
    if (column_parity >> c & 1) set_columns ^= c;
  }
  // The complement half XORs ~index once per term, so it is the plain XOR,
  // inverted when the number of terms is odd.
  const uint32_t row_complement = (odd_row_count & 1) ? ~odd_rows : odd_rows;
  const uint32_t column_complement =
      (std::popcount(column_parity) & 1) ? ~set_columns : set_columns;

  const uint32_t low = (odd_rows & kRowMask) << kWordIndexShift | (set_columns & kColumnMask);
  const uint32_t high =
      (row_complement & kRowMask) << kWordIndexShift | (column_complement & kColumnMask);
  const uint32_t mask = static_cast<uint32_t>((uint64_t{block_size} << 19) - 1);

  BlockChecksum sum;
  sum.ecc = (high << kComplementShift | low) & mask;
  sum.xor_value = column_parity ^ page_number;
  return sum;
}

uint32_t XorWords(const uint8_t* p, size_t begin, size_t end) {
  uint32_t x = 0;
  for (size_t off = begin; off + kWordSize <= end; off += kWordSize) x ^= LoadU32LE(p + off);
  return x;
}

uint32_t PageFlags(const uint8_t* page) { return LoadU32LE(page + kPageFlagsOffset); }

size_t BlockCount(size_t page_size) { return page_size >= kLargePageSize ? kLargePageBlocks : 1; }

BlockChecksum StoredBlockChecksum(const uint8_t* page, size_t block) {
  const uint8_t* p = page + kBlockChecksumOffset[block];
  return BlockChecksum{LoadU32LE(p + kChecksumOffset), LoadU32LE(p + kEccOffset)};
}

// Where one flipped bit would explain the difference between a block's stored
// and computed checksum: in the stored checksum words themselves, or at a bit
// offset within the block.
struct Flip {
  bool in_stored_checksum = false;
  size_t bit = 0;
};

std::optional<Flip> FlipFromSyndrome(size_t block_size, const BlockChecksum& stored,
                                     const BlockChecksum& computed) {
  const uint32_t ecc_diff = stored.ecc ^ computed.ecc;
  const uint32_t xor_diff = stored.xor_value ^ computed.xor_value;
  if (ecc_diff == 0 && std::popcount(xor_diff) == 1) {
    return Flip{true, kChecksumOffset * kBitsPerByte + std::countr_zero(xor_diff)};
  }
  if (xor_diff == 0 && std::popcount(ecc_diff) == 1) {
    return Flip{true, kEccOffset * kBitsPerByte + std::countr_zero(ecc_diff)};
  }
  // A flip in the data flips exactly one XOR bit, and the ECC difference is
  // the bit's index next to its complement.
  if (std::popcount(xor_diff) != 1) return std::nullopt;
  const uint32_t index_mask = static_cast<uint32_t>(block_size * kBitsPerByte - 1);
  if (((ecc_diff >> kComplementShift ^ ecc_diff) & index_mask) != index_mask) return std::nullopt;
  const size_t bit = ecc_diff & kHalfMask;
  if (bit >= block_size * kBitsPerByte) return std::nullopt;
  return Flip{false, bit};
}

}  // namespace

ChecksumScheme SchemeForPage(size_t page_size, uint32_t page_flags) {
  if (page_size >= kLargePageSize) return ChecksumScheme::kLargePage;
  return (page_flags & kPageFlagNewChecksum) ? ChecksumScheme::kXorEcc : ChecksumScheme::kXor;
}

bool IsSupportedPageSize(size_t page_size) {
  return page_size >= kMinPageSize && page_size <= kMaxPageSize && std::has_single_bit(page_size);
}

bool IsEmptyPage(const uint8_t* page, size_t page_size) {
  return page != nullptr && std::all_of(page, page + page_size, [](uint8_t b) { return b == 0; });
}

void StampPageChecksum(uint8_t* page, size_t page_size, uint32_t page_number) {
  if (page == nullptr || !IsSupportedPageSize(page_size) || IsEmptyPage(page, page_size)) return;
  switch (SchemeForPage(page_size, PageFlags(page))) {
    case ChecksumScheme::kXor:
      StoreU32LE(page + kPageNumberOffset, page_number);
      StoreU32LE(page + kChecksumOffset, kXorSeed ^ XorWords(page, kWordSize, page_size));
      return;
    case ChecksumScheme::kXorEcc:
    case ChecksumScheme::kLargePage: {
      const size_t blocks = BlockCount(page_size);
      const size_t block_size = page_size / blocks;
      if (blocks > 1) StoreU32LE(page + kLargePageNumberOffset, page_number);
      // Block 0 last: its checksum covers the other blocks' checksums.
      for (size_t b = blocks; b-- > 0;) {
        const BlockChecksum sum =
            ComputeBlockChecksum(page + b * block_size, block_size, page_number, b == 0);
        uint8_t* field = page + kBlockChecksumOffset[b];
        StoreU32LE(field + kChecksumOffset, sum.xor_value);
        StoreU32LE(field + kEccOffset, sum.ecc);
      }
      return;
    }
  }
}

bool VerifyPageChecksum(const uint8_t* page, size_t page_size, uint32_t page_number) {
  if (page == nullptr || !IsSupportedPageSize(page_size)) return false;
  if (IsEmptyPage(page, page_size)) return true;
  switch (SchemeForPage(page_size, PageFlags(page))) {
    case ChecksumScheme::kXor:
      return LoadU32LE(page + kChecksumOffset) ==
                 (kXorSeed ^ XorWords(page, kWordSize, page_size)) &&
             LoadU32LE(page + kPageNumberOffset) == page_number;
    case ChecksumScheme::kXorEcc:
    case ChecksumScheme::kLargePage: {
      const size_t blocks = BlockCount(page_size);
      const size_t block_size = page_size / blocks;
      if (blocks > 1 && LoadU32LE(page + kLargePageNumberOffset) != page_number) return false;
      for (size_t b = 0; b < blocks; ++b) {
        const BlockChecksum sum =
            ComputeBlockChecksum(page + b * block_size, block_size, page_number, b == 0);
        const BlockChecksum stored = StoredBlockChecksum(page, b);
        if (sum.xor_value != stored.xor_value || sum.ecc != stored.ecc) return false;
      }
      return true;
    }
  }
  return false;
}

std::optional<size_t> LocateFlippedBit(const uint8_t* page, size_t page_size,
                                       uint32_t page_number) {
  if (page == nullptr || !IsSupportedPageSize(page_size)) return std::nullopt;
  if (VerifyPageChecksum(page, page_size, page_number)) return std::nullopt;
  if (SchemeForPage(page_size, PageFlags(page)) == ChecksumScheme::kXor) return std::nullopt;

  const size_t blocks = BlockCount(page_size);
  const size_t block_size = page_size / blocks;
  // A flip in block 0's copy of another block's checksum upsets both blocks;
  // block 0 names the bit, so it is asked first. Every candidate is confirmed
  // against the whole page, which rules out multi-bit damage that happens to
  // look like a single flip in one block.
  std::vector<uint8_t> copy(page, page + page_size);
  for (size_t b = 0; b < blocks; ++b) {
    const BlockChecksum sum =
        ComputeBlockChecksum(page + b * block_size, block_size, page_number, b == 0);
    const BlockChecksum stored = StoredBlockChecksum(page, b);
    if (sum.xor_value == stored.xor_value && sum.ecc == stored.ecc) continue;
    const std::optional<Flip> flip = FlipFromSyndrome(block_size, stored, sum);
    if (!flip) return std::nullopt;
    // The checksums of blocks 1..3 live in block 0, not in their own block.
    const size_t page_bit = flip->in_stored_checksum
                                ? kBlockChecksumOffset[b] * kBitsPerByte + flip->bit
                                : b * block_size * kBitsPerByte + flip->bit;
    copy[page_bit / kBitsPerByte] ^= uint8_t(1u << (page_bit % kBitsPerByte));
    if (VerifyPageChecksum(copy.data(), page_size, page_number)) return page_bit;
    return std::nullopt;
  }
  return std::nullopt;
}

uint32_t ComputeHeaderChecksum(const uint8_t* header, size_t page_size) {
  if (header == nullptr) return kXorSeed;
  return kXorSeed ^ XorWords(header, kWordSize, page_size);
}

}  // namespace tarnwell::engine
