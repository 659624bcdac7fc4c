#include "render/mime/mime_codes.h"

#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

#include "render/mime/mime_test_util.h"

namespace tarnwell::render {
namespace {

std::string Encode(CMimeCodeBase& coder, std::string_view input) {
  coder.SetInput(input);
  return coder.EncodeToString();
}

std::string Decode(CMimeCodeBase& coder, std::string_view input) {
  coder.SetInput(input);
  Bytes out = coder.DecodeToBytes();
  return std::string(out.begin(), out.end());
}

// Every line ends in CR LF (the last may have no end) and is at most `limit` long.
void ExpectWellFormedLines(const std::string& text, size_t limit) {
  size_t start = 0;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\r') {
      ASSERT_TRUE(i + 1 < text.size() && text[i + 1] == '\n') << "bare CR at " << i;
      EXPECT_LE(i - start, limit) << "line at " << start;
      start = i + 2;
      ++i;
    } else {
      ASSERT_NE(text[i], '\n') << "bare LF at " << i;
    }
  }
  EXPECT_LE(text.size() - start, limit);
}

// ---- Base64

struct Base64Case {
  std::string plain;
  std::string encoded;
};

TEST(Base64Test, Rfc4648VectorsBothWays) {
  const Base64Case cases[] = {
      {"", ""},
      {"f", "Zg=="},
      {"fo", "Zm8="},
      {"foo", "Zm9v"},
      {"foob", "Zm9vYg=="},
      {"fooba", "Zm9vYmE="},
      {"foobar", "Zm9vYmFy"},
      {std::string("\0\xff\xfe", 3), "AP/+"},
  };
  for (const Base64Case& c : cases) {
    CMimeCodeBase64 coder;
    coder.SetMode(CMimeCodeBase64::kModeNoLineBreaks);
    EXPECT_EQ(Encode(coder, c.plain), c.encoded);
    EXPECT_EQ(Decode(coder, c.encoded), c.plain);
  }
}

TEST(Base64Test, LineBreaksEvery76Characters) {
  CMimeCodeBase64 coder;  // line breaks are the default
  EXPECT_EQ(Encode(coder, ""), "");
  EXPECT_EQ(Encode(coder, "foo"), "Zm9v\r\n");
  const std::string one_line = Encode(coder, std::string(57, 'x'));
  EXPECT_EQ(one_line.size(), 76u + 2);
  const std::string two_lines = Encode(coder, std::string(58, 'x'));
  EXPECT_EQ(two_lines.substr(76, 2), "\r\n");
  EXPECT_EQ(two_lines.substr(78), "eA==\r\n");
}

TEST(Base64Test, DecodingToleratesWhatMailCarries) {
  const Base64Case cases[] = {
      {"foobar", "Zm9v\r\nYmFy\r\n"},  // line ends
      {"foobar", "Zm9v YmFy"},         // blanks
      {"foob", "Zm9vYg"},              // missing padding
      {"foobar", "Zm9v!YmFy"},         // stray characters are skipped
      {"f", "Zg==Zm9v"},               // padding ends the data
      {"", "Z"},                       // a lone character carries no byte
  };
  for (const Base64Case& c : cases) {
    CMimeCodeBase64 coder;
    EXPECT_EQ(Decode(coder, c.encoded), c.plain) << c.encoded;
  }
}

// ---- Quoted-printable

struct QpCase {
  const char* name;
  std::string plain;
  std::string encoded;
  uint32_t mode = CMimeCodeBase::kModeText;
};

TEST(QuotedPrintableTest, EncodeTable) {
  const QpCase cases[] = {
      {"long line", std::string(100, 'a'), std::string(75, 'a') + "=\r\n" + std::string(25, 'a')},
      {"inner blank", "a b", "a b"},
      {"blank at end of input", "a ", "a=20"},
      {"blank before line end", "a \r\nb", "a=20\r\nb"},
      {"tab at end", "a\tb\t", "a\tb=09"},
      {"equals sign", "1+1=2", "1+1=3D2"},
      {"8-bit", "caf\xc3\xa9", "caf=C3=A9"},
      {"lone dot line", "a\r\n.\r\nb", "a\r\n=2E\r\nb"},
      {"dot at end", "a\r\n.", "a\r\n=2E"},
      {"dots not alone", "..\r\n.a", "..\r\n.a"},
      {"bare LF", "a\nb", "a\r\nb"},
      {"bare CR", "a\rb", "a\r\nb"},
      {"raw mode escapes line ends", "a\r\nb", "a=0D=0Ab", CMimeCodeBase::kModeRaw},
      {"break after last blank", std::string(70, 'a') + " " + std::string(10, 'b'),
       std::string(70, 'a') + " =\r\n" + std::string(10, 'b')},
      {"escape is never split", std::string(74, 'a') + "\xff", std::string(74, 'a') + "=\r\n=FF"},
  };
  for (const QpCase& c : cases) {
    CMimeCodeQP coder;
    coder.SetMode(c.mode);
    EXPECT_EQ(Encode(coder, c.plain), c.encoded) << c.name;
  }
}

