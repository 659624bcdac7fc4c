// What the export job tests share: a scanned store built by the test
// writers, the folder list the tree shows, and running an independent
// checker script whose report lands in the failure message.
#ifndef TARNWELL_APP_EXPORT_TEST_SUPPORT_H_
#define TARNWELL_APP_EXPORT_TEST_SUPPORT_H_

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "app/file_export_job.h"
#include "app/scan_driver.h"
#include "base/paths.h"
#include "base/text.h"
#include "testing/exchange/modern_store_builder.h"
#include "testing/exchange/store_builder.h"

namespace tarnwell::app::testing_support {

inline bool HavePython() {
  return std::system("/usr/bin/python3 -c 'import email' 2>/dev/null") == 0;
}

// Runs `/usr/bin/python3 SCRIPT ARGS...`; a failure shows the script's report.
inline void RunChecker(const std::string& script, const std::vector<std::string>& args,
                       const std::string& report) {
  std::string cmd =
      "/usr/bin/python3 '" + std::string(TARNWELL_SOURCE_DIR) + "/app/testdata/" + script + "'";
  for (const std::string& a : args) cmd += " '" + a + "'";
  cmd += " > '" + report + "' 2>&1";
  const int rc = std::system(cmd.c_str());
  std::ifstream in(report);
  const std::string text((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  EXPECT_EQ(rc, 0) << text;
}

// The export log's text (UTF-16LE after its byte-order mark) as UTF-8.
inline std::string ReadLog(const std::string& path) {
  std::ifstream log(path, std::ios::binary);
  const std::string raw((std::istreambuf_iterator<char>(log)), std::istreambuf_iterator<char>());
  if (raw.size() < 2) return "";
  return Utf16LEToUtf8(ByteView(reinterpret_cast<const uint8_t*>(raw.data()) + 2, raw.size() - 2));
}

// The folders the tree shows, each with its path of names.
class Collector : public store::FolderTreeSink {
 public:
  int64_t AddTopItem(const std::string& text, int, uint64_t) override {
    paths_[0] = {text};
    return 0;
  }
  int64_t AddFolder(int64_t parent, const std::string& text, int, uint32_t index) override {
    return Add(parent, text, {-1, index});
  }
  int64_t AddMailboxFolder(int64_t parent, const std::string& text, int, int32_t mailbox,
                           uint32_t index) override {
    return Add(parent, text, {mailbox, index});
  }
  std::vector<ExportFolder> folders;

 private:
  int64_t Add(int64_t parent, const std::string& text, store::FolderRef ref) {
    ExportFolder f{ref, paths_[parent]};
    f.path.push_back(text);
    paths_[int64_t(folders.size()) + 1] = f.path;
    folders.push_back(f);
    return int64_t(folders.size());
  }
  std::map<int64_t, std::vector<std::string>> paths_;
};

struct StoreCase {
  const char* name;
  int version;
  bool public_store = false;
  bool real_layout = false;  // version 5 as Exchange 2013-2019 servers write it
};

// One store of every version code and layout.
inline const std::vector<StoreCase> kEveryStore = {{"v55", 4},
                                                   {"v2003", 1},
                                                   {"v2007", 2},
                                                   {"v2003_public", 1, true},
                                                   {"v2010", 3},
                                                   {"v2013", 5},
                                                   {"v2013_real", 5, false, true}};

inline std::string StoreCaseName(const ::testing::TestParamInfo<StoreCase>& info) {
  return info.param.name;
}

// A store of the case's version with every damage case, its manifest as
// JSON, scanned and shown.
class ScannedStoreTest : public ::testing::TestWithParam<StoreCase> {
 protected:
  void SetUp() override {
    namespace fx = forge::exchange;
    if (!HavePython()) GTEST_SKIP() << "/usr/bin/python3 is needed to read the export back";
    ASSERT_TRUE(MakeTempDir("tarnwell-export", &dir_).ok());
    fx::StoreManifest manifest;
    if (GetParam().version == fx::kExchange2010 || GetParam().version == fx::kExchange2013) {
      fx::ModernStoreOptions o;
      o.version = GetParam().version;
      o.later_2013_variant = GetParam().version == fx::kExchange2013 && !GetParam().real_layout;
      o.real_layout = GetParam().real_layout;
      o.damage = fx::ModernDamageOptions::All();
      ASSERT_TRUE(fx::BuildModernStore(o, dir_ + "/store.edb", &manifest).ok());
    } else {
      fx::LegacyStoreOptions o;
      o.version = GetParam().version;
      o.public_store = GetParam().public_store;
      o.damage = fx::DamageOptions::All();
      ASSERT_TRUE(fx::BuildLegacyStore(o, dir_ + "/store.edb", &manifest).ok());
    }
    manifest_path_ = dir_ + "/manifest.json";
    std::ofstream(manifest_path_) << fx::ManifestJson(manifest);

    RunSettings settings;
    settings.edb_path = dir_ + "/store.edb";
    settings.temp_root = dir_ + "/temp";
    settings.version_code = GetParam().version;
    ASSERT_TRUE(OpenSource(settings, 1, NullProgress(), &source_).ok());
    RunningFlag running{true};
    ASSERT_TRUE(RunScan(source_, 1, running, NullProgress(), tree_).tree_shown);
  }
  void TearDown() override {
    source_.store.reset();
    source_.reader.reset();
    if (!dir_.empty() && !std::getenv("TARNWELL_KEEP_TEST_FILES"))
      std::filesystem::remove_all(dir_);
  }

  std::string dir_, manifest_path_;
  SourceEntry source_;
  Collector tree_;
};

}  // namespace tarnwell::app::testing_support

#endif  // TARNWELL_APP_EXPORT_TEST_SUPPORT_H_
