#include "app/pst_export_job.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <set>

#include "app/export_test_support.h"
#include "mapi/pst/pst_store.h"

namespace tarnwell::app {
namespace {

namespace fs = std::filesystem;
using namespace testing_support;  // NOLINT

bool HaveReaders() {
  return std::system(
             "command -v pffexport >/dev/null && command -v readpst >/dev/null && "
             "command -v pffinfo >/dev/null") == 0;
}

// Messages in every folder of the files, read with Tarnwell's own reader.
size_t CountMessages(const std::vector<std::string>& files) {
  size_t n = 0;
  for (const std::string& file : files) {
    std::unique_ptr<mapi::pst::PstStore> pst;
    EXPECT_TRUE(mapi::pst::PstStore::Open(file, false, &pst).ok()) << file;
    if (!pst) continue;
    std::vector<mapi::pst::Nid> stack = {pst->root_folder()};
    while (!stack.empty()) {
      const mapi::pst::Nid at = stack.back();
      stack.pop_back();
      n += pst->Messages(at).size();
      for (const auto& f : pst->SubFolders(at)) stack.push_back(f.nid);
    }
  }
  return n;
}

uint64_t Saved(const PstExportResult& result) {
  uint64_t saved = 0;
  for (const FolderResult& f : result.folders) saved += f.saved;
  return saved;
}

class PstExportTest : public ScannedStoreTest {
 protected:
  void SetUp() override {
    if (!HaveReaders()) GTEST_SKIP() << "pffexport, pffinfo and readpst are needed";
    ScannedStoreTest::SetUp();
  }

  PstExportResult Export(const std::string& out, const ExportOptions& pst_page) {
    PstExportRequest r;
    r.options = pst_page;
    if (r.options.pst_mode == 0) r.options.pst_mode = 1;
    r.options.save_path = dir_ + "/" + out;
    r.folders = tree_.folders;
    r.source_path = dir_ + "/store.edb";
    r.log_dir = dir_ + "/log-" + out;  // runs in one second would share a log
    fs::create_directories(r.log_dir);
    RunningFlag running{true};
    PstExportResult result;
    EXPECT_TRUE(RunPstExport(*source_.store, r, running, NullProgress(), &result).ok());
    return result;
  }

