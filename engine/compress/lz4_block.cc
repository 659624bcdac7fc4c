#include "engine/compress/lz4_block.h"

#include <lz4.h>

#include <utility>

namespace tarnwell::engine {

bool DecompressLz4Block(ByteView block, size_t expected_size, Bytes* out) {
  out->clear();
  if (block.empty() || block.size() > LZ4_MAX_INPUT_SIZE || expected_size > LZ4_MAX_INPUT_SIZE) {
    return false;
  }
  // One spare byte keeps the destination pointer valid for empty results.
  Bytes buffer(expected_size + 1);
  const int produced = LZ4_decompress_safe(
      reinterpret_cast<const char*>(block.data()), reinterpret_cast<char*>(buffer.data()),
      static_cast<int>(block.size()), static_cast<int>(expected_size));
  if (produced < 0 || static_cast<size_t>(produced) != expected_size) return false;
  buffer.resize(expected_size);
  *out = std::move(buffer);
  return true;
}

}  // namespace tarnwell::engine
