#include "store/recipient_list.h"

#include <algorithm>
#include <cstring>

#include "store/real_property_blob.h"

namespace tarnwell::store {
namespace {

constexpr char kMagic[] = {'P', 'r', 'o', 'P'};
constexpr size_t kMagicSize = sizeof(kMagic);

constexpr uint16_t kPropRecipientType = 0x0C15;
constexpr uint16_t kPropDisplayName = 0x3001;
constexpr uint16_t kPropAddressType = 0x3002;
constexpr uint16_t kPropAddress = 0x3003;
constexpr uint16_t kPropSmtpAddress = 0x39FE;
constexpr size_t kInt32Size = 4;

constexpr char kSeparator[] = "; ";

size_t FindMagic(ByteView value, size_t from) {
  for (size_t at = from; at + kMagicSize <= value.size(); ++at) {
    if (std::memcmp(value.data() + at, kMagic, kMagicSize) == 0) return at;
  }
  return value.size();
}

std::string Text(const BlobEntry& e) {
  std::string text(e.value.begin(), e.value.end());
  while (!text.empty() && text.back() == '\0') text.pop_back();
  return text;
}

Recipient FromEntries(const std::vector<BlobEntry>& entries) {
  Recipient r;
  for (const BlobEntry& e : entries) {
    if (e.state != BlobValueState::kValue) continue;
    if (e.letters == "L" && e.id == kPropRecipientType && e.value.size() >= kInt32Size) {
      r.type = LoadU32LE(e.value.data());
    } else if (e.letters == "S") {
      switch (e.id) {
        case kPropDisplayName:
          r.display_name = Text(e);
          break;
        case kPropAddressType:
          r.address_type = Text(e);
          break;
        case kPropAddress:
          r.address = Text(e);
          break;
        case kPropSmtpAddress:
          r.smtp_address = Text(e);
          break;
        default:
          break;
      }
    }
  }
  return r;
}

}  // namespace

std::vector<Recipient> ParseRecipientList(ByteView value) {
  std::vector<Recipient> out;
  size_t at = FindMagic(value, 0);
  while (at < value.size()) {
    const ByteView rest = value.From(at);
    size_t next = at + kMagicSize;
    if (IsRealLayout(rest)) {
      const RealBlob blob = ParseRealBlobPrefix(rest);
      Recipient r = FromEntries(blob.entries);
      if (!r.display_name.empty() || !r.address.empty() || !r.smtp_address.empty()) {
        out.push_back(std::move(r));
      }
      // A whole blob is stepped over, so that a "ProP" inside its values
      // is not taken for the next recipient.
      if (blob.complete) next = std::max(next, at + blob.used);
    }
    at = FindMagic(value, next);
  }
  return out;
}

std::string RecipientLine(const std::vector<Recipient>& recipients, uint32_t type) {
  std::string line;
  for (const Recipient& r : recipients) {
    if (r.type != type) continue;
    const std::string& shown = !r.display_name.empty()   ? r.display_name
                               : !r.smtp_address.empty() ? r.smtp_address
                                                         : r.address;
    if (!line.empty()) line += kSeparator;
    line += shown;
  }
  return line;
}

}  // namespace tarnwell::store
