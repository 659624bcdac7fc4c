#include "engine/compress/seven_bit.h"

namespace tarnwell::engine {

namespace {

constexpr size_t kHeaderSize = 1;
constexpr uint8_t kUsedBitsMask = 0x07;
constexpr size_t kBitsPerByte = 8;
constexpr size_t kBitsPerCharacter = 7;
constexpr uint32_t kCharacterMask = 0x7f;

}  // namespace

size_t SevenBitCharacterCount(ByteView value) {
  if (value.size() <= kHeaderSize) return 0;
  const size_t used_in_last = (value[0] & kUsedBitsMask) + 1;
  const size_t bits = (value.size() - kHeaderSize) * kBitsPerByte - (kBitsPerByte - used_in_last);
  return bits / kBitsPerCharacter;
}

Bytes UnpackSevenBit(ByteView value, SevenBitTarget target) {
  const size_t count = SevenBitCharacterCount(value);
  Bytes out;
  out.reserve(target == SevenBitTarget::kUtf16 ? count * 2 : count);
  uint32_t accumulator = 0;
  size_t pending_bits = 0;
  size_t in_pos = kHeaderSize;
  for (size_t i = 0; i < count; ++i) {
    if (pending_bits < kBitsPerCharacter) {
      // The count guarantees the byte exists.
      accumulator |= uint32_t{value[in_pos++]} << pending_bits;
      pending_bits += kBitsPerByte;
    }
    const uint8_t character = static_cast<uint8_t>(accumulator & kCharacterMask);
    accumulator >>= kBitsPerCharacter;
    pending_bits -= kBitsPerCharacter;
    out.push_back(character);
    if (target == SevenBitTarget::kUtf16) out.push_back(0);
  }
  return out;
}

}  // namespace tarnwell::engine
