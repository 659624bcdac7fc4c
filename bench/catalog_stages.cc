// Runs the catalog stages of one scanning mode on a database and prints how
// long each took, for the engine benchmark (bench/engine.sh).
//
//   tarnwell-bench-stages DB standard|advance [VERSION]
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "engine/catalog.h"
#include "engine/edb_class.h"

namespace {

using Clock = std::chrono::steady_clock;

double Seconds(Clock::time_point since) {
  return std::chrono::duration<double>(Clock::now() - since).count();
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 3) {
    std::fprintf(stderr, "usage: %s DB standard|advance [VERSION]\n", argv[0]);
    return 2;
  }
  const std::string path = argv[1];
  const bool advance = std::strcmp(argv[2], "advance") == 0;
  int version = argc > 3 ? std::atoi(argv[3]) : tarnwell::engine::EdbClass::DetectVersion(path);
  std::unique_ptr<tarnwell::engine::EdbClass> reader = tarnwell::engine::MakeReader(version);
  if (!reader || !reader->OpenDatabase(path, {}, version)) {
    std::fprintf(stderr, "cannot open %s as version %d\n", path.c_str(), version);
    return 1;
  }
  const auto start = Clock::now();
  auto t = Clock::now();
  if (advance) {
    reader->ScanLeafPages();
    std::printf("Finding Pages in File\t%.6f\t%zu pages\n", Seconds(t),
                reader->leaf_pages().size());
    t = Clock::now();
    reader->CollectLeafPageRecords();
    std::printf("Reading Catalog for Leaf Pages\t%.6f\t%zu records\n", Seconds(t),
                reader->records().size());
  } else {
    reader->CollectTreeRecords(tarnwell::engine::kCatalogRootPage);
    std::printf("Reading Catalog\t%.6f\t%zu records\n", Seconds(t), reader->records().size());
  }
  t = Clock::now();
  reader->ParseCatalogRecords();
  std::printf("%s\t%.6f\t%zu tables\n", advance ? "Traversing record Vector" : "Traversing record",
              Seconds(t), reader->tables().size());
  t = Clock::now();
  const size_t names = reader->GetTableNames().size();
  std::printf("%s\t%.6f\t%zu names\n", advance ? "Collecting Table Names" : "Finding Table names",
              Seconds(t), names);
  std::printf("total\t%.6f\n", Seconds(start));
  return 0;
}
