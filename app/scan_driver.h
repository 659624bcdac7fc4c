// The scan driver: turns the run settings into a scanned source, in named
// stages whose texts the status line shows.
//
//   Standard Mode                                  Advance Mode
//   "Reading Catalog"                              "Finding Pages in File"
//   "Traversing record"                            "Reading Catalog for Leaf Pages"
//   "Finding Table names"                          "Traversing record Vector"
//                                                  "Collecting Table Names"
//   "Traversing mailBox table"                     "Finding Users"
//   "Traversing folder table to find folder data"  "Traversing Folder Table to find folder data"
//   "Creating Internal tree Structure"             "Creating internal tree structure"
//   "Showing Data in tree control"                 "Showing Data in tree control"
//   "Creating msg map from msg table"              "Creating Msg map from msg Table"
//   "Creating Attachment map from Attachment table"
//                                                  "Creating Attachment Map from attachment table"
//
// Both start with "Checking Adjustment Factor" when the adjustment check is
// on, and end with "Running process completed successfully.".
#ifndef TARNWELL_APP_SCAN_DRIVER_H_
#define TARNWELL_APP_SCAN_DRIVER_H_

#include <string>
#include <vector>

#include "app/run_settings.h"
#include "base/progress_sink.h"
#include "base/status.h"
#include "store/folder_tree.h"

namespace tarnwell::app {

inline constexpr char kScanCompleted[] = "Running process completed successfully.";
inline constexpr char kFileCannotBeOpened[] = "File cannot be opened";
inline constexpr char kStmCannotBeOpened[] = "Stm File cannot be opened";
inline constexpr char kVersionNotDetected[] =
    "Version Cannot be auto detected. please select the version";

struct ScanOutcome {
  bool tree_shown = false;
  std::vector<std::string> stages;  // the stage texts, in order
  bool stopped = false;             // the user stopped the scan
};

// Opens the source: creates the reader of the version's family, opens the
// stream file (codes 1, 2, 4, when given) and the database, and makes the
// source's work folder (temp root + source number). Clear errors for the
// user in the Status.
Status OpenSource(const RunSettings& settings, uint64_t source_number, ProgressSink& progress,
                  SourceEntry* source);

// Runs the stages of `source.mode` on the calling thread. `running` is
// polled by every loop; the tree goes to `tree`.
ScanOutcome RunScan(SourceEntry& source, uint64_t source_number, RunningFlag& running,
                    ProgressSink& progress, store::FolderTreeSink& tree);

}  // namespace tarnwell::app

#endif  // TARNWELL_APP_SCAN_DRIVER_H_
