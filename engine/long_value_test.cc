// Long values read back from databases the test writer builds: many values
// per table, values of many chunks, LV trees of several levels, 8-byte ids,
// compressed chunks of every scheme and a value that lost a chunk.
#include "engine/long_value.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <tuple>

#include "engine/column_decoder.h"
#include "engine/engine_test_support.h"
#include "testing/forge_long_value.h"
#include "testing/forge_record.h"
#include "testing/forge_value.h"

namespace tarnwell::engine {
namespace {

constexpr uint32_t kIdColumn = 1;
constexpr uint32_t kDataColumn = 256;
constexpr uint32_t kNoteColumn = 257;

// Text-like bytes (ASCII, repetitive enough for Xpress and LZ4), different
// for every value so that a chunk read from the wrong value shows.
Bytes TextBytes(uint64_t seed, size_t size) {
  Bytes out;
  out.reserve(size + 64);
  for (uint64_t line = 0; out.size() < size; ++line) {
    const std::string text = "value " + std::to_string(seed) + " line " + std::to_string(line) +
                             ": the quick brown fox jumps over the lazy dog\r\n";
    out.insert(out.end(), text.begin(), text.end());
  }
  out.resize(size);
  return out;
}

Bytes Utf16Bytes(uint64_t seed, size_t size) {
  Bytes ascii = TextBytes(seed, size / 2);
  Bytes out;
  for (uint8_t c : ascii) {
    out.push_back(c);
    out.push_back(0);
  }
  return out;
}

// Equal bytes, or where they part: a whole dump of kilobytes helps nobody.
::testing::AssertionResult SameBytes(const Bytes& got, const Bytes& want) {
  const size_t n = std::min(got.size(), want.size());
  size_t i = 0;
  while (i < n && got[i] == want[i]) ++i;
  if (i == n && got.size() == want.size()) return ::testing::AssertionSuccess();
  return ::testing::AssertionFailure() << got.size() << " bytes where " << want.size()
                                       << " were written; first difference at " << i;
}

struct LvCase {
  const char* name;
  uint32_t values;
  size_t size;          // of the first value; the others grow a little
  uint32_t chunk_size;  // 0: the writer's default
  uint32_t id_size;
  forge::Compression compression;
  uint32_t nodes_per_leaf;  // 0: fill pages
  uint32_t children_per_branch;
  bool want_branches;  // the LV tree must have non-root branch pages
};

const LvCase kLvCases[] = {
    {"many_small_values", 120, 300, 0, 4, forge::Compression::kNone, 0, 0, false},
    {"many_chunks", 3, 40000, 700, 4, forge::Compression::kNone, 0, 0, false},
    {"deep_tree", 6, 9000, 500, 4, forge::Compression::kNone, 3, 3, true},
    {"page_sized_chunks", 4, 100000, 0, 4, forge::Compression::kNone, 0, 0, false},
    {"ids_of_8_bytes", 40, 2500, 600, 8, forge::Compression::kNone, 4, 3, true},
    {"xpress_chunks", 5, 30000, 0, 4, forge::Compression::kXpress, 0, 0, false},
    {"lz4_chunks", 5, 30000, 0, 4, forge::Compression::kLz4, 0, 0, false},
    {"seven_bit_ascii_chunks", 5, 12000, 1000, 4, forge::Compression::kSevenBitAscii, 2, 3, true},
    {"seven_bit_unicode_chunks", 5, 12000, 1000, 8, forge::Compression::kSevenBitUnicode, 0, 0,
     false},
};

void PrintTo(const LvCase& c, std::ostream* os) { *os << c.name; }

// Records (Id, Data -> long value i, Note: a short in-record value) over
// long values 1..n, with ids spread so that they are not consecutive.
forge::DatabaseLayout LongValueDatabase(const Format& f, const LvCase& c) {
  forge::DatabaseLayout layout;
  layout.page_size = f.page_size;
  layout.format_revision = f.revision;
  forge::TableLayout t;
  t.name = "Attachments";
  t.columns = {{kIdColumn, "Id", forge::kColumnLong},
               {kDataColumn, "Data", forge::kColumnLongBinary},
               {kNoteColumn, "Note", forge::kColumnLongText, 0, 1252}};
  t.long_value_id_size = c.id_size;
  t.long_value_chunk_size = c.chunk_size;
  t.max_long_value_nodes_per_leaf = c.nodes_per_leaf;
  t.max_long_value_children_per_branch = c.children_per_branch;
  for (uint32_t i = 0; i < c.values; ++i) {
    forge::LongValueLayout v;
    // 8-byte ids use the high half, which a reader that cuts ids to 4 bytes loses.
    v.id = c.id_size == 8 ? (uint64_t(i + 1) << 32) + 7 * i + 1 : 3 * i + 2;
    const size_t size = c.size + 37 * i;
    v.data = c.compression == forge::Compression::kSevenBitUnicode ? Utf16Bytes(v.id, size)
                                                                   : TextBytes(v.id, size);
    v.compression = c.compression;
    forge::RowLayout row;
    row.cells.push_back({kIdColumn, forge::LittleEndian(i + 1, 4)});
    row.cells.push_back(forge::SeparatedCell(kDataColumn, v.id, c.id_size));
    row.cells.push_back({kNoteColumn, forge::Ascii("note " + std::to_string(i + 1))});
    t.rows.push_back(std::move(row));
    t.long_values.push_back(std::move(v));
  }
  layout.tables.push_back(std::move(t));
  return layout;
}

class LongValueTest : public ::testing::TestWithParam<std::tuple<Format, LvCase>> {};

TEST_P(LongValueTest, ReaderAssemblesEveryValue) {
  const auto& [format, lv_case] = GetParam();
  forge::DatabaseLayout layout = LongValueDatabase(format, lv_case);
  TempDatabase db(layout);
  const forge::TableManifest& m = db.manifest().tables[0];
  ASSERT_NE(m.long_value_root_page, 0u);
  if (lv_case.want_branches) {
    EXPECT_FALSE(m.long_value_branch_pages.empty());
  }
  if (lv_case.compression != forge::Compression::kNone) {
    // All but perhaps a short last chunk of each value shrink.
    EXPECT_GE(m.compressed_chunks + lv_case.values, m.long_value_chunks);
    EXPECT_GT(m.compressed_chunks, 0u);
  }

  auto reader = OpenWithCatalog(db.path());
  ASSERT_TRUE(reader);
  const TableDef* table = reader->FindTable("Attachments");
  ASSERT_NE(table, nullptr);
  ASSERT_TRUE(table->long_value);
  EXPECT_EQ(table->long_value->root_page(), m.long_value_root_page);

  // Straight through the long-value reader.
  const forge::TableLayout& t = layout.tables[0];
  const uint32_t chunk_size = lv_case.chunk_size
                                  ? lv_case.chunk_size
                                  : forge::DefaultLongValueChunkSize(
                                        {format.page_size, format.revision, 0}, lv_case.id_size);
  const LongValueReader lvs = reader->long_values();
  uint64_t compressed = 0;
  for (const forge::LongValueLayout& v : t.long_values) {
    LongValue lv;
    ASSERT_EQ(lvs.Read(m.long_value_root_page, forge::LongValueId(v.id, lv_case.id_size), &lv), 0)
        << "id " << v.id;
    EXPECT_FALSE(lv.truncated) << "id " << v.id;
    EXPECT_EQ(lv.declared_size, v.data.size());
    EXPECT_EQ(lv.total_size, v.data.size());
    EXPECT_EQ(lv.chunks.size(), (v.data.size() + chunk_size - 1) / chunk_size);
    for (const LongValueChunk& c : lv.chunks) compressed += c.compressed;
    Bytes got;
    ASSERT_TRUE(lvs.ReadAll(lv, &got).ok()) << "id " << v.id;
    EXPECT_TRUE(SameBytes(got, v.data)) << "id " << v.id;
  }
  EXPECT_EQ(compressed, m.compressed_chunks);

  // An id the tree does not hold.
  LongValue missing;
  EXPECT_EQ(lvs.Read(m.long_value_root_page, forge::LongValueId(1, lv_case.id_size), &missing), -1);

  // Through the records and the column decoder, as a table dump sees them.
  const ColumnDecoder decoder(&lvs, table->long_value->root_page());
  size_t row = 0;
  auto check_row = [&](const RecordRef&, RecordColumns& columns) {
    DecodedColumn d = decoder.Decode(table->columns[1], columns.at(1));
    EXPECT_EQ(d.kind, DecodedColumn::Kind::kBinary) << d.text;
    EXPECT_TRUE(SameBytes(d.bytes, t.long_values[row].data)) << "row " << row;
    DecodedColumn note = decoder.Decode(table->columns[2], columns.at(2));
    EXPECT_EQ(note.text, "note " + std::to_string(row + 1));
    ++row;
    return true;
  };
  EXPECT_EQ(reader->ForEachRecord(*table, check_row), 1);
  EXPECT_EQ(row, t.rows.size());
}

INSTANTIATE_TEST_SUITE_P(Layouts, LongValueTest,
                         ::testing::Combine(::testing::ValuesIn(kFormats),
                                            ::testing::ValuesIn(kLvCases)),
                         [](const auto& info) {
                           return std::string(std::get<0>(info.param).name) + "_" +
                                  std::get<1>(info.param).name;
                         });

// A long value whose tree lost one chunk (the first, a middle one, the last,
// one of Xpress chunks): the reader says the value is truncated and keeps the
// bytes before the gap, so a dump shows what is left.
class MissingChunkTest : public ::testing::TestWithParam<Format> {};

TEST_P(MissingChunkTest, ValueIsTruncatedAtTheGap) {
  constexpr uint32_t kChunk = 800;
  constexpr uint32_t kChunks = 10;
  const struct {
    uint32_t dropped;  // chunk index
    forge::Compression compression;
  } kDrops[] = {{0, forge::Compression::kNone},
                {4, forge::Compression::kNone},
                {9, forge::Compression::kNone},
                {4, forge::Compression::kXpress}};
  for (const auto& drop : kDrops) {
    SCOPED_TRACE("chunk " + std::to_string(drop.dropped) + " of scheme " +
                 std::to_string(int(drop.compression)));
    const LvCase c = {"", 3, kChunk * kChunks, kChunk, 4, drop.compression, 0, 0, false};
    forge::DatabaseLayout layout = LongValueDatabase(GetParam(), c);
    // Every value the same length, so every one has exactly kChunks chunks.
    for (forge::LongValueLayout& v : layout.tables[0].long_values) v.data.resize(kChunk * kChunks);
    const forge::LongValueLayout& damaged = layout.tables[0].long_values[1];
    forge::FileDamage damage;
    damage.dropped_chunks.push_back({"Attachments", damaged.id, drop.dropped});
    TempDatabase db(layout, damage);
    EXPECT_EQ(db.manifest().tables[0].long_value_chunks, 3 * kChunks - 1);

    auto reader = OpenWithCatalog(db.path());
    ASSERT_TRUE(reader);
    const TableDef* table = reader->FindTable("Attachments");
    ASSERT_TRUE(table && table->long_value);
    const LongValueReader lvs = reader->long_values();
    const uint32_t root = table->long_value->root_page();

    LongValue lv;
    ASSERT_EQ(lvs.Read(root, forge::LongValueId(damaged.id), &lv), 0);
    EXPECT_TRUE(lv.truncated);
    EXPECT_EQ(lv.declared_size, kChunk * kChunks);
    EXPECT_EQ(lv.total_size, uint64_t(kChunk) * drop.dropped);
    Bytes got;
    EXPECT_TRUE(lvs.ReadAll(lv, &got).ok());
    EXPECT_TRUE(
        SameBytes(got, Bytes(damaged.data.begin(), damaged.data.begin() + kChunk * drop.dropped)));

    // The neighbours are whole.
    for (size_t i : {0, 2}) {
      const forge::LongValueLayout& v = layout.tables[0].long_values[i];
      LongValue whole;
      ASSERT_EQ(lvs.Read(root, forge::LongValueId(v.id), &whole), 0);
      EXPECT_FALSE(whole.truncated);
      Bytes bytes;
      EXPECT_TRUE(lvs.ReadAll(whole, &bytes).ok());
      EXPECT_TRUE(SameBytes(bytes, v.data));
    }

    // The decoder marks the column damaged and keeps what was assembled.
    const ColumnDecoder decoder(&lvs, root);
    size_t row = 0;
    reader->ForEachRecord(*table, [&](const RecordRef&, RecordColumns& columns) {
      DecodedColumn d = decoder.Decode(table->columns[1], columns.at(1));
      EXPECT_EQ(d.kind, row == 1 ? DecodedColumn::Kind::kDamaged : DecodedColumn::Kind::kBinary);
      if (row == 1) {
        EXPECT_TRUE(SameBytes(d.bytes, got));
      }
      ++row;
      return true;
    });
    EXPECT_EQ(row, 3u);
  }
}

INSTANTIATE_TEST_SUITE_P(Damage, MissingChunkTest, ::testing::ValuesIn(kFormats),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace tarnwell::engine
