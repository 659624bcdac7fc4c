// StoreSession: what `scan`, `list` and `show` share: open a database, run
// the scan driver, and keep the shown folder tree with stable references.
#ifndef TARNWELL_CLI_STORE_SESSION_H_
#define TARNWELL_CLI_STORE_SESSION_H_

#include <cstdint>
#include <string>
#include <vector>

#include "app/run_settings.h"
#include "app/scan_driver.h"
#include "base/progress_sink.h"
#include "base/status.h"

namespace tarnwell::cli {

struct ScanOptions {
  std::string db;
  std::string version = "auto";   // auto|5.5|2000|2003|2007|2010|2013
  std::string mode = "standard";  // standard|advance
  std::string stm;
  std::string temp;  // empty: a fresh folder, removed at the end
  bool adjust = false;
  bool mailboxes_only = false;  // modern stores: load mailboxes only when used
};

struct ShownFolder {
  std::string ref;                // the folder id in hexadecimal; stable across runs
  std::vector<std::string> path;  // names from the source's top item down
  store::FolderRef folder;        // the folder in its store
  int icon = 0;
  int parent = -1;  // position of the parent in the shown list; -1: the top item
};

// Parses "auto", "5.5", "2000", ... into a version code; auto reads the
// header. Errors name what is wrong.
Status ParseVersion(const std::string& text, const std::string& db, int* code);
const char* VersionName(int code);

class StoreSession {
 public:
  ~StoreSession();
  Status Open(const ScanOptions& options, ProgressSink& progress);

  const app::ScanOutcome& outcome() const { return outcome_; }
  const std::vector<ShownFolder>& folders() const { return folders_; }
  const ShownFolder* FindFolder(const std::string& ref) const;
  store::MailStore& store() { return *source_.store; }
  const app::SourceEntry& source() const { return source_; }
  const std::string& top_text() const { return top_text_; }
  // A job after the scan (list, show) raises the running flag again: the
  // scan's end sequence lowered it.
  void BeginJob() { running_.store(true); }
  RunningFlag& running() { return running_; }

 private:
  app::RunSettings settings_;
  app::SourceEntry source_;
  app::ScanOutcome outcome_;
  std::vector<ShownFolder> folders_;
  std::string top_text_;
  std::string temp_root_;
  bool own_temp_ = false;
  RunningFlag running_{false};
};

}  // namespace tarnwell::cli

#endif  // TARNWELL_CLI_STORE_SESSION_H_
