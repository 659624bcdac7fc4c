#include "testing/exchange/store_builder.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <vector>

#include "base/text.h"
#include "testing/exchange/rtf_literal_encoder.h"
#include "testing/forge_database.h"
#include "testing/forge_long_value.h"
#include "testing/forge_record.h"
#include "testing/forge_tree.h"
#include "testing/forge_value.h"

namespace tarnwell::forge::exchange {
namespace {

constexpr uint32_t kFormatVersion = 0x620;
constexpr uint32_t kPage4K = 4096;
constexpr uint32_t kPage8K = 8192;
constexpr uint32_t kRevision55 = 2;
constexpr uint32_t kRevision2000 = 9;
constexpr uint32_t kRevision2007 = 12;

constexpr uint32_t kCodePageUnicode = 1200;
constexpr uint32_t kCodePageWestern = 1252;
constexpr uint32_t kInternetCodePageUtf8 = 65001;

constexpr uint8_t kKeyPrefix = 0x7F;
constexpr uint8_t kKeySuffix = 0x08;
constexpr uint8_t kDuplicateKeyTail = 0x01;
constexpr size_t kIdSize = 8;
constexpr uint8_t kBitTrue = 1;

// A record must fit its page with room for the node header and the tag; keep
// well below that so several big values in one row still fit.
constexpr uint32_t kRecordBudgetDivisor = 2;
constexpr uint32_t kDefaultLimitDivisor = 4;

// One-off entry id of a distribution-list member.
constexpr uint8_t kOneOffProviderUid[16] = {0x81, 0x2B, 0x1F, 0xA4, 0xBE, 0xA3, 0x10, 0x19,
                                            0x9D, 0x6E, 0x00, 0xDD, 0x01, 0x0F, 0x54, 0x02};
constexpr uint16_t kOneOffUnicode = 0x8000;
constexpr uint32_t kMemberListHeader = 8;  // u32 offset, u32 count

constexpr size_t kWriteBuffer = 4 << 20;

// ---- Table schemas

enum class Slot { kFixed, kVariable, kTagged };

struct Column {
  const char* name;
  uint32_t type;
  uint32_t codepage;
  Slot slot;
};

class Schema {
 public:
  void Add(const Column& c) {
    uint32_t& next = c.slot == Slot::kFixed      ? next_fixed_
                     : c.slot == Slot::kVariable ? next_variable_
                                                 : next_tagged_;
    ColumnLayout layout;
    layout.id = next++;
    layout.name = c.name;
    layout.type = c.type;
    layout.codepage = c.codepage;
    // Fixed binary columns need their width; 8 is all any of ours hold.
    if (c.slot == Slot::kFixed && c.type == kColumnBinary) layout.size = kIdSize;
    columns_.push_back(layout);
  }
  // Ids ascending, as the catalog and the record encoder want them.
  void Seal() {
    std::sort(columns_.begin(), columns_.end(),
              [](const ColumnLayout& a, const ColumnLayout& b) { return a.id < b.id; });
    for (size_t i = 0; i < columns_.size(); ++i) index_[columns_[i].name] = i;
  }
  const ColumnLayout* Find(const std::string& name) const {
    auto it = index_.find(name);
    return it == index_.end() ? nullptr : &columns_[it->second];
  }
  const std::vector<ColumnLayout>& columns() const { return columns_; }

