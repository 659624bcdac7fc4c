// Unicode HEADER (564 bytes at file offset 0):
//
//   offset width  meaning
//   0      4      dwMagic "!BDN"
//   4      4      dwCRCPartial: CRC of the 471 bytes from offset 8
//   8      2      wMagicClient "SM"
//   10     2      wVer (23 Unicode; 14/15 ANSI; 36 Unicode with 4 KiB pages)
//   12     2      wVerClient (19)
//   14     1      bPlatformCreate (1)
//   15     1      bPlatformAccess (1)
//   16     4      dwReserved1
//   20     4      dwReserved2
//   24     8      bidUnused
//   32     8      bidNextP: next page id
//   40     4      dwUnique: changes on every header write
//   44     128    rgnid[32]: next nid index per nid type
//   172    8      qwUnused
//   180    72     ROOT (below)
//   252    4      dwAlign
//   256    128    rgbFM: free map of the first 128 AMaps
//   384    128    rgbFP: free page map of the first 128 PMaps
//   512    1      bSentinel 0x80
//   513    1      bCryptMethod (0 none, 1 permute, 2 cyclic)
//   514    2      rgbReserved
//   516    8      bidNextB: next block id
//   524    4      dwCRCFull: CRC of the 516 bytes from offset 8
//   528    3      rgbReserved2
//   531    1      bReserved
//   532    32     rgbReserved3
//
// ROOT (72 bytes, at header offset 180):
//
//   0      4      dwReserved
//   4      8      ibFileEof: file size
//   12     8      ibAMapLast: offset of the last AMap page
//   20     8      cbAMapFree: free bytes in all AMaps
//   28     8      cbPMapFree: free bytes in all PMaps
//   36     16     BREFNBT: bid, ib of the node B-tree root page
//   52     16     BREFBBT: bid, ib of the block B-tree root page
//   68     1      fAMapValid (0 invalid, 1 and 2 valid)
//   69     1      bReserved
//   70     2      wReserved
#include "mapi/pst/pst_header.h"

#include <string>

#include "mapi/pst/node.h"
#include "mapi/pst/pst_crc.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr uint32_t kMagic = 0x4E444221;    // "!BDN"
constexpr uint16_t kMagicClient = 0x4D53;  // "SM"
constexpr uint8_t kSentinel = 0x80;
constexpr uint16_t kVersionAnsiOld = 14;
constexpr uint16_t kVersionAnsi = 15;
constexpr uint16_t kVersionUnicode4k = 36;

constexpr size_t kCrcStart = 8;
constexpr size_t kPartialCrcLength = 471;
constexpr size_t kFullCrcLength = 516;
constexpr size_t kOffPartialCrc = 4;
constexpr size_t kOffMagicClient = 8;
constexpr size_t kOffVersion = 10;
constexpr size_t kOffClientVersion = 12;
constexpr size_t kOffPlatformCreate = 14;
constexpr size_t kOffPlatformAccess = 15;
constexpr size_t kOffReserved1 = 16;
constexpr size_t kOffReserved2 = 20;
constexpr size_t kOffBidUnused = 24;
constexpr size_t kOffBidNextPage = 32;
constexpr size_t kOffUnique = 40;
constexpr size_t kOffNids = 44;
constexpr size_t kOffUnused = 172;
constexpr size_t kOffRoot = 180;
constexpr size_t kOffAlign = 252;
constexpr size_t kOffFreeMap = 256;
constexpr size_t kOffFreePageMap = 384;
constexpr size_t kOffSentinel = 512;
constexpr size_t kOffCrypt = 513;
constexpr size_t kOffReserved3 = 514;
constexpr size_t kOffBidNextBlock = 516;
constexpr size_t kOffFullCrc = 524;
constexpr size_t kOffReserved4 = 528;
constexpr size_t kOffReserved5 = 531;
constexpr size_t kOffReserved6 = 532;

