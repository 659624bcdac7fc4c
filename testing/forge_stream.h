// Streaming a database of any size straight into its file: tables are
// written row by row through their trees, pages go to the file as the trees
// finish them, and the header block goes in front, twice, at the end.
//
//   forge::DatabaseFile file(layout.page_size);
//   Status s = file.Create("big.edb");
//   forge::DatabaseWriter db(layout, &file);
//   forge::StreamTable table(&db, "Messages", columns, {.long_values = true});
//   s = table.AddRow(key, cells);      // keys ascending
//   s = table.Finish();
//   s = file.Close(file.Finish(&db, &manifest));
//
// Memory stays at a few pages per open tree plus the branch keys.
#ifndef TARNWELL_TESTING_FORGE_STREAM_H_
#define TARNWELL_TESTING_FORGE_STREAM_H_

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "testing/forge_database.h"
#include "testing/forge_layout.h"
#include "testing/forge_long_value.h"
#include "testing/forge_tree.h"

namespace tarnwell::forge {

// The database file: page n sits after the two header pages; runs of
// consecutive pages are gathered into one write.
class DatabaseFile : public PageSink {
 public:
  explicit DatabaseFile(uint32_t page_size) : page_size_(page_size) {}
  ~DatabaseFile() override;
  DatabaseFile(const DatabaseFile&) = delete;
  DatabaseFile& operator=(const DatabaseFile&) = delete;

  Status Create(const std::string& path);
  Status Put(uint32_t page_number, Bytes image) override;
  // Finishes `db` (its catalog and own trees), writes the header block
  // twice and sizes the file. `manifest` may be null.
  Status Finish(DatabaseWriter* db, Manifest* manifest);
  // Closes the file; returns `status`, or the close's failure when
  // `status` is Ok.
  Status Close(Status status);
  // Header pages included; set by Finish.
  uint64_t file_size() const { return file_size_; }

 private:
  Status Flush();
  Status WriteAt(uint64_t offset, const uint8_t* data, size_t size);

  uint32_t page_size_;
  int fd_ = -1;
  std::string path_;
  uint32_t first_ = 0;  // page number of the buffer's first page
  Bytes buffer_;
  uint64_t file_size_ = 0;
};

struct StreamTableOptions {
  bool long_values = false;  // give the table a long-value tree
  // 4 or 8. With 8-byte ids the ids start past 32 bits, so that only a
  // reader of 8-byte ids finds the values.
  uint32_t long_value_id_size = kLongValueIdSize;
  uint32_t max_rows_per_leaf = 0;  // 0: full pages
};

// One table being streamed: its record tree and, optionally, its long-value
// tree, both open until Finish, which names the table in the catalog.
class StreamTable {
 public:
  StreamTable(DatabaseWriter* db, std::string name, std::vector<ColumnLayout> columns,
              const StreamTableOptions& options);

  const std::string& name() const { return name_; }
  const std::vector<ColumnLayout>& columns() const { return columns_; }
  const ColumnLayout* Find(const std::string& column) const;
  uint64_t rows() const { return rows_; }
  uint64_t long_values() const { return long_values_; }
  uint32_t long_value_id_size() const { return id_size_; }

  // Rows in ascending key order.
  Status AddRow(Bytes key, const std::vector<Cell>& cells);
  // Stores `data` (chunks compressed by `compression`) in the long-value
  // tree; `*id` is what the record refers to.
  Status AddLongValue(Bytes data, Compression compression, uint64_t* id);
  Status Finish();

 private:
  DatabaseWriter* db_;
  std::string name_;
  std::vector<ColumnLayout> columns_;
  std::map<std::string, size_t> index_;
  uint32_t id_size_;
  TreeOptions options_, lv_options_;
  std::unique_ptr<TreeWriter> writer_, lv_writer_;
  uint32_t chunk_size_ = 0;
  uint64_t next_lv_ = 1;
  uint64_t long_values_ = 0;
  uint64_t rows_ = 0;
};

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_STREAM_H_
