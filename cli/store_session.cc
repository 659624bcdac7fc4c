#include "cli/store_session.h"

#include <fmt/format.h>

#include <filesystem>
#include <map>

#include "base/paths.h"
#include "engine/version.h"

namespace tarnwell::cli {
namespace {

namespace fs = std::filesystem;

// Collects the tree the scan shows, with each folder's path of names. The
// reference of a folder is its id in hexadecimal; in a store that keeps a
// folder list per mailbox, the mailbox number and the folder id.
class CollectingTree : public store::FolderTreeSink {
 public:
  CollectingTree(app::SourceEntry* source, std::vector<ShownFolder>* out, std::string* top_text)
      : source_(source), out_(out), top_text_(top_text) {}

  int64_t AddTopItem(const std::string& text, int, uint64_t) override {
    *top_text_ = text;
    paths_[0] = {text};
    return 0;
  }
  int64_t AddFolder(int64_t parent, const std::string& text, int icon,
                    uint32_t folder_index) override {
    return Add(parent, text, icon, {-1, folder_index});
  }
  int64_t AddMailboxFolder(int64_t parent, const std::string& text, int icon, int32_t mailbox,
                           uint32_t folder_index) override {
    return Add(parent, text, icon, {mailbox, folder_index});
  }

 private:
  int64_t Add(int64_t parent, const std::string& text, int icon, store::FolderRef ref) {
    store::MailStore& store = *source_->store;
    ShownFolder f;
    f.folder = ref;
    f.icon = icon;
    const store::FolderNode* node = store.Folder(ref);
    const uint64_t id = node ? node->folder_id : 0;
    if (ref.mailbox >= 0) {
      const store::FolderNode* mailbox = store.Folder({-1, uint32_t(ref.mailbox)});
      f.ref = fmt::format("{:x}:{:x}", mailbox ? mailbox->folder_id : 0, id);
    } else {
      f.ref = fmt::format("{:x}", id);
    }
    f.path = paths_[parent];
    f.path.push_back(text);
    f.parent = int(parent) - 1;  // handles are positions + 1; the top item is 0
    const int64_t handle = int64_t(out_->size()) + 1;
    paths_[handle] = f.path;
    out_->push_back(std::move(f));
    return handle;
  }

  app::SourceEntry* source_;
  std::vector<ShownFolder>* out_;
  std::string* top_text_;
  std::map<int64_t, std::vector<std::string>> paths_;
};

}  // namespace

Status ParseVersion(const std::string& text, const std::string& db, int* code) {
  static const std::map<std::string, int> kNames = {
      {"5.5", engine::kExchange55},    {"2000", engine::kExchange2000},
      {"2003", engine::kExchange2000}, {"2007", engine::kExchange2007},
      {"2010", engine::kExchange2010}, {"2013", engine::kExchange2013}};
  if (text == "auto") {
    const int detected = engine::EdbClass::DetectVersion(db);
    if (detected < 0) return Status::IoError(app::kFileCannotBeOpened);
    if (detected == 0) return Status::NotSupported(app::kVersionNotDetected);
    *code = detected;
    return Status::Ok();
  }
  auto it = kNames.find(text);
  if (it == kNames.end()) {
    return Status::InvalidArgument("unknown version \"" + text +
                                   "\" (auto, 5.5, 2000, 2003, 2007, 2010 or 2013)");
  }
  *code = it->second;
  return Status::Ok();
}

const char* VersionName(int code) {
  const engine::VersionInfo* v = engine::FindVersion(code);
  return v ? v->name : "unknown";
}

StoreSession::~StoreSession() {
  source_.store.reset();
  source_.reader.reset();
  if (own_temp_ && !temp_root_.empty()) {
    std::error_code ec;
    fs::remove_all(temp_root_, ec);
  }
}

Status StoreSession::Open(const ScanOptions& options, ProgressSink& progress) {
  int code = 0;
  Status s = ParseVersion(options.version, options.db, &code);
  if (!s.ok()) return s;
  if (options.mode != "standard" && options.mode != "advance") {
    return Status::InvalidArgument("unknown mode \"" + options.mode + "\" (standard or advance)");
  }
  if (options.temp.empty()) {
    s = MakeTempDir("tarnwell-scan", &temp_root_);
    if (!s.ok()) return s;
    own_temp_ = true;
  } else {
    temp_root_ = options.temp;
  }
  settings_.edb_path = options.db;
  settings_.stm_path = options.stm;
  settings_.temp_root = temp_root_;
  settings_.version_code = code;
  settings_.mode =
      options.mode == "advance" ? store::ScanMode::kAdvance : store::ScanMode::kStandard;
  settings_.adjustment_check = options.adjust ? 1 : 0;
  settings_.mailboxes_only = options.mailboxes_only;
  constexpr uint64_t kSourceNumber = 1;
  s = app::OpenSource(settings_, kSourceNumber, progress, &source_);
  if (!s.ok()) return s;
  running_.store(true);
  CollectingTree tree(&source_, &folders_, &top_text_);
  outcome_ = app::RunScan(source_, kSourceNumber, running_, progress, tree);
  if (!outcome_.tree_shown) {
    return Status::Corruption("no mailbox or public folder tree was found in " + options.db);
  }
  return Status::Ok();
}

const ShownFolder* StoreSession::FindFolder(const std::string& ref) const {
  for (const ShownFolder& f : folders_) {
    if (f.ref == ref) return &f;
  }
  return nullptr;
}

}  // namespace tarnwell::cli
