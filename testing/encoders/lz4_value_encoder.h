// LZ4-compressed ESE column values, made with liblz4.
//
//   offset  width  meaning
//   0       1      0x38 (scheme 7)
//   1       2      decoded size, u16
//   3       ...    one raw LZ4 block
#ifndef TARNWELL_TESTING_ENCODERS_LZ4_VALUE_ENCODER_H_
#define TARNWELL_TESTING_ENCODERS_LZ4_VALUE_ENCODER_H_

#include "base/byte_view.h"

namespace tarnwell::forge {

// Empty when `plain` is longer than the u16 size field can say.
Bytes EncodeEseLz4Value(ByteView plain);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_ENCODERS_LZ4_VALUE_ENCODER_H_
