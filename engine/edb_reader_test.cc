// The reader against databases written by the test writer, whose files
// Debian's libesedb reads back identically (testing/esedbexport_test.cc).
#include <gtest/gtest.h>

#include <filesystem>
#include <map>

#include "base/paths.h"
#include "engine/adjustment_probe.h"
#include "engine/catalog.h"
#include "engine/column_decoder.h"
#include "engine/edb_class.h"
#include "engine/tree_walk.h"
#include "testing/ese_writer.h"
#include "testing/forge_sample.h"

namespace tarnwell::engine {
namespace {

struct Format {
  const char* name;
  uint32_t page_size;
  uint32_t revision;
  int version;  // the Exchange version that revision names
};

const Format kFormats[] = {
    {"exchange2003_4k", 4096, 9, kExchange2000},
    {"exchange2007_8k", 8192, 12, kExchange2007},
    {"exchange2010_32k", 32768, 17, kExchange2010},
    {"exchange2013_32k", 32768, 20, kExchange2013},
};

class TempDatabase {
 public:
  TempDatabase(const forge::DatabaseLayout& layout, const forge::FileDamage& damage = {}) {
    EXPECT_TRUE(MakeTempDir("tarnwell-engine", &dir_).ok());
    path_ = dir_ + "/test.edb";
    Status s = forge::WriteDatabase(layout, path_, &manifest_, damage);
    EXPECT_TRUE(s.ok()) << s.ToString();
  }
  ~TempDatabase() { std::filesystem::remove_all(dir_); }
  const std::string& path() const { return path_; }
  const forge::Manifest& manifest() const { return manifest_; }

