// File layout: the database header, an identical shadow copy, then pages
// 1..N; page n starts at (n + 1) * page_size.
//
// Database header (one page-size block, the rest zero):
//   offset width meaning
//   0      4     XOR checksum of the block
//   4      4     signature 0x89ABCDEF
//   8      4     format version (0x620)
//   12     4     file type: 0 database
//   16     8     database time
//   24     28    database signature: random u32, creation log time, computer name
//   52     4     database state (1 just created, 2 dirty, 3 clean shutdown, ...)
//   56     8     consistent log position
//   64     8     consistent log time
//   72     8     attach log time
//   80     8     attach log position
//   88     8     detach log time
//   96     8     detach log position
//   104    28    log signature
//   212    4     last object id in use
//   216    16    OS major, minor, build, service pack of the last index update
//   232    4     format revision
//   236    4     page size
//   340    4     creation format version
//   344    4     creation format revision
// A log time is sec, min, hour, day, month, year-1900, 0, 0 (one byte each).
//
// Fixed pages: 1 the database root (object 1) with its owned and available
// space trees at 2 and 3; 4 the catalog MSysObjects (object 2); 24 its copy
// MSysObjectsShadow (object 3). Tables (objects 5 on) get the other pages in
// ascending order; pages nothing uses stay zero, like never-written pages.
#include "testing/forge_database.h"

#include <algorithm>
#include <cstring>

#include "engine/page_checksum.h"

