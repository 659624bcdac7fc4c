#include "mapi/import/class_fillers.h"

#include <gtest/gtest.h>

#include "base/text.h"
#include "mapi/import/import_test_support.h"
#include "mapi/import/internet_message_import.h"
#include "mapi/property_tags.h"
#include "render/writer_test_support.h"
#include "store/rtf_decompressor.h"

namespace tarnwell::mapi {
namespace {

using testing::Compose;
using testing::Named;
using testing::Str;
using testing::Utc;

store::ItemRecords Records(const store::MessageRecord& message) {
  store::ItemRecords r;
  r.message = message;
  return r;
}

store::ItemRecords Records(const store::ContactRecord& contact) {
  store::ItemRecords r;
  r.contact = contact;
  return r;
}

TEST(ClassFillers, KindByClass) {
  const std::pair<const char*, FillerKind> cases[] = {
      {"IPM.Note", FillerKind::kMail},
      {"IPM.Post", FillerKind::kMail},
      {"IPM.Note.Custom", FillerKind::kMail},
      {"", FillerKind::kMail},
      {"IPM.Contact", FillerKind::kContact},
      {"IPF.Contact", FillerKind::kContact},
      {"ipm.contact", FillerKind::kMail},  // compared exactly
      {"IPM.Appointment.Private Calendar", FillerKind::kAppointment},
      {"IPM.Schedule.Meeting.Request", FillerKind::kAppointment},
      {"IPF.Task", FillerKind::kTask},
      {"IPM.DistList", FillerKind::kDistributionList},
      {"IPF.Activity", FillerKind::kJournal},
      {"IPM.StickyNote", FillerKind::kStickyNote},
  };
  for (const auto& [cls, kind] : cases) EXPECT_EQ(FillerKindFor(cls), kind) << cls;
}

TEST(ClassFillers, AbsentValuesSetNothing) {
  const store::ItemRecords records;  // everything zero, empty or absent
  const store::MessageSummary row;
  for (const char* cls : {"IPM.Note", "IPM.StickyNote", "IPM.Activity", "IPM.Task", "IPM.DistList",
                          "IPM.Appointment", "IPM.Contact"}) {
    Message m;
    FillFromRecords(records, row, cls, &m);
    EXPECT_EQ(m.properties.tagged().size(), 1u) << cls;  // the message class only
    EXPECT_TRUE(m.properties.named().empty()) << cls;
    EXPECT_EQ(Str(m.properties, kPidMessageClass), cls);
  }
}

TEST(ClassFillers, MailFromRecordAndRow) {
  render::testing::ScopedZone zone("Europe/Berlin");
  store::MessageRecord r;
  r.sensitivity = 2;
  r.internet_code_page = 1252;
  r.creation_time = Utc(1600000000);
  r.b2 = -1;
  r.b29 = 1;
  r.response_requested = 1;
  r.transport_headers = "Received: from a\r\nSubject: original\r\n";
  r.in_reply_to = "<p@example.com>";
  r.conversation_index = {1, 2, 3};
  r.strings["S70"] = "topic";
  store::MessageSummary row;
  row.importance = 2;
  row.received = "05/03/2021 14:07:09";
  row.modified = "06/03/2021 10:00:00";
  row.flags_text = "Unmodified,Attachment,";  // not read
  row.to = "Anna";
  Message m;
  // What the import left: read and with attachments, a code page of its own.
  m.properties.Set(kPidMessageFlags, PropertyValue::Int32(kMsgFlagRead | kMsgFlagHasAttach));
  m.properties.Set(kPidInternetCodepage, PropertyValue::Int32(65001));
  m.properties.Set(kPidDisplayTo, PropertyValue::Unicode(""));
  FillFromRecords(Records(r), row, "IPM.Note", &m);
  const PropertyBag& p = m.properties;
  EXPECT_EQ(p.Int32(kPidSensitivity), 2);
  EXPECT_EQ(p.Int32(kPidInternetCodepage), 65001);  // the imported HTML's own
  EXPECT_EQ(p.Find(kPidCreationTime)->AsSysTime(), r.creation_time);
  EXPECT_EQ(p.Find(kPidAlternateRecipientAllowed)->AsBool(), false);
  EXPECT_EQ(p.Find(kPidReadReceiptRequested)->AsBool(), true);
  EXPECT_EQ(p.Find(kPidResponseRequested)->AsBool(), true);
  EXPECT_EQ(Str(p, kPidTransportMessageHeaders), r.transport_headers);
  EXPECT_EQ(Str(p, kPidInReplyToId), "<p@example.com>");
  EXPECT_EQ(p.Find(kPidConversationIndex)->data, r.conversation_index);
  EXPECT_EQ(Str(p, kPidConversationTopic), "topic");
  EXPECT_EQ(p.Int32(kPidImportance), 2);
  EXPECT_EQ(p.Int32(kPidMessageFlags), kMsgFlagUnmodified | kMsgFlagHasAttach);
  EXPECT_EQ(p.Find(kPidMessageDeliveryTime)->AsSysTime(), Utc(1614949629));  // 14:07:09 CET
  EXPECT_EQ(p.Find(kPidLastModificationTime)->AsSysTime(), Utc(1615021200));
  EXPECT_EQ(Str(p, kPidDisplayTo), "Anna");
}

TEST(ClassFillers, FlagsText) {
  const std::pair<const char*, std::optional<int32_t>> flags[] = {
      {"", std::nullopt},
      {"Read,", kMsgFlagRead},
      {"Read", kMsgFlagRead},
      {"UnRead", 0},
      {"Read,Unmodified,Submit,unsent,Attachment,From Me,Associated,Resend,NR Pending,"
       "NRN pending,",
       0x3AF},
  };
  for (const auto& [text, bits] : flags) EXPECT_EQ(MessageFlagsFromText(text), bits) << text;
}

TEST(ClassFillers, DistributionList) {
  store::MessageRecord r;
  r.members = {{"Ann", "SMTP", "ann@example.com"}, {"", "", "bare@example.com"}};
  store::MessageSummary row;
  row.subject = "Team";
  Message m;
  FillFromRecords(Records(r), row, "IPF.DistList", &m);
  const PropertyBag& p = m.properties;
  EXPECT_EQ(Str(p, kPidMessageClass), "IPM.DistList");
  EXPECT_EQ(Named(p, kPsetidAddress, kLidDistributionListName)->AsString(), "Team");
  const PropertyValue* members = Named(p, kPsetidAddress, kLidDistributionListMembers);
  const PropertyValue* one_offs = Named(p, kPsetidAddress, kLidDistributionListOneOffMembers);
  ASSERT_NE(members, nullptr);
  ASSERT_NE(one_offs, nullptr);
  EXPECT_EQ(members->type, kTypeBinary | kMultiFlag);
  ASSERT_EQ(members->elements.size(), 2u);
  EXPECT_EQ(members->elements, one_offs->elements);
  const std::string second = Utf16LEToUtf8(ByteView(members->elements[1]).From(24));
  // A member without a name or type is shown by its address and taken as Internet mail.
  EXPECT_EQ(second, std::string("bare@example.com\0SMTP\0bare@example.com\0", 39));
  EXPECT_TRUE(Named(p, kPsetidAddress, kLidDistributionListChecksum));
}

TEST(ClassFillers, TaskAppointmentNoteJournal) {
  store::TaskRecord task;
  task.times[0] = Utc(1709280000);
  task.times[1] = Utc(1709917200);
  task.percent_complete = 0.25;
  task.priority = 1;
  task.body_text = "do it";
  Message t;
  FillTask(task, {}, &t);
  EXPECT_EQ(Named(t.properties, kPsetidTask, kLidTaskStartDate)->AsSysTime(), task.times[0]);
  EXPECT_EQ(Named(t.properties, kPsetidCommon, kLidCommonEnd)->AsSysTime(), task.times[1]);
  EXPECT_EQ(Named(t.properties, kPsetidTask, kLidTaskStatus)->AsInt32(), kTaskStatusInProgress);
  EXPECT_EQ(Named(t.properties, kPsetidTask, kLidTaskComplete)->AsBool(), false);
  EXPECT_EQ(t.properties.Int32(kPidPriority), 1);
  EXPECT_EQ(Str(t.properties, kPidBody), "do it");
  task.percent_complete = 1.0;
  FillTask(task, {}, &t);
  EXPECT_EQ(Named(t.properties, kPsetidTask, kLidTaskStatus)->AsInt32(), kTaskStatusComplete);

  store::AppointmentRecord a;
  a.named_time_2 = Utc(1709280000);  // stands in for both start and end
  a.value = 0;
  a.value_present = 1;  // busy status "free" is a value too
  Message ap;
  FillAppointment(a, {}, &ap);
  EXPECT_EQ(Named(ap.properties, kPsetidAppointment, kLidAppointmentStartWhole)->AsSysTime(),
            a.named_time_2);
  EXPECT_EQ(Named(ap.properties, kPsetidAppointment, kLidAppointmentDuration)->AsInt32(), 0);
  EXPECT_EQ(Named(ap.properties, kPsetidAppointment, kLidBusyStatus)->AsInt32(), 0);

  store::MessageRecord note;
  note.named_values["L8b00"] = 0;  // blue: present although zero
  note.named_values["L8b03"] = 200;
  Message n;
  FillFromRecords(Records(note), {}, "IPM.StickyNote", &n);
  EXPECT_EQ(Named(n.properties, kPsetidNote, kLidNoteColor)->AsInt32(), 0);
  EXPECT_EQ(Named(n.properties, kPsetidNote, kLidNoteHeight)->AsInt32(), 200);
  EXPECT_FALSE(Named(n.properties, kPsetidNote, kLidNoteWidth));

  store::MessageRecord log;
  log.strings["S8700"] = "Phone call";
  log.named_values["L8707"] = 15;
  Message j;
  FillFromRecords(Records(log), {}, "IPF.Activity", &j);
  EXPECT_EQ(Str(j.properties, kPidMessageClass), "IPM.Activity");
  EXPECT_EQ(Named(j.properties, kPsetidLog, kLidLogType)->AsString(), "Phone call");
  EXPECT_EQ(Named(j.properties, kPsetidLog, kLidLogDuration)->AsInt32(), 15);
}

TEST(ClassFillers, ContactStrings) {
  render::testing::ScopedZone zone("America/New_York");
  store::ContactRecord c;
  c.strings = {{"S3a06", "Ann"},      {"S3a11", "Lee"},     {"S8083", "ann@example.com"},
               {"S8005", "Lee, Ann"}, {"S8008", "unknown"}, {"MS3a58", "Kim;Sam;"},
               {"S3A17", "Engineer"}, {"Sxyz", "bad name"}, {"S3a08", ""}};
  c.birthday = Utc(315532800 + 3 * 3600);  // 1979-12-31 22:00 in New York
  c.gender = 2;
  store::MessageSummary row;
  row.subject = "Ann Lee";
  Message m;
  FillFromRecords(Records(c), row, "IPM.Contact", &m);
  const PropertyBag& p = m.properties;
  EXPECT_EQ(Str(p, kPidGivenName), "Ann");
  EXPECT_EQ(Str(p, kPidSurname), "Lee");
  EXPECT_EQ(Str(p, kPidTitle), "Engineer");
  EXPECT_EQ(p.Find(kPidBusinessTelephoneNumber), nullptr);
  EXPECT_EQ(p.Find(kPidChildrensNames)->AsStrings(), (std::vector<std::string>{"Kim", "Sam"}));
  EXPECT_EQ(Named(p, kPsetidAddress, kLidEmail1EmailAddress)->AsString(), "ann@example.com");
  EXPECT_EQ(Named(p, kPsetidAddress, kLidEmail1AddressType)->AsString(), "SMTP");
  EXPECT_EQ(Named(p, kPsetidAddress, kLidFileUnder)->AsString(), "Lee, Ann");
  EXPECT_FALSE(Named(p, kPsetidAddress, 0x8008));  // meaning unknown: left out
  EXPECT_EQ(Str(p, kPidDisplayName), "Ann Lee");
  EXPECT_EQ(p.Find(kPidBirthday)->AsSysTime(), c.birthday);
  // The local form is the local calendar date at midnight UTC.
  EXPECT_EQ(Named(p, kPsetidAddress, kLidBirthdayLocal)->AsSysTime(), Utc(315532800 - 86400));
  EXPECT_EQ(p.Find(kPidGender)->AsInt32(), 2);
}

// The composed file carries an RTF body as a part of its own, which the import compresses,
// and drops the plain body then; the filler brings the plain body back.
TEST(ClassFillers, ImportThenFillKeepsBothBodies) {
  store::MessageRecord record;
  record.body_is_text = true;
  const std::string text = "plain €";
  record.body.assign(text.begin(), text.end());
  const std::string rtf = "{\\rtf1\\ansi\\deff0{\\fonttbl{\\f0 Arial;}}\\f0 plain \\u8364?\\par }";
  record.rtf_body = Bytes(rtf.begin(), rtf.end());
  render::HeaderStrings h;
  h.subject = "both";
  Message m;
  ASSERT_TRUE(ImportInternetMessage(testing::View(Compose(record, {}, h)), &m).ok());
  auto expect_rtf = [&] {
    const ByteView compressed(m.properties.Find(kPidRtfCompressed)->data);
    EXPECT_EQ(store::CheckRtfCrc(compressed), store::RtfCrcStatus::kMatch);
    std::optional<store::RtfText> decoded = store::DecompressRtf(compressed);
    ASSERT_TRUE(decoded);
    EXPECT_TRUE(decoded->complete);
    EXPECT_EQ(decoded->body().ToString(), rtf);
  };
  expect_rtf();
  EXPECT_EQ(m.properties.Find(kPidRtfInSync)->AsBool(), true);
  EXPECT_EQ(m.properties.Find(kPidBody), nullptr);
  EXPECT_TRUE(m.attachments.empty());  // the RTF part is the body, not an attachment
  FillFromRecords(Records(record), {}, "IPM.Note", &m);
  EXPECT_EQ(Str(m.properties, kPidBody), text);
  EXPECT_EQ(Str(m.properties, kPidSubject), "both");
  expect_rtf();
}

}  // namespace
}  // namespace tarnwell::mapi
