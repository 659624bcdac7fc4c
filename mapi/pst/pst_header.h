// The header at the start of a Unicode PST file and the ROOT inside it: the
// counters for new ids, where the two B-trees start, the end of the file and
// the allocation map summary.
#ifndef TARNWELL_MAPI_PST_PST_HEADER_H_
#define TARNWELL_MAPI_PST_PST_HEADER_H_

#include <array>
#include <cstdint>

#include "base/byte_view.h"
#include "base/status.h"

namespace tarnwell::mapi::pst {

inline constexpr size_t kHeaderSize = 564;
inline constexpr uint16_t kVersionUnicode = 23;
inline constexpr uint16_t kVersionUnicodeAlt = 21;  // seen in repaired Unicode files
inline constexpr int kNidCounterCount = 32;
inline constexpr size_t kFreeMapSize = 128;

// fAMapValid values.
inline constexpr uint8_t kAMapInvalid = 0;
inline constexpr uint8_t kAMapValid1 = 1;
inline constexpr uint8_t kAMapValid2 = 2;

// A reference to a block or page: its id and where it lies.
struct Bref {
  uint64_t bid = 0;
  uint64_t ib = 0;
};

struct PstRoot {
  uint32_t reserved = 0;
  uint64_t file_eof = 0;   // ibFileEof
  uint64_t amap_last = 0;  // ibAMapLast
  uint64_t amap_free = 0;  // cbAMapFree
  uint64_t pmap_free = 0;  // cbPMapFree
  Bref nbt;                // BREFNBT
  Bref bbt;                // BREFBBT
  uint8_t amap_valid = kAMapInvalid;
  uint8_t reserved_byte = 0;
  uint16_t reserved_word = 0;
};

struct PstHeader {
  uint16_t version = kVersionUnicode;  // wVer
  uint16_t client_version = 19;        // wVerClient
  uint8_t platform_create = 1;
  uint8_t platform_access = 1;
  uint32_t reserved1 = 0;
  uint32_t reserved2 = 0;
  uint64_t bid_unused = 0;
  uint64_t bid_next_page = 0;                             // bidNextP
  uint32_t unique = 0;                                    // dwUnique
  std::array<uint32_t, kNidCounterCount> nid_counters{};  // rgnid, as nid indexes
  uint64_t unused = 0;
  PstRoot root;
  uint32_t align = 0;
  std::array<uint8_t, kFreeMapSize> free_map{};       // rgbFM
  std::array<uint8_t, kFreeMapSize> free_page_map{};  // rgbFP
  uint8_t crypt_method = 0;                           // bCryptMethod
  uint16_t reserved3 = 0;
  uint64_t bid_next_block = 0;  // bidNextB
  std::array<uint8_t, 3> reserved4{};
  uint8_t reserved5 = 0;
  std::array<uint8_t, 32> reserved6{};
};

// Decodes the first kHeaderSize bytes of a file. ANSI and 4 KiB-page files
// give NotSupported; a bad magic, sentinel or CRC gives Corruption.
Status DecodeHeader(ByteView bytes, PstHeader* out);
// kHeaderSize bytes with both CRCs filled in.
Bytes EncodeHeader(const PstHeader& header);

// The counters a new file starts with (most types at 0x400; search folders,
// normal and associated messages further up, as Outlook does).
std::array<uint32_t, kNidCounterCount> InitialNidCounters();

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_PST_HEADER_H_
