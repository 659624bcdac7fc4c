// Table context layout: a heap (client signature 0x7C) whose user root is
// the TCINFO:
//
//   0   1  bType        0x7C
//   1   1  cCols        number of columns
//   2   8  rgib[4]      ends of the row's groups: TCI_4b (8- and 4-byte cells),
//                       TCI_2b (2-byte cells), TCI_1b (1-byte cells), TCI_bm (the
//                       cell-existence bits; also the row size)
//   10  4  hidRowIndex  BTH of row id (4 bytes) -> row number (4 bytes)
//   14  4  hnidRows     the row matrix: 0 without rows, a heap id, or a subnode
//   18  4  hidIndex     unused, 0
//   22  8*cCols  rgTCOLDESC, sorted by tag:
//         0  4  tag
//         4  2  ibData   offset of the cell in the row
//         6  1  cbData   cell width
//         7  1  iBit     the cell's bit in the existence bits
//
// A row: dwRowID at 0 (the PidTagLtpRowId cell), PidTagLtpRowVer at 4, then
// 8- and 4-byte cells, 2-byte cells, 1-byte cells, and the cell-existence
// bits (bit iBit is byte iBit/8, mask 0x80 >> iBit%8). Fixed-size values up
// to 8 bytes sit in the row; everything else (strings, binaries, GUIDs,
// multi-valued values) is an HNID. A row matrix larger than one heap
// allocation goes to a subnode whose blocks each hold as many whole rows as
// fit in kMaxBlockData: rows never span blocks, and every block but the last
// is padded to kMaxBlockData.
#include "mapi/pst/table_context.h"

#include <algorithm>
#include <set>
#include <string>

#include "mapi/pst/bth.h"
#include "mapi/pst/heap_on_node.h"
#include "mapi/pst/property_context.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr PropTag kTagLtpRowId = 0x67F20003;
constexpr PropTag kTagLtpRowVer = 0x67F30003;

constexpr size_t kTcInfoSize = 22;
constexpr size_t kTcInfoColumns = 1;
constexpr size_t kTcInfoRgib = 2;
constexpr size_t kTcInfoRowIndex = 10;
constexpr size_t kTcInfoRows = 14;
constexpr size_t kTcInfoIndex = 18;
constexpr size_t kTciGroups = 4;  // TCI_4b, TCI_2b, TCI_1b, TCI_bm
constexpr size_t kTci1b = 2;
constexpr size_t kTciBm = 3;
constexpr size_t kColDescSize = 8;
constexpr size_t kColDescIb = 4;
constexpr size_t kColDescCb = 6;
constexpr size_t kColDescBit = 7;
constexpr size_t kMaxColumns = 255;
constexpr size_t kRowIdSize = 4;
constexpr size_t kRowVerOffset = 4;
constexpr size_t kHnidSize = 4;
constexpr size_t kMaxInlineCell = 8;
constexpr uint8_t kRowIndexKeySize = 4;
constexpr uint8_t kRowIndexDataSize = 4;
constexpr uint8_t kAnsiRowIndexDataSize = 2;

struct Column {
  PropTag tag = 0;
  uint16_t ib = 0;
  uint8_t cb = 0;
  uint8_t bit = 0;
};

bool IsInlineCell(uint16_t type) {
  const size_t width = FixedWidth(type);
  return !IsMultiValued(type) && width > 0 && width <= kMaxInlineCell;
}

size_t CellWidth(PropTag tag) {
  return IsInlineCell(TagType(tag)) ? FixedWidth(TagType(tag)) : kHnidSize;
}

bool HasBit(ByteView row, size_t ceb, uint8_t bit) {
  return (row.U8(ceb + bit / 8) & (0x80 >> (bit % 8))) != 0;
}

void SetBit(uint8_t* row, size_t ceb, uint8_t bit) {
  row[ceb + bit / 8] |= uint8_t(0x80 >> (bit % 8));
}

std::string CellName(PropTag tag) { return "cell " + std::to_string(TagId(tag)); }

// Lays the columns out: row id and version first, then cells by falling
// width, each group's end recorded in rgib.
Status LayOut(const std::vector<PropTag>& requested, std::vector<Column>* columns,
              uint16_t rgib[kTciGroups]) {
  std::vector<PropTag> tags = {kTagLtpRowId, kTagLtpRowVer};
  std::set<PropTag> seen(tags.begin(), tags.end());
  for (PropTag t : requested) {
    if (seen.insert(t).second) tags.push_back(t);
  }
  if (tags.size() > kMaxColumns) return Status::InvalidArgument("table has too many columns");
  columns->clear();
  size_t at = 0;
  auto place = [&](PropTag t) {
    Column c;
    c.tag = t;
    c.ib = uint16_t(at);
    c.cb = uint8_t(CellWidth(t));
    c.bit = uint8_t(columns->size());
    columns->push_back(c);
    at += c.cb;
  };
  auto place_width = [&](size_t width) {
    for (size_t i = 2; i < tags.size(); ++i) {
      if (CellWidth(tags[i]) == width) place(tags[i]);
    }
  };
  place(kTagLtpRowId);
  place(kTagLtpRowVer);
  place_width(8);  // 8-byte cells first keeps them 8-byte aligned
  place_width(4);
  rgib[0] = uint16_t(at);
  place_width(2);
  rgib[1] = uint16_t(at);
  place_width(1);
  rgib[kTci1b] = uint16_t(at);
  rgib[kTciBm] = uint16_t(at + (columns->size() + 7) / 8);
  return Status::Ok();
}

}  // namespace

