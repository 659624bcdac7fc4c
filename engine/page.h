// One database page and its node table.
//
// Page header (both families share the first 40 bytes; large pages add 40):
//
//   offset  width  meaning
//   0       8      checksum(s)
//   8       8      database time of the last change
//   16      4      previous page in the leaf chain (0 = none)
//   20      4      next page in the leaf chain (0 = none)
//   24      4      object id of the tree the page belongs to
//   28      2      free bytes
//   30      2      uncommitted free bytes
//   32      2      offset of the first free byte of the data area
//   34      2      number of tags; large pages use only the low 12 bits,
//                  newer revisions keep other state in the top bits
//   36      4      page flags (kPageFlag*)
//   40      40     large pages only: checksums of blocks 1-3, page number
//
// The data area begins right after the header (offset 40 or 80). The tag
// array lies at the end of the page and grows towards its start: tag i is the
// 4 bytes at page_size - 4 * (i + 1).
//
//   family  tag bytes 0-1                  tag bytes 2-3
//   legacy  node size (bits 0-12)          node offset (bits 0-12),
//                                          node flags (bits 13-15)
//   large   node size (bits 0-14)          node offset (bits 0-14)
//
// Node offsets count from the start of the data area. In the large family the
// node flags are the top three bits of the node's first u16; they are cleared
// in the node bytes handed out. Node flags: kNodeFlagVersion, kNodeFlagDeleted,
// kNodeFlagPrefix.
//
// Tag 0 is the page's external header: for most pages the key prefix that
// prefix-compressed nodes share.
#ifndef TARNWELL_ENGINE_PAGE_H_
#define TARNWELL_ENGINE_PAGE_H_

#include <cstdint>
#include <vector>

#include "base/byte_view.h"
#include "engine/version.h"

namespace tarnwell::engine {

constexpr size_t kLegacyPageHeaderSize = 40;
constexpr size_t kLargePageHeaderSize = 80;
constexpr size_t kPageHeaderCopySize = 80;  // what the page scan reads of each page
constexpr size_t kTagSize = 4;

constexpr size_t kPagePreviousOffset = 16;
constexpr size_t kPageNextOffset = 20;
constexpr size_t kPageObjectIdOffset = 24;
constexpr size_t kPageTagCountOffset = 34;
constexpr size_t kPageFlagsOffset = 36;

constexpr uint16_t kLargePageTagCountMask = 0x0FFF;
constexpr uint16_t kLegacyTagValueMask = 0x1FFF;
constexpr uint16_t kLargeTagValueMask = 0x7FFF;
constexpr int kLegacyTagFlagShift = 13;
constexpr int kLargeNodeFlagShift = 13;  // of the node's first u16

constexpr uint32_t kPageFlagRoot = 0x0001;
constexpr uint32_t kPageFlagLeaf = 0x0002;
constexpr uint32_t kPageFlagParentOfLeaf = 0x0004;
constexpr uint32_t kPageFlagEmpty = 0x0008;
constexpr uint32_t kPageFlagSpaceTree = 0x0020;
constexpr uint32_t kPageFlagIndex = 0x0040;
constexpr uint32_t kPageFlagLongValue = 0x0080;

constexpr uint8_t kNodeFlagVersion = 0x1;
constexpr uint8_t kNodeFlagDeleted = 0x2;
constexpr uint8_t kNodeFlagPrefix = 0x4;

// One node of a page. `bytes` points into the page that produced it, so the
// entry lives no longer than its page. An entry whose tag pointed outside
// the data area is kept (so tag indexes stay aligned) but marked `damaged`
// and has no bytes.
struct NodeEntry {
  ByteView bytes;
  uint16_t size = 0;
  uint16_t offset = 0;  // within the page, header included
  uint8_t flags = 0;
  bool damaged = false;
};

// The fields of a page header the reader uses.
struct PageHeader {
  uint32_t previous = 0;
  uint32_t next = 0;
  uint32_t object_id = 0;
  uint16_t tag_count = 0;
  uint32_t flags = 0;
};

// Decodes the header fields of a page (the first 40 bytes suffice).
PageHeader DecodePageHeader(ByteView header, PageFamily family);

class Page {
 public:
  Page() = default;
  // Takes the page's bytes (exactly one page size long) and decodes its
  // header and node table. Never reads outside `bytes`.
  Page(Bytes bytes, PageFamily family);
  // Node entries point into the page's own bytes: a copy would point into
  // the original, so pages move but never copy.
  Page(const Page&) = delete;
  Page& operator=(const Page&) = delete;
  Page(Page&&) = default;
  Page& operator=(Page&&) = default;

  const PageHeader& header() const { return header_; }
  uint32_t flags() const { return header_.flags; }
  bool is_root() const { return header_.flags & kPageFlagRoot; }
  bool is_leaf() const { return header_.flags & kPageFlagLeaf; }
  bool is_index() const { return header_.flags & kPageFlagIndex; }
  bool is_long_value() const { return header_.flags & kPageFlagLongValue; }
  PageFamily family() const { return family_; }
  ByteView bytes() const { return ByteView(bytes_); }

  // The node table: one entry per tag the page can hold. Tags that would lie
  // inside the header are cut off.
  const std::vector<NodeEntry>& nodes() const { return nodes_; }
  // Tags whose node pointed outside the data area.
  size_t damaged_nodes() const { return damaged_; }

 private:
  void BuildNodeTable();

  // As read from disk, except that in the large family the flag bits of each
  // node's first u16 are cleared once the node table has taken them.
  Bytes bytes_;
  PageFamily family_ = PageFamily::kLegacy;
  PageHeader header_;
  std::vector<NodeEntry> nodes_;
  size_t damaged_ = 0;
};

size_t PageHeaderSize(PageFamily family);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_PAGE_H_
