// Page trailer (last 16 bytes of every 512-byte page):
//
//   offset width  meaning
//   496    1      ptype (0x80 BBT, 0x81 NBT, 0x82 FMap, 0x83 PMap, 0x84 AMap,
//                 0x85 FPMap, 0x86 DList)
//   497    1      ptypeRepeat (same)
//   498    2      wSig: ComputeSignature(ib, bid) for B-tree and DList
//                 pages, 0 for the allocation maps
//   500    4      dwCRC: CRC of bytes 0..495
//   504    8      bid: page id (the page's own offset for allocation maps)
//
// BTPAGE (B-tree page):
//
//   0      488    rgentries
//   488    1      cEnt: entries in use
//   489    1      cEntMax: entries that fit
//   490    1      cbEnt: entry size
//   491    1      cLevel: 0 for leaves, height above the leaves otherwise
//   492    4      dwPadding
//
// BTENTRY (cLevel > 0, 24 bytes): btkey(8) lowest key below, BREF bid(8) ib(8).
// NBTENTRY (NBT leaf, 32 bytes): nid(8, low 32 bits used), bidData(8),
//   bidSub(8), nidParent(4), dwPadding(4).
// BBTENTRY (BBT leaf, 24 bytes): BREF bid(8) ib(8), cb(2), cRef(2),
//   dwPadding(4).
#include "mapi/pst/btree_page.h"

#include <algorithm>
#include <set>
#include <string>

#include "mapi/pst/block_io.h"
#include "mapi/pst/pst_crc.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr size_t kOffType = 496;
constexpr size_t kOffTypeRepeat = 497;
constexpr size_t kOffSig = 498;
constexpr size_t kOffCrc = 500;
constexpr size_t kOffBid = 504;

constexpr size_t kEntriesSize = 488;
constexpr size_t kOffCount = 488;
constexpr size_t kOffMaxCount = 489;
constexpr size_t kOffEntrySize = 490;
constexpr size_t kOffLevel = 491;

constexpr size_t kBtEntrySize = 24;
constexpr size_t kNbtEntrySize = 32;
constexpr size_t kBbtEntrySize = 24;
// Real files stay far below this; it bounds recursion on damaged ones.
constexpr int kMaxTreeLevel = 8;

bool IsMapPage(uint8_t ptype) {
  return ptype == kPageTypeAMap || ptype == kPageTypePMap || ptype == kPageTypeFMap ||
         ptype == kPageTypeFPMap;
}

std::string Hex(uint64_t v) {
  char buf[24];
  snprintf(buf, sizeof buf, "0x%llx", static_cast<unsigned long long>(v));
  return buf;
}

class TreeReader {
 public:
  TreeReader(const PageIo& io, uint8_t ptype, size_t leaf_entry_size)
      : io_(io), ptype_(ptype), leaf_entry_size_(leaf_entry_size) {}

  // Calls `leaf` with each leaf entry in tree order.
  template <typename Fn>
  Status Walk(const Bref& ref, int expected_level, Fn&& leaf) {
    if (!visited_.insert(ref.ib).second) {
      return Status::Corruption("PST: B-tree page " + Hex(ref.ib) + " is reached twice");
    }
    if (ref.ib % kPageSize != 0 || ref.ib > io_.file_size() ||
        io_.file_size() - ref.ib < kPageSize) {
      return Status::Corruption("PST: B-tree page " + Hex(ref.ib) + " lies outside the file");
    }
    uint8_t page[kPageSize];
    Status s = io_.ReadAt(ref.ib, kPageSize, page);
    if (!s.ok()) return s;
    ByteView v(page, kPageSize);
    s = CheckPage(v, ptype_, ref.bid, ref.ib);
    if (!s.ok()) return s;
    int level = page[kOffLevel];
    size_t count = page[kOffCount];
    size_t entry_size = page[kOffEntrySize];
    if (level > kMaxTreeLevel || (expected_level >= 0 && level != expected_level)) {
      return Status::Corruption("PST: B-tree page " + Hex(ref.ib) + " has a bad level");
    }
    size_t want = level > 0 ? kBtEntrySize : leaf_entry_size_;
    if (entry_size != want || count * entry_size > kEntriesSize) {
      return Status::Corruption("PST: B-tree page " + Hex(ref.ib) + " has bad entry sizes");
    }
    for (size_t i = 0; i < count; ++i) {
      ByteView e = v.Sub(i * entry_size, entry_size);
      if (level == 0) {
        leaf(e);
        continue;
      }
      Bref child{e.U64LE(8), e.U64LE(16)};
      s = Walk(child, level - 1, leaf);
      if (!s.ok()) return s;
    }
    return Status::Ok();
  }

 private:
  const PageIo& io_;
  uint8_t ptype_;
  size_t leaf_entry_size_;
  std::set<uint64_t> visited_;
};

