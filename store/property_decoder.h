// PropertyDecoder: turns one column value of a mailbox, folder, message or
// attachment row into a field of the current-item records.
//
// Two things decide what happens to a value:
//   - the column's engine type says how its bytes convert (integer widths,
//     times, text in its code page, raw bytes);
//   - the column's name together with the purpose that is on says which field
//     receives it. The same name lands in different records under different
//     purposes ("S1000" is the body of a message and the text of a task), and
//     a value whose purpose is off is not stored at all.
//
// Names are compared whole; the type letter in front of a property id is not
// interpreted, except for binary values of mailbox and folder rows, whose
// 'T' / 'Q' names say they hold a time or a 64-bit id (typed_binary.h).
//
// Times:
//   currency, long long   little-endian FILETIME
//   date-time             8 bytes taken as a little-endian FILETIME
//   binary of 8 bytes     legacy stores: big-endian (high half first);
//                         Exchange 2010 stores and mailbox/folder rows:
//                         little-endian
//   binary, other length  not a time: nothing stored
#ifndef TARNWELL_STORE_PROPERTY_DECODER_H_
#define TARNWELL_STORE_PROPERTY_DECODER_H_

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "base/byte_view.h"
#include "store/item_records.h"

namespace tarnwell::store {

// Store version codes.
inline constexpr int kStoreExchange2000 = 1;  // 2000 and 2003
inline constexpr int kStoreExchange2007 = 2;
inline constexpr int kStoreExchange2010 = 3;
inline constexpr int kStoreExchange55 = 4;
inline constexpr int kStoreExchange2013 = 5;  // 2013 and later

// Parses a "PropertyBlob" / "OffPagePropertyBlob" value (modern stores) into
// the records of `purpose`. Returns what PropertyDecoder::Decode returns.
using PropertyBlobParser =
    std::function<int(DecodePurpose purpose, ByteView blob, ItemRecords* records)>;

class PropertyDecoder {
 public:
  explicit PropertyDecoder(int store_version);

  // Decodes one column value into the record of `purpose`. `value` holds the
  // column's bytes with long values assembled and compressed values expanded.
  // `engine_type` is the catalog column type (engine::ColumnType); `code_page`
  // that of a text column (1200 UTF-16LE; 0 means windows-1252).
  // Returns 1 when a field was stored, 0 when nothing was (unknown name,
  // purpose off, empty value, value of a kind the field does not take) and
  // -1 for a bad value (too short for its type, a typed binary value of the
  // wrong length, an undecodable compressed RTF body).
  int Decode(DecodePurpose purpose, std::string_view column_name, uint32_t engine_type,
             uint32_t code_page, ByteView value, ItemRecords* records) const;

  // Installs the parser for property blobs. Without one, blob columns store
  // nothing.
  void SetPropertyBlobParser(PropertyBlobParser parser) { blob_parser_ = std::move(parser); }

  int store_version() const { return store_version_; }

  // Every column name some rule of this store version looks at.
  std::vector<std::string> KnownColumnNames() const;

  struct Rule;

 private:
  int store_version_;
  std::unordered_map<std::string, std::vector<const Rule*>> rules_by_name_;
  std::vector<const Rule*> pattern_rules_;
  PropertyBlobParser blob_parser_;
};

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_PROPERTY_DECODER_H_
