// PstStore: the messaging layer of a PST file: the message store, the
// name-to-id map, the folder tree (root folder, "Top of Personal Folders",
// the special folders a new file needs), folders with their hierarchy,
// contents and associated-contents tables, and messages with recipients,
// attachments and embedded messages.
//
// Folder and message handles are node ids. Tables of the folders a session
// changes are kept in memory and written by Commit, so adding the n-th
// message to a folder costs the same as the first.
#ifndef TARNWELL_MAPI_PST_PST_STORE_H_
#define TARNWELL_MAPI_PST_PST_STORE_H_

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "base/status.h"
#include "mapi/property_bag.h"
#include "mapi/pst/node.h"
#include "mapi/pst/pst_file.h"

namespace tarnwell::mapi::pst {

// The default folders a session asks for by kind.
enum class DefaultFolder { kCalendar, kContacts, kJournal, kNotes, kTasks, kDeletedItems };

struct FolderInfo {
  Nid nid = 0;
  std::string name;             // PidTagDisplayName
  std::string container_class;  // PidTagContainerClass; empty for mail folders
  uint32_t content_count = 0;
  bool has_subfolders = false;
};

class PstStore {
 public:
  // A new PST with every node a valid empty store needs; `display_name`
  // names the store ("Personal Folders" when empty).
  static Status Create(const std::string& path, const std::string& display_name,
                       std::unique_ptr<PstStore>* out);
  static Status Open(const std::string& path, bool writable, std::unique_ptr<PstStore>* out);
  ~PstStore();

  std::string display_name() const;
  // The root of the folder tree, and "Top of Personal Folders" below it,
  // where the user's folders live.
  Nid root_folder() const;
  Nid top_folder() const;

  // Finds the default folder of a kind (through the entry ids the store
  // records); creates it below the top folder with its standard name and
  // class, and records it, when missing (writable stores only).
  Status GetDefaultFolder(DefaultFolder kind, Nid* out);

  Status GetFolder(Nid folder, FolderInfo* out) const;
  std::vector<FolderInfo> SubFolders(Nid folder) const;
  // Adds a folder below `parent`; `container_class` may be empty.
  Status AddFolder(Nid parent, const std::string& name, const std::string& container_class,
                   Nid* out);
  // The entry id of a folder or message (flags, the store's record key, the
  // node id), and back.
  Bytes EntryId(Nid nid) const;
  bool NidFromEntryId(ByteView entry_id, Nid* out) const;

  // Messages of a folder (contents table order).
  std::vector<Nid> Messages(Nid folder) const;
  // Stores `message` as a new message of `folder`; `size` receives the
  // message size recorded for it (PidTagMessageSize).
  Status AddMessage(Nid folder, const Message& message, Nid* out, uint64_t* size);
  Status ReadMessage(Nid message, Message* out) const;
  Status DeleteMessage(Nid folder, Nid message);

  // Writes the changed tables and commits the file.
  Status Commit();
  uint64_t file_size() const;
  PstFile& file();

 private:
  struct Impl;
  explicit PstStore(std::unique_ptr<Impl> impl);
  std::unique_ptr<Impl> impl_;
};

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_PST_STORE_H_
