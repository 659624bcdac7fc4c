#include "render/mime/mime_parser.h"

#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

#include "render/mime/mime_message.h"
#include "render/mime/mime_test_util.h"

namespace tarnwell::render {
namespace {

using mime_testing::Text;
using mime_testing::View;

struct SplitCase {
  const char* name;
  std::string body;
  std::string preamble;
  std::vector<std::string> parts;
  bool closed;
};

TEST(SplitMultipartTest, DelimiterLinesTable) {
  const SplitCase cases[] = {
      {"delimiter at start", "--B\r\none\r\n--B\r\ntwo\r\n--B--\r\n", "", {"one", "two"}, true},
      {"preamble and epilogue", "pre\r\n--B\r\none\r\n--B--\r\nepilogue", "pre", {"one"}, true},
      {"bare LF", "--B\none\n--B\ntwo\n--B--\n", "", {"one", "two"}, true},
      {"blanks after boundary", "--B \t\r\none\r\n--B--", "", {"one"}, true},
      {"part keeps its own line end", "--B\r\none\r\n\r\n--B--", "", {"one\r\n"}, true},
      {"longer boundary is not ours", "--B\r\n--BX\r\nin\r\n--B--", "", {"--BX\r\nin"}, true},
      {"delimiter must start a line", "--B\r\nx --B\r\n--B--", "", {"x --B"}, true},
      {"no closing delimiter", "--B\r\none\r\n--B\r\ntwo", "", {"one", "two"}, false},
      {"no delimiter at all", "just text\r\n", "just text\r\n", {}, false},
      {"empty parts", "--B\r\n--B\r\n--B--", "", {"", ""}, true},
  };
  for (const SplitCase& c : cases) {
    SCOPED_TRACE(c.name);
    const MultipartPieces pieces = SplitMultipart(View(c.body), "B", kMaxParts);
    EXPECT_EQ(Text(pieces.preamble), c.preamble);
    ASSERT_EQ(pieces.parts.size(), c.parts.size());
    for (size_t i = 0; i < c.parts.size(); ++i) EXPECT_EQ(Text(pieces.parts[i]), c.parts[i]);
    EXPECT_EQ(pieces.closed, c.closed);
  }
}

size_t Depth(const CMimeBody& part) {
  size_t deepest = 0;
  for (size_t i = 0; i < part.GetChildCount(); ++i) {
    deepest = std::max(deepest, Depth(*part.GetChild(i)));
  }
  return deepest + 1;
}

size_t CountParts(const CMimeBody& part) {
  size_t count = 1;
  for (size_t i = 0; i < part.GetChildCount(); ++i) count += CountParts(*part.GetChild(i));
  return count;
}

TEST(ParserLimitsTest, NestingPartsAndFieldsAreBounded) {
  // 200 levels of multipart nesting.
  std::string nested;
  for (int i = 0; i < 200; ++i) {
    nested += "Content-Type: multipart/mixed; boundary=\"b" + std::to_string(i) + "\"\r\n\r\n--b" +
              std::to_string(i) + "\r\n";
  }
  nested += "\r\nleaf";
  CMimeMessage deep;
  ASSERT_TRUE(deep.Parse(View(nested)).ok());
  EXPECT_LE(Depth(deep), static_cast<size_t>(kMaxPartDepth) + 1);

  // More parts than the limit.
  std::string many = "Content-Type: multipart/mixed; boundary=\"b\"\r\n\r\n";
  for (size_t i = 0; i < kMaxParts + 500; ++i) many += "--b\r\n\r\nx\r\n";
  CMimeMessage wide;
  ASSERT_TRUE(wide.Parse(View(many)).ok());
  EXPECT_LE(CountParts(wide), kMaxParts + 1);

  // More fields than the limit.
  std::string fields;
  for (size_t i = 0; i < kMaxHeaderFields + 100; ++i) fields += "X-F: v\r\n";
  CMimeMessage crowded;
  ASSERT_TRUE(crowded.Parse(View(fields + "\r\nbody")).ok());
  EXPECT_EQ(crowded.fields().size(), kMaxHeaderFields);
}

TEST(ParserTest, MalformedInputsGiveWhatCanBeRead) {
  struct Case {
    const char* name;
    std::string message;
    bool ok;
    size_t children;
  } cases[] = {
      {"empty", "", false, 0},
      {"no field", "\r\njust a body", false, 0},
      {"no empty line", "Subject: x\r\nFrom: y", true, 0},
      {"multipart without boundary", "Content-Type: multipart/mixed\r\n\r\n--x\r\n", true, 0},
      {"boundary never used", "Content-Type: multipart/mixed; boundary=q\r\n\r\ntext", true, 0},
      {"bad base64", "Content-Transfer-Encoding: base64\r\n\r\n!!!!====@@@@", true, 0},
      {"bad quoted-printable", "Content-Transfer-Encoding: quoted-printable\r\n\r\n=\r=Z=", true,
       0},
      {"broken encoded word", "Subject: =?utf-8?B?####?= =?x?Q?=ZZ?= =?\r\n\r\n", true, 0},
      {"unterminated quote", "Content-Type: text/plain; name=\"abc\r\n\r\nx", true, 0},
      {"boundary too long",
       "Content-Type: multipart/mixed; boundary=" + std::string(500, 'b') + "\r\n\r\n--" +
           std::string(500, 'b') + "\r\n\r\nx",
       true, 0},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    CMimeMessage message;
    EXPECT_EQ(message.Parse(View(c.message)).ok(), c.ok);
    EXPECT_EQ(message.GetChildCount(), c.children);
  }
}

// Truncations and random damage of composed messages: parsing must never crash or hang,
// and what was parsed must store again.
TEST(ParserFuzzTest, TruncatedAndMutatedMessages) {
  CMimeMessage source;
  source.SetFieldValue("From", "\"J\xc3\xb6rg\" <j@example.org>");
  source.SetFieldValue("Subject", "\xd0\x9f\xd1\x80\xd0\xb8\xd0\xb2\xd0\xb5\xd1\x82 long subject");
  source.SetBoundary();
  CMimeBody* alternative = source.CreatePart();
  alternative->SetFieldValue("Content-Type", "multipart/alternative");
  alternative->SetBoundary();
  CMimeBody* text = alternative->CreatePart();
  text->SetFieldValue("Content-Type", "text/plain; charset=utf-8");
  text->SetFieldValue("Content-Transfer-Encoding", "quoted-printable");
  text->SetText(std::string(200, 'q') + " caf\xc3\xa9\r\n.\r\n");
  CMimeBody* attachment = source.CreatePart();
  attachment->SetFieldValue("Content-Transfer-Encoding", "base64");
  attachment->SetContent("\xc3\xa9t\xc3\xa9.pdf", ByteView(mime_testing::RandomBytes(300, 1)));
  const std::string stored = source.ToString();

  auto check = [](const std::string& input) {
    CMimeMessage parsed;
    parsed.Parse(View(input));
    std::string again;
    StringSink sink(&again);
    const Status status = parsed.Store(&sink);
    // A damaged multipart header may lose its boundary; nothing else may fail.
    EXPECT_TRUE(status.ok() || status.code() == Status::Code::kInvalidArgument);
    CMimeMessage reparsed;
    reparsed.Parse(View(again));
  };

  for (size_t length = 0; length <= stored.size(); ++length) check(stored.substr(0, length));

  std::mt19937 random(1234);
  const char kInteresting[] = {'\r', '\n', '-', '=', '?', '"', ';', ':', ' ', '\0', '\x80'};
  for (int round = 0; round < 2000; ++round) {
    std::string mutated = stored;
    const int edits = 1 + random() % 8;
    for (int e = 0; e < edits && !mutated.empty(); ++e) {
      const size_t at = random() % mutated.size();
      switch (random() % 4) {
        case 0:
          mutated[at] = static_cast<char>(random());
          break;
        case 1:
          mutated[at] = kInteresting[random() % sizeof(kInteresting)];
          break;
        case 2:
          mutated.erase(at, random() % 40);
          break;
        default:
          mutated.insert(at, mutated.substr(random() % mutated.size(), random() % 60));
          break;
      }
    }
    check(mutated);
  }
}

}  // namespace
}  // namespace tarnwell::render
