// Blocks, data trees, B-tree pages and allocation maps against an in-memory
// file, including damaged ones.
#include "mapi/pst/block_io.h"

#include <gtest/gtest.h>

#include "mapi/pst/pst_crc.h"
#include "mapi/pst/pst_test_support.h"
#include "mapi/pst/subnode_tree.h"

namespace tarnwell::mapi::pst {
namespace {

TEST(PstCrcTest, KnownVectorAndZeros) {
  const char* text = "123456789";
  EXPECT_EQ(ComputeCrc(0, ByteView(reinterpret_cast<const uint8_t*>(text), 9)), 0x2DFD2D88u);
  Bytes zeros(496, 0);
  EXPECT_EQ(ComputeCrc(0, zeros), 0u);
  // Continuing over a split gives the same as one pass, at every split.
  Bytes data = Pattern(40, 7);
  uint32_t whole = ComputeCrc(0, data);
  for (size_t cut = 0; cut <= data.size(); ++cut) {
    EXPECT_EQ(ComputeCrc(ComputeCrc(0, ByteView(data.data(), cut)), ByteView(data).From(cut)),
              whole);
  }
}

// Streams of each shape, with each encoding: one block, an XBLOCK, a full
// XBLOCK, and an XXBLOCK (more than 1021 blocks).
class StreamRoundTrip : public ::testing::TestWithParam<std::tuple<CryptMethod, size_t>> {};

TEST_P(StreamRoundTrip, ReadsBackWhatWasWritten) {
  auto [crypt, count] = GetParam();
  MemoryStore store(crypt);
  std::vector<Bytes> blocks;
  for (size_t i = 0; i < count; ++i) {
    blocks.push_back(Pattern(i + 1 == count ? 100 + i % 50 : kMaxBlockData, uint32_t(i)));
  }
  uint64_t bid;
  ASSERT_TRUE(WriteStream(store, blocks, &bid).ok());
  EXPECT_EQ(bid == 0, count == 0);
  EXPECT_EQ(IsInternalBid(bid), count > 1);
  ReadBudget budget = store.Budget();
  std::vector<Bytes> back;
  Status s = ReadStream(store, bid, &budget, &back);
  ASSERT_TRUE(s.ok()) << s.ToString();
  EXPECT_EQ(back, blocks);
  if (count > 0 && crypt != CryptMethod::kNone) {
    // Data blocks are stored encoded.
    BlockRef ref;
    uint64_t first = count == 1 ? bid : 4;
    ASSERT_TRUE(store.FindBlock(first, &ref).ok());
    EXPECT_NE(Bytes(store.data().begin() + ref.ib, store.data().begin() + ref.ib + ref.cb),
              blocks[0]);
  }
}

TEST(BlockIoTest, RefusesOversizedBlocks) {
  MemoryStore store;
  uint64_t bid;
  EXPECT_FALSE(WriteStream(store, {Bytes(kMaxBlockData + 1)}, &bid).ok());
}

INSTANTIATE_TEST_SUITE_P(Shapes, StreamRoundTrip,
                         ::testing::Combine(::testing::Values(CryptMethod::kNone,
                                                              CryptMethod::kPermute,
                                                              CryptMethod::kCyclic),
                                            ::testing::Values(0, 1, 2, 1021, 1022)));

// Each case damages a two-block stream and expects Corruption, not a crash.
TEST(BlockIoTest, DamagedStreamsAreCorruption) {
  struct Case {
    const char* name;
    void (*damage)(MemoryStore&, uint64_t xbid);
  } cases[] = {
      {"data byte", [](MemoryStore& s, uint64_t) { s.data()[s.index()[4].ib] ^= 1; }},
      {"trailer bid",
       [](MemoryStore& s, uint64_t) {
         BlockRef r = s.index()[4];
         s.data()[r.ib + BlockDiskSize(r.cb) - 8] ^= 0x40;
       }},
      {"index size", [](MemoryStore& s, uint64_t) { s.index()[4].cb -= 1; }},
      {"outside file", [](MemoryStore& s, uint64_t) { s.index()[4].ib = 1ull << 40; }},
      {"missing block", [](MemoryStore& s, uint64_t) { s.index().erase(8); }},
      {"x total",
       [](MemoryStore& s, uint64_t x) {
         BlockRef r = s.index()[x];
         StoreU32LE(&s.data()[r.ib + 4], 5);
         StoreU32LE(&s.data()[r.ib + BlockDiskSize(r.cb) - 12],
                    ComputeCrc(0, ByteView(&s.data()[r.ib], r.cb)));
       }},
      {"x count",
       [](MemoryStore& s, uint64_t x) {
         BlockRef r = s.index()[x];
         StoreU16LE(&s.data()[r.ib + 2], 900);
         StoreU32LE(&s.data()[r.ib + BlockDiskSize(r.cb) - 12],
                    ComputeCrc(0, ByteView(&s.data()[r.ib], r.cb)));
       }},
  };
  for (const Case& c : cases) {
    MemoryStore store(CryptMethod::kPermute);
    uint64_t bid;
    ASSERT_TRUE(WriteStream(store, {Pattern(kMaxBlockData, 1), Pattern(10, 2)}, &bid).ok());
    c.damage(store, bid);
    ReadBudget budget = store.Budget();
    std::vector<Bytes> back;
    Status s = ReadStream(store, bid, &budget, &back);
    EXPECT_EQ(s.code(), Status::Code::kCorruption) << c.name << ": " << s.ToString();
  }
}

// An XBLOCK listing one small block a thousand times must stop at the read
// budget rather than build a huge result from a tiny file.
TEST(BlockIoTest, RepeatedReferencesExhaustTheBudget) {
  MemoryStore store;
  uint64_t data_bid;
  ASSERT_TRUE(WriteStream(store, {Pattern(8000, 3)}, &data_bid).ok());
  Bytes x(8 + 1000 * 8);
  x[0] = 1;
  x[1] = 1;
  StoreU16LE(&x[2], 1000);
  StoreU32LE(&x[4], 8000 * 1000);
  for (int i = 0; i < 1000; ++i) StoreU64LE(&x[8 + 8 * i], data_bid);
  uint64_t xbid = store.NewBid(true);
  ASSERT_TRUE(store.AppendBlock(xbid, x).ok());
  ReadBudget budget = store.Budget();
  std::vector<Bytes> back;
  EXPECT_EQ(ReadStream(store, xbid, &budget, &back).code(), Status::Code::kCorruption);
}

TEST(SubnodeTreeTest, NestedAndWideSubnodesRoundTrip) {
  MemoryStore store(CryptMethod::kPermute);
  NodeContent content;
  content.blocks = {Pattern(300, 1)};
  // More than one SLBLOCK holds, so an SIBLOCK is needed.
  for (Nid nid = 1; nid <= 700; ++nid) {
    content.subnodes[MakeNid(kNidTypeLtp, nid)].blocks = {Pattern(1 + nid % 40, nid)};
  }
  NodeContent& deep = content.subnodes[MakeNid(kNidTypeAttachment, 3)];
  deep.blocks = NodeContent::Split(Pattern(20000, 9));
  deep.subnodes[MakeNid(kNidTypeNormalMessage, 1)].subnodes[0x1F].blocks = {Pattern(5, 5)};
  uint64_t bid_data, bid_sub;
  ASSERT_TRUE(WriteNodeContent(store, content, &bid_data, &bid_sub).ok());
  ReadBudget budget = store.Budget();
  NodeContent back;
  Status s = ReadNodeContent(store, bid_data, bid_sub, &budget, &back);
  ASSERT_TRUE(s.ok()) << s.ToString();
  EXPECT_EQ(back.blocks, content.blocks);
  ExpectSameContent(back, content, "");
  // Every block written is found by the reference walk exactly once.
  std::vector<uint64_t> bids;
  budget = store.Budget();
  ASSERT_TRUE(CollectNodeBids(store, bid_data, bid_sub, &budget, &bids).ok());
  std::sort(bids.begin(), bids.end());
  EXPECT_EQ(std::adjacent_find(bids.begin(), bids.end()), bids.end());
  EXPECT_EQ(bids.size(), store.index().size());
}

TEST(BtreePageTest, MultiLevelTreesRoundTrip) {
  for (size_t n : {0, 1, 15, 16, 301, 5000}) {
    MemoryStore store;
    std::vector<NbtEntry> nodes;
    std::vector<BbtEntry> blocks;
    for (size_t i = 0; i < n; ++i) {
      nodes.push_back({Nid(0x21 + 32 * i), 4 * i + 4, i % 3 ? 0 : 4 * i + 6, 0x122});
      blocks.push_back({4 * i + 4, 0x4400 + 64 * i, uint16_t(i % 8000), 2});
    }
    Bref nbt_root, bbt_root;
    ASSERT_TRUE(WriteNbt(store, nodes, &nbt_root).ok());
    ASSERT_TRUE(WriteBbt(store, blocks, &bbt_root).ok());
    std::vector<NbtEntry> nodes_back;
    std::vector<BbtEntry> blocks_back;
    ASSERT_TRUE(ReadNbt(store, nbt_root, &nodes_back).ok());
    ASSERT_TRUE(ReadBbt(store, bbt_root, &blocks_back).ok());
    ASSERT_EQ(nodes_back.size(), n);
    ASSERT_EQ(blocks_back.size(), n);
    for (size_t i = 0; i < n; ++i) {
      EXPECT_EQ(nodes_back[i].nid, nodes[i].nid);
      EXPECT_EQ(nodes_back[i].bid_sub, nodes[i].bid_sub);
      EXPECT_EQ(blocks_back[i].ib, blocks[i].ib);
      EXPECT_EQ(blocks_back[i].cb, blocks[i].cb);
    }
  }
}

TEST(BtreePageTest, CyclesAndDamageAreCorruption) {
  MemoryStore store;
  std::vector<BbtEntry> blocks;
  for (uint64_t i = 0; i < 500; ++i) blocks.push_back({4 * i + 4, 0x4400, 10, 2});
  Bref root;
  ASSERT_TRUE(WriteBbt(store, blocks, &root).ok());
  std::vector<BbtEntry> out;
  // A child entry pointing back at the root page.
  Bytes saved = store.data();
  uint8_t* page = &store.data()[root.ib];
  StoreU64LE(page + 24 + 8, root.bid);
  StoreU64LE(page + 24 + 16, root.ib);
  SealPage(page, kPageTypeBbt, root.bid, root.ib);
  EXPECT_EQ(ReadBbt(store, root, &out).code(), Status::Code::kCorruption);
  // A flipped byte fails the CRC; a wrong type or id is caught too.
  store.data() = saved;
  store.data()[root.ib + 3] ^= 1;
  EXPECT_EQ(ReadBbt(store, root, &out).code(), Status::Code::kCorruption);
  store.data() = saved;
  std::vector<NbtEntry> nodes;
  EXPECT_EQ(ReadNbt(store, root, &nodes).code(), Status::Code::kCorruption);  // wrong type
  EXPECT_EQ(ReadBbt(store, {root.bid + 1, root.ib}, &out).code(), Status::Code::kCorruption);
  EXPECT_EQ(ReadBbt(store, {root.bid, 1ull << 40}, &out).code(), Status::Code::kCorruption);
}

// Allocation maps in a fake file, far beyond 4 GiB.
class FakeMapIo : public AllocationMap::Io {
 public:
  Status ReadAt(uint64_t ib, size_t size, uint8_t* out) const override {
    auto it = pages.find(ib);
    if (it == pages.end() || size != kPageSize) return Status::IoError("no page");
    std::memcpy(out, it->second.data(), size);
    return Status::Ok();
  }
  Status WriteAt(uint64_t ib, ByteView data) override {
    pages[ib] = data.ToBytes();
    return Status::Ok();
  }
  Status Extend(uint64_t size) override {
    size_ = std::max(size_, size);
    return Status::Ok();
  }
  std::map<uint64_t, Bytes> pages;
  uint64_t size_ = 0;
};

TEST(AllocationMapTest, MapPagesSitWhereTheFormatPutsThem) {
  struct Case {
    uint64_t region;
    bool pmap, fmap, fpmap;
  } cases[] = {{0, true, false, false},    {1, false, false, false},  {8, true, false, false},
               {127, false, false, false}, {128, true, true, false},  {624, true, true, false},
               {1024, true, false, true},  {4992, true, false, true}, {17000, true, false, false}};
  for (const Case& c : cases) {
    EXPECT_EQ(RegionHasPMap(c.region), c.pmap) << c.region;
    EXPECT_EQ(RegionHasFMap(c.region), c.fmap) << c.region;
    EXPECT_EQ(RegionHasFPMap(c.region), c.fpmap) << c.region;
    EXPECT_EQ(RegionOf(AMapOffset(c.region)), c.region);
    EXPECT_EQ(RegionOf(AMapOffset(c.region) + kAMapCoverage - 1), c.region);
  }
  EXPECT_EQ(AMapOffset(1), 0x4400u + 253952u);
}

TEST(AllocationMapTest, AppendsAcrossRegionsBeyondFourGiB) {
  FakeMapIo io;
  // The last region of an existing 4.3 GB file, half used.
  const uint64_t region = 16935;  // not a multiple of 8: no PMap of its own
  const uint64_t start = AMapOffset(region);
  ASSERT_GT(start, 1ull << 32);
  Bytes bits(kPageDataSize, 0);
  for (size_t i = 0; i < kPageDataSize / 2; ++i) bits[i] = 0xFF;
  bits[kPageDataSize / 2] = 0x80;  // one more unit
  io.pages[start] = EncodeMapPage(kPageTypeAMap, start, bits);
  PstRoot root;
  root.file_eof = start + kAMapCoverage;
  root.amap_last = start;
  root.amap_free = 1000000;
  root.amap_valid = kAMapValid2;
  AllocationMap map(&io);
  ASSERT_TRUE(map.InitExisting(root).ok());
  uint64_t ib;
  ASSERT_TRUE(map.Allocate(128, 64, &ib).ok());
  EXPECT_EQ(ib, start + (kPageDataSize / 2 * 8 + 1) * 64);
  // Fill the region; the next block must skip to region + 1, which starts
  // with an AMap and (being a multiple of 8) a PMap.
  uint64_t last = ib;
  do {
    ib = last;
    ASSERT_TRUE(map.Allocate(8192, 64, &last).ok());
    ASSERT_LT(last, AMapOffset(region + 2));
  } while (last < AMapOffset(region + 1));
  EXPECT_LE(ib + 8192, AMapOffset(region + 1));  // nothing straddles the map
  ib = last;
  EXPECT_EQ(ib, AMapOffset(region + 1) + 2 * kPageSize);
  EXPECT_TRUE(io.pages.count(AMapOffset(region + 1) + kPageSize));  // the PMap
  EXPECT_EQ(map.file_end(), AMapOffset(region + 2));
  EXPECT_EQ(map.last_amap(), AMapOffset(region + 1));
  ASSERT_TRUE(map.Flush().ok());
  const Bytes& written = io.pages[AMapOffset(region + 1)];
  EXPECT_TRUE(
      CheckPage(written, kPageTypeAMap, AMapOffset(region + 1), AMapOffset(region + 1)).ok());
  // Bytes 0-1: the AMap and PMap pages; 2-17: the 8192-byte block's 128 units.
  for (size_t i = 0; i < 19; ++i) EXPECT_EQ(written[i], i < 18 ? 0xFF : 0x00) << i;
}

}  // namespace
}  // namespace tarnwell::mapi::pst
