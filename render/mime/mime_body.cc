#include "render/mime/mime_body.h"

#include <algorithm>
#include <cstring>
#include <new>

#include "base/text.h"
#include "render/mime/mime_encoded_word.h"
#include "render/mime/mime_parser.h"
#include "render/mime/mime_registry.h"

namespace tarnwell::render {
namespace {

constexpr std::string_view kCrLf = "\r\n";
constexpr std::string_view kDashes = "--";
constexpr std::string_view kTransferEncoding = "Content-Transfer-Encoding";
constexpr std::string_view kContentType = "Content-Type";
constexpr std::string_view kContentDisposition = "Content-Disposition";
constexpr std::string_view kNameAttribute = "name";
constexpr std::string_view kFileNameAttribute = "filename";
constexpr std::string_view kCharsetAttribute = "charset";
constexpr std::string_view kDefaultTextCharset = "us-ascii";
// RFC 5322: lines of at most 998 characters plus CR LF.
constexpr size_t kMaxLineLength = 998;
constexpr int kMaxBoundaryAttempts = 16;
constexpr std::string_view kBase64Output =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/=\r\n";

// Whether content can travel unmarked: 7-bit, no NUL, no overlong line. Bare CR and LF are
// fine, the copy coder writes them as CR LF.
bool IsPlain7Bit(ByteView content) {
  size_t line = 0;
  for (size_t i = 0; i < content.size(); ++i) {
    const uint8_t c = content[i];
    if (c >= 0x80 || c == 0) return false;
    if (c == '\r' || c == '\n') {
      line = 0;
    } else if (++line > kMaxLineLength) {
      return false;
    }
  }
  return true;
}

// Looks for a string in everything written to it, across write boundaries.
class SearchSink : public MimeSink {
 public:
  explicit SearchSink(std::string_view needle) : needle_(needle) {}
  bool found() const { return found_; }

 protected:
  bool DoWrite(const char* data, size_t size) override {
    if (found_) return false;
    window_.append(data, size);
    if (window_.find(needle_) != std::string::npos) {
      found_ = true;
      return false;  // nothing more to learn
    }
    if (window_.size() >= needle_.size()) window_.erase(0, window_.size() - needle_.size() + 1);
    return true;
  }

