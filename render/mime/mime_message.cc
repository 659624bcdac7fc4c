#include "render/mime/mime_message.h"

namespace tarnwell::render {

CMimeMessage::~CMimeMessage() = default;

Status CMimeMessage::WriteTo(std::ostream& out) {
  StreamSink sink(&out);
  return Store(&sink);
}

Status CMimeMessage::WriteTo(FILE* file) {
  FileSink sink(file);
  return Store(&sink);
}

std::string CMimeMessage::ToString() {
  std::string text;
  StringSink sink(&text);
  Store(&sink);
  return text;
}

Status CMimeMessage::Parse(ByteView data) {
  Load(data);
  if (fields().empty()) return Status::Corruption("no header field found in the message");
  return Status::Ok();
}

}  // namespace tarnwell::render
