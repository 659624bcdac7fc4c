#include "testing/encoders/seven_bit_encoder.h"

#include <gtest/gtest.h>

#include <string>

#include "engine/compress/compressed_value.h"

namespace tarnwell::forge {
namespace {

using engine::CompressionScheme;
using engine::DecodeCompressedValue;
using engine::DecodedValue;

// Every length up to 24 meets every position of the last character in its byte.
TEST(SevenBitEncoderTest, RoundTripsEveryTailLength) {
  const std::string alphabet = "The quick brown fox jumps~";
  for (size_t n = 0; n <= 24; ++n) {
    SCOPED_TRACE("length " + std::to_string(n));
    const std::string text = alphabet.substr(0, n);
    const Bytes ascii = EncodeSevenBitAscii(text);
    EXPECT_EQ(ascii.size(), 1 + (7 * n + 7) / 8);
    const DecodedValue a = DecodeCompressedValue(ascii);
    ASSERT_TRUE(a.ok()) << a.message;
    EXPECT_EQ(a.scheme, CompressionScheme::kSevenBitAscii);
    EXPECT_EQ(std::string(a.bytes.begin(), a.bytes.end()), text);

    const std::u16string wide(text.begin(), text.end());
    const Bytes unicode = EncodeSevenBitUnicode(wide);
    EXPECT_EQ(unicode.size(), ascii.size());
    const DecodedValue u = DecodeCompressedValue(unicode);
    ASSERT_TRUE(u.ok()) << u.message;
    EXPECT_TRUE(u.is_utf16);
    ASSERT_EQ(u.bytes.size(), 2 * n);
    for (size_t i = 0; i < n; ++i) {
      EXPECT_EQ(u.bytes[2 * i] | (u.bytes[2 * i + 1] << 8), wide[i]);
    }
  }
}

TEST(SevenBitEncoderTest, HeaderCountsUsedBits) {
  EXPECT_EQ(EncodeSevenBitAscii(""), Bytes({0x0f}));
  EXPECT_EQ(EncodeSevenBitAscii("x"), Bytes({0x0e, 0x78}));
  EXPECT_EQ(EncodeSevenBitAscii("abcdefg")[0], 0x08);     // 49 bits: one used in the last byte
  EXPECT_EQ(EncodeSevenBitAscii("ABCDEFGH").size(), 8u);  // 56 bits fill 7 bytes
  EXPECT_EQ(EncodeSevenBitAscii("ABCDEFGH")[0], 0x0f);
  EXPECT_EQ(EncodeSevenBitUnicode(u"Hi")[0], 0x15);
}

TEST(SevenBitEncoderTest, RefusesCharactersAboveSevenBits) {
  EXPECT_TRUE(EncodeSevenBitAscii("caf\xc3\xa9").empty());
  EXPECT_TRUE(EncodeSevenBitUnicode(u"caf\u00e9").empty());
  EXPECT_TRUE(EncodeSevenBitUnicode(u"\u0100").empty());
}

}  // namespace
}  // namespace tarnwell::forge
