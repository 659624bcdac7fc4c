#include "engine/page.h"

#include <gtest/gtest.h>

#include "engine/record_ref.h"

namespace tarnwell::engine {
namespace {

// Lays nodes out by hand: the point is to control every tag bit.
struct RawNode {
  Bytes bytes;
  uint8_t flags = 0;
};

Bytes MakePage(PageFamily family, size_t page_size, uint32_t page_flags,
               const std::vector<RawNode>& nodes, int tag_count_override = -1) {
  Bytes page(page_size, 0);
  const size_t header = PageHeaderSize(family);
  StoreU32LE(page.data() + kPageFlagsOffset, page_flags);
  const uint16_t count =
      tag_count_override >= 0 ? uint16_t(tag_count_override) : uint16_t(nodes.size());
  StoreU16LE(page.data() + kPageTagCountOffset, count);
  size_t offset = 0;
  for (size_t i = 0; i < nodes.size(); ++i) {
    Bytes b = nodes[i].bytes;
    uint16_t offset_word = uint16_t(offset);
    if (family == PageFamily::kLegacy) {
      offset_word |= uint16_t(nodes[i].flags << kLegacyTagFlagShift);
    } else if (b.size() >= 2) {
      b[1] |= uint8_t(nodes[i].flags << 5);
    }
    std::copy(b.begin(), b.end(), page.begin() + header + offset);
    uint8_t* tag = page.data() + page_size - kTagSize * (i + 1);
    StoreU16LE(tag, uint16_t(b.size()));
    StoreU16LE(tag + 2, offset_word);
    offset += b.size();
  }
  return page;
}

// key suffix length + key + data
Bytes Node(const Bytes& key, const Bytes& data, int prefix = -1) {
  Bytes out;
  if (prefix >= 0) out = {uint8_t(prefix), uint8_t(prefix >> 8)};
  out.push_back(uint8_t(key.size()));
  out.push_back(uint8_t(key.size() >> 8));
  out.insert(out.end(), key.begin(), key.end());
  out.insert(out.end(), data.begin(), data.end());
  return out;
}

class PageFamilyTest : public ::testing::TestWithParam<std::pair<PageFamily, size_t>> {};

TEST_P(PageFamilyTest, DecodesKeysPrefixesAndDeletedNodes) {
  const auto [family, page_size] = GetParam();
  std::vector<RawNode> nodes = {
      {Bytes{0x7F, 0x10, 0x20, 0x30}, 0},          // external header: prefix
      {Node({0x01, 0x02}, {0xAA, 0xBB}), 0},       // plain key
      {Node({0x40}, {0xCC}, 3), kNodeFlagPrefix},  // prefix 7F 10 20 + 40
      {Node({0x50}, {0xDD}, 0), kNodeFlagPrefix},  // L = 0: suffix alone
      {Node({0x60}, {0xEE}), kNodeFlagDeleted},    // deleted
      {Node({0x70}, {0xFF}, 9), kNodeFlagPrefix},  // prefix longer than tag 0
  };
  Page page(MakePage(family, page_size, kPageFlagLeaf, nodes), family);
  ASSERT_EQ(page.nodes().size(), 6u);

  RecordRef ref;
  ASSERT_EQ(DecodeNode(page, 1, &ref), NodeDecode::kOk);
  EXPECT_EQ(ref.key, (Bytes{0x01, 0x02}));
  EXPECT_EQ(NodeData(page, ref).ToBytes(), (Bytes{0xAA, 0xBB}));
  // The node's first bytes were 02 00; in the large family the flags live in
  // the same u16 and must come out cleared.
  EXPECT_EQ(ref.data_offset, 4);

  ASSERT_EQ(DecodeNode(page, 2, &ref), NodeDecode::kOk);
  EXPECT_EQ(ref.key, (Bytes{0x7F, 0x10, 0x20, 0x40}));
  EXPECT_EQ(ref.key_length, 4u);
  EXPECT_EQ(ref.data_offset, 5);
  EXPECT_EQ(NodeData(page, ref).ToBytes(), (Bytes{0xCC}));

  ASSERT_EQ(DecodeNode(page, 3, &ref), NodeDecode::kOk);
  EXPECT_EQ(ref.key, (Bytes{0x50}));

  EXPECT_EQ(DecodeNode(page, 4, &ref), NodeDecode::kDeleted);
  EXPECT_EQ(DecodeNode(page, 5, &ref), NodeDecode::kPrefixTooLong);
  EXPECT_EQ(DecodeNode(page, 6, &ref), NodeDecode::kDamaged);
}

TEST_P(PageFamilyTest, RootPagesRefusePrefixCompressedNodes) {
  const auto [family, page_size] = GetParam();
  std::vector<RawNode> nodes = {{Bytes{0x01, 0x02}, 0}, {Node({0x40}, {0xCC}, 1), kNodeFlagPrefix}};
  Page page(MakePage(family, page_size, kPageFlagLeaf | kPageFlagRoot, nodes), family);
  RecordRef ref;
  EXPECT_EQ(DecodeNode(page, 1, &ref), NodeDecode::kRootPrefix);
}

TEST_P(PageFamilyTest, DamagedTagsNeverReachOutsideThePage) {
  const auto [family, page_size] = GetParam();
  Bytes raw = MakePage(family, page_size, kPageFlagLeaf, {{Bytes{1, 2}, 0}, {Node({1}, {2}), 0}});
  // Tag 1: a node that would run into the tag array.
  uint8_t* tag1 = raw.data() + page_size - 2 * kTagSize;
  StoreU16LE(tag1, 0xFFFF);
  Page page(raw, family);
  ASSERT_EQ(page.nodes().size(), 2u);
  EXPECT_TRUE(page.nodes()[1].damaged);
  EXPECT_EQ(page.damaged_nodes(), 1u);
  RecordRef ref;
  EXPECT_EQ(DecodeNode(page, 1, &ref), NodeDecode::kDamaged);

  // A tag count far beyond what the page holds keeps only the tags that fit.
  Page huge(MakePage(family, page_size, kPageFlagLeaf, {{Bytes{1, 2}, 0}}, 0x0FFF), family);
  EXPECT_LE(huge.nodes().size(), (page_size - PageHeaderSize(family)) / kTagSize);
}

TEST_P(PageFamilyTest, BranchNodesCarryTheirChildPage) {
  const auto [family, page_size] = GetParam();
  Page page(MakePage(family, page_size, 0, {{Bytes{}, 0}, {Node({0x05}, {0x2A, 0, 0, 0}), 0}}),
            family);
  RecordRef ref;
  ASSERT_EQ(DecodeNode(page, 1, &ref), NodeDecode::kOk);
  EXPECT_EQ(BranchChild(page, ref), 42u);
}

INSTANTIATE_TEST_SUITE_P(Families, PageFamilyTest,
                         ::testing::Values(std::make_pair(PageFamily::kLegacy, size_t(4096)),
                                           std::make_pair(PageFamily::kLegacy, size_t(8192)),
                                           std::make_pair(PageFamily::kLarge, size_t(32768))));

TEST(LargePageTest, NodeFlagsComeFromTheNodeAndAreCleared) {
  // The node's first u16 reads 0xE000: flags 7, cleared in the copy handed out.
  const Page page(MakePage(PageFamily::kLarge, 32768, kPageFlagLeaf,
                           {{Bytes{0, 0, 0, 0}, 0}, {Bytes{0x00, 0x00, 0x33}, 7}}),
                  PageFamily::kLarge);
  ASSERT_EQ(page.nodes().size(), 2u);
  EXPECT_EQ(page.nodes()[1].flags, 7);
  EXPECT_EQ(page.nodes()[1].bytes.ToBytes(), (Bytes{0x00, 0x00, 0x33}));
}

TEST(LargePageTest, TagCountUsesOnlyItsLowTwelveBits) {
  Bytes raw(32768, 0);
  StoreU16LE(raw.data() + kPageTagCountOffset, 0x5001);  // upper bits carry other state
  Page page(raw, PageFamily::kLarge);
  EXPECT_EQ(page.header().tag_count, 1);
  Page legacy(Bytes(raw.begin(), raw.begin() + 8192), PageFamily::kLegacy);
  EXPECT_EQ(legacy.header().tag_count, 0x5001);
  EXPECT_LE(legacy.nodes().size(), (8192 - kLegacyPageHeaderSize) / kTagSize);
}

}  // namespace
}  // namespace tarnwell::engine
