// The catalog's model: one CatalogEntry per catalog record, gathered into a
// TableDef per table. The catalog itself is decoded in catalog.cc.
#ifndef TARNWELL_ENGINE_CATALOG_ENTRY_H_
#define TARNWELL_ENGINE_CATALOG_ENTRY_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::engine {

// Catalog object types.
constexpr uint16_t kCatalogTable = 1;
constexpr uint16_t kCatalogColumn = 2;
constexpr uint16_t kCatalogIndex = 3;
constexpr uint16_t kCatalogLongValue = 4;
constexpr uint16_t kCatalogFurther = 5;

// Engine column types, as the catalog stores them.
enum ColumnType : uint32_t {
  kColumnNil = 0,
  kColumnBit = 1,
  kColumnUnsignedByte = 2,
  kColumnShort = 3,
  kColumnLong = 4,
  kColumnCurrency = 5,
  kColumnFloat = 6,
  kColumnDouble = 7,
  kColumnDateTime = 8,
  kColumnBinary = 9,
  kColumnText = 10,
  kColumnLongBinary = 11,
  kColumnLongText = 12,
  kColumnSLV = 13,
  kColumnUnsignedLong = 14,
  kColumnLongLong = 15,
  kColumnGuid = 16,
  kColumnUnsignedShort = 17,
};

// Column ids: fixed columns 1..127, variable 128..255, tagged above.
constexpr uint32_t kLastFixedColumnId = 127;
constexpr uint32_t kFirstVariableColumnId = 128;
constexpr uint32_t kFirstTaggedColumnId = 256;

struct CatalogEntry {
  uint32_t table_object_id = 0;
  uint16_t type = 0;
  uint32_t id = 0;
  uint32_t column_type_or_root = 0;  // column type, or root page of a tree
  uint32_t size = 0;
  uint32_t code_page = 0;  // columns only
  std::string name;
  Bytes second_value;  // variable column 130
  Bytes third_value;   // variable column 131

  uint32_t column_type() const { return column_type_or_root; }
  uint32_t root_page() const { return column_type_or_root; }
};

struct TableDef {
  CatalogEntry table;
  std::optional<CatalogEntry> long_value;
  std::optional<CatalogEntry> further;
  std::vector<CatalogEntry> columns;  // in catalog order

  const std::string& name() const { return table.name; }
};

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_CATALOG_ENTRY_H_
