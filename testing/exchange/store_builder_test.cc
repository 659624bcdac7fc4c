// The store builder's databases read back through the program's ESE engine:
// every table, row and value the manifest promises must be there, in the
// stated order and encoding.
#include "testing/exchange/store_builder.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <map>

#include "testing/exchange/store_test_support.h"

namespace tarnwell::forge::exchange {
namespace {

struct StoreCase {
  int version;
  bool public_store;
  bool damaged;
  uint32_t rows_per_leaf;
};

std::string CaseName(const ::testing::TestParamInfo<StoreCase>& info) {
  const StoreCase& c = info.param;
  return "v" + std::to_string(c.version) + (c.public_store ? "_public" : "_private") +
         (c.damaged ? "_damaged" : "") + (c.rows_per_leaf ? "_deep" : "");
}

LegacyStoreOptions OptionsFor(const StoreCase& c) {
  LegacyStoreOptions o;
  o.version = c.version;
  o.public_store = c.public_store;
  if (c.damaged) o.damage = DamageOptions::All();
  o.max_rows_per_leaf = c.rows_per_leaf;
  return o;
}

class StoreReadBackTest : public ::testing::TestWithParam<StoreCase> {};

TEST_P(StoreReadBackTest, EveryTableRowAndValueMatchesTheManifest) {
  Store store(OptionsFor(GetParam()));
  const StoreManifest& m = store.manifest();
  std::vector<std::string> expected = {"MSysObjects", "MSysObjectsShadow", "Mailbox", "Folders",
                                       "Msg",         m.attachment_table};
  for (const ManifestFolder& f : m.folders) expected.push_back(f.content_table);
  std::vector<std::string> names;
  for (const engine::TableDef& t : store.reader().tables()) names.push_back(t.name());
  EXPECT_EQ(names, expected);
  // The legacy table list drops everything up to the first '-'.
  const std::vector<std::string> listed = store.reader().GetTableNames();
  for (const ManifestFolder& f : m.folders) {
    EXPECT_NE(std::find(listed.begin(), listed.end(), f.content_name), listed.end())
        << f.content_name;
  }
  EXPECT_EQ(m.attachment_table, GetParam().public_store   ? "1-A"
                                : GetParam().version == 1 ? "1-23"
                                                          : "1-24");

  const Table mailboxes = store.Read("Mailbox");
  ASSERT_EQ(mailboxes.rows.size(), m.mailboxes.size());
  for (const ManifestMailbox& mb : m.mailboxes) {
    const ReadRow& row = mailboxes.rows.at(mb.row);
    EXPECT_EQ(Text(row, "S3001"), mb.name);
    EXPECT_EQ(Le(Blob(row, "Q6764")), mb.number);
    EXPECT_EQ(Blob(row, "N66a0"), mb.property);
  }
  const Table folders = store.Read("Folders");
  ASSERT_EQ(folders.rows.size(), m.folders.size());
  for (const ManifestFolder& f : m.folders) {
    const ReadRow& row = folders.rows.at(f.row);
    EXPECT_EQ(Le(Blob(row, "Q6748")), f.id) << f.name;
    EXPECT_EQ(Le(Blob(row, "Q6749")), f.parent) << f.name;
    EXPECT_EQ(Text(row, "S3001"), f.name);
    // Readers drop rows without all four columns; ours always have them.
    EXPECT_FALSE(Text(row, "S3613").empty()) << f.name;
    EXPECT_EQ(Number(row, "L3602"), f.item_count) << f.name;
  }

  const Table msg = store.Read("Msg");
  EXPECT_EQ(msg.rows.size(), m.msg_rows);
  EXPECT_EQ(m.msg_rows, m.messages + m.duplicates.size());
  std::map<Bytes, const ReadRow*> by_key;  // the first row of each key, as readers keep it
  std::map<Bytes, int> seen;
  Bytes previous;
  for (const ReadRow& row : msg.rows) {
    const Bytes key = Blob(row, "N67b0");
    EXPECT_LE(previous, key) << "Msg is in key order";
    previous = key;
    by_key.emplace(key, &row);
    ++seen[key];
  }
  for (const DuplicateRow& d : m.duplicates) {
    EXPECT_EQ(seen[d.key], 2);
    EXPECT_NE(Text(*by_key[d.key], "Se1d"), d.subject) << "the first row comes first";
  }

  const Table attachments = store.Read(m.attachment_table);
  EXPECT_EQ(attachments.rows.size(), m.attachment_rows);
  std::map<Bytes, std::vector<const ReadRow*>> attachments_of;
  for (const ReadRow& row : attachments.rows) attachments_of[Blob(row, "N67b0")].push_back(&row);
  // Which name column a reader meets first, from the catalog, not the builder.
  const auto& acols = attachments.columns;
  const bool file_name_first = std::find(acols.begin(), acols.end(), "S3704") <
                               std::find(acols.begin(), acols.end(), "S3001");
  EXPECT_EQ(file_name_first, GetParam().version != 4);

  size_t items = 0;
  for (const ManifestFolder& f : m.folders) {
    const Table content = store.Read(f.content_table);
    ASSERT_EQ(content.rows.size(), f.items.size()) << f.content_table;
    EXPECT_EQ(f.item_count, f.items.size());
    for (size_t i = 0; i < f.items.size(); ++i) {
      const ManifestItem& it = f.items[i];
      SCOPED_TRACE(f.name + " / " + it.subject);
      ExpectListColumns(content.rows[i], it);

      auto found = by_key.find(it.key);
      ASSERT_EQ(found != by_key.end(), it.in_msg_table);
      if (!it.in_msg_table) continue;
      ++items;
      const ReadRow& row = *found->second;
      ExpectListColumns(row, it);
      ExpectPropertyColumns(row, it);

      const std::vector<const ReadRow*>& rows = attachments_of[it.key];
      ASSERT_EQ(rows.size(), it.attachments.size());
      for (size_t k = 0; k < rows.size(); ++k) {
        const ManifestAttachment& a = it.attachments[k];
        const ReadRow& arow = *rows[k];
        EXPECT_EQ(Blob(arow, m.attachment_key_column), a.key);
        const std::string display = Text(arow, "S3001"), file = Text(arow, "S3704");
        const std::string first = file_name_first ? file : display;
        EXPECT_EQ(first.empty() ? (file_name_first ? display : file) : first, a.name);
        const Bytes data = Blob(arow, "N3701");
        EXPECT_EQ(data.size(), a.size);
        EXPECT_EQ(Sha256Hex(ByteView(data)), a.sha256);
        EXPECT_EQ(data, a.data);
      }
    }
  }
  EXPECT_EQ(items, m.messages);
}

INSTANTIATE_TEST_SUITE_P(
    Versions, StoreReadBackTest,
    ::testing::Values(StoreCase{4, false, false, 0}, StoreCase{1, false, false, 0},
                      StoreCase{2, false, false, 0}, StoreCase{4, false, true, 3},
                      StoreCase{1, false, true, 4}, StoreCase{2, false, true, 5},
                      StoreCase{1, true, false, 0}, StoreCase{4, true, true, 2}),
    CaseName);

TEST(ContentNameTest, FollowsTheLastRunOfFourZeros) {
  const struct {
    uint64_t id;
    const char* name;
  } cases[] = {
      {0x0001000000000A3Full, "A3F"},  // 1000000000a3f
      {0x00010000010000B7ull, "B7"},   // the last run wins over an earlier one
      {0x0001000000000001ull, "1"},
      {0x0001123456789123ull, "123456789123"},  // no run: everything after the first digit
      {0x0000000000ABCDEFull, "BCDEF"},         // no run, lower-case hex turned upper
      {0x0001000000010000ull, ""},              // the run ends the text
  };
  for (const auto& c : cases) {
    EXPECT_EQ(ContentName(c.id), c.name) << std::hex << c.id;
    EXPECT_EQ(ContentTableName(c.id), std::string("1-") + c.name);
  }
}

TEST(StoreManifestTest, TreeFactsOfThePrivateStore) {
  LegacyStoreOptions o;
  o.damage = DamageOptions::All();
  Store store(o);
  const StoreManifest& m = store.manifest();
  const ManifestFolder* deep = FindFolder(m, "Глубокая папка");
  ASSERT_NE(deep, nullptr);
  EXPECT_EQ(deep->path,
            (std::vector<std::string>{"Müller, Jürgen", "Top of Information Store", "Inbox",
                                      "Projekte Übersicht", "Глубокая папка"}));
  EXPECT_TRUE(deep->visible);
  ASSERT_NE(FindFolder(m, "inbox "), nullptr);
  EXPECT_EQ(FindFolder(m, "inbox ")->icon, 3);
  EXPECT_EQ(FindFolder(m, "Junk E-mail")->icon, 14);
  EXPECT_EQ(FindFolder(m, "Archiv 2009")->content_table, "1-B7");
  bool a3f = false;
  for (const ManifestFolder& f : m.folders) {
    a3f |= f.id == 0x0001000000000A3Full && f.content_table == "1-A3F";
    if (f.name == "Top of Information Store") {
      bool is_mailbox = false;
      for (const ManifestMailbox& mb : m.mailboxes) is_mailbox |= mb.number == f.parent;
      EXPECT_TRUE(is_mailbox) << "a top folder hangs under its mailbox";
    }
  }
  EXPECT_TRUE(a3f);
  for (const char* damage : {"orphan", "self_parent", "parent_zero"}) {
    size_t n = 0;
    for (const ManifestFolder& f : m.folders) {
      if (f.damage != damage) continue;
      ++n;
      EXPECT_FALSE(f.visible) << damage;
      if (f.damage == std::string("self_parent")) {
        EXPECT_EQ(f.id, f.parent);
      }
    }
    EXPECT_EQ(n, 1u) << damage;
  }
  EXPECT_EQ(m.duplicates.size(), 1u);
  size_t ghosts = 0;
  for (const ManifestFolder& f : m.folders) {
    for (const ManifestItem& it : f.items) ghosts += !it.in_msg_table;
  }
  EXPECT_EQ(ghosts, 1u);
}

TEST(StoreManifestTest, PublicStoreHasNoMailboxesAndARootAtParentZero) {
  LegacyStoreOptions o;
  o.public_store = true;
  Store store(o);
  const StoreManifest& m = store.manifest();
  EXPECT_TRUE(m.mailboxes.empty());
  ASSERT_FALSE(m.folders.empty());
  EXPECT_EQ(m.folders[0].name, "Public Root");
  EXPECT_EQ(m.folders[0].parent, 0u);
  EXPECT_EQ(m.folders[0].icon, kIconTop);
  for (const ManifestFolder& f : m.folders) {
    EXPECT_TRUE(f.visible) << f.name;
    EXPECT_EQ(f.path.front(), "Public Root");
  }
}

TEST(StoreManifestTest, JsonIsValidAndCarriesTheCounts) {
  if (std::system("/usr/bin/python3 -c 'import json' >/dev/null 2>&1") != 0) {
    GTEST_SKIP() << "/usr/bin/python3 not available";
  }
  LegacyStoreOptions o;
  o.version = 2;
  o.damage = DamageOptions::All();
  Store store(o);
  const std::string json_path = store.path() + ".json";
  std::ofstream(json_path) << ManifestJson(store.manifest());
  const std::string check =
      "/usr/bin/python3 -c \"import json,sys; m=json.load(open(sys.argv[1])); "
      "assert m['version']==2 and m['attachment_table']=='1-24'; "
      "assert sum(len(f['items']) for f in m['folders'])==" +
      std::to_string(store.manifest().messages + 1) +
      "; assert m['time_encodings']['Msg.T3007']=='binary_be'\" '" + json_path + "'";
  EXPECT_EQ(std::system(check.c_str()), 0);
}

TEST(StoreBuilderTest, OutputIsDeterministic) {
  LegacyStoreOptions o;
  o.version = 4;
  o.damage = DamageOptions::All();
  o.bulk.messages = 300;
  o.bulk.seed = 7;
  Store a(o), b(o);
  EXPECT_TRUE(ReadFileText(a.path()) == ReadFileText(b.path()));
  EXPECT_EQ(ManifestJson(a.manifest()), ManifestJson(b.manifest()));
  o.bulk.seed = 8;
  Store c(o);
  EXPECT_NE(ManifestJson(a.manifest()), ManifestJson(c.manifest()));
}

TEST(StoreBuilderTest, BulkMailFillsOneLargeFolderAndCountsWithoutItems) {
  LegacyStoreOptions o;
  o.version = 2;
  o.bulk.messages = 4000;
  o.bulk.large_folder_items = 2500;
  o.bulk.average_bytes = 3000;
  o.record_items = false;
  Store store(o);
  const StoreManifest& m = store.manifest();
  const ManifestFolder* bulk = FindFolder(m, "Bulk");
  ASSERT_NE(bulk, nullptr);
  EXPECT_GE(bulk->item_count, 2500u);
  EXPECT_TRUE(bulk->items.empty());
  EXPECT_EQ(store.Read(bulk->content_table).rows.size(), bulk->item_count);
  const Table msg = store.Read("Msg");
  EXPECT_EQ(msg.rows.size(), m.msg_rows);
  uint64_t listed = 0;
  for (const ManifestFolder& f : m.folders) listed += f.item_count;
  EXPECT_EQ(listed, m.messages);
  EXPECT_GT(m.attachment_rows, 4000u / 4 - 1);
}

TEST(StoreBuilderTest, RejectsUnknownVersionsAndUnwritablePaths) {
  ScratchDir dir("store_forge");
  StoreManifest m;
  for (int version : {0, 3, 5}) {
    LegacyStoreOptions o;
    o.version = version;
    EXPECT_FALSE(BuildLegacyStore(o, dir / "x.edb", &m).ok()) << version;
  }
  EXPECT_FALSE(BuildLegacyStore({}, "/nonexistent-dir/x.edb", &m).ok());
  ModernStoreOptions modern;
  EXPECT_FALSE(BuildModernStore(modern, "/nonexistent-dir/x.edb", &m).ok());
  modern.version = kExchange2010;
  modern.real_layout = true;
  EXPECT_FALSE(BuildModernStore(modern, dir / "x.edb", &m).ok()) << "the real layout is code 5";
}

}  // namespace
}  // namespace tarnwell::forge::exchange
