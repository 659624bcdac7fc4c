#include "engine/page_checksum.h"

namespace tarnwell::engine {

// Placeholder until the real schemes land.
ChecksumScheme SchemeForPage(size_t page_size, uint32_t page_flags) {
  if (page_size >= 16384) return ChecksumScheme::kLargePage;
  return (page_flags & 0x2000) ? ChecksumScheme::kXorEcc : ChecksumScheme::kXor;
}
void StampPageChecksum(uint8_t*, size_t, uint32_t) {}
bool VerifyPageChecksum(const uint8_t*, size_t, uint32_t) { return false; }
uint32_t ComputeHeaderChecksum(const uint8_t*, size_t) { return 0; }

}  // namespace tarnwell::engine
