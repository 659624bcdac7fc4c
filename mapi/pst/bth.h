// BTree-on-heap (BTH): a sorted map of small fixed-size keys to small
// fixed-size records, kept in heap allocations. Property contexts map
// property ids to values with one; table contexts map row ids to row
// numbers.
#ifndef TARNWELL_MAPI_PST_BTH_H_
#define TARNWELL_MAPI_PST_BTH_H_

#include <cstdint>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "mapi/pst/heap_on_node.h"

namespace tarnwell::mapi::pst {

// Deeper trees than this are taken for damage: even 2-byte keys in
// single-record nodes would not need them within one heap.
inline constexpr uint8_t kMaxBthLevels = 8;

// Writes a BTH in two steps so that its header can be the heap's first
// allocation, as other programs lay heaps out: Reserve takes the space for
// `count` records before the caller allocates what the records point to,
// Write fills it in.
class BthWriter {
 public:
  BthWriter(HeapBuilder* heap, uint8_t key_size, uint8_t data_size)
      : heap_(heap), key_size_(key_size), data_size_(data_size) {}

  // Reserves the header and every tree node for `count` records.
  Status Reserve(size_t count);
  // `records` are key (little-endian) then data, key_size + data_size bytes
  // each, in any order, exactly as many as reserved, keys unique.
  Status Write(std::vector<Bytes> records);
  // The BTHHEADER allocation; valid after Reserve.
  Hid header() const { return header_; }

 private:
  HeapBuilder* heap_;
  uint8_t key_size_;
  uint8_t data_size_;
  size_t count_ = 0;
  Hid header_ = 0;
  std::vector<std::vector<Hid>> levels_;  // levels_[0]: leaves, last: the root
};

// Every record of the BTH whose header is at `header` (key then data), in
// key order. A damaged subtree is skipped: the records that could be read
// and a Corruption status.
Status ReadBth(const HeapReader& heap, Hid header, uint8_t* key_size, uint8_t* data_size,
               std::vector<Bytes>* records);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_BTH_H_
