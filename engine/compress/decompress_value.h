// DecompressValue: the buffer-to-buffer decompression entry point the reader
// classes call for a column value whose format they already know.
#ifndef TARNWELL_ENGINE_COMPRESS_DECOMPRESS_VALUE_H_
#define TARNWELL_ENGINE_COMPRESS_DECOMPRESS_VALUE_H_

#include <cstddef>
#include <cstdint>

namespace tarnwell::engine {

// Formats.
inline constexpr int kValueFormatCopy = 0;    // stored as is
inline constexpr int kValueFormatXpress = 3;  // Xpress Plain LZ77 stream

// Error codes written to *error.
inline constexpr int kDecompressOk = 0;
inline constexpr int kDecompressFormatNotSupported = 257;
inline constexpr int kDecompressOutputTooSmall = 258;  // bytes already written stay
inline constexpr int kDecompressInputMalformed = 259;

// Decompresses in[0, in_len) into out[0, out_cap) and returns the number of
// bytes written, also on failure. `error` may be null. A copy that does not
// fit writes nothing.
size_t DecompressValue(int format, const uint8_t* in, size_t in_len, uint8_t* out, size_t out_cap,
                       int* error);

// A short English description of an error code, for messages.
const char* DecompressErrorText(int error);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_COMPRESS_DECOMPRESS_VALUE_H_
