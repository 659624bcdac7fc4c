// Long-value tree (pages flagged kPageFlagLongValue, one tree per table):
//
//   node   key                                  data
//   root   id, big-endian (4 or 8 bytes)        u32 reference count, u32 total
//                                               length (little-endian)
//   chunk  id big-endian + u32 offset BE        the chunk's stored bytes
//
// Offsets count logical bytes, so a compressed chunk stores fewer bytes than
// the distance to the next offset; that difference is the only sign of its
// compression. The root key is a prefix of its chunks' keys and sorts first.
#include "testing/forge_long_value.h"

#include <algorithm>
#include <string>

#include "testing/forge_record.h"
#include "testing/forge_value.h"

namespace tarnwell::forge {
namespace {

constexpr size_t kChunkOffsetSize = 4;
constexpr size_t kKeyLengthSize = 2;
constexpr uint32_t kMaxTotalLength = 0xFFFFFFFF;

void AppendBigEndian(Bytes* key, uint64_t value, size_t width) {
  for (size_t i = width; i-- > 0;) key->push_back(uint8_t(value >> (8 * i)));
}

}  // namespace

uint32_t DefaultLongValueChunkSize(const PageFormat& format, uint32_t id_size) {
  // Tag 0 and the node's tag, prefix and key lengths, the key itself.
  const size_t overhead = 2 * kTagSize + 2 * kKeyLengthSize + id_size + kChunkOffsetSize;
  const size_t chunk = format.value_space() - overhead;
  return uint32_t(chunk & ~size_t(1));  // even, so UTF-16 text never splits a character
}

Bytes LongValueRootKey(uint64_t id, uint32_t id_size) {
  Bytes key;
  AppendBigEndian(&key, id, id_size);
  return key;
}

Bytes LongValueChunkKey(uint64_t id, uint32_t id_size, uint32_t offset) {
  Bytes key = LongValueRootKey(id, id_size);
  AppendBigEndian(&key, offset, kChunkOffsetSize);
  return key;
}

Status AppendLongValueEntries(const LongValueLayout& value, uint32_t id_size, uint32_t chunk_size,
                              std::optional<uint32_t> dropped, std::vector<TreeEntry>* out,
                              LongValueCounts* counts) {
  const std::string what = "long value " + std::to_string(value.id);
  if (id_size != kLongValueIdSize && id_size != kLongValueId64Size) {
    return Status::InvalidArgument("long-value ids are 4 or 8 bytes");
  }
  if (value.id == 0 || (id_size == kLongValueIdSize && value.id > 0xFFFFFFFFull)) {
    return Status::InvalidArgument(what + ": id out of range");
  }
  if (chunk_size == 0) return Status::InvalidArgument(what + ": chunk size 0");
  if (value.data.size() > kMaxTotalLength) return Status::InvalidArgument(what + ": too long");

  TreeEntry root;
  root.key = LongValueRootKey(value.id, id_size);
  root.data = LittleEndian(value.reference_count, 4);
  const Bytes length = LittleEndian(value.data.size(), 4);
  root.data.insert(root.data.end(), length.begin(), length.end());
  out->push_back(std::move(root));

  uint32_t index = 0;
  for (size_t offset = 0; offset < value.data.size(); offset += chunk_size, ++index) {
    const size_t size = std::min<size_t>(chunk_size, value.data.size() - offset);
    if (dropped && *dropped == index) continue;
    const ByteView plain(value.data.data() + offset, size);
    TreeEntry chunk;
    chunk.key = LongValueChunkKey(value.id, id_size, uint32_t(offset));
    Bytes packed = CompressValue(plain, value.compression);
    if (!packed.empty() && packed.size() < size) {
      chunk.data = std::move(packed);
      if (counts) ++counts->compressed;
    } else {
      chunk.data = plain.ToBytes();
    }
    if (counts) ++counts->chunks;
    out->push_back(std::move(chunk));
  }
  return Status::Ok();
}

}  // namespace tarnwell::forge
