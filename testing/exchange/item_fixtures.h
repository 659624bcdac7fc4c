// The content the Exchange store builder writes: mailboxes, a folder tree
// per mailbox (or a public folder tree), and items of every kind, plus a
// generator of bulk mail for benchmarks.
//
// Everything is deterministic. The fixture content is fixed; the bulk
// generator draws from a seeded splitmix64 sequence, so the same options give
// the same store byte for byte.
//
// Ids:
//   mailbox numbers     101, 102, ... (the mailbox's top folder names it as parent)
//   folder ids          0x0001000000000A30 + n: replica 1, counter from 0xA30, so
//                       the 16th folder is 0x0001000000000A3F; one folder with an
//                       inner run of zeros (0x00010000010000B7, content "B7") and one
//                       with none (0x0001123456789123, content "123456789123")
//   message keys        "N67b0": 00 01, then a 6-byte big-endian counter, so
//                       table order (bytewise) is creation order
//   attachment keys     the same form, own counter
#ifndef TARNWELL_TESTING_EXCHANGE_ITEM_FIXTURES_H_
#define TARNWELL_TESTING_EXCHANGE_ITEM_FIXTURES_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "testing/exchange/store_manifest.h"

namespace tarnwell::forge::exchange {

// Rows damaged on purpose; each is listed in the manifest.
struct DamageOptions {
  bool orphan_folder = false;            // parent id names no folder
  bool self_parent_folder = false;       // parent id is its own id
  bool parent_zero_folder = false;       // parent id 0, name other than "Public Root"
  bool duplicate_message = false;        // a second "Msg" row with a key already used
  bool content_row_without_msg = false;  // a content-table row with no "Msg" row
  static DamageOptions All() { return {true, true, true, true, true}; }
};

struct BulkOptions {
  uint64_t messages = 0;            // generated mails, after the fixture content
  uint64_t large_folder_items = 0;  // of these, how many go to one folder ("Bulk")
  uint64_t average_bytes = 5000;    // body + attachment bytes per message, on average
  uint32_t attachment_every = 4;    // every n-th message carries an attachment (0: none)
  uint64_t seed = 1;
};

// What the builder is to write, before any of it is encoded.
struct StoreContent {
  bool public_store = false;
  std::vector<ManifestMailbox> mailboxes;
  // Creation order. Items carry keys, texts, times and attachment data; the
  // builder fills the derived fields (subject, path, icon, content table,
  // attachment keys and hashes).
  std::vector<ManifestFolder> folders;
  // Keys of items whose "Msg" row is written twice; the second row carries
  // the subject given here.
  std::vector<DuplicateRow> duplicates;
  size_t bulk_folder = SIZE_MAX;          // index of the "Bulk" folder, if any
  std::vector<size_t> bulk_mail_folders;  // folders the rest of the bulk mail goes to
  uint64_t next_message_counter = 0;      // first key counter free for bulk mail
};

constexpr uint64_t kFirstMailboxNumber = 101;
constexpr uint64_t kFolderIdBase = 0x0001000000000A30ull;
constexpr uint64_t kRootFolderParent = 0;  // parent id of "Public Root"

// The 8-byte key for counter n (message and attachment keys).
Bytes ItemKey(uint64_t counter);

// The SID of mailbox owner `rid` ("N66a0", and a folder's creator "Ne58").
Bytes UserSid(uint32_t rid);

StoreContent MakeFixtureContent(bool public_store, const DamageOptions& damage,
                                const BulkOptions& bulk);

// Draws bulk mail one message at a time, in key order.
class BulkMailSource {
 public:
  BulkMailSource(const StoreContent& content, const BulkOptions& options);
  // False when all messages have been drawn. `folder` is an index into
  // content.folders.
  bool Next(size_t* folder, ManifestItem* item);
  // Only the folder of the next message: cheap, for counting ahead. The
  // folders come from their own sequence, so counting draws the same ones.
  bool NextFolder(size_t* folder);

 private:
  static uint64_t Mix(uint64_t* state);
  uint64_t Below(uint64_t n) { return Mix(&state_) % n; }

  const StoreContent& content_;
  BulkOptions options_;
  uint64_t state_;
  uint64_t folder_state_;
  uint64_t drawn_ = 0;
  uint64_t counter_;
};

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_ITEM_FIXTURES_H_
