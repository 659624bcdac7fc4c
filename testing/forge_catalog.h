// The catalog (MSysObjects and its copy MSysObjectsShadow): one record per
// table, column, index and long-value tree of the database.
#ifndef TARNWELL_TESTING_FORGE_CATALOG_H_
#define TARNWELL_TESTING_FORGE_CATALOG_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/status.h"
#include "testing/forge_layout.h"
#include "testing/forge_record.h"
#include "testing/forge_tree.h"

namespace tarnwell::forge {

// Catalog record types.
enum CatalogType : uint16_t {
  kCatalogTable = 1,
  kCatalogColumn = 2,
  kCatalogIndex = 3,
  kCatalogLongValue = 4,
  kCatalogCallback = 5,
};

// A table as the catalog describes it.
struct CatalogTable {
  std::string name;
  uint32_t object_id = 0;
  uint32_t root_page = 0;
  const std::vector<ColumnLayout>* columns = nullptr;
  // Long-value tree of the table; 0 when it has none.
  uint32_t long_value_object_id = 0;
  uint32_t long_value_root_page = 0;
};

// The catalog's own columns as the given format revision has them.
std::vector<ColumnLayout> CatalogColumns(uint32_t revision);

// The catalog tree's entries (key order) for `tables`.
Status BuildCatalogEntries(uint32_t revision, TaggedLayout layout,
                           const std::vector<CatalogTable>& tables,
                           std::vector<TreeEntry>* entries);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_CATALOG_H_
