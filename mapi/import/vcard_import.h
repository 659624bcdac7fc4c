// Importing a vCard (2.1, 3.0 or 4.0) into the message model as a contact
// ("IPM.Contact"), the way a mail program opens a .vcf file.
//
// Only the first card of the file is read. Lines are unfolded, vCard 2.1
// quoted-printable values are joined across their soft line breaks and
// decoded, Base64 values decoded, and text read in the CHARSET the line names
// (UTF-8, else windows-1252, when it names none). The input is bounded by
// kMaxVCardLines; a line that cannot be read is skipped.
//
//   N, FN              name parts (PidTagSurname ...), PidTagDisplayName, PidTagSubject,
//                      and the file-as name (PidLidFileUnder)
//   ORG, TITLE, ROLE, NICKNAME   company and department, job title, profession, nickname
//   TEL;TYPE=...       the telephone property its types name (work/home voice and fax,
//                      cell, car, pager, isdn, ...); a second work or home voice number
//                      goes to the second number of that kind
//   EMAIL              the first three: Email1 to Email3 (address, address type, display
//                      name, original display name, one-off entry id)
//   ADR, LABEL         home, work or other address: parts and the whole text
//   BDAY, X-MS-ANNIVERSARY    PidTagBirthday / PidTagWeddingAnniversary (local midnight)
//   URL, NOTE, PHOTO   home page, body, the contact picture attachment
#ifndef TARNWELL_MAPI_IMPORT_VCARD_IMPORT_H_
#define TARNWELL_MAPI_IMPORT_VCARD_IMPORT_H_

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "mapi/property_bag.h"

namespace tarnwell::mapi {

inline constexpr size_t kMaxVCardLines = 100000;
inline constexpr size_t kVCardEmailSlots = 3;

// One content line of a vCard or iCalendar file, unfolded.
struct ContentLine {
  std::string name;  // upper case, without a group prefix ("item1.")
  // Parameters in order, names upper case, values unquoted. A vCard 2.1 bare
  // parameter ("CELL", "QUOTED-PRINTABLE") is given the name it stands for.
  std::vector<std::pair<std::string, std::string>> params;
  std::string raw_value;  // as written, before any decoding

  // The first value of a parameter, or "".
  std::string Param(std::string_view param_name) const;
  // Every TYPE value, split at commas, lower case.
  std::vector<std::string> Types() const;
  bool HasType(std::string_view type) const;
  // The value with its ENCODING (quoted-printable, Base64) undone.
  Bytes DecodedBytes() const;
  // DecodedBytes() read in the line's CHARSET as UTF-8.
  std::string Text() const;
};

// The logical lines of `text`: folded lines joined, and vCard 2.1
// quoted-printable values joined across their soft line breaks. At most
// max_lines lines; blank lines are dropped.
std::vector<ContentLine> ReadContentLines(std::string_view text, size_t max_lines);

// A text value with its backslash escapes undone ("\n" is a line break).
std::string UnescapeText(std::string_view value);
// A structured value split at its unescaped separators, each part unescaped.
std::vector<std::string> SplitStructured(std::string_view value, char separator = ';');

// Fills `out` from the first card in `text`. Corruption when there is no
// "BEGIN:VCARD" line.
Status ImportVCard(std::string_view text, Message* out);

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_IMPORT_VCARD_IMPORT_H_
