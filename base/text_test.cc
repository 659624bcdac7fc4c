#include "base/text.h"

#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

namespace tarnwell {
namespace {

const std::string kFffd = "\xEF\xBF\xBD";

ByteView View(std::string_view s) {
  return ByteView(reinterpret_cast<const uint8_t*>(s.data()), s.size());
}

struct Utf16Case {
  const char* name;
  std::string utf16le;  // raw bytes
  NulHandling nul;
  std::string utf8;
};

class Utf16ToUtf8Test : public ::testing::TestWithParam<Utf16Case> {};

TEST_P(Utf16ToUtf8Test, DecodesBytesAndUnitsAlike) {
  const Utf16Case& c = GetParam();
  EXPECT_EQ(Utf16LEToUtf8(View(c.utf16le), c.nul), c.utf8);
  std::u16string units;
  for (size_t i = 0; i + 1 < c.utf16le.size(); i += 2) {
    units.push_back(char16_t(uint8_t(c.utf16le[i]) | (uint8_t(c.utf16le[i + 1]) << 8)));
  }
  EXPECT_EQ(Utf16ToUtf8(units, c.nul), c.utf8);
}

using std::string_literals::operator""s;
constexpr NulHandling kKeep = NulHandling::kKeep;
constexpr NulHandling kStop = NulHandling::kStopAtFirst;

INSTANTIATE_TEST_SUITE_P(
    Cases, Utf16ToUtf8Test,
    ::testing::Values(Utf16Case{"Empty", "", kKeep, ""},
                      Utf16Case{"Bmp", "A\0\xE9\0\xAC\x20"s, kKeep, "A\xC3\xA9\xE2\x82\xAC"},
                      Utf16Case{"Pair", "\x3D\xD8\x00\xDE"s, kKeep, "\xF0\x9F\x98\x80"},
                      Utf16Case{"LoneHighAtEnd", "a\0\x3D\xD8"s, kKeep, "a" + kFffd},
                      Utf16Case{"HighThenLetter", "\x3D\xD8x\0"s, kKeep, kFffd + "x"},
                      Utf16Case{"HighHigh", "\x3D\xD8\x3D\xD8\x00\xDE"s, kKeep,
                                kFffd + "\xF0\x9F\x98\x80"},
                      Utf16Case{"LoneLow", "\x00\xDEx\0"s, kKeep, kFffd + "x"},
                      Utf16Case{"ReversedPair", "\x00\xDE\x3D\xD8"s, kKeep, kFffd + kFffd},
                      Utf16Case{"OddTrailingByte", "a\0b"s, kKeep, "a"},
                      Utf16Case{"NulKept", "a\0\0\0b\0"s, kKeep, "a\0b"s},
                      Utf16Case{"NulStops", "a\0\0\0b\0"s, kStop, "a"},
                      Utf16Case{"NulFirst", "\0\0b\0"s, kStop, ""}),
    [](const auto& info) { return std::string(info.param.name); });

struct Utf8Case {
  const char* name;
  std::string utf8;
  std::u16string utf16;
  bool valid;
};

class Utf8ToUtf16Test : public ::testing::TestWithParam<Utf8Case> {};

// Each maximal ill-formed subpart costs exactly one U+FFFD, and the byte that ends it is
// decoded again as the start of the next character.
TEST_P(Utf8ToUtf16Test, ReplacesIllFormedSequences) {
  const Utf8Case& c = GetParam();
  EXPECT_EQ(Utf8ToUtf16(c.utf8), c.utf16);
  EXPECT_EQ(Utf16Length(c.utf8), c.utf16.size());
  EXPECT_EQ(IsValidUtf8(c.utf8), c.valid);
  EXPECT_EQ(Utf16ToUtf8(c.utf16), ToValidUtf8(c.utf8));
}

INSTANTIATE_TEST_SUITE_P(
    Cases, Utf8ToUtf16Test,
    ::testing::Values(Utf8Case{"Ascii", "abc", u"abc", true},
                      Utf8Case{"Supplementary", "\xF0\x9F\x98\x80", u"\xD83D\xDE00", true},
                      Utf8Case{"Max", "\xF4\x8F\xBF\xBF", u"\xDBFF\xDFFF", true},
                      Utf8Case{"LiteralReplacement", "\xEF\xBF\xBD", u"\xFFFD", true},
                      Utf8Case{"OverlongNul", "\xC0\x80", u"\xFFFD\xFFFD", false},
                      Utf8Case{"OverlongThree", "\xE0\x80\xAF", u"\xFFFD\xFFFD\xFFFD", false},
                      Utf8Case{"EncodedSurrogate", "\xED\xA0\x80", u"\xFFFD\xFFFD\xFFFD", false},
                      Utf8Case{"PastMax", "\xF4\x90\x80\x80", u"\xFFFD\xFFFD\xFFFD\xFFFD", false},
                      Utf8Case{"TruncatedThenAscii",
                               "\xE2\x82"
                               "A",
                               u"\xFFFD"
                               "A",
                               false},
                      Utf8Case{"TruncatedAtEnd", "x\xF0\x9F\x98", u"x\xFFFD", false},
                      Utf8Case{"StrayContinuation",
                               "\x80"
                               "a",
                               u"\xFFFD"
                               "a",
                               false},
                      Utf8Case{"InvalidLead", "\xFF\xFE", u"\xFFFD\xFFFD", false}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(TextTest, EveryScalarValueRoundTrips) {
  std::string utf8;
  for (char32_t cp = 0; cp <= 0x10FFFF; ++cp) {
    if (cp == 0xD800) cp = 0xE000;
    AppendUtf8(cp, &utf8);
  }
  ASSERT_TRUE(IsValidUtf8(utf8));
  Bytes utf16 = Utf8ToUtf16LE(utf8);
  EXPECT_EQ(utf16.size(), 2 * Utf16Length(utf8));
  EXPECT_EQ(Utf16LEToUtf8(utf16), utf8);
}

TEST(TextTest, TruncateNeverSplitsASequence) {
  const std::string text = "a\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80";  // a é € 😀
  const size_t kExpected[] = {0, 1, 1, 3, 3, 3, 6, 6, 6, 6, 10, 10};
  for (size_t max = 0; max < std::size(kExpected); ++max) {
    EXPECT_EQ(TruncateUtf8(text, max).size(), kExpected[max]) << "max " << max;
  }
}

struct CodePageCase {
  const char* name;
  uint32_t codepage;
  std::string bytes;
  std::string utf8;
};
void PrintTo(const CodePageCase& c, std::ostream* os) { *os << c.name; }

class CodePageToUtf8Test : public ::testing::TestWithParam<CodePageCase> {};

TEST_P(CodePageToUtf8Test, Converts) {
  const CodePageCase& c = GetParam();
  EXPECT_EQ(CodePageToUtf8(View(c.bytes), c.codepage), c.utf8);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, CodePageToUtf8Test,
    ::testing::Values(
        CodePageCase{"Cp1252", 1252, "caf\xE9 \x80\x92", "caf\xC3\xA9 \xE2\x82\xAC\xE2\x80\x99"},
        // windows-1258 holds each letter back to compose it with a following combining mark.
        CodePageCase{"Cp1258Combining", 1258,
                     "a\xEC"
                     "e",
                     "\xC3\xA1"
                     "e"},
        CodePageCase{"Cp1252Undefined", 1252,
                     "a\x81"
                     "b",
                     "a" + kFffd + "b"},
        CodePageCase{"NulKept", 1252, "a\0b"s, "a\0b"s},
        CodePageCase{"ZeroMeans1252", 0, "\x80", "\xE2\x82\xAC"},
        CodePageCase{"UnknownMeans1252", 12345, "\x80", "\xE2\x82\xAC"},
        CodePageCase{"Cp1250", 1250, "\x8A", "\xC5\xA0"},
        CodePageCase{"Cp1251", 1251, "\xC6", "\xD0\x96"},
        CodePageCase{"Cp1253", 1253, "\xE1", "\xCE\xB1"},
        CodePageCase{"Cp874", 874, "\xA1", "\xE0\xB8\x81"},
        CodePageCase{"Cp932", 932, "\x93\xFA\x96\x7B", "\xE6\x97\xA5\xE6\x9C\xAC"},
        CodePageCase{"Cp932Truncated", 932, "a\x93", "a" + kFffd},
        CodePageCase{"Cp936", 936, "\xD6\xD0\xCE\xC4", "\xE4\xB8\xAD\xE6\x96\x87"},
        CodePageCase{"Cp949", 949, "\xC7\xD1", "\xED\x95\x9C"},
        CodePageCase{"Cp950", 950, "\xA4\xA4", "\xE4\xB8\xAD"},
        CodePageCase{"Ascii", 20127, "a\xE9", "a" + kFffd},
        CodePageCase{"Latin1", 28591, "\xE9", "\xC3\xA9"},
        CodePageCase{"Latin9", 28605, "\xA4", "\xE2\x82\xAC"},
        CodePageCase{"Utf7", 65000, "+AOk-", "\xC3\xA9"},
        CodePageCase{"Utf8Repaired", 65001, "a\xC0", "a" + kFffd},
        CodePageCase{"Utf16LE", 1200, "\x3D\xD8\x00\xDE\x3D\xD8"s, "\xF0\x9F\x98\x80" + kFffd}),
    [](const auto& info) { return std::string(info.param.name); });

class Utf8ToCodePageTest : public ::testing::TestWithParam<CodePageCase> {};

TEST_P(Utf8ToCodePageTest, Converts) {
  const CodePageCase& c = GetParam();
  EXPECT_EQ(Utf8ToCodePage(c.utf8, c.codepage), c.bytes);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, Utf8ToCodePageTest,
    ::testing::Values(
        CodePageCase{"Cp1252", 1252, "caf\xE9 \x80", "caf\xC3\xA9 \xE2\x82\xAC"},
        CodePageCase{"Unrepresentable", 1252, "a?b?c",
                     "a\xE6\x97\xA5"
                     "b\xF0\x9F\x98\x80"
                     "c"},
        CodePageCase{"InvalidInput", 1252, "a?b",
                     "a\xC0"
                     "b"},
        CodePageCase{"NulKept", 1252, "a\0b"s, "a\0b"s},
        CodePageCase{"Cp1251", 1251, "\xC6?", "\xD0\x96\xC3\xA9"},
        CodePageCase{"Cp932", 932, "\x93\xFA\x96\x7B?", "\xE6\x97\xA5\xE6\x9C\xAC\xE0\xB8\x81"},
        CodePageCase{"Ascii", 20127, "caf?", "caf\xC3\xA9"},
        // The substitute must leave the kanji mode first or it would read as half a kanji.
        CodePageCase{"Iso2022JpShift", 50220, "\x1B$BF|\x1B(B?x",
                     "\xE6\x97\xA5\xE2\x82\xAC"
                     "x"},
        CodePageCase{"Utf7Flushed", 65000, "+AOk-", "\xC3\xA9"},
        CodePageCase{"Utf8", 65001, "a" + kFffd, "a\xFF"},
        CodePageCase{"Utf16LE", 1200, "a\0\x3D\xD8\x00\xDE"s, "a\xF0\x9F\x98\x80"}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(TextTest, CodePageNamesAllOpenInIconv) {
  // A code page whose name this iconv lacks would silently become windows-1252; make sure
  // the ones the table promises are really there.
  const uint32_t kPages[] = {874,   932,   936,   949,   950,   1250,  1251,  1252,  1253,
                             1254,  1255,  1256,  1257,  1258,  20127, 20866, 21866, 28591,
                             28592, 28593, 28594, 28595, 28596, 28597, 28598, 28599, 28603,
                             28605, 50220, 51932, 51949, 54936, 65000};
  for (uint32_t page : kPages) {
    // 'A' is the same in all of them, so a fallback would pass the second check: hence the
    // first.
    if (page != 1252) {
      EXPECT_STRNE(IconvNameForCodePage(page), "WINDOWS-1252") << page;
    }
    EXPECT_EQ(CodePageToUtf8(View("A"), page), "A") << page;
  }
  EXPECT_STREQ(IconvNameForCodePage(0), "WINDOWS-1252");
}

TEST(TextTest, ConvertsOnManyThreadsAtOnce) {
  // Each thread alternates code pages so that cached handles are reused with state left
  // from another conversion; a shared handle would mix the outputs up.
  const std::string sjis = "\x93\xFA\x96\x7B";
  const std::string utf8 = "\xE6\x97\xA5\xE6\x9C\xAC";
  std::vector<std::thread> threads;
  std::vector<int> failures(4, 0);
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < 2000; ++i) {
        if (CodePageToUtf8(View(sjis), 932) != utf8) ++failures[t];
        if (Utf8ToCodePage(utf8 + "\xE2\x82\xAC", 50220) != "\x1B$BF|K\\\x1B(B?") {
          ++failures[t];
        }
        if (Utf8ToCodePage("\xE2\x82\xAC", 1252) != "\x80") ++failures[t];
      }
    });
  }
  for (std::thread& th : threads) th.join();
  for (int f : failures) EXPECT_EQ(f, 0);
}

TEST(TextTest, SmallHelpers) {
  EXPECT_EQ(AsciiLower("AbC-\xC3\x89Z"), "abc-\xC3\x89z");
  EXPECT_TRUE(EqualsIgnoreAsciiCase("IPM.Note", "ipm.NOTE"));
  EXPECT_FALSE(EqualsIgnoreAsciiCase("IPM.Note", "IPM.Notes"));
  EXPECT_FALSE(EqualsIgnoreAsciiCase("\xC3\x89", "\xC3\xA9"));
  EXPECT_EQ(TrimNul("ab\0cd"s), "ab");
  EXPECT_EQ(TrimNul("abc"), "abc");
  const uint8_t raw[] = {'x', 0, 'y'};
  EXPECT_EQ(TrimNul(ByteView(raw, sizeof raw)).size(), 1u);
  EXPECT_TRUE(TrimNul(ByteView()).empty());
}

}  // namespace
}  // namespace tarnwell
