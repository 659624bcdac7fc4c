#include "app/scan_driver.h"

#include <filesystem>

#include "engine/catalog.h"
#include "store/legacy_store.h"
#include "store/modern_store.h"

namespace tarnwell::app {
namespace {

namespace fs = std::filesystem;

// Reports each stage to the progress sink and remembers it.
class Stages {
 public:
  Stages(ProgressSink& progress, ScanOutcome& outcome) : progress_(progress), outcome_(outcome) {}
  void Enter(const char* text) {
    progress_.Stage(text);
    outcome_.stages.push_back(text);
  }

 private:
  ProgressSink& progress_;
  ScanOutcome& outcome_;
};

struct StageTexts {
  const char* mailboxes;
  const char* folders;
  const char* tree;
  const char* show;
  const char* messages;
  const char* attachments;
};

constexpr StageTexts kStandardTexts = {
    "Traversing mailBox table",         "Traversing folder table to find folder data",
    "Creating Internal tree Structure", "Showing Data in tree control",
    "Creating msg map from msg table",  "Creating Attachment map from Attachment table",
};

constexpr StageTexts kAdvanceTexts = {
    "Finding Users",
    "Traversing Folder Table to find folder data",
    "Creating internal tree structure",
    "Showing Data in tree control",
    "Creating Msg map from msg Table",
    "Creating Attachment Map from attachment table",
};

}  // namespace

Status OpenSource(const RunSettings& settings, uint64_t source_number, ProgressSink& progress,
                  SourceEntry* source) {
  std::unique_ptr<engine::EdbClass> reader = engine::MakeReader(settings.version_code);
  if (!reader) return Status::InvalidArgument(kVersionNotDetected);
  const bool legacy = settings.version_code != engine::kExchange2010 &&
                      settings.version_code != engine::kExchange2013;
  source->mailboxes_only = settings.mailboxes_only;
  if (legacy && !settings.stm_path.empty() &&
      !reader->OpenStreamFile(settings.stm_path, engine::SourceDescriptor{})) {
    progress.Message(kStmCannotBeOpened);  // the scan goes on without it
  }
  if (!reader->OpenDatabase(settings.edb_path, engine::SourceDescriptor{}, settings.version_code)) {
    return Status::IoError(kFileCannotBeOpened);
  }
  source->version_code = settings.version_code;
  source->adjustment_check = settings.adjustment_check;
  source->mode = settings.mode;
  source->non_english = settings.non_english;
  source->edb_path = settings.edb_path;
  source->work_folder = (fs::path(settings.temp_root) / std::to_string(source_number)).string();
  std::error_code ec;
  fs::create_directories(source->work_folder, ec);
  if (ec) return Status::IoError(source->work_folder + ": " + ec.message());
  source->reader = std::move(reader);
  return Status::Ok();
}

ScanOutcome RunScan(SourceEntry& source, uint64_t source_number, RunningFlag& running,
                    ProgressSink& progress, store::FolderTreeSink& tree) {
  ScanOutcome outcome;
  Stages stages(progress, outcome);
  engine::EdbClass& reader = *source.reader;
  reader.SetProgress(&progress);
  reader.SetRunningFlag(&running);
  const bool advance = source.mode != store::ScanMode::kStandard;
  const StageTexts& texts = advance ? kAdvanceTexts : kStandardTexts;

  auto finish = [&]() {
    outcome.stopped = !running.load();
    progress.Stage("");
    progress.Message(kScanCompleted);
    running.store(false);
    return outcome;
  };

  if (source.adjustment_check == 1) {
    stages.Enter("Checking Adjustment Factor");
    reader.FindAdjustmentFactor();
  }

  if (!advance) {
    stages.Enter("Reading Catalog");
    if (reader.CollectTreeRecords(engine::kCatalogRootPage) != 1) return finish();
    stages.Enter("Traversing record");
    if (reader.ParseCatalogRecords() != 1) return finish();
    stages.Enter("Finding Table names");
    reader.GetTableNames();
  } else {
    stages.Enter("Finding Pages in File");
    if (!reader.ScanLeafPages()) {
      running.store(false);
      return outcome;
    }
    stages.Enter("Reading Catalog for Leaf Pages");
    if (reader.CollectLeafPageRecords() == 1) {
      stages.Enter("Traversing record Vector");
      if (reader.ParseCatalogRecords() == 1) {
        stages.Enter("Collecting Table Names");
        reader.GetTableNames();
      }
    }
  }

  const bool modern =
      source.version_code == engine::kExchange2010 || source.version_code == engine::kExchange2013;
  if (modern) {
    auto s = std::make_unique<store::ModernStore>(reader, source.version_code, source.mode);
    s->SetWorkFolder(source.work_folder);
    source.store = std::move(s);
  } else {
    auto s = std::make_unique<store::LegacyStore>(reader, source.version_code, source.mode);
    s->SetWorkFolder(source.work_folder);
    source.store = std::move(s);
  }
  store::MailStore& store = *source.store;

  stages.Enter(texts.mailboxes);
  store.WalkMailboxes();
  // The modern generation names no stage for its per-mailbox folder tables.
  if (!modern) stages.Enter(texts.folders);
  if (!modern || !source.mailboxes_only) store.WalkFolders();
  stages.Enter(texts.tree);
  store.LinkTree(progress);
  stages.Enter(texts.show);
  outcome.tree_shown = store.ShowTree(source.edb_path, source_number, tree);
  if (!outcome.tree_shown) return finish();
  stages.Enter(texts.messages);
  store.BuildMessageMap();
  stages.Enter(texts.attachments);
  store.BuildAttachmentMap();
  return finish();
}

}  // namespace tarnwell::app
