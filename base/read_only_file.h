// ReadOnlyFile: a file opened for reading only, read with pread so that any
// number of readers can share it without a shared file position.
//
// The user's database is never opened for writing: every source file goes
// through this class.
#ifndef TARNWELL_BASE_READ_ONLY_FILE_H_
#define TARNWELL_BASE_READ_ONLY_FILE_H_

#include <cstddef>
#include <cstdint>
#include <string>

#include "base/status.h"

namespace tarnwell {

class ReadOnlyFile {
 public:
  ReadOnlyFile() = default;
  ~ReadOnlyFile();
  ReadOnlyFile(const ReadOnlyFile&) = delete;
  ReadOnlyFile& operator=(const ReadOnlyFile&) = delete;
  ReadOnlyFile(ReadOnlyFile&& other) noexcept;
  ReadOnlyFile& operator=(ReadOnlyFile&& other) noexcept;

  Status Open(const std::string& path);
  void Close();
  bool is_open() const { return fd_ >= 0; }
  uint64_t size() const { return size_; }
  const std::string& path() const { return path_; }

  // Reads up to `length` bytes at `offset` into `out`. Bytes past the end of
  // the file are not touched. Returns the number of bytes read; a negative
  // offset or one past the end reads nothing.
  size_t ReadAt(int64_t offset, uint8_t* out, size_t length) const;

 private:
  int fd_ = -1;
  uint64_t size_ = 0;
  std::string path_;
};

}  // namespace tarnwell

#endif  // TARNWELL_BASE_READ_ONLY_FILE_H_
