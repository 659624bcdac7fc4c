#include "mapi/pst/pst_store.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <map>
#include <set>

#include "base/text.h"
#include "mapi/property_tags.h"
#include "mapi/pst/name_map.h"
#include "mapi/pst/property_context.h"
#include "mapi/pst/pst_test_support.h"
#include "mapi/pst/store_templates.h"
#include "mapi/pst/table_context.h"

namespace tarnwell::mapi::pst {
namespace {

namespace fs = std::filesystem;

constexpr char kRtfText[] = "{\\rtf1\\ansi\\deff0 Hello RTF body\\par}";
constexpr char kHtmlText[] = "<html><body><b>Hi</b> there</body></html>";
constexpr char kRichSubject[] = "Quarterly report \xC3\xA9t\xC3\xA9";
constexpr char kRichSubjectEncoded[] =
    "=?utf-8?B?UXVhcnRlcmx5IHJlcG9ydCDDqXTDqQ==?=";  // as readpst
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
  Bytes out(16 + body.size());
  StoreU32LE(&out[0], uint32_t(body.size() + 12));
  StoreU32LE(&out[4], uint32_t(rtf.size()));
  StoreU32LE(&out[8], kTypeLzfu);
  StoreU32LE(&out[12], crc);
  std::copy(body.begin(), body.end(), out.begin() + 16);
  return out;
}

// The mail every validator test looks at most closely.
Message RichMail() {
  Message m = Mail(kRichSubject, "Plain body line 1\r\nline 2\r\n");
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
      FileAttachment("big.bin", Pattern(150 * 1024 + 7, 42), "application/octet-stream"));
  Attachment inner;
  inner.properties.Set(kPidAttachMethod, PropertyValue::Int32(kAttachEmbeddedMessage));
  inner.properties.Set(kPidDisplayName, PropertyValue::Unicode("Forwarded note"));
  inner.embedded = std::make_unique<Message>(Mail("Inner subject", "Inner body text"));
  inner.embedded->recipients.push_back(Recipient(kRecipientTo, "Frank", "frank@example.com"));
  inner.embedded->attachments.push_back(
      FileAttachment("inner.dat", Pattern(3000, 7), "application/octet-stream"));
  m.attachments.push_back(std::move(inner));
  return m;
}

Message Contact() {
  return NewMessage(
      "IPM.Contact", "Grace Hopper",
      {{kPidDisplayName, U("Grace Hopper")},
       {kPidGivenName, U("Grace")},
       {kPidSurname, U("Hopper")},
       {kPidCompanyName, U("Navy")},
       {kPidBusinessTelephoneNumber, U("+1 555 0100")}},
      {{NamedId(kPsetidAddress, kLidFileUnder), U("Hopper, Grace")},
       {NamedId(kPsetidAddress, kLidEmail1EmailAddress), U("grace@example.com")},
       {NamedId(kPsetidAddress, kLidEmail1AddressType), U("SMTP")},
       {NamedId(kPsetidAddress, kLidEmail1DisplayName), U("Grace Hopper (grace@example.com)")},
       {NamedId(kPsetidAddress, kLidEmail1OriginalDisplayName), U("grace@example.com")}});
}

