#include "render/vcard_writer.h"

#include <initializer_list>

#include "base/date_time.h"
#include "base/text.h"

namespace tarnwell::render {
namespace {

constexpr std::string_view kCharsetUtf8 = ";CHARSET=utf-8";
constexpr std::string_view kQuotedPrintable = ";ENCODING=QUOTED-PRINTABLE";
constexpr std::string_view kDateFormat = "%Y-%m-%d";
constexpr char kBase64Alphabet[] =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr char kBase64Pad = '=';

// Where each field is kept: the standard MAPI contact properties by their tags, and the named
// ones (e-mail addresses, address texts, business address parts, free/busy and instant
// messaging addresses) by their usual identifiers. The first column present wins.
using Columns = std::initializer_list<const char*>;

struct ColumnField {
  std::string VCardContact::*field;
  Columns columns;
};

struct AddressColumns {
  VCardAddress VCardContact::*address;
  Columns po_box, street, city, region, postal_code, country, label;
};

const ColumnField kColumnFields[] = {
    {&VCardContact::surname, {"S3a11"}},
    {&VCardContact::given_name, {"S3a06"}},
    {&VCardContact::middle_name, {"S3a44"}},
    {&VCardContact::prefix, {"S3a45"}},
    {&VCardContact::suffix, {"S3a05"}},
    {&VCardContact::company, {"S3a16"}},
    {&VCardContact::department, {"S3a18", "S8010"}},
    {&VCardContact::nickname, {"S3a4f"}},
    {&VCardContact::business_fax, {"S3a24"}},
    {&VCardContact::business_phone, {"S3a08"}},
    {&VCardContact::business_phone_2, {"S3a1b"}},
    {&VCardContact::car_phone, {"S3a1e"}},
    {&VCardContact::home_fax, {"S3a25"}},
    {&VCardContact::home_phone, {"S3a09"}},
    {&VCardContact::home_phone_2, {"S3a2f"}},
    {&VCardContact::isdn, {"S3a2d"}},
    {&VCardContact::mobile_phone, {"S3a1c"}},
    {&VCardContact::other_phone, {"S3a1f"}},
    {&VCardContact::pager, {"S3a21"}},
    {&VCardContact::primary_fax, {"S3a23"}},
    {&VCardContact::primary_phone, {"S3a1a"}},
    {&VCardContact::radio_phone, {"S3a1d"}},
    {&VCardContact::telex, {"S3a2c"}},
    {&VCardContact::tty_tdd_phone, {"S3a4b"}},
    {&VCardContact::callback_phone, {"S3a02"}},
    {&VCardContact::company_main_phone, {"S3a57"}},
    {&VCardContact::assistant_phone, {"S3a2e"}},
    {&VCardContact::job_title, {"S3a17"}},
    {&VCardContact::profession, {"S3a46"}},
    {&VCardContact::business_home_page, {"S3a51", "S802b"}},
    {&VCardContact::assistant, {"S3a30"}},
    {&VCardContact::manager, {"S3a4e"}},
    {&VCardContact::spouse, {"S3a48"}},
    {&VCardContact::free_busy_url, {"S80d8"}},
    {&VCardContact::im_address, {"S8062"}},
};

const Columns kEmailColumns[] = {{"S8083"}, {"S8093"}, {"S80a3"}};

const AddressColumns kAddressColumns[] = {
    {&VCardContact::home,
     {"S3a5e"},
     {"S3a5d"},
     {"S3a59"},
     {"S3a5c"},
     {"S3a5b"},
     {"S3a5a"},
     {"S801a"}},
    {&VCardContact::business,
     {"S804a", "S3a2b"},
     {"S8045", "S3a29"},
     {"S8046", "S3a27"},
     {"S8047", "S3a28"},
     {"S8048", "S3a2a"},
     {"S8049", "S3a26"},
     {"S801b"}},
    {&VCardContact::other,
     {"S3a64"},
     {"S3a63"},
     {"S3a5f"},
     {"S3a62"},
     {"S3a61"},
     {"S3a60"},
     {"S801c"}},
};

std::string FirstPresent(const std::map<std::string, std::string>& strings, Columns columns) {
  for (const char* name : columns) {
    auto it = strings.find(name);
    if (it != strings.end() && !it->second.empty()) return it->second;
  }
  return {};
}

// Lines with a fixed name and one text value, in file order between two groups.
struct TextLine {
  std::string_view name;
  std::string VCardContact::*field;
  bool charset;  // the name gains the CHARSET parameter with UTF-8 text
};

const TextLine kTelephoneLines[] = {
    {"TEL;TYPE=work,fax", &VCardContact::business_fax, false},
    {"TEL;TYPE=work,voice", &VCardContact::business_phone, false},
    {"TEL;TYPE=work,voice", &VCardContact::business_phone_2, false},
    {"TEL;TYPE=car,voice", &VCardContact::car_phone, false},
    {"TEL;TYPE=home,fax", &VCardContact::home_fax, false},
    {"TEL;TYPE=home,voice", &VCardContact::home_phone, false},
    {"TEL;TYPE=home,voice", &VCardContact::home_phone_2, false},
    {"TEL;TYPE=isdn", &VCardContact::isdn, false},
    {"TEL;TYPE=cell,voice", &VCardContact::mobile_phone, false},
    {"TEL;TYPE=msg", &VCardContact::other_phone, false},
    {"TEL;TYPE=pager", &VCardContact::pager, false},
    {"TEL;TYPE=fax,pref", &VCardContact::primary_fax, false},
    {"TEL;TYPE=phone,pref", &VCardContact::primary_phone, false},
    {"TEL;VOICE;RADIO", &VCardContact::radio_phone, false},
    {"EMAIL;TLX", &VCardContact::telex, false},
    {"TEL;TTYTDD", &VCardContact::tty_tdd_phone, false},
    {"TEL;VOICE;CALLBACK", &VCardContact::callback_phone, false},
    {"TEL;VOICE;COMPANY", &VCardContact::company_main_phone, false},
    {"TEL;VOICE;ASSISTANT", &VCardContact::assistant_phone, false},
    {"TITLE", &VCardContact::job_title, true},
    {"ROLE", &VCardContact::profession, true},
    {"URL;WORK", &VCardContact::business_home_page, true},
    {"X-MS-ASSISTANT", &VCardContact::assistant, true},
    {"X-MS-MANAGER", &VCardContact::manager, true},
    {"X-MS-SPOUSE", &VCardContact::spouse, true},
};

struct AddressLine {
  std::string_view type;
  VCardAddress VCardContact::*address;
};

const AddressLine kAddressLines[] = {
    {"home", &VCardContact::home},
    {"work", &VCardContact::business},
    {"postal", &VCardContact::other},
};

std::string Base64(ByteView bytes) {
  std::string out;
  out.reserve((bytes.size() + 2) / 3 * 4);
  size_t i = 0;
  for (; i + 3 <= bytes.size(); i += 3) {
    const uint32_t v = uint32_t(bytes[i]) << 16 | uint32_t(bytes[i + 1]) << 8 | bytes[i + 2];
    for (int shift = 18; shift >= 0; shift -= 6) out.push_back(kBase64Alphabet[(v >> shift) & 63]);
  }
  const size_t rest = bytes.size() - i;
  if (rest > 0) {
    uint32_t v = uint32_t(bytes[i]) << 16;
    if (rest == 2) v |= uint32_t(bytes[i + 1]) << 8;
    out.push_back(kBase64Alphabet[(v >> 18) & 63]);
    out.push_back(kBase64Alphabet[(v >> 12) & 63]);
    out.push_back(rest == 2 ? kBase64Alphabet[(v >> 6) & 63] : kBase64Pad);
    out.push_back(kBase64Pad);
  }
  return out;
}

// A street on several lines goes into its address component as one line.
std::string OneLine(std::string_view text) {
  std::string out;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\r' || text[i] == '\n') {
      if (text[i] == '\r' && i + 1 < text.size() && text[i + 1] == '\n') ++i;
      out.push_back(' ');
    } else {
      out.push_back(text[i]);
    }
  }
  return out;
}

