// Destinations for composed message bytes.
//
// Every writer in the MIME library produces its output in pieces through a MimeSink, so a
// message with a large attachment can go straight to a file: the library holds the part's
// content and one small staging buffer, never the whole encoded message. A sink remembers its
// last two bytes because the multipart writer needs to know whether a line has just ended.
#ifndef TARNWELL_RENDER_MIME_MIME_SINK_H_
#define TARNWELL_RENDER_MIME_MIME_SINK_H_

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <ostream>
#include <string>
#include <string_view>

#include "base/byte_view.h"

namespace tarnwell::render {

class MimeSink {
 public:
  MimeSink() = default;
  MimeSink(const MimeSink&) = delete;
  MimeSink& operator=(const MimeSink&) = delete;
  virtual ~MimeSink() = default;

  // Appends bytes. False once the destination has refused a write (buffer full, I/O error);
  // a failed sink ignores everything after.
  bool Write(const char* data, size_t size);
  bool Write(std::string_view text) { return Write(text.data(), text.size()); }

  bool ok() const { return ok_; }
  uint64_t bytes_written() const { return written_; }
  // True when the bytes written so far end in CR LF.
  bool EndsWithCrLf() const { return written_ >= 2 && last_[0] == '\r' && last_[1] == '\n'; }

 protected:
  virtual bool DoWrite(const char* data, size_t size) = 0;

 private:
  uint64_t written_ = 0;
  bool ok_ = true;
  char last_[2] = {0, 0};
};

// A caller-owned buffer of fixed capacity; a write past its end fails.
class BufferSink : public MimeSink {
 public:
  BufferSink(char* buffer, size_t capacity) : buffer_(buffer), capacity_(capacity) {}
  size_t size() const { return size_; }

 protected:
  bool DoWrite(const char* data, size_t size) override;

 private:
  char* buffer_;
  size_t capacity_;
  size_t size_ = 0;
};

class StringSink : public MimeSink {
 public:
  explicit StringSink(std::string* out) : out_(out) {}

 protected:
  bool DoWrite(const char* data, size_t size) override;

 private:
  std::string* out_;
};

class BytesSink : public MimeSink {
 public:
  explicit BytesSink(Bytes* out) : out_(out) {}

 protected:
  bool DoWrite(const char* data, size_t size) override;

 private:
  Bytes* out_;
};

class StreamSink : public MimeSink {
 public:
  explicit StreamSink(std::ostream* out) : out_(out) {}

 protected:
  bool DoWrite(const char* data, size_t size) override;

 private:
  std::ostream* out_;
};

class FileSink : public MimeSink {
 public:
  explicit FileSink(FILE* file) : file_(file) {}

 protected:
  bool DoWrite(const char* data, size_t size) override;

 private:
  FILE* file_;
};

// Discards the bytes and only counts them.
class CountingSink : public MimeSink {
 protected:
  bool DoWrite(const char*, size_t) override { return true; }
};

// Collects small writes into a fixed staging buffer and hands it on in large pieces. The
// coders write a few bytes at a time through one of these.
class StagingBuffer {
 public:
  explicit StagingBuffer(MimeSink* sink) : sink_(sink), data_(new char[kCapacity]) {}
  ~StagingBuffer() { Flush(); }
  StagingBuffer(const StagingBuffer&) = delete;
  StagingBuffer& operator=(const StagingBuffer&) = delete;

  void Put(char c) {
    if (used_ == kCapacity) Flush();
    data_[used_++] = c;
  }
  void Put(std::string_view text) {
    for (char c : text) Put(c);
  }
  // Passes the staged bytes on; false when the sink has failed.
  bool Flush();

  static constexpr size_t kCapacity = 64 * 1024;

 private:
  MimeSink* sink_;
  size_t used_ = 0;
  std::unique_ptr<char[]> data_;
};

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_SINK_H_
