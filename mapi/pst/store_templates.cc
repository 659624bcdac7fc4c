// An entry id names a folder or message to MAPI clients:
//
//   offset  width  meaning
//   ------  -----  ------------------------------------------------
//   0       4      flags, zero
//   4       16     the store's record key (its provider UID)
//   20      4      node id
//
// A new store holds the nodes Outlook puts in every file it creates: the
// message store and name-to-id map, one empty template table per kind of
// table (later tables copy their columns), the search management nodes, and
// the folder tree root -> {Top of Personal Folders -> Deleted Items,
// Search Root, SPAM Search Folder 2}.
#include "mapi/pst/store_templates.h"

#include "mapi/property_tags.h"
#include "mapi/pst/name_map.h"
#include "mapi/pst/property_context.h"
#include "mapi/pst/table_context.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr size_t kEntryIdSize = 24;
constexpr size_t kRecordKeySize = 16;
// Subtree, wastebasket and finder entry ids are valid.
constexpr int32_t kValidFolderMask = 0x01 | 0x08 | 0x80;
constexpr Nid kNidSpamSearchUpdateQueue = 0x2226;
constexpr Nid kNidSpamSearchCriteria = 0x2227;
constexpr Nid kNidSpamSearchContents = 0x2230;
constexpr uint16_t kPidPstLrNoRestrictions = 0x6633;
constexpr uint32_t kLidReminderDelta = 0x8501;
// Table columns beyond the properties mapi/ names.
constexpr uint16_t kPidMessageToMe = 0x0057;
constexpr uint16_t kPidMessageCcMe = 0x0058;
constexpr uint16_t kPidParentDisplay = 0x0E05;
constexpr uint16_t kPidResponsibility = 0x0E0F;
constexpr uint16_t kPidMessageStatus = 0x0E17;
constexpr uint16_t kPidExchangeRemoteHeader = 0x0E2A;
constexpr uint16_t kPidReplItemId = 0x0E30;
constexpr uint16_t kPidReplChangenum = 0x0E33;
constexpr uint16_t kPidReplVersionHistory = 0x0E34;
constexpr uint16_t kPidSearchTableKey = 0x0E37;  // binary, in Outlook's search template
constexpr uint16_t kPidReplFlags = 0x0E38;
constexpr uint16_t kPidReplCopiedFromVersionHistory = 0x0E3C;
constexpr uint16_t kPidReplCopiedFromItemId = 0x0E3D;
constexpr uint16_t kPidItemTemporaryFlags = 0x1097;
constexpr uint16_t kPidSearchKey = 0x300B;
constexpr uint16_t kPidChangeKey = 0x3013;
constexpr uint16_t kPidTransmittableDisplayName = 0x39FF;
constexpr uint16_t kPidSendRichInfo = 0x3A40;
constexpr uint16_t kPidSecureSubmitFlags = 0x65C6;
constexpr uint16_t kPidPstHiddenCount = 0x6635;
constexpr uint16_t kPidPstHiddenUnread = 0x6636;
constexpr uint16_t kPidLtpParentNid = 0x67F1;
constexpr uint16_t kPidOfflineAddressBookName = 0x6800;
constexpr uint16_t kPidSendOutlookRecallReport = 0x6803;
constexpr uint16_t kPidOfflineAddressBookTruncatedProperties = 0x6805;
constexpr uint16_t kPidMapiFormComposeCommand = 0x682F;
constexpr uint16_t kPidViewDescriptorFlags = 0x7003;
constexpr uint16_t kPidViewDescriptorLinkTo = 0x7004;
constexpr uint16_t kPidViewDescriptorViewFolder = 0x7005;
constexpr uint16_t kPidViewDescriptorName = 0x7006;
constexpr uint16_t kPidViewDescriptorVersion = 0x7007;
constexpr uint32_t kLidReminderSet = 0x8503;
constexpr uint16_t kPidSearchCriteriaFlags = 0x660B;  // the one property Outlook gives it

