#include "mapi/import/vcard_import.h"

#include <algorithm>
#include <climits>
#include <ctime>
#include <map>
#include <optional>

#include "base/date_time.h"
#include "base/text.h"
#include "mapi/import/internet_message_import.h"
#include "mapi/property_tags.h"
#include "render/mime/mime_codes.h"
#include "render/mime/mime_encoded_word.h"

namespace tarnwell::mapi {
namespace {

constexpr std::string_view kContactClass = "IPM.Contact";
constexpr std::string_view kSmtp = "SMTP";
constexpr std::string_view kPictureStem = "ContactPicture";
constexpr std::string_view kLineBreak = "\r\n";
constexpr int kTmYearBase = 1900;

// The vCard 2.1 parameters that may stand without "NAME=".
constexpr std::string_view kBareEncodings[] = {"QUOTED-PRINTABLE", "BASE64", "8BIT", "7BIT", "B"};

bool StartsWithIgnoreCase(std::string_view text, std::string_view prefix) {
  return text.size() >= prefix.size() &&
         EqualsIgnoreAsciiCase(text.substr(0, prefix.size()), prefix);
}

std::string AsciiUpper(std::string_view text) {
  std::string out(text);
  for (char& c : out) {
    if (c >= 'a' && c <= 'z') c = char(c - 'a' + 'A');
  }
  return out;
}

std::string_view ToView(const Bytes& b) {
  return std::string_view(reinterpret_cast<const char*>(b.data()), b.size());
}

// Splits at `separator` outside double quotes.
std::vector<std::string_view> SplitOutsideQuotes(std::string_view text, char separator) {
  std::vector<std::string_view> out;
  bool quoted = false;
  size_t start = 0;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '"') quoted = !quoted;
    if (text[i] == separator && !quoted) {
      out.push_back(text.substr(start, i - start));
      start = i + 1;
    }
  }
  out.push_back(text.substr(start));
  return out;
}

std::string Unquote(std::string_view v) {
  if (v.size() >= 2 && v.front() == '"' && v.back() == '"') v = v.substr(1, v.size() - 2);
  return std::string(v);
}

std::optional<ContentLine> ParseLine(std::string_view line) {
  bool quoted = false;
  size_t colon = std::string_view::npos;
  for (size_t i = 0; i < line.size(); ++i) {
    if (line[i] == '"') quoted = !quoted;
    if (line[i] == ':' && !quoted) {
      colon = i;
      break;
    }
  }
  if (colon == std::string_view::npos || colon == 0) return std::nullopt;
  ContentLine out;
  out.raw_value = std::string(line.substr(colon + 1));
  std::vector<std::string_view> head = SplitOutsideQuotes(line.substr(0, colon), ';');
  std::string_view name = head[0];
  if (const size_t dot = name.find('.'); dot != std::string_view::npos) name = name.substr(dot + 1);
  out.name = AsciiUpper(name);
  for (size_t i = 1; i < head.size(); ++i) {
    const std::string_view p = head[i];
    const size_t eq = p.find('=');
    if (eq == std::string_view::npos) {
      std::string bare = AsciiUpper(p);
      bool encoding = false;
      for (std::string_view e : kBareEncodings) encoding = encoding || bare == e;
      if (bare.empty()) continue;
      out.params.emplace_back(encoding ? "ENCODING" : "TYPE", std::string(p));
      continue;
    }
    const std::string param_name = AsciiUpper(p.substr(0, eq));
    for (std::string_view v : SplitOutsideQuotes(p.substr(eq + 1), ',')) {
      out.params.emplace_back(param_name, Unquote(v));
    }
  }
  return out;
}

bool IsQuotedPrintableHead(std::string_view line) {
  const size_t colon = line.find(':');
  return AsciiUpper(line.substr(0, colon)).find("QUOTED-PRINTABLE") != std::string::npos;
}

// ---- Card contents

constexpr int32_t kEmailAddressBookArray[] = {0x1, 0x2, 0x4};

struct AddressKind {
  uint16_t po_box, street, city, region, postal_code, country;
  uint32_t text_lid;
};
constexpr AddressKind kHomeAddress = {0x3A5E, 0x3A5D, 0x3A59,         0x3A5C,
                                      0x3A5B, 0x3A5A, kLidHomeAddress};
