// How the messaging layer lays objects out in nodes:
//
//   object              node                      parent in the node tree
//   ------------------  ------------------------  -----------------------
//   folder              PC, id type 0x02          the parent folder
//   its subfolders      TC, same index, type 0x0D none
//   its messages        TC, same index, type 0x0E none
//   its FAI messages    TC, same index, type 0x0F none
//   message             PC, id type 0x04          the folder
//
// A message node's subnodes:
//
//   subnode             content
//   ------------------  -------------------------------------------------
//   0x692               recipient table (one row per recipient)
//   0x671               attachment table (one row per attachment; only
//                       when there are attachments), row id = the
//                       attachment's subnode id
//   type 0x05           one attachment PC each; an embedded message is a
//                       subnode of the attachment PC, named by the 8 bytes
//                       (subnode id, size) of PidTagAttachDataObject
//   type 0x1F           large property values (kept by the PC layer)
//
// Named properties (ids 0x8000 and up) go through the name-to-id map.
#include "mapi/pst/pst_store.h"

#include <algorithm>
#include <map>
#include <random>

#include "base/date_time.h"
#include "mapi/property_tags.h"
#include "mapi/pst/name_map.h"
#include "mapi/pst/property_context.h"
#include "mapi/pst/store_templates.h"
#include "mapi/pst/table_context.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr size_t kRecordKeySize = 16;
constexpr size_t kEntryIdSize = 24;
constexpr size_t kObjectValueSize = 8;  // subnode id + size
constexpr int32_t kMsgFlagRead = 0x01;
constexpr int32_t kMsgFlagHasAttach = 0x10;
constexpr int32_t kObjectTypeMailUser = 6;
constexpr int32_t kRenderingPositionNone = -1;
constexpr uint16_t kPidMessageStatus = 0x0E17;
constexpr uint16_t kPidSearchKey = 0x300B;
constexpr uint16_t kPidIpmAppointmentEntryId = 0x36D0;
constexpr uint16_t kPidIpmContactEntryId = 0x36D1;
constexpr uint16_t kPidIpmJournalEntryId = 0x36D2;
constexpr uint16_t kPidIpmNoteEntryId = 0x36D3;
constexpr uint16_t kPidIpmTaskEntryId = 0x36D4;
constexpr uint32_t kFirstAttachmentIndex = 0x400;
constexpr Nid kEmbeddedMessageSubnode = MakeNid(kNidTypeNormalMessage, 1);
// Embedded messages nest; a file cannot make us recurse without end.
constexpr int kMaxEmbeddingDepth = 16;
constexpr int kMaxNidRetries = 1000;

bool IsString(uint16_t type) { return type == kTypeUnicode || type == kTypeString8; }

const PropertyValue* FindTagged(const std::vector<TaggedValue>& props, uint16_t id) {
  for (const TaggedValue& p : props) {
    if (TagId(p.tag) == id) return &p.value;
  }
  return nullptr;
}

void SetTagged(std::vector<TaggedValue>* props, uint16_t id, PropertyValue value) {
  props->erase(std::remove_if(props->begin(), props->end(),
                              [id](const TaggedValue& p) { return TagId(p.tag) == id; }),
               props->end());
  PropTag tag = MakeTag(id, value.type);
  props->push_back({tag, std::move(value)});
}

uint64_t ValueSize(const PropertyValue& v) {
  uint64_t size = v.data.size();
  for (const Bytes& e : v.elements) size += e.size();
  return size;
}

std::vector<PropTag> WithoutRowColumns(std::vector<PropTag> columns) {
  columns.erase(std::remove_if(columns.begin(), columns.end(),
                               [](PropTag t) {
                                 return TagId(t) == kPidLtpRowId || TagId(t) == kPidLtpRowVer;
                               }),
                columns.end());
  return columns;
}

// A table cell for `column` from a property of the object the row stands
// for: the same type, or a string of the other width.
std::optional<PropertyValue> CellFor(PropTag column, const PropertyValue& value) {
  if (value.type == TagType(column)) return value;
  if (IsString(TagType(column)) && IsString(value.type)) {
    std::optional<std::string> text = value.AsString();
    if (!text) return std::nullopt;
    return TagType(column) == kTypeUnicode ? PropertyValue::Unicode(*text)
                                           : PropertyValue::String8(*text);
  }
  return std::nullopt;
}

// Outlook stores a subject as 0x01, the length of its prefix ("RE: ") plus
// one, and the subject; the marker is not part of the text.
PropertyValue WithoutPrefixMarker(const PropertyValue& value) {
  constexpr uint8_t kMarker = 0x01;
  PropertyValue out = value;
  if (value.type == kTypeUnicode && value.data.size() >= 4 && value.data[0] == kMarker &&
      value.data[1] == 0) {
    out.data.erase(out.data.begin(), out.data.begin() + 4);
  } else if (value.type == kTypeString8 && value.data.size() >= 2 && value.data[0] == kMarker) {
    out.data.erase(out.data.begin(), out.data.begin() + 2);
  }
  return out;
}

