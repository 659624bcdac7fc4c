#include "render/mime/mime_header.h"

#include <cstdio>
#include <ctime>
#include <map>
#include <mutex>
#include <random>

#include "base/text.h"
#include "render/mime/mime_encoded_word.h"
#include "render/mime/mime_parser.h"
#include "render/mime/mime_registry.h"

namespace tarnwell::render {
namespace {

constexpr std::string_view kCrLf = "\r\n";
constexpr std::string_view kContentType = "Content-Type";
constexpr std::string_view kBoundaryAttribute = "boundary";
constexpr std::string_view kDefaultMultipart = "multipart/mixed";
constexpr int kBoundaryCounterWrap = 9;
constexpr uint32_t kBoundaryRandomRange = 1000000;
constexpr size_t kBoundaryBufferSize = 80;
constexpr int kFirstUnixYear = 1970;
constexpr int kMinutesPerHour = 60;
constexpr int kSecondsPerMinute = 60;
constexpr const char* kWeekdays[] = {"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
constexpr const char* kMonths[] = {"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                   "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};

bool IsBlank(char c) { return c == ' ' || c == '\t'; }

std::string_view Trim(std::string_view text) {
  while (!text.empty() && IsBlank(text.front())) text.remove_prefix(1);
  while (!text.empty() && IsBlank(text.back())) text.remove_suffix(1);
  return text;
}

// Field names are printable ASCII without ':'; anything else is dropped.
std::string CleanFieldName(std::string_view name) {
  std::string out;
  for (char c : name) {
    if (c > ' ' && c <= '~' && c != ':') out.push_back(c);
  }
  return out;
}

std::string QuoteParameter(std::string_view value) {
  std::string out = "\"";
  for (char c : SanitizeFieldValue(value)) {
    if (c == '"' || c == '\\') out.push_back('\\');
    out.push_back(c);
  }
  out.push_back('"');
  return out;
}

size_t SkipQuoted(std::string_view text, size_t pos) {
  for (size_t i = pos + 1; i < text.size(); ++i) {
    if (text[i] == '\\') {
      ++i;
    } else if (text[i] == '"') {
      return i + 1;
    }
  }
  return text.size();
}

std::string Unquote(std::string_view raw) {
  if (raw.empty() || raw.front() != '"') return std::string(raw);
  std::string out;
  const size_t end = SkipQuoted(raw, 0);
  for (size_t i = 1; i < end; ++i) {
    if (raw[i] == '\\' && i + 1 < end) {
      out.push_back(raw[++i]);
    } else if (raw[i] != '"' || i + 1 != end) {
      out.push_back(raw[i]);
    }
  }
  return out;
}

struct ParameterSpan {
  std::string attribute;
  size_t value_begin = 0;
  size_t value_end = 0;
};

// The parameters after the first ';' of a structured value, with where their values lie.
std::vector<ParameterSpan> FindParameters(std::string_view value) {
  std::vector<ParameterSpan> spans;
  size_t i = 0;
  while (i < value.size() && value[i] != ';') {
    i = value[i] == '"' ? SkipQuoted(value, i) : i + 1;
  }
  while (i < value.size()) {
    ++i;  // the ';'
    const size_t attribute_begin = i;
    while (i < value.size() && value[i] != '=' && value[i] != ';') ++i;
    if (i >= value.size() || value[i] == ';') continue;
    ParameterSpan span;
    span.attribute = std::string(Trim(value.substr(attribute_begin, i - attribute_begin)));
    ++i;
    while (i < value.size() && IsBlank(value[i])) ++i;
    span.value_begin = i;
    if (i < value.size() && value[i] == '"') {
      i = SkipQuoted(value, i);
      span.value_end = i;
    } else {
      while (i < value.size() && value[i] != ';') ++i;
      span.value_end =
          span.value_begin + Trim(value.substr(span.value_begin, i - span.value_begin)).size();
    }
    while (i < value.size() && value[i] != ';') {
      i = value[i] == '"' ? SkipQuoted(value, i) : i + 1;
    }
    spans.push_back(std::move(span));
  }
  return spans;
}

// RFC 2231 "charset'language'%XX..." (with_charset) or "%XX..." to bytes.
std::string PercentDecode(std::string_view text) {
  std::string out;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '%' && i + 2 < text.size() && HexValue(text[i + 1]) >= 0 &&
        HexValue(text[i + 2]) >= 0) {
      out.push_back(static_cast<char>(HexValue(text[i + 1]) * 16 + HexValue(text[i + 2])));
      i += 2;
    } else {
      out.push_back(text[i]);
    }
  }
  return out;
}

}  // namespace

