// CMimeMessage: the top-level part of an Internet message, with ways to write it straight to
// a file and to read it back.
#ifndef TARNWELL_RENDER_MIME_MIME_MESSAGE_H_
#define TARNWELL_RENDER_MIME_MIME_MESSAGE_H_

#include <cstdio>
#include <ostream>
#include <string>

#include "render/mime/mime_body.h"

namespace tarnwell::render {

class CMimeMessage : public CMimeBody {
 public:
  CMimeMessage() = default;
  ~CMimeMessage() override;

  // Streams the message; the encoded text is never held whole in memory.
  Status WriteTo(std::ostream& out);
  Status WriteTo(FILE* file);
  // The message as one string (small messages, tests).
  std::string ToString();
  // Replaces the message by the one in `data`. Corruption when data holds no header field
  // at all; damaged input otherwise gives whatever could be read.
  Status Parse(ByteView data);
};

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_MESSAGE_H_