 private:
  std::string dir_, path_;
  forge::Manifest manifest_;
};

forge::DatabaseLayout Sample(const Format& f, uint32_t rows, uint32_t rows_per_leaf = 0,
                             uint32_t children_per_branch = 0) {
  forge::SampleOptions o;
  o.page_size = f.page_size;
  o.revision = f.revision;
  o.rows = rows;
  o.max_rows_per_leaf = rows_per_leaf;
  o.max_children_per_branch = children_per_branch;
  return forge::SampleDatabase(o);
}

std::unique_ptr<EdbClass> Open(const std::string& path, int version) {
  std::unique_ptr<EdbClass> reader = MakeReader(version);
  EXPECT_TRUE(reader->OpenDatabase(path, SourceDescriptor{}, version));
  return reader;
}

// What the sample writer put into the "Items" table, by row key order:
// the surviving (not deleted) rows' "Long" and "Name" values.
struct ItemRow {
  int64_t long_value;
  std::optional<std::string> name;
};
std::vector<ItemRow> ExpectedItems(const forge::DatabaseLayout& layout) {
  std::vector<ItemRow> rows;
  for (const forge::RowLayout& r : layout.tables[0].rows) {
    if (r.deleted) continue;
    ItemRow row{0, std::nullopt};
    for (const forge::Cell& c : r.cells) {
      if (c.column_id == 4) row.long_value = int32_t(LoadU32LE(c.value->data()));
      if (c.column_id == 128 && c.value) row.name = ByteView(*c.value).ToString();
    }
    rows.push_back(row);
  }
  return rows;
}

std::vector<ItemRow> ReadItems(EdbClass& reader) {
  std::vector<ItemRow> rows;
  const TableDef* items = reader.FindTable("Items");
  EXPECT_NE(items, nullptr);
  if (!items) return rows;
  size_t long_slot = 0, name_slot = 0;
  for (size_t i = 0; i < items->columns.size(); ++i) {
    if (items->columns[i].name == "Long") long_slot = i;
    if (items->columns[i].name == "Name") name_slot = i;
  }
  ColumnDecoder decoder(nullptr, 0);
  EXPECT_EQ(reader.ForEachRecord(*items,
                                 [&](const RecordRef&, RecordColumns& columns) {
                                   ItemRow row{0, std::nullopt};
                                   DecodedColumn l = decoder.Decode(items->columns[long_slot],
                                                                    columns.at(long_slot));
                                   row.long_value = l.i;
                                   DecodedColumn n = decoder.Decode(items->columns[name_slot],
                                                                    columns.at(name_slot));
                                   if (n.kind == DecodedColumn::Kind::kText) row.name = n.text;
                                   rows.push_back(row);
                                   return true;
                                 }),
            1);
  return rows;
}

void ExpectSameItems(const std::vector<ItemRow>& want, const std::vector<ItemRow>& got) {
  ASSERT_EQ(want.size(), got.size());
  for (size_t i = 0; i < want.size(); ++i) {
    EXPECT_EQ(want[i].long_value, got[i].long_value) << "row " << i;
    EXPECT_EQ(want[i].name, got[i].name) << "row " << i;
  }
}

class EdbReaderTest : public ::testing::TestWithParam<Format> {};

TEST_P(EdbReaderTest, DetectsTheVersionFromTheHeader) {
  const Format& f = GetParam();
  TempDatabase db(Sample(f, 3));
  EXPECT_EQ(EdbClass::DetectVersion(db.path()), f.version);
  EXPECT_EQ(EdbClass::DetectTemplateVersion(db.path()),
            f.version == kExchange2013 ? kVersionUnknown : f.version);
  EXPECT_EQ(EdbClass::DetectVersion(db.path() + ".missing"), -1);
  std::unique_ptr<EdbClass> reader = MakeReader(f.version);
  EXPECT_EQ(reader->family(), FindVersion(f.version)->family);
}

TEST_P(EdbReaderTest, StandardModeReadsCatalogAndRecordsInKeyOrder) {
  const Format& f = GetParam();
  // Few rows per leaf and branch: several tree levels.
  forge::DatabaseLayout layout = Sample(f, 300, 7, 4);
  TempDatabase db(layout);
  auto reader = Open(db.path(), f.version);
  ASSERT_EQ(reader->CollectTreeRecords(kCatalogRootPage), 1);
  // The catalog arrives in key order: MSysObjects' own record first.
  ASSERT_FALSE(reader->records().empty());
  ASSERT_EQ(reader->ParseCatalogRecords(), 1);
  EXPECT_TRUE(reader->records().empty());
  std::vector<std::string> names = reader->GetTableNames();
  for (const char* want : {"MSysObjects", "MSysObjectsShadow", "Items", "Folders"}) {
    EXPECT_NE(std::find(names.begin(), names.end(), want), names.end()) << want;
  }
  const TableDef* items = reader->FindTable("Items");
  ASSERT_NE(items, nullptr);
  ASSERT_EQ(items->columns.size(), layout.tables[0].columns.size());
  for (size_t i = 0; i < items->columns.size(); ++i) {
    EXPECT_EQ(items->columns[i].id, layout.tables[0].columns[i].id);
    EXPECT_EQ(items->columns[i].name, layout.tables[0].columns[i].name);
    EXPECT_EQ(items->columns[i].column_type(), layout.tables[0].columns[i].type);
  }
  ExpectSameItems(ExpectedItems(layout), ReadItems(*reader));
}

TEST_P(EdbReaderTest, AdvanceModeHarvestsTheSameCatalog) {
  const Format& f = GetParam();
  forge::DatabaseLayout layout = Sample(f, 400, 9, 3);
  TempDatabase db(layout);
  auto standard = Open(db.path(), f.version);
  standard->CollectTreeRecords(kCatalogRootPage);
  standard->ParseCatalogRecords();

  // Harvesting every tree: every live record of the items table is found.
  auto everything = Open(db.path(), f.version);
  everything->set_harvest_catalog_only(false);
  ASSERT_TRUE(everything->ScanLeafPages());
  ASSERT_EQ(everything->CollectLeafPageRecords(), 1);
  size_t live_rows = 0;
  for (const forge::RowLayout& r : layout.tables[0].rows) live_rows += !r.deleted;
  EXPECT_GE(everything->records().size(), live_rows);

  // The catalog harvest keeps the catalog's records only, and finds the same
  // tables as the tree walk.
  auto advance = Open(db.path(), f.version);
  ASSERT_TRUE(advance->ScanLeafPages());
  EXPECT_FALSE(advance->leaf_pages().empty());
  ASSERT_EQ(advance->CollectLeafPageRecords(), 1);
  EXPECT_TRUE(advance->leaf_pages().empty());
  EXPECT_LT(advance->records().size(), everything->records().size());
  ASSERT_EQ(advance->ParseCatalogRecords(), 1);
  ASSERT_EQ(advance->tables().size(), standard->tables().size());
  for (size_t i = 0; i < advance->tables().size(); ++i) {
    const TableDef& t = advance->tables()[i];
    const TableDef& s = standard->tables()[i];
    EXPECT_EQ(t.name(), s.name());
    EXPECT_EQ(t.table.root_page(), s.table.root_page()) << t.name();
    EXPECT_EQ(t.columns.size(), s.columns.size()) << t.name();
  }
  EXPECT_EQ(advance->running().load(), true);
}

TEST_P(EdbReaderTest, AdjustmentProbeFindsJunkAndMissingHeaders) {
  const Format& f = GetParam();
  const VersionInfo* v = FindVersion(f.version);
  forge::DatabaseLayout layout = Sample(f, 40);
  {
    forge::FileDamage junk;
    junk.junk_prefix = 512;
    TempDatabase db(layout, junk);
    auto reader = Open(db.path(), f.version);
    ASSERT_TRUE(reader->FindAdjustmentFactor());
    EXPECT_EQ(reader->file().adjustment(), 512);
    ASSERT_EQ(reader->CollectTreeRecords(kCatalogRootPage), 1);
    reader->ParseCatalogRecords();
    ExpectSameItems(ExpectedItems(layout), ReadItems(*reader));
  }
  {
    forge::FileDamage headless;
    headless.drop_header_pages = true;
    TempDatabase db(layout, headless);
    auto reader = Open(db.path(), f.version);
    ASSERT_TRUE(reader->FindAdjustmentFactor());
    EXPECT_EQ(reader->file().adjustment(), -2 * int64_t(v->page_size));
    EXPECT_EQ(reader->file().missing_pages(), 3u);
    ASSERT_EQ(reader->CollectTreeRecords(kCatalogRootPage), 1);
    reader->ParseCatalogRecords();
    ExpectSameItems(ExpectedItems(layout), ReadItems(*reader));
    // The leaf scan and the harvest agree with the read rule.
    reader->ScanLeafPages();
    for (const LeafPageEntry& e : reader->leaf_pages()) {
      EXPECT_GT(reader->file().PageNumberAt(e.file_position), 0);
    }
  }
}

TEST_P(EdbReaderTest, MakeRecordRefRereadsWhatTheWalkFound) {
  const Format& f = GetParam();
  TempDatabase db(Sample(f, 50, 6));
  auto reader = Open(db.path(), f.version);
  reader->CollectTreeRecords(kCatalogRootPage);
  reader->ParseCatalogRecords();
  const TableDef* items = reader->FindTable("Items");
  ASSERT_NE(items, nullptr);
  std::vector<RecordRef> refs;
  reader->ForEachRecord(*items, [&](const RecordRef& ref, RecordColumns&) {
    refs.push_back(ref);
    return true;
  });
  ASSERT_FALSE(refs.empty());
  for (const RecordRef& r : refs) {
    RecordRef again = reader->MakeRecordRef(r.page_number, r.tag_index);
    EXPECT_EQ(again.kind, kKindRecord);
    EXPECT_EQ(again.file_position, r.file_position);
    EXPECT_EQ(again.data_offset, r.data_offset);
    EXPECT_EQ(again.data_size, r.data_size);
    RecordColumns columns;
    EXPECT_EQ(reader->ReadRecordColumns(again, *items, nullptr, &columns), 0);
    // The record reference's position is two pages before the node.
    NodeCopy node = reader->ReadNode(r.page_number, r.tag_index);
    Bytes on_disk(node.size);
    reader->file().ReadAt(int64_t(r.file_position) + 2 * f.page_size, on_disk.data(), node.size);
    // Large pages keep node flags in the node's first u16; copies clear them.
    if (reader->family() == PageFamily::kLarge && on_disk.size() > 1) on_disk[1] &= 0x1F;
    EXPECT_EQ(on_disk, node.data);
  }
  EXPECT_EQ(reader->MakeRecordRef(refs[0].page_number, 0x7FFF).kind, kKindNone);
}

TEST_P(EdbReaderTest, LeafScanStopsWhenAskedAndRaisesTheFlagAgain) {
  const Format& f = GetParam();
  TempDatabase db(Sample(f, 200, 5));
  auto reader = Open(db.path(), f.version);
  RunningFlag running{false};
  reader->SetRunningFlag(&running);
  ASSERT_TRUE(reader->ScanLeafPages());
  EXPECT_TRUE(reader->leaf_pages().empty());
  EXPECT_TRUE(running.load());
  ASSERT_TRUE(reader->ScanLeafPages());
  EXPECT_FALSE(reader->leaf_pages().empty());
  for (const LeafPageEntry& e : reader->leaf_pages()) {
    Bytes header(kPageHeaderCopySize);
    reader->file().ReadAt(e.file_position, header.data(), header.size());
    EXPECT_TRUE(IsLeafDataPage(DecodePageHeader(ByteView(header), reader->family()).flags));
  }
}

INSTANTIATE_TEST_SUITE_P(Formats, EdbReaderTest, ::testing::ValuesIn(kFormats),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(LeafPageFilterTest, TakesOnlyLeavesOfDataTrees) {
  EXPECT_TRUE(IsLeafDataPage(0x0002));
  EXPECT_TRUE(IsLeafDataPage(0x2803 & ~0x1u));
  EXPECT_FALSE(IsLeafDataPage(0x0082));  // long-value leaf
  EXPECT_FALSE(IsLeafDataPage(0x0042));  // index leaf
  EXPECT_FALSE(IsLeafDataPage(0x0004));  // branch
  EXPECT_FALSE(IsLeafDataPage(0));
}

TEST(CatalogTest, FilesObjectsUnderTheirTableAndListsLegacyNames) {
  CatalogBuilder b;
  auto entry = [](uint32_t table, uint16_t type, uint32_t id, std::string name) {
    CatalogEntry e;
    e.table_object_id = table;
    e.type = type;
    e.id = id;
    e.column_type_or_root = id * 10;
    e.name = std::move(name);
    return e;
  };
  // Harvested in file order: not in key order, with a stale duplicate.
  b.Add(entry(6, kCatalogTable, 6, "Mailbox"));
  b.Add(entry(5, kCatalogLongValue, 8, "lv2"));
  b.Add(entry(5, kCatalogColumn, 1, "a"));
  b.Add(entry(1, kCatalogColumn, 1, "orphan"));  // owned by no table: dropped
  b.Add(entry(5, kCatalogTable, 5, "1-23"));
  b.Add(entry(5, kCatalogLongValue, 7, "lv1"));
  b.Add(entry(5, kCatalogIndex, 9, "ix"));
  b.Add(entry(5, kCatalogColumn, 1, "a-stale"));
  std::vector<TableDef> tables = b.Finish();
  ASSERT_EQ(tables.size(), 2u);
  EXPECT_EQ(tables[0].name(), "1-23");
  ASSERT_EQ(tables[0].columns.size(), 1u);
  EXPECT_EQ(tables[0].columns[0].name, "a");
  EXPECT_TRUE(tables[1].columns.empty());
  ASSERT_TRUE(tables[0].long_value);
  EXPECT_EQ(tables[0].long_value->name, "lv1");
  EXPECT_EQ(ListedTableName("1-23", PageFamily::kLegacy), "23");
  EXPECT_EQ(ListedTableName("Mailbox", PageFamily::kLegacy), "Mailbox");
  EXPECT_EQ(ListedTableName("1-23", PageFamily::kLarge), "1-23");
}

}  // namespace
}  // namespace tarnwell::engine
