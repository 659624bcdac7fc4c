// CheckTreeModel: the folder tree of the main window as a tri-state check-box tree, without
// any drawing. The desktop view draws it and forwards clicks; the command line builds one to
// select folders; the export jobs read which folders are checked.
//
// With smart checking, checking a folder checks everything below it, and a folder whose
// subtree is only partly checked shows a third, mixed state. Each item keeps a small record,
// in this field order:
//
//   field                  meaning
//   checked                the item's own check state (derived for folders, see below)
//   enabled                false draws the item disabled and blocks toggling it
//   separator              a separator line: never checkable, never counted as checked
//   expanded               last known expand state
//   expand_changed         set when a double-click toggled the expand state
//   descendants            number of items below this one, all levels
//   checked_descendants    number of checked items below this one
//   separator_descendants  number of separators below this one
//
// An item's checkable descendants are descendants - separator_descendants. With smart
// checking, an item that has checkable descendants is checked exactly when all of them are;
// its `checked` field is kept equal to that, so that every record's checked_descendants is
// the number of items below it whose `checked` is set, in both modes. An item without
// checkable descendants (a leaf, or a folder holding only separators) answers with its own
// flag.
//
// Disabled items keep their state when an ancestor is toggled, and so does everything below
// them: a disabled folder's state is its subtree's state, so changing the subtree would change
// the folder. A parent above an unchecked disabled item therefore shows mixed after checking;
// a click on such a parent, which cannot check anything more, unchecks it instead so that
// the click always does something.
//
// Not thread-safe: the window's thread owns the model. A job running on a worker thread
// takes CheckedFolders() before it starts rather than reading the model while it runs.
#ifndef TARNWELL_APP_CHECK_TREE_MODEL_H_
#define TARNWELL_APP_CHECK_TREE_MODEL_H_

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace tarnwell::app {

// A handle for an item. Handles are never reused while the model lives (until Clear()).
using ItemId = uint32_t;
// No item: the parent of top-level items, the end of a walk, the answer to a bad request.
inline constexpr ItemId kNoItem = 0;
// Positions for InsertItem's `after`, besides an existing sibling.
inline constexpr ItemId kInsertFirst = 0xFFFFFFFE;
inline constexpr ItemId kInsertLast = 0xFFFFFFFF;

// Check images: the index of the state image the view draws for an item.
inline constexpr int kNoCheckImage = 0;  // separators, and every item with check boxes off
inline constexpr int kUncheckedImage = 1;
inline constexpr int kCheckedImage = 2;
inline constexpr int kMixedImage = 3;
inline constexpr int kDisabledImageOffset = 4;  // added to 1, 2 or 3 for a disabled item

enum class CheckState { kUnchecked, kChecked, kMixed };

struct ItemRecord {
  bool checked = false;
  bool enabled = true;
  bool separator = false;
  bool expanded = false;
  bool expand_changed = false;
  int descendants = 0;
  int checked_descendants = 0;
  int separator_descendants = 0;
};

// Told about changes made by the model itself (toggles), after the model is consistent again,
// so a listener may read or change the model. Changes a caller makes with SetExpanded or
// EnableItem are not reported back to it.
class CheckTreeListener {
 public:
  virtual ~CheckTreeListener() = default;
  // Once per SetCheck or Click that changed any check state. `checked` is the state that was
  // applied to the item and its subtree; the item may still show mixed when a disabled item
  // below kept the other state (GetCheckState tells what to draw).
  virtual void OnCheckChanged(ItemId /*item*/, bool /*checked*/) {}
  // After a double-click toggled an item's expand state.
  virtual void OnExpandChanged(ItemId /*item*/, bool /*expanded*/) {}
};

class CheckTreeModel {
 public:
  struct Options {
    bool check_boxes = true;
    // Fixed for the model's life: the checked fields of folders mean different things in
    // the two modes.
    bool smart_check = true;
  };

  CheckTreeModel();
  explicit CheckTreeModel(Options options);

  CheckTreeModel(const CheckTreeModel&) = delete;
  CheckTreeModel& operator=(const CheckTreeModel&) = delete;

  bool check_boxes() const { return check_boxes_; }
  // Without check boxes nothing is drawn (kNoCheckImage) and clicks on the state icon do
  // nothing; the check states themselves are kept.
  void SetCheckBoxes(bool on) { check_boxes_ = on; }
  bool smart_check() const { return smart_check_; }
  bool read_only() const { return read_only_; }
  // While read-only every check query answers "unchecked" and nothing toggles; the states
  // come back when it is lifted.
  void SetReadOnly(bool on) { read_only_ = on; }
  // Not owned; nullptr for none.
  void SetListener(CheckTreeListener* listener) { listener_ = listener; }

  // Adds an item below `parent` (kNoItem: top level) after the sibling `after` (or
  // kInsertFirst / kInsertLast). The item starts unchecked and enabled; a checked parent
  // thereby becomes mixed or unchecked. Returns kNoItem when `parent` is not an item or is
  // a separator, or `after` is not a child of `parent`.
  ItemId InsertItem(std::string_view text, int image = 0, int selected_image = 0,
                    ItemId parent = kNoItem, ItemId after = kInsertLast);
  ItemId InsertSeparator(ItemId parent = kNoItem, ItemId after = kInsertLast);
  // Removes every item.
  void Clear();
  // Number of items, separators included.
  size_t size() const { return nodes_.size() - 1; }
  bool IsValid(ItemId item) const { return item != kNoItem && item < nodes_.size(); }

  // Pre-order: first child, else next sibling, else the next sibling of the nearest ancestor
  // that has one. kNoItem at the end.
  ItemId GetFirstItem() const { return nodes_[kNoItem].first_child; }
  ItemId GetNextItem(ItemId item) const;
  ItemId GetParent(ItemId item) const;
  ItemId GetFirstChild(ItemId item) const;
  ItemId GetNextSibling(ItemId item) const;
  // Children in order; kNoItem gives the top-level items.
  std::vector<ItemId> GetChildren(ItemId item) const;

  // Empty text, image 0 and data 0 for an invalid item.
  const std::string& GetItemText(ItemId item) const;
  bool SetItemText(ItemId item, std::string_view text);
  int GetImage(ItemId item) const;
  int GetSelectedImage(ItemId item) const;
  uint64_t GetItemData(ItemId item) const;
  bool SetItemData(ItemId item, uint64_t data);
  // nullptr for an invalid item.
  const ItemRecord* GetRecord(ItemId item) const;

  bool GetCheck(ItemId item) const;
  // Unchecked for separators, invalid items and while read-only; never mixed without smart
  // checking.
  CheckState GetCheckState(ItemId item) const;
  // kUncheckedImage, kCheckedImage or kMixedImage, plus kDisabledImageOffset when disabled;
  // kNoCheckImage for separators and without check boxes.
  int GetCheckImage(ItemId item) const;
  // With smart checking, applies `checked` to the item and every descendant except disabled
  // ones and their subtrees, then updates the ancestors; without, sets the item's own flag
  // only. Does nothing for separators, disabled or invalid items and while read-only.
  // Returns whether any check state changed (and the listener was told).
  bool SetCheck(ItemId item, bool checked);
  // A click on the state icon: SetCheck(item, !GetCheck(item)), or unchecking a mixed item
  // whose checkable part is already all checked. Nothing without check boxes.
  bool Click(ItemId item);
  // Number of items whose GetCheck is true; mixed folders do not count.
  int GetCheckedCount() const;
  // The items whose GetCheck is true, depth-first in pre-order, in the subtree of `root`
  // (root included) or, for kNoItem, in the whole tree.
  std::vector<ItemId> CheckedFolders(ItemId root = kNoItem) const;
  // The same for items that are checked or mixed: the folders a job has to descend into.
  std::vector<ItemId> CheckedOrMixedFolders(ItemId root = kNoItem) const;

  bool EnableItem(ItemId item, bool enabled);
  bool IsEnabled(ItemId item) const;
  // Records the view's expand state; no notification and expand_changed stays as it is.
  bool SetExpanded(ItemId item, bool expanded);
  bool IsExpanded(ItemId item) const;
  // A double-click: on an enabled item, flips `expanded`, sets `expand_changed` and tells
  // the listener. Returns whether it did.
  bool ToggleExpanded(ItemId item);

 private:
  struct Node {
    ItemRecord record;
    std::string text;
    int image = 0;
    int selected_image = 0;
    uint64_t data = 0;
    ItemId parent = kNoItem;
    ItemId first_child = kNoItem;
    ItemId last_child = kNoItem;
    ItemId next_sibling = kNoItem;
  };

  ItemId Insert(std::string_view text, int image, int selected_image, ItemId parent, ItemId after,
                bool separator);
  // The item after `item` in pre-order within the subtree of `top` (kNoItem: whole tree),
  // entering item's children only when `descend`.
  ItemId NextInSubtree(ItemId item, ItemId top, bool descend) const;
  // Adds `delta` to checked_descendants from `item` up to the top, re-deriving each folder's
  // flag with smart checking and carrying its change to the next level.
  void PropagateUp(ItemId item, int delta);
  // Sets the leaves of item's subtree to `checked`, skipping disabled items and their
  // subtrees, and recounts the folders in between from their children.
  void ApplyToSubtree(ItemId item, bool checked);
  std::vector<ItemId> CollectFolders(ItemId root, bool with_mixed) const;
  void DeriveChecked(ItemRecord& record) const;

  std::vector<Node> nodes_;  // nodes_[kNoItem] is the hidden root above the top level
  bool check_boxes_;
  bool smart_check_;
  bool read_only_ = false;
  CheckTreeListener* listener_ = nullptr;
};

}  // namespace tarnwell::app

#endif  // TARNWELL_APP_CHECK_TREE_MODEL_H_
