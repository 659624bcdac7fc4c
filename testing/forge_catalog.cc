// Catalog records are ordinary records of the catalog table, whose columns
// are (fixed ones in id order, as each revision has them):
//   id  name             type   meaning
//   1   ObjidTable       Long   object id of the table the record belongs to
//   2   Type             Short  CatalogType
//   3   Id               Long   table/tree object id, or column id
//   4   ColtypOrPgnoFDP  Long   column type, or the tree's root page
//   5   SpaceUsage       Long   column width / maximum size; table density
//   6   Flags            Long   column flags (0x1 fixed, 0x2 tagged, ...)
//   7   PagesOrLocale    Long   initial pages of a tree; a text column's code page
//   8   RootFlag         Bit
//   9   RecordOffset     Short  a fixed column's offset in its records
//   10  LCMapFlags       Long
//   11  KeyMost          Short  revision 12 and later
//   12  LVChunkMax       Long   revision 20 and later
//   128 Name             Text   ASCII
// Records are keyed by (ObjidTable, Type, Id), each normalised the way ESE
// normalises signed integers: a 0x7F marker byte, then the value big-endian
// with its sign bit flipped.
#include "testing/forge_catalog.h"

#include <algorithm>
#include <map>

namespace tarnwell::forge {
namespace {

constexpr uint32_t kColumnFlagFixed = 0x1;
constexpr uint32_t kColumnFlagTagged = 0x2;
constexpr uint32_t kTableDensity = 80;
constexpr uint32_t kInitialPages = 1;
constexpr uint8_t kKeyColumnMarker = 0x7F;
constexpr uint32_t kKeyMostRevision = 12;
constexpr uint32_t kLvChunkMaxRevision = 20;
constexpr uint32_t kWin7CatalogRevision = 17;
constexpr uint32_t kRecordHeaderSize = 4;

enum CatalogColumnId : uint32_t {
  kObjidTable = 1,
  kType = 2,
  kId = 3,
  kColtypOrPgnoFdp = 4,
  kSpaceUsage = 5,
  kFlags = 6,
  kPagesOrLocale = 7,
  kRootFlag = 8,
  kRecordOffset = 9,
  kLcMapFlags = 10,
  kKeyMost = 11,
  kLvChunkMax = 12,
  kName = 128,
};

uint32_t LastFixedCatalogColumn(uint32_t revision) {
  if (revision >= kLvChunkMaxRevision) return kLvChunkMax;
  if (revision >= kKeyMostRevision) return kKeyMost;
  return kLcMapFlags;
}

void AppendKeyPart(Bytes* key, uint32_t value, size_t width) {
  key->push_back(kKeyColumnMarker);
  const uint64_t flipped = value ^ (uint64_t(1) << (8 * width - 1));
  for (size_t i = width; i-- > 0;) key->push_back(uint8_t(flipped >> (8 * i)));
}

Bytes CatalogKey(uint32_t object_id, uint16_t type, uint32_t id) {
  Bytes key;
  AppendKeyPart(&key, object_id, 4);
  AppendKeyPart(&key, type, 2);
  AppendKeyPart(&key, id, 4);
  return key;
}

// Values of one catalog record by catalog column id.
struct CatalogRow {
  uint32_t object_id = 0;
  uint16_t type = 0;
  uint32_t id = 0;
  uint32_t coltyp_or_fdp = 0;
  uint32_t space_usage = 0;
  uint32_t flags = 0;
  uint32_t pages_or_locale = 0;
  uint16_t record_offset = 0;
  std::string name;
};

Status AddRow(const std::vector<ColumnLayout>& columns, uint32_t revision, TaggedLayout layout,
              const CatalogRow& row, std::vector<TreeEntry>* entries) {
  std::vector<Cell> cells = {
      {kObjidTable, LittleEndian(row.object_id, 4)},
      {kType, LittleEndian(row.type, 2)},
      {kId, LittleEndian(row.id, 4)},
      {kColtypOrPgnoFdp, LittleEndian(row.coltyp_or_fdp, 4)},
      {kSpaceUsage, LittleEndian(row.space_usage, 4)},
      {kFlags, LittleEndian(row.flags, 4)},
      {kPagesOrLocale, LittleEndian(row.pages_or_locale, 4)},
      {kRootFlag, LittleEndian(0, 1)},
      {kRecordOffset, LittleEndian(row.record_offset, 2)},
      {kLcMapFlags, LittleEndian(0, 4)},
  };
  if (LastFixedCatalogColumn(revision) >= kKeyMost) cells.push_back({kKeyMost, LittleEndian(0, 2)});
  if (LastFixedCatalogColumn(revision) >= kLvChunkMax) {
    cells.push_back({kLvChunkMax, LittleEndian(0, 4)});
  }
  cells.push_back({kName, Ascii(row.name)});
  TreeEntry entry;
  entry.key = CatalogKey(row.object_id, row.type, row.id);
  Status s = EncodeRecord(columns, cells, layout, &entry.data);
  if (!s.ok()) return s;
  entries->push_back(std::move(entry));
  return Status::Ok();
}

}  // namespace

std::vector<ColumnLayout> CatalogColumns(uint32_t revision) {
  std::vector<ColumnLayout> columns = {
      {kObjidTable, "ObjidTable", kColumnLong},
      {kType, "Type", kColumnShort},
      {kId, "Id", kColumnLong},
      {kColtypOrPgnoFdp, "ColtypOrPgnoFDP", kColumnLong},
      {kSpaceUsage, "SpaceUsage", kColumnLong},
      {kFlags, "Flags", kColumnLong},
      {kPagesOrLocale, "PagesOrLocale", kColumnLong},
      {kRootFlag, "RootFlag", kColumnBit},
      {kRecordOffset, "RecordOffset", kColumnShort},
      {kLcMapFlags, "LCMapFlags", kColumnLong},
  };
  if (LastFixedCatalogColumn(revision) >= kKeyMost) {
    columns.push_back({kKeyMost, "KeyMost", kColumnShort});
  }
  if (LastFixedCatalogColumn(revision) >= kLvChunkMax) {
    columns.push_back({kLvChunkMax, "LVChunkMax", kColumnLong});
  }
  columns.push_back({kName, "Name", kColumnText, 255, 1252});
  columns.push_back({129, "Stats", kColumnBinary, 255});
  columns.push_back({130, "TemplateTable", kColumnText, 255, 1252});
  columns.push_back({131, "DefaultValue", kColumnBinary, 255});
  columns.push_back({132, "KeyFldIDs", kColumnBinary, 255});
  columns.push_back({133, "VarSegMac", kColumnBinary, 255});
  columns.push_back({134, "ConditionalColumns", kColumnBinary, 255});
  columns.push_back({135, "TupleLimits", kColumnBinary, 255});
  if (revision >= kKeyMostRevision) columns.push_back({136, "Version", kColumnBinary, 255});
  columns.push_back({256, "CallbackData", kColumnLongBinary});
  columns.push_back({257, "CallbackDependencies", kColumnLongBinary});
  if (revision >= kWin7CatalogRevision) {
    columns.push_back({258, "SeparateLV", kColumnLongBinary});
    columns.push_back({259, "SpaceHints", kColumnLongBinary});
    columns.push_back({260, "SpaceDeferredLVHints", kColumnLongBinary});
  }
  return columns;
}

Status BuildCatalogEntries(uint32_t revision, TaggedLayout layout,
                           const std::vector<CatalogTable>& tables,
                           std::vector<TreeEntry>* entries) {
  const std::vector<ColumnLayout> catalog_columns = CatalogColumns(revision);
  for (const CatalogTable& table : tables) {
    CatalogRow t;
    t.object_id = table.object_id;
    t.type = kCatalogTable;
    t.id = table.object_id;
    t.coltyp_or_fdp = table.root_page;
    t.space_usage = kTableDensity;
    t.pages_or_locale = kInitialPages;
    t.name = table.name;
    Status s = AddRow(catalog_columns, revision, layout, t, entries);
    if (!s.ok()) return s;

    uint32_t record_offset = kRecordHeaderSize;
    for (const ColumnLayout& column : *table.columns) {
      CatalogRow c;
      c.object_id = table.object_id;
      c.type = kCatalogColumn;
      c.id = column.id;
      c.coltyp_or_fdp = column.type;
      c.flags = column.flags;
      c.pages_or_locale = column.codepage;
      c.name = column.name;
      switch (ClassOf(column.id)) {
        case ColumnClass::kFixed:
          c.space_usage = FixedColumnWidth(column);
          c.flags |= kColumnFlagFixed;
          c.record_offset = uint16_t(record_offset);
          record_offset += c.space_usage;
          break;
        case ColumnClass::kVariable:
          c.space_usage = column.size;
          break;
        case ColumnClass::kTagged:
          c.space_usage = column.size;
          c.flags |= kColumnFlagTagged;
          break;
      }
      s = AddRow(catalog_columns, revision, layout, c, entries);
      if (!s.ok()) return s;
    }

    if (table.long_value_root_page != 0) {
      CatalogRow lv;
      lv.object_id = table.object_id;
      lv.type = kCatalogLongValue;
      lv.id = table.long_value_object_id;
      lv.coltyp_or_fdp = table.long_value_root_page;
      lv.space_usage = kTableDensity;
      lv.pages_or_locale = kInitialPages;
      lv.name = "LV" + std::to_string(table.long_value_object_id);
      s = AddRow(catalog_columns, revision, layout, lv, entries);
      if (!s.ok()) return s;
    }
  }
  std::sort(entries->begin(), entries->end(),
            [](const TreeEntry& a, const TreeEntry& b) { return a.key < b.key; });
  return Status::Ok();
}

}  // namespace tarnwell::forge
