#include "app/pst_export_job.h"

#include <locale.h>
#include <wctype.h>

#include <filesystem>

#include "app/item_render.h"
#include "base/paths.h"
#include "base/text.h"
#include "export/export_log.h"
#include "mapi/import/class_fillers.h"
#include "mapi/property_tags.h"
#include "mapi/session.h"
#include "render/mime/mime_sink.h"

namespace tarnwell::app {
namespace {

namespace fs = std::filesystem;

constexpr int kPermille = 1000;
constexpr size_t kMailboxLevel = 1;  // path[0] is the source's top item

std::string JoinPath(const std::vector<std::string>& path, size_t from) {
  std::string out;
  for (size_t i = from; i < path.size(); ++i) {
    if (i > from) out += "\\";
    out += path[i];
  }
  return out;
}

// Upper case for every script the C.UTF-8 locale knows, not only ASCII.
std::string Upper(const std::string& text) {
  static const locale_t utf8 = newlocale(LC_CTYPE_MASK, "C.UTF-8", locale_t(0));
  std::string out;
  size_t pos = 0;
  while (pos < text.size()) {
    char32_t cp = DecodeUtf8(text, &pos);
    if (utf8) cp = char32_t(towupper_l(wint_t(cp), utf8));
    AppendUtf8(cp, &out);
  }
  return out;
}

// Where an item of a class goes: the mirrored folder, or a default folder.
std::optional<mapi::DefaultFolderKind> DefaultFolderFor(const std::string& message_class,
                                                        ItemKind kind) {
  switch (kind) {
    case ItemKind::kAppointment:
      return mapi::DefaultFolderKind::kCalendar;
    case ItemKind::kContact:
      return mapi::DefaultFolderKind::kContacts;
    case ItemKind::kJournal:
      return mapi::DefaultFolderKind::kJournal;
    case ItemKind::kTask:
      return mapi::DefaultFolderKind::kTasks;
    case ItemKind::kNote:
      // Posts share the note kind for rendering but stay with the mail.
      if (AsciiLower(message_class).find("stickynote") != std::string::npos) {
        return mapi::DefaultFolderKind::kNotes;
      }
      return std::nullopt;
    default:
      return std::nullopt;
  }
}

void AddAttachments(std::vector<store::AttachmentRecord>& attachments, mapi::Message* message) {
  for (store::AttachmentRecord& a : attachments) {
    mapi::Attachment out;
    const std::string name = a.name.empty() ? "Unknown" : ToValidUtf8(a.name);
    out.properties.Set(mapi::kPidAttachMethod, mapi::PropertyValue::Int32(mapi::kAttachByValue));
    out.properties.Set(mapi::kPidAttachLongFilename, mapi::PropertyValue::Unicode(name));
    out.properties.Set(mapi::kPidAttachFilename, mapi::PropertyValue::Unicode(name));
    out.properties.Set(mapi::kPidDisplayName, mapi::PropertyValue::Unicode(name));
    out.data = std::move(a.data);
    message->attachments.push_back(std::move(out));
  }
}

// One run of the job: the session, the log and the running size of the
// current file.
class PstWriter {
 public:
  PstWriter(store::MailStore& store, const PstExportRequest& request, RunningFlag& running,
            ProgressSink& progress, exporter::ExportLog& log, PstExportResult* result)
      : store_(store),
        request_(request),
        options_(request.options),
        running_(running),
        progress_(progress),
        log_(log),
        result_(result) {
    compose_.store_text = request.store_text;
    compose_.ansi_code_page = request.ansi_code_page;
    text_mode_ = {request.store_text, request.ansi_code_page};
  }

  // One PST for `entries` (indexes into the request's folders).
  bool WriteFolderSet(const std::vector<size_t>& entries, const std::string& base_name) {
    pst_bytes_ = kEmptyPstBytes;
    base_name_ = base_name;
    std::string path;
    if (options_.pst_mode == 2) {
      path = options_.existing_pst;
    } else {
      path = FreePstPath(options_.save_path, PstFileName(base_name));
    }
    if (!Logon(path)) return false;
    log_.Write("Creating tree in PST...\r\n");
    for (size_t index : entries) {
      mapi::FolderHandle folder;
      if (!MakeFolderPath(request_.folders[index].path, &folder)) return false;
    }
    for (size_t index : entries) {
      if (!running_.load()) break;
      const ExportFolder& entry = request_.folders[index];
      const std::string tree_path = JoinPath(entry.path, kMailboxLevel);
      progress_.Stage("dumping Folder " + tree_path);
      log_.FolderStart(tree_path);
      if (!SaveFolder(entry, tree_path)) return false;
    }
    Status s = session_.Logoff();
    if (!s.ok()) {
      log_.Error(s.message() + "\r\n");
      return false;
    }
    return true;
  }

