// Allocation maps. The file after offset 0x4400 is cut into regions of
// 253,952 bytes; each region starts with an AMap page whose 496 bytes of bits
// say which 64-byte units of the region are in use (the first bit of each
// byte is its lowest unit). Every eighth region also starts with a PMap page
// after the AMap (page granularity), regions 128, 128 + 496, ... carry an
// FMap, and regions 1024, 1024 + 3968, ... an FPMap. Readers of this era use
// only the AMaps; the others must exist and be valid pages, so they are
// written with every bit set (nothing free in them), which is what Outlook
// itself writes since it stopped using them. A density list page sits at
// 0x4200; an empty one tells Outlook to rebuild it.
//
// AllocationMap hands out space after the last allocated unit only, so that
// nothing a committed reader may need is ever overwritten. It grows the file
// one whole region at a time, as Outlook does.
#ifndef TARNWELL_MAPI_PST_ALLOCATION_MAP_H_
#define TARNWELL_MAPI_PST_ALLOCATION_MAP_H_

#include <cstdint>
#include <map>

#include "base/byte_view.h"
#include "base/status.h"
#include "mapi/pst/pst_header.h"

namespace tarnwell::mapi::pst {

inline constexpr uint64_t kDListOffset = 0x4200;
inline constexpr uint64_t kFirstAMapOffset = 0x4400;
inline constexpr uint64_t kAllocUnit = 64;
inline constexpr uint64_t kAMapCoverage = 253952;  // 496 bytes * 8 bits * 64
inline constexpr uint64_t kRegionsPerPMap = 8;
inline constexpr uint64_t kFirstFMapRegion = 128;  // the header's rgbFM covers the first 128
inline constexpr uint64_t kRegionsPerFMap = 496;
inline constexpr uint64_t kFirstFPMapRegion = 1024;  // rgbFP covers the first 128 PMaps
inline constexpr uint64_t kRegionsPerFPMap = 496 * 8;

uint64_t AMapOffset(uint64_t region);
// The region holding `ib`; `ib` must be at least kFirstAMapOffset.
uint64_t RegionOf(uint64_t ib);
bool RegionHasPMap(uint64_t region);
bool RegionHasFMap(uint64_t region);
bool RegionHasFPMap(uint64_t region);
// Bytes the map pages take at the start of `region`.
uint64_t RegionMapBytes(uint64_t region);

// A map page (AMap, PMap, FMap or FPMap) at `ib` with 496 bytes of `bits`.
Bytes EncodeMapPage(uint8_t ptype, uint64_t ib, ByteView bits);
// An empty density list page.
Bytes EncodeEmptyDList(uint64_t bid);

class AllocationMap {
 public:
  class Io {
   public:
    virtual ~Io() = default;
    virtual Status ReadAt(uint64_t ib, size_t size, uint8_t* out) const = 0;
    virtual Status WriteAt(uint64_t ib, ByteView data) = 0;
    // Makes the file at least `size` bytes long.
    virtual Status Extend(uint64_t size) = 0;
  };

  explicit AllocationMap(Io* io) : io_(io) {}

  // A new file: starts the first region.
  Status InitNew();
  // An existing file described by `root`. With valid maps, space is handed
  // out after the last unit in use in the last region; otherwise after the
  // end of the file, and the maps stay marked invalid.
  Status InitExisting(const PstRoot& root);

  // `size` bytes aligned to `align` (64 or 512), inside one region.
  Status Allocate(uint64_t size, uint64_t align, uint64_t* ib);
  // Writes every AMap changed since the last call.
  Status Flush();

  uint64_t file_end() const { return file_end_; }
  uint64_t last_amap() const { return AMapOffset(last_region_); }
  uint64_t amap_free() const { return amap_free_; }
  bool valid() const { return valid_; }

 private:
  struct Region {
    Bytes bits;
    bool dirty = false;
  };
  Status GetRegion(uint64_t region, Region** out);
  Status StartRegion(uint64_t region, Region** out);

  Io* io_;
  std::map<uint64_t, Region> regions_;
  uint64_t committed_eof_ = 0;  // regions before this already exist
  uint64_t alloc_end_ = 0;
  uint64_t file_end_ = 0;
  uint64_t last_region_ = 0;
  uint64_t amap_free_ = 0;
  bool valid_ = true;
};

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_ALLOCATION_MAP_H_
