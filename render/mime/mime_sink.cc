#include "render/mime/mime_sink.h"

#include <cstring>

namespace tarnwell::render {

bool MimeSink::Write(const char* data, size_t size) {
  if (!ok_) return false;
  if (size == 0) return true;
  if (!DoWrite(data, size)) {
    ok_ = false;
    return false;
  }
  if (size >= 2) {
    last_[0] = data[size - 2];
    last_[1] = data[size - 1];
  } else {
    last_[0] = last_[1];
    last_[1] = data[0];
  }
  written_ += size;
  return true;
}

bool BufferSink::DoWrite(const char* data, size_t size) {
  if (size > capacity_ - size_) return false;
  std::memcpy(buffer_ + size_, data, size);
  size_ += size;
  return true;
}

bool StringSink::DoWrite(const char* data, size_t size) {
  out_->append(data, size);
  return true;
}

bool BytesSink::DoWrite(const char* data, size_t size) {
  const auto* p = reinterpret_cast<const uint8_t*>(data);
  out_->insert(out_->end(), p, p + size);
  return true;
}

bool StreamSink::DoWrite(const char* data, size_t size) {
  out_->write(data, static_cast<std::streamsize>(size));
  return static_cast<bool>(*out_);
}

bool FileSink::DoWrite(const char* data, size_t size) {
  return std::fwrite(data, 1, size, file_) == size;
}

bool StagingBuffer::Flush() {
  bool ok = sink_->Write(data_.get(), used_);
  used_ = 0;
  return ok;
}

}  // namespace tarnwell::render
