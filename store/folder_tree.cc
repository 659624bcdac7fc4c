#include "store/folder_tree.h"

#include <set>

#include "base/text.h"

namespace tarnwell::store {
namespace {

constexpr int kPermille = 1000;
constexpr size_t kProgressEvery = 100;

std::string TrimTrailingSpace(std::string s) {
  while (!s.empty() && (s.back() == ' ' || s.back() == '\t' || s.back() == '\r' ||
                        s.back() == '\n' || s.back() == '\v' || s.back() == '\f')) {
    s.pop_back();
  }
  return s;
}

}  // namespace

FolderList::FolderList() {
  FolderNode orphan;
  orphan.display_name = "Orphan Entry";
  FolderNode root;
  root.display_name = kRootName;
  root.folder_id = kRootFolderId;
  root.parent_id = kRootFolderId;
  Append(orphan);
  Append(root);
}

uint32_t FolderList::Append(const FolderNode& node) {
  const uint32_t index = uint32_t(nodes_.size());
  nodes_.push_back(node);
  nodes_.back().first_child = 0;
  nodes_.back().next_sibling = 0;
  index_map_.emplace(node.folder_id, index);
  return index;
}

void FolderList::LinkTree(ProgressSink& progress) {
  progress.Range(0, kPermille);
  progress.Position(0);
  for (uint32_t i = 1; i < nodes_.size(); ++i) {
    FolderNode& node = nodes_[i];
    auto it = index_map_.find(node.parent_id);
    if (it != index_map_.end() && node.folder_id != node.parent_id && it->second != i) {
      FolderNode& parent = nodes_[it->second];
      if (parent.first_child != 0) node.next_sibling = parent.first_child;
      parent.first_child = i;
    }
    if (i % kProgressEvery == 0) progress.Position(int(uint64_t(i) * kPermille / nodes_.size()));
  }
  progress.Position(kPermille);
  index_map_.clear();
  linked_ = true;
}

int FolderList::FindByName(const std::string& name) const {
  for (size_t i = 0; i < nodes_.size(); ++i) {
    if (nodes_[i].display_name == name) return int(i);
  }
  return -1;
}

std::vector<uint32_t> FolderList::Children(uint32_t index) const {
  std::vector<uint32_t> out;
  if (index >= nodes_.size()) return out;
  // A damaged list could chain siblings into a loop: never visit one twice.
  std::set<uint32_t> seen;
  for (uint32_t c = nodes_[index].first_child; c != 0 && c < nodes_.size();
       c = nodes_[c].next_sibling) {
    if (!seen.insert(c).second) break;
    out.push_back(c);
  }
  return out;
}

int IconForFolderName(const std::string& display_name) {
  struct Entry {
    const char* name;
    int icon;
  };
  static const Entry kIcons[] = {
      {"junk e-mail", 14},    {"inbox", 3},
      {"outbox", 6},          {"rss feeds", 17},
      {"sent items", 7},      {"drafts", 2},
      {"deleted items", 16},  {"large mail", 15},
      {"unread mail", 15},    {"categorized mail", 15},
      {"search folders", 15}, {"search", 15},
      {"calendar", 1},        {"tasks", 8},
      {"journal", 4},         {"notes", 5},
      {"contacts", 10},
  };
  const std::string name = AsciiLower(TrimTrailingSpace(display_name));
  for (const Entry& e : kIcons) {
    if (name == e.name) return e.icon;
  }
  return kIconDefaultFolder;
}

namespace {

void InsertChildrenOnce(const FolderList& folders, uint32_t index, int64_t item,
                        FolderTreeSink& sink, int32_t mailbox, std::set<uint32_t>& shown) {
  for (uint32_t child : folders.Children(index)) {
    if (!shown.insert(child).second) continue;  // a cycle in damaged links
    const FolderNode& node = folders[child];
    const int icon = IconForFolderName(node.display_name);
    const int64_t handle =
        mailbox >= 0 ? sink.AddMailboxFolder(item, node.display_name, icon, mailbox, child)
                     : sink.AddFolder(item, node.display_name, icon, child);
    InsertChildrenOnce(folders, child, handle, sink, mailbox, shown);
  }
}

}  // namespace

void InsertChildren(const FolderList& folders, uint32_t index, int64_t item, FolderTreeSink& sink,
                    int32_t mailbox) {
  std::set<uint32_t> shown{index};
  InsertChildrenOnce(folders, index, item, sink, mailbox, shown);
}

bool ShowTree(const FolderList& folders, bool public_store, const std::string& database_path,
              uint64_t source_number, FolderTreeSink& sink) {
  const int start = folders.FindByName(public_store ? kPublicRootName : kRootName);
  if (start < 0) return false;
  const std::string text = public_store ? folders[start].display_name : database_path;
  const int64_t top = sink.AddTopItem(text, kIconDatabase, source_number);
  InsertChildren(folders, uint32_t(start), top, sink);
  return true;
}

}  // namespace tarnwell::store
