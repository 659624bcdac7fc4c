// Property blobs as Exchange 2013, 2016 and 2019 servers write them: 3-byte
// entries followed by self-describing values.
//
// Header (little-endian):
//
//   offset  width      meaning
//   0       4          magic "ProP"
//   4       2          flags: 0x0400, or 0x0401 when a near-value area follows
//   6       2          property count
//   8       4          (flags 0x0401 only) offset of the near-value area
//   8 / 12  3 x count  entries: u8 type, u16 property id
//   then               one value per entry, in entry order
//
// Types (+0x80: multi-valued), with their letter in column names:
//
//   0x08 bool B   0x10 int16 I    0x18 int32 L    0x20 int64 Q   0x24 currency Q
//   0x28 float D  0x30 double D   0x34 app-time D 0x38 time T    0x40 GUID G
//   0x48 string S 0x50 binary N
//
// A value starts with an encoding byte:
//
//   bool      0x08 false, 0x09 true
//   int16     0x10 zero; 0x11, 0x12: 1 or 2 bytes follow
//   int32     0x18 zero; 0x19, 0x1A, 0x1B: 1, 2 or 4 bytes follow
//   int64     0x20 zero; 0x21 .. 0x24: 1, 2, 4 or 8 bytes follow
//             (shorter forms are sign-extended); currency alike
//   float     0x28 + 4 bytes; 0x2A zero
//   double    0x30 + 8 bytes; 0x32 zero (app-time alike)
//   time      0x38 + 8 bytes (FILETIME); 0x39 + 4 bytes of unknown meaning
//   GUID      0x40 + 16 bytes
//   string    0x48 empty; 0x4D + u8 / 0x4E + u16 count of 8-bit characters;
//             0x49 + u8 / 0x4A + u16 byte count of UTF-16LE
//   binary    0x50 empty; 0x51 + u8 / 0x52 + u16 byte count
//   multi     (family | 0x80) + 1 with a u8 element count, + 2 with a u16
//             count (the family of currency is int64, of app-time double);
//             fixed-size elements packed, each string or binary element with
//             its own encoding byte
//   any       0x00 deleted property, no payload
//             0x78 near value: u16 slot (0), u32 offset from the blob's start,
//                  u16 family, u32 encoded length; the encoded value (encoding
//                  byte first) lies at that offset
//             0x7A far value: u16 slot (1..), u32 size hint, u16 family,
//                  u32 encoded length; the encoded value is the row's column
//                  "SeparatedProperty" + two digits of the slot
#ifndef TARNWELL_STORE_REAL_PROPERTY_BLOB_H_
#define TARNWELL_STORE_REAL_PROPERTY_BLOB_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "store/property_blob.h"

namespace tarnwell::store {

// True when the blob has the magic and the header flags of this layout.
bool IsRealLayout(ByteView blob);

struct RealBlob {
  std::vector<BlobEntry> entries;  // in entry order; those before any damage
  bool complete = false;           // every entry and value read, nothing left over
  std::string problem;             // why not complete
  // Bytes from the blob's start to the end of its last value (inline or
  // near); 0 when damage stopped the parse.
  size_t used = 0;
};

// Reads a blob of this layout. A damaged blob gives the entries before the
// damage; nothing is read outside the blob.
RealBlob ParseRealBlob(ByteView blob);

// Reads a blob that starts at the first byte of `bytes` and may be followed
// by anything (blobs packed back to back in an undocumented frame): complete
// when every entry and value was read; `used` says where the blob ends.
RealBlob ParseRealBlobPrefix(ByteView bytes);

std::vector<BlobEntry> ParseRealBlobEntries(ByteView blob);

// Fills a far-value entry from its "SeparatedPropertyNN" value (decompressed,
// encoding byte first). Returns false, leaving the entry as it was, when the
// value does not decode as the entry's type.
bool ResolveFarValue(ByteView separated_value, BlobEntry* entry);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_REAL_PROPERTY_BLOB_H_
