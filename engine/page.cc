#include "engine/page.h"

#include <algorithm>

namespace tarnwell::engine {

size_t PageHeaderSize(PageFamily family) {
  return family == PageFamily::kLarge ? kLargePageHeaderSize : kLegacyPageHeaderSize;
}

PageHeader DecodePageHeader(ByteView header, PageFamily family) {
  PageHeader h;
  h.previous = header.U32LE(kPagePreviousOffset);
  h.next = header.U32LE(kPageNextOffset);
  h.object_id = header.U32LE(kPageObjectIdOffset);
  h.tag_count = header.U16LE(kPageTagCountOffset);
  if (family == PageFamily::kLarge) h.tag_count &= kLargePageTagCountMask;
  h.flags = header.U32LE(kPageFlagsOffset);
  return h;
}

Page::Page(Bytes bytes, PageFamily family) : bytes_(std::move(bytes)), family_(family) {
  header_ = DecodePageHeader(ByteView(bytes_), family_);
  BuildNodeTable();
}

void Page::BuildNodeTable() {
  const size_t page_size = bytes_.size();
  const size_t header_size = PageHeaderSize(family_);
  if (page_size <= header_size) return;
  // A tag count larger than the page can hold is damage: keep the tags that
  // fit between the header and the end of the page.
  const size_t max_tags = (page_size - header_size) / kTagSize;
  const size_t tag_count = std::min<size_t>(header_.tag_count, max_tags);
  const size_t data_end = page_size - tag_count * kTagSize;
  const uint16_t value_mask =
      family_ == PageFamily::kLarge ? kLargeTagValueMask : kLegacyTagValueMask;

  nodes_.resize(tag_count);
  std::vector<size_t> large_flag_positions;
  for (size_t i = 0; i < tag_count; ++i) {
    const uint8_t* tag = bytes_.data() + page_size - kTagSize * (i + 1);
    const uint16_t size_word = LoadU16LE(tag);
    const uint16_t offset_word = LoadU16LE(tag + 2);
    NodeEntry& node = nodes_[i];
    node.size = size_word & value_mask;
    const size_t start = header_size + (offset_word & value_mask);
    node.offset = uint16_t(start);
    if (family_ == PageFamily::kLegacy) node.flags = uint8_t(offset_word >> kLegacyTagFlagShift);
    if (start > data_end || node.size > data_end - start) {
      node.damaged = true;
      node.size = 0;
      ++damaged_;
      continue;
    }
    node.bytes = ByteView(bytes_.data() + start, node.size);
    if (family_ == PageFamily::kLarge && node.size >= 2) {
      node.flags = uint8_t(LoadU16LE(bytes_.data() + start) >> kLargeNodeFlagShift);
      large_flag_positions.push_back(start);
    }
  }
  // Clear the flag bits only after every tag has read its flags, so that two
  // tags sharing one node (damage) both see them.
  constexpr uint8_t kFlagBitsOfSecondByte = 0xE0;
  for (size_t pos : large_flag_positions) bytes_[pos + 1] &= uint8_t(~kFlagBitsOfSecondByte);
}

}  // namespace tarnwell::engine
