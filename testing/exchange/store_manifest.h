// What the Exchange store builder wrote, in the terms a reader of the store
// should report back: mailboxes, folders with their tree position, the items
// of each folder in content-table order, attachments, and the rows that were
// damaged on purpose.
//
// Texts are UTF-8. Times are FILETIMEs (100-ns ticks since 1601, UTC) as
// stored, whatever column type carried them. Binary values are kept as
// bytes; the JSON form prints them in lower-case hex.
#ifndef TARNWELL_TESTING_EXCHANGE_STORE_MANIFEST_H_
#define TARNWELL_TESTING_EXCHANGE_STORE_MANIFEST_H_

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::forge::exchange {

// Tree icons a folder gets by its name (trailing blanks removed, any case).
constexpr int kIconTop = 0;
constexpr int kIconOther = 11;

struct ManifestMailbox {
  std::string name;     // "S3001"
  uint64_t number = 0;  // "Q6764"; also the parent id of the mailbox's top folder
  Bytes property;       // "N66a0"
  uint32_t row = 0;     // position in the "Mailbox" table
  // Modern stores (codes 3 and 5): the names of the mailbox's own tables, and
  // "no_folder_table" when none of them was written, on purpose.
  std::string folder_table;
  std::string message_table;
  std::string attachment_table;
  std::string header_table;  // code 3: the list rows of its folders
  std::string damage;
};

struct ListMember {
  std::string name;
  std::string address_type;
  std::string address;
};

struct ManifestAttachment {
  Bytes key;                   // 8 bytes of the key column ("Q3f88" / "Q674a")
  std::string display_name;    // "S3001"; empty when not written
  std::string file_name;       // "S3704"; empty when not written
  std::string long_file_name;  // "S3707"; empty when not written
  std::string name;            // the one a reader picks: first of "S3001"/"S3704" in column order
  Bytes data;                  // "N3701" (kept only when items are recorded)
  uint64_t size = 0;
  std::string sha256;       // lower-case hex of data
  bool long_value = false;  // data lives in the table's long-value tree
  uint32_t method = 0;      // "L65f1"
};

struct ManifestItem {
  Bytes key;  // 8 bytes of "N67b0"
  std::string message_class;
  std::string subject_prefix;      // "S3d"
  std::string normalized_subject;  // "Se1d"
  std::string subject;             // as listed: prefix then normalized subject
  std::string sender;              // "S42" as written
  std::string to;                  // "S678e" / "Se04" as written (empty: not written)
  std::string to_shown;            // what the list shows (empty for Exchange 5.5)
  std::string sender_shown;        // what the list shows (empty for Exchange 5.5)
  uint64_t created = 0;            // "T3007"
  uint64_t modified = 0;           // "T3008"
  uint64_t received = 0;           // "Te06"
  uint32_t flags = 0;              // "Le07"
  uint32_t importance = 0;         // "L17"
  bool has_attachments = false;    // "Be1b"
  std::string body_text;           // "S1000"; empty when not written
  std::string body_html;           // "N1013" bytes (UTF-8 HTML); empty when not written
  std::string rtf_text;            // the RTF that "N1009" expands to; empty when not written
  bool rtf_uses_references = false;
  bool body_long_value = false;  // some body went to the long-value tree
  std::string headers;           // "S7d"
  // Kind-specific columns by column name: contact / appointment / task strings,
  // times ("T814e" ...), 32-bit values ("L805c" ...), doubles ("D8121").
  std::map<std::string, std::string> strings;
  std::map<std::string, uint64_t> times;
  std::map<std::string, int64_t> numbers;
  std::map<std::string, double> doubles;
  std::vector<ListMember> members;              // "MN81a9"
  std::vector<ManifestAttachment> attachments;  // attachment-table order
  bool in_msg_table = true;                     // false: a content-table row with no "Msg" row
  // Modern stores only.
  std::string cc;           // Cc line as written (property 0x0E03; empty: not written)
  std::string flags_text;   // what the list shows for the read state ("Read" / "UnRead")
  uint32_t body_type = 0;   // "BodyType": 1 plain text, 3 HTML (0: not written)
  int32_t document_id = 0;  // "MessageDocumentId" (code 5)
};

struct ManifestFolder {
  uint64_t id = 0;                // "Q6748"
  uint64_t parent = 0;            // "Q6749"
  std::string name;               // "S3001"
  std::string container_class;    // "S3613"
  std::vector<std::string> path;  // names from the store's top down, this folder last
  std::string content_name;       // table name as the legacy table list shows it ("A3F")
  std::string content_table;      // catalog name ("1-A3F")
  bool visible = true;            // the folder tree shows it
  int icon = kIconOther;
  uint32_t row = 0;                 // position in the "Folders" table
  std::string damage;               // "", "orphan", "self_parent", "parent_zero"
  uint64_t item_count = 0;          // rows of the content table
  std::vector<ManifestItem> items;  // content-table order (when recorded)
};

// A "Msg" row whose key an earlier row already has; readers keep the first.
struct DuplicateRow {
  Bytes key;
  std::string subject;
};

struct StoreManifest {
  int version = 0;  // 4 Exchange 5.5, 1 Exchange 2000/2003, 2 Exchange 2007, 3 2010, 5 2013+
  bool public_store = false;
  uint32_t page_size = 0;
  uint32_t revision = 0;
  std::string attachment_table;       // "1-23", "1-24" or "1-A"
  std::string attachment_key_column;  // "Q3f88" or "Q674a"
  // How each time column is stored, by "table.column" ("Msg", "Folders", and
  // "Content" for every content table): "currency", "long_long" (both
  // little-endian) or "binary_be" (8-byte binary, high half first).
  std::map<std::string, std::string> time_encodings;
  std::vector<ManifestMailbox> mailboxes;  // "Mailbox" table order
  std::vector<ManifestFolder> folders;     // creation order; `row` gives table order
  std::vector<DuplicateRow> duplicates;
  uint64_t msg_rows = 0;  // rows of "Msg", duplicates included
  uint64_t messages = 0;  // distinct keys in "Msg"
  uint64_t attachment_rows = 0;
  bool items_recorded = true;  // false: folders carry counts only
  // Modern stores: catalog records end at fixed column 12 (later Exchange 2013).
  bool later_2013_variant = false;
  // Code 5 written as servers write it (modern_store_builder.h): 26-byte
  // ids, so folder ids, parents and item keys are the last 8 bytes of them.
  bool real_layout = false;
  // Message rows whose key cannot be read (a "MessageId" of 8 bytes or
  // fewer); no folder lists them. Key = the whole "MessageId".
  std::vector<DuplicateRow> unmapped;
};

// Lower-case hex SHA-256 of `data`.
std::string Sha256Hex(ByteView data);

// The manifest as JSON. Binary values are hex; attachment data is left out
// (size and hash identify it).
std::string ManifestJson(const StoreManifest& manifest);

// Icon number for a folder name, as the folder tree chooses it.
int FolderIcon(const std::string& name);

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_STORE_MANIFEST_H_