// The stored form of a subject: the marker, then the text. Readers that
// know the marker strip it; some readers drop a subject's first character
// when it is missing.
void AddPrefixMarker(std::vector<TaggedValue>* props) {
  constexpr char16_t kMarker = 0x01;
  auto subject = std::find_if(props->begin(), props->end(), [](const TaggedValue& p) {
    return TagId(p.tag) == kPidSubject && p.value.type == kTypeUnicode;
  });
  if (subject == props->end()) return;
  const PropertyValue* prefix = FindTagged(*props, kPidSubjectPrefix);
  size_t prefix_bytes = 0;
  if (prefix && prefix->type == kTypeUnicode && prefix->data.size() <= subject->value.data.size() &&
      std::equal(prefix->data.begin(), prefix->data.end(), subject->value.data.begin())) {
    prefix_bytes = prefix->data.size();
  }
  const char16_t length = char16_t(std::min<size_t>(prefix_bytes / 2 + 1, 0xFFFF));
  Bytes marked = {uint8_t(kMarker), 0, uint8_t(length), uint8_t(length >> 8)};
  marked.insert(marked.end(), subject->value.data.begin(), subject->value.data.end());
  subject->value.data = std::move(marked);
}

void KeepFirstError(Status* first, const Status& s) {
  if (first->ok() && !s.ok()) *first = s;
}

struct FolderState {
  FolderRow row;
  Nid parent = 0;
  std::vector<TaggedValue> properties;  // the whole PC, kept for rewriting
  std::vector<PropTag> hierarchy_columns;
  std::vector<TableRow> hierarchy_rows;
  std::vector<PropTag> contents_columns;
  std::vector<TableRow> contents_rows;
  bool is_new = false;
  bool properties_dirty = false;
  bool hierarchy_dirty = false;
  bool contents_dirty = false;
};

FolderRow RowFromProperties(Nid nid, const std::vector<TaggedValue>& props) {
  FolderRow row;
  row.nid = nid;
  if (const PropertyValue* v = FindTagged(props, kPidDisplayName))
    row.name = v->AsString().value_or("");
  if (const PropertyValue* v = FindTagged(props, kPidContainerClass)) {
    row.container_class = v->AsString().value_or("");
  }
  if (const PropertyValue* v = FindTagged(props, kPidContentCount)) {
    row.content_count = uint32_t(std::max(0, v->AsInt32().value_or(0)));
  }
  if (const PropertyValue* v = FindTagged(props, kPidContentUnreadCount)) {
    row.unread_count = uint32_t(std::max(0, v->AsInt32().value_or(0)));
  }
  if (const PropertyValue* v = FindTagged(props, kPidSubfolders)) {
    row.has_subfolders = v->AsBool().value_or(false);
  }
  return row;
}

FolderInfo InfoFromRow(const FolderRow& row) {
  FolderInfo info;
  info.nid = row.nid;
  info.name = row.name;
  info.container_class = row.container_class;
  info.content_count = row.content_count;
  info.has_subfolders = row.has_subfolders;
  return info;
}

FolderRow RowFromCells(Nid nid, const std::map<PropTag, PropertyValue>& cells) {
  std::vector<TaggedValue> props;
  for (const auto& [tag, value] : cells) props.push_back({tag, value});
  return RowFromProperties(nid, props);
}

}  // namespace

struct PstStore::Impl {
  std::unique_ptr<PstFile> file;
  Bytes record_key;
  std::string display_name;
  std::vector<TaggedValue> store_properties;
  bool store_dirty = false;
  NameMap names;
  std::vector<TaggedValue> name_map_others;  // properties of node 0x61 the map does not own
  Nid top = 0;
  std::map<Nid, Nid> folder_parents;   // folders (normal and search) -> parent
  std::map<Nid, FolderState> folders;  // folders this session loaded for changing

  bool IsFolder(Nid nid) const {
    return NidTypeOf(nid) == kNidTypeNormalFolder && file->HasNode(nid);
  }

  // ---- Reading

  Status ReadProperties(Nid nid, std::vector<TaggedValue>* out) const {
    NodeContent node;
    Status s = file->ReadNode(nid, &node);
    if (!s.ok()) return s;
    return DecodePropertyContext(node, out);
  }

  Status ReadTable(Nid nid, std::vector<PropTag>* columns, std::vector<TableRow>* rows) const {
    NodeContent node;
    Status s = file->ReadNode(nid, &node);
    if (!s.ok()) return s;
    return DecodeTableContext(node, columns, rows);
  }

  // The rows of a folder table, from memory when this session changed it.
  Status FolderTableRows(Nid folder, uint8_t type, std::vector<TableRow>* rows) const {
    auto it = folders.find(folder);
    if (it != folders.end()) {
      *rows = type == kNidTypeHierarchyTable ? it->second.hierarchy_rows : it->second.contents_rows;
      return Status::Ok();
    }
    std::vector<PropTag> columns;
    return ReadTable(FolderTableNid(folder, type), &columns, rows);
  }

