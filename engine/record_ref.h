// Node keys and record references.
//
// A node's bytes are, in order:
//
//   width  present when              meaning
//   2      node flag kNodeFlagPrefix  u16 length L of the key prefix shared
//                                     with the page's external header (tag 0)
//   2      always                     u16 length S of the key suffix
//   S      always                     key suffix
//   ...    always                     the data part
//
// The full key is the first L bytes of tag 0 followed by the suffix. On a
// branch page the data part begins with the u32 child page number.
//
// A RecordRef remembers where a node lies so it can be read again later
// without walking the tree.
#ifndef TARNWELL_ENGINE_RECORD_REF_H_
#define TARNWELL_ENGINE_RECORD_REF_H_

#include <cstdint>

#include "base/byte_view.h"
#include "engine/page.h"

namespace tarnwell::engine {

enum RecordKind : char {
  kKindNone = 0,
  kKindRecord = 'r',     // leaf of a data tree
  kKindLongValue = 'l',  // leaf of a long-value tree
  kKindIndex = 'i',      // leaf of an index tree
  kKindBranch = 'n',     // branch node
};

struct RecordRef {
  char kind = kKindNone;
  uint64_t key_length = 0;
  // (page - 1) * P + A + B + the node's offset in its page: two page sizes
  // before the node's true byte position, as the record vector has always
  // stored it. Readers of node bytes add 2 * P back.
  uint64_t file_position = 0;
  uint32_t page_number = 0;
  uint16_t tag_index = 0;
  uint16_t data_offset = 0;  // of the data part, from the node start
  uint16_t data_size = 0;
  uint32_t object_id = 0;  // the tree the page belongs to (page header)
  Bytes key;               // prefix + suffix
};

// The outcome of decoding one node.
enum class NodeDecode {
  kOk,
  kDeleted,        // flagged deleted: not a record
  kDamaged,        // its tag pointed outside the page, or it is too short
  kRootPrefix,     // prefix-compressed on a root page, which cannot be
  kPrefixTooLong,  // its prefix is longer than the page's external header
};

// Decodes node `tag` of `page` into `ref` (kind and file position are left to
// the caller, who knows the page's place in its tree and in the file).
// `want_key` false skips copying the key bytes (the length is still set).
NodeDecode DecodeNode(const Page& page, uint16_t tag, RecordRef* ref, bool want_key = true);

// The kind of a leaf record on a page with these flags.
char LeafKind(uint32_t page_flags);

// The child page number of a branch node; 0 when the data part is too short.
uint32_t BranchChild(const Page& page, const RecordRef& ref);

// The data part of a decoded node, as a view into the page.
ByteView NodeData(const Page& page, const RecordRef& ref);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_RECORD_REF_H_
