#include "testing/exchange/modern_store_builder.h"

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <cstring>
#include <iterator>
#include <map>
#include <memory>
#include <optional>
#include <string_view>
#include <tuple>
#include <vector>

#include "base/text.h"
#include "testing/exchange/property_blob_encoder.h"
#include "testing/exchange/real_blob_encoder.h"
#include "testing/exchange/store_tables.h"
#include "testing/forge_database.h"
#include "testing/forge_record.h"
#include "testing/forge_stream.h"
#include "testing/forge_value.h"

namespace tarnwell::forge::exchange {
namespace {

constexpr uint32_t kFormatVersion = 0x620;
constexpr uint32_t kPage32K = 32768;
constexpr uint32_t kRevision2010 = 17;
constexpr uint32_t kRevision2013 = 20;
constexpr uint32_t kRevisionReal = 110;
// A catalog of this revision has records ending at fixed column 11.
constexpr uint32_t kEarly2013CatalogRevision = 17;

constexpr uint8_t kKeyPrefix = 0x7F;
constexpr uint32_t kFlagRead = 0x1;

constexpr uint16_t kBodyTypePlain = 1;
constexpr uint16_t kBodyTypeHtml = 3;

// "MessageId": a per-mailbox prefix, then the message key.
constexpr size_t kMessageIdSize = 26;
constexpr size_t kMessageIdPrefix = kMessageIdSize - kIdSize;

// Property ids of the blob.
constexpr uint16_t kPropSender = 0x0042;
constexpr uint16_t kPropNormalizedSubject = 0x0E1D;
constexpr uint16_t kPropCc = 0x0E03;
constexpr uint16_t kPropFlags = 0x0E07;
constexpr uint16_t kPropBody = 0x1000;

constexpr uint64_t kMailboxNumbers2013[] = {7, 101, 102};
constexpr uint64_t kMailboxNumbers2010[] = {0x2000000003Aull, 0x123456789Aull, 0x30000000000C1ull};
constexpr uint64_t kBrokenMailbox2013 = 103;
constexpr uint64_t kBrokenMailbox2010 = 0x400000000D4ull;

constexpr uint32_t kRecordBudgetDivisor = 2;
constexpr uint32_t kDefaultLimitDivisor = 4;
constexpr size_t kLargeHtmlLines = 2500;

// ---- Table schemas

using Columns = std::vector<ColumnLayout>;

constexpr int kSeparatedColumns = 4;
const char* const kSeparated[kSeparatedColumns] = {"SeparatedProperty01", "SeparatedProperty02",
                                                   "SeparatedProperty03", "SeparatedProperty04"};

// Code 5 in either layout (`real`), and code 3's "Mailbox" and "Folders-x".
Columns MailboxSchema(bool modern, bool real) {
  if (!modern) {
    return Schema()
        .Add({Variable("Q6764", kColumnBinary), Variable("S3001", kColumnText, kCodePageUnicode)})
        .Columns();
  }
  Schema s;
  s.Add({Fixed("MailboxNumber", kColumnLong),
         Variable("DisplayName", kColumnText, kCodePageUnicode),
         Tagged("MailboxOwnerDisplayName", kColumnText, kCodePageUnicode)});
  if (real) s.Add(Tagged("PropertyBlob", kColumnLongBinary));
  return s.Columns();
}

Columns FolderSchema(bool modern, bool real) {
  Schema s;
  if (real) s.Add(Fixed("SpecialFolderNumber", kColumnLong));
  s.Add({Variable(modern ? "FolderId" : "Q6748", kColumnBinary),
         Variable(modern ? "ParentFolderId" : "Q6749", kColumnBinary),
         Variable(modern ? "DisplayName" : "S3001", kColumnText, kCodePageUnicode),
         Variable(modern ? "ContainerClass" : "S3613", kColumnText, kCodePageUnicode)});
  if (real) {
    s.Add({Tagged("PropertyBlob", kColumnLongBinary),
           Tagged("SeparatedProperty01", kColumnLongBinary)});
  }
  return s.Columns();
}

Columns MessageSchema(bool real) {
  Schema s;
  s.Add({Fixed("MessageDocumentId", kColumnLong), Fixed("IsRead", kColumnBit),
         Fixed("Importance", kColumnLong), Fixed("HasAttachments", kColumnBit),
         Fixed("BodyType", kColumnShort), Fixed("DateCreated", kColumnDateTime)});
  if (real) {
    s.Add({Fixed("DateReceived", kColumnDateTime), Fixed("DateSent", kColumnDateTime)});
  } else {
    s.Add({Fixed("LastModificationTime", kColumnDateTime), Fixed("DateReceived", kColumnDateTime)});
  }
  s.Add({Variable("MessageId", kColumnBinary), Variable("FolderId", kColumnBinary),
         Tagged("MessageClass", kColumnText, kCodePageWestern),
         Tagged("DisplayTo", kColumnText, kCodePageUnicode),
         Tagged("SubjectPrefix", kColumnText, kCodePageUnicode),
         Tagged("PropertyBlob", kColumnLongBinary)});
  if (real) {
    s.Add({Tagged("OffPagePropertyBlob", kColumnLongBinary),
           Tagged("RecipientList", kColumnLongBinary),
           Tagged("SubobjectsBlob", kColumnLongBinary)});
  }
  s.Add(Tagged("NativeBody", kColumnLongBinary));
  if (real) {
    for (const char* name : kSeparated) s.Add(Tagged(name, kColumnLongBinary));
  }
  return s.Columns();
}

Columns AttachmentSchema(bool real) {
  Schema s;
  s.Add(Fixed("Inid", kColumnLongLong));
  if (!real) s.Add(Fixed("MessageDocumentId", kColumnLong));
  s.Add({Fixed("Size", kColumnLong), Tagged("Name", kColumnText, kCodePageUnicode)});
  if (real) s.Add(Tagged("ContentType", kColumnText, kCodePageUnicode));
  s.Add(Tagged("Content", kColumnLongBinary));
  if (real) s.Add(Tagged("PropertyBlob", kColumnLongBinary));
  return s.Columns();
}

Columns NameMappingSchema() {
  return Schema()
      .Add({Fixed("PropNumber", kColumnLong), Fixed("PropDispId", kColumnLong),
            Variable("PropGuid", kColumnBinary),
            Variable("PropName", kColumnText, kCodePageUnicode)})
      .Columns();
}

// The list columns of code 3, shared by "Body-x" and "MsgHeader-X". Times
// are 64-bit little-endian integers of two types.
Schema ListSchema2010() {
  Schema s;
  s.Add({Fixed("Le07", kColumnLong), Fixed("L17", kColumnLong), Fixed("Be1b", kColumnBit),
         Fixed("T3007", kColumnCurrency), Fixed("T3008", kColumnLongLong),
         Fixed("Te06", kColumnCurrency), Variable("Q6748", kColumnBinary),
         Variable("N67b0", kColumnBinary)});
  for (const char* name : {"S1a", "S3d", "Se1d", "S42", "S678e"}) {
    s.Add(Variable(name, kColumnText, kCodePageUnicode));
  }
  return s;
}

Columns Body2010Schema() {
  Schema s = ListSchema2010();
  s.Add({Variable("Se04", kColumnText, kCodePageUnicode), Fixed("L3fde", kColumnLong),
         Tagged("S1000", kColumnLongText, kCodePageUnicode), Tagged("N1013", kColumnLongBinary),
         Tagged("N1009", kColumnLongBinary), Tagged("S7d", kColumnLongText, kCodePageUnicode)});
  for (const char* name :
       {"S3a06", "S3a08", "S3a11", "S3a16", "S3a17", "S3a1c", "S810c", "S814a"}) {
    s.Add(Tagged(name, kColumnText, kCodePageUnicode));
  }
  for (const char* name : {"T3a42", "T814e", "T8198", "T8078", "T8079"}) {
    s.Add(Tagged(name, kColumnLongLong));
  }
  return s
      .Add({Tagged("I3a4d", kColumnShort), Tagged("L805c", kColumnLong), Tagged("L26", kColumnLong),
            Tagged("L8138", kColumnLong), Tagged("D8121", kColumnDouble),
            Tagged("B8124", kColumnBit), Tagged("MN81a9", kColumnLongBinary)})
      .Columns();
}

Columns Attachment2010Schema() {
  return Schema()
      .Add({Variable("Q674a", kColumnBinary), Variable("N67b0", kColumnBinary),
            Variable("S3001", kColumnText, kCodePageUnicode),
            Variable("S3704", kColumnText, kCodePageUnicode), Tagged("N3701", kColumnLongBinary)})
      .Columns();
}

// ---- Values and keys

// The normalized key of a signed integer: sign bit flipped, big-endian.
Bytes IntegerKey(uint64_t value, size_t width) {
  const uint64_t flipped = value ^ (uint64_t(1) << (8 * width - 1));
  Bytes key = {kKeyPrefix};
  for (size_t i = width; i-- > 0;) key.push_back(uint8_t(flipped >> (8 * i)));
  return key;
}

// "a;b;c" as its parts, empty ones included.
std::vector<std::string> SplitValues(const std::string& value) {
  std::vector<std::string> parts;
  size_t start = 0;
  for (size_t at; (at = value.find(';', start)) != std::string::npos; start = at + 1) {
    parts.push_back(value.substr(start, at - start));
  }
  parts.push_back(value.substr(start));
  return parts;
}

// ---- Real layout: ids, named properties, recipients

constexpr size_t kRealIdSize = 26;
constexpr size_t kGuidBytes = 16;
constexpr size_t kCounterBytes = 6;
constexpr uint64_t kCounterMask = (uint64_t(1) << 48) - 1;

// A mailbox's GUID: any 16 bytes of its own.
Bytes MailboxGuid(size_t mailbox) {
  Bytes g(kGuidBytes);
  for (size_t i = 0; i < kGuidBytes; ++i) g[i] = uint8_t(0x5A ^ (mailbox * 37 + i * 11));
  return g;
}

// GUID, 6-byte big-endian counter, 4 zero bytes.
Bytes RealId(size_t mailbox, uint64_t counter) {
  Bytes id = MailboxGuid(mailbox);
  for (size_t i = kCounterBytes; i-- > 0;)
    id.push_back(uint8_t((counter & kCounterMask) >> (8 * i)));
  id.resize(kRealIdSize, 0);
  return id;
}

// What readers key an id by: its last 8 bytes, little-endian.
uint64_t RealIdKey(const Bytes& id) { return LoadU64LE(id.data() + id.size() - kIdSize); }

// The counter in an item key ("00 01" + 6-byte big-endian counter).
uint64_t KeyCounter(const Bytes& key) {
  uint64_t c = 0;
  for (size_t i = key.size() >= kCounterBytes ? key.size() - kCounterBytes : 0; i < key.size();
       ++i) {
    c = (c << 8) | key[i];
  }
  return c;
}

// Property sets, as a GUID is stored.
const Bytes kSetAppointment = {0x02, 0x20, 0x06, 0x00, 0x00, 0x00, 0x00, 0x00,
                               0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};
const Bytes kSetTask = {0x03, 0x20, 0x06, 0x00, 0x00, 0x00, 0x00, 0x00,
                        0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};
const Bytes kSetAddress = {0x04, 0x20, 0x06, 0x00, 0x00, 0x00, 0x00, 0x00,
                           0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};
const Bytes kSetPublicStrings = {0x29, 0x03, 0x02, 0x00, 0x00, 0x00, 0x00, 0x00,
                                 0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};

struct NamedProperty {
  const Bytes* set;
  uint32_t dispid;   // when named by id
  const char* name;  // when named by string ("" otherwise)
  bool operator<(const NamedProperty& o) const {
    auto key = [](const NamedProperty& p) {
      return std::make_tuple(*p.set, p.dispid, std::string_view(p.name));
    };
    return key(*this) < key(o);
  }
};

// The published property behind each fixed number the fixture content uses.
std::optional<NamedProperty> PublishedProperty(uint16_t fixed) {
  switch (fixed) {
    case 0x814E:
      return NamedProperty{&kSetAppointment, 0x820D, ""};  // start
    case 0x8198:
      return NamedProperty{&kSetAppointment, 0x820E, ""};  // end
    case 0x810C:
      return NamedProperty{&kSetAppointment, 0x8208, ""};  // location
    case 0x805C:
      return NamedProperty{&kSetAppointment, 0x8205, ""};  // busy status
    case 0x8078:
      return NamedProperty{&kSetTask, 0x8104, ""};  // start
    case 0x8079:
      return NamedProperty{&kSetTask, 0x8105, ""};  // due
    case 0x8138:
      return NamedProperty{&kSetTask, 0x8101, ""};  // status
    case 0x8121:
      return NamedProperty{&kSetTask, 0x8102, ""};  // percent complete
    case 0x8124:
      return NamedProperty{&kSetTask, 0x811C, ""};  // complete
    case 0x814A:
      return NamedProperty{&kSetTask, 0x811F, ""};  // owner
    case 0x81A9:
      return NamedProperty{&kSetAddress, 0x8054, ""};  // list members
    case 0x8002:
      return NamedProperty{&kSetPublicStrings, 0, "Keywords"};
    default:
      return std::nullopt;
  }
}

// A named property no reader knows, at a number that means an appointment's
// end in the other layout.
const NamedProperty kUnknownNamed = {&kSetPublicStrings, 0, "TarnwellUnknownTime"};
constexpr uint16_t kUnknownNamedNumber = 0x8198;
constexpr uint64_t kUnknownNamedTime = 0x01BF52FC7D1D8000ull;  // some day in 1999
constexpr uint16_t kFirstNamedNumbers[] = {0x8078, 0x8100, 0x8000};

// The numbers one mailbox gives its named properties, in first-use order.
class NamedNumbers {
 public:
  explicit NamedNumbers(size_t mailbox)
      : next_(kFirstNamedNumbers[mailbox % std::size(kFirstNamedNumbers)]) {
    numbers_[kUnknownNamed] = kUnknownNamedNumber;
  }
  uint16_t Number(const NamedProperty& p) {
    auto it = numbers_.find(p);
    if (it != numbers_.end()) return it->second;
    if (next_ == kUnknownNamedNumber) ++next_;
    return numbers_[p] = next_++;
  }
  const std::map<NamedProperty, uint16_t>& numbers() const { return numbers_; }

