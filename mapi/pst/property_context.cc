// Property context layout: a heap (client signature 0xBC) whose user root
// is a BTH of 2-byte keys and 6-byte records:
//
//   key   0  2  wPropId      property id
//   data  0  2  wPropType    property type
//         2  4  dwValueHnid  the value itself when it is at most 4 bytes wide
//                            (Int16, Int32, Float, Error, Boolean), else an
//                            HNID: 0 for an empty value, a heap id, or the id
//                            of a subnode when larger than a heap allocation
//
// Behind an HNID (see EncodeStoredValue):
//   fixed-size, 8-byte and GUID values   the value
//   strings, binaries                    the bytes (Unicode: UTF-16LE, no terminator)
//   object                               4-byte subnode id, 4-byte size
//   multi-valued fixed-size              the elements back to back
//   multi-valued variable-size:
//     0        4        ulCount          number of elements
//     4        4*count  rgulDataOffsets  offset of each element from the start
//     ...               the elements, back to back
#include "mapi/pst/property_context.h"

#include <algorithm>
#include <string>

#include "mapi/pst/bth.h"
#include "mapi/pst/heap_on_node.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr uint8_t kPcKeySize = 2;
constexpr uint8_t kPcDataSize = 6;
constexpr size_t kPcRecordType = 2;  // offsets within key + data
constexpr size_t kPcRecordValue = 4;
constexpr size_t kInlineLimit = 4;
constexpr size_t kCountSize = 4;
constexpr size_t kOffsetSize = 4;

std::string TagName(PropTag tag) {
  static const char kHex[] = "0123456789abcdef";
  std::string s = "0x";
  for (int shift = 28; shift >= 0; shift -= 4) s += kHex[(tag >> shift) & 0xF];
  return s;
}

bool IsInline(uint16_t type) {
  const size_t width = FixedWidth(type);
  return !IsMultiValued(type) && width > 0 && width <= kInlineLimit;
}

bool IsEmptyType(uint16_t type) { return type == kTypeNull || type == kTypeUnspecified; }

}  // namespace

Status EncodeStoredValue(const PropertyValue& value, Bytes* out) {
  out->clear();
  const size_t width = FixedWidth(value.type);
  if (!IsMultiValued(value.type)) {
    if (width > 0 && value.data.size() != width) {
      return Status::InvalidArgument("value of type " + std::to_string(value.type) + " has " +
                                     std::to_string(value.data.size()) + " bytes");
    }
    *out = value.data;
    return Status::Ok();
  }
  if (width > 0) {
    for (const Bytes& e : value.elements) {
      if (e.size() != width) return Status::InvalidArgument("multi-valued element of wrong size");
      out->insert(out->end(), e.begin(), e.end());
    }
    return Status::Ok();
  }
  const size_t count = value.elements.size();
  out->resize(kCountSize + kOffsetSize * count);
  StoreU32LE(out->data(), uint32_t(count));
  for (size_t i = 0; i < count; ++i) {
    StoreU32LE(out->data() + kCountSize + kOffsetSize * i, uint32_t(out->size()));
    out->insert(out->end(), value.elements[i].begin(), value.elements[i].end());
  }
  return Status::Ok();
}

Status DecodeStoredValue(uint16_t type, ByteView bytes, PropertyValue* out) {
  *out = PropertyValue();
  out->type = type;
  const size_t width = FixedWidth(type);
  if (!IsMultiValued(type)) {
    if (width > 0 && bytes.size() != width) {
      return Status::Corruption("value of type " + std::to_string(type) + " has " +
                                std::to_string(bytes.size()) + " bytes");
    }
    out->data = bytes.ToBytes();
    return Status::Ok();
  }
  if (width > 0) {
    if (bytes.size() % width != 0) return Status::Corruption("multi-valued value is cut short");
    for (size_t at = 0; at < bytes.size(); at += width) {
      out->elements.push_back(bytes.Sub(at, width).ToBytes());
    }
    return Status::Ok();
  }
  if (bytes.empty()) return Status::Ok();
  uint32_t count = 0;
  if (!bytes.ReadU32LE(0, &count) || count > (bytes.size() - kCountSize) / kOffsetSize) {
    return Status::Corruption("multi-valued value has a bad count");
  }
  const size_t data_start = kCountSize + kOffsetSize * size_t(count);
  for (size_t i = 0; i < count; ++i) {
    const size_t begin = bytes.U32LE(kCountSize + kOffsetSize * i);
    const size_t end =
        i + 1 < count ? bytes.U32LE(kCountSize + kOffsetSize * (i + 1)) : bytes.size();
    if (begin < data_start || begin > end || end > bytes.size()) {
      out->elements.clear();
      return Status::Corruption("multi-valued value has a bad offset");
    }
    out->elements.push_back(bytes.Sub(begin, end - begin).ToBytes());
  }
  return Status::Ok();
}

