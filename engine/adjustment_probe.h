// The adjustment probe: finds where the database really starts in a file
// with junk in front of its header, or with its first blocks missing.
//
// Within the first 5 MiB, the first byte position p wins at which either
//   - a header signature stands at p + 4 and again at p + P + 4 (the shadow),
//     and page 1 (at p + 2P) carries the database-root flags; then A = p; or
//   - the flags of pages 1, 2 and 3 stand at p + 36, p + P + 36, p + 2P + 36
//     (the database root and its two space trees), no header in front;
//     then A = p - 2P, negative when the header blocks are missing.
// A comparison that would read past the probed bytes is no match.
#ifndef TARNWELL_ENGINE_ADJUSTMENT_PROBE_H_
#define TARNWELL_ENGINE_ADJUSTMENT_PROBE_H_

#include <cstdint>
#include <optional>

#include "base/byte_view.h"
#include "engine/page_file.h"

namespace tarnwell::engine {

constexpr size_t kProbeWindow = 0x500000;        // bytes read from the base offset
constexpr size_t kProbeLastPosition = 0x4FD000;  // positions tried: [0, this)

// Searches `window` (the first bytes of the database) for the database start.
// Returns the adjustment factor, or nothing when no position matches.
std::optional<int64_t> ProbeAdjustment(ByteView window, uint32_t page_size, uint32_t root_flags,
                                       uint32_t space_flags);

// Reads the probe window of `file` and sets its adjustment factor (0 when
// nothing matches).
void FindAdjustmentFactor(PageFile& file, uint32_t root_flags, uint32_t space_flags);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_ADJUSTMENT_PROBE_H_
