// Mailboxes as Exchange 2013-2019 servers write them: the same content in
// both code-5 layouts must decode to the same records, named properties by
// meaning; and the pieces of the server layout (recipient lists, sub-object
// lists, named-property maps) must hold up against damage.
#include <gtest/gtest.h>

#include <sstream>

#include "store/modern_store.h"
#include "store/named_property_map.h"
#include "store/recipient_list.h"
#include "store/store_test_support.h"
#include "store/subobjects_blob.h"
#include "testing/exchange/modern_store_builder.h"
#include "testing/exchange/real_blob_encoder.h"

namespace tarnwell::store {
namespace {

namespace fx = forge::exchange;
using Store = test_support::OpenedStore<ModernStore>;
using test_support::Cat;

// A later-2013 mailbox store in the documented or the server layout.
void Open(bool real_layout, Store* s) {
  fx::ModernStoreOptions options;
  options.later_2013_variant = true;
  options.real_layout = real_layout;
  const Status built = fx::BuildModernStore(options, s->path(), &s->manifest);
  ASSERT_TRUE(built.ok()) << built.ToString();
  ASSERT_TRUE(s->Open(engine::kExchange2013, ScanMode::kStandard));
  EXPECT_TRUE(s->walked_mailboxes && s->walked_folders);
}

std::string Time(const FileTime& t) { return t ? std::to_string(*t) : "-"; }

std::string Strings(const std::map<std::string, std::string>& m) {
  std::string out;
  for (const auto& [k, v] : m) out += k + "=" + v + ",";
  return out;
}

// Every field the documented layout can carry, as one text.
std::string Describe(const MessageSummary& s, DecodePurpose purpose, const ItemRecords& r,
                     const std::vector<AttachmentRecord>& attachments) {
  std::ostringstream o;
  o << s.subject << "|" << s.sender << "|" << s.to << "|" << s.cc << "|" << s.message_class << "|"
    << s.created << "|" << s.modified << "|" << s.received << "|" << s.flags_text << "|"
    << s.importance << "|" << int(s.has_attachments) << "|purpose " << int(purpose) << "\n";
  const MessageRecord& m = r.message;
  o << "body " << ByteView(m.body).ToString() << "|" << m.body_is_text << "|" << m.body_type << "|"
    << Time(m.creation_time) << "|" << m.transport_headers << "|" << Strings(m.strings) << "\n";
  const AppointmentRecord& a = r.appointment;
  o << "appointment " << Time(a.start_time) << "|" << Time(a.end_time) << "|" << a.s810c << "|"
    << a.value << "|" << a.body_text << "|" << Strings(a.strings) << "\n";
  const TaskRecord& t = r.task;
  o << "task " << Time(t.times[0]) << "|" << Time(t.times[1]) << "|" << t.s814a << "|" << t.value
    << "|" << t.flag << "|" << t.priority << "|" << t.body_text << "\n";
  o << "contact " << Strings(r.contact.strings) << "|" << Time(r.contact.birthday) << "\n";
  for (const AttachmentRecord& at : attachments) {
    o << "attachment " << at.name << "|" << fx::Sha256Hex(ByteView(at.data)) << "\n";
  }
  return o.str();
}

TEST(RealLayoutTest, BothLayoutsDecodeToTheSameRecords) {
  Store documented("tarnwell-real"), real("tarnwell-real");
  ASSERT_NO_FATAL_FAILURE(Open(false, &documented));
  ASSERT_NO_FATAL_FAILURE(Open(true, &real));
  ASSERT_TRUE(real.manifest.real_layout);
  size_t compared = 0;
  bool saw_members = false, saw_percent = false, saw_gender = false, saw_end = false;
  for (const fx::ManifestFolder& f : real.manifest.folders) {
    if (f.items.empty()) continue;
    SCOPED_TRACE(f.name);
    const auto* shown_a = documented.tree.Find(f.path);
    const auto* shown_b = real.tree.Find(f.path);
    ASSERT_TRUE(shown_a && shown_b);
    const FolderRef* a = &shown_a->ref;
    const FolderRef* b = &shown_b->ref;
    const std::vector<MessageSummary> rows_a = documented.store->ListFolder(*a);
    const std::vector<MessageSummary> rows_b = real.store->ListFolder(*b);
    ASSERT_EQ(rows_a.size(), rows_b.size());
    ASSERT_EQ(rows_b.size(), f.items.size());
    for (size_t i = 0; i < rows_a.size(); ++i) {
      const fx::ManifestItem& want = f.items[i];
      SCOPED_TRACE(want.subject);
      DecodePurpose pa, pb;
      std::optional<ItemRecords> ra = documented.store->OpenMessage(*a, rows_a[i].message_key, &pa);
      std::optional<ItemRecords> rb = real.store->OpenMessage(*b, rows_b[i].message_key, &pb);
      ASSERT_TRUE(ra && rb);
      EXPECT_EQ(
          Describe(rows_a[i], pa, *ra,
                   documented.store->ListAttachments(*a, rows_a[i].message_key)),
          Describe(rows_b[i], pb, *rb, real.store->ListAttachments(*b, rows_b[i].message_key)));
      ++compared;
      // What only the server layout holds, against what was written.
      EXPECT_EQ(ByteView(want.key).ToString(),
                ByteView(reinterpret_cast<const uint8_t*>(&rows_b[i].message_key), 8).ToString());
      if (!want.members.empty()) {
        ASSERT_EQ(rb->message.members.size(), want.members.size());
        for (size_t k = 0; k < want.members.size(); ++k) {
          EXPECT_EQ(rb->message.members[k].display_name, want.members[k].name);
          EXPECT_EQ(rb->message.members[k].email_address, want.members[k].address);
        }
        saw_members = true;
      }
      if (want.doubles.count("D8121")) {
        EXPECT_EQ(rb->task.percent_complete, want.doubles.at("D8121"));
        saw_percent = true;
      }
      if (want.numbers.count("I3a4d")) {
        EXPECT_EQ(rb->contact.gender, want.numbers.at("I3a4d"));
        saw_gender = true;
      }
      if (want.times.count("T8198")) {
        // The mailbox's unknown named property at 0x8198 is not the end.
        EXPECT_EQ(rb->appointment.end_time, want.times.at("T8198"));
        saw_end = true;
      }
      if (!want.cc.empty()) {
        const std::vector<Recipient> recipients = real.store->Recipients(*b, rows_b[i].message_key);
        EXPECT_EQ(RecipientLine(recipients, kRecipientCc), want.cc);
        EXPECT_EQ(RecipientLine(recipients, kRecipientTo), want.to);
      }
    }
  }
  EXPECT_GT(compared, 30u);
  EXPECT_TRUE(saw_members && saw_percent && saw_gender && saw_end);
}

// Recipient blobs packed in frames of any kind.
Bytes RecipientBlob(uint32_t type, const std::string& name) {
  fx::RealBlobEncoder e;
  e.AddInt32(0x0C15, int32_t(type));
  e.AddString(0x3001, name);
  e.AddString(0x3002, "SMTP");
  e.AddString(0x3003, "x@example.org");
  return e.Finish(nullptr);
}

TEST(RecipientListTest, EveryBlobIsFoundWhateverTheFrame) {
  const Bytes to = RecipientBlob(kRecipientTo, "Anna"), cc = RecipientBlob(kRecipientCc, "Ben");
  // A name that holds the magic and header of another blob.
  const Bytes tricky = RecipientBlob(kRecipientCc, std::string("ProP\x00\x04\x01X", 8));
  const Bytes length = {0x20, 0, 0, 0};
  struct Case {
    const char* what;
    Bytes value;
    std::string to, cc;
  };
  const std::vector<Case> cases = {
      {"back to back", Cat({to, cc}), "Anna", "Ben"},
      {"length-framed with junk", Cat({{2, 0, 0, 0}, length, to, {0xFF, 'P'}, length, cc}), "Anna",
       "Ben"},
      {"magic inside a value", Cat({tricky, to}), "Anna", std::string("ProP\x00\x04\x01X", 8)},
      // What was read of a damaged blob is kept.
      {"last blob cut", Cat({to, Bytes(cc.begin(), cc.end() - 3)}), "Anna", "Ben"},
      {"no blob", Bytes{1, 2, 3, 'P', 'r', 'o'}, "", ""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    const std::vector<Recipient> r = ParseRecipientList(c.value);
    EXPECT_EQ(RecipientLine(r, kRecipientTo), c.to);
    EXPECT_EQ(RecipientLine(r, kRecipientCc), c.cc);
  }
  // Every cut of a list reads safely and never finds more than there is.
  const Bytes both = Cat({{2, 0, 0, 0}, to, tricky});
  for (size_t n = 0; n <= both.size(); ++n) {
    EXPECT_LE(ParseRecipientList(ByteView(both.data(), n)).size(), 2u);
  }
}

TEST(SubobjectsBlobTest, CompactIntegersUntilTheFirstStranger) {
  struct Case {
    const char* what;
    Bytes value;
    std::vector<int64_t> ids;
    bool complete;
  };
  const std::vector<Case> cases = {
      {"round trip",
       fx::EncodeCompactIntegers({0, 1, -2, 300, 70000, int64_t(1) << 40}),
       {0, 1, -2, 300, 70000, int64_t(1) << 40},
       true},
      {"int32 and int16 forms",
       {0x19, 0x05, 0x1B, 0x01, 0, 0, 0, 0x12, 0xFF, 0x7F},
       {5, 1, 0x7FFF},
       true},
      {"cut value", {0x21, 0x07, 0x23, 0x01, 0x02}, {7}, false},
      {"unknown byte", {0x21, 0x07, 0x48, 0x21, 0x08}, {7}, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    bool complete = !c.complete;
    EXPECT_EQ(ParseSubobjectIds(c.value, &complete), c.ids);
    EXPECT_EQ(complete, c.complete);
  }
}

TEST(NamedPropertyMapTest, NumbersResolveByMeaningOnly) {
  const Bytes appointment = {0x02, 0x20, 0x06, 0x00, 0x00, 0x00, 0x00, 0x00,
                             0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};
  const Bytes strings = {0x29, 0x03, 0x02, 0x00, 0x00, 0x00, 0x00, 0x00,
                         0xC0, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x46};
  NamedPropertyMap map;
  map.Add(0x8000, appointment, 0x820E, "");                                        // end time
  map.Add(0x8001, strings, 0, "Keywords");                                         // categories
  map.Add(0x8002, strings, 0, "Unknown");                                          // nothing known
  map.Add(0x8003, Bytes(appointment.begin(), appointment.end() - 1), 0x820E, "");  // bad GUID
  map.Add(0x0037, appointment, 0x820E, "");  // not a named number
  EXPECT_EQ(map.Resolve(0x8000), 0x8198);
  EXPECT_EQ(map.Resolve(0x8001), 0x8002);
  EXPECT_EQ(map.Resolve(0x8002), std::nullopt);
  EXPECT_EQ(map.Resolve(0x8003), std::nullopt);
  EXPECT_EQ(map.Resolve(0x8004), std::nullopt);
  EXPECT_EQ(map.Resolve(0x0037), 0x0037);
  // A number defined twice keeps its last meaning.
  map.Add(0x8000, strings, 0, "Unknown");
  EXPECT_EQ(map.Resolve(0x8000), std::nullopt);
}

}  // namespace
}  // namespace tarnwell::store