Status EncodePropertyContext(const std::vector<TaggedValue>& properties, NodeContent* node) {
  std::vector<const TaggedValue*> sorted;
  for (const TaggedValue& p : properties) sorted.push_back(&p);
  std::sort(sorted.begin(), sorted.end(), [](const TaggedValue* a, const TaggedValue* b) {
    return TagId(a->tag) < TagId(b->tag);
  });
  for (size_t i = 0; i < sorted.size(); ++i) {
    if (i > 0 && TagId(sorted[i - 1]->tag) == TagId(sorted[i]->tag)) {
      return Status::InvalidArgument("property " + TagName(sorted[i]->tag) + " given twice");
    }
    if (sorted[i]->value.type != TagType(sorted[i]->tag)) {
      return Status::InvalidArgument("property " + TagName(sorted[i]->tag) +
                                     " has a value of another type");
    }
  }

  HeapBuilder heap(kHeapClientProperties);
  BthWriter bth(&heap, kPcKeySize, kPcDataSize);
  Status s = bth.Reserve(sorted.size());
  if (!s.ok()) return s;
  heap.set_user_root(bth.header());
  HnidWriter hnids(&heap, node);
  std::vector<Bytes> records;
  for (const TaggedValue* p : sorted) {
    const uint16_t type = TagType(p->tag);
    uint32_t value = 0;
    if (IsInline(type)) {
      const size_t width = FixedWidth(type);
      if (p->value.data.size() != width) {
        return Status::InvalidArgument("property " + TagName(p->tag) + " has a bad width");
      }
      for (size_t i = 0; i < width; ++i) value |= uint32_t(p->value.data[i]) << (8 * i);
    } else if (!IsEmptyType(type)) {
      Bytes stored;
      s = EncodeStoredValue(p->value, &stored);
      if (s.ok()) s = hnids.Store(stored, &value);
      if (!s.ok()) return s;
    }
    Bytes record(kPcKeySize + kPcDataSize);
    StoreU16LE(record.data(), TagId(p->tag));
    StoreU16LE(record.data() + kPcRecordType, type);
    StoreU32LE(record.data() + kPcRecordValue, value);
    records.push_back(std::move(record));
  }
  s = bth.Write(std::move(records));
  if (!s.ok()) return s;
  node->blocks = heap.Finish();
  return Status::Ok();
}

Status DecodePropertyContext(const NodeContent& node, std::vector<TaggedValue>* out) {
  out->clear();
  HeapReader heap;
  Status s = heap.Open(node.blocks);
  if (!s.ok()) return s;
  if (heap.client_signature() != kHeapClientProperties) {
    return Status::Corruption("node is not a property context");
  }
  uint8_t key_size = 0, data_size = 0;
  std::vector<Bytes> records;
  Status result = ReadBth(heap, heap.user_root(), &key_size, &data_size, &records);
  if (key_size != kPcKeySize || data_size != kPcDataSize) {
    return result.ok() ? Status::Corruption("property context BTH has the wrong record size")
                       : result;
  }
  for (const Bytes& record : records) {
    ByteView r(record);
    const uint16_t id = r.U16LE(0);
    const uint16_t type = r.U16LE(kPcRecordType);
    const uint32_t value = r.U32LE(kPcRecordValue);
    TaggedValue tv;
    tv.tag = MakeTag(id, type);
    tv.value.type = type;
    if (IsInline(type)) {
      const size_t width = FixedWidth(type);
      for (size_t i = 0; i < width; ++i) tv.value.data.push_back(uint8_t(value >> (8 * i)));
      if (type == kTypeBoolean) tv.value.data[0] = (value & 0xFF) != 0 ? 1 : 0;
    } else if (!IsEmptyType(type)) {
      Bytes stored;
      s = ReadHnid(heap, node, value, &stored);
      if (s.ok()) s = DecodeStoredValue(type, stored, &tv.value);
      if (!s.ok()) {
        if (result.ok()) {
          result = Status::Corruption("property " + TagName(tv.tag) + ": " + s.message());
        }
        continue;
      }
    }
    out->push_back(std::move(tv));
  }
  return result;
}

}  // namespace tarnwell::mapi::pst