// Escaped components joined by ';'.
std::string Structured(std::initializer_list<std::string_view> parts) {
  std::string out;
  bool first = true;
  for (std::string_view part : parts) {
    if (!first) out.push_back(';');
    first = false;
    out += EscapeText(part);
  }
  return out;
}

std::string JoinNonEmpty(std::initializer_list<std::string_view> parts) {
  std::string out;
  for (std::string_view part : parts) {
    if (part.empty()) continue;
    if (!out.empty()) out.push_back(' ');
    out += part;
  }
  return out;
}

bool HasParts(const VCardAddress& a) {
  return !(a.po_box.empty() && a.street.empty() && a.city.empty() && a.region.empty() &&
           a.postal_code.empty() && a.country.empty());
}

class VCardComposer {
 public:
  explicit VCardComposer(TextMode mode) : mode_(mode), writer_(mode) {}

  std::string Compose(const VCardContact& c) {
    writer_.Property("BEGIN", "VCARD");
    writer_.Property("VERSION", "2.1");
    Names(c);
    if (!c.company.empty() || !c.department.empty()) {
      // An empty unit after the name is left out rather than written as a trailing ';'.
      writer_.Property(Name("ORG", true), c.department.empty()
                                              ? Structured({c.company})
                                              : Structured({c.company, c.department}));
    }
    Text("NICKNAME", c.nickname, true);
    for (const std::string& email : c.email) Text("EMAIL", email, true);
    for (const AddressLine& line : kAddressLines) Address(line.type, c.*line.address);
    for (const TextLine& line : kTelephoneLines) Text(line.name, c.*line.field, line.charset);
    Date("BDAY", c.birthday);
    Date("X-MS-ANNIVERSARY", c.anniversary);
    Text("FBURL", c.free_busy_url, true);
    if (!c.note.empty()) {
      writer_.QuotedPrintableProperty(std::string("NOTE").append(kQuotedPrintable),
                                      EscapeText(c.note, LineBreaks::kCrLf));
    }
    Text("X-MS-IMADDRESS", c.im_address, true);
    if (c.picture && !c.picture->empty()) {
      writer_.Property("PHOTO;ENCODING=BASE64", Base64(ByteView(*c.picture)));
      writer_.EmptyLine();
    }
    writer_.Property("END", "VCARD");
    return writer_.Take();
  }

