// PageFile: where a page lies in the database file, and reading it.
//
// Page n lies at file position (n + 1) * P + A + B: the database header and
// its shadow copy take the first two page-sized blocks, so page 1 is the
// third. P is the page size, B the base offset of the database inside the
// file (0 for a plain file), A the adjustment factor: a signed byte offset
// found by the adjustment probe when a file has junk in front of its header
// or lacks its first blocks.
//
// A page whose previous- or next-page number exceeds the file's total page
// count is not a page of this database and is rejected.
#ifndef TARNWELL_ENGINE_PAGE_FILE_H_
#define TARNWELL_ENGINE_PAGE_FILE_H_

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "base/read_only_file.h"
#include "base/status.h"
#include "engine/page.h"
#include "engine/version.h"

namespace tarnwell::engine {

// Where the database lies in its file. A non-zero base offset shifts every
// position; a non-zero explicit length replaces the file's own length.
struct SourceDescriptor {
  std::string name;
  uint64_t base_offset = 0;
  uint64_t explicit_length = 0;
};

class PageFile {
 public:
  PageFile() = default;
  PageFile(const PageFile&) = delete;
  PageFile& operator=(const PageFile&) = delete;

  Status Open(const std::string& path, uint32_t page_size, PageFamily family,
              const SourceDescriptor& source = {});
  void Close() { file_.Close(); }
  bool is_open() const { return file_.is_open(); }

  uint32_t page_size() const { return page_size_; }
  PageFamily family() const { return family_; }
  uint64_t file_length() const { return file_length_; }
  uint64_t total_pages() const { return total_pages_; }
  uint64_t base_offset() const { return base_offset_; }
  int64_t adjustment() const { return adjustment_; }
  uint32_t missing_pages() const { return missing_pages_; }

  // Sets the adjustment factor; a negative one also sets the count of pages
  // missing from the front of the file.
  void SetAdjustment(int64_t adjustment);

  // File position of page n.
  int64_t PagePosition(uint64_t page_number) const;
  // The page at a file position, the inverse of PagePosition; -1 when the
  // position lies before page 1 (the header blocks) or is not page-aligned.
  int64_t PageNumberAt(int64_t position) const;

  // Reads page n. Bytes past the end of the file read as zeros. Corruption
  // when its sibling numbers exceed the total page count.
  Status ReadPage(uint64_t page_number, Page* page) const;

  // The same page through a small cache of recently read pages: the pages
  // near the top of a tree are read again for every key searched. Nothing
  // when the page cannot be read or is rejected.
  std::shared_ptr<const Page> Fetch(uint64_t page_number) const;

  // Reads raw bytes at a file position (base offset not added); bytes past the
  // end are left untouched. Returns the count read.
  size_t ReadAt(int64_t position, uint8_t* out, size_t length) const;

 private:
  ReadOnlyFile file_;
  uint32_t page_size_ = 0;
  PageFamily family_ = PageFamily::kLegacy;
  uint64_t file_length_ = 0;
  uint64_t total_pages_ = 0;
  uint64_t base_offset_ = 0;
  int64_t adjustment_ = 0;
  uint32_t missing_pages_ = 0;

  struct CacheSlot {
    uint64_t page_number = 0;
    uint64_t last_use = 0;
    std::shared_ptr<const Page> page;
  };
  static constexpr size_t kCacheSlots = 64;
  mutable std::mutex cache_mutex_;
  mutable std::vector<CacheSlot> cache_;
  mutable uint64_t cache_clock_ = 0;
};

// True when a page header's sibling numbers are possible in a file of
// `total_pages` pages.
inline bool SiblingsInRange(const PageHeader& h, uint64_t total_pages) {
  return h.previous <= total_pages && h.next <= total_pages;
}

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_PAGE_FILE_H_
