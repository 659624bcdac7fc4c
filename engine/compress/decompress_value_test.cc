#include "engine/compress/decompress_value.h"

#include <gtest/gtest.h>

#include <ostream>
#include <string>

#include "base/byte_view.h"

namespace tarnwell::engine {
namespace {

struct ValueCase {
  const char* name;
  int format;
  Bytes in;
  size_t cap;
  int error;
  std::string out;  // the bytes written, also on failure
};

void PrintTo(const ValueCase& c, std::ostream* os) { *os << c.name; }

// "abc" three times as an Xpress stream: three literals, a 6-byte match.
const Bytes kAbc3 = {0xff, 0xff, 0xff, 0x1f, 'a', 'b', 'c', 0x13, 0x00};

const ValueCase kCases[] = {
    {"copy", kValueFormatCopy, {'h', 'i'}, 2, kDecompressOk, "hi"},
    {"copy_empty", kValueFormatCopy, {}, 0, kDecompressOk, ""},
    {"copy_too_small", kValueFormatCopy, {'h', 'i'}, 1, kDecompressOutputTooSmall, ""},
    {"xpress", kValueFormatXpress, kAbc3, 9, kDecompressOk, "abcabcabc"},
    {"xpress_too_small", kValueFormatXpress, kAbc3, 5, kDecompressOutputTooSmall, "abcab"},
    {"xpress_truncated", kValueFormatXpress, Bytes(kAbc3.begin(), kAbc3.end() - 1), 9,
     kDecompressInputMalformed, "abc"},
    {"lznt1", 2, kAbc3, 9, kDecompressFormatNotSupported, ""},
    {"huffman", 4, kAbc3, 9, kDecompressFormatNotSupported, ""},
    {"negative", -1, kAbc3, 9, kDecompressFormatNotSupported, ""},
};

class DecompressValueTest : public ::testing::TestWithParam<ValueCase> {};

TEST_P(DecompressValueTest, WritesAndReports) {
  const ValueCase& c = GetParam();
  Bytes out(c.cap + 4, 0xee);
  int error = -1;
  const size_t n = DecompressValue(c.format, c.in.data(), c.in.size(), out.data(), c.cap, &error);
  EXPECT_EQ(error, c.error) << DecompressErrorText(error);
  ASSERT_EQ(n, c.out.size());
  EXPECT_EQ(std::string(out.begin(), out.begin() + n), c.out);
  for (size_t i = c.cap; i < out.size(); ++i) EXPECT_EQ(out[i], 0xee);
}

INSTANTIATE_TEST_SUITE_P(Formats, DecompressValueTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(DecompressValueEdgeTest, NullBuffersAreErrorsNotCrashes) {
  int error = -1;
  EXPECT_EQ(DecompressValue(kValueFormatXpress, nullptr, 9, nullptr, 0, &error), 0u);
  EXPECT_EQ(error, kDecompressInputMalformed);
  EXPECT_EQ(DecompressValue(kValueFormatXpress, kAbc3.data(), kAbc3.size(), nullptr, 9, &error),
            0u);
  EXPECT_EQ(error, kDecompressOutputTooSmall);
  // The error pointer is optional.
  EXPECT_EQ(DecompressValue(kValueFormatCopy, kAbc3.data(), kAbc3.size(), nullptr, 0, nullptr), 0u);
}

}  // namespace
}  // namespace tarnwell::engine
