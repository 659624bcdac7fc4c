#include "mapi/pst/pst_store.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <optional>
#include <set>
#include <sstream>

#include "base/paths.h"
#include "base/text.h"
#include "mapi/property_tags.h"
#include "mapi/pst/name_map.h"
#include "mapi/pst/property_context.h"
#include "mapi/pst/store_templates.h"
#include "mapi/pst/table_context.h"

namespace tarnwell::mapi::pst {
namespace {

namespace fs = std::filesystem;

constexpr uint64_t kJan2024 = 133485408000000000ull;  // 2024-01-01 00:00 UTC as FILETIME
constexpr char kRtfText[] = "{\\rtf1\\ansi\\deff0 Hello RTF body\\par}";
constexpr char kHtmlText[] = "<html><body><b>Hi</b> there</body></html>";
constexpr uint16_t kLidFileUnder = 0x8005;
constexpr uint16_t kLidEmail1DisplayName = 0x8080;
constexpr uint16_t kLidEmail1AddressType = 0x8082;
constexpr uint16_t kLidEmail1EmailAddress = 0x8083;
constexpr uint16_t kLidEmail1OriginalDisplayName = 0x8084;
constexpr uint16_t kLidLocation = 0x8208;
constexpr uint16_t kLidAppointmentStartWhole = 0x820D;
constexpr uint16_t kLidAppointmentEndWhole = 0x820E;
constexpr uint16_t kLidTaskStatus = 0x8101;
constexpr uint16_t kLidTaskDueDate = 0x8105;
constexpr uint16_t kLidDistributionListName = 0x8053;
constexpr uint16_t kLidDistributionListOneOffMembers = 0x8054;

// ---- Building messages

Bytes PatternBytes(size_t n, uint32_t seed) {
  Bytes out(n);
  uint32_t x = seed;
  for (uint8_t& b : out) {
    x = x * 1103515245u + 12345u;
    b = uint8_t(x >> 16);
  }
  return out;
}

// Compressed RTF made of literals only, with the end marker and the CRC
// readers check.
Bytes CompressedRtf(const std::string& rtf) {
  constexpr uint32_t kPresetDictionaryLength = 207;
  constexpr uint32_t kDictionarySize = 4096;
  constexpr uint32_t kTypeLzfu = 0x75465A4C;
  Bytes body;
  uint32_t write = kPresetDictionaryLength;
  size_t pos = 0;
  for (;;) {
    size_t control = body.size();
    body.push_back(0);
    int tokens = 0;
    for (; tokens < 8 && pos < rtf.size(); ++tokens) {
      body.push_back(uint8_t(rtf[pos++]));
      write = (write + 1) % kDictionarySize;
    }
    if (tokens < 8) {
      // A reference to the write position ends the stream.
      body[control] = uint8_t(body[control] | (1 << tokens));
      body.push_back(uint8_t(write >> 4));
      body.push_back(uint8_t((write & 0xF) << 4));
      break;
    }
  }
  uint32_t crc = 0;
  for (uint8_t b : body) {
    crc ^= b;
    for (int k = 0; k < 8; ++k) crc = (crc & 1) ? (0xEDB88320u ^ (crc >> 1)) : (crc >> 1);
  }
  uint8_t header[16] = {};
  StoreU32LE(header, uint32_t(body.size() + 12));
  StoreU32LE(header + 4, uint32_t(rtf.size()));
  StoreU32LE(header + 8, kTypeLzfu);
  StoreU32LE(header + 12, crc);
  Bytes out;
  for (uint8_t b : header) out.push_back(b);
  for (uint8_t b : body) out.push_back(b);
  return out;
}

PropertyBag Recipient(int32_t type, const std::string& name, const std::string& address) {
  PropertyBag r;
  r.Set(kPidRecipientType, PropertyValue::Int32(type));
  r.Set(kPidDisplayName, PropertyValue::Unicode(name));
  r.Set(kPidAddressType, PropertyValue::Unicode("SMTP"));
  r.Set(kPidEmailAddress, PropertyValue::Unicode(address));
  r.Set(kPidSmtpAddress, PropertyValue::Unicode(address));
  return r;
}

void SetSender(Message* m, const std::string& name, const std::string& address) {
  for (uint16_t id : {kPidSenderName, kPidSentRepresentingName}) {
    m->properties.Set(id, PropertyValue::Unicode(name));
  }
  for (uint16_t id : {kPidSenderEmailAddress, kPidSentRepresentingEmailAddress}) {
    m->properties.Set(id, PropertyValue::Unicode(address));
  }
  for (uint16_t id : {kPidSenderAddressType, kPidSentRepresentingAddressType}) {
    m->properties.Set(id, PropertyValue::Unicode("SMTP"));
  }
}

Message Mail(const std::string& subject, const std::string& body) {
  Message m;
  m.properties.Set(kPidMessageClass, PropertyValue::Unicode("IPM.Note"));
  m.properties.Set(kPidSubject, PropertyValue::Unicode(subject));
  m.properties.Set(kPidConversationTopic, PropertyValue::Unicode(subject));
  m.properties.Set(kPidBody, PropertyValue::Unicode(body));
  m.properties.Set(kPidClientSubmitTime, PropertyValue::SysTime(kJan2024));
  m.properties.Set(kPidMessageDeliveryTime, PropertyValue::SysTime(kJan2024 + 600'000'000));
  m.properties.Set(kPidImportance, PropertyValue::Int32(1));
  SetSender(&m, "Alice Sender", "alice@example.com");
  return m;
}

Attachment FileAttachment(const std::string& name, Bytes data, const std::string& mime) {
  Attachment a;
  a.properties.Set(kPidAttachMethod, PropertyValue::Int32(kAttachByValue));
  a.properties.Set(kPidAttachFilename, PropertyValue::Unicode(name));
  a.properties.Set(kPidAttachLongFilename, PropertyValue::Unicode(name));
  a.properties.Set(kPidAttachMimeTag, PropertyValue::Unicode(mime));
  a.data = std::move(data);
  return a;
}

// The mail every validator test looks at most closely.
Message RichMail() {
  Message m = Mail("Quarterly report \xC3\xA9t\xC3\xA9", "Plain body line 1\r\nline 2\r\n");
  m.properties.Set(kPidHtml,
                   PropertyValue::Binary(Bytes(kHtmlText, kHtmlText + sizeof kHtmlText - 1)));
  m.properties.Set(kPidRtfCompressed, PropertyValue::Binary(CompressedRtf(kRtfText)));
  m.properties.Set(kPidInternetMessageId, PropertyValue::Unicode("<rich-1@example.com>"));
  m.properties.Set(kPidDisplayTo, PropertyValue::Unicode("Bob To; Carol To"));
  m.properties.Set(kPidDisplayCc, PropertyValue::Unicode("Dave Cc"));
  m.properties.Set(kPidDisplayBcc, PropertyValue::Unicode("Erin Bcc"));
  m.recipients.push_back(Recipient(kRecipientTo, "Bob To", "bob@example.com"));
  m.recipients.push_back(Recipient(kRecipientTo, "Carol To", "carol@example.com"));
  m.recipients.push_back(Recipient(kRecipientCc, "Dave Cc", "dave@example.com"));
  m.recipients.push_back(Recipient(kRecipientBcc, "Erin Bcc", "erin@example.com"));
  m.attachments.push_back(
      FileAttachment("notes.txt", Bytes{'s', 'm', 'a', 'l', 'l', '\n'}, "text/plain"));
  m.attachments.push_back(
      FileAttachment("big.bin", PatternBytes(150 * 1024 + 7, 42), "application/octet-stream"));
  Attachment inner;
  inner.properties.Set(kPidAttachMethod, PropertyValue::Int32(kAttachEmbeddedMessage));
  inner.properties.Set(kPidDisplayName, PropertyValue::Unicode("Forwarded note"));
  inner.embedded = std::make_unique<Message>(Mail("Inner subject", "Inner body text"));
  inner.embedded->recipients.push_back(Recipient(kRecipientTo, "Frank", "frank@example.com"));
  inner.embedded->attachments.push_back(
      FileAttachment("inner.dat", PatternBytes(3000, 7), "application/octet-stream"));
  m.attachments.push_back(std::move(inner));
  return m;
}

Message Contact() {
  Message m;
  m.properties.Set(kPidMessageClass, PropertyValue::Unicode("IPM.Contact"));
  m.properties.Set(kPidSubject, PropertyValue::Unicode("Grace Hopper"));
  m.properties.Set(kPidDisplayName, PropertyValue::Unicode("Grace Hopper"));
  m.properties.Set(kPidGivenName, PropertyValue::Unicode("Grace"));
  m.properties.Set(kPidSurname, PropertyValue::Unicode("Hopper"));
  m.properties.Set(kPidCompanyName, PropertyValue::Unicode("Navy"));
  m.properties.SetNamed(NamedId(kPsetidAddress, kLidFileUnder),
                        PropertyValue::Unicode("Hopper, Grace"));
  m.properties.Set(kPidBusinessTelephoneNumber, PropertyValue::Unicode("+1 555 0100"));
  m.properties.SetNamed(NamedId(kPsetidAddress, kLidEmail1EmailAddress),
                        PropertyValue::Unicode("grace@example.com"));
  m.properties.SetNamed(NamedId(kPsetidAddress, kLidEmail1AddressType),
                        PropertyValue::Unicode("SMTP"));
  m.properties.SetNamed(NamedId(kPsetidAddress, kLidEmail1DisplayName),
                        PropertyValue::Unicode("Grace Hopper (grace@example.com)"));
  m.properties.SetNamed(NamedId(kPsetidAddress, kLidEmail1OriginalDisplayName),
                        PropertyValue::Unicode("grace@example.com"));
  return m;
}

Message Appointment() {
  Message m;
  m.properties.Set(kPidMessageClass, PropertyValue::Unicode("IPM.Appointment"));
  m.properties.Set(kPidSubject, PropertyValue::Unicode("Design review"));
  m.properties.Set(kPidBody, PropertyValue::Unicode("Agenda: everything"));
  m.properties.SetNamed(NamedId(kPsetidAppointment, kLidAppointmentStartWhole),
                        PropertyValue::SysTime(kJan2024 + 36'000'000'000ull));
  m.properties.SetNamed(NamedId(kPsetidAppointment, kLidAppointmentEndWhole),
                        PropertyValue::SysTime(kJan2024 + 72'000'000'000ull));
  m.properties.SetNamed(NamedId(kPsetidAppointment, kLidLocation),
                        PropertyValue::Unicode("Room 101"));
  m.properties.SetNamed(NamedString(kPsPublicStrings, "Keywords"),
                        PropertyValue::MultiUnicode({"review", "design"}));
  return m;
}

Message Task() {
  Message m;
  m.properties.Set(kPidMessageClass, PropertyValue::Unicode("IPM.Task"));
  m.properties.Set(kPidSubject, PropertyValue::Unicode("File the taxes"));
  m.properties.Set(kPidBody, PropertyValue::Unicode("Before April"));
  m.properties.SetNamed(NamedId(kPsetidTask, kLidTaskStatus), PropertyValue::Int32(1));
  m.properties.SetNamed(NamedId(kPsetidTask, kLidTaskDueDate),
                        PropertyValue::SysTime(kJan2024 + 864'000'000'000ull));
  return m;
}

Message DistList() {
  Message m;
  m.properties.Set(kPidMessageClass, PropertyValue::Unicode("IPM.DistList"));
  m.properties.Set(kPidSubject, PropertyValue::Unicode("Team list"));
  m.properties.Set(kPidDisplayName, PropertyValue::Unicode("Team list"));
  m.properties.SetNamed(NamedId(kPsetidAddress, kLidDistributionListName),
                        PropertyValue::Unicode("Team list"));
  m.properties.SetNamed(NamedId(kPsetidAddress, kLidDistributionListOneOffMembers),
                        PropertyValue::MultiBinary({Bytes{1, 2, 3}, Bytes{4, 5, 6}}));
  return m;
}

// ---- Comparing what was written with what was read

void ExpectBagContains(const PropertyBag& read, const PropertyBag& written,
                       const std::string& what) {
  for (const auto& [id, value] : written.tagged()) {
    if (id == kPidHasAttachments || id == kPidMessageSize) continue;
    const PropertyValue* got = read.Find(id);
    ASSERT_NE(got, nullptr) << what << ": property 0x" << std::hex << id << " lost";
    EXPECT_EQ(*got, value) << what << ": property 0x" << std::hex << id;
  }
  for (const auto& [name, value] : written.named()) {
    const PropertyValue* got = read.FindNamed(name);
    ASSERT_NE(got, nullptr) << what << ": named property " << name.lid << name.name << " lost";
    EXPECT_EQ(*got, value) << what << ": named property " << name.lid << name.name;
  }
}

void ExpectMessageContains(const Message& read, const Message& written, const std::string& what) {
  ExpectBagContains(read.properties, written.properties, what);
  ASSERT_EQ(read.recipients.size(), written.recipients.size()) << what;
  for (size_t i = 0; i < written.recipients.size(); ++i) {
    ExpectBagContains(read.recipients[i], written.recipients[i], what + " recipient");
  }
  ASSERT_EQ(read.attachments.size(), written.attachments.size()) << what;
  for (size_t i = 0; i < written.attachments.size(); ++i) {
    const Attachment& w = written.attachments[i];
    const Attachment& r = read.attachments[i];
    ExpectBagContains(r.properties, w.properties, what + " attachment");
    EXPECT_EQ(r.data, w.data) << what << " attachment " << i;
    ASSERT_EQ(r.embedded != nullptr, w.embedded != nullptr) << what << " attachment " << i;
    if (w.embedded) ExpectMessageContains(*r.embedded, *w.embedded, what + " embedded");
  }
}

// ---- The sample store

struct Sample {
  struct Item {
    std::string folder_path;  // below the top folder, '/'-separated
    Message message;
  };
  std::vector<Item> items;
  std::map<std::string, std::string> folder_classes;  // path -> class
};

// Builds a store with nested folders and one of every kind of item.
Sample WriteSample(PstStore* store) {
  Sample sample;
  std::map<std::string, Nid> folders = {{"", store->top_folder()}};
  auto add_folder = [&](const std::string& parent, const std::string& name,
                        const std::string& cls) {
    Nid nid = 0;
    EXPECT_TRUE(store->AddFolder(folders.at(parent), name, cls, &nid).ok());
    std::string path = parent.empty() ? name : parent + "/" + name;
    folders[path] = nid;
    sample.folder_classes[path] = cls;
  };
  add_folder("", "Inbox", "IPF.Note");
  add_folder("", "Projects", "IPF.Note");
  add_folder("Projects", "2024", "IPF.Note");
  add_folder("Projects/2024", "Q1", "");
  for (auto [kind, path] : {std::pair{DefaultFolder::kContacts, "Contacts"},
                            std::pair{DefaultFolder::kCalendar, "Calendar"},
                            std::pair{DefaultFolder::kTasks, "Tasks"}}) {
    Nid nid = 0;
    EXPECT_TRUE(store->GetDefaultFolder(kind, &nid).ok());
    folders[path] = nid;
  }
  auto add = [&](const std::string& path, Message m) {
    Nid nid = 0;
    uint64_t size = 0;
    Status s = store->AddMessage(folders.at(path), m, &nid, &size);
    EXPECT_TRUE(s.ok()) << s.ToString();
    EXPECT_GT(size, 0u);
    sample.items.push_back({path, std::move(m)});
  };
  add("Inbox", RichMail());
  Message plain = Mail("Second mail", "Short body");
  plain.recipients.push_back(Recipient(kRecipientTo, "Bob To", "bob@example.com"));
  plain.properties.Set(kPidMessageFlags, PropertyValue::Int32(0));  // unread
  add("Inbox", std::move(plain));
  add("Projects/2024", Mail("Nested mail", "In a nested folder"));
  add("Contacts", Contact());
  add("Contacts", DistList());
  add("Calendar", Appointment());
  add("Tasks", Task());
  return sample;
}

// Folders the tests write in, removed when the test program ends.
struct TempDirs {
  ~TempDirs() {
    std::error_code ignored;
    for (const std::string& d : dirs) fs::remove_all(d, ignored);
  }
  std::vector<std::string> dirs;
};

std::string TempDir(const std::string& name) {
  static TempDirs made;
  std::string dir;
  EXPECT_TRUE(MakeTempDir("pst_store_test_" + name, &dir).ok());
  made.dirs.push_back(dir);
  return dir;
}

// Walks the folder tree below `folder`, path -> nid.
void CollectFolders(const PstStore& store, Nid folder, const std::string& path,
                    std::map<std::string, FolderInfo>* out, int depth = 0) {
  ASSERT_LT(depth, 20);
  for (const FolderInfo& f : store.SubFolders(folder)) {
    std::string p = path.empty() ? f.name : path + "/" + f.name;
    (*out)[p] = f;
    CollectFolders(store, f.nid, p, out, depth + 1);
  }
}

// ---- Tests

TEST(PstStoreTest, NewStoreHasTheFolderTreeOutlookExpects) {
  std::string path = TempDir("new") + "/new.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "My Export", &store).ok());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();
  ASSERT_TRUE(PstStore::Open(path, false, &store).ok());
  EXPECT_EQ(store->display_name(), "My Export");
  EXPECT_EQ(store->root_folder(), kNidRootFolder);
  std::set<std::string> root_names;
  for (const FolderInfo& f : store->SubFolders(store->root_folder())) root_names.insert(f.name);
  EXPECT_EQ(root_names, (std::set<std::string>{"Top of Personal Folders", "Search Root",
                                               "SPAM Search Folder 2"}));
  FolderInfo top;
  ASSERT_TRUE(store->GetFolder(store->top_folder(), &top).ok());
  EXPECT_EQ(top.name, "Top of Personal Folders");
  std::vector<FolderInfo> below_top = store->SubFolders(store->top_folder());
  ASSERT_EQ(below_top.size(), 1u);
  EXPECT_EQ(below_top[0].name, "Deleted Items");
  Nid deleted = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kDeletedItems, &deleted).ok());
  EXPECT_EQ(deleted, below_top[0].nid);
  // Every node a minimal store needs.
  for (Nid nid : {0x21u,   0x61u,   0x122u,  0x12Du,  0x12Eu,  0x12Fu,  0x1E1u,  0x201u,
                  0x261u,  0x60Du,  0x60Eu,  0x60Fu,  0x610u,  0x671u,  0x692u,  0x6B6u,
                  0x8022u, 0x802Du, 0x802Eu, 0x802Fu, 0x8042u, 0x804Du, 0x804Eu, 0x804Fu,
                  0x8062u, 0x806Du, 0x806Eu, 0x806Fu, 0x2223u, 0x2226u, 0x2227u, 0x2230u}) {
    EXPECT_TRUE(store->file().HasNode(nid)) << std::hex << nid;
  }
  // A read-only store cannot make the folders it lacks.
  Nid calendar = 0;
  EXPECT_EQ(store->GetDefaultFolder(DefaultFolder::kCalendar, &calendar).code(),
            Status::Code::kNotFound);
}

TEST(PstStoreTest, WrittenItemsReadBackWhole) {
  std::string path = TempDir("roundtrip") + "/rt.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "", &store).ok());
  Sample sample = WriteSample(store.get());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();

  ASSERT_TRUE(PstStore::Open(path, false, &store).ok());
  EXPECT_EQ(store->display_name(), "Personal Folders");
  std::map<std::string, FolderInfo> folders;
  CollectFolders(*store, store->top_folder(), "", &folders);
  for (const auto& [path_name, cls] : sample.folder_classes) {
    ASSERT_TRUE(folders.count(path_name)) << path_name;
    EXPECT_EQ(folders[path_name].container_class, cls) << path_name;
  }
  EXPECT_EQ(folders["Contacts"].container_class, "IPF.Contact");
  EXPECT_EQ(folders["Calendar"].container_class, "IPF.Appointment");
  EXPECT_EQ(folders["Tasks"].container_class, "IPF.Task");
  EXPECT_TRUE(folders["Projects"].has_subfolders);
  EXPECT_FALSE(folders["Inbox"].has_subfolders);

  std::map<std::string, size_t> next_in_folder;
  for (const Sample::Item& item : sample.items) {
    const FolderInfo& f = folders[item.folder_path];
    std::vector<Nid> messages = store->Messages(f.nid);
    EXPECT_EQ(f.content_count, messages.size()) << item.folder_path;
    size_t index = next_in_folder[item.folder_path]++;
    ASSERT_LT(index, messages.size()) << item.folder_path;
    Message read;
    Status s = store->ReadMessage(messages[index], &read);
    ASSERT_TRUE(s.ok()) << s.ToString();
    std::string subject = item.message.properties.String(kPidSubject).value_or("");
    ExpectMessageContains(read, item.message, subject);
    // What the store adds.
    EXPECT_GT(read.properties.Int32(kPidMessageSize).value_or(0), 0) << subject;
    ASSERT_NE(read.properties.Find(kPidCreationTime), nullptr) << subject;
    int32_t flags = read.properties.Int32(kPidMessageFlags).value_or(-1);
    EXPECT_EQ((flags & 0x10) != 0, !item.message.attachments.empty()) << subject;
    if (!item.message.properties.Find(kPidMessageFlags)) {
      EXPECT_EQ(flags & 1, 1) << subject;
    }
  }
}

TEST(PstStoreTest, ReopenedStoreAppendsAndKeepsNamedPropertyIds) {
  std::string path = TempDir("append") + "/append.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "", &store).ok());
  Nid contacts = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kContacts, &contacts).ok());
  ASSERT_TRUE(store->AddMessage(contacts, Contact(), nullptr, nullptr).ok());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();

  auto read_map = [&](NameMap* map) {
    std::unique_ptr<PstFile> file;
    ASSERT_TRUE(PstFile::Open(path, false, &file).ok());
    NodeContent node;
    ASSERT_TRUE(file->ReadNode(kNidNameToIdMap, &node).ok());
    std::vector<TaggedValue> props;
    ASSERT_TRUE(DecodePropertyContext(node, &props).ok());
    ASSERT_TRUE(NameMap::Decode(props, map).ok());
  };
  NameMap before;
  read_map(&before);
  NamedProperty email = NamedId(kPsetidAddress, kLidEmail1EmailAddress);
  uint16_t email_id = before.Find(email);
  ASSERT_GE(email_id, kFirstNamedId);

  ASSERT_TRUE(PstStore::Open(path, true, &store).ok());
  Nid again = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kContacts, &again).ok());
  EXPECT_EQ(again, contacts);
  ASSERT_TRUE(store->AddMessage(contacts, Contact(), nullptr, nullptr).ok());
  Nid calendar = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kCalendar, &calendar).ok());
  ASSERT_TRUE(store->AddMessage(calendar, Appointment(), nullptr, nullptr).ok());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();

