// Subnode blocks (internal, never encoded):
//
//   offset width  meaning
//   0      1      btype = 0x02
//   1      1      cLevel: 0 SLBLOCK, 1 SIBLOCK
//   2      2      cEnt
//   4      4      dwPadding
//   8      ...    entries, sorted by nid
//
// SLENTRY (24 bytes): nid(8, low 32 bits used), bidData(8), bidSub(8).
// SIENTRY (16 bytes): nid(8) lowest nid below, bid(8) of an SLBLOCK.
#include "mapi/pst/subnode_tree.h"

#include <algorithm>
#include <string>

namespace tarnwell::mapi::pst {
namespace {

constexpr uint8_t kBlockTypeSubnode = 0x02;
constexpr uint8_t kLevelSl = 0;
constexpr uint8_t kLevelSi = 1;
constexpr size_t kHeaderSize = 8;
constexpr size_t kOffType = 0;
constexpr size_t kOffLevel = 1;
constexpr size_t kOffCount = 2;
constexpr size_t kSlEntrySize = 24;
constexpr size_t kSiEntrySize = 16;

struct SlEntry {
  Nid nid;
  uint64_t bid_data;
  uint64_t bid_sub;
};

Status ReadSubnodeBlock(const BlockStore& store, uint64_t bid, uint8_t level, ReadBudget* budget,
                        Bytes* raw, size_t* count) {
  if (!IsInternalBid(bid)) return Status::Corruption("PST: subnode tree refers to a data block");
  Status s = ReadBlock(store, bid, budget, raw);
  if (!s.ok()) return s;
  ByteView v(*raw);
  size_t entry = level == kLevelSl ? kSlEntrySize : kSiEntrySize;
  if (v.size() < kHeaderSize || v[kOffType] != kBlockTypeSubnode || v[kOffLevel] != level) {
    return Status::Corruption("PST: bad subnode block");
  }
  *count = v.U16LE(kOffCount);
  if (kHeaderSize + *count * entry > v.size()) {
    return Status::Corruption("PST: subnode block entry count too large");
  }
  return Status::Ok();
}

// The SLENTRYs of the tree at `bid` (an SLBLOCK or SIBLOCK).
Status ReadSlEntries(const BlockStore& store, uint64_t bid, ReadBudget* budget,
                     std::vector<SlEntry>* out) {
  if (!IsInternalBid(bid)) return Status::Corruption("PST: subnode tree refers to a data block");
  Bytes raw;
  Status s = ReadBlock(store, bid, budget, &raw);
  if (!s.ok()) return s;
  if (raw.size() < kHeaderSize || raw[kOffType] != kBlockTypeSubnode) {
    return Status::Corruption("PST: bad subnode block");
  }
  std::vector<uint64_t> sl_bids;
  if (raw[kOffLevel] == kLevelSi) {
    size_t count = LoadU16LE(&raw[kOffCount]);
    if (kHeaderSize + count * kSiEntrySize > raw.size()) {
      return Status::Corruption("PST: subnode block entry count too large");
    }
    for (size_t i = 0; i < count; ++i) {
      sl_bids.push_back(LoadU64LE(&raw[kHeaderSize + i * kSiEntrySize + 8]));
    }
  } else if (raw[kOffLevel] != kLevelSl) {
    return Status::Corruption("PST: subnode block has a bad level");
  }
  auto take_sl = [&](const Bytes& b, size_t count) {
    for (size_t i = 0; i < count; ++i) {
      const uint8_t* e = &b[kHeaderSize + i * kSlEntrySize];
      out->push_back({Nid(LoadU64LE(e)), LoadU64LE(e + 8), LoadU64LE(e + 16)});
    }
  };
  if (sl_bids.empty() && raw[kOffLevel] == kLevelSl) {
    size_t count = LoadU16LE(&raw[kOffCount]);
    if (kHeaderSize + count * kSlEntrySize > raw.size()) {
      return Status::Corruption("PST: subnode block entry count too large");
    }
    take_sl(raw, count);
    return Status::Ok();
  }
  for (uint64_t sl : sl_bids) {
    Bytes b;
    size_t count = 0;
    s = ReadSubnodeBlock(store, sl, kLevelSl, budget, &b, &count);
    if (!s.ok()) return s;
    take_sl(b, count);
  }
  return Status::Ok();
}

Status PutInternal(BlockStore& store, const Bytes& data, uint64_t* bid) {
  *bid = store.NewBid(true);
  return store.AppendBlock(*bid, data);
}

Status ReadContent(const BlockStore& store, uint64_t bid_data, uint64_t bid_sub, int depth,
                   ReadBudget* budget, NodeContent* out) {
  Status s = ReadStream(store, bid_data, budget, &out->blocks);
  if (!s.ok()) return s;
  out->subnodes.clear();
  if (bid_sub == 0) return Status::Ok();
  if (depth >= kMaxSubnodeDepth) return Status::Corruption("PST: subnodes nest too deeply");
  std::vector<SlEntry> entries;
  s = ReadSlEntries(store, bid_sub, budget, &entries);
  if (!s.ok()) return s;
  for (const SlEntry& e : entries) {
    NodeContent child;
    s = ReadContent(store, e.bid_data, e.bid_sub, depth + 1, budget, &child);
    if (!s.ok()) return s;
    if (!out->subnodes.emplace(e.nid, std::move(child)).second) {
      return Status::Corruption("PST: subnode id listed twice");
    }
  }
  return Status::Ok();
}

Status WriteContent(BlockStore& store, const NodeContent& content, int depth, uint64_t* bid_data,
                    uint64_t* bid_sub) {
  *bid_sub = 0;
  Status s = WriteStream(store, content.blocks, bid_data);
  if (!s.ok() || content.subnodes.empty()) return s;
  if (depth >= kMaxSubnodeDepth) return Status::InvalidArgument("PST: subnodes nest too deeply");
  if (content.subnodes.size() > kMaxSlEntries * kMaxSiEntries) {
    return Status::InvalidArgument("PST: too many subnodes");
  }
  std::vector<SlEntry> entries;
  entries.reserve(content.subnodes.size());
  for (const auto& [nid, child] : content.subnodes) {
    SlEntry e{nid, 0, 0};
    s = WriteContent(store, child, depth + 1, &e.bid_data, &e.bid_sub);
    if (!s.ok()) return s;
    entries.push_back(e);
  }
  std::vector<std::pair<Nid, uint64_t>> sl_blocks;
  for (size_t at = 0; at < entries.size(); at += kMaxSlEntries) {
    size_t count = std::min(kMaxSlEntries, entries.size() - at);
    Bytes b(kHeaderSize + count * kSlEntrySize, 0);
    b[kOffType] = kBlockTypeSubnode;
    b[kOffLevel] = kLevelSl;
    StoreU16LE(&b[kOffCount], uint16_t(count));
    for (size_t i = 0; i < count; ++i) {
      uint8_t* e = &b[kHeaderSize + i * kSlEntrySize];
      StoreU64LE(e, entries[at + i].nid);
      StoreU64LE(e + 8, entries[at + i].bid_data);
      StoreU64LE(e + 16, entries[at + i].bid_sub);
    }
    uint64_t bid;
    s = PutInternal(store, b, &bid);
    if (!s.ok()) return s;
    sl_blocks.emplace_back(entries[at].nid, bid);
  }
  if (sl_blocks.size() == 1) {
    *bid_sub = sl_blocks[0].second;
    return Status::Ok();
  }
  Bytes b(kHeaderSize + sl_blocks.size() * kSiEntrySize, 0);
  b[kOffType] = kBlockTypeSubnode;
  b[kOffLevel] = kLevelSi;
  StoreU16LE(&b[kOffCount], uint16_t(sl_blocks.size()));
  for (size_t i = 0; i < sl_blocks.size(); ++i) {
    StoreU64LE(&b[kHeaderSize + i * kSiEntrySize], sl_blocks[i].first);
    StoreU64LE(&b[kHeaderSize + i * kSiEntrySize + 8], sl_blocks[i].second);
  }
  return PutInternal(store, b, bid_sub);
}

Status CollectBids(const BlockStore& store, uint64_t bid_data, uint64_t bid_sub, int depth,
                   ReadBudget* budget, std::vector<uint64_t>* bids) {
  Status s = CollectStreamBids(store, bid_data, budget, bids);
  if (!s.ok() || bid_sub == 0) return s;
  if (depth >= kMaxSubnodeDepth) return Status::Corruption("PST: subnodes nest too deeply");
  bids->push_back(bid_sub);
  Bytes raw;
  s = ReadBlock(store, bid_sub, budget, &raw);
  if (!s.ok()) return s;
  if (raw.size() >= kHeaderSize && raw[kOffLevel] == kLevelSi) {
    size_t count = LoadU16LE(&raw[kOffCount]);
    for (size_t i = 0; i < count && kHeaderSize + (i + 1) * kSiEntrySize <= raw.size(); ++i) {
      bids->push_back(LoadU64LE(&raw[kHeaderSize + i * kSiEntrySize + 8]));
    }
  }
  std::vector<SlEntry> entries;
  s = ReadSlEntries(store, bid_sub, budget, &entries);
  if (!s.ok()) return s;
  for (const SlEntry& e : entries) {
    s = CollectBids(store, e.bid_data, e.bid_sub, depth + 1, budget, bids);
    if (!s.ok()) return s;
  }
  return Status::Ok();
}

}  // namespace

Status ReadNodeContent(const BlockStore& store, uint64_t bid_data, uint64_t bid_sub,
                       ReadBudget* budget, NodeContent* out) {
  *out = NodeContent();
  return ReadContent(store, bid_data, bid_sub, 0, budget, out);
}

Status WriteNodeContent(BlockStore& store, const NodeContent& content, uint64_t* bid_data,
                        uint64_t* bid_sub) {
  return WriteContent(store, content, 0, bid_data, bid_sub);
}

Status CollectNodeBids(const BlockStore& store, uint64_t bid_data, uint64_t bid_sub,
                       ReadBudget* budget, std::vector<uint64_t>* bids) {
  return CollectBids(store, bid_data, bid_sub, 0, budget, bids);
}

}  // namespace tarnwell::mapi::pst
