#include "testing/forge_value.h"

#include <string>

#include "testing/encoders/lz4_value_encoder.h"
#include "testing/encoders/seven_bit_encoder.h"
#include "testing/encoders/xpress_encoder.h"
#include "testing/forge_record.h"

namespace tarnwell::forge {
namespace {

constexpr uint8_t kXpress9Header = 0x28;
constexpr size_t kMaxSizedValue = 0xFFFF;  // the u16 decoded-size field
constexpr size_t kMaxFirstOfTwo = 0xFF;

}  // namespace

Bytes CompressValue(ByteView plain, Compression scheme) {
  switch (scheme) {
    case Compression::kNone:
      return Bytes();
    case Compression::kSevenBitAscii:
      return EncodeSevenBitAscii(
          std::string_view(reinterpret_cast<const char*>(plain.data()), plain.size()));
    case Compression::kSevenBitUnicode: {
      if (plain.size() % 2 != 0) return Bytes();
      std::u16string text;
      for (size_t i = 0; i < plain.size(); i += 2) text.push_back(char16_t(plain.U16LE(i)));
      return EncodeSevenBitUnicode(text);
    }
    case Compression::kXpress:
      return EncodeEseXpressValue(plain);
    case Compression::kXpress9: {
      if (plain.size() > kMaxSizedValue) return Bytes();
      Bytes out = {kXpress9Header, 0, 0};
      StoreU16LE(out.data() + 1, uint16_t(plain.size()));
      out.insert(out.end(), plain.data(), plain.data() + plain.size());
      return out;
    }
    case Compression::kLz4:
      return EncodeEseLz4Value(plain);
  }
  return Bytes();
}

Bytes LongValueId(uint64_t id, uint32_t id_size) { return LittleEndian(id, id_size); }

Cell SeparatedCell(uint32_t column_id, uint64_t id, uint32_t id_size) {
  return Cell{column_id, LongValueId(id, id_size), kTaggedSeparated};
}

bool CompressedCell(uint32_t column_id, ByteView plain, Compression scheme, Cell* out) {
  Bytes stored = CompressValue(plain, scheme);
  if (stored.empty()) return false;
  *out = Cell{column_id, std::move(stored), kTaggedCompressed};
  return true;
}

Bytes EncodeMultiValue(const std::vector<MultiElement>& elements) {
  Bytes out(2 * elements.size());
  size_t offset = out.size();
  for (size_t i = 0; i < elements.size(); ++i) {
    StoreU16LE(out.data() + 2 * i,
               uint16_t(offset | (elements[i].separated ? kMultiValueSeparated : 0)));
    offset += elements[i].bytes.size();
  }
  for (const MultiElement& e : elements) out.insert(out.end(), e.bytes.begin(), e.bytes.end());
  return out;
}

Cell MultiValueCell(uint32_t column_id, const std::vector<MultiElement>& elements) {
  return Cell{column_id, EncodeMultiValue(elements), kTaggedMultiValued};
}

Bytes EncodeTwoValues(ByteView first, ByteView second) {
  if (first.size() > kMaxFirstOfTwo) return Bytes();
  Bytes out = {uint8_t(first.size())};
  out.insert(out.end(), first.data(), first.data() + first.size());
  out.insert(out.end(), second.data(), second.data() + second.size());
  return out;
}

}  // namespace tarnwell::forge
