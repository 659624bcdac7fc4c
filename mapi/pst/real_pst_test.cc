// PSTs written by Outlook and read by other programs: every layer of our
// reader must read them and see what pffexport sees in them, our writer must
// keep them readable when it appends, and both validators must read the
// result.
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <map>
#include <set>

#include "mapi/property_tags.h"
#include "mapi/pst/pst_header.h"
#include "mapi/pst/pst_store.h"
#include "mapi/pst/pst_test_support.h"
#include "mapi/pst/store_templates.h"
#include "mapi/pst/table_context.h"

namespace tarnwell::mapi::pst {
namespace {

namespace fs = std::filesystem;

std::string FixturePath(const std::string& relative) {
  return std::string(TARNWELL_EXTERNAL_FIXTURES) + "/" + relative;
}

// ---- Decoding every context and table

bool IsPropertyNode(Nid nid) {
  const uint8_t t = NidTypeOf(nid);
  return t == kNidTypeNormalFolder || t == kNidTypeNormalMessage || t == kNidTypeAttachment ||
         nid == kNidMessageStore;
}

bool IsTableNode(Nid nid) {
  const uint8_t t = NidTypeOf(nid);
  return t == kNidTypeHierarchyTable || t == kNidTypeContentsTable ||
         t == kNidTypeAssocContentsTable || t == kNidTypeAttachmentTable ||
         t == kNidTypeRecipientTable;
}

struct DecodeCounts {
  size_t contexts = 0;
  size_t tables = 0;
  size_t max_rows = 0;
};

// Decodes the node and, inside messages, its attachment and table subnodes.
// Tables are written again by us and must read back the same.
void DecodeAll(Nid nid, const NodeContent& node, DecodeCounts* counts) {
  if (IsPropertyNode(nid)) {
    std::vector<TaggedValue> props;
    EXPECT_TRUE(DecodePropertyContext(node, &props).ok()) << std::hex << nid;
    ++counts->contexts;
  } else if (IsTableNode(nid)) {
    std::vector<PropTag> columns, columns_again;
    std::vector<TableRow> rows, rows_again;
    Status s = DecodeTableContext(node, &columns, &rows);
    EXPECT_TRUE(s.ok()) << std::hex << nid << ": " << s.ToString();
    EXPECT_TRUE(std::is_sorted(columns.begin(), columns.end())) << std::hex << nid;
    ++counts->tables;
    counts->max_rows = std::max(counts->max_rows, rows.size());
    NodeContent copy;
    ASSERT_TRUE(EncodeTableContext(columns, rows, &copy).ok()) << std::hex << nid;
    ASSERT_TRUE(DecodeTableContext(copy, &columns_again, &rows_again).ok()) << std::hex << nid;
    EXPECT_EQ(columns_again, columns) << std::hex << nid;
    ASSERT_EQ(rows_again.size(), rows.size());
    for (size_t r = 0; r < rows.size(); ++r) EXPECT_EQ(rows_again[r].cells, rows[r].cells);
  }
  if (NidTypeOf(nid) != kNidTypeNormalMessage && NidTypeOf(nid) != kNidTypeAttachment) return;
  for (const auto& [sub, content] : node.subnodes) DecodeAll(sub, content, counts);
}

const TaggedValue* Find(const std::vector<TaggedValue>& props, uint16_t id) {
  for (const TaggedValue& p : props) {
    if (TagId(p.tag) == id) return &p;
  }
  return nullptr;
}

// ---- Comparing with pffexport

size_t CountItems(const ExportedFolder& f) {
  size_t n = f.items.size();
  for (const auto& [name, sub] : f.folders) n += CountItems(sub);
  return n;
}

// Walks our view of `folder` and pffexport's side by side.
void CompareFolder(const PstStore& store, Nid folder, const ExportedFolder& theirs,
                   const std::set<std::string>& skipped_classes, const std::string& where,
                   int depth = 0) {
  ASSERT_LT(depth, 30);
  // pffexport numbers a folder's items in node id order, not table order.
  std::vector<Nid> nids = store.Messages(folder);
  std::sort(nids.begin(), nids.end());
  std::vector<Message> messages;
  for (Nid nid : nids) {
    Message m;
    Status s = store.ReadMessage(nid, &m);
    EXPECT_TRUE(s.ok()) << where << ": " << s.ToString();
    if (!skipped_classes.count(m.properties.String(kPidMessageClass).value_or(""))) {
      messages.push_back(std::move(m));
    }
  }
  EXPECT_EQ(messages.size(), theirs.items.size()) << where;
  for (size_t i = 0; i < messages.size() && i < theirs.items.size(); ++i) {
    CompareItem(messages[i], theirs.items[i], where);
  }
  std::set<std::string> names;
  for (const FolderInfo& f : store.SubFolders(folder)) {
    names.insert(f.name);
    auto it = theirs.folders.find(SafeFileName(f.name));
    if (it == theirs.folders.end()) it = theirs.folders.find(f.name);
    if (it == theirs.folders.end()) {
      ADD_FAILURE() << where << ": pffexport has no folder " << f.name;
      continue;
    }
    CompareFolder(store, f.nid, it->second, skipped_classes, where + "/" + f.name, depth + 1);
  }
  EXPECT_EQ(names.size(), theirs.folders.size()) << where;
}

struct Fixture {
  const char* path;
  bool writable;    // passworded stores are only read
  size_t min_rows;  // the largest table has at least this many rows
};

class RealPstTest : public ::testing::TestWithParam<Fixture> {
 protected:
  void SetUp() override {
    path_ = FixturePath(GetParam().path);
    if (!fs::exists(path_)) GTEST_SKIP() << "fixture missing: " << path_;
  }
  // A writable copy of the fixture in a fresh folder.
  std::string Copy(const std::string& work) {
    std::string copy = work + "/copy.pst";
    fs::copy_file(path_, copy);
    fs::permissions(copy, fs::perms::owner_read | fs::perms::owner_write);
    return copy;
  }
  std::string path_;
};

TEST_P(RealPstTest, EveryNodeContextAndTableDecodes) {
  std::unique_ptr<PstFile> pst;
  Status s = PstFile::Open(path_, false, &pst);
  ASSERT_TRUE(s.ok()) << s.ToString();
  EXPECT_EQ(pst->crypt_method(), CryptMethod::kPermute);
  for (Nid nid : {kNidMessageStore, kNidNameToIdMap, kNidRootFolder}) {
    EXPECT_TRUE(pst->HasNode(nid)) << nid;
  }
  // The header decodes and encodes back to the same bytes, CRCs included.
  Bytes raw = ReadBytes(path_);
  PstHeader h;
  ASSERT_TRUE(DecodeHeader(raw, &h).ok());
  Bytes again = EncodeHeader(h);
  EXPECT_TRUE(std::equal(again.begin(), again.end(), raw.begin()));

  DecodeCounts counts;
  for (const NodeEntry& e : pst->ListNodes()) {
    NodeContent node;
    s = pst->ReadNode(e.nid, &node);
    EXPECT_TRUE(s.ok()) << std::hex << e.nid << ": " << s.ToString();
    if (s.ok()) DecodeAll(e.nid, node, &counts);
  }
  EXPECT_GT(counts.contexts, 3u);
  EXPECT_GT(counts.tables, 3u);
  EXPECT_GE(counts.max_rows, GetParam().min_rows);

  NodeContent store, root;
  std::vector<TaggedValue> props;
  ASSERT_TRUE(pst->ReadNode(kNidMessageStore, &store).ok());
  ASSERT_TRUE(DecodePropertyContext(store, &props).ok());
  const TaggedValue* name = Find(props, kPidDisplayName);
  ASSERT_NE(name, nullptr);
  EXPECT_EQ(name->value.type, kTypeUnicode);
  EXPECT_FALSE(name->value.AsString().value_or("").empty());
  const TaggedValue* record_key = Find(props, kPidRecordKey);
  ASSERT_NE(record_key, nullptr);
  EXPECT_EQ(record_key->value.data.size(), 16u);

  ASSERT_TRUE(pst->ReadNode(kNidRootFolder, &root).ok());
  ASSERT_TRUE(DecodePropertyContext(root, &props).ok());
  ASSERT_NE(Find(props, kPidContentCount), nullptr);
  EXPECT_EQ(Find(props, kPidContentCount)->value.type, kTypeInt32);
  // What we write from what Outlook wrote reads back the same.
  NodeContent copy;
  ASSERT_TRUE(EncodePropertyContext(props, &copy).ok());
  std::vector<TaggedValue> props_again;
  ASSERT_TRUE(DecodePropertyContext(copy, &props_again).ok());
  ASSERT_EQ(props_again.size(), props.size());
  for (size_t i = 0; i < props.size(); ++i) {
    EXPECT_EQ(props_again[i].tag, props[i].tag) << i;
    EXPECT_EQ(props_again[i].value, props[i].value) << std::hex << props[i].tag;
  }
}

TEST_P(RealPstTest, ReaderAgreesWithPffexport) {
  if (!HaveTool("pffexport")) GTEST_SKIP() << "pffexport not installed";
  std::unique_ptr<PstStore> store;
  Status s = PstStore::Open(path_, false, &store);
  ASSERT_TRUE(s.ok()) << s.ToString();
  ExportedFolder theirs;
  std::string log;
  ASSERT_TRUE(PffExport(path_, TempDir("read"), &theirs, &log)) << log;
  CompareFolder(*store, store->root_folder(), theirs, theirs.skipped_classes, "");
  EXPECT_GT(CountItems(theirs), 0u);
}

// Nodes appended to a copy (passworded ones too: the node layer does not
// care) read back beside every original node, and pffinfo still opens it.
TEST_P(RealPstTest, AppendedNodesKeepOriginalNodes) {
  std::string path = Copy(TempDir("append-nodes"));
  std::map<Nid, NodeContent> before, added;
  std::unique_ptr<PstFile> pst;
  ASSERT_TRUE(PstFile::Open(path, false, &pst).ok());
  for (const NodeEntry& e : pst->ListNodes()) {
    ASSERT_TRUE(pst->ReadNode(e.nid, &before[e.nid]).ok());
  }
  pst.reset();
  ASSERT_TRUE(PstFile::Open(path, true, &pst).ok());
  for (int i = 0; i < 60; ++i) {
    Nid nid = pst->AllocateNid(kNidTypeNormalMessage);
    ASSERT_FALSE(before.count(nid));
    NodeContent c;
    c.blocks = NodeContent::Split(Pattern(i * 3000 + 1, i));  // about 180 KB in all
    c.subnodes[kNidRecipientTable].blocks = {Pattern(64, i)};
    ASSERT_TRUE(pst->WriteNode(nid, kNidRootFolder, c).ok());
    added[nid] = c;
  }
  ASSERT_TRUE(pst->Commit().ok());
  pst.reset();
  ASSERT_TRUE(PstFile::Open(path, false, &pst).ok());
  EXPECT_EQ(pst->ListNodes().size(), before.size() + added.size());
  for (auto* set : {&before, &added}) {
    for (const auto& [nid, c] : *set) {
      NodeContent back;
      ASSERT_TRUE(pst->ReadNode(nid, &back).ok()) << nid;
      ExpectSameContent(back, c, std::to_string(nid));
    }
  }
  if (HaveTool("pffinfo")) {
    std::string log;
    EXPECT_EQ(RunCommand("pffinfo " + Quote(path), &log), 0) << log;
  }
}

// Appending to a copy keeps the original items and adds ours; both
// validators read the result.
TEST_P(RealPstTest, AppendingKeepsOriginalItems) {
  if (!GetParam().writable) GTEST_SKIP() << "read-only fixture";
  std::string work = TempDir("append");
  std::string pst = Copy(work);

  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Open(pst, false, &store).ok());
  std::map<Nid, Message> before;
  std::vector<Nid> stack = {store->root_folder()};
  std::map<Nid, size_t> counts_before;
  for (size_t guard = 0; !stack.empty() && guard < 1000; ++guard) {
    Nid f = stack.back();
    stack.pop_back();
    counts_before[f] = store->Messages(f).size();
    for (Nid m : store->Messages(f)) ASSERT_TRUE(store->ReadMessage(m, &before[m]).ok());
    for (const FolderInfo& sub : store->SubFolders(f)) stack.push_back(sub.nid);
  }
  store.reset();

