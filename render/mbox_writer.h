// MboxWriter: one mailbox file per exported folder ("MboxFile.mbx"), the
// folder's messages one after another, each after a separator line:
//
//   "From - " + the export's local date as "%A, %B %d, %Y" + CR LF
//   the message, with every line that begins with ">*From " given one more
//   '>' (so that no message line can be taken for a separator, and readers
//   that undo the quoting get the message back unchanged)
//   an empty line
#ifndef TARNWELL_RENDER_MBOX_WRITER_H_
#define TARNWELL_RENDER_MBOX_WRITER_H_

#include <cstdio>
#include <ctime>
#include <memory>
#include <string>

#include "base/byte_view.h"
#include "base/status.h"
#include "render/mime/mime_sink.h"

namespace tarnwell::render {

inline constexpr char kMboxFileName[] = "MboxFile.mbx";

// The separator line of messages exported at `now`, without its CR LF.
std::string MboxSeparator(std::time_t now, uint32_t ansi_code_page = 1252);

// `message` with every line that starts with ">*From " quoted once more.
Bytes QuoteFromLines(ByteView message);

class MboxWriter {
 public:
  MboxWriter() = default;
  ~MboxWriter() { Close(); }
  MboxWriter(const MboxWriter&) = delete;
  MboxWriter& operator=(const MboxWriter&) = delete;

  // Creates the file, replacing an existing one.
  Status Open(const std::string& path);
  Status Append(ByteView message, std::time_t now);
  // Streams one message: Begin writes the separator and returns a sink that
  // quotes "From " lines as they pass; End closes the entry. For messages
  // too large to hold twice.
  MimeSink* Begin(std::time_t now);
  Status End();
  void Close();
  bool is_open() const { return file_ != nullptr; }

 private:
  // Quotes lines that begin with ">*From " while passing bytes to the file.
  class QuotingSink : public MimeSink {
   public:
    explicit QuotingSink(FILE* file) : file_(file) {}
    bool at_line_start() const { return line_start_; }
    // Writes out a held-back line start (at the end of the message).
    bool Flush();

   protected:
    bool DoWrite(const char* data, size_t size) override;

   private:
    FILE* file_;
    bool line_start_ = true;
    std::string pending_;  // the start of a line, until it is known not to be "From "
  };

  FILE* file_ = nullptr;
  std::string path_;
  std::unique_ptr<QuotingSink> entry_;
};

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MBOX_WRITER_H_
