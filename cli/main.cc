// tarnwell: the command line.
#include <CLI/CLI.hpp>
#include <cstdio>
#include <string>

#include "cli/dump_command.h"
#include "cli/export_command.h"
#include "cli/info_command.h"
#include "cli/store_commands.h"
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
  const std::string out =
      json ? tarnwell::cli::FormatTablesJson(*reader) : tarnwell::cli::FormatTablesText(*reader);
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

void AddScanOptions(CLI::App* cmd, tarnwell::cli::ScanOptions* o) {
  cmd->add_option("DB", o->db, "database file")->required();
  cmd->add_option("--version", o->version, "auto, 5.5, 2000, 2003, 2007, 2010 or 2013");
  cmd->add_option("--mode", o->mode, "standard or advance");
  cmd->add_option("--stm", o->stm, "the streaming file of an Exchange 2000/2003 database");
  cmd->add_option("--temp", o->temp, "temporary folder (default: a fresh one, removed at the end)");
  cmd->add_flag("--adjust", o->adjust, "handle alignment errors: find where the database starts");
  cmd->add_flag("--mailboxes-only", o->mailboxes_only,
                "Exchange 2010/2013: show the mailboxes; read a mailbox's folders when used");
}

int Fail(const std::string& path, const tarnwell::Status& s) {
  std::fprintf(stderr, "tarnwell: %s: %s\n", path.c_str(), s.message().c_str());
  return 1;
}

int RunStore(const tarnwell::cli::ScanOptions& o, const std::string& command,
             const std::string& ref, size_t item, bool json) {
  tarnwell::cli::TerminalProgress progress;
  tarnwell::cli::StoreSession session;
  tarnwell::Status s = session.Open(o, progress);
  if (!s.ok()) return Fail(o.db, s);
  std::string out;
  if (command == "scan") {
    out = json ? tarnwell::cli::FormatScanJson(session, o) : tarnwell::cli::FormatScanText(session);
  } else if (command == "list") {
    s = tarnwell::cli::RunList(session, ref, json, &out);
  } else {
    s = tarnwell::cli::RunShow(session, ref, item, json, &out);
  }
  if (!s.ok()) return Fail(o.db, s);
  std::fwrite(out.data(), 1, out.size(), stdout);
  return 0;
}

int RunExportCommand(const tarnwell::cli::ExportCommandOptions& o) {
  tarnwell::cli::TerminalProgress progress;
  tarnwell::cli::ExportSummary summary;
  tarnwell::Status s = tarnwell::cli::RunExport(o, progress, &summary);
  if (!s.ok()) return Fail(o.scan.db, s);
  std::printf("Exported %llu of %llu items from %zu folders to %s\n",
              static_cast<unsigned long long>(summary.saved),
              static_cast<unsigned long long>(summary.found), summary.folders,
              summary.destination.c_str());
  for (const std::string& file : summary.pst_files) std::printf("PST: %s\n", file.c_str());
  if (!summary.log_path.empty()) std::printf("Log: %s\n", summary.log_path.c_str());
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
  CLI::App* tables =
      app.add_subcommand("tables", "List the tables of a database and their columns");
  tables->add_option("DB", tables_path, "database file")->required();
  tables->add_flag("--json", tables_json, "print JSON");

  std::string dump_path, dump_table;
  bool dump_json = false;
  CLI::App* dump = app.add_subcommand("dump", "Print every record of a table");
  dump->add_option("DB", dump_path, "database file")->required();
  dump->add_option("TABLE", dump_table, "table name")->required();
  dump->add_flag("--json", dump_json, "print JSON");

  tarnwell::cli::ScanOptions scan_options, list_options, show_options;
  bool scan_json = false, list_json = false, show_json = false;
  std::string list_ref, show_ref;
  size_t show_item = 0;
  CLI::App* scan = app.add_subcommand("scan", "Scan a mailbox database and print its folder tree");
  AddScanOptions(scan, &scan_options);
  scan->add_flag("--json", scan_json, "print JSON");
  CLI::App* list = app.add_subcommand("list", "List the items of a folder");
  AddScanOptions(list, &list_options);
  list->add_option("--folder", list_ref, "folder reference from `scan`")->required();
  list->add_flag("--json", list_json, "print JSON");
  CLI::App* show = app.add_subcommand("show", "Show one decoded item of a folder");
  AddScanOptions(show, &show_options);
  show->add_option("--folder", show_ref, "folder reference from `scan`")->required();
  show->add_option("--item", show_item, "item number in the folder's list, from 1")->required();
  show->add_flag("--json", show_json, "print JSON");

  tarnwell::cli::ExportCommandOptions export_options;
  CLI::App* exp = app.add_subcommand("export", "Export folders to EML files, MBOX mailboxes or PST files");
  AddScanOptions(exp, &export_options.scan);
  exp->add_option("--to", export_options.to, "eml, mbox or pst")->required();
  exp->add_option("--out", export_options.out, "destination folder");
  exp->add_option("--existing-pst", export_options.existing_pst,
                  "pst: add to this PST file instead of writing new ones");
  exp->add_option("--split-size", export_options.split_size,
                  "pst: start a new file past this size (500MB, 2GB; at least 100MB)");
  exp->add_flag("--split-by-user", export_options.split_by_user, "pst: one file per mailbox");
  exp->add_option("--folder", export_options.folders,
                  "folder reference (repeatable; default: all)");
  exp->add_flag("--hierarchy", export_options.hierarchy,
                "recreate the folder tree below the destination");
  exp->add_option("--name-by", export_options.name_by, "file name parts: to,from,subject,date");
  exp->add_option("--date-range", export_options.date_ranges,
                  "START..END, as 2021-01-31..2021-12-31 (repeatable)");
  exp->add_flag("--exclude-ranges", export_options.exclude_ranges,
                "export the items outside the ranges");
  exp->add_option("--dedup", export_options.dedup,
                  "remove duplicates by: to,from,subject,created,modified,arrival");
  exp->add_flag("--keep-native", export_options.keep_native,
                "contacts as .vcf and appointments as .ics");
  exp->add_option("--ansi-codepage", export_options.ansi_code_page,
                  "header texts in this Windows code page instead of UTF-8");
  exp->add_option("--log-dir", export_options.log_dir,
                  "folder of the export log (default: the desktop)");

  CLI11_PARSE(app, argc, argv);
  if (exp->parsed()) return RunExportCommand(export_options);
  if (scan->parsed()) return RunStore(scan_options, "scan", "", 0, scan_json);
  if (list->parsed()) return RunStore(list_options, "list", list_ref, 0, list_json);
  if (show->parsed()) return RunStore(show_options, "show", show_ref, show_item, show_json);
  if (dump->parsed()) return RunDump(dump_path, dump_table, dump_json);
  if (info->parsed()) return RunInfo(info_path, info_json);
  if (tables->parsed()) return RunTables(tables_path, tables_json);
  return 2;
}
