#include "cli/tables_command.h"

#include <fmt/format.h>

#include "base/json_writer.h"
#include "engine/catalog.h"

namespace tarnwell::cli {

Status OpenWithCatalog(const std::string& path, ProgressSink& progress,
                       std::unique_ptr<engine::EdbClass>* reader) {
  Status s = engine::InspectDatabase(path, reader);
  if (!s.ok()) return s;
  engine::EdbClass& r = **reader;
  r.SetProgress(&progress);
  progress.Stage("Reading Catalog");
  if (r.CollectTreeRecords(engine::kCatalogRootPage) != 1) {
    return Status::Corruption("the catalog at page 4 cannot be read");
  }
  progress.Stage("Traversing record");
  r.ParseCatalogRecords();
  return Status::Ok();
}

std::string ColumnTypeName(uint32_t type) {
  static const char* const kNames[] = {
      "nil",       "bit",    "unsigned byte", "short",     "long", "currency",
      "float",     "double", "date time",     "binary",    "text", "long binary",
      "long text", "slv",    "unsigned long", "long long", "guid", "unsigned short"};
  if (type < sizeof kNames / sizeof kNames[0]) return kNames[type];
  return "type " + std::to_string(type);
}

std::string FormatTablesText(const engine::EdbClass& reader) {
  std::string out;
  for (const engine::TableDef& t : reader.tables()) {
    out += fmt::format("{}  (object {}, root page {}", t.name(), t.table.id, t.table.root_page());
    if (t.long_value) out += fmt::format(", long values at page {}", t.long_value->root_page());
    out += ")\n";
    for (const engine::CatalogEntry& c : t.columns) {
      out += fmt::format("  {:>5}  {:<32} {:<14} size {:<6} code page {}\n", c.id, c.name,
                         ColumnTypeName(c.column_type()), c.size, c.code_page);
    }
  }
  return out;
}

std::string FormatTablesJson(const engine::EdbClass& reader) {
  JsonWriter w;
  w.BeginArray();
  for (const engine::TableDef& t : reader.tables()) {
    w.BeginObject();
    w.Key("name").String(t.name());
    w.Key("object_id").Uint(t.table.id);
    w.Key("root_page").Uint(t.table.root_page());
    if (t.long_value) {
      w.Key("long_value_root").Uint(t.long_value->root_page());
    } else {
      w.Key("long_value_root").Null();
    }
    w.Key("columns").BeginArray();
    for (const engine::CatalogEntry& c : t.columns) {
      w.BeginObject();
      w.Key("id").Uint(c.id);
      w.Key("name").String(c.name);
      w.Key("type").String(ColumnTypeName(c.column_type()));
      w.Key("type_code").Uint(c.column_type());
      w.Key("size").Uint(c.size);
      w.Key("code_page").Uint(c.code_page);
      w.EndObject();
    }
    w.EndArray();
    w.EndObject();
  }
  w.EndArray();
  return w.str() + "\n";
}

}  // namespace tarnwell::cli
