// PropertyBag, Message: the message model of mapi/. A message is a bag of
// tagged properties, its recipients (each a bag) and its attachments (each a
// bag, possibly with an embedded message).
//
// Named properties (ids 0x8000 and up in a file) are kept by name, never by
// a file's number: the container that stores the bag maps names to numbers
// (PST: the name-to-id map) and back when it reads.
#ifndef TARNWELL_MAPI_PROPERTY_BAG_H_
#define TARNWELL_MAPI_PROPERTY_BAG_H_

#include <array>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "mapi/property_value.h"

namespace tarnwell::mapi {

using Guid = std::array<uint8_t, 16>;  // in its on-disk byte order

// A named property: a property set and either a numeric id (LID) or a name.
struct NamedProperty {
  Guid property_set{};
  bool is_string = false;
  uint32_t lid = 0;  // numeric kind
  std::string name;  // string kind, UTF-8

  auto operator<=>(const NamedProperty&) const = default;
};

class PropertyBag {
 public:
  // Tagged properties by id (below 0x8000); setting replaces any value of
  // the same id whatever its type.
  void Set(uint16_t id, PropertyValue value) { tagged_[id] = std::move(value); }
  void SetNamed(const NamedProperty& name, PropertyValue value) {
    named_[name] = std::move(value);
  }
  void Erase(uint16_t id) { tagged_.erase(id); }
  const PropertyValue* Find(uint16_t id) const;
  const PropertyValue* FindNamed(const NamedProperty& name) const;

  // Convenience readers; nullopt when absent or of another type.
  std::optional<std::string> String(uint16_t id) const;
  std::optional<int32_t> Int32(uint16_t id) const;

  const std::map<uint16_t, PropertyValue>& tagged() const { return tagged_; }
  const std::map<NamedProperty, PropertyValue>& named() const { return named_; }
  bool empty() const { return tagged_.empty() && named_.empty(); }

 private:
  std::map<uint16_t, PropertyValue> tagged_;
  std::map<NamedProperty, PropertyValue> named_;
};

struct Message;

struct Attachment {
  PropertyBag properties;  // PidTagAttachMethod, names, MIME tag, content id, ...
  Bytes data;              // PidTagAttachDataBinary (attach method 1)
  std::unique_ptr<Message> embedded;  // attach method 5
};

struct Message {
  PropertyBag properties;  // PidTagMessageClass, subject, bodies, ...
  std::vector<PropertyBag> recipients;  // PidTagRecipientType, display name, ...
  std::vector<Attachment> attachments;
};

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_PROPERTY_BAG_H_
