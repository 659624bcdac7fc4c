// LegacyStore: the mailbox store of an Exchange 5.5, 2000/2003 or 2007
// database, read through the engine's reader.
//
// Tables (catalog names; the table-name list drops everything up to the
// first '-'):
//
//   table            rows
//   Mailbox          one per mailbox of a private store; hangs under ROOT
//   Folders          one per folder of every mailbox and of the public tree
//   Msg              one per message of the whole store, keyed by the
//                    normalized key 0x7F + the 8 bytes of "N67b0" + 0x08
//   1-<content name> one content table per folder (the list rows)
//   1-23 / 1-24      attachments (Exchange 2000/2003 / 2007 and 5.5)
//   1-A              attachments of a public folder store
//
// A message's attachments are the rows of the attachment table whose
// "N67b0" (first 8 bytes) equals the message key, in table order.
#ifndef TARNWELL_STORE_LEGACY_STORE_H_
#define TARNWELL_STORE_LEGACY_STORE_H_

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/status.h"
#include "engine/edb_class.h"
#include "store/folder_tree.h"
#include "store/item_records.h"
#include "store/key_ordinal_map.h"
#include "store/location_file.h"
#include "store/mail_store.h"
#include "store/property_decoder.h"

namespace tarnwell::store {

inline constexpr char kMailboxTable[] = "Mailbox";
inline constexpr char kFoldersTable[] = "Folders";
inline constexpr char kMessageTable[] = "Msg";

// The content-table name of a folder, as the table-name list holds it: the
// folder id in lower-case hexadecimal, the text after its last run of four
// '0' that starts at index 1 or later, in upper case (without such a run, the
// text from index 1 on).
std::string ContentTableName(uint64_t folder_id);

// The purpose an item of this message class is opened for.
DecodePurpose PurposeForClass(const std::string& message_class);

class LegacyStore : public MailStore {
 public:
  // `reader` must have parsed its catalog and outlive the store.
  LegacyStore(engine::EdbClass& reader, int version, ScanMode mode);

  // Where "Msgid.txt" and "Attachid.txt" go (the source's work folder).
  void SetWorkFolder(const std::string& folder) { work_folder_ = folder; }

  // Reads "Mailbox" into the folder list; afterwards the store is a public
  // folder store when no mailbox was found.
  bool WalkMailboxes() override;
  bool WalkFolders() override;
  bool public_store() const override { return public_store_; }
  void SetRunningFlag(RunningFlag* running) override { reader_.SetRunningFlag(running); }
  void LinkTree(ProgressSink& progress) override { folders_.LinkTree(progress); }
  bool ShowTree(const std::string& database_path, uint64_t source_number,
                FolderTreeSink& sink) override {
    return store::ShowTree(folders_, public_store_, database_path, source_number, sink);
  }
  const FolderList& folders() const { return folders_; }

  // Finds "Msg"; in Advance and Deep Mode walks it into the MessageMap and
  // "Msgid.txt".
  bool BuildMessageMap() override;
  // Finds the attachment table; in Advance and Deep Mode walks it into the
  // AttachmentMap and "Attachid.txt".
  bool BuildAttachmentMap() override;
  const KeyOrdinalMap& message_map() const { return message_map_; }
  const KeyOrdinalMap& attachment_map() const { return attachment_map_; }
  const engine::TableDef* message_table() const { return message_table_; }
  const engine::TableDef* attachment_table() const { return attachment_table_; }
  std::string attachment_table_name() const;

  // The list rows of folder `index`, from its content table. Nothing when
  // the folder has no content table.
  std::vector<MessageSummary> ListFolder(uint32_t folder_index);
  const engine::TableDef* ContentTable(uint32_t folder_index) const;

  // The message's record in "Msg": by key search in Standard Mode, through
  // the map and "Msgid.txt" otherwise.
  std::optional<engine::RecordRef> FindMessage(uint64_t message_key);

  // Decodes the record at `ref` of `table` for `purpose`.
  ItemRecords OpenItem(const engine::TableDef& table, const engine::RecordRef& ref,
                       DecodePurpose purpose);
  // Opens message `key` with the purpose its class calls for.
  std::optional<ItemRecords> OpenMessage(uint64_t message_key, DecodePurpose* purpose);
  // The attachments of message `key`, in table order.
  std::vector<AttachmentRecord> ListAttachments(uint64_t message_key);

  // The store-wide view (`ref.mailbox` is ignored: one folder list).
  const FolderNode* Folder(FolderRef ref) override {
    return ref.folder < folders_.size() ? &folders_[ref.folder] : nullptr;
  }
  std::vector<MessageSummary> ListFolder(FolderRef ref) override { return ListFolder(ref.folder); }
  std::optional<ItemRecords> OpenMessage(FolderRef, uint64_t key, DecodePurpose* purpose) override {
    return OpenMessage(key, purpose);
  }
  std::vector<AttachmentRecord> ListAttachments(FolderRef, uint64_t key) override {
    return ListAttachments(key);
  }

  int version() const { return version_; }
  ScanMode mode() const { return mode_; }
  engine::EdbClass& reader() { return reader_; }

 private:
  const engine::TableDef* FindListedTable(const std::string& listed) const;
  void DecodeRecord(const engine::TableDef& table, const engine::RecordColumns& columns,
                    DecodePurpose purpose, ItemRecords* records,
                    const std::vector<std::string>* only = nullptr);
  bool WalkKeyedTable(const engine::TableDef& table, const std::string& key_column,
                      KeyOrdinalMap* map, const std::string& location_name, LocationFile* locations,
                      bool index_attachments);
  void BuildAttachmentIndex();

  engine::EdbClass& reader_;
  int version_;
  ScanMode mode_;
  PropertyDecoder decoder_;
  std::string work_folder_;
  FolderList folders_;
  bool public_store_ = false;
  const engine::TableDef* message_table_ = nullptr;
  const engine::TableDef* attachment_table_ = nullptr;
  KeyOrdinalMap message_map_;
  KeyOrdinalMap attachment_map_;
  LocationFile message_locations_;
  LocationFile attachment_locations_;
  // (message key, attachment record) in table order, sorted stably by key.
  std::vector<std::pair<uint64_t, RecordLocation>> attachment_index_;
  bool attachment_index_built_ = false;
};

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_LEGACY_STORE_H_
