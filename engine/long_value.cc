#include "engine/long_value.h"

#include <algorithm>

#include "engine/compress/compressed_value.h"
#include "engine/compress/seven_bit.h"
#include "engine/tree_cursor.h"

namespace tarnwell::engine {

namespace {

constexpr size_t kCompressedSizeOffset = 1;

// The decoded size a compressed chunk announces; nothing when the bytes do
// not start like a compressed value this program can size.
std::optional<uint64_t> DeclaredSize(ByteView chunk) {
  switch (SchemeOf(chunk)) {
    case CompressionScheme::kXpress:
    case CompressionScheme::kLz4: {
      uint16_t size = 0;
      if (!chunk.ReadU16LE(kCompressedSizeOffset, &size)) return std::nullopt;
      return size;
    }
    case CompressionScheme::kSevenBitAscii:
      return SevenBitCharacterCount(chunk);
    case CompressionScheme::kSevenBitUnicode:
      return 2 * uint64_t(SevenBitCharacterCount(chunk));
    default:
      return std::nullopt;
  }
}

}  // namespace

int LongValueReader::Collect(uint32_t root_page, ByteView id, LongValue* out,
                             std::vector<Bytes>* stored) const {
  if (id.size() != kLongValueIdSize && id.size() != kLongValueId64Size) return -1;
  *out = LongValue();
  Bytes key(id.data(), id.data() + id.size());
  std::reverse(key.begin(), key.end());  // stored little-endian, keyed big-endian

  TreeCursor cursor(file_);
  if (!cursor.Seek(root_page, ByteView(key))) return -1;
  if (CompareKeys(cursor.key(), ByteView(key)) != 0) return -1;
  ByteView root = cursor.data();
  if (root.size() >= kLongValueRootDataSize) out->declared_size = root.U32LE(4);

  struct Found {
    uint64_t offset;
    int64_t position;
    uint32_t size;
    std::optional<uint64_t> declared;  // decoded size, if it reads as compressed
  };
  std::vector<Found> found;
  std::vector<Bytes> bytes;
  while (cursor.Next()) {
    ByteView k = cursor.key();
    if (k.size() != key.size() + kChunkOffsetSize ||
        CompareKeys(k.Sub(0, key.size()), ByteView(key)) != 0) {
      break;
    }
    found.push_back({LoadU32BE(k.data() + key.size()), cursor.data_position(),
                     uint32_t(cursor.data().size()),
                     compressible_ ? DeclaredSize(cursor.data()) : std::nullopt});
    if (stored) bytes.push_back(cursor.data().ToBytes());
  }

  for (size_t i = 0; i < found.size(); ++i) {
    const Found& f = found[i];
    if (f.offset != out->total_size) {
      if (f.offset < out->total_size) continue;  // overlaps what we have
      out->truncated = true;                     // a chunk is missing
      break;
    }
    // The logical bytes this chunk should cover: up to the next chunk, or
    // to the declared total for the last one.
    const uint64_t end = i + 1 < found.size() ? found[i + 1].offset : out->declared_size;
    const uint64_t span = end > f.offset ? end - f.offset : 0;
    uint64_t logical = f.size;
    // Stored shorter than its span: compressed, when the bytes say so and
    // their decoded size fits the span. A decoded size short of the span
    // means the next chunk is missing.
    if (span > f.size && f.declared && *f.declared > f.size && *f.declared <= span) {
      logical = *f.declared;
    }
    LongValueChunk chunk;
    chunk.file_position = f.position;
    chunk.stored_size = f.size;
    chunk.logical_offset = out->total_size;
    chunk.logical_size = logical;
    chunk.compressed = logical != f.size;
    out->chunks.push_back(chunk);
    if (stored) stored->push_back(std::move(bytes[i]));
    out->total_size += logical;
    if (i + 1 < found.size() && out->total_size < found[i + 1].offset) {
      out->truncated = true;  // the chunk after this one is missing
      break;
    }
  }
  if (out->declared_size && out->total_size < out->declared_size) out->truncated = true;
  return 0;
}

int LongValueReader::Read(uint32_t root_page, ByteView id, LongValue* out) const {
  return Collect(root_page, id, out, nullptr);
}

int LongValueReader::ReadValue(uint32_t root_page, ByteView id, WholeValue* out,
                               uint64_t limit) const {
  *out = WholeValue();
  LongValue lv;
  std::vector<Bytes> stored;
  if (Collect(root_page, id, &lv, &stored) != 0) return -1;
  if (lv.total_size > limit) return -1;
  out->truncated = lv.truncated;
  out->bytes.reserve(lv.total_size);
  for (size_t i = 0; i < lv.chunks.size(); ++i) {
    const LongValueChunk& c = lv.chunks[i];
    if (!c.compressed) {
      out->bytes.insert(out->bytes.end(), stored[i].begin(), stored[i].end());
      continue;
    }
    DecodedValue d = DecodeCompressedValue(ByteView(stored[i]));
    if (!d.ok()) out->damaged = true;
    d.bytes.resize(c.logical_size, 0);  // later chunks stay at their offsets
    out->bytes.insert(out->bytes.end(), d.bytes.begin(), d.bytes.end());
  }
  return 0;
}

Status LongValueReader::ReadChunk(const LongValue& value, size_t index, Bytes* out) const {
  if (index >= value.chunks.size()) return Status::InvalidArgument("no such chunk");
  const LongValueChunk& c = value.chunks[index];
  Bytes stored(c.stored_size);
  if (file_.ReadAt(c.file_position, stored.data(), stored.size()) != stored.size()) {
    return Status::IoError("long-value chunk past the end of the file");
  }
  if (!c.compressed) {
    *out = std::move(stored);
    return Status::Ok();
  }
  DecodedValue d = DecodeCompressedValue(ByteView(stored));
  if (!d.ok()) {
    // Keep the length promised so that later chunks stay at their offsets.
    out->assign(c.logical_size, 0);
    return Status::Corruption(std::string("compressed long-value chunk: ") + d.message);
  }
  *out = std::move(d.bytes);
  out->resize(c.logical_size, 0);
  return Status::Ok();
}

Status LongValueReader::ReadAll(const LongValue& value, Bytes* out, uint64_t limit) const {
  out->clear();
  if (value.total_size > limit) return Status::NotSupported("long value too large to hold");
  out->reserve(value.total_size);
  Status first_error;
  for (size_t i = 0; i < value.chunks.size(); ++i) {
    Bytes chunk;
    Status s = ReadChunk(value, i, &chunk);
    if (!s.ok() && first_error.ok()) first_error = s;
    out->insert(out->end(), chunk.begin(), chunk.end());
  }
  return first_error;
}

}  // namespace tarnwell::engine
