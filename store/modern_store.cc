#include "store/modern_store.h"

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <set>

#include "engine/catalog.h"
#include "store/legacy_store.h"
#include "store/property_blob.h"
#include "store/real_property_blob.h"
#include "store/rtf_decompressor.h"
#include "store/subobjects_blob.h"

namespace tarnwell::store {
namespace {

namespace fs = std::filesystem;

constexpr size_t kIdSize = 8;
constexpr size_t kMinMessageIdSize = 9;  // a MessageId of 8 bytes or less maps nothing

bool Modern2013(int version) { return version == engine::kExchange2013; }

// Column names by generation.
struct Columns {
  const char* mailbox_number;
  const char* mailbox_name;
  const char* folder_id;
  const char* parent_id;
  const char* folder_name;
  const char* container_class;
  const char* message_class;
};
constexpr Columns k2013 = {"MailboxNumber", "DisplayName",    "FolderId",    "ParentFolderId",
                           "DisplayName",   "ContainerClass", "MessageClass"};
constexpr Columns k2010 = {"Q6764", "S3001", "Q6748", "Q6749", "S3001", "S3613", "S1a"};

const std::vector<std::string>& ListColumns() {
  static const std::vector<std::string> kColumns = {"DisplayTo",
                                                    "RecipientList",
                                                    "MessageId",
                                                    "DateCreated",
                                                    "MessageClass",
                                                    "PropertyBlob",
                                                    "OffPagePropertyBlob",
                                                    "HasAttachments",
                                                    "SubjectPrefix",
                                                    "Importance",
                                                    "IsRead",
                                                    "DateReceived",
                                                    "LastModificationTime",
                                                    "S678e",
                                                    "N67b0",
                                                    "T3007",
                                                    "S1a",
                                                    "Be1b",
                                                    "Le07",
                                                    "L17",
                                                    "T3008",
                                                    "Te06",
                                                    "Q6748",
                                                    "S42",
                                                    "S3d",
                                                    "Se1d"};
  return kColumns;
}

// An id column: the last 8 bytes of the value, little-endian (folder ids are
// 8 bytes; ids of real servers are longer and end in their counter).
std::optional<uint64_t> IdOf(const RowValue& v, size_t min_size = kIdSize) {
  if (v.bytes.size() < min_size || v.bytes.size() < kIdSize) return std::nullopt;
  return LoadU64LE(v.bytes.data() + v.bytes.size() - kIdSize);
}

std::optional<uint64_t> ReadId(const RowValueReader& values, const engine::TableDef& table,
                               const engine::RecordColumns& columns, const char* name,
                               size_t min_size = kIdSize) {
  const int slot = ColumnSlot(table, name);
  RowValue v;
  if (slot < 0 || !values.ReadOne(columns, size_t(slot), &v)) return std::nullopt;
  if (v.engine_type != engine::kColumnBinary && v.engine_type != engine::kColumnLongBinary) {
    // An integer column holds the id itself.
    uint64_t value = 0;
    for (size_t i = v.bytes.size(); i-- > 0;) value = (value << 8) | v.bytes[i];
    return v.bytes.empty() ? std::nullopt : std::optional<uint64_t>(value);
  }
  return IdOf(v, min_size);
}

bool IsBlobColumn(const std::string& name) {
  return name == "PropertyBlob" || name == "OffPagePropertyBlob";
}

// What rows of the list take from a blob of the server layout: its other
// list properties have columns of their own.
const std::vector<std::string> kListBlobNames = {"S42", "Se1d", "T3008"};
const std::vector<std::string> kFolderBlobNames = {"S3001", "S3613"};
const std::vector<std::string> kMailboxBlobNames = {"S3001"};

// Names of the fixed numbers a blob entry is decoded under.
std::string EntryName(const BlobEntry& e, uint16_t id) {
  char hex[8];
  std::snprintf(hex, sizeof hex, "%x", id);
  return e.letters + hex;
}

// The member list the decoder reads ("MN81a9") from one-off entry ids, one
// per element: each is a member as that list has it.
Bytes MemberList(const std::vector<Bytes>& entry_ids) {
  constexpr uint32_t kFirstMember = 4;
  Bytes out(kFirstMember);
  StoreU32LE(out.data(), kFirstMember);
  for (const Bytes& id : entry_ids) out.insert(out.end(), id.begin(), id.end());
  return out;
}

// The row's "SeparatedPropertyNN" values, read as asked for.
class RowSeparatedValues {
 public:
  RowSeparatedValues(const RowValueReader& values, const engine::TableDef& table,
                     const engine::RecordColumns& columns)
      : values_(values), table_(table), columns_(columns) {}
  std::optional<Bytes> operator()(uint16_t slot) const {
    const int at = ColumnSlot(table_, SeparatedPropertyColumn(slot));
    RowValue v;
    if (at < 0 || !values_.ReadOne(columns_, size_t(at), &v) || v.damaged) return std::nullopt;
    return std::move(v.bytes);
  }

