// Splitting a table record into its column values.
//
// Record layout (the data part of a leaf node of a table tree):
//
//   offset          width          meaning
//   0               1              last fixed column id F (0 = none)
//   1               1              last variable column id V (127 = none)
//   2               2              offset of the variable-offset array
//   4               ...            fixed values in column-id order, each as
//                                  wide as the catalog says; then a bitmap of
//                                  ceil(F / 8) bytes, bit id-1 set = null
//   var array       2 * (V - 127)  u16 per variable column 128..V: end of its
//                                  value from the start of the variable data;
//                                  bit 0x8000 = null
//   variable data   ...
//   tagged area     ...            from the end of the variable data on
//
// Tagged area, array form: 4-byte entries {u16 column id, u16 offset word}
// in ascending id order, offsets from the start of the area; the first
// offset is also the array's length. A value runs to the next entry's offset
// (the last one to the end of the record).
//
//   page size     offset bits  other bits
//   < 16 KiB      0x1FFF       0x4000 value starts with a flag byte,
//                              0x2000 null (no bytes)
//   >= 16 KiB     0x7FFF       0x8000 derived column; every value starts
//                              with its flag byte
//
// Tagged area, inline form (Exchange 5.5): items {u16 column id, u16 size
// word, value}. With bit 0x8000 of the size word a flag byte precedes the
// value and (word & 0x5FFF) counts the flag byte and the value; without it
// the word is the value's size.
#ifndef TARNWELL_ENGINE_RECORD_COLUMNS_H_
#define TARNWELL_ENGINE_RECORD_COLUMNS_H_

#include <cstdint>
#include <vector>

#include "base/byte_view.h"
#include "engine/catalog_entry.h"
#include "engine/column_value.h"

namespace tarnwell::engine {

enum class TaggedForm {
  kSmallPageArray,  // 4 and 8 KiB pages
  kLargePageArray,  // 16 and 32 KiB pages
  kInline,          // Exchange 5.5
};

constexpr size_t kRecordHeaderSize = 4;
constexpr uint16_t kVariableNullBit = 0x8000;
constexpr uint16_t kVariableOffsetMask = 0x7FFF;
constexpr uint16_t kSmallTaggedOffsetMask = 0x1FFF;
constexpr uint16_t kSmallTaggedNullBit = 0x2000;
constexpr uint16_t kSmallTaggedFlagByteBit = 0x4000;
constexpr uint16_t kLargeTaggedOffsetMask = 0x7FFF;
constexpr size_t kTaggedEntrySize = 4;
constexpr uint16_t kInlineFlagByteBit = 0x8000;
constexpr uint16_t kInlineSizeMask = 0x5FFF;
constexpr size_t kInlineItemHeaderSize = 4;

// The columns of one record. Owns a copy of the record bytes; every
// ColumnValue points into it.
class RecordColumns {
 public:
  RecordColumns() = default;
  RecordColumns(const RecordColumns&) = delete;
  RecordColumns& operator=(const RecordColumns&) = delete;
  RecordColumns(RecordColumns&&) = default;
  RecordColumns& operator=(RecordColumns&&) = default;

  // Splits `record` by `columns` (catalog order; a template table's columns
  // first). Returns false when the record is shorter than its header; values
  // that would reach past the record stop the walk, keeping those before.
  bool Split(ByteView record, const std::vector<const CatalogEntry*>& columns, TaggedForm form);

  size_t size() const { return values_.size(); }
  // Slot i; an empty slot for an index out of range.
  const ColumnValue& at(size_t i) const;
  bool has(size_t i) const { return i < values_.size(); }
  const std::vector<ColumnValue>& values() const { return values_; }
  // False when the walk stopped early at a value that did not fit.
  bool complete() const { return complete_; }

  int GetU8(size_t i, uint8_t* out) const { return Get(i, engine::GetU8, out); }
  int GetU16(size_t i, uint16_t* out) const { return Get(i, engine::GetU16, out); }
  int GetU32(size_t i, uint32_t* out) const { return Get(i, engine::GetU32, out); }
  int GetU64(size_t i, uint64_t* out) const { return Get(i, engine::GetU64, out); }
  int GetFloat(size_t i, float* out) const { return Get(i, engine::GetFloat, out); }
  int GetDouble(size_t i, double* out) const { return Get(i, engine::GetDouble, out); }

 private:
  template <typename T>
  int Get(size_t i, int (*getter)(const ColumnValue&, T*), T* out) const {
    if (i >= values_.size()) return -1;
    return getter(values_[i], out);
  }

  Bytes storage_;
  std::vector<ColumnValue> values_;
  bool complete_ = true;
};

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_RECORD_COLUMNS_H_
