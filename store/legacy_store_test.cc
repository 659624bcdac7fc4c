// The legacy store against databases written by the Exchange store builder:
// the tree, every folder's list and every item must match its manifest, for
// every legacy version, both modes, private and public stores, and with the
// builder's damage.
#include "store/legacy_store.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <map>

#include "base/date_time.h"
#include "base/paths.h"
#include "engine/catalog.h"
#include "testing/exchange/store_builder.h"

namespace tarnwell::store {
namespace {

namespace fx = forge::exchange;

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

class Tree : public FolderTreeSink {
 public:
  int64_t AddTopItem(const std::string& text, int, uint64_t) override {
    paths[0] = {};
    top = text;
    return 0;
  }
  int64_t AddFolder(int64_t parent, const std::string& text, int icon, uint32_t index) override {
    std::vector<std::string> path = paths[parent];
    path.push_back(text);
    const int64_t handle = int64_t(shown.size()) + 1;
    paths[handle] = path;
    shown.push_back({path, icon, index});
    return handle;
  }
  struct Shown {
    std::vector<std::string> path;
    int icon;
    uint32_t index;
  };
  std::string top;
  std::vector<Shown> shown;
  std::map<int64_t, std::vector<std::string>> paths;
};

std::string Time(uint64_t filetime) { return filetime ? DateText(filetime) : ""; }

class LegacyStoreTest : public ::testing::TestWithParam<Case> {
 protected:
  void SetUp() override {
    const Case& c = GetParam();
    ASSERT_TRUE(MakeTempDir("tarnwell-store", &dir_).ok());
    fx::LegacyStoreOptions options;
    options.version = c.version;
    options.public_store = c.public_store;
    if (c.damaged) options.damage = fx::DamageOptions::All();
    options.max_rows_per_leaf = c.rows_per_leaf;
    path_ = dir_ + "/store.edb";
    Status s = fx::BuildLegacyStore(options, path_, &manifest_);
    ASSERT_TRUE(s.ok()) << s.ToString();

    reader_ = engine::MakeReader(c.version);
    ASSERT_TRUE(reader_->OpenDatabase(path_, {}, c.version));
    if (c.mode == ScanMode::kStandard) {
      ASSERT_EQ(reader_->CollectTreeRecords(engine::kCatalogRootPage), 1);
    } else {
      ASSERT_TRUE(reader_->ScanLeafPages());
      ASSERT_EQ(reader_->CollectLeafPageRecords(), 1);
    }
    ASSERT_EQ(reader_->ParseCatalogRecords(), 1);
    reader_->GetTableNames();
    store_ = std::make_unique<LegacyStore>(*reader_, c.version, c.mode);
    store_->SetWorkFolder(dir_);
    store_->WalkMailboxes();
    store_->WalkFolders();
    store_->LinkTree(NullProgress());
    ASSERT_TRUE(ShowTree(store_->folders(), store_->public_store(), path_, 1, tree_));
    ASSERT_TRUE(store_->BuildMessageMap());
    ASSERT_TRUE(store_->BuildAttachmentMap());
  }
  void TearDown() override {
    store_.reset();
    reader_.reset();
    if (!dir_.empty()) std::filesystem::remove_all(dir_);
  }

  const Tree::Shown* Find(const std::vector<std::string>& path) const {
    for (const auto& s : tree_.shown) {
      if (s.path == path) return &s;
    }
    return nullptr;
  }

