// CMimeHeader: an ordered list of header fields.
//
// Values are kept unencoded, as UTF-8 text; encoding (RFC 2047 words in the field's charset)
// and folding happen when the header is stored, through the coder the registry names for the
// field. Field order is the order of first insertion.
#ifndef TARNWELL_RENDER_MIME_MIME_HEADER_H_
#define TARNWELL_RENDER_MIME_MIME_HEADER_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "render/mime/mime_sink.h"

namespace tarnwell::render {

struct CMimeFieldEntry {
  std::string name;
  std::string value;    // unencoded UTF-8
  std::string charset;  // charset of its encoded words; empty: the header's
};

// "__=_Part_Boundary_" plus a counter running 1 to 9 and two random numbers.
std::string MakeBoundary();

class CMimeHeader {
 public:
  CMimeHeader() = default;
  CMimeHeader(const CMimeHeader&) = delete;
  CMimeHeader& operator=(const CMimeHeader&) = delete;
  virtual ~CMimeHeader();

  // Removes every field.
  virtual void Clear();
  // Upper bound of the bytes Store writes.
  virtual uint64_t GetLength();
  // Writes every field and the empty line that ends the header.
  virtual Status Store(MimeSink* sink);
  // Parses a header block (up to and including its empty line) and appends its fields, with
  // encoded words decoded. Returns the number of bytes read.
  virtual size_t Load(ByteView data);

  // Stores into caller memory: the byte count; 0 when the buffer is too small; -1 when a
  // multipart part has no boundary.
  int64_t Store(char* buffer, size_t size);

  // Replaces the value of the first field of that name (case-insensitive) or appends a new
  // field. CR, LF and NUL in the value become spaces. False when the name has no character
  // a field name may contain.
  bool SetFieldValue(std::string_view name, std::string_view value, std::string_view charset = {});
  // Appends a field even when one of that name exists (Received, parsed headers).
  bool AddField(std::string_view name, std::string_view value, std::string_view charset = {});
  // The value of the first field of that name, or null.
  const std::string* GetFieldValue(std::string_view name) const;
  bool RemoveField(std::string_view name);
  const std::vector<CMimeFieldEntry>& fields() const { return fields_; }

  // Sets the parameter `attribute` inside the field's value ("; attribute=value"), replacing
  // an existing one in place. The value is quoted here; pass it unquoted. False when the
  // field does not exist.
  bool SetParameter(std::string_view field_name, std::string_view attribute,
                    std::string_view value);
  // The parameter's value, unquoted; RFC 2231 forms ("name*=", "name*0*=") are decoded.
  std::optional<std::string> GetParameter(std::string_view field_name,
                                          std::string_view attribute) const;

  // Sets "Date" from a local calendar time, with the local zone offset. False (and nothing
  // set) for a time that cannot be converted or lies before 1970.
  bool SetDate(int year, int month, int day, int hour, int minute, int second);

  // Index of the main type of Content-Type (MediaType); kMediaText when absent.
  int GetMediaType() const;
  // Lower-case main type and subtype; "text" and "plain" when Content-Type is absent.
  std::string GetMainType() const;
  std::string GetSubType() const;
  // Gives the part a fresh boundary. A multipart Content-Type keeps its subtype; any other
  // becomes multipart/mixed.
  void SetBoundary();
  std::string GetBoundary() const;

  // Charset of encoded words for fields that name none; empty means the enclosing part's,
  // and for the top part the registry default (utf-8).
  void SetCharset(std::string charset) { charset_ = std::move(charset); }
  const std::string& charset() const { return charset_; }

 protected:
  // The encoded form of one field line, with its CR LF. The charset of its encoded words is
  // the field's, else the header's, else inherited_charset (the enclosing part's), else the
  // registry default.
  std::string EncodeField(const CMimeFieldEntry& field, std::string_view inherited_charset) const;
  // Writes the fields (and `extra`, when given) without the closing empty line.
  bool StoreFields(MimeSink* sink, const CMimeFieldEntry* extra,
                   std::string_view inherited_charset) const;
  uint64_t FieldsLength(const CMimeFieldEntry* extra, std::string_view inherited_charset) const;

 private:
  CMimeFieldEntry* FindField(std::string_view name);
  std::vector<CMimeFieldEntry> fields_;
  std::string charset_;
};

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_HEADER_H_
