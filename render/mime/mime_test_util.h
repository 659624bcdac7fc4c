// Test support for the MIME library: an independent reading of composed messages by Python's
// email package (Debian's /usr/bin/python3), and small helpers.
#ifndef TARNWELL_RENDER_MIME_MIME_TEST_UTIL_H_
#define TARNWELL_RENDER_MIME_MIME_TEST_UTIL_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::render::mime_testing {

struct PythonPart {
  int index = 0;  // position in walk() order
  std::string content_type;
  std::optional<std::string> file_name;
  std::string sha256;  // of the decoded payload
  uint64_t size = 0;
  std::optional<std::string> text;  // get_content() of text parts
};

struct PythonDefect {
  int index = 0;
  std::string header;  // empty for a defect of the part itself
  std::string text;
};

struct PythonReading {
  bool available = false;                                    // false: /usr/bin/python3 is missing
  std::string error;                                         // the script failed
  std::vector<std::pair<std::string, std::string>> headers;  // top-level, decoded
  // The same decoded by email.header.decode_header, which drops blanks between adjacent
  // encoded words in display names too, as RFC 2047 says, and drops quoting.
  std::vector<std::pair<std::string, std::string>> legacy_headers;
  std::vector<PythonDefect> defects;
  std::vector<PythonPart> parts;  // leaf parts
  std::vector<std::string> multipart_types;

  // Decoded value of the first top-level header of that name (case-insensitive).
  std::optional<std::string> Header(const std::string& name, bool legacy = false) const;
};

inline ByteView View(std::string_view text) {
  return ByteView(reinterpret_cast<const uint8_t*>(text.data()), text.size());
}
inline std::string Text(ByteView view) {
  return std::string(reinterpret_cast<const char*>(view.data()), view.size());
}

bool PythonAvailable();
PythonReading ReadWithPython(const std::string& message);
std::string Sha256Hex(ByteView bytes);
Bytes RandomBytes(size_t size, uint32_t seed);
std::string TempPath(const std::string& name);

}  // namespace tarnwell::render::mime_testing

#endif  // TARNWELL_RENDER_MIME_MIME_TEST_UTIL_H_
