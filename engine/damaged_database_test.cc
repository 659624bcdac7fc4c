// Damaged databases: every reader stage must finish on them, keep what the
// damage did not touch, and never read outside a buffer (the sanitizer build
// runs these too).
//
// Each case starts from a database the test writer builds with deep trees
// (several branch levels, a few rows a leaf), damages it, and runs the stages
// the table dump and the deep scan run: catalog walk and parse, table names,
// every table's records with every column decoded, a keyed cursor over each
// table, the whole-file leaf-page scan and its harvest. Records are
// identified by (page, tag); a record found must be one of the undamaged
// database's, with the same values, unless the damage wrote random bytes.
#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <memory>
#include <random>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "engine/column_decoder.h"
#include "engine/engine_test_support.h"
#include "engine/tree_cursor.h"
#include "testing/forge_sample.h"

namespace tarnwell::engine {
namespace {

using RecordId = std::pair<uint32_t, uint16_t>;  // page, tag
using Rows = std::map<RecordId, std::string>;    // record -> its decoded values

constexpr uint32_t kRows = 60;
constexpr uint32_t kRowsPerLeaf = 4;
constexpr uint32_t kChildrenPerBranch = 3;
constexpr size_t kHeaderSignatureAt = 4;
constexpr size_t kMaxCursorSteps = 100000;
constexpr char kItems[] = "Items";
constexpr char kFolders[] = "Folders";

struct Outcome {
  bool opened = false;
  std::vector<std::string> table_names;
  std::map<std::string, Rows> rows;  // by table name
  bool cursor_ended = true;          // every cursor walk ended by itself
  size_t leaf_pages = 0;
  std::set<RecordId> harvested;
  size_t harvested_twice = 0;
};

std::string Describe(const DecodedColumn& d) {
  std::string s = std::to_string(int(d.kind)) + "|" + std::to_string(d.b) + "|" +
                  std::to_string(d.i) + "|" + std::to_string(d.u) + "|" + std::to_string(d.d) +
                  "|" + d.text + "|" + ToHex(ByteView(d.bytes));
  for (const DecodedColumn& v : d.values) s += "[" + Describe(v) + "]";
  return s;
}

// Opens by the file's own header when `version` is 0, else as that Exchange
// version (with the adjustment probe), and runs every stage.
Outcome RunStages(const Bytes& bytes, int version) {
  Outcome out;
  TempDatabase file(bytes);
  std::unique_ptr<EdbClass> reader;
  if (version == kVersionUnknown) {
    if (!InspectDatabase(file.path(), &reader).ok()) return out;
  } else {
    reader = MakeReader(version);
    if (!reader->OpenDatabase(file.path(), SourceDescriptor{}, version)) return out;
    reader->FindAdjustmentFactor();
  }
  out.opened = true;

  EXPECT_NE(reader->CollectTreeRecords(kCatalogRootPage), -1);
  EXPECT_EQ(reader->ParseCatalogRecords(), 1);
  out.table_names = reader->GetTableNames();

  const LongValueReader long_values = reader->long_values();
  for (const TableDef& table : reader->tables()) {
    const ColumnDecoder decoder(&long_values, table.long_value ? table.long_value->root_page() : 0);
    Rows& rows = out.rows[table.name()];
    reader->ForEachRecord(table, [&](const RecordRef& ref, RecordColumns& columns) {
      std::string values;
      for (size_t i = 0; i < table.columns.size(); ++i) {
        values += Describe(decoder.Decode(table.columns[i], columns.at(i))) + ";";
      }
      rows[{ref.page_number, ref.tag_index}] = values;
      return true;
    });
    TreeCursor cursor(reader->file());
    size_t steps = 0;
    if (cursor.Seek(table.table.root_page(), ByteView())) {
      while (steps < kMaxCursorSteps && cursor.Next()) ++steps;
    }
    if (steps == kMaxCursorSteps) out.cursor_ended = false;
  }

  reader->ScanLeafPages();
  out.leaf_pages = reader->leaf_pages().size();
  reader->set_harvest_catalog_only(false);  // every tree's records, to check them all
  EXPECT_EQ(reader->CollectLeafPageRecords(), 1);
  for (const RecordRef& r : reader->records()) {
    if (!out.harvested.insert({r.page_number, r.tag_index}).second) ++out.harvested_twice;
  }
  return out;
}

struct Pristine {
  uint32_t page_size = 0;
  Bytes bytes;
  forge::Manifest manifest;
  Outcome outcome;

