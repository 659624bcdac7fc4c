// Raw LZ4 blocks, the compression newer ESE revisions use for column values.
// The block format is liblz4's; this wrapper only keeps its int-sized
// interface away from our size_t buffers and insists on the declared size.
#ifndef TARNWELL_ENGINE_COMPRESS_LZ4_BLOCK_H_
#define TARNWELL_ENGINE_COMPRESS_LZ4_BLOCK_H_

#include <cstddef>

#include "base/byte_view.h"

namespace tarnwell::engine {

// Decompresses one raw LZ4 block that must expand to exactly `expected_size`
// bytes. False (and *out cleared) when the block is damaged, expands to a
// different size, or is too large for liblz4.
bool DecompressLz4Block(ByteView block, size_t expected_size, Bytes* out);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_COMPRESS_LZ4_BLOCK_H_
