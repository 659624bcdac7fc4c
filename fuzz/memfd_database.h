// A fuzz input as a file the engine can open by path: an anonymous memory
// file, reused for every input, reached through /proc/self/fd.
#ifndef TARNWELL_FUZZ_MEMFD_DATABASE_H_
#define TARNWELL_FUZZ_MEMFD_DATABASE_H_

#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

namespace tarnwell::fuzz {

class MemfdDatabase {
 public:
  MemfdDatabase() {
    fd_ = memfd_create("tarnwell-fuzz", MFD_CLOEXEC);
    if (fd_ < 0) std::abort();
    path_ = "/proc/self/fd/" + std::to_string(fd_);
  }
  MemfdDatabase(const MemfdDatabase&) = delete;
  MemfdDatabase& operator=(const MemfdDatabase&) = delete;
  ~MemfdDatabase() { close(fd_); }

  // Replaces the file's contents with `data`.
  const std::string& Write(const uint8_t* data, size_t size) {
    if (ftruncate(fd_, 0) != 0) std::abort();
    size_t done = 0;
    while (done < size) {
      const ssize_t n = pwrite(fd_, data + done, size - done, off_t(done));
      if (n <= 0) std::abort();
      done += size_t(n);
    }
    return path_;
  }

 private:
  int fd_ = -1;
  std::string path_;
};

}  // namespace tarnwell::fuzz

#endif  // TARNWELL_FUZZ_MEMFD_DATABASE_H_
