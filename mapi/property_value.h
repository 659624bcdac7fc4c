// PropertyValue: one MAPI property value in the form every layer of mapi/
// shares, whatever file it came from or goes to.
//
// Canonical encodings held in `data` (little-endian throughout):
//
//   type              data
//   ----------------  -------------------------------------------------
//   kInt16            2 bytes
//   kInt32, kError    4 bytes
//   kFloat            4 bytes (IEEE single)
//   kDouble, kAppTime 8 bytes (IEEE double; AppTime = OLE automation date)
//   kCurrency, kInt64 8 bytes
//   kBoolean          1 byte, 0 or 1
//   kSysTime          8 bytes, FILETIME
//   kGuid             16 bytes
//   kString8          the 8-bit characters, no terminator
//   kUnicode          UTF-16LE, no terminator
//   kBinary           the bytes
//   kObject           whatever the container stores for it (PST: 4-byte
//                     subnode id + 4-byte size)
//
// A multi-valued type (kMultiFlag set) leaves `data` empty and keeps one
// element per entry of `elements`, each in its single-valued encoding.
#ifndef TARNWELL_MAPI_PROPERTY_VALUE_H_
#define TARNWELL_MAPI_PROPERTY_VALUE_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::mapi {

// Property types ([MS-OXCDATA] 2.11.1).
enum PropType : uint16_t {
  kTypeUnspecified = 0x0000,
  kTypeNull = 0x0001,
  kTypeInt16 = 0x0002,
  kTypeInt32 = 0x0003,
  kTypeFloat = 0x0004,
  kTypeDouble = 0x0005,
  kTypeCurrency = 0x0006,
  kTypeAppTime = 0x0007,
  kTypeError = 0x000A,
  kTypeBoolean = 0x000B,
  kTypeObject = 0x000D,
  kTypeInt64 = 0x0014,
  kTypeString8 = 0x001E,
  kTypeUnicode = 0x001F,
  kTypeSysTime = 0x0040,
  kTypeGuid = 0x0048,
  kTypeBinary = 0x0102,
};
inline constexpr uint16_t kMultiFlag = 0x1000;

// A property tag: id in the high 16 bits, type in the low 16.
using PropTag = uint32_t;
constexpr PropTag MakeTag(uint16_t id, uint16_t type) { return (uint32_t(id) << 16) | type; }
constexpr uint16_t TagId(PropTag tag) { return uint16_t(tag >> 16); }
constexpr uint16_t TagType(PropTag tag) { return uint16_t(tag & 0xFFFF); }

// Width of a fixed-size single-valued type; 0 for variable-size types.
size_t FixedWidth(uint16_t type);
bool IsMultiValued(uint16_t type);

struct PropertyValue {
  uint16_t type = kTypeNull;
  Bytes data;
  std::vector<Bytes> elements;  // multi-valued types only

  static PropertyValue Int16(int16_t v);
  static PropertyValue Int32(int32_t v);
  static PropertyValue Int64(int64_t v);
  static PropertyValue Double(double v);
  static PropertyValue AppTime(double v);
  static PropertyValue Boolean(bool v);
  static PropertyValue SysTime(uint64_t filetime);
  static PropertyValue Guid(ByteView sixteen_bytes);
  static PropertyValue Unicode(const std::string& utf8);
  static PropertyValue String8(const std::string& bytes);
  static PropertyValue Binary(Bytes bytes);
  static PropertyValue MultiUnicode(const std::vector<std::string>& utf8);
  static PropertyValue MultiBinary(std::vector<Bytes> values);

  // Readers; nullopt when the value is not of a fitting type or size.
  std::optional<int32_t> AsInt32() const;  // Int16, Int32, Boolean, Error
  std::optional<int64_t> AsInt64() const;  // also Int32, Currency
  std::optional<double> AsDouble() const;  // Double, AppTime, Float
  std::optional<bool> AsBool() const;
  std::optional<uint64_t> AsSysTime() const;
  // Unicode and String8 (String8 taken as windows-1252) as UTF-8.
  std::optional<std::string> AsString() const;
  std::vector<std::string> AsStrings() const;  // multi-valued strings

  bool operator==(const PropertyValue& other) const = default;
};

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_PROPERTY_VALUE_H_
