// Pages (512 bytes with a 16-byte trailer) and the two B-trees built from
// them: the node B-tree (NBT: node id -> data and subnode block ids, parent)
// and the block B-tree (BBT: block id -> file offset, size, reference count).
//
// Trees are read whole into sorted vectors and written whole from them; a
// commit writes fresh trees and leaves the old pages where they were.
#ifndef TARNWELL_MAPI_PST_BTREE_PAGE_H_
#define TARNWELL_MAPI_PST_BTREE_PAGE_H_

#include <cstdint>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "mapi/pst/node.h"
#include "mapi/pst/pst_header.h"

namespace tarnwell::mapi::pst {

inline constexpr size_t kPageSize = 512;
inline constexpr size_t kPageTrailerSize = 16;
inline constexpr size_t kPageDataSize = kPageSize - kPageTrailerSize;  // 496

enum PageType : uint8_t {
  kPageTypeBbt = 0x80,
  kPageTypeNbt = 0x81,
  kPageTypeFMap = 0x82,
  kPageTypePMap = 0x83,
  kPageTypeAMap = 0x84,
  kPageTypeFPMap = 0x85,
  kPageTypeDList = 0x86,
};

// Fills the trailer of `page` (kPageSize bytes): type, signature (zero for
// the allocation map pages), CRC of the first 496 bytes, id.
void SealPage(uint8_t* page, uint8_t ptype, uint64_t bid, uint64_t ib);
// Checks a page read from `ib` against the type and id it should have.
Status CheckPage(ByteView page, uint8_t ptype, uint64_t bid, uint64_t ib);

struct NbtEntry {
  Nid nid = 0;
  uint64_t bid_data = 0;
  uint64_t bid_sub = 0;
  Nid parent = 0;
};

struct BbtEntry {
  uint64_t bid = 0;
  uint64_t ib = 0;
  uint16_t cb = 0;
  uint16_t cref = 0;
};

class PageIo {
 public:
  virtual ~PageIo() = default;
  virtual uint64_t file_size() const = 0;
  virtual Status ReadAt(uint64_t ib, size_t size, uint8_t* out) const = 0;
  // Room for one page after the end of the file, and an id for it.
  virtual Status AllocatePage(uint64_t* ib, uint64_t* bid) = 0;
  virtual Status WriteAt(uint64_t ib, ByteView data) = 0;
};

Status ReadNbt(const PageIo& io, const Bref& root, std::vector<NbtEntry>* out);
Status ReadBbt(const PageIo& io, const Bref& root, std::vector<BbtEntry>* out);

// `entries` must be sorted by key without duplicates.
Status WriteNbt(PageIo& io, const std::vector<NbtEntry>& entries, Bref* root);
Status WriteBbt(PageIo& io, const std::vector<BbtEntry>& entries, Bref* root);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_BTREE_PAGE_H_
