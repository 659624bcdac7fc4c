#include "testing/encoders/lz4_value_encoder.h"

#include <lz4.h>

namespace tarnwell::forge {

namespace {

constexpr uint8_t kEseLz4Scheme = 0x38;
constexpr size_t kHeaderSize = 3;
constexpr size_t kEseMaxDecodedSize = 0xffff;

}  // namespace

Bytes EncodeEseLz4Value(ByteView plain) {
  if (plain.size() > kEseMaxDecodedSize) return {};
  const int source_size = static_cast<int>(plain.size());
  const int bound = LZ4_compressBound(source_size);
  Bytes value(kHeaderSize + static_cast<size_t>(bound));
  value[0] = kEseLz4Scheme;
  StoreU16LE(value.data() + 1, static_cast<uint16_t>(plain.size()));
  // liblz4 wants a valid pointer even for an empty source.
  static const char kNothing = 0;
  const char* source = plain.empty() ? &kNothing : reinterpret_cast<const char*>(plain.data());
  const int written = LZ4_compress_default(
      source, reinterpret_cast<char*>(value.data()) + kHeaderSize, source_size, bound);
  if (written <= 0) return {};
  value.resize(kHeaderSize + static_cast<size_t>(written));
  return value;
}

}  // namespace tarnwell::forge
