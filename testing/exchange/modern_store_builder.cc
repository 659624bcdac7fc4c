#include "testing/exchange/modern_store_builder.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
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
#include "testing/exchange/rtf_literal_encoder.h"
#include "testing/forge_database.h"
#include "testing/forge_long_value.h"
#include "testing/forge_record.h"
#include "testing/forge_tree.h"
#include "testing/forge_value.h"

namespace tarnwell::forge::exchange {
namespace {

constexpr uint32_t kFormatVersion = 0x620;
constexpr uint32_t kPage32K = 32768;
constexpr uint32_t kRevision2010 = 17;
constexpr uint32_t kRevision2013 = 20;
constexpr uint32_t kRevisionReal = 110;
constexpr uint64_t kFirstWideLongValueId = (uint64_t(1) << 32) + 1;
// A catalog of this revision has records ending at fixed column 11.
constexpr uint32_t kEarly2013CatalogRevision = 17;

constexpr uint32_t kCodePageUnicode = 1200;
constexpr uint32_t kCodePageWestern = 1252;
constexpr uint32_t kInternetCodePageUtf8 = 65001;

constexpr uint8_t kKeyPrefix = 0x7F;
constexpr uint8_t kKeySuffix = 0x08;
constexpr size_t kIdSize = 8;
constexpr uint8_t kBitTrue = 1;
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
constexpr size_t kWriteBuffer = 4 << 20;
constexpr size_t kLargeHtmlLines = 2500;

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
    if (c.slot == Slot::kFixed && c.type == kColumnBinary) layout.size = kIdSize;
    columns_.push_back(layout);
  }
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

Schema MailboxSchema(int version) {
  Schema s;
  if (version == kExchange2013) {
    s.Add({"MailboxNumber", kColumnLong, 0, Slot::kFixed});
    s.Add({"DisplayName", kColumnText, kCodePageUnicode, Slot::kVariable});
    s.Add({"MailboxOwnerDisplayName", kColumnText, kCodePageUnicode, Slot::kTagged});
  } else {
    s.Add({"Q6764", kColumnBinary, 0, Slot::kVariable});
    s.Add({"S3001", kColumnText, kCodePageUnicode, Slot::kVariable});
  }
  s.Seal();
  return s;
}

Schema FolderSchema(int version) {
  Schema s;
  const bool modern = version == kExchange2013;
  s.Add({modern ? "FolderId" : "Q6748", kColumnBinary, 0, Slot::kVariable});
  s.Add({modern ? "ParentFolderId" : "Q6749", kColumnBinary, 0, Slot::kVariable});
  s.Add({modern ? "DisplayName" : "S3001", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({modern ? "ContainerClass" : "S3613", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Seal();
  return s;
}

Schema Message2013Schema() {
  Schema s;
  s.Add({"MessageDocumentId", kColumnLong, 0, Slot::kFixed});
  s.Add({"IsRead", kColumnBit, 0, Slot::kFixed});
  s.Add({"Importance", kColumnLong, 0, Slot::kFixed});
  s.Add({"HasAttachments", kColumnBit, 0, Slot::kFixed});
  s.Add({"BodyType", kColumnShort, 0, Slot::kFixed});
  s.Add({"DateCreated", kColumnDateTime, 0, Slot::kFixed});
  s.Add({"LastModificationTime", kColumnDateTime, 0, Slot::kFixed});
  s.Add({"DateReceived", kColumnDateTime, 0, Slot::kFixed});
  s.Add({"MessageId", kColumnBinary, 0, Slot::kVariable});
  s.Add({"FolderId", kColumnBinary, 0, Slot::kVariable});
  s.Add({"MessageClass", kColumnText, kCodePageWestern, Slot::kTagged});
  s.Add({"DisplayTo", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"SubjectPrefix", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"PropertyBlob", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"NativeBody", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

Schema Attachment2013Schema() {
  Schema s;
  s.Add({"Inid", kColumnLongLong, 0, Slot::kFixed});
  s.Add({"MessageDocumentId", kColumnLong, 0, Slot::kFixed});
  s.Add({"Size", kColumnLong, 0, Slot::kFixed});
  s.Add({"Name", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"Content", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

// ---- Schemas of the real layout

constexpr int kSeparatedColumns = 4;

Schema MailboxRealSchema() {
  Schema s;
  s.Add({"MailboxNumber", kColumnLong, 0, Slot::kFixed});
  s.Add({"DisplayName", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({"MailboxOwnerDisplayName", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"PropertyBlob", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

Schema FolderRealSchema() {
  Schema s;
  s.Add({"SpecialFolderNumber", kColumnLong, 0, Slot::kFixed});
  s.Add({"FolderId", kColumnBinary, 0, Slot::kVariable});
  s.Add({"ParentFolderId", kColumnBinary, 0, Slot::kVariable});
  s.Add({"DisplayName", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({"ContainerClass", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({"PropertyBlob", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"SeparatedProperty01", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

Schema MessageRealSchema() {
  Schema s;
  s.Add({"MessageDocumentId", kColumnLong, 0, Slot::kFixed});
  s.Add({"IsRead", kColumnBit, 0, Slot::kFixed});
  s.Add({"Importance", kColumnLong, 0, Slot::kFixed});
  s.Add({"HasAttachments", kColumnBit, 0, Slot::kFixed});
  s.Add({"BodyType", kColumnShort, 0, Slot::kFixed});
  s.Add({"DateCreated", kColumnDateTime, 0, Slot::kFixed});
  s.Add({"DateReceived", kColumnDateTime, 0, Slot::kFixed});
  s.Add({"DateSent", kColumnDateTime, 0, Slot::kFixed});
  s.Add({"MessageId", kColumnBinary, 0, Slot::kVariable});
  s.Add({"FolderId", kColumnBinary, 0, Slot::kVariable});
  s.Add({"MessageClass", kColumnText, kCodePageWestern, Slot::kTagged});
  s.Add({"DisplayTo", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"SubjectPrefix", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"PropertyBlob", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"OffPagePropertyBlob", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"RecipientList", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"SubobjectsBlob", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"NativeBody", kColumnLongBinary, 0, Slot::kTagged});
  static const char* const kSeparated[kSeparatedColumns] = {
      "SeparatedProperty01", "SeparatedProperty02", "SeparatedProperty03", "SeparatedProperty04"};
  for (const char* name : kSeparated) s.Add({name, kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

Schema AttachmentRealSchema() {
  Schema s;
  s.Add({"Inid", kColumnLongLong, 0, Slot::kFixed});
  s.Add({"Size", kColumnLong, 0, Slot::kFixed});
  s.Add({"Name", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"ContentType", kColumnText, kCodePageUnicode, Slot::kTagged});
  s.Add({"Content", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"PropertyBlob", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

Schema NameMappingSchema() {
  Schema s;
  s.Add({"PropNumber", kColumnLong, 0, Slot::kFixed});
  s.Add({"PropDispId", kColumnLong, 0, Slot::kFixed});
  s.Add({"PropGuid", kColumnBinary, 0, Slot::kVariable});
  s.Add({"PropName", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Seal();
  return s;
}

// The list columns of code 3, shared by "Body-x" and "MsgHeader-X". Times
// are 64-bit little-endian integers of two types.
void AddListColumns2010(Schema* s) {
  s->Add({"Le07", kColumnLong, 0, Slot::kFixed});
  s->Add({"L17", kColumnLong, 0, Slot::kFixed});
  s->Add({"Be1b", kColumnBit, 0, Slot::kFixed});
  s->Add({"T3007", kColumnCurrency, 0, Slot::kFixed});
  s->Add({"T3008", kColumnLongLong, 0, Slot::kFixed});
  s->Add({"Te06", kColumnCurrency, 0, Slot::kFixed});
  s->Add({"Q6748", kColumnBinary, 0, Slot::kVariable});
  s->Add({"N67b0", kColumnBinary, 0, Slot::kVariable});
  s->Add({"S1a", kColumnText, kCodePageUnicode, Slot::kVariable});
  s->Add({"S3d", kColumnText, kCodePageUnicode, Slot::kVariable});
  s->Add({"Se1d", kColumnText, kCodePageUnicode, Slot::kVariable});
  s->Add({"S42", kColumnText, kCodePageUnicode, Slot::kVariable});
  s->Add({"S678e", kColumnText, kCodePageUnicode, Slot::kVariable});
}

Schema Header2010Schema() {
  Schema s;
  AddListColumns2010(&s);
  s.Seal();
  return s;
}

Schema Body2010Schema() {
  Schema s;
  AddListColumns2010(&s);
  s.Add({"Se04", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({"L3fde", kColumnLong, 0, Slot::kFixed});
  s.Add({"S1000", kColumnLongText, kCodePageUnicode, Slot::kTagged});
  s.Add({"N1013", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"N1009", kColumnLongBinary, 0, Slot::kTagged});
  s.Add({"S7d", kColumnLongText, kCodePageUnicode, Slot::kTagged});
  for (const char* name :
       {"S3a06", "S3a08", "S3a11", "S3a16", "S3a17", "S3a1c", "S810c", "S814a"}) {
    s.Add({name, kColumnText, kCodePageUnicode, Slot::kTagged});
  }
  for (const char* name : {"T3a42", "T814e", "T8198", "T8078", "T8079"}) {
    s.Add({name, kColumnLongLong, 0, Slot::kTagged});
  }
  s.Add({"I3a4d", kColumnShort, 0, Slot::kTagged});
  s.Add({"L805c", kColumnLong, 0, Slot::kTagged});
  s.Add({"L26", kColumnLong, 0, Slot::kTagged});
  s.Add({"L8138", kColumnLong, 0, Slot::kTagged});
  s.Add({"D8121", kColumnDouble, 0, Slot::kTagged});
  s.Add({"B8124", kColumnBit, 0, Slot::kTagged});
  s.Add({"MN81a9", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

Schema Attachment2010Schema() {
  Schema s;
  s.Add({"Q674a", kColumnBinary, 0, Slot::kVariable});
  s.Add({"N67b0", kColumnBinary, 0, Slot::kVariable});
  s.Add({"S3001", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({"S3704", kColumnText, kCodePageUnicode, Slot::kVariable});
  s.Add({"N3701", kColumnLongBinary, 0, Slot::kTagged});
  s.Seal();
  return s;
}

// ---- Values and keys

Bytes Le64(uint64_t v) { return LittleEndian(v, kIdSize); }

Bytes BinaryKey(const Bytes& bytes) {
  Bytes key = {kKeyPrefix};
  key.insert(key.end(), bytes.begin(), bytes.end());
  key.push_back(kKeySuffix);
  return key;
}

// The normalized key of a signed integer: sign bit flipped, big-endian.
Bytes IntegerKey(uint64_t value, size_t width) {
  const uint64_t flipped = value ^ (uint64_t(1) << (8 * width - 1));
  Bytes key = {kKeyPrefix};
  for (size_t i = width; i-- > 0;) key.push_back(uint8_t(flipped >> (8 * i)));
  return key;
}

bool IsAscii(const std::string& s) {
  return std::all_of(s.begin(), s.end(),
                     [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

void AppendUtf16z(Bytes* out, const std::string& utf8) {
  const Bytes b = Utf8ToUtf16LE(utf8);
  out->insert(out->end(), b.begin(), b.end());
  out->push_back(0);
  out->push_back(0);
}

// Distribution-list members as the legacy builder writes them.
Bytes EncodeMembers(const std::vector<ListMember>& members) {
  constexpr uint32_t kHeader = 8;
  constexpr uint8_t kOneOffUid[16] = {0x81, 0x2B, 0x1F, 0xA4, 0xBE, 0xA3, 0x10, 0x19,
                                      0x9D, 0x6E, 0x00, 0xDD, 0x01, 0x0F, 0x54, 0x02};
  constexpr uint16_t kUnicode = 0x8000;
  Bytes out(kHeader);
  StoreU32LE(out.data(), kHeader);
  StoreU32LE(out.data() + 4, uint32_t(members.size()));
  for (const ListMember& m : members) {
    const size_t at = out.size();
    out.resize(at + 4 + sizeof kOneOffUid + 4, 0);
    std::memcpy(out.data() + at + 4, kOneOffUid, sizeof kOneOffUid);
    StoreU16LE(out.data() + at + 4 + sizeof kOneOffUid + 2, kUnicode);
    AppendUtf16z(&out, m.name);
    AppendUtf16z(&out, m.address_type);
    AppendUtf16z(&out, m.address);
  }
  return out;
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

// A one-off entry id: flags, provider, version, flags (Unicode), then the
// name, address type and address as UTF-16LE strings with terminators.
Bytes OneOffEntryId(const ListMember& m) {
  constexpr uint8_t kOneOffUid[16] = {0x81, 0x2B, 0x1F, 0xA4, 0xBE, 0xA3, 0x10, 0x19,
                                      0x9D, 0x6E, 0x00, 0xDD, 0x01, 0x0F, 0x54, 0x02};
  constexpr uint16_t kUnicode = 0x8000;
  Bytes out(4 + sizeof kOneOffUid + 4, 0);
  std::memcpy(out.data() + 4, kOneOffUid, sizeof kOneOffUid);
  StoreU16LE(out.data() + 4 + sizeof kOneOffUid + 2, kUnicode);
  AppendUtf16z(&out, m.name);
  AppendUtf16z(&out, m.address_type);
  AppendUtf16z(&out, m.address);
  return out;
}

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

// ---- Output

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

// One table being streamed: its record tree and its long-value tree.
class StreamTable {
 public:
  StreamTable(DatabaseWriter* db, std::string name, Schema schema, uint32_t max_rows_per_leaf,
              uint32_t long_value_id_size = kLongValueIdSize)
      : db_(db), name_(std::move(name)), schema_(std::move(schema)), id_size_(long_value_id_size) {
    options_ = db->NewTree(0);
    options_.max_entries_per_leaf = max_rows_per_leaf;
    writer_ = std::make_unique<TreeWriter>(db->format(), options_, db->allocator(), db->sink());
    lv_options_ = db->NewTree(kPageFlagLongValue);
    lv_writer_ =
        std::make_unique<TreeWriter>(db->format(), lv_options_, db->allocator(), db->sink());
    // Ids past 32 bits, so that only a reader of 8-byte ids finds the values.
    if (id_size_ == kLongValueId64Size) next_lv_ = kFirstWideLongValueId;
    chunk_size_ = DefaultLongValueChunkSize(db->format(), id_size_);
  }

  const Schema& schema() const { return schema_; }
  const std::string& name() const { return name_; }
  uint64_t rows() const { return rows_; }
  uint32_t long_value_id_size() const { return id_size_; }

  Status AddRow(Bytes key, const std::vector<Cell>& cells) {
    TreeEntry e;
    e.key = std::move(key);
    Status s = EncodeRecord(schema_.columns(), cells, db_->layout(), &e.data);
    if (s.ok()) s = writer_->Add(std::move(e));
    if (!s.ok()) return Status::InvalidArgument(name_ + ": " + s.message());
    ++rows_;
    return s;
  }

  Status AddLongValue(Bytes data, Compression compression, uint64_t* id) {
    LongValueLayout v;
    v.id = next_lv_++;
    v.data = std::move(data);
    v.compression = compression;
    std::vector<TreeEntry> entries;
    Status s = AppendLongValueEntries(v, id_size_, chunk_size_, std::nullopt, &entries, nullptr);
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
    if (s.ok()) s = lv_writer_->Finish(&lv_layout);
    if (!s.ok()) return Status::InvalidArgument(name_ + ": " + s.message());
    db_->AddTable(name_, schema_.columns(), options_, layout, &lv_options_, &lv_layout);
    return s;
  }

 private:
  DatabaseWriter* db_;
  std::string name_;
  Schema schema_;
  uint32_t id_size_;
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

  const ColumnLayout* Column(const std::string& name) const { return table_->schema().Find(name); }

  Status Put(const std::string& name, Bytes value) {
    const ColumnLayout* c = Column(name);
    if (!c) return Missing(name);
    used_ += value.size();
    cells_.push_back({c->id, std::move(value), 0});
    return Status::Ok();
  }
  Status Number(const std::string& name, uint64_t value) {
    const ColumnLayout* c = Column(name);
    if (!c) return Missing(name);
    size_t width = 4;
    if (c->type == kColumnBit) width = 1;
    if (c->type == kColumnShort) width = 2;
    if (c->type == kColumnCurrency || c->type == kColumnLongLong || c->type == kColumnDateTime ||
        c->type == kColumnDouble) {
      width = 8;
    }
    return Put(name, LittleEndian(value, width));
  }
  // Text in the column's code page; with `seven_bit`, stored 7-bit
  // compressed when every character allows it.
  Status Text(const std::string& name, const std::string& utf8, bool seven_bit = false) {
    const ColumnLayout* c = Column(name);
    if (!c) return Missing(name);
    const bool unicode = c->codepage == kCodePageUnicode;
    Bytes plain;
    if (unicode) {
      plain = Utf8ToUtf16LE(utf8);
    } else {
      const std::string bytes = Utf8ToCodePage(utf8, c->codepage);
      plain.assign(bytes.begin(), bytes.end());
    }
    Cell cell;
    if (seven_bit && IsAscii(utf8) &&
        CompressedCell(c->id, ByteView(plain),
                       unicode ? Compression::kSevenBitUnicode : Compression::kSevenBitAscii,
                       &cell)) {
      used_ += cell.value->size();
      cells_.push_back(std::move(cell));
      return Status::Ok();
    }
    return Put(name, std::move(plain));
  }
  // A tagged value that goes to the long-value tree when it is large or
  // the record is filling up; Xpress compressed when `compression` says so.
  Status Large(const std::string& name, Bytes value, Compression compression,
               bool* separated = nullptr) {
    const ColumnLayout* c = Column(name);
    if (!c) return Missing(name);
    Cell cell;
    const bool compressed = compression != Compression::kNone && value.size() <= limit_ &&
                            CompressedCell(c->id, ByteView(value), compression, &cell);
    const size_t stored = compressed ? cell.value->size() : value.size();
    const bool to_tree = stored > limit_ || used_ + stored > budget_;
    if (separated) *separated = to_tree;
    if (!to_tree) {
      if (!compressed) return Put(name, std::move(value));
      used_ += stored;
      cells_.push_back(std::move(cell));
      return Status::Ok();
    }
    uint64_t id = 0;
    Status s = table_->AddLongValue(std::move(value), compression, &id);
    if (s.ok()) cells_.push_back(SeparatedCell(c->id, id, table_->long_value_id_size()));
    return s;
  }
  std::vector<Cell>& cells() { return cells_; }

 private:
  Status Missing(const std::string& name) const {
    return Status::InvalidArgument(table_->name() + " has no column " + name);
  }

  StreamTable* table_;
  uint32_t limit_;
  uint32_t budget_;
  size_t used_ = 0;
  std::vector<Cell> cells_;
};

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
        s = row.Large("PropertyBlob", blob.Finish(nullptr), Compression::kNone);
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
      if (s.ok()) s = row.Large("PropertyBlob", blob.Finish(nullptr), Compression::kNone);
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
      std::vector<std::string> parts;
      size_t start = 0;
      for (size_t at; (at = value.find(';', start)) != std::string::npos; start = at + 1) {
        parts.push_back(value.substr(start, at - start));
      }
      parts.push_back(value.substr(start));
      std::string letters;
      uint16_t id = 0;
      if (!SplitPropertyName(name, &letters, &id) || !blob.AddMultiString(id, parts)) {
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
  Status s = row.Number("MessageDocumentId", uint32_t(item->document_id));
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  next(row.Put("MessageId", short_id ? item->key : MessageId(mailbox, item->key)));
  next(row.Put("FolderId", Le64(content_.folders[folder].id)));
  next(row.Text("MessageClass", item->message_class, true));
  if (!item->to.empty()) next(row.Text("DisplayTo", item->to, true));
  if (!item->subject_prefix.empty()) next(row.Text("SubjectPrefix", item->subject_prefix, true));
  next(row.Number("DateCreated", item->created));
  next(row.Number("LastModificationTime", item->modified));
  next(row.Number("DateReceived", item->received));
  next(row.Number("IsRead", (item->flags & kFlagRead) ? kBitTrue : 0));
  next(row.Number("Importance", item->importance));
  next(row.Number("HasAttachments", item->has_attachments ? kBitTrue : 0));
  if (item->body_type) next(row.Number("BodyType", item->body_type));
  next(row.Large("PropertyBlob", blob.Finish(), Compression::kNone));
  if (item->body_type) {
    const std::string& body = item->body_type == kBodyTypeHtml ? item->body_html : item->body_text;
    next(row.Large("NativeBody", Bytes(body.begin(), body.end()), Compression::kXpress,
                   &item->body_long_value));
  }
  if (s.ok()) s = t.messages->AddRow(IntegerKey(uint32_t(item->document_id), 4), row.cells());
  if (!s.ok()) return s;

  for (ManifestAttachment& a : item->attachments) {
    const uint64_t inid = ++attachment_counter_;
    a.key = Le64(inid);
    a.name = !a.display_name.empty() ? a.display_name : a.file_name;
    a.size = a.data.size();
    if (manifest_->items_recorded) a.sha256 = Sha256Hex(ByteView(a.data));
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
      std::vector<std::string> parts;
      size_t start = 0;
      for (size_t at; (at = value.find(';', start)) != std::string::npos; start = at + 1) {
        parts.push_back(value.substr(start, at - start));
      }
      parts.push_back(value.substr(start));
      if (!own.AddMultiString(id, parts)) return Status::InvalidArgument("blob " + name);
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
  s = row.Number("MessageDocumentId", uint32_t(item->document_id));
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  next(row.Put("MessageId", short_id ? item->key : message_id));
  next(row.Put("FolderId", RealFolderId(content_.folders[folder].id)));
  next(row.Text("MessageClass", item->message_class, true));
  if (!item->to.empty()) next(row.Text("DisplayTo", item->to, true));
  if (!item->subject_prefix.empty()) next(row.Text("SubjectPrefix", item->subject_prefix, true));
  next(row.Number("DateCreated", item->created));
  next(row.Number("DateReceived", item->received));
  next(row.Number("DateSent", item->received));
  next(row.Number("IsRead", (item->flags & kFlagRead) ? kBitTrue : 0));
  next(row.Number("Importance", item->importance));
  next(row.Number("HasAttachments", item->has_attachments ? kBitTrue : 0));
  if (item->body_type) next(row.Number("BodyType", item->body_type));
  next(row.Large("PropertyBlob", main_blob, Compression::kNone));
  if (!own_blob.empty()) next(row.Large("OffPagePropertyBlob", own_blob, Compression::kNone));
  if (!item->to.empty() || !item->cc.empty()) {
    next(row.Large("RecipientList", RecipientList(item->to, item->cc), Compression::kNone));
  }
  if (!inids.empty())
    next(row.Large("SubobjectsBlob", EncodeCompactIntegers(inids), Compression::kNone));
  if (item->body_type) {
    const std::string& body = item->body_type == kBodyTypeHtml ? item->body_html : item->body_text;
    next(row.Large("NativeBody", Bytes(body.begin(), body.end()), Compression::kXpress,
                   &item->body_long_value));
  }
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
    a.name = !a.display_name.empty() ? a.display_name : a.file_name;
    a.size = a.data.size();
    if (manifest_->items_recorded) a.sha256 = Sha256Hex(ByteView(a.data));
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
    next(arow.Large("PropertyBlob", ablob.Finish(nullptr), Compression::kNone));
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
    StreamTable table(db, name, NameMappingSchema(), 0, kLongValueId64Size);
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
    Status s = row->Put("N67b0", item->key);
    auto next = [&](Status st) {
      if (s.ok()) s = st;
    };
    next(row->Put("Q6748", folder_id));
    next(row->Text("S1a", item->message_class));
    if (!item->subject_prefix.empty()) next(row->Text("S3d", item->subject_prefix));
    next(row->Text("Se1d", item->normalized_subject));
    if (!item->sender.empty()) next(row->Text("S42", item->sender));
    if (!item->to.empty()) next(row->Text("S678e", item->to));
    next(row->Number("T3007", item->created));
    next(row->Number("T3008", item->modified));
    next(row->Number("Te06", item->received));
    next(row->Number("Le07", item->flags));
    next(row->Number("L17", item->importance));
    next(row->Number("Be1b", item->has_attachments ? kBitTrue : 0));
    return s;
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
  next(row.Number("L3fde", kInternetCodePageUtf8));
  bool separated = false;
  if (!item->body_text.empty()) {
    next(row.Large("S1000", Utf8ToUtf16LE(item->body_text), Compression::kNone, &separated));
    item->body_long_value |= separated;
  }
  if (!item->body_html.empty()) {
    next(row.Large("N1013", Bytes(item->body_html.begin(), item->body_html.end()),
                   Compression::kNone, &separated));
    item->body_long_value |= separated;
  }
  if (!item->rtf_text.empty()) {
    Bytes rtf = item->rtf_uses_references ? EncodeRtfCompressed(item->rtf_text)
                                          : EncodeRtfLiteral(item->rtf_text);
    next(row.Large("N1009", std::move(rtf), Compression::kNone, &separated));
    item->body_long_value |= separated;
  }
  if (!item->headers.empty()) {
    next(row.Large("S7d", Utf8ToUtf16LE(item->headers), Compression::kNone));
  }
  for (const auto& [name, value] : item->strings) next(row.Text(name, value));
  for (const auto& [name, value] : item->times) next(row.Number(name, value));
  for (const auto& [name, value] : item->numbers) next(row.Number(name, uint64_t(value)));
  for (const auto& [name, value] : item->doubles) {
    uint64_t bits;
    std::memcpy(&bits, &value, sizeof bits);
    next(row.Number(name, bits));
  }
  if (!item->members.empty()) {
    next(row.Large("MN81a9", EncodeMembers(item->members), Compression::kNone));
  }
  if (s.ok()) s = t.messages->AddRow(BinaryKey(item->key), row.cells());
  if (!s.ok()) return s;

  for (ManifestAttachment& a : item->attachments) {
    a.key = ItemKey(++attachment_counter_);
    a.name = !a.display_name.empty() ? a.display_name : a.file_name;
    a.size = a.data.size();
    if (manifest_->items_recorded) a.sha256 = Sha256Hex(ByteView(a.data));
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

  const int fd = open(path.c_str(), O_CREAT | O_TRUNC | O_WRONLY, 0644);
  if (fd < 0) return Status::IoError("cannot create " + path);
  FilePageSink sink(fd, layout.page_size);
  Status s = [&]() -> Status {
    DatabaseWriter db(layout, &sink);
    if (!db.status().ok()) return db.status();
    const uint32_t ids = real_ ? kLongValueId64Size : kLongValueIdSize;
    StreamTable mailbox(&db, "Mailbox",
                        real_ ? MailboxRealSchema() : MailboxSchema(options_.version), 0, ids);
    const uint32_t leaf = options_.max_rows_per_leaf;
    for (size_t i = 0; i < m.mailboxes.size(); ++i) {
      const ManifestMailbox& mb = m.mailboxes[i];
      MailboxTables& t = tables_.emplace_back();
      if (!mb.damage.empty()) continue;
      t.folders = std::make_unique<StreamTable>(
          &db, mb.folder_table, real_ ? FolderRealSchema() : FolderSchema(options_.version), 0,
          ids);
      t.messages = std::make_unique<StreamTable>(&db, mb.message_table,
                                                 real_     ? MessageRealSchema()
                                                 : modern_ ? Message2013Schema()
                                                           : Body2010Schema(),
                                                 leaf, ids);
      t.attachments = std::make_unique<StreamTable>(&db, mb.attachment_table,
                                                    real_     ? AttachmentRealSchema()
                                                    : modern_ ? Attachment2013Schema()
                                                              : Attachment2010Schema(),
                                                    leaf, ids);
      if (real_) t.named = std::make_unique<NamedNumbers>(i);
      if (!modern_) {
        t.headers = std::make_unique<StreamTable>(&db, mb.header_table, Header2010Schema(), leaf);
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
  tables_.clear();
  if (close(fd) != 0 && s.ok()) s = Status::IoError("cannot write " + path);
  return s;
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
