#include "testing/forge_tree.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <string>

#include "testing/forge_layout.h"

namespace tarnwell::forge {
namespace {

// A reading of the page format kept apart from the writer's code, so a
// mistake has to be made twice to go unnoticed.
struct ParsedNode {
  Bytes key;
  Bytes data;
  uint8_t flags = 0;
};
struct ParsedPage {
  uint32_t previous = 0, next = 0, object_id = 0, flags = 0;
  Bytes tag0;
  std::vector<ParsedNode> nodes;
};

ParsedPage Parse(const PageFormat& format, const Bytes& page) {
  ParsedPage p;
  ByteView v(page);
  p.previous = v.U32LE(16);
  p.next = v.U32LE(20);
  p.object_id = v.U32LE(24);
  p.flags = v.U32LE(36);
  const size_t header = format.page_size >= 16384 ? 80 : 40;
  const uint16_t mask = format.page_size >= 16384 ? 0x7FFF : 0x1FFF;
  const uint16_t tags = v.U16LE(34);
  for (uint16_t i = 0; i < tags; ++i) {
    const size_t tag = format.page_size - 4 * (i + 1);
    const uint16_t size = v.U16LE(tag) & mask;
    const uint16_t offset_word = v.U16LE(tag + 2);
    Bytes value = v.Sub(header + (offset_word & mask), size).ToBytes();
    EXPECT_EQ(value.size(), size) << "tag " << i << " outside the page";
    if (i == 0) {
      p.tag0 = value;
      continue;
    }
    ParsedNode n;
    if (format.page_size >= 16384) {
      n.flags = uint8_t(value[1] >> 5);
      value[1] &= 0x1F;
    } else {
      n.flags = uint8_t(offset_word >> 13);
    }
    size_t pos = 0;
    size_t prefix = 0;
    if (n.flags & 0x4) {
      prefix = LoadU16LE(&value[0]);
      pos = 2;
    }
    const size_t suffix = LoadU16LE(&value[pos]);
    pos += 2;
    EXPECT_LE(prefix, p.tag0.size());
    n.key.assign(p.tag0.begin(), p.tag0.begin() + prefix);
    n.key.insert(n.key.end(), value.begin() + pos, value.begin() + pos + suffix);
    n.data.assign(value.begin() + pos + suffix, value.end());
    p.nodes.push_back(n);
  }
  return p;
}

struct TreeCase {
  uint32_t page_size;
  uint32_t entries;
  uint32_t data_size;
  uint32_t max_per_leaf;
  uint32_t max_children;
  bool prefix_compression;
};

class ForgeTreeTest : public ::testing::TestWithParam<TreeCase> {};

// Walks the tree from the root down and along the leaf chain, and checks that
// both ways give back every entry in order, with the B+ tree invariants.
TEST_P(ForgeTreeTest, TreeReadsBackInOrder) {
  const TreeCase& c = GetParam();
  PageFormat format{c.page_size, c.page_size >= 16384 ? 17u : 12u, 0x0800};
  std::vector<TreeEntry> entries;
  for (uint32_t i = 0; i < c.entries; ++i) {
    TreeEntry e;
    e.key = {0x7F, 0x80, uint8_t(i >> 16), uint8_t(i >> 8), uint8_t(i)};
    e.data.assign(c.data_size, uint8_t(i));
    e.deleted = i % 11 == 5;
    entries.push_back(e);
  }
  TreeOptions options;
  options.object_id = 77;
  options.root_page = 4;
  options.root_header = RootPageHeader(1, 1, 0, 0);
  options.max_entries_per_leaf = c.max_per_leaf;
  options.max_children_per_branch = c.max_children;
  options.prefix_compression = c.prefix_compression;
  PageAllocator allocator(5, {24});
  PageMap pages;
  TreeLayout layout;
  Status s = BuildTree(format, options, entries, &allocator, &pages, &layout);
  ASSERT_TRUE(s.ok()) << s.message();
  EXPECT_EQ(pages.size(), 1 + layout.leaf_pages.size() + layout.branch_pages.size());
  EXPECT_EQ(pages.count(24), 0u);

  // Down from the root: collect leaves in key order.
  std::vector<uint32_t> leaves;
  std::function<void(uint32_t, const Bytes*, int)> walk = [&](uint32_t number, const Bytes* bound,
                                                              int depth) {
    ASSERT_LT(depth, 10);
    ASSERT_TRUE(pages.count(number)) << number;
    ParsedPage p = Parse(format, pages[number]);
    EXPECT_EQ(p.object_id, 77u);
    EXPECT_EQ(p.flags & 0x0800, 0x0800u);
    EXPECT_EQ((p.flags & kPageFlagRoot) != 0, number == 4u);
    if (number == 4) {
      EXPECT_EQ(p.tag0, options.root_header);
    }
    if (format.large() && number != 4 && p.tag0.size() >= 2) {
      EXPECT_EQ(p.tag0[1] & 0xE0, 0) << "prefix bits readable as tag flags on page " << number;
    }
    for (const ParsedNode& n : p.nodes) {
      if (bound && !bound->empty()) {
        EXPECT_LE(n.key, *bound);
      }
      if (number == 4) {
        EXPECT_EQ(n.flags & 0x4, 0) << "prefix compression on a root page";
      }
    }
    if (p.flags & kPageFlagLeaf) {
      leaves.push_back(number);
      return;
    }
    EXPECT_EQ(p.previous, 0u);
    EXPECT_EQ(p.next, 0u);
    if (c.max_children) {
      EXPECT_LE(p.nodes.size(), std::max(c.max_children, 2u));
    }
    for (const ParsedNode& n : p.nodes) {
      ASSERT_EQ(n.data.size(), 4u);
      Bytes child = n.key;
      walk(LoadU32LE(n.data.data()), &child, depth + 1);
    }
    ASSERT_FALSE(p.nodes.empty());
    if (!bound || bound->empty()) {
      EXPECT_TRUE(p.nodes.back().key.empty());
    }
  };
  walk(4, nullptr, 0);

  // Along the chain: the same leaves, and every entry once.
  std::vector<ParsedNode> read;
  for (size_t i = 0; i < leaves.size(); ++i) {
    ParsedPage p = Parse(format, pages[leaves[i]]);
    if (leaves.size() > 1) {
      EXPECT_EQ(p.previous, i ? leaves[i - 1] : 0u);
      EXPECT_EQ(p.next, i + 1 < leaves.size() ? leaves[i + 1] : 0u);
    }
    if (c.max_per_leaf) {
      EXPECT_LE(p.nodes.size(), c.max_per_leaf);
    }
    read.insert(read.end(), p.nodes.begin(), p.nodes.end());
  }
  if (leaves.size() > 1) {
    EXPECT_EQ(leaves, layout.leaf_pages);
  }
  ASSERT_EQ(read.size(), entries.size());
  for (size_t i = 0; i < entries.size(); ++i) {
    EXPECT_EQ(read[i].key, entries[i].key) << i;
    EXPECT_EQ(read[i].data, entries[i].data) << i;
    EXPECT_EQ((read[i].flags & 0x2) != 0, entries[i].deleted) << i;
  }
}

INSTANTIATE_TEST_SUITE_P(
    Shapes, ForgeTreeTest,
    ::testing::Values(TreeCase{4096, 0, 10, 0, 0, true},        // empty root leaf
                      TreeCase{4096, 20, 10, 0, 0, true},       // root leaf
                      TreeCase{4096, 2000, 40, 0, 0, true},     // full pages, two levels
                      TreeCase{4096, 2000, 40, 0, 0, false},    // no prefix compression
                      TreeCase{8192, 500, 30, 3, 3, true},      // deep and narrow
                      TreeCase{8192, 500, 30, 1, 1, true},      // one entry per leaf
                      TreeCase{16384, 3000, 50, 0, 0, true},    // large pages
                      TreeCase{32768, 700, 9, 4, 5, true},      // large pages, deep
                      TreeCase{32768, 40000, 20, 0, 0, true}),  // large pages, many leaves
    [](const ::testing::TestParamInfo<TreeCase>& info) {
      const TreeCase& c = info.param;
      return std::to_string(c.page_size) + "_" + std::to_string(c.entries) + "_" +
             std::to_string(c.max_per_leaf) + "_" + std::to_string(c.max_children) +
             (c.prefix_compression ? "_prefix" : "_plain");
    });

TEST(ForgeTreeTest, RejectsUnsortedKeysAndOversizedEntries) {
  PageFormat format{4096, 9, 0};
  TreeOptions options;
  options.root_page = 4;
  options.root_header = RootPageHeader(1, 1, 0, 0);
  PageAllocator allocator(5, {});
  PageMap pages;
  TreeLayout layout;
  std::vector<TreeEntry> unsorted = {{{2}, {}}, {{1}, {}}};
  EXPECT_FALSE(BuildTree(format, options, unsorted, &allocator, &pages, &layout).ok());
  std::vector<TreeEntry> huge = {{{1}, Bytes(5000)}};
  EXPECT_FALSE(BuildTree(format, options, huge, &allocator, &pages, &layout).ok());
}

TEST(ForgeTreeTest, AllocatorSkipsReservedPages) {
  PageAllocator allocator(22, {24});
  EXPECT_EQ(allocator.Allocate(), 22u);
  EXPECT_EQ(allocator.Allocate(), 23u);
  EXPECT_EQ(allocator.Allocate(), 25u);
  EXPECT_EQ(allocator.last_allocated(), 25u);
}

}  // namespace
}  // namespace tarnwell::forge
