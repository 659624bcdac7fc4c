// Large databases for benchmarks, streamed to disk page by page.
//
//   forge::BigOptions options;
//   options.size_mib = 1024;
//   Status s = forge::WriteBigDatabase(options, "big.edb", &manifest);
//
// The database has a few small tables (Folders, Mailboxes) and one large
// one, Messages, whose rows carry fixed, variable and tagged columns; some
// bodies and every attachment live in the Messages long-value tree. Rows and
// long values are made as the trees are written, so memory stays at a few
// pages plus the branch keys whatever the size. The same options give the
// same file.
#ifndef TARNWELL_TESTING_FORGE_BIG_H_
#define TARNWELL_TESTING_FORGE_BIG_H_

#include <cstdint>
#include <string>

#include "base/status.h"
#include "testing/forge_layout.h"

namespace tarnwell::forge {

struct BigOptions {
  uint64_t size_mib = 1024;  // the file grows until it reaches this size
  uint32_t page_size = 8192;
  uint32_t revision = 0;  // 0: the usual one for the page size
  uint64_t seed = 1;
};

struct BigResult {
  uint64_t rows = 0;         // in Messages
  uint64_t long_values = 0;  // in Messages' long-value tree
  uint64_t file_size = 0;
};

// `manifest` (optional) lists the tables; its written_pages stays empty.
Status WriteBigDatabase(const BigOptions& options, const std::string& path,
                        Manifest* manifest = nullptr, BigResult* result = nullptr);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_BIG_H_