 private:
  std::vector<ColumnLayout> columns_;
  std::map<std::string, size_t> index_;
  uint32_t next_fixed_ = 1;
  uint32_t next_variable_ = kFirstVariableColumnId;
  uint32_t next_tagged_ = kFirstTaggedColumnId;
};

enum class TimeForm { kCurrency, kLongLong, kBinaryBigEndian };

Column TimeColumn(const char* name, TimeForm form, bool tagged) {
  switch (form) {
    case TimeForm::kCurrency:
      return {name, kColumnCurrency, 0, tagged ? Slot::kTagged : Slot::kFixed};
    case TimeForm::kLongLong:
      return {name, kColumnLongLong, 0, tagged ? Slot::kTagged : Slot::kFixed};
    case TimeForm::kBinaryBigEndian:
      break;
  }
  return {name, kColumnBinary, 0, tagged ? Slot::kTagged : Slot::kVariable};
}

const char* TimeFormName(uint32_t type) {
  switch (type) {
    case kColumnCurrency:
      return "currency";
    case kColumnLongLong:
      return "long_long";
    default:
      return "binary_be";
  }
}

// The three list times vary by version, so that both byte orders and both
// 64-bit integer types occur in every store family.
struct ListTimeForms {
  TimeForm created, modified, received;
};

ListTimeForms ListTimes(int version) {
  switch (version) {
    case kExchange2007:
      return {TimeForm::kBinaryBigEndian, TimeForm::kLongLong, TimeForm::kCurrency};
    case kExchange55:
      return {TimeForm::kCurrency, TimeForm::kBinaryBigEndian, TimeForm::kBinaryBigEndian};
    default:
      return {TimeForm::kCurrency, TimeForm::kCurrency, TimeForm::kBinaryBigEndian};
  }
}

Schema MailboxSchema() {
  Schema s;
  s.Add({"Q6764", kColumnBinary, 0, Slot::kVariable});
  s.Add({"S3001", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({"N66a0", kColumnBinary, 0, Slot::kVariable});
  s.Seal();
  return s;
}

Schema FolderSchema() {
  Schema s;
  s.Add({"L3602", kColumnLong, 0, Slot::kFixed});  // content count
  s.Add({"L3603", kColumnLong, 0, Slot::kFixed});  // unread count
  s.Add({"Q6748", kColumnBinary, 0, Slot::kVariable});
  s.Add({"Q6749", kColumnBinary, 0, Slot::kVariable});
  s.Add({"S3001", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({"S3613", kColumnText, kCodePageWestern, Slot::kVariable});
  s.Add(TimeColumn("T3007", TimeForm::kBinaryBigEndian, false));
  s.Add({"Ne58", kColumnBinary, 0, Slot::kTagged});
  s.Add({"N3616", kColumnBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

// The columns a folder's list shows, shared by "Msg" and the content tables.
void AddListColumns(Schema* s, int version) {
  const ListTimeForms times = ListTimes(version);
  s->Add({"Le07", kColumnLong, 0, Slot::kFixed});
  s->Add({"L17", kColumnLong, 0, Slot::kFixed});
  s->Add({"Be1b", kColumnBit, 0, Slot::kFixed});
  s->Add(TimeColumn("T3007", times.created, false));
  s->Add(TimeColumn("T3008", times.modified, false));
  s->Add(TimeColumn("Te06", times.received, false));
  s->Add({"N67b0", kColumnBinary, 0, Slot::kVariable});
  s->Add({"S1a", kColumnText, kCodePageWestern, Slot::kVariable});
  if (version == kExchange2007) {
    s->Add({"Se1d", kColumnText, kCodePageUnicode, Slot::kVariable});
    s->Add({"S3d", kColumnText, kCodePageUnicode, Slot::kVariable});
  } else {
    s->Add({"S3d", kColumnText, kCodePageUnicode, Slot::kVariable});
    s->Add({"Se1d", kColumnText, kCodePageUnicode, Slot::kVariable});
  }
  s->Add({"S42", kColumnText, version == kExchange55 ? kCodePageWestern : kCodePageUnicode,
          Slot::kVariable});
  s->Add({"S678e", kColumnText, kCodePageUnicode, Slot::kVariable});
  s->Add({"Se04", kColumnText, kCodePageUnicode, Slot::kVariable});
}

Schema ContentSchema(int version) {
  Schema s;
  AddListColumns(&s, version);
  s.Seal();
  return s;
}

Schema MessageSchema(int version) {
  Schema s;
  AddListColumns(&s, version);
  s.Add({"L3fde", kColumnLong, 0, Slot::kFixed});
  s.Add({"S1000", kColumnLongText, kCodePageUnicode, Slot::kTagged});
  s.Add({"N1013", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"N1009", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"S7d", kColumnLongText, kCodePageUnicode, Slot::kTagged});
  // Contacts.
  for (const char* name : {"S3a06", "S3a08", "S3a11", "S3a16", "S3a17", "S3a1c"}) {
    s.Add({name, kColumnText, kCodePageUnicode, Slot::kTagged});
  }
  s.Add(TimeColumn("T3a42", TimeForm::kLongLong, true));
  s.Add({"I3a4d", kColumnShort, 0, Slot::kTagged});
  // Appointments and meeting requests.
  s.Add({"L805c", kColumnLong, 0, Slot::kTagged});
  s.Add({"S810c", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add(TimeColumn("T814e", TimeForm::kCurrency, true));
  s.Add(TimeColumn("T8198", TimeForm::kBinaryBigEndian, true));
  // Tasks.
  s.Add({"L26", kColumnLong, 0, Slot::kTagged});
  s.Add(TimeColumn("T8078", TimeForm::kBinaryBigEndian, true));
  s.Add(TimeColumn("T8079", TimeForm::kBinaryBigEndian, true));
  s.Add({"D8121", kColumnDouble, 0, Slot::kTagged});
  s.Add({"B8124", kColumnBit, 0, Slot::kTagged});
  s.Add({"L8138", kColumnLong, 0, Slot::kTagged});
  s.Add({"S814a", kColumnText, kCodePageUnicode, Slot::kTagged});
  // Distribution lists.
  s.Add({"MN81a9", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

Schema AttachmentSchema(int version) {
  Schema s;
  s.Add({"L65f1", kColumnLong, 0, Slot::kFixed});
  s.Add({version == kExchange55 ? "Q674a" : "Q3f88", kColumnBinary, 0, Slot::kVariable});
  s.Add({"N67b0", kColumnBinary, 0, Slot::kVariable});
  const Column display = {"S3001", kColumnText, kCodePageUnicode, Slot::kVariable};
  const Column file = {"S3704", kColumnText, kCodePageWestern, Slot::kVariable};
  if (version == kExchange55) {
    s.Add(display);
    s.Add(file);
  } else {
    s.Add(file);
    s.Add(display);
  }
  s.Add({"S3707", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"N3701", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

// ---- Values

Bytes EncodeText(const ColumnLayout& c, const std::string& utf8) {
  if (c.codepage == kCodePageUnicode) return Utf8ToUtf16LE(utf8);
  const std::string bytes = Utf8ToCodePage(utf8, c.codepage);
  return Bytes(bytes.begin(), bytes.end());
}

// What a reader gets back from the column: characters the code page lacks
// come back as '?'.
std::string RoundTrip(const ColumnLayout& c, const std::string& utf8) {
  if (c.codepage == kCodePageUnicode) return utf8;
  const Bytes b = EncodeText(c, utf8);
  return CodePageToUtf8(ByteView(b), c.codepage);
}

Bytes EncodeTime(const ColumnLayout& c, uint64_t filetime) {
  Bytes b(kIdSize);
  if (c.type == kColumnBinary) {
    StoreU32BE(b.data(), uint32_t(filetime >> 32));
    StoreU32BE(b.data() + 4, uint32_t(filetime));
  } else {
    StoreU64LE(b.data(), filetime);
  }
  return b;
}

Bytes Le64(uint64_t v) {
  Bytes b(kIdSize);
  StoreU64LE(b.data(), v);
  return b;
}

Bytes NormalizedKey(const Bytes& eight) {
  Bytes key;
  key.reserve(eight.size() + 2);
  key.push_back(kKeyPrefix);
  key.insert(key.end(), eight.begin(), eight.end());
  key.push_back(kKeySuffix);
  return key;
}

void AppendUtf16z(Bytes* out, const std::string& utf8) {
  const Bytes b = Utf8ToUtf16LE(utf8);
  out->insert(out->end(), b.begin(), b.end());
  out->push_back(0);
  out->push_back(0);
}

Bytes EncodeMembers(const std::vector<ListMember>& members) {
  Bytes out(kMemberListHeader);
  StoreU32LE(out.data(), kMemberListHeader);
  StoreU32LE(out.data() + 4, uint32_t(members.size()));
  for (const ListMember& m : members) {
    const size_t at = out.size();
    out.resize(at + 4 + sizeof kOneOffProviderUid + 4, 0);
    std::memcpy(out.data() + at + 4, kOneOffProviderUid, sizeof kOneOffProviderUid);
    StoreU16LE(out.data() + at + 4 + sizeof kOneOffProviderUid + 2, kOneOffUnicode);
    AppendUtf16z(&out, m.name);
    AppendUtf16z(&out, m.address_type);
    AppendUtf16z(&out, m.address);
  }
  return out;
}

// ---- Output

// Pages go straight to the file, runs of consecutive pages in one write.
class FilePageSink : public PageSink {
 public:
  FilePageSink(int fd, uint32_t page_size) : fd_(fd), page_size_(page_size) {}
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
    // Page n sits after the two header pages.
    Status s = WriteAt(off_t(first_ + 1) * page_size_, buffer_.data(), buffer_.size());
    buffer_.clear();
    return s;
  }
  Status WriteAt(off_t offset, const uint8_t* data, size_t size) {
    while (size > 0) {
      const ssize_t n = pwrite(fd_, data, size, offset);
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

// One table being streamed: its record tree and, optionally, its
// long-value tree, both open until Finish.
class StreamTable {
 public:
  StreamTable(DatabaseWriter* db, std::string name, Schema schema, bool long_values,
              uint32_t max_rows_per_leaf)
      : db_(db), name_(std::move(name)), schema_(std::move(schema)) {
    options_ = db->NewTree(0);
    options_.max_entries_per_leaf = max_rows_per_leaf;
    writer_ = std::make_unique<TreeWriter>(db->format(), options_, db->allocator(), db->sink());
    if (long_values) {
      lv_options_ = db->NewTree(kPageFlagLongValue);
      lv_writer_ =
          std::make_unique<TreeWriter>(db->format(), lv_options_, db->allocator(), db->sink());
      chunk_size_ = DefaultLongValueChunkSize(db->format(), kLongValueIdSize);
    }
  }

  const Schema& schema() const { return schema_; }
  const std::string& name() const { return name_; }
  uint64_t rows() const { return rows_; }

  Status AddRow(Bytes key, const std::vector<Cell>& cells) {
    TreeEntry e;
    e.key = std::move(key);
    Status s = EncodeRecord(schema_.columns(), cells, db_->layout(), &e.data);
    if (s.ok()) s = writer_->Add(std::move(e));
    if (!s.ok()) return Status::InvalidArgument(name_ + ": " + s.message());
    ++rows_;
    return s;
  }

  // Stores `data` in the long-value tree; the id goes in the record.
  Status AddLongValue(Bytes data, uint64_t* id) {
    if (!lv_writer_) return Status::InvalidArgument(name_ + " has no long-value tree");
    LongValueLayout v;
    v.id = next_lv_++;
    v.data = std::move(data);
    std::vector<TreeEntry> entries;
    Status s =
        AppendLongValueEntries(v, kLongValueIdSize, chunk_size_, std::nullopt, &entries, nullptr);
    for (TreeEntry& e : entries) {
      if (!s.ok()) break;
      s = lv_writer_->Add(std::move(e));
    }
    *id = v.id;
    return s;
  }

  Status Finish() {
    TreeLayout layout, lv_layout;
    Status s = writer_->Finish(&layout);
    if (s.ok() && lv_writer_) s = lv_writer_->Finish(&lv_layout);
    if (!s.ok()) return Status::InvalidArgument(name_ + ": " + s.message());
    db_->AddTable(name_, schema_.columns(), options_, layout, lv_writer_ ? &lv_options_ : nullptr,
                  lv_writer_ ? &lv_layout : nullptr);
    return s;
  }

 private:
  DatabaseWriter* db_;
  std::string name_;
  Schema schema_;
  TreeOptions options_, lv_options_;
  std::unique_ptr<TreeWriter> writer_, lv_writer_;
  uint32_t chunk_size_ = 0;
  uint64_t next_lv_ = 1;
  uint64_t rows_ = 0;
};

// Cells of one row, by column name.
class Row {
 public:
  Row(StreamTable* table, uint32_t long_value_limit, uint32_t record_budget)
      : table_(table), limit_(long_value_limit), budget_(record_budget) {}

  Status Put(const std::string& name, Bytes value) {
    const ColumnLayout* c = Column(name);
    if (!c) return Status::InvalidArgument(table_->name() + " has no column " + name);
    used_ += value.size();
    cells_.push_back({c->id, std::move(value), 0});
    return Status::Ok();
  }
  Status Text(const std::string& name, const std::string& utf8) {
    const ColumnLayout* c = Column(name);
    if (!c) return Status::InvalidArgument(table_->name() + " has no column " + name);
    return Put(name, EncodeText(*c, utf8));
  }
  Status Time(const std::string& name, uint64_t filetime) {
    const ColumnLayout* c = Column(name);
    if (!c) return Status::InvalidArgument(table_->name() + " has no column " + name);
    return Put(name, EncodeTime(*c, filetime));
  }
  // A tagged value that goes to the long-value tree when it is large or
  // the record is filling up. `separated` tells which happened.
  Status Large(const std::string& name, Bytes value, bool* separated = nullptr) {
    const ColumnLayout* c = Column(name);
    if (!c) return Status::InvalidArgument(table_->name() + " has no column " + name);
    const bool to_tree = value.size() > limit_ || used_ + value.size() > budget_;
    if (separated) *separated = to_tree;
    if (!to_tree) return Put(name, std::move(value));
    uint64_t id = 0;
    Status s = table_->AddLongValue(std::move(value), &id);
    if (s.ok()) cells_.push_back(SeparatedCell(c->id, id));
    return s;
  }
  const ColumnLayout* Column(const std::string& name) const { return table_->schema().Find(name); }
  std::vector<Cell>& cells() { return cells_; }

 private:
  StreamTable* table_;
  uint32_t limit_;
  uint32_t budget_;
  size_t used_ = 0;
  std::vector<Cell> cells_;
};

// ---- The store

class StoreWriter {
 public:
  StoreWriter(const LegacyStoreOptions& options, const StoreContent& content,
              StoreManifest* manifest)
      : options_(options), content_(content), manifest_(manifest) {}

  Status Write(const std::string& path);

 private:
  Status WriteMailboxes(StreamTable* table);
  Status WriteFolders(StreamTable* table);
  Status WriteItem(size_t folder, ManifestItem item);
  Status ListCells(Row* row, const ManifestItem& item);
  void DescribeFolders();
  size_t OwnerOf(size_t folder) const;

  const LegacyStoreOptions& options_;
  const StoreContent& content_;
  StoreManifest* manifest_;
  uint32_t limit_ = 0;
  uint32_t budget_ = 0;
  StreamTable* msg_ = nullptr;
  StreamTable* attachments_ = nullptr;
  std::vector<std::unique_ptr<StreamTable>> content_tables_;
  std::set<Bytes> duplicate_keys_;
  uint64_t attachment_counter_ = 0;
};

Status StoreWriter::WriteMailboxes(StreamTable* table) {
  std::vector<size_t> order(content_.mailboxes.size());
  for (size_t i = 0; i < order.size(); ++i) order[i] = i;
  auto key = [&](size_t i) { return NormalizedKey(Le64(content_.mailboxes[i].number)); };
  std::sort(order.begin(), order.end(), [&](size_t a, size_t b) { return key(a) < key(b); });
  for (size_t r = 0; r < order.size(); ++r) {
    const ManifestMailbox& mb = content_.mailboxes[order[r]];
    Row row(table, limit_, budget_);
    Status s = row.Put("Q6764", Le64(mb.number));
    if (s.ok()) s = row.Text("S3001", mb.name);
    if (s.ok()) s = row.Put("N66a0", mb.property);
    if (s.ok()) s = table->AddRow(key(order[r]), row.cells());
    if (!s.ok()) return s;
    manifest_->mailboxes[order[r]].row = uint32_t(r);
  }
  return Status::Ok();
}

Status StoreWriter::WriteFolders(StreamTable* table) {
  std::vector<size_t> order(content_.folders.size());
  for (size_t i = 0; i < order.size(); ++i) order[i] = i;
  auto key = [&](size_t i) { return NormalizedKey(Le64(content_.folders[i].id)); };
  std::sort(order.begin(), order.end(), [&](size_t a, size_t b) { return key(a) < key(b); });
  for (size_t r = 0; r < order.size(); ++r) {
    const ManifestFolder& f = content_.folders[order[r]];
    const ManifestFolder& m = manifest_->folders[order[r]];
    Row row(table, limit_, budget_);
    uint32_t unread = 0;
    for (const ManifestItem& it : f.items) unread += (it.flags & 1) ? 0 : 1;
    Status s = row.Put("L3602", LittleEndian(m.item_count, 4));
    if (s.ok()) s = row.Put("L3603", LittleEndian(unread, 4));
    if (s.ok()) s = row.Put("Q6748", Le64(f.id));
    if (s.ok()) s = row.Put("Q6749", Le64(f.parent));
    if (s.ok()) s = row.Text("S3001", f.name);
    if (s.ok()) s = row.Text("S3613", f.container_class);
    if (s.ok() && !f.items.empty()) s = row.Time("T3007", f.items.front().created);
    // The creator: the owner of the folder's mailbox (the first for a public store).
    if (s.ok()) s = row.Put("Ne58", UserSid(uint32_t(1000 + OwnerOf(order[r]))));
    if (s.ok()) s = table->AddRow(key(order[r]), row.cells());
    if (!s.ok()) return s;
    manifest_->folders[order[r]].row = uint32_t(r);
  }
  return Status::Ok();
}

Status StoreWriter::ListCells(Row* row, const ManifestItem& item) {
  Status s = row->Put("N67b0", item.key);
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  next(row->Text("S1a", item.message_class));
  if (!item.subject_prefix.empty()) next(row->Text("S3d", item.subject_prefix));
  next(row->Text("Se1d", item.normalized_subject));
  if (!item.sender.empty()) next(row->Text("S42", item.sender));
  if (!item.to.empty()) {
    next(row->Text("S678e", item.to));
    next(row->Text("Se04", item.to));
  }
  next(row->Time("T3007", item.created));
  next(row->Time("T3008", item.modified));
  next(row->Time("Te06", item.received));
  next(row->Put("Le07", LittleEndian(item.flags, 4)));
  next(row->Put("L17", LittleEndian(item.importance, 4)));
  next(row->Put("Be1b", Bytes{uint8_t(item.has_attachments ? kBitTrue : 0)}));
  return s;
}

Status StoreWriter::WriteItem(size_t folder, ManifestItem item) {
  const int version = options_.version;
  // What a reader sees of the 1252 columns.
  const ColumnLayout* sender = msg_->schema().Find("S42");
  item.sender = RoundTrip(*sender, item.sender);
  item.message_class = RoundTrip(*msg_->schema().Find("S1a"), item.message_class);
  item.subject = item.subject_prefix + item.normalized_subject;
  item.to_shown = version == kExchange55 ? "" : item.to;
  item.sender_shown = version == kExchange55 ? "" : item.sender;

  // The folder's list row.
  StreamTable* list = content_tables_[folder].get();
  Row list_row(list, limit_, budget_);
  Status s = ListCells(&list_row, item);
  if (s.ok()) s = list->AddRow(NormalizedKey(item.key), list_row.cells());
  if (!s.ok()) return s;

  if (item.in_msg_table) {
    Row row(msg_, limit_, budget_);
    s = ListCells(&row, item);
    auto next = [&](Status st) {
      if (s.ok()) s = st;
    };
    next(row.Put("L3fde", LittleEndian(kInternetCodePageUtf8, 4)));
    bool separated = false;
    if (!item.body_text.empty()) {
      next(row.Large("S1000", Utf8ToUtf16LE(item.body_text), &separated));
      item.body_long_value |= separated;
    }
    if (!item.body_html.empty()) {
      next(row.Large("N1013", Bytes(item.body_html.begin(), item.body_html.end()), &separated));
      item.body_long_value |= separated;
    }
    if (!item.rtf_text.empty()) {
      Bytes rtf = item.rtf_uses_references ? EncodeRtfCompressed(item.rtf_text)
                                           : EncodeRtfLiteral(item.rtf_text);
      next(row.Large("N1009", std::move(rtf), &separated));
      item.body_long_value |= separated;
    }
    if (!item.headers.empty()) next(row.Large("S7d", Utf8ToUtf16LE(item.headers)));
    for (const auto& [name, value] : item.strings) next(row.Text(name, value));
    for (const auto& [name, value] : item.times) next(row.Time(name, value));
    for (const auto& [name, value] : item.numbers) {
      const ColumnLayout* c = row.Column(name);
      if (!c) {
        next(Status::InvalidArgument("Msg has no column " + name));
        continue;
      }
      const size_t width = c->type == kColumnBit ? 1 : c->type == kColumnShort ? 2 : 4;
      next(row.Put(name, LittleEndian(uint64_t(value), width)));
    }
    for (const auto& [name, value] : item.doubles) {
      uint64_t bits;
      std::memcpy(&bits, &value, sizeof bits);
      next(row.Put(name, LittleEndian(bits, 8)));
    }
    if (!item.members.empty()) next(row.Large("MN81a9", EncodeMembers(item.members)));
    if (s.ok()) s = msg_->AddRow(NormalizedKey(item.key), row.cells());
    if (!s.ok()) return s;
    ++manifest_->messages;

    // A second row under the same key, as a damaged store may hold.
    if (duplicate_keys_.count(item.key)) {
      std::string subject;
      for (const DuplicateRow& d : content_.duplicates) {
        if (d.key == item.key) subject = d.subject;
      }
      ManifestItem copy = item;
      copy.subject_prefix.clear();
      copy.normalized_subject = subject;
      Row dup(msg_, limit_, budget_);
      s = ListCells(&dup, copy);
      Bytes key = NormalizedKey(item.key);
      key.push_back(kDuplicateKeyTail);
      if (s.ok()) s = msg_->AddRow(std::move(key), dup.cells());
      if (!s.ok()) return s;
      manifest_->duplicates.push_back({item.key, subject});
    }

    // Attachments, in key order, all after the message's own earlier ones.
    for (ManifestAttachment& a : item.attachments) {
      a.key = ItemKey(++attachment_counter_);
      Row arow(attachments_, limit_, budget_);
      s = arow.Put(manifest_->attachment_key_column, a.key);
      next(arow.Put("N67b0", item.key));
      next(arow.Put("L65f1", LittleEndian(a.method, 4)));
      const ColumnLayout* file = attachments_->schema().Find("S3704");
      a.file_name = RoundTrip(*file, a.file_name);
      if (!a.display_name.empty()) next(arow.Text("S3001", a.display_name));
      if (!a.file_name.empty()) next(arow.Text("S3704", a.file_name));
      if (!a.long_file_name.empty()) next(arow.Text("S3707", a.long_file_name));
      // The name a reader keeps: the first non-empty of the two in column order.
      a.name.clear();
      for (const ColumnLayout& c : attachments_->schema().columns()) {
        if (!a.name.empty()) break;
        if (c.name == "S3001") a.name = a.display_name;
        if (c.name == "S3704") a.name = a.file_name;
      }
      a.size = a.data.size();
      if (manifest_->items_recorded) a.sha256 = Sha256Hex(ByteView(a.data));
      next(arow.Large("N3701", a.data, &a.long_value));
      if (s.ok()) s = attachments_->AddRow(NormalizedKey(a.key), arow.cells());
      if (!s.ok()) return s;
      ++manifest_->attachment_rows;
    }
  }
  ManifestFolder& f = manifest_->folders[folder];
  if (manifest_->items_recorded) f.items.push_back(std::move(item));
  return Status::Ok();
}

size_t StoreWriter::OwnerOf(size_t folder) const {
  const std::vector<std::string>& path = manifest_->folders[folder].path;
  for (size_t i = 0; i < content_.mailboxes.size(); ++i) {
    if (!path.empty() && path.front() == content_.mailboxes[i].name) return i;
  }
  return 0;
}

// Paths, visibility and icons: what the folder tree shows.
void StoreWriter::DescribeFolders() {
  std::map<uint64_t, size_t> by_id;
  for (size_t i = 0; i < content_.folders.size(); ++i) by_id.emplace(content_.folders[i].id, i);
  std::map<uint64_t, std::string> mailbox_names;
  for (const ManifestMailbox& mb : content_.mailboxes) mailbox_names[mb.number] = mb.name;

  for (size_t i = 0; i < content_.folders.size(); ++i) {
    ManifestFolder& f = manifest_->folders[i];
    f.content_name = ContentName(f.id);
    f.content_table = ContentTableName(f.id);
    f.icon = FolderIcon(f.name);
    // Walk up; the folder is shown when the walk reaches the top without
    // meeting a row the tree leaves out.
    std::vector<std::string> path;
    bool visible = true;
    size_t at = i;
    for (size_t steps = 0;; ++steps) {
      const ManifestFolder& node = content_.folders[at];
      path.push_back(node.name);
      const bool dropped =
          node.name.empty() || (node.parent == kRootFolderParent && node.name != "Public Root");
      if (dropped || node.id == node.parent || steps > content_.folders.size()) {
        visible = false;
        break;
      }
      if (content_.public_store && node.parent == kRootFolderParent) break;  // "Public Root"
      if (!content_.public_store && mailbox_names.count(node.parent)) {
        path.push_back(mailbox_names[node.parent]);
        break;
      }
      auto p = by_id.find(node.parent);
      if (p == by_id.end()) {
        visible = false;
        break;
      }
      at = p->second;
    }
    std::reverse(path.begin(), path.end());
    f.path = std::move(path);
    f.visible = visible;
    if (content_.public_store && f.parent == kRootFolderParent && f.name == "Public Root") {
      f.icon = kIconTop;
    }
  }
}

Status StoreWriter::Write(const std::string& path) {
  const int version = options_.version;
  DatabaseLayout layout;
  layout.format_version = kFormatVersion;
  switch (version) {
    case kExchange55:
      layout.page_size = kPage4K;
      layout.format_revision = kRevision55;
      break;
    case kExchange2000:
      layout.page_size = kPage4K;
      layout.format_revision = kRevision2000;
      break;
    case kExchange2007:
      layout.page_size = kPage8K;
      layout.format_revision = kRevision2007;
      break;
    default:
      return Status::InvalidArgument("legacy store version must be 4, 1 or 2");
  }
  limit_ = options_.long_value_limit ? options_.long_value_limit
                                     : layout.page_size / kDefaultLimitDivisor;
  budget_ = layout.page_size / kRecordBudgetDivisor;

  StoreManifest& m = *manifest_;
  m = StoreManifest();
  m.version = version;
  m.public_store = content_.public_store;
  m.page_size = layout.page_size;
  m.revision = layout.format_revision;
  m.attachment_table = content_.public_store ? "1-A" : version == kExchange2000 ? "1-23" : "1-24";
  m.attachment_key_column = version == kExchange55 ? "Q674a" : "Q3f88";
  m.items_recorded = options_.record_items;
  m.mailboxes = content_.mailboxes;
  m.folders = content_.folders;
  for (ManifestFolder& f : m.folders) {
    f.item_count = f.items.size();
    f.items.clear();
  }
  DescribeFolders();
  std::set<std::string> names;
  for (const ManifestFolder& f : m.folders) {
    if (!names.insert(f.content_table).second) {
      return Status::InvalidArgument("two folders share the content table " + f.content_table);
    }
  }
  for (const DuplicateRow& d : content_.duplicates) duplicate_keys_.insert(d.key);

  // Bulk mail is counted up front so the "Folders" rows carry real counts.
  std::vector<uint64_t> bulk_counts(m.folders.size(), 0);
  if (options_.bulk.messages) {
    BulkMailSource counter(content_, options_.bulk);
    size_t folder;
    while (counter.NextFolder(&folder)) ++bulk_counts[folder];
  }
  for (size_t i = 0; i < m.folders.size(); ++i) m.folders[i].item_count += bulk_counts[i];

  const int fd = open(path.c_str(), O_CREAT | O_TRUNC | O_WRONLY, 0644);
  if (fd < 0) return Status::IoError("cannot create " + path);
  FilePageSink sink(fd, layout.page_size);
  Status s = [&]() -> Status {
    DatabaseWriter db(layout, &sink);
    if (!db.status().ok()) return db.status();
    StreamTable mailbox(&db, "Mailbox", MailboxSchema(), false, 0);
    StreamTable folders(&db, "Folders", FolderSchema(), false, 0);
    StreamTable msg(&db, "Msg", MessageSchema(version), true, options_.max_rows_per_leaf);
    StreamTable attach(&db, m.attachment_table, AttachmentSchema(version), true,
                       options_.max_rows_per_leaf);
    msg_ = &msg;
    attachments_ = &attach;
    for (const ManifestFolder& f : m.folders) {
      content_tables_.push_back(std::make_unique<StreamTable>(
          &db, f.content_table, ContentSchema(version), false, options_.max_rows_per_leaf));
    }
    for (const auto& [table, schema] :
         {std::pair{std::string("Msg"), &msg.schema()},
          std::pair{std::string("Content"), &content_tables_.front()->schema()},
          std::pair{std::string("Folders"), &folders.schema()}}) {
      for (const ColumnLayout& c : schema->columns()) {
        if (c.name[0] == 'T') m.time_encodings[table + "." + c.name] = TimeFormName(c.type);
      }
    }

    Status st = WriteMailboxes(&mailbox);
    if (st.ok()) st = WriteFolders(&folders);
    if (!st.ok()) return st;

    // Fixture items in key order, then the bulk mail (whose keys follow).
    std::vector<std::pair<size_t, const ManifestItem*>> items;
    for (size_t f = 0; f < content_.folders.size(); ++f) {
      for (const ManifestItem& it : content_.folders[f].items) items.push_back({f, &it});
    }
    std::sort(items.begin(), items.end(),
              [](const auto& a, const auto& b) { return a.second->key < b.second->key; });
    for (const auto& [f, it] : items) {
      st = WriteItem(f, *it);
      if (!st.ok()) return st;
    }
    BulkMailSource bulk(content_, options_.bulk);
    size_t folder;
    ManifestItem item;
    while (bulk.Next(&folder, &item)) {
      st = WriteItem(folder, std::move(item));
      if (!st.ok()) return st;
    }
    m.msg_rows = msg.rows();

    for (StreamTable* t : {&mailbox, &folders, &msg, &attach}) {
      st = t->Finish();
      if (!st.ok()) return st;
    }
    for (auto& t : content_tables_) {
      st = t->Finish();
      if (!st.ok()) return st;
    }
    Bytes header;
    Manifest pages;
    st = db.Finish(&header, &pages);
    if (st.ok()) st = sink.Flush();
    if (st.ok()) st = sink.WriteAt(0, header.data(), header.size());
    if (st.ok()) st = sink.WriteAt(layout.page_size, header.data(), header.size());
    const off_t size = off_t(db.total_pages() + 2) * layout.page_size;
    if (st.ok() && ftruncate(fd, size) != 0) st = Status::IoError("cannot size " + path);
    return st;
  }();
  content_tables_.clear();
  if (close(fd) != 0 && s.ok()) s = Status::IoError("cannot write " + path);
  return s;
}

}  // namespace

std::string ContentName(uint64_t folder_id) {
  char hex[32];
  std::snprintf(hex, sizeof hex, "%llx", static_cast<unsigned long long>(folder_id));
  const std::string text = hex;
  std::string name = text.size() > 1 ? text.substr(1) : "";
  for (size_t i = text.size() >= 4 ? text.size() - 4 : 0; i >= 1 && i + 4 <= text.size(); --i) {
    if (text.compare(i, 4, "0000") == 0) {
      name = text.substr(i + 4);
      break;
    }
  }
  for (char& c : name) c = char(std::toupper(static_cast<unsigned char>(c)));
  return name;
}

std::string ContentTableName(uint64_t folder_id) { return "1-" + ContentName(folder_id); }

Status BuildLegacyStore(const LegacyStoreOptions& options, const std::string& path,
                        StoreManifest* manifest) {
  if (!manifest) return Status::InvalidArgument("no manifest given");
  const StoreContent content =
      MakeFixtureContent(options.public_store, options.damage, options.bulk);
  StoreWriter writer(options, content, manifest);
  return writer.Write(path);
}

}  // namespace tarnwell::forge::exchange