Message Appointment() {
  return NewMessage(
      "IPM.Appointment", "Design review", {{kPidBody, U("Agenda: everything")}},
      {{NamedId(kPsetidAppointment, kLidAppointmentStartWhole), Time(kJan2024 + 36'000'000'000)},
       {NamedId(kPsetidAppointment, kLidAppointmentEndWhole), Time(kJan2024 + 72'000'000'000)},
       {NamedId(kPsetidAppointment, kLidLocation), U("Room 101")},
       {NamedString(kPsPublicStrings, "Keywords"),
        PropertyValue::MultiUnicode({"review", "design"})}});
}

Message Task() {
  return NewMessage("IPM.Task", "File the taxes", {{kPidBody, U("Before April")}},
                    {{NamedId(kPsetidTask, kLidTaskStatus), PropertyValue::Int32(1)},
                     {NamedId(kPsetidTask, kLidTaskDueDate), Time(kJan2024 + 864'000'000'000)}});
}

Message DistList() {
  return NewMessage("IPM.DistList", "Team list", {{kPidDisplayName, U("Team list")}},
                    {{NamedId(kPsetidAddress, kLidDistributionListName), U("Team list")},
                     {NamedId(kPsetidAddress, kLidDistributionListOneOffMembers),
                      PropertyValue::MultiBinary({Bytes{1, 2, 3}, Bytes{4, 5, 6}})}});
}

// ---- The sample store

constexpr int kBulkPerCommit = 400;

struct Sample {
  struct Item {
    std::string folder_path;  // below the top folder, '/'-separated
    Message message;
  };
  std::vector<Item> items;
  std::map<std::string, std::string> folder_classes;  // path -> class
  std::vector<Nid> bulk;                              // the messages of "Bulk", in order
};

// Writes a store with nested folders, one of every kind of item, and a
// folder whose tables outgrow one heap page, filled over two commits.
Sample WriteSample(const std::string& path) {
  Sample sample;
  std::unique_ptr<PstStore> store;
  Status created = PstStore::Create(path, "", &store);
  if (!created.ok()) {
    ADD_FAILURE() << created.ToString();
    return sample;
  }
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
  add_folder("", "Bulk", "IPF.Note");
  for (int round = 0; round < 2; ++round) {
    for (int i = 0; i < kBulkPerCommit; ++i) {
      std::string n = std::to_string(round * kBulkPerCommit + i);
      Message m = Mail("Bulk " + n, "body " + n);
      m.recipients.push_back(Recipient(kRecipientTo, "R" + n, "r" + n + "@example.com"));
      Nid nid = 0;
      EXPECT_TRUE(store->AddMessage(folders.at("Bulk"), m, &nid, nullptr).ok());
      sample.bulk.push_back(nid);
    }
    EXPECT_TRUE(store->Commit().ok());
  }
  EXPECT_TRUE(store->Commit().ok());
  return sample;
}

std::string Text(const PropertyBag& bag, uint16_t id) { return bag.String(id).value_or(""); }

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
  std::string path = TempDir("store") + "/new.pst";
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

// Reopened, a store finds its default folders again (a folder made by name
// before the store recorded one counts), keeps its named property ids, and
// appends.
TEST(PstStoreTest, ReopenedStoreKeepsFoldersAndNamedIdsAndAppends) {
  std::string path = TempDir("append") + "/append.pst";
  std::unique_ptr<PstStore> store;
  ASSERT_TRUE(PstStore::Create(path, "", &store).ok());
  Nid mine = 0, tasks = 0, notes = 0, journal = 0, contacts = 0, calendar = 0;
  ASSERT_TRUE(store->AddFolder(store->top_folder(), "Tasks", "IPF.Task", &mine).ok());
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kTasks, &tasks).ok());
  EXPECT_EQ(tasks, mine);
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kNotes, &notes).ok());
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kJournal, &journal).ok());
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
  NameMap before, after;
  read_map(&before);
  NamedProperty email = NamedId(kPsetidAddress, kLidEmail1EmailAddress);
  uint16_t email_id = before.Find(email);
  ASSERT_GE(email_id, kFirstNamedId);

  ASSERT_TRUE(PstStore::Open(path, true, &store).ok());
  Nid again = 0;
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kContacts, &again).ok());
  EXPECT_EQ(again, contacts);
  ASSERT_TRUE(store->AddMessage(contacts, Contact(), nullptr, nullptr).ok());
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kCalendar, &calendar).ok());
  ASSERT_TRUE(store->AddMessage(calendar, Appointment(), nullptr, nullptr).ok());
  ASSERT_TRUE(store->Commit().ok());
  store.reset();
  read_map(&after);
  EXPECT_EQ(after.Find(email), email_id);
  EXPECT_GT(after.size(), before.size());
  EXPECT_NE(after.Find(NamedId(kPsetidAppointment, kLidLocation)), 0);

  ASSERT_TRUE(PstStore::Open(path, false, &store).ok());
  // Found again through the recorded entry ids, without creating anything.
  ASSERT_TRUE(store->GetDefaultFolder(DefaultFolder::kNotes, &again).ok());
  EXPECT_EQ(again, notes);
  FolderInfo info;
  ASSERT_TRUE(store->GetFolder(notes, &info).ok());
  EXPECT_EQ(info.name, "Notes");
  EXPECT_EQ(info.container_class, "IPF.StickyNote");
  ASSERT_TRUE(store->GetFolder(journal, &info).ok());
  EXPECT_EQ(info.container_class, "IPF.Journal");
  // Deleted Items, Tasks, Notes, Journal, Contacts and Calendar.
  EXPECT_EQ(store->SubFolders(store->top_folder()).size(), 6u);
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
  enum Victim { kFixedNode, kMessage, kContentsTable };
  const struct {
    const char* name;
    Victim victim;
    Nid nid;
    bool store_opens;
  } cases[] = {
      {"store", kFixedNode, kNidMessageStore, false},
      {"name map", kFixedNode, kNidNameToIdMap,
       false},  // writable open refuses a map it cannot read
      {"root folder", kFixedNode, kNidRootFolder, true},
      {"message", kMessage, 0, true},
      {"contents table", kContentsTable, 0, true},
  };
  std::string dir = TempDir("damage");
  for (const auto& c : cases) {
    std::string path = dir + "/" + c.name + ".pst";
    Nid inbox = 0, message = 0;
    std::unique_ptr<PstStore> store;
    ASSERT_TRUE(PstStore::Create(path, "", &store).ok());
    ASSERT_TRUE(store->AddFolder(store->top_folder(), "Inbox", "", &inbox).ok());
    ASSERT_TRUE(store->AddMessage(inbox, RichMail(), &message, nullptr).ok());
    ASSERT_TRUE(store->Commit().ok());
    store.reset();
    Nid victim = c.victim == kMessage         ? message
                 : c.victim == kContentsTable ? FolderTableNid(inbox, kNidTypeContentsTable)
                                              : c.nid;
    {
      std::unique_ptr<PstFile> file;
      ASSERT_TRUE(PstFile::Open(path, true, &file).ok());
      NodeContent junk;
      junk.blocks.push_back(Pattern(300, 99));
      ASSERT_TRUE(file->WriteNode(victim, 0, junk).ok());
      ASSERT_TRUE(file->Commit().ok());
    }
    Status s = PstStore::Open(path, true, &store);
    EXPECT_EQ(s.ok(), c.store_opens) << c.name << ": " << s.ToString();
    if (!s.ok()) continue;
    // Reading walks on whatever is left.
    std::map<std::string, FolderInfo> folders;
    CollectFolders(*store, store->root_folder(), "", &folders);
    Message m;
    for (Nid nid : store->Messages(inbox)) {
      Status r = store->ReadMessage(nid, &m);
      if (nid == victim) {
        EXPECT_FALSE(r.ok()) << c.name;
      }
    }
    if (c.victim == kMessage) {
      EXPECT_FALSE(store->ReadMessage(message, &m).ok());
    }
    // Changing a folder whose table is damaged must not drop its rows.
    if (c.victim == kContentsTable) {
      EXPECT_FALSE(store->AddMessage(inbox, Mail("x", "y"), nullptr, nullptr).ok());
    }
  }
}

