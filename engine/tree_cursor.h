// TreeCursor: keyed positioning in a B+ tree, then stepping through its
// leaves in key order along the leaf chain.
//
// Branch nodes carry separator keys: a child holds no key greater than its
// separator, and the last node of a branch page has an empty separator that
// stands for "everything beyond". Separators may be shortened, so a search
// key equal to a separator over the separator's length descends into that
// child; when the child has no key at or after the search key, the cursor
// goes on along the leaf chain, which reaches the next child's leaves.
//
// Bounded like the tree walk: a page is never entered twice in one seek, the
// depth is limited, and stepping along a chain stops at a page seen before.
#ifndef TARNWELL_ENGINE_TREE_CURSOR_H_
#define TARNWELL_ENGINE_TREE_CURSOR_H_

#include <cstdint>
#include <memory>
#include <unordered_set>

#include "base/byte_view.h"
#include "engine/page_file.h"
#include "engine/record_ref.h"

namespace tarnwell::engine {

// Unsigned byte-wise comparison of two keys; a shorter key that is a prefix
// of the other is smaller.
int CompareKeys(ByteView a, ByteView b);

class TreeCursor {
 public:
  explicit TreeCursor(const PageFile& file) : file_(file) {}

  // Positions at the first leaf node whose key is >= `key`. False when the
  // tree holds none (or cannot be read).
  bool Seek(uint32_t root_page, ByteView key);
  // Moves to the next leaf node in key order. False at the end.
  bool Next();

  bool valid() const { return valid_; }
  const RecordRef& ref() const { return ref_; }
  const Page& page() const { return *page_; }
  ByteView key() const { return ByteView(ref_.key); }
  ByteView data() const { return page_ ? NodeData(*page_, ref_) : ByteView(); }
  // Byte position of the node's data part in the file.
  int64_t data_position() const;
  // Whether the seek or walk met a damaged tree.
  bool damaged() const { return damaged_; }

 private:
  // Descends from page n to the leaf where `key` belongs and positions the
  // cursor there (possibly past the leaf's last node).
  bool Descend(uint32_t page_number, ByteView key, int depth);
  // Positions at the first usable node at tag >= `tag` of the current page,
  // moving along the chain when the page has none.
  bool SettleFrom(size_t tag);

  const PageFile& file_;
  std::shared_ptr<const Page> page_;
  uint32_t page_number_ = 0;
  RecordRef ref_;
  bool valid_ = false;
  bool damaged_ = false;
  std::unordered_set<uint32_t> seen_;
};

// Exact search: 1 found (ref filled), 0 not found, -1 the tree cannot be read.
int SeekKey(const PageFile& file, uint32_t root_page, ByteView key, RecordRef* ref);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_TREE_CURSOR_H_