  NameMap after;
  read_map(&after);
  EXPECT_EQ(after.Find(email), email_id);
  EXPECT_GT(after.size(), before.size());
  EXPECT_NE(after.Find(NamedId(kPsetidAppointment, kLidLocation)), 0);

  ASSERT_TRUE(PstStore::Open(path, false, &store).ok());
  ASSERT_EQ(store->Messages(contacts).size(), 2u);
  for (Nid nid : store->Messages(contacts)) {
    Message m;
    ASSERT_TRUE(store->ReadMessage(nid, &m).ok());
    ExpectMessageContains(m, Contact(), "contact");
  }
  ASSERT_EQ(store->Messages(calendar).size(), 1u);
  Message appointment;
  ASSERT_TRUE(store->ReadMessage(store->Messages(calendar)[0], &appointment).ok());
  ExpectMessageContains(appointment, Appointment(), "appointment");
}

// A store that never recorded its special folders still has them by name.
TEST(PstStoreTest, DefaultFolderReusesAFolderOfItsName) {
  std::string path = TempDir("default") + "/default.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "", &store).ok());
  Nid mine = 0;
  ASSERT_TRUE(store->AddFolder(store->top_folder(), "Tasks", "IPF.Task", &mine).ok());
  Nid tasks = 0, notes = 0, journal = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kTasks, &tasks).ok());
  EXPECT_EQ(tasks, mine);
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kNotes, &notes).ok());
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kJournal, &journal).ok());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();
  ASSERT_TRUE(PstStore::Open(path, false, &store).ok());
  // Found again through the recorded entry ids, without creating anything.
  Nid again = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kNotes, &again).ok());
  EXPECT_EQ(again, notes);
  FolderInfo info;
  ASSERT_TRUE(store->GetFolder(notes, &info).ok());
  EXPECT_EQ(info.name, "Notes");
  EXPECT_EQ(info.container_class, "IPF.StickyNote");
  ASSERT_TRUE(store->GetFolder(journal, &info).ok());
  EXPECT_EQ(info.container_class, "IPF.Journal");
  EXPECT_EQ(store->SubFolders(store->top_folder()).size(), 4u);  // with Deleted Items
}

