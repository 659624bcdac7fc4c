// The Exchange store builder for modern mailbox databases: Exchange 2010
// (version code 3) and 2013 and later (code 5), with tables per mailbox,
// written through the test ESE writer, with a manifest of everything written.
//
//   exchange::ModernStoreOptions options;
//   options.version = exchange::kExchange2013;
//   exchange::StoreManifest manifest;
//   Status s = exchange::BuildModernStore(options, "store.edb", &manifest);
//
// Both codes: 32 KiB pages; revision 17 (code 3) or 20 (code 5). The catalog
// of a code-5 store has records ending at fixed column 11, or 12 for the
// later 2013 variant. The content is the legacy fixture content (three
// mailboxes, nested folders, every item kind) plus a large HTML mail in the
// first inbox and, on the first mail of each inbox, a Cc line (written by
// the later 2013 variant only) and a multi-valued string (code 5).
//
// Code 5 tables (n = mailbox number in decimal; mailbox numbers 7, 101, 102):
//   "Mailbox"        key "MailboxNumber"      "MailboxNumber", "DisplayName",
//                                             "MailboxOwnerDisplayName"
//   "Folder_n"       key "FolderId" bytes     "FolderId", "ParentFolderId" (8 bytes LE;
//                                             top folders name the mailbox number),
//                                             "DisplayName", "ContainerClass"
//   "Message_n"      key "MessageDocumentId"  "MessageId" (26 bytes: 18 bytes of the
//                                             mailbox, then the 8-byte message key),
//                                             "FolderId", list columns, "PropertyBlob",
//                                             "NativeBody"
//   "Attachment_n"   key "Inid"               "Inid", "MessageDocumentId", "Name",
//                                             "Content", "Size"
// Document ids follow the received time, so table order is not key order;
// a folder lists its messages in table order.
//
// Code 3 tables (x from the mailbox number in hex, see Modern2010Tables;
// mailbox numbers 0x2000000003A, 0x123456789A, 0x30000000000C1):
//   "Mailbox"        "Q6764", "S3001"
//   "Folders-x"      "Q6748", "Q6749", "S3001", "S3613"
//   "Body-x"         key "N67b0": the list columns, "Q6748" and the property
//                    columns of the legacy "Msg" table
//   "MsgHeader-X"    key "N67b0": every list row of the mailbox's folders;
//                    a folder lists the rows whose "Q6748" is its id
//   "Attach-x"       key "Q674a": "Q674a", "N67b0", "S3001", "S3704", "N3701"
//
// Values (code 5):
//   - "DateCreated", "LastModificationTime", "DateReceived" are of engine type
//     date-time, their 8 bytes a little-endian FILETIME.
//   - "MessageClass" (code page 1252) is stored 7-bit ASCII compressed;
//     "DisplayTo" and "SubjectPrefix" (UTF-16) 7-bit Unicode compressed
//     when all their characters are ASCII.
//   - "PropertyBlob" (see property_blob_encoder.h): 0x0042 sender, 0x0E1D
//     normalized subject, 0x0E03 Cc (later 2013 variant only), 0x0E07 flags,
//     0x1000 plain body (when at most 255 UTF-8 bytes), and the item's
//     kind-specific values under their column names ("S3a06", "T814e",
//     "L805c", "B8124", "MS8002"). Values a blob cannot hold are not written
//     and left out of the manifest: 16-bit ("I..") and double ("D..")
//     values, strings over 255 bytes, distribution-list members, RTF.
//   - "NativeBody": the HTML body ("BodyType" 3) or else the plain text as
//     UTF-8 ("BodyType" 1), Xpress compressed: in the record (flag 0x02,
//     0x18, u16 size) or, past the long-value limit, in the long-value tree
//     with every chunk compressed on its own.
//   - Attachment "Content": in the record, or in the long-value tree when large.
//
// Real layout (code 5, `real_layout`): the tables as Exchange 2013, 2016 and
// 2019 servers write them, file-format revision 110 with 8-byte long-value
// ids and catalog records ending at fixed column 12:
//   "Mailbox"          "MailboxNumber", "DisplayName", "MailboxOwnerDisplayName",
//                      "PropertyBlob" (0x3001)
//   "Folder_n"         "FolderId", "ParentFolderId" (26 bytes: 16-byte mailbox GUID,
//                      6-byte big-endian counter, 4 zero bytes; the top folder's
//                      parent all zeros), "DisplayName", "ContainerClass",
//                      "SpecialFolderNumber", "PropertyBlob" (0x3001, 0x3613)
//   "Message_n"        "MessageDocumentId", "MessageId" (26 bytes as folder ids),
//                      "FolderId", "MessageClass", "IsRead", "HasAttachments",
//                      "DateCreated", "DateReceived", "DateSent", "Importance",
//                      "DisplayTo", "SubjectPrefix", "BodyType", "NativeBody",
//                      "PropertyBlob" (0x0042, 0x0E1D, 0x0E07, 0x3008, 0x1000 of
//                      any length, 0x007D), "OffPagePropertyBlob" (the item's own
//                      values, named ones under the mailbox's numbers),
//                      "RecipientList" (u32 count, then per recipient a u32
//                      length and a blob: 0x0C15, 0x3001, 0x3002, 0x3003,
//                      0x39FE), "SubobjectsBlob" (attachment Inids),
//                      "SeparatedProperty01".."04" (far values, Xpress compressed)
//   "Attachment_n"     "Inid", "Name", "ContentType", "Content", "Size",
//                      "PropertyBlob" (0x3704, 0x3707, 0x3705, 0x0E20)
//   "ExtendedPropertyNameMapping_n"  "PropNumber", "PropGuid", "PropName",
//                      "PropDispId": each mailbox numbers the named properties
//                      it uses on its own (from 0x8078, 0x8100 and 0x8000), and
//                      every mailbox has an unknown named property at 0x8198,
//                      set on its appointments, which a reader must not take
//                      for the end time that number means elsewhere.
// Blobs follow real_blob_encoder.h (3-byte entries; near and far values).
// Items keep what the other code-5 layout keeps, and also 16-bit values,
// doubles, distribution-list members (one-off entry ids), long plain bodies
// and headers; the Cc line becomes Cc recipients, the To line To recipients.
#ifndef TARNWELL_TESTING_EXCHANGE_MODERN_STORE_BUILDER_H_
#define TARNWELL_TESTING_EXCHANGE_MODERN_STORE_BUILDER_H_

