#include "render/ical_writer.h"

#include <gtest/gtest.h>

#include <ctime>
#include <functional>

#include "base/date_time.h"
#include "render/writer_test_support.h"

namespace tarnwell::render {
namespace {

using testing::BerlinTest;
using testing::Codec;
using testing::ExpectWellFormedLines;
using testing::ReadBackText;
using testing::ReadWithPython;
using testing::ScopedZone;
using testing::Values;

// Prints "COMPONENT.PROPERTY[;PARAM=VALUE] TAB hex" for every property the icalendar module
// reads; times as written (a trailing Z when they are UTC), durations in seconds.
constexpr const char* kReadICalendar = R"PY(
import datetime, sys
try:
    import icalendar
except ImportError:
    sys.exit(77)
path, codec = sys.argv[1], sys.argv[2]
data = open(path, 'rb').read()
for line in data.split(b'\r\n'):
    line.decode(codec)  # every physical line stands on its own: no character is split
cal = icalendar.Calendar.from_ical(data.decode(codec))
components = list(cal.walk())
names = [c.name for c in components]
if names != ['VCALENDAR', 'VEVENT']:
    sys.exit('components: %r' % names)
for component in components:
    if component.errors:
        sys.exit('errors: %r' % component.errors)
    for name, values in component.items():
        for value in values if isinstance(values, list) else [values]:
            key = component.name + '.' + name
            for param, param_value in sorted(value.params.items()):
                key += ';%s=%s' % (param, param_value)
            if hasattr(value, 'dt'):
                dt = value.dt
                if isinstance(dt, datetime.timedelta):
                    text = 'PT%dS' % dt.total_seconds()
                else:
                    text = dt.strftime('%Y%m%dT%H%M%S') + ('Z' if dt.tzinfo else '')
            else:
                text = str(value)
            print(key + '\t' + text.encode('utf-8').hex())
)PY";

constexpr const char* kAny = "<any>";

uint64_t Utc(int year, int month, int day, int hour, int minute) {
  std::tm tm{};
  tm.tm_year = year - 1900;
  tm.tm_mon = month - 1;
  tm.tm_mday = day;
  tm.tm_hour = hour;
  tm.tm_min = minute;
  return *UnixTimeToFileTime(timegm(&tm));
}

uint64_t Local(int year, int month, int day, int hour, int minute) {
  std::tm tm{};
  tm.tm_year = year - 1900;
  tm.tm_mon = month - 1;
  tm.tm_mday = day;
  tm.tm_hour = hour;
  tm.tm_min = minute;
  tm.tm_isdst = -1;
  return *UnixTimeToFileTime(mktime(&tm));
}

std::string Repeat(std::string_view text, size_t times) {
  std::string out;
  for (size_t i = 0; i < times; ++i) out += text;
  return out;
}

// One appointment and the times a reader should find, as written in Berlin.
struct EventCase {
  const char* name;
  std::function<void(store::AppointmentRecord*, AppointmentItem*)> fill;
  const char* created;  // "" for none
  const char* start;
  const char* end;        // "" for none
  const char* duration;   // "" for none
  const char* status;     // "" for none
  const char* busy;       // "" for none
  const char* organizer;  // the address as it stands in the URI, "" for none
};

const EventCase kEventCases[] = {
    {"Full",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->creation_time = Utc(2021, 3, 1, 8, 15);
       r->start_time = Utc(2021, 3, 28, 7, 0);
       r->end_time = Utc(2021, 3, 28, 8, 30);
       r->body_text = "Agenda:\r\n1. Budget\r\n2. Plans";
       r->value = 2;
       r->value_present = 1;
       item->subject = "Quarterly planning";
       item->organizer = "boss@example.org";
       item->importance = 1;
       item->uid = "fixed-uid-1";
     },
     "20210301T081500Z", "20210328T090000", "20210328T103000", "", "CONFIRMED", "BUSY",
     "boss@example.org"},
    {"StartOnly",
     [](store::AppointmentRecord* r, AppointmentItem*) { r->start_time = Utc(2021, 1, 5, 23, 30); },
     "", "20210106T003000", "", "", "", "", ""},
    {"SecondDateField",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->named_time_2 = Utc(2021, 7, 1, 10, 0);
       item->subject = "From the second date";
       item->busy_status = "tentative";
     },
     "", "20210701T120000", "", "", "TENTATIVE", "TENTATIVE", ""},
    {"EndFromSecondDate",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->start_time = Utc(2021, 7, 1, 10, 0);
       r->named_time_2 = Utc(2021, 7, 1, 11, 0);
       item->busy_status = "OUTOFOFFICE";
     },
     "", "20210701T120000", "20210701T130000", "", "CONFIRMED", "OUTOFOFFICE", ""},
    {"NoTimesAtAll",  // an event needs a start, so it gets one
     [](store::AppointmentRecord*, AppointmentItem* item) { item->subject = "Undated"; }, "", kAny,
     "", "", "", "", ""},
    {"EndNotAfterStart",
     [](store::AppointmentRecord* r, AppointmentItem*) {
       r->start_time = Utc(2021, 7, 1, 10, 0);
       r->end_time = Utc(2021, 7, 1, 9, 0);
     },
     "", "20210701T120000", "", "", "", "", ""},
    {"ClockGoesBack",
     // 02:30 summer time to 02:30 winter time: one hour, though the clock reads the same.
     [](store::AppointmentRecord* r, AppointmentItem*) {
       r->start_time = Utc(2021, 10, 31, 0, 30);
       r->end_time = Utc(2021, 10, 31, 1, 30);
     },
     "", "20211031T023000", "", "PT3600S", "", "", ""},
    {"CreatedFromDateText",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->start_time = Utc(2021, 5, 17, 7, 30);
       item->created_text = "17/05/2021 09:30:00";
     },
     "20210517T073000Z", "20210517T093000", "", "", "", "", ""},
    {"InvalidDateText",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->start_time = Utc(2021, 5, 17, 7, 30);
       item->created_text = "Invalid DateTime";
     },
     "", "20210517T093000", "", "", "", "", ""},
    {"ImpossibleDateText",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->start_time = Utc(2021, 5, 17, 7, 30);
       item->created_text = "31/02/2021 09:30:00";
     },
     "", "20210517T093000", "", "", "", "", ""},
    {"SecondBody",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->start_time = Utc(2021, 5, 17, 7, 30);
       item->second_body = "Only the second body\r\nhas text";
     },
     "", "20210517T093000", "", "", "", "", ""},
    {"Hostile",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->start_time = Utc(2021, 5, 17, 7, 30);
       r->end_time = Utc(2021, 5, 17, 8, 30);
       // Not a backslash before 'n': the reader module of Debian 12 takes the written "\\n"
       // for an escaped backslash and a line break (content_line_test checks that case).
       r->body_text = "a;b,c\\d\r\nEND:VEVENT\r\nBEGIN:VEVENT\r\nDTSTART:19700101T000000\n\r\x01" +
                      Repeat("\\x;,", 40);
       item->subject = "Re: a;b,c\\d\r\nEND:VCALENDAR\r\n";
       item->organizer = "x@y.z\r\nATTENDEE:evil@example.org \"q\"%";
       item->busy_status = "weird;status,\r\nX-EVIL:1";
       item->importance = 0xFFFFFFFF;
     },
     "", "20210517T093000", "20210517T103000", "", "", "weird;status,\nX-EVIL:1",
     "x@y.z%0D%0AATTENDEE:evil@example.org%20%22q%22%25"},
    {"Scripts",
     [](store::AppointmentRecord* r, AppointmentItem* item) {
       r->creation_time = Utc(2020, 2, 29, 12, 0);
       r->start_time = Utc(2021, 10, 31, 0, 30);
       r->end_time = Utc(2021, 10, 31, 2, 30);
       r->body_text = Repeat("Повестка дня: бюджет. Ψηφιακή υπογραφή. 会議の議事録。😀\r\n", 6);
       item->subject = Repeat("Квартальное планирование 会議 مجلد ", 4);
       item->organizer = "ольга@пример.рф";
     },
     "20200229T120000Z", "20211031T023000", "20211031T033000", "", "", "", "ольга@пример.рф"},
};

