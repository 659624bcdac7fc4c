#include "store/folder_tree.h"

#include <gtest/gtest.h>

#include "store/key_ordinal_map.h"
#include "store/legacy_store.h"

namespace tarnwell::store {
namespace {

FolderNode Node(const std::string& name, uint64_t id, uint64_t parent) {
  FolderNode n;
  n.display_name = name;
  n.folder_id = id;
  n.parent_id = parent;
  return n;
}

// Records what ShowTree inserts, as "depth:name" lines.
class RecordingSink : public FolderTreeSink {
 public:
  int64_t AddTopItem(const std::string& text, int icon, uint64_t source) override {
    lines.push_back("0:" + text);
    EXPECT_EQ(icon, kIconDatabase);
    EXPECT_EQ(source, 7u);
    depth_[0] = 0;
    return 0;
  }
  int64_t AddFolder(int64_t parent, const std::string& text, int icon, uint32_t) override {
    const int depth = depth_[parent] + 1;
    const int64_t handle = int64_t(lines.size());
    depth_[handle] = depth;
    lines.push_back(std::to_string(depth) + ":" + text);
    icons.push_back(icon);
    return handle;
  }
  std::vector<std::string> lines;
  std::vector<int> icons;

 private:
  std::map<int64_t, int> depth_;
};

TEST(FolderTreeTest, LinksChildrenInReverseAndDropsWhatHasNoParent) {
  FolderList list;
  // Every list starts with the orphan entry and ROOT, its own parent.
  ASSERT_EQ(list.size(), 2u);
  EXPECT_EQ(list[0].display_name, "Orphan Entry");
  EXPECT_EQ(list[0].folder_id, 0u);
  EXPECT_EQ(list[1].display_name, "ROOT");
  EXPECT_EQ(list[1].folder_id, 1u);
  EXPECT_EQ(list[1].parent_id, 1u);
  EXPECT_TRUE(list.only_fixed_entries());
  list.Append(Node("Mailbox A", 100, 1));
  list.Append(Node("A", 200, 100));
  list.Append(Node("B", 201, 100));
  list.Append(Node("C", 202, 100));
  list.Append(Node("Self", 203, 203));        // its own parent: never linked
  list.Append(Node("Lost", 204, 999));        // parent unknown: not shown
  list.Append(Node("Late child", 205, 206));  // parent appended after it
  list.Append(Node("Late parent", 206, 100));
  list.Append(Node("inbox ", 207, 200));  // icon by name, case and blanks ignored
  list.LinkTree(NullProgress());
  RecordingSink sink;
  ASSERT_TRUE(ShowTree(list, false, "/data/priv1.edb", 7, sink));
  const std::vector<std::string> want = {
      "0:/data/priv1.edb", "1:Mailbox A", "2:Late parent", "3:Late child", "2:C", "2:B", "2:A",
      "3:inbox "};
  EXPECT_EQ(sink.lines, want);
  EXPECT_EQ(sink.icons.back(), 3);
}

TEST(FolderTreeTest, PublicStoreShowsItsPublicRoot) {
  FolderList list;
  list.Append(Node("Public Root", 50, 0));
  list.Append(Node("Shared", 51, 50));
  list.LinkTree(NullProgress());
  RecordingSink sink;
  ASSERT_TRUE(ShowTree(list, true, "/data/pub.edb", 7, sink));
  EXPECT_EQ(sink.lines, (std::vector<std::string>{"0:Public Root", "1:Shared"}));
  RecordingSink none;
  FolderList empty;
  empty.LinkTree(NullProgress());
  EXPECT_FALSE(ShowTree(empty, true, "/data/pub.edb", 7, none));
}

TEST(FolderTreeTest, IconsByName) {
  const std::pair<const char*, int> cases[] = {
      {"Junk E-mail", 14}, {"INBOX", 3},     {"Outbox", 6},         {"RSS Feeds", 17},
      {"Sent Items", 7},   {"Drafts", 2},    {"Deleted Items", 16}, {"Search Folders", 15},
      {"Calendar", 1},     {"Tasks", 8},     {"Journal", 4},        {"Notes  ", 5},
      {"Contacts", 10},    {"Projects", 11},
  };
  for (const auto& [name, icon] : cases) EXPECT_EQ(IconForFolderName(name), icon) << name;
}

TEST(ContentTableNameTest, TakesTheTextAfterTheLastRunOfFourZeros) {
  EXPECT_EQ(ContentTableName(0x0001000000000A3Full), "A3F");
  EXPECT_EQ(ContentTableName(0x1234ull), "234");         // no run: from index 1
  EXPECT_EQ(ContentTableName(0x10000ull), "");           // the run ends the text
  EXPECT_EQ(ContentTableName(0x1000020000b1ull), "B1");  // the last run wins
  EXPECT_EQ(ContentTableName(0x00000000ull), "");        // "0"
}

TEST(KeyOrdinalMapTest, RepeatedKeysGetNoOrdinalAndOrdinalsStayDense) {
  KeyOrdinalMap map;
  for (uint64_t key : {50u, 10u, 50u, 30u, 10u, 20u}) map.Add(key);
  std::vector<uint64_t> dropped = map.Finish();
  EXPECT_EQ(dropped, (std::vector<uint64_t>{3, 5}));
  ASSERT_EQ(map.size(), 4u);
  const std::vector<uint64_t> by_ordinal = {50, 10, 30, 20};
  EXPECT_EQ(map.KeysByOrdinal(), by_ordinal);
  for (uint64_t k = 0; k < by_ordinal.size(); ++k) EXPECT_EQ(map.Find(by_ordinal[k]), k + 1);
  EXPECT_FALSE(map.Find(99));
}

}  // namespace
}  // namespace tarnwell::store
