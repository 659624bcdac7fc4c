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
#include "testing/ese_writer.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <set>

#include "engine/page_checksum.h"
#include "testing/forge_catalog.h"
#include "testing/forge_page.h"
#include "testing/forge_record.h"
#include "testing/forge_tree.h"

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
constexpr uint8_t kJunkSeed = 0x5A;

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

Bytes BuildHeader(const DatabaseSpec& spec, uint32_t last_object_id) {
  Bytes h(spec.page_size, 0);
  uint8_t* p = h.data();
  StoreU32LE(p + kHeaderSignature, kSignature);
  StoreU32LE(p + kHeaderVersion, spec.format_version);
  StoreU32LE(p + kHeaderFileType, kFileTypeDatabase);
  StoreU64LE(p + kHeaderDbTime, kHeaderDbTimeValue);
  WriteSignature(p + kHeaderDbSignature);
  StoreU32LE(p + kHeaderState, spec.database_state);
  std::memcpy(p + kHeaderAttachTime, kLogTime, 8);
  std::memcpy(p + kHeaderAttachPosition, kLogPosition, 8);
  if (spec.database_state == kDatabaseStateClean) {
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
    if (spec.format_revision >= v.min_revision) os = v;
  }
  StoreU32LE(p + kHeaderOsVersion, os.major);
  StoreU32LE(p + kHeaderOsVersion + 4, os.minor);
  StoreU32LE(p + kHeaderOsVersion + 8, os.build);
  StoreU32LE(p + kHeaderOsVersion + 12, os.service_pack);
  StoreU32LE(p + kHeaderRevision, spec.format_revision);
  StoreU32LE(p + kHeaderPageSize, spec.page_size);
  StoreU32LE(p + kHeaderCreationVersion, spec.format_version);
  StoreU32LE(p + kHeaderCreationRevision, spec.format_revision);
  StoreU32LE(p + kHeaderChecksum, engine::ComputeHeaderChecksum(p, spec.page_size));
  return h;
}

Status CheckSpec(const DatabaseSpec& spec) {
  const uint32_t ps = spec.page_size;
  if (ps != 4096 && ps != 8192 && ps != 16384 && ps != 32768) {
    return Status::InvalidArgument("page size must be 4096, 8192, 16384 or 32768");
  }
  if (ps >= kLargePageMinimum && spec.format_revision < kLargeRevision) {
    return Status::InvalidArgument("pages of 16 KiB and more need format revision 17 or later");
  }
  std::set<std::string> names = {"MSysObjects", "MSysObjectsShadow"};
  for (const TableSpec& t : spec.tables) {
    if (t.name.empty()) return Status::InvalidArgument("a table without a name");
    if (!names.insert(t.name).second) {
      return Status::InvalidArgument("table " + t.name + " appears twice");
    }
    Status s = CheckColumns(t.columns);
    if (!s.ok()) return Status::InvalidArgument("table " + t.name + ": " + s.message());
  }
  return Status::Ok();
}

Bytes OrdinalKey(size_t ordinal) {
  Bytes key(4);
  for (int i = 0; i < 4; ++i) key[i] = uint8_t(ordinal >> (8 * (3 - i)));
  return key;
}

Status TableEntries(const TableSpec& table, TaggedLayout layout, std::vector<TreeEntry>* entries) {
  for (size_t i = 0; i < table.rows.size(); ++i) {
    const RowSpec& row = table.rows[i];
    TreeEntry e;
    e.key = row.key.empty() ? OrdinalKey(i + 1) : row.key;
    e.deleted = row.deleted;
    Status s = EncodeRecord(table.columns, row.cells, layout, &e.data);
    if (!s.ok()) {
      return Status::InvalidArgument("table " + table.name + " row " + std::to_string(i + 1) +
                                     ": " + s.message());
    }
    entries->push_back(std::move(e));
  }
  std::stable_sort(entries->begin(), entries->end(),
                   [](const TreeEntry& a, const TreeEntry& b) { return a.key < b.key; });
  return Status::Ok();
}

void AddManifest(Manifest* manifest, const std::string& name, uint32_t object_id,
                 const TreeLayout& layout) {
  if (!manifest) return;
  manifest->tables.push_back(
      {name, object_id, layout.root_page, layout.leaf_pages, layout.branch_pages});
}

