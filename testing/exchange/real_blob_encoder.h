// Writes property blobs as Exchange 2013 and later servers store them, and
// the other compact values of their mailbox tables.
//
// Blob layout (little-endian):
//
//   offset  width      meaning
//   0       4          magic "ProP"
//   4       2          0x0400, or 0x0401 when a near-value area follows
//   6       2          entry count
//   8       4          (0x0401 only) offset of the near-value area
//   8 / 12  3 x count  entries: u8 type (+0x80 multi-valued), u16 property id
//   then               one value per entry, in entry order, encoding byte first
//   then               (0x0401) the near-value area: encoded values back to back
//
// Encodings written: bool 0x08/0x09; int16 0x10/0x11/0x12; int32
// 0x18/0x19/0x1A/0x1B; int64 0x20..0x24 (always the shortest form); double
// 0x30 + 8 or 0x32 for zero; time 0x38 + 8; GUID 0x40 + 16; string 0x48
// empty, 0x4D/0x4E + u8/u16 count of 8-bit characters when every character
// is ASCII, else 0x49/0x4A + u8/u16 byte count of UTF-16LE; binary 0x50
// empty, 0x51/0x52 + u8/u16 count; multi-valued (type | 0x80) + 1 with a u8
// count or + 2 with a u16 count, then each element (strings and binaries
// with their own encoding byte).
//
// Where a value goes:
//   - payload (the value's own bytes) of 2049 bytes or more: a far value,
//     0x7A, u16 slot (1, 2, ... per row), u32 payload size, u16 family
//     (type with its multi-valued bit), u32 encoded length; the encoded
//     value is returned for the row's "SeparatedProperty" + two-digit slot;
//   - encoded in more than kNearValueThreshold bytes: a near value, 0x78,
//     u16 0, u32 offset from the blob's start, u16 family, u32 encoded
//     length, the encoded value in the near-value area;
//   - else inline.
#ifndef TARNWELL_TESTING_EXCHANGE_REAL_BLOB_ENCODER_H_
#define TARNWELL_TESTING_EXCHANGE_REAL_BLOB_ENCODER_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::forge::exchange {

constexpr size_t kNearValueThreshold = 128;
constexpr size_t kFarValuePayload = 2049;

constexpr uint8_t kRealTypeBool = 0x08;
constexpr uint8_t kRealTypeInt16 = 0x10;
constexpr uint8_t kRealTypeInt32 = 0x18;
constexpr uint8_t kRealTypeInt64 = 0x20;
constexpr uint8_t kRealTypeDouble = 0x30;
constexpr uint8_t kRealTypeTime = 0x38;
constexpr uint8_t kRealTypeGuid = 0x40;
constexpr uint8_t kRealTypeString = 0x48;
constexpr uint8_t kRealTypeBinary = 0x50;
constexpr uint8_t kRealMultiValued = 0x80;

struct SeparatedValue {
  uint16_t slot;  // "SeparatedProperty%02u"
  Bytes encoded;  // encoding byte first
};

class RealBlobEncoder {
 public:
  // Far values are numbered from `first_slot` on (rows with two blobs share
  // the slots).
  explicit RealBlobEncoder(uint16_t first_slot = 1) : next_slot_(first_slot) {}

  void AddBool(uint16_t id, bool value);
  void AddInt16(uint16_t id, int16_t value);
  void AddInt32(uint16_t id, int32_t value);
  void AddInt64(uint16_t id, int64_t value);
  void AddDouble(uint16_t id, double value);
  void AddTime(uint16_t id, uint64_t filetime);
  void AddGuid(uint16_t id, ByteView guid);
  // False (nothing added) when a u16 count cannot say the value's size.
  bool AddString(uint16_t id, const std::string& utf8);
  bool AddBinary(uint16_t id, ByteView bytes);
  bool AddMultiString(uint16_t id, const std::vector<std::string>& items);
  bool AddMultiBinary(uint16_t id, const std::vector<Bytes>& items);
  // A deleted property: its entry with the encoding byte 0x00.
  void AddDeleted(uint8_t type, uint16_t id);

  size_t entries() const { return entries_.size(); }
  uint16_t next_slot() const { return next_slot_; }
  // The blob; far values are appended to `separated`.
  Bytes Finish(std::vector<SeparatedValue>* separated);

 private:
  struct Entry {
    uint8_t type;
    uint16_t id;
    Bytes encoded;  // encoding byte first
    size_t payload;
  };
  void Add(uint8_t type, uint16_t id, Bytes encoded, size_t payload);

  std::vector<Entry> entries_;
  uint16_t next_slot_;
};

// Integers back to back in the shortest int64 encoding ("SubobjectsBlob").
Bytes EncodeCompactIntegers(const std::vector<int64_t>& values);

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_REAL_BLOB_ENCODER_H_
