// Page and header checksums of ESE database files.
#ifndef TARNWELL_ENGINE_PAGE_CHECKSUM_H_
#define TARNWELL_ENGINE_PAGE_CHECKSUM_H_

#include <cstddef>
#include <cstdint>

namespace tarnwell::engine {

// Which checksum a page carries.
enum class ChecksumScheme {
  kXor,        // small pages without flag 0x2000: u32 XOR at offset 0
  kXorEcc,     // small pages with flag 0x2000: u32 XOR at 0 and u32 ECC at 4
  kLargePage,  // 16 KiB and larger pages: one 64-bit checksum per block
};

ChecksumScheme SchemeForPage(size_t page_size, uint32_t page_flags);

// Writes the checksum fields of a data page (page number as ESE numbers it:
// page 1 is the block after the header and its shadow).
void StampPageChecksum(uint8_t* page, size_t page_size, uint32_t page_number);

// True when the stored checksum fields of a data page match its contents.
bool VerifyPageChecksum(const uint8_t* page, size_t page_size, uint32_t page_number);

// Checksum of the database header (and its shadow), stored as u32 at offset 0.
uint32_t ComputeHeaderChecksum(const uint8_t* header, size_t page_size);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_PAGE_CHECKSUM_H_
