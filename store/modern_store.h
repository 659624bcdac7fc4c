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
//
// Exchange 2013 and later servers write more than that: ids of 26 bytes
// (keyed by their last 8 bytes, like "MessageId"; a parent of all zeros is
// a top folder), property blobs with 3-byte entries whose values may lie in
// the row's "SeparatedPropertyNN" columns, "OffPagePropertyBlob" beside
// "PropertyBlob", recipients in "RecipientList", a message's attachment
// "Inid"s in its "SubobjectsBlob", and named properties numbered per mailbox
// ("ExtendedPropertyNameMapping_n", named_property_map.h). Both are read:
// the blob layout is told by its header, the rest by what the rows hold.
#ifndef TARNWELL_STORE_MODERN_STORE_H_
#define TARNWELL_STORE_MODERN_STORE_H_

#include <cstdint>
#include <functional>
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
#include "store/named_property_map.h"
#include "store/property_decoder.h"
#include "store/recipient_list.h"
#include "store/row_values.h"

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
  // Attachment rows by "Inid", for messages that list theirs in
  // "SubobjectsBlob".
  std::map<uint64_t, RecordLocation> attachments_by_inid;
  NamedPropertyMap named;
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

  // The recipients of a message, from its "RecipientList"; empty when the
  // row has none.
  std::vector<Recipient> Recipients(FolderRef ref, uint64_t message_key);

 private:
  // Fetches a row's "SeparatedPropertyNN" value by slot.
  using SeparatedValues = std::function<std::optional<Bytes>(uint16_t slot)>;

  // Decodes a "PropertyBlob" / "OffPagePropertyBlob" value. Blobs of the
  // layout servers write go entry by entry, named properties by meaning
  // (through the mailbox's map; without one they are left out), far values
  // from `separated`; with `only`, entries of other names are left out.
  // Blobs of the other layout go to the decoder as the column they are.
  void DecodeBlob(const MailboxContext* mailbox, DecodePurpose purpose, const RowValue& value,
                  const SeparatedValues& separated, ItemRecords* records,
                  const std::vector<std::string>* only = nullptr) const;
  void IndexAttachments(MailboxContext& mailbox);
  // The message row's columns; false when the key maps no readable row.
  bool ReadMessageColumns(MailboxContext& mailbox, uint64_t key, engine::RecordColumns* columns);

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
