#include "testing/forge_record.h"

#include <gtest/gtest.h>

namespace tarnwell::forge {
namespace {

const std::vector<ColumnLayout> kColumns = {
    {1, "A", kColumnLong},
    {2, "B", kColumnShort},
    {3, "C", kColumnBit},
    {128, "V1", kColumnText, 255, 1252},
    {129, "V2", kColumnBinary, 255},
    {130, "V3", kColumnBinary, 255},
    {256, "T1", kColumnLongText},
    {300, "T2", kColumnLongBinary},
};

Bytes Record(const std::vector<Cell>& cells, TaggedLayout layout = TaggedLayout::kSmallPages) {
  Bytes out;
  Status s = EncodeRecord(kColumns, cells, layout, &out);
  EXPECT_TRUE(s.ok()) << s.message();
  return out;
}

struct LayoutCase {
  const char* name;
  std::vector<Cell> cells;
  TaggedLayout layout;
  Bytes expected;
};

// Whole records byte for byte: the layouts other readers rely on.
TEST(ForgeRecordTest, Layouts) {
  const LayoutCase cases[] = {
      {"empty record", {}, TaggedLayout::kSmallPages, {0, 127, 4, 0}},
      {"fixed only, trailing columns left out",
       {{1, LittleEndian(0x11223344, 4)}},
       TaggedLayout::kSmallPages,
       {1, 127, 9, 0, 0x44, 0x33, 0x22, 0x11, 0x00}},
      {"fixed null in the middle sets its bitmap bit",
       {{1, LittleEndian(1, 4)}, {2, std::nullopt}, {3, Bytes{0xFF}}},
       TaggedLayout::kSmallPages,
       {3, 127, 12, 0, 1, 0, 0, 0, 0, 0, 0xFF, 0x02}},
      {"variable values with an explicit and an implied null",
       {{128, Bytes{'a', 'b'}}, {129, std::nullopt}, {130, Bytes{0x01}}},
       TaggedLayout::kSmallPages,
       {0, 130, 4, 0, 2, 0, 2, 0x80, 3, 0, 'a', 'b', 0x01}},
      {"tagged on small pages: flag byte only when asked for",
       {{256, Bytes{'x'}}, {300, Bytes{0xAA, 0xBB}, kTaggedLongValue}},
       TaggedLayout::kSmallPages,
       {0, 127, 4, 0, 0x00, 0x01, 8, 0x00, 0x2C, 0x01, 9, 0x40, 'x', 0x01, 0xAA, 0xBB}},
      {"tagged null on small pages has no bytes",
       {{256, std::nullopt}, {300, Bytes{0x55}}},
       TaggedLayout::kSmallPages,
       {0, 127, 4, 0, 0x00, 0x01, 8, 0x20, 0x2C, 0x01, 8, 0x00, 0x55}},
      {"tagged on large pages: every value has a flag byte",
       {{256, Bytes{'x'}}, {300, std::nullopt, kTaggedMultiValued}},
       TaggedLayout::kLargePages,
       {0, 127, 4, 0, 0x00, 0x01, 8, 0x00, 0x2C, 0x01, 10, 0x00, 0x00, 'x', 0x28}},
      {"revision 2: id, size, value triples",
       {{256, Bytes{'x', 'y'}}, {300, Bytes{0x77}, kTaggedLongValue}},
       TaggedLayout::kLinear,
       {0, 127, 4, 0, 0x00, 0x01, 2, 0x00, 'x', 'y', 0x2C, 0x01, 2, 0x80, 0x01, 0x77}},
  };
  for (const LayoutCase& c : cases) {
    EXPECT_EQ(ToHex(Record(c.cells, c.layout)), ToHex(c.expected)) << c.name;
  }
}

TEST(ForgeRecordTest, RejectsCellsThatDoNotMatchTheColumns) {
  const std::vector<std::vector<Cell>> bad = {
      {{1, Bytes{1, 2}}},                  // fixed value of the wrong width
      {{999, Bytes{1}}},                   // no such column
      {{128, Bytes{1}}, {128, Bytes{2}}},  // the same column twice
  };
  for (const auto& cells : bad) {
    Bytes out;
    EXPECT_FALSE(EncodeRecord(kColumns, cells, TaggedLayout::kSmallPages, &out).ok());
  }
}

TEST(ForgeRecordTest, ChecksColumnDefinitions) {
  EXPECT_TRUE(CheckColumns(kColumns).ok());
  const std::vector<std::vector<ColumnLayout>> bad = {
      {{2, "A", kColumnLong}, {1, "B", kColumnLong}},  // not ascending
      {{1, "A", kColumnBinary}},                       // fixed binary without a size
      {{1, "", kColumnLong}},                          // no name
      {{0, "A", kColumnLong}},                         // id 0
  };
  for (const auto& columns : bad) EXPECT_FALSE(CheckColumns(columns).ok());
}

TEST(ForgeRecordTest, MultiValueOffsetsCountFromTheStart) {
  EXPECT_EQ(ToHex(EncodeMultiValue({{'a'}, {'b', 'c'}})), "04000500616263");
}

TEST(ForgeRecordTest, LayoutFollowsPageSizeAndRevision) {
  EXPECT_EQ(TaggedLayoutFor({4096, 2, 0}), TaggedLayout::kLinear);
  EXPECT_EQ(TaggedLayoutFor({4096, 9, 0}), TaggedLayout::kSmallPages);
  EXPECT_EQ(TaggedLayoutFor({8192, 17, 0}), TaggedLayout::kSmallPages);
  EXPECT_EQ(TaggedLayoutFor({32768, 17, 0}), TaggedLayout::kLargePages);
}

}  // namespace
}  // namespace tarnwell::forge
