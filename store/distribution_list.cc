#include "store/distribution_list.h"

#include <optional>

#include "base/text.h"

namespace tarnwell::store {

namespace {

constexpr size_t kUtf16UnitSize = 2;
constexpr uint8_t kByteOrderMark[] = {0xFF, 0xFE};

// Reads the NUL-terminated UTF-16LE string at *pos and moves *pos past its
// terminator; nothing when no terminator lies inside the value.
std::optional<std::string> ReadTerminatedUtf16(ByteView value, size_t* pos) {
  for (size_t at = *pos; value.Has(at, kUtf16UnitSize); at += kUtf16UnitSize) {
    if (LoadU16LE(value.data() + at) == 0) {
      std::string text = Utf16LEToUtf8(value.Sub(*pos, at - *pos));
      *pos = at + kUtf16UnitSize;
      return text;
    }
  }
  return std::nullopt;
}

}  // namespace

std::vector<ListMember> ParseDistributionList(ByteView value) {
  std::vector<ListMember> members;
  uint32_t first = 0;
  if (!value.ReadU32LE(0, &first)) return members;
  size_t pos = first;
  // Every member takes at least its header, so the loop ends by itself.
  while (value.Has(pos, kMemberHeaderSize)) {
    pos += kMemberHeaderSize;
    std::optional<std::string> name = ReadTerminatedUtf16(value, &pos);
    if (!name) break;
    std::optional<std::string> type = ReadTerminatedUtf16(value, &pos);
    if (!type) break;
    std::optional<std::string> address = ReadTerminatedUtf16(value, &pos);
    if (!address) break;
    members.push_back({std::move(*name), std::move(*type), std::move(*address)});
  }
  return members;
}

Bytes DistributionListText(const std::vector<ListMember>& members) {
  std::string text;
  for (const ListMember& m : members) {
    text += "Name:" + m.display_name + "\tType:" + m.address_type + "\tEmailID:" + m.email_address +
            "\r\n";
  }
  Bytes out(std::begin(kByteOrderMark), std::end(kByteOrderMark));
  const Bytes body = Utf8ToUtf16LE(text);
  out.insert(out.end(), body.begin(), body.end());
  return out;
}

}  // namespace tarnwell::store
