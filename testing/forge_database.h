// DatabaseWriter: the frame of one database file around its user trees.
//
// The caller writes each table's trees through TreeWriters (or BuildTree)
// with options from NewTree, then names the table with AddTable; Finish
// writes the catalog, its shadow, the database root and its space trees and
// returns the header block. Pages go to a PageSink as they are finished, so
// a database of any size can be streamed to disk.
#ifndef TARNWELL_TESTING_FORGE_DATABASE_H_
#define TARNWELL_TESTING_FORGE_DATABASE_H_

#include <cstdint>
#include <deque>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "testing/forge_catalog.h"
#include "testing/forge_layout.h"
#include "testing/forge_record.h"
#include "testing/forge_tree.h"

namespace tarnwell::forge {

class DatabaseWriter {
 public:
  // Uses the format fields of `database`; its tables are the caller's business.
  DatabaseWriter(const DatabaseLayout& database, PageSink* sink);

  // Why the format cannot be written; Ok when it can.
  const Status& status() const { return status_; }
  const PageFormat& format() const { return format_; }
  TaggedLayout layout() const { return layout_; }
  PageAllocator* allocator() { return &allocator_; }
  PageSink* sink() { return sink_; }

  // Options for the tree of a new object: its object id is the next free
  // one, its root page allocated now.
  TreeOptions NewTree(uint32_t kind_flags);

  // A finished table for the catalog. `long_values` may be null. The
  // columns are copied.
  void AddTable(const std::string& name, const std::vector<ColumnLayout>& columns,
                const TreeOptions& tree, const TreeLayout& layout, const TreeOptions* lv_tree,
                const TreeLayout* lv_layout, TableManifest* manifest_out = nullptr);

  // Writes the catalog and the database's own trees. `header` receives the
  // header block (one page) that goes, twice, before page 1; `manifest`
  // gets the tables (as added, then the catalogs), page size and count.
  Status Finish(Bytes* header, Manifest* manifest);

  uint32_t total_pages() const { return total_pages_; }

 private:
  struct Table {
    std::string name;
    std::vector<ColumnLayout> columns;
    CatalogTable catalog;
    TableManifest manifest;
  };

  DatabaseLayout database_;  // format fields only
  PageSink* sink_;
  PageFormat format_;
  TaggedLayout layout_;
  PageAllocator allocator_;
  TreeOptions base_options_;
  uint32_t next_object_id_;
  std::deque<Table> tables_;  // stable addresses: the catalog keeps pointers to columns
  uint32_t total_pages_ = 0;
  Status status_;
};

// Rejects formats the writer cannot produce.
Status CheckFormat(const DatabaseLayout& database);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_DATABASE_H_