constexpr AddressKind kWorkAddress = {0x3A2B, 0x3A29, 0x3A27,         0x3A28,
                                      0x3A2A, 0x3A26, kLidWorkAddress};
constexpr AddressKind kOtherAddress = {0x3A64, 0x3A63, 0x3A5F,          0x3A62,
                                       0x3A61, 0x3A60, kLidOtherAddress};
// The business address is also kept in the named work-address properties.
constexpr uint32_t kWorkNamedParts[] = {kLidWorkAddressPostOfficeBox, kLidWorkAddressStreet,
                                        kLidWorkAddressCity,          kLidWorkAddressState,
                                        kLidWorkAddressPostalCode,    kLidWorkAddressCountry};

// ADR components: post office box; extended address; street; locality; region; postal code;
// country.
enum AdrPart { kAdrPoBox, kAdrExtended, kAdrStreet, kAdrCity, kAdrRegion, kAdrPostal, kAdrCountry };

struct TelRule {
  std::string_view type;
  uint16_t id;
};
// Types that name one property whatever else the line says, tested in order.
constexpr TelRule kTelRules[] = {
    {"cell", 0x3A1C},    {"car", 0x3A1E},       {"pager", 0x3A21},     {"isdn", 0x3A2D},
    {"radio", 0x3A1D},   {"ttytdd", 0x3A4B},    {"textphone", 0x3A4B}, {"callback", 0x3A02},
    {"company", 0x3A57}, {"assistant", 0x3A2E}, {"msg", 0x3A1F},
};
constexpr uint16_t kBusinessFax = 0x3A24, kHomeFax = 0x3A25, kPrimaryFax = 0x3A23;
constexpr uint16_t kBusinessPhone = 0x3A08, kBusinessPhone2 = 0x3A1B;
constexpr uint16_t kHomePhone = 0x3A09, kHomePhone2 = 0x3A2F;
constexpr uint16_t kPrimaryPhone = 0x3A1A, kOtherPhone = 0x3A1F, kTelex = 0x3A2C;
constexpr uint16_t kPersonalHomePage = 0x3A50, kBusinessHomePage = 0x3A51;
constexpr uint16_t kProfession = 0x3A46, kAssistant = 0x3A30, kManager = 0x3A4E, kSpouse = 0x3A48;
constexpr uint32_t kLidHtml = 0x802B;

struct TextRule {
  std::string_view name;
  uint16_t id;
};
constexpr TextRule kTextRules[] = {
    {"TITLE", kPidTitle},           {"ROLE", kProfession},      {"NICKNAME", kPidNickname},
    {"X-MS-ASSISTANT", kAssistant}, {"X-MS-MANAGER", kManager}, {"X-MS-SPOUSE", kSpouse},
};

class CardImporter {
 public:
  explicit CardImporter(Message* out) : out_(out), bag_(out->properties) {}

