#include "app/file_export_job.h"

#include "app/item_render.h"

#include <openssl/evp.h>

#include <filesystem>

#include "base/paths.h"
#include "base/text.h"
#include "export/export_log.h"
#include "render/eml_composer.h"
#include "render/ical_writer.h"
#include "render/mbox_writer.h"
#include "render/mime/mime_sink.h"
#include "render/vcard_writer.h"

namespace tarnwell::app {
namespace {

namespace fs = std::filesystem;

constexpr size_t kMaxPathUnits = 256;  // folder path + name, in UTF-16 units
constexpr size_t kCutMargin = 20;      // what a cut name gives up beyond the overflow
constexpr size_t kMaxNameBytes = 255;  // one file-name component on Linux
constexpr int kPermille = 1000;
inline constexpr char kForbidden[] = "\\/:*?\"<>|";
inline constexpr char kTemporarySuffix[] = ".part";

// Control characters and the characters Windows forbids in names become
// spaces; the result is one safe path component.
std::string CleanComponent(const std::string& text) {
  std::string out = ToValidUtf8(text);
  for (char& c : out) {
    if (static_cast<unsigned char>(c) < 0x20 || std::strchr(kForbidden, c)) c = ' ';
  }
  return out;
}

// Cuts UTF-8 text to at most `units` UTF-16 units and `bytes` bytes, never
// inside a character.
std::string CutText(const std::string& text, size_t units, size_t bytes) {
  size_t pos = 0, count = 0, end = 0;
  while (pos < text.size()) {
    size_t next = pos;
    const char32_t cp = DecodeUtf8(text, &next);
    const size_t cost = cp >= 0x10000 ? 2 : 1;
    if (count + cost > units || next > bytes) break;
    count += cost;
    pos = next;
    end = pos;
  }
  return text.substr(0, end);
}

std::string JoinPath(const std::vector<std::string>& path, const char* separator) {
  std::string out;
  for (size_t i = 0; i < path.size(); ++i) {
    if (i) out += separator;
    out += path[i];
  }
  return out;
}

// Writes a file through a temporary name, so that a failed or stopped write
// leaves nothing half-written under the final name.
class AtomicFile {
 public:
  explicit AtomicFile(std::string path) : path_(std::move(path)), temp_(path_ + kTemporarySuffix) {}
  ~AtomicFile() {
    if (file_) {
      std::fclose(file_);
      std::remove(temp_.c_str());
    }
  }
  FILE* Open() {
    file_ = std::fopen(temp_.c_str(), "wb");
    return file_;
  }
  bool Commit() {
    const bool ok = std::fflush(file_) == 0 && !std::ferror(file_);
    std::fclose(file_);
    file_ = nullptr;
    if (!ok || std::rename(temp_.c_str(), path_.c_str()) != 0) {
      std::remove(temp_.c_str());
      return false;
    }
    return true;
  }