TEST(PstStoreTest, EntryIdsNameOnlyThisStore) {
  std::string dir = TempDir("entryid");
  std::unique_ptr<PstStore> a, b;
  ASSERT_TRUE(PstStore::Create(dir + "/a.pst", "", &a).ok());
  ASSERT_TRUE(PstStore::Create(dir + "/b.pst", "", &b).ok());
  Bytes id = a->EntryId(0x200024);
  ASSERT_EQ(id.size(), 24u);
  Nid nid = 0;
  EXPECT_TRUE(a->NidFromEntryId(id, &nid));
  EXPECT_EQ(nid, 0x200024u);
  EXPECT_FALSE(b->NidFromEntryId(id, &nid));
  id[0] = 1;  // flags must be zero
  EXPECT_FALSE(a->NidFromEntryId(id, &nid));
  EXPECT_FALSE(a->NidFromEntryId(ByteView(id.data(), 20), &nid));
}

TEST(PstStoreTest, DeleteMessageUpdatesTheFolder) {
  std::string path = TempDir("delete") + "/d.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "", &store).ok());
  Nid inbox = 0, first = 0, second = 0;
  ASSERT_TRUE(store->AddFolder(store->top_folder(), "Inbox", "IPF.Note", &inbox).ok());
  ASSERT_TRUE(store->AddMessage(inbox, Mail("one", "1"), &first, nullptr).ok());
  ASSERT_TRUE(store->AddMessage(inbox, Mail("two", "2"), &second, nullptr).ok());
  ASSERT_TRUE(store->Commit().ok());
  ASSERT_TRUE(store->DeleteMessage(inbox, first).ok());
  EXPECT_EQ(store->DeleteMessage(inbox, first).code(), Status::Code::kNotFound);
  ASSERT_TRUE(store->Commit().ok());
  store.reset();
  ASSERT_TRUE(PstStore::Open(path, false, &store).ok());
  EXPECT_EQ(store->Messages(inbox), std::vector<Nid>{second});
  FolderInfo info;
  ASSERT_TRUE(store->GetFolder(inbox, &info).ok());
  EXPECT_EQ(info.content_count, 1u);
  EXPECT_FALSE(store->file().HasNode(first));
}

