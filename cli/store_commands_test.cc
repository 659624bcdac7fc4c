#include "cli/store_commands.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "base/paths.h"
#include "testing/exchange/store_builder.h"

namespace tarnwell::cli {
namespace {

namespace fx = forge::exchange;
namespace fs = std::filesystem;

// Damage the written file the way real ones are damaged: junk in front of
// the header, or both header pages gone.
enum class Shift { kNone, kJunk512, kNoHeaders };

class StoreCommandsTest : public ::testing::TestWithParam<std::tuple<Shift, std::string>> {
 protected:
  void SetUp() override {
    ASSERT_TRUE(MakeTempDir("tarnwell-cli", &dir_).ok());
    fx::LegacyStoreOptions options;
    options.version = 2;
    ASSERT_TRUE(fx::BuildLegacyStore(options, dir_ + "/clean.edb", &manifest_).ok());
    std::ifstream in(dir_ + "/clean.edb", std::ios::binary);
    std::string bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    const size_t page = manifest_.page_size;
    switch (std::get<0>(GetParam())) {
      case Shift::kNone:
        break;
      case Shift::kJunk512:
        bytes = std::string(512, '\x5A') + bytes;
        break;
      case Shift::kNoHeaders:
        bytes = bytes.substr(2 * page);
        break;
    }
    db_ = dir_ + "/store.edb";
    std::ofstream(db_, std::ios::binary) << bytes;
  }
  void TearDown() override { fs::remove_all(dir_); }

  ScanOptions Options() {
    ScanOptions o;
    o.db = db_;
    o.version = "2007";  // a headerless file cannot say its version
    o.mode = std::get<1>(GetParam());
    o.adjust = std::get<0>(GetParam()) != Shift::kNone;
    return o;
  }

  std::string dir_, db_;
  fx::StoreManifest manifest_;
};

TEST_P(StoreCommandsTest, ShiftedFilesScanLikeTheWholeFileWithAdjust) {
  StoreSession session;
  ASSERT_TRUE(session.Open(Options(), NullProgress()).ok());
  size_t visible = 0;
  for (const auto& f : manifest_.folders) visible += f.visible;
  EXPECT_EQ(session.folders().size(), visible + manifest_.mailboxes.size());
  // Every folder lists what the manifest holds, and items open.
  for (const auto& f : manifest_.folders) {
    if (!f.visible || f.items.empty()) continue;
    char ref[32];
    std::snprintf(ref, sizeof ref, "%llx", static_cast<unsigned long long>(f.id));
    std::string out;
    ASSERT_TRUE(RunList(session, ref, true, &out).ok()) << f.name;
    EXPECT_EQ(std::count(out.begin(), out.end(), '{'), long(f.items.size())) << f.name;
    ASSERT_TRUE(RunShow(session, ref, 1, true, &out).ok()) << f.name;
    EXPECT_NE(out.find("\"key\""), std::string::npos);
  }
}

INSTANTIATE_TEST_SUITE_P(Files, StoreCommandsTest,
                         ::testing::Combine(::testing::Values(Shift::kNone, Shift::kJunk512,
                                                              Shift::kNoHeaders),
                                            ::testing::Values("standard", "advance")));

TEST(StoreCommandErrorsTest, ClearErrors) {
  int code = 0;
  EXPECT_FALSE(ParseVersion("2016", "x.edb", &code).ok());
  EXPECT_EQ(ParseVersion("auto", "/nonexistent.edb", &code).message(), "File cannot be opened");
  ASSERT_TRUE(ParseVersion("5.5", "x.edb", &code).ok());
  EXPECT_EQ(code, 4);
  StoreSession session;
  ScanOptions o;
  o.db = "/nonexistent.edb";
  o.version = "2007";
  EXPECT_FALSE(session.Open(o, NullProgress()).ok());
  EXPECT_EQ(ImportanceText(1), "Normal");
  EXPECT_EQ(ImportanceText(7), "");
  store::MessageSummary no_class;
  EXPECT_EQ(MakeListRow(no_class).type, "IPM.Note");
}

}  // namespace
}  // namespace tarnwell::cli
