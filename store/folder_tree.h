// FolderList and the folder tree built from it.
//
// The list starts with two fixed entries: index 0 "Orphan Entry" (id 0,
// parent 0) and index 1 "ROOT" (id 1, its own parent). Mailbox and folder
// rows are appended; then LinkTree chains every node under its parent
// through first-child / next-sibling indices (0 = none: the orphan entry can
// never be anybody's child). Children end up in reverse order of appending.
#ifndef TARNWELL_STORE_FOLDER_TREE_H_
#define TARNWELL_STORE_FOLDER_TREE_H_

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "base/progress_sink.h"
#include "store/item_records.h"

namespace tarnwell::store {

constexpr uint32_t kOrphanIndex = 0;
constexpr uint32_t kRootIndex = 1;
constexpr uint64_t kRootFolderId = 1;
inline constexpr char kRootName[] = "ROOT";
inline constexpr char kPublicRootName[] = "Public Root";

class FolderList {
 public:
  FolderList();

  // Appends a node and records its id in the FolderIndexMap (the first index
  // of an id wins). Returns its index.
  uint32_t Append(const FolderNode& node);
  size_t size() const { return nodes_.size(); }
  const FolderNode& operator[](size_t i) const { return nodes_[i]; }
  FolderNode& operator[](size_t i) { return nodes_[i]; }
  const std::vector<FolderNode>& nodes() const { return nodes_; }
  // True while only the two fixed entries exist.
  bool only_fixed_entries() const { return nodes_.size() == 2; }

  // Chains every node under its parent; clears the index map afterwards.
  void LinkTree(ProgressSink& progress);
  bool linked() const { return linked_; }

  // The first node with this display name; -1 when none.
  int FindByName(const std::string& name) const;
  // Children of node i in sibling order.
  std::vector<uint32_t> Children(uint32_t index) const;

 private:
  std::vector<FolderNode> nodes_;
  std::map<uint64_t, uint32_t> index_map_;  // the FolderIndexMap
  bool linked_ = false;
};

// Tree icons, chosen by display name.
constexpr int kIconDatabase = 0;
constexpr int kIconDefaultFolder = 11;
int IconForFolderName(const std::string& display_name);

// Receives the shown tree, top item first, then children depth-first.
class FolderTreeSink {
 public:
  virtual ~FolderTreeSink() = default;
  // Returns a handle for the item, passed back as `parent` for its children.
  virtual int64_t AddTopItem(const std::string& text, int icon, uint64_t source_number) = 0;
  virtual int64_t AddFolder(int64_t parent, const std::string& text, int icon,
                            uint32_t folder_index) = 0;
  // A folder of a mailbox that keeps its own folder list (modern stores).
  virtual int64_t AddMailboxFolder(int64_t parent, const std::string& text, int icon,
                                   int32_t mailbox, uint32_t folder_index) {
    (void)mailbox;
    return AddFolder(parent, text, icon, folder_index);
  }
};

// Shows the tree: a private store (at least one mailbox) under an item named
// after the database path, starting from "ROOT"; a public store under its
// "Public Root" node. False when the start node does not exist.
bool ShowTree(const FolderList& folders, bool public_store, const std::string& database_path,
              uint64_t source_number, FolderTreeSink& sink);

// Inserts the children of node `index` of `folders` below `item`, depth
// first; with `mailbox` >= 0 through AddMailboxFolder.
void InsertChildren(const FolderList& folders, uint32_t index, int64_t item, FolderTreeSink& sink,
                    int32_t mailbox = -1);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_FOLDER_TREE_H_
