#include "base/text.h"

#include <iconv.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <vector>

namespace tarnwell {
namespace {

constexpr char16_t kHighSurrogateFirst = 0xD800;
constexpr char16_t kLowSurrogateFirst = 0xDC00;
constexpr char16_t kLowSurrogateLast = 0xDFFF;
constexpr char32_t kSupplementaryFirst = 0x10000;
constexpr char32_t kMaxCodePoint = 0x10FFFF;
constexpr char kReplacementUtf8[] = "\xEF\xBF\xBD";

bool IsHighSurrogate(char32_t u) { return u >= kHighSurrogateFirst && u < kLowSurrogateFirst; }
bool IsLowSurrogate(char32_t u) { return u >= kLowSurrogateFirst && u <= kLowSurrogateLast; }

// Shared by the byte and the char16_t front ends; unit(i) returns the i-th code unit.
template <typename UnitAt>
std::string Utf16UnitsToUtf8(size_t count, UnitAt unit, NulHandling nul) {
  // Written into a buffer sized for the worst case (3 bytes a unit; a pair
  // of units makes 4), then cut to length: no growth checks per byte.
  constexpr size_t kMaxBytesPerUnit = 3;
  std::string out(count * kMaxBytesPerUnit, '\0');
  char* o = out.data();
  for (size_t i = 0; i < count; ++i) {
    char32_t u = unit(i);
    if (u < 0x80) {
      if (u == 0 && nul == NulHandling::kStopAtFirst) break;
      *o++ = char(u);
      continue;
    }
    if (IsHighSurrogate(u) && i + 1 < count && IsLowSurrogate(unit(i + 1))) {
      char32_t low = unit(++i);
      u = kSupplementaryFirst + ((u - kHighSurrogateFirst) << 10) + (low - kLowSurrogateFirst);
    }
    if (u >= kHighSurrogateFirst && u <= kLowSurrogateLast) u = kReplacementChar;  // unpaired
    if (u < 0x800) {
      *o++ = char(0xC0 | (u >> 6));
      *o++ = char(0x80 | (u & 0x3F));
    } else if (u < kSupplementaryFirst) {
      *o++ = char(0xE0 | (u >> 12));
      *o++ = char(0x80 | ((u >> 6) & 0x3F));
      *o++ = char(0x80 | (u & 0x3F));
    } else {
      *o++ = char(0xF0 | (u >> 18));
      *o++ = char(0x80 | ((u >> 12) & 0x3F));
      *o++ = char(0x80 | ((u >> 6) & 0x3F));
      *o++ = char(0x80 | (u & 0x3F));
    }
  }
  out.resize(size_t(o - out.data()));
  return out;
}

template <typename Sink>
void ForEachUtf16Unit(std::string_view text, Sink sink) {
  size_t pos = 0;
  while (pos < text.size()) {
    char32_t cp = DecodeUtf8(text, &pos);
    if (cp >= kSupplementaryFirst) {
      cp -= kSupplementaryFirst;
      sink(char16_t(kHighSurrogateFirst + (cp >> 10)));
      sink(char16_t(kLowSurrogateFirst + (cp & 0x3FF)));
    } else {
      sink(char16_t(cp));
    }
  }
}

// ---- iconv

struct CodePageName {
  uint32_t codepage;
  const char* iconv_name;
};

constexpr CodePageName kCodePageNames[] = {
    {874, "CP874"},         {932, "CP932"},           {936, "CP936"},
    {949, "CP949"},         {950, "CP950"},           {kCodePageUtf16LE, "UTF-16LE"},
    {1250, "WINDOWS-1250"}, {1251, "WINDOWS-1251"},   {1252, "WINDOWS-1252"},
    {1253, "WINDOWS-1253"}, {1254, "WINDOWS-1254"},   {1255, "WINDOWS-1255"},
    {1256, "WINDOWS-1256"}, {1257, "WINDOWS-1257"},   {1258, "WINDOWS-1258"},
    {20127, "ASCII"},       {20866, "KOI8-R"},        {21866, "KOI8-U"},
    {28591, "ISO-8859-1"},  {28592, "ISO-8859-2"},    {28593, "ISO-8859-3"},
    {28594, "ISO-8859-4"},  {28595, "ISO-8859-5"},    {28596, "ISO-8859-6"},
    {28597, "ISO-8859-7"},  {28598, "ISO-8859-8"},    {28599, "ISO-8859-9"},
    {28603, "ISO-8859-13"}, {28605, "ISO-8859-15"},   {50220, "ISO-2022-JP"},
    {51932, "EUC-JP"},      {51949, "EUC-KR"},        {54936, "GB18030"},
    {65000, "UTF-7"},       {kCodePageUtf8, "UTF-8"},
};
constexpr const char kFallbackCharset[] = "WINDOWS-1252";
constexpr const char kUtf8Charset[] = "UTF-8";

const iconv_t kNoConverter = reinterpret_cast<iconv_t>(-1);

// Opening a converter costs a lookup under glibc's lock, so each thread keeps the few it
// used last. A thread never uses one handle for two conversions at once, which is all iconv
// asks for; the handles are closed when the thread exits.
class ConverterCache {
 public:
  ConverterCache() = default;
  ConverterCache(const ConverterCache&) = delete;
  ConverterCache& operator=(const ConverterCache&) = delete;
  ~ConverterCache() {
    for (Entry& e : entries_) Close(e.cd);
  }

