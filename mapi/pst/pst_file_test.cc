// PstFile end to end: new files, reopening, appending, interrupted sessions
// and damaged files. Outlook's files are read in real_pst_test.cc.
#include "mapi/pst/pst_file.h"

#include <gtest/gtest.h>

#include <fstream>
#include <functional>

#include "mapi/pst/pst_header.h"
#include "mapi/pst/pst_test_support.h"

namespace tarnwell::mapi::pst {
namespace {

// A committed file as a page reader sees it.
MemoryStore OnDisk(const std::string& path) {
  MemoryStore disk;
  disk.data() = ReadBytes(path);
  return disk;
}

class PstFileTest : public ::testing::Test {
 protected:
  std::string Path(const std::string& name) { return dir_ + "/" + name; }

  // Checks that every block and page the header reaches is marked in the
  // AMaps, and that the header's free count matches the maps.
  void ExpectMapsConsistent(const std::string& path) {
    MemoryStore disk = OnDisk(path);
    PstHeader h;
    ASSERT_TRUE(DecodeHeader(disk.data(), &h).ok());
    EXPECT_EQ(h.root.file_eof, disk.data().size());
    EXPECT_EQ(h.root.amap_valid, kAMapValid2);
    std::vector<std::pair<uint64_t, uint64_t>> used;  // offset, bytes
    std::vector<BbtEntry> blocks;
    ASSERT_TRUE(ReadBbt(disk, h.root.bbt, &blocks).ok());
    for (const BbtEntry& b : blocks) used.push_back({b.ib, (b.cb + 16 + 63) / 64 * 64});
    used.push_back({h.root.nbt.ib, kPageSize});
    used.push_back({h.root.bbt.ib, kPageSize});
    uint64_t free_bytes = 0;
    uint64_t last_amap = 0;
    for (uint64_t r = 0; AMapOffset(r) < h.root.file_eof; ++r) {
      uint64_t at = AMapOffset(r);
      ByteView page(disk.data().data() + at, kPageSize);
      ASSERT_TRUE(CheckPage(page, kPageTypeAMap, at, at).ok()) << r;
      if (RegionHasPMap(r)) {
        EXPECT_TRUE(CheckPage(ByteView(disk.data().data() + at + kPageSize, kPageSize),
                              kPageTypePMap, at + kPageSize, at + kPageSize)
                        .ok());
      }
      for (size_t u = 0; u < kPageDataSize * 8; ++u) {
        if (!(page[u / 8] & (0x80 >> (u % 8)))) free_bytes += 64;
      }
      last_amap = at;
    }
    EXPECT_EQ(h.root.amap_last, last_amap);
    EXPECT_EQ(free_bytes, h.root.amap_free);
    for (auto [ib, n] : used) {
      for (uint64_t u = ib; u < ib + n; u += 64) {
        uint64_t r = RegionOf(u);
        uint64_t unit = (u - AMapOffset(r)) / 64;
        EXPECT_TRUE(disk.data()[AMapOffset(r) + unit / 8] & (0x80 >> (unit % 8)))
            << "offset " << u << " in use but free in the map";
      }
    }
    EXPECT_TRUE(CheckPage(ByteView(disk.data().data() + kDListOffset, kPageSize), kPageTypeDList,
                          h.bid_next_page, kDListOffset)
                    .ok());
  }

