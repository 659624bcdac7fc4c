// `tarnwell info DB [--json]`: what a database file is, from its header and
// a scan of every page header.
#ifndef TARNWELL_CLI_INFO_COMMAND_H_
#define TARNWELL_CLI_INFO_COMMAND_H_

#include <cstdint>
#include <string>

#include "base/progress_sink.h"
#include "base/status.h"

namespace tarnwell::cli {

struct DatabaseInfo {
  std::string path;
  bool signature_ok = false;
  uint32_t format_version = 0;
  uint32_t format_revision = 0;
  int version_code = 0;
  std::string version_name;  // empty when the revision names no Exchange version
  uint32_t header_page_size = 0;
  uint32_t version_page_size = 0;  // 0 without a version
  int64_t adjustment = 0;
  uint64_t total_pages = 0;
  uint64_t leaf_pages = 0;
  uint32_t state = 0;
  std::string state_name;
  std::string warning;  // e.g. the header's page size disagrees with the version's
};

Status CollectDatabaseInfo(const std::string& path, ProgressSink& progress, DatabaseInfo* info);
std::string FormatInfoText(const DatabaseInfo& info);
std::string FormatInfoJson(const DatabaseInfo& info);

}  // namespace tarnwell::cli

#endif  // TARNWELL_CLI_INFO_COMMAND_H_