PropTag Str(uint16_t id) { return MakeTag(id, kTypeUnicode); }
PropTag I32(uint16_t id) { return MakeTag(id, kTypeInt32); }
PropTag Bin(uint16_t id) { return MakeTag(id, kTypeBinary); }
PropTag Bool(uint16_t id) { return MakeTag(id, kTypeBoolean); }
PropTag Time(uint16_t id) { return MakeTag(id, kTypeSysTime); }
PropTag I64(uint16_t id) { return MakeTag(id, kTypeInt64); }
PropTag MultiI32(uint16_t id) { return MakeTag(id, kTypeInt32 | kMultiFlag); }

Status WriteTable(PstFile* file, Nid nid, const std::vector<PropTag>& columns,
                  const std::vector<TableRow>& rows) {
  NodeContent node;
  Status s = EncodeTableContext(columns, rows, &node);
  if (!s.ok()) return s;
  return file->WriteNode(nid, 0, node);
}

Status WriteProperties(PstFile* file, Nid nid, Nid parent,
                       const std::vector<TaggedValue>& properties) {
  NodeContent node;
  Status s = EncodePropertyContext(properties, &node);
  if (!s.ok()) return s;
  return file->WriteNode(nid, parent, node);
}

Status WriteFolder(PstFile* file, Nid nid, Nid parent, const FolderRow& folder,
                   const std::vector<TableRow>& children) {
  Status s = WriteProperties(file, nid, parent, FolderProperties(folder));
  if (s.ok()) {
    s = WriteTable(file, FolderTableNid(nid, kNidTypeHierarchyTable), HierarchyTableColumns(),
                   children);
  }
  if (s.ok()) {
    s = WriteTable(file, FolderTableNid(nid, kNidTypeContentsTable), ContentsTableColumns(), {});
  }
  if (s.ok()) {
    s = WriteTable(file, FolderTableNid(nid, kNidTypeAssocContentsTable),
                   AssocContentsTableColumns(), {});
  }
  return s;
}

}  // namespace

std::vector<PropTag> HierarchyTableColumns() {
  return {Bin(kPidReplItemId),         I64(kPidReplChangenum),  Bin(kPidReplVersionHistory),
          I32(kPidReplFlags),          Str(kPidDisplayName),    I32(kPidContentCount),
          I32(kPidContentUnreadCount), Bool(kPidSubfolders),    Str(kPidContainerClass),
          I32(kPidPstHiddenCount),     I32(kPidPstHiddenUnread)};
}

std::vector<PropTag> ContentsTableColumns() {
  return {I32(kPidImportance),
          Str(kPidMessageClass),
          I32(kPidSensitivity),
          Str(kPidSubject),
          Time(kPidClientSubmitTime),
          Str(kPidSentRepresentingName),
          Bool(kPidMessageToMe),
          Bool(kPidMessageCcMe),
          Str(kPidConversationTopic),
          Bin(kPidConversationIndex),
          Str(kPidDisplayCc),
          Str(kPidDisplayTo),
          Time(kPidMessageDeliveryTime),
          I32(kPidMessageFlags),
          I32(kPidMessageSize),
          I32(kPidMessageStatus),
          Bin(kPidReplItemId),
          I64(kPidReplChangenum),
          Bin(kPidReplVersionHistory),
          I32(kPidReplFlags),
          Bin(kPidReplCopiedFromVersionHistory),
          Bin(kPidReplCopiedFromItemId),
          I32(kPidItemTemporaryFlags),
          Time(kPidLastModificationTime),
          Bin(kPidChangeKey),
          I32(kPidSecureSubmitFlags)};
}

std::vector<PropTag> AssocContentsTableColumns() {
  return {Str(kPidMessageClass),
          I32(kPidMessageFlags),
          I32(kPidMessageStatus),
          Str(kPidDisplayName),
          Str(kPidOfflineAddressBookName),
          Bool(kPidSendOutlookRecallReport),
          MultiI32(kPidOfflineAddressBookTruncatedProperties),
          Str(kPidMapiFormComposeCommand),
          I32(kPidViewDescriptorFlags),
          Bin(kPidViewDescriptorLinkTo),
          Bin(kPidViewDescriptorViewFolder),
          Str(kPidViewDescriptorName),
          I32(kPidViewDescriptorVersion)};
}

