// Catalog record parsing and the table list built from it. The input is a
// sequence of records, each a u16 length (little-endian) then its bytes, as
// the catalog's leaves would hand them over in key order.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "engine/catalog.h"

namespace {

using namespace tarnwell;
using namespace tarnwell::engine;

constexpr size_t kLengthSize = 2;

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const ByteView input(data, size);
  CatalogBuilder builder;
  size_t pos = 0;
  size_t parsed_tables = 0;
  uint16_t length = 0;
  while (input.ReadU16LE(pos, &length)) {
    pos += kLengthSize;
    // A length past the end takes what is left: a record cut short.
    const ByteView record = input.Has(pos, length) ? input.Sub(pos, length) : input.From(pos);
    pos += record.size();
    CatalogEntry entry;
    bool extended = false;
    ParseCatalogRecord(record, &entry, &extended);
    // Variable values are cut from the record: none can be longer.
    if (entry.name.size() > record.size() || entry.second_value.size() > record.size() ||
        entry.third_value.size() > record.size()) {
      std::abort();
    }
    if (entry.type == kCatalogTable) ++parsed_tables;
    builder.Add(std::move(entry));
    if (record.empty() && length != 0) break;
  }
  std::vector<TableDef> tables = builder.Finish();
  // Every table comes from a table record; repeats of one key count once.
  if (tables.size() > parsed_tables) std::abort();
  volatile size_t sink = 0;
  for (const TableDef& t : tables) {
    sink = sink + ListedTableName(t.name(), PageFamily::kLegacy).size() +
           ListedTableName(t.name(), PageFamily::kLarge).size() + t.columns.size();
    for (const CatalogEntry& c : t.columns) {
      if (c.type != kCatalogColumn) std::abort();
    }
  }
  return 0;
}