// ---- Independent readers

// Checks pffexport's item against the mail we wrote: what CompareItem
// checks, and senders, recipient types, bodies and attachment names.
void CheckExportedMail(const ExportedItem& item, const Message& m) {
  std::string what = Text(m.properties, kPidSubject);
  CompareItem(m, item, "pffexport");
  for (auto [id, key] : {std::pair{kPidSenderName, "Sender name"},
                         std::pair{kPidSenderEmailAddress, "Sender email address"}}) {
    EXPECT_EQ(Field(item.description, key), Text(m.properties, id)) << what;
  }
  for (size_t i = 0; i < m.recipients.size() && i < item.recipients.size(); ++i) {
    int32_t type = m.recipients[i].Int32(kPidRecipientType).value_or(kRecipientTo);
    EXPECT_EQ(item.recipients[i].at("Recipient type"), type == kRecipientTo   ? "To"
                                                       : type == kRecipientCc ? "CC"
                                                                              : "BCC")
        << what;
  }
  auto file = [&](const std::string& name) {
    auto it = item.files.find(name);
    return it == item.files.end() ? std::string()
                                  : std::string(it->second.begin(), it->second.end());
  };
  if (const PropertyValue* html = m.properties.Find(kPidHtml)) {
    EXPECT_EQ(file("Message.html"), std::string(html->data.begin(), html->data.end())) << what;
  } else {
    EXPECT_EQ(file("Message.txt"), Text(m.properties, kPidBody)) << what;
  }
  if (m.properties.Find(kPidRtfCompressed)) {
    // pffexport writes the decompressed RTF with its terminating NUL.
    EXPECT_EQ(TrimNul(file("Message.rtf")), kRtfText) << what;
  }
  for (const Attachment& a : m.attachments) {
    if (!a.embedded) {
      std::string name = "_" + Text(a.properties, kPidAttachLongFilename);
      EXPECT_TRUE(std::any_of(item.attachments.begin(), item.attachments.end(),
                              [&](auto& e) {
                                return e.first.size() > name.size() && e.first.ends_with(name) &&
                                       e.second == a.data;
                              }))
          << what << ": no attachment " << name;
      continue;
    }
    bool found = false;
    for (const ExportedItem& inner : item.embedded) {
      if (Field(inner.description, "Subject") == Text(a.embedded->properties, kPidSubject)) {
        found = true;
        CheckExportedMail(inner, *a.embedded);
      }
    }
    EXPECT_TRUE(found) << what << ": embedded message missing";
  }
}