Status EncodeTableContext(const std::vector<PropTag>& requested, const std::vector<TableRow>& rows,
                          NodeContent* node) {
  std::vector<Column> columns;
  uint16_t rgib[kTciGroups];
  Status s = LayOut(requested, &columns, rgib);
  if (!s.ok()) return s;
  const size_t row_size = rgib[kTciBm];
  const size_t ceb = rgib[kTci1b];

  HeapBuilder heap(kHeapClientTable);
  Hid info_hid = 0;
  s = heap.Reserve(kTcInfoSize + kColDescSize * columns.size(), &info_hid);
  if (!s.ok()) return s;
  heap.set_user_root(info_hid);
  BthWriter row_index(&heap, kRowIndexKeySize, kRowIndexDataSize);
  s = row_index.Reserve(rows.size());
  if (!s.ok()) return s;

  HnidWriter hnids(&heap, node);
  Bytes matrix(row_size * rows.size(), 0);
  std::vector<Bytes> index_records;
  for (size_t r = 0; r < rows.size(); ++r) {
    const TableRow& row = rows[r];
    uint8_t* out = matrix.data() + r * row_size;
    StoreU32LE(out, row.row_id);
    auto ver = row.cells.find(kTagLtpRowVer);
    const bool ver_given = ver != row.cells.end() && ver->second.data.size() == kRowIdSize;
    StoreU32LE(out + kRowVerOffset,
               ver_given ? LoadU32LE(ver->second.data.data()) : uint32_t(r + 1));
    SetBit(out, ceb, columns[0].bit);
    SetBit(out, ceb, columns[1].bit);
    for (size_t c = 2; c < columns.size(); ++c) {
      const Column& col = columns[c];
      auto cell = row.cells.find(col.tag);
      if (cell == row.cells.end()) continue;
      const PropertyValue& v = cell->second;
      if (v.type != TagType(col.tag)) {
        return Status::InvalidArgument(CellName(col.tag) + " has a value of another type");
      }
      if (IsInlineCell(v.type)) {
        if (v.data.size() != col.cb)
          return Status::InvalidArgument(CellName(col.tag) + " has a bad width");
        std::copy(v.data.begin(), v.data.end(), out + col.ib);
      } else {
        Bytes stored;
        uint32_t hnid = 0;
        s = EncodeStoredValue(v, &stored);
        if (s.ok()) s = hnids.Store(stored, &hnid);
        if (!s.ok()) return s;
        StoreU32LE(out + col.ib, hnid);
      }
      SetBit(out, ceb, col.bit);
    }
    Bytes record(kRowIndexKeySize + kRowIndexDataSize);
    StoreU32LE(record.data(), row.row_id);
    StoreU32LE(record.data() + kRowIndexKeySize, uint32_t(r));
    index_records.push_back(std::move(record));
  }
  s = row_index.Write(std::move(index_records));
  if (!s.ok()) return s;

  uint32_t rows_hnid = 0;
  if (matrix.size() > kMaxHeapAllocation) {
    const size_t rows_per_block = kMaxBlockData / row_size;
    std::vector<Bytes> blocks;
    for (size_t at = 0; at < matrix.size(); at += rows_per_block * row_size) {
      const size_t n = std::min(rows_per_block * row_size, matrix.size() - at);
      blocks.emplace_back(matrix.begin() + at, matrix.begin() + at + n);
      // Outlook fills every block but the last to its full size; readers may
      // find a row by its block's position in the stream.
      if (at + n < matrix.size()) blocks.back().resize(kMaxBlockData, 0);
    }
    rows_hnid = hnids.AddSubnode(std::move(blocks));
  } else if (!matrix.empty()) {
    s = heap.Allocate(matrix, &rows_hnid);
    if (!s.ok()) return s;
  }

  std::vector<Column> by_tag = columns;
  std::sort(by_tag.begin(), by_tag.end(),
            [](const Column& a, const Column& b) { return a.tag < b.tag; });
  Bytes info(kTcInfoSize + kColDescSize * columns.size(), 0);
  info[0] = kHeapClientTable;
  info[kTcInfoColumns] = uint8_t(columns.size());
  for (size_t g = 0; g < kTciGroups; ++g) StoreU16LE(info.data() + kTcInfoRgib + 2 * g, rgib[g]);
  StoreU32LE(info.data() + kTcInfoRowIndex, row_index.header());
  StoreU32LE(info.data() + kTcInfoRows, rows_hnid);
  StoreU32LE(info.data() + kTcInfoIndex, 0);
  for (size_t c = 0; c < by_tag.size(); ++c) {
    uint8_t* d = info.data() + kTcInfoSize + kColDescSize * c;
    StoreU32LE(d, by_tag[c].tag);
    StoreU16LE(d + kColDescIb, by_tag[c].ib);
    d[kColDescCb] = by_tag[c].cb;
    d[kColDescBit] = by_tag[c].bit;
  }
  s = heap.Fill(info_hid, info);
  if (!s.ok()) return s;
  node->blocks = heap.Finish();
  return Status::Ok();
}