// Offsets inside ROOT.
constexpr size_t kRootReserved = 0;
constexpr size_t kRootFileEof = 4;
constexpr size_t kRootAMapLast = 12;
constexpr size_t kRootAMapFree = 20;
constexpr size_t kRootPMapFree = 28;
constexpr size_t kRootNbt = 36;
constexpr size_t kRootBbt = 52;
constexpr size_t kRootAMapValid = 68;
constexpr size_t kRootReservedByte = 69;
constexpr size_t kRootReservedWord = 70;

constexpr uint32_t kDefaultNidIndex = 0x400;
constexpr uint32_t kSearchFolderNidIndex = 0x4000;
constexpr uint32_t kNormalMessageNidIndex = 0x10000;
constexpr uint32_t kAssocMessageNidIndex = 0x8000;

}  // namespace

std::array<uint32_t, kNidCounterCount> InitialNidCounters() {
  std::array<uint32_t, kNidCounterCount> n;
  n.fill(kDefaultNidIndex);
  n[kNidTypeSearchFolder] = kSearchFolderNidIndex;
  n[kNidTypeNormalMessage] = kNormalMessageNidIndex;
  n[kNidTypeAssocMessage] = kAssocMessageNidIndex;
  return n;
}

Status DecodeHeader(ByteView b, PstHeader* out) {
  if (b.size() < kHeaderSize) return Status::Corruption("PST header: file too short");
  const uint8_t* p = b.data();
  if (LoadU32LE(p) != kMagic) return Status::Corruption("PST header: not a PST file (bad magic)");
  uint16_t version = LoadU16LE(p + kOffVersion);
  if (version == kVersionAnsiOld || version == kVersionAnsi) {
    return Status::NotSupported("PST file is in the old ANSI format (version " +
                                std::to_string(version) +
                                "); only Unicode PST files are supported");
  }
  if (version == kVersionUnicode4k) {
    return Status::NotSupported(
        "PST/OST file uses 4 KiB pages (version 36); only Unicode PST files are supported");
  }
  if (version != kVersionUnicode && version != kVersionUnicodeAlt) {
    return Status::NotSupported("PST file has unknown format version " + std::to_string(version));
  }
  if (p[kOffSentinel] != kSentinel) return Status::Corruption("PST header: bad sentinel byte");
  uint32_t partial = ComputeCrc(0, b.Sub(kCrcStart, kPartialCrcLength));
  uint32_t full = ComputeCrc(0, b.Sub(kCrcStart, kFullCrcLength));
  if (partial != LoadU32LE(p + kOffPartialCrc) || full != LoadU32LE(p + kOffFullCrc)) {
    return Status::Corruption("PST header: CRC mismatch");
  }
  PstHeader h;
  h.version = version;
  h.client_version = LoadU16LE(p + kOffClientVersion);
  h.platform_create = p[kOffPlatformCreate];
  h.platform_access = p[kOffPlatformAccess];
  h.reserved1 = LoadU32LE(p + kOffReserved1);
  h.reserved2 = LoadU32LE(p + kOffReserved2);
  h.bid_unused = LoadU64LE(p + kOffBidUnused);
  h.bid_next_page = LoadU64LE(p + kOffBidNextPage);
  h.unique = LoadU32LE(p + kOffUnique);
  for (int i = 0; i < kNidCounterCount; ++i) h.nid_counters[i] = LoadU32LE(p + kOffNids + 4 * i);
  h.unused = LoadU64LE(p + kOffUnused);
  const uint8_t* r = p + kOffRoot;
  h.root.reserved = LoadU32LE(r + kRootReserved);
  h.root.file_eof = LoadU64LE(r + kRootFileEof);
  h.root.amap_last = LoadU64LE(r + kRootAMapLast);
  h.root.amap_free = LoadU64LE(r + kRootAMapFree);
  h.root.pmap_free = LoadU64LE(r + kRootPMapFree);
  h.root.nbt = {LoadU64LE(r + kRootNbt), LoadU64LE(r + kRootNbt + 8)};
  h.root.bbt = {LoadU64LE(r + kRootBbt), LoadU64LE(r + kRootBbt + 8)};
  h.root.amap_valid = r[kRootAMapValid];
  h.root.reserved_byte = r[kRootReservedByte];
  h.root.reserved_word = LoadU16LE(r + kRootReservedWord);
  h.align = LoadU32LE(p + kOffAlign);
  std::copy(p + kOffFreeMap, p + kOffFreeMap + kFreeMapSize, h.free_map.begin());
  std::copy(p + kOffFreePageMap, p + kOffFreePageMap + kFreeMapSize, h.free_page_map.begin());
  h.crypt_method = p[kOffCrypt];
  h.reserved3 = LoadU16LE(p + kOffReserved3);
  h.bid_next_block = LoadU64LE(p + kOffBidNextBlock);
  std::copy(p + kOffReserved4, p + kOffReserved4 + 3, h.reserved4.begin());
  h.reserved5 = p[kOffReserved5];
  std::copy(p + kOffReserved6, p + kOffReserved6 + 32, h.reserved6.begin());
  *out = h;
  return Status::Ok();
}

