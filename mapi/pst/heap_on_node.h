// Heap-on-node (HN): many small allocations packed into a node's data
// blocks, one heap page per block, each found again by a heap id (HID).
// Property and table contexts keep everything but their largest values in
// a heap.
#ifndef TARNWELL_MAPI_PST_HEAP_ON_NODE_H_
#define TARNWELL_MAPI_PST_HEAP_ON_NODE_H_

#include <cstdint>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "mapi/pst/node.h"

namespace tarnwell::mapi::pst {

// A heap id: bits 0-4 are zero (the node-id type "HID"), bits 5-15 the
// 1-based allocation index within its page, bits 16-31 the page (block)
// index. Zero is no allocation.
using Hid = uint32_t;

constexpr Hid MakeHid(uint32_t page, uint32_t index) { return (page << 16) | (index << 5); }
constexpr uint32_t HidPage(Hid hid) { return hid >> 16; }
constexpr uint32_t HidIndex(Hid hid) { return (hid >> 5) & 0x7FF; }

// What the heap holds (the HNHDR client signature).
inline constexpr uint8_t kHeapClientTable = 0x7C;
inline constexpr uint8_t kHeapClientBth = 0xB5;
inline constexpr uint8_t kHeapClientProperties = 0xBC;

// The largest single allocation; bigger values go to subnodes.
inline constexpr size_t kMaxHeapAllocation = 3580;

// Builds a heap from scratch. Allocations never move: a page that cannot
// take an allocation is left as it is and a later page (a new one when none
// has room) takes it.
class HeapBuilder {
 public:
  explicit HeapBuilder(uint8_t client_signature);

  // Copies `bytes` into the heap. InvalidArgument when longer than
  // kMaxHeapAllocation.
  Status Allocate(ByteView bytes, Hid* hid);
  // Space of `size` zero bytes whose content Fill supplies later, so that a
  // structure can get its id before the ids it points to are known.
  Status Reserve(size_t size, Hid* hid);
  // Replaces the content of an allocation by bytes of the same size.
  Status Fill(Hid hid, ByteView bytes);

  void set_user_root(Hid hid) { user_root_ = hid; }

  // The heap's pages, one block each, every one at most kMaxBlockData bytes.
  std::vector<Bytes> Finish() const;

 private:
  struct Page {
    size_t header_size = 0;
    Bytes payload;               // the allocations back to back
    std::vector<uint16_t> ends;  // payload end of each allocation
  };
  static size_t PageSize(size_t header, size_t payload, size_t allocations);
  bool Fits(const Page& page, size_t size) const;

  uint8_t client_signature_;
  Hid user_root_ = 0;
  std::vector<Page> pages_;
};

// Reads a heap from a node's blocks, which must outlive the reader. Every
// page map is checked once when the heap is opened; a damaged page only
// makes the allocations on that page unreadable.
class HeapReader {
 public:
  // Corruption when the first block is not a heap.
  Status Open(const std::vector<Bytes>& blocks);

  uint8_t client_signature() const { return client_signature_; }
  Hid user_root() const { return user_root_; }
  size_t page_count() const { return pages_.size(); }
  // Allocations on all readable pages (a bound for walks over the heap).
  size_t allocation_count() const { return allocation_count_; }

  // The bytes of allocation `hid`; Corruption for an id that names no
  // allocation or one on a damaged page.
  Status Read(Hid hid, ByteView* out) const;

 private:
  struct Page {
    ByteView block;
    bool valid = false;
    std::vector<uint16_t> offsets;  // rgibAlloc: cAlloc + 1 entries
  };
  uint8_t client_signature_ = 0;
  Hid user_root_ = 0;
  size_t allocation_count_ = 0;
  std::vector<Page> pages_;
};

// Values too large for a record or cell are stored behind an HNID: 0 for
// no bytes, a heap id for up to kMaxHeapAllocation bytes, beyond that the
// id of a subnode (any node-id type but HID) holding them as a plain stream.
class HnidWriter {
 public:
  // New subnodes go into node->subnodes, as kNidTypeLtp ids not in use.
  HnidWriter(HeapBuilder* heap, NodeContent* node) : heap_(heap), node_(node) {}
  Status Store(ByteView bytes, uint32_t* hnid);
  // A new subnode with `blocks` as its data stream, cut by the caller.
  Nid AddSubnode(std::vector<Bytes> blocks);

 private:
  HeapBuilder* heap_;
  NodeContent* node_;
  uint32_t next_index_ = 1;
};

// The bytes behind an HNID; subnodes are looked up in node.subnodes.
Status ReadHnid(const HeapReader& heap, const NodeContent& node, uint32_t hnid, Bytes* out);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_HEAP_ON_NODE_H_
