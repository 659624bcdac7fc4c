// The catalog: the database's table of tables (MSysObjects, rooted at page 4).
//
// Catalog record (the data part of a catalog leaf node, record layout of
// record_columns.h; only these columns are read):
//
//   column  position     width  meaning
//   header  bytes 0-3           last fixed id (5 or more; 12 in Exchange 2013,
//                               13 in newer Windows databases), last variable id,
//                               offset of the variable-offset array
//   1       bytes 4-7    u32    object id of the table the object belongs to
//   2       bytes 8-9    u16    type: 1 table, 2 column, 3 index,
//                               4 long-value tree, 5 further object
//   3       bytes 10-13  u32    object id (for a column: the column id)
//   4       bytes 14-17  u32    column type, or root page of a tree
//   5       bytes 18-21  u32    column size
//   7       bytes 26-29  u32    code page (columns only)
//   128     variable            name (8-bit text)
//   130     variable            kept as is (template table name)
//   131     variable            kept as is (default value)
//
// The catalog's key is (table object id, type, id): the objects of a table
// follow its table record, and are filed under it in that order.
#ifndef TARNWELL_ENGINE_CATALOG_H_
#define TARNWELL_ENGINE_CATALOG_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "engine/catalog_entry.h"
#include "engine/page.h"
#include "engine/record_columns.h"

namespace tarnwell::engine {

constexpr uint32_t kCatalogRootPage = 4;
constexpr uint32_t kCatalogObjectId = 2;  // MSysObjects
constexpr uint8_t kCatalogMinLastFixed = 5;
constexpr uint8_t kCatalogExtendedLastFixed = 12;
constexpr uint8_t kCatalogMaxLastFixed = 127;
constexpr size_t kCatalogObjectIdOffset = 4;
constexpr size_t kCatalogTypeOffset = 8;
constexpr size_t kCatalogIdOffset = 10;
constexpr size_t kCatalogColumnTypeOffset = 14;
constexpr size_t kCatalogSizeOffset = 18;
constexpr size_t kCatalogCodePageOffset = 26;
constexpr uint32_t kCatalogNameColumn = 128;
constexpr uint32_t kCatalogSecondColumn = 130;
constexpr uint32_t kCatalogThirdColumn = 131;

// Decodes one catalog record into `entry`. Returns false when the record is
// not a catalog record; the fields read before the failure stay. Sets
// `*extended` when the record's last fixed id is 12.
bool ParseCatalogRecord(ByteView data, CatalogEntry* entry, bool* extended);

// Files catalog entries into tables. Entries are put in catalog key order
// (table object id, type, id) before filing, so that records harvested page
// by page in file order are filed as a tree walk would file them; an entry
// whose key was met before (a stale copy on another page) is dropped.
class CatalogBuilder {
 public:
  void Add(CatalogEntry entry) { entries_.push_back(std::move(entry)); }
  std::vector<TableDef> Finish();

 private:
  void File(CatalogEntry entry);

  std::vector<CatalogEntry> entries_;
  std::vector<TableDef> tables_;
};

// The name the table-name vector lists for a table: the legacy family drops
// everything up to and including the first '-'.
std::string ListedTableName(const std::string& name, PageFamily family);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_CATALOG_H_
