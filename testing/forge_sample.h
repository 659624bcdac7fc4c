// A deterministic sample database with a column of every kind, for the
// demo, smoke tests and the checks against other ESE readers.
#ifndef TARNWELL_TESTING_FORGE_SAMPLE_H_
#define TARNWELL_TESTING_FORGE_SAMPLE_H_

#include <cstdint>

#include "testing/forge_layout.h"

namespace tarnwell::forge {

struct SampleOptions {
  uint32_t page_size = 8192;
  uint32_t revision = 12;
  uint32_t rows = 200;
  // Force several tree levels even with few rows.
  uint32_t max_rows_per_leaf = 0;
  uint32_t max_children_per_branch = 0;
};

// Tables "Items" (every fixed type, ASCII and UTF-16 text, binary, tagged
// text and binary; some NULLs and deleted rows) and "Folders" (a few rows).
DatabaseLayout SampleDatabase(const SampleOptions& options);

// The Exchange revision that goes with a page size: 4 KiB 9, 8 KiB 12,
// larger 17.
uint32_t DefaultRevisionFor(uint32_t page_size);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_SAMPLE_H_
