#include "engine/compress/xpress_decoder.h"

#include <gtest/gtest.h>

#include <ostream>
#include <string>
#include <vector>

#include "engine/compress/compress_test_support.h"

namespace tarnwell::engine {
namespace {

struct GoodCase {
  std::string name;
  std::string stream;
  std::string text;
};

void PrintTo(const GoodCase& c, std::ostream* os) { *os << c.name; }

std::string Repeat(const std::string& s, size_t times) {
  std::string out;
  while (times-- > 0) out += s;
  return out;
}

std::vector<GoodCase> GoodCases() {
  return {
      // The two worked examples Microsoft publishes for Plain LZ77.
      {"published_literals", "3f000000 6162636465666768696a6b6c6d6e6f707172737475767778797a",
       "abcdefghijklmnopqrstuvwxyz"},
      {"published_match", "ffffff1f 616263 1700 0f ff 2601", Repeat("abc", 100)},
      // 32 literals fill the first flag word; the second holds the end marker.
      {"second_flag_word",
       "00000000 4142434445464748494a4b4c4d4e4f505152535455565758595a5b5c5d5e5f60 ffffffff",
       "ABCDEFGHIJKLMNOPQRSTUVWXYZ[\\]^_`"},
      // Every length form, built by hand: one literal 'a' then matches at distance 1.
      {"short_code", "ffffff7f 61 0600", std::string(1 + 9, 'a')},
      {"nibble", "ffffff7f 61 0700 00", std::string(1 + 10, 'a')},
      {"nibble_max", "ffffff7f 61 0700 0e", std::string(1 + 24, 'a')},
      {"extra8", "ffffff7f 61 0700 0f 00", std::string(1 + 25, 'a')},
      {"extra8_max", "ffffff7f 61 0700 0f fe", std::string(1 + 279, 'a')},
      {"extra16", "ffffff7f 61 0700 0f ff 1501", std::string(1 + 280, 'a')},
      {"extra16_max", "ffffff7f 61 0700 0f ff ffff", std::string(1 + 65538, 'a')},
      {"extra32", "ffffff7f 61 0700 0f ff 0000 00000100", std::string(1 + 65539, 'a')},
      // Two long matches share one length byte: low half first, then high half.
      {"shared_nibble", "ffffff7f 61 0700 f0 0700 00", std::string(1 + 10 + 25, 'a')},
      // A third long match opens a fresh shared byte.
      {"shared_nibble_reopen", "ffffff7f 61 0700 21 0700 0700 03",
       std::string(1 + 11 + 12 + 13, 'a')},
  };
}

class XpressGoodTest : public ::testing::TestWithParam<GoodCase> {};

TEST_P(XpressGoodTest, Decodes) {
  const GoodCase& c = GetParam();
  std::string out(c.text.size() + 8, '\0');
  const XpressResult r =
      DecodePlainLz77(FromHex(c.stream), reinterpret_cast<uint8_t*>(out.data()), out.size());
  EXPECT_EQ(r.code, XpressCode::kOk);
  out.resize(r.written);
  EXPECT_EQ(out, c.text);
}

INSTANTIATE_TEST_SUITE_P(Streams, XpressGoodTest, ::testing::ValuesIn(GoodCases()),
                         [](const auto& info) { return info.param.name; });

struct BadCase {
  const char* name;
  const char* stream;
  size_t cap;
  XpressCode code;
  size_t written;
};

void PrintTo(const BadCase& c, std::ostream* os) { *os << c.name; }

const BadCase kBadCases[] = {
    {"empty", "", 16, XpressCode::kMalformed, 0},
    {"short_flag_word", "ffffff", 16, XpressCode::kMalformed, 0},
    {"literal_past_input", "00000000 61", 16, XpressCode::kMalformed, 1},
    {"match_before_output", "ffffffff 0000", 16, XpressCode::kMalformed, 0},
    {"distance_past_output", "ffffff7f 61 0800", 16, XpressCode::kMalformed, 1},
    {"token_cut", "ffffff7f 61 07", 16, XpressCode::kMalformed, 1},
    {"nibble_cut", "ffffff7f 61 0700", 16, XpressCode::kMalformed, 1},
    {"extra8_cut", "ffffff7f 61 0700 0f", 64, XpressCode::kMalformed, 1},
    {"extra16_cut", "ffffff7f 61 0700 0f ff 15", 512, XpressCode::kMalformed, 1},
    {"extra16_too_small", "ffffff7f 61 0700 0f ff 1500", 512, XpressCode::kMalformed, 1},
    {"extra32_cut", "ffffff7f 61 0700 0f ff 0000 0000", 512, XpressCode::kMalformed, 1},
    {"extra32_too_small", "ffffff7f 61 0700 0f ff 0000 05000000", 512, XpressCode::kMalformed, 1},
    {"literal_no_room", "3f000000 616263", 2, XpressCode::kOutputTooSmall, 2},
    {"match_no_room", "ffffff7f 61 0600", 5, XpressCode::kOutputTooSmall, 5},
    // A 4 GiB match into a small buffer fills the buffer and stops.
    {"huge_match", "ffffff7f 61 0700 0f ff 0000 ffffffff", 100, XpressCode::kOutputTooSmall, 100},
    {"no_output_buffer", "3f000000 61", 0, XpressCode::kOutputTooSmall, 0},
};

class XpressBadTest : public ::testing::TestWithParam<BadCase> {};

TEST_P(XpressBadTest, FailsCleanly) {
  const BadCase& c = GetParam();
  // Sentinel bytes after the capacity catch writes past the end.
  Bytes out(c.cap + 16, 0xee);
  const XpressResult r = DecodePlainLz77(FromHex(c.stream), out.data(), c.cap);
  EXPECT_EQ(r.code, c.code);
  EXPECT_EQ(r.written, c.written);
  for (size_t i = c.cap; i < out.size(); ++i) ASSERT_EQ(out[i], 0xee) << "byte " << i;
}

INSTANTIATE_TEST_SUITE_P(Streams, XpressBadTest, ::testing::ValuesIn(kBadCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(XpressDecoderTest, OutputFullEndsStreamWhenSizeIsKnown) {
  // A complete stream followed by a stray byte where the end marker's match
  // token would be: strict decoding rejects it, known-size decoding does not.
  const Bytes stream = FromHex("ffffff7f 61 0600 aa");
  Bytes out(10);
  EXPECT_EQ(DecodePlainLz77(stream, out.data(), out.size()).code, XpressCode::kMalformed);
  const XpressResult r = DecodePlainLz77(stream, out.data(), out.size(), XpressEnd::kOutputFull);
  EXPECT_EQ(r.code, XpressCode::kOk);
  EXPECT_EQ(r.written, 10u);
  EXPECT_EQ(Bytes(10, 'a'), out);
  // A stream that ends early still reports how much it produced.
  Bytes big(20);
  const XpressResult short_r =
      DecodePlainLz77(FromHex("ffffff7f 61 0600"), big.data(), big.size(), XpressEnd::kOutputFull);
  EXPECT_EQ(short_r.code, XpressCode::kOk);
  EXPECT_EQ(short_r.written, 10u);
}

}  // namespace
}  // namespace tarnwell::engine