std::vector<PropTag> SearchContentsTableColumns() {
  return {I32(kPidImportance),
          Str(kPidMessageClass),
          I32(kPidSensitivity),
          Str(kPidSubject),
          Str(kPidSentRepresentingName),
          Bool(kPidMessageToMe),
          Bool(kPidMessageCcMe),
          Str(kPidDisplayCc),
          Str(kPidDisplayTo),
          Str(kPidParentDisplay),
          Time(kPidMessageDeliveryTime),
          I32(kPidMessageFlags),
          I32(kPidMessageSize),
          I32(kPidMessageStatus),
          Bool(kPidExchangeRemoteHeader),
          Time(kPidLastModificationTime),
          I32(kPidLtpParentNid)};
}

std::vector<PropTag> RecipientTableColumns() {
  return {I32(kPidRecipientType),
          Bool(kPidResponsibility),
          Bin(kPidRecordKey),
          I32(kPidObjectType),
          Bin(kPidEntryId),
          Str(kPidDisplayName),
          Str(kPidAddressType),
          Str(kPidEmailAddress),
          Bin(kPidSearchKey),
          I32(kPidDisplayType),
          Str(kPidTransmittableDisplayName),
          Bool(kPidSendRichInfo)};
}

std::vector<PropTag> AttachmentTableColumns() {
  return {I32(kPidAttachSize), Str(kPidAttachFilename), I32(kPidAttachMethod),
          I32(kPidRenderingPosition)};
}

std::vector<PropTag> SearchTableTemplateColumns() {
  return {I64(kPidReplChangenum), Bin(kPidSearchTableKey), I32(kPidReplFlags)};
}

std::vector<TableTemplate> TableTemplates() {
  return {
      {kNidHierarchyTableTemplate, HierarchyTableColumns()},
      {kNidContentsTableTemplate, ContentsTableColumns()},
      {kNidAssocContentsTableTemplate, AssocContentsTableColumns()},
      {kNidSearchContentsTableTemplate, SearchContentsTableColumns()},
      {kNidAttachmentTable, AttachmentTableColumns()},
      {kNidRecipientTable, RecipientTableColumns()},
      {kNidSearchTableTemplate, SearchTableTemplateColumns()},
  };
}

std::vector<TaggedValue> FolderProperties(const FolderRow& folder) {
  std::vector<TaggedValue> props = {
      {Str(kPidDisplayName), PropertyValue::Unicode(folder.name)},
      {I32(kPidContentCount), PropertyValue::Int32(int32_t(folder.content_count))},
      {I32(kPidContentUnreadCount), PropertyValue::Int32(int32_t(folder.unread_count))},
      {Bool(kPidSubfolders), PropertyValue::Boolean(folder.has_subfolders)},
  };
  if (!folder.container_class.empty()) {
    props.push_back({Str(kPidContainerClass), PropertyValue::Unicode(folder.container_class)});
  }
  return props;
}

TableRow HierarchyRow(const FolderRow& folder) {
  TableRow row;
  row.row_id = folder.nid;
  for (TaggedValue& p : FolderProperties(folder)) row.cells[p.tag] = std::move(p.value);
  return row;
}

Bytes MakeEntryId(ByteView record_key, Nid nid) {
  Bytes id(kEntryIdSize, 0);
  for (size_t i = 0; i < kRecordKeySize && i < record_key.size(); ++i) id[4 + i] = record_key[i];
  StoreU32LE(id.data() + 4 + kRecordKeySize, nid);
  return id;
}

