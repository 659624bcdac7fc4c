#include "testing/exchange/real_blob_encoder.h"

#include <cstring>

#include "base/text.h"

namespace tarnwell::forge::exchange {
namespace {

constexpr uint8_t kMagic[] = {'P', 'r', 'o', 'P'};
constexpr uint16_t kFlagsPlain = 0x0400;
constexpr uint16_t kFlagsWithNearArea = 0x0401;
constexpr size_t kHeaderSize = 8;
constexpr size_t kNearAreaOffsetSize = 4;
constexpr size_t kEntrySize = 3;
constexpr size_t kReferenceSize = 13;  // encoding byte, slot, offset/hint, family, length
constexpr uint8_t kNearValue = 0x78;
constexpr uint8_t kFarValue = 0x7A;
constexpr uint8_t kDeleted = 0x00;
constexpr size_t kMaxByteCount = 0xFF;
constexpr size_t kMaxWordCount = 0xFFFF;

constexpr uint8_t kString16Byte = 0x49, kString16Word = 0x4A, kString8Byte = 0x4D,
                  kString8Word = 0x4E;
constexpr uint8_t kBinaryByte = 0x51, kBinaryWord = 0x52;
constexpr uint8_t kDoubleZero = 0x32;

void PutU16(Bytes* out, uint16_t v) {
  out->push_back(uint8_t(v));
  out->push_back(uint8_t(v >> 8));
}
void PutU32(Bytes* out, uint32_t v) {
  PutU16(out, uint16_t(v));
  PutU16(out, uint16_t(v >> 16));
}
void PutLe(Bytes* out, uint64_t v, size_t width) {
  for (size_t i = 0; i < width; ++i) out->push_back(uint8_t(v >> (8 * i)));
}
void Append(Bytes* out, ByteView more) {
  out->insert(out->end(), more.data(), more.data() + more.size());
}

bool FitsSigned(int64_t v, size_t width) {
  const int64_t limit = int64_t(1) << (8 * width - 1);
  return v >= -limit && v < limit;
}

// The shortest encoding among zero, 1, 2, 4 (and 8) bytes of a family.
Bytes CompactInteger(uint8_t family, int64_t v, size_t max_width) {
  if (v == 0) return {family};
  uint8_t code = family;
  for (size_t width = 1; width <= max_width; width *= 2) {
    ++code;
    if (width == max_width || FitsSigned(v, width)) {
      Bytes out = {code};
      PutLe(&out, uint64_t(v), width);
      return out;
    }
  }
  return {};
}

bool IsAscii(const std::string& s) {
  for (char c : s) {
    if (static_cast<unsigned char>(c) >= 0x80) return false;
  }
  return true;
}

// A counted value: `byte_code` + u8 count, or the next code + u16 count.
bool Counted(uint8_t byte_code, ByteView data, Bytes* out) {
  if (data.size() > kMaxWordCount) return false;
  if (data.size() <= kMaxByteCount) {
    out->push_back(byte_code);
    out->push_back(uint8_t(data.size()));
  } else {
    out->push_back(uint8_t(byte_code + 1));
    PutU16(out, uint16_t(data.size()));
  }
  Append(out, data);
  return true;
}

bool EncodeString(const std::string& utf8, Bytes* out, size_t* payload) {
  if (utf8.empty()) {
    out->push_back(kRealTypeString);
    *payload = 0;
    return true;
  }
  if (IsAscii(utf8)) {
    *payload = utf8.size();
    return Counted(kString8Byte,
                   ByteView(reinterpret_cast<const uint8_t*>(utf8.data()), utf8.size()), out);
  }
  const Bytes utf16 = Utf8ToUtf16LE(utf8);
  *payload = utf16.size();
  return Counted(kString16Byte, utf16, out);
}

bool EncodeBinary(ByteView bytes, Bytes* out) {
  if (bytes.empty()) {
    out->push_back(kRealTypeBinary);
    return true;
  }
  return Counted(kBinaryByte, bytes, out);
}

// The count that starts a multi-valued value.
bool MultiHeader(uint8_t type, size_t count, Bytes* out) {
  const uint8_t mv = type | kRealMultiValued;
  if (count > kMaxWordCount) return false;
  if (count <= kMaxByteCount) {
    out->push_back(uint8_t(mv + 1));
    out->push_back(uint8_t(count));
  } else {
    out->push_back(uint8_t(mv + 2));
    PutU16(out, uint16_t(count));
  }
  return true;
}

}  // namespace

void RealBlobEncoder::Add(uint8_t type, uint16_t id, Bytes encoded, size_t payload) {
  entries_.push_back({type, id, std::move(encoded), payload});
}

void RealBlobEncoder::AddBool(uint16_t id, bool value) {
  Add(kRealTypeBool, id, {uint8_t(value ? 0x09 : 0x08)}, 1);
}
void RealBlobEncoder::AddInt16(uint16_t id, int16_t value) {
  Add(kRealTypeInt16, id, CompactInteger(kRealTypeInt16, value, 2), 2);
}
void RealBlobEncoder::AddInt32(uint16_t id, int32_t value) {
  Add(kRealTypeInt32, id, CompactInteger(kRealTypeInt32, value, 4), 4);
}
void RealBlobEncoder::AddInt64(uint16_t id, int64_t value) {
  Add(kRealTypeInt64, id, CompactInteger(kRealTypeInt64, value, 8), 8);
}
void RealBlobEncoder::AddDouble(uint16_t id, double value) {
  if (value == 0) {
    Add(kRealTypeDouble, id, {kDoubleZero}, 8);
    return;
  }
  uint64_t bits;
  std::memcpy(&bits, &value, sizeof bits);
  Bytes out = {kRealTypeDouble};
  PutLe(&out, bits, sizeof bits);
  Add(kRealTypeDouble, id, std::move(out), 8);
}
void RealBlobEncoder::AddTime(uint16_t id, uint64_t filetime) {
  Bytes out = {kRealTypeTime};
  PutLe(&out, filetime, 8);
  Add(kRealTypeTime, id, std::move(out), 8);
}
void RealBlobEncoder::AddGuid(uint16_t id, ByteView guid) {
  Bytes out = {kRealTypeGuid};
  Append(&out, guid);
  Add(kRealTypeGuid, id, std::move(out), guid.size());
}
bool RealBlobEncoder::AddString(uint16_t id, const std::string& utf8) {
  Bytes out;
  size_t payload = 0;
  if (!EncodeString(utf8, &out, &payload)) return false;
  Add(kRealTypeString, id, std::move(out), payload);
  return true;
}
bool RealBlobEncoder::AddBinary(uint16_t id, ByteView bytes) {
  Bytes out;
  if (!EncodeBinary(bytes, &out)) return false;
  Add(kRealTypeBinary, id, std::move(out), bytes.size());
  return true;
}
bool RealBlobEncoder::AddMultiString(uint16_t id, const std::vector<std::string>& items) {
  Bytes out;
  size_t payload = 0;
  if (!MultiHeader(kRealTypeString, items.size(), &out)) return false;
  for (const std::string& item : items) {
    size_t size = 0;
    if (!EncodeString(item, &out, &size)) return false;
    payload += size;
  }
  Add(kRealTypeString | kRealMultiValued, id, std::move(out), payload);
  return true;
}
bool RealBlobEncoder::AddMultiBinary(uint16_t id, const std::vector<Bytes>& items) {
  Bytes out;
  size_t payload = 0;
  if (!MultiHeader(kRealTypeBinary, items.size(), &out)) return false;
  for (const Bytes& item : items) {
    if (!EncodeBinary(item, &out)) return false;
    payload += item.size();
  }
  Add(kRealTypeBinary | kRealMultiValued, id, std::move(out), payload);
  return true;
}
void RealBlobEncoder::AddDeleted(uint8_t type, uint16_t id) { Add(type, id, {kDeleted}, 0); }

Bytes RealBlobEncoder::Finish(std::vector<SeparatedValue>* separated) {
  enum class Place { kInline, kNear, kFar };
  std::vector<Place> places;
  bool any_near = false;
  size_t inline_size = 0;
  for (const Entry& e : entries_) {
    const Place p = e.payload >= kFarValuePayload            ? Place::kFar
                    : e.encoded.size() > kNearValueThreshold ? Place::kNear
                                                             : Place::kInline;
    places.push_back(p);
    any_near |= p == Place::kNear;
    inline_size += p == Place::kInline ? e.encoded.size() : kReferenceSize;
  }
  Bytes out(std::begin(kMagic), std::end(kMagic));
  PutU16(&out, any_near ? kFlagsWithNearArea : kFlagsPlain);
  PutU16(&out, uint16_t(entries_.size()));
  const size_t entries_at = kHeaderSize + (any_near ? kNearAreaOffsetSize : 0);
  const size_t near_area = entries_at + kEntrySize * entries_.size() + inline_size;
  if (any_near) PutU32(&out, uint32_t(near_area));
  for (const Entry& e : entries_) {
    out.push_back(e.type);
    PutU16(&out, e.id);
  }
  Bytes near;
  for (size_t i = 0; i < entries_.size(); ++i) {
    const Entry& e = entries_[i];
    switch (places[i]) {
      case Place::kInline:
        Append(&out, e.encoded);
        break;
      case Place::kNear:
        out.push_back(kNearValue);
        PutU16(&out, 0);
        PutU32(&out, uint32_t(near_area + near.size()));
        PutU16(&out, e.type);
        PutU32(&out, uint32_t(e.encoded.size()));
        Append(&near, e.encoded);
        break;
      case Place::kFar: {
        const uint16_t slot = next_slot_++;
        out.push_back(kFarValue);
        PutU16(&out, slot);
        PutU32(&out, uint32_t(e.payload));
        PutU16(&out, e.type);
        PutU32(&out, uint32_t(e.encoded.size()));
        if (separated) separated->push_back({slot, e.encoded});
        break;
      }
    }
  }
  Append(&out, near);
  return out;
}

Bytes EncodeCompactIntegers(const std::vector<int64_t>& values) {
  Bytes out;
  for (int64_t v : values) Append(&out, CompactInteger(kRealTypeInt64, v, 8));
  return out;
}

}  // namespace tarnwell::forge::exchange
