#include "base/byte_view.h"

#include <gtest/gtest.h>

namespace tarnwell {
namespace {

TEST(ByteViewTest, ReadsNeverCrossTheEnd) {
  const uint8_t raw[] = {0x01, 0x02, 0x03, 0x04, 0x05};
  ByteView v(raw, sizeof raw);
  uint32_t u32 = 0;
  EXPECT_TRUE(v.ReadU32LE(1, &u32));
  EXPECT_EQ(u32, 0x05040302u);
  EXPECT_FALSE(v.ReadU32LE(2, &u32));
  uint16_t u16 = 0;
  EXPECT_FALSE(v.ReadU16LE(SIZE_MAX, &u16));  // offset + width overflows
  EXPECT_EQ(v.U16LE(4, 0xBEEF), 0xBEEF);
  EXPECT_TRUE(v.Sub(3, 3).empty());
  EXPECT_EQ(v.Sub(3, 2).size(), 2u);
  EXPECT_TRUE(v.From(6).empty());
  uint32_t be = 0;
  EXPECT_TRUE(v.ReadU32BE(0, &be));
  EXPECT_EQ(be, 0x01020304u);
  EXPECT_EQ(ToHex(v.Sub(0, 2)), "0102");
}

}  // namespace
}  // namespace tarnwell