void CheckPffexport(const std::string& dir, const std::string& path, const Sample& sample) {
  std::string log;
  ASSERT_EQ(RunCommand("pffinfo " + Quote(path), &log), 0) << log;
  EXPECT_NE(log.find("Subtree, Wastbox, Finder"), std::string::npos) << log;
  ExportedFolder root;
  ASSERT_TRUE(PffExport(path, dir, &root, &log)) << log;
  EXPECT_EQ(root.log.find("Unable"), std::string::npos) << root.log;
  EXPECT_TRUE(root.skipped_classes.empty()) << root.log;
  EXPECT_TRUE(root.folders.count("Search Root"));
  const ExportedFolder& top = root.folders["Top of Personal Folders"];
  EXPECT_TRUE(top.folders.count("Deleted Items"));
  // Folder paths below the top folder, as pffexport laid them out.
  std::map<std::string, const ExportedFolder*> folders;
  std::vector<std::pair<std::string, const ExportedFolder*>> walk = {{"", &top}};
  while (!walk.empty()) {
    auto [path_name, folder] = walk.back();
    walk.pop_back();
    for (const auto& [name, sub] : folder->folders) {
      std::string p = path_name.empty() ? name : path_name + "/" + name;
      folders[p] = &sub;
      walk.push_back({p, &sub});
    }
  }
  std::map<std::string, size_t> per_folder;
  for (const auto& [folder, cls] : sample.folder_classes) per_folder[folder] = 0;
  per_folder["Bulk"] = sample.bulk.size();
  for (const Sample::Item& item : sample.items) per_folder[item.folder_path]++;
  for (const auto& [folder, count] : per_folder) {
    ASSERT_TRUE(folders.count(folder)) << folder;
    EXPECT_EQ(folders[folder]->items.size(), count) << folder;
  }
  for (const Sample::Item& item : sample.items) {
    const Message& m = item.message;
    std::string subject = Text(m.properties, kPidSubject);
    const ExportedItem* found = nullptr;
    for (const ExportedItem& e : folders[item.folder_path]->items) {
      if (Field(e.description, "Subject") == subject) found = &e;
    }
    ASSERT_NE(found, nullptr) << "pffexport lost " << subject;
    std::string cls = Text(m.properties, kPidMessageClass);
    const std::string& description = found->description;
    if (cls == "IPM.Note") {
      CheckExportedMail(*found, m);
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

void CheckReadpst(const std::string& dir, const std::string& path, const Sample& sample) {
  fs::path out = fs::path(dir) / "readpst";
  fs::create_directories(out);
  std::string log;
  ASSERT_EQ(RunCommand("readpst -D -S -b -j 0 -o " + Quote(out.string()) + " " + Quote(path), &log),
            0)
      << log;
  // readpst names the top folder after the store; tasks and distribution
  // lists are item types it does not export.
  fs::path top = out / "Personal Folders";
  auto files_in = [](const fs::path& folder) {
    std::map<std::string, std::string> files;
    if (!fs::is_directory(folder)) return files;
    for (const auto& e : fs::directory_iterator(folder)) {
      if (e.is_regular_file()) files[e.path().filename().string()] = ReadText(e.path());
    }
    return files;
  };
  EXPECT_EQ(files_in(top / "Bulk").size(), sample.bulk.size()) << log;
  for (const Sample::Item& item : sample.items) {
    const Message& m = item.message;
    std::string cls = Text(m.properties, kPidMessageClass);
    if (cls == "IPM.Task" || cls == "IPM.DistList") continue;
    std::map<std::string, std::string> files = files_in(top / item.folder_path);
    std::string subject = Text(m.properties, kPidSubject);
    std::string wanted = subject == kRichSubject ? kRichSubjectEncoded : subject;
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
    for (auto [id, header] : {std::pair{kPidDisplayTo, "To: "}, std::pair{kPidDisplayCc, "Cc: "}}) {
      std::string value = Text(m.properties, id);
      if (!value.empty()) {
        EXPECT_NE(text->find(header + value + "\n"), std::string::npos) << *text;
      }
    }
    std::string body = Text(m.properties, kPidBody);
    EXPECT_NE(text->find(body.substr(0, body.find('\r'))), std::string::npos) << *text;
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

// The sample, with a folder whose tables outgrow one heap page, reads back
// whole in our reader, and pffexport and readpst read every folder, item and
// attachment of it.
TEST(PstStoreTest, WrittenItemsReadBackWholeHereAndElsewhere) {
  std::string dir = TempDir("sample");
  std::string path = dir + "/sample.pst";
  Sample sample = WriteSample(path);
  std::unique_ptr<PstStore> store;
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
    std::string subject = Text(item.message.properties, kPidSubject);
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
  EXPECT_EQ(store->Messages(folders["Bulk"].nid), sample.bulk);
  EXPECT_EQ(folders["Bulk"].content_count, sample.bulk.size());
  Message last;
  ASSERT_TRUE(store->ReadMessage(sample.bulk.back(), &last).ok());
  EXPECT_EQ(Text(last.properties, kPidSubject), "Bulk " + std::to_string(2 * kBulkPerCommit - 1));

  if (HaveTool("pffexport") && HaveTool("pffinfo")) CheckPffexport(dir, path, sample);
  if (HaveTool("readpst")) CheckReadpst(dir, path, sample);
}

// ---- The name-to-id map on its own

TEST(NameMapTest, AppendsAfterExistingMappingsAndSurvivesEncoding) {
  const NamedProperty names[] = {
      NamedId(kPsetidAddress, 0x8083), NamedString(kPsPublicStrings, "Keywords"),
      NamedId(kPsMapi, 0x1234), NamedString(kPsetidCommon, "x-custom-\xC3\xA9")};
  const NamedProperty& d = names[3];
  NameMap map;
  for (uint16_t i = 0; i < 3; ++i) EXPECT_EQ(map.FindOrAdd(names[i]), 0x8000 + i);
  EXPECT_EQ(map.FindOrAdd(names[0]), 0x8000);
  EXPECT_TRUE(map.changed());

  NameMap decoded;
  ASSERT_TRUE(NameMap::Decode(map.Encode(), &decoded).ok());
  EXPECT_FALSE(decoded.changed());
  for (uint16_t i = 0; i < 3; ++i) EXPECT_EQ(decoded.Find(names[i]), 0x8000 + i);
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
