#include "render/mime/mime_encoded_word.h"

#include <algorithm>

#include "base/text.h"

namespace tarnwell::render {
namespace {

struct CharsetName {
  uint32_t codepage;
  const char* name;  // the name written; the first entry of a code page wins
};

// Names as mail programs write them. Several names may map to one code page when reading.
constexpr CharsetName kCharsetNames[] = {
    {65001, "utf-8"},       {65001, "utf8"},         {20127, "us-ascii"},    {20127, "ascii"},
    {1250, "windows-1250"}, {1251, "windows-1251"},  {1252, "windows-1252"}, {1253, "windows-1253"},
    {1254, "windows-1254"}, {1255, "windows-1255"},  {1256, "windows-1256"}, {1257, "windows-1257"},
    {1258, "windows-1258"}, {874, "windows-874"},    {874, "tis-620"},       {932, "shift_jis"},
    {932, "shift-jis"},     {932, "sjis"},           {932, "windows-31j"},   {936, "gb2312"},
    {936, "gbk"},           {949, "ks_c_5601-1987"}, {949, "cp949"},         {950, "big5"},
    {20866, "koi8-r"},      {21866, "koi8-u"},       {28591, "iso-8859-1"},  {28591, "latin1"},
    {28592, "iso-8859-2"},  {28593, "iso-8859-3"},   {28594, "iso-8859-4"},  {28595, "iso-8859-5"},
    {28596, "iso-8859-6"},  {28597, "iso-8859-7"},   {28598, "iso-8859-8"},  {28599, "iso-8859-9"},
    {28603, "iso-8859-13"}, {28605, "iso-8859-15"},  {50220, "iso-2022-jp"}, {51932, "euc-jp"},
    {51949, "euc-kr"},      {54936, "gb18030"},
};

constexpr std::string_view kWordStart = "=?";
constexpr std::string_view kWordEnd = "?=";
constexpr char kWordSeparator = '?';
// "=?" charset "?X?" ... "?="
constexpr size_t kWordFixedOverhead = 7;
constexpr size_t kBase64GroupBytes = 3;
constexpr size_t kBase64GroupChars = 4;
constexpr size_t kQEscapeWidth = 3;

bool IsQLiteral(uint8_t c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '!' ||
         c == '*' || c == '+' || c == '-' || c == '/';
}

bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; }

// Text in the target charset with the offsets where its characters start.
struct CharsetText {
  std::string bytes;
  std::vector<size_t> starts;  // one per character, plus bytes.size() at the end
};

CharsetText ConvertForWords(std::string_view utf8_text, uint32_t codepage) {
  const std::string text = ToValidUtf8(utf8_text);
  CharsetText out;
  std::vector<size_t> utf8_starts;
  for (size_t pos = 0; pos < text.size();) {
    utf8_starts.push_back(pos);
    DecodeUtf8(text, &pos);
  }
  utf8_starts.push_back(text.size());
  if (codepage == kCodePageUtf8) {
    out.bytes = text;
    out.starts = std::move(utf8_starts);
    return out;
  }
  // Single-byte code pages convert one character to one byte; only multi-byte ones need the
  // slower character-by-character conversion.
  out.bytes = Utf8ToCodePage(text, codepage);
  const size_t chars = utf8_starts.size() - 1;
  if (out.bytes.size() == chars) {
    for (size_t i = 0; i <= chars; ++i) out.starts.push_back(i);
    return out;
  }
  out.bytes.clear();
  for (size_t i = 0; i < chars; ++i) {
    out.starts.push_back(out.bytes.size());
    out.bytes += Utf8ToCodePage(
        std::string_view(text).substr(utf8_starts[i], utf8_starts[i + 1] - utf8_starts[i]),
        codepage);
  }
  out.starts.push_back(out.bytes.size());
  return out;
}

void AppendQ(std::string_view bytes, std::string* out) {
  for (char ch : bytes) {
    const auto c = static_cast<uint8_t>(ch);
    if (IsQLiteral(c)) {
      out->push_back(ch);
    } else {
      out->push_back('=');
      out->push_back(kHexDigits[c >> 4]);
      out->push_back(kHexDigits[c & 0x0F]);
    }
  }
}

std::string BytesToUtf8(std::string_view bytes, uint32_t codepage) {
  if (codepage == 0 || codepage == kCodePageUtf8 || codepage == 20127) {
    if (IsValidUtf8(bytes)) return std::string(bytes);
    if (codepage == kCodePageUtf8) return ToValidUtf8(bytes);
    codepage = kDefaultCodePage;
  }
  return CodePageToUtf8(ByteView(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size()),
                        codepage);
}

}  // namespace

