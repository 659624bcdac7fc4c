#include "app/file_export_job.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "app/export_test_support.h"
#include "render/eml_composer.h"
#include "render/mime/mime_sink.h"

namespace tarnwell::app {
namespace {

namespace fs = std::filesystem;
namespace fx = forge::exchange;

using namespace testing_support;  // NOLINT

void CheckExport(const std::string& manifest, const std::string& dir, const std::string& mode) {
  RunChecker("check_export.py", {manifest, dir, mode}, dir + ".report");
}

class FileExportTest : public ScannedStoreTest {
 protected:
  FileExportResult Export(OutputFormat format, bool keep_native, const std::string& out) {
    FileExportRequest r;
    r.options.format = format;
    r.options.keep_hierarchy = true;
    r.options.destination = dir_ + "/" + out;
    r.folders = tree_.folders;
    r.source_path = dir_ + "/store.edb";
    r.keep_native = keep_native;
    r.log_dir = dir_;
    RunningFlag running{true};
    FileExportResult result;
    EXPECT_TRUE(RunFileExport(*source_.store, r, running, NullProgress(), &result).ok());
    return result;
  }
};

TEST_P(FileExportTest, EmlMboxAndNativeFilesReadBackAsTheManifestSays) {
  Export(OutputFormat::kEml, false, "eml");
  CheckExport(manifest_path_, dir_ + "/eml", "eml");
  Export(OutputFormat::kMbox, false, "mbox");
  CheckExport(manifest_path_, dir_ + "/mbox", "mbox");
  const FileExportResult native = Export(OutputFormat::kEml, true, "native");
  CheckExport(manifest_path_, dir_ + "/native", "native");
  // Every folder logged what it found and saved.
  const std::string text = ReadLog(native.log_path);
  EXPECT_NE(text.find("Save Items as:\tEML\t\r\n"), std::string::npos);
  EXPECT_NE(text.find("Items Found: "), std::string::npos);
  EXPECT_NE(text.find("Save Process Completed Successfully"), std::string::npos);
}

// Lowers the running flag when the n-th item starts saving.
class StopAfter : public ProgressSink {
 public:
  StopAfter(RunningFlag* running, int items) : running_(running), left_(items) {}
  void Stage(const std::string& text) override {
    if (text.size() > 10 && text.compare(text.size() - 10, 10, " is saving") == 0 && --left_ == 0) {
      running_->store(false);
    }
  }