std::string MakeBoundary() {
  static std::mutex mutex;
  static std::mt19937 random(std::random_device{}() ^ static_cast<uint32_t>(std::time(nullptr)));
  static int counter = 0;
  std::lock_guard<std::mutex> lock(mutex);
  ++counter;
  const uint32_t r1 = random() % kBoundaryRandomRange;
  const uint32_t r2 = random() % kBoundaryRandomRange;
  char buffer[kBoundaryBufferSize];
  std::snprintf(buffer, sizeof(buffer), "__=_Part_Boundary_%03d_%06u.%06u", counter, r2, r1);
  if (counter >= kBoundaryCounterWrap) counter = 0;
  return buffer;
}

CMimeHeader::~CMimeHeader() = default;

void CMimeHeader::Clear() { fields_.clear(); }

std::string CMimeHeader::EncodeField(const CMimeFieldEntry& field,
                                     std::string_view inherited_charset) const {
  std::unique_ptr<CFieldCodeBase> coder = CMimeCoderRegistry::CreateFieldCoder(field.name);
  std::string_view charset = field.charset;
  if (charset.empty()) charset = charset_;
  if (charset.empty()) charset = inherited_charset;
  if (charset.empty()) charset = CMimeCoderRegistry::DefaultCharset();
  coder->SetCharset(std::string(charset));
  coder->SetStartColumn(field.name.size() + 1);
  coder->SetInput(std::string_view(field.value));
  std::string line = field.name;
  line += ':';
  line += coder->EncodeToString();
  line += kCrLf;
  return line;
}

bool CMimeHeader::StoreFields(MimeSink* sink, const CMimeFieldEntry* extra,
                              std::string_view inherited_charset) const {
  for (const CMimeFieldEntry& field : fields_) {
    if (!sink->Write(EncodeField(field, inherited_charset))) return false;
  }
  return !extra || sink->Write(EncodeField(*extra, inherited_charset));
}

uint64_t CMimeHeader::FieldsLength(const CMimeFieldEntry* extra,
                                   std::string_view inherited_charset) const {
  uint64_t length = extra ? EncodeField(*extra, inherited_charset).size() : 0;
  for (const CMimeFieldEntry& field : fields_) {
    length += EncodeField(field, inherited_charset).size();
  }
  return length;
}

uint64_t CMimeHeader::GetLength() { return FieldsLength(nullptr, {}) + kCrLf.size(); }

Status CMimeHeader::Store(MimeSink* sink) {
  if (!StoreFields(sink, nullptr, {}) || !sink->Write(kCrLf)) {
    return Status::IoError("the header could not be written");
  }
  return Status::Ok();
}

int64_t CMimeHeader::Store(char* buffer, size_t size) {
  BufferSink sink(buffer, size);
  Status status = Store(&sink);
  if (status.ok()) return static_cast<int64_t>(sink.size());
  return status.code() == Status::Code::kInvalidArgument ? -1 : 0;
}

