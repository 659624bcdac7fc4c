// AMap, PMap, FMap and FPMap pages (512 bytes, ptype 0x84, 0x83, 0x82, 0x85):
//
//   offset width  meaning
//   0      496    rgbBits: AMap one bit per 64 bytes of the region, PMap one
//                 bit per 512 bytes of eight regions, bit set = in use, most
//                 significant bit first; FMap/FPMap one byte per AMap/PMap
//   496    16     page trailer, wSig 0, bid = the page's own offset
//
// DList page (ptype 0x86, at 0x4200):
//
//   0      1      bFlags (bit 0: the list is complete)
//   1      1      cEntDList: entries
//   2      2      wPadding
//   4      4      ulCurrentPage
//   8      476    rgDListPageEnt (4 bytes each)
//   484    12     rgPadding
//   496    16     page trailer, bid from bidNextP
#include "mapi/pst/allocation_map.h"

#include <algorithm>

#include "mapi/pst/btree_page.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr uint8_t kAllSet = 0xFF;
constexpr int kBitsPerByte = 8;
// Allocation never needs more than a couple of region hops.
constexpr int kMaxAllocateTries = 4;

uint64_t AlignUp(uint64_t v, uint64_t align) { return (v + align - 1) / align * align; }

void MarkUnits(Bytes* bits, uint64_t first, uint64_t count) {
  for (uint64_t u = first; u < first + count; ++u) {
    (*bits)[u / kBitsPerByte] |= uint8_t(0x80 >> (u % kBitsPerByte));
  }
}

bool UnitSet(const Bytes& bits, uint64_t u) {
  return (bits[u / kBitsPerByte] & (0x80 >> (u % kBitsPerByte))) != 0;
}

}  // namespace

uint64_t AMapOffset(uint64_t region) { return kFirstAMapOffset + region * kAMapCoverage; }
uint64_t RegionOf(uint64_t ib) { return (ib - kFirstAMapOffset) / kAMapCoverage; }
bool RegionHasPMap(uint64_t region) { return region % kRegionsPerPMap == 0; }
bool RegionHasFMap(uint64_t region) {
  return region >= kFirstFMapRegion && (region - kFirstFMapRegion) % kRegionsPerFMap == 0;
}
bool RegionHasFPMap(uint64_t region) {
  return region >= kFirstFPMapRegion && (region - kFirstFPMapRegion) % kRegionsPerFPMap == 0;
}
uint64_t RegionMapBytes(uint64_t region) {
  return kPageSize * (1 + RegionHasPMap(region) + RegionHasFMap(region) + RegionHasFPMap(region));
}

Bytes EncodeMapPage(uint8_t ptype, uint64_t ib, ByteView bits) {
  Bytes page(kPageSize, 0);
  std::copy(bits.data(), bits.data() + std::min<size_t>(bits.size(), kPageDataSize), page.begin());
  SealPage(page.data(), ptype, ib, ib);
  return page;
}

Bytes EncodeEmptyDList(uint64_t bid) {
  Bytes page(kPageSize, 0);
  SealPage(page.data(), kPageTypeDList, bid, kDListOffset);
  return page;
}

Status AllocationMap::InitNew() {
  committed_eof_ = 0;
  alloc_end_ = kFirstAMapOffset;
  amap_free_ = 0;
  valid_ = true;
  Region* r;
  return StartRegion(0, &r);
}

Status AllocationMap::InitExisting(const PstRoot& root) {
  committed_eof_ = root.file_eof;
  file_end_ = root.file_eof;
  amap_free_ = root.amap_free;
  valid_ = root.amap_valid != kAMapInvalid;
  uint64_t last = root.amap_last;
  if (valid_ && (last < kFirstAMapOffset || (last - kFirstAMapOffset) % kAMapCoverage != 0 ||
                 last >= root.file_eof)) {
    valid_ = false;
  }
  if (valid_) {
    last_region_ = RegionOf(last);
    Region* r;
    Status s = GetRegion(last_region_, &r);
    if (!s.ok()) return s;
  }
  if (!valid_) {
    // Nothing to trust but the end of the file.
    alloc_end_ = std::max(AlignUp(root.file_eof, kPageSize), kFirstAMapOffset);
    last_region_ = RegionOf(std::max(alloc_end_, kFirstAMapOffset + 1) - 1);
    return Status::Ok();
  }
  const Bytes& bits = regions_[last_region_].bits;
  uint64_t used = 0;
  for (uint64_t u = kPageDataSize * kBitsPerByte; u > 0; --u) {
    if (UnitSet(bits, u - 1)) {
      used = u;
      break;
    }
  }
  alloc_end_ = AMapOffset(last_region_) + std::max(used * kAllocUnit, RegionMapBytes(last_region_));
  return Status::Ok();
}

