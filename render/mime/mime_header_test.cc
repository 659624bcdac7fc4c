#include "render/mime/mime_header.h"

#include <gtest/gtest.h>

#include <regex>
#include <string>
#include <vector>

#include "render/mime/mime_body.h"
#include "render/mime/mime_encoded_word.h"
#include "render/mime/mime_registry.h"
#include "render/mime/mime_test_util.h"
#include "render/writer_test_support.h"

namespace tarnwell::render {
namespace {

std::string StoreHeader(CMimeHeader& header) {
  std::string out;
  StringSink sink(&out);
  EXPECT_TRUE(header.Store(&sink).ok());
  EXPECT_LE(out.size(), header.GetLength());
  return out;
}

// The lines of a stored header up to its empty line; `unfold` joins continuations to their
// field line.
std::vector<std::string> Lines(const std::string& stored, bool unfold) {
  std::vector<std::string> lines;
  size_t pos = 0;
  while (pos < stored.size()) {
    const size_t end = stored.find("\r\n", pos);
    EXPECT_NE(end, std::string::npos) << "no CR LF at the end";
    if (end == std::string::npos || end == pos) break;
    const std::string line = stored.substr(pos, end - pos);
    pos = end + 2;
    if (unfold && !lines.empty() && (line[0] == ' ' || line[0] == '\t')) {
      lines.back() += line;
    } else {
      lines.push_back(line);
    }
  }
  return lines;
}

TEST(HeaderFieldsTest, SecondSetKeepsPositionAndTakesValue) {
  CMimeHeader header;
  header.SetFieldValue("From", "a@example.org");
  header.SetFieldValue("Subject", "first");
  header.SetFieldValue("subject", "second");
  header.AddField("Received", "one");
  header.AddField("Received", "two");
  ASSERT_EQ(header.fields().size(), 4u);
  EXPECT_EQ(header.fields()[1].name, "Subject");
  EXPECT_EQ(*header.GetFieldValue("SUBJECT"), "second");
  EXPECT_EQ(StoreHeader(header),
            "From: a@example.org\r\nSubject: second\r\nReceived: one\r\nReceived: two\r\n\r\n");
  EXPECT_EQ(header.GetFieldValue("Cc"), nullptr);
}

// Line breaks in values from a mailbox must not become header lines of their own.
TEST(HeaderFieldsTest, LineBreaksInValuesCannotInjectFields) {
  const std::string attacks[] = {
      "Hello\r\nBcc: victim@example.org",
      "Hello\nBcc: victim@example.org",
      "Hello\rBcc: victim@example.org",
      std::string("Hello\0Bcc: victim@example.org", 29),
      "H\xc3\xa9llo\r\n\r\nBcc: victim@example.org",
      "Hello\r\n\tBcc: victim@example.org",
  };
  const char* fields[] = {"Subject", "From", "To", "X-Custom", "Content-Description"};
  for (const std::string& attack : attacks) {
    for (const char* name : fields) {
      CMimeBody part;
      part.SetFieldValue(name, attack);
      part.SetContent("report\r\nContent-Type: text/html" + attack + ".pdf", ByteView());
      const std::string stored = StoreHeader(part);
      SCOPED_TRACE(std::string(name) + ": " + stored);
      const std::vector<std::string> lines = Lines(stored, /*unfold=*/true);
      ASSERT_EQ(lines.size(), 2u);
      EXPECT_EQ(lines[0].rfind(std::string(name) + ":", 0), 0u);
      EXPECT_EQ(lines[1].rfind("Content-Type:", 0), 0u);
      // The stored text ends with exactly one empty line.
      EXPECT_EQ(stored.find("\r\n\r\n"), stored.size() - 4);
    }
  }
  CMimeHeader header;
  header.SetFieldValue("X-A\r\nBcc", "v");
  EXPECT_EQ(StoreHeader(header), "X-ABcc: v\r\n\r\n");
  EXPECT_FALSE(header.SetFieldValue("\r\n", "v"));
}

struct FoldCase {
  const char* name;
  std::string field;
  std::string value;
  std::string charset;
};

TEST(HeaderFoldingTest, LongValuesFoldWithinLimitsAndReadBack) {
  std::string long_ascii;
  for (int i = 0; i < 40; ++i) long_ascii += "word" + std::to_string(i) + " ";
  long_ascii += "end";
  std::string long_greek;
  for (int i = 0; i < 30; ++i) long_greek += "\xce\xb1\xce\xb2\xce\xb3 \xce\xb4\xce\xb5 ";
  std::string address_list;
  for (int i = 0; i < 20; ++i) {
    address_list += (i ? ", " : "") + std::string("\"J\xc3\xb6rg ") + std::to_string(i) +
                    "\" <user" + std::to_string(i) + "@example.org>";
  }
  const FoldCase cases[] = {
      {"ascii subject", "Subject", long_ascii, ""},
      {"greek subject", "Subject", long_greek, ""},
      {"greek subject in iso-8859-7", "Subject", long_greek, "iso-8859-7"},
      {"address list", "To", address_list, ""},
      {"long field name", "X-A-Very-Long-Field-Name-That-Leaves-Little-Room-On-Its-First-Line",
       "\xc3\xa9t\xc3\xa9 " + long_greek, ""},
      {"unbreakable word", "Subject", std::string(1200, 'x'), ""},
      {"text that looks encoded", "Subject", "=?utf-8?Q?not_a_word?= plain", ""},
  };
  for (const FoldCase& c : cases) {
    SCOPED_TRACE(c.name);
    CMimeHeader header;
    header.SetFieldValue(c.field, c.value, c.charset);
    const std::string stored = StoreHeader(header);
    for (const std::string& line : Lines(stored, /*unfold=*/false)) {
      const size_t limit = line.find("=?") != std::string::npos ? 76 : 998;
      EXPECT_LE(line.size(), limit) << line;
    }
    CMimeHeader reread;
    reread.Load(mime_testing::View(stored));
    ASSERT_EQ(reread.fields().size(), 1u);
    std::string expected = c.value;
    if (c.field == std::string("To")) {
      // Address lists come back with folding blanks after the commas.
      std::string got = *reread.GetFieldValue(c.field);
      std::string normal;
      for (size_t i = 0; i < got.size(); ++i) {
        if (got[i] == '\t') continue;
        normal.push_back(got[i]);
      }
      std::string want;
      // Quotes around a name that needs none are not kept.
      for (char ch : expected) {
        if (ch == '"') continue;
        if (ch != ' ' || (want.empty() || want.back() != ',')) want.push_back(ch);
      }
      EXPECT_EQ(normal, want);
    } else {
      EXPECT_EQ(*reread.GetFieldValue(c.field), expected);
    }
  }
}

TEST(HeaderParameterTest, SetReplacesInPlaceAndQuotes) {
  CMimeHeader header;
  EXPECT_FALSE(header.SetParameter("Content-Type", "name", "x"));
  header.SetFieldValue("Content-Type", "text/plain; charset=us-ascii; format=flowed");
  EXPECT_TRUE(header.SetParameter("Content-Type", "CHARSET", "utf-8"));
  EXPECT_TRUE(header.SetParameter("Content-Type", "name", "say \"hi\"\\.txt"));
  EXPECT_EQ(*header.GetFieldValue("Content-Type"),
            "text/plain; charset=\"utf-8\"; format=flowed; name=\"say \\\"hi\\\"\\\\.txt\"");
  EXPECT_EQ(header.GetParameter("Content-Type", "name"), "say \"hi\"\\.txt");
  EXPECT_EQ(header.GetParameter("Content-Type", "format"), "flowed");
  EXPECT_EQ(header.GetParameter("Content-Type", "missing"), std::nullopt);
}

TEST(HeaderParameterTest, ReadsRfc2231Forms) {
  struct Case {
    std::string value;
    std::string attribute;
    std::string expected;
  } cases[] = {
      {"application/x-stuff; title*=us-ascii'en-us'This%20is%20%2A%2A%2Afun%2A%2A%2A", "title",
       "This is ***fun***"},
      {"message/external-body; access-type=URL; "
       "URL*0=\"ftp://\"; URL*1=\"cs.utk.edu/pub/moore/bulk-mailer/bulk-mailer.tar\"",
       "url", "ftp://cs.utk.edu/pub/moore/bulk-mailer/bulk-mailer.tar"},
      {"application/x-stuff; title*0*=us-ascii'en'This%20is%20even%20more%20; "
       "title*1*=%2A%2A%2Afun%2A%2A%2A%20; title*2=\"isn't it!\"",
       "title", "This is even more ***fun*** isn't it!"},
      {"attachment; filename*=UTF-8''%E2%82%AC%20rates.pdf; filename=\"fallback.pdf\"", "filename",
       "\xe2\x82\xac rates.pdf"},
      {"attachment; filename*=iso-8859-1''caf%E9", "filename", "caf\xc3\xa9"},
  };
  for (const Case& c : cases) {
    CMimeHeader header;
    header.SetFieldValue("Content-Type", c.value);
    EXPECT_EQ(header.GetParameter("Content-Type", c.attribute), c.expected) << c.value;
  }
}

TEST(HeaderDateTest, WritesLocalTimeWithItsZone) {
  struct Case {
    const char* zone;
    int date[6];
    const char* expected;  // null: no Date field
  } cases[] = {
      {"CET-1CEST,M3.5.0,M10.5.0/3", {2021, 3, 5, 14, 7, 9}, "Fri, 5 Mar 2021 14:07:09 +0100"},
      {"CET-1CEST,M3.5.0,M10.5.0/3", {2021, 7, 14, 23, 59, 1}, "Wed, 14 Jul 2021 23:59:01 +0200"},
      {"EST5EDT,M3.2.0,M11.1.0", {2000, 1, 1, 0, 0, 0}, "Sat, 1 Jan 2000 00:00:00 -0500"},
      {"IST-5:30", {2023, 12, 31, 12, 30, 0}, "Sun, 31 Dec 2023 12:30:00 +0530"},
      {"UTC0", {2024, 2, 29, 6, 5, 4}, "Thu, 29 Feb 2024 06:05:04 +0000"},
      // Out-of-range fields are normalised by the calendar conversion.
      {"UTC0", {2024, 1, 32, 0, 0, 0}, "Thu, 1 Feb 2024 00:00:00 +0000"},
      {"UTC0", {1969, 12, 31, 23, 0, 0}, nullptr},
  };
  for (const auto& c : cases) {
    testing::ScopedZone zone(c.zone);
    CMimeHeader header;
    const bool set =
        header.SetDate(c.date[0], c.date[1], c.date[2], c.date[3], c.date[4], c.date[5]);
    if (c.expected) {
      EXPECT_TRUE(set);
      ASSERT_NE(header.GetFieldValue("Date"), nullptr) << c.expected;
      EXPECT_EQ(*header.GetFieldValue("Date"), c.expected);
    } else {
      EXPECT_FALSE(set);
      EXPECT_EQ(header.GetFieldValue("Date"), nullptr);
    }
  }
}

TEST(HeaderBoundaryTest, FormatCounterAndContentType) {
  const std::regex pattern(R"(__=_Part_Boundary_00([1-9])_\d{6}\.\d{6})");
  int previous = 0;
  for (int i = 0; i < 20; ++i) {
    const std::string boundary = MakeBoundary();
    std::smatch match;
    ASSERT_TRUE(std::regex_match(boundary, match, pattern)) << boundary;
    const int counter = std::stoi(match[1]);
    if (i > 0) {
      EXPECT_EQ(counter, previous % 9 + 1);
    }
    previous = counter;
  }

  CMimeHeader absent;
  absent.SetBoundary();
  EXPECT_EQ(absent.GetMainType(), "multipart");
  EXPECT_EQ(absent.GetSubType(), "mixed");
  EXPECT_FALSE(absent.GetBoundary().empty());

  CMimeHeader alternative;
  alternative.SetFieldValue("Content-Type", "Multipart/Alternative; boundary=old");
  alternative.SetBoundary();
  EXPECT_EQ(alternative.GetSubType(), "alternative");
  EXPECT_NE(alternative.GetBoundary(), "old");

  CMimeHeader text;
  text.SetFieldValue("Content-Type", "text/plain; charset=utf-8");
  text.SetBoundary();
  EXPECT_EQ(text.GetSubType(), "mixed");
  EXPECT_EQ(text.GetParameter("Content-Type", "charset"), std::nullopt);
}

TEST(MediaTypeTest, FileNamesAndMainTypes) {
  const std::pair<const char*, const char*> cases[] = {
      {"report.pdf", "application/pdf"},
      {"PHOTO.JPG", "image/jpeg"},
      {"a.jpeg", "image/jpeg"},
      {"scan.TiFf", "image/tiff"},
      {"song.mp3", "audio/basic"},
      {"clip.mpeg", "video/mpeg"},
      {"data.xml", "application/xml"},
      {"sheet.xls", "application/vnd.ms-excel"},
      {"noextension", "application/octet-stream"},
      {"archive.tar.gz", "application/octet-stream"},
      {"trailingdot.", "application/octet-stream"},
      {"", "application/octet-stream"},
  };
  for (const auto& [file, type] : cases) {
    CMimeBody part;
    part.SetContent(std::string("C:\\dir\\") + file, ByteView());
    EXPECT_EQ(*part.GetFieldValue("Content-Type"), std::string(type) + "; name=\"" + file + "\"");
    EXPECT_EQ(part.GetFileName(), file);
  }
  CMimeBody typed;
  typed.SetFieldValue("Content-Type", "text/x-custom");
  typed.SetName("a.pdf");
  EXPECT_EQ(*typed.GetFieldValue("Content-Type"), "text/x-custom; name=\"a.pdf\"");
  EXPECT_EQ(typed.GetMediaType(), kMediaText);
  CMimeHeader none;
  EXPECT_EQ(none.GetMediaType(), kMediaText);
  none.SetFieldValue("Content-Type", " IMAGE /png");
  EXPECT_EQ(none.GetMediaType(), kMediaImage);
  none.SetFieldValue("Content-Type", "chemical/x-pdb");
  EXPECT_EQ(none.GetMediaType(), kMediaUnknown);
}

TEST(HeaderLoadTest, UnfoldsDecodesAndStopsAtEmptyLine) {
  const std::string text =
      "Subject: =?utf-8?Q?Gr=C3=BC=C3=9Fe?=\r\n"
      "  =?utf-8?B?YXVz?= Wien\r\n"
      "From: =?utf-8?Q?M=C3=BCller=2C_Hans?= <h@example.org>\n"  // bare LF
      "Content-Type: application/pdf;\r\n\tname=\"=?utf-8?B?w6l0w6kucGRm?=\"\r\n"
      "not a field line\r\n"
      "X-Empty:\r\n"
      "\r\n"
      "Body: not a header\r\n";
  CMimeHeader header;
  const size_t used = header.Load(mime_testing::View(text));
  EXPECT_EQ(used, text.find("Body:"));
  EXPECT_EQ(*header.GetFieldValue("Subject"),
            "Gr\xc3\xbc\xc3\x9f"
            "eaus Wien");
  EXPECT_EQ(*header.GetFieldValue("From"), "\"M\xc3\xbcller, Hans\" <h@example.org>");
  EXPECT_EQ(header.GetParameter("Content-Type", "name"), "\xc3\xa9t\xc3\xa9.pdf");
  EXPECT_EQ(*header.GetFieldValue("X-Empty"), "");
  EXPECT_EQ(header.GetFieldValue("Body"), nullptr);
  EXPECT_EQ(header.fields().size(), 4u);
}

TEST(MimeHeaderParameterTest, HugeSectionNumbersAreNotSections) {
  // Found by fuzzing: a long run of digits after "name*" overflowed the
  // section number.
  CMimeHeader h;
  const std::string raw =
      "Content-Type: text/plain; name*99999999999999=\"a\"; name*0=\"b\"\r\n\r\n";
  h.Load(mime_testing::View(raw));
  std::optional<std::string> name = h.GetParameter("Content-Type", "name");
  ASSERT_TRUE(name);
  EXPECT_EQ(*name, "b");
}

}  // namespace
}  // namespace tarnwell::render