 private:
  RunningFlag* running_;
  int left_;
};

TEST_P(FileExportTest, DateFilterAndStop) {
  auto run = [&](DateMode mode, const std::string& out, ProgressSink& progress,
                 RunningFlag& running) {
    FileExportRequest r;
    r.options.format = OutputFormat::kEml;
    r.options.date_mode = mode;
    r.options.date_ranges = {{{1990, 1, 1}, {1991, 12, 31}}};
    r.options.destination = dir_ + "/" + out;
    r.folders = tree_.folders;
    r.log_dir = dir_ + "/log-" + out;  // runs in one second would share a log
    fs::create_directories(r.log_dir);
    FileExportResult result;
    EXPECT_TRUE(RunFileExport(*source_.store, r, running, progress, &result).ok());
    return result;
  };
  auto totals = [](const FileExportResult& r) {
    uint64_t found = 0, saved = 0;
    for (const FolderResult& f : r.folders) found += f.found, saved += f.saved;
    return std::make_pair(found, saved);
  };
  RunningFlag running{true};
  // Nothing lies in 1990-1991: inside the range saves nothing, excluding it
  // saves what opens.
  auto [found_in, saved_in] = totals(run(DateMode::kInside, "inside", NullProgress(), running));
  EXPECT_GT(found_in, 0u);
  EXPECT_EQ(saved_in, 0u);
  running.store(true);
  auto [found_out, saved_out] = totals(run(DateMode::kExclude, "outside", NullProgress(), running));
  EXPECT_EQ(found_out, found_in);
  EXPECT_GT(saved_out, 0u);
  // Stop during the second item: the item in hand is finished, the loop
  // stops before the next, the folder still ends with its "Items Saved"
  // line, and nothing half-written is left.
  running.store(true);
  StopAfter stopper(&running, 2);
  FileExportResult stopped = run(DateMode::kAllTime, "stopped", stopper, running);
  EXPECT_EQ(totals(stopped).second, 2u);
  EXPECT_TRUE(stopped.stopped);
  const std::string text = ReadLog(stopped.log_path);
  size_t saved_lines = 0;
  for (size_t at = text.find("Items Saved: "); at != std::string::npos;
       at = text.find("Items Saved: ", at + 1)) {
    ++saved_lines;
  }
  EXPECT_EQ(saved_lines, stopped.folders.size());
  for (const auto& e : fs::recursive_directory_iterator(dir_ + "/stopped")) {
    EXPECT_NE(e.path().extension(), ".part");
  }
}

INSTANTIATE_TEST_SUITE_P(Stores, FileExportTest, ::testing::ValuesIn(kEveryStore), StoreCaseName);

TEST(ItemFileNameTest, ForbiddenCharactersCounterAndCuts) {
  store::MessageSummary row;
  row.to = "A<b>";
  row.sender = "x|y";
  row.subject = "a/b:c";
  const bool all[4] = {true, true, true, false};
  EXPECT_EQ(ItemFileName(row, "", all, 7, ".eml", 10), "A b x ya b c7.eml");
  const bool none[4] = {false, false, false, false};
  EXPECT_EQ(ItemFileName(row, "", none, 3, ".eml", 10), "3.eml");
  // Hostile subjects never leave the folder or hide the file.
  row.subject = "../../etc/passwd\r\n";
  const bool subject[4] = {false, false, true, false};
  const std::string hostile = ItemFileName(row, "", subject, 1, ".eml", 10);
  EXPECT_EQ(hostile.find('/'), std::string::npos);
  EXPECT_NE(hostile.front(), '.');
  EXPECT_EQ(hostile.find('\n'), std::string::npos);
  // A deep folder shortens the name; counter and extension survive.
  row.subject = std::string(300, 'S');
  const std::string cut = ItemFileName(row, "", subject, 12, ".eml", 200);
  EXPECT_LT(cut.size() + 200, 256u);
  EXPECT_EQ(cut.substr(cut.size() - 6), "12.eml");
  // Multi-byte text is cut on a character and fits a file-system name.
  row.subject = std::string();
  for (int i = 0; i < 200; ++i) row.subject += "\xE6\x97\xA5";  // 日
  const std::string wide = ItemFileName(row, "", subject, 5, ".eml", 0);
  EXPECT_LE(wide.size(), 255u);
  EXPECT_TRUE(IsValidUtf8(wide));
  EXPECT_EQ(wide.substr(wide.size() - 5), "5.eml");
}

TEST(DuplicateDigestTest, ChosenFieldsDecide) {
  store::MessageSummary a, b;
  a.to = b.to = "x";
  a.subject = "one";
  b.subject = "two";
  a.created = b.created = "01/01/2020 00:00:00";
  const bool by_to_created[6] = {true, false, false, true, false, false};
  const bool by_subject[6] = {false, false, true, false, false, false};
  EXPECT_EQ(DuplicateDigest(a, by_to_created), DuplicateDigest(b, by_to_created));
  EXPECT_NE(DuplicateDigest(a, by_subject), DuplicateDigest(b, by_subject));
  // A To line of a single space counts as empty.
  store::MessageSummary c = a, d = a;
  c.to = " ";
  d.to = "";
  EXPECT_EQ(DuplicateDigest(c, by_to_created), DuplicateDigest(d, by_to_created));
}

TEST(ExportOptionsTest, PagesRefuseWithTheirMessages) {
  ExportOptions o;
  o.dedup_on = true;
  for (bool& b : o.dedup_by) b = false;
  EXPECT_EQ(CheckFilterPage(o).message(), kNoDedupCriteria);
  o.dedup_on = false;
  o.date_mode = DateMode::kInside;
  EXPECT_EQ(CheckFilterPage(o).message(), kNoDateRange);
  EXPECT_EQ(AddDateRange(&o.date_ranges, {{2021, 5, 1}, {2021, 4, 1}}).message(), kEndBeforeStart);
  ASSERT_TRUE(AddDateRange(&o.date_ranges, {{2021, 1, 1}, {2021, 6, 30}}).ok());
  ASSERT_TRUE(AddDateRange(&o.date_ranges, {{2021, 1, 1}, {2021, 6, 30}}).ok());
  EXPECT_EQ(o.date_ranges.size(), 1u);
  EXPECT_TRUE(CheckFilterPage(o).ok());
  EXPECT_EQ(CheckPstPage(&o, true, "/x", true, "99", false).message(), kSplitTooSmall);
  EXPECT_TRUE(CheckPstPage(&o, true, "/x", true, "1", true).ok());
  EXPECT_EQ(o.split_size, uint64_t(1) << 30);
  EXPECT_EQ(CheckPstPage(&o, true, "/x", true, "", false).message(), kNoSplitSize);
  EXPECT_EQ(CheckPstPage(&o, false, "", false, "", false).message(), kNoExistingPst);
  for (bool& b : o.name_by) b = false;
  EXPECT_EQ(CheckFormatPage(&o, "/out", 0).message(), kNoNamingOption);
  o.name_by[2] = true;
  EXPECT_EQ(CheckFormatPage(&o, "", 0).message(), kNoDestination);
  // Field by field: June 15 lies in Jan 1 - Jun 30; Feb 20 not in Jan 15 - Mar 10.
  EXPECT_TRUE(InRange({2021, 6, 15}, {{2021, 1, 1}, {2021, 6, 30}}));
  EXPECT_FALSE(InRange({2021, 2, 20}, {{2021, 1, 15}, {2021, 3, 10}}));
}

TEST(EmlComposerTest, LargeAttachmentsGoOutWhole) {
  if (!HavePython()) GTEST_SKIP() << "/usr/bin/python3 is needed";
  std::string dir;
  ASSERT_TRUE(MakeTempDir("tarnwell-big", &dir).ok());
  constexpr size_t kSize = 41u << 20;
  std::vector<store::AttachmentRecord> attachments(1);
  attachments[0].name = "big.bin";
  attachments[0].data.resize(kSize);
  for (size_t i = 0; i < kSize; ++i) attachments[0].data[i] = uint8_t(i * 2654435761u >> 24);
  store::MessageRecord message;
  const std::string text = "Body\r\nFrom here on\r\n";
  message.body.assign(text.begin(), text.end());
  message.body_is_text = true;
  render::HeaderStrings headers;
  headers.subject = "Line one\r\nBcc: injected@example.com";
  const std::string path = dir + "/big.eml";
  FILE* f = std::fopen(path.c_str(), "wb");
  ASSERT_NE(f, nullptr);
  render::FileSink sink(f);
  ASSERT_TRUE(render::ComposeMessage(message, std::nullopt, attachments, headers, {}, &sink).ok());
  std::fclose(f);
  const std::string script =
      "import email, email.policy, hashlib, sys\n"
      "m = email.message_from_binary_file(open(sys.argv[1], 'rb'), policy=email.policy.default)\n"
      "assert m['bcc'] is None, 'header injected'\n"
      "a = list(m.iter_attachments())\n"
      "d = a[0].get_payload(decode=True)\n"
      "print(len(d), hashlib.sha256(d).hexdigest())\n";
  std::ofstream(dir + "/read.py") << script;
  const std::string cmd = "/usr/bin/python3 " + dir + "/read.py " + path + " > " + dir + "/out.txt";
  ASSERT_EQ(std::system(cmd.c_str()), 0);
  std::ifstream in(dir + "/out.txt");
  size_t size = 0;
  in >> size;
  EXPECT_EQ(size, kSize);
  fs::remove_all(dir);
}

}  // namespace
}  // namespace tarnwell::app