Values Expected(const EventCase& c, const store::AppointmentRecord& r, const AppointmentItem& item,
                TextMode mode) {
  auto text = [&](std::string_view value) { return ReadBackText(value, "\n", mode); };
  Values v = {{"VCALENDAR.VERSION", "2.0"},
              {"VCALENDAR.PRODID", "-//Tarnwell//Tarnwell Store Converter//EN"},
              {"VEVENT.UID", item.uid.empty() ? kAny : item.uid},
              {"VEVENT.DTSTAMP", r.creation_time ? c.created : kAny},
              {"VEVENT.DTSTART", c.start}};
  if (*c.organizer) v.emplace_back("VEVENT.ORGANIZER", "MAILTO:" + text(c.organizer));
  if (*c.created) v.emplace_back("VEVENT.CREATED", c.created);
  if (*c.end) v.emplace_back("VEVENT.DTEND", c.end);
  if (*c.duration) v.emplace_back("VEVENT.DURATION", c.duration);
  if (!item.subject.empty()) {
    v.emplace_back(mode.utf8 ? "VEVENT.SUMMARY;CHARSET=utf-8" : "VEVENT.SUMMARY",
                   text(item.subject));
  }
  const std::string& body = r.body_text.empty() ? item.second_body : r.body_text;
  if (!body.empty()) v.emplace_back("VEVENT.DESCRIPTION", text(body));
  if (*c.status) v.emplace_back("VEVENT.STATUS", c.status);
  if (*c.busy) v.emplace_back("VEVENT.X-MICROSOFT-CDO-BUSYSTATUS", c.busy);
  if (item.importance != 0) {
    v.emplace_back("VEVENT.X-MICROSOFT-CDO-IMPORTANCE",
                   std::to_string(static_cast<int32_t>(item.importance)));
  }
  std::sort(v.begin(), v.end());
  return v;
}

