#include "mapi/import/internet_message_import.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "base/date_text.h"
#include "base/text.h"
#include "mapi/import/import_test_support.h"
#include "mapi/property_tags.h"
#include "store/rtf_decompressor.h"

namespace tarnwell::mapi {
namespace {

using testing::Compose;
using testing::ExpectStrings;
using testing::Str;
using testing::Utc;
using testing::View;

std::optional<uint64_t> Time(const PropertyBag& bag, uint16_t id) {
  const PropertyValue* v = bag.Find(id);
  return v ? v->AsSysTime() : std::nullopt;
}

Message Import(const std::string& eml) {
  Message m;
  Status s = ImportInternetMessage(View(eml), &m);
  EXPECT_TRUE(s.ok()) << s.message();
  return m;
}

store::AttachmentRecord MakeAttachment(std::string name, std::string data) {
  store::AttachmentRecord a;
  a.name = std::move(name);
  a.data.assign(data.begin(), data.end());
  return a;
}

// ---- What the composer writes comes back

TEST(InternetMessageImport, ComposedMailRoundTrips) {
  store::MessageRecord record;
  const std::string html = "<html><body><p>Grüße = 100%</p></body></html>";
  record.body.assign(html.begin(), html.end());
  render::HeaderStrings h;
  h.from = "\"Sender, Séverine\" <severine@example.com>";
  h.to = "Anna Ärger <anna@example.com>, bob@example.org";
  h.cc = "carol@example.net";
  h.subject = "RE: Grüße aus Köln";
  h.date_text = "05/03/2021 14:07:09";
  const Message m =
      Import(Compose(record,
                     {MakeAttachment("résumé final.pdf", std::string("%PDF\0\x01\xFF", 7)),
                      MakeAttachment("notes.txt", "line one\r\nline two\r\n")},
                     h));
  const PropertyBag& p = m.properties;
  ExpectStrings(p, {{kPidMessageClass, "IPM.Note"},
                    {kPidSubject, h.subject},
                    {kPidSubjectPrefix, "RE: "},
                    {kPidNormalizedSubject, "Grüße aus Köln"},
                    {kPidSentRepresentingName, "Sender, Séverine"},
                    {kPidSentRepresentingEmailAddress, "severine@example.com"},
                    {kPidSenderSmtpAddress, "severine@example.com"},
                    {kPidSenderAddressType, "SMTP"},
                    {kPidDisplayTo, "Anna Ärger; bob@example.org"},
                    {kPidDisplayCc, "carol@example.net"},
                    {kPidDisplayBcc, ""}});

  ASSERT_EQ(m.recipients.size(), 3u);
  const struct {
    int32_t type;
    const char* name;
    const char* address;
  } expected[] = {{kRecipientTo, "Anna Ärger", "anna@example.com"},
                  {kRecipientTo, "bob@example.org", "bob@example.org"},
                  {kRecipientCc, "carol@example.net", "carol@example.net"}};
  for (size_t i = 0; i < m.recipients.size(); ++i) {
    const PropertyBag& r = m.recipients[i];
    EXPECT_EQ(r.Int32(kPidRecipientType), expected[i].type);
    ExpectStrings(r, {{kPidDisplayName, expected[i].name},
                      {kPidRecipientDisplayName, expected[i].name},
                      {kPidEmailAddress, expected[i].address},
                      {kPidSmtpAddress, expected[i].address},
                      {kPidAddressType, "SMTP"}});
  }

  // The date text is local time; the header carries the offset, so both agree on the instant.
  EXPECT_EQ(Time(p, kPidClientSubmitTime), FileTimeFromDateText(h.date_text));
  EXPECT_EQ(Time(p, kPidMessageDeliveryTime), FileTimeFromDateText(h.date_text));
  EXPECT_EQ(p.Int32(kPidImportance), kImportanceNormal);  // X-Priority 3
  EXPECT_EQ(p.Int32(kPidMessageFlags), kMsgFlagRead | kMsgFlagHasAttach);
  EXPECT_NE(Str(p, kPidTransportMessageHeaders).find("X-My-Field: My value"), std::string::npos);

  const PropertyValue* html_value = p.Find(kPidHtml);
  ASSERT_NE(html_value, nullptr);
  EXPECT_EQ(html_value->type, kTypeBinary);
  EXPECT_EQ(ByteView(html_value->data).ToString(), html);
  EXPECT_EQ(p.Int32(kPidInternetCodepage), int32_t(kCodePageUtf8));
  EXPECT_EQ(p.Find(kPidBody), nullptr);

  ASSERT_EQ(m.attachments.size(), 2u);
  const Attachment& pdf = m.attachments[0];
  EXPECT_EQ(pdf.data, Bytes({'%', 'P', 'D', 'F', 0, 1, 0xFF}));
  EXPECT_EQ(pdf.properties.Int32(kPidAttachMethod), kAttachByValue);
  EXPECT_EQ(pdf.properties.Int32(kPidAttachSize), 7);
  ExpectStrings(pdf.properties, {{kPidAttachLongFilename, "résumé final.pdf"},
                                 {kPidAttachExtension, ".pdf"},
                                 {kPidAttachFilename, "RSUMFI~1.PDF"},
                                 {kPidAttachMimeTag, "application/pdf"},
                                 {kPidAttachContentId, "résumé final.pdf"}});
  // A named text part is an attachment, not a second body.
  EXPECT_EQ(ByteView(m.attachments[1].data).ToString(), "line one\r\nline two\r\n");
  EXPECT_EQ(Str(m.attachments[1].properties, kPidAttachMimeTag), "application/octet-stream");
}

TEST(InternetMessageImport, PlainBodyAndAnsiHeadersRoundTrip) {
  store::MessageRecord record;
  record.body_is_text = true;
  const std::string text = "Zeile 1\r\nZeile 2 €\r\n";
  record.body.assign(text.begin(), text.end());
  render::HeaderStrings h;
  h.from = "Jürgen <j@example.com>";
  h.subject = "AW: Preis";
  for (bool store_text : {true, false}) {
    SCOPED_TRACE(store_text ? "utf-8 headers" : "windows-1252 headers");
    const Message m = Import(Compose(record, {}, h, store_text));
    ExpectStrings(
        m.properties,
        {{kPidBody, text}, {kPidSentRepresentingName, "Jürgen"}, {kPidSubjectPrefix, "AW: "}});
    EXPECT_EQ(m.properties.Int32(kPidMessageFlags), kMsgFlagRead);
    EXPECT_TRUE(m.attachments.empty());
  }
}

// The database's display lines carry names without addresses: semicolons
// separate them, a comma belongs to a name.
TEST(InternetMessageImport, DisplayNamesWithoutAddresses) {
  struct Case {
    const char* to;
    std::vector<std::string> names;
  };
  for (const Case& c :
       {Case{"Müller, Jürgen", {"Müller, Jürgen"}}, Case{"Пётр; Anna B", {"Пётр", "Anna B"}}}) {
    store::MessageRecord record;
    record.body = {'x'};
    record.body_is_text = true;
    render::HeaderStrings h;
    h.to = c.to;
    h.subject = "s";
    const Message m = Import(Compose(record, {}, h));
    std::vector<std::string> names;
    for (const PropertyBag& r : m.recipients) names.push_back(Str(r, kPidDisplayName));
    EXPECT_EQ(names, c.names) << c.to;
  }
}

// ---- Messages written by other programs

struct ForeignCase {
  const char* name;
  const char* eml;
  void (*check)(const Message&);
};

const ForeignCase kForeignCases[] = {
    {"EncodedWordsAndAlternative",
     "From: =?ISO-8859-1?Q?Andr=E9?= Pirard <PIRARD@vm1.ulg.ac.be>\r\n"
     "To: =?UTF-8?B?w4TDpA==?= <ae@example.com>, \"Doe, John\" <john@example.com>\r\n"
     "Subject: =?ISO-8859-1?B?SWYgeW91IGNhbiByZWFkIHRoaXMgeW8=?=\r\n"
     " =?ISO-8859-2?B?dSB1bmRlcnN0YW5kIHRoZSBleGFtcGxlLg==?=\r\n"
     "Date: Fri, 05 Mar 2021 14:07:09 +0100\r\n"
     "Message-ID: <abc@example.com>\r\n"
     "In-Reply-To: <parent@example.com>\r\n"
     "X-Priority: 1 (Highest)\r\n"
     "MIME-Version: 1.0\r\n"
     "Content-Type: multipart/alternative; boundary=\"b1\"\r\n"
     "\r\n"
     "--b1\r\n"
     "Content-Type: text/plain; charset=iso-8859-1\r\n"
     "Content-Transfer-Encoding: quoted-printable\r\n"
     "\r\n"
     "Gr=FC=DFe\r\n"
     "--b1\r\n"
     "Content-Type: text/html; charset=iso-8859-1\r\n"
     "\r\n"
     "<p>Gr\xFC\xDF"
     "e</p>\r\n"
     "--b1--\r\n",
     [](const Message& m) {
       const PropertyBag& p = m.properties;
       ExpectStrings(p, {{kPidSubject, "If you can read this you understand the example."},
                         {kPidSubjectPrefix, ""},
                         {kPidSentRepresentingName, "André Pirard"},
                         {kPidDisplayTo, "Ää; Doe, John"},
                         {kPidInternetMessageId, "<abc@example.com>"},
                         {kPidInReplyToId, "<parent@example.com>"},
                         {kPidBody, "Grüße"}});
       ASSERT_EQ(m.recipients.size(), 2u);
       EXPECT_EQ(Str(m.recipients[1], kPidDisplayName), "Doe, John");
       EXPECT_EQ(Time(p, kPidClientSubmitTime), Utc(1614949629));
       EXPECT_EQ(p.Int32(kPidImportance), kImportanceHigh);
       // HTML stays in its own charset, and says which.
       EXPECT_EQ(ByteView(p.Find(kPidHtml)->data).ToString(),
                 "<p>Gr\xFC\xDF"
                 "e</p>");
       EXPECT_EQ(p.Int32(kPidInternetCodepage), 28591);
       EXPECT_TRUE(m.attachments.empty());
     }},
    {"NestedMessageAndRfc2231Name",
     "From: a@example.com\r\n"
     "To: undisclosed-recipients:;\r\n"
     "Subject: outer\r\n"
     "Content-Type: multipart/mixed; boundary=outer\r\n"
     "\r\n"
     "--outer\r\n"
     "Content-Type: text/plain\r\n"
     "\r\n"
     "see attached\r\n"
     "--outer\r\n"
     "Content-Type: message/rfc822\r\n"
     "\r\n"
     "From: b@example.com\r\n"
     "Subject: inner\r\n"
     "Content-Type: multipart/mixed; boundary=inner\r\n"
     "\r\n"
     "--inner\r\n"
     "Content-Type: text/plain\r\n"
     "\r\n"
     "inner body\r\n"
     "--inner\r\n"
     "Content-Type: application/octet-stream\r\n"
     "Content-Disposition: attachment; filename*=utf-8''%C3%A4rger.bin\r\n"
     "Content-Transfer-Encoding: base64\r\n"
     "\r\n"
     "AAEC\r\n"
     "--inner--\r\n"
     "--outer--\r\n",
     [](const Message& m) {
       EXPECT_TRUE(m.recipients.empty());  // a group without members
       EXPECT_EQ(Str(m.properties, kPidBody), "see attached");
       ASSERT_EQ(m.attachments.size(), 1u);
       const Attachment& a = m.attachments[0];
       EXPECT_EQ(a.properties.Int32(kPidAttachMethod), kAttachEmbeddedMessage);
       EXPECT_EQ(Str(a.properties, kPidDisplayName), "inner");
       ASSERT_TRUE(a.embedded);
       ExpectStrings(a.embedded->properties, {{kPidSubject, "inner"}, {kPidBody, "inner body"}});
       ASSERT_EQ(a.embedded->attachments.size(), 1u);
       EXPECT_EQ(Str(a.embedded->attachments[0].properties, kPidAttachLongFilename), "ärger.bin");
       EXPECT_EQ(a.embedded->attachments[0].data, Bytes({0, 1, 2}));
     }},
    {"UnclosedMultipartAndBareLineEnds",
     "From: x@example.com\nSubject: cut\nContent-Type: multipart/mixed; boundary=zz\n\n"
     "--zz\nContent-Type: text/plain\n\nbody text\n"
     "--zz\nContent-Type: image/png; name=\"p.png\"\nContent-Transfer-Encoding: base64\n\niVBO",
     [](const Message& m) {
       EXPECT_EQ(Str(m.properties, kPidBody), "body text");
       ASSERT_EQ(m.attachments.size(), 1u);
       ExpectStrings(m.attachments[0].properties,
                     {{kPidAttachLongFilename, "p.png"}, {kPidAttachMimeTag, "image/png"}});
     }},
    {"AddressForms",
     "From: (Comment Name) plain@example.com\r\n"
     "To: Group: one@example.com, \"Two \\\"Q\\\"\" <two@example.com>;, "
     "<three@example.com>\r\n"
     "Bcc: four@example.com (Four)\r\n"
     "\r\nbody",
     [](const Message& m) {
       ExpectStrings(m.properties, {{kPidSentRepresentingName, "Comment Name"},
                                    {kPidSentRepresentingEmailAddress, "plain@example.com"},
                                    {kPidBody, "body"}});
       ASSERT_EQ(m.recipients.size(), 4u);
       EXPECT_EQ(Str(m.recipients[0], kPidEmailAddress), "one@example.com");
       EXPECT_EQ(Str(m.recipients[1], kPidDisplayName), "Two \"Q\"");
       EXPECT_EQ(Str(m.recipients[2], kPidDisplayName), "three@example.com");
       EXPECT_EQ(m.recipients[3].Int32(kPidRecipientType), kRecipientBcc);
       EXPECT_EQ(Str(m.recipients[3], kPidDisplayName), "Four");
     }},
};

class ForeignMessage : public ::testing::TestWithParam<ForeignCase> {};

TEST_P(ForeignMessage, Imports) { GetParam().check(Import(GetParam().eml)); }

INSTANTIATE_TEST_SUITE_P(InternetMessageImport, ForeignMessage, ::testing::ValuesIn(kForeignCases),
                         [](const auto& info) { return std::string(info.param.name); });

// ---- Damaged input

TEST(InternetMessageImport, DamagedInput) {
  // Without a header there is nothing to import.
  for (const char* eml : {"", "\r\n\r\nno header at all", "\x01\x02\x03"}) {
    Message m;
    EXPECT_EQ(ImportInternetMessage(View(eml), &m).code(), Status::Code::kCorruption) << eml;
  }
  // Embedding is followed to a bounded depth; the level past the limit is kept, as a file.
  std::string eml = "Subject: innermost\r\n\r\nbody";
  for (int i = 0; i < 3 * kMaxEmbeddedDepth; ++i) {
    eml = "Subject: level\r\nContent-Type: message/rfc822\r\n\r\n" + eml;
  }
  const Message deep = Import(eml);
  int depth = 0;
  const Message* at = &deep;
  for (; !at->attachments.empty() && at->attachments[0].embedded; ++depth) {
    at = at->attachments[0].embedded.get();
  }
  EXPECT_EQ(depth, kMaxEmbeddedDepth);
  ASSERT_EQ(at->attachments.size(), 1u);
  EXPECT_EQ(at->attachments[0].properties.Int32(kPidAttachMethod), kAttachByValue);
  // Cut and damaged composed messages do not crash.
  store::MessageRecord record;
  record.body_is_text = true;
  record.body = Bytes(300, 'x');
  record.rtf_body = Bytes(200, '{');
  render::HeaderStrings h;
  h.from = "A <a@example.com>";
  h.to = "b@example.com";
  h.subject = "=?utf-8?Q?broken";
  const std::string whole = Compose(record, {MakeAttachment("a.bin", std::string(500, '\x80'))}, h);
  uint32_t seed = 12345;
  for (size_t cut = 0; cut < whole.size(); cut += 7) {
    std::string damaged = whole.substr(0, cut);
    for (char& c : damaged) {
      seed = seed * 1103515245 + 12345;
      if ((seed >> 16) % 50 == 0) c = char(seed >> 24);
    }
    Message m;
    ImportInternetMessage(View(damaged), &m);
  }
}

// ---- Pieces

TEST(ParseInternetDate, Forms) {
  const struct {
    const char* text;
    std::optional<int64_t> unix_seconds;
  } cases[] = {
      {"Fri, 05 Mar 2021 14:07:09 +0100", 1614949629},
      {"5 Mar 2021 13:07:09 GMT", 1614949629},
      {"Fri, 5 Mar 21 08:07:09 EST", 1614949629},
      {"Fri, 05 Mar 2021 13:07 +0000 (UTC)", 1614949620},
      {"Mon, 29 Feb 2016 23:59:59 -0130", 1456795799},
      {"Thu, 01 Jan 1970 00:00:00 +0000", 0},
      {"Fri, 31 Feb 2021 10:00:00 +0000", std::nullopt},
      {"Fri, 05 Foo 2021 10:00:00 +0000", std::nullopt},
      {"Fri, 05 Mar 2021 25:00:00 +0000", std::nullopt},
      {"yesterday", std::nullopt},
      {"", std::nullopt},
  };
  for (const auto& c : cases) {
    std::optional<uint64_t> expected;
    if (c.unix_seconds) expected = Utc(*c.unix_seconds);
    EXPECT_EQ(ParseInternetDate(c.text), expected) << c.text;
  }
}

TEST(CompressRtf, RoundTripsThroughTheDecoder) {
  std::string random(5000, ' ');
  uint32_t seed = 7;
  for (char& c : random) {
    seed = seed * 1664525 + 1013904223;
    c = char(seed >> 24);
  }
  std::string repetitive;
  for (int i = 0; repetitive.size() < 60000; ++i) {
    repetitive += "{\\par\\pard\\plain Line " + std::to_string(i % 97) + " of the body}\r\n";
  }
  const std::string inputs[] = {
      "",
      "{",
      std::string(store::kRtfPrebuffer),  // all of it already in the dictionary
      "{\\rtf1\\ansi\\ansicpg1252\\pard hello}\r\n",
      std::string(10000, 'a'),  // references that must not read what they write
      random,
      repetitive,
  };
  for (const std::string& in : inputs) {
    const Bytes compressed = CompressRtf(View(in));
    EXPECT_EQ(store::CheckRtfCrc(ByteView(compressed)), store::RtfCrcStatus::kMatch);
    std::optional<store::RtfText> out = store::DecompressRtf(ByteView(compressed));
    ASSERT_TRUE(out) << in.size();
    EXPECT_TRUE(out->complete);
    EXPECT_EQ(out->body().ToString(), in) << in.size();
  }
  EXPECT_LT(CompressRtf(View(repetitive)).size(), repetitive.size() / 4);
}

TEST(OneOffEntryId, Layout) {
  const Bytes id = OneOffEntryId("Jürgen", "SMTP", "j@example.com");
  const Bytes provider = {0x81, 0x2B, 0x1F, 0xA4, 0xBE, 0xA3, 0x10, 0x19,
                          0x9D, 0x6E, 0x00, 0xDD, 0x01, 0x0F, 0x54, 0x02};
  ASSERT_GT(id.size(), 24u);
  EXPECT_EQ(LoadU32LE(id.data()), 0u);
  EXPECT_EQ(Bytes(id.begin() + 4, id.begin() + 20), provider);
  EXPECT_EQ(LoadU16LE(id.data() + 20), 0u);
  EXPECT_TRUE(LoadU16LE(id.data() + 22) & 0x8000);  // Unicode strings
  EXPECT_EQ(Utf16LEToUtf8(ByteView(id).From(24)), std::string("Jürgen\0SMTP\0j@example.com\0", 27));
}

}  // namespace
}  // namespace tarnwell::mapi
