#include "render/mime/mime_codes.h"

#include <array>

namespace tarnwell::render {
namespace {

constexpr char kBase64Alphabet[] =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr char kBase64Pad = '=';
constexpr size_t kBase64GroupBytes = 3;
constexpr size_t kBase64GroupChars = 4;
constexpr uint8_t kNotBase64 = 0xFF;
constexpr std::string_view kCrLf = "\r\n";
constexpr std::string_view kSoftBreak = "=\r\n";
constexpr size_t kQpEscapeWidth = 3;

constexpr std::array<uint8_t, 256> MakeBase64Table() {
  std::array<uint8_t, 256> table{};
  for (auto& v : table) v = kNotBase64;
  for (uint8_t i = 0; i < 64; ++i) table[static_cast<uint8_t>(kBase64Alphabet[i])] = i;
  return table;
}
constexpr std::array<uint8_t, 256> kBase64Values = MakeBase64Table();

bool IsLineBreak(uint8_t c) { return c == '\r' || c == '\n'; }

// Encodes one group of 1 to 3 bytes as four characters.
void PutBase64Group(const uint8_t* p, size_t count, StagingBuffer* out) {
  uint32_t bits = uint32_t(p[0]) << 16;
  if (count > 1) bits |= uint32_t(p[1]) << 8;
  if (count > 2) bits |= p[2];
  out->Put(kBase64Alphabet[(bits >> 18) & 0x3F]);
  out->Put(kBase64Alphabet[(bits >> 12) & 0x3F]);
  out->Put(count > 1 ? kBase64Alphabet[(bits >> 6) & 0x3F] : kBase64Pad);
  out->Put(count > 2 ? kBase64Alphabet[bits & 0x3F] : kBase64Pad);
}

}  // namespace

int HexValue(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  return -1;
}

// ---- CMimeCodeBase

uint64_t CMimeCodeBase::GetEncodeLength() const {
  // In text mode a lone CR or LF grows into two bytes.
  return mode_ == kModeText ? 2 * uint64_t(input_.size()) : input_.size();
}

uint64_t CMimeCodeBase::GetDecodeLength() const { return input_.size(); }

bool CMimeCodeBase::EncodeTo(MimeSink* sink) const {
  if (mode_ != kModeText)
    return sink->Write(reinterpret_cast<const char*>(input_.data()), input_.size());
  StagingBuffer out(sink);
  const size_t n = input_.size();
  for (size_t i = 0; i < n; ++i) {
    uint8_t c = input_[i];
    if (IsLineBreak(c)) {
      if (c == '\r' && i + 1 < n && input_[i + 1] == '\n') ++i;
      out.Put(kCrLf);
    } else {
      out.Put(static_cast<char>(c));
    }
  }
  return out.Flush();
}

bool CMimeCodeBase::DecodeTo(MimeSink* sink) const {
  return sink->Write(reinterpret_cast<const char*>(input_.data()), input_.size());
}

size_t CMimeCodeBase::Encode(char* out, size_t out_size) const {
  BufferSink sink(out, out_size);
  EncodeTo(&sink);
  return sink.size();
}

size_t CMimeCodeBase::Decode(char* out, size_t out_size) const {
  BufferSink sink(out, out_size);
  DecodeTo(&sink);
  return sink.size();
}

std::string CMimeCodeBase::EncodeToString() const {
  std::string out;
  StringSink sink(&out);
  EncodeTo(&sink);
  return out;
}

Bytes CMimeCodeBase::DecodeToBytes() const {
  Bytes out;
  BytesSink sink(&out);
  DecodeTo(&sink);
  return out;
}

// ---- CMimeCodeQP

uint64_t CMimeCodeQP::GetEncodeLength() const {
  // Every byte may become a three-character escape. A soft break costs three characters; a
  // break that moves the tail of a line after its last blank can leave a short line, but the
  // line after it is then long, so two breaks at most fall on every 70 characters of output.
  uint64_t escaped = kQpEscapeWidth * uint64_t(input().size());
  return escaped + 2 * kSoftBreak.size() * (escaped / 70 + 1);
}

bool CMimeCodeQP::EncodeTo(MimeSink* sink) const {
  const bool text = mode() == kModeText;
  const ByteView in = input();
  const size_t n = in.size();
  StagingBuffer out(sink);
  std::string line;  // the output line being built, without its line end
  line.reserve(kMaxEncodedLineLength + kQpEscapeWidth);
  char token[kQpEscapeWidth];

  auto soft_break = [&] {
    // Break after the last blank so that words stay whole; a line without blanks breaks where
    // it is full. Literal blanks never end a line: only escaped ones do.
    size_t blank = line.find_last_of(" \t");
    std::string rest;
    if (blank != std::string::npos && blank + 1 < line.size()) {
      rest = line.substr(blank + 1);
      line.resize(blank + 1);
    }
    out.Put(line);
    out.Put(kSoftBreak);
    line = std::move(rest);
  };

  for (size_t i = 0; i < n; ++i) {
    const uint8_t c = in[i];
    if (text && IsLineBreak(c)) {
      if (c == '\r' && i + 1 < n && in[i + 1] == '\n') ++i;
      out.Put(line);
      out.Put(kCrLf);
      line.clear();
      continue;
    }
    const bool last = i + 1 == n;
    const bool before_break = text && !last && IsLineBreak(in[i + 1]);
    bool escape;
    if (c == ' ' || c == '\t') {
      // Trailing blanks may be stripped in transit.
      escape = last || before_break;
    } else if (c == '.' && line.empty()) {
      // A line holding only "." ends the message for SMTP.
      escape = last || before_break;
    } else {
      escape = c < '!' || c > '~' || c == '=';
    }
    size_t width = 1;
    if (escape) {
      token[0] = '=';
      token[1] = kHexDigits[c >> 4];
      token[2] = kHexDigits[c & 0x0F];
      width = kQpEscapeWidth;
    } else {
      token[0] = static_cast<char>(c);
    }
    // Room is kept for the '=' of a soft break.
    while (line.size() + width >= kMaxEncodedLineLength) soft_break();
    line.append(token, width);
  }
  out.Put(line);
  return out.Flush();
}

bool CMimeCodeQP::DecodeTo(MimeSink* sink) const {
  const ByteView in = input();
  const auto* text = reinterpret_cast<const char*>(in.data());
  const size_t n = in.size();
  StagingBuffer out(sink);
  size_t pos = 0;
  while (pos < n) {
    size_t end = pos;
    while (end < n && text[end] != '\n') ++end;
    const bool has_break = end < n;
    size_t stop = end;
    if (has_break && stop > pos && text[stop - 1] == '\r') --stop;
    // Blanks at the end of a line were added in transit.
    while (stop > pos && (text[stop - 1] == ' ' || text[stop - 1] == '\t')) --stop;
    const bool soft = stop > pos && text[stop - 1] == '=';
    if (soft) --stop;
    for (size_t i = pos; i < stop; ++i) {
      if (text[i] == '=' && i + 2 < stop) {
        const int hi = HexValue(text[i + 1]);
        const int lo = HexValue(text[i + 2]);
        if (hi >= 0 && lo >= 0) {
          out.Put(static_cast<char>(hi * 16 + lo));
          i += 2;
          continue;
        }
      }
      out.Put(text[i]);
    }
    if (has_break && !soft) out.Put(kCrLf);
    pos = has_break ? end + 1 : end;
  }
  return out.Flush();
}

// ---- CMimeCodeBase64

uint64_t CMimeCodeBase64::GetEncodeLength() const {
  uint64_t chars = kBase64GroupChars * ((uint64_t(input().size()) + 2) / kBase64GroupBytes);
  if (mode() == kModeLineBreaks) {
    chars += kCrLf.size() * ((chars + kMaxEncodedLineLength - 1) / kMaxEncodedLineLength);
  }
  return chars;
}

uint64_t CMimeCodeBase64::GetDecodeLength() const {
  return uint64_t(input().size()) * kBase64GroupBytes / kBase64GroupChars + 2;
}

bool CMimeCodeBase64::EncodeTo(MimeSink* sink) const {
  const bool breaks = mode() == kModeLineBreaks;
  const ByteView in = input();
  StagingBuffer out(sink);
  size_t column = 0;
  for (size_t i = 0; i < in.size(); i += kBase64GroupBytes) {
    PutBase64Group(in.data() + i, std::min(kBase64GroupBytes, in.size() - i), &out);
    column += kBase64GroupChars;
    if (breaks && column == kMaxEncodedLineLength) {
      out.Put(kCrLf);
      column = 0;
    }
  }
  if (breaks && column > 0) out.Put(kCrLf);
  return out.Flush();
}

bool CMimeCodeBase64::DecodeTo(MimeSink* sink) const {
  const ByteView in = input();
  StagingBuffer out(sink);
  uint32_t bits = 0;
  int count = 0;
  for (size_t i = 0; i < in.size(); ++i) {
    const uint8_t c = in[i];
    if (c == kBase64Pad) break;
    const uint8_t v = kBase64Values[c];
    // Line ends and anything else outside the alphabet are skipped, as mail readers do.
    if (v == kNotBase64) continue;
    bits = (bits << 6) | v;
    if (++count == 4) {
      out.Put(static_cast<char>(bits >> 16));
      out.Put(static_cast<char>(bits >> 8));
      out.Put(static_cast<char>(bits));
      bits = 0;
      count = 0;
    }
  }
  // A final group of two or three characters carries one or two bytes; a single character
  // carries none.
  if (count == 2) {
    out.Put(static_cast<char>(bits >> 4));
  } else if (count == 3) {
    out.Put(static_cast<char>(bits >> 10));
    out.Put(static_cast<char>(bits >> 2));
  }
  return out.Flush();
}

std::string Base64Encode(ByteView bytes) {
  CMimeCodeBase64 coder;
  coder.SetMode(CMimeCodeBase64::kModeNoLineBreaks);
  coder.SetInput(bytes);
  return coder.EncodeToString();
}

Bytes Base64Decode(std::string_view text) {
  CMimeCodeBase64 coder;
  coder.SetInput(text);
  return coder.DecodeToBytes();
}

}  // namespace tarnwell::render
