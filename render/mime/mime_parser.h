// Reading composed messages back: header blocks and multipart bodies.
//
// The input is never trusted. Lines may end in CR LF or a bare LF; a header block without the
// empty line that should end it runs to the end of the input; a multipart body without its
// closing delimiter ends where the input does. Sizes and counts are bounded by the limits
// below, and nesting deeper than kMaxPartDepth is kept as an opaque part rather than followed.
//
// Multipart layout (RFC 2046 section 5.1.1):
//
//   preamble CRLF "--" boundary [blanks] CRLF
//   part      CRLF "--" boundary [blanks] CRLF
//   ...
//   part      CRLF "--" boundary "--" ... epilogue
//
// The CR LF before each delimiter belongs to the delimiter, not to the part before it; the
// first delimiter may also start the body directly.
#ifndef TARNWELL_RENDER_MIME_MIME_PARSER_H_
#define TARNWELL_RENDER_MIME_MIME_PARSER_H_

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::render {

inline constexpr size_t kMaxHeaderBytes = 1 << 20;
inline constexpr size_t kMaxHeaderFields = 4096;
inline constexpr int kMaxPartDepth = 32;
inline constexpr size_t kMaxParts = 10000;
inline constexpr size_t kMaxBoundaryLength = 200;

struct RawField {
  std::string name;
  std::string value;  // unfolded: line ends removed, the blanks that began continuations kept
};

// Parses the header block at the start of `data` into fields. Returns the number of bytes it
// covers, including the empty line that ends it. Lines that are not fields are skipped;
// parsing stops adding fields after kMaxHeaderFields or kMaxHeaderBytes.
size_t ParseHeaderBlock(ByteView data, std::vector<RawField>* fields);

struct MultipartPieces {
  ByteView preamble;
  std::vector<ByteView> parts;
  bool closed = false;  // the closing delimiter was found
};

// Splits a multipart body at its delimiter lines. No more than max_parts parts are returned.
MultipartPieces SplitMultipart(ByteView body, std::string_view boundary, size_t max_parts);

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_PARSER_H_
