// Stored forms of tagged column values beyond plain bytes: compressed,
// separated into the long-value tree, multi-valued and two-valued.
//
// Compressed value (flag kTaggedCompressed), first byte scheme << 3 | extra:
//   0x08 | bits  7-bit ASCII     packed characters (bits: used bits of the last byte - 1)
//   0x10 | bits  7-bit Unicode   packed UTF-16 code units below 0x80
//   0x18         Xpress          u16 decoded size, Plain LZ77 stream
//   0x28         Xpress9         (written only as a header over filler)
//   0x38         LZ4             u16 decoded size, one LZ4 block
//
// Separated value (flag kTaggedSeparated): the long-value id, little-endian,
// 4 bytes (or 8 in newer revisions).
//
// Multi-valued value (flag kTaggedMultiValued):
//   offset  width  meaning
//   0       2*n    u16 offset of each element from the value's start; bit
//                  0x8000 = the element is a separated long-value id
//   2*n     ...    the elements, in order
//
// Two values (flag kTaggedTwoValues):
//   0       1      length of the first value
//   1       ...    the first value, then the second
#ifndef TARNWELL_TESTING_FORGE_VALUE_H_
#define TARNWELL_TESTING_FORGE_VALUE_H_

#include <cstdint>
#include <vector>

#include "base/byte_view.h"
#include "testing/forge_layout.h"

namespace tarnwell::forge {

constexpr uint16_t kMultiValueSeparated = 0x8000;

// The compressed form of `plain`, header byte included. Empty when the
// scheme cannot hold it: 7-bit schemes and bytes of 0x80 and above (or an
// odd length for Unicode), Xpress and LZ4 over 65535 bytes, kNone.
Bytes CompressValue(ByteView plain, Compression scheme);

// A long-value id as a record stores it.
Bytes LongValueId(uint64_t id, uint32_t id_size = 4);

// A tagged cell referring to long value `id`.
Cell SeparatedCell(uint32_t column_id, uint64_t id, uint32_t id_size = 4);

// A tagged cell holding `plain` compressed. False when the scheme cannot
// hold it.
bool CompressedCell(uint32_t column_id, ByteView plain, Compression scheme, Cell* out);

struct MultiElement {
  Bytes bytes;             // the value, or a long-value id when separated
  bool separated = false;  // stored in the long-value tree
};
Bytes EncodeMultiValue(const std::vector<MultiElement>& elements);
Cell MultiValueCell(uint32_t column_id, const std::vector<MultiElement>& elements);

// Empty when the first value is longer than its length byte can say.
Bytes EncodeTwoValues(ByteView first, ByteView second);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_VALUE_H_