  ASSERT_TRUE(PstStore::Open(pst, true, &store).ok());
  Nid contacts = 0, added_folder = 0, mail = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kContacts, &contacts).ok());
  ASSERT_TRUE(
      store->AddFolder(store->top_folder(), "Added by Tarnwell", "IPF.Note", &added_folder).ok());
  Message m = NewMessage("IPM.Note", "Appended mail", {{kPidBody, U("appended body")}},
                         {{NamedString(kPsPublicStrings, "Tarnwell-Test"), U("yes")}});
  m.recipients.push_back(Recipient(kRecipientTo, "Someone", "someone@example.com"));
  Attachment a;  // no attach method: the store fills one in
  a.properties.Set(kPidAttachLongFilename, U("data.bin"));
  a.properties.Set(kPidAttachFilename, U("data.bin"));
  a.data = Pattern(20000, 7);
  m.attachments.push_back(std::move(a));
  ASSERT_TRUE(store->AddMessage(added_folder, m, &mail, nullptr).ok());
  Message contact =
      NewMessage("IPM.Contact", "Appended contact", {{kPidDisplayName, U("Appended contact")}},
                 {{NamedId(kPsetidAddress, 0x8083), U("appended@example.com")}});
  ASSERT_TRUE(store->AddMessage(contacts, contact, nullptr, nullptr).ok());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();

  // Our reader: everything that was there is still there, plus ours.
  ASSERT_TRUE(PstStore::Open(pst, false, &store).ok());
  for (const auto& [nid, message] : before) {
    Message again;
    ASSERT_TRUE(store->ReadMessage(nid, &again).ok());
    EXPECT_EQ(again.properties.tagged(), message.properties.tagged());
    EXPECT_EQ(again.properties.named(), message.properties.named());
    EXPECT_EQ(again.recipients.size(), message.recipients.size());
    EXPECT_EQ(again.attachments.size(), message.attachments.size());
  }
  for (const auto& [folder, count] : counts_before) {
    size_t expected = count + (folder == contacts ? 1 : 0);
    if (store->file().HasNode(folder)) {
      EXPECT_EQ(store->Messages(folder).size(), expected);
    }
  }
  Message read_back;
  ASSERT_TRUE(store->ReadMessage(mail, &read_back).ok());
  ExpectMessageContains(read_back, m, "appended mail");

  // pffexport agrees with our reader on the whole file.
  if (HaveTool("pffexport")) {
    ExportedFolder theirs;
    std::string log;
    ASSERT_TRUE(PffExport(pst, work, &theirs, &log)) << log;
    CompareFolder(*store, store->root_folder(), theirs, theirs.skipped_classes, "");
  }
  // readpst reads every folder, ours included.
  if (HaveTool("readpst")) {
    std::string out = work + "/readpst";
    fs::create_directories(out);
    std::string log;
    ASSERT_EQ(RunCommand("readpst -q -D -S -b -j 0 -o " + Quote(out) + " " + Quote(pst), &log), 0)
        << log;
    bool found_mail = false, found_attachment = false;
    for (const auto& e : fs::recursive_directory_iterator(out)) {
      if (!e.is_regular_file()) continue;
      std::string text = ReadText(e.path());
      if (text.find("Subject: Appended mail") != std::string::npos) found_mail = true;
      if (e.path().filename().string().find("data.bin") != std::string::npos) {
        found_attachment = ReadBytes(e.path()) == m.attachments[0].data;
      }
    }
    EXPECT_TRUE(found_mail) << log;
    EXPECT_TRUE(found_attachment) << log;
  }
}