  // A converter from `from` to `to`, or kNoConverter when iconv lacks one of them.
  iconv_t Get(const char* to, const char* from) {
    for (Entry& e : entries_) {
      if (e.to == to && e.from == from) return e.cd;
    }
    if (entries_.size() >= kMaxEntries) {
      Close(entries_.front().cd);
      entries_.erase(entries_.begin());
    }
    entries_.push_back({to, from, iconv_open(to, from)});
    return entries_.back().cd;
  }

 private:
  static constexpr size_t kMaxEntries = 8;
  struct Entry {
    std::string to;
    std::string from;
    iconv_t cd;
  };
  static void Close(iconv_t cd) {
    if (cd != kNoConverter) iconv_close(cd);
  }
  std::vector<Entry> entries_;
};

ConverterCache& ThreadConverters() {
  thread_local ConverterCache cache;
  return cache;
}

// A converter for the code page in the given direction, falling back to windows-1252 when
// iconv does not know the code page's name.
iconv_t ConverterFor(uint32_t codepage, bool to_utf8) {
  ConverterCache& cache = ThreadConverters();
  const char* name = IconvNameForCodePage(codepage);
  iconv_t cd = to_utf8 ? cache.Get(kUtf8Charset, name) : cache.Get(name, kUtf8Charset);
  if (cd != kNoConverter || std::strcmp(name, kFallbackCharset) == 0) return cd;
  return to_utf8 ? cache.Get(kUtf8Charset, kFallbackCharset)
                 : cache.Get(kFallbackCharset, kUtf8Charset);
}

// Appends what iconv makes of [*in, *in + *in_left) to *out, growing it as needed; with in
// == nullptr it writes the sequence that returns a stateful encoding to its initial state.
// Returns 0 when everything was converted, else the errno iconv stopped with (EILSEQ: *in
// points at input it cannot convert; EINVAL: the input ends inside a sequence).
int Pump(iconv_t cd, const char** in, size_t* in_left, std::string* out) {
  constexpr size_t kMinRoom = 32;
  constexpr size_t kBytesPerInputByte = 4;  // enough for every pair above; E2BIG covers the rest
  for (;;) {
    size_t used = out->size();
    size_t pending = in ? *in_left : 0;
    out->resize(used + pending * kBytesPerInputByte + kMinRoom);
    char* out_ptr = out->data() + used;
    size_t out_left = out->size() - used;
    size_t result = in ? iconv(cd, const_cast<char**>(in), in_left, &out_ptr, &out_left)
                       : iconv(cd, nullptr, nullptr, &out_ptr, &out_left);
    int error = errno;
    out->resize(out_ptr - out->data());
    if (result != static_cast<size_t>(-1)) return 0;
    if (error != E2BIG) return error;
  }
}

}  // namespace

// ---- UTF-16 <-> UTF-8

std::string Utf16LEToUtf8(ByteView bytes, NulHandling nul) {
  const uint8_t* p = bytes.data();
  return Utf16UnitsToUtf8(
      bytes.size() / 2, [p](size_t i) { return char32_t(LoadU16LE(p + 2 * i)); }, nul);
}

std::string Utf16ToUtf8(std::u16string_view text, NulHandling nul) {
  return Utf16UnitsToUtf8(
      text.size(), [text](size_t i) { return char32_t(text[i]); }, nul);
}

std::u16string Utf8ToUtf16(std::string_view text) {
  std::u16string out;
  out.reserve(text.size());
  ForEachUtf16Unit(text, [&out](char16_t u) { out.push_back(u); });
  return out;
}

Bytes Utf8ToUtf16LE(std::string_view text) {
  Bytes out;
  out.reserve(text.size() * 2);
  ForEachUtf16Unit(text, [&out](char16_t u) {
    out.push_back(uint8_t(u));
    out.push_back(uint8_t(u >> 8));
  });
  return out;
}

size_t Utf16Length(std::string_view text) {
  size_t count = 0;
  ForEachUtf16Unit(text, [&count](char16_t) { ++count; });
  return count;
}

// ---- UTF-8 building blocks

char32_t DecodeUtf8(std::string_view text, size_t* pos) {
  const uint8_t lead = uint8_t(text[*pos]);
  ++*pos;
  if (lead < 0x80) return lead;
  // The ranges of well-formed sequences (Unicode table 3-7): the second byte's range depends
  // on the lead byte, which is what rules out overlong forms, surrogates and values past
  // U+10FFFF.
  int trail_count;
  char32_t cp;
  uint8_t second_low = 0x80;
  uint8_t second_high = 0xBF;
  if (lead >= 0xC2 && lead <= 0xDF) {
    trail_count = 1;
    cp = lead & 0x1F;
  } else if (lead >= 0xE0 && lead <= 0xEF) {
    trail_count = 2;
    cp = lead & 0x0F;
    if (lead == 0xE0) second_low = 0xA0;
    if (lead == 0xED) second_high = 0x9F;
  } else if (lead >= 0xF0 && lead <= 0xF4) {
    trail_count = 3;
    cp = lead & 0x07;
    if (lead == 0xF0) second_low = 0x90;
    if (lead == 0xF4) second_high = 0x8F;
  } else {
    return kReplacementChar;
  }
  uint8_t low = second_low;
  uint8_t high = second_high;
  for (int i = 0; i < trail_count; ++i) {
    if (*pos >= text.size()) return kReplacementChar;
    const uint8_t b = uint8_t(text[*pos]);
    if (b < low || b > high) return kReplacementChar;  // b starts the next sequence
    cp = (cp << 6) | (b & 0x3F);
    ++*pos;
    low = 0x80;
    high = 0xBF;
  }
  return cp;
}

void AppendUtf8(char32_t cp, std::string* out) {
  if (cp > kMaxCodePoint || (cp >= kHighSurrogateFirst && cp <= kLowSurrogateLast)) {
    cp = kReplacementChar;
  }
  if (cp < 0x80) {
    out->push_back(char(cp));
  } else if (cp < 0x800) {
    out->push_back(char(0xC0 | (cp >> 6)));
    out->push_back(char(0x80 | (cp & 0x3F)));
  } else if (cp < kSupplementaryFirst) {
    out->push_back(char(0xE0 | (cp >> 12)));
    out->push_back(char(0x80 | ((cp >> 6) & 0x3F)));
    out->push_back(char(0x80 | (cp & 0x3F)));
  } else {
    out->push_back(char(0xF0 | (cp >> 18)));
    out->push_back(char(0x80 | ((cp >> 12) & 0x3F)));
    out->push_back(char(0x80 | ((cp >> 6) & 0x3F)));
    out->push_back(char(0x80 | (cp & 0x3F)));
  }
}

bool IsValidUtf8(std::string_view text) {
  size_t pos = 0;
  while (pos < text.size()) {
    const size_t start = pos;
    if (DecodeUtf8(text, &pos) == kReplacementChar &&
        text.substr(start, pos - start) != kReplacementUtf8) {
      return false;
    }
  }
  return true;
}

std::string ToValidUtf8(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  size_t pos = 0;
  while (pos < text.size()) AppendUtf8(DecodeUtf8(text, &pos), &out);
  return out;
}

std::string_view TruncateUtf8(std::string_view text, size_t max_bytes) {
  if (text.size() <= max_bytes) return text;
  size_t end = max_bytes;
  // Back off over continuation bytes to the lead byte of the cut sequence, which then starts
  // the part that is dropped.
  while (end > 0 && (uint8_t(text[end]) & 0xC0) == 0x80) --end;
  return text.substr(0, end);
}

// ---- Code pages

const char* IconvNameForCodePage(uint32_t codepage) {
  for (const CodePageName& entry : kCodePageNames) {
    if (entry.codepage == codepage) return entry.iconv_name;
  }
  return kFallbackCharset;
}

std::string CodePageToUtf8(ByteView bytes, uint32_t codepage) {
  if (codepage == kCodePageUtf8) {
    return ToValidUtf8({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
  }
  if (codepage == kCodePageUtf16LE) return Utf16LEToUtf8(bytes);

  std::string out;
  const char* in = reinterpret_cast<const char*>(bytes.data());
  size_t in_left = bytes.size();
  iconv_t cd = ConverterFor(codepage, /*to_utf8=*/true);
  if (cd == kNoConverter) {
    // No iconv at all (a system without gconv modules): keep ASCII, mark the rest.
    for (size_t i = 0; i < in_left; ++i) {
      if (uint8_t(in[i]) < 0x80) {
        out.push_back(in[i]);
      } else {
        out += kReplacementUtf8;
      }
    }
    return out;
  }
  out.reserve(in_left);
  iconv(cd, nullptr, nullptr, nullptr, nullptr);  // a cached handle may hold a shift state
  while (in_left > 0) {
    int error = Pump(cd, &in, &in_left, &out);
    if (error == 0) break;
    out += kReplacementUtf8;
    if (error != EILSEQ) break;  // EINVAL: the input ends inside a sequence
    ++in;
    --in_left;
  }
  // Some decoders hold back the last character to see whether a combining mark follows
  // (windows-1258); without this the text would lose its end.
  Pump(cd, nullptr, nullptr, &out);
  return out;
}

std::string Utf8ToCodePage(std::string_view text, uint32_t codepage) {
  std::string valid;
  if (!IsValidUtf8(text)) {
    valid = ToValidUtf8(text);
    text = valid;
  }
  if (codepage == kCodePageUtf8) return std::string(text);
  if (codepage == kCodePageUtf16LE) {
    Bytes units = Utf8ToUtf16LE(text);
    return std::string(units.begin(), units.end());
  }

  std::string out;
  iconv_t cd = ConverterFor(codepage, /*to_utf8=*/false);
  if (cd == kNoConverter) {
    size_t pos = 0;
    while (pos < text.size()) {
      char32_t cp = DecodeUtf8(text, &pos);
      out.push_back(cp < 0x80 ? char(cp) : '?');
    }
    return out;
  }
  out.reserve(text.size());
  iconv(cd, nullptr, nullptr, nullptr, nullptr);
  const char* in = text.data();
  size_t in_left = text.size();
  while (in_left > 0) {
    int error = Pump(cd, &in, &in_left, &out);
    if (error != EILSEQ) break;  // 0, or EINVAL which valid UTF-8 cannot cause
    // The '?' goes through the converter too, so that a stateful encoding (ISO-2022-JP,
    // UTF-7) first returns to ASCII.
    const char* question = "?";
    size_t question_left = 1;
    if (Pump(cd, &question, &question_left, &out) != 0) out.push_back('?');
    size_t skip = 0;
    DecodeUtf8(std::string_view(in, in_left), &skip);
    in += skip;
    in_left -= skip;
  }
  Pump(cd, nullptr, nullptr, &out);
  return out;
}

// ---- Small helpers

std::string AsciiLower(std::string_view text) {
  std::string out(text);
  for (char& c : out) {
    if (c >= 'A' && c <= 'Z') c = char(c - 'A' + 'a');
  }
  return out;
}

bool EqualsIgnoreAsciiCase(std::string_view a, std::string_view b) {
  if (a.size() != b.size()) return false;
  for (size_t i = 0; i < a.size(); ++i) {
    char x = a[i];
    char y = b[i];
    if (x >= 'A' && x <= 'Z') x = char(x - 'A' + 'a');
    if (y >= 'A' && y <= 'Z') y = char(y - 'A' + 'a');
    if (x != y) return false;
  }
  return true;
}

std::string_view TrimNul(std::string_view text) {
  size_t nul = text.find('\0');
  return nul == std::string_view::npos ? text : text.substr(0, nul);
}

ByteView TrimNul(ByteView bytes) {
  const uint8_t* end = std::find(bytes.data(), bytes.data() + bytes.size(), uint8_t{0});
  return bytes.Sub(0, size_t(end - bytes.data()));
}

}  // namespace tarnwell
