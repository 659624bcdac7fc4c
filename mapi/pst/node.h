// Node ids and node contents: what the NDB layer of a PST file stores and
// what the layers above it (heaps, property and table contexts, messaging)
// build and read.
//
// A node id (NID) is 32 bits: the low 5 bits are the node's type, the high
// 27 bits its index. A node has a data stream and may have subnodes, each
// with a data stream and subnodes of its own; subnode ids need only be
// unique among the subnodes of one node.
#ifndef TARNWELL_MAPI_PST_NODE_H_
#define TARNWELL_MAPI_PST_NODE_H_

#include <cstdint>
#include <map>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::mapi::pst {

using Nid = uint32_t;

enum NidType : uint8_t {
  kNidTypeHid = 0x00,
  kNidTypeInternal = 0x01,
  kNidTypeNormalFolder = 0x02,
  kNidTypeSearchFolder = 0x03,
  kNidTypeNormalMessage = 0x04,
  kNidTypeAttachment = 0x05,
  kNidTypeSearchUpdateQueue = 0x06,
  kNidTypeSearchCriteriaObject = 0x07,
  kNidTypeAssocMessage = 0x08,
  kNidTypeContentsTableIndex = 0x0A,
  kNidTypeReceiveFolderTable = 0x0B,
  kNidTypeOutgoingQueueTable = 0x0C,
  kNidTypeHierarchyTable = 0x0D,
  kNidTypeContentsTable = 0x0E,
  kNidTypeAssocContentsTable = 0x0F,
  kNidTypeSearchContentsTable = 0x10,
  kNidTypeAttachmentTable = 0x11,
  kNidTypeRecipientTable = 0x12,
  kNidTypeSearchTableIndex = 0x13,
  kNidTypeLtp = 0x1F,
};

inline constexpr uint32_t kNidTypeBits = 5;
constexpr Nid MakeNid(uint8_t type, uint32_t index) { return (index << kNidTypeBits) | type; }
constexpr uint8_t NidTypeOf(Nid nid) { return uint8_t(nid & 0x1F); }
constexpr uint32_t NidIndexOf(Nid nid) { return nid >> kNidTypeBits; }

// The most data one data block carries (8 KiB less its 16-byte trailer).
inline constexpr size_t kMaxBlockData = 8176;

// A node's content. `blocks` is the data stream cut into blocks of at most
// kMaxBlockData bytes: a heap-on-node puts one heap page in each block, a
// plain stream is cut anywhere. An empty stream has no blocks.
struct NodeContent {
  std::vector<Bytes> blocks;
  std::map<Nid, NodeContent> subnodes;

  // The stream as one piece.
  Bytes Joined() const;
  // A plain stream cut into kMaxBlockData pieces.
  static std::vector<Bytes> Split(ByteView stream);
};

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_NODE_H_
