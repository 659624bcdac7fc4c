#include "engine/record_columns.h"

#include <gtest/gtest.h>

namespace tarnwell::engine {
namespace {

CatalogEntry Column(uint32_t id, uint32_t type, uint32_t size = 0, uint32_t code_page = 0) {
  CatalogEntry c;
  c.type = kCatalogColumn;
  c.id = id;
  c.column_type_or_root = type;
  c.size = size;
  c.code_page = code_page;
  return c;
}

std::vector<const CatalogEntry*> Pointers(const std::vector<CatalogEntry>& columns) {
  std::vector<const CatalogEntry*> out;
  for (const auto& c : columns) out.push_back(&c);
  return out;
}

void Append(Bytes& out, std::initializer_list<uint8_t> bytes) {
  out.insert(out.end(), bytes.begin(), bytes.end());
}
void AppendU16(Bytes& out, uint16_t v) { Append(out, {uint8_t(v), uint8_t(v >> 8)}); }

// Fixed: 1 u32, 2 u16 (null by bitmap), 3 u8. Variable: 128 text, 129 null,
// 130 binary. Tagged: 256, 257, 300.
std::vector<CatalogEntry> Columns() {
  return {Column(1, kColumnUnsignedLong, 4), Column(2, kColumnShort, 2),
          Column(3, kColumnUnsignedByte, 1), Column(128, kColumnText, 255, 0),
          Column(129, kColumnBinary, 255),   Column(130, kColumnBinary, 255),
          Column(256, kColumnLongBinary),    Column(257, kColumnLongText, 0, 1200),
          Column(300, kColumnLong)};
}

Bytes FixedAndVariable() {
  Bytes r;
  Append(r, {3, 130});
  AppendU16(r, 4 + 7 + 1);  // fixed data, then a 1-byte null bitmap
  Append(r, {0x78, 0x56, 0x34, 0x12});
  Append(r, {0xFF, 0xFF});
  Append(r, {0x09});
  Append(r, {0x02});         // bit 1: column 2 is null
  AppendU16(r, 3);           // 128: "abc"
  AppendU16(r, 0x8000 | 3);  // 129: null
  AppendU16(r, 5);           // 130: 2 bytes
  Append(r, {'a', 'b', 'c', 0xDE, 0xAD});
  return r;
}

TEST(RecordColumnsTest, FixedAndVariableColumnsWithNulls) {
  auto columns = Columns();
  RecordColumns rc;
  ASSERT_TRUE(
      rc.Split(ByteView(FixedAndVariable()), Pointers(columns), TaggedForm::kSmallPageArray));
  uint32_t u32 = 0;
  EXPECT_EQ(rc.GetU32(0, &u32), 1);
  EXPECT_EQ(u32, 0x12345678u);
  EXPECT_FALSE(rc.at(1).present);  // null in the bitmap
  EXPECT_EQ(rc.GetU32(1, &u32), 0);
  uint8_t u8 = 0;
  EXPECT_EQ(rc.GetU8(2, &u8), 1);
  EXPECT_EQ(u8, 9);
  EXPECT_EQ(rc.at(3).value.ToString(), "abc");
  EXPECT_EQ(rc.at(3).code_page, kDefaultCodePage);
  EXPECT_FALSE(rc.at(4).present);
  EXPECT_EQ(rc.at(5).value.ToBytes(), (Bytes{0xDE, 0xAD}));
  for (size_t i = 6; i < columns.size(); ++i) EXPECT_FALSE(rc.at(i).present);
  EXPECT_TRUE(rc.complete());
  EXPECT_EQ(rc.GetU32(99, &u32), -1);
}

TEST(RecordColumnsTest, RecordWithoutVariableColumnsTreatsHighIdsAsTagged) {
  auto columns = Columns();
  Bytes r;
  Append(r, {1, 127});
  AppendU16(r, 8);
  Append(r, {1, 0, 0, 0});
  // Tagged area right after: one entry for 256.
  AppendU16(r, 256);
  AppendU16(r, 4);
  Append(r, {0xAB});
  RecordColumns rc;
  ASSERT_TRUE(rc.Split(ByteView(r), Pointers(columns), TaggedForm::kSmallPageArray));
  EXPECT_FALSE(rc.at(3).present);
  EXPECT_EQ(rc.at(6).value.ToBytes(), Bytes{0xAB});
}

struct TaggedCase {
  const char* name;
  TaggedForm form;
  Bytes area;
  // expected values of columns 256, 257, 300 (nullopt = absent)
  std::optional<Bytes> v256, v257, v300;
  uint8_t flag257 = 0;
};

TEST(RecordColumnsTest, TaggedAreaForms) {
  std::vector<TaggedCase> cases;
  {
    // Small pages: 257 has a flag byte (0x4000), 300 is marked null (0x2000),
    // and an entry for 280 (a deleted column) must not hide 300's successor.
    Bytes a;
    AppendU16(a, 256), AppendU16(a, 16);
    AppendU16(a, 257), AppendU16(a, 0x4000 | 18);
    AppendU16(a, 280), AppendU16(a, 20);
    AppendU16(a, 300), AppendU16(a, 0x2000 | 21);
    Append(a, {0x11, 0x22, 0x05, 'x', 0x99, 0x77});
    cases.push_back({"small", TaggedForm::kSmallPageArray, a, Bytes{0x11, 0x22}, Bytes{'x'},
                     std::nullopt, 0x05});
  }
  {
    // Large pages: every value has a flag byte; bit 0x8000 is not offset.
    Bytes a;
    AppendU16(a, 256), AppendU16(a, 0x8000 | 12);
    AppendU16(a, 257), AppendU16(a, 15);
    AppendU16(a, 300), AppendU16(a, 17);
    Append(a, {0x00, 0x11, 0x22, 0x02, 'y', 0x00, 0x2A, 0, 0, 0});
    cases.push_back({"large", TaggedForm::kLargePageArray, a, Bytes{0x11, 0x22}, Bytes{'y'},
                     Bytes{0x2A, 0, 0, 0}, 0x02});
  }
  {
    // Exchange 5.5 inline items; 257's size word counts its flag byte.
    Bytes a;
    AppendU16(a, 250), AppendU16(a, 0x8000 | 3), Append(a, {0x01, 0xEE, 0xEE});
    AppendU16(a, 256), AppendU16(a, 2), Append(a, {0x11, 0x22});
    AppendU16(a, 257), AppendU16(a, 0x8000 | 2), Append(a, {0x03, 'z'});
    AppendU16(a, 300), AppendU16(a, 4), Append(a, {7, 0, 0, 0});
    cases.push_back(
        {"inline", TaggedForm::kInline, a, Bytes{0x11, 0x22}, Bytes{'z'}, Bytes{7, 0, 0, 0}, 0x03});
  }
  auto columns = Columns();
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    Bytes r;
    Append(r, {0, 127});
    AppendU16(r, 4);
    r.insert(r.end(), c.area.begin(), c.area.end());
    RecordColumns rc;
    ASSERT_TRUE(rc.Split(ByteView(r), Pointers(columns), c.form));
    auto check = [&](size_t slot, const std::optional<Bytes>& want) {
      if (want) {
        ASSERT_TRUE(rc.at(slot).present) << slot;
        EXPECT_EQ(rc.at(slot).value.ToBytes(), *want) << slot;
      } else {
        EXPECT_FALSE(rc.at(slot).present) << slot;
      }
    };
    check(6, c.v256);
    check(7, c.v257);
    check(8, c.v300);
    EXPECT_EQ(rc.at(7).flag_byte, c.flag257);
    EXPECT_EQ(rc.at(7).code_page, 1200u);
    EXPECT_TRUE(rc.complete());
  }
}

TEST(RecordColumnsTest, DamagedRecordsKeepWhatFits) {
  auto columns = Columns();
  RecordColumns rc;
  EXPECT_FALSE(rc.Split(ByteView(Bytes{3, 130}), Pointers(columns), TaggedForm::kSmallPageArray));

  // Variable end offset beyond the record.
  Bytes r = FixedAndVariable();
  StoreU16LE(r.data() + 12 + 4, 0x7000);
  ASSERT_TRUE(rc.Split(ByteView(r), Pointers(columns), TaggedForm::kSmallPageArray));
  EXPECT_TRUE(rc.at(3).present);
  EXPECT_FALSE(rc.at(5).present);
  EXPECT_FALSE(rc.complete());

  // Tagged offsets pointing past the end; and an array length of 0xFFFF.
  for (uint16_t word : {uint16_t(0x1FFF), uint16_t(0x0001), uint16_t(0xFFFF)}) {
    Bytes t;
    Append(t, {0, 127});
    AppendU16(t, 4);
    AppendU16(t, 256), AppendU16(t, 8);
    AppendU16(t, 257), AppendU16(t, word);
    Append(t, {1, 2, 3});
    ASSERT_TRUE(rc.Split(ByteView(t), Pointers(columns), TaggedForm::kSmallPageArray));
    EXPECT_FALSE(rc.at(7).present && rc.at(7).value.size() > 3);
  }

  // Fixed columns wider than the record.
  Bytes f;
  Append(f, {3, 127});
  AppendU16(f, 200);
  Append(f, {1, 2});
  ASSERT_TRUE(rc.Split(ByteView(f), Pointers(columns), TaggedForm::kSmallPageArray));
  EXPECT_FALSE(rc.at(0).present);
}

TEST(ColumnValueTest, GettersHonourTypeSizeSignAndByteOrder) {
  auto value = [](uint8_t type, Bytes bytes, char order = kByteOrderLittle) {
    static std::vector<Bytes> keep;
    keep.push_back(std::move(bytes));
    ColumnValue v;
    v.filled = v.present = true;
    v.type_code = type;
    v.value = ByteView(keep.back());
    v.byte_order = order;
    return v;
  };
  uint32_t u32 = 1;
  uint64_t u64 = 0;
  EXPECT_EQ(GetU32(value(kTypeLong, {1, 2, 3, 4}, kByteOrderBig), &u32), 1);
  EXPECT_EQ(u32, 0x01020304u);
  EXPECT_EQ(GetU32(value(kTypeShort, {0xFF, 0xFF}), &u32), 1);
  EXPECT_EQ(u32, 0u);  // negative short reads as 0
  EXPECT_EQ(GetU64(value(kTypeShort, {0xFF, 0xFF}), &u64), 1);
  EXPECT_EQ(u64, 0x8000000000007FFFull);
  EXPECT_EQ(GetU64(value(kTypeLong, {0xFE, 0xFF, 0xFF, 0xFF}), &u64), 1);
  EXPECT_EQ(u64, 0x800000007FFFFFFEull);
  EXPECT_EQ(GetU64(value(kTypeUnsignedShort, {0xFF, 0xFF}), &u64), 1);
  EXPECT_EQ(u64, 0xFFFFu);
  EXPECT_EQ(GetU64(value(kTypeDateTime, {1, 0, 0, 0, 0, 0, 0, 0}), &u64), 1);
  EXPECT_EQ(GetU64(value(kTypeDateTime, {1, 0, 0, 0, 0, 0, 0, 0}, kByteOrderBig), &u64), 0);
  EXPECT_EQ(GetU32(value(kTypeLong, {1, 2, 3}), &u32), -1);       // wrong size
  EXPECT_EQ(GetU32(value(kTypeText, {1, 2, 3, 4}), &u32), 0);     // wrong type
  EXPECT_EQ(GetU32(value(kTypeLongLong, Bytes(8, 0)), &u32), 0);  // too wide for u32
  double d = 0;
  EXPECT_EQ(GetDouble(value(kTypeFloat, {0, 0, 0xC0, 0x3F}), &d), 1);
  EXPECT_DOUBLE_EQ(d, 1.5);
  EXPECT_EQ(GetDouble(value(kTypeDouble, {0, 0, 0, 0, 0, 0, 0xF8, 0x3F}), &d), 1);
  EXPECT_DOUBLE_EQ(d, 1.5);
  ColumnValue empty;
  EXPECT_EQ(GetU32(empty, &u32), 0);
}

}  // namespace
}  // namespace tarnwell::engine