// Damaged nodes give statuses, never crashes.
TEST(PstStoreTest, DamagedNodesAreReportedNotTrusted) {
  std::string dir = TempDir("damage");
  struct Case {
    const char* name;
    Nid nid;
    bool store_opens;
  };
  const Case cases[] = {
      {"store", kNidMessageStore, false},
      {"name map", kNidNameToIdMap, false},  // writable open refuses a map it cannot read
      {"root folder", kNidRootFolder, true},
      {"message", 0, true},
      {"contents table", 0, true},
  };
  for (const Case& c : cases) {
    std::string path = dir + "/" + std::string(c.name) + ".pst";
    Nid inbox = 0, message = 0;
    {
      std::unique_ptr<PstStore> store;
      ASSERT_TRUE(PstStore::Create(path, "", &store).ok());
      ASSERT_TRUE(store->AddFolder(store->top_folder(), "Inbox", "", &inbox).ok());
      ASSERT_TRUE(store->AddMessage(inbox, RichMail(), &message, nullptr).ok());
      ASSERT_TRUE(store->Commit().ok());
    }
    Nid victim = c.nid;
    if (std::string(c.name) == "message") victim = message;
    if (std::string(c.name) == "contents table") {
      victim = FolderTableNid(inbox, kNidTypeContentsTable);
    }
    {
      std::unique_ptr<PstFile> file;
      ASSERT_TRUE(PstFile::Open(path, true, &file).ok());
      NodeContent junk;
      junk.blocks.push_back(PatternBytes(300, 99));
      ASSERT_TRUE(file->WriteNode(victim, 0, junk).ok());
      ASSERT_TRUE(file->Commit().ok());
    }
    std::unique_ptr<PstStore> store;
    Status s = PstStore::Open(path, true, &store);
    EXPECT_EQ(s.ok(), c.store_opens) << c.name << ": " << s.ToString();
    if (!s.ok()) continue;
    // Reading walks on whatever is left.
    std::map<std::string, FolderInfo> folders;
    CollectFolders(*store, store->root_folder(), "", &folders);
    for (Nid nid : store->Messages(inbox)) {
      Message m;
      Status r = store->ReadMessage(nid, &m);
      if (nid == victim) {
        EXPECT_FALSE(r.ok()) << c.name;
      }
    }
    Message m;
    if (std::string(c.name) == "message") {
      EXPECT_FALSE(store->ReadMessage(message, &m).ok());
    }
    // Changing a folder whose table is damaged must not drop its rows.
    if (std::string(c.name) == "contents table") {
      EXPECT_FALSE(store->AddMessage(inbox, Mail("x", "y"), nullptr, nullptr).ok());
    }
  }
}

