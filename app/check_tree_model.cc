#include "app/check_tree_model.h"

#include <cassert>
#include <utility>

namespace tarnwell::app {

namespace {

int CheckableDescendants(const ItemRecord& r) { return r.descendants - r.separator_descendants; }

// An item's share of its parent's checked_descendants: itself and everything below.
int CheckedWeight(const ItemRecord& r) { return (r.checked ? 1 : 0) + r.checked_descendants; }

}  // namespace

CheckTreeModel::CheckTreeModel() : CheckTreeModel(Options()) {}

CheckTreeModel::CheckTreeModel(Options options)
    : nodes_(1), check_boxes_(options.check_boxes), smart_check_(options.smart_check) {}

void CheckTreeModel::Clear() { nodes_.assign(1, Node()); }

ItemId CheckTreeModel::InsertItem(std::string_view text, int image, int selected_image,
                                  ItemId parent, ItemId after) {
  return Insert(text, image, selected_image, parent, after, /*separator=*/false);
}

ItemId CheckTreeModel::InsertSeparator(ItemId parent, ItemId after) {
  return Insert({}, 0, 0, parent, after, /*separator=*/true);
}

ItemId CheckTreeModel::Insert(std::string_view text, int image, int selected_image, ItemId parent,
                              ItemId after, bool separator) {
  if (parent != kNoItem && (!IsValid(parent) || nodes_[parent].record.separator)) {
    return kNoItem;
  }
  if (after != kInsertFirst && after != kInsertLast &&
      (!IsValid(after) || nodes_[after].parent != parent)) {
    return kNoItem;
  }
  if (nodes_.size() >= kInsertFirst) return kNoItem;  // out of handles

  std::string owned_text(text);  // `text` may point into a node that emplace_back moves
  const ItemId id = static_cast<ItemId>(nodes_.size());
  nodes_.emplace_back();
  Node& node = nodes_[id];
  node.text = std::move(owned_text);
  node.image = image;
  node.selected_image = selected_image;
  node.record.separator = separator;
  node.parent = parent;

  Node& p = nodes_[parent];
  if (after == kInsertFirst || p.first_child == kNoItem) {
    node.next_sibling = p.first_child;
    p.first_child = id;
    if (p.last_child == kNoItem) p.last_child = id;
  } else {
    const ItemId prev = after == kInsertLast ? p.last_child : after;
    node.next_sibling = nodes_[prev].next_sibling;
    nodes_[prev].next_sibling = id;
    if (p.last_child == prev) p.last_child = id;
  }

  for (ItemId a = parent; a != kNoItem; a = nodes_[a].parent) {
    ItemRecord& r = nodes_[a].record;
    ++r.descendants;
    if (separator) ++r.separator_descendants;
  }
  // The new item is unchecked, but a checked ancestor now has an unchecked item below it
  // (or, for a leaf that just became a folder, its flag turns into a derived one).
  if (!separator) PropagateUp(parent, 0);
  return id;
}

ItemId CheckTreeModel::NextInSubtree(ItemId item, ItemId top, bool descend) const {
  if (descend && nodes_[item].first_child != kNoItem) return nodes_[item].first_child;
  for (ItemId x = item; x != top && x != kNoItem; x = nodes_[x].parent) {
    if (nodes_[x].next_sibling != kNoItem) return nodes_[x].next_sibling;
  }
  return kNoItem;
}

ItemId CheckTreeModel::GetNextItem(ItemId item) const {
  return IsValid(item) ? NextInSubtree(item, kNoItem, /*descend=*/true) : kNoItem;
}

ItemId CheckTreeModel::GetParent(ItemId item) const {
  return IsValid(item) ? nodes_[item].parent : kNoItem;
}

ItemId CheckTreeModel::GetFirstChild(ItemId item) const {
  return item == kNoItem || IsValid(item) ? nodes_[item].first_child : kNoItem;
}

ItemId CheckTreeModel::GetNextSibling(ItemId item) const {
  return IsValid(item) ? nodes_[item].next_sibling : kNoItem;
}

std::vector<ItemId> CheckTreeModel::GetChildren(ItemId item) const {
  std::vector<ItemId> children;
  for (ItemId c = GetFirstChild(item); c != kNoItem; c = nodes_[c].next_sibling) {
    children.push_back(c);
  }
  return children;
}

const std::string& CheckTreeModel::GetItemText(ItemId item) const {
  static const std::string kEmpty;
  return IsValid(item) ? nodes_[item].text : kEmpty;
}

bool CheckTreeModel::SetItemText(ItemId item, std::string_view text) {
  if (!IsValid(item)) return false;
  nodes_[item].text = text;
  return true;
}

int CheckTreeModel::GetImage(ItemId item) const { return IsValid(item) ? nodes_[item].image : 0; }

int CheckTreeModel::GetSelectedImage(ItemId item) const {
  return IsValid(item) ? nodes_[item].selected_image : 0;
}

uint64_t CheckTreeModel::GetItemData(ItemId item) const {
  return IsValid(item) ? nodes_[item].data : 0;
}

bool CheckTreeModel::SetItemData(ItemId item, uint64_t data) {
  if (!IsValid(item)) return false;
  nodes_[item].data = data;
  return true;
}

const ItemRecord* CheckTreeModel::GetRecord(ItemId item) const {
  return IsValid(item) ? &nodes_[item].record : nullptr;
}

void CheckTreeModel::DeriveChecked(ItemRecord& r) const {
  const int checkable = CheckableDescendants(r);
  if (smart_check_ && !r.separator && checkable > 0) {
    r.checked = r.checked_descendants == checkable;
  }
}

CheckState CheckTreeModel::GetCheckState(ItemId item) const {
  if (!IsValid(item) || read_only_) return CheckState::kUnchecked;
  const ItemRecord& r = nodes_[item].record;
  if (r.separator) return CheckState::kUnchecked;
  const int checkable = CheckableDescendants(r);
  if (!smart_check_ || checkable == 0) {
    return r.checked ? CheckState::kChecked : CheckState::kUnchecked;
  }
  if (r.checked_descendants == 0) return CheckState::kUnchecked;
  if (r.checked_descendants == checkable) return CheckState::kChecked;
  return CheckState::kMixed;
}

bool CheckTreeModel::GetCheck(ItemId item) const {
  return GetCheckState(item) == CheckState::kChecked;
}

int CheckTreeModel::GetCheckImage(ItemId item) const {
  if (!check_boxes_ || !IsValid(item) || nodes_[item].record.separator) return kNoCheckImage;
  int image = kUncheckedImage;
  switch (GetCheckState(item)) {
    case CheckState::kUnchecked:
      image = kUncheckedImage;
      break;
    case CheckState::kChecked:
      image = kCheckedImage;
      break;
    case CheckState::kMixed:
      image = kMixedImage;
      break;
  }
  return nodes_[item].record.enabled ? image : image + kDisabledImageOffset;
}

void CheckTreeModel::PropagateUp(ItemId item, int delta) {
  for (ItemId a = item; a != kNoItem; a = nodes_[a].parent) {
    ItemRecord& r = nodes_[a].record;
    r.checked_descendants += delta;
    assert(r.checked_descendants >= 0 && r.checked_descendants <= CheckableDescendants(r));
    const bool was_checked = r.checked;
    DeriveChecked(r);
    delta += (r.checked ? 1 : 0) - (was_checked ? 1 : 0);
  }
}

void CheckTreeModel::ApplyToSubtree(ItemId item, bool checked) {
  // Folders are recounted from their children after the leaves are set, deepest first
  // (reverse pre-order), instead of being given "all" or "none": a disabled item below keeps
  // its state, and only a recount makes every count above it true.
  std::vector<ItemId> folders;
  ItemId x = item;
  while (x != kNoItem) {
    Node& n = nodes_[x];
    bool descend = false;
    const bool skip = x != item && (!n.record.enabled || n.record.separator);
    if (!skip) {
      if (CheckableDescendants(n.record) == 0) {
        n.record.checked = checked;
      } else {
        folders.push_back(x);
        descend = true;
      }
    }
    x = NextInSubtree(x, item, descend);
  }
  for (auto it = folders.rbegin(); it != folders.rend(); ++it) {
    Node& folder = nodes_[*it];
    int count = 0;
    for (ItemId c = folder.first_child; c != kNoItem; c = nodes_[c].next_sibling) {
      count += CheckedWeight(nodes_[c].record);
    }
    folder.record.checked_descendants = count;
    DeriveChecked(folder.record);
  }
}

bool CheckTreeModel::SetCheck(ItemId item, bool checked) {
  if (!IsValid(item) || read_only_) return false;
  ItemRecord& r = nodes_[item].record;
  if (!r.enabled || r.separator) return false;

  // The ancestors are moved by the measured change of the item's weight, not by a predicted
  // one: separators and disabled items below make "all descendants" the wrong amount.
  const int before = CheckedWeight(r);
  if (smart_check_) {
    ApplyToSubtree(item, checked);
  } else {
    r.checked = checked;
  }
  const int delta = CheckedWeight(nodes_[item].record) - before;
  // Every state the call changes moves the same way, so no change in weight means no
  // change at all.
  if (delta == 0) return false;
  PropagateUp(nodes_[item].parent, delta);
  if (listener_ != nullptr) listener_->OnCheckChanged(item, checked);
  return true;
}

bool CheckTreeModel::Click(ItemId item) {
  if (!check_boxes_) return false;
  const CheckState state = GetCheckState(item);
  if (SetCheck(item, state != CheckState::kChecked)) return true;
  // A mixed item that cannot be checked further (a disabled item below stays unchecked)
  // would otherwise never leave the mixed state by clicking.
  return state == CheckState::kMixed && SetCheck(item, false);
}

int CheckTreeModel::GetCheckedCount() const {
  int count = 0;
  for (ItemId x = GetFirstItem(); x != kNoItem; x = GetNextItem(x)) {
    if (GetCheck(x)) ++count;
  }
  return count;
}

std::vector<ItemId> CheckTreeModel::CollectFolders(ItemId root, bool with_mixed) const {
  std::vector<ItemId> out;
  if (read_only_ || (root != kNoItem && !IsValid(root))) return out;
  ItemId x = root == kNoItem ? GetFirstItem() : root;
  while (x != kNoItem) {
    const CheckState state = GetCheckState(x);
    if (state == CheckState::kChecked || (with_mixed && state == CheckState::kMixed)) {
      out.push_back(x);
    }
    // Nothing below is checked when the count says so, in either mode.
    x = NextInSubtree(x, root, nodes_[x].record.checked_descendants > 0);
  }
  return out;
}

std::vector<ItemId> CheckTreeModel::CheckedFolders(ItemId root) const {
  return CollectFolders(root, /*with_mixed=*/false);
}

std::vector<ItemId> CheckTreeModel::CheckedOrMixedFolders(ItemId root) const {
  return CollectFolders(root, /*with_mixed=*/true);
}

bool CheckTreeModel::EnableItem(ItemId item, bool enabled) {
  if (!IsValid(item)) return false;
  nodes_[item].record.enabled = enabled;
  return true;
}

bool CheckTreeModel::IsEnabled(ItemId item) const {
  return IsValid(item) && nodes_[item].record.enabled;
}

bool CheckTreeModel::SetExpanded(ItemId item, bool expanded) {
  if (!IsValid(item)) return false;
  nodes_[item].record.expanded = expanded;
  return true;
}

bool CheckTreeModel::IsExpanded(ItemId item) const {
  return IsValid(item) && nodes_[item].record.expanded;
}

bool CheckTreeModel::ToggleExpanded(ItemId item) {
  if (!IsValid(item) || !nodes_[item].record.enabled) return false;
  ItemRecord& r = nodes_[item].record;
  r.expanded = !r.expanded;
  r.expand_changed = true;
  if (listener_ != nullptr) listener_->OnExpandChanged(item, r.expanded);
  return true;
}

}  // namespace tarnwell::app
