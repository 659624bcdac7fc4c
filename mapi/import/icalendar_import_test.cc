#include "mapi/import/icalendar_import.h"

#include <gtest/gtest.h>

#include <algorithm>

#include "mapi/import/import_test_support.h"
#include "mapi/property_tags.h"
#include "render/ical_writer.h"
#include "render/writer_test_support.h"

namespace tarnwell::mapi {
namespace {

using testing::NamedInt;
using testing::NamedTime;
using testing::Str;
using testing::Utc;

Message Import(std::string_view text) {
  Message m;
  Status s = ImportICalendar(text, &m);
  EXPECT_TRUE(s.ok()) << s.message();
  return m;
}

// Summer time in Berlin begins on the last Sunday of March and ends on the last Sunday of
// October.
constexpr char kBerlinZone[] =
    "BEGIN:VTIMEZONE\r\nTZID:W. Europe\r\n"
    "BEGIN:STANDARD\r\nDTSTART:16011028T030000\r\nTZOFFSETFROM:+0200\r\nTZOFFSETTO:+0100\r\n"
    "RRULE:FREQ=YEARLY;BYDAY=-1SU;BYMONTH=10\r\nEND:STANDARD\r\n"
    "BEGIN:DAYLIGHT\r\nDTSTART:16010325T020000\r\nTZOFFSETFROM:+0100\r\nTZOFFSETTO:+0200\r\n"
    "RRULE:FREQ=YEARLY;BYDAY=-1SU;BYMONTH=3\r\nEND:DAYLIGHT\r\n"
    "END:VTIMEZONE\r\n";

std::string Event(std::string_view body) {
  return std::string("BEGIN:VCALENDAR\r\nVERSION:2.0\r\n") + kBerlinZone + "BEGIN:VEVENT\r\n" +
         std::string(body) + "END:VEVENT\r\nEND:VCALENDAR\r\n";
}

// ---- What the iCalendar writer writes comes back

class ICalRoundTrip : public ::testing::TestWithParam<const char*> {};

TEST_P(ICalRoundTrip, TimesAndFields) {
  render::testing::ScopedZone zone(GetParam());
  store::AppointmentRecord r;
  r.start_time = Utc(1720000800);  // 2024-07-03 10:00:00 UTC
  r.end_time = Utc(1720000800 + 5400);
  r.creation_time = Utc(1719000000);
  r.body_text = "Agenda:\r\n1. one; 2. two";
  r.value = 3;
  r.value_present = 1;
  render::AppointmentItem item;
  item.subject = "Planung Übersicht";
  item.organizer = "boss@example.com";
  item.importance = 2;
  for (bool utf8 : {true, false}) {
    SCOPED_TRACE(utf8 ? "UTF-8" : "windows-1252");
    const Message m = Import(render::ComposeICalendar(r, item, render::TextMode{utf8, 1252}));
    const PropertyBag& p = m.properties;
    testing::ExpectStrings(p, {{kPidMessageClass, "IPM.Appointment"},
                               {kPidSubject, item.subject},
                               {kPidBody, r.body_text},
                               {kPidSentRepresentingEmailAddress, "boss@example.com"}});
    EXPECT_EQ(NamedTime(p, kPsetidAppointment, kLidAppointmentStartWhole), r.start_time);
    EXPECT_EQ(NamedTime(p, kPsetidAppointment, kLidAppointmentEndWhole), r.end_time);
    EXPECT_EQ(NamedTime(p, kPsetidCommon, kLidCommonStart), r.start_time);
    EXPECT_EQ(NamedTime(p, kPsetidCommon, kLidCommonEnd), r.end_time);
    EXPECT_EQ(NamedInt(p, kPsetidAppointment, kLidAppointmentDuration), 90);
    EXPECT_EQ(NamedInt(p, kPsetidAppointment, kLidBusyStatus), 3);
    EXPECT_EQ(p.Int32(kPidImportance), kImportanceHigh);
    EXPECT_EQ(p.Find(kPidCreationTime)->AsSysTime(), r.creation_time);
    ASSERT_EQ(m.recipients.size(), 1u);
    EXPECT_EQ(m.recipients[0].Int32(kPidRecipientFlags),
              kRecipientFlagSendable | kRecipientFlagOrganizer);
  }
}

// The writer writes local time without a zone; the import must read it in the same zone.
INSTANTIATE_TEST_SUITE_P(ICalendarImport, ICalRoundTrip,
                         ::testing::Values("UTC", "Europe/Berlin", "America/New_York",
                                           "Asia/Kolkata"),
                         [](const auto& info) {
                           std::string name = info.param;
                           std::replace(name.begin(), name.end(), '/', '_');
                           return name;
                         });

// ---- Zones, dates and people

TEST(ICalendarImport, TimeForms) {
  render::testing::ScopedZone zone("Asia/Tokyo");  // floating times are read as +0900
  const struct {
    const char* dtstart;
    int64_t unix_seconds;
  } cases[] = {
      {"DTSTART;TZID=W. Europe:20240715T100000", 1721030400},      // summer: +0200
      {"DTSTART;TZID=\"W. Europe\":20240115T100000", 1705309200},  // winter: +0100
      {"DTSTART;TZID=W. Europe:20240331T030000", 1711846800},      // first summer hour
      {"DTSTART;TZID=W. Europe:20241027T040000", 1729998000},      // back to winter
      {"DTSTART:20240715T100000Z", 1721037600},
      {"DTSTART:20240715T100000", 1721005200},                       // floating
      {"DTSTART;TZID=Nowhere/Special:20240715T100000", 1721005200},  // unknown zone: local
  };
  for (const auto& c : cases) {
    const Message m = Import(Event(std::string(c.dtstart) + "\r\n"));
    EXPECT_EQ(NamedTime(m.properties, kPsetidAppointment, kLidAppointmentStartWhole),
              Utc(c.unix_seconds))
        << c.dtstart;
  }
}

TEST(ICalendarImport, AllDayAndDurations) {
  render::testing::ScopedZone zone("UTC");
  const Message all_day = Import(Event("DTSTART;VALUE=DATE:20240301\r\n"));
  EXPECT_EQ(NamedTime(all_day.properties, kPsetidAppointment, kLidAppointmentEndWhole),
            Utc(1709251200 + 86400));
  EXPECT_EQ(
      all_day.properties.FindNamed(NamedId(kPsetidAppointment, kLidAppointmentSubType))->AsBool(),
      true);
  const Message timed = Import(Event("DTSTART:20240301T080000Z\r\nDURATION:PT1H30M\r\n"));
  EXPECT_EQ(NamedTime(timed.properties, kPsetidAppointment, kLidAppointmentEndWhole),
            Utc(1709280000 + 5400));

  const struct {
    const char* text;
    std::optional<int64_t> seconds;
  } durations[] = {{"P1D", 86400},        {"PT15M", 900},
                   {"-PT15M", -900},      {"P1W", 604800},
                   {"P1DT2H3M4S", 93784}, {"P", std::nullopt},
                   {"PT5", std::nullopt}, {"1H", std::nullopt},
                   {"P1H", std::nullopt}, {"P99999999999999999999D", std::nullopt}};
  for (const auto& d : durations) EXPECT_EQ(ParseICalDuration(d.text), d.seconds) << d.text;
}

TEST(ICalendarImport, MeetingPeopleAndStatus) {
  const Message m =
      Import(Event("DTSTART:20240301T080000Z\r\nSUMMARY:Review\r\nLOCATION:Room 1\\, floor 2\r\n"
                   "ORGANIZER;CN=\"Boss, The\":mailto:boss@example.com\r\n"
                   "ATTENDEE;ROLE=REQ-PARTICIPANT;CN=Ann:MAILTO:ann@example.com\r\n"
                   "ATTENDEE;ROLE=OPT-PARTICIPANT:mailto:opt@example.com\r\n"
                   "TRANSP:TRANSPARENT\r\nCLASS:PRIVATE\r\nPRIORITY:9\r\n"));
  const PropertyBag& p = m.properties;
  EXPECT_EQ(Str(p, kPidSentRepresentingName), "Boss, The");
  EXPECT_EQ(p.FindNamed(NamedId(kPsetidAppointment, kLidLocation))->AsString(), "Room 1, floor 2");
  ASSERT_EQ(m.recipients.size(), 3u);
  EXPECT_EQ(Str(m.recipients[1], kPidEmailAddress), "ann@example.com");
  EXPECT_EQ(m.recipients[2].Int32(kPidRecipientType), kRecipientCc);
  EXPECT_EQ(Str(p, kPidDisplayTo), "Ann");
  EXPECT_EQ(Str(p, kPidDisplayCc), "opt@example.com");
  EXPECT_EQ(NamedInt(p, kPsetidAppointment, kLidAppointmentStateFlags), kAppointmentStateMeeting);
  EXPECT_EQ(NamedInt(p, kPsetidAppointment, kLidBusyStatus), 0);  // transparent: free
  EXPECT_EQ(p.Int32(kPidSensitivity), 2);
  EXPECT_EQ(p.Int32(kPidImportance), kImportanceLow);
}

TEST(ICalendarImport, TodoBecomesTask) {
  const Message m = Import(
      "BEGIN:VCALENDAR\r\nBEGIN:VTODO\r\nSUMMARY:Write report\r\n"
      "DTSTART:20240301T080000Z\r\nDUE:20240308T170000Z\r\nSTATUS:IN-PROCESS\r\n"
      "PERCENT-COMPLETE:40\r\nEND:VTODO\r\nEND:VCALENDAR\r\n");
  const PropertyBag& p = m.properties;
  EXPECT_EQ(Str(p, kPidMessageClass), "IPM.Task");
  EXPECT_EQ(Str(p, kPidSubject), "Write report");
  EXPECT_EQ(NamedTime(p, kPsetidTask, kLidTaskStartDate), Utc(1709280000));
  EXPECT_EQ(NamedTime(p, kPsetidTask, kLidTaskDueDate), Utc(1709917200));
  EXPECT_EQ(NamedInt(p, kPsetidTask, kLidTaskStatus), kTaskStatusInProgress);
  EXPECT_DOUBLE_EQ(*p.FindNamed(NamedId(kPsetidTask, kLidPercentComplete))->AsDouble(), 0.4);
  EXPECT_EQ(p.FindNamed(NamedId(kPsetidTask, kLidTaskComplete))->AsBool(), false);

  const Message done = Import(
      "BEGIN:VCALENDAR\r\nBEGIN:VTODO\r\nSTATUS:COMPLETED\r\nCOMPLETED:20240305T120000Z\r\n"
      "END:VTODO\r\nEND:VCALENDAR\r\n");
  EXPECT_EQ(NamedInt(done.properties, kPsetidTask, kLidTaskStatus), kTaskStatusComplete);
  EXPECT_EQ(NamedTime(done.properties, kPsetidTask, kLidTaskDateCompleted), Utc(1709640000));
  EXPECT_EQ(done.properties.FindNamed(NamedId(kPsetidTask, kLidTaskComplete))->AsBool(), true);
}

TEST(ICalendarImport, DamagedInput) {
  Message m;
  EXPECT_EQ(ImportICalendar("", &m).code(), Status::Code::kCorruption);
  EXPECT_EQ(ImportICalendar("BEGIN:VCALENDAR\r\nEND:VCALENDAR\r\n", &m).code(),
            Status::Code::kCorruption);
  // Components nested far too deep are not followed; the event beside them still counts.
  std::string deep = "BEGIN:VCALENDAR\r\n";
  for (int i = 0; i < 1000; ++i) deep += "BEGIN:X\r\n";
  deep += "BEGIN:VEVENT\r\nSUMMARY:lost\r\nEND:VEVENT\r\n";
  EXPECT_EQ(ImportICalendar(deep, &m).code(), Status::Code::kCorruption);
  // Unclosed components, stray ENDs, bad times and zones: whatever can be read is kept.
  const Message odd = Import(
      "END:VEVENT\r\nBEGIN:VCALENDAR\r\nBEGIN:VTIMEZONE\r\nTZID:Z\r\nBEGIN:STANDARD\r\n"
      "DTSTART:bad\r\nTZOFFSETTO:+99\r\nRRULE:BYDAY=;BYMONTH=13\r\nEND:STANDARD\r\n"
      "BEGIN:DAYLIGHT\r\nDTSTART:20000101T000000\r\nTZOFFSETTO:+0100\r\n"
      "RRULE:FREQ=YEARLY;BYMONTH=2;BYDAY=5SU\r\n"
      "BEGIN:VEVENT\r\nSUMMARY:kept\r\nDTSTART;TZID=Z:20240230T250000\r\n"
      "DTEND;TZID=Z:20240301T100000\r\nDURATION:garbage\r\n");
  EXPECT_EQ(Str(odd.properties, kPidSubject), "kept");
  // Every prefix of a real file, and big numbers where small ones belong.
  const std::string whole = Event(
      "DTSTART;TZID=W. Europe:20240715T100000\r\nDURATION:P99999999W\r\nPRIORITY:99999999999\r\n"
      "ATTENDEE;CN=\"x:mailto:y\r\nSUMMARY:s\r\n");
  for (size_t cut = 0; cut <= whole.size(); ++cut) {
    Message part;
    ImportICalendar(std::string_view(whole).substr(0, cut), &part);
  }
  Import(
      Event("BEGIN:VTIMEZONE\r\nTZID:Q\r\nBEGIN:STANDARD\r\nDTSTART:20000101T000000\r\n"
            "TZOFFSETTO:+0100\r\nRRULE:BYMONTH=3;BYDAY=-99999999999SU;BYMONTHDAY=99\r\n"
            "END:STANDARD\r\nEND:VTIMEZONE\r\nDTSTART;TZID=Q:20240715T100000\r\n"));
  EXPECT_FALSE(NamedTime(odd.properties, kPsetidAppointment, kLidAppointmentStartWhole));
  EXPECT_TRUE(NamedTime(odd.properties, kPsetidAppointment, kLidAppointmentEndWhole));
}

}  // namespace
}  // namespace tarnwell::mapi
