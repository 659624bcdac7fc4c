// Stores from the builder as libesedb (Debian's esedbinfo / esedbexport)
// sees them: an ESE reader written without any of our code must find the
// same tables, rows and keys.
//
// libesedb 20181229 recognises these files as Exchange databases and prints
// some columns its own way. Its SID printer fails on every "N66a0" and
// "Ne58" value ("unsupported byte order" from libfwnt), so "Mailbox" and
// "Folders" cannot be exported; esedbinfo still lists them with their
// columns. The other tables are exported one at a time.
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "testing/exchange/store_builder.h"
#include "testing/forge_test_support.h"

namespace tarnwell::forge::exchange {
namespace {

class StoreEsedbTest : public ::testing::TestWithParam<int> {
 protected:
  void SetUp() override {
    if (!HaveTool("esedbexport") || !HaveTool("esedbinfo")) {
      GTEST_SKIP() << "esedbinfo/esedbexport (Debian libesedb-utils) not installed";
    }
  }

  // The rows of one table as esedbexport prints them; the first line is the
  // column names.
  std::vector<std::vector<std::string>> Export(const std::string& edb, const std::string& table) {
    const std::string target = dir_ / ("t" + std::to_string(++exports_));
    EXPECT_EQ(RunTool("esedbexport -T '" + table + "' -t '" + target + "' '" + edb + "'",
                      target + ".log"),
              0)
        << table << "\n"
        << ReadFileText(target + ".log");
    std::vector<std::vector<std::string>> rows;
    for (const auto& entry : std::filesystem::directory_iterator(target + ".export")) {
      for (const std::string& line : SplitText(ReadFileText(entry.path()), '\n')) {
        rows.push_back(SplitText(line, '\t'));
      }
    }
    return rows;
  }

  ScratchDir dir_{"store_esedb"};
  int exports_ = 0;
};

std::vector<std::string> Column(const std::vector<std::vector<std::string>>& rows,
                                const std::string& name) {
  std::vector<std::string> out;
  if (rows.empty()) return out;
  size_t index = 0;
  while (index < rows[0].size() && rows[0][index] != name) ++index;
  EXPECT_LT(index, rows[0].size()) << name;
  for (size_t r = 1; r < rows.size(); ++r)
    out.push_back(index < rows[r].size() ? rows[r][index] : "");
  return out;
}

TEST_P(StoreEsedbTest, LibesedbFindsTheTablesRowsAndKeys) {
  LegacyStoreOptions options;
  options.version = GetParam();
  options.damage = DamageOptions::All();
  options.bulk.messages = 200;
  const std::string edb = dir_ / "store.edb";
  StoreManifest m;
  ASSERT_TRUE(BuildLegacyStore(options, edb, &m).ok());

  const std::string log = dir_ / "esedbinfo.log";
  ASSERT_EQ(RunTool("esedbinfo '" + edb + "'", log), 0) << ReadFileText(log);
  const std::string info = ReadFileText(log);
  EXPECT_NE(info.find("Page size:\t\t" + std::to_string(m.page_size) + " bytes"),
            std::string::npos);
  EXPECT_NE(info.find("Number of tables:\t" + std::to_string(m.folders.size() + 6)),
            std::string::npos)
      << info;
  for (const char* table : {"Mailbox", "Folders", "Q6748", "Q6749", "S3613"}) {
    EXPECT_NE(info.find(table), std::string::npos) << table;
  }

  // "Msg": every row, in key order, the duplicate right after its first row.
  std::vector<std::string> msg_keys;
  for (const ManifestFolder& f : m.folders) {
    for (const ManifestItem& it : f.items) {
      if (!it.in_msg_table) continue;
      msg_keys.push_back(ToHex(ByteView(it.key)));
      for (const DuplicateRow& d : m.duplicates) {
        if (d.key == it.key) msg_keys.push_back(ToHex(ByteView(d.key)));
      }
    }
  }
  std::sort(msg_keys.begin(), msg_keys.end());
  EXPECT_EQ(Column(Export(edb, "Msg"), "N67b0"), msg_keys);

  std::vector<std::string> owners;
  for (const ManifestFolder& f : m.folders) {
    for (const ManifestItem& it : f.items) {
      for (size_t k = 0; k < it.attachments.size(); ++k) owners.push_back(ToHex(ByteView(it.key)));
    }
  }
  std::sort(owners.begin(), owners.end());
  EXPECT_EQ(Column(Export(edb, m.attachment_table), "N67b0"), owners);

  for (const ManifestFolder& f : m.folders) {
    std::vector<std::string> keys;
    for (const ManifestItem& it : f.items) keys.push_back(ToHex(ByteView(it.key)));
    EXPECT_EQ(Column(Export(edb, f.content_table), "N67b0"), keys) << f.content_table;
  }
}

INSTANTIATE_TEST_SUITE_P(Versions, StoreEsedbTest, ::testing::Values(4, 1, 2),
                         [](const ::testing::TestParamInfo<int>& info) {
                           return "v" + std::to_string(info.param);
                         });

}  // namespace
}  // namespace tarnwell::forge::exchange