  void Line(const ContentLine& line) {
    const std::string& n = line.name;
    if (n == "N") {
      Names(SplitStructured(line.Text()));
    } else if (n == "FN") {
      full_name_ = UnescapeText(line.Text());
    } else if (n == "ORG") {
      std::vector<std::string> parts = SplitStructured(line.Text());
      SetText(kPidCompanyName, parts[0]);
      if (parts.size() > 1) SetText(kPidDepartmentName, parts[1]);
      company_ = parts[0];
    } else if (n == "TEL") {
      Telephone(line);
    } else if (n == "EMAIL") {
      if (line.HasType("tlx")) {
        SetText(kTelex, UnescapeText(line.Text()));
      } else if (emails_.size() < kVCardEmailSlots) {
        emails_.push_back(UnescapeText(line.Text()));
      }
    } else if (n == "ADR") {
      Address(line);
    } else if (n == "LABEL") {
      const std::string text = UnescapeText(line.Text());
      if (!text.empty())
        bag_.SetNamed(NamedId(kPsetidAddress, KindOf(line).text_lid), PropertyValue::Unicode(text));
    } else if (n == "BDAY") {
      Date(line, kPidBirthday, kLidBirthdayLocal);
    } else if (n == "X-MS-ANNIVERSARY" || n == "ANNIVERSARY") {
      Date(line, kPidWeddingAnniversary, kLidWeddingAnniversaryLocal);
    } else if (n == "URL") {
      const std::string url = UnescapeText(line.Text());
      if (line.HasType("home")) {
        SetText(kPersonalHomePage, url);
      } else {
        SetText(kBusinessHomePage, url);
        if (!url.empty())
          bag_.SetNamed(NamedId(kPsetidAddress, kLidHtml), PropertyValue::Unicode(url));
      }
    } else if (n == "NOTE") {
      SetText(kPidBody, UnescapeText(line.Text()));
    } else if (n == "FBURL") {
      SetNamedText(kLidFreeBusyLocation, UnescapeText(line.Text()));
    } else if (n == "X-MS-IMADDRESS" || n == "IMPP") {
      SetNamedText(kLidInstantMessagingAddress, UnescapeText(line.Text()));
    } else if (n == "CATEGORIES") {
      std::vector<std::string> list;
      for (std::string& c : SplitStructured(line.Text(), ',')) {
        if (!c.empty()) list.push_back(std::move(c));
      }
      if (!list.empty()) {
        bag_.SetNamed(NamedString(kPsPublicStrings, "Keywords"), PropertyValue::MultiUnicode(list));
      }
    } else if (n == "PHOTO") {
      Photo(line);
    } else {
      for (const TextRule& r : kTextRules) {
        if (n == r.name) SetText(r.id, UnescapeText(line.Text()));
      }
    }
  }

  void Finish() {
    if (!bag_.Find(kPidMessageClass)) {
      bag_.Set(kPidMessageClass, PropertyValue::Unicode(std::string(kContactClass)));
    }
    std::string display = full_name_;
    if (display.empty()) {
      for (const std::string& part : {prefix_, given_, middle_, surname_, suffix_}) {
        if (part.empty()) continue;
        if (!display.empty()) display.push_back(' ');
        display += part;
      }
    }
    if (display.empty()) display = company_;
    if (display.empty() && !emails_.empty()) display = emails_[0];
    if (!display.empty()) {
      bag_.Set(kPidDisplayName, PropertyValue::Unicode(display));
      bag_.Set(kPidSubject, PropertyValue::Unicode(display));
      bag_.Set(kPidNormalizedSubject, PropertyValue::Unicode(display));
    }
    std::string file_as;
    if (!surname_.empty()) {
      file_as = surname_;
      std::string first = given_;
      if (!middle_.empty()) first += (first.empty() ? "" : " ") + middle_;
      if (!first.empty()) file_as += ", " + first;
    } else {
      file_as = display;
    }
    if (!file_as.empty()) SetNamedText(kLidFileUnder, file_as);
    Emails(display);
    for (const AddressKind* kind : {&kHomeAddress, &kWorkAddress, &kOtherAddress}) {
      const NamedProperty text_name = NamedId(kPsetidAddress, kind->text_lid);
      auto it = address_texts_.find(kind->text_lid);
      if (!bag_.FindNamed(text_name) && it != address_texts_.end() && !it->second.empty()) {
        bag_.SetNamed(text_name, PropertyValue::Unicode(it->second));
      }
    }
  }

 private:
  void SetText(uint16_t id, const std::string& text) {
    if (!text.empty()) bag_.Set(id, PropertyValue::Unicode(text));
  }
  void SetNamedText(uint32_t lid, const std::string& text) {
    if (!text.empty()) bag_.SetNamed(NamedId(kPsetidAddress, lid), PropertyValue::Unicode(text));
  }

  void Names(const std::vector<std::string>& parts) {
    std::string* fields[] = {&surname_, &given_, &middle_, &prefix_, &suffix_};
    const uint16_t ids[] = {kPidSurname, kPidGivenName, kPidMiddleName, kPidDisplayNamePrefix,
                            kPidGeneration};
    for (size_t i = 0; i < std::size(fields) && i < parts.size(); ++i) {
      *fields[i] = parts[i];
      SetText(ids[i], parts[i]);
    }
  }