 private:
  uint16_t next_;
  std::map<NamedProperty, uint16_t> numbers_;
};

// Recipient blobs framed as this builder frames them: u32 count, then per
// recipient u32 length and the blob.
constexpr uint16_t kPropRecipientType = 0x0C15;
constexpr uint16_t kPropDisplayName = 0x3001;
constexpr uint16_t kPropAddressType = 0x3002;
constexpr uint16_t kPropAddress = 0x3003;
constexpr uint16_t kPropSmtpAddress = 0x39FE;
constexpr int32_t kRecipientTo = 1;
constexpr int32_t kRecipientCc = 2;

std::vector<std::string> SplitLine(const std::string& line) {
  std::vector<std::string> parts;
  const std::string separator = "; ";
  size_t start = 0;
  for (size_t at; (at = line.find(separator, start)) != std::string::npos;
       start = at + separator.size()) {
    parts.push_back(line.substr(start, at - start));
  }
  if (start < line.size()) parts.push_back(line.substr(start));
  return parts;
}

Bytes RecipientList(const std::string& to, const std::string& cc) {
  Bytes out(4, 0);
  uint32_t count = 0;
  for (const auto& [type, line] : {std::pair{kRecipientTo, to}, std::pair{kRecipientCc, cc}}) {
    for (const std::string& name : SplitLine(line)) {
      std::string local;
      for (char c : name) {
        if (std::isalnum(static_cast<unsigned char>(c))) local += char(std::tolower(c));
      }
      const std::string address =
          (local.empty() ? "recipient" : local) + std::to_string(count) + "@example.org";
      RealBlobEncoder r;
      r.AddInt32(kPropRecipientType, type);
      r.AddString(kPropDisplayName, name);
      r.AddString(kPropAddressType, "SMTP");
      r.AddString(kPropAddress, address);
      r.AddString(kPropSmtpAddress, address);
      const Bytes blob = r.Finish(nullptr);
      const size_t at = out.size();
      out.resize(at + 4);
      StoreU32LE(out.data() + at, uint32_t(blob.size()));
      out.insert(out.end(), blob.begin(), blob.end());
      ++count;
    }
  }
  StoreU32LE(out.data(), count);
  return out;
}

// ---- Content

std::string Lower(std::string s) {
  for (char& c : s) c = char(std::tolower(static_cast<unsigned char>(c)));
  return s;
}
std::string Upper(std::string s) {
  for (char& c : s) c = char(std::toupper(static_cast<unsigned char>(c)));
  return s;
}

// What a code-5 item keeps: values a property blob cannot hold are dropped.
void FitItemTo2013(ManifestItem* item) {
  item->rtf_text.clear();
  item->rtf_uses_references = false;
  item->members.clear();
  item->doubles.clear();
  for (auto it = item->numbers.begin(); it != item->numbers.end();) {
    const char letter = it->first.empty() ? 0 : it->first[0];
    it = (letter == 'L' || letter == 'B') ? std::next(it) : item->numbers.erase(it);
  }
  for (auto it = item->strings.begin(); it != item->strings.end();) {
    it = it->second.size() > kBlobMaxValueBytes ? item->strings.erase(it) : std::next(it);
  }
  if (item->headers.size() > kBlobMaxValueBytes) item->headers.clear();
  // A plain body too long for the blob survives only as the native body.
  if (item->body_text.size() > kBlobMaxValueBytes && !item->body_html.empty()) {
    item->body_text.clear();
  }
  item->body_type = !item->body_html.empty()   ? kBodyTypeHtml
                    : !item->body_text.empty() ? kBodyTypePlain
                                               : 0;
  item->flags_text = (item->flags & kFlagRead) ? "Read" : "UnRead";
}

std::string LargeHtml() {
  std::string html = "<html><head><meta charset=\"utf-8\"></head><body>\n";
  for (size_t i = 0; i < kLargeHtmlLines; ++i) {
    html += "<p>Zeile " + std::to_string(i) + ": Größenprüfung — длинное письмо, 長い本文.</p>\n";
  }
  return html + "</body></html>\n";
}

// The columns of a code-5 message row that both layouts write alike.
Status PutMessageColumns(Row* row, const ManifestItem& item, Bytes message_id, Bytes folder_id) {
  Status s = row->Number("MessageDocumentId", uint32_t(item.document_id));
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  next(row->Put("MessageId", std::move(message_id)));
  next(row->Put("FolderId", std::move(folder_id)));
  next(row->Text("MessageClass", item.message_class, true));
  if (!item.to.empty()) next(row->Text("DisplayTo", item.to, true));
  if (!item.subject_prefix.empty()) next(row->Text("SubjectPrefix", item.subject_prefix, true));
  next(row->Number("DateCreated", item.created));
  next(row->Number("DateReceived", item.received));
  next(row->Number("IsRead", (item.flags & kFlagRead) ? kBitTrue : 0));
  next(row->Number("Importance", item.importance));
  next(row->Number("HasAttachments", item.has_attachments ? kBitTrue : 0));
  if (item.body_type) next(row->Number("BodyType", item.body_type));
  return s;
}

// "NativeBody": the body in its own format, Xpress compressed.
Status PutNativeBody(Row* row, ManifestItem* item) {
  if (!item->body_type) return Status::Ok();
  const std::string& body = item->body_type == kBodyTypeHtml ? item->body_html : item->body_text;
  return row->Large("NativeBody", Bytes(body.begin(), body.end()), Compression::kXpress,
                    &item->body_long_value);
}

// The attachment name readers pick, its size and digest.
void DescribeAttachment(ManifestAttachment* a, bool record_digest) {
  a->name = !a->display_name.empty() ? a->display_name : a->file_name;
  a->size = a->data.size();
  if (record_digest) a->sha256 = Sha256Hex(ByteView(a->data));
}

// ---- The store

// What the real layout keeps: what the other layout keeps, and the values
// its blobs can hold besides (16-bit values, doubles, members, long texts).
void FitItemToReal(ManifestItem* item) {
  const ManifestItem whole = *item;
  FitItemTo2013(item);
  item->doubles = whole.doubles;
  item->numbers = whole.numbers;
  item->members = whole.members;
  item->strings = whole.strings;
  item->headers = whole.headers;
  item->body_text = whole.body_text;
}

struct MailboxTables {
  std::unique_ptr<StreamTable> folders, messages, headers, attachments;
  int32_t next_document_id = 1;
  std::unique_ptr<NamedNumbers> named;  // real layout
};

class ModernWriter {
 public:
  ModernWriter(const ModernStoreOptions& options, StoreManifest* manifest)
      : options_(options),
        manifest_(manifest),
        modern_(options.version == kExchange2013),
        real_(modern_ && options.real_layout) {}

