// The modern store against databases written by the modern store builder:
// every mailbox's tree, lists and items must match the manifest.
#include "store/modern_store.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <map>

#include "base/date_time.h"
#include "base/paths.h"
#include "engine/catalog.h"
#include "testing/exchange/modern_store_builder.h"

namespace tarnwell::store {
namespace {

namespace fx = forge::exchange;

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

class Tree : public FolderTreeSink {
 public:
  int64_t AddTopItem(const std::string&, int, uint64_t) override {
    paths[0] = {};
    return 0;
  }
  int64_t AddFolder(int64_t parent, const std::string& text, int icon, uint32_t index) override {
    return Add(parent, text, icon, {-1, index});
  }
  int64_t AddMailboxFolder(int64_t parent, const std::string& text, int icon, int32_t mailbox,
                           uint32_t index) override {
    return Add(parent, text, icon, {mailbox, index});
  }
  int64_t Add(int64_t parent, const std::string& text, int icon, FolderRef ref) {
    std::vector<std::string> path = paths[parent];
    path.push_back(text);
    const int64_t handle = int64_t(shown.size()) + 1;
    paths[handle] = path;
    shown.push_back({path, icon, ref});
    return handle;
  }
  struct Shown {
    std::vector<std::string> path;
    int icon;
    FolderRef ref;
  };
  std::vector<Shown> shown;
  std::map<int64_t, std::vector<std::string>> paths;
};

std::string Time(uint64_t filetime) { return filetime ? DateText(filetime) : ""; }

class ModernStoreTest : public ::testing::TestWithParam<Case> {
 protected:
  void SetUp() override {
    const Case& c = GetParam();
    ASSERT_TRUE(MakeTempDir("tarnwell-modern", &dir_).ok());
    fx::ModernStoreOptions options;
    options.version = c.version;
    options.later_2013_variant = c.later_variant;
    options.real_layout = c.real_layout;
    if (c.damaged) options.damage = fx::ModernDamageOptions::All();
    const std::string path = dir_ + "/store.edb";
    Status s = fx::BuildModernStore(options, path, &manifest_);
    ASSERT_TRUE(s.ok()) << s.ToString();
    reader_ = engine::MakeReader(c.version);
    ASSERT_TRUE(reader_->OpenDatabase(path, {}, c.version));
    if (c.mode == ScanMode::kStandard) {
      ASSERT_EQ(reader_->CollectTreeRecords(engine::kCatalogRootPage), 1);
    } else {
      ASSERT_TRUE(reader_->ScanLeafPages());
      ASSERT_EQ(reader_->CollectLeafPageRecords(), 1);
    }
    ASSERT_EQ(reader_->ParseCatalogRecords(), 1);
    reader_->GetTableNames();
    store_ = std::make_unique<ModernStore>(*reader_, c.version, c.mode);
    store_->SetWorkFolder(dir_);
    ASSERT_TRUE(store_->WalkMailboxes());
    ASSERT_TRUE(store_->WalkFolders());
    store_->LinkTree(NullProgress());
    ASSERT_TRUE(store_->ShowTree(path, 1, tree_));
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

  std::string dir_;
  fx::StoreManifest manifest_;
  std::unique_ptr<engine::EdbClass> reader_;
  std::unique_ptr<ModernStore> store_;
  Tree tree_;
};

TEST_P(ModernStoreTest, MailboxesNameTheirTables) {
  EXPECT_EQ(reader_->extended_catalog(), GetParam().later_variant);
  for (const fx::ManifestMailbox& m : manifest_.mailboxes) {
    EXPECT_EQ(ModernFolderTableName(GetParam().version, m.number), m.folder_table) << m.name;
    const Tree::Shown* shown = Find({m.name});
    ASSERT_NE(shown, nullptr) << m.name;
  }
}

TEST_P(ModernStoreTest, TreeListsAndItemsMatchTheManifest) {
  size_t items_checked = 0;
  for (const fx::ManifestFolder& f : manifest_.folders) {
    const Tree::Shown* shown = Find(f.path);
    if (!f.visible) {
      EXPECT_EQ(shown, nullptr) << f.name;
      continue;
    }
    ASSERT_NE(shown, nullptr) << "folder not shown: " << f.name;
    EXPECT_EQ(shown->icon, f.icon) << f.name;
    std::vector<MessageSummary> rows = store_->ListFolder(shown->ref);
    ASSERT_EQ(rows.size(), f.items.size()) << f.name;
    for (size_t i = 0; i < rows.size(); ++i) {
      const fx::ManifestItem& want = f.items[i];
      const MessageSummary& got = rows[i];
      SCOPED_TRACE(f.name + " item " + std::to_string(i) + ": " + want.subject);
      EXPECT_EQ(got.subject, want.subject);
      EXPECT_EQ(got.message_class, want.message_class);
      EXPECT_EQ(got.created, Time(want.created));
      EXPECT_EQ(got.received, Time(want.received));
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
      if (GetParam().later_variant && !want.cc.empty()) {
        EXPECT_EQ(got.cc, want.cc);
      }
      DecodePurpose purpose;
      std::optional<ItemRecords> item = store_->OpenMessage(shown->ref, got.message_key, &purpose);
      ASSERT_TRUE(item);
      ++items_checked;
      if (purpose == DecodePurpose::kMessageDetail && !want.body_html.empty()) {
        EXPECT_EQ(ByteView(item->message.body).ToString(), want.body_html);
      }
      std::vector<AttachmentRecord> attachments =
          store_->ListAttachments(shown->ref, got.message_key);
      ASSERT_EQ(attachments.size(), want.attachments.size());
      for (size_t k = 0; k < attachments.size(); ++k) {
        EXPECT_EQ(attachments[k].name, want.attachments[k].name);
        EXPECT_EQ(fx::Sha256Hex(ByteView(attachments[k].data)), want.attachments[k].sha256);
      }
    }
  }
  EXPECT_GT(items_checked, 0u);
}

INSTANTIATE_TEST_SUITE_P(Builder, ModernStoreTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace tarnwell::store
