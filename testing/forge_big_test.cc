// The large-database generator's files read back whole in our reader: every
// message, every long value; and the same options give the same bytes.
#include "testing/forge_big.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <memory>

#include "engine/catalog.h"
#include "engine/column_decoder.h"
#include "engine/edb_class.h"
#include "testing/forge_test_support.h"

namespace tarnwell::forge {
namespace {

using Kind = engine::DecodedColumn::Kind;

constexpr uint64_t kSizeMib = 3;

class ForgeBigTest : public ::testing::TestWithParam<uint32_t> {
 protected:
  ScratchDir dir_{"forge_big"};
};

TEST_P(ForgeBigTest, EveryMessageAndLongValueReadsBack) {
  BigOptions options;
  options.size_mib = kSizeMib;
  options.page_size = GetParam();
  const std::string path = dir_ / "big.edb";
  Manifest manifest;
  BigResult result;
  ASSERT_TRUE(WriteBigDatabase(options, path, &manifest, &result).ok());
  EXPECT_EQ(std::filesystem::file_size(path), result.file_size);
  EXPECT_GE(result.file_size, kSizeMib << 20);
  EXPECT_EQ(result.file_size, (manifest.total_pages + 2) * options.page_size);

  std::unique_ptr<engine::EdbClass> reader;
  ASSERT_TRUE(engine::InspectDatabase(path, &reader).ok());
  ASSERT_EQ(reader->CollectTreeRecords(engine::kCatalogRootPage), 1);
  reader->ParseCatalogRecords();
  for (const char* name : {"Mailboxes", "Folders"}) EXPECT_NE(reader->FindTable(name), nullptr);
  const engine::TableDef* messages = reader->FindTable("Messages");
  ASSERT_TRUE(messages && messages->long_value);
  const engine::LongValueReader lvs = reader->long_values();
  const engine::ColumnDecoder decoder(&lvs, messages->long_value->root_page());

  uint64_t rows = 0, attachments = 0, separated_bodies = 0;
  ASSERT_EQ(reader->ForEachRecord(
                *messages,
                [&](const engine::RecordRef&, engine::RecordColumns& columns) {
                  ++rows;
                  const auto id = decoder.Decode(messages->columns[0], columns.at(0));
                  EXPECT_EQ(id.i, int64_t(rows));
                  const auto size = decoder.Decode(messages->columns[3], columns.at(3));
                  const auto body = decoder.Decode(messages->columns[7], columns.at(7));
                  EXPECT_EQ(body.kind, Kind::kText) << "row " << rows << body.text;
                  EXPECT_EQ(int64_t(body.text.size()) * 2, size.i) << "row " << rows;
                  separated_bodies += columns.at(7).flag_byte & kTaggedSeparated ? 1 : 0;
                  const auto att = decoder.Decode(messages->columns[8], columns.at(8));
                  if (att.kind != Kind::kAbsent) {
                    EXPECT_EQ(att.kind, Kind::kBinary) << "row " << rows << att.text;
                    ++attachments;
                  }
                  return true;
                }),
            1);
  EXPECT_EQ(rows, result.rows);
  EXPECT_EQ(attachments + separated_bodies, result.long_values);
  EXPECT_GT(separated_bodies, 0u);
}

TEST_P(ForgeBigTest, SameOptionsSameBytes) {
  BigOptions options;
  options.size_mib = 1;
  options.page_size = GetParam();
  ASSERT_TRUE(WriteBigDatabase(options, dir_ / "a.edb").ok());
  ASSERT_TRUE(WriteBigDatabase(options, dir_ / "b.edb").ok());
  options.seed = 2;
  ASSERT_TRUE(WriteBigDatabase(options, dir_ / "c.edb").ok());
  const std::string a = ReadFileText(dir_ / "a.edb");
  EXPECT_TRUE(a == ReadFileText(dir_ / "b.edb"));
  EXPECT_FALSE(a == ReadFileText(dir_ / "c.edb"));
  EXPECT_FALSE(WriteBigDatabase(options, "/nonexistent-dir/x.edb").ok());
}

INSTANTIATE_TEST_SUITE_P(PageSizes, ForgeBigTest, ::testing::Values(4096u, 8192u, 32768u),
                         [](const ::testing::TestParamInfo<uint32_t>& info) {
                           return std::to_string(info.param);
                         });

}  // namespace
}  // namespace tarnwell::forge