 private:
  std::string Name(std::string_view name, bool charset) const {
    std::string out(name);
    if (charset && mode_.utf8) out += kCharsetUtf8;
    return out;
  }

  void Text(std::string_view name, const std::string& value, bool charset) {
    if (!value.empty()) writer_.Property(Name(name, charset), EscapeText(value));
  }

  void Names(const VCardContact& c) {
    std::string surname = c.surname;
    if (mode_.utf8) {
      for (char& ch : surname) {
        if (ch == ',') ch = ';';
      }
    }
    writer_.Property(Name("N", true),
                     Structured({surname, c.given_name, c.middle_name, c.prefix, c.suffix}));
    std::string full = JoinNonEmpty({c.prefix, c.given_name, c.middle_name, c.surname, c.suffix});
    for (const std::string* fallback : {&c.company, &c.nickname, &c.email[0]}) {
      if (full.empty()) full = *fallback;
    }
    writer_.Property(Name("FN", true), EscapeText(full));
  }

  void Address(std::string_view type, const VCardAddress& a) {
    const std::string base = std::string("TYPE=").append(type);
    if (HasParts(a)) {
      writer_.Property(Name("ADR;" + base, true),
                       Structured({a.po_box, "", OneLine(a.street), a.city, a.region, a.postal_code,
                                   a.country}));
    }
    if (!a.label.empty()) {
      writer_.QuotedPrintableProperty(
          Name(std::string("LABEL;").append(base).append(kQuotedPrintable), true),
          EscapeText(a.label, LineBreaks::kCrLf));
    }
  }

  void Date(std::string_view name, const store::FileTime& time) {
    if (!time) return;
    std::optional<std::string> text = FormatFileTime(*time, kDateFormat, Zone::kLocal);
    if (text) writer_.Property(name, *text);
  }

  TextMode mode_;
  ContentWriter writer_;
};

}  // namespace

VCardContact ContactFromRecord(const store::ContactRecord& record) {
  VCardContact c;
  for (const ColumnField& f : kColumnFields) c.*f.field = FirstPresent(record.strings, f.columns);
  for (size_t i = 0; i < std::size(kEmailColumns); ++i) {
    c.email[i] = FirstPresent(record.strings, kEmailColumns[i]);
  }
  for (const AddressColumns& a : kAddressColumns) {
    VCardAddress& out = c.*a.address;
    out.po_box = FirstPresent(record.strings, a.po_box);
    out.street = FirstPresent(record.strings, a.street);
    out.city = FirstPresent(record.strings, a.city);
    out.region = FirstPresent(record.strings, a.region);
    out.postal_code = FirstPresent(record.strings, a.postal_code);
    out.country = FirstPresent(record.strings, a.country);
    out.label = FirstPresent(record.strings, a.label);
  }
  c.birthday = record.birthday;
  c.anniversary = record.anniversary;
  return c;
}

const Bytes* FindContactPicture(const std::vector<store::AttachmentRecord>& attachments) {
  for (const store::AttachmentRecord& a : attachments) {
    const std::string_view name = a.name;
    const std::string_view stem = name.substr(0, name.find('.'));
    if (EqualsIgnoreAsciiCase(stem, kContactPictureName)) return &a.data;
  }
  return nullptr;
}

std::string ComposeVCard(const VCardContact& contact, TextMode mode) {
  return VCardComposer(mode).Compose(contact);
}

}  // namespace tarnwell::render
