// NameMap: the name-to-id map of a PST file (node 0x61), which gives every
// named property used in the file a property id of 0x8000 and up.
//
// The map is read from the properties of its node and written back as
// properties; mappings read from a file are never renumbered or dropped, new
// names are appended after them.
#ifndef TARNWELL_MAPI_PST_NAME_MAP_H_
#define TARNWELL_MAPI_PST_NAME_MAP_H_

#include <cstdint>
#include <map>
#include <vector>

#include "base/status.h"
#include "mapi/property_bag.h"
#include "mapi/pst/property_context.h"

namespace tarnwell::mapi::pst {

inline constexpr uint16_t kFirstNamedId = 0x8000;

class NameMap {
 public:
  NameMap();

  // Reads the map from the properties of its node. Damaged entries are
  // skipped; the map keeps what could be read and the status says what was
  // wrong.
  static Status Decode(const std::vector<TaggedValue>& properties, NameMap* out);

  // The property id of `name`, or 0 when the map has none.
  uint16_t Find(const NamedProperty& name) const;
  // The property id of `name`, adding a mapping when there is none; 0 when
  // every id is taken.
  uint16_t FindOrAdd(const NamedProperty& name);
  // The name behind a property id, or nullptr.
  const NamedProperty* Lookup(uint16_t id) const;

  size_t size() const { return by_id_.size(); }
  bool changed() const { return changed_; }
  void MarkWritten() { changed_ = false; }

  // The properties of the map's node: bucket count, the GUID, entry and
  // string streams, and the hash buckets.
  std::vector<TaggedValue> Encode() const;

  // Whether a property id belongs to the map (the streams and buckets); the
  // store keeps any other property of the node as it found it.
  static bool IsMapProperty(uint16_t id);

 private:
  struct Entry {
    uint32_t property_id = 0;  // the LID, or the name's offset in the string stream
    uint16_t guid_index = 0;
    bool is_string = false;
    uint16_t index = 0;  // property id - 0x8000
  };

  uint16_t GuidIndexFor(const Guid& guid, bool add);
  uint32_t BucketOf(uint32_t hash_key, uint16_t guid_index, bool is_string) const;
  void AddToBucket(const Entry& entry, const NamedProperty& name);

  uint32_t bucket_count_;
  std::vector<Guid> guids_;  // the GUID stream
  std::vector<Entry> entries_;
  Bytes strings_;                      // the string stream
  std::map<uint16_t, Bytes> buckets_;  // by bucket number
  std::map<uint16_t, NamedProperty> by_id_;
  std::map<NamedProperty, uint16_t> by_name_;
  bool changed_ = false;
};

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_NAME_MAP_H_
