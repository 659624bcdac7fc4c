// Long values: column values too large for their record. The record holds a
// long-value id; the bytes lie in the table's long-value tree as a root node
// followed by chunk nodes, all in key order:
//
//   node   key                                   data
//   root   id (big-endian, 4 or 8 bytes)         u32 reference count,
//                                                u32 total length
//   chunk  id (big-endian) + u32 offset (BE)     the chunk's bytes
//
// The record stores the id little-endian: 4 bytes, or 8 in databases of
// newer file-format revisions. Chunk offsets count logical (uncompressed)
// bytes. Each chunk may be compressed on its own (large-page databases do
// it, and so do newer small-page ones); a chunk is compressed exactly when it
// stores fewer bytes than the logical bytes it covers (up to the next
// chunk's offset, or the total length).
//
// Chunks stay on disk: a LongValue is a list of file positions, read when
// the value is used, so large attachments never sit in memory during a scan.
#ifndef TARNWELL_ENGINE_LONG_VALUE_H_
#define TARNWELL_ENGINE_LONG_VALUE_H_

#include <cstdint>
#include <optional>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "engine/page_file.h"

namespace tarnwell::engine {

constexpr size_t kLongValueIdSize = 4;
constexpr size_t kLongValueId64Size = 8;
constexpr size_t kChunkOffsetSize = 4;
constexpr size_t kLongValueRootDataSize = 8;

struct LongValueChunk {
  int64_t file_position = 0;  // of the stored bytes
  uint32_t stored_size = 0;
  uint64_t logical_offset = 0;
  uint64_t logical_size = 0;
  bool compressed = false;
};

struct LongValue {
  uint64_t declared_size = 0;  // from the root node; 0 when unknown
  uint64_t total_size = 0;     // logical bytes assembled
  std::vector<LongValueChunk> chunks;
  bool truncated = false;  // a chunk was missing: the value ends early
};

class LongValueReader {
 public:
  // `chunks_may_be_compressed`: false only to read chunks as stored.
  LongValueReader(const PageFile& file, bool chunks_may_be_compressed)
      : file_(file), compressible_(chunks_may_be_compressed) {}

  // Assembles the chunk list of the long value whose id (as the record
  // stores it) is `id`, from the tree rooted at `root_page`. 0 assembled; -1
  // refused (an id of any other size) or not found.
  int Read(uint32_t root_page, ByteView id, LongValue* out) const;

  // Assembles and reads a whole value in one pass over its tree, for callers
  // that want the bytes now: the chunks are copied from the pages as they
  // are met instead of being read again. -1 refused or not found; 0 read
  // (`truncated` set when chunks were missing, `damaged` when a compressed
  // chunk could not be expanded). Values over `limit` bytes are refused.
  struct WholeValue {
    Bytes bytes;
    bool truncated = false;
    bool damaged = false;
  };
  int ReadValue(uint32_t root_page, ByteView id, WholeValue* out,
                uint64_t limit = uint64_t(1) << 31) const;

  // The logical bytes of chunk i, decompressed when compressed.
  Status ReadChunk(const LongValue& value, size_t index, Bytes* out) const;
  // The whole value; refuses values larger than `limit` bytes.
  Status ReadAll(const LongValue& value, Bytes* out, uint64_t limit = uint64_t(1) << 31) const;

 private:
  int Collect(uint32_t root_page, ByteView id, LongValue* out, std::vector<Bytes>* stored) const;

  const PageFile& file_;
  bool compressible_;
};

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_LONG_VALUE_H_
