// The name-to-id map is a property context whose properties hold streams:
//
//   property            type    meaning
//   ------------------  ------  ---------------------------------------------
//   0x0001              Int32   number of hash buckets (251 in new files)
//   0x0002              Binary  GUID stream: 16-byte property set GUIDs
//   0x0003              Binary  entry stream: one NAMEID record per mapping
//   0x0004              Binary  string stream: names of string-named entries
//   0x1000 + n          Binary  hash bucket n: NAMEID records
//
// A NAMEID record is 8 bytes:
//
//   offset  width  meaning
//   ------  -----  ---------------------------------------------------------
//   0       4      LID (numeric names), or the name's byte offset in the
//                  string stream (string names; in a bucket: the name's CRC)
//   4       2      bit 0: 1 for a string name; bits 1-15: GUID index
//                  (1 = PS_MAPI, 2 = PS_PUBLIC_STRINGS, n >= 3 = GUID stream
//                  entry n - 3)
//   6       2      property index: the property id is 0x8000 + index
//
// A string stream entry is a 4-byte byte length and the UTF-16LE name,
// padded so the next entry starts on a 4-byte boundary. A record sits in
// bucket (key XOR (guid index << 1 | string bit)) mod bucket count, the key
// being the LID or the name's CRC.
#include "mapi/pst/name_map.h"

#include <array>

#include "base/text.h"
#include "mapi/property_tags.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr uint16_t kPidBucketCount = 0x0001;
constexpr uint16_t kPidStreamGuid = 0x0002;
constexpr uint16_t kPidStreamEntry = 0x0003;
constexpr uint16_t kPidStreamString = 0x0004;
constexpr uint16_t kPidBucketBase = 0x1000;
constexpr uint32_t kDefaultBucketCount = 251;
constexpr uint32_t kMaxBucketCount = 0x0FFF;  // bucket ids stay below 0x2000
constexpr size_t kGuidSize = 16;
constexpr size_t kRecordSize = 8;
constexpr uint16_t kGuidIndexNone = 0;
constexpr uint16_t kGuidIndexMapi = 1;
constexpr uint16_t kGuidIndexPublicStrings = 2;
constexpr uint16_t kFirstStreamGuidIndex = 3;
constexpr uint16_t kMaxIndex = 0x7FFE;  // ids end at 0xFFFE

// The CRC the file format uses elsewhere: reflected 0xEDB88320, started at
// zero, no final inversion.
uint32_t NameCrc(ByteView bytes) {
  static const std::array<uint32_t, 256> table = [] {
    std::array<uint32_t, 256> t{};
    for (uint32_t i = 0; i < 256; ++i) {
      uint32_t c = i;
      for (int k = 0; k < 8; ++k) c = (c & 1) ? (0xEDB88320u ^ (c >> 1)) : (c >> 1);
      t[i] = c;
    }
    return t;
  }();
  uint32_t crc = 0;
  for (size_t i = 0; i < bytes.size(); ++i) crc = table[(crc ^ bytes[i]) & 0xFF] ^ (crc >> 8);
  return crc;
}

void AppendRecord(uint32_t property_id, uint16_t guid_index, bool is_string, uint16_t index,
                  Bytes* out) {
  uint8_t record[kRecordSize];
  StoreU32LE(record, property_id);
  StoreU16LE(record + 4, uint16_t((guid_index << 1) | (is_string ? 1 : 0)));
  StoreU16LE(record + 6, index);
  out->insert(out->end(), record, record + kRecordSize);
}

const PropertyValue* FindValue(const std::vector<TaggedValue>& properties, uint16_t id) {
  for (const TaggedValue& p : properties) {
    if (TagId(p.tag) == id) return &p.value;
  }
  return nullptr;
}

}  // namespace

NameMap::NameMap() : bucket_count_(kDefaultBucketCount) {}

bool NameMap::IsMapProperty(uint16_t id) {
  return (id >= kPidBucketCount && id <= kPidStreamString) ||
         (id >= kPidBucketBase && id < kPidBucketBase + kMaxBucketCount);
}

