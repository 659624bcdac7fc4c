// Page layout (all integers little-endian).
//
// Page header, 40 bytes (pages smaller than 16 KiB) or 80 bytes:
//   offset width meaning
//   0      4     XOR checksum (64-bit checksum on large pages)
//   4      4     ECC checksum (flag 0x2000) or page number (older pages)
//   8      8     database time of the last change
//   16     4     previous page of the same level
//   20     4     next page of the same level
//   24     4     father data page object id: the tree the page belongs to
//   28     2     free bytes
//   30     2     uncommitted free bytes (always 0 here)
//   32     2     first free byte, relative to the end of the header
//   34     2     number of tags
//   36     4     page flags
//   40     24    large pages: checksums of the 2nd..4th quarter of the page
//   64     8     large pages: page number
//   72     8     large pages: unused
//
// Values are stored from the end of the header on; tag i lies at
// page_size - 4 * (i + 1):
//   +0 u16  value size   (13 bits; 15 bits on large pages)
//   +2 u16  value offset (13 bits, tag flags in bits 13-15; 15 bits on large
//           pages, whose tag flags sit in bits 13-15 of the value's first u16)
#include "testing/forge_page.h"

#include <cstring>

#include "engine/page_checksum.h"
#include "testing/forge_layout.h"

namespace tarnwell::forge {
namespace {

constexpr size_t kOffsetOldPageNumber = 4;
constexpr size_t kOffsetDbTime = 8;
constexpr size_t kOffsetPrevious = 16;
constexpr size_t kOffsetNext = 20;
constexpr size_t kOffsetObjectId = 24;
constexpr size_t kOffsetFreeBytes = 28;
constexpr size_t kOffsetFirstFree = 32;
constexpr size_t kOffsetTagCount = 34;
constexpr size_t kOffsetFlags = 36;
constexpr size_t kOffsetLargePageNumber = 64;
constexpr int kTagFlagShift = 13;

}  // namespace

bool LayoutPage(const PageFormat& format, const PageHeaderFields& header,
                const std::vector<PageValue>& values, uint8_t* page) {
  const size_t page_size = format.page_size;
  const size_t header_size = format.header_size();
  size_t used = 0;
  for (const PageValue& v : values) used += PageValueCost(v.data.size());
  if (used > format.value_space()) return false;

  std::memset(page, 0, page_size);
  const uint32_t flags = header.flags | format.format_flags;
  StoreU64LE(page + kOffsetDbTime, header.db_time);
  StoreU32LE(page + kOffsetPrevious, header.previous_page);
  StoreU32LE(page + kOffsetNext, header.next_page);
  StoreU32LE(page + kOffsetObjectId, header.object_id);
  StoreU32LE(page + kOffsetFlags, flags);
  if (format.large()) {
    StoreU64LE(page + kOffsetLargePageNumber, header.page_number);
  } else if (!(flags & kPageFlagNewChecksum)) {
    // Pages from before the ECC checksum name themselves after the checksum.
    StoreU32LE(page + kOffsetOldPageNumber, header.page_number);
  }

  size_t offset = 0;  // relative to the end of the header
  for (size_t i = 0; i < values.size(); ++i) {
    const PageValue& v = values[i];
    uint8_t* data = page + header_size + offset;
    if (!v.data.empty()) std::memcpy(data, v.data.data(), v.data.size());
    uint16_t offset_word = uint16_t(offset);
    if (format.large()) {
      if (v.tag_flags != 0 && v.data.size() >= 2) {
        StoreU16LE(data, uint16_t(LoadU16LE(data) | (v.tag_flags << kTagFlagShift)));
      }
    } else {
      offset_word = uint16_t(offset_word | (v.tag_flags << kTagFlagShift));
    }
    uint8_t* tag = page + page_size - kTagSize * (i + 1);
    StoreU16LE(tag, uint16_t(v.data.size()));
    StoreU16LE(tag + 2, offset_word);
    offset += v.data.size();
  }
  StoreU16LE(page + kOffsetFreeBytes, uint16_t(format.value_space() - used));
  StoreU16LE(page + kOffsetFirstFree, uint16_t(offset));
  StoreU16LE(page + kOffsetTagCount, uint16_t(values.size()));
  engine::StampPageChecksum(page, page_size, header.page_number);
  return true;
}

}  // namespace tarnwell::forge
