#include "render/content_line.h"

#include <gtest/gtest.h>

#include <cctype>
#include <vector>

#include "render/writer_test_support.h"

namespace tarnwell::render {
namespace {

using testing::Repeat;

// The physical lines of `text`, without their CR LF.
std::vector<std::string> PhysicalLines(const std::string& text) {
  std::vector<std::string> out;
  size_t start = 0;
  while (start < text.size()) {
    size_t end = text.find("\r\n", start);
    if (end == std::string::npos) end = text.size();
    out.push_back(text.substr(start, end - start));
    start = end + 2;
  }
  return out;
}

// Undoes folding: every CR LF followed by one space goes.
std::string Unfold(std::string text) {
  for (size_t at; (at = text.find("\r\n ")) != std::string::npos;) text.erase(at, 3);
  return text;
}

TEST(ContentLineTest, EscapesEverythingThatCouldEndOrSplitAValue) {
  struct Case {
    std::string in, escaped, kept;
  } cases[] = {
      {"plain text", "plain text", "plain text"},
      {"a;b,c\\d", "a\\;b\\,c\\\\d", "a\\;b\\,c\\\\d"},
      {"a\r\nb\nc\rd", "a\\nb\\nc\\nd", "a\r\nb\r\nc\r\nd"},
      {"\r\n\r\n", "\\n\\n", "\r\n\r\n"},
      {"\n\r", "\\n\\n", "\r\n\r\n"},  // LF then CR are two breaks
      {"literal \\n", "literal \\\\n", "literal \\\\n"},
      {std::string("nul\0bell\x07tab\tdel\x7F", 17), "nulbelltab\tdel", "nulbelltab\tdel"},
      {"bad \xC3 utf8", "bad \xEF\xBF\xBD utf8", "bad \xEF\xBF\xBD utf8"},
      {"key: value", "key: value", "key: value"},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(EscapeText(c.in), c.escaped) << c.in;
    EXPECT_EQ(EscapeText(c.in, LineBreaks::kCrLf), c.kept) << c.in;
  }
}

TEST(ContentLineTest, QuotedPrintableEncodesBreaksBytesAndLineEnds) {
  struct Case {
    std::string in;
    size_t used;
    std::string out;
  } cases[] = {
      {"Main St 1\r\nOslo", 10, "Main St 1=0D=0A=\r\nOslo"},
      {"ends with break\r\n", 0, "ends with break=0D=0A"},  // no soft break after the last
      {"a=b", 0, "a=3Db"},
      {"Gr\xFC\xDF", 0, "Gr=FC=DF"},
      {"trailing  ", 0, "trailing =20"},
      {"space before break \r\nx", 0, "space before break=20=0D=0A=\r\nx"},
      {"lone\rcr", 0, "lone=0Dcr"},
      {"", 30, ""},
  };
  for (const Case& c : cases) EXPECT_EQ(QuotedPrintable(c.in, c.used), c.out) << c.in;
}

TEST(ContentLineTest, QuotedPrintableLinesStayShortAndKeepEscapesWhole) {
  for (size_t used : {0u, 1u, 40u, 74u, 75u, 76u, 90u}) {
    for (const std::string& text :
         {Repeat("=", 100), Repeat("x", 300), Repeat("ab ", 100), Repeat("\xE9", 77)}) {
      const std::string encoded = std::string(used, 'N') + QuotedPrintable(text, used);
      for (const std::string& line : PhysicalLines(encoded)) {
        if (line.size() > kMaxQuotedPrintableLine) {
          // Only a name longer than a line may overrun, and then it stands alone.
          EXPECT_EQ(line, std::string(used, 'N') + "=");
          continue;
        }
        EXPECT_LE(line.size(), kMaxQuotedPrintableLine);
        EXPECT_NE(line.back(), ' ');
        // Every '=' is a whole "=XX" escape or the soft break ending the line.
        for (size_t p = line.find('='); p != std::string::npos; p = line.find('=', p + 1)) {
          if (p + 1 == line.size()) break;
          ASSERT_LT(p + 2, line.size()) << line;
          EXPECT_TRUE(isxdigit(line[p + 1]) && isxdigit(line[p + 2])) << line;
          p += 2;
        }
      }
    }
  }
}

struct FoldCase {
  const char* name;
  TextMode mode;
  std::string value;
};

class FoldTest : public ::testing::TestWithParam<FoldCase> {};

TEST_P(FoldTest, FoldsWithinLimitWithoutSplittingCharacters) {
  const FoldCase& c = GetParam();
  ContentWriter writer(c.mode);
  writer.Property("X-TEST", c.value);
  const std::string out = writer.text();
  ASSERT_EQ(out.substr(out.size() - 2), "\r\n");
  const std::vector<std::string> lines = PhysicalLines(out);
  for (size_t i = 0; i < lines.size(); ++i) {
    EXPECT_LE(lines[i].size(), kMaxLineOctets) << lines[i];
    if (i > 0) {
      EXPECT_EQ(lines[i][0], ' ');
      // A continuation of blanks only reads as an empty line to many readers.
      EXPECT_NE(lines[i].find_first_not_of(" \t"), std::string::npos) << i;
    }
    // Every physical line converts on its own: no character is cut in two.
    EXPECT_EQ(writer.Encode(CodePageToUtf8(
                  ByteView(reinterpret_cast<const uint8_t*>(lines[i].data()), lines[i].size()),
                  c.mode.utf8 ? kCodePageUtf8 : c.mode.ansi_code_page)),
              lines[i]);
  }
  EXPECT_EQ(Unfold(out), "X-TEST:" + writer.Encode(c.value) + "\r\n");
}

INSTANTIATE_TEST_SUITE_P(
    Values, FoldTest,
    ::testing::Values(FoldCase{"Short", {}, "short"},
                      FoldCase{"ExactlyFull", {}, std::string(kMaxLineOctets - 7, 'x')},
                      FoldCase{"OneOver", {}, std::string(kMaxLineOctets - 6, 'x')},
                      FoldCase{"Ascii", {}, Repeat("0123456789", 30)},
                      FoldCase{"TwoByteUtf8", {}, Repeat("\xC3\xA9", 200)},
                      FoldCase{"ThreeByteUtf8", {}, "x" + Repeat("日本語", 60)},
                      FoldCase{"FourByteUtf8", {}, "xy" + Repeat("😀", 60)},
                      FoldCase{"ShiftJis", {false, 932}, "x" + Repeat("日本語テキスト", 30)},
                      FoldCase{"Windows1251", {false, 1251}, Repeat("Привет ", 30)},
                      FoldCase{"TrailingBlanks", {}, std::string(kMaxLineOctets - 8, 'x') + "y   "},
                      FoldCase{
                          "BlankRunAtFold", {}, std::string(60, 'x') + std::string(30, ' ') + "z"}),
    [](const ::testing::TestParamInfo<FoldCase>& info) { return info.param.name; });

TEST(ContentLineTest, AnsiModeUsesTheCodePageAndFallsBackForUnusableOnes) {
  EXPECT_EQ(ContentWriter({false, 1251}).Encode("Привет"), "\xCF\xF0\xE8\xE2\xE5\xF2");
  EXPECT_EQ(ContentWriter({false, 1252}).Encode("café Привет"), "caf\xE9 ??????");
  // UTF-16 would put NUL bytes into the structure; the default code page stands in.
  EXPECT_EQ(ContentWriter({false, kCodePageUtf16LE}).Encode("café"), "caf\xE9");
  EXPECT_EQ(ContentWriter({true, 1252}).Encode("café"), "caf\xC3\xA9");
}

}  // namespace
}  // namespace tarnwell::render
