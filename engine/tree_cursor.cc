#include "engine/tree_cursor.h"

#include <algorithm>
#include <cstring>
#include <optional>

#include "engine/tree_walk.h"

namespace tarnwell::engine {

int CompareKeys(ByteView a, ByteView b) {
  const size_t n = std::min(a.size(), b.size());
  if (n > 0) {
    int c = std::memcmp(a.data(), b.data(), n);
    if (c != 0) return c < 0 ? -1 : 1;
  }
  if (a.size() == b.size()) return 0;
  return a.size() < b.size() ? -1 : 1;
}

// True when `key` belongs under a branch node with this separator: it is
// smaller, or equal over the separator's length, or the separator is empty.
static bool BelongsUnder(ByteView key, ByteView separator) {
  if (separator.empty()) return true;
  const size_t n = std::min(key.size(), separator.size());
  int c = n ? std::memcmp(key.data(), separator.data(), n) : 0;
  return c <= 0;
}

namespace {

// The key of node `tag`, deleted or not: deleted nodes keep their place in
// key order. False when the node cannot be decoded.
bool NodeKeyAt(const Page& page, size_t tag, RecordRef* scratch) {
  NodeDecode d = DecodeNode(page, uint16_t(tag), scratch);
  if (d == NodeDecode::kOk) return true;
  if (d != NodeDecode::kDeleted) return false;
  // Decode the key of a deleted node as if it were live.
  const NodeEntry& node = page.nodes()[tag];
  ByteView b = node.bytes;
  size_t cursor = 0;
  uint16_t prefix = 0, suffix = 0;
  if (node.flags & kNodeFlagPrefix) {
    if (page.is_root() || !b.ReadU16LE(0, &prefix) || prefix > page.nodes()[0].size) return false;
    cursor = 2;
  }
  if (!b.ReadU16LE(cursor, &suffix) || !b.Has(cursor + 2, suffix)) return false;
  scratch->key.assign(page.nodes()[0].bytes.data(), page.nodes()[0].bytes.data() + prefix);
  scratch->key.insert(scratch->key.end(), b.data() + cursor + 2, b.data() + cursor + 2 + suffix);
  return true;
}

// The first tag for which `before(key of tag)` is false, by binary search
// over tags 1..N-1; nothing when a probed node cannot be decoded (the caller
// then scans the page in order).
template <typename Before>
std::optional<size_t> PartitionTags(const Page& page, Before before) {
  size_t low = 1, high = page.nodes().size();
  RecordRef scratch;
  while (low < high) {
    const size_t mid = low + (high - low) / 2;
    if (!NodeKeyAt(page, mid, &scratch)) return std::nullopt;
    if (before(ByteView(scratch.key))) {
      low = mid + 1;
    } else {
      high = mid;
    }
  }
  return low;
}

}  // namespace

bool TreeCursor::Seek(uint32_t root_page, ByteView key) {
  valid_ = false;
  damaged_ = false;
  seen_.clear();
  if (!Descend(root_page, key, 0)) return false;
  // Past the last node of the leaf: the answer lies further along the chain.
  while (valid_ && CompareKeys(this->key(), key) < 0) {
    if (!Next()) return false;
  }
  return valid_;
}

bool TreeCursor::Descend(uint32_t page_number, ByteView key, int depth) {
  if (depth > kMaxTreeDepth || !seen_.insert(page_number).second) {
    damaged_ = true;
    return false;
  }
  std::shared_ptr<const Page> fetched = file_.Fetch(page_number);
  if (!fetched) {
    damaged_ = true;
    return false;
  }
  const Page& page = *fetched;
  if (page.is_leaf()) {
    page_ = std::move(fetched);
    page_number_ = page_number;
    // The first node at or after the key, else the last node (Seek then
    // steps along the chain).
    const auto& nodes = page_->nodes();
    std::optional<size_t> first =
        PartitionTags(*page_, [&](ByteView node_key) { return CompareKeys(node_key, key) < 0; });
    if (first && nodes.size() > 1) {
      return SettleFrom(*first < nodes.size() ? *first : nodes.size() - 1);
    }
    size_t last_ok = 0;
    RecordRef ref;  // reused: keeps its key buffer
    for (size_t tag = 1; tag < nodes.size(); ++tag) {
      if (DecodeNode(*page_, uint16_t(tag), &ref) != NodeDecode::kOk) continue;
      last_ok = tag;
      if (CompareKeys(ByteView(ref.key), key) >= 0) return SettleFrom(tag);
    }
    if (last_ok) return SettleFrom(last_ok);
    return SettleFrom(nodes.size());
  }
  const auto& nodes = page.nodes();
  // Children before the first separator the key belongs under cannot hold it.
  std::optional<size_t> first =
      PartitionTags(page, [&](ByteView separator) { return !BelongsUnder(key, separator); });
  RecordRef ref;  // reused: keeps its key buffer
  for (size_t tag = first.value_or(1); tag < nodes.size(); ++tag) {
    NodeDecode d = DecodeNode(page, uint16_t(tag), &ref);
    if (d == NodeDecode::kDeleted) continue;
    if (d != NodeDecode::kOk) {
      damaged_ = true;
      continue;
    }
    if (!BelongsUnder(key, ByteView(ref.key))) continue;
    const uint32_t child = BranchChild(page, ref);
    if (child != 0 && Descend(child, key, depth + 1)) return true;
  }
  return false;
}

bool TreeCursor::SettleFrom(size_t tag) {
  valid_ = false;
  for (;;) {
    const auto& nodes = page_->nodes();
    for (size_t t = tag; t < nodes.size(); ++t) {
      RecordRef ref;
      if (DecodeNode(*page_, uint16_t(t), &ref) != NodeDecode::kOk) continue;
      ref.page_number = page_number_;
      ref.kind = LeafKind(page_->flags());
      ref.file_position = RecordFilePosition(file_, page_number_, nodes[t].offset);
      ref_ = std::move(ref);
      valid_ = true;
      return true;
    }
    const uint32_t next = page_->header().next;
    if (next == 0 || !seen_.insert(next).second) return false;
    std::shared_ptr<const Page> page = file_.Fetch(next);
    if (!page || !page->is_leaf()) {
      damaged_ = true;
      return false;
    }
    page_ = std::move(page);
    page_number_ = next;
    tag = 1;
  }
}

bool TreeCursor::Next() {
  if (!valid_) return false;
  return SettleFrom(size_t(ref_.tag_index) + 1);
}

int64_t TreeCursor::data_position() const {
  if (!page_) return -1;
  const auto& nodes = page_->nodes();
  if (!valid_ || ref_.tag_index >= nodes.size()) return -1;
  return file_.PagePosition(page_number_) + nodes[ref_.tag_index].offset + ref_.data_offset;
}

int SeekKey(const PageFile& file, uint32_t root_page, ByteView key, RecordRef* ref) {
  TreeCursor cursor(file);
  if (!cursor.Seek(root_page, key)) return cursor.damaged() ? -1 : 0;
  if (CompareKeys(cursor.key(), key) != 0) return 0;
  *ref = cursor.ref();
  return 1;
}

}  // namespace tarnwell::engine
