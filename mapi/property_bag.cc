#include "mapi/property_bag.h"

namespace tarnwell::mapi {

const PropertyValue* PropertyBag::Find(uint16_t id) const {
  auto it = tagged_.find(id);
  return it == tagged_.end() ? nullptr : &it->second;
}

const PropertyValue* PropertyBag::FindNamed(const NamedProperty& name) const {
  auto it = named_.find(name);
  return it == named_.end() ? nullptr : &it->second;
}

std::optional<std::string> PropertyBag::String(uint16_t id) const {
  const PropertyValue* v = Find(id);
  return v ? v->AsString() : std::nullopt;
}

std::optional<int32_t> PropertyBag::Int32(uint16_t id) const {
  const PropertyValue* v = Find(id);
  return v ? v->AsInt32() : std::nullopt;
}

}  // namespace tarnwell::mapi