  void Telephone(const ContentLine& line) {
    const std::string number = UnescapeText(line.Text());
    if (number.empty()) return;
    const bool work = line.HasType("work"), home = line.HasType("home");
    auto put = [&](uint16_t first, uint16_t second) {
      bag_.Set(bag_.Find(first) && second ? second : first, PropertyValue::Unicode(number));
    };
    if (line.HasType("fax")) return put(work ? kBusinessFax : home ? kHomeFax : kPrimaryFax, 0);
    for (const TelRule& r : kTelRules) {
      if (line.HasType(r.type)) return put(r.id, 0);
    }
    if (work) return put(kBusinessPhone, kBusinessPhone2);
    if (home) return put(kHomePhone, kHomePhone2);
    if (line.HasType("pref")) return put(kPrimaryPhone, 0);
    if (!bag_.Find(kOtherPhone)) put(kOtherPhone, 0);
  }

  static const AddressKind& KindOf(const ContentLine& line) {
    if (line.HasType("home")) return kHomeAddress;
    if (line.HasType("work")) return kWorkAddress;
    return kOtherAddress;
  }

  void Address(const ContentLine& line) {
    const AddressKind& kind = KindOf(line);
    std::vector<std::string> p = SplitStructured(line.Text());
    p.resize(kAdrCountry + 1);
    std::string street = p[kAdrStreet];
    if (!p[kAdrExtended].empty()) {
      street += (street.empty() ? "" : std::string(kLineBreak)) + p[kAdrExtended];
    }
    const std::pair<uint16_t, const std::string*> tagged[] = {
        {kind.po_box, &p[kAdrPoBox]},       {kind.street, &street},
        {kind.city, &p[kAdrCity]},          {kind.region, &p[kAdrRegion]},
        {kind.postal_code, &p[kAdrPostal]}, {kind.country, &p[kAdrCountry]}};
    for (size_t i = 0; i < std::size(tagged); ++i) {
      SetText(tagged[i].first, *tagged[i].second);
      if (&kind == &kWorkAddress) SetNamedText(kWorkNamedParts[i], *tagged[i].second);
    }
    // The whole address as one text, for when no LABEL gives it.
    std::string text = street;
    std::string city_line = p[kAdrCity];
    for (const std::string* part : {&p[kAdrRegion], &p[kAdrPostal]}) {
      if (part->empty()) continue;
      if (!city_line.empty()) city_line += ' ';
      city_line += *part;
    }
    for (const std::string* part : {&city_line, &p[kAdrCountry]}) {
      if (part->empty()) continue;
      if (!text.empty()) text += kLineBreak;
      text += *part;
    }
    address_texts_[kind.text_lid] = text;
  }

  // BDAY: "yyyy-mm-dd", "yyyymmdd", either with a time after it.
  void Date(const ContentLine& line, uint16_t tag, uint32_t local_lid) {
    std::string digits;
    for (char c : line.Text()) {
      if (c == 'T' || c == 't') break;
      if (c >= '0' && c <= '9') digits.push_back(c);
    }
    constexpr size_t kDateDigits = 8;
    if (digits.size() != kDateDigits) return;
    std::tm tm{};
    tm.tm_year = std::stoi(digits.substr(0, 4)) - kTmYearBase;
    tm.tm_mon = std::stoi(digits.substr(4, 2)) - 1;
    tm.tm_mday = std::stoi(digits.substr(6, 2));
    tm.tm_isdst = -1;
    const std::tm asked = tm;
    std::tm utc = tm;
    const std::time_t local = std::mktime(&tm);
    if (local == std::time_t(-1) || tm.tm_mday != asked.tm_mday || tm.tm_mon != asked.tm_mon) {
      return;
    }
    // The date at local midnight, and the same date at midnight UTC ("local" form).
    if (std::optional<uint64_t> t = UnixTimeToFileTime(local)) {
      bag_.Set(tag, PropertyValue::SysTime(*t));
    }
    if (std::optional<uint64_t> t = UnixTimeToFileTime(timegm(&utc))) {
      bag_.SetNamed(NamedId(kPsetidAddress, local_lid), PropertyValue::SysTime(*t));
    }
  }