// Values of `expected` that are kAny take whatever was read.
void ExpectValues(const Values& read, const Values& expected) {
  ASSERT_EQ(read.size(), expected.size()) << ::testing::PrintToString(read);
  for (size_t i = 0; i < read.size(); ++i) {
    EXPECT_EQ(read[i].first, expected[i].first);
    if (expected[i].second != kAny) {
      EXPECT_EQ(read[i].second, expected[i].second) << read[i].first;
    }
  }
}

void PrintTo(const EventCase& c, std::ostream* os) { *os << c.name; }

const TextMode kModes[] = {
    {true, kDefaultCodePage},
    {false, 1252},
    {false, 1251},
    {false, 932},
};

class ICalendarReadBackTest
    : public BerlinTest,
      public ::testing::WithParamInterface<std::tuple<EventCase, TextMode>> {};

TEST_P(ICalendarReadBackTest, ReaderFindsEveryValue) {
  const auto& [event, mode] = GetParam();
  store::AppointmentRecord record;
  AppointmentItem item;
  event.fill(&record, &item);
  const std::string file = ComposeICalendar(record, item, mode);
  ExpectWellFormedLines(file);

  const testing::ReadBack read =
      ReadWithPython(kReadICalendar, file, ".ics", Codec(mode), "icalendar");
  if (read.skipped) GTEST_SKIP() << read.skip_reason;
  ASSERT_EQ(read.failure, "") << file;
  ExpectValues(read.values, Expected(event, record, item, mode));
  if (::testing::Test::HasFailure()) ADD_FAILURE() << file;
}

INSTANTIATE_TEST_SUITE_P(Events, ICalendarReadBackTest,
                         ::testing::Combine(::testing::ValuesIn(kEventCases),
                                            ::testing::ValuesIn(kModes)),
                         [](const ::testing::TestParamInfo<std::tuple<EventCase, TextMode>>& info) {
                           const TextMode mode = std::get<1>(info.param);
                           return std::string(std::get<0>(info.param).name) +
                                  (mode.utf8 ? "Utf8" : "Cp" + std::to_string(mode.ansi_code_page));
                         });

TEST(ICalendarWriterTest, StartsAtTheLocalClockTimeInAnyZone) {
  for (const char* zone : {"Europe/Berlin", "America/New_York", "Asia/Tokyo", "UTC"}) {
    ScopedZone scoped(zone);
    store::AppointmentRecord record;
    record.start_time = Local(2021, 6, 15, 9, 0);
    record.end_time = Local(2021, 6, 15, 10, 0);
    const std::string file = ComposeICalendar(record, {}, {});
    EXPECT_NE(file.find("\r\nDTSTART:20210615T090000\r\n"), std::string::npos) << zone << file;
    EXPECT_NE(file.find("\r\nDTEND:20210615T100000\r\n"), std::string::npos) << zone << file;
  }
}

TEST(ICalendarWriterTest, DerivedUidIsStableAndTellsItemsApart) {
  store::AppointmentRecord a;
  a.start_time = Utc(2021, 1, 1, 9, 0);
  AppointmentItem item;
  item.subject = "One";
  auto uid = [](const std::string& file) {
    const size_t at = file.find("\r\nUID:") + 6;
    return file.substr(at, file.find("\r\n", at) - at);
  };
  const std::string first = uid(ComposeICalendar(a, item, {}));
  EXPECT_EQ(uid(ComposeICalendar(a, item, {})), first);
  item.subject = "Two";
  EXPECT_NE(uid(ComposeICalendar(a, item, {})), first);
}

TEST(ICalendarWriterTest, ImportanceLineOnlyWhenNotZero) {
  store::AppointmentRecord record;
  record.start_time = Utc(2021, 1, 1, 9, 0);
  AppointmentItem item;
  item.importance = 1;
  EXPECT_NE(ComposeICalendar(record, item, {}).find("\r\nX-MICROSOFT-CDO-IMPORTANCE:1\r\n"),
            std::string::npos);
  item.importance = 0;
  EXPECT_EQ(ComposeICalendar(record, item, {}).find("IMPORTANCE"), std::string::npos);
}

}  // namespace
}  // namespace tarnwell::render