 private:
  const RowValueReader& values_;
  const engine::TableDef& table_;
  const engine::RecordColumns& columns_;
};

constexpr uint16_t kBodyTypePlainText = 1;
constexpr uint16_t kBodyTypeRtf = 2;

}  // namespace

std::string ModernFolderTableName(int version, uint64_t number) {
  if (Modern2013(version)) {
    return "Folder_" + std::to_string(static_cast<long long>(number));
  }
  char hex[24];
  std::snprintf(hex, sizeof hex, "%llx", static_cast<unsigned long long>(number));
  const std::string text = hex;
  // The second piece is cut the way a legacy content-table name is.
  const size_t first_run = text.find("0000");
  const std::string first = first_run == std::string::npos ? "" : text.substr(0, first_run);
  const std::string second = ContentTableName(number);
  return "Folders-" + first + "-" + second;
}

ModernStore::ModernStore(engine::EdbClass& reader, int version, ScanMode mode)
    : reader_(reader), version_(version), mode_(mode), decoder_(version) {
  BlobParserOptions options;
  options.later_2013_variant = reader.extended_catalog();
  InstallPropertyBlobParser(&decoder_, options);
}

const engine::TableDef* ModernStore::FindTable(const std::string& name) const {
  return reader_.FindTable(name);
}

void ModernStore::DecodeBlob(const MailboxContext* m, DecodePurpose purpose, const RowValue& v,
                             const SeparatedValues& separated, ItemRecords* records,
                             const std::vector<std::string>* only) const {
  if (!IsRealLayout(v.bytes)) {
    decoder_.Decode(purpose, v.column ? v.column->name : "PropertyBlob", v.engine_type, v.code_page,
                    ByteView(v.bytes), records);
    return;
  }
  RealBlob blob = ParseRealBlob(v.bytes);
  for (BlobEntry& e : blob.entries) {
    if (e.state == BlobValueState::kFarValue && separated) {
      if (std::optional<Bytes> far = separated(e.far_slot)) ResolveFarValue(*far, &e);
    }
    if (e.state != BlobValueState::kValue) continue;
    // A named number means nothing without the mailbox's map: taken as it
    // is, it could land in any field.
    std::optional<uint16_t> id = e.id;
    if (e.id >= kFirstNamedPropertyId) {
      id = m && m->named.loaded() ? m->named.Resolve(e.id) : std::nullopt;
    }
    if (!id) continue;
    const std::string name = EntryName(e, *id);
    if (only && std::find(only->begin(), only->end(), name) == only->end()) continue;
    if (name == "MN81a9") {
      decoder_.Decode(purpose, name, engine::kColumnBinary, 0, MemberList(e.items), records);
      continue;
    }
    const int stored =
        decoder_.Decode(purpose, name, e.engine_type, e.code_page, ByteView(e.value), records);
    // Contact texts known by meaning but by no rule (file-as, e-mail
    // display names) are kept with the contact's other strings.
    if (stored == 0 && purpose == DecodePurpose::kContactDetail && e.id >= kFirstNamedPropertyId &&
        e.letters == "S" && !e.value.empty()) {
      records->contact.strings[name] = std::string(e.value.begin(), e.value.end());
    }
  }
}

bool ModernStore::WalkMailboxes() {
  const engine::TableDef* table = FindTable(kMailboxTable);
  if (table) {
    const Columns& c = Modern2013(version_) ? k2013 : k2010;
    const engine::LongValueReader lv = reader_.long_values();
    RowValueReader values(lv, *table);
    reader_.ForEachRecord(*table, [&](const engine::RecordRef&, engine::RecordColumns& columns) {
      FolderNode node;
      std::optional<uint64_t> number = ReadId(values, *table, columns, c.mailbox_number, 1);
      if (!number) return true;
      // The first of the mailbox's name, its owner's name and the name in
      // its blob that has a value.
      for (const char* column : {c.mailbox_name, "MailboxOwnerDisplayName", "PropertyBlob"}) {
        const int name_slot = ColumnSlot(*table, column);
        RowValue name;
        if (name_slot < 0 || !values.ReadOne(columns, size_t(name_slot), &name)) continue;
        ItemRecords records;
        if (IsBlobColumn(column)) {
          RowSeparatedValues separated(values, *table, columns);
          DecodeBlob(nullptr, DecodePurpose::kFolderRow, name, separated, &records,
                     &kMailboxBlobNames);
        } else {
          decoder_.Decode(DecodePurpose::kFolderRow, c.folder_name, name.engine_type,
                          name.code_page, ByteView(name.bytes), &records);
        }
        node.display_name = records.node.display_name;
        if (!node.display_name.empty()) break;
      }
      node.folder_id = *number;
      node.parent_id = kRootFolderId;
      node.source_table = ModernFolderTableName(version_, *number);
      node.state = 1;
      folders_.Append(node);
      return true;
    });
  }
  public_store_ = folders_.only_fixed_entries();
  return table != nullptr;
}

MailboxContext* ModernStore::Mailbox(uint32_t node_index) {
  if (node_index >= folders_.size() || folders_[node_index].state != 1) return nullptr;
  std::unique_ptr<MailboxContext>& slot = mailboxes_[node_index];
  if (!slot) {
    slot = std::make_unique<MailboxContext>();
    slot->node_index = node_index;
    slot->number = folders_[node_index].folder_id;
    slot->folder_table = folders_[node_index].source_table;
    Load(*slot);
  }
  return slot.get();
}

void ModernStore::Load(MailboxContext& m) {
  m.loaded = true;
  const Columns& c = Modern2013(version_) ? k2013 : k2010;
  // Message and attachment tables follow from the folder table's name.
  if (Modern2013(version_)) {
    const std::string n = m.folder_table.substr(m.folder_table.find('_') + 1);
    m.message_table = "Message_" + n;
    m.attachment_table = "Attachment_" + n;
  } else {
    const std::string x = m.folder_table.substr(m.folder_table.find('-') + 1);
    m.message_table = "Body-" + x;
    m.attachment_table = "Attach-" + x;
  }

  if (Modern2013(version_))
    m.named = LoadNamedPropertyMap(reader_, NamedPropertyTableName(m.number));

  if (const engine::TableDef* table = FindTable(m.folder_table)) {
    const engine::LongValueReader lv = reader_.long_values();
    RowValueReader values(lv, *table);
    const std::vector<std::string> text_columns = {c.folder_name, c.container_class};
    const int blob_slot = ColumnSlot(*table, "PropertyBlob");
    reader_.ForEachRecord(*table, [&](const engine::RecordRef&, engine::RecordColumns& columns) {
      std::optional<uint64_t> id = ReadId(values, *table, columns, c.folder_id);
      std::optional<uint64_t> parent = ReadId(values, *table, columns, c.parent_id);
      if (!id) return true;
      ItemRecords records;
      // Name and class from the blob, where the columns leave them out.
      RowValue blob;
      if (blob_slot >= 0 && values.ReadOne(columns, size_t(blob_slot), &blob) &&
          IsRealLayout(blob.bytes)) {
        RowSeparatedValues separated(values, *table, columns);
        DecodeBlob(&m, DecodePurpose::kFolderRow, blob, separated, &records, &kFolderBlobNames);
      }
      for (const std::string& name : text_columns) {
        RowValue v;
        const int slot = ColumnSlot(*table, name);
        if (slot >= 0 && values.ReadOne(columns, size_t(slot), &v)) {
          decoder_.Decode(DecodePurpose::kFolderRow, name, v.engine_type, v.code_page,
                          ByteView(v.bytes), &records);
        }
      }
      FolderNode node = records.node;
      if (node.display_name.empty()) return true;
      node.folder_id = *id;
      // Top folders of the mailbox hang under its ROOT.
      node.parent_id = (!parent || *parent == 0 || *parent == m.number) ? kRootFolderId : *parent;
      node.source_table = m.folder_table;
      m.folders.Append(node);
      return true;
    });
  }
  m.folders.LinkTree(NullProgress());

  const engine::TableDef* messages = FindTable(m.message_table);
  if (!messages) return;
  m.work_folder = (fs::path(work_folder_) / ("mailbox" + std::to_string(m.node_index))).string();
  std::error_code ec;
  fs::create_directories(m.work_folder, ec);
  const std::string path = m.work_folder + "/" + kMessageLocationFile;
  if (!m.message_locations.Create(path).ok()) return;
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader values(lv, *messages);
  const char* key_column = Modern2013(version_) ? "MessageId" : "N67b0";
  const char* folder_column = Modern2013(version_) ? "FolderId" : "Q6748";
  reader_.ForEachRecord(
      *messages, [&](const engine::RecordRef& ref, engine::RecordColumns& columns) {
        uint64_t key = 0;
        if (Modern2013(version_)) {
          key = ReadId(values, *messages, columns, key_column, kMinMessageIdSize).value_or(0);
        } else {
          const int slot = ColumnSlot(*messages, key_column);
          RowValue v;
          if (slot >= 0 && values.ReadOne(columns, size_t(slot), &v) && v.bytes.size() >= kIdSize) {
            key = LoadU64LE(v.bytes.data());
          }
        }
        if (key == 0) return true;  // no key, or one too short to map
        m.message_map.Add(key);
        m.message_locations.Append({ref.page_number, ref.tag_index});
        if (std::optional<uint64_t> folder = ReadId(values, *messages, columns, folder_column)) {
          m.folder_messages[*folder].push_back(key);
        }
        return true;
      });
  std::vector<uint64_t> dropped = m.message_map.Finish();
  CompactLocations(&m.message_locations, dropped);
}

std::optional<engine::RecordRef> ModernStore::FindMessage(MailboxContext& m, uint64_t key) {
  std::optional<uint64_t> ordinal = m.message_map.Find(key);
  if (!ordinal) return std::nullopt;
  std::optional<RecordLocation> loc = m.message_locations.Read(*ordinal);
  if (!loc) return std::nullopt;
  engine::RecordRef ref = reader_.MakeRecordRef(loc->page_number, loc->tag_index);
  if (ref.kind != engine::kKindRecord) return std::nullopt;
  return ref;
}

std::vector<MessageSummary> ModernStore::ListFolder(MailboxContext& m, uint32_t folder_index) {
  std::vector<MessageSummary> rows;
  const engine::TableDef* messages = FindTable(m.message_table);
  if (!messages || folder_index >= m.folders.size()) return rows;
  auto it = m.folder_messages.find(m.folders[folder_index].folder_id);
  if (it == m.folder_messages.end()) return rows;
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader values(lv, *messages);
  std::set<uint64_t> listed;
  BlobParserOptions blob_options;
  blob_options.later_2013_variant = reader_.extended_catalog();
  for (uint64_t key : it->second) {
    if (!listed.insert(key).second) continue;  // a repeated key was mapped once
    std::optional<engine::RecordRef> ref = FindMessage(m, key);
    if (!ref) continue;
    engine::RecordColumns columns;
    if (reader_.ReadRecordColumns(*ref, *messages, nullptr, &columns) != 0) continue;
    ItemRecords records;
    std::vector<Recipient> recipients;
    for (const std::string& name : ListColumns()) {
      const int slot = ColumnSlot(*messages, name);
      RowValue v;
      if (slot < 0 || !values.ReadOne(columns, size_t(slot), &v)) continue;
      if (IsBlobColumn(name)) {
        if (!Modern2013(version_)) continue;
        if (IsRealLayout(v.bytes)) {
          RowSeparatedValues separated(values, *messages, columns);
          DecodeBlob(&m, DecodePurpose::kMessageListRow, v, separated, &records, &kListBlobNames);
        } else if (name == "PropertyBlob") {
          ParseBlobForList(ByteView(v.bytes), blob_options, &records.summary);
        }
        continue;
      }
      if (name == "RecipientList") {
        recipients = ParseRecipientList(v.bytes);
        continue;
      }
      decoder_.Decode(DecodePurpose::kMessageListRow, name, v.engine_type, v.code_page,
                      ByteView(v.bytes), &records);
    }
    // Lines the row does not hold itself come from its recipients.
    if (records.summary.to.empty()) records.summary.to = RecipientLine(recipients, kRecipientTo);
    if (records.summary.cc.empty()) records.summary.cc = RecipientLine(recipients, kRecipientCc);
    records.summary.message_key = key;
    rows.push_back(std::move(records.summary));
  }
  return rows;
}

std::optional<ItemRecords> ModernStore::OpenMessage(MailboxContext& m, uint64_t key,
                                                    DecodePurpose* purpose) {
  const engine::TableDef* messages = FindTable(m.message_table);
  if (!messages) return std::nullopt;
  std::optional<engine::RecordRef> ref = FindMessage(m, key);
  if (!ref) return std::nullopt;
  engine::RecordColumns columns;
  if (reader_.ReadRecordColumns(*ref, *messages, nullptr, &columns) != 0) return std::nullopt;
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader reader(lv, *messages);
  std::vector<RowValue> values = reader.Read(columns);
  const Columns& c = Modern2013(version_) ? k2013 : k2010;
  ItemRecords records;
  for (const RowValue& v : values) {
    if (v.column->name != c.message_class) continue;
    decoder_.Decode(DecodePurpose::kMessageListRow, v.column->name, v.engine_type, v.code_page,
                    ByteView(v.bytes), &records);
  }
  *purpose = PurposeForClass(records.summary.message_class);
  auto separated = [&values](uint16_t slot) -> std::optional<Bytes> {
    const std::string column = SeparatedPropertyColumn(slot);
    for (const RowValue& v : values) {
      if (v.column->name == column && !v.damaged) return v.bytes;
    }
    return std::nullopt;
  };
  for (const RowValue& v : values) {
    if (Modern2013(version_) && IsBlobColumn(v.column->name)) {
      DecodeBlob(&m, *purpose, v, separated, &records);
      continue;
    }
    if (v.column->name == "RecipientList") {
      const std::vector<Recipient> recipients = ParseRecipientList(v.bytes);
      if (records.summary.cc.empty()) records.summary.cc = RecipientLine(recipients, kRecipientCc);
      continue;
    }
    decoder_.Decode(*purpose, v.column->name, v.engine_type, v.code_page, ByteView(v.bytes),
                    &records);
  }
  // "NativeBody" holds the plain text itself, or compressed RTF, when the
  // body type says so.
  if (records.message.body_type == kBodyTypePlainText) records.message.body_is_text = true;
  if (records.message.body_type == kBodyTypeRtf && !records.message.rtf_body &&
      !records.message.body_is_text && !records.message.body.empty()) {
    if (std::optional<RtfText> rtf = DecompressRtf(records.message.body)) {
      records.message.rtf_compressed_length = records.message.body.size();
      records.message.rtf_body = std::move(rtf->text);
      records.message.body.clear();
    }
  }
  records.summary.message_key = key;
  return records;
}

bool ModernStore::ReadMessageColumns(MailboxContext& m, uint64_t key,
                                     engine::RecordColumns* columns) {
  const engine::TableDef* messages = FindTable(m.message_table);
  if (!messages) return false;
  std::optional<engine::RecordRef> ref = FindMessage(m, key);
  return ref && reader_.ReadRecordColumns(*ref, *messages, nullptr, columns) == 0;
}

void ModernStore::IndexAttachments(MailboxContext& m) {
  if (m.attachments_indexed) return;
  m.attachments_indexed = true;
  const engine::TableDef* attachments = FindTable(m.attachment_table);
  if (!attachments) return;
  // Attachment rows name their message by document id (2013+) or by its
  // key (2010); rows of servers name none and are found by "Inid".
  const char* owner_column = Modern2013(version_) ? "MessageDocumentId" : "N67b0";
  const bool has_owner = ColumnSlot(*attachments, owner_column) >= 0;
  const bool has_inid = Modern2013(version_) && ColumnSlot(*attachments, "Inid") >= 0;
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader values(lv, *attachments);
  reader_.ForEachRecord(
      *attachments, [&](const engine::RecordRef& ref, engine::RecordColumns& columns) {
        const RecordLocation at{ref.page_number, ref.tag_index};
        if (has_inid) {
          if (std::optional<uint64_t> inid = ReadId(values, *attachments, columns, "Inid", 1)) {
            m.attachments_by_inid.emplace(*inid, at);
          }
        }
        if (!has_owner) return true;
        std::optional<uint64_t> id;
        if (Modern2013(version_)) {
          id = ReadId(values, *attachments, columns, owner_column, 1);
        } else {
          const int slot = ColumnSlot(*attachments, owner_column);
          RowValue v;
          if (slot >= 0 && values.ReadOne(columns, size_t(slot), &v) && v.bytes.size() >= kIdSize) {
            id = LoadU64LE(v.bytes.data());
          }
        }
        if (id) m.attachment_index.push_back({*id, at});
        return true;
      });
  std::stable_sort(m.attachment_index.begin(), m.attachment_index.end(),
                   [](const auto& a, const auto& b) { return a.first < b.first; });
}

std::vector<AttachmentRecord> ModernStore::ListAttachments(MailboxContext& m, uint64_t key) {
  std::vector<AttachmentRecord> out;
  const engine::TableDef* attachments = FindTable(m.attachment_table);
  const engine::TableDef* messages = FindTable(m.message_table);
  if (!attachments || !messages) return out;
  IndexAttachments(m);
  const engine::LongValueReader lv = reader_.long_values();
  std::vector<RecordLocation> rows;
  bool listed = false;
  if (Modern2013(version_)) {
    engine::RecordColumns columns;
    if (!ReadMessageColumns(m, key, &columns)) return out;
    RowValueReader values(lv, *messages);
    // A message that lists its attachments says which rows are its own.
    const int subobjects_slot = ColumnSlot(*messages, "SubobjectsBlob");
    RowValue subobjects;
    if (subobjects_slot >= 0 && values.ReadOne(columns, size_t(subobjects_slot), &subobjects) &&
        !subobjects.bytes.empty()) {
      listed = true;
      for (int64_t inid : ParseSubobjectIds(subobjects.bytes)) {
        auto it = m.attachments_by_inid.find(uint64_t(inid));
        if (it != m.attachments_by_inid.end()) rows.push_back(it->second);
      }
    } else if (std::optional<uint64_t> id =
                   ReadId(values, *messages, columns, "MessageDocumentId", 1)) {
      key = *id;
    } else {
      return out;
    }
  }
  if (!listed) {
    auto range = std::equal_range(m.attachment_index.begin(), m.attachment_index.end(),
                                  std::make_pair(key, RecordLocation{}),
                                  [](const auto& a, const auto& b) { return a.first < b.first; });
    for (auto it = range.first; it != range.second; ++it) rows.push_back(it->second);
  }
  RowValueReader values(lv, *attachments);
  for (const RecordLocation& at : rows) {
    engine::RecordRef ref = reader_.MakeRecordRef(at.page_number, at.tag_index);
    engine::RecordColumns columns;
    if (ref.kind != engine::kKindRecord ||
        reader_.ReadRecordColumns(ref, *attachments, nullptr, &columns) != 0) {
      continue;
    }
    ItemRecords records;
    RowSeparatedValues separated(values, *attachments, columns);
    for (const RowValue& v : values.Read(columns)) {
      if (IsBlobColumn(v.column->name)) {
        if (IsRealLayout(v.bytes)) {
          DecodeBlob(&m, DecodePurpose::kAttachmentRow, v, separated, &records);
        }
        continue;
      }
      decoder_.Decode(DecodePurpose::kAttachmentRow, v.column->name, v.engine_type, v.code_page,
                      ByteView(v.bytes), &records);
    }
    out.push_back(std::move(records.attachment));
  }
  return out;
}

std::vector<Recipient> ModernStore::Recipients(FolderRef ref, uint64_t key) {
  if (ref.mailbox < 0) return {};
  MailboxContext* m = Mailbox(uint32_t(ref.mailbox));
  const engine::TableDef* messages = m ? FindTable(m->message_table) : nullptr;
  engine::RecordColumns columns;
  if (!messages || !ReadMessageColumns(*m, key, &columns)) return {};
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader values(lv, *messages);
  const int slot = ColumnSlot(*messages, "RecipientList");
  RowValue v;
  if (slot < 0 || !values.ReadOne(columns, size_t(slot), &v)) return {};
  return ParseRecipientList(v.bytes);
}

bool ModernStore::WalkFolders() {
  for (uint32_t i = 0; i < folders_.size(); ++i) {
    if (folders_[i].state == 1) Mailbox(i);
  }
  return true;
}

bool ModernStore::ShowTree(const std::string& database_path, uint64_t source_number,
                           FolderTreeSink& sink) {
  const int start = folders_.FindByName(public_store_ ? kPublicRootName : kRootName);
  if (start < 0) return false;
  const int64_t top = sink.AddTopItem(public_store_ ? folders_[start].display_name : database_path,
                                      kIconDatabase, source_number);
  for (uint32_t child : folders_.Children(uint32_t(start))) {
    const FolderNode& node = folders_[child];
    const int64_t item =
        sink.AddFolder(top, node.display_name, IconForFolderName(node.display_name), child);
    auto it = mailboxes_.find(child);
    if (it != mailboxes_.end() && it->second->loaded) {
      InsertChildren(it->second->folders, kRootIndex, item, sink, int32_t(child));
    }
  }
  return true;
}

const FolderNode* ModernStore::Folder(FolderRef ref) {
  if (ref.mailbox < 0) return ref.folder < folders_.size() ? &folders_[ref.folder] : nullptr;
  MailboxContext* m = Mailbox(uint32_t(ref.mailbox));
  return m && ref.folder < m->folders.size() ? &m->folders[ref.folder] : nullptr;
}

std::vector<MessageSummary> ModernStore::ListFolder(FolderRef ref) {
  if (ref.mailbox < 0) return {};  // a mailbox node lists nothing
  MailboxContext* m = Mailbox(uint32_t(ref.mailbox));
  return m ? ListFolder(*m, ref.folder) : std::vector<MessageSummary>();
}

std::optional<ItemRecords> ModernStore::OpenMessage(FolderRef ref, uint64_t key,
                                                    DecodePurpose* purpose) {
  if (ref.mailbox < 0) return std::nullopt;
  MailboxContext* m = Mailbox(uint32_t(ref.mailbox));
  return m ? OpenMessage(*m, key, purpose) : std::nullopt;
}

std::vector<AttachmentRecord> ModernStore::ListAttachments(FolderRef ref, uint64_t key) {
  if (ref.mailbox < 0) return {};
  MailboxContext* m = Mailbox(uint32_t(ref.mailbox));
  return m ? ListAttachments(*m, key) : std::vector<AttachmentRecord>();
}

}  // namespace tarnwell::store