size_t CMimeHeader::Load(ByteView data) {
  std::vector<RawField> raw;
  const size_t consumed = ParseHeaderBlock(data, &raw);
  for (const RawField& field : raw) {
    std::unique_ptr<CFieldCodeBase> coder = CMimeCoderRegistry::CreateFieldCoder(field.name);
    coder->SetInput(std::string_view(field.value));
    Bytes decoded = coder->DecodeToBytes();
    // Keeping the charset the words were in lets the field be stored again as it came.
    std::string charset = FirstEncodedWordCharset(field.value);
    if (CodePageForCharset(charset) == 0) charset.clear();
    AddField(field.name,
             std::string_view(reinterpret_cast<const char*>(decoded.data()), decoded.size()),
             charset);
  }
  return consumed;
}

CMimeFieldEntry* CMimeHeader::FindField(std::string_view name) {
  for (CMimeFieldEntry& field : fields_) {
    if (EqualsIgnoreAsciiCase(field.name, name)) return &field;
  }
  return nullptr;
}

bool CMimeHeader::SetFieldValue(std::string_view name, std::string_view value,
                                std::string_view charset) {
  const std::string clean_name = CleanFieldName(name);
  if (clean_name.empty()) return false;
  if (CMimeFieldEntry* field = FindField(clean_name)) {
    field->value = SanitizeFieldValue(value);
    field->charset = std::string(charset);
    return true;
  }
  return AddField(clean_name, value, charset);
}

bool CMimeHeader::AddField(std::string_view name, std::string_view value,
                           std::string_view charset) {
  CMimeFieldEntry field;
  field.name = CleanFieldName(name);
  if (field.name.empty()) return false;
  field.value = SanitizeFieldValue(value);
  field.charset = std::string(charset);
  fields_.push_back(std::move(field));
  return true;
}

const std::string* CMimeHeader::GetFieldValue(std::string_view name) const {
  for (const CMimeFieldEntry& field : fields_) {
    if (EqualsIgnoreAsciiCase(field.name, name)) return &field.value;
  }
  return nullptr;
}

bool CMimeHeader::RemoveField(std::string_view name) {
  for (auto it = fields_.begin(); it != fields_.end(); ++it) {
    if (EqualsIgnoreAsciiCase(it->name, name)) {
      fields_.erase(it);
      return true;
    }
  }
  return false;
}

bool CMimeHeader::SetParameter(std::string_view field_name, std::string_view attribute,
                               std::string_view value) {
  CMimeFieldEntry* field = FindField(field_name);
  const std::string clean_attribute = CleanFieldName(attribute);
  if (!field || clean_attribute.empty()) return false;
  const std::string quoted = QuoteParameter(value);
  for (const ParameterSpan& span : FindParameters(field->value)) {
    if (EqualsIgnoreAsciiCase(span.attribute, clean_attribute)) {
      field->value.replace(span.value_begin, span.value_end - span.value_begin, quoted);
      return true;
    }
  }
  field->value += "; ";
  field->value += clean_attribute;
  field->value += '=';
  field->value += quoted;
  return true;
}

std::optional<std::string> CMimeHeader::GetParameter(std::string_view field_name,
                                                     std::string_view attribute) const {
  const std::string* value = GetFieldValue(field_name);
  if (!value) return std::nullopt;
  std::optional<std::string> plain;
  std::optional<std::string> extended;                   // "attribute*"
  std::map<int, std::pair<bool, std::string>> sections;  // "attribute*N" and "attribute*N*"
  for (const ParameterSpan& span : FindParameters(*value)) {
    const std::string raw = Unquote(
        std::string_view(*value).substr(span.value_begin, span.value_end - span.value_begin));
    std::string_view name = span.attribute;
    if (EqualsIgnoreAsciiCase(name, attribute)) {
      if (!plain) plain = raw;
      continue;
    }
    if (name.size() <= attribute.size() || name[attribute.size()] != '*' ||
        !EqualsIgnoreAsciiCase(name.substr(0, attribute.size()), attribute)) {
      continue;
    }
    std::string_view rest = name.substr(attribute.size() + 1);
    if (rest.empty()) {
      extended = raw;
      continue;
    }
    const bool encoded = rest.back() == '*';
    if (encoded) rest.remove_suffix(1);
    int index = 0;
    bool digits = !rest.empty() && rest.size() <= 4;
    for (char c : digits ? rest : std::string_view()) {
      if (c < '0' || c > '9') {
        digits = false;
        break;  // not a section number: no arithmetic on it
      }
      index = index * 10 + (c - '0');
    }
    if (digits) sections.emplace(index, std::make_pair(encoded, raw));
  }
  auto decode_extended = [](std::string_view text, std::string* charset) {
    const size_t first = text.find('\'');
    const size_t second = first == std::string_view::npos ? first : text.find('\'', first + 1);
    if (second == std::string_view::npos) return PercentDecode(text);
    *charset = std::string(text.substr(0, first));
    return PercentDecode(text.substr(second + 1));
  };
  std::string charset;
  if (extended) return CharsetBytesToUtf8(decode_extended(*extended, &charset), charset);
  if (!sections.empty() && sections.begin()->first == 0) {
    std::string bytes;
    int expected = 0;
    for (const auto& [index, section] : sections) {
      if (index != expected++) break;
      if (!section.first) {
        bytes += section.second;
      } else if (index == 0) {
        bytes += decode_extended(section.second, &charset);
      } else {
        bytes += PercentDecode(section.second);
      }
    }
    return CharsetBytesToUtf8(bytes, charset);
  }
  return plain;
}