  Status Write(const std::string& path);

 private:
  void PrepareContent();
  void DescribeFolders();
  Status WriteMailboxes(StreamTable* table);
  Status WriteFolders(size_t mailbox);
  Status WriteItem(size_t folder, ManifestItem item, bool short_id = false);
  Status WriteItem2013(size_t folder, ManifestItem* item, bool short_id);
  Status WriteItem2010(size_t folder, ManifestItem* item);
  Status WriteItemReal(size_t folder, ManifestItem* item, bool short_id);
  Status WriteNameMappings(DatabaseWriter* db);
  Bytes MessageId(size_t mailbox, const Bytes& key) const;
  // The 26-byte id of folder `id` (a fixture id or a mailbox number), all
  // zeros for a mailbox's top folder's parent.
  Bytes RealFolderId(uint64_t id) const;

  const ModernStoreOptions& options_;
  StoreManifest* manifest_;
  const bool modern_;
  const bool real_;
  StoreContent content_;
  std::vector<size_t> owner_;  // mailbox index of each folder
  std::vector<MailboxTables> tables_;
  std::optional<ManifestItem> short_id_item_;
  size_t short_id_folder_ = 0;
  uint32_t limit_ = 0;
  uint32_t budget_ = 0;
  uint64_t attachment_counter_ = 0;
};

void ModernWriter::PrepareContent() {
  content_ = MakeFixtureContent(false, DamageOptions{}, options_.bulk);
  const uint64_t* numbers = modern_ ? kMailboxNumbers2013 : kMailboxNumbers2010;
  std::map<uint64_t, uint64_t> renumber;
  for (size_t i = 0; i < content_.mailboxes.size(); ++i) {
    renumber[content_.mailboxes[i].number] = numbers[i];
    content_.mailboxes[i].number = numbers[i];
  }
  for (ManifestFolder& f : content_.folders) {
    auto it = renumber.find(f.parent);
    if (it != renumber.end()) f.parent = it->second;
  }
  // The first inbox mail of each mailbox gets a Cc line and categories.
  size_t first_inbox = SIZE_MAX;
  for (size_t i = 0; i < content_.folders.size(); ++i) {
    ManifestFolder& f = content_.folders[i];
    if (f.name != "Inbox" || f.items.empty()) continue;
    if (first_inbox == SIZE_MAX) first_inbox = i;
    ManifestItem& it = f.items.front();
    it.cc = "Ольга Смирнова; Jan Novák";
    if (modern_) it.strings["MS8002"] = "Rot;Grün;緑";
  }
  if (first_inbox == SIZE_MAX) return;
  // A body large enough for several long-value chunks.
  ManifestFolder& inbox = content_.folders[first_inbox];
  const ManifestItem& model = inbox.items.front();
  ManifestItem big;
  big.key = ItemKey(content_.next_message_counter++);
  big.message_class = "IPM.Note";
  big.subject_prefix = "RE: ";
  big.normalized_subject = "Großer Bericht";
  big.sender = "Large Sender";
  big.to = model.to;
  big.received = model.received + 1;
  big.created = model.created;
  big.modified = model.modified;
  big.importance = 2;
  big.body_html = LargeHtml();
  inbox.items.push_back(std::move(big));
  if (options_.damage.short_message_id && modern_) {
    ManifestItem broken;
    broken.key = ItemKey(content_.next_message_counter++);
    broken.message_class = "IPM.Note";
    broken.normalized_subject = "Kurze MessageId";
    broken.received = model.received;
    broken.created = model.created;
    broken.modified = model.modified;
    short_id_item_ = std::move(broken);
    short_id_folder_ = first_inbox;
  }
  if (options_.damage.missing_folder_table) {
    ManifestMailbox mb;
    mb.name = "Ohne Ordnertabelle";
    mb.number = modern_ ? kBrokenMailbox2013 : kBrokenMailbox2010;
    mb.damage = "no_folder_table";
    content_.mailboxes.push_back(mb);
  }
}

// Paths, visibility, icons and owning mailboxes.
void ModernWriter::DescribeFolders() {
  std::map<uint64_t, size_t> by_id;
  for (size_t i = 0; i < content_.folders.size(); ++i) by_id.emplace(content_.folders[i].id, i);
  std::map<uint64_t, size_t> mailbox_of;
  for (size_t i = 0; i < content_.mailboxes.size(); ++i) {
    mailbox_of[content_.mailboxes[i].number] = i;
  }
  owner_.assign(content_.folders.size(), 0);
  for (size_t i = 0; i < content_.folders.size(); ++i) {
    ManifestFolder& f = manifest_->folders[i];
    f.icon = FolderIcon(f.name);
    std::vector<std::string> path;
    size_t at = i;
    for (size_t steps = 0; steps <= content_.folders.size(); ++steps) {
      const ManifestFolder& node = content_.folders[at];
      path.push_back(node.name);
      auto mb = mailbox_of.find(node.parent);
      if (mb != mailbox_of.end()) {
        path.push_back(content_.mailboxes[mb->second].name);
        owner_[i] = mb->second;
        break;
      }
      auto p = by_id.find(node.parent);
      if (p == by_id.end()) break;
      at = p->second;
    }
    std::reverse(path.begin(), path.end());
    f.path = std::move(path);
    f.visible = true;
  }
}

Bytes ModernWriter::MessageId(size_t mailbox, const Bytes& key) const {
  Bytes id(kMessageIdPrefix);
  for (size_t i = 0; i < kMessageIdPrefix; ++i) id[i] = uint8_t(0xA0 + mailbox * 16 + i);
  id.insert(id.end(), key.begin(), key.end());
  return id;
}

Bytes ModernWriter::RealFolderId(uint64_t id) const {
  for (size_t i = 0; i < content_.folders.size(); ++i) {
    if (content_.folders[i].id == id) return RealId(owner_[i], id);
  }
  return Bytes(kRealIdSize, 0);
}

Status ModernWriter::WriteMailboxes(StreamTable* table) {
  std::vector<size_t> order(content_.mailboxes.size());
  for (size_t i = 0; i < order.size(); ++i) order[i] = i;
  auto key = [&](size_t i) {
    const uint64_t n = content_.mailboxes[i].number;
    return modern_ ? IntegerKey(n, 4) : BinaryKey(Le64(n));
  };
  std::sort(order.begin(), order.end(), [&](size_t a, size_t b) { return key(a) < key(b); });
  for (size_t r = 0; r < order.size(); ++r) {
    const ManifestMailbox& mb = content_.mailboxes[order[r]];
    Row row(table, limit_, budget_);
    Status s;
    if (modern_) {
      s = row.Number("MailboxNumber", mb.number);
      if (s.ok()) s = row.Text("DisplayName", mb.name);
      if (s.ok()) s = row.Text("MailboxOwnerDisplayName", mb.name);
      if (s.ok() && real_) {
        RealBlobEncoder blob;
        blob.AddString(kPropDisplayName, mb.name);
        s = row.Large("PropertyBlob", blob.Finish(nullptr));
      }
    } else {
      s = row.Put("Q6764", Le64(mb.number));
      if (s.ok()) s = row.Text("S3001", mb.name);
    }
    if (s.ok()) s = table->AddRow(key(order[r]), row.cells());
    if (!s.ok()) return s;
    manifest_->mailboxes[order[r]].row = uint32_t(r);
  }
  return Status::Ok();
}

Status ModernWriter::WriteFolders(size_t mailbox) {
  StreamTable* table = tables_[mailbox].folders.get();
  std::vector<size_t> order;
  for (size_t i = 0; i < content_.folders.size(); ++i) {
    if (owner_[i] == mailbox) order.push_back(i);
  }
  auto key = [&](size_t i) {
    return BinaryKey(real_ ? RealFolderId(content_.folders[i].id) : Le64(content_.folders[i].id));
  };
  std::sort(order.begin(), order.end(), [&](size_t a, size_t b) { return key(a) < key(b); });
  for (size_t r = 0; r < order.size(); ++r) {
    const ManifestFolder& f = content_.folders[order[r]];
    Row row(table, limit_, budget_);
    Status s;
    if (real_) {
      constexpr uint16_t kPropContainerClass = 0x3613;
      s = row.Put("FolderId", RealFolderId(f.id));
      if (s.ok()) s = row.Put("ParentFolderId", RealFolderId(f.parent));
      if (s.ok()) s = row.Number("SpecialFolderNumber", r + 1);
      RealBlobEncoder blob;
      blob.AddString(kPropDisplayName, f.name);
      blob.AddString(kPropContainerClass, f.container_class);
      if (s.ok()) s = row.Large("PropertyBlob", blob.Finish(nullptr));
    } else {
      s = row.Put(modern_ ? "FolderId" : "Q6748", Le64(f.id));
      if (s.ok()) s = row.Put(modern_ ? "ParentFolderId" : "Q6749", Le64(f.parent));
    }
    if (s.ok()) s = row.Text(modern_ ? "DisplayName" : "S3001", f.name);
    if (s.ok()) s = row.Text(modern_ ? "ContainerClass" : "S3613", f.container_class);
    if (s.ok()) s = table->AddRow(key(order[r]), row.cells());
    if (!s.ok()) return s;
    manifest_->folders[order[r]].row = uint32_t(r);
  }
  return Status::Ok();
}

Status ModernWriter::WriteItem(size_t folder, ManifestItem item, bool short_id) {
  item.subject = item.subject_prefix + item.normalized_subject;
  item.to_shown = item.to;
  item.sender_shown = item.sender;
  Status s = real_     ? WriteItemReal(folder, &item, short_id)
             : modern_ ? WriteItem2013(folder, &item, short_id)
                       : WriteItem2010(folder, &item);
  if (!s.ok()) return s;
  ++manifest_->msg_rows;
  if (short_id) {
    manifest_->unmapped.push_back({item.key, item.subject});
    return Status::Ok();
  }
  ++manifest_->messages;
  ManifestFolder& f = manifest_->folders[folder];
  ++f.item_count;
  if (manifest_->items_recorded) f.items.push_back(std::move(item));
  return Status::Ok();
}

Status ModernWriter::WriteItem2013(size_t folder, ManifestItem* item, bool short_id) {
  FitItemTo2013(item);
  if (!options_.later_2013_variant) item->cc.clear();
  const size_t mailbox = owner_[folder];
  MailboxTables& t = tables_[mailbox];
  item->document_id = t.next_document_id++;

  PropertyBlobEncoder blob;
  if (!item->sender.empty()) blob.AddString(kPropSender, item->sender);
  blob.AddString(kPropNormalizedSubject, item->normalized_subject);
  if (!item->cc.empty()) blob.AddString(kPropCc, item->cc);
  blob.AddLong(kPropFlags, item->flags);
  if (!item->body_text.empty() && item->body_text.size() <= kBlobMaxValueBytes) {
    blob.AddString(kPropBody, item->body_text);
  }
  for (const auto& [name, value] : item->strings) {
    if (name.rfind("MS", 0) == 0) {
      std::string letters;
      uint16_t id = 0;
      if (!SplitPropertyName(name, &letters, &id) || !blob.AddMultiString(id, SplitValues(value))) {
        return Status::InvalidArgument("cannot put " + name + " in a property blob");
      }
    } else if (!blob.AddNamedString(name, value)) {
      return Status::InvalidArgument("cannot put " + name + " in a property blob");
    }
  }
  for (const auto& [name, value] : item->times) {
    if (!blob.AddNamedTime(name, value)) return Status::InvalidArgument("blob time " + name);
  }
  for (const auto& [name, value] : item->numbers) {
    if (!blob.AddNamedNumber(name, value)) return Status::InvalidArgument("blob number " + name);
  }
  if (!item->headers.empty()) blob.AddString(0x007D, item->headers);

  Row row(t.messages.get(), limit_, budget_);
  Status s = PutMessageColumns(&row, *item, short_id ? item->key : MessageId(mailbox, item->key),
                               Le64(content_.folders[folder].id));
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  next(row.Number("LastModificationTime", item->modified));
  next(row.Large("PropertyBlob", blob.Finish()));
  next(PutNativeBody(&row, item));
  if (s.ok()) s = t.messages->AddRow(IntegerKey(uint32_t(item->document_id), 4), row.cells());
  if (!s.ok()) return s;

  for (ManifestAttachment& a : item->attachments) {
    const uint64_t inid = ++attachment_counter_;
    a.key = Le64(inid);
    DescribeAttachment(&a, manifest_->items_recorded);
    Row arow(t.attachments.get(), limit_, budget_);
    s = arow.Number("Inid", inid);
    next(arow.Number("MessageDocumentId", uint32_t(item->document_id)));
    next(arow.Number("Size", a.size));
    next(arow.Text("Name", a.name));
    next(arow.Large("Content", a.data, Compression::kNone, &a.long_value));
    if (s.ok()) s = t.attachments->AddRow(IntegerKey(inid, 8), arow.cells());
    if (!s.ok()) return s;
    ++manifest_->attachment_rows;
    if (!manifest_->items_recorded) a.data.clear();
  }
  return Status::Ok();
}

Status ModernWriter::WriteItemReal(size_t folder, ManifestItem* item, bool short_id) {
  constexpr uint16_t kPropHeaders = 0x007D;
  constexpr uint16_t kPropModified = 0x3008;
  constexpr uint16_t kPropAttachFileName = 0x3704;
  constexpr uint16_t kPropAttachLongFileName = 0x3707;
  constexpr uint16_t kPropAttachMethod = 0x3705;
  constexpr uint16_t kPropAttachSize = 0x0E20;
  FitItemToReal(item);
  const size_t mailbox = owner_[folder];
  MailboxTables& t = tables_[mailbox];
  NamedNumbers& named = *t.named;
  item->document_id = t.next_document_id++;

  std::vector<SeparatedValue> separated;
  RealBlobEncoder blob;
  if (!item->sender.empty()) blob.AddString(kPropSender, item->sender);
  blob.AddString(kPropNormalizedSubject, item->normalized_subject);
  blob.AddInt32(kPropFlags, int32_t(item->flags));
  blob.AddTime(kPropModified, item->modified);
  // A body too long for any count is left to the native body.
  if (!item->body_text.empty() && !blob.AddString(kPropBody, item->body_text)) {
    if (item->body_type != kBodyTypePlain) item->body_text.clear();
  }
  if (!item->headers.empty() && !blob.AddString(kPropHeaders, item->headers)) {
    item->headers.clear();
  }
  const Bytes main_blob = blob.Finish(&separated);

  // The item's own values; named ones under this mailbox's numbers.
  RealBlobEncoder own(blob.next_slot());
  auto id_of = [&](const std::string& name, uint16_t* id) -> Status {
    std::string letters;
    if (!SplitPropertyName(name, &letters, id)) return Status::InvalidArgument("bad name " + name);
    if (*id < 0x8000) return Status::Ok();
    std::optional<NamedProperty> p = PublishedProperty(*id);
    if (!p) return Status::InvalidArgument("no published property for " + name);
    *id = named.Number(*p);
    return Status::Ok();
  };
  Status s;
  uint16_t id = 0;
  for (const auto& [name, value] : item->strings) {
    if (!(s = id_of(name, &id)).ok()) return s;
    if (name.rfind("MS", 0) == 0) {
      if (!own.AddMultiString(id, SplitValues(value)))
        return Status::InvalidArgument("blob " + name);
    } else if (!own.AddString(id, value)) {
      return Status::InvalidArgument("blob " + name);
    }
  }
  for (const auto& [name, value] : item->times) {
    if (!(s = id_of(name, &id)).ok()) return s;
    own.AddTime(id, value);
  }
  for (const auto& [name, value] : item->numbers) {
    if (!(s = id_of(name, &id)).ok()) return s;
    switch (name[0]) {
      case 'B':
        own.AddBool(id, value != 0);
        break;
      case 'I':
        own.AddInt16(id, int16_t(value));
        break;
      default:
        own.AddInt32(id, int32_t(value));
        break;
    }
  }
  for (const auto& [name, value] : item->doubles) {
    if (!(s = id_of(name, &id)).ok()) return s;
    own.AddDouble(id, value);
  }
  if (!item->members.empty()) {
    std::vector<Bytes> ids;
    for (const ListMember& m : item->members) ids.push_back(OneOffEntryId(m));
    if (!(s = id_of("MN81a9", &id)).ok()) return s;
    if (!own.AddMultiBinary(id, ids)) return Status::InvalidArgument("blob members");
  }
  if (item->times.count("T814e")) own.AddTime(named.Number(kUnknownNamed), kUnknownNamedTime);
  const Bytes own_blob = own.entries() ? own.Finish(&separated) : Bytes();

  std::vector<int64_t> inids;
  for (ManifestAttachment& a : item->attachments) {
    inids.push_back(int64_t(++attachment_counter_));
    a.key = Le64(uint64_t(inids.back()));
  }
  const Bytes message_id = RealId(mailbox, KeyCounter(item->key));
  if (!short_id) item->key.assign(message_id.end() - kIdSize, message_id.end());

  Row row(t.messages.get(), limit_, budget_);
  s = PutMessageColumns(&row, *item, short_id ? item->key : message_id,
                        RealFolderId(content_.folders[folder].id));
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  next(row.Number("DateSent", item->received));
  next(row.Large("PropertyBlob", main_blob));
  if (!own_blob.empty()) next(row.Large("OffPagePropertyBlob", own_blob));
  if (!item->to.empty() || !item->cc.empty()) {
    next(row.Large("RecipientList", RecipientList(item->to, item->cc)));
  }
  if (!inids.empty()) next(row.Large("SubobjectsBlob", EncodeCompactIntegers(inids)));
  next(PutNativeBody(&row, item));
  for (const SeparatedValue& v : separated) {
    if (v.slot > kSeparatedColumns) return Status::InvalidArgument("too many far values");
    char column[32];
    std::snprintf(column, sizeof column, "SeparatedProperty%02u", unsigned(v.slot));
    next(row.Large(column, v.encoded, Compression::kXpress));
  }
  if (s.ok()) s = t.messages->AddRow(IntegerKey(uint32_t(item->document_id), 4), row.cells());
  if (!s.ok()) return s;

  for (size_t k = 0; k < item->attachments.size(); ++k) {
    ManifestAttachment& a = item->attachments[k];
    const uint64_t inid = uint64_t(inids[k]);
    DescribeAttachment(&a, manifest_->items_recorded);
    RealBlobEncoder ablob;
    if (!a.file_name.empty()) ablob.AddString(kPropAttachFileName, a.file_name);
    if (!a.long_file_name.empty()) ablob.AddString(kPropAttachLongFileName, a.long_file_name);
    ablob.AddInt32(kPropAttachMethod, int32_t(a.method));
    ablob.AddInt32(kPropAttachSize, int32_t(a.size));
    Row arow(t.attachments.get(), limit_, budget_);
    s = arow.Number("Inid", inid);
    next(arow.Number("Size", a.size));
    next(arow.Text("Name", a.name));
    next(arow.Text("ContentType", "application/octet-stream"));
    next(arow.Large("Content", a.data, Compression::kNone, &a.long_value));
    next(arow.Large("PropertyBlob", ablob.Finish(nullptr)));
    if (s.ok()) s = t.attachments->AddRow(IntegerKey(inid, 8), arow.cells());
    if (!s.ok()) return s;
    ++manifest_->attachment_rows;
    if (!manifest_->items_recorded) a.data.clear();
  }
  return Status::Ok();
}

Status ModernWriter::WriteNameMappings(DatabaseWriter* db) {
  for (size_t i = 0; i < tables_.size(); ++i) {
    if (!tables_[i].named) continue;
    const std::string name =
        "ExtendedPropertyNameMapping_" + std::to_string(manifest_->mailboxes[i].number);
    StreamTable table(db, name, NameMappingSchema(),
                      {.long_values = true, .long_value_id_size = kLongValueId64Size});
    std::vector<std::pair<uint16_t, NamedProperty>> rows;
    for (const auto& [p, number] : tables_[i].named->numbers()) rows.push_back({number, p});
    std::sort(rows.begin(), rows.end(),
              [](const auto& a, const auto& b) { return a.first < b.first; });
    for (const auto& [number, p] : rows) {
      Row row(&table, limit_, budget_);
      Status s = row.Number("PropNumber", number);
      if (s.ok()) s = row.Number("PropDispId", p.dispid);
      if (s.ok()) s = row.Put("PropGuid", *p.set);
      if (s.ok() && *p.name) s = row.Text("PropName", p.name);
      if (s.ok()) s = table.AddRow(IntegerKey(number, 4), row.cells());
      if (!s.ok()) return s;
    }
    Status s = table.Finish();
    if (!s.ok()) return s;
  }
  return Status::Ok();
}

Status ModernWriter::WriteItem2010(size_t folder, ManifestItem* item) {
  item->cc.clear();
  const size_t mailbox = owner_[folder];
  MailboxTables& t = tables_[mailbox];
  const Bytes folder_id = Le64(content_.folders[folder].id);

  auto list_cells = [&](Row* row) {
    Status s = PutListColumns(row, *item);
    return s.ok() ? row->Put("Q6748", folder_id) : s;
  };

  Row header(t.headers.get(), limit_, budget_);
  Status s = list_cells(&header);
  if (s.ok()) s = t.headers->AddRow(BinaryKey(item->key), header.cells());
  if (!s.ok()) return s;

  Row row(t.messages.get(), limit_, budget_);
  s = list_cells(&row);
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  if (!item->to.empty()) next(row.Text("Se04", item->to));
  next(PutPropertyColumns(&row, item));
  if (s.ok()) s = t.messages->AddRow(BinaryKey(item->key), row.cells());
  if (!s.ok()) return s;

  for (ManifestAttachment& a : item->attachments) {
    a.key = ItemKey(++attachment_counter_);
    DescribeAttachment(&a, manifest_->items_recorded);
    Row arow(t.attachments.get(), limit_, budget_);
    s = arow.Put("Q674a", a.key);
    next(arow.Put("N67b0", item->key));
    if (!a.display_name.empty()) next(arow.Text("S3001", a.display_name));
    if (!a.file_name.empty()) next(arow.Text("S3704", a.file_name));
    next(arow.Large("N3701", a.data, Compression::kNone, &a.long_value));
    if (s.ok()) s = t.attachments->AddRow(BinaryKey(a.key), arow.cells());
    if (!s.ok()) return s;
    ++manifest_->attachment_rows;
    if (!manifest_->items_recorded) a.data.clear();
  }
  return Status::Ok();
}

Status ModernWriter::Write(const std::string& path) {
  if (options_.version != kExchange2010 && options_.version != kExchange2013) {
    return Status::InvalidArgument("modern store version must be 3 or 5");
  }
  if (options_.real_layout && !modern_) {
    return Status::InvalidArgument("the real layout is one of version 5");
  }
  DatabaseLayout layout;
  layout.format_version = kFormatVersion;
  layout.page_size = kPage32K;
  layout.format_revision = real_ ? kRevisionReal : modern_ ? kRevision2013 : kRevision2010;
  if (modern_ && !real_ && !options_.later_2013_variant) {
    layout.catalog_revision = kEarly2013CatalogRevision;
  }
  limit_ = options_.long_value_limit ? options_.long_value_limit
                                     : layout.page_size / kDefaultLimitDivisor;
  budget_ = layout.page_size / kRecordBudgetDivisor;

  PrepareContent();
  StoreManifest& m = *manifest_;
  m = StoreManifest();
  m.version = options_.version;
  m.page_size = layout.page_size;
  m.revision = layout.format_revision;
  m.later_2013_variant = modern_ && (options_.later_2013_variant || real_);
  m.real_layout = real_;
  m.attachment_key_column = modern_ ? "Inid" : "Q674a";
  m.items_recorded = options_.record_items;
  m.mailboxes = content_.mailboxes;
  m.folders = content_.folders;
  for (ManifestFolder& f : m.folders) f.items.clear();
  DescribeFolders();
  if (real_) {
    // Readers know folders by the last 8 bytes of their 26-byte ids.
    for (ManifestFolder& f : m.folders) {
      f.id = RealIdKey(RealFolderId(f.id));
      f.parent = RealIdKey(RealFolderId(f.parent));
    }
  }
  if (modern_) {
    for (const char* c :
         {"DateCreated", real_ ? "DateSent" : "LastModificationTime", "DateReceived"}) {
      m.time_encodings[std::string("Message.") + c] = "date_time_filetime";
    }
  } else {
    for (const char* c : {"T3007", "Te06"}) m.time_encodings[std::string("Body.") + c] = "currency";
    m.time_encodings["Body.T3008"] = "long_long";
    for (const char* c : {"T3a42", "T814e", "T8198", "T8078", "T8079"}) {
      m.time_encodings[std::string("Body.") + c] = "long_long";
    }
  }
  for (ManifestMailbox& mb : m.mailboxes) {
    if (modern_) {
      const std::string n = std::to_string(mb.number);
      mb.folder_table = "Folder_" + n;
      mb.message_table = "Message_" + n;
      mb.attachment_table = "Attachment_" + n;
    } else {
      const Modern2010Tables names = Exchange2010TableNames(mb.number);
      mb.folder_table = names.folders;
      mb.message_table = names.body;
      mb.header_table = names.header;
      mb.attachment_table = names.attach;
    }
  }
  for (size_t i = 0; i < m.folders.size(); ++i) {
    const ManifestMailbox& mb = m.mailboxes[owner_[i]];
    m.folders[i].content_table = modern_ ? mb.message_table : mb.header_table;
  }

  DatabaseFile file(layout.page_size);
  Status s = file.Create(path);
  if (!s.ok()) return s;
  s = [&]() -> Status {
    DatabaseWriter db(layout, &file);
    if (!db.status().ok()) return db.status();
    // Every table has a long-value tree, as the servers' tables do.
    const StreamTableOptions small = {
        .long_values = true, .long_value_id_size = real_ ? kLongValueId64Size : kLongValueIdSize};
    StreamTableOptions large = small;
    large.max_rows_per_leaf = options_.max_rows_per_leaf;
    StreamTable mailbox(&db, "Mailbox", MailboxSchema(modern_, real_), small);
    for (size_t i = 0; i < m.mailboxes.size(); ++i) {
      const ManifestMailbox& mb = m.mailboxes[i];
      MailboxTables& t = tables_.emplace_back();
      if (!mb.damage.empty()) continue;
      t.folders =
          std::make_unique<StreamTable>(&db, mb.folder_table, FolderSchema(modern_, real_), small);
      t.messages = std::make_unique<StreamTable>(
          &db, mb.message_table, modern_ ? MessageSchema(real_) : Body2010Schema(), large);
      t.attachments = std::make_unique<StreamTable>(
          &db, mb.attachment_table, modern_ ? AttachmentSchema(real_) : Attachment2010Schema(),
          large);
      if (real_) t.named = std::make_unique<NamedNumbers>(i);
      if (!modern_) {
        t.headers =
            std::make_unique<StreamTable>(&db, mb.header_table, ListSchema2010().Columns(), large);
      }
    }
    Status st = WriteMailboxes(&mailbox);
    for (size_t i = 0; st.ok() && i < m.mailboxes.size(); ++i) {
      if (tables_[i].folders) st = WriteFolders(i);
    }
    if (!st.ok()) return st;

    // Code 5 numbers documents by received time, code 3 keys rows by message key.
    std::vector<std::pair<size_t, const ManifestItem*>> items;
    for (size_t f = 0; f < content_.folders.size(); ++f) {
      for (const ManifestItem& it : content_.folders[f].items) items.push_back({f, &it});
    }
    std::sort(items.begin(), items.end(), [&](const auto& a, const auto& b) {
      if (modern_ && a.second->received != b.second->received) {
        return a.second->received < b.second->received;
      }
      return a.second->key < b.second->key;
    });
    for (const auto& [f, it] : items) {
      st = WriteItem(f, *it);
      if (!st.ok()) return st;
      if (short_id_item_ && f == short_id_folder_ && it == &content_.folders[f].items.front()) {
        st = WriteItem(short_id_folder_, *short_id_item_, true);
        if (!st.ok()) return st;
      }
    }
    BulkMailSource bulk(content_, options_.bulk);
    size_t folder;
    ManifestItem item;
    while (bulk.Next(&folder, &item)) {
      st = WriteItem(folder, std::move(item));
      if (!st.ok()) return st;
    }

    st = mailbox.Finish();
    for (MailboxTables& t : tables_) {
      for (StreamTable* table :
           {t.folders.get(), t.messages.get(), t.headers.get(), t.attachments.get()}) {
        if (st.ok() && table) st = table->Finish();
      }
    }
    if (st.ok() && real_) st = WriteNameMappings(&db);
    if (!st.ok()) return st;
    Manifest pages;
    return file.Finish(&db, &pages);
  }();
  tables_.clear();
  return file.Close(s);
}

}  // namespace

Modern2010Tables Exchange2010TableNames(uint64_t mailbox_number) {
  char hex[32];
  std::snprintf(hex, sizeof hex, "%llx", static_cast<unsigned long long>(mailbox_number));
  const std::string text = hex;
  constexpr char kRun[] = "0000";
  constexpr size_t kRunSize = 4;
  std::string first, second;
  const size_t run = text.find(kRun);
  if (run == std::string::npos) {
    second = text.size() > 1 ? text.substr(1) : "";
  } else {
    first = text.substr(0, run);
    for (size_t i = text.size() >= kRunSize ? text.size() - kRunSize : 0;
         i >= 1 && i + kRunSize <= text.size(); --i) {
      if (text.compare(i, kRunSize, kRun) == 0) {
        second = text.substr(i + kRunSize);
        break;
      }
    }
  }
  first = Lower(first);
  second = Upper(second);
  const std::string x = first + "-" + second;
  return {"Folders-" + x, "Body-" + x, "MsgHeader-" + Upper(first) + "-" + second, "Attach-" + x};
}

Status BuildModernStore(const ModernStoreOptions& options, const std::string& path,
                        StoreManifest* manifest) {
  if (!manifest) return Status::InvalidArgument("no manifest given");
  ModernWriter writer(options, manifest);
  return writer.Write(path);
}

}  // namespace tarnwell::forge::exchange