  void Photo(const ContentLine& line) {
    Bytes data;
    std::string type = AsciiLower(line.Param("TYPE"));
    const std::string& raw = line.raw_value;
    if (StartsWithIgnoreCase(raw, "data:")) {
      // data:image/jpeg;base64,....
      const size_t comma = raw.find(',');
      if (comma == std::string::npos) return;
      const std::string media = AsciiLower(raw.substr(5, comma - 5));
      if (const size_t slash = media.find('/'); slash != std::string::npos) {
        type = media.substr(slash + 1, media.find(';') - slash - 1);
      }
      data = render::Base64Decode(std::string_view(raw).substr(comma + 1));
    } else {
      data = line.DecodedBytes();
    }
    if (data.empty() || !out_->attachments.empty()) return;
    if (type.empty() || type == "jpeg") type = "jpg";
    const std::string name = std::string(kPictureStem) + "." + type;
    Attachment a;
    PropertyBag& p = a.properties;
    p.Set(kPidAttachMethod, PropertyValue::Int32(kAttachByValue));
    p.Set(kPidAttachLongFilename, PropertyValue::Unicode(name));
    p.Set(kPidAttachFilename, PropertyValue::Unicode(name));
    p.Set(kPidDisplayName, PropertyValue::Unicode(name));
    p.Set(kPidAttachExtension, PropertyValue::Unicode("." + type));
    p.Set(kPidAttachMimeTag,
          PropertyValue::Unicode(type == "jpg" ? "image/jpeg" : "image/" + type));
    p.Set(kPidAttachmentContactPhoto, PropertyValue::Boolean(true));
    p.Set(kPidAttachmentHidden, PropertyValue::Boolean(true));
    p.Set(kPidRenderingPosition, PropertyValue::Int32(-1));
    p.Set(kPidAttachSize, PropertyValue::Int32(int32_t(std::min<size_t>(data.size(), INT32_MAX))));
    a.data = std::move(data);
    out_->attachments.push_back(std::move(a));
    bag_.SetNamed(NamedId(kPsetidAddress, kLidHasPicture), PropertyValue::Boolean(true));
  }

  void Emails(const std::string& display) {
    PropertyValue list, array;
    list.type = kTypeInt32 | kMultiFlag;
    int32_t array_bits = 0;
    for (size_t i = 0; i < emails_.size(); ++i) {
      const std::string& address = emails_[i];
      if (address.empty()) continue;
      const uint32_t stride = kLidEmailStride * uint32_t(i);
      const std::string shown = display.empty() ? address : display + " (" + address + ")";
      SetNamedText(kLidEmail1EmailAddress + stride, address);
      SetNamedText(kLidEmail1AddressType + stride, std::string(kSmtp));
      SetNamedText(kLidEmail1DisplayName + stride, shown);
      SetNamedText(kLidEmail1OriginalDisplayName + stride, address);
      bag_.SetNamed(NamedId(kPsetidAddress, kLidEmail1OriginalEntryId + stride),
                    PropertyValue::Binary(OneOffEntryId(shown, kSmtp, address)));
      Bytes slot(sizeof(int32_t));
      StoreU32LE(slot.data(), uint32_t(i));
      list.elements.push_back(std::move(slot));
      array_bits |= kEmailAddressBookArray[i];
    }
    if (list.elements.empty()) return;
    bag_.SetNamed(NamedId(kPsetidAddress, kLidAddressBookProviderEmailList), std::move(list));
    bag_.SetNamed(NamedId(kPsetidAddress, kLidAddressBookProviderArrayType),
                  PropertyValue::Int32(array_bits));
  }

  Message* out_;
  PropertyBag& bag_;
  std::string surname_, given_, middle_, prefix_, suffix_, full_name_, company_;
  std::vector<std::string> emails_;
  std::map<uint32_t, std::string> address_texts_;
};

}  // namespace

std::string ContentLine::Param(std::string_view param_name) const {
  for (const auto& [name, value] : params) {
    if (name == param_name) return value;
  }
  return {};
}

std::vector<std::string> ContentLine::Types() const {
  std::vector<std::string> out;
  for (const auto& [name, value] : params) {
    if (name != "TYPE") continue;
    for (std::string_view t : SplitOutsideQuotes(value, ',')) out.push_back(AsciiLower(t));
  }
  return out;
}