Status NameMap::Decode(const std::vector<TaggedValue>& properties, NameMap* out) {
  *out = NameMap();
  std::string problems;
  if (const PropertyValue* v = FindValue(properties, kPidBucketCount)) {
    std::optional<int32_t> count = v->AsInt32();
    if (count && *count > 0 && uint32_t(*count) <= kMaxBucketCount) {
      out->bucket_count_ = uint32_t(*count);
    } else {
      problems += " bad bucket count;";
    }
  }
  if (const PropertyValue* v = FindValue(properties, kPidStreamGuid)) {
    if (v->data.size() % kGuidSize != 0) problems += " GUID stream of odd size;";
    for (size_t off = 0; off + kGuidSize <= v->data.size(); off += kGuidSize) {
      Guid g;
      std::copy(v->data.begin() + off, v->data.begin() + off + kGuidSize, g.begin());
      out->guids_.push_back(g);
    }
  }
  if (const PropertyValue* v = FindValue(properties, kPidStreamString)) out->strings_ = v->data;
  for (const TaggedValue& p : properties) {
    uint16_t id = TagId(p.tag);
    if (id >= kPidBucketBase && id < kPidBucketBase + kMaxBucketCount &&
        TagType(p.tag) == kTypeBinary) {
      out->buckets_[uint16_t(id - kPidBucketBase)] = p.value.data;
    }
  }
  const PropertyValue* entries = FindValue(properties, kPidStreamEntry);
  if (entries == nullptr) return problems.empty() ? Status::Ok() : Status::Corruption(problems);
  ByteView stream(entries->data);
  if (stream.size() % kRecordSize != 0) problems += " entry stream of odd size;";
  ByteView strings(out->strings_);
  for (size_t off = 0; off + kRecordSize <= stream.size(); off += kRecordSize) {
    Entry e;
    e.property_id = stream.U32LE(off);
    uint16_t bits = stream.U16LE(off + 4);
    e.is_string = (bits & 1) != 0;
    e.guid_index = uint16_t(bits >> 1);
    e.index = stream.U16LE(off + 6);
    // Keep the record even when it cannot be resolved: rewriting the map
    // must not lose what another program put there.
    out->entries_.push_back(e);
    NamedProperty name;
    if (e.guid_index == kGuidIndexMapi) {
      name.property_set = kPsMapi;
    } else if (e.guid_index == kGuidIndexPublicStrings) {
      name.property_set = kPsPublicStrings;
    } else if (e.guid_index >= kFirstStreamGuidIndex &&
               size_t(e.guid_index - kFirstStreamGuidIndex) < out->guids_.size()) {
      name.property_set = out->guids_[e.guid_index - kFirstStreamGuidIndex];
    } else if (e.guid_index != kGuidIndexNone) {
      problems += " entry with unknown GUID index;";
      continue;
    }
    name.is_string = e.is_string;
    if (e.is_string) {
      uint32_t length = 0;
      if (!strings.ReadU32LE(e.property_id, &length) ||
          !strings.Has(size_t(e.property_id) + 4, length)) {
        problems += " string name outside the string stream;";
        continue;
      }
      name.name = Utf16LEToUtf8(strings.Sub(size_t(e.property_id) + 4, length));
    } else {
      name.lid = e.property_id;
    }
    if (e.index > kMaxIndex || out->by_id_.count(uint16_t(kFirstNamedId + e.index))) {
      problems += " duplicate or out-of-range property index;";
      continue;
    }
    uint16_t id = uint16_t(kFirstNamedId + e.index);
    out->by_id_[id] = name;
    out->by_name_.emplace(name, id);  // the first mapping of a name wins
  }
  return problems.empty() ? Status::Ok() : Status::Corruption("name-to-id map:" + problems);
}

uint16_t NameMap::Find(const NamedProperty& name) const {
  auto it = by_name_.find(name);
  return it == by_name_.end() ? 0 : it->second;
}

