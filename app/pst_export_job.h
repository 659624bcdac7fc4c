// The PST export job: the checked folders of a scanned source into PST
// files, through a mail session.
//
// Mode 1 writes new files (named from the source, or from each mailbox when
// splitting by user; an existing file is never overwritten: a free numbered
// name is taken instead), mode 2 adds to an existing PST, reusing the
// folders it already has. With a split size, a file that has reached it is
// closed before the next item and the folder path is re-created in the next
// numbered file. Mail and posts go to the mirrored folder; appointments,
// contacts, journal entries, sticky notes and tasks to the default folder of
// their kind.
#ifndef TARNWELL_APP_PST_EXPORT_JOB_H_
#define TARNWELL_APP_PST_EXPORT_JOB_H_

#include <cstdint>
#include <ctime>
#include <string>
#include <vector>

#include "app/export_options.h"
#include "app/file_export_job.h"
#include "base/progress_sink.h"
#include "base/status.h"
#include "store/mail_store.h"

namespace tarnwell::app {

// What a new file's running size starts from: the size of an empty PST.
inline constexpr uint64_t kEmptyPstBytes = 262144;

struct PstExportRequest {
  // The filters, and the PST page: pst_mode, save_path, existing_pst,
  // split_by_user, split_enabled, split_size.
  ExportOptions options;
  // The checked folders, depth-first; path[0] is the source's top item,
  // path[1] the mailbox.
  std::vector<ExportFolder> folders;
  std::string source_path;
  bool store_text = true;
  uint32_t ansi_code_page = 1252;
  std::string log_dir;  // empty: the desktop folder
  std::time_t now = 0;  // 0: the clock
};

struct PstExportResult {
  std::vector<std::string> files;  // every PST written to, in order
  std::vector<FolderResult> folders;
  std::string log_path;
  bool stopped = false;
};

// The file name of a new PST for a base name: the text after the last path
// separator, then ".pst", upper case, made safe as a file name.
std::string PstFileName(const std::string& base_name);
// `folder`/`name`, or, when that exists, the first free `folder`/n`name`
// for n = 0, 1, 2, ...
std::string FreePstPath(const std::string& folder, const std::string& name);
// The class a new PST folder gets by its name ("Tasks" -> "IPF.Task", ...);
// empty for mail folders.
std::string FolderClassForName(const std::string& name);

Status RunPstExport(store::MailStore& store, const PstExportRequest& request, RunningFlag& running,
                    ProgressSink& progress, PstExportResult* result);

}  // namespace tarnwell::app

#endif  // TARNWELL_APP_PST_EXPORT_JOB_H_
