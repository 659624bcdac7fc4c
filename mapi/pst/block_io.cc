// Block layouts (Unicode). A block is its data, zero padding up to a multiple
// of 64 bytes less 16, and this trailer:
//
//   offset width  meaning
//   0      2      cb: data bytes
//   2      2      wSig: ComputeSignature(ib, bid)
//   4      4      dwCRC: CRC of the cb data bytes as stored
//   8      8      bid
//
// XBLOCK / XXBLOCK data (internal, never encoded):
//
//   0      1      btype = 0x01
//   1      1      cLevel: 1 XBLOCK (lists data blocks), 2 XXBLOCK (lists XBLOCKs)
//   2      2      cEnt
//   4      4      lcbTotal: bytes of the whole stream below this block
//   8      8*cEnt rgbid
#include "mapi/pst/block_io.h"

#include <algorithm>
#include <string>

#include "mapi/pst/node.h"
#include "mapi/pst/pst_crc.h"
#include "mapi/pst/pst_crypt.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr size_t kTrailerCb = 0;
constexpr size_t kTrailerSig = 2;
constexpr size_t kTrailerCrc = 4;
constexpr size_t kTrailerBid = 8;

constexpr uint8_t kBlockTypeData = 0x01;
constexpr uint8_t kXBlockLevel = 1;
constexpr uint8_t kXXBlockLevel = 2;
constexpr uint8_t kAnyXLevel = 0;  // ReadXBlock: the top of a stream may be either
constexpr size_t kXHeaderSize = 8;
constexpr size_t kXOffType = 0;
constexpr size_t kXOffLevel = 1;
constexpr size_t kXOffCount = 2;
constexpr size_t kXOffTotal = 4;
constexpr size_t kBidSize = 8;

std::string Hex(uint64_t v) {
  char buf[24];
  snprintf(buf, sizeof buf, "0x%llx", static_cast<unsigned long long>(v));
  return buf;
}

struct XBlock {
  uint8_t level = 0;
  uint32_t total = 0;
  std::vector<uint64_t> bids;
};

Status DecodeXBlock(ByteView b, uint64_t bid, XBlock* out) {
  if (b.size() < kXHeaderSize || b[kXOffType] != kBlockTypeData) {
    return Status::Corruption("PST: block " + Hex(bid) + " is not a data tree block");
  }
  out->level = b[kXOffLevel];
  if (out->level != kXBlockLevel && out->level != kXXBlockLevel) {
    return Status::Corruption("PST: data tree block " + Hex(bid) + " has bad level");
  }
  uint16_t count = b.U16LE(kXOffCount);
  out->total = b.U32LE(kXOffTotal);
  if (count == 0 || kXHeaderSize + size_t(count) * kBidSize > b.size()) {
    return Status::Corruption("PST: data tree block " + Hex(bid) + " has a bad entry count");
  }
  out->bids.resize(count);
  for (size_t i = 0; i < count; ++i) out->bids[i] = b.U64LE(kXHeaderSize + i * kBidSize);
  return Status::Ok();
}

Bytes EncodeXBlock(uint8_t level, uint32_t total, const std::vector<uint64_t>& bids) {
  Bytes b(kXHeaderSize + bids.size() * kBidSize);
  b[kXOffType] = kBlockTypeData;
  b[kXOffLevel] = level;
  StoreU16LE(&b[kXOffCount], uint16_t(bids.size()));
  StoreU32LE(&b[kXOffTotal], total);
  for (size_t i = 0; i < bids.size(); ++i) StoreU64LE(&b[kXHeaderSize + i * kBidSize], bids[i]);
  return b;
}

Status PutBlock(BlockStore& store, ByteView data, bool internal, uint64_t* bid) {
  *bid = store.NewBid(internal);
  Bytes stored = data.ToBytes();
  if (!internal) EncodeBlockData(store.crypt_method(), *bid, stored.data(), stored.size());
  return store.AppendBlock(*bid, stored);
}

Status LoadXBlock(const BlockStore& store, uint64_t bid, ReadBudget* budget, XBlock* x) {
  Bytes raw;
  Status s = ReadBlock(store, bid, budget, &raw);
  if (!s.ok()) return s;
  return DecodeXBlock(raw, bid, x);
}

