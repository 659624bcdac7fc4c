#include "store/row_values.h"

#include "base/text.h"
#include "engine/column_value.h"
#include "engine/compress/compressed_value.h"

namespace tarnwell::store {
namespace {

constexpr uint16_t kMultiOffsetMask = 0x7FFF;
constexpr uint16_t kMultiSeparatedBit = 0x8000;
constexpr uint32_t kUtf16CodePage = 1200;
constexpr uint32_t kAsciiCodePage = 1252;

bool IsText(uint32_t engine_type) {
  return engine_type == engine::kColumnText || engine_type == engine::kColumnLongText;
}

}  // namespace

int ColumnSlot(const engine::TableDef& table, const std::string& name) {
  for (size_t i = 0; i < table.columns.size(); ++i) {
    if (table.columns[i].name == name) return int(i);
  }
  return -1;
}

bool RowValueReader::Resolve(ByteView stored, uint8_t flags, Bytes* out, bool* damaged,
                             uint32_t* code_page, uint64_t max_long_value) const {
  if (flags & engine::kTaggedSeparated) {
    engine::LongValueReader::WholeValue whole;
    if (lv_root_ == 0 || long_values_.ReadValue(lv_root_, stored, &whole, max_long_value) != 0) {
      *damaged = true;
      return false;
    }
    if (whole.truncated || whole.damaged) *damaged = true;
    *out = std::move(whole.bytes);
    return true;
  }
  if (flags & engine::kTaggedCompressed) {
    engine::DecodedValue d = engine::DecodeCompressedValue(stored);
    if (!d.ok()) *damaged = true;
    *out = std::move(d.bytes);
    if (d.is_utf16) *code_page = kUtf16CodePage;
    // 7-bit ASCII comes out as 8-bit characters whatever the column says.
    if (d.scheme == engine::CompressionScheme::kSevenBitAscii) *code_page = kAsciiCodePage;
    return true;
  }
  *out = stored.ToBytes();
  return true;
}

bool RowValueReader::ReadOne(const engine::RecordColumns& columns, size_t slot, RowValue* out,
                             uint64_t max_long_value) const {
  if (slot >= table_.columns.size()) return false;
  const engine::ColumnValue& v = columns.at(slot);
  if (!v.filled || !v.present) return false;
  const engine::CatalogEntry& col = table_.columns[slot];
  *out = RowValue();
  out->column = &col;
  out->engine_type = col.column_type();
  out->code_page = IsText(out->engine_type) ? (col.code_page ? col.code_page : 1252) : 0;
  const uint8_t flags = v.has_flag_byte ? v.flag_byte : 0;
  if (flags & (engine::kTaggedMultiValued | engine::kTaggedTwoValues)) {
    // Split the elements; text elements are joined with ";" as UTF-8.
    std::vector<Bytes> elements;
    ByteView b = v.value;
    if (flags & engine::kTaggedTwoValues) {
      if (b.empty() || !b.Has(1, b[0])) {
        out->damaged = true;
        return true;
      }
      elements.push_back(b.Sub(1, b[0]).ToBytes());
      elements.push_back(b.From(1 + b[0]).ToBytes());
    } else {
      const size_t count = (b.U16LE(0) & kMultiOffsetMask) / 2;
      for (size_t k = 0; k < count && b.Has(0, 2 * count); ++k) {
        const uint16_t word = b.U16LE(2 * k);
        const size_t begin = word & kMultiOffsetMask;
        const size_t end = k + 1 < count ? (b.U16LE(2 * (k + 1)) & kMultiOffsetMask) : b.size();
        if (begin > end || end > b.size()) {
          out->damaged = true;
          break;
        }
        Bytes element;
        uint32_t cp = out->code_page;
        if (!Resolve(b.Sub(begin, end - begin),
                     (word & kMultiSeparatedBit) ? engine::kTaggedSeparated : 0, &element,
                     &out->damaged, &cp, max_long_value)) {
          continue;
        }
        elements.push_back(std::move(element));
      }
    }
    if (IsText(out->engine_type)) {
      std::string joined;
      for (size_t k = 0; k < elements.size(); ++k) {
        if (k) joined += ";";
        ByteView e(elements[k]);
        std::string text =
            out->code_page == kUtf16CodePage ? Utf16LEToUtf8(e) : CodePageToUtf8(e, out->code_page);
        while (!text.empty() && text.back() == '\0') text.pop_back();
        joined += text;
      }
      out->bytes.assign(joined.begin(), joined.end());
      out->code_page = kUtf8CodePage;
    } else {
      for (const Bytes& e : elements) out->bytes.insert(out->bytes.end(), e.begin(), e.end());
    }
    return true;
  }
  uint32_t cp = out->code_page;
  if (!Resolve(v.value, flags, &out->bytes, &out->damaged, &cp, max_long_value)) return true;
  if (IsText(out->engine_type)) out->code_page = cp;
  return true;
}

std::vector<RowValue> RowValueReader::Read(const engine::RecordColumns& columns,
                                           uint64_t max_long_value) const {
  std::vector<RowValue> out;
  for (size_t slot = 0; slot < table_.columns.size(); ++slot) {
    RowValue v;
    if (ReadOne(columns, slot, &v, max_long_value)) out.push_back(std::move(v));
  }
  return out;
}

}  // namespace tarnwell::store
