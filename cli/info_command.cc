#include "cli/info_command.h"

#include <fmt/format.h>

#include "base/json_writer.h"
#include "engine/edb_class.h"

namespace tarnwell::cli {

Status CollectDatabaseInfo(const std::string& path, ProgressSink& progress, DatabaseInfo* info) {
  *info = DatabaseInfo();
  info->path = path;
  std::unique_ptr<engine::EdbClass> reader;
  Status s = engine::InspectDatabase(path, &reader);
  if (!s.ok()) return s;
  reader->SetProgress(&progress);
  const engine::DatabaseHeader& h = reader->header();
  info->signature_ok = h.signature == engine::kDatabaseSignature;
  info->format_version = h.format_version;
  info->format_revision = h.format_revision;
  info->header_page_size = h.page_size;
  info->state = h.state;
  info->state_name = engine::DatabaseStateName(h.state);
  info->version_code = reader->version();
  if (const engine::VersionInfo* v = engine::FindVersion(reader->version())) {
    info->version_name = v->name;
    info->version_page_size = v->page_size;
    if (v->page_size != h.page_size) {
      info->warning = fmt::format(
          "the header's page size ({}) differs from the {} bytes of {}; read with the header's",
          h.page_size, v->page_size, v->name);
    }
  }
  info->adjustment = reader->file().adjustment();
  info->total_pages = reader->file().total_pages();
  progress.Stage("Finding Pages in File");
  reader->ScanLeafPages();
  info->leaf_pages = reader->leaf_pages().size();
  return Status::Ok();
}

std::string FormatInfoText(const DatabaseInfo& i) {
  std::string out;
  out += fmt::format("File:               {}\n", i.path);
  out += fmt::format("Signature:          {}\n", i.signature_ok ? "ok (0x89ABCDEF)" : "wrong");
  out += fmt::format("Format:             0x{:X}, revision {} (0x{:X})\n", i.format_version,
                     i.format_revision, i.format_revision);
  if (i.version_code > 0) {
    out += fmt::format("Exchange version:   {} ({})\n", i.version_code, i.version_name);
  } else {
    out += "Exchange version:   none (the revision names no Exchange version)\n";
  }
  if (i.version_page_size) {
    out += fmt::format("Page size:          {} (header), {} (version)\n", i.header_page_size,
                       i.version_page_size);
  } else {
    out += fmt::format("Page size:          {} (header)\n", i.header_page_size);
  }
  out += fmt::format("Adjustment factor:  {}\n", i.adjustment);
  out += fmt::format("Total pages:        {}\n", i.total_pages);
  out += fmt::format("Leaf pages:         {}\n", i.leaf_pages);
  out +=
      fmt::format("State:              {} ({})\n", i.state_name, i.state == 3 ? "clean" : "dirty");
  if (!i.warning.empty()) out += fmt::format("Note:               {}\n", i.warning);
  return out;
}

std::string FormatInfoJson(const DatabaseInfo& i) {
  JsonWriter w;
  w.BeginObject();
  w.Key("file").String(i.path);
  w.Key("signature_ok").Bool(i.signature_ok);
  w.Key("format_version").Uint(i.format_version);
  w.Key("format_revision").Uint(i.format_revision);
  w.Key("version_code").Int(i.version_code);
  w.Key("version_name").String(i.version_name);
  w.Key("page_size_header").Uint(i.header_page_size);
  w.Key("page_size_version").Uint(i.version_page_size);
  w.Key("adjustment_factor").Int(i.adjustment);
  w.Key("total_pages").Uint(i.total_pages);
  w.Key("leaf_pages").Uint(i.leaf_pages);
  w.Key("state").Uint(i.state);
  w.Key("state_name").String(i.state_name);
  w.Key("clean").Bool(i.state == 3);
  if (!i.warning.empty()) w.Key("warning").String(i.warning);
  w.EndObject();
  return w.str() + "\n";
}

}  // namespace tarnwell::cli
