// Session: the small mail-system surface the export jobs drive. It logs on
// to one PST at a time (opening or creating it), walks and adds folders,
// adds items, imports composed files into them, sets properties, saves.
//
// A folder is named by a FolderHandle that stays valid for the store it came
// from; a new logon (the next mailbox, the next split file) invalidates the
// handles of the previous store.
#ifndef TARNWELL_MAPI_SESSION_H_
#define TARNWELL_MAPI_SESSION_H_

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/status.h"
#include "mapi/property_bag.h"
#include "mapi/pst/pst_store.h"

namespace tarnwell::mapi {

// Default folders by the numbers the mail system gives their kinds.
enum class DefaultFolderKind : int {
  kDeletedItems = 3,
  kCalendar = 9,
  kContacts = 10,
  kJournal = 11,
  kNotes = 12,
  kTasks = 13,
};

// The one import format: an RFC 822 message. vCard and iCalendar files are
// recognised by their first line and imported as contacts and appointments.
inline constexpr int kImportRfc822 = 1024;

struct FolderHandle {
  pst::Nid nid = 0;
  bool operator==(const FolderHandle&) const = default;
};

class Session;

// A new item of a folder, not in the store until Save.
class Item {
 public:
  // Reads a composed file into the item (replacing what it held; the
  // message class given at creation is kept).
  Status Import(const std::string& path, int format);
  Status ImportBytes(ByteView file);
  void Put(uint16_t id, PropertyValue value) { message_.properties.Set(id, std::move(value)); }
  void PutNamed(const NamedProperty& name, PropertyValue value) {
    message_.properties.SetNamed(name, std::move(value));
  }
  Message& message() { return message_; }
  // Stores the item; size() is valid afterwards.
  Status Save();
  uint64_t size() const { return size_; }

 private:
  friend class Session;
  Item(Session* session, FolderHandle folder, std::string message_class);
  Session* session_;
  FolderHandle folder_;
  std::string message_class_;
  Message message_;
  uint64_t size_ = 0;
  bool saved_ = false;
};

class Session {
 public:
  Session();
  ~Session();

  bool LoggedOn() const { return store_ != nullptr; }
  // Commits and closes the store.
  Status Logoff();
  // The version of the mail system behind the session; never empty.
  std::string Version() const;
  // Opens the PST at `path`, creating it (named `display_name`) when it does
  // not exist.
  Status LogonPstStore(const std::string& path, const std::string& display_name = "");

  // The store's folder tree. RootFolder is where a user's folders go (the
  // store's top folder).
  Status RootFolder(FolderHandle* out) const;
  Status GetDefaultFolder(DefaultFolderKind kind, FolderHandle* out);
  Status GetFolderFromId(ByteView entry_id, FolderHandle* out) const;
  Bytes EntryId(FolderHandle folder) const;
  std::vector<pst::FolderInfo> SubFolders(FolderHandle folder) const;
  // Finds a sub-folder by name (without regard to case); nullopt when none.
  std::optional<FolderHandle> FindSubFolder(FolderHandle parent, const std::string& name) const;
  Status AddSubFolder(FolderHandle parent, const std::string& name,
                      const std::string& container_class, FolderHandle* out);

  // A new item of `message_class` for `folder`.
  std::unique_ptr<Item> AddItem(FolderHandle folder, const std::string& message_class);
  // Bytes the store's file occupies now.
  uint64_t StoreSize() const;
  pst::PstStore* store() { return store_.get(); }

 private:
  friend class Item;
  std::unique_ptr<pst::PstStore> store_;
};

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_SESSION_H_