  void Check(const PstExportResult& result, const std::string& name) {
    std::vector<std::string> args = {manifest_path_, dir_ + "/check-" + name};
    fs::create_directories(args.back());
    args.insert(args.end(), result.files.begin(), result.files.end());
    RunChecker("check_pst.py", args, dir_ + "/" + name + ".report");
  }
};

TEST_P(PstExportTest, EveryItemReadsBackWithBothReaders) {
  const PstExportResult result = Export("pst", {});
  ASSERT_EQ(result.files.size(), 1u);
  EXPECT_EQ(fs::path(result.files[0]).filename(), "STORE.EDB.PST");
  Check(result, "one");
  EXPECT_EQ(CountMessages(result.files), Saved(result));
  const std::string log = ReadLog(result.log_path);
  for (const char* line :
       {"Initializing session..\r\n", "Creating tree in PST...\r\n", "\r\n Saving Folder: ",
        "Items Found: ", "Items Saved: ", "Save Process Completed Successfully\r\n"}) {
    EXPECT_NE(log.find(line), std::string::npos) << line;
  }
  // The only errors are the items the damaged store has no record for.
  for (size_t at = log.find("ERROR:"); at != std::string::npos; at = log.find("ERROR:", at + 1)) {
    EXPECT_NE(log.substr(at, log.find("\r\n", at) - at).find("has no message record"),
              std::string::npos)
        << log.substr(at, 200);
  }
}

TEST_P(PstExportTest, SplitBySizeAndByMailbox) {
  // A split size far below the page's minimum, so that a small store fills
  // several files; every file still holds at least one item.
  ExportOptions split;
  split.split_enabled = true;
  split.split_size = kEmptyPstBytes + 4096;
  const PstExportResult sized = Export("split", split);
  EXPECT_GT(sized.files.size(), 1u);
  Check(sized, "split");
  EXPECT_EQ(CountMessages(sized.files), Saved(sized));
  for (const std::string& file : sized.files) EXPECT_GT(CountMessages({file}), 0u) << file;

  ExportOptions by_user;
  by_user.split_by_user = true;
  const PstExportResult users = Export("users", by_user);
  std::set<std::string> mailboxes;
  for (const ExportFolder& f : tree_.folders) {
    if (f.path.size() > 1) mailboxes.insert(PstFileName(f.path[1]));
  }
  std::set<std::string> names;
  for (const std::string& file : users.files) names.insert(fs::path(file).filename().string());
  EXPECT_EQ(names, mailboxes);
  Check(users, "users");
  EXPECT_EQ(CountMessages(users.files), Saved(users));
}

INSTANTIATE_TEST_SUITE_P(Stores, PstExportTest, ::testing::ValuesIn(kEveryStore), StoreCaseName);

// Adding to a PST written by another program keeps its items; a second run
// reuses the folders the first made.
class ExistingPstTest : public PstExportTest {};

TEST_P(ExistingPstTest, AddsToARealPstAndReusesFolders) {
  const std::string original =
      std::string(TARNWELL_EXTERNAL_FIXTURES) + "/ruby-msg/pst/attachAndInline.pst";
  if (!fs::exists(original)) GTEST_SKIP() << original << " is absent";
  const std::string copy = dir_ + "/existing.pst";
  fs::copy_file(original, copy);
  fs::permissions(copy, fs::perms::owner_write, fs::perm_options::add);
  auto count_messages = [](const std::string& file) { return CountMessages({file}); };
  const size_t before = count_messages(copy);
  ASSERT_GT(before, 0u);
  ExportOptions existing;
  existing.pst_mode = 2;
  existing.existing_pst = copy;
  const PstExportResult first = Export("unused", existing);
  ASSERT_EQ(first.files, std::vector<std::string>{copy});
  const size_t after_one = count_messages(copy);
  EXPECT_GT(after_one, before);
  Export("unused2", existing);
  EXPECT_EQ(count_messages(copy) - after_one, after_one - before);
  // One folder per name at every level.
  std::unique_ptr<mapi::pst::PstStore> pst;
  ASSERT_TRUE(mapi::pst::PstStore::Open(copy, false, &pst).ok());
  std::vector<mapi::pst::Nid> stack = {pst->root_folder()};
  while (!stack.empty()) {
    const mapi::pst::Nid at = stack.back();
    stack.pop_back();
    std::set<std::string> seen;
    for (const auto& f : pst->SubFolders(at)) {
      EXPECT_TRUE(seen.insert(f.name).second) << "folder twice: " << f.name;
      stack.push_back(f.nid);
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Stores, ExistingPstTest,
                         ::testing::Values(StoreCase{"v2007", 2, false},
                                           StoreCase{"v2013", 5, false}),
                         StoreCaseName);

TEST(PstFileNameTest, NamesNumbersAndClasses) {
  EXPECT_EQ(PstFileName("/data/Priv1.edb"), "PRIV1.EDB.PST");
  EXPECT_EQ(PstFileName("C:\\Exchsrvr\\mdbdata\\priv.edb"), "PRIV.EDB.PST");
  EXPECT_EQ(PstFileName("Müller, Jürgen"), "MÜLLER, JÜRGEN.PST");
  // A hostile mailbox name stays one file name.
  EXPECT_EQ(PstFileName("../..").find('/'), std::string::npos);
  std::string dir;
  ASSERT_TRUE(MakeTempDir("tarnwell-pstname", &dir).ok());
  EXPECT_EQ(FreePstPath(dir, "A.PST"), dir + "/A.PST");
  std::ofstream(dir + "/A.PST") << "x";
  std::ofstream(dir + "/0A.PST") << "x";
  EXPECT_EQ(FreePstPath(dir, "A.PST"), dir + "/1A.PST");
  fs::remove_all(dir);
  EXPECT_EQ(FolderClassForName("tasks"), "IPF.Task");
  EXPECT_EQ(FolderClassForName("Calendar"), "IPF.Appointment");
  EXPECT_EQ(FolderClassForName("CONTACTS"), "IPF.Contact");
  EXPECT_EQ(FolderClassForName("Inbox"), "");
}

}  // namespace
}  // namespace tarnwell::app