  Status Finish() { return session_.Logoff(); }

 private:
  bool Logon(const std::string& path) {
    Status s = session_.LogonPstStore(path);
    if (!s.ok()) {
      log_.Error("Logon in outlook failed...\r\n");
      log_.Error(path + ": " + s.message() + "\r\n");
      return false;
    }
    if (!session_.RootFolder(&root_).ok()) {
      log_.Error("Rdostore failed...\r\n");
      return false;
    }
    result_->files.push_back(path);
    current_path_ = path;
    return true;
  }

  // Walks a folder's path down from the root, adding what is missing.
  bool MakeFolderPath(const std::vector<std::string>& path, mapi::FolderHandle* out) {
    mapi::FolderHandle at = root_;
    for (size_t i = kMailboxLevel; i < path.size(); ++i) {
      if (std::optional<mapi::FolderHandle> found = session_.FindSubFolder(at, path[i])) {
        at = *found;
        continue;
      }
      Status s = session_.AddSubFolder(at, path[i], FolderClassForName(path[i]), &at);
      if (!s.ok()) {
        log_.Error("cannot create folder " + path[i] + ": " + s.message() + "\r\n");
        return false;
      }
    }
    *out = at;
    return true;
  }

  // The next numbered file of the run, with the folder being written made
  // again there.
  bool NextSplitFile(const ExportFolder& entry, mapi::FolderHandle* target) {
    Status s = session_.Logoff();
    if (!s.ok()) log_.Error(s.message() + "\r\n");
    pst_bytes_ = kEmptyPstBytes;
    const std::string folder = options_.pst_mode == 2
                                   ? fs::path(options_.existing_pst).parent_path().string()
                                   : options_.save_path;
    const std::string name = options_.pst_mode == 2
                                 ? fs::path(options_.existing_pst).filename().string()
                                 : PstFileName(base_name_);
    return Logon(FreePstPath(folder, name)) && MakeFolderPath(entry.path, target);
  }

  bool SaveFolder(const ExportFolder& entry, const std::string& tree_path) {
    FolderResult counts;
    counts.directory = current_path_;
    mapi::FolderHandle target;
    if (!MakeFolderPath(entry.path, &target)) return false;
    std::vector<store::MessageSummary> rows = store_.ListFolder(entry.folder);
    counts.found = rows.size();
    log_.ItemsFound(rows.size());
    progress_.Range(0, kPermille);
    ItemFilter filter(options_);
    uint64_t counter = 0;
    for (const store::MessageSummary& row : rows) {
      if (!running_.load()) break;
      ++counter;
      progress_.Position(int(counter * kPermille / rows.size()));
      progress_.Stage(row.subject + " is saving");
      if (!filter.Passes(row)) continue;
      if (options_.split_enabled && pst_bytes_ >= options_.split_size) {
        if (!NextSplitFile(entry, &target)) return false;
      }
      OpenedItem item;
      if (!OpenItem(store_, entry.folder, row, text_mode_, &item)) {
        log_.Error("item " + std::to_string(counter) + " of " + tree_path +
                   " has no message record\r\n");
        continue;
      }
      Status s = SaveItem(item, target);
      if (!s.ok()) {
        log_.Error("item " + std::to_string(counter) + " of " + tree_path + ": " + s.message() +
                   "\r\n");
        continue;
      }
      ++counts.saved;
    }
    log_.ItemsSaved(counts.saved);
    result_->folders.push_back(counts);
    return true;
  }

  Status SaveItem(OpenedItem& item, mapi::FolderHandle target) {
    mapi::FolderHandle folder = target;
    if (auto kind = DefaultFolderFor(item.message_class, item.kind)) {
      Status s = session_.GetDefaultFolder(*kind, &folder);
      if (!s.ok()) return s;
    }
    // The composed file stays in memory: nothing is left behind on disk.
    Bytes composed;
    if (!item.native.empty()) {
      composed.assign(item.native.begin(), item.native.end());
    } else {
      render::BytesSink sink(&composed);
      Status s = ComposeItem(item, "", compose_, &sink);
      if (!s.ok()) return s;
    }
    std::unique_ptr<mapi::Item> pst_item = session_.AddItem(folder, item.message_class);
    Status s = pst_item->ImportBytes(composed);
    if (!s.ok()) return s;
    composed = Bytes();
    // A vCard or iCalendar file has no room for attachments: they come from
    // the item itself.
    if (!item.native.empty()) AddAttachments(item.attachments, &pst_item->message());
    mapi::FillFromRecords(item.records, *item.row, item.message_class, &pst_item->message());
    s = pst_item->Save();
    if (!s.ok()) return s;
    pst_bytes_ += pst_item->size();
    return Status::Ok();
  }

