#include "testing/forge_big.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <optional>
#include <string>
#include <vector>

#include "testing/forge_database.h"
#include "testing/forge_long_value.h"
#include "testing/forge_record.h"
#include "testing/forge_sample.h"
#include "testing/forge_tree.h"
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
constexpr size_t kWriteBuffer = 4 << 20;  // contiguous pages gathered per write
constexpr uint64_t kMiB = 1 << 20;
// Every n-th message gets an attachment; bodies above the limit go to the
// long-value tree, the others stay in the record.
constexpr uint32_t kAttachmentEvery = 3;
constexpr size_t kInlineBodyLimit = 1024;
constexpr size_t kMaxBody = 6000;
constexpr size_t kMinAttachment = 2000;
constexpr size_t kMaxAttachment = 60000;

// Writes pages where they belong in the file, gathering runs of consecutive
// pages into one write.
class FileSink : public PageSink {
 public:
  FileSink(int fd, uint32_t page_size) : fd_(fd), page_size_(page_size) {}
  Status Put(uint32_t page_number, Bytes image) override {
    if (!buffer_.empty() && page_number != first_ + buffer_.size() / page_size_) {
      Status s = Flush();
      if (!s.ok()) return s;
    }
    if (buffer_.empty()) first_ = page_number;
    buffer_.insert(buffer_.end(), image.begin(), image.end());
    return buffer_.size() >= kWriteBuffer ? Flush() : Status::Ok();
  }
  Status Flush() {
    if (buffer_.empty()) return Status::Ok();
    Status s = WriteAt(off_t(first_ + 1) * page_size_, buffer_.data(), buffer_.size());
    buffer_.clear();
    return s;
  }
  Status WriteAt(off_t offset, const uint8_t* data, size_t size) {
    while (size > 0) {
      ssize_t n = pwrite(fd_, data, size, offset);
      if (n <= 0) return Status::IoError(std::string("write failed: ") + std::strerror(errno));
      data += n;
      size -= size_t(n);
      offset += n;
    }
    return Status::Ok();
  }

 private:
  int fd_;
  uint32_t page_size_;
  uint32_t first_ = 0;
  Bytes buffer_;
};

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
  TreeOptions options = db->NewTree(0);
  TreeWriter writer(db->format(), options, db->allocator(), db->sink());
  for (size_t i = 0; i < table.rows.size(); ++i) {
    TreeEntry e;
    e.key = OrdinalKey(i + 1);
    Status s = EncodeRecord(table.columns, table.rows[i].cells, db->layout(), &e.data);
    if (s.ok()) s = writer.Add(std::move(e));
    if (!s.ok()) return s;
  }
  TreeLayout layout;
  Status s = writer.Finish(&layout);
  if (s.ok()) db->AddTable(table.name, table.columns, options, layout, nullptr, nullptr);
  return s;
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
  const int fd = open(path.c_str(), O_CREAT | O_TRUNC | O_WRONLY, 0644);
  if (fd < 0) return Status::IoError("cannot create " + path);
  FileSink sink(fd, layout.page_size);
  DatabaseWriter db(layout, &sink);
  Status s = db.status();
  BigResult local;
  auto finish = [&](Status st) {
    if (close(fd) != 0 && st.ok()) st = Status::IoError("cannot write " + path);
    if (result) *result = local;
    return st;
  };
  if (!s.ok()) return finish(s);
  for (const TableLayout& t : {MailboxesTable(), FoldersTable()}) {
    s = WriteSmallTable(&db, t);
    if (!s.ok()) return finish(s);
  }

  const std::vector<ColumnLayout> columns = MessageColumns();
  const TreeOptions table_options = db.NewTree(0);
  const TreeOptions lv_options = db.NewTree(kPageFlagLongValue);
  TreeWriter rows(db.format(), table_options, db.allocator(), db.sink());
  TreeWriter lvs(db.format(), lv_options, db.allocator(), db.sink());
  const uint32_t chunk_size = DefaultLongValueChunkSize(db.format(), kLongValueIdSize);
  const uint64_t target_pages = options.size_mib * kMiB / layout.page_size;
  Random rng(options.seed);
  uint64_t next_lv = 1;
  std::vector<TreeEntry> lv_entries;
  auto add_long_value = [&](Bytes data) -> Status {
    LongValueLayout v;
    v.id = next_lv++;
    v.data = std::move(data);
    lv_entries.clear();
    Status st =
        AppendLongValueEntries(v, kLongValueIdSize, chunk_size, std::nullopt, &lv_entries, nullptr);
    for (TreeEntry& e : lv_entries) {
      if (!st.ok()) break;
      st = lvs.Add(std::move(e));
    }
    ++local.long_values;
    return st;
  };

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
    if (body.size() > kInlineBodyLimit) {
      cells.push_back(SeparatedCell(256, next_lv));
      s = add_long_value(std::move(body));
    } else {
      cells.push_back({256, std::move(body)});
    }
    if (s.ok() && id % kAttachmentEvery == 0) {
      cells.push_back(SeparatedCell(257, next_lv));
      s = add_long_value(
          Attachment(rng, kMinAttachment + rng.Below(kMaxAttachment - kMinAttachment)));
    }
    TreeEntry row;
    row.key = OrdinalKey(id);
    if (s.ok()) s = EncodeRecord(columns, cells, db.layout(), &row.data);
    if (s.ok()) s = rows.Add(std::move(row));
    if (!s.ok()) return finish(s);
    ++local.rows;
  }
  TreeLayout table_layout, lv_layout;
  s = rows.Finish(&table_layout);
  if (s.ok()) s = lvs.Finish(&lv_layout);
  if (!s.ok()) return finish(s);
  db.AddTable("Messages", columns, table_options, table_layout, &lv_options, &lv_layout);

  Bytes header;
  s = db.Finish(&header, manifest);
  if (s.ok()) s = sink.Flush();
  if (s.ok()) s = sink.WriteAt(0, header.data(), header.size());
  if (s.ok()) s = sink.WriteAt(layout.page_size, header.data(), header.size());
  local.file_size = uint64_t(db.total_pages() + 2) * layout.page_size;
  if (s.ok() && ftruncate(fd, off_t(local.file_size)) != 0) {
    s = Status::IoError("cannot size " + path);
  }
  return finish(s);
}

}  // namespace tarnwell::forge
