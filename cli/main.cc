// tarnwell: the command line.
#include <CLI/CLI.hpp>
#include <cstdio>
#include <string>

#include "cli/info_command.h"
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

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"tarnwell: reads offline Exchange mailbox databases"};
  app.require_subcommand(1);

  std::string info_path;
  bool info_json = false;
  CLI::App* info = app.add_subcommand("info", "Describe a database file from its header and pages");
  info->add_option("DB", info_path, "database file")->required();
  info->add_flag("--json", info_json, "print JSON");

  CLI11_PARSE(app, argc, argv);
  if (info->parsed()) return RunInfo(info_path, info_json);
  return 2;
}