  void AddToBag(PropTag tag, const PropertyValue& value, PropertyBag* bag) const {
    uint16_t id = TagId(tag);
    if (id == kPidLtpRowId || id == kPidLtpRowVer) return;
    if (id == kPidSubject) {
      bag->Set(id, WithoutPrefixMarker(value));
      return;
    }
    if (id >= kFirstNamedId) {
      // A number the map does not explain cannot be given a name; drop it.
      if (const NamedProperty* name = names.Lookup(id)) bag->SetNamed(*name, value);
      return;
    }
    bag->Set(id, value);
  }

  Status DecodeMessage(const NodeContent& node, int depth, Message* out) const {
    Status first;
    std::vector<TaggedValue> props;
    KeepFirstError(&first, DecodePropertyContext(node, &props));
    for (const TaggedValue& p : props) AddToBag(p.tag, p.value, &out->properties);

    auto recipients = node.subnodes.find(kNidRecipientTable);
    if (recipients != node.subnodes.end()) {
      std::vector<PropTag> columns;
      std::vector<TableRow> rows;
      KeepFirstError(&first, DecodeTableContext(recipients->second, &columns, &rows));
      for (const TableRow& row : rows) {
        PropertyBag bag;
        for (const auto& [tag, value] : row.cells) AddToBag(tag, value, &bag);
        out->recipients.push_back(std::move(bag));
      }
    }

    auto attachments = node.subnodes.find(kNidAttachmentTable);
    if (attachments == node.subnodes.end()) return first;
    std::vector<PropTag> columns;
    std::vector<TableRow> rows;
    KeepFirstError(&first, DecodeTableContext(attachments->second, &columns, &rows));
    for (const TableRow& row : rows) {
      auto sub = node.subnodes.find(row.row_id);
      if (sub == node.subnodes.end()) {
        KeepFirstError(&first, Status::Corruption("attachment row without its attachment"));
        continue;
      }
      Attachment attachment;
      std::vector<TaggedValue> attach_props;
      KeepFirstError(&first, DecodePropertyContext(sub->second, &attach_props));
      for (const TaggedValue& p : attach_props) {
        if (TagId(p.tag) == kPidAttachDataBinary && p.value.type == kTypeBinary) {
          attachment.data = p.value.data;
        } else if (TagId(p.tag) == kPidAttachDataBinary && p.value.type == kTypeObject) {
          ByteView object(p.value.data);
          uint32_t subnode = 0;
          if (!object.ReadU32LE(0, &subnode)) {
            KeepFirstError(&first, Status::Corruption("short embedded message reference"));
            continue;
          }
          auto embedded = sub->second.subnodes.find(subnode);
          if (embedded == sub->second.subnodes.end() || depth >= kMaxEmbeddingDepth) {
            KeepFirstError(&first, Status::Corruption("embedded message missing or too deep"));
            continue;
          }
          attachment.embedded = std::make_unique<Message>();
          KeepFirstError(&first,
                         DecodeMessage(embedded->second, depth + 1, attachment.embedded.get()));
        } else {
          AddToBag(p.tag, p.value, &attachment.properties);
        }
      }
      out->attachments.push_back(std::move(attachment));
    }
    return first;
  }

  // ---- Writing

  // The tagged and named properties of a bag as PC properties. Named ones
  // get their ids from the name-to-id map, which grows as needed.
  std::vector<TaggedValue> PropertiesOf(const PropertyBag& bag) {
    std::vector<TaggedValue> props;
    for (const auto& [id, value] : bag.tagged()) {
      if (id >= kFirstNamedId || value.type == kTypeNull) continue;
      props.push_back({MakeTag(id, value.type), value});
    }
    for (const auto& [name, value] : bag.named()) {
      uint16_t id = names.FindOrAdd(name);
      if (id == 0 || value.type == kTypeNull) continue;
      props.push_back({MakeTag(id, value.type), value});
    }
    return props;
  }

