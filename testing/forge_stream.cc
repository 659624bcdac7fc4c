#include "testing/forge_stream.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <optional>

#include "testing/forge_record.h"

namespace tarnwell::forge {
namespace {

constexpr size_t kWriteBuffer = 4 << 20;  // contiguous pages gathered per write
constexpr uint32_t kHeaderPages = 2;      // the header block and its shadow
constexpr uint64_t kFirstWideLongValueId = (uint64_t(1) << 32) + 1;

}  // namespace

DatabaseFile::~DatabaseFile() {
  if (fd_ >= 0) close(fd_);
}

Status DatabaseFile::Create(const std::string& path) {
  path_ = path;
  fd_ = open(path.c_str(), O_CREAT | O_TRUNC | O_WRONLY, 0644);
  return fd_ < 0 ? Status::IoError("cannot create " + path) : Status::Ok();
}

Status DatabaseFile::Put(uint32_t page_number, Bytes image) {
  if (!buffer_.empty() && page_number != first_ + buffer_.size() / page_size_) {
    Status s = Flush();
    if (!s.ok()) return s;
  }
  if (buffer_.empty()) first_ = page_number;
  buffer_.insert(buffer_.end(), image.begin(), image.end());
  return buffer_.size() >= kWriteBuffer ? Flush() : Status::Ok();
}

Status DatabaseFile::Flush() {
  if (buffer_.empty()) return Status::Ok();
  // Page n sits after the two header pages.
  Status s = WriteAt(uint64_t(first_ + 1) * page_size_, buffer_.data(), buffer_.size());
  buffer_.clear();
  return s;
}

Status DatabaseFile::WriteAt(uint64_t offset, const uint8_t* data, size_t size) {
  while (size > 0) {
    const ssize_t n = pwrite(fd_, data, size, off_t(offset));
    if (n <= 0) return Status::IoError(std::string("write failed: ") + std::strerror(errno));
    data += n;
    size -= size_t(n);
    offset += uint64_t(n);
  }
  return Status::Ok();
}

Status DatabaseFile::Finish(DatabaseWriter* db, Manifest* manifest) {
  Bytes header;
  Status s = db->Finish(&header, manifest);
  if (s.ok()) s = Flush();
  if (s.ok()) s = WriteAt(0, header.data(), header.size());
  if (s.ok()) s = WriteAt(page_size_, header.data(), header.size());
  file_size_ = uint64_t(db->total_pages() + kHeaderPages) * page_size_;
  if (s.ok() && ftruncate(fd_, off_t(file_size_)) != 0) s = Status::IoError("cannot size " + path_);
  return s;
}

Status DatabaseFile::Close(Status status) {
  if (fd_ < 0) return status;
  const bool closed = close(fd_) == 0;
  fd_ = -1;
  if (!closed && status.ok()) return Status::IoError("cannot write " + path_);
  return status;
}

StreamTable::StreamTable(DatabaseWriter* db, std::string name, std::vector<ColumnLayout> columns,
                         const StreamTableOptions& options)
    : db_(db),
      name_(std::move(name)),
      columns_(std::move(columns)),
      id_size_(options.long_value_id_size) {
  for (size_t i = 0; i < columns_.size(); ++i) index_[columns_[i].name] = i;
  options_ = db->NewTree(0);
  options_.max_entries_per_leaf = options.max_rows_per_leaf;
  writer_ = std::make_unique<TreeWriter>(db->format(), options_, db->allocator(), db->sink());
  if (options.long_values) {
    lv_options_ = db->NewTree(kPageFlagLongValue);
    lv_writer_ =
        std::make_unique<TreeWriter>(db->format(), lv_options_, db->allocator(), db->sink());
    if (id_size_ == kLongValueId64Size) next_lv_ = kFirstWideLongValueId;
    chunk_size_ = DefaultLongValueChunkSize(db->format(), id_size_);
  }
}

const ColumnLayout* StreamTable::Find(const std::string& column) const {
  auto it = index_.find(column);
  return it == index_.end() ? nullptr : &columns_[it->second];
}

Status StreamTable::AddRow(Bytes key, const std::vector<Cell>& cells) {
  TreeEntry e;
  e.key = std::move(key);
  Status s = EncodeRecord(columns_, cells, db_->layout(), &e.data);
  if (s.ok()) s = writer_->Add(std::move(e));
  if (!s.ok()) return Status::InvalidArgument(name_ + ": " + s.message());
  ++rows_;
  return s;
}

Status StreamTable::AddLongValue(Bytes data, Compression compression, uint64_t* id) {
  if (!lv_writer_) return Status::InvalidArgument(name_ + " has no long-value tree");
  LongValueLayout v;
  v.id = next_lv_++;
  v.data = std::move(data);
  v.compression = compression;
  std::vector<TreeEntry> entries;
  Status s = AppendLongValueEntries(v, id_size_, chunk_size_, std::nullopt, &entries, nullptr);
  for (TreeEntry& e : entries) {
    if (!s.ok()) break;
    s = lv_writer_->Add(std::move(e));
  }
  ++long_values_;
  *id = v.id;
  return s;
}

Status StreamTable::Finish() {
  TreeLayout layout, lv_layout;
  Status s = writer_->Finish(&layout);
  if (s.ok() && lv_writer_) s = lv_writer_->Finish(&lv_layout);
  if (!s.ok()) return Status::InvalidArgument(name_ + ": " + s.message());
  db_->AddTable(name_, columns_, options_, layout, lv_writer_ ? &lv_options_ : nullptr,
                lv_writer_ ? &lv_layout : nullptr);
  return s;
}

}  // namespace tarnwell::forge
