// Content lines, the shared syntax of vCard and iCalendar files.
//
// A content line is "NAME;PARAM=VALUE:value" ended by CR LF. The rules both writers follow:
//
//   escaping   In text values a backslash, ';' and ',' are written with a backslash before
//              them and a line break (CR LF, CR or LF) as the two characters "\n", so that no
//              value can end its line or split its structure. Other control characters except
//              TAB have no written form in text values and are dropped.
//   folding    A line longer than kMaxLineOctets octets (CR LF not counted) continues on the
//              next physical line, which starts with one space. Folding never splits a
//              character, whatever the output character set.
//   quoted-printable  Values of vCard 2.1 properties that carry line breaks: the bytes in the
//              output character set, '=' and every byte outside printable ASCII as "=XX", a
//              line break as "=0D=0A" followed by a soft line break ("=" CR LF); physical
//              lines stay within kMaxQuotedPrintableLine octets. Such lines are not folded.
//   charset    TextMode: UTF-8 when the store-text flag is set, else the ANSI code page. A
//              code page that cannot be a Windows ANSI code page (UTF-16, UTF-7, the stateful
//              ISO-2022-JP) means the default code page instead, because every byte of the
//              structure must stay ASCII.
#ifndef TARNWELL_RENDER_CONTENT_LINE_H_
#define TARNWELL_RENDER_CONTENT_LINE_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "base/text.h"

namespace tarnwell::render {

inline constexpr size_t kMaxLineOctets = 75;
inline constexpr size_t kMaxQuotedPrintableLine = 76;  // the soft-break '=' included
inline constexpr std::string_view kCrLf = "\r\n";

// How composed text files are encoded: the store-text flag and the ANSI code page setting.
struct TextMode {
  bool utf8 = true;
  uint32_t ansi_code_page = kDefaultCodePage;
};

enum class LineBreaks {
  kEscape,  // "\n", for values on one line
  kCrLf,    // kept, as CR LF, for quoted-printable values
};

// `text` (UTF-8, repaired where ill-formed) escaped as a text value.
std::string EscapeText(std::string_view text, LineBreaks breaks = LineBreaks::kEscape);

// `bytes` quoted-printable encoded for a value that starts `first_line_used` octets into its
// physical line.
std::string QuotedPrintable(std::string_view bytes, size_t first_line_used);

// Collects the lines of one file in the output character set.
class ContentWriter {
 public:
  explicit ContentWriter(TextMode mode);

  // "name:value", folded. `name` (ASCII) holds the property name and its parameters; `value`
  // is UTF-8, already escaped as its type needs.
  void Property(std::string_view name, std::string_view value);
  // "name:" and `value` (UTF-8, line breaks as CR LF, escaped otherwise) quoted-printable
  // encoded in the output character set.
  void QuotedPrintableProperty(std::string_view name, std::string_view value);
  // An empty line, which ends a vCard 2.1 Base64 value.
  void EmptyLine();

  // UTF-8 `text` in the output character set.
  std::string Encode(std::string_view text) const;
  const std::string& text() const { return out_; }
  std::string Take() { return std::move(out_); }

 private:
  // Appends the output bytes of the code point at text[*pos] and advances *pos.
  void AppendChar(std::string_view text, size_t* pos, std::string* bytes) const;

  bool utf8_;
  uint32_t code_page_;
  std::string out_;
};

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_CONTENT_LINE_H_
