// `tarnwell dump DB TABLE [--json]`: every record of one table, every column
// decoded by its engine type.
#ifndef TARNWELL_CLI_DUMP_COMMAND_H_
#define TARNWELL_CLI_DUMP_COMMAND_H_

#include <cstdio>
#include <string>

#include "base/status.h"
#include "engine/edb_class.h"

namespace tarnwell::cli {

// Writes the dump of `table_name` to `out`. NotFound when there is no such
// table.
Status DumpTable(engine::EdbClass& reader, const std::string& table_name, bool json, FILE* out);

}  // namespace tarnwell::cli

#endif  // TARNWELL_CLI_DUMP_COMMAND_H_
