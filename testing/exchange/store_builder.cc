#include "testing/exchange/store_builder.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <map>
#include <memory>
#include <set>
#include <vector>

#include "base/text.h"
#include "testing/exchange/store_tables.h"
#include "testing/forge_database.h"
#include "testing/forge_record.h"
#include "testing/forge_stream.h"

namespace tarnwell::forge::exchange {
namespace {

constexpr uint32_t kFormatVersion = 0x620;
constexpr uint32_t kPage4K = 4096;
constexpr uint32_t kPage8K = 8192;
constexpr uint32_t kRevision55 = 2;
constexpr uint32_t kRevision2000 = 9;
constexpr uint32_t kRevision2007 = 12;
// A second row under a key: the first row's key plus this byte.
constexpr uint8_t kDuplicateKeyTail = 0x01;

// A record must fit its page with room for the node header and the tag; keep
// well below that so several big values in one row still fit.
constexpr uint32_t kRecordBudgetDivisor = 2;
constexpr uint32_t kDefaultLimitDivisor = 4;

// ---- Table schemas

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

using Columns = std::vector<ColumnLayout>;

Columns MailboxSchema() {
  return Schema()
      .Add({Variable("Q6764", kColumnBinary), Variable("S3001", kColumnText, kCodePageUnicode),
            Variable("N66a0", kColumnBinary)})
      .Columns();
}

Columns FolderSchema() {
  return Schema()
      .Add({Fixed("L3602", kColumnLong),  // content count
            Fixed("L3603", kColumnLong),  // unread count
            Variable("Q6748", kColumnBinary), Variable("Q6749", kColumnBinary),
            Variable("S3001", kColumnText, kCodePageUnicode),
            Variable("S3613", kColumnText, kCodePageWestern),
            TimeColumn("T3007", TimeForm::kBinaryBigEndian, false), Tagged("Ne58", kColumnBinary),
            Tagged("N3616", kColumnBinary)})
      .Columns();
}

// The columns a folder's list shows, shared by "Msg" and the content tables.
Schema ListSchema(int version) {
  const ListTimeForms times = ListTimes(version);
  const Column prefix = Variable("S3d", kColumnText, kCodePageUnicode);
  const Column subject = Variable("Se1d", kColumnText, kCodePageUnicode);
  Schema s;
  s.Add({Fixed("Le07", kColumnLong), Fixed("L17", kColumnLong), Fixed("Be1b", kColumnBit),
         TimeColumn("T3007", times.created, false), TimeColumn("T3008", times.modified, false),
         TimeColumn("Te06", times.received, false), Variable("N67b0", kColumnBinary),
         Variable("S1a", kColumnText, kCodePageWestern)});
  if (version == kExchange2007) {
    s.Add({subject, prefix});
  } else {
    s.Add({prefix, subject});
  }
  return s.Add(
      {Variable("S42", kColumnText, version == kExchange55 ? kCodePageWestern : kCodePageUnicode),
       Variable("S678e", kColumnText, kCodePageUnicode),
       Variable("Se04", kColumnText, kCodePageUnicode)});
}

Columns MessageSchema(int version) {
  Schema s = ListSchema(version);
  s.Add({Fixed("L3fde", kColumnLong), Tagged("S1000", kColumnLongText, kCodePageUnicode),
         Tagged("N1013", kColumnLongBinary), Tagged("N1009", kColumnLongBinary),
         Tagged("S7d", kColumnLongText, kCodePageUnicode)});
  // Contacts.
  for (const char* name : {"S3a06", "S3a08", "S3a11", "S3a16", "S3a17", "S3a1c"}) {
    s.Add(Tagged(name, kColumnText, kCodePageUnicode));
  }
  s.Add({TimeColumn("T3a42", TimeForm::kLongLong, true), Tagged("I3a4d", kColumnShort)});
  // Appointments and meeting requests.
  s.Add({Tagged("L805c", kColumnLong), Tagged("S810c", kColumnText, kCodePageUnicode),
         TimeColumn("T814e", TimeForm::kCurrency, true),
         TimeColumn("T8198", TimeForm::kBinaryBigEndian, true)});
  // Tasks.
  s.Add({Tagged("L26", kColumnLong), TimeColumn("T8078", TimeForm::kBinaryBigEndian, true),
         TimeColumn("T8079", TimeForm::kBinaryBigEndian, true), Tagged("D8121", kColumnDouble),
         Tagged("B8124", kColumnBit), Tagged("L8138", kColumnLong),
         Tagged("S814a", kColumnText, kCodePageUnicode)});
  // Distribution lists.
  return s.Add(Tagged("MN81a9", kColumnLongBinary)).Columns();
}

Columns AttachmentSchema(int version) {
  Schema s;
  s.Add({Fixed("L65f1", kColumnLong),
         Variable(version == kExchange55 ? "Q674a" : "Q3f88", kColumnBinary),
         Variable("N67b0", kColumnBinary)});
  const Column display = Variable("S3001", kColumnText, kCodePageUnicode);
  const Column file = Variable("S3704", kColumnText, kCodePageWestern);
  if (version == kExchange55) {
    s.Add({display, file});
  } else {
    s.Add({file, display});
  }
  return s.Add({Tagged("S3707", kColumnText, kCodePageUnicode), Tagged("N3701", kColumnLongBinary)})
      .Columns();
}

// What a reader gets back from a text column: characters the code page
// lacks come back as '?'.
std::string RoundTrip(const ColumnLayout& c, const std::string& utf8) {
  if (c.codepage == kCodePageUnicode) return utf8;
  const std::string bytes = Utf8ToCodePage(utf8, c.codepage);
  return CodePageToUtf8(ByteView(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size()),
                        c.codepage);
}

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
  auto key = [&](size_t i) { return BinaryKey(Le64(content_.mailboxes[i].number)); };
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
  auto key = [&](size_t i) { return BinaryKey(Le64(content_.folders[i].id)); };
  std::sort(order.begin(), order.end(), [&](size_t a, size_t b) { return key(a) < key(b); });
  for (size_t r = 0; r < order.size(); ++r) {
    const ManifestFolder& f = content_.folders[order[r]];
    const ManifestFolder& m = manifest_->folders[order[r]];
    Row row(table, limit_, budget_);
    uint32_t unread = 0;
    for (const ManifestItem& it : f.items) unread += (it.flags & 1) ? 0 : 1;
    Status s = row.Number("L3602", m.item_count);
    if (s.ok()) s = row.Number("L3603", unread);
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

// The list columns; "Se04" shows the To line too.
Status StoreWriter::ListCells(Row* row, const ManifestItem& item) {
  Status s = PutListColumns(row, item);
  if (s.ok() && !item.to.empty()) s = row->Text("Se04", item.to);
  return s;
}

Status StoreWriter::WriteItem(size_t folder, ManifestItem item) {
  const int version = options_.version;
  // What a reader sees of the 1252 columns.
  item.sender = RoundTrip(*msg_->Find("S42"), item.sender);
  item.message_class = RoundTrip(*msg_->Find("S1a"), item.message_class);
  item.subject = item.subject_prefix + item.normalized_subject;
  item.to_shown = version == kExchange55 ? "" : item.to;
  item.sender_shown = version == kExchange55 ? "" : item.sender;

  // The folder's list row.
  StreamTable* list = content_tables_[folder].get();
  Row list_row(list, limit_, budget_);
  Status s = ListCells(&list_row, item);
  if (s.ok()) s = list->AddRow(BinaryKey(item.key), list_row.cells());
  if (!s.ok()) return s;

  if (item.in_msg_table) {
    Row row(msg_, limit_, budget_);
    s = ListCells(&row, item);
    auto next = [&](Status st) {
      if (s.ok()) s = st;
    };
    next(PutPropertyColumns(&row, &item));
    if (s.ok()) s = msg_->AddRow(BinaryKey(item.key), row.cells());
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
      Bytes key = BinaryKey(item.key);
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
      next(arow.Number("L65f1", a.method));
      a.file_name = RoundTrip(*attachments_->Find("S3704"), a.file_name);
      if (!a.display_name.empty()) next(arow.Text("S3001", a.display_name));
      if (!a.file_name.empty()) next(arow.Text("S3704", a.file_name));
      if (!a.long_file_name.empty()) next(arow.Text("S3707", a.long_file_name));
      // The name a reader keeps: the first non-empty of the two in column order.
      a.name.clear();
      for (const ColumnLayout& c : attachments_->columns()) {
        if (!a.name.empty()) break;
        if (c.name == "S3001") a.name = a.display_name;
        if (c.name == "S3704") a.name = a.file_name;
      }
      a.size = a.data.size();
      if (manifest_->items_recorded) a.sha256 = Sha256Hex(ByteView(a.data));
      next(arow.Large("N3701", a.data, Compression::kNone, &a.long_value));
      if (s.ok()) s = attachments_->AddRow(BinaryKey(a.key), arow.cells());
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

  DatabaseFile file(layout.page_size);
  Status s = file.Create(path);
  if (!s.ok()) return s;
  s = [&]() -> Status {
    DatabaseWriter db(layout, &file);
    if (!db.status().ok()) return db.status();
    const uint32_t leaf = options_.max_rows_per_leaf;
    StreamTable mailbox(&db, "Mailbox", MailboxSchema(), {});
    StreamTable folders(&db, "Folders", FolderSchema(), {});
    StreamTable msg(&db, "Msg", MessageSchema(version),
                    {.long_values = true, .max_rows_per_leaf = leaf});
    StreamTable attach(&db, m.attachment_table, AttachmentSchema(version),
                       {.long_values = true, .max_rows_per_leaf = leaf});
    msg_ = &msg;
    attachments_ = &attach;
    for (const ManifestFolder& f : m.folders) {
      content_tables_.push_back(
          std::make_unique<StreamTable>(&db, f.content_table, ListSchema(version).Columns(),
                                        StreamTableOptions{.max_rows_per_leaf = leaf}));
    }
    for (const auto& [table, columns] :
         {std::pair{std::string("Msg"), &msg.columns()},
          std::pair{std::string("Content"), &content_tables_.front()->columns()},
          std::pair{std::string("Folders"), &folders.columns()}}) {
      for (const ColumnLayout& c : *columns) {
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
    Manifest pages;
    return file.Finish(&db, &pages);
  }();
  content_tables_.clear();
  return file.Close(s);
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