  std::string dir_ = TempDir("file");
};

class PstFileCryptTest : public PstFileTest, public ::testing::WithParamInterface<CryptMethod> {};

// A file with every shape of node survives a commit and a reopen.
TEST_P(PstFileCryptTest, CreateWriteCommitReopen) {
  std::string path = Path("new.pst");
  std::map<Nid, NodeContent> written;
  {
    std::unique_ptr<PstFile> pst;
    ASSERT_TRUE(PstFile::Create(path, GetParam(), &pst).ok());
    EXPECT_TRUE(pst->ListNodes().empty());
    // Enough nodes and blocks for three-level B-trees.
    for (int i = 0; i < 450; ++i) {
      Nid nid = pst->AllocateNid(kNidTypeNormalMessage);
      NodeContent c;
      c.blocks = {Pattern(50 + i, i)};
      if (i % 7 == 0) c.subnodes[MakeNid(kNidTypeLtp, 1)].blocks = {Pattern(i + 1, i + 1)};
      ASSERT_TRUE(pst->WriteNode(nid, 0x122, c).ok());
      written[nid] = c;
    }
    NodeContent x;  // XBLOCK
    x.blocks = NodeContent::Split(Pattern(3 * kMaxBlockData + 17, 77));
    written[0x21] = x;
    NodeContent xx;  // XXBLOCK
    xx.blocks = NodeContent::Split(Pattern(1022 * kMaxBlockData + 5, 78));
    written[MakeNid(kNidTypeInternal, 0x601)] = xx;
    NodeContent nested;  // subnodes with subnodes, and an SIBLOCK
    nested.blocks = {Pattern(10, 1)};
    for (Nid s = 1; s < 400; ++s) nested.subnodes[MakeNid(kNidTypeLtp, s)].blocks = {Pattern(s, s)};
    nested.subnodes[MakeNid(kNidTypeAttachment, 2)].subnodes[MakeNid(kNidTypeLtp, 9)].blocks =
        NodeContent::Split(Pattern(9000, 5));
    written[MakeNid(kNidTypeNormalFolder, 0x9)] = nested;
    written[MakeNid(kNidTypeNormalFolder, 0xA)] = NodeContent();  // empty
    for (const auto& [nid, c] : written) {
      if (nid >= MakeNid(kNidTypeNormalMessage, 0x10000)) continue;
      ASSERT_TRUE(pst->WriteNode(nid, 0x122, c).ok());
    }
    ASSERT_TRUE(pst->Commit().ok());
  }
  std::unique_ptr<PstFile> pst;
  ASSERT_TRUE(PstFile::Open(path, false, &pst).ok());
  EXPECT_EQ(pst->crypt_method(), GetParam());
  ASSERT_EQ(pst->ListNodes().size(), written.size());
  for (const auto& [nid, c] : written) {
    NodeContent back;
    Status s = pst->ReadNode(nid, &back);
    ASSERT_TRUE(s.ok()) << nid << " " << s.ToString();
    ExpectSameContent(back, c, std::to_string(nid));
  }
  ExpectMapsConsistent(path);
}

INSTANTIATE_TEST_SUITE_P(Crypt, PstFileCryptTest,
                         ::testing::Values(CryptMethod::kNone, CryptMethod::kPermute,
                                           CryptMethod::kCyclic));

TEST_F(PstFileTest, UncommittedWorkIsInvisible) {
  std::string path = Path("crash.pst");
  NodeContent first, second;
  first.blocks = {Pattern(100, 1)};
  second.blocks = NodeContent::Split(Pattern(20000, 2));
  {
    std::unique_ptr<PstFile> pst;
    ASSERT_TRUE(PstFile::Create(path, CryptMethod::kPermute, &pst).ok());
    ASSERT_TRUE(pst->WriteNode(0x21, 0, first).ok());
    ASSERT_TRUE(pst->Commit().ok());
  }
  Bytes header_before = ReadBytes(path);
  header_before.resize(kHeaderSize);
  {
    std::unique_ptr<PstFile> pst;
    ASSERT_TRUE(PstFile::Open(path, true, &pst).ok());
    ASSERT_TRUE(pst->WriteNode(0x21, 0, second).ok());
    ASSERT_TRUE(pst->WriteNode(0x61, 0, second).ok());
    ASSERT_TRUE(pst->DeleteNode(0x21).ok() || true);
    // Destroyed without Commit, as if the program stopped here.
  }
  Bytes header_after = ReadBytes(path);
  header_after.resize(kHeaderSize);
  EXPECT_EQ(header_after, header_before);
  std::unique_ptr<PstFile> pst;
  ASSERT_TRUE(PstFile::Open(path, true, &pst).ok());
  ASSERT_EQ(pst->ListNodes().size(), 1u);
  NodeContent back;
  ASSERT_TRUE(pst->ReadNode(0x21, &back).ok());
  EXPECT_EQ(back.blocks, first.blocks);
  // And the next session still appends and commits cleanly.
  ASSERT_TRUE(pst->WriteNode(0x61, 0, second).ok());
  ASSERT_TRUE(pst->Commit().ok());
  pst.reset();
  ASSERT_TRUE(PstFile::Open(path, false, &pst).ok());
  ASSERT_TRUE(pst->ReadNode(0x61, &back).ok());
  EXPECT_EQ(back.Joined(), second.Joined());
  ExpectMapsConsistent(path);
}

TEST_F(PstFileTest, RewriteAndDeleteReleaseBlockReferences) {
  std::string path = Path("refs.pst");
  std::unique_ptr<PstFile> pst;
  ASSERT_TRUE(PstFile::Create(path, CryptMethod::kNone, &pst).ok());
  NodeContent big;
  big.blocks = NodeContent::Split(Pattern(3 * kMaxBlockData, 1));  // 3 data blocks + XBLOCK
  ASSERT_TRUE(pst->WriteNode(0x21, 0, big).ok());
  ASSERT_TRUE(pst->WriteNode(0x61, 0, big).ok());
  NodeContent small;
  small.blocks = {Pattern(10, 2)};
  ASSERT_TRUE(pst->WriteNode(0x21, 0, small).ok());  // 4 blocks released
  ASSERT_TRUE(pst->DeleteNode(0x61).ok());           // 4 more
  EXPECT_EQ(pst->DeleteNode(0x61).code(), Status::Code::kNotFound);
  ASSERT_TRUE(pst->Commit().ok());
  pst.reset();
  MemoryStore disk = OnDisk(path);
  PstHeader h;
  ASSERT_TRUE(DecodeHeader(disk.data(), &h).ok());
  std::vector<BbtEntry> blocks;
  ASSERT_TRUE(ReadBbt(disk, h.root.bbt, &blocks).ok());
  int live = 0, released = 0;
  for (const BbtEntry& b : blocks) (b.cref == 2 ? live : released) += b.cref == 1 || b.cref == 2;
  EXPECT_EQ(live, 1);
  EXPECT_EQ(released, 8);
}

TEST_F(PstFileTest, AllocateNidNeverRepeats) {
  std::unique_ptr<PstFile> pst;
  ASSERT_TRUE(PstFile::Create(Path("nid.pst"), CryptMethod::kNone, &pst).ok());
  EXPECT_EQ(pst->AllocateNid(kNidTypeNormalFolder), MakeNid(kNidTypeNormalFolder, 0x400));
  EXPECT_EQ(pst->AllocateNid(kNidTypeNormalMessage), MakeNid(kNidTypeNormalMessage, 0x10000));
  ASSERT_TRUE(pst->WriteNode(MakeNid(kNidTypeNormalFolder, 0x402), 0, NodeContent()).ok());
  EXPECT_EQ(pst->AllocateNid(kNidTypeNormalFolder), MakeNid(kNidTypeNormalFolder, 0x403));
  EXPECT_EQ(pst->AllocateNid(32), 0u);
  ASSERT_TRUE(pst->Commit().ok());
  pst.reset();
  ASSERT_TRUE(PstFile::Open(Path("nid.pst"), true, &pst).ok());
  EXPECT_EQ(pst->AllocateNid(kNidTypeNormalFolder), MakeNid(kNidTypeNormalFolder, 0x404));
  EXPECT_EQ(PstFile::Create(Path("nid.pst"), CryptMethod::kNone, &pst).code(),
            Status::Code::kIoError);  // exists already
}

// Each case damages a committed file; opening or reading must fail cleanly.
TEST_F(PstFileTest, DamagedFilesGiveClearErrors) {
  std::string good = Path("good.pst");
  {
    std::unique_ptr<PstFile> pst;
    ASSERT_TRUE(PstFile::Create(good, CryptMethod::kPermute, &pst).ok());
    NodeContent c;
    c.blocks = {Pattern(500, 1)};
    ASSERT_TRUE(pst->WriteNode(0x21, 0, c).ok());
    ASSERT_TRUE(pst->Commit().ok());
  }
  Bytes original = ReadBytes(good);
  PstHeader h;
  ASSERT_TRUE(DecodeHeader(original, &h).ok());
  struct Case {
    const char* name;
    std::function<void(Bytes&)> damage;
    Status::Code open_code;  // kOk: opening works and reading node 0x21 fails
  } cases[] = {
      {"truncated", [](Bytes& b) { b.resize(300); }, Status::Code::kCorruption},
      {"magic", [](Bytes& b) { b[0] = 'X'; }, Status::Code::kCorruption},
      {"header crc", [](Bytes& b) { b[200] ^= 1; }, Status::Code::kCorruption},
      {"ansi", [](Bytes& b) { StoreU16LE(&b[10], 14); }, Status::Code::kNotSupported},
      {"4k pages", [](Bytes& b) { StoreU16LE(&b[10], 36); }, Status::Code::kNotSupported},
      {"nbt page", [&](Bytes& b) { b[h.root.nbt.ib + 5] ^= 1; }, Status::Code::kCorruption},
      {"bbt outside",
       [&](Bytes& b) {
         PstHeader x = h;
         x.root.bbt.ib = 1ull << 40;
         Bytes e = EncodeHeader(x);
         std::copy(e.begin(), e.end(), b.begin());
       },
       Status::Code::kCorruption},
      {"data block",
       [&](Bytes& b) {
         MemoryStore disk;
         disk.data() = b;
         std::vector<BbtEntry> blocks;
         ASSERT_TRUE(ReadBbt(disk, h.root.bbt, &blocks).ok());
         b[blocks[0].ib + 7] ^= 1;
       },
       Status::Code::kOk},
  };
  for (const Case& c : cases) {
    Bytes b = original;
    c.damage(b);
    std::string path = Path(std::string("bad-") + c.name + ".pst");
    std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(b.data()), b.size());
    std::unique_ptr<PstFile> pst;
    Status s = PstFile::Open(path, false, &pst);
    EXPECT_EQ(s.code(), c.open_code) << c.name << ": " << s.ToString();
    if (c.open_code == Status::Code::kOk && s.ok()) {
      NodeContent out;
      EXPECT_EQ(pst->ReadNode(0x21, &out).code(), Status::Code::kCorruption) << c.name;
    }
  }
}

}  // namespace
}  // namespace tarnwell::mapi::pst
