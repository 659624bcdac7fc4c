// libFuzzer target: parsing Internet messages (the side that reads composed
// files back), then storing what was parsed and parsing that again.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "render/mime/mime_message.h"
#include "render/mime/mime_sink.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace tarnwell;
  render::CMimeMessage message;
  message.Parse(ByteView(data, size));
  Bytes stored;
  render::BytesSink sink(&stored);
  if (message.Store(&sink).ok()) {
    render::CMimeMessage again;
    again.Parse(ByteView(stored));
  }
  for (size_t i = 0; i < message.GetChildCount(); ++i) {
    render::CMimeBody* part = message.GetChild(i);
    volatile size_t sink_size = part->GetText().size() + part->GetContentLength();
    (void)sink_size;
  }
  return 0;
}
