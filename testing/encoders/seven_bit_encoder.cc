#include "testing/encoders/seven_bit_encoder.h"

#include <cstdint>

namespace tarnwell::forge {

namespace {

constexpr uint8_t kAsciiScheme = 1;
constexpr uint8_t kUnicodeScheme = 2;
constexpr int kSchemeShift = 3;
constexpr uint32_t kSevenBitLimit = 0x80;
constexpr size_t kBitsPerByte = 8;
constexpr size_t kBitsPerCharacter = 7;

template <typename Char>
Bytes Pack(uint8_t scheme, const Char* text, size_t count) {
  Bytes out(1);
  uint32_t accumulator = 0;
  size_t pending_bits = 0;
  for (size_t i = 0; i < count; ++i) {
    const uint32_t unit = static_cast<uint32_t>(text[i]);
    if (unit >= kSevenBitLimit) return {};
    accumulator |= unit << pending_bits;
    pending_bits += kBitsPerCharacter;
    while (pending_bits >= kBitsPerByte) {
      out.push_back(static_cast<uint8_t>(accumulator));
      accumulator >>= kBitsPerByte;
      pending_bits -= kBitsPerByte;
    }
  }
  size_t used_in_last = kBitsPerByte;
  if (pending_bits != 0) {
    out.push_back(static_cast<uint8_t>(accumulator));
    used_in_last = pending_bits;
  }
  out[0] = static_cast<uint8_t>((scheme << kSchemeShift) | (used_in_last - 1));
  return out;
}

}  // namespace

Bytes EncodeSevenBitAscii(std::string_view text) {
  return Pack(kAsciiScheme, reinterpret_cast<const unsigned char*>(text.data()), text.size());
}

Bytes EncodeSevenBitUnicode(std::u16string_view text) {
  return Pack(kUnicodeScheme, text.data(), text.size());
}

}  // namespace tarnwell::forge
