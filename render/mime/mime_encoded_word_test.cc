#include "render/mime/mime_encoded_word.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "render/mime/mime_test_util.h"

namespace tarnwell::render {
namespace {

struct DecodeCase {
  std::string encoded;
  std::string decoded;
};

TEST(EncodedWordTest, DecodesRfc2047Examples) {
  const DecodeCase cases[] = {
      // RFC 2047 section 8.
      {"=?ISO-8859-1?Q?a?=", "a"},
      {"=?ISO-8859-1?Q?a?= b", "a b"},
      {"=?ISO-8859-1?Q?a?= =?ISO-8859-1?Q?b?=", "ab"},
      {"=?ISO-8859-1?Q?a?=  =?ISO-8859-1?Q?b?=", "ab"},
      {"=?ISO-8859-1?Q?a?=\r\n   =?ISO-8859-1?Q?b?=", "ab"},
      {"=?ISO-8859-1?Q?a_b?=", "a b"},
      {"=?ISO-8859-1?Q?a?= =?ISO-8859-2?Q?_b?=", "a b"},
      {"=?ISO-8859-1?Q?Andr=E9?= Pirard", "Andr\xc3\xa9 Pirard"},
      {"=?US-ASCII?Q?Keith_Moore?=", "Keith Moore"},
      {"=?ISO-8859-1?Q?Olle_J=E4rnefors?=", "Olle J\xc3\xa4rnefors"},
      // Base64, lower-case letter, language suffix (RFC 2231).
      {"=?utf-8?b?SGVsbG8gV8O2cmxk?=", "Hello W\xc3\xb6rld"},
      {"=?utf-8*en?Q?hi?=", "hi"},
      // Code pages.
      {"=?windows-1251?B?z/Do4uXy?=", "Привет"},
      {"=?shift_jis?B?k/qWe4zq?=", "日本語"},
      // Not words: left as they are.
      {"=?utf-8?X?abc?=", "=?utf-8?X?abc?="},
      {"=?utf-8?Q?a b?=", "=?utf-8?Q?a b?="},
      {"=?utf-8?Q?unterminated", "=?utf-8?Q?unterminated"},
      {"a =?", "a =?"},
      // Raw 8-bit text: UTF-8 when valid, else windows-1252.
      {"caf\xc3\xa9", "caf\xc3\xa9"},
      {"caf\xe9", "caf\xc3\xa9"},
  };
  for (const DecodeCase& c : cases) {
    EXPECT_EQ(DecodeEncodedWords(c.encoded), c.decoded) << c.encoded;
  }
}

struct EncodeCase {
  const char* name;
  std::string text;
  std::string charset;
};

TEST(EncodedWordTest, WordsRoundTripAndStayShort) {
  const EncodeCase cases[] = {
      {"latin", "Grüße aus München", "utf-8"},
      {"cyrillic", std::string(40, ' ') + "Привет мир", "utf-8"},
      {"cyrillic in cp1251", "Привет", "windows-1251"},
      {"japanese in shift_jis", "日本語の件名 日本語の件名 日本語の件名", "shift_jis"},
      {"emoji", "😀😁😂😃😄😅😆😇😈😉😊😋", "utf-8"},
      {"specials", "a_b=c?d \"e\" (f) <g>, h; i", "utf-8"},
      {"unknown charset falls back to utf-8", "été", "x-no-such-charset"},
  };
  for (const EncodeCase& c : cases) {
    for (char letter : {'B', 'Q', '\0'}) {
      SCOPED_TRACE(std::string(c.name) + " " + (letter ? std::string(1, letter) : "auto"));
      const std::vector<std::string> words = EncodeWords(c.text, c.charset, letter, 30, 75);
      ASSERT_FALSE(words.empty());
      std::string joined;
      for (size_t i = 0; i < words.size(); ++i) {
        EXPECT_LE(words[i].size(), i == 0 ? 30u : 75u) << words[i];
        // Each word must decode on its own: no character is cut in two.
        std::string alone;
        EXPECT_TRUE(DecodeEncodedWord(words[i], &alone)) << words[i];
        EXPECT_EQ(alone.find("\xef\xbf\xbd"), std::string::npos) << words[i];
        // Only characters that are safe in a phrase, a comment and plain text.
        const size_t payload = words[i].find('?', words[i].find('?', 2) + 1) + 1;
        for (size_t k = payload; k + 2 < words[i].size(); ++k) {
          EXPECT_EQ(std::string("\"(),.:;<>@[\\] _?").find(words[i][k]), std::string::npos)
              << words[i];
        }
        joined += (i ? " " : "") + words[i];
      }
      EXPECT_EQ(DecodeEncodedWords(joined), c.text);
    }
  }
}

TEST(EncodedWordTest, ChoosesQForMostlyAsciiAndBForTheRest) {
  EXPECT_EQ(ChooseWordEncoding(mime_testing::View("Hello World\xe9")), 'Q');
  EXPECT_EQ(ChooseWordEncoding(mime_testing::View("Привет")), 'B');
}

TEST(CharsetTest, NamesAndCodePagesAgree) {
  for (uint32_t codepage : {65001u, 1250u, 1251u, 1252u, 932u, 936u, 949u, 950u, 28591u}) {
    EXPECT_EQ(CodePageForCharset(CharsetForCodePage(codepage)), codepage) << codepage;
  }
  EXPECT_EQ(CodePageForCharset("UTF-8"), 65001u);
  EXPECT_EQ(CodePageForCharset("cp1257"), 1257u);
  EXPECT_EQ(CodePageForCharset("x-unknown"), 0u);
  EXPECT_EQ(CharsetForCodePage(12345), "windows-1252");
}

}  // namespace
}  // namespace tarnwell::render
