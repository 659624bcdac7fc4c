#include "engine/record_columns.h"

#include <algorithm>

namespace tarnwell::engine {
namespace {

constexpr uint8_t kInlineSeparatedBit = 0x04;
constexpr size_t kLongValueIdSize = 4;

struct TaggedEntry {
  uint16_t id = 0;
  size_t begin = 0;  // within the tagged area
  size_t end = 0;
  bool null = false;
  bool flag_byte = false;
};

// Decodes the tagged array; stops at the first entry that does not fit.
std::vector<TaggedEntry> DecodeTaggedArray(ByteView area, TaggedForm form, bool* complete) {
  std::vector<TaggedEntry> entries;
  if (area.size() < kTaggedEntrySize) return entries;
  const bool large = form == TaggedForm::kLargePageArray;
  const uint16_t mask = large ? kLargeTaggedOffsetMask : kSmallTaggedOffsetMask;
  const size_t array_size = area.U16LE(2) & mask;
  if (array_size == 0) return entries;
  const size_t count = std::min(array_size, area.size()) / kTaggedEntrySize;
  entries.reserve(count);
  for (size_t i = 0; i < count; ++i) {
    TaggedEntry e;
    e.id = area.U16LE(i * kTaggedEntrySize);
    const uint16_t word = area.U16LE(i * kTaggedEntrySize + 2);
    e.begin = word & mask;
    if (!large) {
      e.null = word & kSmallTaggedNullBit;
      e.flag_byte = word & kSmallTaggedFlagByteBit;
    } else {
      e.flag_byte = true;
    }
    entries.push_back(e);
  }
  for (size_t i = 0; i < entries.size(); ++i) {
    entries[i].end = i + 1 < entries.size() ? entries[i + 1].begin : area.size();
    if (entries[i].begin < array_size || entries[i].begin > entries[i].end ||
        entries[i].end > area.size()) {
      // A value outside the area, or overlapping the array: damage. Keep
      // the entries before it.
      entries.resize(i);
      *complete = false;
      break;
    }
  }
  return entries;
}

}  // namespace

const ColumnValue& RecordColumns::at(size_t i) const {
  static const ColumnValue kEmpty;
  return i < values_.size() ? values_[i] : kEmpty;
}

bool RecordColumns::Split(ByteView record, const std::vector<const CatalogEntry*>& columns,
                          TaggedForm form) {
  storage_ = record.ToBytes();
  values_.assign(columns.size(), ColumnValue());
  complete_ = true;
  ByteView rec(storage_);
  if (rec.size() < kRecordHeaderSize) return false;

  const uint8_t last_fixed = rec[0];
  const uint8_t last_variable = rec[1];
  const size_t var_array = std::min<size_t>(rec.U16LE(2), rec.size());
  const size_t var_count =
      last_variable >= kFirstVariableColumnId ? last_variable - kLastFixedColumnId : 0;
  const size_t var_data = var_array + 2 * var_count;

  // Where the fixed values end and whether there is room for a null bitmap.
  size_t fixed_end = kRecordHeaderSize;
  for (const CatalogEntry* c : columns) {
    if (c->id >= 1 && c->id <= last_fixed && c->id <= kLastFixedColumnId) fixed_end += c->size;
  }
  const size_t bitmap_size = (size_t(last_fixed) + 7) / 8;
  const bool has_null_bitmap = last_fixed > 0 && fixed_end + bitmap_size <= var_array;
  const size_t bitmap_at = var_array - bitmap_size;

  // The tagged area starts where the last variable value ends.
  size_t tagged_start = var_data;
  if (var_count > 0) {
    uint16_t last_end = 0;
    if (rec.ReadU16LE(var_array + 2 * (var_count - 1), &last_end)) {
      tagged_start = var_data + (last_end & kVariableOffsetMask);
    }
  }
  ByteView tagged = rec.From(tagged_start);
  std::vector<TaggedEntry> entries;
  if (form != TaggedForm::kInline) entries = DecodeTaggedArray(tagged, form, &complete_);

  size_t fixed_cursor = kRecordHeaderSize;
  size_t var_end = 0;  // end of the last variable value taken
  size_t tagged_cursor = 0;
  size_t inline_cursor = 0;

  for (size_t slot = 0; slot < columns.size(); ++slot) {
    const CatalogEntry& col = *columns[slot];
    std::optional<uint8_t> code = TypeCodeFor(col.column_type());
    if (!code) {
      // A type this program does not read; its fixed bytes still take room.
      if (col.id >= 1 && col.id <= kLastFixedColumnId && col.id <= last_fixed) {
        fixed_cursor += col.size;
      }
      continue;
    }
    ColumnValue& v = values_[slot];
    v.filled = true;
    v.type_code = *code;
    v.marker = kColumnValueMarker;
    if (col.column_type() == kColumnText || col.column_type() == kColumnLongText) {
      v.code_page = col.code_page ? col.code_page : kDefaultCodePage;
    }

    if (col.id >= 1 && col.id <= kLastFixedColumnId) {
      v.byte_order = kByteOrderLittle;
      if (col.id > last_fixed) continue;
      const size_t at = fixed_cursor;
      fixed_cursor += col.size;
      if (!rec.Has(at, col.size) || at + col.size > var_array) {
        complete_ = false;
        break;
      }
      const bool null =
          has_null_bitmap && (rec[bitmap_at + (col.id - 1) / 8] >> ((col.id - 1) % 8)) & 1;
      if (null) continue;
      v.value = rec.Sub(at, col.size);
      v.present = true;
    } else if (col.id >= kFirstVariableColumnId && col.id <= last_variable &&
               col.id < kFirstTaggedColumnId) {
      uint16_t entry = 0;
      if (!rec.ReadU16LE(var_array + 2 * (col.id - kFirstVariableColumnId), &entry)) {
        complete_ = false;
        break;
      }
      if (entry & kVariableNullBit) continue;
      const size_t end = entry & kVariableOffsetMask;
      if (end < var_end || !rec.Has(var_data + var_end, end - var_end)) {
        complete_ = false;
        break;
      }
      v.value = rec.Sub(var_data + var_end, end - var_end);
      v.present = true;
      var_end = end;
    } else if (col.id >= kFirstVariableColumnId && col.id < kFirstTaggedColumnId) {
      continue;  // a variable column past V: absent
    } else if (form == TaggedForm::kInline) {
      v.byte_order = kByteOrderLittle;
      // Items are in ascending id order: step over smaller ids.
      while (tagged.Has(inline_cursor, kInlineItemHeaderSize)) {
        const uint16_t id = tagged.U16LE(inline_cursor);
        const uint16_t word = tagged.U16LE(inline_cursor + 2);
        const bool flag = word & kInlineFlagByteBit;
        const size_t stored = flag ? (word & kInlineSizeMask) : word;
        const size_t body = inline_cursor + kInlineItemHeaderSize;
        if (!tagged.Has(body, stored)) {
          complete_ = false;
          inline_cursor = tagged.size();
          break;
        }
        if (id > col.id) break;
        inline_cursor = body + stored;
        if (id < col.id) continue;
        if (flag && stored >= 1) {
          v.has_flag_byte = true;
          v.flag_byte = tagged[body];
          v.value = tagged.Sub(body + 1, stored - 1);
        } else {
          v.value = tagged.Sub(body, stored);
        }
        if (v.type_code == kTypeBinary && v.value.size() == kLongValueIdSize && v.flag_byte) {
          v.flag_byte |= kInlineSeparatedBit;
        }
        v.present = true;
        break;
      }
    } else {
      v.byte_order = kByteOrderLittle;
      // Entries are in ascending id order; ids matching no catalog column
      // (deleted columns) are stepped over.
      if (tagged_cursor < entries.size() && entries[tagged_cursor].id > col.id) tagged_cursor = 0;
      while (tagged_cursor < entries.size() && entries[tagged_cursor].id < col.id) ++tagged_cursor;
      if (tagged_cursor >= entries.size() || entries[tagged_cursor].id != col.id) continue;
      const TaggedEntry& e = entries[tagged_cursor++];
      if (e.null) continue;
      ByteView bytes = tagged.Sub(e.begin, e.end - e.begin);
      if (e.flag_byte) {
        if (bytes.empty()) continue;
        v.has_flag_byte = true;
        v.flag_byte = bytes[0];
        bytes = bytes.From(1);
        if (v.flag_byte & kTaggedNull) continue;
      }
      v.value = bytes;
      v.present = true;
    }
  }
  return true;
}

}  // namespace tarnwell::engine
