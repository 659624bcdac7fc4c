// Blocks: the units a node's data lives in. A data block holds up to 8176
// bytes of (encoded) stream; an XBLOCK lists the data blocks of a longer
// stream and an XXBLOCK lists XBLOCKs. Every block ends in a trailer with its
// size, id and CRC and is padded to a multiple of 64 bytes.
//
// BlockStore is what these routines need from the file: find a block by id,
// read raw bytes, and (for writing) hand out ids and append a block.
#ifndef TARNWELL_MAPI_PST_BLOCK_IO_H_
#define TARNWELL_MAPI_PST_BLOCK_IO_H_

#include <cstdint>
#include <vector>

#include "base/byte_view.h"
#include "base/status.h"
#include "mapi/pst/pst_file.h"

namespace tarnwell::mapi::pst {

inline constexpr size_t kBlockTrailerSize = 16;
inline constexpr size_t kBlockAlignment = 64;
inline constexpr size_t kMaxBlockSize = 8192;  // data plus trailer, aligned
// Bit 1 of a block id marks internal blocks (data and subnode trees).
inline constexpr uint64_t kBidInternalFlag = 0x2;
// Bit 0 is reserved; lookups ignore it.
inline constexpr uint64_t kBidReservedBit = 0x1;
inline constexpr uint64_t kBidIncrement = 4;
// Ids an XBLOCK or XXBLOCK holds: (8176 - 8) / 8.
inline constexpr size_t kMaxXBlockEntries = 1021;

inline bool IsInternalBid(uint64_t bid) { return (bid & kBidInternalFlag) != 0; }
// The bytes a block with `cb` data bytes occupies in the file.
constexpr size_t BlockDiskSize(size_t cb) {
  return (cb + kBlockTrailerSize + kBlockAlignment - 1) / kBlockAlignment * kBlockAlignment;
}
// wSig of block and page trailers.
uint16_t ComputeSignature(uint64_t ib, uint64_t bid);

struct BlockRef {
  uint64_t ib = 0;
  uint16_t cb = 0;
};

class BlockStore {
 public:
  virtual ~BlockStore() = default;
  virtual CryptMethod crypt_method() const = 0;
  virtual uint64_t file_size() const = 0;
  // Where the block `bid` lies, or NotFound/Corruption.
  virtual Status FindBlock(uint64_t bid, BlockRef* out) const = 0;
  virtual Status ReadAt(uint64_t ib, size_t size, uint8_t* out) const = 0;

  // A fresh block id.
  virtual uint64_t NewBid(bool internal) = 0;
  // Places a block holding `data` (already encoded) after the end of the
  // file (EncodeBlock) and lists `bid` in the block index.
  virtual Status AppendBlock(uint64_t bid, ByteView data) = 0;
};

// Limits one read may consume, so that damaged trees that list the same
// blocks over and over cannot make a reader loop or allocate without end.
struct ReadBudget {
  uint64_t blocks = 0;
  uint64_t bytes = 0;
};

// Builds the on-disk form of a block: `data` (already encoded), padding and
// trailer. `data` must be at most kMaxBlockData bytes.
Bytes EncodeBlock(ByteView data, uint64_t bid, uint64_t ib);

// Reads block `bid` and checks its trailer (size, id, signature, CRC). The
// result is the stored bytes: data blocks are decoded, internal ones are not.
Status ReadBlock(const BlockStore& store, uint64_t bid, ReadBudget* budget, Bytes* out);

// Reads a whole data stream starting at `bid` (a data block, XBLOCK or
// XXBLOCK), one piece per data block. bid 0 is the empty stream.
Status ReadStream(const BlockStore& store, uint64_t bid, ReadBudget* budget,
                  std::vector<Bytes>* blocks);

// Writes `blocks` (each at most kMaxBlockData bytes) as a stream and returns
// the id that refers to it (0 for no data; empty pieces are dropped). Encodes data blocks with the
// store's method; adds XBLOCKs/XXBLOCK as needed.
Status WriteStream(BlockStore& store, const std::vector<Bytes>& blocks, uint64_t* bid);

// Every block id a stream refers to (itself included), for reference
// counting. Missing or damaged blocks end the walk with an error.
Status CollectStreamBids(const BlockStore& store, uint64_t bid, ReadBudget* budget,
                         std::vector<uint64_t>* bids);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_BLOCK_IO_H_
