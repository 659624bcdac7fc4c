// Compressed column values: the Xpress decoder through both entry points,
// the whole compressed-value decoder (7-bit, Xpress, LZ4 and the schemes it
// refuses), and 7-bit unpacking. Input layout:
//
//   offset  width  meaning
//   0       2      output capacity for DecompressValue (little-endian)
//   2       1      format number for a second DecompressValue call
//   3       ...    the stream / value
//
// The Xpress and 7-bit decoders are also checked against the test encoders:
// what the encoder writes, the decoder must give back unchanged.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "engine/compress/compressed_value.h"
#include "engine/compress/decompress_value.h"
#include "engine/compress/seven_bit.h"
#include "engine/compress/xpress_decoder.h"
#include "testing/encoders/seven_bit_encoder.h"
#include "testing/encoders/xpress_encoder.h"

namespace {

using namespace tarnwell;
using namespace tarnwell::engine;

constexpr size_t kCapacityOffset = 0;
constexpr size_t kFormatOffset = 2;
constexpr size_t kPayloadOffset = 3;
constexpr uint8_t kSevenBitMask = 0x7F;
// Round trips stop at the largest value a compressed header can announce.
constexpr size_t kMaxRoundTrip = 0xFFFF;

void CheckDecompress(int format, ByteView in, size_t cap) {
  Bytes out(cap);
  int error = -1;
  const size_t written = DecompressValue(format, in.data(), in.size(), out.data(), cap, &error);
  if (written > cap) std::abort();
  if (error != kDecompressOk && error != kDecompressFormatNotSupported &&
      error != kDecompressOutputTooSmall && error != kDecompressInputMalformed) {
    std::abort();
  }
  if (DecompressErrorText(error) == nullptr) std::abort();
  // The same call without room must not write, and null output is no room.
  DecompressValue(format, in.data(), in.size(), nullptr, cap, nullptr);
}

void CheckDecoded(ByteView value) {
  const DecodedValue d = DecodeCompressedValue(value);
  if (d.ok() && (d.scheme == CompressionScheme::kXpress || d.scheme == CompressionScheme::kLz4) &&
      d.bytes.size() != d.declared_size) {
    std::abort();
  }
  if (d.ok() && d.scheme == CompressionScheme::kSevenBitAscii &&
      d.bytes.size() != SevenBitCharacterCount(value)) {
    std::abort();
  }
  if (!d.ok() && d.message.empty()) std::abort();
}

void CheckSevenBit(ByteView value) {
  const size_t count = SevenBitCharacterCount(value);
  if (UnpackSevenBit(value, SevenBitTarget::kAscii).size() != count) std::abort();
  if (UnpackSevenBit(value, SevenBitTarget::kUtf16).size() != 2 * count) std::abort();
}

void CheckRoundTrips(ByteView plain) {
  if (plain.empty() || plain.size() > kMaxRoundTrip) return;
  const Bytes packed = forge::XpressCompress(plain);
  Bytes back(plain.size());
  const XpressResult r = DecodePlainLz77(ByteView(packed), back.data(), back.size());
  if (r.code != XpressCode::kOk || r.written != plain.size() ||
      std::memcmp(back.data(), plain.data(), plain.size()) != 0) {
    std::abort();
  }
  const DecodedValue value = DecodeCompressedValue(ByteView(forge::EncodeEseXpressValue(plain)));
  if (!value.ok() || value.bytes != plain.ToBytes()) std::abort();

  std::string ascii(plain.size(), '\0');
  for (size_t i = 0; i < plain.size(); ++i) ascii[i] = char(plain[i] & kSevenBitMask);
  const Bytes seven = forge::EncodeSevenBitAscii(ascii);
  const Bytes unpacked = UnpackSevenBit(ByteView(seven), SevenBitTarget::kAscii);
  if (std::string(unpacked.begin(), unpacked.end()) != ascii) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const ByteView input(data, size);
  const ByteView payload = input.From(kPayloadOffset);
  const size_t cap = input.U16LE(kCapacityOffset);
  CheckDecompress(kValueFormatXpress, payload, cap);
  CheckDecompress(int(input.U8(kFormatOffset)), payload, cap);
  for (XpressEnd end : {XpressEnd::kEndMarker, XpressEnd::kOutputFull}) {
    Bytes out(cap);
    const XpressResult r = DecodePlainLz77(payload, out.data(), out.size(), end);
    if (r.written > cap) std::abort();
  }
  CheckDecoded(input);
  CheckDecoded(payload);
  CheckSevenBit(input);
  CheckRoundTrips(payload);
  return 0;
}
