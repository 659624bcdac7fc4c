#include "testing/encoders/xpress_encoder.h"

#include <gtest/gtest.h>

#include <ostream>
#include <string>
#include <vector>

#include "engine/compress/compress_test_support.h"
#include "engine/compress/compressed_value.h"
#include "engine/compress/decompress_value.h"
#include "engine/compress/xpress_decoder.h"

namespace tarnwell::forge {
namespace {

using engine::DecodePlainLz77;
using engine::FromHex;
using engine::Noise;
using engine::XpressCode;
using engine::XpressResult;

Bytes FromString(const std::string& s) { return Bytes(s.begin(), s.end()); }

Bytes Repeat(size_t n, uint8_t b = 'a') { return Bytes(n, b); }

Bytes Concat(std::initializer_list<Bytes> parts) {
  Bytes out;
  for (const Bytes& p : parts) out.insert(out.end(), p.begin(), p.end());
  return out;
}

Bytes Text(size_t n) {
  const std::string sentence =
      "Dear team, the quarterly mailbox export finished; please review the attached report. ";
  std::string s;
  for (size_t i = 0; s.size() < n; ++i) s += sentence + std::to_string(i % 17) + " ";
  s.resize(n);
  return FromString(s);
}

TEST(XpressEncoderTest, ReproducesPublishedExamples) {
  EXPECT_EQ(XpressCompress(FromString("abcdefghijklmnopqrstuvwxyz")),
            FromHex("3f000000 6162636465666768696a6b6c6d6e6f707172737475767778797a"));
  std::string abc;
  for (int i = 0; i < 100; ++i) abc += "abc";
  EXPECT_EQ(XpressCompress(FromString(abc)), FromHex("ffffff1f 616263 1700 0f ff 2601"));
}

struct RoundTripCase {
  std::string name;
  Bytes plain;
  size_t max_stream;  // upper bound proving matches were used; 0 = none
};

void PrintTo(const RoundTripCase& c, std::ostream* os) { *os << c.name; }

std::vector<RoundTripCase> RoundTripCases() {
  return {
      {"empty", {}, 4},
      {"one_byte", {0x7f}, 5},
      {"no_match", Noise(31, 1), 0},
      {"literals_32", Noise(32, 2), 0},
      {"literals_33", Noise(33, 3), 0},
      // One literal then one match of the length in the name: every
      // boundary of the length forms.
      {"match_3", Repeat(1 + 3), 8},
      {"match_9", Repeat(1 + 9), 8},
      {"match_10", Repeat(1 + 10), 8},
      {"match_24", Repeat(1 + 24), 8},
      {"match_25", Repeat(1 + 25), 9},
      {"match_279", Repeat(1 + 279), 9},
      {"match_280", Repeat(1 + 280), 11},
      {"match_65538", Repeat(1 + 65538), 11},
      {"match_65539", Repeat(1 + 65539), 15},
      {"match_200000", Repeat(1 + 200000), 15},
      // Consecutive long matches share their 4-bit length byte.
      {"shared_nibbles",
       Concat({Repeat(12, 'a'), Repeat(30, 'b'), Repeat(11, 'c'), Repeat(300, 'd'),
               Repeat(70000, 'e')}),
       40},
      {"distance_8192", Concat({Noise(8192, 4), Noise(8192, 4)}), 8192 + 8192 / 8 + 32},
      {"distance_8193", Concat({Noise(8193, 5), Noise(8193, 5)}), 0},
      {"text", Text(20000), 20000 / 4},
      {"noise", Noise(100000, 6), 0},
  };
}

class XpressRoundTripTest : public ::testing::TestWithParam<RoundTripCase> {};

TEST_P(XpressRoundTripTest, DecoderGetsOriginalBack) {
  const RoundTripCase& c = GetParam();
  const Bytes stream = XpressCompress(c.plain);
  if (c.max_stream != 0) {
    EXPECT_LE(stream.size(), c.max_stream);
  }
  Bytes out(c.plain.size() + 1, 0xee);
  const XpressResult r = DecodePlainLz77(stream, out.data(), c.plain.size());
  ASSERT_EQ(r.code, XpressCode::kOk);
  ASSERT_EQ(r.written, c.plain.size());
  out.pop_back();
  EXPECT_TRUE(out == c.plain);
  // The same through the value layer when the size fits its header.
  if (c.plain.size() <= 0xffff) {
    const engine::DecodedValue v = engine::DecodeCompressedValue(EncodeEseXpressValue(c.plain));
    ASSERT_TRUE(v.ok()) << v.message;
    EXPECT_TRUE(v.bytes == c.plain);
  } else {
    EXPECT_TRUE(EncodeEseXpressValue(c.plain).empty());
  }
}

INSTANTIATE_TEST_SUITE_P(Inputs, XpressRoundTripTest, ::testing::ValuesIn(RoundTripCases()),
                         [](const auto& info) { return info.param.name; });

// Damaged streams: a cut stream yields an error or a shorter prefix of the
// original, a flipped byte anything but a write outside the buffer.
TEST(XpressEncoderTest, DamagedStreamsFailCleanly) {
  const Bytes plain = Concat({Text(3000), Repeat(400, 'z'), Text(500), Repeat(70000, 'q')});
  const Bytes stream = XpressCompress(plain);
  constexpr size_t kSentinel = 64;
  for (size_t cut = 0; cut < stream.size(); ++cut) {
    Bytes out(plain.size() + kSentinel, 0xee);
    const XpressResult r = DecodePlainLz77(ByteView(stream.data(), cut), out.data(), plain.size());
    ASSERT_LE(r.written, plain.size());
    if (r.code == XpressCode::kOk) {
      ASSERT_LT(r.written, plain.size()) << "cut " << cut;
    }
    ASSERT_TRUE(std::equal(out.begin(), out.begin() + r.written, plain.begin())) << "cut " << cut;
    for (size_t i = plain.size(); i < out.size(); ++i) ASSERT_EQ(out[i], 0xee);
  }
  Bytes damaged = stream;
  for (size_t pos = 0; pos < damaged.size(); pos += 7) {
    for (uint8_t mask : {0x01, 0x10, 0x80, 0xff}) {
      damaged[pos] ^= mask;
      Bytes out(plain.size() + kSentinel, 0xee);
      int error = -1;
      const size_t n = engine::DecompressValue(engine::kValueFormatXpress, damaged.data(),
                                               damaged.size(), out.data(), plain.size(), &error);
      ASSERT_LE(n, plain.size());
      if (error != engine::kDecompressOk) {
        ASSERT_TRUE(error == engine::kDecompressInputMalformed ||
                    error == engine::kDecompressOutputTooSmall);
      }
      for (size_t i = plain.size(); i < out.size(); ++i) ASSERT_EQ(out[i], 0xee);
      damaged[pos] ^= mask;
    }
  }
}

}  // namespace
}  // namespace tarnwell::forge
