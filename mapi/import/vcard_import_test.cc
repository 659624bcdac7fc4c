#include "mapi/import/vcard_import.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "base/date_time.h"
#include "mapi/import/import_test_support.h"
#include "mapi/property_tags.h"
#include "render/vcard_writer.h"
#include "render/writer_test_support.h"

namespace tarnwell::mapi {
namespace {

using testing::ExpectStrings;
using testing::Str;

std::string Named(const PropertyBag& bag, uint32_t lid) {
  return testing::NamedStr(bag, kPsetidAddress, lid);
}

Message Import(std::string_view text) {
  Message m;
  Status s = ImportVCard(text, &m);
  EXPECT_TRUE(s.ok()) << s.message();
  return m;
}

// The local calendar date of a FILETIME property, "yyyy-mm-dd".
std::string LocalDate(const PropertyBag& bag, uint16_t id) {
  const PropertyValue* v = bag.Find(id);
  if (!v || !v->AsSysTime()) return "<absent>";
  return FormatFileTime(*v->AsSysTime(), "%Y-%m-%d").value_or("<bad>");
}

// ---- What the vCard writer writes comes back

class VCardRoundTrip : public ::testing::TestWithParam<render::TextMode> {
 protected:
  render::testing::ScopedZone zone_{"Europe/Berlin"};
};

TEST_P(VCardRoundTrip, EveryFieldComesBack) {
  render::VCardContact c;
  c.surname = "Müller";
  c.given_name = "Jürgen";
  c.middle_name = "K.";
  c.prefix = "Dr.";
  c.suffix = "Jr.";
  c.company = "Acme; Sons";
  c.department = "R&D";
  c.nickname = "Jo";
  c.email[0] = "j@example.com";
  c.email[1] = "jm@example.org";
  c.home = {"PO 1", "Hauptstr. 5\r\nHinterhaus", "Köln", "NRW", "50667", "Germany", ""};
  c.business = {"", "1 Main St", "Springfield", "IL", "62701", "USA", "Acme\r\n1 Main St"};
  c.business_phone = "+1 555 0100";
  c.business_phone_2 = "+1 555 0101";
  c.home_phone = "+49 221 1";
  c.mobile_phone = "+49 170 2";
  c.business_fax = "+1 555 0199";
  c.pager = "99";
  c.telex = "TLX 1";
  c.job_title = "Chief, Tester";
  c.business_home_page = "https://example.com/";
  c.assistant = "Ann";
  c.birthday = *UnixTimeToFileTime(315532800 + 12 * 3600);  // 1980-01-01 noon UTC
  c.anniversary = *UnixTimeToFileTime(946684800);           // 2000-01-01
  c.note = "Line one; with \\ backslash\r\nLine two";
  c.picture = Bytes{0xFF, 0xD8, 0xFF, 0xE0, 0, 1, 2};
  const Message m = Import(render::ComposeVCard(c, GetParam()));
  const PropertyBag& p = m.properties;
  const std::string full = "Dr. Jürgen K. Müller Jr.";
  // The writer puts a street's line break as a space; a LABEL wins over the parts.
  ExpectStrings(p, {{kPidMessageClass, "IPM.Contact"},
                    {kPidSurname, c.surname},
                    {kPidGivenName, c.given_name},
                    {kPidMiddleName, "K."},
                    {kPidDisplayNamePrefix, "Dr."},
                    {kPidGeneration, "Jr."},
                    {kPidDisplayName, full},
                    {kPidSubject, full},
                    {kPidCompanyName, "Acme; Sons"},
                    {kPidDepartmentName, "R&D"},
                    {kPidNickname, "Jo"},
                    {kPidTitle, "Chief, Tester"},
                    {kPidBusinessTelephoneNumber, "+1 555 0100"},
                    {0x3A1B, "+1 555 0101"},  // second business number
                    {kPidHomeTelephoneNumber, "+49 221 1"},
                    {kPidMobileTelephoneNumber, "+49 170 2"},
                    {kPidBusinessFaxNumber, "+1 555 0199"},
                    {0x3A21, "99"},     // pager
                    {0x3A2C, "TLX 1"},  // telex
                    {0x3A30, "Ann"},    // assistant
                    {0x3A5E, "PO 1"},
                    {0x3A5D, "Hauptstr. 5 Hinterhaus"},
                    {0x3A59, "Köln"},
                    {0x3A5B, "50667"},
                    {kPidStreetAddress, "1 Main St"},
                    {kPidLocality, "Springfield"},
                    {kPidBusinessHomePage, "https://example.com/"},
                    {kPidBody, c.note}});
  testing::ExpectNamedStrings(
      p, kPsetidAddress,
      {{kLidFileUnder, "Müller, Jürgen K."},
       {kLidEmail1EmailAddress, "j@example.com"},
       {kLidEmail1AddressType, "SMTP"},
       {kLidEmail1DisplayName, full + " (j@example.com)"},
       {kLidEmail1OriginalDisplayName, "j@example.com"},
       {kLidEmail1EmailAddress + kLidEmailStride, "jm@example.org"},
       {kLidEmail1EmailAddress + 2 * kLidEmailStride, "<absent>"},
       {kLidHomeAddress, "Hauptstr. 5 Hinterhaus\r\nKöln NRW 50667\r\nGermany"},
       {kLidWorkAddressCity, "Springfield"},
       {kLidWorkAddressCountry, "USA"},
       {kLidWorkAddress, "Acme\r\n1 Main St"}});
  EXPECT_EQ(p.FindNamed(NamedId(kPsetidAddress, kLidAddressBookProviderEmailList))->elements.size(),
            2u);
  EXPECT_EQ(LocalDate(p, kPidBirthday), "1980-01-01");
  EXPECT_EQ(LocalDate(p, kPidWeddingAnniversary), "2000-01-01");

  ASSERT_EQ(m.attachments.size(), 1u);
  EXPECT_EQ(m.attachments[0].data, *c.picture);
  EXPECT_EQ(Str(m.attachments[0].properties, kPidAttachLongFilename), "ContactPicture.jpg");
  EXPECT_EQ(m.attachments[0].properties.Find(kPidAttachmentContactPhoto)->AsBool(), true);
  EXPECT_EQ(p.FindNamed(NamedId(kPsetidAddress, kLidHasPicture))->AsBool(), true);
}

INSTANTIATE_TEST_SUITE_P(VCardImport, VCardRoundTrip,
                         ::testing::Values(render::TextMode{true, 1252},
                                           render::TextMode{false, 1252}),
                         [](const auto& info) { return info.param.utf8 ? "Utf8" : "Ansi1252"; });

// ---- Files written by other programs

TEST(VCardImport, ExternalFiles) {
  const std::filesystem::path dir =
      std::filesystem::path(TARNWELL_EXTERNAL_FIXTURES) / "ruby-msg" / "msg";
  if (!std::filesystem::exists(dir / "contact.vcf")) GTEST_SKIP() << "no fixtures in " << dir;
  auto read = [&](const char* name) {
    std::ifstream in(dir / name, std::ios::binary);
    std::stringstream s;
    s << in.rdbuf();
    return s.str();
  };
  const Message a = Import(read("contact.vcf"));
  ExpectStrings(a.properties, {{kPidSurname, "contact"},
                               {kPidGivenName, "(full name) A"},
                               {kPidDisplayName, "(full name) A completely bogus contact"},
                               {kPidTitle, "(job title) Manager, bogus division"},
                               {kPidMobileTelephoneNumber, "(mobile) 0404 123 456"}});
  EXPECT_EQ(Named(a.properties, kLidEmail1EmailAddress), "email@emailland.com");

  const Message b = Import(read("Swetlana Novikova.vcf"));
  ExpectStrings(b.properties, {{kPidDisplayName, "Swetlana Novikova"},
                               {kPidCompanyName, "Scalabium Software"},
                               {kPidBusinessHomePage, "http://www.scalabium.com"}});
  EXPECT_EQ(Named(b.properties, kLidEmail1EmailAddress), "support@scalabium.com");
}

TEST(VCardImport, SyntaxVariants) {
  const char* card =
      "junk before the card\r\n"
      "BEGIN:VCARD\r\n"
      "VERSION:3.0\r\n"
      "N:Doe;Jane;;;\r\n"
      "FN:Jane\r\n"
      "  Doe\r\n"  // folded: the first blank of the continuation goes
      "item1.EMAIL;type=INTERNET;type=pref:jane@example.com\n"
      "TEL;TYPE=\"home,fax\":+1 2\r\n"
      "TEL:+1 3\r\n"
      "NOTE;ENCODING=QUOTED-PRINTABLE;CHARSET=ISO-8859-1:Caf=E9=0D=0A=\r\n"
      "au lait\\, bitte\r\n"
      "ADR;TYPE=WORK:;;Street\\nSecond;Town;;;\r\n"
      "PHOTO;VALUE=uri:data:image/png;base64,iVBORw==\r\n"
      "CATEGORIES:Friends,Work\r\n"
      "a line without a colon\r\n"
      "BEGIN:VCARD\r\nFN:Agent Smith\r\nEND:VCARD\r\n"  // an embedded AGENT card
      "BDAY:19991231\r\n"
      "END:VCARD\r\n"
      "BEGIN:VCARD\r\nFN:Second card\r\nEND:VCARD\r\n";
  render::testing::ScopedZone zone("UTC");
  const Message m = Import(card);
  const PropertyBag& p = m.properties;
  ExpectStrings(p, {{kPidDisplayName, "Jane Doe"},
                    {0x3A25, "+1 2"},
                    {0x3A1F, "+1 3"},  // untyped: other telephone
                    {kPidBody, "Café\r\nau lait, bitte"},
                    {kPidStreetAddress, "Street\r\nSecond"}});
  EXPECT_EQ(Named(p, kLidEmail1EmailAddress), "jane@example.com");
  ASSERT_EQ(m.attachments.size(), 1u);
  EXPECT_EQ(Str(m.attachments[0].properties, kPidAttachLongFilename), "ContactPicture.png");
  EXPECT_EQ(m.attachments[0].data, Bytes({0x89, 'P', 'N', 'G'}));
  EXPECT_EQ(p.FindNamed(NamedString(kPsPublicStrings, "Keywords"))->AsStrings(),
            (std::vector<std::string>{"Friends", "Work"}));
  EXPECT_EQ(LocalDate(p, kPidBirthday), "1999-12-31");
}

TEST(VCardImport, DamagedInput) {
  Message m;
  EXPECT_EQ(ImportVCard("", &m).code(), Status::Code::kCorruption);
  EXPECT_EQ(ImportVCard("FN:no begin\r\n", &m).code(), Status::Code::kCorruption);
  // Cut short: what was read is kept.
  const Message cut = Import("BEGIN:VCARD\r\nFN:Cut\r\nN:Cut;Short\r\nTEL;TYPE=cell:1");
  ExpectStrings(cut.properties, {{kPidDisplayName, "Cut"}, {kPidMobileTelephoneNumber, "1"}});
  // Broken encodings and dates are skipped, not fatal.
  Import(
      "BEGIN:VCARD\r\nPHOTO;ENCODING=b:!!!!\r\nBDAY:1999-02-31\r\nBDAY:x\r\nN:;;;;;;;;\r\n"
      "NOTE;ENCODING=QUOTED-PRINTABLE:=\r\nEND:VCARD\r\n");
  // Every prefix of a full card.
  render::VCardContact c;
  c.surname = "S";
  c.email[0] = "e@example.com";
  c.home.street = "1 Road";
  c.note = "n\r\nn";
  c.birthday = 0;
  c.picture = Bytes(100, 7);
  const std::string whole = render::ComposeVCard(c, {});
  for (size_t cut = 0; cut <= whole.size(); ++cut) {
    Message part;
    ImportVCard(std::string_view(whole).substr(0, cut), &part);
  }
  // A soft line break at the very end of the file.
  Import("BEGIN:VCARD\r\nNOTE;QUOTED-PRINTABLE:abc=");
}

TEST(ContentLines, Unfolding) {
  const std::vector<ContentLine> lines = ReadContentLines(
      "A;X=\"a:b;c\";Y=1,2:v1\r\n \tcont\rB:v2\nC;QUOTED-PRINTABLE:x=\n=41\r\n\r\n", 10);
  ASSERT_EQ(lines.size(), 3u);
  EXPECT_EQ(lines[0].Param("X"), "a:b;c");
  EXPECT_EQ(lines[0].raw_value, "v1\tcont");
  EXPECT_EQ(lines[0].params.size(), 3u);  // Y has two values
  EXPECT_EQ(lines[1].raw_value, "v2");
  EXPECT_EQ(lines[2].Text(), "xA");
  EXPECT_EQ(ReadContentLines("A:1\r\nB:2\r\nC:3\r\n", 2).size(), 2u);
  EXPECT_EQ(SplitStructured("a\\;b;c\\\\;d"), (std::vector<std::string>{"a;b", "c\\", "d"}));
}

}  // namespace
}  // namespace tarnwell::mapi
