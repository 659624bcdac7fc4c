#include "testing/ese_writer.h"

#include <gtest/gtest.h>

#include "engine/page_checksum.h"
#include "testing/forge_sample.h"
#include "testing/forge_test_support.h"

namespace tarnwell::forge {
namespace {

struct Format {
  uint32_t page_size;
  uint32_t revision;
  uint32_t format_flags;  // what every page should carry
};

class EseWriterFormatTest : public ::testing::TestWithParam<Format> {
 protected:
  Bytes Build(Manifest* manifest, uint32_t rows = 120) {
    SampleOptions options;
    options.page_size = GetParam().page_size;
    options.revision = GetParam().revision;
    options.rows = rows;
    options.max_rows_per_leaf = 7;
    options.max_children_per_branch = 4;
    Status s;
    Bytes file = BuildDatabase(SampleDatabase(options), manifest, {}, &s);
    EXPECT_TRUE(s.ok()) << s.message();
    return file;
  }
  const uint8_t* Page(const Bytes& file, uint32_t n) {
    return file.data() + size_t(n + 1) * GetParam().page_size;
  }
};

TEST_P(EseWriterFormatTest, HeaderAndShadowDescribeTheFile) {
  const Format& f = GetParam();
  Manifest manifest, again;
  Bytes file = Build(&manifest);
  EXPECT_EQ(file, Build(&again)) << "the same layout should give the same bytes";
  ASSERT_EQ(file.size(), (manifest.total_pages + 2) * f.page_size);
  ByteView header(file.data(), f.page_size);
  EXPECT_EQ(header.U32LE(4), 0x89ABCDEFu);
  EXPECT_EQ(header.U32LE(8), 0x620u);
  EXPECT_EQ(header.U32LE(12), 0u);
  EXPECT_EQ(header.U32LE(52), 3u);
  EXPECT_EQ(header.U32LE(232), f.revision);
  EXPECT_EQ(header.U32LE(236), f.page_size);
  EXPECT_EQ(header.U32LE(0), engine::ComputeHeaderChecksum(file.data(), f.page_size));
  EXPECT_TRUE(std::equal(file.begin(), file.begin() + f.page_size, file.begin() + f.page_size));
}

// The fixed pages carry the flags the format probes look for; every written
// page's checksum verifies and every other page is zero.
TEST_P(EseWriterFormatTest, PagesHaveTheirFlagsAndChecksums) {
  const Format& f = GetParam();
  EXPECT_EQ(DefaultPageFormatFlags(f.page_size, f.revision), f.format_flags);
  Manifest manifest;
  Bytes file = Build(&manifest);
  auto flags = [&](uint32_t n) { return LoadU32LE(Page(file, n) + 36); };
  auto object = [&](uint32_t n) { return LoadU32LE(Page(file, n) + 24); };
  EXPECT_EQ(flags(1), f.format_flags | 0x03);
  EXPECT_EQ(flags(2), f.format_flags | 0x23);
  EXPECT_EQ(flags(3), f.format_flags | 0x23);
  EXPECT_EQ(flags(4) & 0x01, 0x01u);
  EXPECT_EQ(flags(24) & 0x01, 0x01u);
  EXPECT_EQ(object(1), 1u);
  EXPECT_EQ(object(4), 2u);
  EXPECT_EQ(object(24), 3u);
  ASSERT_EQ(manifest.tables.size(), 4u);
  const TableManifest& items = manifest.tables[0];
  EXPECT_EQ(items.name, "Items");
  EXPECT_GT(items.branch_pages.size(), 1u) << "the sample should have a deep tree";
  for (uint32_t leaf : items.leaf_pages) {
    EXPECT_EQ(flags(leaf), f.format_flags | 0x02) << leaf;
    EXPECT_EQ(object(leaf), items.object_id);
  }
  for (uint32_t branch : items.branch_pages) {
    EXPECT_EQ(flags(branch) & 0x03, 0u) << branch;
  }
  for (uint64_t n = 1; n <= manifest.total_pages; ++n) {
    bool written = std::count(manifest.written_pages.begin(), manifest.written_pages.end(), n);
    const uint8_t* p = Page(file, uint32_t(n));
    bool zero = std::all_of(p, p + f.page_size, [](uint8_t b) { return b == 0; });
    EXPECT_NE(written, zero) << "page " << n;
    if (written) {
      EXPECT_TRUE(engine::VerifyPageChecksum(p, f.page_size, uint32_t(n))) << "page " << n;
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Exchange, EseWriterFormatTest,
                         ::testing::Values(Format{4096, 2, 0x0000}, Format{4096, 9, 0x0800},
                                           Format{8192, 12, 0x2800}, Format{16384, 17, 0xA800},
                                           Format{32768, 17, 0xA800}, Format{32768, 20, 0xA800}),
                         [](const ::testing::TestParamInfo<Format>& info) {
                           return std::to_string(info.param.page_size) + "_rev" +
                                  std::to_string(info.param.revision);
                         });

TEST(EseWriterTest, DamageMovesOrDropsTheHeader) {
  DatabaseLayout layout = SampleDatabase({4096, 9, 10});
  Manifest manifest;
  Bytes clean = BuildDatabase(layout, &manifest);
  ASSERT_FALSE(clean.empty());

  Bytes junk = BuildDatabase(layout, nullptr, {1000, false, {}});
  ASSERT_EQ(junk.size(), clean.size() + 1000);
  EXPECT_TRUE(std::equal(clean.begin(), clean.end(), junk.begin() + 1000));

  Bytes headless = BuildDatabase(layout, nullptr, {0, true, {}});
  ASSERT_EQ(headless.size(), clean.size() - 2 * 4096);
  EXPECT_TRUE(std::equal(headless.begin(), headless.end(), clean.begin() + 2 * 4096));
  EXPECT_EQ(LoadU32LE(headless.data() + 36), 0x0803u) << "file should start with page 1";
}

TEST(EseWriterTest, RejectsImpossibleSpecs) {
  DatabaseLayout good = SampleDatabase({8192, 12, 5});
  std::vector<DatabaseLayout> bad(4, good);
  bad[0].page_size = 2048;
  bad[1].page_size = 32768;  // large pages need revision 17
  bad[2].tables.push_back(bad[2].tables[0]);
  bad[3].tables[0].rows[0].cells.push_back({4, Bytes{1}});  // the same column twice
  for (const DatabaseLayout& layout : bad) {
    Status s;
    EXPECT_TRUE(BuildDatabase(layout, nullptr, {}, &s).empty());
    EXPECT_FALSE(s.ok());
  }
}

TEST(EseWriterTest, WritesTheFile) {
  ScratchDir dir("forge_write");
  DatabaseLayout layout = SampleDatabase({8192, 12, 30});
  ASSERT_TRUE(WriteDatabase(layout, dir / "x.edb").ok());
  const Bytes built = BuildDatabase(layout);
  EXPECT_EQ(ReadFileText(dir / "x.edb"), std::string(built.begin(), built.end()));
  EXPECT_FALSE(WriteDatabase(layout, "/nonexistent-dir/x.edb").ok());
}

}  // namespace
}  // namespace tarnwell::forge
