// CMimeBody: a header plus content bytes and child parts.
//
// The content is kept raw (unencoded) and encoded while storing, with the coder named by the
// part's Content-Transfer-Encoding. A part without that field whose content is not plain
// 7-bit text with short lines is stored with one added: quoted-printable for text, base64
// otherwise, because a reader would take unmarked content as 7-bit.
//
// Storing a multipart body writes its content (the preamble) and then each child after a
// delimiter line, ending with the closing delimiter:
//
//   header CRLF [content] CRLF "--" boundary CRLF child ... CRLF "--" boundary "--" CRLF
//
// When the bytes before the first delimiter already end in CR LF (an empty preamble right
// after the header), the first delimiter starts there without another CR LF. Before storing,
// every boundary is checked against what its part encloses and replaced if it occurs there.
#ifndef TARNWELL_RENDER_MIME_MIME_BODY_H_
#define TARNWELL_RENDER_MIME_MIME_BODY_H_

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "render/mime/mime_codes.h"
#include "render/mime/mime_header.h"

namespace tarnwell::render {

class CMimeBody : public CMimeHeader {
 public:
  CMimeBody() = default;
  ~CMimeBody() override;

  // Deletes the children, frees the content and removes the fields.
  void Clear() override;
  // Upper bound of the bytes Store writes.
  uint64_t GetLength() override;
  // Writes the whole part. InvalidArgument when a multipart part has no boundary; IoError
  // when the sink refuses bytes.
  Status Store(MimeSink* sink) override;
  // Replaces this part by the one parsed from `data`; content is decoded by its transfer
  // encoding, multipart bodies are split into children. Returns data.size().
  size_t Load(ByteView data) override;
  using CMimeHeader::Store;

  // Replaces the content by a copy of `text`; its length, or -1 when memory runs out (the
  // content is then empty).
  int64_t SetText(std::string_view text);
  // Replaces the content and names the part after the file: the text after the last '\'
  // of file_name goes to SetName. False when memory runs out (content empty, name set).
  bool SetContent(std::string_view file_name, ByteView bytes);
  bool SetContent(std::string_view file_name, Bytes&& bytes);
  // Sets the "name" parameter of Content-Type, creating Content-Type from the file's
  // extension when the part has none.
  void SetName(std::string_view file_name);

  ByteView GetContent() const { return content_; }
  size_t GetContentLength() const { return content_.size(); }
  Bytes TakeContent() { return std::move(content_); }
  // The content as UTF-8, read in the charset named by Content-Type (us-ascii when none).
  std::string GetText() const;
  // Content-Disposition's filename, else Content-Type's name.
  std::optional<std::string> GetFileName() const;
  // The transfer encoding the part is stored with (lower case, "" for 7bit without a field).
  std::string GetTransferEncoding() const;

  // New child parts go to the end of the list; the parent owns them.
  CMimeBody* CreatePart(std::string_view media_type = "text");
  CMimeBody* AddChild(std::unique_ptr<CMimeBody> part);
  size_t GetChildCount() const { return children_.size(); }
  CMimeBody* GetChild(size_t index) const {
    return index < children_.size() ? children_[index].get() : nullptr;
  }

 protected:
  Status StorePart(MimeSink* sink, std::string_view inherited_charset);
  uint64_t PartLength(std::string_view inherited_charset);
  void LoadPart(ByteView data, int depth, size_t* parts_left);

 private:
  std::optional<CMimeFieldEntry> ImpliedTransferEncoding() const;
  std::unique_ptr<CMimeCodeBase> ContentCoder() const;
  void PrepareBoundaries();
  bool EnclosedTextContains(std::string_view boundary) const;

  Bytes content_;
  std::vector<std::unique_ptr<CMimeBody>> children_;
};

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_BODY_H_
