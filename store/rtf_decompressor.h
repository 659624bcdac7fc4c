// Compressed RTF: the body of a message stored in PR_RTF_COMPRESSED.
//
// A value starts with a 16-byte header (all fields little-endian):
//
//   offset  width  meaning
//   0       4      COMPSIZE: bytes that follow this field (12 header bytes + the stream)
//   4       4      RAWSIZE: bytes the stream decodes to
//   8       4      COMPTYPE: "LZFu" (0x75465A4C) compressed, "MELA" (0x414C454D) stored
//   12      4      CRC of the stream bytes (zero for stored values)
//   16      ...    the stream
//
// The compressed stream is a sequence of runs. Each run is a control byte
// whose bits, least significant first, describe up to eight tokens:
//
//   bit 0   one byte, copied to the output as is
//   bit 1   two bytes, big-endian: bits 15..4 dictionary offset, bits 3..0 length - 2
//
// Every byte produced is also written into a 4096-byte ring dictionary, which
// starts out holding a fixed RTF prologue (kRtfPrebuffer) with the write
// position just after it. References are copied one byte at a time, so a
// reference may overlap the write position and repeat what it is producing.
// A reference whose offset equals the write position ends the stream.
#ifndef TARNWELL_STORE_RTF_DECOMPRESSOR_H_
#define TARNWELL_STORE_RTF_DECOMPRESSOR_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "base/byte_view.h"

namespace tarnwell::store {

inline constexpr size_t kRtfHeaderSize = 16;
inline constexpr uint32_t kRtfCompressed = 0x75465A4C;    // "LZFu"
inline constexpr uint32_t kRtfUncompressed = 0x414C454D;  // "MELA"
inline constexpr size_t kRtfDictionarySize = 4096;

// Values announcing more than this are not decoded at all.
inline constexpr uint32_t kMaxRtfRawSize = 30 * 1024 * 1024;

// The dictionary's initial contents (207 bytes).
extern const std::string_view kRtfPrebuffer;

// Appended to every decoded body: they close the groups a stream cut short
// left open, and end the text for consumers that want a terminator.
inline constexpr uint8_t kRtfClosingBytes[] = {' ', '}', '}', '\0'};
inline constexpr size_t kRtfClosingSize = sizeof(kRtfClosingBytes);

struct RtfText {
  Bytes text;             // the decoded bytes followed by kRtfClosingBytes
  size_t length = 0;      // text.size(): RAWSIZE + 4 for a whole stream
  bool complete = false;  // the end marker was met or RAWSIZE bytes were produced
  bool stored = false;    // the value was returned as stored ("MELA", sound mode only)

  // The decoded bytes without the closing bytes.
  ByteView body() const { return ByteView(text.data(), length - kRtfClosingSize); }
};

struct RtfDecodeOptions {
  // Off (the program's behaviour): COMPTYPE is not examined and every value
  // goes through the decoder, so a stored value yields meaningless text.
  // On: a "MELA" value returns its RAWSIZE stored bytes (as far as present).
  bool honour_stored = false;
};

// Decodes a PR_RTF_COMPRESSED value. std::nullopt when the value has no
// complete header or announces more than kMaxRtfRawSize bytes. A damaged or
// cut stream ends early: the result is what was produced plus the closing
// bytes, with complete == false. Never reads past `value`, never produces
// more than RAWSIZE bytes before the closing bytes.
std::optional<RtfText> DecompressRtf(ByteView value, const RtfDecodeOptions& options = {});

// The CRC-32 variant of compressed RTF: reflected polynomial 0xEDB88320,
// starting at 0, no final inversion.
uint32_t RtfCrc32(ByteView bytes, uint32_t crc = 0);

enum class RtfCrcStatus {
  kMatch,      // the stream's CRC equals the header's
  kMismatch,   // it does not: the stream was altered
  kTruncated,  // the header or the COMPSIZE - 12 stream bytes are not all present
  kStored,     // a "MELA" value: nothing to check (its CRC field must be zero)
};

// Checks the header CRC of a compressed value over its COMPSIZE - 12 stream
// bytes. For callers that want to know; the decoder never looks at the CRC.
RtfCrcStatus CheckRtfCrc(ByteView value);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_RTF_DECOMPRESSOR_H_
