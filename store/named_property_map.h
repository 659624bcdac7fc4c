// Named properties of a mailbox: the numbers 0x8000 and up that its items'
// property blobs use, and what each one means.
//
// Every mailbox numbers its named properties on its own, in the table
// "ExtendedPropertyNameMapping_<n>", one row per number:
//
//   column       type            meaning
//   PropNumber   long            the number blobs use (0x8000 ..)
//   PropGuid     binary / GUID   the property set, 16 bytes as Windows stores a GUID
//   PropDispId   long            the id inside the set (for sets named by id)
//   PropName     text            the name inside the set (for sets named by string)
//
// The item decoder knows named properties by the fixed numbers Tarnwell's
// other stores use ("T814e" for an appointment's start). A number of this
// table is read as that fixed number when it names a property the decoder
// knows by meaning; any other named property is left out, since its number
// could stand for anything.
#ifndef TARNWELL_STORE_NAMED_PROPERTY_MAP_H_
#define TARNWELL_STORE_NAMED_PROPERTY_MAP_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "base/byte_view.h"
#include "engine/edb_class.h"

namespace tarnwell::store {

inline constexpr uint16_t kFirstNamedPropertyId = 0x8000;
inline constexpr size_t kGuidSize = 16;

// The fixed number the decoder knows a well-known named property by, from
// its set and its id (or name); nullopt for any other property.
std::optional<uint16_t> WellKnownNamedProperty(ByteView guid, uint32_t dispid,
                                               const std::string& name);

class NamedPropertyMap {
 public:
  // Records what number `number` means in this mailbox. Numbers below
  // 0x8000 and GUIDs that are not 16 bytes are ignored.
  void Add(uint16_t number, ByteView guid, uint32_t dispid, const std::string& name);

  // Whether the mailbox has a mapping table at all.
  bool loaded() const { return loaded_; }
  void set_loaded() { loaded_ = true; }

  // The fixed number for blob id `number`: ids below 0x8000 are themselves;
  // a named number maps to its well-known property's fixed number; nullopt
  // for a named number whose meaning the decoder does not know.
  std::optional<uint16_t> Resolve(uint16_t number) const;

 private:
  bool loaded_ = false;
  std::map<uint16_t, uint16_t> fixed_;  // mailbox number -> fixed number
};

// Reads the mapping table `table_name`; an absent table leaves the map not
// loaded. Rows without a number or a GUID are skipped.
NamedPropertyMap LoadNamedPropertyMap(engine::EdbClass& reader, const std::string& table_name);

// "ExtendedPropertyNameMapping_" + the mailbox number in decimal.
std::string NamedPropertyTableName(uint64_t mailbox_number);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_NAMED_PROPERTY_MAP_H_
