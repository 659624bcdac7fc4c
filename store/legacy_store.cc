#include "store/legacy_store.h"

#include <algorithm>
#include <cstdio>
#include <filesystem>

#include "base/text.h"
#include "engine/catalog.h"
#include "engine/tree_cursor.h"
#include "store/row_values.h"

namespace tarnwell::store {
namespace {

constexpr size_t kMessageKeySize = 8;
constexpr uint8_t kKeyPrefixByte = 0x7F;
constexpr uint8_t kKeySegmentLength = 0x08;
inline constexpr char kMessageKeyColumn[] = "N67b0";
inline constexpr char kMessageClassColumn[] = "S1a";

// The first 8 bytes of a key column, little-endian; nothing when shorter.
std::optional<uint64_t> KeyOf(const RowValue& v) {
  if (v.bytes.size() < kMessageKeySize) return std::nullopt;
  return LoadU64LE(v.bytes.data());
}

const std::vector<std::string>& ListColumns() {
  static const std::vector<std::string> kColumns = {"S678e", "S42",  "N67b9", "N67bd", "N67b0",
                                                    "T3007", "S1a",  "Se1d",  "Be1b",  "S3d",
                                                    "L17",   "Le07", "Te06",  "T3008"};
  return kColumns;
}

}  // namespace

std::string ContentTableName(uint64_t folder_id) {
  char hex[24];
  std::snprintf(hex, sizeof hex, "%llx", static_cast<unsigned long long>(folder_id));
  const std::string text = hex;
  constexpr size_t kRun = 4;
  size_t found = std::string::npos;
  if (text.size() >= kRun + 1) {
    for (size_t start = text.size() - kRun; start >= 1; --start) {
      if (text.compare(start, kRun, "0000") == 0) {
        found = start;
        break;
      }
      if (start == 1) break;
    }
  }
  std::string name = found != std::string::npos ? text.substr(found + kRun)
                                                : (text.size() > 1 ? text.substr(1) : "");
  for (char& c : name) c = char(std::toupper(static_cast<unsigned char>(c)));
  return name;
}

DecodePurpose PurposeForClass(const std::string& message_class) {
  if (message_class == "IPM.Contact" || message_class == "IPF.Contact") {
    return DecodePurpose::kContactDetail;
  }
  if (message_class == "IPM.Appointment" || message_class == "IPF.Appointment" ||
      message_class == "IPM.Appointment.Private Calendar" ||
      message_class == "IPM.Schedule.Meeting.Request") {
    return DecodePurpose::kAppointmentDetail;
  }
  if (message_class == "IPM.Task" || message_class == "IPF.Task") {
    return DecodePurpose::kTaskDetail;
  }
  return DecodePurpose::kMessageDetail;
}

LegacyStore::LegacyStore(engine::EdbClass& reader, int version, ScanMode mode)
    : reader_(reader), version_(version), mode_(mode), decoder_(version) {}

const engine::TableDef* LegacyStore::FindListedTable(const std::string& listed) const {
  for (const engine::TableDef& t : reader_.tables()) {
    if (engine::ListedTableName(t.name(), reader_.family()) == listed) return &t;
  }
  return nullptr;
}

void LegacyStore::DecodeRecord(const engine::TableDef& table, const engine::RecordColumns& columns,
                               DecodePurpose purpose, ItemRecords* records,
                               const std::vector<std::string>* only) {
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader values(lv, table);
  size_t seen = 0;
  for (size_t slot = 0; slot < table.columns.size(); ++slot) {
    const std::string& name = table.columns[slot].name;
    if (only && std::find(only->begin(), only->end(), name) == only->end()) continue;
    RowValue v;
    if (!values.ReadOne(columns, slot, &v)) continue;
    decoder_.Decode(purpose, name, v.engine_type, v.code_page, ByteView(v.bytes), records);
    // The list stops going through the columns once it has seen them all.
    if (only && ++seen == only->size()) break;
  }
}

bool LegacyStore::WalkMailboxes() {
  const engine::TableDef* table = FindListedTable(kMailboxTable);
  if (table) {
    static const std::vector<std::string> kColumns = {"N66a0", "Q6764", "S3001"};
    reader_.ForEachRecord(*table, [&](const engine::RecordRef&, engine::RecordColumns& columns) {
      ItemRecords records;
      DecodeRecord(*table, columns, DecodePurpose::kMailboxRow, &records, &kColumns);
      records.node.parent_id = kRootFolderId;
      folders_.Append(records.node);
      return true;
    });
  }
  public_store_ = folders_.only_fixed_entries();
  return table != nullptr;
}

bool LegacyStore::WalkFolders() {
  const engine::TableDef* table = FindListedTable(kFoldersTable);
  if (!table) return false;
  static const std::vector<std::string> kColumns = {"Q6748", "Q6749", "S3001", "S3613"};
  std::vector<int> slots;
  for (const std::string& c : kColumns) slots.push_back(ColumnSlot(*table, c));
  reader_.ForEachRecord(*table, [&](const engine::RecordRef&, engine::RecordColumns& columns) {
    ItemRecords records;
    // A row counts only when all four columns are there.
    for (int slot : slots) {
      if (slot < 0 || !columns.at(size_t(slot)).present) return true;
    }
    DecodeRecord(*table, columns, DecodePurpose::kFolderRow, &records, &kColumns);
    const FolderNode& node = records.node;
    const bool ordinary = node.parent_id != 0 && !node.display_name.empty();
    if (ordinary || node.display_name == kPublicRootName) folders_.Append(node);
    return true;
  });
  return true;
}

bool LegacyStore::WalkKeyedTable(const engine::TableDef& table, const std::string& key_column,
                                 KeyOrdinalMap* map, const std::string& location_name,
                                 LocationFile* locations, bool index_attachments) {
  const int key_slot = ColumnSlot(table, key_column);
  const int owner_slot = index_attachments ? ColumnSlot(table, kMessageKeyColumn) : -1;
  if (key_slot < 0) return false;
  const std::string path = work_folder_.empty() ? "" : work_folder_ + "/" + location_name;
  if (path.empty() || !locations->Create(path).ok()) return false;
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader values(lv, table);
  reader_.ForEachRecord(table, [&](const engine::RecordRef& ref, engine::RecordColumns& columns) {
    RowValue v;
    if (!values.ReadOne(columns, size_t(key_slot), &v)) return true;
    std::optional<uint64_t> key = KeyOf(v);
    if (!key || *key == 0) return true;
    map->Add(*key);
    locations->Append({ref.page_number, ref.tag_index});
    if (owner_slot >= 0) {
      RowValue owner;
      if (values.ReadOne(columns, size_t(owner_slot), &owner)) {
        if (std::optional<uint64_t> m = KeyOf(owner)) {
          attachment_index_.push_back({*m, {ref.page_number, ref.tag_index}});
        }
      }
    }
    return true;
  });
  CompactLocations(locations, map->Finish());
  return true;
}

bool LegacyStore::BuildMessageMap() {
  message_table_ = FindListedTable(kMessageTable);
  if (!message_table_) return false;
  if (mode_ == ScanMode::kStandard) return true;
  return WalkKeyedTable(*message_table_, kMessageKeyColumn, &message_map_, kMessageLocationFile,
                        &message_locations_, false);
}

std::string LegacyStore::attachment_table_name() const {
  if (public_store_) return "A";
  return version_ == engine::kExchange2000 ? "23" : "24";
}

bool LegacyStore::BuildAttachmentMap() {
  attachment_table_ = FindListedTable(attachment_table_name());
  if (!attachment_table_) return false;
  if (mode_ == ScanMode::kStandard) return true;
  const std::string key = version_ == engine::kExchange55 ? "Q674a" : "Q3f88";
  attachment_index_.clear();
  const bool ok = WalkKeyedTable(*attachment_table_, key, &attachment_map_, kAttachmentLocationFile,
                                 &attachment_locations_, true);
  std::stable_sort(attachment_index_.begin(), attachment_index_.end(),
                   [](const auto& a, const auto& b) { return a.first < b.first; });
  attachment_index_built_ = ok;
  return ok;
}

void LegacyStore::BuildAttachmentIndex() {
  attachment_index_built_ = true;
  if (!attachment_table_) return;
  const int owner_slot = ColumnSlot(*attachment_table_, kMessageKeyColumn);
  if (owner_slot < 0) return;
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader values(lv, *attachment_table_);
  reader_.ForEachRecord(*attachment_table_,
                        [&](const engine::RecordRef& ref, engine::RecordColumns& columns) {
                          RowValue owner;
                          if (values.ReadOne(columns, size_t(owner_slot), &owner)) {
                            if (std::optional<uint64_t> m = KeyOf(owner)) {
                              attachment_index_.push_back({*m, {ref.page_number, ref.tag_index}});
                            }
                          }
                          return true;
                        });
  std::stable_sort(attachment_index_.begin(), attachment_index_.end(),
                   [](const auto& a, const auto& b) { return a.first < b.first; });
}

const engine::TableDef* LegacyStore::ContentTable(uint32_t folder_index) const {
  if (folder_index >= folders_.size()) return nullptr;
  return FindListedTable(ContentTableName(folders_[folder_index].folder_id));
}

std::vector<MessageSummary> LegacyStore::ListFolder(uint32_t folder_index) {
  std::vector<MessageSummary> rows;
  const engine::TableDef* table = ContentTable(folder_index);
  if (!table) return rows;
  reader_.ForEachRecord(*table, [&](const engine::RecordRef&, engine::RecordColumns& columns) {
    ItemRecords records;
    DecodeRecord(*table, columns, DecodePurpose::kMessageListRow, &records, &ListColumns());
    rows.push_back(std::move(records.summary));
    return true;
  });
  return rows;
}

std::optional<engine::RecordRef> LegacyStore::FindMessage(uint64_t message_key) {
  if (!message_table_) message_table_ = FindListedTable(kMessageTable);
  if (!message_table_) return std::nullopt;
  if (mode_ == ScanMode::kStandard) {
    Bytes key;
    key.push_back(kKeyPrefixByte);
    for (size_t i = 0; i < kMessageKeySize; ++i) key.push_back(uint8_t(message_key >> (8 * i)));
    key.push_back(kKeySegmentLength);
    engine::RecordRef ref;
    if (engine::SeekKey(reader_.file(), message_table_->table.root_page(), ByteView(key), &ref) !=
        1) {
      return std::nullopt;
    }
    ref.kind = engine::kKindRecord;
    return ref;
  }
  std::optional<uint64_t> ordinal = message_map_.Find(message_key);
  if (!ordinal) return std::nullopt;
  std::optional<RecordLocation> loc = message_locations_.Read(*ordinal);
  if (!loc) return std::nullopt;
  engine::RecordRef ref = reader_.MakeRecordRef(loc->page_number, loc->tag_index);
  if (ref.kind != engine::kKindRecord) return std::nullopt;
  return ref;
}

ItemRecords LegacyStore::OpenItem(const engine::TableDef& table, const engine::RecordRef& ref,
                                  DecodePurpose purpose) {
  ItemRecords records;
  engine::RecordColumns columns;
  if (reader_.ReadRecordColumns(ref, table, nullptr, &columns) != 0) return records;
  DecodeRecord(table, columns, purpose, &records);
  return records;
}

std::optional<ItemRecords> LegacyStore::OpenMessage(uint64_t message_key, DecodePurpose* purpose) {
  std::optional<engine::RecordRef> ref = FindMessage(message_key);
  if (!ref) return std::nullopt;
  engine::RecordColumns columns;
  if (reader_.ReadRecordColumns(*ref, *message_table_, nullptr, &columns) != 0) {
    return std::nullopt;
  }
  // Every value is read once; the class among them decides the purpose.
  const engine::LongValueReader lv = reader_.long_values();
  RowValueReader reader(lv, *message_table_);
  std::vector<RowValue> values = reader.Read(columns);
  ItemRecords records;
  for (const RowValue& v : values) {
    if (v.column->name != kMessageClassColumn) continue;
    decoder_.Decode(DecodePurpose::kMessageListRow, v.column->name, v.engine_type, v.code_page,
                    ByteView(v.bytes), &records);
  }
  *purpose = PurposeForClass(records.summary.message_class);
  for (const RowValue& v : values) {
    decoder_.Decode(*purpose, v.column->name, v.engine_type, v.code_page, ByteView(v.bytes),
                    &records);
  }
  return records;
}

std::vector<AttachmentRecord> LegacyStore::ListAttachments(uint64_t message_key) {
  std::vector<AttachmentRecord> out;
  if (!attachment_table_) attachment_table_ = FindListedTable(attachment_table_name());
  if (!attachment_table_) return out;
  if (!attachment_index_built_) BuildAttachmentIndex();
  auto range = std::equal_range(attachment_index_.begin(), attachment_index_.end(),
                                std::make_pair(message_key, RecordLocation{}),
                                [](const auto& a, const auto& b) { return a.first < b.first; });
  for (auto it = range.first; it != range.second; ++it) {
    engine::RecordRef ref = reader_.MakeRecordRef(it->second.page_number, it->second.tag_index);
    if (ref.kind != engine::kKindRecord) continue;
    out.push_back(OpenItem(*attachment_table_, ref, DecodePurpose::kAttachmentRow).attachment);
  }
  return out;
}

}  // namespace tarnwell::store
