#include "testing/forge_big.h"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <string>
#include <vector>

#include "testing/forge_database.h"
#include "testing/forge_record.h"
#include "testing/forge_sample.h"
#include "testing/forge_stream.h"
#include "testing/forge_value.h"

namespace tarnwell::forge {
namespace {

constexpr uint32_t kCodepageWestern = 1252;
constexpr uint32_t kCodepageUtf16 = 1200;
// Date-time columns hold OLE automation dates: days since 1899-12-30.
constexpr double kOleDate2013 = 41440.0;   // 2013-06-15
constexpr double kOleDateStep = 1.0 / 24;  // an hour
constexpr uint32_t kFolders = 24;
constexpr uint32_t kMailboxes = 6;
constexpr uint64_t kMiB = 1 << 20;
// Every n-th message gets an attachment; bodies above the limit go to the
// long-value tree, the others stay in the record.
constexpr uint32_t kAttachmentEvery = 3;
constexpr size_t kInlineBodyLimit = 1024;
constexpr size_t kMaxBody = 6000;
constexpr size_t kMinAttachment = 2000;
constexpr size_t kMaxAttachment = 60000;

// splitmix64: fast, and the same sequence for the same seed everywhere.
class Random {
 public:
  explicit Random(uint64_t seed) : state_(seed) {}
  uint64_t Next() {
    uint64_t z = (state_ += 0x9E3779B97F4A7C15ull);
    z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ull;
    z = (z ^ (z >> 27)) * 0x94D049BB133111EBull;
    return z ^ (z >> 31);
  }
  uint64_t Below(uint64_t n) { return Next() % n; }

