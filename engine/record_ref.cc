#include "engine/record_ref.h"

namespace tarnwell::engine {

constexpr size_t kLengthFieldSize = 2;
constexpr size_t kChildPageSize = 4;

char LeafKind(uint32_t page_flags) {
  if (page_flags & kPageFlagIndex) return kKindIndex;
  if (page_flags & kPageFlagLongValue) return kKindLongValue;
  return kKindRecord;
}

NodeDecode DecodeNode(const Page& page, uint16_t tag, RecordRef* ref, bool want_key) {
  const auto& nodes = page.nodes();
  if (tag >= nodes.size()) return NodeDecode::kDamaged;
  const NodeEntry& node = nodes[tag];
  if (node.damaged) return NodeDecode::kDamaged;
  if (node.flags & kNodeFlagDeleted) return NodeDecode::kDeleted;

  ByteView bytes = node.bytes;
  size_t cursor = 0;
  uint16_t prefix_length = 0;
  if (node.flags & kNodeFlagPrefix) {
    if (page.is_root()) return NodeDecode::kRootPrefix;
    if (!bytes.ReadU16LE(0, &prefix_length)) return NodeDecode::kDamaged;
    if (nodes.empty() || nodes[0].damaged || prefix_length > nodes[0].size) {
      return NodeDecode::kPrefixTooLong;
    }
    cursor += kLengthFieldSize;
  }
  uint16_t suffix_length = 0;
  if (!bytes.ReadU16LE(cursor, &suffix_length)) return NodeDecode::kDamaged;
  cursor += kLengthFieldSize;
  if (!bytes.Has(cursor, suffix_length)) return NodeDecode::kDamaged;

  ref->tag_index = tag;
  ref->key_length = uint64_t(prefix_length) + suffix_length;
  ref->key.clear();
  if (want_key) {
    ref->key.reserve(ref->key_length);
    const uint8_t* prefix = nodes[0].bytes.data();
    ref->key.insert(ref->key.end(), prefix, prefix + prefix_length);
    const uint8_t* suffix = bytes.data() + cursor;
    ref->key.insert(ref->key.end(), suffix, suffix + suffix_length);
  }
  cursor += suffix_length;
  ref->data_offset = uint16_t(cursor);
  ref->data_size = uint16_t(node.size - cursor);
  return NodeDecode::kOk;
}

uint32_t BranchChild(const Page& page, const RecordRef& ref) {
  ByteView data = NodeData(page, ref);
  return data.size() >= kChildPageSize ? LoadU32LE(data.data()) : 0;
}

ByteView NodeData(const Page& page, const RecordRef& ref) {
  const auto& nodes = page.nodes();
  if (ref.tag_index >= nodes.size()) return ByteView();
  return nodes[ref.tag_index].bytes.From(ref.data_offset);
}

}  // namespace tarnwell::engine
