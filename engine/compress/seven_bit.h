// The 7-bit compression schemes of ESE column values: text whose characters
// (or UTF-16 code units) are all below 0x80 is stored 7 bits a character.
//
//   offset  width  meaning
//   0       1      bits 7..3: scheme (1 ASCII, 2 Unicode);
//                  bits 2..0: bits used in the last byte, minus 1
//   1       S-1    characters, 7 bits each, least significant bit first;
//                  a character crossing a byte boundary continues in the
//                  low bits of the next byte
//
// So a value of S bytes holds ((S - 1) * 8 - (8 - used)) / 7 characters. Windows
// writes the used-bit count exactly; counting (S * 8 - 8) / 7 instead finds a
// phantom NUL character whenever the count is 7 modulo 8.
#ifndef TARNWELL_ENGINE_COMPRESS_SEVEN_BIT_H_
#define TARNWELL_ENGINE_COMPRESS_SEVEN_BIT_H_

#include <cstddef>

#include "base/byte_view.h"

namespace tarnwell::engine {

enum class SevenBitTarget {
  kAscii,  // one byte a character
  kUtf16,  // one UTF-16LE code unit (two bytes) a character
};

// Number of characters a 7-bit value holds (header byte included in `value`).
// An empty value or a lone header byte holds none.
size_t SevenBitCharacterCount(ByteView value);

// Unpacks the characters of a 7-bit value. Bits left after the last whole
// character are ignored.
Bytes UnpackSevenBit(ByteView value, SevenBitTarget target);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_COMPRESS_SEVEN_BIT_H_
