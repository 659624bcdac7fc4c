#include "app/check_tree_model.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <random>
#include <string>
#include <utility>
#include <vector>

namespace tarnwell::app {
namespace {

struct CheckEvent {
  ItemId item;
  bool state;
  bool operator==(const CheckEvent&) const = default;
};

class Recorder : public CheckTreeListener {
 public:
  void OnCheckChanged(ItemId item, bool checked) override { checks.push_back({item, checked}); }
  void OnExpandChanged(ItemId item, bool expanded) override { expands.push_back({item, expanded}); }
  std::vector<CheckEvent> checks;
  std::vector<CheckEvent> expands;
};

// Server
//   A                (a mailbox)
//     Inbox
//       Projects
//       Receipts
//     Sent
//     ----           (separator)
//     Deleted
//   B                (a second mailbox, empty)
class MailboxTree {
 public:
  explicit MailboxTree(CheckTreeModel::Options options = {}) : model(options) {
    Add("Server", kNoItem);
    Add("A", id["Server"]);
    Add("Inbox", id["A"]);
    Add("Projects", id["Inbox"]);
    Add("Receipts", id["Inbox"]);
    Add("Sent", id["A"]);
    id["-"] = model.InsertSeparator(id["A"]);
    Add("Deleted", id["A"]);
    Add("B", id["Server"]);
    model.SetListener(&recorder);
  }

  // Check images of every item in pre-order, separated by spaces.
  std::string Images() const {
    std::string out;
    for (ItemId x = model.GetFirstItem(); x != kNoItem; x = model.GetNextItem(x)) {
      if (!out.empty()) out += ' ';
      out += std::to_string(model.GetCheckImage(x));
    }
    return out;
  }

  CheckTreeModel model;
  Recorder recorder;
  std::map<std::string, ItemId> id;

