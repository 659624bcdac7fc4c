// 7-bit packing of ESE column values (the ASCII and Unicode schemes).
//
//   offset  width  meaning
//   0       1      scheme << 3 | (bits used in the last byte - 1); scheme 1 ASCII, 2 Unicode
//   1       S-1    characters, 7 bits each, least significant bit first
#ifndef TARNWELL_TESTING_ENCODERS_SEVEN_BIT_ENCODER_H_
#define TARNWELL_TESTING_ENCODERS_SEVEN_BIT_ENCODER_H_

#include <string_view>

#include "base/byte_view.h"

namespace tarnwell::forge {

// Both return the whole value, header byte included, or an empty Bytes when a
// character is 0x80 or above and the scheme cannot hold it.
Bytes EncodeSevenBitAscii(std::string_view text);
Bytes EncodeSevenBitUnicode(std::u16string_view text);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_ENCODERS_SEVEN_BIT_ENCODER_H_
