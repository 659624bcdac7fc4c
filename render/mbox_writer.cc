#include "render/mbox_writer.h"

#include <cerrno>
#include <cstring>

#include "base/text.h"

namespace tarnwell::render {
namespace {

constexpr char kFrom[] = "From ";
constexpr size_t kFromLength = sizeof kFrom - 1;

// True when the line starting at `i` is ">*From ".
bool IsFromLine(ByteView m, size_t i) {
  while (i < m.size() && m[i] == '>') ++i;
  return m.Has(i, kFromLength) && std::memcmp(m.data() + i, kFrom, kFromLength) == 0;
}

}  // namespace

std::string MboxSeparator(std::time_t now, uint32_t ansi_code_page) {
  std::tm t{};
  localtime_r(&now, &t);
  char date[128];
  std::strftime(date, sizeof date, "%A, %B %d, %Y", &t);
  return "From - " + Utf8ToCodePage(date, ansi_code_page);
}

Bytes QuoteFromLines(ByteView m) {
  Bytes out;
  out.reserve(m.size() + 16);
  bool line_start = true;
  for (size_t i = 0; i < m.size(); ++i) {
    if (line_start && IsFromLine(m, i)) out.push_back('>');
    out.push_back(m[i]);
    line_start = m[i] == '\n';
  }
  return out;
}

Status MboxWriter::Open(const std::string& path) {
  Close();
  file_ = std::fopen(path.c_str(), "wb");
  if (!file_) return Status::IoError(path + ": " + std::strerror(errno));
  path_ = path;
  return Status::Ok();
}

Status MboxWriter::Append(ByteView message, std::time_t now) {
  MimeSink* sink = Begin(now);
  if (!sink) return Status::IoError("mailbox file not open");
  sink->Write(reinterpret_cast<const char*>(message.data()), message.size());
  return End();
}

MimeSink* MboxWriter::Begin(std::time_t now) {
  if (!file_) return nullptr;
  const std::string separator = MboxSeparator(now) + "\r\n";
  std::fwrite(separator.data(), 1, separator.size(), file_);
  entry_ = std::make_unique<QuotingSink>(file_);
  return entry_.get();
}

Status MboxWriter::End() {
  if (!entry_) return Status::IoError("no message begun");
  bool ok = entry_->ok() && entry_->Flush();
  const bool line_start = entry_->at_line_start();
  entry_.reset();
  // A message ends with its line end, then one empty line before the next.
  if (!line_start) ok = ok && std::fputs("\r\n", file_) >= 0;
  ok = ok && std::fputs("\r\n", file_) >= 0 && !std::ferror(file_);
  if (!ok) return Status::IoError(path_ + ": " + std::strerror(errno));
  return Status::Ok();
}

bool MboxWriter::QuotingSink::DoWrite(const char* data, size_t size) {
  size_t i = 0;
  while (i < size) {
    if (line_start_ || !pending_.empty()) {
      // A line start: hold ">*From " candidates back until decided.
      const char c = data[i++];
      pending_.push_back(c);
      line_start_ = false;
      size_t k = 0;
      while (k < pending_.size() && pending_[k] == '>') ++k;
      const std::string_view rest = std::string_view(pending_).substr(k);
      const bool prefix = std::string_view(kFrom).substr(0, rest.size()) == rest;
      if (prefix && rest.size() < kFromLength) continue;  // undecided yet
      if (prefix && std::fputc('>', file_) == EOF) return false;
      if (!Flush()) return false;
      line_start_ = c == '\n';
      continue;
    }
    // The rest of a line goes out in one piece.
    const void* newline = std::memchr(data + i, '\n', size - i);
    const size_t end = newline ? size_t(static_cast<const char*>(newline) - data) + 1 : size;
    if (std::fwrite(data + i, 1, end - i, file_) != end - i) return false;
    line_start_ = newline != nullptr;
    i = end;
  }
  return true;
}

bool MboxWriter::QuotingSink::Flush() {
  const bool ok = std::fwrite(pending_.data(), 1, pending_.size(), file_) == pending_.size();
  pending_.clear();
  return ok;
}

void MboxWriter::Close() {
  if (file_) std::fclose(file_);
  file_ = nullptr;
}

}  // namespace tarnwell::render