 private:
  std::string needle_;
  std::string window_;
  bool found_ = false;
};

bool Contains(ByteView haystack, std::string_view needle) {
  const auto* begin = reinterpret_cast<const char*>(haystack.data());
  const auto* end = begin + haystack.size();
  return std::search(begin, end, needle.begin(), needle.end()) != end;
}

}  // namespace

CMimeBody::~CMimeBody() = default;

void CMimeBody::Clear() {
  children_.clear();
  content_.clear();
  content_.shrink_to_fit();
  CMimeHeader::Clear();
}

// ---- Content

int64_t CMimeBody::SetText(std::string_view text) {
  content_.clear();
  try {
    content_.assign(text.begin(), text.end());
  } catch (const std::bad_alloc&) {
    content_ = Bytes();
    return -1;
  }
  return static_cast<int64_t>(content_.size());
}

bool CMimeBody::SetContent(std::string_view file_name, ByteView bytes) {
  bool ok = true;
  content_.clear();
  try {
    content_.assign(bytes.data(), bytes.data() + bytes.size());
  } catch (const std::bad_alloc&) {
    content_ = Bytes();
    ok = false;
  }
  const size_t slash = file_name.rfind('\\');
  SetName(slash == std::string_view::npos ? file_name : file_name.substr(slash + 1));
  return ok;
}

bool CMimeBody::SetContent(std::string_view file_name, Bytes&& bytes) {
  content_ = std::move(bytes);
  const size_t slash = file_name.rfind('\\');
  SetName(slash == std::string_view::npos ? file_name : file_name.substr(slash + 1));
  return true;
}

void CMimeBody::SetName(std::string_view file_name) {
  if (!GetFieldValue(kContentType)) SetFieldValue(kContentType, MediaTypeForFileName(file_name));
  SetParameter(kContentType, kNameAttribute, file_name);
}

std::string CMimeBody::GetText() const {
  const std::string charset =
      GetParameter(kContentType, kCharsetAttribute).value_or(std::string(kDefaultTextCharset));
  return CharsetBytesToUtf8(
      std::string_view(reinterpret_cast<const char*>(content_.data()), content_.size()), charset);
}

std::optional<std::string> CMimeBody::GetFileName() const {
  std::optional<std::string> name = GetParameter(kContentDisposition, kFileNameAttribute);
  return name ? name : GetParameter(kContentType, kNameAttribute);
}

std::optional<CMimeFieldEntry> CMimeBody::ImpliedTransferEncoding() const {
  if (GetFieldValue(kTransferEncoding) || !children_.empty() || IsPlain7Bit(content_)) {
    return std::nullopt;
  }
  CMimeFieldEntry field;
  field.name = kTransferEncoding;
  switch (GetMediaType()) {
    case kMediaText:
      field.value = "quoted-printable";
      break;
    case kMediaMessage:
      // Message parts may only be 7bit, 8bit or binary.
      field.value = "binary";
      break;
    default:
      field.value = "base64";
      break;
  }
  return field;
}

std::string CMimeBody::GetTransferEncoding() const {
  if (const std::string* value = GetFieldValue(kTransferEncoding)) {
    std::string lower = AsciiLower(*value);
    const size_t begin = lower.find_first_not_of(" \t");
    const size_t end = lower.find_last_not_of(" \t");
    return begin == std::string::npos ? std::string() : lower.substr(begin, end - begin + 1);
  }
  std::optional<CMimeFieldEntry> implied = ImpliedTransferEncoding();
  return implied ? implied->value : std::string();
}

std::unique_ptr<CMimeCodeBase> CMimeBody::ContentCoder() const {
  std::unique_ptr<CMimeCodeBase> coder =
      CMimeCoderRegistry::CreateContentCoder(GetTransferEncoding());
  coder->SetInput(ByteView(content_));
  return coder;
}

// ---- Children

CMimeBody* CMimeBody::CreatePart(std::string_view media_type) {
  return AddChild(CMimeCoderRegistry::CreatePart(media_type));
}

CMimeBody* CMimeBody::AddChild(std::unique_ptr<CMimeBody> part) {
  if (!part) return nullptr;
  children_.push_back(std::move(part));
  return children_.back().get();
}

// ---- Boundaries

bool CMimeBody::EnclosedTextContains(std::string_view boundary) const {
  // The part's own content (a multipart preamble) and everything in its children.
  std::unique_ptr<CMimeCodeBase> coder = ContentCoder();
  const std::string encoding = GetTransferEncoding();
  bool may_contain;
  if (encoding == "base64") {
    may_contain = boundary.find_first_not_of(kBase64Output) == std::string_view::npos;
  } else if (encoding == "quoted-printable") {
    // Quoted-printable writes '=' only before two hex digits or a line end.
    may_contain = true;
    for (size_t i = boundary.find('='); i != std::string_view::npos && may_contain;
         i = boundary.find('=', i + 1)) {
      if (i + 1 < boundary.size() && HexValue(boundary[i + 1]) < 0 && boundary[i + 1] != '\r') {
        may_contain = false;
      }
    }
  } else {
    // The copy coder changes only line ends, and a boundary holds none.
    if (Contains(content_, boundary)) return true;
    may_contain = false;
  }
  if (may_contain) {
    SearchSink search(boundary);
    coder->EncodeTo(&search);
    if (search.found()) return true;
  }
  for (const auto& child : children_) {
    for (const CMimeFieldEntry& field : child->fields()) {
      if (field.value.find(boundary) != std::string::npos ||
          child->EncodeField(field, {}).find(boundary) != std::string::npos) {
        return true;
      }
    }
    if (child->EnclosedTextContains(boundary)) return true;
  }
  return false;
}

void CMimeBody::PrepareBoundaries() {
  // Children first, so that a change here cannot be undone by one further down.
  for (const auto& child : children_) child->PrepareBoundaries();
  if (children_.empty()) return;
  std::string boundary = GetBoundary();
  if (boundary.empty()) return;  // Store reports it
  for (int attempt = 0; attempt < kMaxBoundaryAttempts && EnclosedTextContains(boundary);
       ++attempt) {
    SetBoundary();
    boundary = GetBoundary();
  }
}

// ---- Storing

uint64_t CMimeBody::GetLength() {
  PrepareBoundaries();
  return PartLength({});
}

Status CMimeBody::Store(MimeSink* sink) {
  PrepareBoundaries();
  return StorePart(sink, {});
}

uint64_t CMimeBody::PartLength(std::string_view inherited_charset) {
  std::optional<CMimeFieldEntry> implied = ImpliedTransferEncoding();
  uint64_t length = FieldsLength(implied ? &*implied : nullptr, inherited_charset) + kCrLf.size();
  length += ContentCoder()->GetEncodeLength();
  if (!children_.empty()) {
    const std::string_view child_charset = charset().empty() ? inherited_charset : charset();
    const uint64_t boundary = GetBoundary().size();
    for (const auto& child : children_) {
      length += boundary + 2 * kCrLf.size() + kDashes.size() + child->PartLength(child_charset);
    }
    length += boundary + 2 * kCrLf.size() + 2 * kDashes.size();
  }
  return length;
}

Status CMimeBody::StorePart(MimeSink* sink, std::string_view inherited_charset) {
  const Status write_error = Status::IoError("the message could not be written");
  std::optional<CMimeFieldEntry> implied = ImpliedTransferEncoding();
  if (!StoreFields(sink, implied ? &*implied : nullptr, inherited_charset) || !sink->Write(kCrLf) ||
      !ContentCoder()->EncodeTo(sink)) {
    return write_error;
  }
  if (children_.empty()) return Status::Ok();
  const std::string boundary = GetBoundary();
  if (boundary.empty()) return Status::InvalidArgument("a multipart part has no boundary");
  const std::string_view child_charset = charset().empty() ? inherited_charset : charset();
  for (size_t i = 0; i < children_.size(); ++i) {
    // Right after the header's empty line the first delimiter needs no line end of its own.
    const bool at_line_start = i == 0 && sink->EndsWithCrLf();
    if ((!at_line_start && !sink->Write(kCrLf)) || !sink->Write(kDashes) ||
        !sink->Write(boundary) || !sink->Write(kCrLf)) {
      return write_error;
    }
    Status status = children_[i]->StorePart(sink, child_charset);
    if (!status.ok()) return status;
  }
  if (!sink->Write(kCrLf) || !sink->Write(kDashes) || !sink->Write(boundary) ||
      !sink->Write(kDashes) || !sink->Write(kCrLf)) {
    return write_error;
  }
  return Status::Ok();
}

// ---- Loading

size_t CMimeBody::Load(ByteView data) {
  Clear();
  size_t parts_left = kMaxParts;
  LoadPart(data, 0, &parts_left);
  return data.size();
}

void CMimeBody::LoadPart(ByteView data, int depth, size_t* parts_left) {
  const size_t header_size = CMimeHeader::Load(data);
  const ByteView body = data.From(header_size);
  const std::string boundary = GetBoundary();
  if (GetMediaType() == kMediaMultipart && !boundary.empty() && depth < kMaxPartDepth) {
    MultipartPieces pieces = SplitMultipart(body, boundary, *parts_left);
    content_ = pieces.preamble.ToBytes();
    for (ByteView piece : pieces.parts) {
      if (*parts_left == 0) break;
      --*parts_left;
      std::unique_ptr<CMimeBody> child = CMimeCoderRegistry::CreatePart(GetMainType());
      child->LoadPart(piece, depth + 1, parts_left);
      children_.push_back(std::move(child));
    }
    return;
  }
  // Parsed content is kept exactly as decoded; line ends are not touched.
  std::unique_ptr<CMimeCodeBase> coder =
      CMimeCoderRegistry::CreateContentCoder(GetTransferEncoding());
  coder->SetInput(body);
  // Decoded content is never larger than the encoded text; reserving it avoids the copies
  // a growing buffer makes of a large attachment.
  content_.clear();
  content_.reserve(std::min<uint64_t>(coder->GetDecodeLength(), body.size()));
  BytesSink sink(&content_);
  coder->DecodeTo(&sink);
}

}  // namespace tarnwell::render
