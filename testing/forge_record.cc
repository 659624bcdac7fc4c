// Record layout (the data of a table leaf node):
//   offset width meaning
//   0      1     highest fixed column id stored (0 when none)
//   1      1     highest variable column id stored (127 when none)
//   2      2     offset of the variable offset array
//   4      ...   fixed values in id order, each as wide as its column
//   ...    ...   null bitmap of the fixed columns: bit (id - 1) set = NULL
//   ...    2*n   variable offset array, one u16 per id 128..highest: end of
//                the value relative to the variable data; 0x8000 = NULL
//   ...    ...   variable data
//   ...    ...   tagged area, to the end of the record
//
// Tagged area, revision 9 and later: an array of {u16 column id, u16 offset}
// in ascending id order, then the values. Offsets count from the start of
// the area, so the first one is the array's length.
//   small pages: offset & 0x1FFF; 0x4000 = the value starts with a flag byte;
//                0x2000 = NULL (no bytes)
//   large pages: offset & 0x7FFF; every value starts with its flag byte
//                (kTagged*), NULL is a flag byte with kTaggedNull alone
// Revision 2: a sequence of {u16 column id, u16 size, value}, size | 0x8000
// when the value starts with a flag byte (counted in the size).
#include "testing/forge_record.h"

#include <algorithm>
#include <map>
#include <string>

