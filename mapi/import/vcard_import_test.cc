#include "mapi/import/vcard_import.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "base/date_time.h"
#include "mapi/property_tags.h"
#include "render/vcard_writer.h"
#include "render/writer_test_support.h"

namespace tarnwell::mapi {
namespace {

std::string Str(const PropertyBag& bag, uint16_t id) { return bag.String(id).value_or("<absent>"); }

std::string Named(const PropertyBag& bag, uint32_t lid) {
  const PropertyValue* v = bag.FindNamed(NamedId(kPsetidAddress, lid));
  return v ? v->AsString().value_or("<not text>") : "<absent>";
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
  c.surname = "M\xC3\xBCller";
  c.given_name = "J\xC3\xBCrgen";
  c.middle_name = "K.";
  c.prefix = "Dr.";
  c.suffix = "Jr.";
  c.company = "Acme; Sons";
  c.department = "R&D";
  c.nickname = "Jo";
  c.email[0] = "j@example.com";
  c.email[1] = "jm@example.org";
  c.home = {"PO 1", "Hauptstr. 5\r\nHinterhaus", "K\xC3\xB6ln", "NRW", "50667", "Germany", ""};
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

  EXPECT_EQ(Str(p, kPidMessageClass), "IPM.Contact");
  EXPECT_EQ(Str(p, kPidSurname), c.surname);
  EXPECT_EQ(Str(p, kPidGivenName), c.given_name);
  EXPECT_EQ(Str(p, kPidMiddleName), "K.");
  EXPECT_EQ(Str(p, kPidDisplayNamePrefix), "Dr.");
  EXPECT_EQ(Str(p, kPidGeneration), "Jr.");
  const std::string full = "Dr. J\xC3\xBCrgen K. M\xC3\xBCller Jr.";
  EXPECT_EQ(Str(p, kPidDisplayName), full);
  EXPECT_EQ(Str(p, kPidSubject), full);
  EXPECT_EQ(Named(p, kLidFileUnder), "M\xC3\xBCller, J\xC3\xBCrgen K.");
  EXPECT_EQ(Str(p, kPidCompanyName), "Acme; Sons");
  EXPECT_EQ(Str(p, kPidDepartmentName), "R&D");
  EXPECT_EQ(Str(p, kPidNickname), "Jo");
  EXPECT_EQ(Str(p, kPidTitle), "Chief, Tester");

  EXPECT_EQ(Named(p, kLidEmail1EmailAddress), "j@example.com");
  EXPECT_EQ(Named(p, kLidEmail1AddressType), "SMTP");
  EXPECT_EQ(Named(p, kLidEmail1DisplayName), full + " (j@example.com)");
  EXPECT_EQ(Named(p, kLidEmail1OriginalDisplayName), "j@example.com");
  EXPECT_EQ(Named(p, kLidEmail1EmailAddress + kLidEmailStride), "jm@example.org");
  EXPECT_EQ(Named(p, kLidEmail1EmailAddress + 2 * kLidEmailStride), "<absent>");
  EXPECT_EQ(p.FindNamed(NamedId(kPsetidAddress, kLidAddressBookProviderEmailList))->elements.size(),
            2u);

  EXPECT_EQ(Str(p, kPidBusinessTelephoneNumber), "+1 555 0100");
  EXPECT_EQ(Str(p, 0x3A1B), "+1 555 0101");  // second business number
  EXPECT_EQ(Str(p, kPidHomeTelephoneNumber), "+49 221 1");
  EXPECT_EQ(Str(p, kPidMobileTelephoneNumber), "+49 170 2");
  EXPECT_EQ(Str(p, kPidBusinessFaxNumber), "+1 555 0199");
  EXPECT_EQ(Str(p, 0x3A21), "99");     // pager
  EXPECT_EQ(Str(p, 0x3A2C), "TLX 1");  // telex
  EXPECT_EQ(Str(p, 0x3A30), "Ann");    // assistant

  // Home address: the writer puts a street's line break as a space.
  EXPECT_EQ(Str(p, 0x3A5E), "PO 1");
  EXPECT_EQ(Str(p, 0x3A5D), "Hauptstr. 5 Hinterhaus");
  EXPECT_EQ(Str(p, 0x3A59), "K\xC3\xB6ln");
  EXPECT_EQ(Str(p, 0x3A5B), "50667");
  EXPECT_EQ(Named(p, kLidHomeAddress),
            "Hauptstr. 5 Hinterhaus\r\nK\xC3\xB6ln NRW 50667\r\nGermany");
  EXPECT_EQ(Str(p, kPidStreetAddress), "1 Main St");
  EXPECT_EQ(Str(p, kPidLocality), "Springfield");
  EXPECT_EQ(Named(p, kLidWorkAddressCity), "Springfield");
  EXPECT_EQ(Named(p, kLidWorkAddressCountry), "USA");
  EXPECT_EQ(Named(p, kLidWorkAddress), "Acme\r\n1 Main St");  // the LABEL wins

  EXPECT_EQ(Str(p, kPidBusinessHomePage), "https://example.com/");
  EXPECT_EQ(LocalDate(p, kPidBirthday), "1980-01-01");
  EXPECT_EQ(LocalDate(p, kPidWeddingAnniversary), "2000-01-01");
  EXPECT_EQ(Str(p, kPidBody), c.note);

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
  EXPECT_EQ(Str(a.properties, kPidSurname), "contact");
  EXPECT_EQ(Str(a.properties, kPidGivenName), "(full name) A");
  EXPECT_EQ(Str(a.properties, kPidDisplayName), "(full name) A completely bogus contact");
  EXPECT_EQ(Str(a.properties, kPidTitle), "(job title) Manager, bogus division");
  EXPECT_EQ(Str(a.properties, kPidMobileTelephoneNumber), "(mobile) 0404 123 456");
  EXPECT_EQ(Named(a.properties, kLidEmail1EmailAddress), "email@emailland.com");

  const Message b = Import(read("Swetlana Novikova.vcf"));
  EXPECT_EQ(Str(b.properties, kPidDisplayName), "Swetlana Novikova");
  EXPECT_EQ(Str(b.properties, kPidCompanyName), "Scalabium Software");
  EXPECT_EQ(Str(b.properties, kPidBusinessHomePage), "http://www.scalabium.com");
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
  EXPECT_EQ(Str(p, kPidDisplayName), "Jane Doe");
  EXPECT_EQ(Named(p, kLidEmail1EmailAddress), "jane@example.com");
  EXPECT_EQ(Str(p, 0x3A25), "+1 2");
  EXPECT_EQ(Str(p, 0x3A1F), "+1 3");  // untyped: other telephone
  EXPECT_EQ(Str(p, kPidBody), "Caf\xC3\xA9\r\nau lait, bitte");
  EXPECT_EQ(Str(p, kPidStreetAddress), "Street\r\nSecond");
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
  EXPECT_EQ(Str(cut.properties, kPidDisplayName), "Cut");
  EXPECT_EQ(Str(cut.properties, kPidMobileTelephoneNumber), "1");
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
