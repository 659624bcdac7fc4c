// Property blobs: the "PropertyBlob" / "OffPagePropertyBlob" columns in which
// Exchange 2013 and later keep most properties of an item in one value.
//
// Each blob entry becomes a value under the name a column of its own would
// have ("S3001", "L36", "MS8002": type letters, then the property id in
// lower-case hexadecimal), typed like such a column, so that the decoder's
// name-to-field rules serve blobs and plain columns alike.
//
// Two layouts exist. This file reads the one with 8-byte entries; the layout
// real servers write (3-byte entries, self-describing values) is read by
// real_property_blob.h, and the parser installed into a PropertyDecoder picks
// whichever layout the value has.
//
// Layout with 8-byte entries (little-endian):
//
//   offset  width      meaning
//   0       4          magic "ProP"
//   4       2          not used
//   6       2          entry count
//   8       8 x count  entries
//
//   entry:  0  2  kind
//           2  2  property id
//           4  4  value offset from the blob's start; for kinds B and L the
//                 value itself
//
//   kind    letter  value at the offset
//   0x0808  B       (inline)
//   0x1818  L       (inline)
//   0x3838  T       marker, length, data
//   0x4848  S       marker, length, data
//   0x5050  N       marker, length, data
//   0xC8C8  MS      0xC9, item count, items (u16: low byte 'M', high byte
//                   length; then the item's bytes)
//
// A string's marker 'M' means UTF-8; 'H' means "no value" and ends the blob.
#ifndef TARNWELL_STORE_PROPERTY_BLOB_H_
#define TARNWELL_STORE_PROPERTY_BLOB_H_

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "store/item_records.h"
#include "store/property_decoder.h"

namespace tarnwell::store {

enum class BlobValueState {
  kValue,            // `value` holds the value
  kDeleted,          // the property was deleted; no value
  kFarValue,         // the value lives in the row's "SeparatedPropertyNN" column
  kUnknownEncoding,  // `value` holds bytes of an encoding whose meaning is unknown
};

struct BlobEntry {
  std::string letters;  // "S", "L", "MS", ...
  uint16_t id = 0;
  std::string name;  // letters + id in "%x" form: "S3001"
  // The entry's type byte in the layout real servers write; 0 otherwise.
  uint8_t type = 0;
  BlobValueState state = BlobValueState::kValue;
  // How `value` converts: an engine column type and, for text, a code page.
  // Text is always UTF-8 here.
  uint32_t engine_type = 0;
  uint32_t code_page = 0;
  // The value as a column of `engine_type` holds it: fixed-size values
  // little-endian at their natural width, text as UTF-8, binary as is.
  // A multi-valued string is its items joined with ";".
  Bytes value;
  // Multi-valued entries: each element on its own (strings as UTF-8).
  std::vector<Bytes> items;
  // kFarValue: the two digits of the "SeparatedProperty" column, what the
  // blob says about the value's encoding and its encoded length.
  uint16_t far_slot = 0;
  uint16_t far_family = 0;
  uint32_t far_length = 0;
};

// "SeparatedProperty01" for slot 1.
std::string SeparatedPropertyColumn(uint16_t slot);

// The entries of a blob with 8-byte entries, in blob order. A blob without the
// magic or shorter than 9 bytes has none; entries stop where the blob ends or
// at a string marked 'H'; values that pass the blob's end are left out.
std::vector<BlobEntry> ParseBlobEntries(ByteView blob);

// The entries of a blob of either layout.
std::vector<BlobEntry> ReadBlobEntries(ByteView blob);

struct BlobParserOptions {
  // Databases of the later 2013 variant: the list parser also takes the Cc
  // line and the conversation topic.
  bool later_2013_variant = false;
  // Fetches a row's "SeparatedPropertyNN" value (already decompressed) for
  // far values; without it far values are skipped.
  std::function<std::optional<Bytes>(uint16_t slot)> separated_value;
};

// Message-list rows: property 0x0042 gives the sender and 0x0E1D the
// normalized subject, appended to the subject held. In the later 2013
// variant a second pass takes 0x0E03 as the Cc line and fills the sender and
// subject from 0x0042, 0x0E1D and, failing both, 0x0070 (conversation topic)
// where the first pass left them empty. Returns 1.
int ParseBlobForList(ByteView blob, const BlobParserOptions& options, MessageSummary* summary);

// Item detail: every entry goes through `decoder` under its name, as if it
// were a column of its own. Returns 1.
int ParseBlobForDetail(const PropertyDecoder& decoder, DecodePurpose purpose, ByteView blob,
                       const BlobParserOptions& options, ItemRecords* records);

// The parser to install with PropertyDecoder::SetPropertyBlobParser: list rows
// go to ParseBlobForList, item details to ParseBlobForDetail. It refers to
// `decoder`, which must outlive it (and not move).
PropertyBlobParser MakePropertyBlobParser(const PropertyDecoder* decoder,
                                          BlobParserOptions options = {});

// Installs MakePropertyBlobParser(decoder, options) into `decoder`.
void InstallPropertyBlobParser(PropertyDecoder* decoder, BlobParserOptions options = {});

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_PROPERTY_BLOB_H_
