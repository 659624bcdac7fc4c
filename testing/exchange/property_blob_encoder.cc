#include "testing/exchange/property_blob_encoder.h"

#include <algorithm>
#include <cctype>
#include <cstring>

namespace tarnwell::forge::exchange {
namespace {

constexpr char kMagic[] = "ProP";
constexpr size_t kMagicSize = 4;
constexpr size_t kHeaderSize = 8;
constexpr size_t kCountOffset = 6;
constexpr size_t kEntrySize = 8;
constexpr uint8_t kMarkerUtf8 = 'M';
constexpr uint8_t kMarkerNoValue = 'H';
constexpr uint8_t kMarkerMultiString = 0xC9;
constexpr size_t kValueHeaderSize = 2;  // marker, length
constexpr size_t kTimeSize = 8;
constexpr size_t kMaxItems = 255;
constexpr size_t kMaxIdDigits = 4;

Bytes Marked(uint8_t marker, ByteView data) {
  Bytes out(kValueHeaderSize + data.size());
  out[0] = marker;
  out[1] = uint8_t(data.size());
  if (!data.empty()) std::memcpy(out.data() + kValueHeaderSize, data.data(), data.size());
  return out;
}

ByteView View(const std::string& s) {
  return ByteView(reinterpret_cast<const uint8_t*>(s.data()), s.size());
}

}  // namespace

bool SplitPropertyName(const std::string& name, std::string* letters, uint16_t* id) {
  size_t at = 0;
  while (at < name.size() && std::isupper(static_cast<unsigned char>(name[at]))) ++at;
  const size_t digits = name.size() - at;
  if (at == 0 || digits == 0 || digits > kMaxIdDigits) return false;
  uint32_t value = 0;
  for (size_t i = at; i < name.size(); ++i) {
    const char c = name[i];
    if (!std::isxdigit(static_cast<unsigned char>(c)) ||
        std::isupper(static_cast<unsigned char>(c))) {
      return false;
    }
    value =
        value * 16 + uint32_t(std::isdigit(static_cast<unsigned char>(c)) ? c - '0' : c - 'a' + 10);
  }
  *letters = name.substr(0, at);
  *id = uint16_t(value);
  return true;
}

void PropertyBlobEncoder::Add(uint16_t kind, uint16_t id, uint32_t inline_value, Bytes value) {
  entries_.push_back({kind, id, inline_value, std::move(value)});
}

void PropertyBlobEncoder::AddBool(uint16_t id, bool value) {
  Add(kBlobKindBool, id, value ? 1 : 0, {});
}

void PropertyBlobEncoder::AddLong(uint16_t id, uint32_t value) {
  Add(kBlobKindLong, id, value, {});
}

void PropertyBlobEncoder::AddTime(uint16_t id, uint64_t filetime) {
  uint8_t bytes[kTimeSize];
  StoreU64LE(bytes, filetime);
  Add(kBlobKindTime, id, 0, Marked(kMarkerUtf8, ByteView(bytes, kTimeSize)));
}

bool PropertyBlobEncoder::AddString(uint16_t id, const std::string& utf8) {
  if (utf8.size() > kBlobMaxValueBytes) return false;
  Add(kBlobKindString, id, 0, Marked(kMarkerUtf8, View(utf8)));
  return true;
}

bool PropertyBlobEncoder::AddBinary(uint16_t id, ByteView bytes) {
  if (bytes.size() > kBlobMaxValueBytes) return false;
  Add(kBlobKindBinary, id, 0, Marked(kMarkerUtf8, bytes));
  return true;
}

bool PropertyBlobEncoder::AddMultiString(uint16_t id, const std::vector<std::string>& items) {
  if (items.size() > kMaxItems) return false;
  Bytes value = {kMarkerMultiString, uint8_t(items.size())};
  for (const std::string& item : items) {
    if (item.size() > kBlobMaxValueBytes) return false;
    const Bytes marked = Marked(kMarkerUtf8, View(item));
    value.insert(value.end(), marked.begin(), marked.end());
  }
  Add(kBlobKindMultiString, id, 0, std::move(value));
  return true;
}

void PropertyBlobEncoder::AddNoValue(uint16_t id) {
  Add(kBlobKindString, id, 0, Marked(kMarkerNoValue, ByteView()));
}

bool PropertyBlobEncoder::AddNamedString(const std::string& name, const std::string& utf8) {
  std::string letters;
  uint16_t id = 0;
  if (!SplitPropertyName(name, &letters, &id) || letters != "S") return false;
  return AddString(id, utf8);
}

bool PropertyBlobEncoder::AddNamedNumber(const std::string& name, int64_t value) {
  std::string letters;
  uint16_t id = 0;
  if (!SplitPropertyName(name, &letters, &id)) return false;
  if (letters == "L") {
    AddLong(id, uint32_t(value));
    return true;
  }
  if (letters == "B") {
    AddBool(id, value != 0);
    return true;
  }
  return false;
}

bool PropertyBlobEncoder::AddNamedTime(const std::string& name, uint64_t filetime) {
  std::string letters;
  uint16_t id = 0;
  if (!SplitPropertyName(name, &letters, &id) || letters != "T") return false;
  AddTime(id, filetime);
  return true;
}

Bytes PropertyBlobEncoder::Finish() const {
  Bytes out(kHeaderSize + kEntrySize * entries_.size(), 0);
  std::copy(kMagic, kMagic + kMagicSize, out.begin());
  StoreU16LE(out.data() + kCountOffset, uint16_t(entries_.size()));
  for (size_t i = 0; i < entries_.size(); ++i) {
    const Entry& e = entries_[i];
    uint8_t* at = out.data() + kHeaderSize + kEntrySize * i;
    StoreU16LE(at, e.kind);
    StoreU16LE(at + 2, e.id);
    uint32_t field = e.inline_value;
    if (e.kind != kBlobKindBool && e.kind != kBlobKindLong) {
      field = uint32_t(out.size());
      out.insert(out.end(), e.value.begin(), e.value.end());
      at = out.data() + kHeaderSize + kEntrySize * i;  // insert may move the buffer
    }
    StoreU32LE(at + 4, field);
  }
  return out;
}

}  // namespace tarnwell::forge::exchange
