#include "engine/page_file.h"

namespace tarnwell::engine {

// The database header and its shadow come before page 1.
constexpr int64_t kHeaderBlocks = 2;

Status PageFile::Open(const std::string& path, uint32_t page_size, PageFamily family,
                      const SourceDescriptor& source) {
  if (!IsValidPageSize(page_size)) {
    return Status::InvalidArgument("unsupported page size " + std::to_string(page_size));
  }
  Status s = file_.Open(path);
  if (!s.ok()) return s;
  page_size_ = page_size;
  family_ = family;
  base_offset_ = source.base_offset;
  file_length_ = (source.base_offset != 0 && source.explicit_length != 0) ? source.explicit_length
                                                                          : file_.size();
  total_pages_ = file_length_ / page_size_;
  adjustment_ = 0;
  missing_pages_ = 0;
  std::lock_guard<std::mutex> lock(cache_mutex_);
  cache_.clear();
  return Status::Ok();
}

void PageFile::SetAdjustment(int64_t adjustment) {
  {
    std::lock_guard<std::mutex> lock(cache_mutex_);
    cache_.clear();  // pages now lie elsewhere
  }
  adjustment_ = adjustment;
  missing_pages_ = adjustment < 0 ? uint32_t(uint64_t(-adjustment) / page_size_ + 1) : 0;
}

int64_t PageFile::PagePosition(uint64_t page_number) const {
  return int64_t(page_number + 1) * int64_t(page_size_) + adjustment_ + int64_t(base_offset_);
}

int64_t PageFile::PageNumberAt(int64_t position) const {
  const int64_t relative = position - adjustment_ - int64_t(base_offset_);
  if (relative < kHeaderBlocks * int64_t(page_size_)) return -1;
  if (relative % int64_t(page_size_) != 0) return -1;
  return relative / int64_t(page_size_) - 1;
}

size_t PageFile::ReadAt(int64_t position, uint8_t* out, size_t length) const {
  return file_.ReadAt(position, out, length);
}

Status PageFile::ReadPage(uint64_t page_number, Page* page) const {
  if (!is_open()) return Status::IoError("database not open");
  Bytes bytes(page_size_, 0);
  const int64_t position = PagePosition(page_number);
  if (position < 0) {
    // The front of the file is missing: only the part inside the file exists.
    const int64_t skip = -position;
    if (skip < int64_t(page_size_)) {
      file_.ReadAt(0, bytes.data() + skip, page_size_ - size_t(skip));
    }
  } else {
    file_.ReadAt(position, bytes.data(), page_size_);
  }
  PageHeader h = DecodePageHeader(ByteView(bytes), family_);
  if (!SiblingsInRange(h, total_pages_)) {
    return Status::Corruption("page " + std::to_string(page_number) +
                              ": sibling page number beyond the end of the file");
  }
  *page = Page(std::move(bytes), family_);
  return Status::Ok();
}

std::shared_ptr<const Page> PageFile::Fetch(uint64_t page_number) const {
  {
    std::lock_guard<std::mutex> lock(cache_mutex_);
    for (CacheSlot& slot : cache_) {
      if (slot.page && slot.page_number == page_number) {
        slot.last_use = ++cache_clock_;
        return slot.page;
      }
    }
  }
  auto page = std::make_shared<Page>();
  if (!ReadPage(page_number, page.get()).ok()) return nullptr;
  std::lock_guard<std::mutex> lock(cache_mutex_);
  if (cache_.size() < kCacheSlots) {
    cache_.push_back({page_number, ++cache_clock_, page});
  } else {
    CacheSlot* oldest = &cache_[0];
    for (CacheSlot& slot : cache_) {
      if (slot.last_use < oldest->last_use) oldest = &slot;
    }
    *oldest = {page_number, ++cache_clock_, page};
  }
  return page;
}

}  // namespace tarnwell::engine
