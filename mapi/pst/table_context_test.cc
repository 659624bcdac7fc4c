#include "mapi/pst/table_context.h"

#include <gtest/gtest.h>

#include "mapi/pst/bth.h"
#include "mapi/pst/heap_on_node.h"
#include "mapi/pst/pst_test_support.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr PropTag kRowId = 0x67F20003;
constexpr PropTag kRowVer = 0x67F30003;
constexpr PropTag kDisplayName = MakeTag(0x3001, kTypeUnicode);
constexpr PropTag kContentCount = MakeTag(0x3602, kTypeInt32);
constexpr PropTag kSubfolders = MakeTag(0x360A, kTypeBoolean);
constexpr PropTag kDelivery = MakeTag(0x0E06, kTypeSysTime);
constexpr PropTag kImportance = MakeTag(0x0017, kTypeInt16);
constexpr PropTag kSearchKey = MakeTag(0x300B, kTypeBinary);
constexpr PropTag kGuid = MakeTag(0x6800, kTypeGuid);
constexpr PropTag kKeywords = MakeTag(0x6801, kTypeUnicode | kMultiFlag);
constexpr PropTag kFlags = MakeTag(0x6802, kTypeInt32 | kMultiFlag);

const std::vector<PropTag> kColumns = {kDisplayName, kContentCount, kSubfolders,
                                       kDelivery,    kImportance,   kSearchKey,
                                       kGuid,        kKeywords,     kFlags};

