// `tarnwell tables DB [--json]`: every table of any ESE database with its
// object id, root pages and columns, read from the catalog.
#ifndef TARNWELL_CLI_TABLES_COMMAND_H_
#define TARNWELL_CLI_TABLES_COMMAND_H_

#include <memory>
#include <string>

#include "base/progress_sink.h"
#include "base/status.h"
#include "engine/edb_class.h"

namespace tarnwell::cli {

// Opens any ESE file for inspection and reads its catalog from page 4.
Status OpenWithCatalog(const std::string& path, ProgressSink& progress,
                       std::unique_ptr<engine::EdbClass>* reader);

std::string ColumnTypeName(uint32_t type);

std::string FormatTablesText(const engine::EdbClass& reader);
std::string FormatTablesJson(const engine::EdbClass& reader);

}  // namespace tarnwell::cli

#endif  // TARNWELL_CLI_TABLES_COMMAND_H_
