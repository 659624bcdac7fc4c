#include "engine/compress/compressed_value.h"

#include <string>

#include "engine/compress/lz4_block.h"
#include "engine/compress/seven_bit.h"
#include "engine/compress/xpress_decoder.h"

namespace tarnwell::engine {

namespace {

constexpr int kSchemeShift = 3;
constexpr uint8_t kHighestKnownScheme = 7;
constexpr size_t kSizeOffset = 1;
constexpr size_t kSizedHeaderSize = 3;  // scheme byte + u16 decoded size

DecodedValue Fail(DecodedValue v, DecodeStatus status, std::string message) {
  v.status = status;
  v.message = std::move(message);
  return v;
}

DecodedValue DecodeXpress(DecodedValue v, ByteView value) {
  uint16_t size;
  if (!value.ReadU16LE(kSizeOffset, &size)) {
    return Fail(std::move(v), DecodeStatus::kMalformed, "Xpress value shorter than its header");
  }
  v.declared_size = size;
  v.bytes.resize(size);
  // The header gives the decoded size, so the stream ends when it is reached;
  // Exchange leaves stray bytes after some streams.
  const XpressResult r = DecodePlainLz77(value.From(kSizedHeaderSize), v.bytes.data(),
                                         v.bytes.size(), XpressEnd::kOutputFull);
  v.bytes.resize(r.written);
  if (r.code != XpressCode::kOk) {
    return Fail(std::move(v), DecodeStatus::kMalformed,
                "damaged Xpress stream (" + std::to_string(r.written) + " of " +
                    std::to_string(size) + " bytes decoded)");
  }
  if (r.written != size) {
    return Fail(std::move(v), DecodeStatus::kMalformed,
                "Xpress stream ends after " + std::to_string(r.written) + " of " +
                    std::to_string(size) + " bytes");
  }
  v.status = DecodeStatus::kOk;
  return v;
}

DecodedValue DecodeLz4(DecodedValue v, ByteView value) {
  uint16_t size;
  if (!value.ReadU16LE(kSizeOffset, &size)) {
    return Fail(std::move(v), DecodeStatus::kMalformed, "LZ4 value shorter than its header");
  }
  v.declared_size = size;
  if (!DecompressLz4Block(value.From(kSizedHeaderSize), size, &v.bytes)) {
    return Fail(std::move(v), DecodeStatus::kMalformed,
                "damaged LZ4 block (declared size " + std::to_string(size) + ")");
  }
  v.status = DecodeStatus::kOk;
  return v;
}

}  // namespace

CompressionScheme SchemeOf(ByteView value) {
  if (value.empty()) return CompressionScheme::kUnknown;
  const uint8_t scheme = value[0] >> kSchemeShift;
  if (scheme == 0 || scheme > kHighestKnownScheme) return CompressionScheme::kUnknown;
  return static_cast<CompressionScheme>(scheme);
}

const char* SchemeName(CompressionScheme scheme) {
  switch (scheme) {
    case CompressionScheme::kSevenBitAscii:
      return "7-bit ASCII";
    case CompressionScheme::kSevenBitUnicode:
      return "7-bit Unicode";
    case CompressionScheme::kXpress:
      return "Xpress";
    case CompressionScheme::kScrubbed:
      return "scrubbed";
    case CompressionScheme::kXpress9:
      return "Xpress9";
    case CompressionScheme::kXpress10:
      return "Xpress10";
    case CompressionScheme::kLz4:
      return "LZ4";
    case CompressionScheme::kUnknown:
      break;
  }
  return "unknown";
}

DecodedValue DecodeCompressedValue(ByteView value) {
  DecodedValue v;
  v.scheme = SchemeOf(value);
  switch (v.scheme) {
    case CompressionScheme::kSevenBitAscii:
      v.bytes = UnpackSevenBit(value, SevenBitTarget::kAscii);
      v.status = DecodeStatus::kOk;
      return v;
    case CompressionScheme::kSevenBitUnicode:
      v.bytes = UnpackSevenBit(value, SevenBitTarget::kUtf16);
      v.is_utf16 = true;
      v.status = DecodeStatus::kOk;
      return v;
    case CompressionScheme::kXpress:
      return DecodeXpress(std::move(v), value);
    case CompressionScheme::kLz4:
      return DecodeLz4(std::move(v), value);
    case CompressionScheme::kScrubbed:
      return Fail(std::move(v), DecodeStatus::kScrubbed, "value was scrubbed");
    case CompressionScheme::kXpress9:
    case CompressionScheme::kXpress10:
      return Fail(std::move(v), DecodeStatus::kUnsupported,
                  std::string("unsupported compression: ") + SchemeName(v.scheme));
    case CompressionScheme::kUnknown:
      break;
  }
  if (value.empty()) return Fail(std::move(v), DecodeStatus::kMalformed, "empty compressed value");
  return Fail(std::move(v), DecodeStatus::kUnsupported,
              "unsupported compression: scheme " + std::to_string(value[0] >> kSchemeShift));
}

}  // namespace tarnwell::engine
