// ColumnValue: one column of one record, as stored, with the getters that
// assemble integers and floats from it.
//
// Catalog column types map to the program's internal type codes:
//
//   catalog type                 type code
//   nil (0), SLV (13)            0
//   bit (1)                      2
//   unsigned byte (2)            5
//   short (3)                    6
//   long (4)                     8
//   currency (5), long long (15) 10
//   float (6)                    12
//   double (7)                   13
//   date-time (8)                21
//   binary (9), long binary (11) 1
//   text (10), long text (12)    14
//   unsigned long (14)           9
//   GUID (16)                    25
//   unsigned short (17)          7
//
// Getter results: 1 value returned; 0 the slot is empty or its type does not
// suit the getter; -1 no such column, or a value of the wrong size.
#ifndef TARNWELL_ENGINE_COLUMN_VALUE_H_
#define TARNWELL_ENGINE_COLUMN_VALUE_H_

#include <cstdint>
#include <optional>

#include "base/byte_view.h"

namespace tarnwell::engine {

enum TypeCode : uint8_t {
  kTypeNone = 0,
  kTypeBinary = 1,
  kTypeBit = 2,
  kTypeSignedByte = 4,
  kTypeUnsignedByte = 5,
  kTypeShort = 6,
  kTypeUnsignedShort = 7,
  kTypeLong = 8,
  kTypeUnsignedLong = 9,
  kTypeLongLong = 10,
  kTypeUnsignedLongLong = 11,
  kTypeFloat = 12,
  kTypeDouble = 13,
  kTypeText = 14,
  kTypeDateTime = 21,
  kTypeGuid = 25,
};

constexpr char kByteOrderLittle = 'l';
constexpr char kByteOrderBig = 'b';
constexpr char kByteOrderNative = 'n';
constexpr uint8_t kColumnValueMarker = 6;
constexpr uint32_t kDefaultCodePage = 1252;

// Tagged-value flag bits (the byte before a tagged value).
constexpr uint8_t kTaggedLongValue = 0x01;
constexpr uint8_t kTaggedCompressed = 0x02;
constexpr uint8_t kTaggedSeparated = 0x04;
constexpr uint8_t kTaggedMultiValued = 0x08;
constexpr uint8_t kTaggedTwoValues = 0x10;
constexpr uint8_t kTaggedNull = 0x20;
constexpr uint8_t kTaggedEncrypted = 0x40;

// The type code of a catalog column type; nothing for types the program does
// not read.
std::optional<uint8_t> TypeCodeFor(uint32_t catalog_type);

struct ColumnValue {
  bool filled = false;   // the column has a slot value (its type is known)
  bool present = false;  // the record stores bytes for it
  uint8_t type_code = kTypeNone;
  ByteView value;  // points into the record's storage
  uint8_t flag_byte = 0;
  bool has_flag_byte = false;
  char byte_order = 0;  // 'l', 'b', 'n', or 0 for variable values
  uint32_t code_page = 0;
  uint8_t marker = kColumnValueMarker;
};

int GetU8(const ColumnValue& v, uint8_t* out);
int GetU16(const ColumnValue& v, uint16_t* out);
int GetU32(const ColumnValue& v, uint32_t* out);
int GetU64(const ColumnValue& v, uint64_t* out);
int GetFloat(const ColumnValue& v, float* out);
int GetDouble(const ColumnValue& v, double* out);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_COLUMN_VALUE_H_