TableRow MakeRow(uint32_t id, size_t i) {
  TableRow row;
  row.row_id = id;
  row.cells[kDisplayName] = PropertyValue::Unicode("Row " + std::to_string(i));
  row.cells[kContentCount] = PropertyValue::Int32(int32_t(i * 3));
  row.cells[kSubfolders] = PropertyValue::Boolean(i % 2 == 0);
  row.cells[kDelivery] = PropertyValue::SysTime(0x01D0'0000'0000'0000ull + i);
  if (i % 3 != 0) row.cells[kImportance] = PropertyValue::Int16(int16_t(i % 3));
  if (i % 5 == 1) row.cells[kSearchKey] = PropertyValue::Binary(Pattern(i % 7 == 1 ? 5000 : 16, 1));
  if (i % 4 == 2) row.cells[kGuid] = PropertyValue::Guid(Pattern(16, uint8_t(i)));
  if (i % 6 == 0) row.cells[kKeywords] = PropertyValue::MultiUnicode({"a", "", "bcd"});
  if (i % 9 == 0) {
    PropertyValue flags;
    flags.type = kTypeInt32 | kMultiFlag;
    flags.elements = {{1, 0, 0, 0}, {2, 0, 0, 0}};
    row.cells[kFlags] = flags;
  }
  if (i % 10 == 0) row.cells[kDisplayName] = PropertyValue::Unicode("");
  return row;
}

std::vector<TableRow> MakeRows(size_t n) {
  std::vector<TableRow> rows;
  for (size_t i = 0; i < n; ++i)
    rows.push_back(MakeRow(MakeNid(kNidTypeNormalMessage, 0x400 + uint32_t(i) * 7), i));
  return rows;
}

// The decoded row: the written cells plus row id and version.
void ExpectRowsMatch(const std::vector<TableRow>& want, const std::vector<TableRow>& got) {
  ASSERT_EQ(want.size(), got.size());
  for (size_t i = 0; i < want.size(); ++i) {
    EXPECT_EQ(got[i].row_id, want[i].row_id) << i;
    auto cells = got[i].cells;
    ASSERT_EQ(cells.count(kRowId), 1u) << i;
    EXPECT_EQ(cells[kRowId], PropertyValue::Int32(int32_t(want[i].row_id)));
    ASSERT_EQ(cells.count(kRowVer), 1u) << i;
    cells.erase(kRowId);
    cells.erase(kRowVer);
    EXPECT_EQ(cells, want[i].cells) << i;
  }
}

class TableSizeTest : public ::testing::TestWithParam<size_t> {};

// Small tables keep the row matrix in the heap; hundreds of rows move it to
// a subnode whose blocks hold whole rows only, beside the subnodes the node
// has already.
TEST_P(TableSizeTest, RowsRoundTrip) {
  const std::vector<TableRow> rows = MakeRows(GetParam());
  NodeContent node;
  node.subnodes[MakeNid(kNidTypeLtp, 1)].blocks = {Bytes{9}};
  node.subnodes[0x671].blocks = {Bytes{8}};
  ASSERT_TRUE(EncodeTableContext(kColumns, rows, &node).ok());
  for (const Bytes& b : node.blocks) EXPECT_LE(b.size(), kMaxBlockData);
  EXPECT_EQ(node.subnodes.at(MakeNid(kNidTypeLtp, 1)).blocks, std::vector<Bytes>{Bytes{9}});
  EXPECT_EQ(node.subnodes.at(0x671).blocks, std::vector<Bytes>{Bytes{8}});

  std::vector<PropTag> columns;
  std::vector<TableRow> got;
  ASSERT_TRUE(DecodeTableContext(node, &columns, &got).ok());
  EXPECT_EQ(columns.size(), kColumns.size() + 2);
  EXPECT_TRUE(std::is_sorted(columns.begin(), columns.end()));
  ExpectRowsMatch(rows, got);

  HeapReader heap;
  ASSERT_TRUE(heap.Open(node.blocks).ok());
  ByteView info;
  ASSERT_TRUE(heap.Read(heap.user_root(), &info).ok());
  const size_t row_size = info.U16LE(8);
  const uint32_t matrix = info.U32LE(14);
  if (rows.empty()) {
    EXPECT_EQ(matrix, 0u);
  } else if (rows.size() * row_size <= kMaxHeapAllocation) {
    EXPECT_EQ(NidTypeOf(matrix), kNidTypeHid);
  } else {
    ASSERT_EQ(NidTypeOf(matrix), kNidTypeLtp);
    const NodeContent& sub = node.subnodes.at(matrix);
    const size_t per_block = kMaxBlockData / row_size;
    EXPECT_EQ(sub.blocks.size(), (rows.size() + per_block - 1) / per_block);
    for (size_t b = 0; b + 1 < sub.blocks.size(); ++b) {
      EXPECT_EQ(sub.blocks[b].size(), kMaxBlockData);
    }
  }
  // The row index maps every row id to its row number.
  uint8_t k = 0, d = 0;
  std::vector<Bytes> index;
  ASSERT_TRUE(ReadBth(heap, info.U32LE(10), &k, &d, &index).ok());
  EXPECT_EQ(k, 4);
  EXPECT_EQ(d, 4);
  ASSERT_EQ(index.size(), rows.size());
  for (const Bytes& r : index) {
    const uint32_t at = LoadU32LE(r.data() + 4);
    ASSERT_LT(at, rows.size());
    EXPECT_EQ(LoadU32LE(r.data()), rows[at].row_id);
  }
}

INSTANTIATE_TEST_SUITE_P(Sizes, TableSizeTest, ::testing::Values(0, 1, 20, 600, 1200));

// Offsets, widths and existence bits as the TCINFO must describe them.
TEST(TableContextTest, ColumnsAreLaidOutBySize) {
  TableRow row;
  row.row_id = 0x8022;
  row.cells[kSubfolders] = PropertyValue::Boolean(true);
  row.cells[kDisplayName] = PropertyValue::Unicode("Inbox");
  NodeContent node;
  ASSERT_TRUE(EncodeTableContext({kSubfolders, kImportance, kDisplayName, kDelivery, kContentCount},
                                 {row}, &node)
                  .ok());
  HeapReader heap;
  ASSERT_TRUE(heap.Open(node.blocks).ok());
  EXPECT_EQ(heap.client_signature(), 0x7C);
  EXPECT_EQ(heap.user_root(), 0x20u);
  ByteView info;
  ASSERT_TRUE(heap.Read(0x20, &info).ok());
  EXPECT_EQ(info[0], 0x7C);
  ASSERT_EQ(info[1], 7);
  // RowId 0, RowVer 4, SysTime 8, Unicode HNID 16, Int32 20 | Int16 24 | Bool 26 | bits 27.
  EXPECT_EQ(info.U16LE(2), 24);
  EXPECT_EQ(info.U16LE(4), 26);
  EXPECT_EQ(info.U16LE(6), 27);
  EXPECT_EQ(info.U16LE(8), 28);
  EXPECT_EQ(info.U32LE(18), 0u);
  struct Desc {
    PropTag tag;
    uint16_t ib;
    uint8_t cb;
    uint8_t bit;
  };
  const Desc want[] = {{kImportance, 24, 2, 5},   {kDelivery, 8, 8, 2},    {kDisplayName, 16, 4, 3},
                       {kContentCount, 20, 4, 4}, {kSubfolders, 26, 1, 6}, {kRowId, 0, 4, 0},
                       {kRowVer, 4, 4, 1}};
  for (size_t c = 0; c < 7; ++c) {
    ByteView d = info.Sub(22 + 8 * c, 8);
    EXPECT_EQ(d.U32LE(0), want[c].tag) << c;
    EXPECT_EQ(d.U16LE(4), want[c].ib) << c;
    EXPECT_EQ(d.U8(6), want[c].cb) << c;
    EXPECT_EQ(d.U8(7), want[c].bit) << c;
  }
  ByteView matrix;
  ASSERT_TRUE(heap.Read(info.U32LE(14), &matrix).ok());
  ASSERT_EQ(matrix.size(), 28u);
  EXPECT_EQ(matrix.U32LE(0), 0x8022u);
  EXPECT_EQ(matrix[26], 1);
  // Bits 0 (row id), 1 (version), 3 (name) and 6 (subfolders), high bit first.
  EXPECT_EQ(matrix[27], 0b11010010);
}

TEST(TableContextTest, BadInputIsRefused) {
  NodeContent node;
  std::vector<TableRow> twins = {MakeRow(5, 1), MakeRow(5, 2)};
  EXPECT_EQ(EncodeTableContext(kColumns, twins, &node).code(), Status::Code::kInvalidArgument);
  TableRow wrong;
  wrong.row_id = 1;
  wrong.cells[kContentCount] = PropertyValue::Unicode("x");
  EXPECT_EQ(EncodeTableContext(kColumns, {wrong}, &node).code(), Status::Code::kInvalidArgument);
  std::vector<PropTag> too_many;
  for (uint16_t i = 0; i < 300; ++i) too_many.push_back(MakeTag(0x8000 + i, kTypeInt32));
  EXPECT_EQ(EncodeTableContext(too_many, {}, &node).code(), Status::Code::kInvalidArgument);
}

TEST(TableContextTest, DamageIsReported) {
  NodeContent node;
  ASSERT_TRUE(EncodeTableContext(kColumns, MakeRows(600), &node).ok());
  std::vector<PropTag> columns;
  std::vector<TableRow> got;

  HeapReader heap;
  ASSERT_TRUE(heap.Open(node.blocks).ok());
  ByteView info;
  ASSERT_TRUE(heap.Read(heap.user_root(), &info).ok());
  const Nid matrix = info.U32LE(14);

  NodeContent no_matrix = node;
  no_matrix.subnodes.erase(matrix);
  EXPECT_EQ(DecodeTableContext(no_matrix, &columns, &got).code(), Status::Code::kCorruption);

  NodeContent short_matrix = node;
  short_matrix.subnodes.at(matrix).blocks.pop_back();
  EXPECT_EQ(DecodeTableContext(short_matrix, &columns, &got).code(), Status::Code::kCorruption);
  EXPECT_GT(got.size(), 0u);  // the rows that are there still come back

  // A column descriptor pointing past the row.
  NodeContent wide = node;
  const size_t info_at = size_t(info.data() - node.blocks[0].data());
  StoreU16LE(wide.blocks[0].data() + info_at + 22 + 4, 0x4000);
  EXPECT_EQ(DecodeTableContext(wide, &columns, &got).code(), Status::Code::kCorruption);
}

TEST(TableContextTest, EverySingleByteDamageIsSurvived) {
  NodeContent node;
  ASSERT_TRUE(EncodeTableContext(kColumns, MakeRows(12), &node).ok());
  ASSERT_EQ(node.blocks.size(), 1u);
  for (size_t at = 0; at < node.blocks[0].size(); ++at) {
    for (uint8_t v : {uint8_t(0x00), uint8_t(0xFF), uint8_t(0x81)}) {
      NodeContent damaged = node;
      damaged.blocks[0][at] = v;
      std::vector<PropTag> columns;
      std::vector<TableRow> got;
      Status s = DecodeTableContext(damaged, &columns, &got);
      EXPECT_TRUE(s.ok() || s.code() == Status::Code::kCorruption) << at;
    }
  }
}

}  // namespace
}  // namespace tarnwell::mapi::pst
