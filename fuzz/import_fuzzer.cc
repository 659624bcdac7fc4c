// libFuzzer target: importing untrusted composed files (Internet messages,
// vCards, iCalendar files) into the message model.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "mapi/import/icalendar_import.h"
#include "mapi/import/internet_message_import.h"
#include "mapi/import/vcard_import.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace tarnwell;
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  mapi::Message message;
  mapi::ImportInternetMessage(ByteView(data, size), &message);
  mapi::Message card;
  mapi::ImportVCard(text, &card);
  mapi::Message event;
  mapi::ImportICalendar(text, &event);
  return 0;
}
