// Property contexts (PC): a node's properties, kept in a BTree-on-heap of
// 8-byte records inside a heap-on-node, values too large for the heap in
// subnodes.
#ifndef TARNWELL_MAPI_PST_PROPERTY_CONTEXT_H_
#define TARNWELL_MAPI_PST_PROPERTY_CONTEXT_H_

#include <utility>
#include <vector>

#include "base/status.h"
#include "mapi/pst/node.h"
#include "mapi/property_value.h"

namespace tarnwell::mapi::pst {

struct TaggedValue {
  PropTag tag = 0;
  PropertyValue value;
};

// Writes `properties` (any order; one per id) as the PC of `node`: sets
// node->blocks and adds subnodes of type kNidTypeLtp, with ids not already
// among node->subnodes.
Status EncodePropertyContext(const std::vector<TaggedValue>& properties, NodeContent* node);

// Reads the PC of a node: every property in id order. Values kept in
// subnodes are read from node.subnodes. A damaged heap gives what could be
// read and a Corruption status.
Status DecodePropertyContext(const NodeContent& node, std::vector<TaggedValue>* out);

// How a value looks when stored outside its record or cell (behind an
// HNID), shared with table contexts: fixed-size and variable-size values as
// they are, multi-valued fixed-size ones back to back, multi-valued
// variable-size ones as a count, offsets and the elements.
// InvalidArgument when `value` does not fit its own type.
Status EncodeStoredValue(const PropertyValue& value, Bytes* out);
// Corruption when `bytes` cannot be a value of `type`.
Status DecodeStoredValue(uint16_t type, ByteView bytes, PropertyValue* out);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_PROPERTY_CONTEXT_H_