#include <cstdint>
#include <string>

#include "base/status.h"
#include "testing/exchange/item_fixtures.h"
#include "testing/exchange/store_manifest.h"

namespace tarnwell::forge::exchange {

constexpr int kExchange2010 = 3;
constexpr int kExchange2013 = 5;

// Rows damaged on purpose; each is listed in the manifest.
struct ModernDamageOptions {
  // A fourth mailbox whose folder, message and attachment tables are missing.
  bool missing_folder_table = false;
  // Code 5: a message row whose "MessageId" has 8 bytes (no key can be read).
  bool short_message_id = false;
  static ModernDamageOptions All() { return {true, true}; }
};

struct ModernStoreOptions {
  int version = kExchange2013;      // 3 or 5
  bool later_2013_variant = false;  // code 5: catalog records end at fixed column 12
  bool real_layout = false;         // code 5 as servers write it (see above)
  ModernDamageOptions damage;
  BulkOptions bulk;
  bool record_items = true;  // off: folders carry counts only
  // Values longer than this go to the long-value tree (0: a quarter page).
  uint32_t long_value_limit = 0;
  // Rows per leaf of the message tables (0: full pages).
  uint32_t max_rows_per_leaf = 0;
};

// The table names of a code-3 mailbox. From the number in lower-case hex:
// `first` is the text before the first run of "0000", `second` the text
// after the last run of "0000" that starts at index 1 or later, in upper
// case; without any run, `first` is empty and `second` the text from index
// 1 on, in upper case.
struct Modern2010Tables {
  std::string folders;  // "Folders-" first "-" second
  std::string body;     // "Body-" first "-" second
  std::string header;   // "MsgHeader-" FIRST "-" second
  std::string attach;   // "Attach-" first "-" second
};
Modern2010Tables Exchange2010TableNames(uint64_t mailbox_number);

Status BuildModernStore(const ModernStoreOptions& options, const std::string& path,
                        StoreManifest* manifest);

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_MODERN_STORE_BUILDER_H_
