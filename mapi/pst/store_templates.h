// The fixed parts of a PST message store: the node ids every store has, the
// column sets of folder, recipient and attachment tables, and the nodes of a
// new, empty store.
#ifndef TARNWELL_MAPI_PST_STORE_TEMPLATES_H_
#define TARNWELL_MAPI_PST_STORE_TEMPLATES_H_

#include <cstdint>
#include <string>
#include <vector>

#include "base/status.h"
#include "mapi/property_value.h"
#include "mapi/pst/node.h"
#include "mapi/pst/property_context.h"
#include "mapi/pst/pst_file.h"
#include "mapi/pst/table_context.h"

namespace tarnwell::mapi::pst {

// Nodes with fixed ids.
inline constexpr Nid kNidMessageStore = 0x21;
inline constexpr Nid kNidNameToIdMap = 0x61;
inline constexpr Nid kNidRootFolder = 0x122;
inline constexpr Nid kNidSearchManagementQueue = 0x1E1;
inline constexpr Nid kNidSearchActivityList = 0x201;
inline constexpr Nid kNidSearchDomainObject = 0x261;
inline constexpr Nid kNidHierarchyTableTemplate = 0x60D;
inline constexpr Nid kNidContentsTableTemplate = 0x60E;
inline constexpr Nid kNidAssocContentsTableTemplate = 0x60F;
inline constexpr Nid kNidSearchContentsTableTemplate = 0x610;
inline constexpr Nid kNidAttachmentTable = 0x671;  // also the subnode of a message
inline constexpr Nid kNidRecipientTable = 0x692;   // likewise
inline constexpr Nid kNidSearchTableTemplate = 0x6B6;
// The folders of a new store.
inline constexpr Nid kNidIpmSubtree = 0x8022;
inline constexpr Nid kNidSearchRoot = 0x8042;
inline constexpr Nid kNidDeletedItems = 0x8062;
inline constexpr Nid kNidSpamSearchFolder = 0x2223;

// Store properties.
inline constexpr uint16_t kPidIpmSubtreeEntryId = 0x35E0;
inline constexpr uint16_t kPidIpmWastebasketEntryId = 0x35E3;
inline constexpr uint16_t kPidFinderEntryId = 0x35E7;
inline constexpr uint16_t kPidValidFolderMask = 0x35DF;
inline constexpr uint16_t kPidPstPassword = 0x67FF;
// Folder properties that tables carry beside the folder's own.
inline constexpr uint16_t kPidLtpRowId = 0x67F2;
inline constexpr uint16_t kPidLtpRowVer = 0x67F3;

// The table node of a folder: the folder's id with another type.
constexpr Nid FolderTableNid(Nid folder, uint8_t table_type) {
  return (folder & ~Nid(0x1F)) | table_type;
}

// What a folder's property context and its row in the parent's hierarchy
// table say about it.
struct FolderRow {
  Nid nid = 0;
  std::string name;
  std::string container_class;  // empty: none
  uint32_t content_count = 0;
  uint32_t unread_count = 0;
  bool has_subfolders = false;
};
std::vector<TaggedValue> FolderProperties(const FolderRow& folder);
TableRow HierarchyRow(const FolderRow& folder);

// Column sets of the tables a store creates.
std::vector<PropTag> HierarchyTableColumns();
std::vector<PropTag> ContentsTableColumns();
std::vector<PropTag> AssocContentsTableColumns();
std::vector<PropTag> SearchContentsTableColumns();
std::vector<PropTag> RecipientTableColumns();
std::vector<PropTag> AttachmentTableColumns();
std::vector<PropTag> SearchTableTemplateColumns();

// The empty tables of a new store whose columns new tables copy.
struct TableTemplate {
  Nid nid;
  std::vector<PropTag> columns;
};
std::vector<TableTemplate> TableTemplates();

// The entry id of `nid` in the store with `record_key`.
Bytes MakeEntryId(ByteView record_key, Nid nid);

// Writes the nodes of an empty store named `display_name` into `file`: the
// message store, the name-to-id map, the table templates, the search
// management nodes, the root folder with "Top of Personal Folders" (holding
// "Deleted Items"), "Search Root" and the spam search folder below it.
Status WriteEmptyStore(PstFile* file, const std::string& display_name, ByteView record_key);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_STORE_TEMPLATES_H_
