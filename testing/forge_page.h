// One database page: header, values and the tag array, laid out as ESE does.
#ifndef TARNWELL_TESTING_FORGE_PAGE_H_
#define TARNWELL_TESTING_FORGE_PAGE_H_

#include <cstddef>
#include <cstdint>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::forge {

// Tag flags of a page value (bits 13-15 of a small page's tag offset word,
// or of a large page's first node word).
constexpr uint8_t kTagFlagVersion = 0x1;
constexpr uint8_t kTagFlagDeleted = 0x2;
constexpr uint8_t kTagFlagPrefix = 0x4;

constexpr size_t kSmallPageHeaderSize = 40;
constexpr size_t kLargePageHeaderSize = 80;
constexpr size_t kTagSize = 4;
constexpr uint32_t kLargePageMinimum = 16384;

// The facts about a database's page format that change the byte layout.
struct PageFormat {
  uint32_t page_size = 8192;
  uint32_t revision = 12;
  uint32_t format_flags = 0;  // OR-ed into every page's flags

  // 16 KiB and larger pages: 80-byte header, 15-bit tags, tag flags in the
  // nodes, and a flag byte before every tagged column value.
  bool large() const { return page_size >= kLargePageMinimum; }
  size_t header_size() const { return large() ? kLargePageHeaderSize : kSmallPageHeaderSize; }
  // Bytes for values and tags together.
  size_t value_space() const { return page_size - header_size(); }
  // The largest value offset or size a tag can hold.
  size_t tag_field_limit() const { return large() ? 0x7FFF : 0x1FFF; }
};

struct PageValue {
  Bytes data;
  uint8_t tag_flags = 0;  // kTagFlag*
};

struct PageHeaderFields {
  uint32_t page_number = 0;
  uint32_t previous_page = 0;
  uint32_t next_page = 0;
  uint32_t object_id = 0;  // father data page object id
  uint32_t flags = 0;      // without the format flags, which are added here
  uint64_t db_time = 0;
};

// Bytes one value costs in a page: the value and its tag.
inline size_t PageValueCost(size_t value_size) { return value_size + kTagSize; }

// Lays out a page: values[0] is the page's external header (tag 0), the
// rest its nodes. Fills `page` (format.page_size bytes) and stamps its
// checksum. False when the values do not fit.
bool LayoutPage(const PageFormat& format, const PageHeaderFields& header,
                const std::vector<PageValue>& values, uint8_t* page);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_PAGE_H_
