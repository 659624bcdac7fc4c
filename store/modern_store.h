// ModernStore: the mailbox store of an Exchange 2010 or 2013+ database,
// which keeps one set of tables per mailbox:
//
//   table                     rows
//   Mailbox                   one per mailbox
//   Folder_<n>                folders of mailbox n (2013+)
//   Message_<n>               messages of mailbox n (2013+)
//   Attachment_<n>            attachments of mailbox n (2013+)
//   Folders-<x>, Body-<x>     folders and messages of one mailbox (2010);
//                             x is cut from the mailbox number in hexadecimal
//
// A mailbox's folders and maps are loaded into its MailboxContext when it is
// first used, and reused after. Conventions where the Exchange documents are
// silent: a folder whose parent id is the mailbox number, or 0, is a top
// folder of that mailbox; a message's attachments are the attachment rows
// that carry its "MessageDocumentId", in table order; folder ids are 8-byte
// binaries read little-endian.
#ifndef TARNWELL_STORE_MODERN_STORE_H_
#define TARNWELL_STORE_MODERN_STORE_H_

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "engine/edb_class.h"
#include "store/folder_tree.h"
#include "store/item_records.h"
#include "store/key_ordinal_map.h"
#include "store/location_file.h"
#include "store/mail_store.h"
#include "store/property_decoder.h"

namespace tarnwell::store {

// The folder table of a mailbox: "Folder_" + n (2013+), or "Folders-" + the
// text before the first run of four '0' in the number's lower-case hex, "-",
// and the upper-cased text after the last such run starting at index 1 or
// later (2010).
std::string ModernFolderTableName(int version, uint64_t mailbox_number);

struct MailboxContext {
  uint32_t node_index = 0;  // the mailbox's node in the store's folder list
  uint64_t number = 0;
  std::string folder_table, message_table, attachment_table;
  std::string work_folder;
  bool loaded = false;
  FolderList folders;  // the mailbox's own folders, top folders under ROOT
  KeyOrdinalMap message_map;
  LocationFile message_locations;
  // The FolderMessageMap: folder id -> message keys, in table order.
  std::map<uint64_t, std::vector<uint64_t>> folder_messages;
  // (owning message's document id or key, attachment record), sorted
  // stably by owner.
  std::vector<std::pair<uint64_t, RecordLocation>> attachment_index;
  bool attachments_indexed = false;
};

class ModernStore : public MailStore {
 public:
  ModernStore(engine::EdbClass& reader, int version, ScanMode mode);

  // Where the mailboxes' work folders go (one sub-folder each).
  void SetWorkFolder(const std::string& folder) { work_folder_ = folder; }

  // Reads "Mailbox": one node under ROOT per mailbox, each naming its folder
  // table (state byte 1).
  bool WalkMailboxes() override;
  // Loads every mailbox, as if each had been selected.
  bool WalkFolders() override;
  const FolderList& folders() const { return folders_; }
  bool public_store() const override { return public_store_; }
  void SetRunningFlag(RunningFlag* running) override { reader_.SetRunningFlag(running); }
  void LinkTree(ProgressSink& progress) override { folders_.LinkTree(progress); }
  // The mailboxes under the top item, each loaded mailbox's folders under it.
  bool ShowTree(const std::string& database_path, uint64_t source_number,
                FolderTreeSink& sink) override;
  // A modern store's maps belong to its mailboxes: built as they load.
  bool BuildMessageMap() override { return true; }
  bool BuildAttachmentMap() override { return true; }

  const FolderNode* Folder(FolderRef ref) override;
  std::vector<MessageSummary> ListFolder(FolderRef ref) override;
  std::optional<ItemRecords> OpenMessage(FolderRef ref, uint64_t key,
                                         DecodePurpose* purpose) override;
  std::vector<AttachmentRecord> ListAttachments(FolderRef ref, uint64_t key) override;

  // The context of the mailbox at node `index`, loaded on first use; null
  // for a node that is not a mailbox.
  MailboxContext* Mailbox(uint32_t node_index);

  std::vector<MessageSummary> ListFolder(MailboxContext& mailbox, uint32_t folder_index);
  std::optional<ItemRecords> OpenMessage(MailboxContext& mailbox, uint64_t message_key,
                                         DecodePurpose* purpose);
  std::vector<AttachmentRecord> ListAttachments(MailboxContext& mailbox, uint64_t message_key);

 private:
  const engine::TableDef* FindTable(const std::string& name) const;
  void Load(MailboxContext& mailbox);
  std::optional<engine::RecordRef> FindMessage(MailboxContext& mailbox, uint64_t key);

  engine::EdbClass& reader_;
  int version_;
  ScanMode mode_;
  PropertyDecoder decoder_;
  std::string work_folder_;
  FolderList folders_;
  bool public_store_ = false;
  std::map<uint32_t, std::unique_ptr<MailboxContext>> mailboxes_;
};

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_MODERN_STORE_H_
