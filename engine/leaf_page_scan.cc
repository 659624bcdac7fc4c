#include "engine/leaf_page_scan.h"

#include <algorithm>
#include <cstring>

namespace tarnwell::engine {
namespace {

// Page headers are read a batch of pages at a time: one read per page would
// cost a system call per 4 KiB on small-page databases.
constexpr size_t kScanBatchBytes = 4 << 20;
// From this page size on, headers are read one by one rather than in batches.
constexpr size_t kHeaderOnlyPageSize = 16384;
constexpr uint64_t kProgressEveryPages = 1024;
constexpr int kPermille = 1000;

}  // namespace

bool IsLeafDataPage(uint32_t flags) {
  return flags != 0 && (flags & kPageFlagLeaf) && !(flags & kPageFlagIndex) &&
         !(flags & kPageFlagLongValue);
}

std::vector<LeafPageEntry> ScanLeafPages(const PageFile& file, uint64_t skip, RunningFlag& running,
                                         ProgressSink& progress) {
  std::vector<LeafPageEntry> pages;
  progress.Range(0, kPermille);
  progress.Position(0);
  const int64_t page_size = file.page_size();
  const int64_t end = int64_t(file.base_offset() + file.file_length());
  int64_t position = file.adjustment() + int64_t(file.base_offset()) + int64_t(skip);
  // Never before page 1, and never before the start of the file.
  const int64_t first_page = file.PagePosition(1);
  while (position < first_page || position < 0) position += page_size;
  if (position >= end) return pages;

  if (page_size >= int64_t(kHeaderOnlyPageSize)) {
    // Large pages: reading only each header costs far less than the pages.
    uint8_t header_bytes[kPageHeaderCopySize];
    const uint64_t length = std::max<uint64_t>(1, file.file_length());
    uint64_t count = 0;
    for (; position < end; position += page_size) {
      if (!running.load()) {
        running.store(true);
        return pages;
      }
      std::memset(header_bytes, 0, sizeof header_bytes);
      if (file.ReadAt(position, header_bytes, sizeof header_bytes) == 0) break;
      PageHeader h = DecodePageHeader(ByteView(header_bytes, sizeof header_bytes), file.family());
      if (IsLeafDataPage(h.flags)) pages.push_back({position, h.next, h.previous});
      if (++count % kProgressEveryPages == 0) {
        progress.Position(int(std::min<uint64_t>(
            kPermille, uint64_t(position - int64_t(file.base_offset())) * kPermille / length)));
      }
    }
    progress.Position(kPermille);
    return pages;
  }
  // Small files need no more than their own length.
  const uint64_t remaining = uint64_t(end - position);
  const size_t batch_bytes = size_t(std::min<uint64_t>(kScanBatchBytes, remaining + page_size));
  const size_t pages_per_batch = std::max<size_t>(1, batch_bytes / size_t(page_size));
  Bytes batch(pages_per_batch * size_t(page_size));
  while (position < end) {
    if (!running.load()) {
      running.store(true);
      return pages;
    }
    const size_t got = file.ReadAt(position, batch.data(), batch.size());
    const size_t whole = got / size_t(page_size);
    const size_t in_batch = std::max<size_t>(whole, got > 0 ? 1 : 0);
    if (in_batch == 0) break;
    if (whole == 0) std::fill(batch.begin() + got, batch.begin() + page_size, 0);
    for (size_t i = 0; i < in_batch; ++i) {
      ByteView header(batch.data() + i * size_t(page_size), kPageHeaderCopySize);
      PageHeader h = DecodePageHeader(header, file.family());
      if (IsLeafDataPage(h.flags)) {
        pages.push_back({position + int64_t(i) * page_size, h.next, h.previous});
      }
    }
    position += int64_t(in_batch) * page_size;
    const uint64_t length = std::max<uint64_t>(1, file.file_length());
    progress.Position(int(std::min<uint64_t>(
        kPermille, uint64_t(std::max<int64_t>(0, position - int64_t(file.base_offset()))) *
                       kPermille / length)));
  }
  return pages;
}

}  // namespace tarnwell::engine
