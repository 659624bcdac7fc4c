// Decoder for Xpress "Plain LZ77" streams ([MS-XCA]), the compression ESE
// uses for column values that the 7-bit schemes cannot hold.
//
// Stream layout (integers little-endian):
//
//   field      width  meaning
//   flags      4      32 item flags, most significant bit first: 0 literal, 1 match
//   literal    1      the byte itself
//   match      2      (distance - 1) << 3 | length code; length = code + 3 when code < 7
//   nibble     0/1    code 7: 4 more length bits; the first such match opens a shared
//                     byte and uses its low half, the next one takes its high half
//   extra8     1      nibble 15: 8 more bits; 255 escapes to extra16
//   extra16    2      length - 3 in full; 0 escapes to extra32
//   extra32    4      length - 3 in full
//
// A new flag word follows every 32 items. The stream ends at a match flag
// that finds no input left (the encoder pads its last flag word with ones).
#ifndef TARNWELL_ENGINE_COMPRESS_XPRESS_DECODER_H_
#define TARNWELL_ENGINE_COMPRESS_XPRESS_DECODER_H_

#include <cstddef>
#include <cstdint>

#include "base/byte_view.h"

namespace tarnwell::engine {

enum class XpressCode {
  kOk,
  kOutputTooSmall,  // the stream is sound so far but needs more room
  kMalformed,       // reads past the input, reaches before the output, or bad length
};

// How a decode recognises the end of the stream.
enum class XpressEnd {
  kEndMarker,   // only by the end marker
  kOutputFull,  // also once the output holds exactly out_cap bytes: the caller
                // knows the decoded size and trailing input is ignored
};

struct XpressResult {
  XpressCode code = XpressCode::kOk;
  size_t written = 0;  // bytes written to the output, also when decoding fails
};

// Decodes `in` into out[0, out_cap). Never touches memory outside either buffer.
XpressResult DecodePlainLz77(ByteView in, uint8_t* out, size_t out_cap,
                             XpressEnd end = XpressEnd::kEndMarker);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_COMPRESS_XPRESS_DECODER_H_
