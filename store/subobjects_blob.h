// The "SubobjectsBlob" column of a message: the "Inid"s of its attachment
// rows, as integers one after another, each in the compact encoding of
// property blob values (real_property_blob.h):
//
//   byte         then                  value
//   0x10, 0x18   nothing               0
//   0x20
//   0x11, 0x19   1 byte                sign-extended
//   0x21
//   0x12, 0x1A   2 bytes little-endian sign-extended
//   0x22
//   0x1B, 0x23   4 bytes little-endian sign-extended
//   0x24         8 bytes little-endian
//
// Anything else ends the list.
#ifndef TARNWELL_STORE_SUBOBJECTS_BLOB_H_
#define TARNWELL_STORE_SUBOBJECTS_BLOB_H_

#include <cstdint>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::store {

// The integers of `value` up to its end or the first byte that starts none.
// `complete` (optional) says whether the whole value was read.
std::vector<int64_t> ParseSubobjectIds(ByteView value, bool* complete = nullptr);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_SUBOBJECTS_BLOB_H_