bool ContentLine::HasType(std::string_view type) const {
  for (const std::string& t : Types()) {
    if (t == type) return true;
  }
  return false;
}

Bytes ContentLine::DecodedBytes() const {
  const std::string encoding = AsciiUpper(Param("ENCODING"));
  if (encoding == "QUOTED-PRINTABLE") {
    render::CMimeCodeQP coder;
    coder.SetInput(std::string_view(raw_value));
    return coder.DecodeToBytes();
  }
  if (encoding == "BASE64" || encoding == "B") return render::Base64Decode(raw_value);
  return Bytes(raw_value.begin(), raw_value.end());
}

std::string ContentLine::Text() const {
  const Bytes bytes = DecodedBytes();
  return render::CharsetBytesToUtf8(ToView(bytes), Param("CHARSET"));
}

std::vector<ContentLine> ReadContentLines(std::string_view text, size_t max_lines) {
  std::vector<ContentLine> out;
  std::string current;
  bool have = false;
  auto flush = [&] {
    if (have && !current.empty()) {
      if (std::optional<ContentLine> line = ParseLine(current)) out.push_back(std::move(*line));
    }
    current.clear();
    have = false;
  };
  size_t pos = 0;
  while (pos < text.size() && out.size() < max_lines) {
    size_t end = text.find_first_of("\r\n", pos);
    if (end == std::string_view::npos) end = text.size();
    const std::string_view physical = text.substr(pos, end - pos);
    // CR LF, a lone CR and a lone LF each end one line.
    pos = end;
    if (pos < text.size() && text[pos] == '\r') ++pos;
    if (pos < text.size() && text[pos] == '\n') ++pos;
    if (have && !current.empty() && current.back() == '=' && IsQuotedPrintableHead(current)) {
      current.pop_back();  // a soft line break
      current += physical;
    } else if (have && !physical.empty() && (physical[0] == ' ' || physical[0] == '\t')) {
      current += physical.substr(1);
    } else {
      flush();
      current = std::string(physical);
      have = true;
    }
  }
  flush();
  if (out.size() > max_lines) out.resize(max_lines);
  return out;
}

std::string UnescapeText(std::string_view value) {
  std::string out;
  out.reserve(value.size());
  for (size_t i = 0; i < value.size(); ++i) {
    if (value[i] != '\\' || i + 1 == value.size()) {
      out.push_back(value[i]);
      continue;
    }
    const char next = value[++i];
    if (next == 'n' || next == 'N') {
      out += kLineBreak;
    } else {
      out.push_back(next);
    }
  }
  return out;
}

std::vector<std::string> SplitStructured(std::string_view value, char separator) {
  std::vector<std::string> out;
  size_t start = 0;
  for (size_t i = 0; i < value.size(); ++i) {
    if (value[i] == '\\') {
      ++i;
    } else if (value[i] == separator) {
      out.push_back(UnescapeText(value.substr(start, i - start)));
      start = i + 1;
    }
  }
  out.push_back(UnescapeText(value.substr(std::min(start, value.size()))));
  return out;
}

Status ImportVCard(std::string_view text, Message* out) {
  const std::vector<ContentLine> lines = ReadContentLines(text, kMaxVCardLines);
  size_t i = 0;
  while (i < lines.size() &&
         !(lines[i].name == "BEGIN" && EqualsIgnoreAsciiCase(lines[i].raw_value, "VCARD"))) {
    ++i;
  }
  if (i == lines.size()) return Status::Corruption("not a vCard: no BEGIN:VCARD line");
  CardImporter card(out);
  int nested = 0;  // an AGENT card inside this one is not ours
  for (++i; i < lines.size(); ++i) {
    const ContentLine& line = lines[i];
    const bool is_card = EqualsIgnoreAsciiCase(line.raw_value, "VCARD");
    if (line.name == "BEGIN" && is_card) ++nested;
    if (line.name == "END" && is_card) {
      if (nested-- == 0) break;
      continue;
    }
    if (nested == 0) card.Line(line);
  }
  card.Finish();
  return Status::Ok();
}

}  // namespace tarnwell::mapi
