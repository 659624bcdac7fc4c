// Compressed RTF bodies ("N1009") as message stores hold them.
//
// A value is a 16-byte header followed by the compressed stream:
//
//   offset  width  meaning
//   0       4      COMPSIZE: the bytes after this field (12 + stream length)
//   4       4      RAWSIZE: the length of the RTF text
//   8       4      COMPTYPE: 0x75465A4C ("LZFu")
//   12      4      CRC-32 of the stream (reflected 0xEDB88320, start 0, no final xor)
//   16      ...    stream
//
// The stream is a series of runs: a control byte whose bits, least
// significant first, say whether each of the next eight tokens is a literal
// byte (0) or a two-byte big-endian dictionary reference (1: bits 15..4
// offset, bits 3..0 length - 2). Decoders keep a 4096-byte ring dictionary
// that starts with a fixed 207-byte RTF prologue and the write position just
// after it; a reference whose offset is the write position ends the stream.
//
// Two encoders: one that writes only literals (the simplest value every
// decoder must accept) and one that also uses references, including ones
// into the prologue and ones that overlap the write position.
#ifndef TARNWELL_TESTING_EXCHANGE_RTF_LITERAL_ENCODER_H_
#define TARNWELL_TESTING_EXCHANGE_RTF_LITERAL_ENCODER_H_

#include <cstdint>
#include <string_view>

#include "base/byte_view.h"

namespace tarnwell::forge::exchange {

constexpr size_t kRtfValueHeaderSize = 16;
constexpr uint32_t kRtfTypeCompressed = 0x75465A4C;  // "LZFu"
constexpr size_t kRtfRingSize = 4096;
constexpr size_t kRtfMinReference = 2;
constexpr size_t kRtfMaxReference = 17;

// The ring dictionary's starting contents (207 bytes).
std::string_view RtfPrologue();

uint32_t RtfCrc(ByteView stream);

// Header + a stream of literals only: a zero control byte before each group
// of eight bytes, then the end reference.
Bytes EncodeRtfLiteral(std::string_view rtf);

// Header + a stream with greedy longest-match references where they help.
Bytes EncodeRtfCompressed(std::string_view rtf);

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_RTF_LITERAL_ENCODER_H_
