// tarnwell: the command line.
#include <CLI/CLI.hpp>
#include <cstdio>
#include <string>

#include "cli/dump_command.h"
#include "cli/info_command.h"
#include "cli/tables_command.h"
#include "cli/terminal_progress.h"

namespace {

int RunInfo(const std::string& path, bool json) {
  tarnwell::cli::TerminalProgress progress;
  tarnwell::cli::DatabaseInfo info;
  tarnwell::Status s = tarnwell::cli::CollectDatabaseInfo(path, progress, &info);
  if (!s.ok()) {
    std::fprintf(stderr, "tarnwell: %s: %s\n", path.c_str(), s.ToString().c_str());
    return 1;
  }
  const std::string out =
      json ? tarnwell::cli::FormatInfoJson(info) : tarnwell::cli::FormatInfoText(info);
  std::fwrite(out.data(), 1, out.size(), stdout);
  return 0;
}

int RunTables(const std::string& path, bool json) {
  tarnwell::cli::TerminalProgress progress;
  std::unique_ptr<tarnwell::engine::EdbClass> reader;
  tarnwell::Status s = tarnwell::cli::OpenWithCatalog(path, progress, &reader);
  if (!s.ok()) {
    std::fprintf(stderr, "tarnwell: %s: %s\n", path.c_str(), s.ToString().c_str());
    return 1;
  }
  const std::string out = json ? tarnwell::cli::FormatTablesJson(*reader)
                               : tarnwell::cli::FormatTablesText(*reader);
  std::fwrite(out.data(), 1, out.size(), stdout);
  return 0;
}

int RunDump(const std::string& path, const std::string& table, bool json) {
  tarnwell::cli::TerminalProgress progress;
  std::unique_ptr<tarnwell::engine::EdbClass> reader;
  tarnwell::Status s = tarnwell::cli::OpenWithCatalog(path, progress, &reader);
  if (s.ok()) s = tarnwell::cli::DumpTable(*reader, table, json, stdout);
  if (!s.ok()) {
    std::fprintf(stderr, "tarnwell: %s: %s\n", path.c_str(), s.ToString().c_str());
    return 1;
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"tarnwell: reads offline Exchange mailbox databases"};
  app.require_subcommand(1);

  std::string info_path;
  bool info_json = false;
  CLI::App* info = app.add_subcommand("info", "Describe a database file from its header and pages");
  info->add_option("DB", info_path, "database file")->required();
  info->add_flag("--json", info_json, "print JSON");

  std::string tables_path;
  bool tables_json = false;
  CLI::App* tables = app.add_subcommand("tables", "List the tables of a database and their columns");
  tables->add_option("DB", tables_path, "database file")->required();
  tables->add_flag("--json", tables_json, "print JSON");

  std::string dump_path, dump_table;
  bool dump_json = false;
  CLI::App* dump = app.add_subcommand("dump", "Print every record of a table");
  dump->add_option("DB", dump_path, "database file")->required();
  dump->add_option("TABLE", dump_table, "table name")->required();
  dump->add_flag("--json", dump_json, "print JSON");

  CLI11_PARSE(app, argc, argv);
  if (dump->parsed()) return RunDump(dump_path, dump_table, dump_json);
  if (info->parsed()) return RunInfo(info_path, info_json);
  if (tables->parsed()) return RunTables(tables_path, tables_json);
  return 2;
}
