// RowValues: the columns of one table record as the property decoder wants
// them: by name, with long values assembled and compressed values expanded.
#ifndef TARNWELL_STORE_ROW_VALUES_H_
#define TARNWELL_STORE_ROW_VALUES_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "engine/catalog_entry.h"
#include "engine/long_value.h"
#include "engine/record_columns.h"

namespace tarnwell::store {

// Code page of text that RowValues has already turned into UTF-8 (joined
// multi-valued strings).
constexpr uint32_t kUtf8CodePage = 65001;

struct RowValue {
  const engine::CatalogEntry* column = nullptr;
  uint32_t engine_type = 0;
  uint32_t code_page = 0;
  Bytes bytes;
  bool damaged = false;  // a long value or compressed value could not be read whole
};

class RowValueReader {
 public:
  RowValueReader(const engine::LongValueReader& long_values, const engine::TableDef& table)
      : long_values_(long_values),
        table_(table),
        lv_root_(table.long_value ? table.long_value->root_page() : 0) {}

  // The present values of `columns`, in catalog order. Long values larger
  // than `max_long_value` bytes are left empty and marked damaged.
  std::vector<RowValue> Read(const engine::RecordColumns& columns,
                             uint64_t max_long_value = uint64_t(1) << 31) const;

  // One column's value; false when absent.
  bool ReadOne(const engine::RecordColumns& columns, size_t slot, RowValue* out,
               uint64_t max_long_value = uint64_t(1) << 31) const;

 private:
  bool Resolve(ByteView stored, uint8_t flags, Bytes* out, bool* damaged, uint32_t* code_page,
               uint64_t max_long_value) const;

  const engine::LongValueReader& long_values_;
  const engine::TableDef& table_;
  uint32_t lv_root_;
};

// The slot of a column by name in `table`; -1 when absent.
int ColumnSlot(const engine::TableDef& table, const std::string& name);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_ROW_VALUES_H_