// Writes leaves from `entries` (flat, `entry_size` each) and the levels above
// them; `keys` holds each entry's key.
Status WriteTree(PageIo& io, uint8_t ptype, size_t entry_size, const Bytes& entries,
                 const std::vector<uint64_t>& keys, Bref* root) {
  struct Child {
    uint64_t key;
    Bref ref;
  };
  std::vector<Child> level_refs;
  auto write_page = [&](const uint8_t* data, size_t count, size_t size, int level,
                        uint64_t first_key) -> Status {
    uint8_t page[kPageSize] = {};
    std::copy(data, data + count * size, page);
    page[kOffCount] = uint8_t(count);
    page[kOffMaxCount] = uint8_t(kEntriesSize / size);
    page[kOffEntrySize] = uint8_t(size);
    page[kOffLevel] = uint8_t(level);
    Bref ref;
    Status s = io.AllocatePage(&ref.ib, &ref.bid);
    if (!s.ok()) return s;
    SealPage(page, ptype, ref.bid, ref.ib);
    s = io.WriteAt(ref.ib, ByteView(page, kPageSize));
    if (!s.ok()) return s;
    level_refs.push_back({first_key, ref});
    return Status::Ok();
  };

  size_t n = keys.size();
  size_t per_leaf = kEntriesSize / entry_size;
  if (n == 0) {
    Status s = write_page(nullptr, 0, entry_size, 0, 0);
    if (!s.ok()) return s;
  }
  for (size_t at = 0; at < n; at += per_leaf) {
    size_t count = std::min(per_leaf, n - at);
    Status s = write_page(entries.data() + at * entry_size, count, entry_size, 0, keys[at]);
    if (!s.ok()) return s;
  }
  int level = 0;
  size_t per_branch = kEntriesSize / kBtEntrySize;
  while (level_refs.size() > 1) {
    ++level;
    if (level > kMaxTreeLevel) return Status::InvalidArgument("PST: B-tree too large");
    std::vector<Child> below = std::move(level_refs);
    level_refs.clear();
    for (size_t at = 0; at < below.size(); at += per_branch) {
      size_t count = std::min(per_branch, below.size() - at);
      uint8_t buf[kEntriesSize] = {};
      for (size_t i = 0; i < count; ++i) {
        uint8_t* e = buf + i * kBtEntrySize;
        StoreU64LE(e, below[at + i].key);
        StoreU64LE(e + 8, below[at + i].ref.bid);
        StoreU64LE(e + 16, below[at + i].ref.ib);
      }
      Status s = write_page(buf, count, kBtEntrySize, level, below[at].key);
      if (!s.ok()) return s;
    }
  }
  *root = level_refs[0].ref;
  return Status::Ok();
}

}  // namespace

void SealPage(uint8_t* page, uint8_t ptype, uint64_t bid, uint64_t ib) {
  page[kOffType] = ptype;
  page[kOffTypeRepeat] = ptype;
  StoreU16LE(page + kOffSig, IsMapPage(ptype) ? 0 : ComputeSignature(ib, bid));
  StoreU32LE(page + kOffCrc, ComputeCrc(0, ByteView(page, kPageDataSize)));
  StoreU64LE(page + kOffBid, bid);
}

Status CheckPage(ByteView page, uint8_t ptype, uint64_t bid, uint64_t ib) {
  if (page.size() != kPageSize) return Status::Corruption("PST: short page");
  if (page[kOffType] != ptype || page[kOffTypeRepeat] != ptype) {
    return Status::Corruption("PST: page at " + Hex(ib) + " has the wrong type");
  }
  // Page ids count up by one, so unlike block ids every bit matters.
  uint64_t stored_bid = page.U64LE(kOffBid);
  if (stored_bid != bid) {
    return Status::Corruption("PST: page at " + Hex(ib) + " has the wrong id");
  }
  uint16_t sig = IsMapPage(ptype) ? 0 : ComputeSignature(ib, stored_bid);
  if (page.U16LE(kOffSig) != sig) {
    return Status::Corruption("PST: page at " + Hex(ib) + " has a bad signature");
  }
  if (page.U32LE(kOffCrc) != ComputeCrc(0, page.Sub(0, kPageDataSize))) {
    return Status::Corruption("PST: page at " + Hex(ib) + " fails its CRC");
  }
  return Status::Ok();
}

Status ReadNbt(const PageIo& io, const Bref& root, std::vector<NbtEntry>* out) {
  out->clear();
  TreeReader reader(io, kPageTypeNbt, kNbtEntrySize);
  return reader.Walk(root, -1, [out](ByteView e) {
    out->push_back({Nid(e.U64LE(0)), e.U64LE(8), e.U64LE(16), e.U32LE(24)});
  });
}

Status ReadBbt(const PageIo& io, const Bref& root, std::vector<BbtEntry>* out) {
  out->clear();
  TreeReader reader(io, kPageTypeBbt, kBbtEntrySize);
  return reader.Walk(root, -1, [out](ByteView e) {
    out->push_back({e.U64LE(0), e.U64LE(8), e.U16LE(16), e.U16LE(18)});
  });
}

Status WriteNbt(PageIo& io, const std::vector<NbtEntry>& entries, Bref* root) {
  Bytes flat(entries.size() * kNbtEntrySize, 0);
  std::vector<uint64_t> keys(entries.size());
  for (size_t i = 0; i < entries.size(); ++i) {
    uint8_t* e = flat.data() + i * kNbtEntrySize;
    StoreU64LE(e, entries[i].nid);
    StoreU64LE(e + 8, entries[i].bid_data);
    StoreU64LE(e + 16, entries[i].bid_sub);
    StoreU32LE(e + 24, entries[i].parent);
    keys[i] = entries[i].nid;
  }
  return WriteTree(io, kPageTypeNbt, kNbtEntrySize, flat, keys, root);
}

Status WriteBbt(PageIo& io, const std::vector<BbtEntry>& entries, Bref* root) {
  Bytes flat(entries.size() * kBbtEntrySize, 0);
  std::vector<uint64_t> keys(entries.size());
  for (size_t i = 0; i < entries.size(); ++i) {
    uint8_t* e = flat.data() + i * kBbtEntrySize;
    StoreU64LE(e, entries[i].bid);
    StoreU64LE(e + 8, entries[i].ib);
    StoreU16LE(e + 16, entries[i].cb);
    StoreU16LE(e + 18, entries[i].cref);
    keys[i] = entries[i].bid;
  }
  return WriteTree(io, kPageTypeBbt, kBbtEntrySize, flat, keys, root);
}

}  // namespace tarnwell::mapi::pst
