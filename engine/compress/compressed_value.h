// Compressed column values: which scheme a value uses, and its decoding.
//
// A value whose tagged-field flags say "compressed" starts with one byte:
//
//   offset  width  meaning
//   0       1      bits 7..3: scheme; bits 2..0: scheme-specific (7-bit: used bits - 1)
//
//   scheme  name           rest of the value
//   1       7-bit ASCII    packed characters from offset 1 (seven_bit.h)
//   2       7-bit Unicode  packed UTF-16 code units from offset 1
//   3       Xpress         u16 decoded size at 1, Plain LZ77 stream from 3 (xpress_decoder.h)
//   4       scrubbed       wiped on delete; filler only
//   5       Xpress9        not decoded
//   6       Xpress10       not decoded
//   7       LZ4            u16 decoded size at 1, one raw LZ4 block from 3 (lz4_block.h)
#ifndef TARNWELL_ENGINE_COMPRESS_COMPRESSED_VALUE_H_
#define TARNWELL_ENGINE_COMPRESS_COMPRESSED_VALUE_H_

#include <cstddef>
#include <cstdint>
#include <string>

#include "base/byte_view.h"

namespace tarnwell::engine {

enum class CompressionScheme : uint8_t {
  kSevenBitAscii = 1,
  kSevenBitUnicode = 2,
  kXpress = 3,
  kScrubbed = 4,
  kXpress9 = 5,
  kXpress10 = 6,
  kLz4 = 7,
  kUnknown = 0xff,  // empty value, scheme 0, or a scheme number beyond 7
};

// The scheme named by a value's first byte.
CompressionScheme SchemeOf(ByteView value);

// "7-bit ASCII", "Xpress", ... for messages.
const char* SchemeName(CompressionScheme scheme);

enum class DecodeStatus {
  kOk,
  kScrubbed,     // the data was wiped: bytes stay empty
  kUnsupported,  // a scheme this program does not decode (Xpress9, Xpress10, unknown)
  kMalformed,    // the value is damaged; bytes hold what could be decoded
};

struct DecodedValue {
  DecodeStatus status = DecodeStatus::kMalformed;
  CompressionScheme scheme = CompressionScheme::kUnknown;
  Bytes bytes;
  bool is_utf16 = false;     // bytes are UTF-16LE code units (7-bit Unicode)
  size_t declared_size = 0;  // decoded size the header announces (Xpress, LZ4), else 0
  std::string message;       // why the status is not kOk

  bool ok() const { return status == DecodeStatus::kOk; }
};

// Decodes one compressed value, header byte included. A pure function of its
// input: damaged values give kMalformed with a message, never a crash.
DecodedValue DecodeCompressedValue(ByteView value);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_COMPRESS_COMPRESSED_VALUE_H_