bool CMimeHeader::SetDate(int year, int month, int day, int hour, int minute, int second) {
  if (year < kFirstUnixYear) return false;
  std::tm local{};
  local.tm_year = year - 1900;
  local.tm_mon = month - 1;
  local.tm_mday = day;
  local.tm_hour = hour;
  local.tm_min = minute;
  local.tm_sec = second;
  local.tm_isdst = -1;  // let the conversion decide
  const std::time_t when = std::mktime(&local);
  if (when == static_cast<std::time_t>(-1) || when < 0) return false;
  std::tm normal{};
  if (!localtime_r(&when, &normal)) return false;
  // The zone is the plain difference between local time and UTC at that moment, daylight
  // saving included; whole minutes (old local mean time offsets carry seconds).
  const long offset_minutes = normal.tm_gmtoff / kSecondsPerMinute;
  const long magnitude = offset_minutes < 0 ? -offset_minutes : offset_minutes;
  char buffer[64];
  std::snprintf(buffer, sizeof(buffer), "%s, %d %s %d %02d:%02d:%02d %c%02ld%02ld",
                kWeekdays[normal.tm_wday], normal.tm_mday, kMonths[normal.tm_mon],
                normal.tm_year + 1900, normal.tm_hour, normal.tm_min, normal.tm_sec,
                offset_minutes < 0 ? '-' : '+', magnitude / kMinutesPerHour,
                magnitude % kMinutesPerHour);
  return SetFieldValue("Date", buffer);
}

std::string CMimeHeader::GetMainType() const {
  const std::string* value = GetFieldValue(kContentType);
  if (!value) return std::string(MediaTypeName(kMediaText));
  std::string_view type = *value;
  type = type.substr(0, std::min(type.find(';'), type.find('/')));
  return AsciiLower(Trim(type));
}

std::string CMimeHeader::GetSubType() const {
  const std::string* value = GetFieldValue(kContentType);
  if (!value) return "plain";
  std::string_view type = *value;
  type = type.substr(0, type.find(';'));
  const size_t slash = type.find('/');
  if (slash == std::string_view::npos) return {};
  return AsciiLower(Trim(type.substr(slash + 1)));
}

int CMimeHeader::GetMediaType() const { return MediaTypeFromName(GetMainType()); }

void CMimeHeader::SetBoundary() {
  if (!GetFieldValue(kContentType) || GetMediaType() != kMediaMultipart) {
    SetFieldValue(kContentType, kDefaultMultipart);
  }
  SetParameter(kContentType, kBoundaryAttribute, MakeBoundary());
}

std::string CMimeHeader::GetBoundary() const {
  return GetParameter(kContentType, kBoundaryAttribute).value_or(std::string());
}

}  // namespace tarnwell::render
