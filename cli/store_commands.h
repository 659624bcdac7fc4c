// `tarnwell scan`, `list` and `show`: the scanned folder tree, a folder's
// item list, and one decoded item.
#ifndef TARNWELL_CLI_STORE_COMMANDS_H_
#define TARNWELL_CLI_STORE_COMMANDS_H_

#include <string>

#include "cli/store_session.h"

namespace tarnwell::cli {

std::string FormatScanText(StoreSession& session);
std::string FormatScanJson(StoreSession& session, const ScanOptions& options);

// The ten list columns, as the item list shows them.
struct ListRow {
  std::string to, from, subject, has_attachment, created, type, importance, status, modified,
      arrival;
  uint64_t key = 0;
};
ListRow MakeListRow(const store::MessageSummary& summary);
std::string ImportanceText(uint32_t importance);

Status RunList(StoreSession& session, const std::string& ref, bool json, std::string* out);
Status RunShow(StoreSession& session, const std::string& ref, size_t item, bool json,
               std::string* out);

}  // namespace tarnwell::cli

#endif  // TARNWELL_CLI_STORE_COMMANDS_H_