  // Builds the node of `message` (PC and subnodes); `size` receives the
  // size recorded in it.
  Status EncodeMessage(const Message& message, int depth, NodeContent* node, uint64_t* size,
                       std::vector<TaggedValue>* stored) {
    if (depth > kMaxEmbeddingDepth) return Status::InvalidArgument("messages nested too deep");
    std::vector<TaggedValue> props = PropertiesOf(message.properties);
    AddPrefixMarker(&props);
    // Computed by the store, whatever the caller says.
    for (uint16_t computed : {kPidMessageSize, kPidHasAttachments}) {
      props.erase(
          std::remove_if(props.begin(), props.end(),
                         [computed](const TaggedValue& p) { return TagId(p.tag) == computed; }),
          props.end());
    }
    uint64_t total = 0;

    // Recipients.
    std::vector<PropTag> recipient_columns = RecipientTableColumns();
    std::vector<TableRow> recipient_rows;
    for (size_t i = 0; i < message.recipients.size(); ++i) {
      TableRow row;
      row.row_id = uint32_t(i);
      std::vector<TaggedValue> cells = PropertiesOf(message.recipients[i]);
      if (!FindTagged(cells, kPidRecipientType)) {
        SetTagged(&cells, kPidRecipientType, PropertyValue::Int32(kRecipientTo));
      }
      if (!FindTagged(cells, kPidObjectType)) {
        SetTagged(&cells, kPidObjectType, PropertyValue::Int32(kObjectTypeMailUser));
      }
      if (!FindTagged(cells, kPidDisplayType)) {
        SetTagged(&cells, kPidDisplayType, PropertyValue::Int32(0));
      }
      for (TaggedValue& c : cells) {
        total += ValueSize(c.value);
        if (std::find(recipient_columns.begin(), recipient_columns.end(), c.tag) ==
            recipient_columns.end()) {
          recipient_columns.push_back(c.tag);
        }
        row.cells[c.tag] = std::move(c.value);
      }
      recipient_rows.push_back(std::move(row));
    }
    Status s =
        EncodeTableContext(recipient_columns, recipient_rows, &node->subnodes[kNidRecipientTable]);
    if (!s.ok()) return s;

    // Attachments.
    std::vector<TableRow> attachment_rows;
    for (size_t i = 0; i < message.attachments.size(); ++i) {
      const Attachment& a = message.attachments[i];
      Nid sub = MakeNid(kNidTypeAttachment, uint32_t(kFirstAttachmentIndex + i));
      NodeContent& attach_node = node->subnodes[sub];
      std::vector<TaggedValue> attach_props = PropertiesOf(a.properties);
      attach_props.erase(
          std::remove_if(attach_props.begin(), attach_props.end(),
                         [](const TaggedValue& p) { return TagId(p.tag) == kPidAttachDataBinary; }),
          attach_props.end());
      uint64_t attach_size = 0;
      for (const TaggedValue& p : attach_props) attach_size += ValueSize(p.value);
      if (a.embedded) {
        NodeContent& inner = attach_node.subnodes[kEmbeddedMessageSubnode];
        uint64_t inner_size = 0;
        std::vector<TaggedValue> ignored;
        s = EncodeMessage(*a.embedded, depth + 1, &inner, &inner_size, &ignored);
        if (!s.ok()) return s;
        PropertyValue object;
        object.type = kTypeObject;
        object.data.resize(kObjectValueSize);
        StoreU32LE(object.data.data(), kEmbeddedMessageSubnode);
        StoreU32LE(object.data.data() + 4, uint32_t(std::min<uint64_t>(inner_size, UINT32_MAX)));
        SetTagged(&attach_props, kPidAttachDataBinary, std::move(object));
        attach_size += inner_size;
        if (!FindTagged(attach_props, kPidAttachMethod)) {
          SetTagged(&attach_props, kPidAttachMethod, PropertyValue::Int32(kAttachEmbeddedMessage));
        }
      } else {
        SetTagged(&attach_props, kPidAttachDataBinary, PropertyValue::Binary(a.data));
        attach_size += a.data.size();
        if (!FindTagged(attach_props, kPidAttachMethod)) {
          SetTagged(&attach_props, kPidAttachMethod, PropertyValue::Int32(kAttachByValue));
        }
      }
      SetTagged(&attach_props, kPidAttachSize,
                PropertyValue::Int32(int32_t(std::min<uint64_t>(attach_size, INT32_MAX))));
      if (!FindTagged(attach_props, kPidRenderingPosition)) {
        SetTagged(&attach_props, kPidRenderingPosition,
                  PropertyValue::Int32(kRenderingPositionNone));
      }
      if (!FindTagged(attach_props, kPidAttachNumber)) {
        SetTagged(&attach_props, kPidAttachNumber, PropertyValue::Int32(int32_t(i)));
      }
      TableRow row;
      row.row_id = sub;
      for (const TaggedValue& p : attach_props) {
        if (TagId(p.tag) != kPidAttachDataBinary) row.cells[p.tag] = p.value;
      }
      attachment_rows.push_back(std::move(row));
      s = EncodePropertyContext(attach_props, &attach_node);
      if (!s.ok()) return s;
      total += attach_size;
    }
    if (!attachment_rows.empty()) {
      s = EncodeTableContext(AttachmentTableColumns(), attachment_rows,
                             &node->subnodes[kNidAttachmentTable]);
      if (!s.ok()) return s;
    }

    // The message's own properties, with what every message carries.
    if (!FindTagged(props, kPidMessageClass)) {
      SetTagged(&props, kPidMessageClass, PropertyValue::Unicode("IPM.Note"));
    }
    int32_t flags = kMsgFlagRead;
    if (const PropertyValue* v = FindTagged(props, kPidMessageFlags)) {
      flags = v->AsInt32().value_or(kMsgFlagRead);
    }
    flags =
        message.attachments.empty() ? (flags & ~kMsgFlagHasAttach) : (flags | kMsgFlagHasAttach);
    SetTagged(&props, kPidMessageFlags, PropertyValue::Int32(flags));
    uint64_t now = CurrentFileTime();
    if (!FindTagged(props, kPidCreationTime)) {
      SetTagged(&props, kPidCreationTime, PropertyValue::SysTime(now));
    }
    if (!FindTagged(props, kPidLastModificationTime)) {
      SetTagged(&props, kPidLastModificationTime, PropertyValue::SysTime(now));
    }
    if (!FindTagged(props, kPidMessageStatus)) {
      SetTagged(&props, kPidMessageStatus, PropertyValue::Int32(0));
    }
    if (!FindTagged(props, kPidSearchKey)) {
      SetTagged(&props, kPidSearchKey, PropertyValue::Binary(RandomBytes(kRecordKeySize)));
    }
    for (const TaggedValue& p : props) total += ValueSize(p.value);
    total = std::min<uint64_t>(total, INT32_MAX);
    SetTagged(&props, kPidMessageSize, PropertyValue::Int32(int32_t(total)));
    *size = total;
    *stored = props;
    return EncodePropertyContext(props, node);
  }