// ---- Independent readers

bool HaveTool(const std::string& name) {
  return std::system(("command -v " + name + " >/dev/null 2>&1").c_str()) == 0;
}

std::string Quote(const std::string& s) {
  std::string out = "'";
  for (char c : s) out += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return out + "'";
}

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

// The value after "Key:" and tabs in a pffexport description.
std::string Field(const std::string& text, const std::string& key) {
  std::string needle = "\n" + key + ":";
  size_t at = ("\n" + text).find(needle);
  if (at == std::string::npos) return "";
  // `at` is where "\nKey:" starts in "\n" + text, so the colon is at
  // at + key.size() in text.
  size_t start = text.find_first_not_of('\t', at + key.size() + 1);
  size_t end = text.find('\n', start);
  return start == std::string::npos ? "" : text.substr(start, end - start);
}

std::string Base64(const std::string& in) {
  static const char kAlphabet[] =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::string out;
  for (size_t i = 0; i < in.size(); i += 3) {
    uint32_t v = uint32_t(uint8_t(in[i])) << 16;
    if (i + 1 < in.size()) v |= uint32_t(uint8_t(in[i + 1])) << 8;
    if (i + 2 < in.size()) v |= uint8_t(in[i + 2]);
    out += kAlphabet[(v >> 18) & 63];
    out += kAlphabet[(v >> 12) & 63];
    out += i + 1 < in.size() ? kAlphabet[(v >> 6) & 63] : '=';
    out += i + 2 < in.size() ? kAlphabet[v & 63] : '=';
  }
  return out;
}