 private:
  uint64_t state_;
};

const char* const kWords[] = {"meeting", "report", "quarterly", "budget",   "draft",  "review",
                              "project", "status", "update",    "invoice",  "travel", "agenda",
                              "notes",   "lunch",  "deadline",  "contract", "team",   "plan"};

std::string Sentence(Random& rng, size_t words) {
  std::string s;
  for (size_t i = 0; i < words; ++i) {
    if (i) s += ' ';
    s += kWords[rng.Below(std::size(kWords))];
  }
  return s;
}

Bytes BodyText(Random& rng, size_t size) {
  std::string text;
  while (text.size() < size / 2) text += Sentence(rng, 12) + ".\r\n";
  text.resize(size / 2);
  return Utf16(text);
}

Bytes Attachment(Random& rng, size_t size) {
  Bytes b(size);
  for (size_t i = 0; i < size; i += 8) {
    const uint64_t v = rng.Next();
    std::memcpy(b.data() + i, &v, std::min<size_t>(8, size - i));
  }
  return b;
}

Bytes OrdinalKey(uint64_t ordinal) {
  Bytes key(4);
  for (int i = 0; i < 4; ++i) key[i] = uint8_t(ordinal >> (8 * (3 - i)));
  return key;
}

Status WriteSmallTable(DatabaseWriter* db, const TableLayout& table) {
  StreamTable writer(db, table.name, table.columns, {});
  for (size_t i = 0; i < table.rows.size(); ++i) {
    Status s = writer.AddRow(OrdinalKey(i + 1), table.rows[i].cells);
    if (!s.ok()) return s;
  }
  return writer.Finish();
}

TableLayout FoldersTable() {
  TableLayout t;
  t.name = "Folders";
  t.columns = {{1, "FolderId", kColumnLong},
               {2, "MailboxId", kColumnLong},
               {3, "ParentId", kColumnLong},
               {128, "DisplayName", kColumnText, 255, kCodepageUtf16}};
  for (uint32_t i = 1; i <= kFolders; ++i) {
    RowLayout row;
    row.cells = {{1, LittleEndian(i, 4)},
                 {2, LittleEndian((i - 1) % kMailboxes + 1, 4)},
                 {3, LittleEndian(i <= kMailboxes ? 0 : (i - 1) % kMailboxes + 1, 4)},
                 {128, Utf16("Folder " + std::to_string(i))}};
    t.rows.push_back(std::move(row));
  }
  return t;
}

TableLayout MailboxesTable() {
  TableLayout t;
  t.name = "Mailboxes";
  t.columns = {{1, "MailboxId", kColumnLong},
               {128, "DisplayName", kColumnText, 255, kCodepageUtf16},
               {129, "Address", kColumnText, 255, kCodepageWestern}};
  for (uint32_t i = 1; i <= kMailboxes; ++i) {
    RowLayout row;
    row.cells = {{1, LittleEndian(i, 4)},
                 {128, Utf16("User " + std::to_string(i))},
                 {129, Ascii("user" + std::to_string(i) + "@example.org")}};
    t.rows.push_back(std::move(row));
  }
  return t;
}

std::vector<ColumnLayout> MessageColumns() {
  return {{1, "MessageId", kColumnLong},
          {2, "FolderId", kColumnLong},
          {3, "Received", kColumnDateTime},
          {4, "Size", kColumnLong},
          {5, "Flags", kColumnUnsignedLong},
          {128, "Subject", kColumnText, 255, kCodepageUtf16},
          {129, "Sender", kColumnText, 255, kCodepageWestern},
          {256, "Body", kColumnLongText, 0, kCodepageUtf16},
          {257, "Attachment", kColumnLongBinary}};
}

}  // namespace

Status WriteBigDatabase(const BigOptions& options, const std::string& path, Manifest* manifest,
                        BigResult* result) {
  DatabaseLayout layout;
  layout.page_size = options.page_size;
  layout.format_revision =
      options.revision ? options.revision : DefaultRevisionFor(options.page_size);
  DatabaseFile file(layout.page_size);
  Status s = file.Create(path);
  if (!s.ok()) return s;
  BigResult local;
  s = [&]() -> Status {
    DatabaseWriter db(layout, &file);
    if (!db.status().ok()) return db.status();
    for (const TableLayout& t : {MailboxesTable(), FoldersTable()}) {
      Status st = WriteSmallTable(&db, t);
      if (!st.ok()) return st;
    }
    StreamTable messages(&db, "Messages", MessageColumns(), {.long_values = true});
    const uint64_t target_pages = options.size_mib * kMiB / layout.page_size;
    Random rng(options.seed);
    for (uint64_t id = 1; db.allocator()->last_allocated() < target_pages; ++id) {
      std::vector<Cell> cells;
      cells.push_back({1, LittleEndian(id, 4)});
      cells.push_back({2, LittleEndian(rng.Below(kFolders) + 1, 4)});
      const double received = kOleDate2013 + double(id) * kOleDateStep;
      uint64_t received_bits;
      std::memcpy(&received_bits, &received, sizeof received_bits);
      cells.push_back({3, LittleEndian(received_bits, 8)});
      const size_t body_size = 2 * (rng.Below(kMaxBody / 2) + 1);
      cells.push_back({4, LittleEndian(body_size, 4)});
      cells.push_back({5, LittleEndian(rng.Next() & 0xFF, 4)});
      cells.push_back({128, Utf16(Sentence(rng, 2 + rng.Below(6)))});
      cells.push_back(
          {129, Ascii("user" + std::to_string(rng.Below(kMailboxes) + 1) + "@example.org")});
      Bytes body = BodyText(rng, body_size);
      Status st;
      uint64_t lv = 0;
      if (body.size() > kInlineBodyLimit) {
        st = messages.AddLongValue(std::move(body), Compression::kNone, &lv);
        cells.push_back(SeparatedCell(256, lv));
      } else {
        cells.push_back({256, std::move(body)});
      }
      if (st.ok() && id % kAttachmentEvery == 0) {
        st = messages.AddLongValue(
            Attachment(rng, kMinAttachment + rng.Below(kMaxAttachment - kMinAttachment)),
            Compression::kNone, &lv);
        cells.push_back(SeparatedCell(257, lv));
      }
      if (st.ok()) st = messages.AddRow(OrdinalKey(id), cells);
      local.rows = messages.rows();
      local.long_values = messages.long_values();
      if (!st.ok()) return st;
    }
    Status st = messages.Finish();
    return st.ok() ? file.Finish(&db, manifest) : st;
  }();
  local.file_size = file.file_size();
  if (result) *result = local;
  return file.Close(s);
}

}  // namespace tarnwell::forge