const NamedProperty* NameMap::Lookup(uint16_t id) const {
  auto it = by_id_.find(id);
  return it == by_id_.end() ? nullptr : &it->second;
}

uint16_t NameMap::GuidIndexFor(const Guid& guid, bool add) {
  if (guid == kPsMapi) return kGuidIndexMapi;
  if (guid == kPsPublicStrings) return kGuidIndexPublicStrings;
  for (size_t i = 0; i < guids_.size(); ++i) {
    if (guids_[i] == guid) return uint16_t(kFirstStreamGuidIndex + i);
  }
  if (!add || guids_.size() + kFirstStreamGuidIndex > 0x7FFF) return 0xFFFF;
  guids_.push_back(guid);
  return uint16_t(kFirstStreamGuidIndex + guids_.size() - 1);
}

uint32_t NameMap::BucketOf(uint32_t hash_key, uint16_t guid_index, bool is_string) const {
  return (hash_key ^ ((uint32_t(guid_index) << 1) | (is_string ? 1u : 0u))) % bucket_count_;
}

void NameMap::AddToBucket(const Entry& entry, const NamedProperty& name) {
  uint32_t key = entry.property_id;
  if (entry.is_string) key = NameCrc(Utf8ToUtf16LE(name.name));
  uint32_t bucket = BucketOf(key, entry.guid_index, entry.is_string);
  AppendRecord(key, entry.guid_index, entry.is_string, entry.index, &buckets_[uint16_t(bucket)]);
}

uint16_t NameMap::FindOrAdd(const NamedProperty& name) {
  if (uint16_t id = Find(name)) return id;
  uint32_t next = 0;
  for (const Entry& e : entries_) next = std::max<uint32_t>(next, uint32_t(e.index) + 1);
  if (next > kMaxIndex) return 0;
  uint16_t guid_index = GuidIndexFor(name.property_set, true);
  if (guid_index == 0xFFFF) return 0;
  Entry e;
  e.guid_index = guid_index;
  e.is_string = name.is_string;
  e.index = uint16_t(next);
  if (name.is_string) {
    while (strings_.size() % 4 != 0) strings_.push_back(0);
    e.property_id = uint32_t(strings_.size());
    Bytes text = Utf8ToUtf16LE(name.name);
    uint8_t length[4];
    StoreU32LE(length, uint32_t(text.size()));
    strings_.insert(strings_.end(), length, length + 4);
    strings_.insert(strings_.end(), text.begin(), text.end());
    while (strings_.size() % 4 != 0) strings_.push_back(0);
  } else {
    e.property_id = name.lid;
  }
  entries_.push_back(e);
  AddToBucket(e, name);
  uint16_t id = uint16_t(kFirstNamedId + e.index);
  by_id_[id] = name;
  by_name_[name] = id;
  changed_ = true;
  return id;
}

std::vector<TaggedValue> NameMap::Encode() const {
  std::vector<TaggedValue> out;
  out.push_back(
      {MakeTag(kPidBucketCount, kTypeInt32), PropertyValue::Int32(int32_t(bucket_count_))});
  Bytes guids;
  for (const Guid& g : guids_) guids.insert(guids.end(), g.begin(), g.end());
  out.push_back({MakeTag(kPidStreamGuid, kTypeBinary), PropertyValue::Binary(std::move(guids))});
  Bytes entries;
  for (const Entry& e : entries_)
    AppendRecord(e.property_id, e.guid_index, e.is_string, e.index, &entries);
  out.push_back({MakeTag(kPidStreamEntry, kTypeBinary), PropertyValue::Binary(std::move(entries))});
  out.push_back({MakeTag(kPidStreamString, kTypeBinary), PropertyValue::Binary(strings_)});
  for (const auto& [bucket, records] : buckets_) {
    if (bucket >= bucket_count_) continue;
    out.push_back(
        {MakeTag(uint16_t(kPidBucketBase + bucket), kTypeBinary), PropertyValue::Binary(records)});
  }
  return out;
}

}  // namespace tarnwell::mapi::pst
