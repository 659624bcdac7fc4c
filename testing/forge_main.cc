// tarnwell-forge: writes test ESE databases.
//
//   tarnwell-forge sample OUT.edb [--page-size N] [--revision N] [--rows N]
//                                 [--rows-per-leaf N]
//   tarnwell-forge big OUT.edb --size-mib N [--page-size N] [--revision N] [--seed N]
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "testing/ese_writer.h"
#include "testing/forge_big.h"
#include "testing/forge_sample.h"

namespace {

constexpr const char kUsage[] =
    "usage: tarnwell-forge sample OUT.edb [--page-size N] [--revision N] [--rows N]\n"
    "                                     [--rows-per-leaf N]\n"
    "       tarnwell-forge big OUT.edb --size-mib N [--page-size N] [--revision N] [--seed N]\n";

bool ParseNumber(const char* text, uint32_t* out) {
  char* end = nullptr;
  unsigned long v = std::strtoul(text, &end, 10);
  if (!*text || *end || v > 0xFFFFFFFFul) return false;
  *out = uint32_t(v);
  return true;
}

void PrintManifest(const tarnwell::forge::Manifest& manifest) {
  for (const tarnwell::forge::TableManifest& t : manifest.tables) {
    std::printf("  %-18s object %u, root page %u, %zu leaves, %zu branches", t.name.c_str(),
                t.object_id, t.root_page, t.leaf_pages.size(), t.branch_pages.size());
    if (t.long_value_root_page) {
      std::printf("; long values at page %u, %zu leaves", t.long_value_root_page,
                  t.long_value_leaf_pages.size());
    }
    std::printf("\n");
  }
}

int RunBig(int argc, char** argv) {
  using namespace tarnwell::forge;
  BigOptions options;
  bool size_given = false;
  for (int i = 3; i < argc; i += 2) {
    uint32_t value = 0;
    if (i + 1 >= argc || !ParseNumber(argv[i + 1], &value)) {
      std::fputs(kUsage, stderr);
      return 2;
    }
    if (!std::strcmp(argv[i], "--size-mib")) {
      options.size_mib = value;
      size_given = true;
    } else if (!std::strcmp(argv[i], "--page-size")) {
      options.page_size = value;
    } else if (!std::strcmp(argv[i], "--revision")) {
      options.revision = value;
    } else if (!std::strcmp(argv[i], "--seed")) {
      options.seed = value;
    } else {
      std::fputs(kUsage, stderr);
      return 2;
    }
  }
  if (!size_given) {
    std::fputs(kUsage, stderr);
    return 2;
  }
  Manifest manifest;
  BigResult result;
  tarnwell::Status s = WriteBigDatabase(options, argv[2], &manifest, &result);
  if (!s.ok()) {
    std::fprintf(stderr, "tarnwell-forge: %s\n", s.message().c_str());
    return 1;
  }
  std::printf("%s: %u-byte pages, %llu bytes, %llu messages, %llu long values\n", argv[2],
              options.page_size, static_cast<unsigned long long>(result.file_size),
              static_cast<unsigned long long>(result.rows),
              static_cast<unsigned long long>(result.long_values));
  PrintManifest(manifest);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace tarnwell::forge;
  if (argc >= 3 && std::strcmp(argv[1], "big") == 0) return RunBig(argc, argv);
  if (argc < 3 || std::strcmp(argv[1], "sample") != 0) {
    std::fputs(kUsage, stderr);
    return 2;
  }
  const std::string out = argv[2];
  SampleOptions options;
  bool revision_given = false;
  for (int i = 3; i < argc; i += 2) {
    uint32_t* target = nullptr;
    if (!std::strcmp(argv[i], "--page-size")) target = &options.page_size;
    if (!std::strcmp(argv[i], "--revision")) target = &options.revision, revision_given = true;
    if (!std::strcmp(argv[i], "--rows")) target = &options.rows;
    if (!std::strcmp(argv[i], "--rows-per-leaf")) target = &options.max_rows_per_leaf;
    if (!target || i + 1 >= argc || !ParseNumber(argv[i + 1], target)) {
      std::fputs(kUsage, stderr);
      return 2;
    }
  }
  if (!revision_given) options.revision = DefaultRevisionFor(options.page_size);
  Manifest manifest;
  tarnwell::Status s = WriteDatabase(SampleDatabase(options), out, &manifest);
  if (!s.ok()) {
    std::fprintf(stderr, "tarnwell-forge: %s\n", s.message().c_str());
    return 1;
  }
  std::printf("%s: %u-byte pages, revision %u, %llu pages\n", out.c_str(), options.page_size,
              options.revision, static_cast<unsigned long long>(manifest.total_pages));
  PrintManifest(manifest);
  return 0;
}