Status DecodeTableContext(const NodeContent& node, std::vector<PropTag>* column_tags,
                          std::vector<TableRow>* rows) {
  column_tags->clear();
  rows->clear();
  HeapReader heap;
  Status s = heap.Open(node.blocks);
  if (!s.ok()) return s;
  if (heap.client_signature() != kHeapClientTable) {
    return Status::Corruption("node is not a table context");
  }
  ByteView info;
  s = heap.Read(heap.user_root(), &info);
  if (!s.ok()) return s;
  if (info.size() < kTcInfoSize || info[0] != kHeapClientTable ||
      !info.Has(kTcInfoSize, kColDescSize * info[kTcInfoColumns])) {
    return Status::Corruption("table header is damaged");
  }
  uint16_t rgib[kTciGroups];
  for (size_t g = 0; g < kTciGroups; ++g) {
    rgib[g] = info.U16LE(kTcInfoRgib + 2 * g);
    if (g > 0 && rgib[g] < rgib[g - 1]) return Status::Corruption("table row layout is damaged");
  }
  const size_t row_size = rgib[kTciBm];
  const size_t ceb = rgib[kTci1b];
  if (row_size < kRowIdSize) return Status::Corruption("table rows are too small");
  std::vector<Column> columns;
  for (size_t c = 0; c < info[kTcInfoColumns]; ++c) {
    const size_t at = kTcInfoSize + kColDescSize * c;
    Column col;
    col.tag = info.U32LE(at);
    col.ib = info.U16LE(at + kColDescIb);
    col.cb = info[at + kColDescCb];
    col.bit = info[at + kColDescBit];
    if (size_t(col.ib) + col.cb > ceb || ceb + col.bit / 8 >= row_size) {
      return Status::Corruption("table column " + std::to_string(c) + " lies outside the row");
    }
    columns.push_back(col);
    column_tags->push_back(col.tag);
  }

  Status result;
  uint8_t key_size = 0, data_size = 0;
  std::vector<Bytes> index;
  s = ReadBth(heap, info.U32LE(kTcInfoRowIndex), &key_size, &data_size, &index);
  bool count_known = s.ok();
  if (s.ok() && (key_size != kRowIndexKeySize ||
                 (data_size != kRowIndexDataSize && data_size != kAnsiRowIndexDataSize))) {
    s = Status::Corruption("table row index has the wrong record size");
    count_known = false;
  }
  if (!s.ok()) result = s;

  std::vector<ByteView> pieces;
  const uint32_t rows_hnid = info.U32LE(kTcInfoRows);
  if (rows_hnid != 0 && NidTypeOf(rows_hnid) == kNidTypeHid) {
    ByteView matrix;
    s = heap.Read(rows_hnid, &matrix);
    if (!s.ok()) return s;
    pieces.push_back(matrix);
  } else if (rows_hnid != 0) {
    auto it = node.subnodes.find(rows_hnid);
    if (it == node.subnodes.end()) return Status::Corruption("table row matrix subnode is missing");
    for (const Bytes& b : it->second.blocks) pieces.emplace_back(b);
  }

  const size_t wanted = count_known ? index.size() : SIZE_MAX;
  for (ByteView piece : pieces) {
    for (size_t at = 0; at + row_size <= piece.size() && rows->size() < wanted; at += row_size) {
      ByteView r = piece.Sub(at, row_size);
      TableRow row;
      row.row_id = r.U32LE(0);
      for (const Column& col : columns) {
        if (!HasBit(r, ceb, col.bit)) continue;
        const uint16_t type = TagType(col.tag);
        ByteView cell = r.Sub(col.ib, col.cb);
        PropertyValue v;
        v.type = type;
        if (IsInlineCell(type)) {
          if (cell.size() != FixedWidth(type)) {
            s = Status::Corruption(CellName(col.tag) + " has a bad width");
          } else {
            v.data = cell.ToBytes();
            if (type == kTypeBoolean) v.data[0] = v.data[0] != 0 ? 1 : 0;
          }
        } else if (type != kTypeNull && type != kTypeUnspecified) {
          Bytes stored;
          s = cell.size() == kHnidSize
                  ? ReadHnid(heap, node, cell.U32LE(0), &stored)
                  : Status::Corruption(CellName(col.tag) + " is not a reference");
          if (s.ok()) s = DecodeStoredValue(type, stored, &v);
        }
        if (!s.ok()) {
          if (result.ok()) result = s;
          s = Status::Ok();
          continue;
        }
        row.cells[col.tag] = std::move(v);
      }
      rows->push_back(std::move(row));
    }
  }
  if (count_known && rows->size() < index.size() && result.ok()) {
    result = Status::Corruption("table row matrix holds fewer rows than its index");
  }
  return result;
}

}  // namespace tarnwell::mapi::pst