std::string Text(const PropertyBag& bag, uint16_t id) { return bag.String(id).value_or(""); }

// The item directories pffexport made in `folder`: <Kind><5 digits>.
std::vector<fs::path> ItemDirs(const fs::path& folder) {
  std::vector<fs::path> out;
  if (!fs::is_directory(folder)) return out;
  for (const auto& e : fs::directory_iterator(folder)) {
    std::string name = e.path().filename().string();
    if (e.is_directory() && name.size() > 5 &&
        name.find_first_not_of("0123456789", name.size() - 5) == std::string::npos &&
        std::isalpha(static_cast<unsigned char>(name[0]))) {
      out.push_back(e.path());
    }
  }
  std::sort(out.begin(), out.end());
  return out;
}

// An item's description: mail keeps it beside the body, in OutlookHeaders.txt.
std::string Description(const fs::path& item) {
  if (fs::exists(item / "OutlookHeaders.txt")) return ReadText(item / "OutlookHeaders.txt");
  std::string name = item.filename().string();
  return ReadText(item / (name.substr(0, name.size() - 5) + ".txt"));
}

// The recipients pffexport lists: (display name, type) in order.
std::vector<std::pair<std::string, std::string>> ExportedRecipients(const fs::path& item) {
  std::vector<std::pair<std::string, std::string>> out;
  std::string text = ReadText(item / "Recipients.txt");
  for (size_t at = 0; (at = text.find("Display name:", at)) != std::string::npos; ++at) {
    std::string block = text.substr(at, text.find("\n\n", at) - at);
    out.push_back({Field(block, "Display name"), Field(block, "Recipient type")});
  }
  return out;
}

// The exported attachment whose file name ends in `name`.
std::optional<Bytes> ExportedAttachment(const fs::path& item, const std::string& name) {
  if (!fs::is_directory(item / "Attachments")) return std::nullopt;
  for (const auto& e : fs::directory_iterator(item / "Attachments")) {
    std::string file = e.path().filename().string();
    if (e.is_regular_file() && file.size() >= name.size() &&
        file.compare(file.size() - name.size(), name.size(), name) == 0) {
      return ReadBytes(e.path());
    }
  }
  return std::nullopt;
}

const char* TypeName(int32_t type) {
  return type == kRecipientTo ? "To" : type == kRecipientCc ? "CC" : "BCC";
}

// Checks pffexport's item against the mail we wrote.
void CheckExportedMail(const fs::path& item, const Message& m) {
  std::string what = item.string();
  std::string description = Description(item);
  EXPECT_EQ(Field(description, "Sender name"), Text(m.properties, kPidSenderName)) << what;
  EXPECT_EQ(Field(description, "Sender email address"), Text(m.properties, kPidSenderEmailAddress))
      << what;
  std::vector<std::pair<std::string, std::string>> expected;
  for (const PropertyBag& r : m.recipients) {
    expected.push_back(
        {Text(r, kPidDisplayName), TypeName(r.Int32(kPidRecipientType).value_or(1))});
  }
  EXPECT_EQ(ExportedRecipients(item), expected) << what;
  if (const PropertyValue* html = m.properties.Find(kPidHtml)) {
    EXPECT_EQ(ReadBytes(item / "Message.html"), html->data) << what;
  } else {
    EXPECT_EQ(ReadText(item / "Message.txt"), Text(m.properties, kPidBody)) << what;
  }
  if (m.properties.Find(kPidRtfCompressed)) {
    // pffexport writes the decompressed RTF with its terminating NUL.
    EXPECT_EQ(TrimNul(ReadText(item / "Message.rtf")), kRtfText) << what;
  }
  size_t embedded = 0;
  for (const Attachment& a : m.attachments) {
    if (!a.embedded) {
      std::string name = Text(a.properties, kPidAttachLongFilename);
      std::optional<Bytes> bytes = ExportedAttachment(item, name);
      ASSERT_TRUE(bytes.has_value()) << what << ": no attachment " << name;
      EXPECT_TRUE(*bytes == a.data) << what << ": attachment " << name << " differs";
      continue;
    }
    // pffexport puts an embedded message in Attachments/Attachment<n>/<kind><n>.
    bool found = false;
    for (const auto& e : fs::directory_iterator(item / "Attachments")) {
      if (!e.is_directory()) continue;
      for (const fs::path& inner : ItemDirs(e.path())) {
        if (Field(Description(inner), "Subject") != Text(a.embedded->properties, kPidSubject)) {
          continue;
        }
        found = true;
        CheckExportedMail(inner, *a.embedded);
      }
    }
    EXPECT_TRUE(found) << what << ": embedded message " << ++embedded << " missing";
  }
}

