#include "engine/edb_class.h"

#include "engine/adjustment_probe.h"
#include "engine/catalog.h"
#include "engine/edb2010_class.h"
#include "engine/leaf_harvest.h"
#include "engine/tree_walk.h"

namespace tarnwell::engine {

EdbClass::EdbClass() : progress_(&NullProgress()), running_(&own_running_) {}
EdbClass::~EdbClass() = default;

void EdbClass::ReadHeader(uint64_t base_offset) {
  Bytes block(kHeaderMinSize, 0);
  file_.ReadAt(int64_t(base_offset), block.data(), block.size());
  header_valid_ = DecodeDatabaseHeader(ByteView(block), &header_).ok();
}

bool EdbClass::OpenDatabase(const std::string& path, const SourceDescriptor& source, int version) {
  const VersionInfo* info = FindVersion(version);
  if (!info) return false;
  if (!file_.Open(path, info->page_size, family(), source).ok()) return false;
  version_ = version;
  ReadHeader(source.base_offset);
  return true;
}

Status EdbClass::OpenForInspection(const std::string& path) {
  int64_t header_at = 0;
  DatabaseHeader header;
  Status s = ReadInspectionHeader(path, &header, &header_at);
  if (!s.ok()) return s;
  s = file_.Open(path, header.page_size, family());
  if (!s.ok()) return s;
  file_.SetAdjustment(header_at);
  header_ = header;
  header_valid_ = true;
  version_ = VersionFromRevision(header.format_revision);
  return Status::Ok();
}

Status ReadInspectionHeader(const std::string& path, DatabaseHeader* header, int64_t* header_at) {
  ReadOnlyFile probe;
  Status s = probe.Open(path);
  if (!s.ok()) return s;
  Bytes window(kProbeWindow, 0);
  window.resize(probe.ReadAt(0, window.data(), window.size()));
  *header_at = 0;
  s = DecodeDatabaseHeader(ByteView(window), header);
  if (!s.ok()) {
    // Junk in front of the database: look for a header followed by its
    // shadow copy one page further on.
    ByteView w(window);
    for (size_t p = 1; p + kHeaderMinSize <= w.size() && p < kProbeLastPosition; ++p) {
      if (w.U32LE(p + kHeaderSignatureOffset) != kDatabaseSignature) continue;
      DatabaseHeader found;
      if (!DecodeDatabaseHeader(w.From(p), &found).ok() || !IsValidPageSize(found.page_size)) {
        continue;
      }
      if (w.U32LE(p + found.page_size + kHeaderSignatureOffset) != kDatabaseSignature) continue;
      *header = found;
      *header_at = int64_t(p);
      s = Status::Ok();
      break;
    }
    if (!s.ok()) return s;
  }
  if (!IsValidPageSize(header->page_size)) {
    return Status::NotSupported("header gives page size " + std::to_string(header->page_size));
  }
  return Status::Ok();
}

Status InspectDatabase(const std::string& path, std::unique_ptr<EdbClass>* reader) {
  DatabaseHeader header;
  int64_t header_at = 0;
  Status s = ReadInspectionHeader(path, &header, &header_at);
  if (!s.ok()) return s;
  std::unique_ptr<EdbClass> r = MakeReaderForPageSize(header.page_size);
  s = r->OpenForInspection(path);
  if (!s.ok()) return s;
  *reader = std::move(r);
  return Status::Ok();
}

bool EdbClass::OpenStreamFile(const std::string& path, const SourceDescriptor& /*source*/) {
  stream_.Close();
  return stream_.Open(path).ok();
}

bool EdbClass::OpenTemplateDatabase(const std::string& path) { return template_.Open(path).ok(); }

static uint32_t ReadRevision(const std::string& path, uint64_t base_offset, bool* opened) {
  ReadOnlyFile f;
  *opened = f.Open(path).ok();
  if (!*opened) return 0;
  uint8_t raw[4] = {0, 0, 0, 0};
  f.ReadAt(int64_t(base_offset + kHeaderRevisionOffset), raw, sizeof raw);
  return LoadU32LE(raw);
}

int EdbClass::DetectVersion(const std::string& path, uint64_t base_offset) {
  bool opened = false;
  uint32_t revision = ReadRevision(path, base_offset, &opened);
  return opened ? VersionFromRevision(revision) : -1;
}

int EdbClass::DetectTemplateVersion(const std::string& path) {
  bool opened = false;
  uint32_t revision = ReadRevision(path, 0, &opened);
  return opened ? TemplateVersionFromRevision(revision) : kVersionUnknown;
}

bool EdbClass::FindAdjustmentFactor() {
  running_->store(true);
  file_.SetAdjustment(0);
  const VersionInfo* info = FindVersion(version_);
  if (!info || !info->has_probe || !file_.is_open()) return true;
  engine::FindAdjustmentFactor(file_, info->probe_root_flags, info->probe_space_flags);
  return true;
}

bool EdbClass::ScanLeafPages() {
  const VersionInfo* info = FindVersion(version_);
  // Skip what the version's layout reserves at the front; inspection of a
  // file whose header disagrees with its version scans from page 1.
  uint64_t skip = 0;
  if (info && info->page_size == file_.page_size()) skip = info->scan_skip;
  leaf_pages_ = engine::ScanLeafPages(file_, skip, *running_, *progress_);
  return true;
}

int EdbClass::CollectTreeRecords(uint32_t page_number) {
  running_->store(true);
  TreeWalker walker(file_, *progress_, *running_);
  return walker.Walk(page_number, [this](const Page&, const RecordRef& ref) {
    if (ref.kind != kKindIndex) records_.push_back(ref);
    return true;
  });
}

uint32_t EdbClass::CatalogObjectId() const {
  // The catalog's object id as its root page states it; the engine's own
  // number when page 4 is not a sound root.
  Page root;
  if (ReadPage(kCatalogRootPage, &root) && root.is_root() && root.header().object_id != 0) {
    return root.header().object_id;
  }
  return kCatalogObjectId;
}

int EdbClass::CollectLeafPageRecords() {
  LeafHarvest harvest(file_, *progress_, *running_, &records_);
  if (harvest_catalog_only_) harvest.set_object_filter(CatalogObjectId());
  int result = harvest.CollectLeafPageRecords(leaf_pages_);
  leaf_pages_.clear();
  leaf_pages_.shrink_to_fit();
  return result;
}

bool EdbClass::FollowLeafChain(uint32_t page_number) {
  LeafHarvest harvest(file_, *progress_, *running_, &records_);
  return harvest.FollowLeafChain(page_number);
}

int EdbClass::ParseCatalogRecords() {
  constexpr int kPermille = 1000;
  constexpr size_t kProgressEvery = 100;
  progress_->Range(0, kPermille);
  progress_->Position(0);
  CatalogBuilder builder;
  // The harvest of Advance Mode brings the leaf records of every tree in the
  // file; only those on pages of the catalog's own tree are catalog records.
  // (Other tables' records can look like catalog records and would file
  // bogus columns under the last table.)
  const uint32_t catalog_object = CatalogObjectId();
  // References come grouped by page: keep the last page read.
  Page page;
  uint32_t page_number = 0;
  bool page_read = false, page_ok = false;
  for (size_t k = 0; k < records_.size(); ++k) {
    if (k % kProgressEvery == 0) progress_->Position(int(k * kPermille / records_.size()));
    const RecordRef& ref = records_[k];
    if (ref.object_id != catalog_object) continue;
    if (!page_read || ref.page_number != page_number) {
      page_number = ref.page_number;
      page_read = true;
      page_ok = ReadPage(page_number, &page);
    }
    if (!page_ok || ref.tag_index >= page.nodes().size()) continue;
    const NodeEntry& node = page.nodes()[ref.tag_index];
    if (ref.data_offset > node.size) continue;
    CatalogEntry entry;
    bool extended = false;
    ParseCatalogRecord(node.bytes.From(ref.data_offset), &entry, &extended);
    if (extended && version_ == kExchange2013) extended_catalog_ = true;
    builder.Add(std::move(entry));
  }
  tables_ = builder.Finish();
  records_.clear();
  records_.shrink_to_fit();
  return 1;
}

int EdbClass::ForEachRecord(const TableDef& table, const RecordVisitor& visit) {
  std::vector<const CatalogEntry*> columns;
  for (const CatalogEntry& c : table.columns) columns.push_back(&c);
  const TaggedForm form = tagged_form();
  TreeWalker walker(file_, *progress_, *running_);
  walker.set_want_keys(false);
  return walker.Walk(table.table.root_page(), [&](const Page& page, const RecordRef& ref) {
    if (ref.kind != kKindRecord) return true;
    RecordColumns split;
    if (!split.Split(NodeData(page, ref), columns, form)) return true;
    return visit(ref, split);
  });
}

std::vector<std::string> EdbClass::GetTableNames() {
  table_names_.clear();
  for (const TableDef& t : tables_) table_names_.push_back(ListedTableName(t.name(), family()));
  return table_names_;
}

const TableDef* EdbClass::FindTable(const std::string& name) const {
  for (const TableDef& t : tables_) {
    if (t.name() == name) return &t;
  }
  return nullptr;
}

bool EdbClass::ReadPage(uint32_t page_number, Page* page) const {
  return file_.ReadPage(page_number, page).ok();
}

NodeCopy EdbClass::ReadNode(uint32_t page_number, uint16_t tag) const {
  NodeCopy copy;
  std::shared_ptr<const Page> page = file_.Fetch(page_number);
  if (!page || tag >= page->nodes().size()) return copy;
  const NodeEntry& node = page->nodes()[tag];
  copy.data = node.bytes.ToBytes();
  copy.size = node.size;
  copy.offset = node.offset;
  copy.flags = node.flags;
  return copy;
}

int EdbClass::LoadPageNodes(PageRecord* record) const {
  if (!ReadPage(record->page_number, &record->page)) return -1;
  record->flags = record->page.flags();
  record->last_tag = int(record->page.nodes().size()) - 1;
  return 1;
}

RecordRef EdbClass::MakeRecordRef(uint32_t page_number, uint16_t tag) const {
  RecordRef ref;
  std::shared_ptr<const Page> page = file_.Fetch(page_number);
  if (!page) return ref;
  if (DecodeNode(*page, tag, &ref) != NodeDecode::kOk) return RecordRef();
  ref.page_number = page_number;
  ref.object_id = page->header().object_id;
  ref.kind = page->is_leaf() ? LeafKind(page->flags()) : char(kKindNone);
  ref.file_position = RecordFilePosition(file_, page_number, page->nodes()[tag].offset);
  return ref;
}

TaggedForm EdbClass::tagged_form() const {
  if (version_ == kExchange55) return TaggedForm::kInline;
  return family() == PageFamily::kLarge ? TaggedForm::kLargePageArray : TaggedForm::kSmallPageArray;
}

int EdbClass::ReadRecordColumns(const RecordRef& ref, const TableDef& table,
                                const TableDef* template_table, RecordColumns* out) const {
  if (ref.kind != kKindRecord) return -1;
  std::shared_ptr<const Page> page = file_.Fetch(ref.page_number);
  if (!page || ref.tag_index >= page->nodes().size()) return -1;
  const NodeEntry& node = page->nodes()[ref.tag_index];
  if (ref.data_offset > node.size) return -1;
  ByteView record = node.bytes.From(ref.data_offset);
  if (record.size() < kRecordHeaderSize) return -1;
  std::vector<const CatalogEntry*> columns;
  if (template_table) {
    for (const CatalogEntry& c : template_table->columns) columns.push_back(&c);
  }
  for (const CatalogEntry& c : table.columns) columns.push_back(&c);
  out->Split(record, columns, tagged_form());
  return 0;
}

std::unique_ptr<EdbClass> MakeReader(int version) {
  const VersionInfo* info = FindVersion(version);
  if (!info) return nullptr;
  if (info->family == PageFamily::kLarge) return std::make_unique<Edb2010Class>();
  return std::make_unique<EdbClass>();
}

std::unique_ptr<EdbClass> MakeReaderForPageSize(uint32_t page_size) {
  if (FamilyForPageSize(page_size) == PageFamily::kLarge) return std::make_unique<Edb2010Class>();
  return std::make_unique<EdbClass>();
}

}  // namespace tarnwell::engine