namespace tarnwell::forge {
namespace {

constexpr size_t kRecordHeaderSize = 4;
constexpr uint8_t kNoVariableColumns = 127;
constexpr uint16_t kVariableNull = 0x8000;
constexpr uint16_t kTaggedHasFlagByte = 0x4000;
constexpr uint16_t kTaggedSmallNull = 0x2000;
constexpr uint16_t kTaggedSmallOffsetMask = 0x1FFF;
constexpr uint16_t kTaggedLargeOffsetMask = 0x7FFF;
constexpr uint16_t kLinearHasFlagByte = 0x8000;
constexpr size_t kTaggedEntrySize = 4;
constexpr uint32_t kLastFixedColumnId = 127;
constexpr uint32_t kLastVariableColumnId = 255;
constexpr uint32_t kLargeTaggedRevision = 17;
constexpr uint32_t kLastLinearTaggedRevision = 2;

void AppendU16(Bytes* b, uint16_t v) {
  b->push_back(uint8_t(v));
  b->push_back(uint8_t(v >> 8));
}

std::string ColumnName(uint32_t id) { return "column " + std::to_string(id); }

}  // namespace

TaggedLayout TaggedLayoutFor(const PageFormat& format) {
  if (format.revision <= kLastLinearTaggedRevision) return TaggedLayout::kLinear;
  if (format.large() && format.revision >= kLargeTaggedRevision) return TaggedLayout::kLargePages;
  return TaggedLayout::kSmallPages;
}

ColumnClass ClassOf(uint32_t column_id) {
  if (column_id < kFirstVariableColumnId) return ColumnClass::kFixed;
  if (column_id < kFirstTaggedColumnId) return ColumnClass::kVariable;
  return ColumnClass::kTagged;
}

uint32_t FixedColumnWidth(const ColumnLayout& column) {
  switch (column.type) {
    case kColumnBit:
    case kColumnUnsignedByte:
      return 1;
    case kColumnShort:
    case kColumnUnsignedShort:
      return 2;
    case kColumnLong:
    case kColumnFloat:
    case kColumnUnsignedLong:
      return 4;
    case kColumnCurrency:
    case kColumnDouble:
    case kColumnDateTime:
    case kColumnLongLong:
      return 8;
    case kColumnGuid:
      return 16;
    case kColumnBinary:
    case kColumnText:
      return column.size;
    default:
      return 0;
  }
}

Status CheckColumns(const std::vector<ColumnLayout>& columns) {
  for (size_t i = 0; i < columns.size(); ++i) {
    const ColumnLayout& c = columns[i];
    if (c.id == 0 || c.id > kLastTaggedColumnId) {
      return Status::InvalidArgument(ColumnName(c.id) + ": id out of range");
    }
    if (i > 0 && columns[i - 1].id >= c.id) {
      return Status::InvalidArgument(ColumnName(c.id) + ": ids must be unique and ascending");
    }
    if (c.name.empty()) return Status::InvalidArgument(ColumnName(c.id) + ": no name");
    if (ClassOf(c.id) == ColumnClass::kFixed && FixedColumnWidth(c) == 0) {
      return Status::InvalidArgument(ColumnName(c.id) + ": fixed column without a width");
    }
  }
  return Status::Ok();
}

Status EncodeRecord(const std::vector<ColumnLayout>& columns, const std::vector<Cell>& cells,
                    TaggedLayout layout, Bytes* out) {
  std::map<uint32_t, const Cell*> by_id;
  for (const Cell& cell : cells) {
    if (!by_id.emplace(cell.column_id, &cell).second) {
      return Status::InvalidArgument(ColumnName(cell.column_id) + ": two cells");
    }
  }
  std::map<uint32_t, const ColumnLayout*> column_by_id;
  for (const ColumnLayout& c : columns) column_by_id[c.id] = &c;
  uint32_t last_fixed = 0, last_variable = kNoVariableColumns;
  for (const auto& [id, cell] : by_id) {
    if (!column_by_id.count(id))
      return Status::InvalidArgument(ColumnName(id) + ": no such column");
    if (ClassOf(id) == ColumnClass::kFixed) last_fixed = std::max(last_fixed, id);
    if (ClassOf(id) == ColumnClass::kVariable) last_variable = std::max(last_variable, id);
  }
  auto value_of = [&](uint32_t id) -> const Bytes* {
    auto it = by_id.find(id);
    return it != by_id.end() && it->second->value ? &*it->second->value : nullptr;
  };

  Bytes& r = *out;
  r.assign(kRecordHeaderSize, 0);
  r[0] = uint8_t(last_fixed);
  r[1] = uint8_t(last_variable);

  // Fixed values, then their null bitmap.
  Bytes null_bitmap((last_fixed + 7) / 8, 0);
  for (const ColumnLayout& c : columns) {
    if (c.id > last_fixed || c.id > kLastFixedColumnId) break;
    const uint32_t width = FixedColumnWidth(c);
    if (const Bytes* v = value_of(c.id)) {
      if (v->size() != width) {
        return Status::InvalidArgument(ColumnName(c.id) + ": fixed value of " +
                                       std::to_string(v->size()) + " bytes, column has " +
                                       std::to_string(width));
      }
      r.insert(r.end(), v->begin(), v->end());
    } else {
      r.insert(r.end(), width, 0);
      null_bitmap[(c.id - 1) / 8] |= uint8_t(1u << ((c.id - 1) % 8));
    }
  }
  r.insert(r.end(), null_bitmap.begin(), null_bitmap.end());
  StoreU16LE(r.data() + 2, uint16_t(r.size()));

  // Variable offsets and data.
  Bytes variable_data;
  for (uint32_t id = kFirstVariableColumnId; id <= last_variable && id <= kLastVariableColumnId;
       ++id) {
    if (const Bytes* v = value_of(id)) {
      variable_data.insert(variable_data.end(), v->begin(), v->end());
      AppendU16(&r, uint16_t(variable_data.size()));
    } else {
      AppendU16(&r, uint16_t(variable_data.size() | kVariableNull));
    }
  }
  if (variable_data.size() >= kVariableNull) {
    return Status::InvalidArgument("variable columns hold more than 32 KiB");
  }
  r.insert(r.end(), variable_data.begin(), variable_data.end());

  // Tagged values.
  std::vector<const Cell*> tagged;
  for (const auto& [id, cell] : by_id) {
    if (ClassOf(id) == ColumnClass::kTagged) tagged.push_back(cell);
  }
  if (layout == TaggedLayout::kLinear) {
    for (const Cell* cell : tagged) {
      const bool flag_byte = cell->tagged_flags != 0 && cell->value;
      size_t size = (cell->value ? cell->value->size() : 0) + (flag_byte ? 1 : 0);
      if (size >= kTaggedHasFlagByte) return Status::InvalidArgument("tagged value too large");
      AppendU16(&r, uint16_t(cell->column_id));
      AppendU16(&r, uint16_t(size | (flag_byte ? kLinearHasFlagByte : 0)));
      if (flag_byte) r.push_back(cell->tagged_flags);
      if (cell->value) r.insert(r.end(), cell->value->begin(), cell->value->end());
    }
    return Status::Ok();
  }
  const bool large = layout == TaggedLayout::kLargePages;
  const uint16_t offset_mask = large ? kTaggedLargeOffsetMask : kTaggedSmallOffsetMask;
  Bytes array, data;
  for (const Cell* cell : tagged) {
    size_t offset = tagged.size() * kTaggedEntrySize + data.size();
    if (offset > offset_mask) return Status::InvalidArgument("tagged area too large");
    uint16_t word = uint16_t(offset);
    if (large) {
      data.push_back(uint8_t(cell->tagged_flags | (cell->value ? 0 : kTaggedNull)));
    } else if (!cell->value) {
      word |= kTaggedSmallNull;
    } else if (cell->tagged_flags != 0) {
      word |= kTaggedHasFlagByte;
      data.push_back(cell->tagged_flags);
    }
    if (cell->value) data.insert(data.end(), cell->value->begin(), cell->value->end());
    AppendU16(&array, uint16_t(cell->column_id));
    AppendU16(&array, word);
  }
  r.insert(r.end(), array.begin(), array.end());
  r.insert(r.end(), data.begin(), data.end());
  return Status::Ok();
}

Bytes EncodeMultiValue(const std::vector<Bytes>& values) {
  Bytes out;
  size_t offset = values.size() * 2;
  for (const Bytes& v : values) {
    AppendU16(&out, uint16_t(offset));
    offset += v.size();
  }
  for (const Bytes& v : values) out.insert(out.end(), v.begin(), v.end());
  return out;
}

Bytes LittleEndian(uint64_t value, size_t width) {
  Bytes b(width);
  for (size_t i = 0; i < width; ++i) b[i] = uint8_t(value >> (8 * i));
  return b;
}

Bytes Utf16(std::string_view ascii) {
  Bytes b;
  for (char c : ascii) {
    b.push_back(uint8_t(c));
    b.push_back(0);
  }
  return b;
}

Bytes Ascii(std::string_view text) { return Bytes(text.begin(), text.end()); }

}  // namespace tarnwell::forge