  std::string dir_, path_;
  fx::StoreManifest manifest_;
  std::unique_ptr<engine::EdbClass> reader_;
  std::unique_ptr<LegacyStore> store_;
  Tree tree_;
};

TEST_P(LegacyStoreTest, TreeMatchesTheManifest) {
  EXPECT_EQ(store_->public_store(), manifest_.public_store);
  if (manifest_.public_store) {
    EXPECT_EQ(tree_.top, "Public Root");
  }
  size_t visible = 0;
  for (const fx::ManifestFolder& f : manifest_.folders) {
    std::vector<std::string> path = f.path;
    // The public store's top item is "Public Root" itself.
    if (manifest_.public_store && !path.empty() && path.front() == "Public Root") {
      path.erase(path.begin());
      if (path.empty()) continue;
    }
    const Tree::Shown* shown = Find(path);
    if (!f.visible) {
      EXPECT_EQ(shown, nullptr) << f.name << " (" << f.damage << ") must not be shown";
      continue;
    }
    ++visible;
    ASSERT_NE(shown, nullptr) << "folder not shown: " << f.name;
    EXPECT_EQ(shown->icon, f.icon) << f.name;
  }
  // Mailboxes are shown too.
  EXPECT_EQ(tree_.shown.size(), visible + manifest_.mailboxes.size());
}

TEST_P(LegacyStoreTest, ListsAndItemsMatchTheManifest) {
  const int version = GetParam().version;
  size_t items_checked = 0;
  for (const fx::ManifestFolder& f : manifest_.folders) {
    if (!f.visible) continue;
    std::vector<std::string> path = f.path;
    if (manifest_.public_store && path.front() == "Public Root") path.erase(path.begin());
    if (path.empty()) continue;  // the public store's top item
    const Tree::Shown* shown = Find(path);
    ASSERT_NE(shown, nullptr);
    std::vector<MessageSummary> rows = store_->ListFolder(shown->index);
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
      EXPECT_EQ(got.created, Time(want.created));
      EXPECT_EQ(got.modified, Time(want.modified));
      EXPECT_EQ(got.received, Time(want.received));
      EXPECT_EQ(got.flags_text, MessageFlagsText(want.flags));
      EXPECT_EQ(got.importance, want.importance);

      DecodePurpose purpose;
      std::optional<ItemRecords> item = store_->OpenMessage(got.message_key, &purpose);
      if (!want.in_msg_table) {
        EXPECT_FALSE(item) << "a list row without a message record opened";
        continue;
      }
      ASSERT_TRUE(item);
      ++items_checked;
      EXPECT_EQ(purpose, PurposeForClass(want.message_class));
      if (purpose == DecodePurpose::kMessageDetail) {
        const MessageRecord& m = item->message;
        if (!want.body_html.empty()) {
          EXPECT_EQ(ByteView(m.body).ToString(), want.body_html);
        } else if (!want.body_text.empty()) {
          EXPECT_EQ(ByteView(m.body).ToString(), want.body_text);
          EXPECT_TRUE(m.body_is_text);
        }
        if (!want.rtf_text.empty()) {
          ASSERT_TRUE(m.rtf_body);
          EXPECT_EQ(ByteView(*m.rtf_body).ToString().substr(0, want.rtf_text.size()),
                    want.rtf_text);
        }
        ASSERT_EQ(m.members.size(), want.members.size());
        for (size_t k = 0; k < m.members.size(); ++k) {
          EXPECT_EQ(m.members[k].display_name, want.members[k].name);
          EXPECT_EQ(m.members[k].email_address, want.members[k].address);
        }
      } else if (purpose == DecodePurpose::kContactDetail) {
        for (const auto& [name, value] : want.strings) {
          auto it = item->contact.strings.find(name);
          if (it != item->contact.strings.end()) {
            EXPECT_EQ(it->second, value) << name;
          }
        }
      } else if (purpose == DecodePurpose::kAppointmentDetail) {
        for (const char* column : {"T814e", "T8197", "T60", "T81ef"}) {
          auto it = want.times.find(column);
          if (it != want.times.end()) {
            EXPECT_EQ(item->appointment.start_time, it->second) << column;
            break;
          }
        }
      }
      std::vector<AttachmentRecord> attachments = store_->ListAttachments(got.message_key);
      ASSERT_EQ(attachments.size(), want.attachments.size());
      for (size_t k = 0; k < attachments.size(); ++k) {
        EXPECT_EQ(attachments[k].name, want.attachments[k].name);
        EXPECT_EQ(fx::Sha256Hex(ByteView(attachments[k].data)), want.attachments[k].sha256)
            << attachments[k].name;
      }
    }
  }
  EXPECT_GT(items_checked, 0u);
  (void)version;
}

TEST_P(LegacyStoreTest, MapsHoldEveryKeyOnce) {
  if (GetParam().mode == ScanMode::kStandard) {
    EXPECT_EQ(store_->message_map().size(), 0u);
    return;
  }
  EXPECT_EQ(store_->message_map().size(), manifest_.messages);
  // The location file is dense: ordinal k at (k - 1) * 6.
  const auto size = std::filesystem::file_size(dir_ + "/" + kMessageLocationFile);
  EXPECT_EQ(size, manifest_.messages * kRecordLocationSize);
  EXPECT_EQ(store_->attachment_map().size(), manifest_.attachment_rows);
}

INSTANTIATE_TEST_SUITE_P(Builder, LegacyStoreTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace tarnwell::store