Status Build(const DatabaseSpec& spec, Manifest* manifest, Bytes* out) {
  Status s = CheckSpec(spec);
  if (!s.ok()) return s;
  PageFormat format;
  format.page_size = spec.page_size;
  format.revision = spec.format_revision;
  format.format_flags =
      spec.page_format_flags.value_or(DefaultPageFormatFlags(spec.page_size, spec.format_revision));
  const TaggedLayout layout = TaggedLayoutFor(format);

  PageAllocator allocator(kFirstFreePage, {kShadowCatalogRootPage});
  PageMap pages;
  uint32_t next_object_id = kFirstUserObjectId;
  std::vector<CatalogTable> catalog_tables;
  const std::vector<ColumnSpec> catalog_columns = CatalogColumns(spec.format_revision);
  catalog_tables.push_back({"MSysObjects", kCatalogObjectId, kCatalogRootPage, &catalog_columns});
  catalog_tables.push_back(
      {"MSysObjectsShadow", kShadowCatalogObjectId, kShadowCatalogRootPage, &catalog_columns});

  TreeOptions options;
  options.prefix_compression = spec.prefix_compression;
  options.db_time = kPageDbTime;
  // Single-extent trees whose parent is the database root.
  options.root_header = RootPageHeader(1, kDatabaseRootPage, 0, 0);

  if (manifest) *manifest = Manifest();
  for (const TableSpec& table : spec.tables) {
    std::vector<TreeEntry> entries;
    s = TableEntries(table, layout, &entries);
    if (!s.ok()) return s;
    options.object_id = next_object_id++;
    options.root_page = allocator.Allocate();
    options.max_entries_per_leaf = table.max_rows_per_leaf;
    options.max_children_per_branch = table.max_children_per_branch;
    TreeLayout tree;
    s = BuildTree(format, options, entries, &allocator, &pages, &tree);
    if (!s.ok()) return Status::InvalidArgument("table " + table.name + ": " + s.message());
    catalog_tables.push_back({table.name, options.object_id, tree.root_page, &table.columns});
    AddManifest(manifest, table.name, options.object_id, tree);
  }

  std::vector<TreeEntry> catalog;
  s = BuildCatalogEntries(spec.format_revision, layout, catalog_tables, &catalog);
  if (!s.ok()) return s;
  options.max_entries_per_leaf = options.max_children_per_branch = 0;
  for (const auto& [object_id, root] :
       {std::pair{kCatalogObjectId, kCatalogRootPage},
        std::pair{kShadowCatalogObjectId, kShadowCatalogRootPage}}) {
    options.object_id = object_id;
    options.root_page = root;
    TreeLayout tree;
    s = BuildTree(format, options, catalog, &allocator, &pages, &tree);
    if (!s.ok()) return s;
    AddManifest(manifest, object_id == kCatalogObjectId ? "MSysObjects" : "MSysObjectsShadow",
                object_id, tree);
  }

  // The database root owns every page; none is free.
  const uint32_t total_pages = std::max(kShadowCatalogRootPage, allocator.last_allocated());
  options.object_id = kDatabaseObjectId;
  options.root_page = kDatabaseRootPage;
  options.root_header = RootPageHeader(kDatabaseInitialPages, 0, 1, kDatabaseOwnedSpacePage);
  TreeLayout unused;
  s = BuildTree(format, options, {}, &allocator, &pages, &unused);
  if (!s.ok()) return s;
  options.kind_flags = kPageFlagSpaceTree;
  options.root_header = Bytes(kSpaceTreeHeaderSize, 0);
  TreeEntry extent;
  extent.key = OrdinalKey(total_pages);  // space trees key extents by their last page
  extent.data = LittleEndian(total_pages, 4);
  options.root_page = kDatabaseOwnedSpacePage;
  s = BuildTree(format, options, {extent}, &allocator, &pages, &unused);
  if (!s.ok()) return s;
  options.root_page = kDatabaseAvailableSpacePage;
  s = BuildTree(format, options, {}, &allocator, &pages, &unused);
  if (!s.ok()) return s;

  const Bytes header = BuildHeader(spec, next_object_id - 1);
  out->assign(size_t(total_pages + 2) * spec.page_size, 0);
  std::copy(header.begin(), header.end(), out->begin());
  std::copy(header.begin(), header.end(), out->begin() + spec.page_size);
  for (const auto& [number, image] : pages) {
    std::copy(image.begin(), image.end(), out->begin() + size_t(number + 1) * spec.page_size);
  }
  if (manifest) {
    manifest->page_size = spec.page_size;
    manifest->total_pages = total_pages;
    for (const auto& entry : pages) manifest->written_pages.push_back(entry.first);
  }
  return Status::Ok();
}

void ApplyDamage(const DamageSpec& damage, uint32_t page_size, Bytes* file) {
  if (damage.drop_header_pages) {
    file->erase(file->begin(), file->begin() + std::min<size_t>(file->size(), 2 * page_size));
  }
  if (damage.junk_prefix > 0) {
    Bytes junk(damage.junk_prefix);
    uint8_t x = kJunkSeed;
    for (uint8_t& b : junk) {
      x = uint8_t(x * 33 + 7);  // a fixed byte sequence that looks like nothing in particular
      b = x;
    }
    file->insert(file->begin(), junk.begin(), junk.end());
  }
}

}  // namespace

uint32_t DefaultPageFormatFlags(uint32_t page_size, uint32_t revision) {
  if (page_size >= kLargePageMinimum) return kFlagsLarge;
  if (page_size >= 8192) return kFlags8K;
  return revision <= kLegacyRevision ? kFlagsLegacy : kFlags4K;
}

Bytes BuildDatabase(const DatabaseSpec& spec, Manifest* manifest, const DamageSpec& damage,
                    Status* status) {
  Bytes file;
  Status s = Build(spec, manifest, &file);
  if (status) *status = s;
  if (!s.ok()) return Bytes();
  ApplyDamage(damage, spec.page_size, &file);
  return file;
}

Status WriteDatabase(const DatabaseSpec& spec, const std::string& path, Manifest* manifest,
                     const DamageSpec& damage) {
  Status s;
  Bytes file = BuildDatabase(spec, manifest, damage, &s);
  if (!s.ok()) return s;
  std::FILE* f = std::fopen(path.c_str(), "wb");
  if (!f) return Status::IoError("cannot create " + path);
  bool ok = std::fwrite(file.data(), 1, file.size(), f) == file.size();
  ok = std::fclose(f) == 0 && ok;
  return ok ? Status::Ok() : Status::IoError("cannot write " + path);
}

}  // namespace tarnwell::forge
