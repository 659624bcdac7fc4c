#include "store/named_property_map.h"

#include <cstring>

#include "base/text.h"
#include "store/row_values.h"

namespace tarnwell::store {
namespace {

// Property sets, 16 bytes as a GUID is stored: Data1..Data3 little-endian.
constexpr uint8_t kAppointmentSet[kGuidSize] = {0x02, 0x20, 0x06, 0x00, 0x00, 0x00, 0x00, 0x00,
                                                0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};
constexpr uint8_t kTaskSet[kGuidSize] = {0x03, 0x20, 0x06, 0x00, 0x00, 0x00, 0x00, 0x00,
                                         0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};
constexpr uint8_t kAddressSet[kGuidSize] = {0x04, 0x20, 0x06, 0x00, 0x00, 0x00, 0x00, 0x00,
                                            0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};
constexpr uint8_t kPublicStringsSet[kGuidSize] = {0x29, 0x03, 0x02, 0x00, 0x00, 0x00, 0x00, 0x00,
                                                  0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};

struct ById {
  const uint8_t* set;
  uint32_t dispid;
  uint16_t fixed;  // the number the decoder's rules use
};

// The published ids of the properties items are filled from, and the fixed
// numbers the decoder knows them by. Properties with no fixed number of
// their own keep their published id, which no other property of these sets
// uses.
constexpr ById kById[] = {
    // Appointments: start, end, location, busy status, recurrence.
    {kAppointmentSet, 0x820D, 0x814E},
    {kAppointmentSet, 0x820E, 0x8198},
    {kAppointmentSet, 0x8208, 0x810C},
    {kAppointmentSet, 0x8205, 0x805C},
    {kAppointmentSet, 0x8216, 0x8216},
    {kAppointmentSet, 0x8223, 0x8223},
    {kAppointmentSet, 0x8232, 0x8232},
    // Tasks: start, due, status, percent complete, complete, owner.
    {kTaskSet, 0x8104, 0x8078},
    {kTaskSet, 0x8105, 0x8079},
    {kTaskSet, 0x8101, 0x8138},
    {kTaskSet, 0x8102, 0x8121},
    {kTaskSet, 0x811C, 0x8124},
    {kTaskSet, 0x811F, 0x814A},
    // Contacts: file-as, address texts and parts, home page, IM address,
    // free/busy address, the three e-mail addresses with their display
    // names, address types and original display names.
    {kAddressSet, 0x8005, 0x8005},
    {kAddressSet, 0x801A, 0x801A},
    {kAddressSet, 0x801B, 0x801B},
    {kAddressSet, 0x801C, 0x801C},
    {kAddressSet, 0x802B, 0x802B},
    {kAddressSet, 0x8045, 0x8045},
    {kAddressSet, 0x8046, 0x8046},
    {kAddressSet, 0x8047, 0x8047},
    {kAddressSet, 0x8048, 0x8048},
    {kAddressSet, 0x8049, 0x8049},
    {kAddressSet, 0x804A, 0x804A},
    {kAddressSet, 0x8062, 0x8062},
    {kAddressSet, 0x80D8, 0x80D8},
    {kAddressSet, 0x8080, 0x8080},
    {kAddressSet, 0x8082, 0x8082},
    {kAddressSet, 0x8083, 0x8083},
    {kAddressSet, 0x8084, 0x8084},
    {kAddressSet, 0x8090, 0x8090},
    {kAddressSet, 0x8092, 0x8092},
    {kAddressSet, 0x8093, 0x8093},
    {kAddressSet, 0x8094, 0x8094},
    {kAddressSet, 0x80A0, 0x80A0},
    {kAddressSet, 0x80A2, 0x80A2},
    {kAddressSet, 0x80A3, 0x80A3},
    {kAddressSet, 0x80A4, 0x80A4},
    // Distribution lists: members as one-off entry ids, and as entry ids.
    {kAddressSet, 0x8054, 0x81A9},
    {kAddressSet, 0x8055, 0x8055},
};

struct ByName {
  const uint8_t* set;
  const char* name;
  uint16_t fixed;
};

constexpr ByName kByName[] = {
    {kPublicStringsSet, "Keywords", 0x8002},  // categories
};

constexpr const char kMappingTablePrefix[] = "ExtendedPropertyNameMapping_";

bool SameSet(ByteView guid, const uint8_t* set) {
  return guid.size() == kGuidSize && std::memcmp(guid.data(), set, kGuidSize) == 0;
}

}  // namespace

std::optional<uint16_t> WellKnownNamedProperty(ByteView guid, uint32_t dispid,
                                               const std::string& name) {
  if (name.empty()) {
    for (const ById& p : kById) {
      if (p.dispid == dispid && SameSet(guid, p.set)) return p.fixed;
    }
    return std::nullopt;
  }
  for (const ByName& p : kByName) {
    if (name == p.name && SameSet(guid, p.set)) return p.fixed;
  }
  return std::nullopt;
}

void NamedPropertyMap::Add(uint16_t number, ByteView guid, uint32_t dispid,
                           const std::string& name) {
  if (number < kFirstNamedPropertyId || guid.size() != kGuidSize) return;
  std::optional<uint16_t> fixed = WellKnownNamedProperty(guid, dispid, name);
  if (fixed) {
    fixed_[number] = *fixed;
  } else {
    fixed_.erase(number);
  }
}

std::optional<uint16_t> NamedPropertyMap::Resolve(uint16_t number) const {
  if (number < kFirstNamedPropertyId) return number;
  auto it = fixed_.find(number);
  if (it == fixed_.end()) return std::nullopt;
  return it->second;
}

std::string NamedPropertyTableName(uint64_t mailbox_number) {
  return kMappingTablePrefix + std::to_string(static_cast<unsigned long long>(mailbox_number));
}

NamedPropertyMap LoadNamedPropertyMap(engine::EdbClass& reader, const std::string& table_name) {
  NamedPropertyMap map;
  const engine::TableDef* table = reader.FindTable(table_name);
  if (!table) return map;
  map.set_loaded();
  const engine::LongValueReader lv = reader.long_values();
  RowValueReader values(lv, *table);
  const int number_slot = ColumnSlot(*table, "PropNumber");
  const int guid_slot = ColumnSlot(*table, "PropGuid");
  const int dispid_slot = ColumnSlot(*table, "PropDispId");
  const int name_slot = ColumnSlot(*table, "PropName");
  auto integer = [](const RowValue& v) {
    uint64_t n = 0;
    for (size_t i = v.bytes.size(); i-- > 0;) n = (n << 8) | v.bytes[i];
    return n;
  };
  reader.ForEachRecord(*table, [&](const engine::RecordRef&, engine::RecordColumns& columns) {
    RowValue number, guid, dispid, name;
    if (number_slot < 0 || guid_slot < 0 ||
        !values.ReadOne(columns, size_t(number_slot), &number) ||
        !values.ReadOne(columns, size_t(guid_slot), &guid) || number.bytes.empty()) {
      return true;
    }
    std::string name_text;
    if (name_slot >= 0 && values.ReadOne(columns, size_t(name_slot), &name)) {
      name_text = name.code_page == kCodePageUtf16LE ? Utf16LEToUtf8(name.bytes)
                                                     : CodePageToUtf8(name.bytes, name.code_page);
      while (!name_text.empty() && name_text.back() == '\0') name_text.pop_back();
    }
    uint64_t id = 0;
    if (dispid_slot >= 0 && values.ReadOne(columns, size_t(dispid_slot), &dispid)) {
      id = integer(dispid);
    }
    const uint64_t n = integer(number);
    if (n <= 0xFFFF) map.Add(uint16_t(n), guid.bytes, uint32_t(id), name_text);
    return true;
  });
  return map;
}

}  // namespace tarnwell::store
