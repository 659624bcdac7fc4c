#include "cli/dump_command.h"

#include <fmt/format.h>

#include "base/json_writer.h"
#include "cli/tables_command.h"
#include "engine/column_decoder.h"

namespace tarnwell::cli {
namespace {

using Kind = engine::DecodedColumn::Kind;

void WriteJsonValue(JsonWriter& w, const engine::DecodedColumn& d) {
  switch (d.kind) {
    case Kind::kAbsent:
      w.Null();
      break;
    case Kind::kBool:
      w.Bool(d.b);
      break;
    case Kind::kSigned:
      w.Int(d.i);
      break;
    case Kind::kUnsigned:
      w.Uint(d.u);
      break;
    case Kind::kDouble:
      w.Double(d.d);
      break;
    case Kind::kDateTime:
    case Kind::kGuid:
    case Kind::kText:
      w.String(d.text);
      break;
    case Kind::kBinary:
      w.PlainString(ToHex(ByteView(d.bytes)));
      break;
    case Kind::kMulti:
      w.BeginArray();
      for (const auto& v : d.values) WriteJsonValue(w, v);
      w.EndArray();
      break;
    case Kind::kUnsupported:
    case Kind::kDamaged:
      w.BeginObject();
      w.Key(d.kind == Kind::kUnsupported ? "unsupported" : "damaged").String(d.text);
      if (!d.bytes.empty()) w.Key("bytes").String(ToHex(ByteView(d.bytes)));
      w.EndObject();
      break;
  }
}

std::string TextValue(const engine::DecodedColumn& d) {
  switch (d.kind) {
    case Kind::kAbsent:
      return "";
    case Kind::kBool:
      return d.b ? "true" : "false";
    case Kind::kSigned:
      return std::to_string(d.i);
    case Kind::kUnsigned:
      return std::to_string(d.u);
    case Kind::kDouble:
      return fmt::format("{}", d.d);
    case Kind::kDateTime:
    case Kind::kGuid:
    case Kind::kText:
      return d.text;
    case Kind::kBinary:
      return ToHex(ByteView(d.bytes));
    case Kind::kMulti: {
      std::string out = "[";
      for (size_t i = 0; i < d.values.size(); ++i) {
        if (i) out += ", ";
        out += TextValue(d.values[i]);
      }
      return out + "]";
    }
    case Kind::kUnsupported:
      return "<" + d.text + ">";
    case Kind::kDamaged:
      return "<damaged: " + d.text + ">";
  }
  return "";
}

}  // namespace

Status DumpTable(engine::EdbClass& reader, const std::string& table_name, bool json, FILE* out) {
  const engine::TableDef* table = reader.FindTable(table_name);
  if (!table) return Status::NotFound("no table named \"" + table_name + "\"");
  const engine::LongValueReader long_values = reader.long_values();
  const engine::ColumnDecoder decoder(&long_values,
                                      table->long_value ? table->long_value->root_page() : 0);

  if (json) {
    JsonWriter head;
    head.BeginObject().Key("table").String(table->name()).Key("columns").BeginArray();
    for (const auto& c : table->columns) {
      head.BeginObject().Key("id").Uint(c.id).Key("name").String(c.name).Key("type").String(
          ColumnTypeName(c.column_type()));
      head.EndObject();
    }
    head.EndArray();
    std::string text = head.str();
    text += ",\"records\":[";
    std::fwrite(text.data(), 1, text.size(), out);
  } else {
    std::fprintf(out, "Table %s\n", table->name().c_str());
  }

  uint64_t count = 0;
  const int walked =
      reader.ForEachRecord(*table, [&](const engine::RecordRef&, engine::RecordColumns& columns) {
        std::string text;
        if (json) {
          JsonWriter w;
          w.BeginObject();
          for (size_t i = 0; i < table->columns.size(); ++i) {
            engine::DecodedColumn d = decoder.Decode(table->columns[i], columns.at(i));
            if (d.kind == Kind::kAbsent) continue;
            w.Key(table->columns[i].name);
            WriteJsonValue(w, d);
          }
          w.EndObject();
          text = (count ? "," : "") + w.str() + "\n";
        } else {
          text = fmt::format("Record {}\n", count + 1);
          for (size_t i = 0; i < table->columns.size(); ++i) {
            engine::DecodedColumn d = decoder.Decode(table->columns[i], columns.at(i));
            if (d.kind == Kind::kAbsent) continue;
            text += fmt::format("  {}: {}\n", table->columns[i].name, TextValue(d));
          }
        }
        std::fwrite(text.data(), 1, text.size(), out);
        ++count;
        return true;
      });
  if (json) std::fputs("]}\n", out);
  if (walked != 1) return Status::Corruption("the table's tree could not be walked whole");
  return Status::Ok();
}

}  // namespace tarnwell::cli
