#include "engine/catalog.h"

#include <algorithm>
#include <tuple>

namespace tarnwell::engine {

bool ParseCatalogRecord(ByteView data, CatalogEntry* entry, bool* extended) {
  *extended = false;
  if (data.size() < kRecordHeaderSize) return false;
  const uint8_t last_fixed = data[0];
  const uint8_t last_variable = data[1];
  const uint16_t var_array = data.U16LE(2);
  if (last_fixed < kCatalogMinLastFixed || last_fixed > kCatalogMaxLastFixed) return false;
  if (var_array > data.size()) return false;
  *extended = last_fixed == kCatalogExtendedLastFixed;

  entry->table_object_id = data.U32LE(kCatalogObjectIdOffset);
  entry->type = data.U16LE(kCatalogTypeOffset);
  entry->id = data.U32LE(kCatalogIdOffset);
  entry->column_type_or_root = data.U32LE(kCatalogColumnTypeOffset);
  entry->size = data.U32LE(kCatalogSizeOffset);
  if (entry->type == kCatalogColumn) entry->code_page = data.U32LE(kCatalogCodePageOffset);

  if (last_variable < kCatalogNameColumn) return true;
  const size_t var_count = size_t(last_variable) - (kCatalogNameColumn - 1);
  const size_t var_data = size_t(var_array) + 2 * var_count;
  size_t running_end = 0;
  for (size_t i = 0; i < var_count; ++i) {
    uint16_t word = 0;
    if (!data.ReadU16LE(var_array + 2 * i, &word)) return false;
    if (word & kVariableNullBit) continue;
    const size_t end = word & kVariableOffsetMask;
    if (end < running_end) return false;
    ByteView value = data.Sub(var_data + running_end, end - running_end);
    if (value.size() != end - running_end) return false;
    running_end = end;
    switch (kCatalogNameColumn + i) {
      case kCatalogNameColumn:
        entry->name = value.ToString();
        break;
      case kCatalogSecondColumn:
        entry->second_value = value.ToBytes();
        break;
      case kCatalogThirdColumn:
        entry->third_value = value.ToBytes();
        break;
      default:
        break;
    }
  }
  return true;
}

std::vector<TableDef> CatalogBuilder::Finish() {
  auto key = [](const CatalogEntry& e) { return std::make_tuple(e.table_object_id, e.type, e.id); };
  std::stable_sort(entries_.begin(), entries_.end(),
                   [&](const CatalogEntry& a, const CatalogEntry& b) { return key(a) < key(b); });
  for (size_t i = 0; i < entries_.size(); ++i) {
    if (i > 0 && key(entries_[i]) == key(entries_[i - 1])) continue;
    File(std::move(entries_[i]));
  }
  entries_.clear();
  return std::move(tables_);
}

void CatalogBuilder::File(CatalogEntry entry) {
  if (entry.type == kCatalogTable) {
    TableDef table;
    table.table = std::move(entry);
    tables_.push_back(std::move(table));
    return;
  }
  // Objects belong to the table whose object id they carry; one whose table
  // record is missing has no owner.
  if (tables_.empty() || tables_.back().table.table_object_id != entry.table_object_id) return;
  TableDef& current = tables_.back();
  switch (entry.type) {
    case kCatalogColumn:
      current.columns.push_back(std::move(entry));
      break;
    case kCatalogLongValue:
      if (!current.long_value) current.long_value = std::move(entry);
      break;
    case kCatalogFurther:
      if (!current.further) current.further = std::move(entry);
      break;
    default:  // indexes and unknown objects are not kept
      break;
  }
}

std::string ListedTableName(const std::string& name, PageFamily family) {
  if (family != PageFamily::kLegacy) return name;
  const size_t dash = name.find('-');
  return dash == std::string::npos ? name : name.substr(dash + 1);
}

}  // namespace tarnwell::engine