Bytes EncodeHeader(const PstHeader& h) {
  Bytes out(kHeaderSize, 0);
  uint8_t* p = out.data();
  StoreU32LE(p, kMagic);
  StoreU16LE(p + kOffMagicClient, kMagicClient);
  StoreU16LE(p + kOffVersion, h.version);
  StoreU16LE(p + kOffClientVersion, h.client_version);
  p[kOffPlatformCreate] = h.platform_create;
  p[kOffPlatformAccess] = h.platform_access;
  StoreU32LE(p + kOffReserved1, h.reserved1);
  StoreU32LE(p + kOffReserved2, h.reserved2);
  StoreU64LE(p + kOffBidUnused, h.bid_unused);
  StoreU64LE(p + kOffBidNextPage, h.bid_next_page);
  StoreU32LE(p + kOffUnique, h.unique);
  for (int i = 0; i < kNidCounterCount; ++i) StoreU32LE(p + kOffNids + 4 * i, h.nid_counters[i]);
  StoreU64LE(p + kOffUnused, h.unused);
  uint8_t* r = p + kOffRoot;
  StoreU32LE(r + kRootReserved, h.root.reserved);
  StoreU64LE(r + kRootFileEof, h.root.file_eof);
  StoreU64LE(r + kRootAMapLast, h.root.amap_last);
  StoreU64LE(r + kRootAMapFree, h.root.amap_free);
  StoreU64LE(r + kRootPMapFree, h.root.pmap_free);
  StoreU64LE(r + kRootNbt, h.root.nbt.bid);
  StoreU64LE(r + kRootNbt + 8, h.root.nbt.ib);
  StoreU64LE(r + kRootBbt, h.root.bbt.bid);
  StoreU64LE(r + kRootBbt + 8, h.root.bbt.ib);
  r[kRootAMapValid] = h.root.amap_valid;
  r[kRootReservedByte] = h.root.reserved_byte;
  StoreU16LE(r + kRootReservedWord, h.root.reserved_word);
  StoreU32LE(p + kOffAlign, h.align);
  std::copy(h.free_map.begin(), h.free_map.end(), p + kOffFreeMap);
  std::copy(h.free_page_map.begin(), h.free_page_map.end(), p + kOffFreePageMap);
  p[kOffSentinel] = kSentinel;
  p[kOffCrypt] = h.crypt_method;
  StoreU16LE(p + kOffReserved3, h.reserved3);
  StoreU64LE(p + kOffBidNextBlock, h.bid_next_block);
  std::copy(h.reserved4.begin(), h.reserved4.end(), p + kOffReserved4);
  p[kOffReserved5] = h.reserved5;
  std::copy(h.reserved6.begin(), h.reserved6.end(), p + kOffReserved6);
  StoreU32LE(p + kOffPartialCrc, ComputeCrc(0, ByteView(p + kCrcStart, kPartialCrcLength)));
  StoreU32LE(p + kOffFullCrc, ComputeCrc(0, ByteView(p + kCrcStart, kFullCrcLength)));
  return out;
}

}  // namespace tarnwell::mapi::pst
