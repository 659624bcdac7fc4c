// Subnode trees: the private nodes of a node (a message's recipient table,
// attachments, large properties). An SLBLOCK lists subnodes with their data
// and nested subnode tree; an SIBLOCK lists SLBLOCKs when one is not enough.
// The whole content of a node (stream plus subnodes) is read and written here.
#ifndef TARNWELL_MAPI_PST_SUBNODE_TREE_H_
#define TARNWELL_MAPI_PST_SUBNODE_TREE_H_

#include <cstdint>
#include <vector>

#include "base/status.h"
#include "mapi/pst/block_io.h"
#include "mapi/pst/node.h"

namespace tarnwell::mapi::pst {

// Entries per SLBLOCK ((8176 - 8) / 24) and per SIBLOCK ((8176 - 8) / 16).
inline constexpr size_t kMaxSlEntries = 340;
inline constexpr size_t kMaxSiEntries = 510;
// How deep subnodes may nest (embedded messages nest two levels each).
inline constexpr int kMaxSubnodeDepth = 64;

// Reads the stream at `bid_data` and the subnode tree at `bid_sub`.
Status ReadNodeContent(const BlockStore& store, uint64_t bid_data, uint64_t bid_sub,
                       ReadBudget* budget, NodeContent* out);
// Writes `content` and returns the ids that refer to it (0 where empty).
Status WriteNodeContent(BlockStore& store, const NodeContent& content, uint64_t* bid_data,
                        uint64_t* bid_sub);
// Every block id the content refers to, nested subnodes included; each
// reference is listed once per referrer.
Status CollectNodeBids(const BlockStore& store, uint64_t bid_data, uint64_t bid_sub,
                       ReadBudget* budget, std::vector<uint64_t>* bids);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_SUBNODE_TREE_H_