 private:
  void Add(const std::string& name, ItemId parent) {
    id[name] = model.InsertItem(name, 0, 0, parent);
  }
};

struct SmartCase {
  const char* name;
  std::vector<std::pair<const char*, bool>> steps;
  const char* images;  // pre-order: Server A Inbox Projects Receipts Sent - Deleted B
  int checked_count;
};

class SmartCheckTest : public ::testing::TestWithParam<SmartCase> {};

TEST_P(SmartCheckTest, ImagesCountsAndFolderListsAgree) {
  const SmartCase& c = GetParam();
  MailboxTree t;
  for (const auto& [name, state] : c.steps) EXPECT_TRUE(t.model.SetCheck(t.id[name], state));
  EXPECT_EQ(t.Images(), c.images);
  EXPECT_EQ(t.model.GetCheckedCount(), c.checked_count);

  std::vector<ItemId> checked, checked_or_mixed;
  for (ItemId x = t.model.GetFirstItem(); x != kNoItem; x = t.model.GetNextItem(x)) {
    const int image = t.model.GetCheckImage(x);
    EXPECT_EQ(t.model.GetCheck(x), image == kCheckedImage) << t.model.GetItemText(x);
    if (image == kCheckedImage) checked.push_back(x);
    if (image == kCheckedImage || image == kMixedImage) checked_or_mixed.push_back(x);
  }
  EXPECT_EQ(t.model.CheckedFolders(), checked);
  EXPECT_EQ(t.model.CheckedOrMixedFolders(), checked_or_mixed);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, SmartCheckTest,
    ::testing::Values(
        // The separator neither blocks A nor counts towards Server.
        SmartCase{"CheckMailboxRoot", {{"A", true}}, "3 2 2 2 2 2 0 2 1", 6},
        SmartCase{"UncheckLeafUnderCheckedMailbox",
                  {{"A", true}, {"Projects", false}},
                  "3 3 3 1 2 2 0 2 1",
                  3},
        SmartCase{"UncheckFolderUnderCheckedServer",
                  {{"Server", true}, {"Inbox", false}},
                  "3 3 1 1 1 2 0 2 2",
                  3},
        SmartCase{"CheckLastLeavesCompleteTheChain",
                  {{"Projects", true},
                   {"Receipts", true},
                   {"Sent", true},
                   {"Deleted", true},
                   {"B", true}},
                  "2 2 2 2 2 2 0 2 2",
                  8},
        SmartCase{"RecheckLeaf",
                  {{"Server", true}, {"Receipts", false}, {"Receipts", true}},
                  "2 2 2 2 2 2 0 2 2",
                  8},
        SmartCase{"LoneLeaf", {{"Projects", true}}, "3 3 3 2 1 1 0 1 1", 1},
        SmartCase{"UncheckServer", {{"Server", true}, {"Server", false}}, "1 1 1 1 1 1 0 1 1", 0}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(CheckTreeModelTest, DisabledItemsKeepTheirStateThroughParentToggles) {
  MailboxTree t;
  CheckTreeModel& m = t.model;
  m.EnableItem(t.id["Receipts"], false);
  EXPECT_TRUE(m.SetCheck(t.id["Server"], true));
  EXPECT_EQ(t.Images(), "3 3 3 2 5 2 0 2 2");
  EXPECT_FALSE(m.GetCheck(t.id["Server"]));
  EXPECT_FALSE(m.SetCheck(t.id["Receipts"], true));
  EXPECT_FALSE(m.Click(t.id["Receipts"]));

  // A click on a mixed parent that cannot check anything more unchecks it; the next one
  // checks again.
  EXPECT_TRUE(m.Click(t.id["Server"]));
  EXPECT_EQ(t.Images(), "1 1 1 1 5 1 0 1 1");
  EXPECT_TRUE(m.Click(t.id["Server"]));
  EXPECT_EQ(t.Images(), "3 3 3 2 5 2 0 2 2");

  // A checked disabled item survives unchecking above it.
  m.EnableItem(t.id["Receipts"], true);
  EXPECT_TRUE(m.SetCheck(t.id["Receipts"], true));
  m.EnableItem(t.id["Receipts"], false);
  EXPECT_TRUE(m.SetCheck(t.id["A"], false));
  EXPECT_EQ(t.Images(), "3 3 3 1 6 1 0 1 2");
  EXPECT_EQ(m.GetCheckedCount(), 2);
  EXPECT_EQ(m.GetRecord(t.id["Server"])->checked_descendants, 2);
}

TEST(CheckTreeModelTest, DisabledFolderShieldsItsSubtree) {
  MailboxTree t;
  CheckTreeModel& m = t.model;
  m.EnableItem(t.id["Inbox"], false);
  EXPECT_TRUE(m.SetCheck(t.id["A"], true));
  EXPECT_EQ(t.Images(), "3 3 5 1 1 2 0 2 1");
  // Its enabled children can still be toggled one by one; the folder shows their state.
  EXPECT_TRUE(m.SetCheck(t.id["Projects"], true));
  EXPECT_TRUE(m.SetCheck(t.id["Receipts"], true));
  EXPECT_EQ(t.Images(), "3 2 6 2 2 2 0 2 1");
  EXPECT_EQ(m.GetRecord(t.id["Server"])->checked_descendants, 6);
}

TEST(CheckTreeModelTest, SeparatorsAreNeverChecked) {
  MailboxTree t;
  CheckTreeModel& m = t.model;
  const ItemId sep = t.id["-"];
  EXPECT_FALSE(m.SetCheck(sep, true));
  EXPECT_FALSE(m.Click(sep));
  EXPECT_TRUE(m.SetCheck(t.id["A"], true));
  EXPECT_FALSE(m.GetCheck(sep));
  EXPECT_EQ(m.GetCheckImage(sep), kNoCheckImage);
  EXPECT_EQ(m.InsertItem("under a separator", 0, 0, sep), kNoItem);

  // A folder holding only separators is checked like a leaf.
  const ItemId lines = m.InsertItem("Lines", 0, 0, t.id["B"]);
  m.InsertSeparator(lines);
  m.InsertSeparator(lines);
  EXPECT_TRUE(m.Click(lines));
  EXPECT_TRUE(m.GetCheck(lines));
  EXPECT_TRUE(m.GetCheck(t.id["B"]));
  EXPECT_TRUE(m.GetCheck(t.id["Server"]));
  EXPECT_EQ(m.GetRecord(t.id["Server"])->checked_descendants, 8);
}

TEST(CheckTreeModelTest, ReadOnlyAnswersUncheckedAndTogglesNothing) {
  MailboxTree t;
  CheckTreeModel& m = t.model;
  m.SetCheck(t.id["A"], true);
  t.recorder.checks.clear();
  m.SetReadOnly(true);
  EXPECT_EQ(t.Images(), "1 1 1 1 1 1 0 1 1");
  EXPECT_FALSE(m.GetCheck(t.id["Inbox"]));
  EXPECT_EQ(m.GetCheckedCount(), 0);
  EXPECT_TRUE(m.CheckedFolders().empty());
  EXPECT_TRUE(m.CheckedOrMixedFolders().empty());
  EXPECT_FALSE(m.SetCheck(t.id["B"], true));
  EXPECT_FALSE(m.Click(t.id["Inbox"]));
  EXPECT_TRUE(t.recorder.checks.empty());
  m.SetReadOnly(false);
  EXPECT_EQ(t.Images(), "3 2 2 2 2 2 0 2 1");
}

TEST(CheckTreeModelTest, NotificationsFireOncePerChange) {
  MailboxTree t;
  CheckTreeModel& m = t.model;
  const ItemId a = t.id["A"], inbox = t.id["Inbox"], projects = t.id["Projects"];
  m.EnableItem(t.id["B"], false);

  EXPECT_TRUE(m.SetCheck(a, true));
  EXPECT_FALSE(m.SetCheck(a, true));  // nothing changes
  EXPECT_FALSE(m.SetCheck(t.id["B"], true));
  EXPECT_TRUE(m.Click(projects));
  EXPECT_TRUE(m.Click(inbox));  // mixed: the click checks
  std::vector<CheckEvent> want{{a, true}, {projects, false}, {inbox, true}};
  EXPECT_EQ(t.recorder.checks, want);

  EXPECT_TRUE(m.SetExpanded(inbox, true));
  EXPECT_FALSE(m.GetRecord(inbox)->expand_changed);
  EXPECT_TRUE(m.ToggleExpanded(inbox));
  EXPECT_TRUE(m.ToggleExpanded(inbox));
  EXPECT_FALSE(m.ToggleExpanded(t.id["B"]));
  EXPECT_TRUE(m.GetRecord(inbox)->expand_changed);
  want = {{inbox, false}, {inbox, true}};
  EXPECT_EQ(t.recorder.expands, want);
}

TEST(CheckTreeModelTest, WithoutSmartCheckOnlyTheItemChanges) {
  MailboxTree t({.check_boxes = true, .smart_check = false});
  CheckTreeModel& m = t.model;
  EXPECT_TRUE(m.SetCheck(t.id["Inbox"], true));
  EXPECT_EQ(t.Images(), "1 1 2 1 1 1 0 1 1");
  EXPECT_TRUE(m.SetCheck(t.id["Projects"], true));
  EXPECT_TRUE(m.SetCheck(t.id["Receipts"], true));
  EXPECT_TRUE(m.SetCheck(t.id["Inbox"], false));
  EXPECT_EQ(t.Images(), "1 1 1 2 2 1 0 1 1");
  EXPECT_EQ(m.GetRecord(t.id["Server"])->checked_descendants, 2);
  std::vector<ItemId> want{t.id["Projects"], t.id["Receipts"]};
  EXPECT_EQ(m.CheckedFolders(), want);
}

TEST(CheckTreeModelTest, WithoutCheckBoxesNothingIsDrawnOrClicked) {
  MailboxTree t({.check_boxes = false, .smart_check = true});
  EXPECT_EQ(t.Images(), "0 0 0 0 0 0 0 0 0");
  EXPECT_FALSE(t.model.Click(t.id["A"]));
  EXPECT_TRUE(t.model.SetCheck(t.id["A"], true));
  EXPECT_EQ(t.model.GetCheckedCount(), 6);
}

TEST(CheckTreeModelTest, InsertingBelowCheckedItemsMakesThemUnchecked) {
  MailboxTree t;
  CheckTreeModel& m = t.model;
  m.SetCheck(t.id["Server"], true);
  // A new folder starts unchecked, so Inbox is no longer fully checked...
  m.InsertItem("Later", 0, 0, t.id["Inbox"]);
  // ...and a checked leaf that becomes a folder takes its children's state.
  m.InsertItem("Archive", 0, 0, t.id["Sent"]);
  EXPECT_EQ(t.Images(), "3 3 3 2 2 1 1 1 0 2 2");
  EXPECT_EQ(m.GetRecord(t.id["Server"])->checked_descendants, 4);
  EXPECT_EQ(m.GetCheckedCount(), 4);
}

TEST(CheckTreeModelTest, InsertPositionsAndPreOrderWalk) {
  CheckTreeModel m;
  const ItemId top = m.InsertItem("top");
  const ItemId b = m.InsertItem("b", 0, 0, top);
  const ItemId a = m.InsertItem("a", 0, 0, top, kInsertFirst);
  const ItemId c = m.InsertItem("c", 0, 0, top, b);
  const ItemId ab = m.InsertItem("ab", 0, 0, a);
  m.InsertItem("aa", 0, 0, a, kInsertFirst);
  m.InsertItem("abc", 0, 0, ab);
  m.InsertItem("second top");
  EXPECT_EQ(m.InsertItem("bad parent", 0, 0, 999), kNoItem);
  EXPECT_EQ(m.InsertItem("after a non-child", 0, 0, top, ab), kNoItem);

  std::string walk;
  for (ItemId x = m.GetFirstItem(); x != kNoItem; x = m.GetNextItem(x)) {
    walk += m.GetItemText(x) + ",";
  }
  EXPECT_EQ(walk, "top,a,aa,ab,abc,b,c,second top,");
  EXPECT_EQ(m.GetChildren(top), (std::vector<ItemId>{a, b, c}));
  EXPECT_EQ(m.GetParent(ab), a);
  EXPECT_EQ(m.GetRecord(top)->descendants, 6);
  EXPECT_TRUE(m.SetItemData(c, 0x1122334455667788u));
  EXPECT_EQ(m.GetItemData(c), 0x1122334455667788u);

  m.SetCheck(top, true);
  EXPECT_EQ(m.CheckedFolders(a).size(), 4u);  // a and its subtree, nothing after it
}

// A brute-force mirror of the model: own flags on items; every derived state and count
// recomputed from scratch on each question.
class Mirror {
 public:
  struct Item {
    ItemId parent = kNoItem;
    std::vector<ItemId> children;
    bool separator = false;
    bool enabled = true;
    bool own = false;
  };
  struct Counts {
    int checkable = 0;
    int checked = 0;
  };
  struct Snapshot {
    std::vector<CheckState> state;
    std::vector<Counts> below;
  };

  explicit Mirror(bool smart) : items(1), smart_(smart) {}

  void Insert(ItemId id, ItemId parent, size_t position, bool separator) {
    items.resize(std::max<size_t>(items.size(), id + 1));
    items[id].parent = parent;
    items[id].separator = separator;
    auto& siblings = items[parent].children;
    siblings.insert(siblings.begin() + position, id);
  }

  Snapshot Take() const {
    Snapshot s{std::vector<CheckState>(items.size(), CheckState::kUnchecked),
               std::vector<Counts>(items.size())};
    Compute(kNoItem, s);
    return s;
  }
  CheckState State(ItemId x) const { return Take().state[x]; }

  bool SetCheck(ItemId x, bool state) {
    if (!items[x].enabled || items[x].separator) return false;
    const auto before = Take().state;
    Apply(x, state, /*top=*/true);
    return Take().state != before;
  }

  bool Click(ItemId x) {
    const CheckState s = State(x);
    if (SetCheck(x, s != CheckState::kChecked)) return true;
    return s == CheckState::kMixed && SetCheck(x, false);
  }

  void PreOrder(ItemId x, std::vector<ItemId>& out) const {
    for (ItemId c : items[x].children) {
      out.push_back(c);
      PreOrder(c, out);
    }
  }

  std::vector<Item> items;

 private:
  void Compute(ItemId x, Snapshot& s) const {
    Counts counts;
    for (ItemId c : items[x].children) {
      Compute(c, s);
      if (!items[c].separator) {
        ++counts.checkable;
        counts.checked += s.state[c] == CheckState::kChecked ? 1 : 0;
      }
      counts.checkable += s.below[c].checkable;
      counts.checked += s.below[c].checked;
    }
    s.below[x] = counts;
    CheckState& state = s.state[x];
    if (x == kNoItem || items[x].separator) {
      state = CheckState::kUnchecked;
    } else if (!smart_ || counts.checkable == 0) {
      state = items[x].own ? CheckState::kChecked : CheckState::kUnchecked;
    } else if (counts.checked == 0) {
      state = CheckState::kUnchecked;
    } else {
      state = counts.checked == counts.checkable ? CheckState::kChecked : CheckState::kMixed;
    }
  }

  void Apply(ItemId x, bool state, bool top) {
    if (!top && (!items[x].enabled || items[x].separator)) return;
    items[x].own = state;
    if (smart_) {
      for (ItemId c : items[x].children) Apply(c, state, false);
    }
  }

  bool smart_;
};

struct RandomCase {
  bool smart;
  unsigned seed;
};

class RandomOperationsTest : public ::testing::TestWithParam<RandomCase> {};

TEST_P(RandomOperationsTest, RecordsMatchBruteForce) {
  const RandomCase& rc = GetParam();
  std::mt19937 rng(rc.seed);
  auto pick = [&](size_t n) { return std::uniform_int_distribution<size_t>(0, n - 1)(rng); };

  CheckTreeModel m({.check_boxes = true, .smart_check = rc.smart});
  Recorder recorder;
  m.SetListener(&recorder);
  Mirror mirror(rc.smart);
  size_t expected_events = 0;

  auto insert = [&](bool separator) {
    ItemId parent = kNoItem;
    if (m.size() > 0 && pick(6) != 0) parent = ItemId(1 + pick(m.size()));
    if (mirror.items[parent].separator) return;
    const auto& siblings = mirror.items[parent].children;
    const size_t position = pick(siblings.size() + 1);
    const ItemId after = position == 0 ? kInsertFirst : siblings[position - 1];
    const ItemId id =
        separator ? m.InsertSeparator(parent, after) : m.InsertItem("x", 0, 0, parent, after);
    ASSERT_NE(id, kNoItem);
    mirror.Insert(id, parent, position, separator);
  };
  for (int i = 0; i < 12; ++i) insert(false);

  for (int step = 0; step < 300; ++step) {
    const ItemId x = ItemId(1 + pick(m.size()));
    const size_t op = pick(10);
    // Toggles leave disabled items below the toggled one as they are (insertions may not:
    // a new unchecked child makes a checked folder unchecked).
    std::vector<std::pair<ItemId, CheckState>> disabled_below;
    if (op >= 3) {
      std::vector<ItemId> subtree;
      mirror.PreOrder(x, subtree);
      for (ItemId d : subtree) {
        if (!mirror.items[d].enabled) disabled_below.push_back({d, mirror.State(d)});
      }
    }

    if (op == 0) {
      insert(false);
    } else if (op == 1) {
      insert(true);
    } else if (op == 2) {
      const bool enabled = pick(3) != 0;
      m.EnableItem(x, enabled);
      mirror.items[x].enabled = enabled;
    } else if (op < 6) {
      const bool state = pick(2) != 0;
      const bool changed = m.SetCheck(x, state);
      ASSERT_EQ(changed, mirror.SetCheck(x, state)) << "step " << step;
      if (changed) {
        ++expected_events;
        ASSERT_EQ(recorder.checks.back(), (CheckEvent{x, state}));
      }
    } else {
      const bool changed = m.Click(x);
      ASSERT_EQ(changed, mirror.Click(x)) << "step " << step;
      expected_events += changed ? 1 : 0;
    }
    ASSERT_EQ(recorder.checks.size(), expected_events);
    for (const auto& [d, state] : disabled_below) {
      ASSERT_EQ(mirror.State(d), state) << "step " << step << " op " << op;
    }

    std::vector<ItemId> order, checked;
    mirror.PreOrder(kNoItem, order);
    const Mirror::Snapshot snap = mirror.Take();
    for (ItemId y : order) {
      const ItemRecord& r = *m.GetRecord(y);
      std::vector<ItemId> below;
      mirror.PreOrder(y, below);
      int separators = 0;
      for (ItemId b : below) separators += mirror.items[b].separator ? 1 : 0;
      ASSERT_EQ(r.descendants, int(below.size())) << "step " << step;
      ASSERT_EQ(r.separator_descendants, separators);
      ASSERT_EQ(r.checked_descendants, snap.below[y].checked) << "step " << step << " item " << y;
      ASSERT_EQ(m.GetCheckState(y), snap.state[y]) << "step " << step << " item " << y;
      ASSERT_EQ(r.enabled, mirror.items[y].enabled);
      if (snap.state[y] == CheckState::kChecked) checked.push_back(y);
    }
    const int count = int(checked.size());
    ASSERT_EQ(m.GetCheckedCount(), count);
    ASSERT_EQ(m.CheckedFolders(), checked);
    std::vector<ItemId> walk;
    for (ItemId y = m.GetFirstItem(); y != kNoItem; y = m.GetNextItem(y)) walk.push_back(y);
    ASSERT_EQ(walk, order);
  }
}

std::vector<RandomCase> RandomCases() {
  std::vector<RandomCase> cases;
  for (unsigned seed = 1; seed <= 12; ++seed) {
    cases.push_back({true, seed});
    if (seed <= 4) cases.push_back({false, seed});
  }
  return cases;
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomOperationsTest, ::testing::ValuesIn(RandomCases()),
                         [](const auto& info) {
                           return std::string(info.param.smart ? "Smart" : "Plain") +
                                  std::to_string(info.param.seed);
                         });

}  // namespace
}  // namespace tarnwell::app
