// Page and header checksums of ESE database files.
//
// Every page ESE writes carries a checksum in its first bytes, and the
// checksum folds in the page number, so a page read from the wrong place
// fails just like a damaged one. Three schemes exist; which one a page uses
// follows from the page size and one page flag (see SchemeForPage). The ECC
// schemes can also name the bit of a page that a single bit flip damaged.
#ifndef TARNWELL_ENGINE_PAGE_CHECKSUM_H_
#define TARNWELL_ENGINE_PAGE_CHECKSUM_H_

#include <cstddef>
#include <cstdint>
#include <optional>

#include "engine/page.h"

namespace tarnwell::engine {

// Which checksum a page carries.
enum class ChecksumScheme {
  kXor,        // small pages without flag 0x2000: u32 XOR at offset 0
  kXorEcc,     // small pages with flag 0x2000: u32 XOR at 0 and u32 ECC at 4
  kLargePage,  // 16 KiB and larger pages: one 64-bit checksum per block
};

// Page flag that selects the XOR/ECC checksum on small pages.
inline constexpr uint32_t kPageFlagNewChecksum = 0x2000;

ChecksumScheme SchemeForPage(size_t page_size, uint32_t page_flags);

// Page sizes ESE writes: 2, 4 and 8 KiB (small) and 16 and 32 KiB (large).
bool IsSupportedPageSize(size_t page_size);

// An unused page is all zero bytes and carries no checksum.
bool IsEmptyPage(const uint8_t* page, size_t page_size);

// Writes the checksum fields of a data page (page number as ESE numbers it:
// page 1 is the block after the header and its shadow). Leaves empty pages and
// unsupported page sizes untouched, as ESE leaves unused pages zero.
void StampPageChecksum(uint8_t* page, size_t page_size, uint32_t page_number);

// True when the stored checksum fields of a data page match its contents, or
// when the page is empty. False for unsupported page sizes.
bool VerifyPageChecksum(const uint8_t* page, size_t page_size, uint32_t page_number);

// For a page that fails VerifyPageChecksum because of one flipped bit: the bit
// offset from the start of the page (byte = bit / 8, mask = 1 << bit % 8) that
// the ECC names, confirmed by flipping it back and verifying. Nothing when the
// page verifies, has no ECC (kXor) or is damaged beyond one bit.
std::optional<size_t> LocateFlippedBit(const uint8_t* page, size_t page_size, uint32_t page_number);

// Checksum of the database header (and its shadow), stored as u32 at offset 0.
// ESE computes it over the whole first page, so page_size bytes must be
// readable; whole u32 words only.
uint32_t ComputeHeaderChecksum(const uint8_t* header, size_t page_size);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_PAGE_CHECKSUM_H_
