// The compressed-RTF encoders against the program's own decoder, which was
// written separately from them, and against the published example value.
#include "testing/exchange/rtf_literal_encoder.h"

#include <gtest/gtest.h>

#include <string>

#include "store/rtf_decompressor.h"

namespace tarnwell::forge::exchange {
namespace {

std::string Repeat(const std::string& s, size_t n) {
  std::string out;
  for (size_t i = 0; i < n; ++i) out += s;
  return out;
}

std::string AllBytes() {
  std::string s;
  for (int i = 0; i < 256; ++i) s.push_back(char(i));
  return s;
}

struct RtfCase {
  const char* name;
  std::string text;
};

const RtfCase kCases[] = {
    {"Empty", ""},
    {"OneByte", "{"},
    {"SevenBytes", "{\\rtf1 "},
    {"EightBytes", "{\\rtf1 }"},
    {"NineBytes", "{\\rtf1 x}"},
    {"HelloWorld", "{\\rtf1\\ansi\\ansicpg1252\\pard hello world}\r\n"},
    {"PrologueWords", "{\\rtf1\\ansi\\mac\\deff0\\deftab720{\\fonttbl;}\\par \\pard\\plain\\f0"},
    {"EveryByteValue", AllBytes() + AllBytes()},
    {"Repetitive", Repeat("ab", 40) + Repeat("\\par Wiederholung ", 30)},
    {"PastTheRing", Repeat("{\\rtf1 Lorem ipsum dolor sit amet, \\b consectetur\\b0 }", 200)},
};

class RtfEncoderTest : public ::testing::TestWithParam<RtfCase> {};

TEST_P(RtfEncoderTest, BothEncodersRoundTripThroughTheDecoder) {
  const std::string& text = GetParam().text;
  for (bool references : {false, true}) {
    SCOPED_TRACE(references ? "with references" : "literals only");
    const Bytes value = references ? EncodeRtfCompressed(text) : EncodeRtfLiteral(text);
    ASSERT_GE(value.size(), kRtfValueHeaderSize);
    EXPECT_EQ(LoadU32LE(value.data()), value.size() - 4);
    EXPECT_EQ(LoadU32LE(value.data() + 4), text.size());
    EXPECT_EQ(LoadU32LE(value.data() + 8), kRtfTypeCompressed);
    EXPECT_EQ(store::CheckRtfCrc(ByteView(value)), store::RtfCrcStatus::kMatch);
    const auto decoded = store::DecompressRtf(ByteView(value));
    ASSERT_TRUE(decoded.has_value());
    EXPECT_TRUE(decoded->complete);
    const ByteView body = decoded->body();
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(body.data()), body.size()), text);
  }
}

INSTANTIATE_TEST_SUITE_P(Texts, RtfEncoderTest, ::testing::ValuesIn(kCases),
                         [](const ::testing::TestParamInfo<RtfCase>& info) {
                           return std::string(info.param.name);
                         });

TEST(RtfEncoderTest, LiteralStreamIsControlBytesLiteralsAndTheEndMarker) {
  const std::string text = "{\\rtf1 abcdefghijklmnop}";  // 24 bytes: three full runs
  const Bytes value = EncodeRtfLiteral(text);
  // 3 runs of a zero control byte and 8 literals, then a run with only the
  // end reference, which points at the write position (prologue + 24).
  ASSERT_EQ(value.size(), kRtfValueHeaderSize + 3 * 9 + 3);
  for (size_t run = 0; run < 3; ++run) EXPECT_EQ(value[kRtfValueHeaderSize + run * 9], 0);
  const size_t end = kRtfValueHeaderSize + 27;
  EXPECT_EQ(value[end], 0x01);
  EXPECT_EQ(((value[end + 1] << 8) | value[end + 2]) >> 4, RtfPrologue().size() + text.size());
}

TEST(RtfEncoderTest, ReferencesShrinkRepetitiveText) {
  const std::string text = Repeat("\\f0\\fs20 Wiederholung, Wiederholung. \\par ", 100);
  EXPECT_LT(EncodeRtfCompressed(text).size() * 4, EncodeRtfLiteral(text).size());
}

TEST(RtfEncoderTest, CrcMatchesThePublishedExample) {
  // The stream bytes of the "hello world" example value.
  const Bytes stream = {0x03, 0x00, 0x0a, 0x00, 0x72, 0x63, 0x70, 0x67, 0x31, 0x32, 0x35,
                        0x42, 0x32, 0x0a, 0xf3, 0x20, 0x68, 0x65, 0x6c, 0x09, 0x00, 0x20,
                        0x62, 0x77, 0x05, 0xb0, 0x6c, 0x64, 0x7d, 0x0a, 0x80, 0x0f, 0xa0};
  EXPECT_EQ(RtfCrc(ByteView(stream)), 0xA7C7C5F1u);
  EXPECT_EQ(RtfPrologue().size(), 207u);
}

}  // namespace
}  // namespace tarnwell::forge::exchange