INSTANTIATE_TEST_SUITE_P(Fixtures, RealPstTest,
                         ::testing::Values(Fixture{"ruby-msg/pst/attachAndInline.pst", true, 1},
                                           Fixture{"ruby-msg/pst/200 recipients.pst", true, 200},
                                           Fixture{"java-libpst/dist-list.pst", true, 1},
                                           Fixture{"java-libpst/passworded.pst", false, 1}),
                         [](const ::testing::TestParamInfo<Fixture>& info) {
                           std::string out = fs::path(info.param.path).stem().string();
                           for (char& c : out) {
                             if (!std::isalnum(static_cast<unsigned char>(c))) c = '_';
                           }
                           return out;
                         });

// The tables a new store starts from have the columns Outlook gives them.
TEST(RealPstTemplatesTest, NewStoreTemplatesMatchOutlooks) {
  std::string pst = FixturePath("java-libpst/dist-list.pst");
  if (!fs::exists(pst)) GTEST_SKIP() << "fixture missing";
  std::unique_ptr<PstFile> file;
  ASSERT_TRUE(PstFile::Open(pst, false, &file).ok());
  for (const TableTemplate& t : TableTemplates()) {
    NodeContent node;
    ASSERT_TRUE(file->ReadNode(t.nid, &node).ok()) << std::hex << t.nid;
    std::vector<PropTag> columns;
    std::vector<TableRow> rows;
    ASSERT_TRUE(DecodeTableContext(node, &columns, &rows).ok()) << std::hex << t.nid;
    std::set<PropTag> theirs(columns.begin(), columns.end());
    theirs.erase(MakeTag(kPidLtpRowId, kTypeInt32));
    theirs.erase(MakeTag(kPidLtpRowVer, kTypeInt32));
    EXPECT_EQ(std::set<PropTag>(t.columns.begin(), t.columns.end()), theirs) << std::hex << t.nid;
  }
}

// The distribution list of dist-list.pst, as java-libpst's own test knows it.
TEST(RealPstDistListTest, DistributionListReads) {
  std::string pst = FixturePath("java-libpst/dist-list.pst");
  if (!fs::exists(pst)) GTEST_SKIP() << "fixture missing";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Open(pst, false, &store).ok());
  Nid contacts = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kContacts, &contacts).ok());
  bool found = false;
  for (Nid nid : store->Messages(contacts)) {
    Message m;
    ASSERT_TRUE(store->ReadMessage(nid, &m).ok());
    if (m.properties.String(kPidMessageClass) != "IPM.DistList") continue;
    found = true;
    EXPECT_EQ(m.properties.String(kPidSubject), "test dist list");
    const PropertyValue* members =
        m.properties.FindNamed(NamedId(kPsetidAddress, 0x8055));  // PidLidDistributionListMembers
    ASSERT_NE(members, nullptr);
    EXPECT_GT(members->elements.size(), 0u);
  }
  EXPECT_TRUE(found);
}

}  // namespace
}  // namespace tarnwell::mapi::pst
