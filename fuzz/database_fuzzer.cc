// Whole-database stages over a fuzzed file, as the table dump and the deep
// scan run them: catalog walk and parse, table names, every table's records
// with every column decoded (long values included), keyed seeks, the
// whole-file leaf-page scan and harvest, and the per-node accessors.
//
// The input is the file. Its last byte picks how it is opened: 0 modulo 6
// inspects it by its own header; 1..5 open it as that Exchange version code
// (with the adjustment probe), whatever its header says.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>

#include "engine/catalog.h"
#include "engine/column_decoder.h"
#include "engine/edb_class.h"
#include "engine/tree_cursor.h"
#include "fuzz/memfd_database.h"

namespace {

using namespace tarnwell;
using namespace tarnwell::engine;

constexpr int kModes = 6;
// Bounds that keep one input fast; a fuzzed catalog can list thousands of
// tables over the same few pages.
constexpr size_t kMaxTables = 64;
constexpr size_t kMaxRecordsPerTable = 512;
constexpr size_t kMaxCursorSteps = 256;
constexpr size_t kMaxHarvested = 2048;

volatile size_t sink = 0;

void Touch(ByteView v) {
  size_t sum = 0;
  for (size_t i = 0; i < v.size(); ++i) sum += v[i];
  sink = sink + sum;
}

void Weigh(const DecodedColumn& d) {
  sink = sink + d.text.size() + d.bytes.size();
  for (const DecodedColumn& v : d.values) Weigh(v);
}

void WalkCursor(const PageFile& file, uint32_t root) {
  TreeCursor cursor(file);
  Bytes middle_key;
  if (cursor.Seek(root, ByteView())) {
    for (size_t step = 0; step < kMaxCursorSteps; ++step) {
      Touch(cursor.key());
      Touch(cursor.data());
      sink = sink + size_t(cursor.data_position());
      if (step == kMaxCursorSteps / 8) middle_key = cursor.ref().key;
      if (!cursor.Next()) break;
    }
  }
  RecordRef found;
  sink = sink + size_t(SeekKey(file, root, ByteView(middle_key), &found));
}

void DumpTables(EdbClass& reader) {
  const LongValueReader long_values = reader.long_values();
  size_t table_count = 0;
  for (const TableDef& table : reader.tables()) {
    if (++table_count > kMaxTables) break;
    const uint32_t lv_root = table.long_value ? table.long_value->root_page() : 0;
    const ColumnDecoder decoder(&long_values, lv_root);
    size_t records = 0;
    reader.ForEachRecord(table, [&](const RecordRef& ref, RecordColumns& columns) {
      for (size_t i = 0; i < table.columns.size(); ++i) {
        const ColumnValue& v = columns.at(i);
        Touch(v.value);
        Weigh(decoder.Decode(table.columns[i], v));
      }
      RecordColumns again;
      sink = sink + size_t(reader.ReadRecordColumns(ref, table, &table, &again));
      return ++records < kMaxRecordsPerTable;
    });
    WalkCursor(reader.file(), table.table.root_page());
    if (lv_root != 0) {
      WalkCursor(reader.file(), lv_root);
      // The first long value of the tree, by the id its first key holds.
      TreeCursor cursor(reader.file());
      if (cursor.Seek(lv_root, ByteView()) && cursor.key().size() >= kLongValueIdSize) {
        Bytes id(cursor.key().data(), cursor.key().data() + kLongValueIdSize);
        std::reverse(id.begin(), id.end());
        LongValue value;
        if (long_values.Read(lv_root, ByteView(id), &value) == 0) {
          Bytes all;
          long_values.ReadAll(value, &all);
          Touch(ByteView(all));
        }
      }
    }
  }
}

void Harvest(EdbClass& reader) {
  reader.ScanLeafPages();
  const std::vector<LeafPageEntry> pages = reader.leaf_pages();
  reader.CollectLeafPageRecords();
  const std::vector<RecordRef>& records = reader.records();
  const TableDef* first_table = reader.tables().empty() ? nullptr : &reader.tables().front();
  for (size_t i = 0; i < records.size() && i < kMaxHarvested; ++i) {
    const RecordRef& r = records[i];
    const RecordRef again = reader.MakeRecordRef(r.page_number, r.tag_index);
    const NodeCopy node = reader.ReadNode(r.page_number, r.tag_index);
    if (node.data.size() != node.size) std::abort();
    Touch(ByteView(node.data));
    if (first_table) {
      RecordColumns columns;
      sink = sink + size_t(reader.ReadRecordColumns(again, *first_table, nullptr, &columns));
    }
  }
  reader.records().clear();
  if (!pages.empty()) {
    PageRecord loaded;
    loaded.page_number = uint32_t(reader.file().PageNumberAt(pages.front().file_position));
    sink = sink + size_t(reader.LoadPageNodes(&loaded));
    reader.FollowLeafChain(pages.front().next);
    reader.records().clear();
  }
}

void RunStages(EdbClass& reader) {
  reader.CollectTreeRecords(kCatalogRootPage);
  reader.ParseCatalogRecords();
  for (const std::string& name : reader.GetTableNames()) sink = sink + name.size();
  if (!reader.tables().empty()) {
    sink = sink + size_t(reader.FindTable(reader.tables().back().name()) != nullptr);
  }
  DumpTables(reader);
  Harvest(reader);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static tarnwell::fuzz::MemfdDatabase file;
  if (size == 0) return 0;
  const std::string& path = file.Write(data, size);
  const int mode = data[size - 1] % kModes;
  std::unique_ptr<EdbClass> reader;
  if (mode == 0) {
    if (!InspectDatabase(path, &reader).ok()) return 0;
  } else {
    reader = MakeReader(mode);
    if (!reader || !reader->OpenDatabase(path, SourceDescriptor{}, mode)) return 0;
    reader->FindAdjustmentFactor();
  }
  RunStages(*reader);
  return 0;
}
