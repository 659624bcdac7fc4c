// Lists one folder and then opens every item of it, one after another, with
// its attachments, timing both; for the store benchmark (bench/store.sh).
//
//   tarnwell-bench-store DB FOLDER_REF [standard|advance]
#include <chrono>
#include <cstdio>
#include <string>

#include "cli/store_session.h"

int main(int argc, char** argv) {
  if (argc < 3) {
    std::fprintf(stderr, "usage: %s DB FOLDER_REF [standard|advance]\n", argv[0]);
    return 2;
  }
  using Clock = std::chrono::steady_clock;
  auto seconds = [](Clock::time_point t) {
    return std::chrono::duration<double>(Clock::now() - t).count();
  };
  tarnwell::cli::ScanOptions options;
  options.db = argv[1];
  options.mode = argc > 3 ? argv[3] : "standard";
  tarnwell::cli::StoreSession session;
  auto t = Clock::now();
  tarnwell::Status s = session.Open(options, tarnwell::NullProgress());
  if (!s.ok()) {
    std::fprintf(stderr, "%s\n", s.ToString().c_str());
    return 1;
  }
  std::printf("scan\t%.6f\n", seconds(t));
  const tarnwell::cli::ShownFolder* folder = session.FindFolder(argv[2]);
  if (!folder) {
    std::fprintf(stderr, "no folder %s\n", argv[2]);
    return 1;
  }
  session.BeginJob();
  t = Clock::now();
  std::vector<tarnwell::store::MessageSummary> rows = session.store().ListFolder(folder->folder);
  std::printf("list\t%.6f\t%zu items\n", seconds(t), rows.size());
  t = Clock::now();
  size_t opened = 0, attachments = 0;
  for (const auto& row : rows) {
    tarnwell::store::DecodePurpose purpose;
    if (session.store().OpenMessage(folder->folder, row.message_key, &purpose)) ++opened;
    attachments += session.store().ListAttachments(folder->folder, row.message_key).size();
  }
  std::printf("show\t%.6f\t%zu items\t%zu attachments\n", seconds(t), opened, attachments);
  return 0;
}
