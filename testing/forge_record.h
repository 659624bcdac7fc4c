// Table records: one row's column values in ESE's record layout.
#ifndef TARNWELL_TESTING_FORGE_RECORD_H_
#define TARNWELL_TESTING_FORGE_RECORD_H_

#include <cstdint>
#include <string_view>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "testing/forge_layout.h"
#include "testing/forge_page.h"

namespace tarnwell::forge {

enum class TaggedLayout {
  kLinear,      // revision 2 and older: id, size, value, id, size, value, ...
  kSmallPages,  // an offset array; a flag byte only where bit 0x4000 says so
  kLargePages,  // an offset array with 15-bit offsets; a flag byte before every value
};

TaggedLayout TaggedLayoutFor(const PageFormat& format);

enum class ColumnClass { kFixed, kVariable, kTagged };
ColumnClass ClassOf(uint32_t column_id);

// Bytes a fixed column takes in every record; 0 for types without one.
uint32_t FixedColumnWidth(const ColumnLayout& column);

// Checks a table's columns: ids unique and ascending, 1..65535, fixed
// columns of a fixed-width type (or binary/text with a size), names set.
Status CheckColumns(const std::vector<ColumnLayout>& columns);

// Encodes one row. `columns` must have passed CheckColumns. Columns without
// a cell are NULL; fixed and variable columns after the last one with a
// cell are left out of the record, as ESE does.
Status EncodeRecord(const std::vector<ColumnLayout>& columns, const std::vector<Cell>& cells,
                    TaggedLayout layout, Bytes* out);

// The value of a multi-valued tagged column (flag kTaggedMultiValued):
// an array of u16 offsets, one per value, then the values.
Bytes EncodeMultiValue(const std::vector<Bytes>& values);

// Little helpers for building cell values.
Bytes LittleEndian(uint64_t value, size_t width);
Bytes Utf16(std::string_view ascii);
Bytes Ascii(std::string_view text);

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_RECORD_H_