TEST(PstStoreValidatorTest, PffexportReadsEveryFolderItemAndAttachment) {
  if (!HaveTool("pffexport") || !HaveTool("pffinfo")) GTEST_SKIP() << "pff-tools not installed";
  std::string dir = TempDir("pffexport");
  std::string path = dir + "/sample.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "Validator Store", &store).ok());
  Sample sample = WriteSample(store.get());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();

  std::string log;
  ASSERT_EQ(RunCommand("pffinfo " + Quote(path), &log), 0) << log;
  EXPECT_NE(log.find("Subtree, Wastbox, Finder"), std::string::npos) << log;
  ASSERT_EQ(RunCommand("pffexport -q -m items -f all -l " + Quote(dir + "/pff.log") + " -t " +
                           Quote(dir + "/pff") + " " + Quote(path),
                       &log),
            0)
      << log;
  std::string export_log = ReadText(dir + "/pff.log");
  EXPECT_EQ(export_log.find("Unable"), std::string::npos) << export_log;
  EXPECT_EQ(export_log.find("Skipped"), std::string::npos) << export_log;

  fs::path top = fs::path(dir) / "pff.export" / "Top of Personal Folders";
  EXPECT_TRUE(fs::is_directory(fs::path(dir) / "pff.export" / "Search Root"));
  EXPECT_TRUE(fs::is_directory(top / "Deleted Items"));
  for (const auto& [folder, cls] : sample.folder_classes) {
    EXPECT_TRUE(fs::is_directory(top / folder)) << folder;
  }
  std::map<std::string, size_t> per_folder;
  for (const Sample::Item& item : sample.items) per_folder[item.folder_path]++;
  for (const auto& [folder, count] : per_folder) {
    EXPECT_EQ(ItemDirs(top / folder).size(), count) << folder;
  }

  for (const Sample::Item& item : sample.items) {
    const Message& m = item.message;
    std::string subject = Text(m.properties, kPidSubject);
    fs::path found;
    for (const fs::path& dir_item : ItemDirs(top / item.folder_path)) {
      if (Field(Description(dir_item), "Subject") == subject) found = dir_item;
    }
    ASSERT_FALSE(found.empty()) << "pffexport lost " << subject;
    std::string cls = Text(m.properties, kPidMessageClass);
    std::string description = Description(found);
    if (cls == "IPM.Note") {
      CheckExportedMail(found, m);
    } else if (cls == "IPM.Contact") {
      EXPECT_EQ(Field(description, "Given name"), "Grace");
      EXPECT_EQ(Field(description, "Surname"), "Hopper");
      EXPECT_EQ(Field(description, "Email address 1"), "grace@example.com");
    } else if (cls == "IPM.Appointment") {
      EXPECT_EQ(Field(description, "Location"), "Room 101");
      EXPECT_EQ(Field(description, "Start time"), "Jan 01, 2024 01:00:00.000000000 UTC");
      EXPECT_EQ(Field(description, "End time"), "Jan 01, 2024 02:00:00.000000000 UTC");
    } else if (cls == "IPM.Task") {
      EXPECT_EQ(Field(description, "Due date"), "Jan 02, 2024 00:00:00.000000000 UTC");
    } else if (cls == "IPM.DistList") {
      EXPECT_EQ(Field(description, "Name"), "Team list");
    }
  }
}

TEST(PstStoreValidatorTest, ReadpstReadsMailContactsAndAppointments) {
  if (!HaveTool("readpst")) GTEST_SKIP() << "readpst not installed";
  std::string dir = TempDir("readpst");
  std::string path = dir + "/sample.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "Validator Store", &store).ok());
  Sample sample = WriteSample(store.get());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();

  fs::path out = fs::path(dir) / "readpst";
  fs::create_directories(out);
  std::string log;
  ASSERT_EQ(RunCommand("readpst -D -S -b -j 0 -o " + Quote(out.string()) + " " + Quote(path), &log),
            0)
      << log;
  // readpst names the top folder after the store; tasks and distribution
  // lists are item types it does not export.
  fs::path top = out / "Validator Store";
  for (const char* folder : {"Inbox", "Projects/2024", "Contacts", "Calendar"}) {
    EXPECT_TRUE(fs::is_directory(top / folder)) << folder << "\n" << log;
  }
  auto files_in = [](const fs::path& folder) {
    std::map<std::string, std::string> files;
    if (!fs::is_directory(folder)) return files;
    for (const auto& e : fs::directory_iterator(folder)) {
      if (e.is_regular_file()) files[e.path().filename().string()] = ReadText(e.path());
    }
    return files;
  };
  for (const Sample::Item& item : sample.items) {
    const Message& m = item.message;
    std::string cls = Text(m.properties, kPidMessageClass);
    if (cls == "IPM.Task" || cls == "IPM.DistList") continue;
    std::map<std::string, std::string> files = files_in(top / item.folder_path);
    std::string subject = Text(m.properties, kPidSubject);
    std::string wanted = IsValidUtf8(subject) && subject.find('\xC3') != std::string::npos
                             ? "=?utf-8?B?" + Base64(subject) + "?="
                             : subject;
    const std::string* text = nullptr;
    std::string number;
    for (const auto& [name, content] : files) {
      bool matches =
          cls == "IPM.Note"      ? content.find("Subject: " + wanted + "\n") != std::string::npos
          : cls == "IPM.Contact" ? content.find("EMAIL:grace@example.com") != std::string::npos
                                 : content.find("SUMMARY:" + subject) != std::string::npos;
      if (matches && name.find('-') == std::string::npos) {
        text = &content;
        number = name;
      }
    }
    ASSERT_NE(text, nullptr) << "readpst lost " << subject << "\n" << log;
    if (cls == "IPM.Appointment") {
      EXPECT_NE(text->find("LOCATION:Room 101"), std::string::npos);
      EXPECT_NE(text->find("DTSTART;VALUE=DATE-TIME:20240101T010000Z"), std::string::npos);
      continue;
    }
    if (cls != "IPM.Note") continue;
    EXPECT_NE(text->find("From: \"Alice Sender\" <alice@example.com>"), std::string::npos);
    std::string to = Text(m.properties, kPidDisplayTo);
    if (!to.empty()) {
      EXPECT_NE(text->find("To: " + to + "\n"), std::string::npos) << *text;
    }
    std::string cc = Text(m.properties, kPidDisplayCc);
    if (!cc.empty()) {
      EXPECT_NE(text->find("Cc: " + cc + "\n"), std::string::npos) << *text;
    }
    std::string body = Text(m.properties, kPidBody);
    std::string first_line = body.substr(0, body.find('\r'));
    EXPECT_NE(text->find(first_line), std::string::npos) << *text;
    if (m.properties.Find(kPidHtml)) {
      EXPECT_NE(text->find(kHtmlText), std::string::npos);
    }
    for (const Attachment& a : m.attachments) {
      if (a.embedded) {
        EXPECT_NE(text->find("Subject: " + Text(a.embedded->properties, kPidSubject)),
                  std::string::npos);
        EXPECT_NE(text->find(Text(a.embedded->properties, kPidBody)), std::string::npos);
        continue;
      }
      std::string name = number + "-" + Text(a.properties, kPidAttachLongFilename);
      ASSERT_TRUE(files.count(name)) << name;
      EXPECT_TRUE(Bytes(files[name].begin(), files[name].end()) == a.data) << name;
    }
  }
}

