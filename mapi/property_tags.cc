#include "mapi/property_tags.h"

namespace tarnwell::mapi {
namespace {

// A property set of the form xxxxxxxx-0000-0000-C000-000000000046, in its
// on-disk (little-endian first three fields) byte order.
constexpr Guid OleGuid(uint32_t first) {
  return Guid{uint8_t(first), uint8_t(first >> 8), uint8_t(first >> 16), uint8_t(first >> 24),
              0, 0, 0, 0, 0xC0, 0, 0, 0, 0, 0, 0, 0x46};
}

}  // namespace

const Guid kPsetidCommon = OleGuid(0x00062008);
const Guid kPsetidAddress = OleGuid(0x00062004);
const Guid kPsetidAppointment = OleGuid(0x00062002);
const Guid kPsetidTask = OleGuid(0x00062003);
const Guid kPsetidLog = OleGuid(0x0006200A);
const Guid kPsetidNote = OleGuid(0x0006200E);
const Guid kPsPublicStrings = OleGuid(0x00020329);
const Guid kPsInternetHeaders = OleGuid(0x00020386);
const Guid kPsMapi = OleGuid(0x00020328);

NamedProperty NamedId(const Guid& set, uint32_t lid) {
  NamedProperty p;
  p.property_set = set;
  p.lid = lid;
  return p;
}

NamedProperty NamedString(const Guid& set, const std::string& name) {
  NamedProperty p;
  p.property_set = set;
  p.is_string = true;
  p.name = name;
  return p;
}

}  // namespace tarnwell::mapi
