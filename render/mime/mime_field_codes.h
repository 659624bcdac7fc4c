// Header field value coders.
//
// A field value is kept unencoded, as UTF-8 text. Storing it turns it into what may stand on
// the wire: characters outside printable ASCII become RFC 2047 encoded words in the field's
// charset, and the value is folded so that lines stay within 76 characters wherever the
// syntax leaves a place to fold. The coder kind says what the syntax is:
//
//   CFieldCodeText       unstructured text (Subject): the whole value is one unit; when any
//                        of it needs encoding, all of it becomes encoded words.
//   CFieldCodeAddress    address lists: units end at blanks, quoted strings, comments and
//                        angle addresses are whole units; a line break follows ',' and ':'.
//                        Display names are encoded, "<addr-layout>" never is.
//   CFieldCodeParameter  "type/sub; attr=value": a line break follows ';'; an encoded value
//                        stays inside double quotes.
//   CFieldCodeBase       any other field: units as for addresses, no forced breaks.
//
// Values never carry CR, LF or NUL onto the wire: each is written as a space, so text from a
// mailbox cannot add header lines. Decoding turns encoded words back into UTF-8 and, in
// structured fields, quotes decoded text that would otherwise change the field's structure.
#ifndef TARNWELL_RENDER_MIME_MIME_FIELD_CODES_H_
#define TARNWELL_RENDER_MIME_MIME_FIELD_CODES_H_

#include <cstddef>
#include <string>
#include <string_view>

#include "render/mime/mime_codes.h"

namespace tarnwell::render {

class CFieldCodeBase : public CMimeCodeBase {
 public:
  // Charset of encoded words; empty means utf-8.
  void SetCharset(std::string charset) { charset_ = std::move(charset); }
  const std::string& charset() const { return charset_; }
  // The column where the value starts, i.e. the length of "Name:". The encoded value begins
  // with the blank that separates it from the colon (or with a fold).
  void SetStartColumn(size_t column) { start_column_ = column; }

  // True for a character after which the value is always continued on a new line.
  virtual bool IsDelimiter(char ch) const;
  // 0: units end at blanks and specials; 255: the whole value is one unit.
  virtual char GetDelimiter() const;

  uint64_t GetEncodeLength() const override;
  bool EncodeTo(MimeSink* sink) const override;
  bool DecodeTo(MimeSink* sink) const override;

 protected:
  enum class Syntax { kText, kAddress, kParameter, kOther };
  virtual Syntax syntax() const { return Syntax::kOther; }

 private:
  std::string charset_;
  size_t start_column_ = 0;
};

class CFieldCodeText : public CFieldCodeBase {
 public:
  char GetDelimiter() const override;

 protected:
  Syntax syntax() const override { return Syntax::kText; }
};

class CFieldCodeAddress : public CFieldCodeBase {
 public:
  bool IsDelimiter(char ch) const override;

 protected:
  Syntax syntax() const override { return Syntax::kAddress; }
};

class CFieldCodeParameter : public CFieldCodeBase {
 public:
  bool IsDelimiter(char ch) const override;

 protected:
  Syntax syntax() const override { return Syntax::kParameter; }
};

// The value with CR, LF and NUL replaced by spaces.
std::string SanitizeFieldValue(std::string_view value);

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_FIELD_CODES_H_
