#include "engine/compress/seven_bit.h"

#include <gtest/gtest.h>

#include <ostream>
#include <string>

#include "engine/compress/compress_test_support.h"

namespace tarnwell::engine {
namespace {

Bytes Utf16(const std::string& ascii) {
  Bytes out;
  for (char c : ascii) {
    out.push_back(static_cast<uint8_t>(c));
    out.push_back(0);
  }
  return out;
}

struct SevenBitCase {
  const char* name;
  const char* value;  // hex, header byte included
  std::string text;
};

void PrintTo(const SevenBitCase& c, std::ostream* os) { *os << c.name; }

// Packed by hand: seven bits a character, least significant bit first.
const SevenBitCase kCases[] = {
    {"header_only", "0f", ""},
    {"one_character", "0e78", "x"},
    {"two_characters", "0dc834", "Hi"},
    // 7 characters need 49 bits: one used bit in the last byte, and no
    // phantom eighth character from the seven padding bits.
    {"seven_characters", "0861f1985c369f01", "abcdefg"},
    // 8 characters fill 7 bytes exactly.
    {"eight_characters", "0f41e19058341e91", "ABCDEFGH"},
    {"fifteen_characters", "0861f1985c369fd169f59add76bf01", "abcdefghijklmno"},
    // A header claiming fewer used bits than a whole last character drops it.
    {"partial_last_character", "0bc834", "H"},
};

class SevenBitTest : public ::testing::TestWithParam<SevenBitCase> {};

TEST_P(SevenBitTest, AsciiAndUnicodeTargets) {
  const SevenBitCase& c = GetParam();
  const Bytes value = FromHex(c.value);
  EXPECT_EQ(SevenBitCharacterCount(value), c.text.size());
  const Bytes ascii = UnpackSevenBit(value, SevenBitTarget::kAscii);
  EXPECT_EQ(std::string(ascii.begin(), ascii.end()), c.text);
  EXPECT_EQ(UnpackSevenBit(value, SevenBitTarget::kUtf16), Utf16(c.text));
}

INSTANTIATE_TEST_SUITE_P(Values, SevenBitTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(SevenBitEdgeTest, EmptyValueHoldsNothing) {
  EXPECT_EQ(SevenBitCharacterCount(ByteView()), 0u);
  EXPECT_TRUE(UnpackSevenBit(ByteView(), SevenBitTarget::kAscii).empty());
}

}  // namespace
}  // namespace tarnwell::engine
