// Tree pages.
//
// Node (the value of every tag but tag 0):
//   [u16 prefix length]   only when the prefix tag flag is set
//   u16  key suffix length
//   ...  key suffix: the key without the first `prefix length` bytes of the
//        page's common prefix, which tag 0 holds on non-root pages
//   ...  data: the record (leaves) or the u32 child page number (branches)
//
// Tag 0 holds the root header (16 bytes, see RootPageHeader) on root pages
// and the common key prefix elsewhere. A branch entry's key is the highest
// key of its child's subtree; the entry for the rightmost subtree of the
// whole tree has an empty key. Leaves of one tree are chained through the
// previous/next page fields; branches have both 0.
#include "testing/forge_tree.h"

#include <algorithm>
#include <string>

#include "testing/forge_layout.h"

namespace tarnwell::forge {
namespace {

constexpr size_t kKeyLengthSize = 2;
constexpr size_t kChildPageSize = 4;

struct Item {
  const Bytes* key;
  Bytes data;
  bool deleted;
};

size_t CommonPrefix(const Bytes& a, const Bytes& b) {
  size_t n = std::min(a.size(), b.size());
  size_t i = 0;
  while (i < n && a[i] == b[i]) ++i;
  return i;
}

// Space a set of nodes needs in a page, given the bytes of their plain
// encodings (length word, key, data) and the page prefix they share.
size_t PageCost(size_t count, size_t plain_bytes, size_t prefix, size_t header_bytes) {
  size_t cost = PageValueCost(header_bytes) + plain_bytes + count * kTagSize;
  if (prefix > 0) cost = cost + prefix + count * kKeyLengthSize - count * prefix;
  return cost;
}

// Readers of large pages disagree on whether tag 0 too carries tag flags in
// the top bits of its second byte; a prefix that sets them is cut to one byte
// so that both readings give the same key.
size_t SafePrefix(const PageFormat& format, const Bytes& first_key, size_t prefix) {
  constexpr uint8_t kFlagBitsOfSecondByte = 0xE0;
  if (format.large() && prefix >= 2 && (first_key[1] & kFlagBitsOfSecondByte)) return 1;
  return prefix;
}

// A run of items placed in one page, with the prefix it compresses with.
struct PageRun {
  size_t begin;
  size_t end;
  size_t prefix;
};

// The prefix worth using for a page: none when it would not save space.
size_t UsefulPrefix(size_t count, size_t plain, size_t lcp) {
  if (lcp == 0) return 0;
  return PageCost(count, plain, lcp, 0) < PageCost(count, plain, 0, 0) ? lcp : 0;
}

Status PackRuns(const PageFormat& format, const std::vector<Item>& items, uint32_t max_per_page,
                bool prefix_compression, std::vector<PageRun>* runs) {
  size_t i = 0;
  while (i < items.size()) {
    size_t plain = 0, lcp = 0, count = 0;
    size_t j = i;
    for (; j < items.size(); ++j) {
      if (max_per_page != 0 && count == max_per_page) break;
      const Item& item = items[j];
      size_t next_plain = plain + kKeyLengthSize + item.key->size() + item.data.size();
      size_t next_lcp =
          count == 0 ? item.key->size() : std::min(lcp, CommonPrefix(*items[i].key, *item.key));
      next_lcp = SafePrefix(format, *items[i].key, next_lcp);
      size_t prefix = prefix_compression ? UsefulPrefix(count + 1, next_plain, next_lcp) : 0;
      if (PageCost(count + 1, next_plain, prefix, 0) > format.value_space()) break;
      plain = next_plain;
      lcp = next_lcp;
      ++count;
    }
    if (count == 0) {
      return Status::InvalidArgument("an entry of " + std::to_string(items[i].data.size()) +
                                     " bytes does not fit in a " +
                                     std::to_string(format.page_size) + "-byte page");
    }
    runs->push_back({i, j, prefix_compression ? UsefulPrefix(count, plain, lcp) : 0});
    i = j;
  }
  return Status::Ok();
}

bool FitsInRoot(const PageFormat& format, const std::vector<Item>& items, uint32_t max_count,
                size_t root_header_size) {
  if (max_count != 0 && items.size() > max_count) return false;
  size_t plain = 0;
  for (const Item& item : items) plain += kKeyLengthSize + item.key->size() + item.data.size();
  return PageCost(items.size(), plain, 0, root_header_size) <= format.value_space();
}

PageValue EncodeNode(const Item& item, size_t prefix) {
  PageValue v;
  const Bytes& key = *item.key;
  size_t suffix = key.size() - prefix;
  v.data.resize((prefix > 0 ? kKeyLengthSize : 0) + kKeyLengthSize + suffix + item.data.size());
  uint8_t* p = v.data.data();
  if (prefix > 0) {
    StoreU16LE(p, uint16_t(prefix));
    p += kKeyLengthSize;
    v.tag_flags |= kTagFlagPrefix;
  }
  StoreU16LE(p, uint16_t(suffix));
  p += kKeyLengthSize;
  std::copy(key.begin() + prefix, key.end(), p);
  p += suffix;
  std::copy(item.data.begin(), item.data.end(), p);
  if (item.deleted) v.tag_flags |= kTagFlagDeleted;
  return v;
}

Status WritePage(const PageFormat& format, const PageHeaderFields& header, const Bytes& tag0,
                 const std::vector<Item>& items, size_t begin, size_t end, size_t prefix,
                 PageSink* sink) {
  std::vector<PageValue> values;
  values.push_back({tag0, 0});
  for (size_t i = begin; i < end; ++i) values.push_back(EncodeNode(items[i], prefix));
  Bytes image(format.page_size);
  if (!LayoutPage(format, header, values, image.data())) {
    return Status::InvalidArgument("page " + std::to_string(header.page_number) + " overflows");
  }
  return sink->Put(header.page_number, std::move(image));
}

Bytes ChildPage(uint32_t page) {
  Bytes b(kChildPageSize);
  StoreU32LE(b.data(), page);
  return b;
}

}  // namespace

uint32_t PageAllocator::Allocate() {
  while (reserved_.count(next_)) ++next_;
  return next_++;
}

Bytes RootPageHeader(uint32_t initial_pages, uint32_t parent_fdp_page, uint32_t extent_space,
                     uint32_t space_tree_page) {
  Bytes b(16);
  StoreU32LE(b.data(), initial_pages);
  StoreU32LE(b.data() + 4, parent_fdp_page);
  StoreU32LE(b.data() + 8, extent_space);
  StoreU32LE(b.data() + 12, space_tree_page);
  return b;
}

TreeWriter::TreeWriter(const PageFormat& format, const TreeOptions& options,
                       PageAllocator* allocator, PageSink* sink)
    : format_(format), options_(options), allocator_(allocator), sink_(sink) {
  layout_.root_page = options.root_page;
}

Status TreeWriter::Add(TreeEntry entry) {
  if (!status_.ok()) return status_;
  if (entries_ > 0 && !(last_key_ < entry.key)) {
    return status_ = Status::InvalidArgument("tree keys must be unique and ascending");
  }
  const size_t item_plain = kKeyLengthSize + entry.key.size() + entry.data.size();
  if (!pending_.empty()) {
    const size_t count = pending_.size();
    bool full = options_.max_entries_per_leaf != 0 && count == options_.max_entries_per_leaf;
    if (!full) {
      const Bytes& first = pending_.front().key;
      const size_t plain = pending_plain_ + item_plain;
      const size_t lcp =
          SafePrefix(format_, first, std::min(pending_lcp_, CommonPrefix(first, entry.key)));
      const size_t prefix = options_.prefix_compression ? UsefulPrefix(count + 1, plain, lcp) : 0;
      full = PageCost(count + 1, plain, prefix, 0) > format_.value_space();
    }
    if (full) {
      if (pending_page_ == 0) pending_page_ = allocator_->Allocate();
      const uint32_t next = allocator_->Allocate();
      status_ = FlushLeaf(next);
      if (!status_.ok()) return status_;
      pending_page_ = next;
    }
  }
  if (pending_.empty()) {
    if (PageCost(1, item_plain, 0, 0) > format_.value_space()) {
      return status_ = Status::InvalidArgument("an entry of " + std::to_string(entry.data.size()) +
                                               " bytes does not fit in a " +
                                               std::to_string(format_.page_size) + "-byte page");
    }
    pending_lcp_ = SafePrefix(format_, entry.key, entry.key.size());
  } else {
    const Bytes& first = pending_.front().key;
    pending_lcp_ =
        SafePrefix(format_, first, std::min(pending_lcp_, CommonPrefix(first, entry.key)));
  }
  pending_plain_ += item_plain;
  last_key_ = entry.key;
  ++entries_;
  pending_.push_back(std::move(entry));
  return Status::Ok();
}

Status TreeWriter::FlushLeaf(uint32_t next_page) {
  std::vector<Item> items;
  items.reserve(pending_.size());
  for (TreeEntry& e : pending_) items.push_back({&e.key, std::move(e.data), e.deleted});
  size_t prefix = 0;
  if (options_.full_leaf_prefix) {
    prefix = pending_lcp_;
  } else if (options_.prefix_compression) {
    prefix = UsefulPrefix(items.size(), pending_plain_, pending_lcp_);
  }
  PageHeaderFields header;
  header.object_id = options_.object_id;
  header.db_time = options_.db_time;
  header.page_number = pending_page_;
  header.previous_page = previous_leaf_;
  header.next_page = next_page;
  header.flags = options_.kind_flags | kPageFlagLeaf;
  Bytes tag0(pending_.front().key.begin(), pending_.front().key.begin() + prefix);
  Status s = WritePage(format_, header, tag0, items, 0, items.size(), prefix, sink_);
  if (!s.ok()) return s;
  layout_.leaf_pages.push_back(pending_page_);
  children_.push_back({pending_page_, pending_.back().key});
  previous_leaf_ = pending_page_;
  pending_.clear();
  pending_plain_ = pending_lcp_ = 0;
  return Status::Ok();
}

Status TreeWriter::Finish(TreeLayout* layout) {
  if (!status_.ok()) return status_;
  if (children_.empty()) {
    std::vector<Item> items;
    for (TreeEntry& e : pending_) items.push_back({&e.key, e.data, e.deleted});
    if (FitsInRoot(format_, items, options_.max_entries_per_leaf, options_.root_header.size())) {
      PageHeaderFields header;
      header.object_id = options_.object_id;
      header.db_time = options_.db_time;
      header.page_number = options_.root_page;
      header.flags = options_.kind_flags | kPageFlagRoot | kPageFlagLeaf;
      status_ = WritePage(format_, header, options_.root_header, items, 0, items.size(), 0, sink_);
      pending_.clear();
      if (status_.ok()) *layout = layout_;
      return status_;
    }
    pending_page_ = allocator_->Allocate();
  }
  if (!pending_.empty()) {
    status_ = FlushLeaf(0);
    if (!status_.ok()) return status_;
  }
  status_ = WriteBranches();
  if (status_.ok()) *layout = layout_;
  return status_;
}

// Branch levels until one page, the root, holds them all.
Status TreeWriter::WriteBranches() {
  uint32_t max_children = options_.max_children_per_branch;
  if (max_children == 1) max_children = 2;
  static const Bytes kEmptyKey;
  PageHeaderFields header;
  header.object_id = options_.object_id;
  header.db_time = options_.db_time;
  std::vector<Child> children = std::move(children_);
  for (bool parent_of_leaf = true;; parent_of_leaf = false) {
    std::vector<Item> level;
    for (size_t c = 0; c < children.size(); ++c) {
      bool last = c + 1 == children.size();
      level.push_back(
          {last ? &kEmptyKey : &children[c].max_key, ChildPage(children[c].page), false});
    }
    const uint32_t level_flags = options_.kind_flags | (parent_of_leaf ? kPageFlagParentOfLeaf : 0);
    if (FitsInRoot(format_, level, max_children, options_.root_header.size())) {
      header.page_number = options_.root_page;
      header.flags = level_flags | kPageFlagRoot;
      return WritePage(format_, header, options_.root_header, level, 0, level.size(), 0, sink_);
    }
    std::vector<PageRun> runs;
    Status s = PackRuns(format_, level, max_children, options_.prefix_compression, &runs);
    if (!s.ok()) return s;
    if (runs.size() >= level.size()) {
      return Status::InvalidArgument("branch keys too long for a tree to converge");
    }
    std::vector<Child> parents;
    for (const PageRun& run : runs) {
      header.page_number = allocator_->Allocate();
      header.flags = level_flags;
      Bytes prefix(level[run.begin].key->begin(), level[run.begin].key->begin() + run.prefix);
      s = WritePage(format_, header, prefix, level, run.begin, run.end, run.prefix, sink_);
      if (!s.ok()) return s;
      layout_.branch_pages.push_back(header.page_number);
      parents.push_back({header.page_number, children[run.end - 1].max_key});
    }
    children = std::move(parents);
  }
}

Status BuildTree(const PageFormat& format, const TreeOptions& options,
                 const std::vector<TreeEntry>& entries, PageAllocator* allocator, PageMap* pages,
                 TreeLayout* layout) {
  *layout = TreeLayout();
  layout->root_page = options.root_page;
  PageMapSink sink(pages);
  TreeWriter writer(format, options, allocator, &sink);
  for (const TreeEntry& e : entries) {
    Status s = writer.Add(e);
    if (!s.ok()) return s;
  }
  return writer.Finish(layout);
}

}  // namespace tarnwell::forge
