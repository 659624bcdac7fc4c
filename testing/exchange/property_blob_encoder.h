// Writes "PropertyBlob" values: the one column in which modern mailbox
// stores keep most properties of an item.
//
// Layout (little-endian):
//
//   offset  width      meaning
//   0       4          magic "ProP"
//   4       2          0
//   6       2          entry count
//   8       8 x count  entries, in the order they were added
//   ...                values of the entries that are not inline
//
//   entry:  0  2  kind
//           2  2  property id
//           4  4  value offset from the blob's start; kinds B and L hold
//                 the value itself here
//
//   kind    letter  value at the offset
//   0x0808  B       (inline, 0 or 1)
//   0x1818  L       (inline)
//   0x3838  T       'M', 8, FILETIME (u64)
//   0x4848  S       'M', length, UTF-8 bytes; 'H', 0 for "no value"
//   0x5050  N       'M', length, bytes
//   0xC8C8  MS      0xC9, item count, then per item: 'M', length, UTF-8 bytes
//
// Lengths are one byte, so a string or binary value holds at most 255 bytes.
#ifndef TARNWELL_TESTING_EXCHANGE_PROPERTY_BLOB_ENCODER_H_
#define TARNWELL_TESTING_EXCHANGE_PROPERTY_BLOB_ENCODER_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::forge::exchange {

constexpr uint16_t kBlobKindBool = 0x0808;
constexpr uint16_t kBlobKindLong = 0x1818;
constexpr uint16_t kBlobKindTime = 0x3838;
constexpr uint16_t kBlobKindString = 0x4848;
constexpr uint16_t kBlobKindBinary = 0x5050;
constexpr uint16_t kBlobKindMultiString = 0xC8C8;
constexpr size_t kBlobMaxValueBytes = 255;

class PropertyBlobEncoder {
 public:
  void AddBool(uint16_t id, bool value);
  void AddLong(uint16_t id, uint32_t value);
  void AddTime(uint16_t id, uint64_t filetime);
  // False (nothing added) when the value is longer than a length byte says.
  bool AddString(uint16_t id, const std::string& utf8);
  bool AddBinary(uint16_t id, ByteView bytes);
  bool AddMultiString(uint16_t id, const std::vector<std::string>& items);
  // A string entry that says "no value"; readers stop at it.
  void AddNoValue(uint16_t id);

  // Adds a value under the name a column of its own would have: letters,
  // then the id in hex ("S3a06", "T814e", "L805c", "B8124"). False when the
  // letter has no blob kind or the value does not fit.
  bool AddNamedString(const std::string& name, const std::string& utf8);
  bool AddNamedNumber(const std::string& name, int64_t value);
  bool AddNamedTime(const std::string& name, uint64_t filetime);

  size_t entries() const { return entries_.size(); }
  Bytes Finish() const;

 private:
  struct Entry {
    uint16_t kind;
    uint16_t id;
    uint32_t inline_value;
    Bytes value;  // marker, length, data (not for inline kinds)
  };
  void Add(uint16_t kind, uint16_t id, uint32_t inline_value, Bytes value);

  std::vector<Entry> entries_;
};

// "S3a06" -> letters "S", id 0x3a06. False when the name has no hex id.
bool SplitPropertyName(const std::string& name, std::string* letters, uint16_t* id);

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_PROPERTY_BLOB_ENCODER_H_
