// What the store tests that open a builder's database share: a temporary
// folder, the reader with its catalog parsed in either scan mode, the scan
// stages run the way the scan driver runs them, and a sink that keeps the
// tree a store shows.
#ifndef TARNWELL_STORE_STORE_TEST_SUPPORT_H_
#define TARNWELL_STORE_STORE_TEST_SUPPORT_H_

#include <gtest/gtest.h>

#include <filesystem>
#include <initializer_list>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "base/date_time.h"
#include "base/paths.h"
#include "base/text.h"
#include "engine/catalog.h"
#include "engine/edb_class.h"
#include "store/folder_tree.h"
#include "store/mail_store.h"
#include "testing/exchange/store_manifest.h"

namespace tarnwell::store::test_support {

namespace fx = forge::exchange;

// Values laid out by hand, little-endian as the stores keep them.
inline void Append(Bytes* out, const Bytes& more) {
  out->insert(out->end(), more.begin(), more.end());
}
inline Bytes Cat(std::initializer_list<Bytes> parts) {
  Bytes out;
  for (const Bytes& p : parts) Append(&out, p);
  return out;
}
inline Bytes Le16(uint16_t v) { return {uint8_t(v), uint8_t(v >> 8)}; }
inline Bytes Le32(uint32_t v) { return Cat({Le16(uint16_t(v)), Le16(uint16_t(v >> 16))}); }
inline Bytes Le64(uint64_t v) { return Cat({Le32(uint32_t(v)), Le32(uint32_t(v >> 32))}); }
// UTF-16LE text with its terminator.
inline Bytes Wide(std::string_view utf8) { return Cat({Utf8ToUtf16LE(utf8), {0, 0}}); }

// Property blobs of the layout servers write: "ProP", flags, entry count,
// (near area offset), then a type byte and id per entry, then the values.
constexpr uint16_t kPlainBlob = 0x0400;
constexpr uint16_t kWithNearArea = 0x0401;
struct BlobProperty {
  uint8_t type;
  uint16_t id;
};
inline Bytes ServerBlob(const std::vector<BlobProperty>& props, const Bytes& values,
                        uint16_t flags = kPlainBlob, uint32_t near_area = 0) {
  Bytes b = Cat({{'P', 'r', 'o', 'P'}, Le16(flags), Le16(uint16_t(props.size()))});
  if (flags == kWithNearArea) Append(&b, Le32(near_area));
  for (const BlobProperty& p : props) Append(&b, Cat({{p.type}, Le16(p.id)}));
  Append(&b, values);
  return b;
}
// A value kept in the blob's near area at `offset`, or in the row's
// "SeparatedPropertyNN" column `slot` (`hint`: its size before compression).
inline Bytes NearRef(uint32_t offset, uint16_t family, uint32_t length) {
  return Cat({{0x78}, Le16(0), Le32(offset), Le16(family), Le32(length)});
}
inline Bytes FarRef(uint16_t slot, uint32_t hint, uint16_t family, uint32_t length) {
  return Cat({{0x7A}, Le16(slot), Le32(hint), Le16(family), Le32(length)});
}

// Every folder the store shows, with the path of names that leads to it.
class TreeRecorder : public FolderTreeSink {
 public:
  struct Shown {
    std::vector<std::string> path;
    int icon;
    FolderRef ref;
  };
  int64_t AddTopItem(const std::string& text, int, uint64_t) override {
    top = text;
    return 0;
  }
  int64_t AddFolder(int64_t parent, const std::string& text, int icon, uint32_t index) override {
    return Add(parent, text, icon, {-1, index});
  }
  int64_t AddMailboxFolder(int64_t parent, const std::string& text, int icon, int32_t mailbox,
                           uint32_t index) override {
    return Add(parent, text, icon, {mailbox, index});
  }
  const Shown* Find(const std::vector<std::string>& path) const {
    for (const Shown& s : shown) {
      if (s.path == path) return &s;
    }
    return nullptr;
  }

  std::string top;
  std::vector<Shown> shown;  // handle k is shown[k - 1]; the top item is 0

 private:
  int64_t Add(int64_t parent, const std::string& text, int icon, FolderRef ref) {
    std::vector<std::string> path;
    if (parent > 0 && size_t(parent) <= shown.size()) path = shown[parent - 1].path;
    path.push_back(text);
    shown.push_back({path, icon, ref});
    return int64_t(shown.size());
  }
};

// A builder's database in a temporary folder, opened and scanned as `Store`.
// Build into `path`, then Open.
template <typename Store>
struct OpenedStore {
  explicit OpenedStore(const char* prefix) { EXPECT_TRUE(MakeTempDir(prefix, &dir).ok()); }
  ~OpenedStore() {
    store.reset();
    reader.reset();
    if (!dir.empty()) std::filesystem::remove_all(dir);
  }

  // The catalog comes from the catalog tree (Standard Mode) or from the
  // leaf-page scan (Advance Mode); the stages run in the driver's order.
  ::testing::AssertionResult Open(int version, ScanMode mode) {
    reader = engine::MakeReader(version);
    if (!reader->OpenDatabase(path(), {}, version)) return Fail("open");
    if (mode == ScanMode::kStandard) {
      if (reader->CollectTreeRecords(engine::kCatalogRootPage) != 1) return Fail("catalog tree");
    } else if (!reader->ScanLeafPages() || reader->CollectLeafPageRecords() != 1) {
      return Fail("leaf scan");
    }
    if (reader->ParseCatalogRecords() != 1) return Fail("catalog");
    reader->GetTableNames();
    store = std::make_unique<Store>(*reader, version, mode);
    store->SetWorkFolder(dir);
    walked_mailboxes = store->WalkMailboxes();
    walked_folders = store->WalkFolders();
    store->LinkTree(NullProgress());
    if (!store->ShowTree(path(), 1, tree)) return Fail("tree");
    if (!store->BuildMessageMap() || !store->BuildAttachmentMap()) return Fail("maps");
    return ::testing::AssertionSuccess();
  }
  std::string path() const { return dir + "/store.edb"; }

  std::string dir;
  fx::StoreManifest manifest;
  std::unique_ptr<engine::EdbClass> reader;
  std::unique_ptr<Store> store;
  TreeRecorder tree;
  bool walked_mailboxes = false, walked_folders = false;

 private:
  static ::testing::AssertionResult Fail(const char* stage) {
    return ::testing::AssertionFailure() << "failed at " << stage;
  }
};

// A list row's time as the item list shows it; empty for no time.
inline std::string ListTime(uint64_t filetime) { return filetime ? DateText(filetime) : ""; }

inline void ExpectAttachments(const std::vector<AttachmentRecord>& got,
                              const std::vector<fx::ManifestAttachment>& want) {
  ASSERT_EQ(got.size(), want.size());
  for (size_t k = 0; k < got.size(); ++k) {
    EXPECT_EQ(got[k].name, want[k].name);
    EXPECT_EQ(fx::Sha256Hex(ByteView(got[k].data)), want[k].sha256) << got[k].name;
  }
}

}  // namespace tarnwell::store::test_support

#endif  // TARNWELL_STORE_STORE_TEST_SUPPORT_H_
