#include "render/mime/mime_field_codes.h"

#include <vector>

#include "render/mime/mime_encoded_word.h"

namespace tarnwell::render {
namespace {

constexpr char kWholeValueDelimiter = static_cast<char>(255);
constexpr std::string_view kFold = "\r\n";
constexpr std::string_view kDelimiterFold = "\r\n\t";
// A word this long cannot be folded within 998 characters once the field name is added, so
// unstructured text carrying one is encoded (encoded words can be cut anywhere).
constexpr size_t kMaxPlainWord = 900;
// Room below which an encoded word is moved to the next line rather than cut tiny: the fixed
// part of a word plus the widest encoding of one character.
constexpr size_t kMinWordPayload = 12;
constexpr std::string_view kAddressSpecials = "()<>@,;:\\\".[]";
constexpr std::string_view kParameterSpecials = "()<>@,;:\\\"/[]?= \t";

bool IsBlank(char c) { return c == ' ' || c == '\t'; }

// A byte that cannot stand in a header as it is.
bool NeedsEncoding(char ch) {
  const auto c = static_cast<uint8_t>(ch);
  return c >= 0x80 || (c < 0x20 && c != '\t') || c == 0x7F;
}

bool TextNeedsEncoding(std::string_view text) {
  for (char c : text) {
    if (NeedsEncoding(c)) return true;
  }
  // Plain text that looks like an encoded word would be decoded by a reader.
  return text.find("=?") != std::string_view::npos;
}

std::string Unescape(std::string_view inner) {
  std::string out;
  for (size_t i = 0; i < inner.size(); ++i) {
    if (inner[i] == '\\' && i + 1 < inner.size()) ++i;
    out.push_back(inner[i]);
  }
  return out;
}

std::string Quote(std::string_view text) {
  std::string out = "\"";
  for (char c : text) {
    if (c == '"' || c == '\\') out.push_back('\\');
    out.push_back(c);
  }
  out.push_back('"');
  return out;
}

enum class UnitKind { kPlain, kQuoted, kComment, kAngle };

struct Unit {
  std::string blanks;  // blanks before the unit in the value
  std::string text;    // the unit as written in the value
  UnitKind kind = UnitKind::kPlain;
  char delimiter = 0;  // delimiter that ends the unit, written after it
  bool encode = false;
  std::string to_encode;  // the text the encoded words carry
};

// End of a quoted string or comment starting at value[pos], past its closing character (or
// the end of the value when it is not closed).
size_t SkipEnclosed(std::string_view value, size_t pos) {
  const char open = value[pos];
  const char close = open == '"' ? '"' : open == '(' ? ')' : '>';
  int depth = 0;
  for (size_t i = pos; i < value.size(); ++i) {
    const char c = value[i];
    if (c == '\\' && open != '<') {
      ++i;
      continue;
    }
    if (i > pos && c == close) {
      if (open != '(' || depth == 1) return i + 1;
      --depth;
    } else if (c == open && open == '(') {
      ++depth;
    } else if (i == pos) {
      depth = 1;
    }
  }
  return value.size();
}

// The text between the opening and the closing character of a quoted string or comment.
std::string_view InnerOf(std::string_view enclosed) {
  const char close = enclosed.front() == '(' ? ')' : '"';
  size_t end = enclosed.size();
  if (end > 1 && enclosed.back() == close) --end;
  return enclosed.substr(1, end - 1);
}

}  // namespace

std::string SanitizeFieldValue(std::string_view value) {
  std::string out(value);
  for (char& c : out) {
    if (c == '\r' || c == '\n' || c == '\0') c = ' ';
  }
  return out;
}

bool CFieldCodeBase::IsDelimiter(char) const { return false; }
char CFieldCodeBase::GetDelimiter() const { return 0; }
char CFieldCodeText::GetDelimiter() const { return kWholeValueDelimiter; }
bool CFieldCodeAddress::IsDelimiter(char ch) const { return ch == ',' || ch == ':'; }
bool CFieldCodeParameter::IsDelimiter(char ch) const { return ch == ';'; }

uint64_t CFieldCodeBase::GetEncodeLength() const { return EncodeToString().size(); }

bool CFieldCodeBase::EncodeTo(MimeSink* sink) const {
  const ByteView in = input();
  const std::string value =
      SanitizeFieldValue(std::string_view(reinterpret_cast<const char*>(in.data()), in.size()));
  const Syntax kind = syntax();

  // ---- Split into units.
  std::vector<Unit> units;
  std::string blanks;
  if (GetDelimiter() == kWholeValueDelimiter) {
    bool encode_all = TextNeedsEncoding(value);
    size_t i = 0;
    while (i < value.size() && !encode_all) {
      size_t start = i;
      while (i < value.size() && !IsBlank(value[i])) ++i;
      if (i - start > kMaxPlainWord) encode_all = true;
      while (i < value.size() && IsBlank(value[i])) ++i;
    }
    if (encode_all) {
      Unit unit;
      unit.encode = true;
      unit.to_encode = value;
      units.push_back(std::move(unit));
    } else {
      for (size_t i = 0; i < value.size();) {
        Unit unit;
        while (i < value.size() && IsBlank(value[i])) unit.blanks.push_back(value[i++]);
        while (i < value.size() && !IsBlank(value[i])) unit.text.push_back(value[i++]);
        units.push_back(std::move(unit));
      }
    }
  } else {
    size_t i = 0;
    while (i < value.size()) {
      if (IsBlank(value[i])) {
        blanks.push_back(value[i++]);
        continue;
      }
      Unit unit;
      unit.blanks = std::move(blanks);
      blanks.clear();
      const char c = value[i];
      if (c == '"' || c == '(' || c == '<') {
        const size_t end = SkipEnclosed(value, i);
        unit.text = value.substr(i, end - i);
        unit.kind = c == '"' ? UnitKind::kQuoted : c == '(' ? UnitKind::kComment : UnitKind::kAngle;
        i = end;
      } else {
        while (i < value.size() && !IsBlank(value[i]) && value[i] != '"' && value[i] != '(' &&
               value[i] != '<' && !IsDelimiter(value[i])) {
          unit.text.push_back(value[i++]);
          // In a parameter list the value after '=' is a unit of its own, so that only the
          // value is encoded.
          if (kind == Syntax::kParameter && unit.text.back() == '=') break;
        }
      }
      if (i < value.size() && IsDelimiter(value[i])) unit.delimiter = value[i++];
      if (unit.text.empty() && unit.delimiter == 0) {
        // A lone character no rule above takes; keep it as text.
        unit.text.push_back(value[i++]);
      }
      switch (unit.kind) {
        case UnitKind::kPlain:
          unit.encode = TextNeedsEncoding(unit.text) &&
                        !(kind == Syntax::kAddress && unit.text.find('@') != std::string::npos);
          unit.to_encode = unit.text;
          break;
        case UnitKind::kQuoted:
        case UnitKind::kComment: {
          std::string inner = Unescape(InnerOf(unit.text));
          unit.encode = TextNeedsEncoding(inner);
          unit.to_encode = std::move(inner);
          break;
        }
        case UnitKind::kAngle:
          break;
      }
      units.push_back(std::move(unit));
    }
    if (!blanks.empty()) {
      Unit unit;
      unit.blanks = std::move(blanks);
      units.push_back(std::move(unit));
    }
    // Adjacent encoded words lose the blanks between them when decoded, so neighbouring
    // units that both need encoding become one run that carries the blanks inside.
    if (kind != Syntax::kParameter) {
      std::vector<Unit> merged;
      for (Unit& unit : units) {
        if (!merged.empty() && unit.encode && merged.back().encode &&
            merged.back().delimiter == 0 && unit.kind != UnitKind::kComment &&
            merged.back().kind != UnitKind::kComment) {
          merged.back().to_encode += unit.blanks + unit.to_encode;
          merged.back().delimiter = unit.delimiter;
          merged.back().kind = UnitKind::kPlain;
          continue;
        }
        merged.push_back(std::move(unit));
      }
      units = std::move(merged);
    }
  }

  // ---- Write with folding.
  const std::string charset = charset_.empty() ? std::string(kCharsetUtf8) : charset_;
  std::string out;
  size_t column = start_column_;
  bool fold_next = false;
  for (size_t u = 0; u < units.size(); ++u) {
    const Unit& unit = units[u];
    const bool first = u == 0;
    std::string sep = first ? " " + unit.blanks : unit.blanks;
    if (fold_next) {
      out += kDelimiterFold;
      column = 1;
      sep.clear();
    }
    fold_next = false;
    const std::string delimiter = unit.delimiter ? std::string(1, unit.delimiter) : "";
    if (unit.encode) {
      std::string prefix, suffix;
      if (unit.kind == UnitKind::kComment) {
        prefix = "(";
        suffix = ")";
      } else if (kind == Syntax::kParameter) {
        prefix = suffix = "\"";
      }
      suffix += delimiter;
      const size_t overhead = prefix.size() + suffix.size();
      const size_t min_room = charset.size() + 7 + kMinWordPayload;
      auto room = [&](size_t used) {
        return kMaxEncodedLineLength > used ? kMaxEncodedLineLength - used : 0;
      };
      size_t first_limit = room(column + sep.size() + overhead);
      if (first_limit < min_room && !sep.empty()) {
        out += kFold;
        column = 0;
        first_limit = room(sep.size() + overhead);
      }
      const std::vector<std::string> words =
          EncodeWords(unit.to_encode, charset, 0, first_limit, room(1 + suffix.size()));
      out += sep;
      out += prefix;
      column += sep.size() + prefix.size();
      for (size_t w = 0; w < words.size(); ++w) {
        const size_t tail = w + 1 == words.size() ? suffix.size() : 0;
        if (w > 0) {
          if (column + 1 + words[w].size() + tail > kMaxEncodedLineLength) {
            out += kFold;
            column = 0;
          }
          out += ' ';
          ++column;
        }
        out += words[w];
        column += words[w].size();
      }
      out += suffix;
      column += suffix.size();
    } else {
      const std::string text = unit.text + delimiter;
      if (!first && !sep.empty() && column > sep.size() &&
          column + sep.size() + text.size() > kMaxEncodedLineLength) {
        out += kFold;
        column = 0;
      }
      out += sep;
      out += text;
      column += sep.size() + text.size();
    }
    fold_next = unit.delimiter != 0 && u + 1 < units.size();
  }
  if (units.empty()) out = " ";
  return sink->Write(out);
}

bool CFieldCodeBase::DecodeTo(MimeSink* sink) const {
  const ByteView in = input();
  const std::string_view value(reinterpret_cast<const char*>(in.data()), in.size());
  const Syntax kind = syntax();
  if (kind == Syntax::kText || kind == Syntax::kOther) {
    return sink->Write(DecodeEncodedWords(value));
  }
  const std::string_view specials =
      kind == Syntax::kAddress ? kAddressSpecials : kParameterSpecials;
  std::string out;
  size_t plain_start = 0;
  auto flush_plain = [&](size_t end) {
    if (end > plain_start) out += HeaderBytesToUtf8(value.substr(plain_start, end - plain_start));
  };
  size_t i = 0;
  while (i < value.size()) {
    const char c = value[i];
    if (c == '"') {
      const size_t end = SkipEnclosed(value, i);
      std::string_view quoted = value.substr(i, end - i);
      if (quoted.find("=?") != std::string_view::npos) {
        flush_plain(i);
        out += Quote(DecodeEncodedWords(Unescape(InnerOf(quoted))));
        plain_start = end;
      }
      i = end;
      continue;
    }
    const size_t length = c == '=' ? MatchEncodedWord(value, i) : 0;
    if (length == 0) {
      ++i;
      continue;
    }
    // A run of encoded words separated by blanks decodes as one piece of text.
    flush_plain(i);
    size_t end = i + length;
    for (;;) {
      size_t next = end;
      while (next < value.size() && IsBlank(value[next])) ++next;
      const size_t more = next < value.size() ? MatchEncodedWord(value, next) : 0;
      if (next == end || more == 0) break;
      end = next + more;
    }
    const std::string decoded = DecodeEncodedWords(value.substr(i, end - i));
    const bool needs_quotes =
        decoded.empty() || decoded.find_first_of(specials) != std::string::npos;
    out += needs_quotes ? Quote(decoded) : decoded;
    i = end;
    plain_start = end;
  }
  flush_plain(value.size());
  return sink->Write(out);
}

}  // namespace tarnwell::render
