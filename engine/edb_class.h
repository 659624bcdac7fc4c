// EdbClass: the reader of one Exchange database file, legacy page family
// (Exchange 5.5, 2000/2003, 2007: 4 and 8 KiB pages, 40-byte page headers).
// Edb2010Class (edb2010_class.h) reads the large-page family.
//
// The reader owns the open files and the results of the scan stages. Its
// operations are the surface the store model and the scan driver see; the
// work is done by small components: PageFile (where pages are), Page (tags
// and nodes), record_ref (keys), RecordColumns (records), the adjustment
// probe and the leaf-page scan.
//
// Results follow the program's convention: 1 (or true) success, 0 failure,
// -1 refused or absent.
#ifndef TARNWELL_ENGINE_EDB_CLASS_H_
#define TARNWELL_ENGINE_EDB_CLASS_H_

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "base/progress_sink.h"
#include "base/read_only_file.h"
#include "base/status.h"
#include "engine/catalog_entry.h"
#include "engine/database_header.h"
#include "engine/leaf_page_scan.h"
#include "engine/long_value.h"
#include "engine/page_file.h"
#include "engine/record_columns.h"
#include "engine/record_ref.h"
#include "engine/version.h"

namespace tarnwell::engine {

// A copy of one node, independent of its page.
struct NodeCopy {
  Bytes data;  // the node's bytes (large family: flag bits cleared)
  uint16_t size = 0;
  uint16_t offset = 0;
  uint8_t flags = 0;
};

// A page loaded whole: its node table, count and flags.
struct PageRecord {
  uint32_t page_number = 0;
  Page page;
  uint32_t flags = 0;
  int last_tag = -1;  // tag count - 1
};

class EdbClass {
 public:
  EdbClass();
  virtual ~EdbClass();
  EdbClass(const EdbClass&) = delete;
  EdbClass& operator=(const EdbClass&) = delete;

  virtual PageFamily family() const { return PageFamily::kLegacy; }

  // Where progress goes and the flag that Stop lowers. Both must outlive
  // the reader; by default progress is dropped and nothing stops.
  void SetProgress(ProgressSink* sink) { progress_ = sink ? sink : &NullProgress(); }
  void SetRunningFlag(RunningFlag* running) { running_ = running ? running : &own_running_; }
  RunningFlag& running() { return *running_; }
  ProgressSink& progress() { return *progress_; }

  // Opens the database read-only with the page size of `version`.
  bool OpenDatabase(const std::string& path, const SourceDescriptor& source, int version);
  // Opens any ESE file read-only with the page size its header gives, for
  // inspection. The version code follows from the header's revision (0 when
  // it names no Exchange version); the page size is the header's. A header
  // found behind junk sets the adjustment factor.
  Status OpenForInspection(const std::string& path);
  bool OpenStreamFile(const std::string& path, const SourceDescriptor& source);
  bool OpenTemplateDatabase(const std::string& path);

  // The Exchange version of a database file from its header revision, read
  // from a read-only handle. -1 when the file cannot be opened; 0 when the
  // revision names no version.
  static int DetectVersion(const std::string& path, uint64_t base_offset = 0);
  static int DetectTemplateVersion(const std::string& path);

  // The adjustment probe for this reader's version; no-op for Exchange 5.5.
  bool FindAdjustmentFactor();
  // The whole-file page scan; the list is kept by the reader.
  bool ScanLeafPages();
  const std::vector<LeafPageEntry>& leaf_pages() const { return leaf_pages_; }

  // Walks the tree rooted at page n and pushes every leaf record reference
  // (but index leaves) on the record vector. 1 done, 0 failed.
  int CollectTreeRecords(uint32_t page_number);
  // Harvests the leaf-page list into the record vector (Advance and Deep
  // Mode); the list is emptied.
  int CollectLeafPageRecords();
  bool FollowLeafChain(uint32_t page_number);
  // By default the harvest keeps only the catalog's records (all that the
  // catalog stage reads); off keeps every leaf record of every tree.
  void set_harvest_catalog_only(bool only) { harvest_catalog_only_ = only; }
  uint32_t CatalogObjectId() const;
  std::vector<RecordRef>& records() { return records_; }

  // Decodes the record vector as catalog records into the table list and
  // empties the vector. Always 1.
  int ParseCatalogRecords();
  // The table names in catalog order (legacy family: up to the first '-'
  // dropped); also kept by the reader.
  std::vector<std::string> GetTableNames();
  const std::vector<TableDef>& tables() const { return tables_; }
  const TableDef* FindTable(const std::string& name) const;
  // Set when a catalog record with last fixed id 12 was met in an Exchange
  // 2013 database.
  bool extended_catalog() const { return extended_catalog_; }

  // Reads one page; false when it cannot be read or is rejected.
  bool ReadPage(uint32_t page_number, Page* page) const;
  NodeCopy ReadNode(uint32_t page_number, uint16_t tag) const;
  int LoadPageNodes(PageRecord* record) const;
  // The reference of node `tag` of page n; kind 0 when the node is deleted,
  // out of range or unusable, or the page is not a leaf.
  RecordRef MakeRecordRef(uint32_t page_number, uint16_t tag) const;
  // Splits the record `ref` points to by the columns of `table` (after those
  // of `template_table` when given). 0 done; -1 when `ref` is no record.
  int ReadRecordColumns(const RecordRef& ref, const TableDef& table, const TableDef* template_table,
                        RecordColumns* out) const;

  // Walks the tree of `table` and splits each of its records. The visitor
  // returns false to stop. 1 walked, 0 the root could not be walked.
  using RecordVisitor = std::function<bool(const RecordRef& ref, RecordColumns& columns)>;
  int ForEachRecord(const TableDef& table, const RecordVisitor& visit);

  // Long values of this database. Chunks may be compressed in any family:
  // Windows databases with 4 KiB pages compress them too.
  LongValueReader long_values() const { return LongValueReader(file_, true); }

  // The tagged-value form records of this reader's database use.
  TaggedForm tagged_form() const;

  int version() const { return version_; }
  const PageFile& file() const { return file_; }
  PageFile& file() { return file_; }
  const DatabaseHeader& header() const { return header_; }
  bool header_valid() const { return header_valid_; }
  uint64_t stream_length() const { return stream_.size(); }

 protected:
  PageFile file_;
  ReadOnlyFile stream_;
  ReadOnlyFile template_;
  int version_ = kVersionUnknown;
  DatabaseHeader header_;
  bool header_valid_ = false;
  std::vector<LeafPageEntry> leaf_pages_;
  std::vector<RecordRef> records_;
  std::vector<TableDef> tables_;
  std::vector<std::string> table_names_;
  bool extended_catalog_ = false;
  bool harvest_catalog_only_ = true;

 private:
  void ReadHeader(uint64_t base_offset);

  ProgressSink* progress_;
  RunningFlag own_running_{true};
  RunningFlag* running_;
};

// Reads the header of any ESE file: at the start, or where the first header
// followed by its shadow stands within the first 5 MiB (`header_at`).
Status ReadInspectionHeader(const std::string& path, DatabaseHeader* header, int64_t* header_at);
// Opens any ESE file for inspection with the reader its page size needs.
Status InspectDatabase(const std::string& path, std::unique_ptr<EdbClass>* reader);

// Makes the reader of a version's family (nullptr for an unknown code).
std::unique_ptr<EdbClass> MakeReader(int version);
// Makes the reader for a page size, for inspecting any ESE file.
std::unique_ptr<EdbClass> MakeReaderForPageSize(uint32_t page_size);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_EDB_CLASS_H_
