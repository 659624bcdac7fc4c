#include "app/scan_driver.h"

#include <gtest/gtest.h>

#include <condition_variable>
#include <filesystem>

#include "app/job_runner.h"
#include "base/paths.h"
#include "testing/ese_writer.h"
#include "testing/exchange/modern_store_builder.h"
#include "testing/exchange/store_builder.h"
#include "testing/forge_layout.h"

namespace tarnwell::app {
namespace {

namespace fx = forge::exchange;

class Recorder : public ProgressSink {
 public:
  void Stage(const std::string& text) override {
    if (!text.empty()) stages.push_back(text);
  }
  void Message(const std::string& text) override { messages.push_back(text); }
  std::vector<std::string> stages, messages;
};

class CountingTree : public store::FolderTreeSink {
 public:
  int64_t AddTopItem(const std::string&, int, uint64_t) override { return 0; }
  int64_t AddFolder(int64_t, const std::string&, int, uint32_t) override { return ++count; }
  int64_t count = 0;
};

class ScanDriverTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_TRUE(MakeTempDir("tarnwell-app", &dir_).ok());
    fx::LegacyStoreOptions options;
    options.version = 2;
    ASSERT_TRUE(fx::BuildLegacyStore(options, dir_ + "/s.edb", &manifest_).ok());
  }
  void TearDown() override { std::filesystem::remove_all(dir_); }

  RunSettings Settings(store::ScanMode mode) {
    RunSettings s;
    s.edb_path = dir_ + "/s.edb";
    s.temp_root = dir_ + "/temp";
    s.version_code = 2;
    s.mode = mode;
    return s;
  }

  std::string dir_;
  fx::StoreManifest manifest_;
};

TEST_F(ScanDriverTest, StagesRunInOrderWithTheirTexts) {
  const std::vector<std::string> standard = {"Reading Catalog",
                                             "Traversing record",
                                             "Finding Table names",
                                             "Traversing mailBox table",
                                             "Traversing folder table to find folder data",
                                             "Creating Internal tree Structure",
                                             "Showing Data in tree control",
                                             "Creating msg map from msg table",
                                             "Creating Attachment map from Attachment table"};
  const std::vector<std::string> advance = {"Checking Adjustment Factor",
                                            "Finding Pages in File",
                                            "Reading Catalog for Leaf Pages",
                                            "Traversing record Vector",
                                            "Collecting Table Names",
                                            "Finding Users",
                                            "Traversing Folder Table to find folder data",
                                            "Creating internal tree structure",
                                            "Showing Data in tree control",
                                            "Creating Msg map from msg Table",
                                            "Creating Attachment Map from attachment table"};
  for (auto [mode, want] : {std::pair{store::ScanMode::kStandard, standard},
                            std::pair{store::ScanMode::kAdvance, advance}}) {
    RunSettings settings = Settings(mode);
    settings.adjustment_check = mode == store::ScanMode::kAdvance ? 1 : 0;
    Recorder progress;
    SourceEntry source;
    ASSERT_TRUE(OpenSource(settings, 3, progress, &source).ok());
    EXPECT_TRUE(std::filesystem::is_directory(dir_ + "/temp/3"));
    RunningFlag running{true};
    CountingTree tree;
    ScanOutcome outcome = RunScan(source, 3, running, progress, tree);
    EXPECT_TRUE(outcome.tree_shown);
    EXPECT_EQ(progress.stages, want);
    EXPECT_EQ(progress.messages.back(), kScanCompleted);
    EXPECT_FALSE(running.load());
    EXPECT_GT(tree.count, 0);
  }
}

// Both code-5 layouts: the documented one and the one servers write
// (revision 110, 26-byte folder ids).
class ModernScanDriverTest : public ::testing::TestWithParam<bool> {};

TEST_P(ModernScanDriverTest, MailboxesAndTheirFoldersWithoutAFolderStage) {
  std::string dir;
  ASSERT_TRUE(MakeTempDir("tarnwell-app-modern", &dir).ok());
  fx::ModernStoreOptions options;
  options.version = fx::kExchange2013;
  options.real_layout = GetParam();
  fx::StoreManifest manifest;
  ASSERT_TRUE(fx::BuildModernStore(options, dir + "/m.edb", &manifest).ok());
  for (bool mailboxes_only : {false, true}) {
    RunSettings settings;
    settings.edb_path = dir + "/m.edb";
    settings.temp_root = dir + "/temp";
    settings.version_code = fx::kExchange2013;
    settings.mailboxes_only = mailboxes_only;
    Recorder progress;
    SourceEntry source;
    ASSERT_TRUE(OpenSource(settings, 1, progress, &source).ok());
    RunningFlag running{true};
    CountingTree tree;
    ASSERT_TRUE(RunScan(source, 1, running, progress, tree).tree_shown);
    EXPECT_EQ(std::count(progress.stages.begin(), progress.stages.end(),
                         "Traversing folder table to find folder data"),
              0);
    size_t visible = 0;
    for (const auto& f : manifest.folders) visible += f.visible;
    EXPECT_EQ(size_t(tree.count), manifest.mailboxes.size() + (mailboxes_only ? 0 : visible));
  }
  std::filesystem::remove_all(dir);
}

INSTANTIATE_TEST_SUITE_P(Layouts, ModernScanDriverTest, ::testing::Bool(),
                         [](const auto& info) { return info.param ? "real" : "documented"; });

TEST_F(ScanDriverTest, OpenFailuresSayWhy) {
  Recorder progress;
  SourceEntry source;
  RunSettings settings = Settings(store::ScanMode::kStandard);
  settings.edb_path = dir_ + "/missing.edb";
  EXPECT_EQ(OpenSource(settings, 1, progress, &source).message(), kFileCannotBeOpened);
  settings = Settings(store::ScanMode::kStandard);
  settings.stm_path = dir_ + "/missing.stm";
  EXPECT_TRUE(OpenSource(settings, 1, progress, &source).ok());  // goes on without it
  EXPECT_EQ(progress.messages, (std::vector<std::string>{kStmCannotBeOpened}));
}

TEST(JobRunnerTest, OneJobAtATimeAndStopOnlyAsks) {
  JobRunner runner;
  Recorder progress;
  std::mutex m;
  std::condition_variable cv;
  bool release = false;
  bool saw_stop = false;
  ASSERT_TRUE(runner.Start(
      [&] {
        std::unique_lock<std::mutex> lock(m);
        cv.wait(lock, [&] { return release; });
        saw_stop = !runner.running().load();
      },
      progress));
  EXPECT_TRUE(runner.busy());
  EXPECT_FALSE(runner.Start([] {}, progress));
  EXPECT_EQ(progress.messages, (std::vector<std::string>{kThreadAlreadyRunning}));
  runner.Stop();
  {
    std::lock_guard<std::mutex> lock(m);
    release = true;
  }
  cv.notify_all();
  runner.Wait();
  EXPECT_TRUE(saw_stop);
  EXPECT_FALSE(runner.busy());
  EXPECT_TRUE(runner.Start([] {}, progress));  // free again
  runner.Wait();
}

}  // namespace
}  // namespace tarnwell::app