uint32_t CodePageForCharset(std::string_view charset) {
  for (const CharsetName& entry : kCharsetNames) {
    if (EqualsIgnoreAsciiCase(charset, entry.name)) return entry.codepage;
  }
  // "windows-NNNN" and "cpNNNN" for code pages without a listed name.
  std::string lower = AsciiLower(charset);
  for (std::string_view prefix : {std::string_view("windows-"), std::string_view("cp")}) {
    if (lower.size() > prefix.size() && lower.compare(0, prefix.size(), prefix) == 0) {
      uint32_t number = 0;
      for (size_t i = prefix.size(); i < lower.size(); ++i) {
        if (lower[i] < '0' || lower[i] > '9' || number > 100000) return 0;
        number = number * 10 + (lower[i] - '0');
      }
      return number;
    }
  }
  return 0;
}

std::string CharsetForCodePage(uint32_t codepage) {
  for (const CharsetName& entry : kCharsetNames) {
    if (entry.codepage == codepage) return entry.name;
  }
  return CharsetForCodePage(kDefaultCodePage);
}

char ChooseWordEncoding(ByteView bytes) {
  size_t escaped = 0;
  for (size_t i = 0; i < bytes.size(); ++i) {
    if (!IsQLiteral(bytes[i])) ++escaped;
  }
  const size_t length = bytes.size();
  const bool q = length + 2 * escaped <= kBase64GroupChars * ((length + 2) / kBase64GroupBytes) ||
                 5 * escaped <= length;
  return q ? 'Q' : 'B';
}

std::vector<std::string> EncodeWords(std::string_view text, std::string_view charset_in,
                                     char letter, size_t first_limit, size_t limit) {
  std::string charset(charset_in);
  uint32_t codepage = CodePageForCharset(charset);
  if (codepage == 0 || charset.empty()) {
    charset = kCharsetUtf8;
    codepage = kCodePageUtf8;
  }
  const CharsetText converted = ConvertForWords(text, codepage);
  const std::string& bytes = converted.bytes;
  if (letter != 'B' && letter != 'Q') {
    letter =
        ChooseWordEncoding(ByteView(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size()));
  }
  const size_t overhead = kWordFixedOverhead + charset.size();
  const size_t chars = converted.starts.size() - 1;

  std::vector<std::string> words;
  size_t next = 0;
  while (next < chars) {
    size_t word_limit = std::min(words.empty() ? first_limit : limit, kMaxEncodedWordLength);
    const size_t budget = word_limit > overhead ? word_limit - overhead : 0;
    // Take whole characters while the encoded text fits the budget; always at least one.
    size_t end = next;
    size_t q_length = 0;
    while (end < chars) {
      const size_t from = converted.starts[end];
      const size_t to = converted.starts[end + 1];
      size_t encoded;
      if (letter == 'B') {
        encoded = kBase64GroupChars * ((to - converted.starts[next] + 2) / kBase64GroupBytes);
      } else {
        size_t add = 0;
        for (size_t i = from; i < to; ++i) {
          add += IsQLiteral(static_cast<uint8_t>(bytes[i])) ? 1 : kQEscapeWidth;
        }
        encoded = q_length + add;
      }
      if (encoded > budget && end > next) break;
      if (letter == 'Q') q_length = encoded;
      ++end;
    }
    std::string_view piece = std::string_view(bytes).substr(
        converted.starts[next], converted.starts[end] - converted.starts[next]);
    std::string word(kWordStart);
    word += charset;
    word += kWordSeparator;
    word += letter;
    word += kWordSeparator;
    if (letter == 'B') {
      word += Base64Encode(ByteView(reinterpret_cast<const uint8_t*>(piece.data()), piece.size()));
    } else {
      AppendQ(piece, &word);
    }
    word += kWordEnd;
    words.push_back(std::move(word));
    next = end;
  }
  return words;
}

size_t MatchEncodedWord(std::string_view text, size_t pos) {
  if (text.compare(pos, kWordStart.size(), kWordStart) != 0) return 0;
  size_t i = pos + kWordStart.size();
  const size_t charset_start = i;
  while (i < text.size() && text[i] != kWordSeparator && !IsBlank(text[i])) ++i;
  if (i == charset_start || i + 2 >= text.size() || text[i] != kWordSeparator) return 0;
  const char letter = text[i + 1];
  if (letter != 'B' && letter != 'b' && letter != 'Q' && letter != 'q') return 0;
  if (text[i + 2] != kWordSeparator) return 0;
  i += 3;
  while (i < text.size() && text[i] != kWordSeparator && !IsBlank(text[i])) ++i;
  if (text.compare(i, kWordEnd.size(), kWordEnd) != 0) return 0;
  return i + kWordEnd.size() - pos;
}

