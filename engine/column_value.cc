#include "engine/column_value.h"

#include <cstring>

namespace tarnwell::engine {
namespace {

constexpr int kGot = 1;
constexpr int kNoValue = 0;
constexpr int kWrongSize = -1;

// Assembles an unsigned integer of `width` bytes in the value's byte order.
uint64_t Assemble(const ColumnValue& v, size_t width) {
  uint64_t out = 0;
  const uint8_t* p = v.value.data();
  if (v.byte_order == kByteOrderBig) {
    for (size_t i = 0; i < width; ++i) out = (out << 8) | p[i];
  } else {  // little-endian, which is also this machine's native order
    for (size_t i = width; i-- > 0;) out = (out << 8) | p[i];
  }
  return out;
}

// The width a type code's value must have for the integer getters; 0 when the
// getter does not take that type.
size_t IntegerWidth(uint8_t type_code) {
  switch (type_code) {
    case kTypeBit:
    case kTypeSignedByte:
    case kTypeUnsignedByte:
      return 1;
    case kTypeShort:
    case kTypeUnsignedShort:
      return 2;
    case kTypeLong:
    case kTypeUnsignedLong:
      return 4;
    case kTypeLongLong:
    case kTypeUnsignedLongLong:
    case kTypeDateTime:
      return 8;
    default:
      return 0;
  }
}

bool IsSignedType(uint8_t type_code) {
  return type_code == kTypeSignedByte || type_code == kTypeShort || type_code == kTypeLong;
}

// Common checks: a slot with bytes, of a type the getter takes (width <= max),
// of exactly that width.
int Prepare(const ColumnValue& v, size_t max_width, size_t* width) {
  if (!v.filled || !v.present) return kNoValue;
  *width = IntegerWidth(v.type_code);
  if (*width == 0 || *width > max_width) return kNoValue;
  if (v.value.size() != *width) return kWrongSize;
  return kGot;
}

}  // namespace

std::optional<uint8_t> TypeCodeFor(uint32_t catalog_type) {
  switch (catalog_type) {
    case 0:
    case 13:
      return kTypeNone;
    case 1:
      return kTypeBit;
    case 2:
      return kTypeUnsignedByte;
    case 3:
      return kTypeShort;
    case 4:
      return kTypeLong;
    case 5:
    case 15:
      return kTypeLongLong;
    case 6:
      return kTypeFloat;
    case 7:
      return kTypeDouble;
    case 8:
      return kTypeDateTime;
    case 9:
    case 11:
      return kTypeBinary;
    case 10:
    case 12:
      return kTypeText;
    case 14:
      return kTypeUnsignedLong;
    case 16:
      return kTypeGuid;
    case 17:
      return kTypeUnsignedShort;
    default:
      return std::nullopt;
  }
}

int GetU8(const ColumnValue& v, uint8_t* out) {
  size_t width = 0;
  int r = Prepare(v, 1, &width);
  if (r == kGot) *out = uint8_t(Assemble(v, width));
  return r;
}

int GetU16(const ColumnValue& v, uint16_t* out) {
  size_t width = 0;
  int r = Prepare(v, 2, &width);
  if (r == kGot) *out = uint16_t(Assemble(v, width));
  return r;
}

int GetU32(const ColumnValue& v, uint32_t* out) {
  size_t width = 0;
  int r = Prepare(v, 4, &width);
  if (r != kGot) return r;
  uint64_t raw = Assemble(v, width);
  // Negative small integers read as 0 through this getter.
  const bool negative = IsSignedType(v.type_code) && width < 4 && (raw >> (8 * width - 1)) & 1;
  *out = negative ? 0 : uint32_t(raw);
  return kGot;
}

int GetU64(const ColumnValue& v, uint64_t* out) {
  size_t width = 0;
  int r = Prepare(v, 8, &width);
  if (r != kGot) return r;
  if (v.type_code == kTypeDateTime && v.byte_order == kByteOrderBig) return kNoValue;
  uint64_t raw = Assemble(v, width);
  const unsigned sign_bit = unsigned(8 * width - 1);
  if (IsSignedType(v.type_code) && ((raw >> sign_bit) & 1)) {
    // A negative value keeps its bits below the sign bit and gets bit 63.
    raw = (raw & ((uint64_t(1) << sign_bit) - 1)) | (uint64_t(1) << 63);
  }
  *out = raw;
  return kGot;
}

int GetFloat(const ColumnValue& v, float* out) {
  if (!v.filled || !v.present || v.type_code != kTypeFloat) return kNoValue;
  if (v.value.size() != sizeof(float)) return kWrongSize;
  uint32_t bits = uint32_t(Assemble(v, sizeof(float)));
  std::memcpy(out, &bits, sizeof bits);
  return kGot;
}

int GetDouble(const ColumnValue& v, double* out) {
  if (!v.filled || !v.present) return kNoValue;
  if (v.type_code == kTypeFloat) {
    float f = 0;
    int r = GetFloat(v, &f);
    if (r == kGot) *out = f;
    return r;
  }
  if (v.type_code != kTypeDouble) return kNoValue;
  if (v.value.size() != sizeof(double)) return kWrongSize;
  uint64_t bits = Assemble(v, sizeof(double));
  std::memcpy(out, &bits, sizeof bits);
  return kGot;
}

}  // namespace tarnwell::engine
