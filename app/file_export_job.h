// The file export job: the checked folders, depth-first, each into its own
// directory below the destination; per item the date filter, duplicate
// removal, the file name, and a writer chosen by the message class.
//
// Formats written here: EML (mail-like items and tasks as composed;
// contacts and appointments as an .eml carrying their vCard or iCalendar
// file, or the .vcf / .ics itself with `keep_native`) and MBOX (one
// "MboxFile.mbx" per folder).
#ifndef TARNWELL_APP_FILE_EXPORT_JOB_H_
#define TARNWELL_APP_FILE_EXPORT_JOB_H_

#include <cstdint>
#include <ctime>
#include <string>
#include <vector>

#include "app/export_options.h"
#include "base/progress_sink.h"
#include "base/status.h"
#include "store/mail_store.h"

namespace tarnwell::app {

struct ExportFolder {
  store::FolderRef folder;        // the folder in its store
  std::vector<std::string> path;  // names from the source's top item down
};

struct FileExportRequest {
  ExportOptions options;
  std::vector<ExportFolder> folders;  // the checked folders, depth-first
  std::string source_path;
  bool keep_native = false;
  bool store_text = true;  // "Support Non English characters"
  uint32_t ansi_code_page = 1252;
  std::string log_dir;  // empty: the desktop folder
  std::time_t now = 0;  // 0: the clock
};

struct FolderResult {
  std::string directory;
  uint64_t found = 0;
  uint64_t saved = 0;
};

struct FileExportResult {
  std::vector<FolderResult> folders;
  std::string log_path;
  bool stopped = false;
};

inline constexpr char kDataExtracted[] = "Data is extracted in path ";

// The file name of an item: the chosen parts (To, From, Subject, date
// text), each of \ / : * ? " < > | as a space, then the folder's item
// counter and the extension; cut so that folder path and name stay under
// 256 characters, keeping counter and extension.
std::string ItemFileName(const store::MessageSummary& row, const std::string& date_text,
                         const bool name_by[4], uint64_t counter, const std::string& extension,
                         size_t folder_path_length);

// The duplicate key of an item: the chosen fields' texts concatenated, each
// UTF-16 unit reduced to its low byte, hashed with MD5.
std::string DuplicateDigest(const store::MessageSummary& row, const bool dedup_by[6]);

Status RunFileExport(store::MailStore& store, const FileExportRequest& request,
                     RunningFlag& running, ProgressSink& progress, FileExportResult* result);

}  // namespace tarnwell::app

#endif  // TARNWELL_APP_FILE_EXPORT_JOB_H_