  const forge::TableManifest& table(const std::string& name) const {
    for (const auto& t : manifest.tables) {
      if (t.name == name) return t;
    }
    ADD_FAILURE() << "no table " << name;
    return manifest.tables.front();
  }
  size_t PageOffset(uint32_t page) const { return size_t(page + 1) * page_size; }
  Page ReadPage(const Bytes& file, uint32_t page) const {
    const size_t at = PageOffset(page);
    return Page(Bytes(file.begin() + at, file.begin() + at + page_size),
                FamilyForPageSize(page_size));
  }
  // The records of the subtree below page n, as a walk from it finds them.
  std::set<RecordId> RecordsUnder(uint32_t page) const {
    TempDatabase file(bytes);
    std::unique_ptr<EdbClass> reader;
    EXPECT_TRUE(InspectDatabase(file.path(), &reader).ok());
    std::set<RecordId> ids;
    if (!reader) return ids;
    reader->CollectTreeRecords(page);
    for (const RecordRef& r : reader->records()) ids.insert({r.page_number, r.tag_index});
    return ids;
  }
  std::set<RecordId> RecordsOnPage(uint32_t page) const {
    std::set<RecordId> ids;
    for (const auto& [id, values] : outcome.rows.at(kItems)) {
      if (id.first == page) ids.insert(id);
    }
    return ids;
  }
};

const Pristine& PristineFor(const Format& f) {
  static std::map<std::string, std::unique_ptr<Pristine>> cache;
  auto& p = cache[f.name];
  if (!p) {
    p = std::make_unique<Pristine>();
    p->page_size = f.page_size;
    forge::SampleOptions options;
    options.page_size = f.page_size;
    options.revision = f.revision;
    options.rows = kRows;
    options.max_rows_per_leaf = kRowsPerLeaf;
    options.max_children_per_branch = kChildrenPerBranch;
    Status s;
    p->bytes = forge::BuildDatabase(forge::SampleDatabase(options), &p->manifest, {}, &s);
    EXPECT_TRUE(s.ok()) << s.ToString();
    p->outcome = RunStages(p->bytes, kVersionUnknown);
  }
  return *p;
}

// The file position of the child page number of branch node `tag` on page n.
size_t ChildFieldAt(const Pristine& db, const Bytes& file, uint32_t page, uint16_t tag) {
  const Page p = db.ReadPage(file, page);
  RecordRef ref;
  EXPECT_EQ(DecodeNode(p, tag, &ref), NodeDecode::kOk) << "page " << page << " tag " << tag;
  EXPECT_GE(ref.data_size, 4) << "page " << page << " is no branch page";
  return db.PageOffset(page) + p.nodes()[tag].offset + ref.data_offset;
}

uint32_t ChildOf(const Pristine& db, uint32_t page, uint16_t tag) {
  return LoadU32LE(db.bytes.data() + ChildFieldAt(db, db.bytes, page, tag));
}

// The branch page whose node points to page n.
uint32_t ParentOf(const Pristine& db, uint32_t page) {
  const forge::TableManifest& items = db.table(kItems);
  std::vector<uint32_t> branches = items.branch_pages;
  branches.push_back(items.root_page);
  for (uint32_t b : branches) {
    const Page p = db.ReadPage(db.bytes, b);
    for (size_t tag = 1; tag < p.nodes().size(); ++tag) {
      if (ChildOf(db, b, uint16_t(tag)) == page) return b;
    }
  }
  ADD_FAILURE() << "page " << page << " has no parent";
  return 0;
}

// Every Items record but `lost` is in `found` (rows or harvested ids).
template <typename Found>
void ExpectItemsFound(const Pristine& db, const Found& found, const std::set<RecordId>& lost,
                      const char* by) {
  size_t missing = 0;
  for (const auto& [id, values] : db.outcome.rows.at(kItems)) {
    if (lost.count(id) || found.count(id)) continue;
    ADD_FAILURE() << by << " lost the Items record at page " << id.first << " tag " << id.second;
    if (++missing > 5) break;
  }
}

void CheckPristine(const Pristine& db) {
  const Outcome& o = db.outcome;
  ASSERT_TRUE(o.opened);
  ASSERT_EQ(o.rows.count(kItems), 1u);
  // Every thirteenth sample row is deleted.
  EXPECT_EQ(o.rows.at(kItems).size(), kRows - kRows / 13);
  EXPECT_EQ(o.rows.at(kFolders).size(), 4u);
  ExpectItemsFound(db, o.harvested, {}, "the harvest");
  // The trees must be deep enough for the branch damage below.
  ASSERT_GE(db.table(kItems).branch_pages.size(), 3u);
  ASSERT_GE(db.table(kItems).leaf_pages.size(), 4u);
}

// Every record found is one of the undamaged database's, with its values.
void ExpectOnlyOriginalRows(const Outcome& damaged, const Pristine& db) {
  for (const auto& [table, rows] : damaged.rows) {
    auto original = db.outcome.rows.find(table);
    ASSERT_NE(original, db.outcome.rows.end()) << "unknown table " << table;
    for (const auto& [id, values] : rows) {
      auto it = original->second.find(id);
      ASSERT_NE(it, original->second.end())
          << table << ": record at page " << id.first << " tag " << id.second << " is new";
      EXPECT_EQ(values, it->second) << table << ": page " << id.first << " tag " << id.second;
    }
  }
}

// Every Items record but `lost` is still found, and Folders is whole.
void ExpectRowsKept(const Outcome& damaged, const Pristine& db, const std::set<RecordId>& lost) {
  ASSERT_EQ(damaged.rows.count(kItems), 1u) << "the catalog lost Items";
  ASSERT_EQ(damaged.rows.count(kFolders), 1u) << "the catalog lost Folders";
  ExpectItemsFound(db, damaged.rows.at(kItems), lost, "the tree walk");
  EXPECT_EQ(damaged.rows.at(kFolders).size(), db.outcome.rows.at(kFolders).size());
}

void ExpectStagesEnded(const Outcome& o) {
  EXPECT_TRUE(o.cursor_ended) << "a cursor walk went on and on";
  EXPECT_EQ(o.harvested_twice, 0u) << "the harvest took a record twice";
}

class DamagedDatabaseTest : public ::testing::TestWithParam<Format> {};

TEST_P(DamagedDatabaseTest, TruncatedFileKeepsOnlyOriginalRecords) {
  const Format& f = GetParam();
  const Pristine& db = PristineFor(f);
  ASSERT_NO_FATAL_FAILURE(CheckPristine(db));
  std::mt19937 random(f.page_size + f.revision);
  std::vector<size_t> cuts = {0,
                              1,
                              kHeaderSignatureAt + 2,
                              db.page_size / 2,
                              db.page_size,
                              2 * db.page_size,
                              db.PageOffset(kCatalogRootPage) + db.page_size / 2,
                              db.bytes.size() - 1};
  for (int i = 0; i < 6; ++i) cuts.push_back(random() % db.bytes.size());
  for (size_t cut : cuts) {
    SCOPED_TRACE("cut at " + std::to_string(cut));
    const Bytes file(db.bytes.begin(), db.bytes.begin() + cut);
    for (int version : {int(kVersionUnknown), f.version}) {
      const Outcome o = RunStages(file, version);
      ExpectStagesEnded(o);
      ExpectOnlyOriginalRows(o, db);
      if (cut == 0 && version == kVersionUnknown) {
        EXPECT_FALSE(o.opened);
      }
      if (cut < 2 * db.page_size) {  // not one page
        EXPECT_TRUE(o.table_names.empty());
        EXPECT_TRUE(o.rows.empty()) << "records without any page";
        EXPECT_EQ(o.leaf_pages, 0u);
        EXPECT_TRUE(o.harvested.empty());
      }
    }
  }
}

TEST_P(DamagedDatabaseTest, RandomBytesOverPagesEndEveryStage) {
  const Format& f = GetParam();
  const Pristine& db = PristineFor(f);
  ASSERT_NO_FATAL_FAILURE(CheckPristine(db));
  std::mt19937 random(f.page_size + f.revision + 1);
  const auto& leaves = db.table(kItems).leaf_pages;
  const size_t blocks = db.bytes.size() / db.page_size;
  for (int round = 0; round < 10; ++round) {
    // First an Items leaf alone, which loses only its own records; then one
    // to three blocks anywhere, header blocks included.
    const bool one_leaf = round < 4;
    std::vector<size_t> hit;
    if (one_leaf) hit.push_back(leaves[random() % leaves.size()] + 1);
    for (int k = 0; !one_leaf && k <= round % 3; ++k) hit.push_back(random() % blocks);
    Bytes file = db.bytes;
    std::string which;
    for (size_t block : hit) {
      which += " " + std::to_string(block);
      for (size_t i = 0; i < db.page_size; ++i) file[block * db.page_size + i] = uint8_t(random());
    }
    SCOPED_TRACE("random bytes over file blocks" + which);
    for (int version : {int(kVersionUnknown), f.version}) {
      const Outcome o = RunStages(file, version);
      ExpectStagesEnded(o);
      if (!one_leaf) continue;
      EXPECT_TRUE(o.opened);
      ExpectRowsKept(o, db, db.RecordsOnPage(uint32_t(hit[0] - 1)));
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Formats, DamagedDatabaseTest, ::testing::ValuesIn(kFormats),
                         [](const auto& info) { return std::string(info.param.name); });

struct Damage {
  Bytes file;
  std::set<RecordId> lost;          // Items records the tree walks may lose
  std::set<RecordId> harvest_lost;  // Items records the leaf harvest may lose
  bool header_readable = true;      // false: only a reader told the version opens it
};

struct StructuralCase {
  const char* name;
  std::function<Damage(const Pristine&)> apply;
};

Damage BranchToItself(const Pristine& db) {
  // The topmost non-root branch: its first child now is the page itself.
  const uint32_t page = db.table(kItems).branch_pages.back();
  Damage d{db.bytes, db.RecordsUnder(ChildOf(db, page, 1)), {}};
  StoreU32LE(d.file.data() + ChildFieldAt(db, d.file, page, 1), page);
  return d;
}

Damage BranchToParentAndRoot(const Pristine& db) {
  // A bottom branch whose first child is its parent and whose second is the
  // root: two cycles through pages the walk is still inside.
  const forge::TableManifest& items = db.table(kItems);
  const uint32_t page = items.branch_pages.front();
  Damage d{db.bytes, db.RecordsUnder(ChildOf(db, page, 1)), {}};
  const std::set<RecordId> second = db.RecordsUnder(ChildOf(db, page, 2));
  d.lost.insert(second.begin(), second.end());
  StoreU32LE(d.file.data() + ChildFieldAt(db, d.file, page, 1), ParentOf(db, page));
  StoreU32LE(d.file.data() + ChildFieldAt(db, d.file, page, 2), items.root_page);
  return d;
}

Damage LeafChainCycle(const Pristine& db) {
  // The last leaf links back to the first, and the first leaf's successor
  // links to itself.
  const auto& leaves = db.table(kItems).leaf_pages;
  Damage d{db.bytes, {}, {}};
  StoreU32LE(d.file.data() + db.PageOffset(leaves.back()) + kPageNextOffset, leaves.front());
  StoreU32LE(d.file.data() + db.PageOffset(leaves[1]) + kPageNextOffset, leaves[1]);
  return d;
}

Damage TagCountBeyondPage(const Pristine& db) {
  const uint32_t page = db.table(kItems).leaf_pages[1];
  Damage d{db.bytes, db.RecordsOnPage(page), db.RecordsOnPage(page)};
  StoreU16LE(d.file.data() + db.PageOffset(page) + kPageTagCountOffset, 0xFFFF);
  return d;
}

// Sets every value bit of a tag's size word (field 0) or offset word (2).
void MaxTagField(const Pristine& db, Damage& d, uint32_t page, size_t tag, size_t field) {
  const bool large = FamilyForPageSize(db.page_size) == PageFamily::kLarge;
  uint8_t* word = d.file.data() + db.PageOffset(page) + db.page_size - (tag + 1) * kTagSize + field;
  StoreU16LE(word, uint16_t(LoadU16LE(word) | (large ? kLargeTagValueMask : kLegacyTagValueMask)));
}

Damage NodesPastPageEnd(const Pristine& db) {
  // Tag 1 claims the largest size a tag can say; tag 2 starts at the
  // largest offset. Only those two records may go.
  const uint32_t page = db.table(kItems).leaf_pages[2];
  Damage d{db.bytes, {{page, 1}, {page, 2}}, {{page, 1}, {page, 2}}};
  MaxTagField(db, d, page, 1, 0);
  MaxTagField(db, d, page, 2, 2);
  return d;
}

Damage RootNodePastPageEnd(const Pristine& db) {
  // The root's first node overruns the page: its whole subtree is lost.
  const uint32_t root = db.table(kItems).root_page;
  Damage d{db.bytes, db.RecordsUnder(ChildOf(db, root, 1)), {}};
  MaxTagField(db, d, root, 1, 0);
  return d;
}

Damage WrongHeaderSignature(const Pristine& db) {
  Damage d{db.bytes, {}, {}, false};
  for (size_t block : {size_t(0), size_t(db.page_size)}) {
    StoreU32LE(d.file.data() + block + kHeaderSignatureAt, 0x12345678);
  }
  return d;
}

const StructuralCase kStructuralCases[] = {
    {"BranchToItself", BranchToItself},
    {"BranchToParentAndRoot", BranchToParentAndRoot},
    {"LeafChainCycle", LeafChainCycle},
    {"TagCountBeyondPage", TagCountBeyondPage},
    {"NodesPastPageEnd", NodesPastPageEnd},
    {"RootNodePastPageEnd", RootNodePastPageEnd},
    {"WrongHeaderSignature", WrongHeaderSignature},
};

void PrintTo(const StructuralCase& c, std::ostream* os) { *os << c.name; }

class StructuralDamageTest : public ::testing::TestWithParam<std::tuple<Format, StructuralCase>> {};

TEST_P(StructuralDamageTest, KeepsEveryUndamagedRecord) {
  const auto& [format, damage_case] = GetParam();
  const Pristine& db = PristineFor(format);
  ASSERT_NO_FATAL_FAILURE(CheckPristine(db));
  const Damage damage = damage_case.apply(db);
  ASSERT_FALSE(::testing::Test::HasFailure());
  for (int version : {int(kVersionUnknown), format.version}) {
    SCOPED_TRACE("version " + std::to_string(version));
    const Outcome o = RunStages(damage.file, version);
    if (version == kVersionUnknown && !damage.header_readable) {
      EXPECT_FALSE(o.opened);
      continue;
    }
    ASSERT_TRUE(o.opened);
    ExpectStagesEnded(o);
    ExpectOnlyOriginalRows(o, db);
    ExpectRowsKept(o, db, damage.lost);
    // The harvest reads leaves whether or not a tree reaches them: only
    // records on damaged leaves may be missing from it.
    ExpectItemsFound(db, o.harvested, damage.harvest_lost, "the harvest");
  }
}

INSTANTIATE_TEST_SUITE_P(Formats, StructuralDamageTest,
                         ::testing::Combine(::testing::ValuesIn(kFormats),
                                            ::testing::ValuesIn(kStructuralCases)),
                         [](const auto& info) {
                           return std::string(std::get<1>(info.param).name) + "_" +
                                  std::get<0>(info.param).name;
                         });

}  // namespace
}  // namespace tarnwell::engine