TEST(QuotedPrintableTest, DecodeTable) {
  const QpCase cases[] = {
      {"soft break", "ab", "a=\r\nb"},
      {"soft break after LF-only line", "ab", "a=\nb"},
      {"soft break with trailing blanks", "ab", "a= \t\r\nb"},
      {"escape", "a=b", "a=3Db"},
      {"lower-case escape", "a=b", "a=3db"},
      {"transport blanks removed", "a\r\nb", "a  \r\nb"},
      {"LF-only line end", "a\r\nb", "a\nb"},
      {"bad escape kept", "=ZZ", "=ZZ"},
      {"truncated escape kept", "a=4", "a=4"},
      {"rfc 2045 example", "Now's the time for all folk to come to the aid of their country.",
       "Now's the time =\r\nfor all folk to come=\r\n to the aid of their country."},
  };
  for (const QpCase& c : cases) {
    CMimeCodeQP coder;
    EXPECT_EQ(Decode(coder, c.encoded), c.plain) << c.name;
  }
}

// ---- Round trips over generated inputs

enum class Alphabet { kBinary, kText };

std::string Generate(std::mt19937* random, Alphabet alphabet, size_t size) {
  // Text favours the characters that drive the coders' special cases.
  static const std::string kTextPieces[] = {"a", "b",    " ",        "\t",    ".",
                                            "=", "\r\n", "\xc3\xa9", "From ", "word "};
  std::string out;
  while (out.size() < size) {
    if (alphabet == Alphabet::kBinary) {
      out.push_back(static_cast<char>((*random)()));
    } else {
      out += kTextPieces[(*random)() % std::size(kTextPieces)];
    }
  }
  return out;
}

TEST(CoderRoundTripTest, GeneratedInputsSurviveAndRespectLineLimits) {
  std::mt19937 random(7);
  for (int round = 0; round < 300; ++round) {
    const size_t size = random() % 600;
    const Alphabet alphabet = round % 2 ? Alphabet::kBinary : Alphabet::kText;
    const std::string input = Generate(&random, alphabet, size);
    SCOPED_TRACE("round " + std::to_string(round));

    CMimeCodeBase64 base64;
    const std::string b64 = Encode(base64, input);
    EXPECT_LE(b64.size(), base64.GetEncodeLength());
    ExpectWellFormedLines(b64, kMaxEncodedLineLength);
    EXPECT_EQ(Decode(base64, b64), input);

    CMimeCodeQP raw;
    raw.SetMode(CMimeCodeBase::kModeRaw);
    const std::string raw_encoded = Encode(raw, input);
    raw.SetInput(std::string_view(input));
    EXPECT_LE(raw_encoded.size(), raw.GetEncodeLength());
    ExpectWellFormedLines(raw_encoded, kMaxEncodedLineLength);
    EXPECT_EQ(Decode(raw, raw_encoded), input);

    if (alphabet == Alphabet::kText) {
      // Text input has only CR LF line ends, which text mode keeps as they are.
      CMimeCodeQP text;
      const std::string text_encoded = Encode(text, input);
      text.SetInput(std::string_view(input));
      EXPECT_LE(text_encoded.size(), text.GetEncodeLength());
      ExpectWellFormedLines(text_encoded, kMaxEncodedLineLength);
      EXPECT_EQ(Decode(text, text_encoded), input);
    }
  }
}

TEST(CopyCoderTest, TextModeWritesCrLfRawModeKeepsBytes) {
  CMimeCodeBase text;
  EXPECT_EQ(Encode(text, "a\nb\rc\r\nd\r"), "a\r\nb\r\nc\r\nd\r\n");
  EXPECT_LE(text.EncodeToString().size(), text.GetEncodeLength());
  CMimeCodeBase raw;
  raw.SetMode(CMimeCodeBase::kModeRaw);
  EXPECT_EQ(Encode(raw, "a\nb\rc"), "a\nb\rc");
}

TEST(CoderBufferTest, ShortBufferGetsAPrefixNeverMore) {
  CMimeCodeBase64 coder;
  coder.SetInput(std::string_view("foobar"));
  char buffer[16] = {};
  EXPECT_EQ(coder.Encode(buffer, 5), 0u);  // the first write of 10 bytes does not fit
  EXPECT_EQ(coder.Encode(buffer, sizeof(buffer)), 10u);
  EXPECT_EQ(std::string(buffer, 10), "Zm9vYmFy\r\n");
}

// Records how large the pieces handed to a sink are.
class PieceSizeSink : public MimeSink {
 public:
  size_t largest = 0;

 protected:
  bool DoWrite(const char*, size_t size) override {
    largest = std::max(largest, size);
    return true;
  }
};

TEST(CoderStreamingTest, LargeInputLeavesInBoundedPieces) {
  // 41 MiB: the encoder must hand its output on in staging-sized pieces, not as one copy.
  const Bytes input = mime_testing::RandomBytes(41u << 20, 3);
  for (int kind = 0; kind < 2; ++kind) {
    std::unique_ptr<CMimeCodeBase> coder;
    if (kind == 0) {
      coder = std::make_unique<CMimeCodeBase64>();
    } else {
      coder = std::make_unique<CMimeCodeQP>();
    }
    coder->SetInput(ByteView(input));
    PieceSizeSink sink;
    ASSERT_TRUE(coder->EncodeTo(&sink));
    EXPECT_LE(sink.largest, StagingBuffer::kCapacity);
    EXPECT_LE(sink.bytes_written(), coder->GetEncodeLength());
    if (kind == 0) {
      EXPECT_EQ(sink.bytes_written(), coder->GetEncodeLength());
    }
  }
}

}  // namespace
}  // namespace tarnwell::render
