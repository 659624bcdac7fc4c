// The member list of a distribution list ("IPM.DistList") and its text form.
//
// The member column's value (all integers little-endian):
//
//   offset  width  meaning
//   0       4      o: offset of the first member from the start of the value
//   o       ...    members, one after another, each:
//                    0   24  header (its meaning is unknown; skipped)
//                    24  ... display name, UTF-16LE, ending with a 00 00 unit
//                    ..  ... address type, UTF-16LE, ending with a 00 00 unit
//                    ..  ... e-mail address, UTF-16LE, ending with a 00 00 unit
//
// The list ends where the bytes do: a member whose header or any of whose
// three strings would run past the end is not part of the list.
#ifndef TARNWELL_STORE_DISTRIBUTION_LIST_H_
#define TARNWELL_STORE_DISTRIBUTION_LIST_H_

#include <vector>

#include "base/byte_view.h"
#include "store/item_records.h"

namespace tarnwell::store {

inline constexpr size_t kMemberListOffsetSize = 4;
inline constexpr size_t kMemberHeaderSize = 24;

// The complete members of `value`, in value order. Empty when the value is
// shorter than its offset field or the offset points past the end.
std::vector<ListMember> ParseDistributionList(ByteView value);

// The members as the UTF-16LE text that previews and writers show: a
// byte-order mark, then per member "Name:" name, TAB, "Type:" type, TAB,
// "EmailID:" address, CR LF.
Bytes DistributionListText(const std::vector<ListMember>& members);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_DISTRIBUTION_LIST_H_
