// Xpress "Plain LZ77" compressor, so the test databases carry Xpress values
// that exercise every corner of the reader's decoder.
//
// Output layout (integers little-endian), the one xpress_decoder.h reads:
//
//   field      width  meaning
//   flags      4      32 item flags, most significant bit first: 0 literal, 1 match
//   literal    1      the byte itself
//   match      2      (distance - 1) << 3 | min(length - 3, 7)
//   nibble     0/1    length - 10 (15 = more follows); two consecutive long matches
//                     share one byte, the first using its low half
//   extra8     1      length - 25 (255 = more follows)
//   extra16    2      length - 3, or 0 when extra32 follows
//   extra32    4      length - 3
//
// The last flag word is padded with ones: a match flag with no input left
// ends the stream.
#ifndef TARNWELL_TESTING_ENCODERS_XPRESS_ENCODER_H_
#define TARNWELL_TESTING_ENCODERS_XPRESS_ENCODER_H_

#include "base/byte_view.h"

namespace tarnwell::forge {

// Compresses with greedy hash-chain matching (distances up to 8192).
Bytes XpressCompress(ByteView plain);

// An ESE Xpress column value: 0x18, u16 decoded size, then the stream. Empty
// when `plain` is longer than the u16 size field can say.
Bytes EncodeEseXpressValue(ByteView plain);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_ENCODERS_XPRESS_ENCODER_H_
