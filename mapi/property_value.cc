#include "mapi/property_value.h"

#include <cstring>

#include "base/text.h"

namespace tarnwell::mapi {
namespace {

PropertyValue Fixed(uint16_t type, uint64_t bits, size_t width) {
  PropertyValue v;
  v.type = type;
  v.data.resize(width);
  for (size_t i = 0; i < width; ++i) v.data[i] = uint8_t(bits >> (8 * i));
  return v;
}

uint64_t DoubleBits(double d) {
  uint64_t bits;
  std::memcpy(&bits, &d, sizeof bits);
  return bits;
}

uint64_t LoadLE(const Bytes& data) {
  uint64_t v = 0;
  for (size_t i = 0; i < data.size() && i < 8; ++i) v |= uint64_t(data[i]) << (8 * i);
  return v;
}

}  // namespace

size_t FixedWidth(uint16_t type) {
  switch (type & ~kMultiFlag) {
    case kTypeInt16:
      return 2;
    case kTypeInt32:
    case kTypeFloat:
    case kTypeError:
      return 4;
    case kTypeDouble:
    case kTypeCurrency:
    case kTypeAppTime:
    case kTypeInt64:
    case kTypeSysTime:
      return 8;
    case kTypeBoolean:
      return 1;
    case kTypeGuid:
      return 16;
    default:
      return 0;
  }
}

bool IsMultiValued(uint16_t type) { return (type & kMultiFlag) != 0; }

PropertyValue PropertyValue::Int16(int16_t v) { return Fixed(kTypeInt16, uint16_t(v), 2); }
PropertyValue PropertyValue::Int32(int32_t v) { return Fixed(kTypeInt32, uint32_t(v), 4); }
PropertyValue PropertyValue::Int64(int64_t v) { return Fixed(kTypeInt64, uint64_t(v), 8); }
PropertyValue PropertyValue::Double(double v) { return Fixed(kTypeDouble, DoubleBits(v), 8); }
PropertyValue PropertyValue::AppTime(double v) { return Fixed(kTypeAppTime, DoubleBits(v), 8); }
PropertyValue PropertyValue::Boolean(bool v) { return Fixed(kTypeBoolean, v ? 1 : 0, 1); }
PropertyValue PropertyValue::SysTime(uint64_t filetime) {
  return Fixed(kTypeSysTime, filetime, 8);
}
PropertyValue PropertyValue::Guid(ByteView sixteen_bytes) {
  PropertyValue v;
  v.type = kTypeGuid;
  v.data.assign(sixteen_bytes.data(), sixteen_bytes.data() + sixteen_bytes.size());
  v.data.resize(16);
  return v;
}
PropertyValue PropertyValue::Unicode(const std::string& utf8) {
  PropertyValue v;
  v.type = kTypeUnicode;
  v.data = Utf8ToUtf16LE(utf8);
  return v;
}
PropertyValue PropertyValue::String8(const std::string& bytes) {
  PropertyValue v;
  v.type = kTypeString8;
  v.data.assign(bytes.begin(), bytes.end());
  return v;
}
PropertyValue PropertyValue::Binary(Bytes bytes) {
  PropertyValue v;
  v.type = kTypeBinary;
  v.data = std::move(bytes);
  return v;
}
PropertyValue PropertyValue::MultiUnicode(const std::vector<std::string>& utf8) {
  PropertyValue v;
  v.type = kTypeUnicode | kMultiFlag;
  for (const std::string& s : utf8) v.elements.push_back(Utf8ToUtf16LE(s));
  return v;
}
PropertyValue PropertyValue::MultiBinary(std::vector<Bytes> values) {
  PropertyValue v;
  v.type = kTypeBinary | kMultiFlag;
  v.elements = std::move(values);
  return v;
}

std::optional<int32_t> PropertyValue::AsInt32() const {
  switch (type) {
    case kTypeInt16:
      if (data.size() != 2) return std::nullopt;
      return int16_t(LoadLE(data));
    case kTypeInt32:
    case kTypeError:
      if (data.size() != 4) return std::nullopt;
      return int32_t(uint32_t(LoadLE(data)));
    case kTypeBoolean:
      if (data.empty()) return std::nullopt;
      return data[0] != 0 ? 1 : 0;
    default:
      return std::nullopt;
  }
}

std::optional<int64_t> PropertyValue::AsInt64() const {
  if ((type == kTypeInt64 || type == kTypeCurrency) && data.size() == 8) {
    return int64_t(LoadLE(data));
  }
  if (auto v = AsInt32()) return *v;
  return std::nullopt;
}

std::optional<double> PropertyValue::AsDouble() const {
  if ((type == kTypeDouble || type == kTypeAppTime) && data.size() == 8) {
    uint64_t bits = LoadLE(data);
    double d;
    std::memcpy(&d, &bits, sizeof d);
    return d;
  }
  if (type == kTypeFloat && data.size() == 4) {
    uint32_t bits = uint32_t(LoadLE(data));
    float f;
    std::memcpy(&f, &bits, sizeof f);
    return f;
  }
  return std::nullopt;
}

std::optional<bool> PropertyValue::AsBool() const {
  if (type != kTypeBoolean || data.empty()) return std::nullopt;
  return data[0] != 0;
}

std::optional<uint64_t> PropertyValue::AsSysTime() const {
  if (type != kTypeSysTime || data.size() != 8) return std::nullopt;
  return LoadLE(data);
}

std::optional<std::string> PropertyValue::AsString() const {
  if (type == kTypeUnicode) return Utf16LEToUtf8(data);
  if (type == kTypeString8) return CodePageToUtf8(data, 1252);
  return std::nullopt;
}

std::vector<std::string> PropertyValue::AsStrings() const {
  std::vector<std::string> out;
  if (type == (kTypeUnicode | kMultiFlag)) {
    for (const Bytes& e : elements) out.push_back(Utf16LEToUtf8(e));
  } else if (type == (kTypeString8 | kMultiFlag)) {
    for (const Bytes& e : elements) out.push_back(CodePageToUtf8(e, 1252));
  }
  return out;
}

}  // namespace tarnwell::mapi