  static Bytes RandomBytes(size_t n) {
    static std::random_device device;
    static std::mt19937_64 engine(device());
    Bytes out(n);
    for (uint8_t& b : out) b = uint8_t(engine());
    return out;
  }

  // Loads a folder's PC and tables for changing them.
  Status LoadFolder(Nid nid, FolderState** out) {
    auto it = folders.find(nid);
    if (it != folders.end()) {
      *out = &it->second;
      return Status::Ok();
    }
    if (!IsFolder(nid)) return Status::NotFound("no such folder");
    FolderState state;
    Status s = ReadProperties(nid, &state.properties);
    if (s.ok()) {
      s = ReadTable(FolderTableNid(nid, kNidTypeHierarchyTable), &state.hierarchy_columns,
                    &state.hierarchy_rows);
    }
    if (s.ok()) {
      s = ReadTable(FolderTableNid(nid, kNidTypeContentsTable), &state.contents_columns,
                    &state.contents_rows);
    }
    // Rewriting a table we could not read whole would lose rows.
    if (!s.ok()) return s;
    state.hierarchy_columns = WithoutRowColumns(state.hierarchy_columns);
    state.contents_columns = WithoutRowColumns(state.contents_columns);
    if (state.hierarchy_columns.empty()) state.hierarchy_columns = HierarchyTableColumns();
    if (state.contents_columns.empty()) state.contents_columns = ContentsTableColumns();
    state.row = RowFromProperties(nid, state.properties);
    auto parent = folder_parents.find(nid);
    state.parent = parent == folder_parents.end() ? kNidRootFolder : parent->second;
    *out = &folders.emplace(nid, std::move(state)).first->second;
    return Status::Ok();
  }

  // Copies a folder's counts and flags into its PC and its row in the
  // parent's hierarchy table.
  void FolderChanged(FolderState* folder) {
    SetTagged(&folder->properties, kPidContentCount,
              PropertyValue::Int32(int32_t(folder->row.content_count)));
    SetTagged(&folder->properties, kPidContentUnreadCount,
              PropertyValue::Int32(int32_t(folder->row.unread_count)));
    SetTagged(&folder->properties, kPidSubfolders,
              PropertyValue::Boolean(folder->row.has_subfolders));
    folder->properties_dirty = true;
    if (folder->parent == folder->row.nid) return;  // the root
    // The parent's row only repeats the folder's counts; a parent we cannot
    // load must not keep the folder from changing.
    FolderState* parent = nullptr;
    if (!LoadFolder(folder->parent, &parent).ok()) return;
    for (TableRow& row : parent->hierarchy_rows) {
      if (row.row_id != folder->row.nid) continue;
      row.cells[MakeTag(kPidContentCount, kTypeInt32)] =
          PropertyValue::Int32(int32_t(folder->row.content_count));
      row.cells[MakeTag(kPidContentUnreadCount, kTypeInt32)] =
          PropertyValue::Int32(int32_t(folder->row.unread_count));
      row.cells[MakeTag(kPidSubfolders, kTypeBoolean)] =
          PropertyValue::Boolean(folder->row.has_subfolders);
      parent->hierarchy_dirty = true;
    }
  }

  Status WriteFolderState(const FolderState& f) {
    Status s;
    if (f.properties_dirty || f.is_new) {
      NodeContent node;
      s = EncodePropertyContext(f.properties, &node);
      if (s.ok()) s = file->WriteNode(f.row.nid, f.parent, node);
    }
    if (s.ok() && (f.hierarchy_dirty || f.is_new)) {
      NodeContent node;
      s = EncodeTableContext(f.hierarchy_columns, f.hierarchy_rows, &node);
      if (s.ok()) s = file->WriteNode(FolderTableNid(f.row.nid, kNidTypeHierarchyTable), 0, node);
    }
    if (s.ok() && (f.contents_dirty || f.is_new)) {
      NodeContent node;
      s = EncodeTableContext(f.contents_columns, f.contents_rows, &node);
      if (s.ok()) s = file->WriteNode(FolderTableNid(f.row.nid, kNidTypeContentsTable), 0, node);
    }
    if (s.ok() && f.is_new) {
      NodeContent node;
      s = EncodeTableContext(AssocContentsTableColumns(), {}, &node);
      if (s.ok()) {
        s = file->WriteNode(FolderTableNid(f.row.nid, kNidTypeAssocContentsTable), 0, node);
      }
    }
    return s;
  }