bool DecodeEncodedWord(std::string_view word, std::string* utf8) {
  if (MatchEncodedWord(word, 0) != word.size()) return false;
  const size_t charset_end = word.find(kWordSeparator, kWordStart.size());
  std::string_view charset = word.substr(kWordStart.size(), charset_end - kWordStart.size());
  // RFC 2231 lets a language follow the charset: "utf-8*en".
  charset = charset.substr(0, charset.find('*'));
  const char letter = word[charset_end + 1];
  std::string_view payload =
      word.substr(charset_end + 3, word.size() - charset_end - 3 - kWordEnd.size());
  std::string bytes;
  if (letter == 'B' || letter == 'b') {
    Bytes decoded = Base64Decode(payload);
    bytes.assign(decoded.begin(), decoded.end());
  } else {
    for (size_t i = 0; i < payload.size(); ++i) {
      const char c = payload[i];
      if (c == '_') {
        bytes.push_back(' ');
      } else if (c == '=' && i + 2 < payload.size() && HexValue(payload[i + 1]) >= 0 &&
                 HexValue(payload[i + 2]) >= 0) {
        bytes.push_back(
            static_cast<char>(HexValue(payload[i + 1]) * 16 + HexValue(payload[i + 2])));
        i += 2;
      } else {
        bytes.push_back(c);
      }
    }
  }
  *utf8 = BytesToUtf8(bytes, CodePageForCharset(charset));
  return true;
}

std::string FirstEncodedWordCharset(std::string_view text) {
  for (size_t pos = text.find(kWordStart); pos != std::string_view::npos;
       pos = text.find(kWordStart, pos + 1)) {
    if (MatchEncodedWord(text, pos) == 0) continue;
    const size_t start = pos + kWordStart.size();
    std::string_view charset = text.substr(start, text.find(kWordSeparator, start) - start);
    return std::string(charset.substr(0, charset.find('*')));
  }
  return {};
}

std::string HeaderBytesToUtf8(std::string_view text) { return BytesToUtf8(text, 0); }

std::string CharsetBytesToUtf8(std::string_view bytes, std::string_view charset) {
  return BytesToUtf8(bytes, CodePageForCharset(charset));
}

std::string DecodeEncodedWords(std::string_view text) {
  std::string out;
  std::string pending_blanks;  // blanks after a word, dropped if another word follows
  bool after_word = false;
  size_t plain_start = 0;
  auto flush_plain = [&](size_t end) {
    if (end > plain_start) out += HeaderBytesToUtf8(text.substr(plain_start, end - plain_start));
  };
  size_t i = 0;
  while (i < text.size()) {
    const size_t length = text[i] == '=' ? MatchEncodedWord(text, i) : 0;
    if (length == 0) {
      if (after_word && IsBlank(text[i])) {
        ++i;
        continue;
      }
      if (after_word) {
        // Not another word: the blanks after the previous one are real text.
        out.append(text.substr(plain_start, i - plain_start));
        plain_start = i;
        after_word = false;
      }
      ++i;
      continue;
    }
    if (!after_word) flush_plain(i);
    std::string decoded;
    DecodeEncodedWord(text.substr(i, length), &decoded);
    out += decoded;
    i += length;
    plain_start = i;
    after_word = true;
  }
  flush_plain(text.size());
  return out;
}

uint64_t CMimeEncodedWord::GetEncodeLength() const { return EncodeToString().size(); }

bool CMimeEncodedWord::EncodeTo(MimeSink* sink) const {
  const ByteView in = input();
  std::vector<std::string> words = EncodeWords(
      std::string_view(reinterpret_cast<const char*>(in.data()), in.size()), charset_, letter_);
  for (size_t i = 0; i < words.size(); ++i) {
    if (i > 0 && !sink->Write(" ", 1)) return false;
    if (!sink->Write(words[i])) return false;
  }
  return sink->ok();
}

bool CMimeEncodedWord::DecodeTo(MimeSink* sink) const {
  const ByteView in = input();
  return sink->Write(
      DecodeEncodedWords(std::string_view(reinterpret_cast<const char*>(in.data()), in.size())));
}

}  // namespace tarnwell::render