Status AllocationMap::StartRegion(uint64_t region, Region** out) {
  uint64_t start = AMapOffset(region);
  Region& r = regions_[region];
  r.bits.assign(kPageDataSize, 0);
  uint64_t map_bytes = RegionMapBytes(region);
  MarkUnits(&r.bits, 0, map_bytes / kAllocUnit);
  r.dirty = true;
  Bytes full(kPageDataSize, kAllSet);
  uint64_t at = start + kPageSize;
  if (RegionHasPMap(region)) {
    Status s = io_->WriteAt(at, EncodeMapPage(kPageTypePMap, at, full));
    if (!s.ok()) return s;
    at += kPageSize;
  }
  if (RegionHasFMap(region)) {
    Status s = io_->WriteAt(at, EncodeMapPage(kPageTypeFMap, at, full));
    if (!s.ok()) return s;
    at += kPageSize;
  }
  if (RegionHasFPMap(region)) {
    Status s = io_->WriteAt(at, EncodeMapPage(kPageTypeFPMap, at, full));
    if (!s.ok()) return s;
  }
  file_end_ = std::max(file_end_, start + kAMapCoverage);
  Status s = io_->Extend(file_end_);
  if (!s.ok()) return s;
  amap_free_ += kAMapCoverage - map_bytes;
  last_region_ = std::max(last_region_, region);
  *out = &r;
  return Status::Ok();
}

Status AllocationMap::GetRegion(uint64_t region, Region** out) {
  auto it = regions_.find(region);
  if (it != regions_.end()) {
    *out = &it->second;
    return Status::Ok();
  }
  uint64_t start = AMapOffset(region);
  if (start >= committed_eof_) return StartRegion(region, out);
  Region& r = regions_[region];
  uint8_t page[kPageSize];
  Status s = io_->ReadAt(start, kPageSize, page);
  if (!s.ok()) return s;
  if (CheckPage(ByteView(page, kPageSize), kPageTypeAMap, start, start).ok()) {
    r.bits.assign(page, page + kPageDataSize);
  } else {
    // A damaged map: treat the region as full and let Outlook rebuild the maps.
    r.bits.assign(kPageDataSize, kAllSet);
    valid_ = false;
  }
  if (start + kAMapCoverage > file_end_) {
    file_end_ = start + kAMapCoverage;
    s = io_->Extend(file_end_);
    if (!s.ok()) return s;
  }
  *out = &r;
  return Status::Ok();
}

Status AllocationMap::Allocate(uint64_t size, uint64_t align, uint64_t* ib) {
  if (size == 0 || size % kAllocUnit != 0 || size > kAMapCoverage / 2) {
    return Status::InvalidArgument("PST: bad allocation size");
  }
  for (int attempt = 0; attempt < kMaxAllocateTries; ++attempt) {
    uint64_t pos = AlignUp(std::max(alloc_end_, kFirstAMapOffset), align);
    uint64_t region = RegionOf(pos);
    Region* r;
    Status s = GetRegion(region, &r);
    if (!s.ok()) return s;
    uint64_t start = AMapOffset(region);
    pos = std::max(pos, AlignUp(start + RegionMapBytes(region), align));
    if (pos + size > start + kAMapCoverage) {
      alloc_end_ = start + kAMapCoverage;
      continue;
    }
    MarkUnits(&r->bits, (pos - start) / kAllocUnit, size / kAllocUnit);
    r->dirty = true;
    alloc_end_ = pos + size;
    amap_free_ -= std::min(amap_free_, size);
    *ib = pos;
    return Status::Ok();
  }
  return Status::Corruption("PST: could not place a block");
}

Status AllocationMap::Flush() {
  for (auto& [region, r] : regions_) {
    if (!r.dirty) continue;
    uint64_t start = AMapOffset(region);
    Status s = io_->WriteAt(start, EncodeMapPage(kPageTypeAMap, start, r.bits));
    if (!s.ok()) return s;
    r.dirty = false;
  }
  // Only the last region receives new allocations; forget the others so a
  // large file does not keep all its maps in memory.
  for (auto it = regions_.begin(); it != regions_.end();) {
    it = it->first == last_region_ ? std::next(it) : regions_.erase(it);
  }
  committed_eof_ = file_end_;
  return Status::Ok();
}

}  // namespace tarnwell::mapi::pst