 private:
  std::string path_, temp_;
  FILE* file_ = nullptr;
};

}  // namespace

std::string ItemFileName(const store::MessageSummary& row, const std::string& date_text,
                         const bool name_by[4], uint64_t counter, const std::string& extension,
                         size_t folder_path_length) {
  std::string base;
  if (name_by[0]) base += row.to;
  if (name_by[1]) base += row.sender;
  if (name_by[2]) base += row.subject;
  if (name_by[3]) base += date_text;
  base = CleanComponent(base);
  const std::string tail = std::to_string(counter) + extension;
  const size_t units = Utf16Length(base) + Utf16Length(tail);
  if (folder_path_length + units >= kMaxPathUnits) {
    const size_t overflow = folder_path_length + units - kMaxPathUnits;
    const size_t base_units = Utf16Length(base);
    const size_t keep = base_units > overflow + kCutMargin ? base_units - overflow - kCutMargin : 0;
    base = CutText(base, keep, SIZE_MAX);
  }
  // Whatever the count in characters, a name must fit the file system.
  base = CutText(base, SIZE_MAX, kMaxNameBytes - tail.size());
  // A name of dots or leading blanks would hide the file or climb out.
  while (!base.empty() && (base.front() == '.' || base.front() == ' ')) base.erase(base.begin());
  return base + tail;
}

std::string DuplicateDigest(const store::MessageSummary& row, const bool dedup_by[6]) {
  std::string key;
  if (dedup_by[0] && row.to != " ") key += row.to;
  if (dedup_by[1] && row.sender != " ") key += row.sender;
  if (dedup_by[2]) key += row.subject;
  if (dedup_by[3]) key += row.created;
  if (dedup_by[4]) key += row.modified;
  if (dedup_by[5]) key += row.received;
  std::string low_bytes;
  for (char16_t unit : Utf8ToUtf16(key)) low_bytes.push_back(char(unit & 0xFF));
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int length = 0;
  EVP_Digest(low_bytes.data(), low_bytes.size(), digest, &length, EVP_md5(), nullptr);
  return std::string(reinterpret_cast<char*>(digest), length);
}

Status RunFileExport(store::MailStore& store, const FileExportRequest& request,
                     RunningFlag& running, ProgressSink& progress, FileExportResult* result) {
  const ExportOptions& options = request.options;
  const bool mbox = options.format == OutputFormat::kMbox;
  if (!mbox && options.format != OutputFormat::kEml) {
    return Status::NotSupported(std::string(FormatName(options.format)) +
                                " export is not available yet");
  }
  // Every loop below polls this job's flag, the reader's walks included.
  store.SetRunningFlag(&running);
  const std::time_t started = request.now ? request.now : std::time(nullptr);
  const std::string& destination = options.destination;
  std::error_code ec;
  fs::create_directories(destination, ec);
  if (ec) return Status::IoError(destination + ": " + ec.message());

  exporter::ExportLog log;
  log.Open(request.log_dir.empty() ? exporter::DesktopFolder() : request.log_dir, started,
           request.source_path, destination, FormatLogName(options.format));
  result->log_path = log.path();
  log.StartTime(started);
  log.Write("Processing Checked items in tree..\r\n");

  render::ComposeOptions compose;
  compose.store_text = request.store_text;
  compose.ansi_code_page = request.ansi_code_page;
  const render::TextMode text_mode{request.store_text, request.ansi_code_page};

  for (const ExportFolder& folder : request.folders) {
    if (!running.load()) break;
    if (folder.path.empty()) continue;
    // The folder's directory: its whole tree path, or only its own name.
    fs::path dir = destination;
    if (options.keep_hierarchy) {
      // The top item names the database by its path: its file name stands
      // for it.
      for (size_t i = 0; i < folder.path.size(); ++i) {
        dir /= SafeFileName(i == 0 ? fs::path(folder.path[i]).filename().string() : folder.path[i]);
      }
    } else {
      dir /= SafeFileName(folder.path.back());
    }
    if (!IsInside(destination, dir.string())) continue;
    fs::create_directories(dir, ec);
    const std::string tree_path = JoinPath(folder.path, "\\");
    log.Write("dumping Folder " + folder.path.back() + "\r\n");
    log.FolderStart(tree_path);
    FolderResult counts;
    counts.directory = dir.string();

    progress.Stage("Dumping Mails");
    render::MboxWriter mailbox;
    if (mbox && !mailbox.Open((dir / render::kMboxFileName).string()).ok()) {
      log.Error("cannot create " + (dir / render::kMboxFileName).string() + "\r\n");
    }
    std::vector<store::MessageSummary> rows = store.ListFolder(folder.folder);
    counts.found = rows.size();
    log.ItemsFound(rows.size());
    progress.Range(0, kPermille);
    ItemFilter filter(options);
    uint64_t counter = 0;
    for (const store::MessageSummary& row : rows) {
      if (!running.load()) break;
      ++counter;
      progress.Position(int(counter * kPermille / rows.size()));
      progress.Stage(row.subject + " is saving");
      if (!filter.Passes(row)) continue;
      OpenedItem item;
      if (!OpenItem(store, folder.folder, row, text_mode, &item)) {
        log.Error("item " + std::to_string(counter) + " of " + tree_path +
                  " has no message record\r\n");
        continue;
      }
      const std::string& native = item.native;
      const std::string& native_extension = item.native_extension;
      const std::string date_text = item.headers.date_text;
      const bool write_native = !native.empty() && request.keep_native && !mbox;
      const std::string extension = write_native ? native_extension : ".eml";
      const std::string name = ItemFileName(row, date_text, options.name_by, counter, extension,
                                            Utf16Length(dir.string()) + 1);
      // Composed straight into the file (or the mailbox), so that a large
      // attachment is never held twice.
      auto compose_into = [&](render::MimeSink* out) -> Status {
        if (write_native) {
          out->Write(native);
          return out->ok() ? Status::Ok() : Status::IoError("write failed");
        }
        return ComposeItem(item, std::to_string(counter) + native_extension, compose, out);
      };
      Status s;
      if (mbox) {
        render::MimeSink* sink = mailbox.Begin(started);
        if (!sink) continue;
        s = compose_into(sink);
        Status end = mailbox.End();
        if (s.ok()) s = end;
      } else {
        AtomicFile file((dir / name).string());
        FILE* f = file.Open();
        if (!f) {
          s = Status::IoError("cannot be created");
        } else {
          render::FileSink sink(f);
          s = compose_into(&sink);
          if (s.ok() && (!sink.ok() || !file.Commit())) s = Status::IoError("cannot be written");
        }
      }
      if (!s.ok()) {
        log.Error(name + ": " + s.message() + "\r\n");
        continue;
      }
      ++counts.saved;
    }
    log.ItemsSaved(counts.saved);
    result->folders.push_back(counts);
  }
  result->stopped = !running.load();
  const std::time_t ended = request.now ? request.now : std::time(nullptr);
  log.End(destination, started, ended);
  progress.Message(kDataExtracted + destination);
  return Status::Ok();
}

}  // namespace tarnwell::app
