#include "cli/export_command.h"

#include <sstream>

#include "app/check_tree_model.h"
#include "app/export_options.h"
#include "app/file_export_job.h"
#include "app/pst_export_job.h"

namespace tarnwell::cli {
namespace {

std::vector<std::string> SplitList(const std::string& text) {
  std::vector<std::string> out;
  std::stringstream in(text);
  std::string item;
  while (std::getline(in, item, ',')) {
    if (!item.empty()) out.push_back(item);
  }
  return out;
}

// Sets `flags` (in the order of `names`) from a comma list.
Status ParseSwitches(const std::string& text, const std::vector<std::string>& names, bool* flags,
                     const char* what) {
  for (size_t i = 0; i < names.size(); ++i) flags[i] = false;
  for (const std::string& item : SplitList(text)) {
    bool known = false;
    for (size_t i = 0; i < names.size(); ++i) {
      if (item == names[i]) flags[i] = known = true;
    }
    if (!known)
      return Status::InvalidArgument("unknown " + std::string(what) + " \"" + item + "\"");
  }
  return Status::Ok();
}

bool ParseDate(const std::string& text, app::CalendarDate* date) {
  char tail = 0;
  return std::sscanf(text.c_str(), "%d-%d-%d%c", &date->year, &date->month, &date->day, &tail) ==
             3 &&
         date->month >= 1 && date->month <= 12 && date->day >= 1 && date->day <= 31;
}

// The format page.
Status CheckFormat(const ExportCommandOptions& o, app::ExportOptions* options) {
  Status s = ParseSwitches(o.name_by, {"to", "from", "subject", "date"}, options->name_by,
                           "naming part");
  if (!s.ok()) return s;
  options->keep_hierarchy = o.hierarchy;
  return app::CheckFormatPage(options, o.out, std::time(nullptr));
}

// The PST page: "500MB" or "2GB" as the split size.
Status CheckPst(const ExportCommandOptions& o, app::ExportOptions* options) {
  const bool create_new = o.existing_pst.empty();
  std::string size = o.split_size;
  bool gigabytes = false;
  for (const char* unit : {"GB", "gb", "MB", "mb"}) {
    const size_t n = size.size();
    if (n > 2 && size.compare(n - 2, 2, unit) == 0) {
      gigabytes = unit[0] == 'G' || unit[0] == 'g';
      size.resize(n - 2);
      break;
    }
  }
  if (!o.split_size.empty() && size == o.split_size) {
    return Status::InvalidArgument("a split size ends in MB or GB, as 500MB or 2GB");
  }
  if (!create_new && !o.split_size.empty()) {
    return Status::InvalidArgument("an existing PST is not split");
  }
  Status s = app::CheckPstPage(options, create_new, create_new ? o.out : o.existing_pst,
                               !o.split_size.empty(), size, gigabytes);
  if (!s.ok()) return s;
  options->split_by_user = o.split_by_user;
  return Status::Ok();
}

// The check-box tree: the chosen folders (with everything below them), or
// the whole tree; the checked folders depth-first.
Status CheckedFolders(StoreSession& session, const std::vector<std::string>& refs,
                      std::vector<app::ExportFolder>* out) {
  app::CheckTreeModel tree;
  const app::ItemId top = tree.InsertItem(session.top_text());
  std::vector<app::ItemId> items;
  for (const ShownFolder& f : session.folders()) {
    const app::ItemId parent = f.parent < 0 ? top : items[size_t(f.parent)];
    const app::ItemId item = tree.InsertItem(f.path.back(), f.icon, f.icon, parent);
    tree.SetItemData(item, items.size());
    items.push_back(item);
  }
  if (refs.empty()) {
    tree.SetCheck(top, true);
  } else {
    for (const std::string& ref : refs) {
      const ShownFolder* f = session.FindFolder(ref);
      if (!f) return Status::NotFound("no folder with reference \"" + ref + "\"");
      tree.SetCheck(items[size_t(f - session.folders().data())], true);
    }
  }
  for (app::ItemId item : tree.CheckedFolders()) {
    if (item == top) continue;
    const ShownFolder& f = session.folders()[tree.GetItemData(item)];
    out->push_back({f.folder, f.path});
  }
  return Status::Ok();
}

}  // namespace

Status RunExport(const ExportCommandOptions& o, ProgressSink& progress, ExportSummary* summary) {
  app::ExportOptions options;
  if (o.to == "eml") {
    options.format = app::OutputFormat::kEml;
  } else if (o.to == "mbox") {
    options.format = app::OutputFormat::kMbox;
  } else if (o.to == "pst") {
    options.pst_target = true;
  } else {
    return Status::InvalidArgument("unknown format \"" + o.to + "\" (eml, mbox or pst)");
  }
  // The filter page.
  if (!o.dedup.empty()) {
    options.dedup_on = true;
    Status s = ParseSwitches(o.dedup, {"to", "from", "subject", "created", "modified", "arrival"},
                             options.dedup_by, "duplicate criterion");
    if (!s.ok()) return s;
  }
  for (const std::string& range : o.date_ranges) {
    const size_t dots = range.find("..");
    app::DateRange r;
    if (dots == std::string::npos || !ParseDate(range.substr(0, dots), &r.start) ||
        !ParseDate(range.substr(dots + 2), &r.end)) {
      return Status::InvalidArgument(
          "a date range is written START..END, as 2021-01-31..2021-12-31");
    }
    Status s = app::AddDateRange(&options.date_ranges, r);
    if (!s.ok()) return s;
  }
  if (!o.date_ranges.empty() || o.exclude_ranges) {
    options.date_mode = o.exclude_ranges ? app::DateMode::kExclude : app::DateMode::kInside;
  }
  Status s = app::CheckFilterPage(options);
  if (!s.ok()) return s;
  if (options.pst_target) {
    s = CheckPst(o, &options);
  } else {
    s = CheckFormat(o, &options);
  }
  if (!s.ok()) return s;

  StoreSession session;
  s = session.Open(o.scan, progress);
  if (!s.ok()) return s;
  std::vector<app::ExportFolder> folders;
  s = CheckedFolders(session, o.folders, &folders);
  if (!s.ok()) return s;
  session.BeginJob();
  if (options.pst_target) {
    app::PstExportRequest request;
    request.options = options;
    request.folders = std::move(folders);
    request.source_path = o.scan.db;
    request.store_text = o.ansi_code_page == 0;
    request.ansi_code_page = o.ansi_code_page ? o.ansi_code_page : 1252;
    request.log_dir = o.log_dir;
    app::PstExportResult result;
    s = app::RunPstExport(session.store(), request, session.running(), progress, &result);
    if (!s.ok()) return s;
    summary->destination = options.pst_mode == 1 ? options.save_path : options.existing_pst;
    summary->log_path = result.log_path;
    summary->pst_files = result.files;
    summary->folders = result.folders.size();
    for (const app::FolderResult& f : result.folders) {
      summary->found += f.found;
      summary->saved += f.saved;
    }
    return Status::Ok();
  }
  app::FileExportRequest request;
  request.options = options;
  request.folders = std::move(folders);
  request.source_path = o.scan.db;
  request.keep_native = o.keep_native;
  request.store_text = o.ansi_code_page == 0;
  request.ansi_code_page = o.ansi_code_page ? o.ansi_code_page : 1252;
  request.log_dir = o.log_dir;
  app::FileExportResult result;
  s = app::RunFileExport(session.store(), request, session.running(), progress, &result);
  if (!s.ok()) return s;
  summary->destination = options.destination;
  summary->log_path = result.log_path;
  summary->folders = result.folders.size();
  for (const app::FolderResult& f : result.folders) {
    summary->found += f.found;
    summary->saved += f.saved;
  }
  return Status::Ok();
}

}  // namespace tarnwell::cli
