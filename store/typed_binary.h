// Values stored in binary columns whose meaning comes from the column name.
//
// Some mailbox and folder columns hold numbers and times as plain binary
// bytes. The column name's first letter then says what they are: 'T' an
// 8-byte FILETIME, 'Q' a 64-bit integer. Which end comes first depends on
// who wrote the value, so every reader takes the byte order as a parameter:
//
//   width  'l' (little-endian)            'b' (big-endian)
//   4      u32, least significant first   u32, most significant first
//   8      u64, least significant first   high u32 then low u32, each most
//                                         significant first (01 D4 2A 5B 8C 3E 00 00
//                                         is high 0x01D42A5B, low 0x8C3E0000)
//   16     GUID: u32, u16, u16, 8 bytes,  GUID: the same fields, the first
//          the first three little-endian  three big-endian
//
// A value whose length is not exactly the width is rejected, never padded or
// cut: a wrong length means the column is not what its name claims.
#ifndef TARNWELL_STORE_TYPED_BINARY_H_
#define TARNWELL_STORE_TYPED_BINARY_H_

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

#include "base/byte_view.h"

namespace tarnwell::store {

enum class ByteOrder : char { kLittle = 'l', kBig = 'b' };

inline constexpr size_t kTypedU32Size = 4;
inline constexpr size_t kTypedU64Size = 8;
inline constexpr size_t kTypedGuidSize = 16;

struct Guid {
  uint32_t data1 = 0;
  uint16_t data2 = 0;
  uint16_t data3 = 0;
  std::array<uint8_t, 8> data4{};

  bool operator==(const Guid&) const = default;
};

// Each returns 1 and sets *out, or -1 (leaving *out alone) when the value is
// not exactly the reader's width.
int ReadTypedU32(ByteView value, ByteOrder order, uint32_t* out);
int ReadTypedU64(ByteView value, ByteOrder order, uint64_t* out);
int ReadTypedFileTime(ByteView value, ByteOrder order, uint64_t* out);
int ReadTypedGuid(ByteView value, ByteOrder order, Guid* out);

// What a column's name says its binary value is.
enum class TypedKind { kNone, kFileTime, kInteger64 };

// kFileTime for names of 2 to 7 characters starting with 'T', kInteger64 for
// such names starting with 'Q', kNone for every other name.
TypedKind TypedKindOfName(std::string_view column_name);

struct TypedValue {
  TypedKind kind = TypedKind::kNone;
  uint64_t value = 0;  // the FILETIME or the integer
};

// Converts a binary value by its column name. 1: *out filled; 0: the name is
// not a typed name, or the value is empty (absent); -1: wrong length.
int DecodeTypedBinary(std::string_view column_name, ByteView value, ByteOrder order,
                      TypedValue* out);

// Lower-case hexadecimal without leading zeros ("0" for zero), the way
// 64-bit ids are shown and turned into table names.
std::string HexText(uint64_t value);

// "{xxxxxxxx-xxxx-xxxx-xxxx-xxxxxxxxxxxx}" in upper case.
std::string GuidText(const Guid& guid);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_TYPED_BINARY_H_
