// What the test database writer is asked to build, and what it reports back.
//
// A DatabaseLayout is a plain description: tables, their columns and rows, and
// the page format of one Exchange generation. The writer turns it into an ESE
// database file; the Manifest says where everything ended up so tests can
// damage or inspect particular pages.
#ifndef TARNWELL_TESTING_FORGE_LAYOUT_H_
#define TARNWELL_TESTING_FORGE_LAYOUT_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::forge {

// ESE column types (JET_coltyp).
enum ColumnType : uint32_t {
  kColumnBit = 1,
  kColumnUnsignedByte = 2,
  kColumnShort = 3,
  kColumnLong = 4,
  kColumnCurrency = 5,
  kColumnFloat = 6,
  kColumnDouble = 7,
  kColumnDateTime = 8,
  kColumnBinary = 9,
  kColumnText = 10,
  kColumnLongBinary = 11,
  kColumnLongText = 12,
  kColumnUnsignedLong = 14,
  kColumnLongLong = 15,
  kColumnGuid = 16,
  kColumnUnsignedShort = 17,
};

// Column identifiers decide how a value is stored, as in ESE itself:
// 1..127 fixed, 128..255 variable, 256 and up tagged.
constexpr uint32_t kFirstVariableColumnId = 128;
constexpr uint32_t kFirstTaggedColumnId = 256;
constexpr uint32_t kLastTaggedColumnId = 0xFFFF;

// Flag byte bits of a tagged value (written before the value when present).
constexpr uint8_t kTaggedLongValue = 0x01;
constexpr uint8_t kTaggedCompressed = 0x02;
constexpr uint8_t kTaggedSeparated = 0x04;
constexpr uint8_t kTaggedMultiValued = 0x08;
constexpr uint8_t kTaggedTwoValues = 0x10;
constexpr uint8_t kTaggedNull = 0x20;

// How a value is compressed: in a record (flag kTaggedCompressed) or as a
// long-value chunk. kXpress9 stands for the schemes the reader does not
// decode: its value carries the right header byte over filler.
enum class Compression : uint8_t {
  kNone,
  kSevenBitAscii,
  kSevenBitUnicode,
  kXpress,
  kXpress9,
  kLz4,
};

struct ColumnLayout {
  uint32_t id = 0;
  std::string name;
  uint32_t type = 0;
  uint32_t size = 0;      // 0: natural width of fixed types; max size for variable ones
  uint32_t codepage = 0;  // text columns: 1252, 1200 (UTF-16), ...
  uint32_t flags = 0;     // extra catalog column flags (e.g. 0x400 multi-valued)
};

struct Cell {
  uint32_t column_id = 0;
  std::optional<Bytes> value;  // nullopt: an explicit NULL
  uint8_t tagged_flags = 0;    // flag byte of a tagged value (kTagged*); 0 = none on small pages
};

struct RowLayout {
  std::vector<Cell> cells;
  bool deleted = false;  // written as a node with the deleted tag flag
  Bytes key;             // empty: the 4-byte big-endian ordinal of the row (1-based)
};

// A value of the table's long-value tree. Records refer to it by id through
// a separated tagged value (see SeparatedCell in forge_value.h).
struct LongValueLayout {
  uint64_t id = 0;  // unique within the table, 1 and up
  Bytes data;
  uint32_t reference_count = 1;
  // Each chunk is compressed on its own; a chunk the scheme does not shrink
  // is stored as it is, the way ESE does.
  Compression compression = Compression::kNone;
};

struct TableLayout {
  std::string name;
  std::vector<ColumnLayout> columns;
  std::vector<RowLayout> rows;
  uint32_t max_rows_per_leaf = 0;        // 0: fill pages; small values force deep trees
  uint32_t max_children_per_branch = 0;  // 0: fill pages