  // ---- Entry ids

  bool NidFromEntryId(ByteView id, Nid* out) const {
    if (id.size() != kEntryIdSize || id.U32LE(0) != 0) return false;
    if (!std::equal(record_key.begin(), record_key.end(), id.data() + 4)) return false;
    *out = id.U32LE(4 + kRecordKeySize);
    return true;
  }

  // The folder an entry-id property of `props` names, if it exists.
  Nid FolderFromProperty(const std::vector<TaggedValue>& props, uint16_t id) const {
    const PropertyValue* v = FindTagged(props, id);
    Nid nid = 0;
    if (v == nullptr || v->type != kTypeBinary || !NidFromEntryId(v->data, &nid)) return 0;
    return IsFolder(nid) ? nid : 0;
  }
};

PstStore::PstStore(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
PstStore::~PstStore() = default;

Status PstStore::Create(const std::string& path, const std::string& display_name,
                        std::unique_ptr<PstStore>* out) {
  auto impl = std::make_unique<Impl>();
  Status s = PstFile::Create(path, CryptMethod::kPermute, &impl->file);
  if (!s.ok()) return s;
  impl->record_key = Impl::RandomBytes(kRecordKeySize);
  impl->display_name = display_name.empty() ? "Personal Folders" : display_name;
  s = WriteEmptyStore(impl->file.get(), impl->display_name, impl->record_key);
  if (s.ok()) s = impl->file->Commit();
  if (!s.ok()) return s;
  impl->file.reset();
  // Reading back what was written sets up the session the way Open does.
  return Open(path, true, out);
}

Status PstStore::Open(const std::string& path, bool writable, std::unique_ptr<PstStore>* out) {
  auto impl = std::make_unique<Impl>();
  Status s = PstFile::Open(path, writable, &impl->file);
  if (!s.ok()) return s;

  s = impl->ReadProperties(kNidMessageStore, &impl->store_properties);
  if (!s.ok()) return Status::Corruption("message store unreadable: " + s.message());
  const PropertyValue* key = FindTagged(impl->store_properties, kPidRecordKey);
  if (key == nullptr || key->type != kTypeBinary || key->data.size() != kRecordKeySize) {
    return Status::Corruption("message store has no record key");
  }
  impl->record_key = key->data;
  if (const PropertyValue* v = FindTagged(impl->store_properties, kPidDisplayName)) {
    impl->display_name = v->AsString().value_or("");
  }

  if (impl->file->HasNode(kNidNameToIdMap)) {
    std::vector<TaggedValue> map_props;
    s = impl->ReadProperties(kNidNameToIdMap, &map_props);
    // A map we cannot read whole must not be rewritten: ids would clash.
    if (!s.ok() && writable) return Status::Corruption("name-to-id map: " + s.message());
    s = NameMap::Decode(map_props, &impl->names);
    if (!s.ok() && writable) return s;
    for (TaggedValue& p : map_props) {
      if (!NameMap::IsMapProperty(TagId(p.tag))) impl->name_map_others.push_back(std::move(p));
    }
  }

  for (const NodeEntry& e : impl->file->ListNodes()) {
    uint8_t type = NidTypeOf(e.nid);
    if (type == kNidTypeNormalFolder || type == kNidTypeSearchFolder) {
      impl->folder_parents[e.nid] = e.parent;
    }
  }
  if (!impl->IsFolder(kNidRootFolder)) return Status::Corruption("no root folder");
  impl->top = impl->FolderFromProperty(impl->store_properties, kPidIpmSubtreeEntryId);
  if (impl->top == 0) {
    // Without the store's pointer, the first plain folder below the root.
    std::vector<TableRow> rows;
    impl->FolderTableRows(kNidRootFolder, kNidTypeHierarchyTable, &rows);
    for (const TableRow& row : rows) {
      if (impl->IsFolder(row.row_id)) {
        impl->top = row.row_id;
        break;
      }
    }
  }
  if (impl->top == 0) return Status::Corruption("no top of personal folders");
  out->reset(new PstStore(std::move(impl)));
  return Status::Ok();
}

std::string PstStore::display_name() const { return impl_->display_name; }
Nid PstStore::root_folder() const { return kNidRootFolder; }
Nid PstStore::top_folder() const { return impl_->top; }
PstFile& PstStore::file() { return *impl_->file; }
uint64_t PstStore::file_size() const { return impl_->file->file_size(); }

Bytes PstStore::EntryId(Nid nid) const { return MakeEntryId(impl_->record_key, nid); }

bool PstStore::NidFromEntryId(ByteView entry_id, Nid* out) const {
  return impl_->NidFromEntryId(entry_id, out);
}

Status PstStore::GetFolder(Nid folder, FolderInfo* out) const {
  auto it = impl_->folders.find(folder);
  if (it != impl_->folders.end()) {
    *out = InfoFromRow(it->second.row);
    return Status::Ok();
  }
  uint8_t type = NidTypeOf(folder);
  if ((type != kNidTypeNormalFolder && type != kNidTypeSearchFolder) ||
      !impl_->file->HasNode(folder)) {
    return Status::NotFound("no such folder");
  }
  std::vector<TaggedValue> props;
  Status s = impl_->ReadProperties(folder, &props);
  *out = InfoFromRow(RowFromProperties(folder, props));
  return s;
}

std::vector<FolderInfo> PstStore::SubFolders(Nid folder) const {
  std::vector<TableRow> rows;
  impl_->FolderTableRows(folder, kNidTypeHierarchyTable, &rows);
  std::vector<FolderInfo> out;
  for (const TableRow& row : rows) {
    auto it = impl_->folders.find(row.row_id);
    out.push_back(InfoFromRow(it != impl_->folders.end() ? it->second.row
                                                         : RowFromCells(row.row_id, row.cells)));
  }
  return out;
}

std::vector<Nid> PstStore::Messages(Nid folder) const {
  std::vector<TableRow> rows;
  impl_->FolderTableRows(folder, kNidTypeContentsTable, &rows);
  std::vector<Nid> out;
  for (const TableRow& row : rows) out.push_back(row.row_id);
  return out;
}

Status PstStore::AddFolder(Nid parent, const std::string& name, const std::string& container_class,
                           Nid* out) {
  if (!impl_->file->writable()) return Status::InvalidArgument("store opened read-only");
  FolderState* parent_state = nullptr;
  Status s = impl_->LoadFolder(parent, &parent_state);
  if (!s.ok()) return s;
  Nid nid = 0;
  for (int i = 0; i < kMaxNidRetries && nid == 0; ++i) {
    Nid candidate = impl_->file->AllocateNid(kNidTypeNormalFolder);
    bool clash = false;
    for (uint8_t type : {kNidTypeNormalFolder, kNidTypeHierarchyTable, kNidTypeContentsTable,
                         kNidTypeAssocContentsTable}) {
      clash = clash || impl_->file->HasNode(FolderTableNid(candidate, type)) ||
              impl_->folders.count(FolderTableNid(candidate, type)) > 0;
    }
    if (!clash) nid = candidate;
  }
  if (nid == 0) return Status::IoError("no free folder id");

  FolderState state;
  state.is_new = true;
  state.parent = parent;
  state.row.nid = nid;
  state.row.name = name;
  state.row.container_class = container_class;
  state.properties = FolderProperties(state.row);
  state.hierarchy_columns = HierarchyTableColumns();
  state.contents_columns = ContentsTableColumns();
  parent_state->hierarchy_rows.push_back(HierarchyRow(state.row));
  parent_state->hierarchy_dirty = true;
  impl_->folders.emplace(nid, std::move(state));
  impl_->folder_parents[nid] = parent;
  if (!parent_state->row.has_subfolders) {
    parent_state->row.has_subfolders = true;
    impl_->FolderChanged(parent_state);
  }
  *out = nid;
  return Status::Ok();
}

Status PstStore::GetDefaultFolder(DefaultFolder kind, Nid* out) {
  struct Traits {
    uint16_t property;
    const char* name;
    const char* container_class;
  };
  Traits traits;
  switch (kind) {
    case DefaultFolder::kCalendar:
      traits = {kPidIpmAppointmentEntryId, "Calendar", "IPF.Appointment"};
      break;
    case DefaultFolder::kContacts:
      traits = {kPidIpmContactEntryId, "Contacts", "IPF.Contact"};
      break;
    case DefaultFolder::kJournal:
      traits = {kPidIpmJournalEntryId, "Journal", "IPF.Journal"};
      break;
    case DefaultFolder::kNotes:
      traits = {kPidIpmNoteEntryId, "Notes", "IPF.StickyNote"};
      break;
    case DefaultFolder::kTasks:
      traits = {kPidIpmTaskEntryId, "Tasks", "IPF.Task"};
      break;
    case DefaultFolder::kDeletedItems:
    default:
      traits = {kPidIpmWastebasketEntryId, "Deleted Items", ""};
      break;
  }
  // The wastebasket is named by the store; the other special folders by
  // the root folder, as Outlook records them.
  bool on_store = kind == DefaultFolder::kDeletedItems;
  Nid found = 0;
  if (on_store) {
    found = impl_->FolderFromProperty(impl_->store_properties, traits.property);
  } else {
    auto it = impl_->folders.find(kNidRootFolder);
    if (it != impl_->folders.end()) {
      found = impl_->FolderFromProperty(it->second.properties, traits.property);
    } else {
      std::vector<TaggedValue> props;
      impl_->ReadProperties(kNidRootFolder, &props);
      found = impl_->FolderFromProperty(props, traits.property);
    }
  }
  if (found != 0) {
    *out = found;
    return Status::Ok();
  }
  // A file without the pointer may still have the folder by its name.
  for (const FolderInfo& f : SubFolders(impl_->top)) {
    if (f.name == traits.name && NidTypeOf(f.nid) == kNidTypeNormalFolder) found = f.nid;
  }
  if (!impl_->file->writable()) {
    if (found == 0) return Status::NotFound(std::string("no ") + traits.name + " folder");
    *out = found;
    return Status::Ok();
  }
  if (found == 0) {
    Status s = AddFolder(impl_->top, traits.name, traits.container_class, &found);
    if (!s.ok()) return s;
  }
  PropertyValue entry_id = PropertyValue::Binary(EntryId(found));
  if (on_store) {
    SetTagged(&impl_->store_properties, traits.property, std::move(entry_id));
    impl_->store_dirty = true;
  } else {
    FolderState* root = nullptr;
    Status s = impl_->LoadFolder(kNidRootFolder, &root);
    if (!s.ok()) return s;
    SetTagged(&root->properties, traits.property, std::move(entry_id));
    root->properties_dirty = true;
  }
  *out = found;
  return Status::Ok();
}

Status PstStore::AddMessage(Nid folder, const Message& message, Nid* out, uint64_t* size) {
  if (!impl_->file->writable()) return Status::InvalidArgument("store opened read-only");
  FolderState* state = nullptr;
  Status s = impl_->LoadFolder(folder, &state);
  if (!s.ok()) return s;
  NodeContent node;
  uint64_t message_size = 0;
  std::vector<TaggedValue> stored;
  s = impl_->EncodeMessage(message, 0, &node, &message_size, &stored);
  if (!s.ok()) return s;
  Nid nid = impl_->file->AllocateNid(kNidTypeNormalMessage);
  s = impl_->file->WriteNode(nid, folder, node);
  if (!s.ok()) return s;

  TableRow row;
  row.row_id = nid;
  for (PropTag column : state->contents_columns) {
    const PropertyValue* v = FindTagged(stored, TagId(column));
    if (v == nullptr) continue;
    if (std::optional<PropertyValue> cell = CellFor(column, *v)) row.cells[column] = *cell;
  }
  state->contents_rows.push_back(std::move(row));
  state->contents_dirty = true;
  state->row.content_count++;
  const PropertyValue* flags = FindTagged(stored, kPidMessageFlags);
  if (flags && (flags->AsInt32().value_or(0) & kMsgFlagRead) == 0) state->row.unread_count++;
  impl_->FolderChanged(state);
  if (out) *out = nid;
  if (size) *size = message_size;
  return Status::Ok();
}

Status PstStore::ReadMessage(Nid message, Message* out) const {
  *out = Message();
  uint8_t type = NidTypeOf(message);
  if (type != kNidTypeNormalMessage && type != kNidTypeAssocMessage) {
    return Status::InvalidArgument("not a message id");
  }
  NodeContent node;
  Status s = impl_->file->ReadNode(message, &node);
  if (!s.ok()) return s;
  return impl_->DecodeMessage(node, 0, out);
}

Status PstStore::DeleteMessage(Nid folder, Nid message) {
  if (!impl_->file->writable()) return Status::InvalidArgument("store opened read-only");
  FolderState* state = nullptr;
  Status s = impl_->LoadFolder(folder, &state);
  if (!s.ok()) return s;
  auto it = std::find_if(state->contents_rows.begin(), state->contents_rows.end(),
                         [message](const TableRow& r) { return r.row_id == message; });
  if (it == state->contents_rows.end()) return Status::NotFound("message not in folder");
  const PropertyValue* flags = nullptr;
  auto f = it->cells.find(MakeTag(kPidMessageFlags, kTypeInt32));
  if (f != it->cells.end()) flags = &f->second;
  if (flags && (flags->AsInt32().value_or(0) & kMsgFlagRead) == 0 && state->row.unread_count > 0) {
    state->row.unread_count--;
  }
  state->contents_rows.erase(it);
  state->contents_dirty = true;
  if (state->row.content_count > 0) state->row.content_count--;
  s = impl_->file->DeleteNode(message);
  if (!s.ok()) return s;
  impl_->FolderChanged(state);
  return Status::Ok();
}

Status PstStore::Commit() {
  if (!impl_->file->writable()) return Status::InvalidArgument("store opened read-only");
  Status s;
  for (auto& [nid, folder] : impl_->folders) {
    s = impl_->WriteFolderState(folder);
    if (!s.ok()) return s;
    folder.is_new = false;
    folder.properties_dirty = folder.hierarchy_dirty = folder.contents_dirty = false;
  }
  if (impl_->names.changed()) {
    std::vector<TaggedValue> props = impl_->name_map_others;
    for (TaggedValue& p : impl_->names.Encode()) props.push_back(std::move(p));
    NodeContent node;
    s = EncodePropertyContext(props, &node);
    if (s.ok()) s = impl_->file->WriteNode(kNidNameToIdMap, 0, node);
    if (!s.ok()) return s;
    impl_->names.MarkWritten();
  }
  if (impl_->store_dirty) {
    NodeContent node;
    s = EncodePropertyContext(impl_->store_properties, &node);
    if (s.ok()) s = impl_->file->WriteNode(kNidMessageStore, 0, node);
    if (!s.ok()) return s;
    impl_->store_dirty = false;
  }
  return impl_->file->Commit();
}

}  // namespace tarnwell::mapi::pst
