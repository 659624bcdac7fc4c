// What the legacy and the modern store builders share: table schemas built
// by column kind, rows filled by column name, and the cells of a message's
// list and property columns.
//
// Column ids follow the order of Add within each kind (fixed from 1,
// variable from 128, tagged from 256), so the order of Add is part of a
// store's bytes.
#ifndef TARNWELL_TESTING_EXCHANGE_STORE_TABLES_H_
#define TARNWELL_TESTING_EXCHANGE_STORE_TABLES_H_

#include <cstdint>
#include <initializer_list>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "testing/exchange/store_manifest.h"
#include "testing/forge_layout.h"
#include "testing/forge_stream.h"

namespace tarnwell::forge::exchange {

constexpr uint32_t kCodePageUnicode = 1200;
constexpr uint32_t kCodePageWestern = 1252;
constexpr uint32_t kInternetCodePageUtf8 = 65001;
constexpr size_t kIdSize = 8;  // 64-bit ids, and the width of fixed binary columns
constexpr uint8_t kBitTrue = 1;

enum class Slot { kFixed, kVariable, kTagged };

struct Column {
  const char* name;
  uint32_t type;
  uint32_t codepage;
  Slot slot;
};

inline Column Fixed(const char* name, uint32_t type) { return {name, type, 0, Slot::kFixed}; }
inline Column Variable(const char* name, uint32_t type, uint32_t codepage = 0) {
  return {name, type, codepage, Slot::kVariable};
}
inline Column Tagged(const char* name, uint32_t type, uint32_t codepage = 0) {
  return {name, type, codepage, Slot::kTagged};
}

class Schema {
 public:
  Schema& Add(const Column& c);
  Schema& Add(std::initializer_list<Column> columns);
  // Ids ascending, as the catalog and the record encoder want them.
  std::vector<ColumnLayout> Columns() const;

 private:
  std::vector<ColumnLayout> columns_;
  uint32_t next_fixed_ = 1;
  uint32_t next_variable_ = kFirstVariableColumnId;
  uint32_t next_tagged_ = kFirstTaggedColumnId;
};

// The cells of one row, by column name.
class Row {
 public:
  // Tagged values past `long_value_limit` bytes, or that would take the
  // record past `record_budget`, go to the long-value tree.
  Row(StreamTable* table, uint32_t long_value_limit, uint32_t record_budget)
      : table_(table), limit_(long_value_limit), budget_(record_budget) {}

  const ColumnLayout* Column(const std::string& name) const { return table_->Find(name); }
  std::vector<Cell>& cells() { return cells_; }

  Status Put(const std::string& name, Bytes value);
  // Little-endian at the column type's width.
  Status Number(const std::string& name, uint64_t value);
  // A FILETIME: little-endian in 64-bit integer columns, big-endian (high
  // half first) in binary ones.
  Status Time(const std::string& name, uint64_t filetime);
  // Text in the column's code page; with `seven_bit`, stored 7-bit
  // compressed when every character allows it.
  Status Text(const std::string& name, const std::string& utf8, bool seven_bit = false);
  // A tagged value, in the record or the long-value tree (see above); Xpress
  // compressed when `compression` says so. `separated` tells which happened.
  Status Large(const std::string& name, Bytes value, Compression compression = Compression::kNone,
               bool* separated = nullptr);

 private:
  Status Missing(const std::string& name) const;

  StreamTable* table_;
  uint32_t limit_;
  uint32_t budget_;
  size_t used_ = 0;
  std::vector<Cell> cells_;
};

Bytes Le64(uint64_t v);
// The normalized key of a binary column: 0x7F, the bytes, 0x08.
Bytes BinaryKey(const Bytes& bytes);

// A one-off entry id: u32 flags 0, the one-off provider UID, u16 version 0,
// u16 flags (Unicode), then name, address type and address as NUL-terminated
// UTF-16LE.
Bytes OneOffEntryId(const ListMember& member);
// "MN81a9": u32 offset of the first member (8), u32 count, the members'
// one-off entry ids.
Bytes EncodeMembers(const std::vector<ListMember>& members);

// The list columns of a message row: "N67b0", "S1a", "S3d", "Se1d", "S42",
// "S678e", the three list times, "Le07", "L17", "Be1b".
Status PutListColumns(Row* row, const ManifestItem& item);

// The property columns of a message row, in this order (their sizes decide
// what goes to the long-value tree): "L3fde", bodies, RTF, headers, then the
// item's kind-specific values and distribution-list members. Notes in `item`
// whether a body went to the long-value tree.
Status PutPropertyColumns(Row* row, ManifestItem* item);

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_STORE_TABLES_H_
