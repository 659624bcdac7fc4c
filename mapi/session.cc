#include "mapi/session.h"

#include <filesystem>
#include <fstream>
#include <iterator>

#include "base/text.h"
#include "mapi/import/icalendar_import.h"
#include "mapi/import/internet_message_import.h"
#include "mapi/import/vcard_import.h"
#include "mapi/property_tags.h"

namespace tarnwell::mapi {
namespace {

inline constexpr char kVersion[] = "Tarnwell PST 1.0";
// Composed files larger than this are refused rather than read whole.
inline constexpr uintmax_t kMaxImportBytes = uintmax_t(4) << 30;

bool StartsWithLine(std::string_view text, std::string_view line) {
  size_t at = 0;
  // A byte-order mark or blank lines may come first.
  if (text.substr(0, 3) == "\xEF\xBB\xBF") at = 3;
  while (at < text.size() && (text[at] == '\r' || text[at] == '\n' || text[at] == ' ')) ++at;
  return AsciiLower(text.substr(at, line.size())) == AsciiLower(line);
}

}  // namespace

Item::Item(Session* session, FolderHandle folder, std::string message_class)
    : session_(session), folder_(folder), message_class_(std::move(message_class)) {
  message_.properties.Set(kPidMessageClass, PropertyValue::Unicode(message_class_));
}

Status Item::Import(const std::string& path, int format) {
  if (format != kImportRfc822) return Status::NotSupported("unknown import format");
  std::error_code ec;
  const uintmax_t size = std::filesystem::file_size(path, ec);
  if (ec) return Status::IoError(path + ": " + ec.message());
  if (size > kMaxImportBytes) return Status::NotSupported(path + ": too large to import");
  std::ifstream in(path, std::ios::binary);
  if (!in) return Status::IoError(path + ": cannot be opened");
  Bytes bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  return ImportBytes(bytes);
}

Status Item::ImportBytes(ByteView file) {
  Message imported;
  const std::string_view text(reinterpret_cast<const char*>(file.data()), file.size());
  Status s;
  if (StartsWithLine(text, "BEGIN:VCARD")) {
    s = ImportVCard(text, &imported);
  } else if (StartsWithLine(text, "BEGIN:VCALENDAR")) {
    s = ImportICalendar(text, &imported);
  } else {
    s = ImportInternetMessage(file, &imported);
  }
  if (!s.ok()) return s;
  message_ = std::move(imported);
  message_.properties.Set(kPidMessageClass, PropertyValue::Unicode(message_class_));
  return Status::Ok();
}

Status Item::Save() {
  if (saved_) return Status::InvalidArgument("the item is already saved");
  if (!session_->store_) return Status::InvalidArgument("not logged on");
  pst::Nid nid = 0;
  Status s = session_->store_->AddMessage(folder_.nid, message_, &nid, &size_);
  if (s.ok()) saved_ = true;
  return s;
}

Session::Session() = default;
Session::~Session() { Logoff(); }

Status Session::Logoff() {
  if (!store_) return Status::Ok();
  Status s = store_->Commit();
  store_.reset();
  return s;
}

std::string Session::Version() const { return kVersion; }

Status Session::LogonPstStore(const std::string& path, const std::string& display_name) {
  Status s = Logoff();
  if (!s.ok()) return s;
  std::error_code ec;
  if (std::filesystem::exists(path, ec)) return pst::PstStore::Open(path, true, &store_);
  return pst::PstStore::Create(path, display_name, &store_);
}

Status Session::RootFolder(FolderHandle* out) const {
  if (!store_) return Status::InvalidArgument("not logged on");
  out->nid = store_->top_folder();
  return out->nid ? Status::Ok() : Status::NotFound("the store has no folder tree");
}

Status Session::GetDefaultFolder(DefaultFolderKind kind, FolderHandle* out) {
  if (!store_) return Status::InvalidArgument("not logged on");
  pst::DefaultFolder which;
  switch (kind) {
    case DefaultFolderKind::kCalendar:
      which = pst::DefaultFolder::kCalendar;
      break;
    case DefaultFolderKind::kContacts:
      which = pst::DefaultFolder::kContacts;
      break;
    case DefaultFolderKind::kJournal:
      which = pst::DefaultFolder::kJournal;
      break;
    case DefaultFolderKind::kNotes:
      which = pst::DefaultFolder::kNotes;
      break;
    case DefaultFolderKind::kTasks:
      which = pst::DefaultFolder::kTasks;
      break;
    case DefaultFolderKind::kDeletedItems:
      which = pst::DefaultFolder::kDeletedItems;
      break;
    default:
      return Status::InvalidArgument("unknown default folder kind");
  }
  return store_->GetDefaultFolder(which, &out->nid);
}

Status Session::GetFolderFromId(ByteView entry_id, FolderHandle* out) const {
  if (!store_) return Status::InvalidArgument("not logged on");
  pst::FolderInfo info;
  if (!store_->NidFromEntryId(entry_id, &out->nid) || !store_->GetFolder(out->nid, &info).ok()) {
    return Status::NotFound("no folder with that entry id");
  }
  return Status::Ok();
}

Bytes Session::EntryId(FolderHandle folder) const {
  return store_ ? store_->EntryId(folder.nid) : Bytes();
}

std::vector<pst::FolderInfo> Session::SubFolders(FolderHandle folder) const {
  return store_ ? store_->SubFolders(folder.nid) : std::vector<pst::FolderInfo>();
}

std::optional<FolderHandle> Session::FindSubFolder(FolderHandle parent,
                                                   const std::string& name) const {
  const std::string wanted = AsciiLower(name);
  for (const pst::FolderInfo& f : SubFolders(parent)) {
    if (AsciiLower(f.name) == wanted) return FolderHandle{f.nid};
  }
  return std::nullopt;
}

Status Session::AddSubFolder(FolderHandle parent, const std::string& name,
                             const std::string& container_class, FolderHandle* out) {
  if (!store_) return Status::InvalidArgument("not logged on");
  return store_->AddFolder(parent.nid, name, container_class, &out->nid);
}

std::unique_ptr<Item> Session::AddItem(FolderHandle folder, const std::string& message_class) {
  return std::unique_ptr<Item>(new Item(this, folder, message_class));
}

uint64_t Session::StoreSize() const { return store_ ? store_->file_size() : 0; }

}  // namespace tarnwell::mapi
