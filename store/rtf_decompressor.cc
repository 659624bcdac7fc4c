#include "store/rtf_decompressor.h"

#include <algorithm>
#include <array>
#include <utility>

namespace tarnwell::store {

namespace {

// Header field offsets (see the table in the header file).
constexpr size_t kCompSizeOffset = 0;
constexpr size_t kRawSizeOffset = 4;
constexpr size_t kCompTypeOffset = 8;
constexpr size_t kCrcOffset = 12;
// COMPSIZE counts the bytes after its own field.
constexpr size_t kCompSizeCountsFrom = 4;

constexpr size_t kDictionaryMask = kRtfDictionarySize - 1;
constexpr int kTokensPerRun = 8;
constexpr size_t kReferenceSize = 2;
constexpr unsigned kReferenceOffsetShift = 4;
constexpr unsigned kReferenceLengthMask = 0x0F;
constexpr size_t kMinReferenceLength = 2;
// The best a run can do: eight references of 17 bytes from 17 stream bytes.
// Used only to keep the first reservation in proportion to the input.
constexpr size_t kMaxExpansion = 8;

constexpr char kPrebufferText[] =
    "{\\rtf1\\ansi\\mac\\deff0\\deftab720{\\fonttbl;}"
    "{\\f0\\fnil \\froman \\fswiss \\fmodern \\fscript \\fdecor MS Sans Serif"
    "SymbolArialTimes New RomanCourier{\\colortbl\\red0\\green0\\blue0"
    "\r\n\\par \\pard\\plain\\f0\\fs20\\b\\i\\u\\tab\\tx";
constexpr size_t kPrebufferSize = sizeof(kPrebufferText) - 1;
static_assert(kPrebufferSize == 207, "the dictionary prologue is 207 bytes");

constexpr std::array<uint32_t, 256> MakeCrcTable() {
  std::array<uint32_t, 256> table{};
  for (uint32_t i = 0; i < 256; ++i) {
    uint32_t c = i;
    for (int bit = 0; bit < 8; ++bit) c = (c & 1) ? (c >> 1) ^ 0xEDB88320u : c >> 1;
    table[i] = c;
  }
  return table;
}
constexpr std::array<uint32_t, 256> kCrcTable = MakeCrcTable();

// The stream bytes COMPSIZE announces, cut to what the value holds. Empty
// when COMPSIZE does not even cover the rest of the header.
ByteView StreamOf(ByteView value) {
  const uint64_t declared_end = uint64_t(kCompSizeCountsFrom) + value.U32LE(kCompSizeOffset);
  const size_t end = size_t(std::min<uint64_t>(declared_end, value.size()));
  if (end <= kRtfHeaderSize) return ByteView();
  return value.Sub(kRtfHeaderSize, end - kRtfHeaderSize);
}

RtfText Finish(Bytes out, bool complete, bool stored) {
  RtfText result;
  out.insert(out.end(), std::begin(kRtfClosingBytes), std::end(kRtfClosingBytes));
  result.length = out.size();
  result.text = std::move(out);
  result.complete = complete;
  result.stored = stored;
  return result;
}

RtfText CopyStored(ByteView value, uint32_t raw_size) {
  const ByteView rest = value.From(kRtfHeaderSize);
  const size_t take = std::min<size_t>(raw_size, rest.size());
  Bytes out(rest.data(), rest.data() + take);
  return Finish(std::move(out), take == raw_size, /*stored=*/true);
}

RtfText Decode(ByteView stream, uint32_t raw_size) {
  uint8_t dictionary[kRtfDictionarySize] = {};
  std::copy_n(kPrebufferText, kPrebufferSize, dictionary);
  size_t write_pos = kPrebufferSize;

  Bytes out;
  // RAWSIZE is only a claim: a 30 MiB header over a few stream bytes must
  // not cost 30 MiB before anything is decoded.
  out.reserve(std::min<uint64_t>(raw_size, uint64_t(stream.size()) * kMaxExpansion));

  auto emit = [&](uint8_t byte) {
    out.push_back(byte);
    dictionary[write_pos] = byte;
    write_pos = (write_pos + 1) & kDictionaryMask;
  };

  size_t in = 0;
  while (out.size() < raw_size) {
    uint8_t control;
    if (!stream.ReadU8(in, &control)) return Finish(std::move(out), false, false);
    ++in;
    for (int bit = 0; bit < kTokensPerRun && out.size() < raw_size; ++bit) {
      if ((control & (1u << bit)) == 0) {
        uint8_t literal;
        if (!stream.ReadU8(in, &literal)) return Finish(std::move(out), false, false);
        ++in;
        emit(literal);
        continue;
      }
      if (!stream.Has(in, kReferenceSize)) return Finish(std::move(out), false, false);
      const uint16_t reference = LoadU16BE(stream.data() + in);
      in += kReferenceSize;
      size_t offset = reference >> kReferenceOffsetShift;
      if (offset == write_pos) return Finish(std::move(out), true, false);
      const size_t length = (reference & kReferenceLengthMask) + kMinReferenceLength;
      for (size_t i = 0; i < length && out.size() < raw_size; ++i) {
        emit(dictionary[offset]);
        offset = (offset + 1) & kDictionaryMask;
      }
    }
  }
  return Finish(std::move(out), true, false);
}

}  // namespace

const std::string_view kRtfPrebuffer(kPrebufferText, kPrebufferSize);

std::optional<RtfText> DecompressRtf(ByteView value, const RtfDecodeOptions& options) {
  if (!value.Has(0, kRtfHeaderSize)) return std::nullopt;
  const uint32_t raw_size = value.U32LE(kRawSizeOffset);
  if (raw_size > kMaxRtfRawSize) return std::nullopt;
  if (options.honour_stored && value.U32LE(kCompTypeOffset) == kRtfUncompressed) {
    return CopyStored(value, raw_size);
  }
  return Decode(StreamOf(value), raw_size);
}

uint32_t RtfCrc32(ByteView bytes, uint32_t crc) {
  for (size_t i = 0; i < bytes.size(); ++i) {
    crc = kCrcTable[(crc ^ bytes[i]) & 0xFF] ^ (crc >> 8);
  }
  return crc;
}

RtfCrcStatus CheckRtfCrc(ByteView value) {
  if (!value.Has(0, kRtfHeaderSize)) return RtfCrcStatus::kTruncated;
  if (value.U32LE(kCompTypeOffset) == kRtfUncompressed) return RtfCrcStatus::kStored;
  const uint32_t comp_size = value.U32LE(kCompSizeOffset);
  const size_t header_rest = kRtfHeaderSize - kCompSizeCountsFrom;
  if (comp_size < header_rest) return RtfCrcStatus::kTruncated;
  const ByteView stream = value.Sub(kRtfHeaderSize, comp_size - header_rest);
  if (stream.size() != comp_size - header_rest) return RtfCrcStatus::kTruncated;
  return RtfCrc32(stream) == value.U32LE(kCrcOffset) ? RtfCrcStatus::kMatch
                                                     : RtfCrcStatus::kMismatch;
}

}  // namespace tarnwell::store