  store::MailStore& store_;
  const PstExportRequest& request_;
  const ExportOptions& options_;
  RunningFlag& running_;
  ProgressSink& progress_;
  exporter::ExportLog& log_;
  PstExportResult* result_;
  render::ComposeOptions compose_;
  render::TextMode text_mode_;
  mapi::Session session_;
  mapi::FolderHandle root_;
  std::string base_name_, current_path_;
  uint64_t pst_bytes_ = kEmptyPstBytes;
};

}  // namespace

std::string PstFileName(const std::string& base_name) {
  size_t cut = base_name.find_last_of("\\/");
  std::string name = cut == std::string::npos ? base_name : base_name.substr(cut + 1);
  return SafeFileName(Upper(name + ".pst"));
}

std::string FreePstPath(const std::string& folder, const std::string& name) {
  std::error_code ec;
  fs::path first = fs::path(folder) / name;
  if (!fs::exists(first, ec)) return first.string();
  for (uint64_t n = 0;; ++n) {
    fs::path numbered = fs::path(folder) / (std::to_string(n) + name);
    if (!fs::exists(numbered, ec)) return numbered.string();
  }
}

std::string FolderClassForName(const std::string& name) {
  const std::string lower = AsciiLower(name);
  if (lower == "tasks") return "IPF.Task";
  if (lower == "calendar") return "IPF.Appointment";
  if (lower == "notes") return "IPF.StickyNote";
  if (lower == "journal") return "IPF.Journal";
  if (lower == "contacts") return "IPF.Contact";
  return "";
}

Status RunPstExport(store::MailStore& store, const PstExportRequest& request, RunningFlag& running,
                    ProgressSink& progress, PstExportResult* result) {
  const ExportOptions& options = request.options;
  if (options.pst_mode != 1 && options.pst_mode != 2) {
    return Status::InvalidArgument("choose a new PST or an existing one");
  }
  store.SetRunningFlag(&running);
  const std::time_t started = request.now ? request.now : std::time(nullptr);
  std::error_code ec;
  if (options.pst_mode == 1) {
    fs::create_directories(options.save_path, ec);
    if (ec) return Status::IoError(options.save_path + ": " + ec.message());
  }
  const std::string save_path = options.pst_mode == 1 ? options.save_path : options.existing_pst;

  exporter::ExportLog log;
  log.Open(request.log_dir.empty() ? exporter::DesktopFolder() : request.log_dir, started,
           request.source_path, save_path, "");
  result->log_path = log.path();
  log.StartTime(started);
  log.Write("Processing Checked items in tree..\r\n");
  log.Write("Initializing session..\r\n");

  PstWriter writer(store, request, running, progress, log, result);
  if (options.split_by_user) {
    // One file per mailbox: the mailbox's entries, which follow each other
    // in the depth-first list (the mailbox itself need not be checked).
    for (size_t i = 0; i < request.folders.size() && running.load();) {
      const std::vector<std::string>& path = request.folders[i].path;
      if (path.size() <= kMailboxLevel) {
        ++i;
        continue;
      }
      std::vector<size_t> set;
      size_t j = i;
      for (; j < request.folders.size(); ++j) {
        const std::vector<std::string>& other = request.folders[j].path;
        if (other.size() <= kMailboxLevel || other[kMailboxLevel] != path[kMailboxLevel]) break;
        set.push_back(j);
      }
      writer.WriteFolderSet(set, path[kMailboxLevel]);
      progress.Position(int(j));
      i = j;
    }
  } else {
    std::vector<size_t> all(request.folders.size());
    for (size_t i = 0; i < all.size(); ++i) all[i] = i;
    writer.WriteFolderSet(all, request.source_path);
  }
  Status s = writer.Finish();
  if (!s.ok()) log.Error(s.message() + "\r\n");
  result->stopped = !running.load();
  const std::time_t ended = request.now ? request.now : std::time(nullptr);
  log.End(save_path, started, ended);
  progress.Message(kDataExtracted + save_path);
  return Status::Ok();
}

}  // namespace tarnwell::app
