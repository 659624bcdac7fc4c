#include "mapi/pst/heap_on_node.h"

#include <gtest/gtest.h>

#include <functional>

#include "mapi/pst/bth.h"
#include "mapi/pst/pst_test_support.h"

namespace tarnwell::mapi::pst {
namespace {

TEST(HeapOnNodeTest, ManyAllocationsSpanPagesAndReadBack) {
  HeapBuilder builder(kHeapClientProperties);
  std::vector<std::pair<Hid, Bytes>> stored;
  // Sizes from empty to the largest allowed, enough for bitmap pages.
  for (uint32_t i = 0; i < 400; ++i) {
    Bytes b = Pattern((i * 397) % (kMaxHeapAllocation + 1), i);
    Hid hid = 0;
    ASSERT_TRUE(builder.Allocate(b, &hid).ok());
    stored.emplace_back(hid, b);
  }
  builder.set_user_root(stored[3].first);
  const std::vector<Bytes> blocks = builder.Finish();
  ASSERT_GT(blocks.size(), 9u);
  for (const Bytes& b : blocks) EXPECT_LE(b.size(), kMaxBlockData);
  EXPECT_EQ(blocks[0][2], 0xEC);
  EXPECT_EQ(blocks[0][3], kHeapClientProperties);
  // The first allocation of a page starts right after its header.
  const auto first_alloc = [&](size_t page) {
    const uint16_t map = LoadU16LE(blocks[page].data());
    return LoadU16LE(blocks[page].data() + map + 4);
  };
  EXPECT_EQ(first_alloc(0), 12);
  EXPECT_EQ(first_alloc(1), 2);
  EXPECT_EQ(first_alloc(8), 66);

  HeapReader reader;
  ASSERT_TRUE(reader.Open(blocks).ok());
  EXPECT_EQ(reader.client_signature(), kHeapClientProperties);
  EXPECT_EQ(reader.user_root(), stored[3].first);
  EXPECT_EQ(reader.page_count(), blocks.size());
  EXPECT_EQ(reader.allocation_count(), stored.size());
  for (const auto& [hid, bytes] : stored) {
    ByteView got;
    ASSERT_TRUE(reader.Read(hid, &got).ok()) << hid;
    EXPECT_EQ(got.ToBytes(), bytes) << hid;
  }
}

TEST(HeapOnNodeTest, AllocationLimitsAndFill) {
  HeapBuilder builder(kHeapClientTable);
  Hid hid = 0;
  EXPECT_TRUE(builder.Allocate(Bytes(kMaxHeapAllocation, 1), &hid).ok());
  EXPECT_EQ(builder.Allocate(Bytes(kMaxHeapAllocation + 1, 1), &hid).code(),
            Status::Code::kInvalidArgument);
  Hid reserved = 0;
  ASSERT_TRUE(builder.Reserve(6, &reserved).ok());
  EXPECT_FALSE(builder.Fill(reserved, Bytes(5)).ok());
  EXPECT_FALSE(builder.Fill(reserved + MakeHid(0, 1), Bytes(6)).ok());
  ASSERT_TRUE(builder.Fill(reserved, Bytes{1, 2, 3, 4, 5, 6}).ok());
  const auto blocks = builder.Finish();
  HeapReader reader;
  ASSERT_TRUE(reader.Open(blocks).ok());
  ByteView got;
  ASSERT_TRUE(reader.Read(reserved, &got).ok());
  EXPECT_EQ(got.ToBytes(), (Bytes{1, 2, 3, 4, 5, 6}));
}

// Two pages: page 0 with allocations 1..3, page 1 with one large allocation.
std::vector<Bytes> TwoPageHeap(Hid* on_first, Hid* on_second) {
  HeapBuilder builder(kHeapClientProperties);
  Hid hid = 0;
  builder.Allocate(Bytes(10, 0xAA), on_first);
  builder.Allocate(Bytes(3000, 1), &hid);
  builder.Allocate(Bytes(3000, 2), &hid);
  builder.Allocate(Bytes(3000, 3), on_second);
  return builder.Finish();
}

struct DamageCase {
  const char* name;
  std::function<void(std::vector<Bytes>*)> damage;
  bool open_fails;
  bool first_page_readable;
};

class HeapDamageTest : public ::testing::TestWithParam<DamageCase> {};

TEST_P(HeapDamageTest, DamageIsReportedNotTrusted) {
  Hid first = 0, second = 0;
  std::vector<Bytes> blocks = TwoPageHeap(&first, &second);
  ASSERT_EQ(HidPage(second), 1u);
  GetParam().damage(&blocks);
  HeapReader reader;
  Status s = reader.Open(blocks);
  if (GetParam().open_fails) {
    EXPECT_EQ(s.code(), Status::Code::kCorruption);
    return;
  }
  ASSERT_TRUE(s.ok());
  ByteView got;
  EXPECT_EQ(reader.Read(first, &got).ok(), GetParam().first_page_readable);
  // Ids that name nothing never read.
  for (Hid bad : {Hid(0), first | 1, MakeHid(0, 0x7FF), MakeHid(7, 1), MakeHid(0xFFFF, 1)}) {
    EXPECT_EQ(reader.Read(bad, &got).code(), Status::Code::kCorruption) << bad;
  }
}

void PokeU16(Bytes* b, size_t at, uint16_t v) { StoreU16LE(b->data() + at, v); }
uint16_t MapAt(const Bytes& b) { return LoadU16LE(b.data()); }

INSTANTIATE_TEST_SUITE_P(
    Cases, HeapDamageTest,
    ::testing::Values(
        DamageCase{"BadSignature", [](auto* b) { (*b)[0][2] = 0xED; }, true, false},
        DamageCase{"TruncatedHeader", [](auto* b) { (*b)[0].resize(5); }, true, false},
        DamageCase{"NoBlocks", [](auto* b) { b->clear(); }, true, false},
        DamageCase{"PageMapPastEnd", [](auto* b) { PokeU16(&(*b)[0], 0, 0xFFF0); }, false, false},
        DamageCase{"PageMapInHeader", [](auto* b) { PokeU16(&(*b)[0], 0, 4); }, false, false},
        DamageCase{"HugeAllocCount", [](auto* b) { PokeU16(&(*b)[0], MapAt((*b)[0]), 0x7000); },
                   false, false},
        DamageCase{"OffsetsOutOfOrder",
                   [](auto* b) { PokeU16(&(*b)[0], MapAt((*b)[0]) + 6, 0x2000); }, false, false},
        DamageCase{"OffsetIntoHeader", [](auto* b) { PokeU16(&(*b)[0], MapAt((*b)[0]) + 4, 2); },
                   false, false},
        DamageCase{"SecondPageCut", [](auto* b) { (*b)[1].resize(100); }, false, true}),
    [](const auto& info) { return std::string(info.param.name); });

// ---- BTree-on-heap ----

std::vector<Bytes> Records(size_t count, size_t key_size, size_t data_size) {
  std::vector<Bytes> records;
  for (size_t i = 0; i < count; ++i) {
    Bytes r = Pattern(key_size + data_size, uint32_t(i));
    // Unique keys, given in scrambled order.
    const uint32_t key = uint32_t((i * 7919) % count);
    for (size_t k = 0; k < key_size; ++k) r[k] = k < 4 ? uint8_t(key >> (8 * k)) : 0;
    records.push_back(r);
  }
  return records;
}

struct BthShape {
  size_t count;
  uint8_t key_size;
  uint8_t data_size;
  uint8_t levels;
};

class BthRoundTripTest : public ::testing::TestWithParam<BthShape> {};

TEST_P(BthRoundTripTest, RecordsComeBackSorted) {
  const BthShape shape = GetParam();
  HeapBuilder builder(kHeapClientBth);
  BthWriter writer(&builder, shape.key_size, shape.data_size);
  ASSERT_TRUE(writer.Reserve(shape.count).ok());
  builder.set_user_root(writer.header());
  std::vector<Bytes> records = Records(shape.count, shape.key_size, shape.data_size);
  ASSERT_TRUE(writer.Write(records).ok());
  const auto blocks = builder.Finish();

  HeapReader reader;
  ASSERT_TRUE(reader.Open(blocks).ok());
  ByteView header;
  ASSERT_TRUE(reader.Read(reader.user_root(), &header).ok());
  EXPECT_EQ(header.U8(3), shape.levels);
  uint8_t key_size = 0, data_size = 0;
  std::vector<Bytes> got;
  ASSERT_TRUE(ReadBth(reader, reader.user_root(), &key_size, &data_size, &got).ok());
  EXPECT_EQ(key_size, shape.key_size);
  EXPECT_EQ(data_size, shape.data_size);
  ASSERT_EQ(got.size(), shape.count);
  std::sort(records.begin(), records.end(), [](const Bytes& a, const Bytes& b) {
    return LoadU32LE(a.data()) < LoadU32LE(b.data());
  });
  EXPECT_EQ(got, records);
}

INSTANTIATE_TEST_SUITE_P(Shapes, BthRoundTripTest,
                         ::testing::Values(BthShape{0, 2, 6, 0}, BthShape{1, 2, 6, 0},
                                           BthShape{447, 4, 4, 0},  // one full leaf
                                           BthShape{448, 4, 4, 1}, BthShape{3000, 4, 4, 1},
                                           BthShape{14000, 16, 32, 2}));

TEST(BthTest, DuplicateKeysAreRejected) {
  HeapBuilder builder(kHeapClientBth);
  BthWriter writer(&builder, 2, 6);
  ASSERT_TRUE(writer.Reserve(2).ok());
  Bytes r(8, 0);
  EXPECT_EQ(writer.Write({r, r}).code(), Status::Code::kInvalidArgument);
}

// An index whose every entry points at the same child, nine levels deep,
// would make a naive walk visit 300^8 nodes.
TEST(BthTest, SharedSubtreesAndDepthAreBounded) {
  HeapBuilder builder(kHeapClientBth);
  Hid child = 0;
  ASSERT_TRUE(builder.Allocate(Bytes(8, 1), &child).ok());
  for (int level = 1; level <= 8; ++level) {
    Bytes node;
    for (int e = 0; e < 300; ++e) {
      Bytes entry(6, 0);
      StoreU16LE(entry.data(), uint16_t(e));
      StoreU32LE(entry.data() + 2, child);
      node.insert(node.end(), entry.begin(), entry.end());
    }
    ASSERT_TRUE(builder.Allocate(node, &child).ok());
  }
  uint8_t header[8] = {0xB5, 2, 6, 8, 0, 0, 0, 0};
  StoreU32LE(header + 4, child);
  Hid shared = 0, too_deep = 0;
  ASSERT_TRUE(builder.Allocate(ByteView(header, 8), &shared).ok());
  header[3] = 9;
  ASSERT_TRUE(builder.Allocate(ByteView(header, 8), &too_deep).ok());
  const auto blocks = builder.Finish();
  HeapReader reader;
  ASSERT_TRUE(reader.Open(blocks).ok());
  uint8_t k, d;
  std::vector<Bytes> records;
  EXPECT_EQ(ReadBth(reader, shared, &k, &d, &records).code(), Status::Code::kCorruption);
  EXPECT_LE(records.size(), reader.allocation_count());
  EXPECT_EQ(ReadBth(reader, too_deep, &k, &d, &records).code(), Status::Code::kCorruption);
}

}  // namespace
}  // namespace tarnwell::mapi::pst
