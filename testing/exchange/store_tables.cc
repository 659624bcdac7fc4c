#include "testing/exchange/store_tables.h"

#include <algorithm>
#include <cstring>

#include "base/text.h"
#include "testing/exchange/rtf_literal_encoder.h"
#include "testing/forge_record.h"
#include "testing/forge_value.h"

namespace tarnwell::forge::exchange {
namespace {

constexpr uint8_t kKeyPrefix = 0x7F;
constexpr uint8_t kKeySuffix = 0x08;

constexpr uint8_t kOneOffProviderUid[16] = {0x81, 0x2B, 0x1F, 0xA4, 0xBE, 0xA3, 0x10, 0x19,
                                            0x9D, 0x6E, 0x00, 0xDD, 0x01, 0x0F, 0x54, 0x02};
constexpr size_t kOneOffFlagsSize = 4;
constexpr uint16_t kOneOffUnicode = 0x8000;
constexpr uint32_t kMemberListHeader = 8;  // u32 offset, u32 count

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

}  // namespace

Schema& Schema::Add(const Column& c) {
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
  return *this;
}

Schema& Schema::Add(std::initializer_list<Column> columns) {
  for (const Column& c : columns) Add(c);
  return *this;
}

std::vector<ColumnLayout> Schema::Columns() const {
  std::vector<ColumnLayout> sorted = columns_;
  std::sort(sorted.begin(), sorted.end(),
            [](const ColumnLayout& a, const ColumnLayout& b) { return a.id < b.id; });
  return sorted;
}

Status Row::Missing(const std::string& name) const {
  return Status::InvalidArgument(table_->name() + " has no column " + name);
}

Status Row::Put(const std::string& name, Bytes value) {
  const ColumnLayout* c = Column(name);
  if (!c) return Missing(name);
  used_ += value.size();
  cells_.push_back({c->id, std::move(value), 0});
  return Status::Ok();
}

Status Row::Number(const std::string& name, uint64_t value) {
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

Status Row::Time(const std::string& name, uint64_t filetime) {
  const ColumnLayout* c = Column(name);
  if (!c) return Missing(name);
  Bytes b(kIdSize);
  if (c->type == kColumnBinary) {
    StoreU32BE(b.data(), uint32_t(filetime >> 32));
    StoreU32BE(b.data() + 4, uint32_t(filetime));
  } else {
    StoreU64LE(b.data(), filetime);
  }
  return Put(name, std::move(b));
}

Status Row::Text(const std::string& name, const std::string& utf8, bool seven_bit) {
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

Status Row::Large(const std::string& name, Bytes value, Compression compression, bool* separated) {
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

Bytes Le64(uint64_t v) { return LittleEndian(v, kIdSize); }

Bytes BinaryKey(const Bytes& bytes) {
  Bytes key = {kKeyPrefix};
  key.insert(key.end(), bytes.begin(), bytes.end());
  key.push_back(kKeySuffix);
  return key;
}

Bytes OneOffEntryId(const ListMember& m) {
  Bytes out(kOneOffFlagsSize + sizeof kOneOffProviderUid + 4, 0);
  std::memcpy(out.data() + kOneOffFlagsSize, kOneOffProviderUid, sizeof kOneOffProviderUid);
  StoreU16LE(out.data() + kOneOffFlagsSize + sizeof kOneOffProviderUid + 2, kOneOffUnicode);
  AppendUtf16z(&out, m.name);
  AppendUtf16z(&out, m.address_type);
  AppendUtf16z(&out, m.address);
  return out;
}

Bytes EncodeMembers(const std::vector<ListMember>& members) {
  Bytes out(kMemberListHeader);
  StoreU32LE(out.data(), kMemberListHeader);
  StoreU32LE(out.data() + 4, uint32_t(members.size()));
  for (const ListMember& m : members) {
    const Bytes id = OneOffEntryId(m);
    out.insert(out.end(), id.begin(), id.end());
  }
  return out;
}

Status PutListColumns(Row* row, const ManifestItem& item) {
  Status s = row->Put("N67b0", item.key);
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  next(row->Text("S1a", item.message_class));
  if (!item.subject_prefix.empty()) next(row->Text("S3d", item.subject_prefix));
  next(row->Text("Se1d", item.normalized_subject));
  if (!item.sender.empty()) next(row->Text("S42", item.sender));
  if (!item.to.empty()) next(row->Text("S678e", item.to));
  next(row->Time("T3007", item.created));
  next(row->Time("T3008", item.modified));
  next(row->Time("Te06", item.received));
  next(row->Number("Le07", item.flags));
  next(row->Number("L17", item.importance));
  next(row->Number("Be1b", item.has_attachments ? kBitTrue : 0));
  return s;
}

Status PutPropertyColumns(Row* row, ManifestItem* item) {
  Status s = row->Number("L3fde", kInternetCodePageUtf8);
  auto next = [&](Status st) {
    if (s.ok()) s = st;
  };
  auto body = [&](const std::string& name, Bytes value) {
    bool separated = false;
    next(row->Large(name, std::move(value), Compression::kNone, &separated));
    item->body_long_value |= separated;
  };
  if (!item->body_text.empty()) body("S1000", Utf8ToUtf16LE(item->body_text));
  if (!item->body_html.empty())
    body("N1013", Bytes(item->body_html.begin(), item->body_html.end()));
  if (!item->rtf_text.empty()) {
    body("N1009", item->rtf_uses_references ? EncodeRtfCompressed(item->rtf_text)
                                            : EncodeRtfLiteral(item->rtf_text));
  }
  if (!item->headers.empty()) next(row->Large("S7d", Utf8ToUtf16LE(item->headers)));
  for (const auto& [name, value] : item->strings) next(row->Text(name, value));
  for (const auto& [name, value] : item->times) next(row->Time(name, value));
  for (const auto& [name, value] : item->numbers) next(row->Number(name, uint64_t(value)));
  for (const auto& [name, value] : item->doubles) {
    uint64_t bits;
    std::memcpy(&bits, &value, sizeof bits);
    next(row->Number(name, bits));
  }
  if (!item->members.empty()) next(row->Large("MN81a9", EncodeMembers(item->members)));
  return s;
}

}  // namespace tarnwell::forge::exchange
