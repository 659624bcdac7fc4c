// MailStore: what the scan driver, the item list and the export jobs ask of
// a mailbox store, whichever generation wrote it.
#ifndef TARNWELL_STORE_MAIL_STORE_H_
#define TARNWELL_STORE_MAIL_STORE_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/progress_sink.h"
#include "store/folder_tree.h"
#include "store/item_records.h"

namespace tarnwell::store {

// A folder of a store: its index in the folder list of its mailbox (modern
// stores, `mailbox` = the mailbox's node index) or of the store (legacy
// stores, `mailbox` = -1).
struct FolderRef {
  int32_t mailbox = -1;
  uint32_t folder = 0;
};

class MailStore {
 public:
  virtual ~MailStore() = default;

  // Scan stages.
  virtual bool WalkMailboxes() = 0;
  // Legacy: the "Folders" table. Modern: every mailbox's folders (the
  // contexts are loaded as if each mailbox had been selected).
  virtual bool WalkFolders() = 0;
  virtual void LinkTree(ProgressSink& progress) = 0;
  virtual bool ShowTree(const std::string& database_path, uint64_t source_number,
                        FolderTreeSink& sink) = 0;
  virtual bool BuildMessageMap() = 0;
  virtual bool BuildAttachmentMap() = 0;
  virtual bool public_store() const = 0;
  // The flag every loop of the store and its reader polls.
  virtual void SetRunningFlag(RunningFlag* running) = 0;

  // Items.
  virtual const FolderNode* Folder(FolderRef ref) = 0;
  virtual std::vector<MessageSummary> ListFolder(FolderRef ref) = 0;
  virtual std::optional<ItemRecords> OpenMessage(FolderRef ref, uint64_t message_key,
                                                 DecodePurpose* purpose) = 0;
  virtual std::vector<AttachmentRecord> ListAttachments(FolderRef ref, uint64_t message_key) = 0;
};

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_MAIL_STORE_H_
