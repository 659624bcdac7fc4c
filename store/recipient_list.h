// The recipients of a message: its "RecipientList" column.
//
// The column holds one property blob (real_property_blob.h) per recipient;
// how the blobs are framed is not documented, so they are found by their
// header: every "ProP" whose flags are those of the layout starts a blob,
// and the next search begins where that blob's values end. Properties
// taken from each blob:
//
//   id      type    meaning
//   0x0C15  int32   recipient type: 1 To, 2 Cc, 3 Bcc
//   0x3001  string  display name
//   0x3002  string  address type ("SMTP", "EX")
//   0x3003  string  address
//   0x39FE  string  SMTP address
#ifndef TARNWELL_STORE_RECIPIENT_LIST_H_
#define TARNWELL_STORE_RECIPIENT_LIST_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::store {

inline constexpr uint32_t kRecipientTo = 1;
inline constexpr uint32_t kRecipientCc = 2;
inline constexpr uint32_t kRecipientBcc = 3;

struct Recipient {
  uint32_t type = 0;
  std::string display_name;
  std::string address_type;
  std::string address;
  std::string smtp_address;
};

// The recipients in column order. A damaged blob gives what was read of it
// (a recipient with neither a name nor an address is left out); nothing is
// read outside `value`.
std::vector<Recipient> ParseRecipientList(ByteView value);

// The display line of the recipients of `type`: their names (or, for a
// recipient without one, the address) joined with "; ".
std::string RecipientLine(const std::vector<Recipient>& recipients, uint32_t type);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_RECIPIENT_LIST_H_
