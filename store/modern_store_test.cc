// The modern store against databases written by the modern store builder:
// every mailbox's tree, lists and items must match the manifest.
#include "store/modern_store.h"

#include <gtest/gtest.h>

#include "store/store_test_support.h"
#include "testing/exchange/modern_store_builder.h"

namespace tarnwell::store {
namespace {

namespace fx = forge::exchange;
using test_support::ListTime;
using test_support::OpenedStore;
using Shown = test_support::TreeRecorder::Shown;

struct Case {
  const char* name;
  int version;
  bool later_variant;
  bool damaged;
  ScanMode mode;
  bool real_layout = false;
};

const Case kCases[] = {
    {"v2013_standard", 5, false, false, ScanMode::kStandard},
    {"v2013_later_advance", 5, true, true, ScanMode::kAdvance},
    {"v2010_standard", 3, false, true, ScanMode::kStandard},
    {"v2010_advance", 3, false, false, ScanMode::kAdvance},
    {"real_layout_standard", 5, true, true, ScanMode::kStandard, true},
    {"real_layout_advance", 5, true, false, ScanMode::kAdvance, true},
};

class ModernStoreTest : public ::testing::TestWithParam<Case> {};

TEST_P(ModernStoreTest, TreeListsAndItemsMatchTheManifest) {
  const Case& c = GetParam();
  OpenedStore<ModernStore> s("tarnwell-modern");
  fx::ModernStoreOptions options;
  options.version = c.version;
  options.later_2013_variant = c.later_variant;
  options.real_layout = c.real_layout;
  if (c.damaged) options.damage = fx::ModernDamageOptions::All();
  const Status built = fx::BuildModernStore(options, s.path(), &s.manifest);
  ASSERT_TRUE(built.ok()) << built.ToString();
  ASSERT_TRUE(s.Open(c.version, c.mode));
  EXPECT_TRUE(s.walked_mailboxes && s.walked_folders);
  ModernStore& store = *s.store;

  EXPECT_EQ(s.reader->extended_catalog(), c.later_variant);
  for (const fx::ManifestMailbox& m : s.manifest.mailboxes) {
    EXPECT_EQ(ModernFolderTableName(c.version, m.number), m.folder_table) << m.name;
    EXPECT_NE(s.tree.Find({m.name}), nullptr) << m.name;
  }
  size_t items_checked = 0;
  for (const fx::ManifestFolder& f : s.manifest.folders) {
    const Shown* shown = s.tree.Find(f.path);
    if (!f.visible) {
      EXPECT_EQ(shown, nullptr) << f.name;
      continue;
    }
    ASSERT_NE(shown, nullptr) << "folder not shown: " << f.name;
    EXPECT_EQ(shown->icon, f.icon) << f.name;
    std::vector<MessageSummary> rows = store.ListFolder(shown->ref);
    ASSERT_EQ(rows.size(), f.items.size()) << f.name;
    for (size_t i = 0; i < rows.size(); ++i) {
      const fx::ManifestItem& want = f.items[i];
      const MessageSummary& got = rows[i];
      SCOPED_TRACE(f.name + " item " + std::to_string(i) + ": " + want.subject);
      EXPECT_EQ(got.subject, want.subject);
      EXPECT_EQ(got.message_class, want.message_class);
      EXPECT_EQ(got.created, ListTime(want.created));
      EXPECT_EQ(got.received, ListTime(want.received));
      // Fields the builder left empty are not checked.
      if (!want.sender_shown.empty()) {
        EXPECT_EQ(got.sender, want.sender_shown);
      }
      if (!want.to_shown.empty()) {
        EXPECT_EQ(got.to, want.to_shown);
      }
      if (!want.flags_text.empty()) {
        EXPECT_EQ(got.flags_text, want.flags_text);
      }
      if (c.later_variant && !want.cc.empty()) {
        EXPECT_EQ(got.cc, want.cc);
      }
      DecodePurpose purpose;
      std::optional<ItemRecords> item = store.OpenMessage(shown->ref, got.message_key, &purpose);
      ASSERT_TRUE(item);
      ++items_checked;
      if (purpose == DecodePurpose::kMessageDetail && !want.body_html.empty()) {
        EXPECT_EQ(ByteView(item->message.body).ToString(), want.body_html);
      }
      test_support::ExpectAttachments(store.ListAttachments(shown->ref, got.message_key),
                                      want.attachments);
    }
  }
  EXPECT_GT(items_checked, 0u);
}

INSTANTIATE_TEST_SUITE_P(Builder, ModernStoreTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace tarnwell::store