// Reads the XBLOCK/XXBLOCK at `bid` with the expected level (or either, for
// the top of a stream) whose size the rest of the file can hold.
Status ReadXBlock(const BlockStore& store, uint64_t bid, uint8_t level, ReadBudget* budget,
                  XBlock* x) {
  Status s = LoadXBlock(store, bid, budget, x);
  if (!s.ok()) return s;
  if (level != kAnyXLevel && x->level != level)
    return Status::Corruption("PST: data tree block " + Hex(bid) + " nested wrongly");
  if (x->total > budget->bytes) {
    return Status::Corruption("PST: data tree " + Hex(bid) +
                              " claims more bytes than the file holds");
  }
  return Status::Ok();
}

Status ReadXChildren(const BlockStore& store, const XBlock& x, uint64_t bid, ReadBudget* budget,
                     std::vector<Bytes>* blocks) {
  uint64_t sum = 0;
  for (uint64_t child : x.bids) {
    if (x.level == kXBlockLevel) {
      if (IsInternalBid(child)) return Status::Corruption("PST: XBLOCK lists an internal block");
      Bytes data;
      Status s = ReadBlock(store, child, budget, &data);
      if (!s.ok()) return s;
      sum += data.size();
      if (budget->bytes < data.size()) return Status::Corruption("PST: data tree too large");
      budget->bytes -= data.size();
      blocks->push_back(std::move(data));
    } else {
      if (!IsInternalBid(child)) return Status::Corruption("PST: XXBLOCK lists a data block");
      XBlock sub;
      Status s = ReadXBlock(store, child, kXBlockLevel, budget, &sub);
      if (!s.ok()) return s;
      size_t before = blocks->size();
      s = ReadXChildren(store, sub, child, budget, blocks);
      if (!s.ok()) return s;
      for (size_t i = before; i < blocks->size(); ++i) sum += (*blocks)[i].size();
    }
    if (sum > x.total) break;
  }
  if (sum != x.total) {
    return Status::Corruption("PST: data tree " + Hex(bid) + " size does not match its blocks");
  }
  return Status::Ok();
}

}  // namespace

uint16_t ComputeSignature(uint64_t ib, uint64_t bid) {
  uint64_t v = ib ^ bid;
  return uint16_t(uint16_t(v >> 16) ^ uint16_t(v));
}

Bytes EncodeBlock(ByteView data, uint64_t bid, uint64_t ib) {
  size_t disk = BlockDiskSize(data.size());
  Bytes out(disk, 0);
  std::copy(data.data(), data.data() + data.size(), out.begin());
  uint8_t* t = out.data() + disk - kBlockTrailerSize;
  StoreU16LE(t + kTrailerCb, uint16_t(data.size()));
  StoreU16LE(t + kTrailerSig, ComputeSignature(ib, bid));
  StoreU32LE(t + kTrailerCrc, ComputeCrc(0, data));
  StoreU64LE(t + kTrailerBid, bid);
  return out;
}

Status ReadBlock(const BlockStore& store, uint64_t bid, ReadBudget* budget, Bytes* out) {
  if (budget->blocks == 0) return Status::Corruption("PST: block tree refers to too many blocks");
  --budget->blocks;
  BlockRef ref;
  Status s = store.FindBlock(bid, &ref);
  if (!s.ok()) return s;
  size_t disk = BlockDiskSize(ref.cb);
  if (ref.cb > kMaxBlockData || ref.ib % kBlockAlignment != 0 || ref.ib > store.file_size() ||
      disk > store.file_size() - ref.ib) {
    return Status::Corruption("PST: block " + Hex(bid) + " lies outside the file");
  }
  Bytes raw(disk);
  s = store.ReadAt(ref.ib, disk, raw.data());
  if (!s.ok()) return s;
  const uint8_t* t = raw.data() + disk - kBlockTrailerSize;
  uint64_t trailer_bid = LoadU64LE(t + kTrailerBid);
  if (LoadU16LE(t + kTrailerCb) != ref.cb ||
      (trailer_bid & ~kBidReservedBit) != (bid & ~kBidReservedBit)) {
    return Status::Corruption("PST: block " + Hex(bid) + " trailer does not match the index");
  }
  if (LoadU16LE(t + kTrailerSig) != ComputeSignature(ref.ib, trailer_bid)) {
    return Status::Corruption("PST: block " + Hex(bid) + " has a bad signature");
  }
  if (LoadU32LE(t + kTrailerCrc) != ComputeCrc(0, ByteView(raw.data(), ref.cb))) {
    return Status::Corruption("PST: block " + Hex(bid) + " fails its CRC");
  }
  raw.resize(ref.cb);
  if (!IsInternalBid(bid))
    DecodeBlockData(store.crypt_method(), trailer_bid, raw.data(), raw.size());
  *out = std::move(raw);
  return Status::Ok();
}

