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
  // Leaves share their whole common key prefix even where it saves nothing
  // (some readers find keys only through the prefix).
  bool full_leaf_prefix = false;
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

// Where finished pages go: a map in memory, or straight into a file.
class PageSink {
 public:
  virtual ~PageSink() = default;
  virtual Status Put(uint32_t page_number, Bytes image) = 0;
};

class PageMapSink : public PageSink {
 public:
  explicit PageMapSink(PageMap* pages) : pages_(pages) {}
  Status Put(uint32_t page_number, Bytes image) override {
    (*pages_)[page_number] = std::move(image);
    return Status::Ok();
  }

 private:
  PageMap* pages_;
};

struct TreeLayout {
  uint32_t root_page = 0;
  std::vector<uint32_t> leaf_pages;    // non-root leaves, left to right
  std::vector<uint32_t> branch_pages;  // non-root branches, bottom level first
};

// The 16-byte root page header: initial page count, parent FDP page,
// extent kind (0 single, 1 multiple) and the owned-space tree's page.
Bytes RootPageHeader(uint32_t initial_pages, uint32_t parent_fdp_page, uint32_t extent_space,
                     uint32_t space_tree_page);

// Builds one tree from entries given in ascending key order. Each leaf goes
// to the sink as soon as it is full, so a tree of any size needs memory only
// for one leaf and the branch keys; the branch levels and the root follow in
// Finish. Leaves are numbered from the allocator as they fill, so trees
// written side by side interleave their pages.
class TreeWriter {
 public:
  TreeWriter(const PageFormat& format, const TreeOptions& options, PageAllocator* allocator,
             PageSink* sink);

  Status Add(TreeEntry entry);
  Status Finish(TreeLayout* layout);
  uint64_t entries() const { return entries_; }

 private:
  struct Child {
    uint32_t page;
    Bytes max_key;
  };
  Status FlushLeaf(uint32_t next_page);
  Status WriteBranches();

  PageFormat format_;
  TreeOptions options_;
  PageAllocator* allocator_;
  PageSink* sink_;
  TreeLayout layout_;
  std::vector<TreeEntry> pending_;  // the leaf being filled
  size_t pending_plain_ = 0;        // bytes of its nodes without prefix compression
  size_t pending_lcp_ = 0;          // common prefix of its keys
  uint32_t pending_page_ = 0;       // its number; 0 while it may still become the root
  uint32_t previous_leaf_ = 0;
  std::vector<Child> children_;  // written leaves
  Bytes last_key_;
  uint64_t entries_ = 0;
  Status status_;
};

// Writes the tree for `entries` (sorted by key, keys unique) into `pages`.
Status BuildTree(const PageFormat& format, const TreeOptions& options,
                 const std::vector<TreeEntry>& entries, PageAllocator* allocator, PageMap* pages,
                 TreeLayout* layout);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_TREE_H_