// A folder whose tables outgrow one heap page, filled over two commits.
TEST(PstStoreValidatorTest, LargeFolderReadsBackEverywhere) {
  constexpr int kPerCommit = 400;
  std::string dir = TempDir("large");
  std::string path = dir + "/large.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "", &store).ok());
  Nid folder = 0;
  ASSERT_TRUE(store->AddFolder(store->top_folder(), "Bulk", "IPF.Note", &folder).ok());
  std::vector<Nid> added;
  for (int round = 0; round < 2; ++round) {
    for (int i = 0; i < kPerCommit; ++i) {
      std::string n = std::to_string(round * kPerCommit + i);
      Message m = Mail("Bulk " + n, "body " + n);
      m.recipients.push_back(Recipient(kRecipientTo, "R" + n, "r" + n + "@example.com"));
      Nid nid = 0;
      ASSERT_TRUE(store->AddMessage(folder, m, &nid, nullptr).ok());
      added.push_back(nid);
    }
    ASSERT_TRUE(store->Commit().ok());
  }
  store.reset();
  ASSERT_TRUE(PstStore::Open(path, false, &store).ok());
  EXPECT_EQ(store->Messages(folder), added);
  FolderInfo info;
  ASSERT_TRUE(store->GetFolder(folder, &info).ok());
  EXPECT_EQ(info.content_count, added.size());
  Message last;
  ASSERT_TRUE(store->ReadMessage(added.back(), &last).ok());
  EXPECT_EQ(Text(last.properties, kPidSubject), "Bulk " + std::to_string(2 * kPerCommit - 1));

  if (HaveTool("pffexport")) {
    std::string log;
    ASSERT_EQ(
        RunCommand("pffexport -q -m items -f text -t " + Quote(dir + "/pff") + " " + Quote(path),
                   &log),
        0)
        << log;
    EXPECT_EQ(ItemDirs(fs::path(dir) / "pff.export" / "Top of Personal Folders" / "Bulk").size(),
              added.size());
  }
  if (HaveTool("readpst")) {
    std::string log;
    fs::create_directories(dir + "/readpst");
    ASSERT_EQ(RunCommand("readpst -S -j 0 -o " + Quote(dir + "/readpst") + " " + Quote(path), &log),
              0)
        << log;
    size_t files = 0;
    for (const auto& e :
         fs::directory_iterator(fs::path(dir) / "readpst" / "Personal Folders" / "Bulk")) {
      files += e.is_regular_file() ? 1 : 0;
    }
    EXPECT_EQ(files, added.size());
  }
}

// ---- The name-to-id map on its own

TEST(NameMapTest, AppendsAfterExistingMappingsAndSurvivesEncoding) {
  NameMap map;
  NamedProperty a = NamedId(kPsetidAddress, 0x8083);
  NamedProperty b = NamedString(kPsPublicStrings, "Keywords");
  NamedProperty c = NamedId(kPsMapi, 0x1234);
  NamedProperty d = NamedString(kPsetidCommon, "x-custom-\xC3\xA9");
  EXPECT_EQ(map.FindOrAdd(a), 0x8000);
  EXPECT_EQ(map.FindOrAdd(b), 0x8001);
  EXPECT_EQ(map.FindOrAdd(a), 0x8000);
  EXPECT_EQ(map.FindOrAdd(c), 0x8002);
  EXPECT_TRUE(map.changed());

  NameMap decoded;
  ASSERT_TRUE(NameMap::Decode(map.Encode(), &decoded).ok());
  EXPECT_FALSE(decoded.changed());
  EXPECT_EQ(decoded.Find(a), 0x8000);
  EXPECT_EQ(decoded.Find(b), 0x8001);
  EXPECT_EQ(decoded.Find(c), 0x8002);
  EXPECT_EQ(decoded.FindOrAdd(d), 0x8003);
  ASSERT_NE(decoded.Lookup(0x8003), nullptr);
  EXPECT_EQ(decoded.Lookup(0x8003)->name, d.name);

  // Every mapping sits in the bucket its hash names, once.
  NameMap again;
  ASSERT_TRUE(NameMap::Decode(decoded.Encode(), &again).ok());
  size_t records = 0;
  for (const TaggedValue& p : decoded.Encode()) {
    if (TagId(p.tag) >= 0x1000 && TagId(p.tag) < 0x2000) records += p.value.data.size() / 8;
  }
  EXPECT_EQ(records, 4u);
  EXPECT_EQ(again.Find(d), 0x8003);
}

TEST(NameMapTest, DamagedStreamsKeepWhatCanBeRead) {
  NameMap map;
  map.FindOrAdd(NamedId(kPsetidAddress, 0x8083));
  map.FindOrAdd(NamedString(kPsetidCommon, "name"));
  std::vector<TaggedValue> props = map.Encode();
  struct Case {
    const char* what;
    uint16_t id;
    Bytes data;
  };
  const Case cases[] = {
      {"guid stream cut", 0x0002, Bytes(5, 0)},
      {"string stream empty", 0x0004, Bytes()},
      {"entry stream odd", 0x0003, Bytes{0x83, 0x80, 0, 0, 0x07, 0, 0, 0, 1, 2, 3}},
      {"string offset far", 0x0003, Bytes{0xFF, 0xFF, 0xFF, 0x7F, 0x07, 0, 1, 0}},
  };
  for (const Case& c : cases) {
    std::vector<TaggedValue> damaged = props;
    for (TaggedValue& p : damaged) {
      if (TagId(p.tag) == c.id) p.value.data = c.data;
    }
    NameMap out;
    EXPECT_FALSE(NameMap::Decode(damaged, &out).ok()) << c.what;
    // New names never take an index a damaged record holds.
    uint16_t id = out.FindOrAdd(NamedId(kPsetidTask, 0x8101));
    EXPECT_GE(id, kFirstNamedId) << c.what;
    NameMap reread;
    NameMap::Decode(out.Encode(), &reread);
    EXPECT_EQ(reread.Find(NamedId(kPsetidTask, 0x8101)), id) << c.what;
  }
}

}  // namespace
}  // namespace tarnwell::mapi::pst
