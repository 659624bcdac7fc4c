// The reader against databases written by the test writer, whose files
// Debian's libesedb reads back identically (testing/esedbexport_test.cc).
#include <gtest/gtest.h>

#include <algorithm>
#include <optional>
#include <utility>

#include "engine/adjustment_probe.h"
#include "engine/column_decoder.h"
#include "engine/engine_test_support.h"
#include "engine/tree_walk.h"
#include "testing/forge_sample.h"

namespace tarnwell::engine {
namespace {

forge::DatabaseLayout Sample(const Format& f, uint32_t rows, uint32_t rows_per_leaf,
                             uint32_t children_per_branch) {
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

// The "Items" table by row key order: (Long, Name) of the rows not deleted.
using ItemRow = std::pair<int64_t, std::optional<std::string>>;

std::vector<ItemRow> ExpectedItems(const forge::DatabaseLayout& layout) {
  std::vector<ItemRow> rows;
  for (const forge::RowLayout& r : layout.tables[0].rows) {
    if (r.deleted) continue;
    ItemRow row{0, std::nullopt};
    for (const forge::Cell& c : r.cells) {
      if (c.column_id == 4) row.first = int32_t(LoadU32LE(c.value->data()));
      if (c.column_id == 128 && c.value) row.second = ByteView(*c.value).ToString();
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
  const ColumnDecoder decoder(nullptr, 0);
  auto add_row = [&](const RecordRef&, RecordColumns& columns) {
    const DecodedColumn l = decoder.Decode(items->columns[long_slot], columns.at(long_slot));
    const DecodedColumn n = decoder.Decode(items->columns[name_slot], columns.at(name_slot));
    rows.emplace_back(l.i,
                      n.kind == DecodedColumn::Kind::kText ? std::optional(n.text) : std::nullopt);
    return true;
  };
  EXPECT_EQ(reader.ForEachRecord(*items, add_row), 1);
  return rows;
}

class EdbReaderTest : public ::testing::TestWithParam<Format> {};

TEST_P(EdbReaderTest, TreeWalkReadsCatalogRecordsAndRefsInKeyOrder) {
  const Format& f = GetParam();
  // Few rows per leaf and branch: several tree levels.
  forge::DatabaseLayout layout = Sample(f, 300, 7, 4);
  TempDatabase db(layout);
  EXPECT_EQ(EdbClass::DetectVersion(db.path()), f.version);
  EXPECT_EQ(EdbClass::DetectTemplateVersion(db.path()),
            f.version == kExchange2013 ? kVersionUnknown : f.version);
  EXPECT_EQ(EdbClass::DetectVersion(db.path() + ".missing"), -1);

  auto reader = Open(db.path(), f.version);
  EXPECT_EQ(reader->family(), FindVersion(f.version)->family);
  ASSERT_EQ(reader->CollectTreeRecords(kCatalogRootPage), 1);
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
  EXPECT_EQ(ReadItems(*reader), ExpectedItems(layout));

  // A record reference made from (page, tag) finds what the walk found.
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

TEST_P(EdbReaderTest, LeafHarvestFindsTheSameCatalog) {
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
  EXPECT_GE(everything->records().size(), ExpectedItems(layout).size());

  // A scan asked to stop finds nothing and raises the flag again.
  auto advance = Open(db.path(), f.version);
  RunningFlag running{false};
  advance->SetRunningFlag(&running);
  ASSERT_TRUE(advance->ScanLeafPages());
  EXPECT_TRUE(advance->leaf_pages().empty());
  EXPECT_TRUE(running.load());

  // The catalog harvest keeps the catalog's records only, and finds the same
  // tables as the tree walk.
  ASSERT_TRUE(advance->ScanLeafPages());
  ASSERT_FALSE(advance->leaf_pages().empty());
  for (const LeafPageEntry& e : advance->leaf_pages()) {
    Bytes header(kPageHeaderCopySize);
    advance->file().ReadAt(e.file_position, header.data(), header.size());
    EXPECT_TRUE(IsLeafDataPage(DecodePageHeader(ByteView(header), advance->family()).flags));
  }
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
  EXPECT_TRUE(advance->running().load());
}

TEST_P(EdbReaderTest, AdjustmentProbeFindsJunkAndMissingHeaders) {
  const Format& f = GetParam();
  const forge::DatabaseLayout layout = Sample(f, 40, 0, 0);
  forge::FileDamage junk, headless;
  junk.junk_prefix = 512;
  headless.drop_header_pages = true;
  const struct {
    forge::FileDamage damage;
    int64_t adjustment;
    uint32_t missing_pages;
  } kCases[] = {{junk, 512, 0}, {headless, -2 * int64_t(f.page_size), 3}};
  for (const auto& c : kCases) {
    SCOPED_TRACE("adjustment " + std::to_string(c.adjustment));
    TempDatabase db(layout, c.damage);
    auto reader = Open(db.path(), f.version);
    ASSERT_TRUE(reader->FindAdjustmentFactor());
    EXPECT_EQ(reader->file().adjustment(), c.adjustment);
    EXPECT_EQ(reader->file().missing_pages(), c.missing_pages);
    ASSERT_EQ(reader->CollectTreeRecords(kCatalogRootPage), 1);
    reader->ParseCatalogRecords();
    EXPECT_EQ(ReadItems(*reader), ExpectedItems(layout));
    // The leaf scan steps over what is not a page.
    reader->ScanLeafPages();
    for (const LeafPageEntry& e : reader->leaf_pages()) {
      EXPECT_GT(reader->file().PageNumberAt(e.file_position), 0);
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Formats, EdbReaderTest, ::testing::ValuesIn(kFormats),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(LeafPageFilterTest, TakesOnlyLeavesOfDataTrees) {
  EXPECT_TRUE(IsLeafDataPage(0x0002));
  EXPECT_TRUE(IsLeafDataPage(0x2803 & ~0x1u));
  for (uint32_t flags :
       {0x0082u /* long-value leaf */, 0x0042u /* index leaf */, 0x0004u /* branch */, 0u}) {
    EXPECT_FALSE(IsLeafDataPage(flags)) << flags;
  }
}

TEST(CatalogTest, FilesObjectsUnderTheirTableAndListsLegacyNames) {
  CatalogBuilder b;
  auto add = [&](uint32_t table, uint16_t type, uint32_t id, std::string name) {
    CatalogEntry e;
    e.table_object_id = table;
    e.type = type;
    e.id = id;
    e.column_type_or_root = id * 10;
    e.name = std::move(name);
    b.Add(e);
  };
  // Harvested in file order: not in key order, with a stale duplicate.
  add(6, kCatalogTable, 6, "Mailbox");
  add(5, kCatalogLongValue, 8, "lv2");
  add(5, kCatalogColumn, 1, "a");
  add(1, kCatalogColumn, 1, "orphan");  // owned by no table: dropped
  add(5, kCatalogTable, 5, "1-23");
  add(5, kCatalogLongValue, 7, "lv1");
  add(5, kCatalogIndex, 9, "ix");
  add(5, kCatalogColumn, 1, "a-stale");
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
