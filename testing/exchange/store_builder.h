// The Exchange store builder: legacy mailbox databases (Exchange 5.5,
// 2000/2003, 2007) written through the test ESE writer, with a manifest of
// everything written.
//
//   exchange::LegacyStoreOptions options;
//   options.version = 1;
//   exchange::StoreManifest manifest;
//   Status s = exchange::BuildLegacyStore(options, "store.edb", &manifest);
//
// Page format per version code:
//   4 (Exchange 5.5)        4 KiB pages, revision 2 (tagged values inline)
//   1 (Exchange 2000/2003)  4 KiB pages, revision 9
//   2 (Exchange 2007)       8 KiB pages, revision 12
//
// Tables, in catalog order, and their keys (every key is the normalized form
// 0x7F, the 8 bytes, 0x08 of one binary column):
//   "Mailbox"     "Q6764" (little-endian bytes)        one row per mailbox; empty in a public store
//   "Folders"     "Q6748" (little-endian bytes)        every folder of every mailbox
//   "Msg"         "N67b0"                              every message; a duplicate row gets the
//                                                      key of its first row plus one byte 0x01
//   "1-23" / "1-24" / "1-A"  "Q3f88" / "Q674a"         attachments (code 1 / codes 2, 4 / public)
//   "1-<content name>"  "N67b0"                        one per folder, its list rows
//
// Conventions where a reader has to agree with us:
//   - 64-bit ids ("Q6764", "Q6748", "Q6749", "Q3f88", "Q674a") are 8-byte binary,
//     little-endian. A mailbox's top folder ("Top of Information Store") has
//     the mailbox number as its parent id; "Public Root" has parent id 0.
//   - Times are FILETIMEs; a column of type currency or long long holds them
//     little-endian, an 8-byte binary column big-endian (high half first).
//     The manifest's time_encodings says which column has which.
//   - Column order is catalog id order: fixed, then variable, then tagged.
//     In the attachment table "S3704" comes before "S3001" for codes 1 and 2
//     and after it for code 4, so the first non-empty of the two names the
//     attachment. For code 2 "Se1d" comes before "S3d" (the prefix still
//     goes first in the subject).
//   - A message's attachments are the rows of the attachment table whose
//     "N67b0" equals the message's key, in table order.
//   - Content tables hold the list columns only; bodies, kind-specific
//     columns and attachments are in "Msg" and the attachment table.
//   - "S42" is written for every version; "S678e" and "Se04" too (a 5.5 list
//     does not show them: the manifest's to_shown is empty there).
//   - Bodies, RTF and attachment data larger than the long-value limit (or
//     that would overflow the record) go to the table's long-value tree.
//   - "N1009" is compressed RTF; "N1013" HTML bytes (UTF-8); "S1000" text.
//   - "MN81a9" (distribution-list members) is one long-binary value: u32
//     offset of the first member (8), u32 member count, then one one-off
//     entry id per member: u32 flags 0, 16-byte one-off provider UID, u16
//     version 0, u16 flags 0x8000 (Unicode), then display name, address type
//     and address as NUL-terminated UTF-16.
#ifndef TARNWELL_TESTING_EXCHANGE_STORE_BUILDER_H_
#define TARNWELL_TESTING_EXCHANGE_STORE_BUILDER_H_

#include <cstdint>
#include <string>

#include "base/status.h"
#include "testing/exchange/item_fixtures.h"
#include "testing/exchange/store_manifest.h"

namespace tarnwell::forge::exchange {

constexpr int kExchange55 = 4;
constexpr int kExchange2000 = 1;
constexpr int kExchange2007 = 2;

struct LegacyStoreOptions {
  int version = kExchange2000;  // 4, 1 or 2
  bool public_store = false;    // a public folder store: no mailboxes, "Public Root"
  DamageOptions damage;
  BulkOptions bulk;  // generated mail on top of the fixture content
  // Keep every item in the manifest. Off for benchmark stores: folders then
  // carry counts only.
  bool record_items = true;
  // Values longer than this go to the long-value tree (0: a quarter page).
  uint32_t long_value_limit = 0;
  // Rows per leaf of "Msg" and the content tables (0: full pages); small
  // numbers give deep trees from little content.
  uint32_t max_rows_per_leaf = 0;
};

// The catalog name of a folder's content table, and the name the legacy
// table list shows for it: the folder id in lower-case hex; from the end,
// the last run of four '0' that starts at index 1 or later; the text after
// it in upper case (without such a run: the text from index 1 on, upper case).
std::string ContentName(uint64_t folder_id);
std::string ContentTableName(uint64_t folder_id);

Status BuildLegacyStore(const LegacyStoreOptions& options, const std::string& path,
                        StoreManifest* manifest);

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_STORE_BUILDER_H_
