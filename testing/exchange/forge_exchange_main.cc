// tarnwell-forge-exchange: writes an Exchange store and its manifest.
//
//   tarnwell-forge-exchange OUT.edb [--version 4|1|2|3|5] [--later-2013] [--real-layout]
//                           [--public] [--damage]
//                           [--messages N] [--large-folder N] [--size-mib N]
//                           [--seed N] [--manifest OUT.json]
//
// --real-layout writes version 5 as Exchange 2013-2019 servers lay it out
// (file-format revision 110; see modern_store_builder.h).
// --size-mib sets the average bytes per generated message so that N messages
// come to about that size (e.g. --messages 200000 --size-mib 1024).
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>

#include "testing/exchange/modern_store_builder.h"
#include "testing/exchange/store_builder.h"

namespace {

constexpr const char kUsage[] =
    "usage: tarnwell-forge-exchange OUT.edb [--version 4|1|2|3|5] [--later-2013] [--real-layout]\n"
    "                               [--public] [--damage]\n"
    "                               [--messages N] [--large-folder N] [--size-mib N]\n"
    "                               [--seed N] [--manifest OUT.json]\n";
constexpr uint64_t kMiB = 1 << 20;
// Measured: each message costs about this much beyond its payload (list row,
// "Msg" row, page slack), and payload bytes grow by the factor below on disk
// (UTF-16 text, long-value chunk keys, partly filled pages).
constexpr uint64_t kRowOverheadBytes = 1000;
constexpr double kPayloadGrowth = 1.11;

bool ParseNumber(const char* text, uint64_t* out) {
  char* end = nullptr;
  const unsigned long long v = std::strtoull(text, &end, 10);
  if (!*text || *end) return false;
  *out = v;
  return true;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace tarnwell::forge::exchange;
  if (argc < 2 || argv[1][0] == '-') {
    std::fputs(kUsage, stderr);
    return 2;
  }
  LegacyStoreOptions options;
  std::string manifest_path;
  uint64_t size_mib = 0;
  bool later_2013 = false;
  bool real_layout = false;
  for (int i = 2; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--public") {
      options.public_store = true;
      continue;
    }
    if (arg == "--later-2013") {
      later_2013 = true;
      continue;
    }
    if (arg == "--real-layout") {
      real_layout = true;
      options.version = kExchange2013;
      continue;
    }
    if (arg == "--damage") {
      options.damage = DamageOptions::All();
      continue;
    }
    if (i + 1 >= argc) {
      std::fputs(kUsage, stderr);
      return 2;
    }
    const char* value = argv[++i];
    if (arg == "--manifest") {
      manifest_path = value;
      continue;
    }
    uint64_t n = 0;
    if (!ParseNumber(value, &n)) {
      std::fputs(kUsage, stderr);
      return 2;
    }
    if (arg == "--version") {
      options.version = int(n);
    } else if (arg == "--messages") {
      options.bulk.messages = n;
    } else if (arg == "--large-folder") {
      options.bulk.large_folder_items = n;
    } else if (arg == "--size-mib") {
      size_mib = n;
    } else if (arg == "--seed") {
      options.bulk.seed = n;
    } else {
      std::fputs(kUsage, stderr);
      return 2;
    }
  }
  if (size_mib && options.bulk.messages) {
    const uint64_t per_message = size_mib * kMiB / options.bulk.messages;
    options.bulk.average_bytes =
        per_message > kRowOverheadBytes
            ? uint64_t(double(per_message - kRowOverheadBytes) / kPayloadGrowth)
            : 1;
  }
  // Big stores keep counts only; their items would not fit in memory.
  options.record_items = options.bulk.messages <= 10000;

  StoreManifest manifest;
  tarnwell::Status s;
  if (options.version == kExchange2010 || options.version == kExchange2013) {
    if (options.public_store) {
      std::fputs("tarnwell-forge-exchange: modern stores have no public variant\n", stderr);
      return 2;
    }
    ModernStoreOptions modern;
    modern.version = options.version;
    modern.later_2013_variant = later_2013;
    modern.real_layout = real_layout;
    if (options.damage.orphan_folder) modern.damage = ModernDamageOptions::All();
    modern.bulk = options.bulk;
    modern.record_items = options.record_items;
    s = BuildModernStore(modern, argv[1], &manifest);
  } else {
    s = BuildLegacyStore(options, argv[1], &manifest);
  }
  if (!s.ok()) {
    std::fprintf(stderr, "tarnwell-forge-exchange: %s\n", s.message().c_str());
    return 1;
  }
  if (!manifest_path.empty()) {
    std::ofstream out(manifest_path, std::ios::binary);
    out << ManifestJson(manifest);
    if (!out) {
      std::fprintf(stderr, "tarnwell-forge-exchange: cannot write %s\n", manifest_path.c_str());
      return 1;
    }
  }
  std::printf(
      "%s: version %d, %u-byte pages, %zu mailboxes, %zu folders, %llu messages, "
      "%llu attachments\n",
      argv[1], manifest.version, manifest.page_size, manifest.mailboxes.size(),
      manifest.folders.size(), static_cast<unsigned long long>(manifest.messages),
      static_cast<unsigned long long>(manifest.attachment_rows));
  return 0;
}
