#include "render/vcard_writer.h"

#include <gtest/gtest.h>

#include <functional>

#include "render/writer_test_support.h"

namespace tarnwell::render {
namespace {

using testing::Repeat;
using testing::Utc;
using testing::Values;

// Prints every property vobject reads as "key TAB hex": the key is the name, the TYPE values
// and the bare parameters; structured values get one key per component.
constexpr const char* kReadVCard = R"PY(
import re
text = data.decode(codec)
if codec != 'utf-8':
    # An importer knows the ANSI code page without being told in the file.
    text = re.sub(r'ENCODING=QUOTED-PRINTABLE(?=[;:])',
                  'ENCODING=QUOTED-PRINTABLE;CHARSET=' + codec, text)
cards = list(vobject.readComponents(text, allowQP=True))
if len(cards) != 1:
    sys.exit('%d cards' % len(cards))

def out(key, value):
    if not isinstance(value, bytes):
        if not isinstance(value, str):
            value = ','.join(value)
        value = value.encode('utf-8')
    print(key + '\t' + value.hex())

parts = {'N': ('family', 'given', 'additional', 'prefix', 'suffix'),
         'ADR': ('box', 'extended', 'street', 'city', 'region', 'code', 'country')}
for child in cards[0].getChildren():
    key = child.name
    if child.params.get('TYPE'):
        key += ';' + ','.join(child.params['TYPE'])
    if child.singletonparams:
        key += ';' + ';'.join(child.singletonparams)
    if child.name in parts:
        for part in parts[child.name]:
            out(key + '.' + part, getattr(child.value, part))
    elif child.name == 'ORG':
        for i, value in enumerate(child.value):
            out(key + '.' + str(i), value)
    else:
        out(key, child.value)
)PY";

// 23:30 UTC is already the next day in Berlin.
const uint64_t kBirthday = Utc(1980, 5, 16, 23, 30);
const uint64_t kAnniversary = Utc(2004, 12, 31, 23, 30);
constexpr const char* kBirthdayText = "1980-05-17";
constexpr const char* kAnniversaryText = "2005-01-01";

// ---- What a reader should find, worked out from the record's columns.

enum class Kind { kText, kMultiLine, kStreet };

struct SimpleLine {
  const char* column;
  const char* key;
};

// clang-format off
const SimpleLine kSimpleLines[] = {
    {"S3a4f", "NICKNAME"},            {"S8083", "EMAIL"},
    {"S8093", "EMAIL"},               {"S80a3", "EMAIL"},
    {"S3a24", "TEL;work,fax"},        {"S3a08", "TEL;work,voice"},
    {"S3a1b", "TEL;work,voice"},      {"S3a1e", "TEL;car,voice"},
    {"S3a25", "TEL;home,fax"},        {"S3a09", "TEL;home,voice"},
    {"S3a2f", "TEL;home,voice"},      {"S3a2d", "TEL;isdn"},
    {"S3a1c", "TEL;cell,voice"},      {"S3a1f", "TEL;msg"},
    {"S3a21", "TEL;pager"},           {"S3a23", "TEL;fax,pref"},
    {"S3a1a", "TEL;phone,pref"},      {"S3a1d", "TEL;VOICE;RADIO"},
    {"S3a2c", "EMAIL;TLX"},           {"S3a4b", "TEL;TTYTDD"},
    {"S3a02", "TEL;VOICE;CALLBACK"},  {"S3a57", "TEL;VOICE;COMPANY"},
    {"S3a2e", "TEL;VOICE;ASSISTANT"}, {"S3a17", "TITLE"},
    {"S3a46", "ROLE"},                {"S3a51", "URL;WORK"},
    {"S3a30", "X-MS-ASSISTANT"},      {"S3a4e", "X-MS-MANAGER"},
    {"S3a48", "X-MS-SPOUSE"},         {"S80d8", "FBURL"},
    {"S8062", "X-MS-IMADDRESS"}};
// clang-format on

struct AddressKind {
  const char* type;
  const char* columns[6];  // box, street, city, region, postal code, country
  const char* label;
};

const AddressKind kAddresses[] = {
    {"home", {"S3a5e", "S3a5d", "S3a59", "S3a5c", "S3a5b", "S3a5a"}, "S801a"},
    {"work", {"S804a", "S8045", "S8046", "S8047", "S8048", "S8049"}, "S801b"},
    {"postal", {"S3a64", "S3a63", "S3a5f", "S3a62", "S3a61", "S3a60"}, "S801c"},
};

const char* const kNameColumns[] = {"S3a11", "S3a06", "S3a44", "S3a45", "S3a05"};

std::vector<std::string> AllColumns() {
  std::vector<std::string> out(std::begin(kNameColumns), std::end(kNameColumns));
  out.insert(out.end(), {"S3a16", "S3a18"});
  for (const SimpleLine& l : kSimpleLines) out.push_back(l.column);
  for (const AddressKind& a : kAddresses) {
    out.insert(out.end(), std::begin(a.columns), std::end(a.columns));
    out.push_back(a.label);
  }
  return out;
}

// The value a reader gets back for `text`.
std::string ReadValue(std::string_view text, Kind kind, TextMode mode) {
  return testing::ReadBackText(text,
                               kind == Kind::kText        ? "\n"
                               : kind == Kind::kMultiLine ? "\r\n"
                                                          : " ",
                               mode);
}

struct Item {
  store::ContactRecord record;
  std::string note;
  std::optional<Bytes> picture;
};

Values Expected(const Item& item, TextMode mode) {
  const auto& s = item.record.strings;
  auto get = [&](const std::string& column) {
    auto it = s.find(column);
    return it == s.end() ? std::string() : it->second;
  };
  auto text = [&](const std::string& column, Kind kind = Kind::kText) {
    return ReadValue(get(column), kind, mode);
  };
  Values v = {{"VERSION", "2.1"}};
  static const char* const kNameParts[] = {"family", "given", "additional", "prefix", "suffix"};
  for (int i = 0; i < 5; ++i) {
    std::string part = text(kNameColumns[i]);
    if (i == 0 && mode.utf8) std::replace(part.begin(), part.end(), ',', ';');
    v.emplace_back(std::string("N.") + kNameParts[i], part);
  }
  std::string full;
  for (const char* column : {"S3a45", "S3a06", "S3a44", "S3a11", "S3a05"}) {
    if (get(column).empty()) continue;
    if (!full.empty()) full += " ";
    full += text(column);
  }
  for (const char* column : {"S3a16", "S3a4f", "S8083"}) {
    if (full.empty()) full = text(column);
  }
  v.emplace_back("FN", full);
  if (!get("S3a16").empty() || !get("S3a18").empty()) {
    v.emplace_back("ORG.0", text("S3a16"));
    if (!get("S3a18").empty()) v.emplace_back("ORG.1", text("S3a18"));
  }
  for (const SimpleLine& l : kSimpleLines) {
    if (!get(l.column).empty()) v.emplace_back(l.key, text(l.column));
  }
  static const char* const kAdrParts[] = {"box", "street", "city", "region", "code", "country"};
  for (const AddressKind& a : kAddresses) {
    const std::string adr = std::string("ADR;") + a.type + ".";
    bool any = false;
    for (const char* column : a.columns) any |= !get(column).empty();
    if (any) {
      v.emplace_back(adr + "extended", "");
      for (int i = 0; i < 6; ++i) {
        v.emplace_back(adr + kAdrParts[i],
                       text(a.columns[i], i == 1 ? Kind::kStreet : Kind::kText));
      }
    }
    if (!get(a.label).empty()) {
      v.emplace_back(std::string("LABEL;") + a.type, text(a.label, Kind::kMultiLine));
    }
  }
  if (item.record.birthday) v.emplace_back("BDAY", kBirthdayText);
  if (item.record.anniversary) v.emplace_back("X-MS-ANNIVERSARY", kAnniversaryText);
  if (!item.note.empty()) v.emplace_back("NOTE", ReadValue(item.note, Kind::kMultiLine, mode));
  if (item.picture && !item.picture->empty()) {
    v.emplace_back("PHOTO", std::string(item.picture->begin(), item.picture->end()));
  }
  std::sort(v.begin(), v.end());
  return v;
}

// ---- The records.

const char* const kScripts[] = {
    "Ødegård Æblegrød",      // Latin
    "Пётр Иванов",           // Cyrillic
    "Γιώργος Παπαδόπουλος",  // Greek
    "山田太郎 やまだ",       // Japanese
    "محمد العربي",           // Arabic
    "😀 Emoji 🎉",             // outside the BMP
};

Item FilledWith(const std::function<std::string(const std::string& column, size_t i)>& value) {
  Item item;
  const std::vector<std::string> columns = AllColumns();
  for (size_t i = 0; i < columns.size(); ++i) {
    item.record.strings[columns[i]] = value(columns[i], i);
  }
  item.record.birthday = kBirthday;
  item.record.anniversary = kAnniversary;
  return item;
}

// A card with one column set.
Item Only(const char* column, const char* value) {
  Item item;
  item.record.strings[column] = value;
  return item;
}

struct CardCase {
  const char* name;
  std::function<Item()> make;
};

const CardCase kCardCases[] = {
    {"Full",
     [] {
       Item item = FilledWith([](const std::string& c, size_t) { return "Value " + c; });
       item.record.strings["S801a"] = "Main Street 1\r\nBack door\r\n0150 Oslo";
       item.record.strings["S3a5d"] = "Main Street 1\r\nBack door";
       item.note = "First line\r\nSecond line";
       item.picture = Bytes{0xFF, 0xD8, 0xFF, 0xE0, 0x00, 0x10, 'J', 'F', 'I', 'F', 0x00};
       return item;
     }},
    // The full name falls back to what there is.
    {"GivenNameOnly", [] { return Only("S3a06", "Anna"); }},
    {"SurnameOnly", [] { return Only("S3a11", "Berg, Jr."); }},
    {"CompanyOnly", [] { return Only("S3a16", "Acme; Sons, Ltd"); }},
    {"Empty", [] { return Item(); }},
    {"Hostile",
     [] {
       Item item = FilledWith([](const std::string& c, size_t i) {
         static const char* const kHostile[] = {"a;b,c\\d\r\nEND:VCARD\r\nBEGIN:VCARD",
                                                "x\ny\rz:\x01\x07=3D=\r\n",
                                                "\\n\\,\\;",
                                                ";;;;",
                                                ",,,",
                                                "=",
                                                " leading and trailing ",
                                                "\r\n"};
         return std::string(kHostile[i % std::size(kHostile)]) + c;
       });
       item.record.strings["S3a11"] = "O'Neil, Jr.;\r\nFN:Mallory";
       item.note = "=0D=0A literal\r\nEND:VCARD\r\n\r\n" + Repeat("a=b ", 40) + "\r\n\r\n";
       return item;
     }},
    {"Long",
     [] {
       Item item = FilledWith([](const std::string& c, size_t i) {
         return c + " " + Repeat(i % 2 ? "Wort, Satz; " : "xyzzy", 30);
       });
       item.note = Repeat("A long note line that goes on and on with spaces ", 12) + "\r\n" +
                   Repeat("=", 200);
       item.picture = Bytes(3000);
       for (size_t i = 0; i < item.picture->size(); ++i) (*item.picture)[i] = uint8_t(i * 7);
       return item;
     }},
    {"Scripts",
     [] {
       Item item = FilledWith([](const std::string& c, size_t i) {
         return std::string(kScripts[i % std::size(kScripts)]) + " " + c;
       });
       item.record.strings["S3a17"] = Repeat("日本語の長い肩書き", 12);
       item.note = Repeat("Заметка на русском языке, ", 8) + "\r\n" + Repeat("メモ", 60);
       return item;
     }},
};

void PrintTo(const CardCase& c, std::ostream* os) { *os << c.name; }

class VCardReadBackTest : public testing::BerlinTest,
                          public ::testing::WithParamInterface<std::tuple<CardCase, TextMode>> {};

TEST_P(VCardReadBackTest, ReaderFindsEveryValue) {
  const auto& [card, mode] = GetParam();
  const Item item = card.make();
  VCardContact contact = ContactFromRecord(item.record);
  contact.note = item.note;
  contact.picture = item.picture;
  const std::string file = ComposeVCard(contact, mode);
  testing::ExpectWellFormedLines(file);
  EXPECT_EQ(file.rfind("END:VCARD\r\n"), file.size() - 11);

  const testing::ReadBack read =
      testing::ReadWithPython(kReadVCard, file, ".vcf", testing::Codec(mode), "vobject");
  if (read.skipped) GTEST_SKIP() << read.skip_reason;
  ASSERT_EQ(read.failure, "") << file;
  EXPECT_EQ(read.values, Expected(item, mode)) << file;
}

INSTANTIATE_TEST_SUITE_P(Cards, VCardReadBackTest,
                         ::testing::Combine(::testing::ValuesIn(kCardCases),
                                            ::testing::ValuesIn(testing::kModes)),
                         testing::CaseName<CardCase>);

// The exact lines, where the labels, the order and the two text modes show: in UTF-8 mode
// every text line says its charset, and the family name's comma becomes a separator.
class VCardLinesTest : public testing::BerlinTest {};

TEST_F(VCardLinesTest, WritesLinesInOrderWithLabelsOfEitherMode) {
  store::ContactRecord record;
  record.strings = {{"S3a06", "Anna"},
                    {"S3a11", "Berg, Jr"},
                    {"S3a16", "Acme"},
                    {"S8083", "anna@example.org"},
                    {"S3a5d", "Main St 1\r\nBack door"},
                    {"S3a59", "Oslo"},
                    {"S801a", "Main St 1\r\nOslo"},
                    {"S3a08", "+47 1"},
                    {"S3a09", "+47 2"},
                    {"S3a17", "Boss"}};
  record.birthday = kBirthday;
  const VCardContact contact = ContactFromRecord(record);
  const std::string utf8 =
      "BEGIN:VCARD\r\n"
      "VERSION:2.1\r\n"
      "N;CHARSET=utf-8:Berg\\; Jr;Anna;;;\r\n"
      "FN;CHARSET=utf-8:Anna Berg\\, Jr\r\n"
      "ORG;CHARSET=utf-8:Acme\r\n"
      "EMAIL;CHARSET=utf-8:anna@example.org\r\n"
      "ADR;TYPE=home;CHARSET=utf-8:;;Main St 1 Back door;Oslo;;;\r\n"
      "LABEL;TYPE=home;ENCODING=QUOTED-PRINTABLE;CHARSET=utf-8:Main St 1=0D=0A=\r\n"
      "Oslo\r\n"
      "TEL;TYPE=work,voice:+47 1\r\n"
      "TEL;TYPE=home,voice:+47 2\r\n"
      "TITLE;CHARSET=utf-8:Boss\r\n"
      "BDAY:1980-05-17\r\n"
      "END:VCARD\r\n";
  std::string ansi = utf8;
  for (size_t at; (at = ansi.find(";CHARSET=utf-8")) != std::string::npos;) ansi.erase(at, 14);
  ansi.replace(ansi.find("Berg\\;"), 6, "Berg\\,");
  EXPECT_EQ(ComposeVCard(contact, {true, kDefaultCodePage}), utf8);
  EXPECT_EQ(ComposeVCard(contact, {false, 1252}), ansi);
}

TEST(VCardWriterTest, FindsThePictureAttachmentByName) {
  std::vector<store::AttachmentRecord> attachments(3);
  const char* const kNames[] = {"ContactPictures.txt", "contactpicture.JPG", "ContactPicture"};
  for (uint8_t i = 0; i < 3; ++i) {
    attachments[i].name = kNames[i];
    attachments[i].data = {i};
  }
  const Bytes* picture = FindContactPicture(attachments);
  ASSERT_NE(picture, nullptr);
  EXPECT_EQ(*picture, Bytes{1});
  attachments.erase(attachments.begin() + 1, attachments.end());
  EXPECT_EQ(FindContactPicture(attachments), nullptr);
}

}  // namespace
}  // namespace tarnwell::render