Status WriteEmptyStore(PstFile* file, const std::string& display_name, ByteView record_key) {
  if (record_key.size() != kRecordKeySize) return Status::InvalidArgument("bad record key");
  std::vector<TaggedValue> store = {
      {Bin(kPidRecordKey), PropertyValue::Binary(record_key.ToBytes())},
      {Str(kPidDisplayName), PropertyValue::Unicode(display_name)},
      {Bin(kPidIpmSubtreeEntryId), PropertyValue::Binary(MakeEntryId(record_key, kNidIpmSubtree))},
      {Bin(kPidIpmWastebasketEntryId),
       PropertyValue::Binary(MakeEntryId(record_key, kNidDeletedItems))},
      {Bin(kPidFinderEntryId), PropertyValue::Binary(MakeEntryId(record_key, kNidSearchRoot))},
      {I32(kPidValidFolderMask), PropertyValue::Int32(kValidFolderMask)},
      {Bool(kPidPstLrNoRestrictions), PropertyValue::Boolean(true)},
      {I32(kPidPstPassword), PropertyValue::Int32(0)},
  };
  Status s = WriteProperties(file, kNidMessageStore, 0, store);
  // Outlook's stores never have an empty map, and some readers refuse one:
  // start with names every Outlook item uses, a numeric one from a property
  // set of the GUID stream and a string one.
  NameMap names;
  names.FindOrAdd(NamedId(kPsetidCommon, kLidReminderDelta));
  names.FindOrAdd(NamedId(kPsetidCommon, kLidReminderSet));
  names.FindOrAdd(NamedString(kPsPublicStrings, "Keywords"));
  if (s.ok()) s = WriteProperties(file, kNidNameToIdMap, 0, names.Encode());

  for (const TableTemplate& t : TableTemplates()) {
    if (s.ok()) s = WriteTable(file, t.nid, t.columns, {});
  }
  // Search management: nothing queued, nothing searched yet; the spam
  // search folder is the one search that is active.
  for (Nid nid : {kNidSearchManagementQueue, kNidSearchDomainObject}) {
    if (s.ok()) s = file->WriteNode(nid, 0, NodeContent());
  }
  Bytes active(sizeof(Nid));
  StoreU32LE(active.data(), kNidSpamSearchFolder);
  NodeContent activity;
  activity.blocks.push_back(active);
  if (s.ok()) s = file->WriteNode(kNidSearchActivityList, 0, activity);
  if (!s.ok()) return s;

  FolderRow root{kNidRootFolder, "", "", 0, 0, true};
  FolderRow top{kNidIpmSubtree, "Top of Personal Folders", "", 0, 0, true};
  FolderRow search_root{kNidSearchRoot, "Search Root", "", 0, 0, false};
  FolderRow spam{kNidSpamSearchFolder, "SPAM Search Folder 2", "", 0, 0, false};
  FolderRow deleted{kNidDeletedItems, "Deleted Items", "", 0, 0, false};
  s = WriteFolder(file, kNidRootFolder, kNidRootFolder, root,
                  {HierarchyRow(top), HierarchyRow(search_root), HierarchyRow(spam)});
  if (s.ok()) s = WriteFolder(file, kNidIpmSubtree, kNidRootFolder, top, {HierarchyRow(deleted)});
  if (s.ok()) s = WriteFolder(file, kNidSearchRoot, kNidRootFolder, search_root, {});
  if (s.ok()) s = WriteFolder(file, kNidDeletedItems, kNidIpmSubtree, deleted, {});
  if (s.ok())
    s = WriteProperties(file, kNidSpamSearchFolder, kNidRootFolder, FolderProperties(spam));
  if (s.ok()) s = file->WriteNode(kNidSpamSearchUpdateQueue, 0, NodeContent());
  if (s.ok()) {
    s = WriteProperties(file, kNidSpamSearchCriteria, 0,
                        {{I32(kPidSearchCriteriaFlags), PropertyValue::Int32(0)}});
  }
  if (s.ok()) s = WriteTable(file, kNidSpamSearchContents, SearchContentsTableColumns(), {});
  return s;
}

}  // namespace tarnwell::mapi::pst
