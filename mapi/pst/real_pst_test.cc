// PSTs written by Outlook and read by other programs: our reader must see
// what pffexport sees in them, our writer must keep them readable when it
// appends, and what we write must read back in readpst and pffexport.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <regex>
#include <set>
#include <sstream>

#include "base/paths.h"
#include "base/text.h"
#include "mapi/property_tags.h"
#include "mapi/pst/pst_store.h"
#include "mapi/pst/store_templates.h"
#include "mapi/pst/table_context.h"

namespace tarnwell::mapi::pst {
namespace {

namespace fs = std::filesystem;

// ---- Running the other programs

bool HaveTool(const std::string& name) {
  return std::system(("command -v " + name + " >/dev/null 2>&1").c_str()) == 0;
}

std::string Quote(const std::string& s) {
  std::string out = "'";
  for (char c : s) out += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return out + "'";
}

// Runs a shell command; its exit status, with stdout and stderr in *output.
int RunCommand(const std::string& command, std::string* output) {
  FILE* pipe = popen((command + " 2>&1").c_str(), "r");
  if (pipe == nullptr) return -1;
  char buffer[4096];
  size_t n;
  output->clear();
  while ((n = fread(buffer, 1, sizeof buffer, pipe)) > 0) output->append(buffer, n);
  int status = pclose(pipe);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

std::string ReadText(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream ss;
  ss << in.rdbuf();
  return ss.str();
}

Bytes ReadBytes(const fs::path& path) {
  std::string s = ReadText(path);
  return Bytes(s.begin(), s.end());
}

// The value after "Key:" and tabs in a pffexport item description.
std::string Field(const std::string& text, const std::string& key) {
  std::regex re("(^|\\n)" + key + ":\\t+([^\\n]*)");
  std::smatch m;
  if (!std::regex_search(text, m, re)) return "";
  return m[2].str();
}

// ---- What pffexport wrote

struct ExportedItem {
  std::string kind;         // "Message", "Contact", "Appointment", ...
  std::string description;  // the item's <kind>.txt
  std::vector<std::map<std::string, std::string>> recipients;
  std::map<std::string, Bytes> files;                      // other files of the item (bodies)
  std::vector<std::pair<std::string, Bytes>> attachments;  // data attachments
  std::vector<ExportedItem> embedded;
};

struct ExportedFolder {
  std::map<std::string, ExportedFolder> folders;
  std::vector<ExportedItem> items;        // in pffexport's numbering order
  std::set<std::string> skipped_classes;  // the root's: classes pffexport does not export
};

// An item directory is <Kind><5 digits> holding <Kind>.txt.
bool IsItemDir(const fs::path& dir, std::string* kind) {
  static const std::regex re("([A-Za-z]+)[0-9]{5}");
  std::smatch m;
  std::string name = dir.filename().string();
  if (!std::regex_match(name, m, re)) return false;
  *kind = m[1].str();
  return fs::exists(dir / (*kind + ".txt"));
}

ExportedItem ParseItem(const fs::path& dir, const std::string& kind) {
  ExportedItem item;
  item.kind = kind;
  // Mail items keep their description beside the body, which takes
  // Message.txt.
  item.description = fs::exists(dir / "OutlookHeaders.txt") ? ReadText(dir / "OutlookHeaders.txt")
                                                            : ReadText(dir / (kind + ".txt"));
  std::string recipients = ReadText(dir / "Recipients.txt");
  std::map<std::string, std::string> current;
  std::istringstream lines(recipients);
  std::string line;
  while (std::getline(lines, line)) {
    size_t colon = line.find(':');
    if (line.empty() || colon == std::string::npos) {
      if (!current.empty()) item.recipients.push_back(current);
      current.clear();
      continue;
    }
    size_t value = line.find_first_not_of('\t', colon + 1);
    current[line.substr(0, colon)] = value == std::string::npos ? "" : line.substr(value);
  }
  if (!current.empty()) item.recipients.push_back(current);
  std::set<fs::path> sorted;
  for (const auto& e : fs::directory_iterator(dir)) sorted.insert(e.path());
  for (const fs::path& p : sorted) {
    if (fs::is_regular_file(p)) item.files[p.filename().string()] = ReadBytes(p);
  }
  if (!fs::is_directory(dir / "Attachments")) return item;
  std::set<fs::path> attachments;
  for (const auto& e : fs::directory_iterator(dir / "Attachments")) attachments.insert(e.path());
  for (const fs::path& p : attachments) {
    if (fs::is_regular_file(p)) {
      item.attachments.push_back({p.filename().string(), ReadBytes(p)});
      continue;
    }
    for (const auto& inner : fs::directory_iterator(p)) {
      std::string inner_kind;
      if (IsItemDir(inner.path(), &inner_kind)) {
        item.embedded.push_back(ParseItem(inner.path(), inner_kind));
      }
    }
  }
  return item;
}

void ParseFolder(const fs::path& dir, ExportedFolder* out, int depth = 0) {
  if (depth > 30) return;
  std::map<std::string, fs::path> items;  // by number: pffexport's order
  for (const auto& e : fs::directory_iterator(dir)) {
    if (!e.is_directory()) continue;
    std::string kind;
    std::string name = e.path().filename().string();
    if (IsItemDir(e.path(), &kind)) {
      items[name.substr(kind.size())] = e.path();
    } else {
      ParseFolder(e.path(), &out->folders[name], depth + 1);
    }
  }
  for (const auto& [number, path] : items) {
    std::string kind;
    IsItemDir(path, &kind);
    out->items.push_back(ParseItem(path, kind));
  }
}

// Runs pffexport on `pst`; false (with the output in *log) when it fails.
// pffexport leaves out items of classes it does not know; their classes go
// to root->skipped_classes.
bool PffExport(const std::string& pst, const std::string& work, ExportedFolder* root,
               std::string* log) {
  std::string target = work + "/pff";
  fs::remove_all(target + ".export");
  fs::remove(work + "/pff.log");
  if (RunCommand("pffexport -q -m items -f all -l " + Quote(work + "/pff.log") + " -t " +
                     Quote(target) + " " + Quote(pst),
                 log) != 0) {
    return false;
  }
  ParseFolder(target + ".export", root);
  std::string skipped = ReadText(work + "/pff.log");
  static const std::regex re(
      "Skipped export of item: [0-9]+ out of: [0-9]+ of type: ([^\\n]*) \\(");
  for (std::sregex_iterator it(skipped.begin(), skipped.end(), re), end; it != end; ++it) {
    root->skipped_classes.insert((*it)[1].str());
  }
  return true;
}

// ---- Comparing with our reader

std::string FixturePath(const std::string& relative) {
  return std::string(TARNWELL_EXTERNAL_FIXTURES) + "/" + relative;
}

// Folders the tests write in, removed when the test program ends.
struct TempDirs {
  ~TempDirs() {
    std::error_code ignored;
    for (const std::string& d : dirs) fs::remove_all(d, ignored);
  }
  std::vector<std::string> dirs;
};

std::string WorkDir(const std::string& name) {
  static TempDirs made;
  std::string dir;
  EXPECT_TRUE(MakeTempDir("real_pst_test_" + name, &dir).ok());
  made.dirs.push_back(dir);
  return dir;
}

size_t CountItems(const ExportedFolder& f) {
  size_t n = f.items.size();
  for (const auto& [name, sub] : f.folders) n += CountItems(sub);
  return n;
}

// Checks one message of ours against the item pffexport exported for it.
void CompareItem(const Message& ours, const ExportedItem& theirs, const std::string& where) {
  std::string subject = ours.properties.String(kPidSubject).value_or("");
  EXPECT_EQ(Field(theirs.description, "Subject"), subject) << where;
  EXPECT_EQ(theirs.recipients.size(), ours.recipients.size()) << where << " " << subject;
  for (size_t i = 0; i < ours.recipients.size() && i < theirs.recipients.size(); ++i) {
    EXPECT_EQ(theirs.recipients[i].at("Display name"),
              ours.recipients[i].String(kPidDisplayName).value_or(""))
        << where << " " << subject;
  }
  size_t data_attachments = 0, embedded = 0;
  for (const Attachment& a : ours.attachments) {
    if (a.embedded) {
      ++embedded;
    } else if (!a.data.empty()) {
      ++data_attachments;
    }
  }
  EXPECT_EQ(theirs.attachments.size(), data_attachments) << where << " " << subject;
  EXPECT_EQ(theirs.embedded.size(), embedded) << where << " " << subject;
  // pffexport names data attachments "<n>_<file name>"; the bytes must match.
  for (const auto& [name, bytes] : theirs.attachments) {
    bool matched = false;
    for (const Attachment& a : ours.attachments)
      matched = matched || (!a.embedded && a.data == bytes);
    EXPECT_TRUE(matched) << where << " " << subject << ": attachment " << name;
  }
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
  bool writable;  // passworded stores are only read
};

class RealPstTest : public ::testing::TestWithParam<Fixture> {};

TEST_P(RealPstTest, ReaderAgreesWithPffexport) {
  std::string pst = FixturePath(GetParam().path);
  if (!fs::exists(pst)) GTEST_SKIP() << "fixture missing: " << pst;
  if (!HaveTool("pffexport")) GTEST_SKIP() << "pffexport not installed";
  std::unique_ptr<PstStore> store;
  Status s = PstStore::Open(pst, false, &store);
  ASSERT_TRUE(s.ok()) << s.ToString();
  ExportedFolder theirs;
  std::string log;
  ASSERT_TRUE(PffExport(pst, WorkDir("read"), &theirs, &log)) << log;
  CompareFolder(*store, store->root_folder(), theirs, theirs.skipped_classes, "");
  EXPECT_GT(CountItems(theirs), 0u);
}

// Appending to a copy keeps the original items and adds ours; both
// validators read the result.
TEST_P(RealPstTest, AppendingKeepsOriginalItems) {
  if (!GetParam().writable) GTEST_SKIP() << "read-only fixture";
  std::string original = FixturePath(GetParam().path);
  if (!fs::exists(original)) GTEST_SKIP() << "fixture missing: " << original;
  std::string work = WorkDir("append");
  std::string pst = work + "/copy.pst";
  fs::copy_file(original, pst);

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
  Message m;
  m.properties.Set(kPidMessageClass, PropertyValue::Unicode("IPM.Note"));
  m.properties.Set(kPidSubject, PropertyValue::Unicode("Appended mail"));
  m.properties.Set(kPidBody, PropertyValue::Unicode("appended body"));
  m.properties.SetNamed(NamedString(kPsPublicStrings, "Tarnwell-Test"),
                        PropertyValue::Unicode("yes"));
  PropertyBag to;
  to.Set(kPidRecipientType, PropertyValue::Int32(kRecipientTo));
  to.Set(kPidDisplayName, PropertyValue::Unicode("Someone"));
  to.Set(kPidEmailAddress, PropertyValue::Unicode("someone@example.com"));
  to.Set(kPidAddressType, PropertyValue::Unicode("SMTP"));
  m.recipients.push_back(to);
  Attachment a;
  a.properties.Set(kPidAttachLongFilename, PropertyValue::Unicode("data.bin"));
  a.properties.Set(kPidAttachFilename, PropertyValue::Unicode("data.bin"));
  for (int i = 0; i < 20000; ++i) a.data.push_back(uint8_t(i * 7));
  m.attachments.push_back(std::move(a));
  ASSERT_TRUE(store->AddMessage(added_folder, m, &mail, nullptr).ok());
  Message contact;
  contact.properties.Set(kPidMessageClass, PropertyValue::Unicode("IPM.Contact"));
  contact.properties.Set(kPidSubject, PropertyValue::Unicode("Appended contact"));
  contact.properties.Set(kPidDisplayName, PropertyValue::Unicode("Appended contact"));
  contact.properties.SetNamed(NamedId(kPsetidAddress, 0x8083),
                              PropertyValue::Unicode("appended@example.com"));
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
  EXPECT_EQ(read_back.properties.String(kPidSubject), "Appended mail");
  const PropertyValue* named =
      read_back.properties.FindNamed(NamedString(kPsPublicStrings, "Tarnwell-Test"));
  ASSERT_NE(named, nullptr);
  EXPECT_EQ(named->AsString(), "yes");
  ASSERT_EQ(read_back.attachments.size(), 1u);
  EXPECT_EQ(read_back.attachments[0].data, m.attachments[0].data);

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
                         ::testing::Values(Fixture{"ruby-msg/pst/attachAndInline.pst", true},
                                           Fixture{"ruby-msg/pst/200 recipients.pst", true},
                                           Fixture{"java-libpst/dist-list.pst", true},
                                           Fixture{"java-libpst/passworded.pst", false}),
                         [](const ::testing::TestParamInfo<Fixture>& info) {
                           std::string name = fs::path(info.param.path).stem().string();
                           std::string out;
                           for (char c : name)
                             out += std::isalnum(static_cast<unsigned char>(c)) ? c : '_';
                           return out;
                         });

// The tables a new store starts from have the columns Outlook gives them.
TEST(RealPstTemplatesTest, NewStoreTemplatesMatchOutlooks) {
  std::string pst = FixturePath("java-libpst/dist-list.pst");
  if (!fs::exists(pst)) GTEST_SKIP() << "fixture missing";
  std::unique_ptr<PstFile> file;
  ASSERT_TRUE(PstFile::Open(pst, false, &file).ok());
  const std::pair<Nid, std::vector<PropTag>> templates[] = {
      {kNidHierarchyTableTemplate, HierarchyTableColumns()},
      {kNidContentsTableTemplate, ContentsTableColumns()},
      {kNidAssocContentsTableTemplate, AssocContentsTableColumns()},
      {kNidSearchContentsTableTemplate, SearchContentsTableColumns()},
      {kNidAttachmentTable, AttachmentTableColumns()},
      {kNidRecipientTable, RecipientTableColumns()},
      {kNidSearchTableTemplate, SearchTableTemplateColumns()},
  };
  for (const auto& [nid, ours] : templates) {
    NodeContent node;
    ASSERT_TRUE(file->ReadNode(nid, &node).ok()) << std::hex << nid;
    std::vector<PropTag> columns;
    std::vector<TableRow> rows;
    ASSERT_TRUE(DecodeTableContext(node, &columns, &rows).ok()) << std::hex << nid;
    std::set<PropTag> theirs(columns.begin(), columns.end());
    theirs.erase(MakeTag(kPidLtpRowId, kTypeInt32));
    theirs.erase(MakeTag(kPidLtpRowVer, kTypeInt32));
    EXPECT_EQ(std::set<PropTag>(ours.begin(), ours.end()), theirs) << std::hex << nid;
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
