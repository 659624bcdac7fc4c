// B+ trees of pages: sorted key/data entries packed into leaves, branch
// levels above them, and a root page at a fixed page number.
#ifndef TARNWELL_TESTING_FORGE_TREE_H_
#define TARNWELL_TESTING_FORGE_TREE_H_

#include <cstdint>
#include <map>
#include <set>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "testing/forge_page.h"

namespace tarnwell::forge {

struct TreeEntry {
  Bytes key;
  Bytes data;
  bool deleted = false;
};

struct TreeOptions {
  uint32_t object_id = 0;
  uint32_t root_page = 0;
  uint32_t kind_flags = 0;               // kPageFlagSpaceTree, kPageFlagIndex or kPageFlagLongValue
  Bytes root_header;                     // tag 0 of the root page
  uint32_t max_entries_per_leaf = 0;     // 0: as many as fit
  uint32_t max_children_per_branch = 0;  // 0: as many as fit; at least 2 otherwise
  bool prefix_compression = true;
  uint64_t db_time = 0;
};

// Hands out page numbers in ascending order, skipping the fixed ones.
class PageAllocator {
 public:
  PageAllocator(uint32_t first, std::set<uint32_t> reserved)
      : next_(first), reserved_(std::move(reserved)) {}
  uint32_t Allocate();
  uint32_t last_allocated() const { return next_ - 1; }

 private:
  uint32_t next_;
  std::set<uint32_t> reserved_;
};

using PageMap = std::map<uint32_t, Bytes>;  // page number -> page image

struct TreeLayout {
  uint32_t root_page = 0;
  std::vector<uint32_t> leaf_pages;    // non-root leaves, left to right
  std::vector<uint32_t> branch_pages;  // non-root branches, bottom level first
};

// The 16-byte root page header: initial page count, parent FDP page,
// extent kind (0 single, 1 multiple) and the owned-space tree's page.
Bytes RootPageHeader(uint32_t initial_pages, uint32_t parent_fdp_page, uint32_t extent_space,
                     uint32_t space_tree_page);

// Writes the tree for `entries` (sorted by key, keys unique) into `pages`.
Status BuildTree(const PageFormat& format, const TreeOptions& options,
                 const std::vector<TreeEntry>& entries, PageAllocator* allocator, PageMap* pages,
                 TreeLayout* layout);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_TREE_H_