namespace tarnwell::forge {
namespace {

constexpr uint32_t kSignature = 0x89ABCDEF;
constexpr uint32_t kFileTypeDatabase = 0;
constexpr size_t kHeaderChecksum = 0;
constexpr size_t kHeaderSignature = 4;
constexpr size_t kHeaderVersion = 8;
constexpr size_t kHeaderFileType = 12;
constexpr size_t kHeaderDbTime = 16;
constexpr size_t kHeaderDbSignature = 24;
constexpr size_t kHeaderState = 52;
constexpr size_t kHeaderConsistentPosition = 56;
constexpr size_t kHeaderConsistentTime = 64;
constexpr size_t kHeaderAttachTime = 72;
constexpr size_t kHeaderAttachPosition = 80;
constexpr size_t kHeaderDetachTime = 88;
constexpr size_t kHeaderDetachPosition = 96;
constexpr size_t kHeaderLogSignature = 104;
constexpr size_t kHeaderLastObjectId = 212;
constexpr size_t kHeaderOsVersion = 216;
constexpr size_t kHeaderRevision = 232;
constexpr size_t kHeaderPageSize = 236;
constexpr size_t kHeaderCreationVersion = 340;
constexpr size_t kHeaderCreationRevision = 344;
constexpr size_t kSignatureComputerName = 12;
constexpr size_t kComputerNameSize = 16;

constexpr uint32_t kDatabaseStateClean = 3;
constexpr uint32_t kDatabaseSignatureRandom = 0x7A4E5701;       // fixed: output is deterministic
constexpr uint8_t kLogTime[8] = {0, 30, 12, 15, 6, 113, 0, 0};  // 2013-06-15 12:30:00
constexpr uint8_t kLogPosition[8] = {0, 0, 0, 0, 1, 0, 0, 0};   // generation 1
constexpr uint64_t kHeaderDbTimeValue = 0x2000;
constexpr uint64_t kPageDbTime = 0x1000;
constexpr uint32_t kFirstUserObjectId = 5;
// Kept below 0x2000 so no reader mistakes its high bits for large-page tag flags.
constexpr uint32_t kDatabaseInitialPages = 256;
constexpr uint32_t kFirstFreePage = 5;
constexpr uint32_t kSpaceTreeHeaderSize = 16;
constexpr uint32_t kLargeRevision = 17;
constexpr uint32_t kLegacyRevision = 2;

constexpr uint32_t kFlagsLegacy = 0x0000;
constexpr uint32_t kFlags4K = 0x0800;
constexpr uint32_t kFlags8K = 0x2800;
constexpr uint32_t kFlagsLarge = 0xA800;

struct OsVersion {
  uint32_t min_revision, major, minor, build, service_pack;
};
// The Windows version that last touched a database of each revision.
constexpr OsVersion kOsVersions[] = {
    {0, 5, 0, 2195, 4},  {9, 5, 2, 3790, 2},  {12, 6, 0, 6002, 2},
    {17, 6, 1, 7601, 1}, {20, 6, 3, 9600, 0},
};

void WriteSignature(uint8_t* p) {
  StoreU32LE(p, kDatabaseSignatureRandom);
  std::memcpy(p + 4, kLogTime, sizeof(kLogTime));
  const char name[] = "TARNWELL";
  std::memcpy(p + kSignatureComputerName, name, std::min(sizeof(name), kComputerNameSize));
}

Bytes BuildHeader(const DatabaseLayout& database, uint32_t last_object_id) {
  Bytes h(database.page_size, 0);
  uint8_t* p = h.data();
  StoreU32LE(p + kHeaderSignature, kSignature);
  StoreU32LE(p + kHeaderVersion, database.format_version);
  StoreU32LE(p + kHeaderFileType, kFileTypeDatabase);
  StoreU64LE(p + kHeaderDbTime, kHeaderDbTimeValue);
  WriteSignature(p + kHeaderDbSignature);
  StoreU32LE(p + kHeaderState, database.database_state);
  std::memcpy(p + kHeaderAttachTime, kLogTime, 8);
  std::memcpy(p + kHeaderAttachPosition, kLogPosition, 8);
  if (database.database_state == kDatabaseStateClean) {
    // Only a cleanly detached database records where it became consistent.
    std::memcpy(p + kHeaderConsistentPosition, kLogPosition, 8);
    std::memcpy(p + kHeaderConsistentTime, kLogTime, 8);
    std::memcpy(p + kHeaderDetachTime, kLogTime, 8);
    std::memcpy(p + kHeaderDetachPosition, kLogPosition, 8);
  }
  WriteSignature(p + kHeaderLogSignature);
  StoreU32LE(p + kHeaderLastObjectId, last_object_id);
  OsVersion os = kOsVersions[0];
  for (const OsVersion& v : kOsVersions) {
    if (database.format_revision >= v.min_revision) os = v;
  }
  StoreU32LE(p + kHeaderOsVersion, os.major);
  StoreU32LE(p + kHeaderOsVersion + 4, os.minor);
  StoreU32LE(p + kHeaderOsVersion + 8, os.build);
  StoreU32LE(p + kHeaderOsVersion + 12, os.service_pack);
  StoreU32LE(p + kHeaderRevision, database.format_revision);
  StoreU32LE(p + kHeaderPageSize, database.page_size);
  StoreU32LE(p + kHeaderCreationVersion, database.format_version);
  StoreU32LE(p + kHeaderCreationRevision, database.format_revision);
  StoreU32LE(p + kHeaderChecksum, engine::ComputeHeaderChecksum(p, database.page_size));
  return h;
}

Bytes OrdinalKey(size_t ordinal) {
  Bytes key(4);
  for (int i = 0; i < 4; ++i) key[i] = uint8_t(ordinal >> (8 * (3 - i)));
  return key;
}

}  // namespace

uint32_t DefaultPageFormatFlags(uint32_t page_size, uint32_t revision) {
  if (page_size >= kLargePageMinimum) return kFlagsLarge;
  if (page_size >= 8192) return kFlags8K;
  return revision <= kLegacyRevision ? kFlagsLegacy : kFlags4K;
}

Status CheckFormat(const DatabaseLayout& database) {
  const uint32_t ps = database.page_size;
  if (ps != 4096 && ps != 8192 && ps != 16384 && ps != 32768) {
    return Status::InvalidArgument("page size must be 4096, 8192, 16384 or 32768");
  }
  if (ps >= kLargePageMinimum && database.format_revision < kLargeRevision) {
    return Status::InvalidArgument("pages of 16 KiB and more need format revision 17 or later");
  }
  return Status::Ok();
}

DatabaseWriter::DatabaseWriter(const DatabaseLayout& database, PageSink* sink)
    : sink_(sink),
      allocator_(kFirstFreePage, {kShadowCatalogRootPage}),
      next_object_id_(kFirstUserObjectId) {
  database_.page_size = database.page_size;
  database_.format_version = database.format_version;
  database_.format_revision = database.format_revision;
  database_.page_format_flags = database.page_format_flags;
  database_.prefix_compression = database.prefix_compression;
  database_.database_state = database.database_state;
  database_.catalog_revision = database.catalog_revision;
  status_ = CheckFormat(database_);
  format_.page_size = database.page_size;
  format_.revision = database.format_revision;
  format_.format_flags = database.page_format_flags.value_or(
      DefaultPageFormatFlags(database.page_size, database.format_revision));
  layout_ = TaggedLayoutFor(format_);
  base_options_.prefix_compression = database.prefix_compression;
  base_options_.db_time = kPageDbTime;
  // Single-extent trees whose parent is the database root.
  base_options_.root_header = RootPageHeader(1, kDatabaseRootPage, 0, 0);
}

TreeOptions DatabaseWriter::NewTree(uint32_t kind_flags) {
  TreeOptions options = base_options_;
  options.kind_flags = kind_flags;
  options.object_id = next_object_id_++;
  options.root_page = allocator_.Allocate();
  return options;
}

void DatabaseWriter::AddTable(const std::string& name, const std::vector<ColumnLayout>& columns,
                              const TreeOptions& tree, const TreeLayout& layout,
                              const TreeOptions* lv_tree, const TreeLayout* lv_layout,
                              TableManifest* manifest_out) {
  Table& t = tables_.emplace_back();
  t.name = name;
  t.columns = columns;
  t.catalog = {name, tree.object_id, layout.root_page, &t.columns};
  t.manifest.name = name;
  t.manifest.object_id = tree.object_id;
  t.manifest.root_page = layout.root_page;
  t.manifest.leaf_pages = layout.leaf_pages;
  t.manifest.branch_pages = layout.branch_pages;
  if (lv_tree && lv_layout) {
    t.catalog.long_value_object_id = lv_tree->object_id;
    t.catalog.long_value_root_page = lv_layout->root_page;
    t.manifest.long_value_object_id = lv_tree->object_id;
    t.manifest.long_value_root_page = lv_layout->root_page;
    t.manifest.long_value_leaf_pages = lv_layout->leaf_pages;
    t.manifest.long_value_branch_pages = lv_layout->branch_pages;
  }
  if (manifest_out) *manifest_out = t.manifest;
}

Status DatabaseWriter::Finish(Bytes* header, Manifest* manifest) {
  if (!status_.ok()) return status_;
  const uint32_t catalog_revision = database_.catalog_revision.value_or(database_.format_revision);
  const std::vector<ColumnLayout> catalog_columns = CatalogColumns(catalog_revision);
  std::vector<CatalogTable> catalog_tables;
  catalog_tables.push_back({"MSysObjects", kCatalogObjectId, kCatalogRootPage, &catalog_columns});
  catalog_tables.push_back(
      {"MSysObjectsShadow", kShadowCatalogObjectId, kShadowCatalogRootPage, &catalog_columns});
  for (const Table& t : tables_) catalog_tables.push_back(t.catalog);
  if (manifest) {
    *manifest = Manifest();
    for (const Table& t : tables_) manifest->tables.push_back(t.manifest);
  }

  std::vector<TreeEntry> catalog;
  Status s = BuildCatalogEntries(catalog_revision, layout_, catalog_tables, &catalog);
  if (!s.ok()) return s;
  TreeOptions options = base_options_;
  for (const auto& [object_id, root] :
       {std::pair{kCatalogObjectId, kCatalogRootPage},
        std::pair{kShadowCatalogObjectId, kShadowCatalogRootPage}}) {
    options.object_id = object_id;
    options.root_page = root;
    TreeWriter writer(format_, options, &allocator_, sink_);
    for (const TreeEntry& e : catalog) {
      s = writer.Add(e);
      if (!s.ok()) return s;
    }
    TreeLayout tree;
    s = writer.Finish(&tree);
    if (!s.ok()) return s;
    if (manifest) {
      TableManifest& m = manifest->tables.emplace_back();
      m.name = object_id == kCatalogObjectId ? "MSysObjects" : "MSysObjectsShadow";
      m.object_id = object_id;
      m.root_page = tree.root_page;
      m.leaf_pages = tree.leaf_pages;
      m.branch_pages = tree.branch_pages;
    }
  }

  // The database root owns every page; none is free.
  total_pages_ = std::max(kShadowCatalogRootPage, allocator_.last_allocated());
  auto write_tree = [&](const std::vector<TreeEntry>& entries) {
    TreeWriter writer(format_, options, &allocator_, sink_);
    for (const TreeEntry& e : entries) {
      Status st = writer.Add(e);
      if (!st.ok()) return st;
    }
    TreeLayout unused;
    return writer.Finish(&unused);
  };
  options.object_id = kDatabaseObjectId;
  options.root_page = kDatabaseRootPage;
  options.root_header = RootPageHeader(kDatabaseInitialPages, 0, 1, kDatabaseOwnedSpacePage);
  s = write_tree({});
  if (!s.ok()) return s;
  options.kind_flags = kPageFlagSpaceTree;
  options.root_header = Bytes(kSpaceTreeHeaderSize, 0);
  TreeEntry extent;
  extent.key = OrdinalKey(total_pages_);  // space trees key extents by their last page
  extent.data = LittleEndian(total_pages_, 4);
  options.root_page = kDatabaseOwnedSpacePage;
  s = write_tree({extent});
  if (!s.ok()) return s;
  options.root_page = kDatabaseAvailableSpacePage;
  s = write_tree({});
  if (!s.ok()) return s;

  *header = BuildHeader(database_, next_object_id_ - 1);
  if (manifest) {
    manifest->page_size = database_.page_size;
    manifest->total_pages = total_pages_;
  }
  return Status::Ok();
}

}  // namespace tarnwell::forge
