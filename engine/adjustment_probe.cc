#include "engine/adjustment_probe.h"

#include "engine/database_header.h"

namespace tarnwell::engine {

std::optional<int64_t> ProbeAdjustment(ByteView window, uint32_t page_size, uint32_t root_flags,
                                       uint32_t space_flags) {
  const size_t p_size = page_size;
  const size_t limit = std::min(window.size(), kProbeLastPosition);
  for (size_t p = 0; p < limit; ++p) {
    uint32_t v = 0;
    if (window.ReadU32LE(p + kHeaderSignatureOffset, &v) && v == kDatabaseSignature) {
      uint32_t shadow = 0, flags = 0;
      if (window.ReadU32LE(p + p_size + kHeaderSignatureOffset, &shadow) &&
          shadow == kDatabaseSignature &&
          window.ReadU32LE(p + 2 * p_size + kPageFlagsOffset, &flags) && flags == root_flags) {
        return int64_t(p);
      }
      continue;
    }
    uint32_t f1 = 0, f2 = 0, f3 = 0;
    if (window.ReadU32LE(p + kPageFlagsOffset, &f1) && f1 == root_flags &&
        window.ReadU32LE(p + p_size + kPageFlagsOffset, &f2) && f2 == space_flags &&
        window.ReadU32LE(p + 2 * p_size + kPageFlagsOffset, &f3) && f3 == space_flags) {
      return int64_t(p) - 2 * int64_t(p_size);
    }
  }
  return std::nullopt;
}

void FindAdjustmentFactor(PageFile& file, uint32_t root_flags, uint32_t space_flags) {
  file.SetAdjustment(0);
  Bytes window(kProbeWindow, 0);
  const size_t got = file.ReadAt(int64_t(file.base_offset()), window.data(), window.size());
  window.resize(got);  // bytes past the end of the file match nothing
  std::optional<int64_t> a =
      ProbeAdjustment(ByteView(window), file.page_size(), root_flags, space_flags);
  if (a) file.SetAdjustment(*a);
}

}  // namespace tarnwell::engine
