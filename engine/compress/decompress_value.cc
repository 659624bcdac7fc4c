#include "engine/compress/decompress_value.h"

#include <cstring>

#include "base/byte_view.h"
#include "engine/compress/xpress_decoder.h"

namespace tarnwell::engine {

size_t DecompressValue(int format, const uint8_t* in, size_t in_len, uint8_t* out, size_t out_cap,
                       int* error) {
  int ignored;
  if (error == nullptr) error = &ignored;
  *error = kDecompressOk;
  if (out == nullptr) out_cap = 0;
  if (in == nullptr && in_len != 0) {
    *error = kDecompressInputMalformed;
    return 0;
  }
  const ByteView input(in, in_len);
  switch (format) {
    case kValueFormatCopy:
      if (in_len > out_cap) {
        *error = kDecompressOutputTooSmall;
        return 0;
      }
      if (in_len != 0) std::memcpy(out, in, in_len);
      return in_len;
    case kValueFormatXpress: {
      const XpressResult r = DecodePlainLz77(input, out, out_cap);
      switch (r.code) {
        case XpressCode::kOk:
          break;
        case XpressCode::kOutputTooSmall:
          *error = kDecompressOutputTooSmall;
          break;
        case XpressCode::kMalformed:
          *error = kDecompressInputMalformed;
          break;
      }
      return r.written;
    }
    default:
      *error = kDecompressFormatNotSupported;
      return 0;
  }
}

const char* DecompressErrorText(int error) {
  switch (error) {
    case kDecompressOk:
      return "no error";
    case kDecompressFormatNotSupported:
      return "format not supported";
    case kDecompressOutputTooSmall:
      return "output buffer too small";
    case kDecompressInputMalformed:
      return "input stream malformed";
    default:
      return "unknown error";
  }
}

}  // namespace tarnwell::engine
