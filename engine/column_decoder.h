// ColumnDecoder: turns a stored column value into what it means, by the
// column's engine type, for generic table dumps of any ESE database.
//
// Tagged values may be separated (the record holds a long-value id; flag
// 0x04), compressed (flag 0x02; see compress/compressed_value.h) or
// multi-valued:
//
//   flag              layout
//   0x10 two values   u8 length of the first value, first value, second value
//   0x08 multi-valued u16 offsets, one per value, from the value's start; the
//                     first offset / 2 is the count; bit 0x8000 of an offset
//                     = that element is a separated long-value id
#ifndef TARNWELL_ENGINE_COLUMN_DECODER_H_
#define TARNWELL_ENGINE_COLUMN_DECODER_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "engine/catalog_entry.h"
#include "engine/column_value.h"
#include "engine/long_value.h"

namespace tarnwell::engine {

struct DecodedColumn {
  enum class Kind {
    kAbsent,
    kBool,
    kSigned,
    kUnsigned,
    kDouble,
    kDateTime,     // text holds "YYYY-MM-DD HH:MM:SS", d the day count
    kGuid,         // text holds the canonical form
    kText,         // UTF-8
    kBinary,       // bytes
    kMulti,        // values
    kUnsupported,  // text says why (e.g. "unsupported compression: Xpress9")
    kDamaged,      // text says why; bytes hold what could be read
  };
  Kind kind = Kind::kAbsent;
  bool b = false;
  int64_t i = 0;
  uint64_t u = 0;
  double d = 0;
  std::string text;
  Bytes bytes;
  std::vector<DecodedColumn> values;
};

class ColumnDecoder {
 public:
  // `long_values` may be null when the table has no long-value tree.
  ColumnDecoder(const LongValueReader* long_values, uint32_t long_value_root)
      : long_values_(long_values), lv_root_(long_value_root) {}

  DecodedColumn Decode(const CatalogEntry& column, const ColumnValue& value) const;

 private:
  // One value's bytes after separation and compression are resolved.
  DecodedColumn DecodeElement(const CatalogEntry& column, ByteView bytes, bool separated,
                              bool compressed) const;
  DecodedColumn Interpret(const CatalogEntry& column, ByteView bytes, bool utf16) const;

  const LongValueReader* long_values_;
  uint32_t lv_root_;
};

// Canonical text of a GUID stored in its Windows byte order.
std::string GuidText(ByteView bytes);
// "YYYY-MM-DD HH:MM:SS" of an OLE automation date (days since 1899-12-30).
std::string OleDateText(double days);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_COLUMN_DECODER_H_
