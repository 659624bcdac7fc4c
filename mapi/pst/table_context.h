// Table contexts (TC): the rows of a table node (hierarchy, contents,
// recipients, attachments): a TCINFO header, a row index BTree-on-heap
// (row id -> row number) and a row matrix with cell-existence bits, kept in
// the heap or, when large, in a subnode.
#ifndef TARNWELL_MAPI_PST_TABLE_CONTEXT_H_
#define TARNWELL_MAPI_PST_TABLE_CONTEXT_H_

#include <cstdint>
#include <map>
#include <vector>

#include "base/status.h"
#include "mapi/pst/node.h"
#include "mapi/property_value.h"

namespace tarnwell::mapi::pst {

struct TableRow {
  uint32_t row_id = 0;  // PidTagLtpRowId: the row's node id (or its index)
  std::map<PropTag, PropertyValue> cells;  // absent = cell does not exist
};

// Writes a table with `columns` (tags; the encoder lays them out by size
// and adds PidTagLtpRowId and PidTagLtpRowVer itself) and `rows` in order.
// Cells whose tag is not among the columns are ignored. Sets node->blocks
// and adds kNidTypeLtp subnodes not already in node->subnodes.
Status EncodeTableContext(const std::vector<PropTag>& columns, const std::vector<TableRow>& rows,
                          NodeContent* node);

// Reads a table: its column tags (PidTagLtpRowId and PidTagLtpRowVer
// included) and rows in row-matrix order.
Status DecodeTableContext(const NodeContent& node, std::vector<PropTag>* columns,
                          std::vector<TableRow>* rows);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_TABLE_CONTEXT_H_