Status ReadStream(const BlockStore& store, uint64_t bid, ReadBudget* budget,
                  std::vector<Bytes>* blocks) {
  blocks->clear();
  if (bid == 0) return Status::Ok();
  if (!IsInternalBid(bid)) {
    Bytes data;
    Status s = ReadBlock(store, bid, budget, &data);
    if (!s.ok()) return s;
    if (budget->bytes < data.size()) return Status::Corruption("PST: stream too large");
    budget->bytes -= data.size();
    if (!data.empty()) blocks->push_back(std::move(data));
    return Status::Ok();
  }
  XBlock x;
  Status s = ReadXBlock(store, bid, kAnyXLevel, budget, &x);
  if (!s.ok()) return s;
  return ReadXChildren(store, x, bid, budget, blocks);
}

Status CollectStreamBids(const BlockStore& store, uint64_t bid, ReadBudget* budget,
                         std::vector<uint64_t>* bids) {
  if (bid == 0) return Status::Ok();
  bids->push_back(bid);
  if (!IsInternalBid(bid)) return Status::Ok();
  XBlock x;
  Status s = LoadXBlock(store, bid, budget, &x);
  if (!s.ok()) return s;
  for (uint64_t child : x.bids) {
    if (x.level == kXXBlockLevel) {
      if (!IsInternalBid(child)) return Status::Corruption("PST: XXBLOCK lists a data block");
      s = CollectStreamBids(store, child, budget, bids);
      if (!s.ok()) return s;
    } else {
      if (IsInternalBid(child)) return Status::Corruption("PST: XBLOCK lists an internal block");
      bids->push_back(child);
    }
  }
  return Status::Ok();
}

Status WriteStream(BlockStore& store, const std::vector<Bytes>& blocks, uint64_t* bid) {
  *bid = 0;
  // Empty pieces carry nothing and a reader could not tell them apart from
  // no piece at all, so they are not stored.
  std::vector<const Bytes*> pieces;
  for (const Bytes& b : blocks) {
    if (!b.empty()) pieces.push_back(&b);
  }
  if (pieces.empty()) return Status::Ok();
  uint64_t total = 0;
  for (const Bytes* b : pieces) {
    if (b->size() > kMaxBlockData) {
      return Status::InvalidArgument("PST: a block holds at most 8176 bytes");
    }
    total += b->size();
  }
  if (pieces.size() > kMaxXBlockEntries * kMaxXBlockEntries || total > UINT32_MAX) {
    return Status::InvalidArgument("PST: node stream too large");
  }
  std::vector<uint64_t> data_bids(pieces.size());
  std::vector<uint32_t> sizes(pieces.size());
  for (size_t i = 0; i < pieces.size(); ++i) {
    Status s = PutBlock(store, *pieces[i], false, &data_bids[i]);
    if (!s.ok()) return s;
    sizes[i] = uint32_t(pieces[i]->size());
  }
  if (pieces.size() == 1) {
    *bid = data_bids[0];
    return Status::Ok();
  }
  std::vector<uint64_t> x_bids;
  for (size_t at = 0; at < data_bids.size(); at += kMaxXBlockEntries) {
    size_t end = std::min(data_bids.size(), at + kMaxXBlockEntries);
    uint32_t group_total = 0;
    for (size_t i = at; i < end; ++i) group_total += sizes[i];
    std::vector<uint64_t> group(data_bids.begin() + at, data_bids.begin() + end);
    uint64_t x_bid;
    Status s = PutBlock(store, EncodeXBlock(kXBlockLevel, group_total, group), true, &x_bid);
    if (!s.ok()) return s;
    x_bids.push_back(x_bid);
  }
  if (x_bids.size() == 1) {
    *bid = x_bids[0];
    return Status::Ok();
  }
  return PutBlock(store, EncodeXBlock(kXXBlockLevel, uint32_t(total), x_bids), true, bid);
}

}  // namespace tarnwell::mapi::pst
