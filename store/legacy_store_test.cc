// The legacy store against databases written by the Exchange store builder:
// the tree, every folder's list and every item must match its manifest, for
// every legacy version, both modes, private and public stores, and with the
// builder's damage.
#include "store/legacy_store.h"

#include <gtest/gtest.h>

#include "store/store_test_support.h"
#include "testing/exchange/store_builder.h"

namespace tarnwell::store {
namespace {

namespace fx = forge::exchange;
using test_support::ListTime;
using test_support::OpenedStore;
using Shown = test_support::TreeRecorder::Shown;

struct Case {
  const char* name;
  int version;
  bool public_store;
  bool damaged;
  ScanMode mode;
  uint32_t rows_per_leaf;
};

const Case kCases[] = {
    {"v55_private_standard", 4, false, false, ScanMode::kStandard, 0},
    {"v55_private_advance", 4, false, true, ScanMode::kAdvance, 3},
    {"v2003_private_standard", 1, false, true, ScanMode::kStandard, 3},
    {"v2003_private_advance", 1, false, false, ScanMode::kAdvance, 0},
    {"v2003_public_advance", 1, true, true, ScanMode::kAdvance, 0},
    {"v2007_private_standard", 2, false, false, ScanMode::kStandard, 0},
    {"v2007_private_advance", 2, false, true, ScanMode::kAdvance, 2},
    {"v2007_public_standard", 2, true, false, ScanMode::kStandard, 0},
};

// The parts of an opened item that only a detail decode fills.
void ExpectDetail(const fx::ManifestItem& want, DecodePurpose purpose, const ItemRecords& item) {
  EXPECT_EQ(purpose, PurposeForClass(want.message_class));
  if (purpose == DecodePurpose::kMessageDetail) {
    const MessageRecord& m = item.message;
    if (!want.body_html.empty()) {
      EXPECT_EQ(ByteView(m.body).ToString(), want.body_html);
    } else if (!want.body_text.empty()) {
      EXPECT_EQ(ByteView(m.body).ToString(), want.body_text);
      EXPECT_TRUE(m.body_is_text);
    }
    if (!want.rtf_text.empty()) {
      ASSERT_TRUE(m.rtf_body);
      EXPECT_EQ(ByteView(*m.rtf_body).ToString().substr(0, want.rtf_text.size()), want.rtf_text);
    }
    ASSERT_EQ(m.members.size(), want.members.size());
    for (size_t k = 0; k < m.members.size(); ++k) {
      EXPECT_EQ(m.members[k].display_name, want.members[k].name);
      EXPECT_EQ(m.members[k].email_address, want.members[k].address);
    }
  } else if (purpose == DecodePurpose::kContactDetail) {
    for (const auto& [name, value] : want.strings) {
      auto it = item.contact.strings.find(name);
      if (it != item.contact.strings.end()) {
        EXPECT_EQ(it->second, value) << name;
      }
    }
  } else if (purpose == DecodePurpose::kAppointmentDetail) {
    for (const char* column : {"T814e", "T8197", "T60", "T81ef"}) {
      auto it = want.times.find(column);
      if (it != want.times.end()) {
        EXPECT_EQ(item.appointment.start_time, it->second) << column;
        break;
      }
    }
  }
}

class LegacyStoreTest : public ::testing::TestWithParam<Case> {};

TEST_P(LegacyStoreTest, TreeListsItemsAndMapsMatchTheManifest) {
  const Case& c = GetParam();
  OpenedStore<LegacyStore> s("tarnwell-store");
  fx::LegacyStoreOptions options;
  options.version = c.version;
  options.public_store = c.public_store;
  if (c.damaged) options.damage = fx::DamageOptions::All();
  options.max_rows_per_leaf = c.rows_per_leaf;
  const Status built = fx::BuildLegacyStore(options, s.path(), &s.manifest);
  ASSERT_TRUE(built.ok()) << built.ToString();
  ASSERT_TRUE(s.Open(c.version, c.mode));
  LegacyStore& store = *s.store;
  const fx::StoreManifest& manifest = s.manifest;

  EXPECT_EQ(store.public_store(), manifest.public_store);
  if (manifest.public_store) {
    EXPECT_EQ(s.tree.top, "Public Root");
  }
  size_t visible = 0, items_checked = 0;
  for (const fx::ManifestFolder& f : manifest.folders) {
    std::vector<std::string> path = f.path;
    // The public store's top item is "Public Root" itself.
    if (manifest.public_store && !path.empty() && path.front() == "Public Root") {
      path.erase(path.begin());
      if (path.empty()) continue;
    }
    const Shown* shown = s.tree.Find(path);
    if (!f.visible) {
      EXPECT_EQ(shown, nullptr) << f.name << " (" << f.damage << ") must not be shown";
      continue;
    }
    ++visible;
    ASSERT_NE(shown, nullptr) << "folder not shown: " << f.name;
    EXPECT_EQ(shown->icon, f.icon) << f.name;
    std::vector<MessageSummary> rows = store.ListFolder(shown->ref.folder);
    ASSERT_EQ(rows.size(), f.item_count) << f.name;
    for (size_t i = 0; i < f.items.size() && i < rows.size(); ++i) {
      const fx::ManifestItem& want = f.items[i];
      const MessageSummary& got = rows[i];
      SCOPED_TRACE(f.name + " item " + std::to_string(i) + ": " + want.subject);
      EXPECT_EQ(got.message_key, LoadU64LE(want.key.data()));
      EXPECT_EQ(got.subject, want.subject);
      EXPECT_EQ(got.sender, want.sender_shown);
      EXPECT_EQ(got.to, want.to_shown);
      EXPECT_EQ(got.message_class, want.message_class);
      EXPECT_EQ(got.created, ListTime(want.created));
      EXPECT_EQ(got.modified, ListTime(want.modified));
      EXPECT_EQ(got.received, ListTime(want.received));
      EXPECT_EQ(got.flags_text, MessageFlagsText(want.flags));
      EXPECT_EQ(got.importance, want.importance);

      DecodePurpose purpose;
      std::optional<ItemRecords> item = store.OpenMessage(got.message_key, &purpose);
      if (!want.in_msg_table) {
        EXPECT_FALSE(item) << "a list row without a message record opened";
        continue;
      }
      ASSERT_TRUE(item);
      ++items_checked;
      ExpectDetail(want, purpose, *item);
      test_support::ExpectAttachments(store.ListAttachments(got.message_key), want.attachments);
    }
  }
  EXPECT_GT(items_checked, 0u);
  // Mailboxes are shown too.
  EXPECT_EQ(s.tree.shown.size(), visible + manifest.mailboxes.size());

  // The maps hold every key once; Standard Mode searches by key instead.
  if (c.mode == ScanMode::kStandard) {
    EXPECT_EQ(store.message_map().size(), 0u);
    return;
  }
  EXPECT_EQ(store.message_map().size(), manifest.messages);
  // The location file is dense: ordinal k at (k - 1) * 6.
  EXPECT_EQ(std::filesystem::file_size(s.dir + "/" + kMessageLocationFile),
            manifest.messages * kRecordLocationSize);
  EXPECT_EQ(store.attachment_map().size(), manifest.attachment_rows);
}

INSTANTIATE_TEST_SUITE_P(Builder, LegacyStoreTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace tarnwell::store
