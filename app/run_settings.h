// RunSettings and SourceEntry: the choices a scan runs with, and one scanned
// source with its reader.
#ifndef TARNWELL_APP_RUN_SETTINGS_H_
#define TARNWELL_APP_RUN_SETTINGS_H_

#include <cstdint>
#include <memory>
#include <string>

#include "base/progress_sink.h"
#include "engine/edb_class.h"
#include "store/item_records.h"
#include "store/mail_store.h"

namespace tarnwell::app {

struct RunSettings {
  std::string edb_path;
  std::string stm_path;
  std::string template_path;
  std::string snapshot_path;
  std::string temp_root;  // the temporary folder chosen by the user
  int version_code = 0;   // the StoreVersion
  store::ScanMode mode = store::ScanMode::kStandard;
  uint32_t non_english = 1;       // "Support Non English characters"
  uint32_t adjustment_check = 0;  // runs "Checking Adjustment Factor"
  bool load_snapshot = false;
  bool mailboxes_only = false;  // modern stores: show the mailboxes, load them when used
};

// One scanned source. Its 1-based position in the list of sources is its
// source number.
struct SourceEntry {
  int version_code = 0;
  uint32_t adjustment_check = 0;
  store::ScanMode mode = store::ScanMode::kStandard;
  uint32_t non_english = 1;
  std::string edb_path;
  std::string work_folder;      // temp root + source number
  bool mailboxes_only = false;  // modern stores: load no mailbox during the scan
  std::unique_ptr<engine::EdbClass> reader;
  std::unique_ptr<store::MailStore> store;
};

}  // namespace tarnwell::app

#endif  // TARNWELL_APP_RUN_SETTINGS_H_