  // The long-value tree; written (with its catalog record) when not empty.
  std::vector<LongValueLayout> long_values;
  uint32_t long_value_id_size = 4;             // 4, or 8 as newer revisions have it
  uint32_t long_value_chunk_size = 0;          // 0: DefaultLongValueChunkSize
  uint32_t max_long_value_nodes_per_leaf = 0;  // 0: fill pages
  uint32_t max_long_value_children_per_branch = 0;
  bool long_value_full_leaf_prefix = false;  // see TreeOptions::full_leaf_prefix
};

struct DatabaseLayout {
  uint32_t page_size = 8192;  // 4096, 8192, 16384 or 32768
  uint32_t format_version = 0x620;
  uint32_t format_revision = 12;
  // OR-ed into every page's flags. Unset: what the page size and revision
  // imply (4 KiB revision 2: 0, other 4 KiB: 0x0800, 8 KiB: 0x2800,
  // 16/32 KiB: 0xA800).
  std::optional<uint32_t> page_format_flags;
  bool prefix_compression = true;
  uint32_t database_state = 3;  // clean shutdown
  // The revision whose catalog columns the catalog records have (unset:
  // format_revision). 17 in a revision-20 file gives catalog records whose
  // last fixed column is 11 instead of 12, as earlier Exchange 2013 stores have.
  std::optional<uint32_t> catalog_revision;
  std::vector<TableLayout> tables;
};

// One chunk of one long value left out of its tree.
struct DroppedChunk {
  std::string table;
  uint64_t long_value_id = 0;
  uint32_t chunk = 0;  // 0-based, in offset order
};

struct FileDamage {
  size_t junk_prefix = 0;          // bytes of junk before the header
  bool drop_header_pages = false;  // the file starts with page 1
  std::vector<DroppedChunk> dropped_chunks;
};

struct TableManifest {
  std::string name;
  uint32_t object_id = 0;
  uint32_t root_page = 0;
  std::vector<uint32_t> leaf_pages;    // non-root leaves, left to right
  std::vector<uint32_t> branch_pages;  // non-root branch pages
  // The long-value tree, when the table has one (root page 0 otherwise).
  uint32_t long_value_object_id = 0;
  uint32_t long_value_root_page = 0;
  std::vector<uint32_t> long_value_leaf_pages;
  std::vector<uint32_t> long_value_branch_pages;
  uint64_t long_value_chunks = 0;
  uint64_t compressed_chunks = 0;  // chunks stored in fewer bytes than they hold
};

struct Manifest {
  uint32_t page_size = 0;
  uint64_t total_pages = 0;             // database pages, header blocks not counted
  std::vector<uint32_t> written_pages;  // pages with content (the others are all zero)
  std::vector<TableManifest> tables;    // user tables, then MSysObjects and its shadow
};

// Page flags used by the writer and by tests that check them.
constexpr uint32_t kPageFlagRoot = 0x0001;
constexpr uint32_t kPageFlagLeaf = 0x0002;
constexpr uint32_t kPageFlagParentOfLeaf = 0x0004;
constexpr uint32_t kPageFlagEmpty = 0x0008;
constexpr uint32_t kPageFlagSpaceTree = 0x0020;
constexpr uint32_t kPageFlagIndex = 0x0040;
constexpr uint32_t kPageFlagLongValue = 0x0080;
constexpr uint32_t kPageFlagNewRecordFormat = 0x0800;
constexpr uint32_t kPageFlagNewChecksum = 0x2000;
constexpr uint32_t kPageFlagLargePageWriter = 0x8000;

// Fixed page numbers every ESE database uses.
constexpr uint32_t kDatabaseRootPage = 1;
constexpr uint32_t kDatabaseOwnedSpacePage = 2;
constexpr uint32_t kDatabaseAvailableSpacePage = 3;
constexpr uint32_t kCatalogRootPage = 4;
constexpr uint32_t kShadowCatalogRootPage = 24;

constexpr uint32_t kDatabaseObjectId = 1;
constexpr uint32_t kCatalogObjectId = 2;
constexpr uint32_t kShadowCatalogObjectId = 3;

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_LAYOUT_H_
