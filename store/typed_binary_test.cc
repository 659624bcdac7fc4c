#include "store/typed_binary.h"

#include <gtest/gtest.h>

namespace tarnwell::store {
namespace {

const Bytes kEight = {0x01, 0xD4, 0x2A, 0x5B, 0x8C, 0x3E, 0x00, 0x00};

TEST(TypedBinaryTest, ByteOrdersOfEachWidth) {
  uint32_t u32 = 0;
  EXPECT_EQ(ReadTypedU32(Bytes{0x78, 0x56, 0x34, 0x12}, ByteOrder::kLittle, &u32), 1);
  EXPECT_EQ(u32, 0x12345678u);
  EXPECT_EQ(ReadTypedU32(Bytes{0x12, 0x34, 0x56, 0x78}, ByteOrder::kBig, &u32), 1);
  EXPECT_EQ(u32, 0x12345678u);

  const Bytes guid_bytes = {0x33, 0x22, 0x11, 0x00, 0x55, 0x44, 0x77, 0x66,
                            0x88, 0x99, 0xAA, 0xBB, 0xCC, 0xDD, 0xEE, 0xFF};
  Guid g;
  ASSERT_EQ(ReadTypedGuid(guid_bytes, ByteOrder::kLittle, &g), 1);
  EXPECT_EQ(GuidText(g), "{00112233-4455-6677-8899-AABBCCDDEEFF}");
  ASSERT_EQ(ReadTypedGuid(guid_bytes, ByteOrder::kBig, &g), 1);
  EXPECT_EQ(GuidText(g), "{33221100-5544-7766-8899-AABBCCDDEEFF}");

  // Folder ids as text: lower case, no leading zeros.
  EXPECT_EQ(HexText(0x0001000000000A3Full), "1000000000a3f");
  EXPECT_EQ(HexText(0), "0");
  EXPECT_EQ(HexText(~0ull), "ffffffffffffffff");
}

TEST(TypedBinaryTest, WrongLengthIsRejectedAndLeavesOutputAlone) {
  for (size_t length : {0, 1, 3, 5, 7, 9, 12, 15, 17, 32}) {
    SCOPED_TRACE(length);
    const Bytes value(length, 0xAB);
    for (ByteOrder order : {ByteOrder::kLittle, ByteOrder::kBig}) {
      uint32_t u32 = 7;
      uint64_t u64 = 7;
      Guid g;
      g.data1 = 7;
      if (length != kTypedU32Size) {
        EXPECT_EQ(ReadTypedU32(value, order, &u32), -1);
        EXPECT_EQ(u32, 7u);
      }
      if (length != kTypedU64Size) {
        EXPECT_EQ(ReadTypedU64(value, order, &u64), -1);
        EXPECT_EQ(ReadTypedFileTime(value, order, &u64), -1);
        EXPECT_EQ(u64, 7u);
      }
      if (length != kTypedGuidSize) {
        EXPECT_EQ(ReadTypedGuid(value, order, &g), -1);
        EXPECT_EQ(g.data1, 7u);
      }
    }
  }
}

TEST(TypedBinaryTest, NameDecidesTheKindAndTheDecode) {
  const std::pair<const char*, TypedKind> kinds[] = {
      {"Tf", TypedKind::kFileTime},
      {"T3007", TypedKind::kFileTime},
      {"T123456", TypedKind::kFileTime},
      {"T1234567", TypedKind::kNone},
      {"T", TypedKind::kNone},
      {"Q6748", TypedKind::kInteger64},
      {"S3001", TypedKind::kNone},
      {"q6748", TypedKind::kNone},
      {"", TypedKind::kNone},
      {"MN81a9", TypedKind::kNone},
  };
  for (const auto& [name, kind] : kinds) EXPECT_EQ(TypedKindOfName(name), kind) << name;

  TypedValue v;
  EXPECT_EQ(DecodeTypedBinary("Q6748", kEight, ByteOrder::kLittle, &v), 1);
  EXPECT_EQ(v.kind, TypedKind::kInteger64);
  EXPECT_EQ(v.value, 0x00003E8C5B2AD401ull);
  // A legacy binary time: high half first, each half most significant first.
  EXPECT_EQ(DecodeTypedBinary("T3007", kEight, ByteOrder::kBig, &v), 1);
  EXPECT_EQ(v.kind, TypedKind::kFileTime);
  EXPECT_EQ(v.value, 0x01D42A5B8C3E0000ull);
  // Absent, untyped, and wrong-length values.
  EXPECT_EQ(DecodeTypedBinary("Q6748", Bytes{}, ByteOrder::kLittle, &v), 0);
  EXPECT_EQ(DecodeTypedBinary("N67b0", kEight, ByteOrder::kLittle, &v), 0);
  EXPECT_EQ(DecodeTypedBinary("Q6748", Bytes(9, 1), ByteOrder::kLittle, &v), -1);
}

}  // namespace
}  // namespace tarnwell::store
