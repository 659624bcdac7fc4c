// The in-memory writer: a DatabaseLayout's tables, their long values and the
// damage asked for, through a DatabaseWriter into one buffer. The file's
// layout is described in forge_database.cc.
#include "testing/ese_writer.h"

#include <algorithm>
#include <cstdio>
#include <map>
#include <set>

#include "testing/forge_database.h"
#include "testing/forge_long_value.h"
#include "testing/forge_record.h"
#include "testing/forge_tree.h"

namespace tarnwell::forge {
namespace {

constexpr uint8_t kJunkSeed = 0x5A;

Status CheckLayout(const DatabaseLayout& layout) {
  Status s = CheckFormat(layout);
  if (!s.ok()) return s;
  std::set<std::string> names = {"MSysObjects", "MSysObjectsShadow"};
  for (const TableLayout& t : layout.tables) {
    if (t.name.empty()) return Status::InvalidArgument("a table without a name");
    if (!names.insert(t.name).second) {
      return Status::InvalidArgument("table " + t.name + " appears twice");
    }
    s = CheckColumns(t.columns);
    if (!s.ok()) return Status::InvalidArgument("table " + t.name + ": " + s.message());
  }
  return Status::Ok();
}

Bytes OrdinalKey(size_t ordinal) {
  Bytes key(4);
  for (int i = 0; i < 4; ++i) key[i] = uint8_t(ordinal >> (8 * (3 - i)));
  return key;
}

Status TableEntries(const TableLayout& table, TaggedLayout layout,
                    std::vector<TreeEntry>* entries) {
  for (size_t i = 0; i < table.rows.size(); ++i) {
    const RowLayout& row = table.rows[i];
    TreeEntry e;
    e.key = row.key.empty() ? OrdinalKey(i + 1) : row.key;
    e.deleted = row.deleted;
    Status s = EncodeRecord(table.columns, row.cells, layout, &e.data);
    if (!s.ok()) {
      return Status::InvalidArgument("table " + table.name + " row " + std::to_string(i + 1) +
                                     ": " + s.message());
    }
    entries->push_back(std::move(e));
  }
  std::stable_sort(entries->begin(), entries->end(),
                   [](const TreeEntry& a, const TreeEntry& b) { return a.key < b.key; });
  return Status::Ok();
}

Status LongValueEntries(const TableLayout& table, const PageFormat& format,
                        const FileDamage& damage, std::vector<TreeEntry>* entries,
                        LongValueCounts* counts) {
  const uint32_t chunk_size = table.long_value_chunk_size
                                  ? table.long_value_chunk_size
                                  : DefaultLongValueChunkSize(format, table.long_value_id_size);
  std::vector<const LongValueLayout*> values;
  for (const LongValueLayout& v : table.long_values) values.push_back(&v);
  std::stable_sort(
      values.begin(), values.end(),
      [](const LongValueLayout* a, const LongValueLayout* b) { return a->id < b->id; });
  for (const LongValueLayout* v : values) {
    std::optional<uint32_t> dropped;
    for (const DroppedChunk& d : damage.dropped_chunks) {
      if (d.table == table.name && d.long_value_id == v->id) dropped = d.chunk;
    }
    Status s =
        AppendLongValueEntries(*v, table.long_value_id_size, chunk_size, dropped, entries, counts);
    if (!s.ok()) return Status::InvalidArgument("table " + table.name + ": " + s.message());
  }
  return Status::Ok();
}

Status WriteTree(DatabaseWriter* db, const TreeOptions& options,
                 const std::vector<TreeEntry>& entries, TreeLayout* layout) {
  TreeWriter writer(db->format(), options, db->allocator(), db->sink());
  for (const TreeEntry& e : entries) {
    Status s = writer.Add(e);
    if (!s.ok()) return s;
  }
  return writer.Finish(layout);
}

Status Build(const DatabaseLayout& layout, const FileDamage& damage, Manifest* manifest,
             Bytes* out) {
  Status s = CheckLayout(layout);
  if (!s.ok()) return s;
  PageMap pages;
  PageMapSink sink(&pages);
  DatabaseWriter db(layout, &sink);
  std::map<std::string, LongValueCounts> counts;

  for (const TableLayout& table : layout.tables) {
    std::vector<TreeEntry> entries;
    s = TableEntries(table, db.layout(), &entries);
    if (!s.ok()) return s;
    TreeOptions options = db.NewTree(0);
    options.max_entries_per_leaf = table.max_rows_per_leaf;
    options.max_children_per_branch = table.max_children_per_branch;
    TreeLayout tree;
    s = WriteTree(&db, options, entries, &tree);
    if (!s.ok()) return Status::InvalidArgument("table " + table.name + ": " + s.message());
    if (table.long_values.empty()) {
      db.AddTable(table.name, table.columns, options, tree, nullptr, nullptr);
      continue;
    }
    std::vector<TreeEntry> lv_entries;
    s = LongValueEntries(table, db.format(), damage, &lv_entries, &counts[table.name]);
    if (!s.ok()) return s;
    TreeOptions lv_options = db.NewTree(kPageFlagLongValue);
    lv_options.max_entries_per_leaf = table.max_long_value_nodes_per_leaf;
    lv_options.max_children_per_branch = table.max_long_value_children_per_branch;
    lv_options.full_leaf_prefix = table.long_value_full_leaf_prefix;
    TreeLayout lv_tree;
    s = WriteTree(&db, lv_options, lv_entries, &lv_tree);
    if (!s.ok()) {
      return Status::InvalidArgument("table " + table.name + " long values: " + s.message());
    }
    db.AddTable(table.name, table.columns, options, tree, &lv_options, &lv_tree);
  }

  Bytes header;
  Manifest local;
  s = db.Finish(&header, &local);
  if (!s.ok()) return s;
  out->assign(size_t(db.total_pages() + 2) * layout.page_size, 0);
  std::copy(header.begin(), header.end(), out->begin());
  std::copy(header.begin(), header.end(), out->begin() + layout.page_size);
  for (const auto& [number, image] : pages) {
    std::copy(image.begin(), image.end(), out->begin() + size_t(number + 1) * layout.page_size);
  }
  if (manifest) {
    *manifest = std::move(local);
    for (const auto& entry : pages) manifest->written_pages.push_back(entry.first);
    for (TableManifest& t : manifest->tables) {
      auto it = counts.find(t.name);
      if (it == counts.end()) continue;
      t.long_value_chunks = it->second.chunks;
      t.compressed_chunks = it->second.compressed;
    }
  }
  return Status::Ok();
}

void ApplyDamage(const FileDamage& damage, uint32_t page_size, Bytes* file) {
  if (damage.drop_header_pages) {
    file->erase(file->begin(), file->begin() + std::min<size_t>(file->size(), 2 * page_size));
  }
  if (damage.junk_prefix > 0) {
    Bytes junk(damage.junk_prefix);
    uint8_t x = kJunkSeed;
    for (uint8_t& b : junk) {
      x = uint8_t(x * 33 + 7);  // a fixed byte sequence that looks like nothing in particular
      b = x;
    }
    file->insert(file->begin(), junk.begin(), junk.end());
  }
}

}  // namespace

Bytes BuildDatabase(const DatabaseLayout& layout, Manifest* manifest, const FileDamage& damage,
                    Status* status) {
  Bytes file;
  Status s = Build(layout, damage, manifest, &file);
  if (status) *status = s;
  if (!s.ok()) return Bytes();
  ApplyDamage(damage, layout.page_size, &file);
  return file;
}

Status WriteDatabase(const DatabaseLayout& layout, const std::string& path, Manifest* manifest,
                     const FileDamage& damage) {
  Status s;
  Bytes file = BuildDatabase(layout, manifest, damage, &s);
  if (!s.ok()) return s;
  std::FILE* f = std::fopen(path.c_str(), "wb");
  if (!f) return Status::IoError("cannot create " + path);
  bool ok = std::fwrite(file.data(), 1, file.size(), f) == file.size();
  ok = std::fclose(f) == 0 && ok;
  return ok ? Status::Ok() : Status::IoError("cannot write " + path);
}

}  // namespace tarnwell::forge
