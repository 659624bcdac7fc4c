#include "store/typed_binary.h"

#include <cstdio>

namespace tarnwell::store {

namespace {

constexpr size_t kMinTypedNameLength = 2;
constexpr size_t kMaxTypedNameLength = 7;
constexpr size_t kGuidData2Offset = 4;
constexpr size_t kGuidData3Offset = 6;
constexpr size_t kGuidData4Offset = 8;

}  // namespace

int ReadTypedU32(ByteView value, ByteOrder order, uint32_t* out) {
  if (value.size() != kTypedU32Size) return -1;
  *out = order == ByteOrder::kBig ? LoadU32BE(value.data()) : LoadU32LE(value.data());
  return 1;
}

int ReadTypedU64(ByteView value, ByteOrder order, uint64_t* out) {
  if (value.size() != kTypedU64Size) return -1;
  *out = order == ByteOrder::kBig ? LoadU64BE(value.data()) : LoadU64LE(value.data());
  return 1;
}

int ReadTypedFileTime(ByteView value, ByteOrder order, uint64_t* out) {
  // Big-endian high half then big-endian low half is the whole 64-bit value
  // most significant byte first.
  return ReadTypedU64(value, order, out);
}

int ReadTypedGuid(ByteView value, ByteOrder order, Guid* out) {
  if (value.size() != kTypedGuidSize) return -1;
  const uint8_t* p = value.data();
  Guid g;
  if (order == ByteOrder::kBig) {
    g.data1 = LoadU32BE(p);
    g.data2 = LoadU16BE(p + kGuidData2Offset);
    g.data3 = LoadU16BE(p + kGuidData3Offset);
  } else {
    g.data1 = LoadU32LE(p);
    g.data2 = LoadU16LE(p + kGuidData2Offset);
    g.data3 = LoadU16LE(p + kGuidData3Offset);
  }
  for (size_t i = 0; i < g.data4.size(); ++i) g.data4[i] = p[kGuidData4Offset + i];
  *out = g;
  return 1;
}

TypedKind TypedKindOfName(std::string_view column_name) {
  if (column_name.size() < kMinTypedNameLength || column_name.size() > kMaxTypedNameLength) {
    return TypedKind::kNone;
  }
  if (column_name[0] == 'T') return TypedKind::kFileTime;
  if (column_name[0] == 'Q') return TypedKind::kInteger64;
  return TypedKind::kNone;
}

int DecodeTypedBinary(std::string_view column_name, ByteView value, ByteOrder order,
                      TypedValue* out) {
  const TypedKind kind = TypedKindOfName(column_name);
  if (kind == TypedKind::kNone || value.empty()) return 0;
  uint64_t v = 0;
  const int r = kind == TypedKind::kFileTime ? ReadTypedFileTime(value, order, &v)
                                             : ReadTypedU64(value, order, &v);
  if (r < 0) return r;
  out->kind = kind;
  out->value = v;
  return 1;
}

std::string HexText(uint64_t value) {
  char buffer[17];
  std::snprintf(buffer, sizeof buffer, "%llx", static_cast<unsigned long long>(value));
  return buffer;
}

std::string GuidText(const Guid& guid) {
  char buffer[39];
  std::snprintf(buffer, sizeof buffer, "{%08X-%04X-%04X-%02X%02X-%02X%02X%02X%02X%02X%02X}",
                guid.data1, guid.data2, guid.data3, guid.data4[0], guid.data4[1], guid.data4[2],
                guid.data4[3], guid.data4[4], guid.data4[5], guid.data4[6], guid.data4[7]);
  return buffer;
}

}  // namespace tarnwell::store
