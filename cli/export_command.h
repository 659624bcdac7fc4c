// `tarnwell export`: the checked folders of a scanned database to files or
// PST files.
#ifndef TARNWELL_CLI_EXPORT_COMMAND_H_
#define TARNWELL_CLI_EXPORT_COMMAND_H_

#include <string>
#include <vector>

#include "base/progress_sink.h"
#include "base/status.h"
#include "cli/store_session.h"

namespace tarnwell::cli {

struct ExportCommandOptions {
  ScanOptions scan;
  std::string to = "eml";  // eml | mbox | pst
  std::string out;
  // PST: an existing file to add to (instead of new files in `out`), a
  // split size ("500MB", "2GB"; empty: no split), one file per mailbox.
  std::string existing_pst;
  std::string split_size;
  bool split_by_user = false;
  std::vector<std::string> folders;  // references; none: every folder
  bool hierarchy = false;
  std::string name_by = "to,from,subject,date";
  std::vector<std::string> date_ranges;  // "YYYY-MM-DD..YYYY-MM-DD"
  bool exclude_ranges = false;
  std::string dedup;  // e.g. "to,from,subject"; empty: off
  bool keep_native = false;
  uint32_t ansi_code_page = 0;  // 0: UTF-8 texts
  std::string log_dir;
};

struct ExportSummary {
  std::string destination;
  std::string log_path;
  uint64_t found = 0, saved = 0;
  std::vector<std::string> pst_files;
  size_t folders = 0;
};

// Validates the options with the option pages' own messages, scans, and
// exports. The destination of files is OUT/Tarnwell_<date and time>; PST
// files go to OUT itself.
Status RunExport(const ExportCommandOptions& options, ProgressSink& progress,
                 ExportSummary* summary);

}  // namespace tarnwell::cli

#endif  // TARNWELL_CLI_EXPORT_COMMAND_H_
