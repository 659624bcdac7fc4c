// Long-value trees: the values of a table too large for its records, cut
// into chunks and keyed by long-value id.
#ifndef TARNWELL_TESTING_FORGE_LONG_VALUE_H_
#define TARNWELL_TESTING_FORGE_LONG_VALUE_H_

#include <cstdint>
#include <optional>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "testing/forge_layout.h"
#include "testing/forge_page.h"
#include "testing/forge_tree.h"

namespace tarnwell::forge {

constexpr uint32_t kLongValueIdSize = 4;
constexpr uint32_t kLongValueId64Size = 8;

// The largest chunk that fills a leaf on its own: ESE cuts long values into
// chunks of about a page.
uint32_t DefaultLongValueChunkSize(const PageFormat& format, uint32_t id_size);

Bytes LongValueRootKey(uint64_t id, uint32_t id_size);
Bytes LongValueChunkKey(uint64_t id, uint32_t id_size, uint32_t offset);

struct LongValueCounts {
  uint64_t chunks = 0;      // chunk nodes written
  uint64_t compressed = 0;  // of which stored compressed
};

// Appends the tree entries of one long value (root node, then its chunks in
// offset order), leaving out chunk `dropped` when given.
Status AppendLongValueEntries(const LongValueLayout& value, uint32_t id_size, uint32_t chunk_size,
                              std::optional<uint32_t> dropped, std::vector<TreeEntry>* out,
                              LongValueCounts* counts);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_LONG_VALUE_H_
