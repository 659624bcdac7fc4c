#include "render/content_line.h"

#include <vector>

namespace tarnwell::render {
namespace {

constexpr char kEscape = '\\';
constexpr char32_t kFirstPrintable = 0x20;
constexpr char32_t kDelete = 0x7F;
constexpr char32_t kFirstNonAscii = 0x80;
constexpr unsigned char kFirstQpLiteral = 0x21;  // '!'; space and tab are handled apart
constexpr unsigned char kLastQpLiteral = 0x7E;   // '~'
constexpr std::string_view kQpLineBreak = "=0D=0A";
constexpr std::string_view kSoftBreak = "=\r\n";
constexpr char kQpHexDigits[] = "0123456789ABCDEF";

// Code pages whose bytes are not ASCII-compatible or that switch state inside a text; a
// content line cannot be written in them.
constexpr uint32_t kUnusableCodePages[] = {1200, 1201, 12000, 12001, 65000, 50220, 50221, 50222};

uint32_t UsableCodePage(uint32_t code_page) {
  for (uint32_t bad : kUnusableCodePages) {
    if (code_page == bad) return kDefaultCodePage;
  }
  return code_page;
}

std::string QpEscaped(unsigned char byte) {
  return {'=', kQpHexDigits[byte >> 4], kQpHexDigits[byte & 0xF]};
}

bool IsQpSpace(std::string_view token) { return token == " " || token == "\t"; }

}  // namespace

std::string EscapeText(std::string_view text, LineBreaks breaks) {
  const std::string valid = ToValidUtf8(text);
  std::string out;
  out.reserve(valid.size() + valid.size() / 8);
  for (size_t i = 0; i < valid.size(); ++i) {
    const char c = valid[i];
    switch (c) {
      case '\\':
      case ';':
      case ',':
        out.push_back(kEscape);
        out.push_back(c);
        break;
      case '\r':
      case '\n':
        // CR LF, a lone CR and a lone LF are each one line break.
        if (c == '\r' && i + 1 < valid.size() && valid[i + 1] == '\n') ++i;
        out += breaks == LineBreaks::kEscape ? std::string_view("\\n") : kCrLf;
        break;
      case '\t':
        out.push_back(c);
        break;
      default:
        if (static_cast<unsigned char>(c) < kFirstPrintable ||
            static_cast<unsigned char>(c) == kDelete) {
          break;
        }
        out.push_back(c);
    }
  }
  return out;
}

std::string QuotedPrintable(std::string_view bytes, size_t first_line_used) {
  // Tokens are the units that never split across physical lines.
  std::vector<std::string> tokens;
  tokens.reserve(bytes.size());
  for (size_t i = 0; i < bytes.size(); ++i) {
    const unsigned char b = static_cast<unsigned char>(bytes[i]);
    if (b == '\r' && i + 1 < bytes.size() && bytes[i + 1] == '\n') {
      tokens.emplace_back(kQpLineBreak);
      ++i;
    } else if ((b >= kFirstQpLiteral && b <= kLastQpLiteral && b != '=') || b == ' ' || b == '\t') {
      tokens.emplace_back(1, char(b));
    } else {
      tokens.push_back(QpEscaped(b));
    }
  }

  std::string out;
  size_t used = first_line_used;
  for (size_t i = 0; i < tokens.size(); ++i) {
    std::string token = tokens[i];
    if (IsQpSpace(token)) {
      // A space or tab ending a physical line may be stripped on the way, so it is written
      // encoded there.
      const bool last = i + 1 == tokens.size() || tokens[i + 1] == kQpLineBreak ||
                        used + 1 + tokens[i + 1].size() + 1 > kMaxQuotedPrintableLine;
      if (last) token = QpEscaped(static_cast<unsigned char>(token[0]));
    }
    if (used + token.size() + 1 > kMaxQuotedPrintableLine && used > 0) {
      out += kSoftBreak;
      used = 0;
    }
    out += token;
    used += token.size();
    if (token == kQpLineBreak && i + 1 < tokens.size()) {
      out += kSoftBreak;
      used = 0;
    }
  }
  return out;
}

ContentWriter::ContentWriter(TextMode mode)
    : utf8_(mode.utf8), code_page_(UsableCodePage(mode.ansi_code_page)) {}

void ContentWriter::AppendChar(std::string_view text, size_t* pos, std::string* bytes) const {
  const char32_t cp = DecodeUtf8(text, pos);
  if (cp < kFirstNonAscii) {
    bytes->push_back(char(cp));
    return;
  }
  std::string utf8;
  AppendUtf8(cp, &utf8);
  if (utf8_) {
    *bytes += utf8;
  } else {
    *bytes += Utf8ToCodePage(utf8, code_page_);
  }
}

std::string ContentWriter::Encode(std::string_view text) const {
  std::string out;
  out.reserve(text.size());
  size_t pos = 0;
  while (pos < text.size()) AppendChar(text, &pos, &out);
  return out;
}

void ContentWriter::Property(std::string_view name, std::string_view value) {
  // Each character in output bytes, so that folds fall between characters.
  const std::string line = std::string(name).append(":").append(value);
  std::vector<std::string> chars;
  chars.reserve(line.size());
  for (size_t pos = 0; pos < line.size();) {
    chars.emplace_back();
    AppendChar(line, &pos, &chars.back());
  }
  auto blank = [&](size_t i) { return chars[i] == " " || chars[i] == "\t"; };

  std::vector<size_t> offsets;  // where each character of the current physical line starts
  size_t first = 0;             // index of the current physical line's first character
  size_t used = 0;
  for (size_t i = 0; i < chars.size(); ++i) {
    if (used + chars[i].size() > kMaxLineOctets && used > 0) {
      // Many readers take a line of nothing but white space for an empty line, which ends a
      // property; a continuation holds at least one other character where that can be had.
      bool only_blanks = true;
      size_t room = kMaxLineOctets - 1;
      for (size_t k = i; k < chars.size() && chars[k].size() <= room; ++k) {
        if (!blank(k)) {
          only_blanks = false;
          break;
        }
        room -= chars[k].size();
      }
      if (only_blanks) {
        size_t j = i;
        while (j > first + 1 && blank(j - 1)) --j;
        if (j > first + 1) {
          out_.resize(offsets[j - 1 - first]);
          i = j - 1;
        }
      }
      out_ += kCrLf;
      out_.push_back(' ');
      used = 1;
      first = i;
      offsets.clear();
    }
    offsets.push_back(out_.size());
    out_ += chars[i];
    used += chars[i].size();
  }
  out_ += kCrLf;
}

void ContentWriter::QuotedPrintableProperty(std::string_view name, std::string_view value) {
  out_ += name;
  out_.push_back(':');
  out_ += QuotedPrintable(Encode(value), name.size() + 1);
  out_ += kCrLf;
}

void ContentWriter::EmptyLine() { out_ += kCrLf; }

}  // namespace tarnwell::render
