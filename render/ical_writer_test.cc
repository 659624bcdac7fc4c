#include "render/ical_writer.h"

#include <gtest/gtest.h>

#include "render/writer_test_support.h"

namespace tarnwell::render {
namespace {

using testing::Local;
using testing::Repeat;
using testing::Utc;
using testing::Values;

// Prints "COMPONENT.PROPERTY[;PARAM=VALUE] TAB hex" for every property the icalendar module
// reads; times as written (a trailing Z when they are UTC), durations in seconds.
constexpr const char* kReadICalendar = R"PY(
import datetime
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

// The times and codes a reader should find, as written in Berlin; "" for none.
struct Want {
  const char* created = "";
  const char* start = "";
  const char* end = "";
  const char* duration = "";
  const char* status = "";
  const char* busy = "";
  const char* organizer = "";  // the address as it stands in the URI
};

struct EventCase {
  const char* name;
  void (*fill)(store::AppointmentRecord*, AppointmentItem*);
  Want want;
};

using Record = store::AppointmentRecord;
using Item = AppointmentItem;

const EventCase kEventCases[] = {
    {"Full",
     [](Record* r, Item* item) {
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
     {"20210301T081500Z", "20210328T090000", "20210328T103000", "", "CONFIRMED", "BUSY",
      "boss@example.org"}},
    {"StartOnly",
     [](Record* r, Item*) { r->start_time = Utc(2021, 1, 5, 23, 30); },
     {.start = "20210106T003000"}},
    {"SecondDateField",
     [](Record* r, Item* item) {
       r->named_time_2 = Utc(2021, 7, 1, 10, 0);
       item->subject = "From the second date";
       item->busy_status = "tentative";
     },
     {.start = "20210701T120000", .status = "TENTATIVE", .busy = "TENTATIVE"}},
    {"EndFromSecondDate",
     [](Record* r, Item* item) {
       r->start_time = Utc(2021, 7, 1, 10, 0);
       r->named_time_2 = Utc(2021, 7, 1, 11, 0);
       item->busy_status = "OUTOFOFFICE";
     },
     {.start = "20210701T120000",
      .end = "20210701T130000",
      .status = "CONFIRMED",
      .busy = "OUTOFOFFICE"}},
    // An event needs a start, so it gets one.
    {"NoTimesAtAll", [](Record*, Item* item) { item->subject = "Undated"; }, {.start = kAny}},
    {"EndNotAfterStart",
     [](Record* r, Item*) {
       r->start_time = Utc(2021, 7, 1, 10, 0);
       r->end_time = Utc(2021, 7, 1, 9, 0);
     },
     {.start = "20210701T120000"}},
    // 02:30 summer time to 02:30 winter time: one hour, though the clock reads the same.
    {"ClockGoesBack",
     [](Record* r, Item*) {
       r->start_time = Utc(2021, 10, 31, 0, 30);
       r->end_time = Utc(2021, 10, 31, 1, 30);
     },
     {.start = "20211031T023000", .duration = "PT3600S"}},
    {"CreatedFromDateTextAndSecondBody",
     [](Record* r, Item* item) {
       r->start_time = Utc(2021, 5, 17, 7, 30);
       item->created_text = "17/05/2021 09:30:00";
       item->second_body = "Only the second body\r\nhas text";
     },
     {.created = "20210517T073000Z", .start = "20210517T093000"}},
    {"UnreadableDateText",
     [](Record* r, Item* item) {
       r->start_time = Utc(2021, 5, 17, 7, 30);
       item->created_text = "Invalid DateTime";
     },
     {.start = "20210517T093000"}},
    {"Hostile",
     [](Record* r, Item* item) {
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
     {.start = "20210517T093000",
      .end = "20210517T103000",
      .busy = "weird;status,\nX-EVIL:1",
      .organizer = "x@y.z%0D%0AATTENDEE:evil@example.org%20%22q%22%25"}},
    {"Scripts",
     [](Record* r, Item* item) {
       r->creation_time = Utc(2020, 2, 29, 12, 0);
       r->start_time = Utc(2021, 10, 31, 0, 30);
       r->end_time = Utc(2021, 10, 31, 2, 30);
       r->body_text = Repeat("Повестка дня: бюджет. Ψηφιακή υπογραφή. 会議の議事録。😀\r\n", 6);
       item->subject = Repeat("Квартальное планирование 会議 مجلد ", 4);
       item->organizer = "ольга@пример.рф";
     },
     {"20200229T120000Z", "20211031T023000", "20211031T033000", "", "", "", "ольга@пример.рф"}},
};

Values Expected(const Want& w, const Record& r, const Item& item, TextMode mode) {
  auto text = [&](std::string_view value) { return testing::ReadBackText(value, "\n", mode); };
  Values v = {{"VCALENDAR.VERSION", "2.0"},
              {"VCALENDAR.PRODID", "-//Tarnwell//Tarnwell Store Converter//EN"},
              {"VEVENT.UID", item.uid.empty() ? kAny : item.uid},
              {"VEVENT.DTSTAMP", r.creation_time ? w.created : kAny},
              {"VEVENT.DTSTART", w.start}};
  const std::string& body = r.body_text.empty() ? item.second_body : r.body_text;
  const std::pair<const char*, std::string> optional[] = {
      {"VEVENT.ORGANIZER", *w.organizer ? "MAILTO:" + text(w.organizer) : ""},
      {"VEVENT.CREATED", w.created},
      {"VEVENT.DTEND", w.end},
      {"VEVENT.DURATION", w.duration},
      {mode.utf8 ? "VEVENT.SUMMARY;CHARSET=utf-8" : "VEVENT.SUMMARY", text(item.subject)},
      {"VEVENT.DESCRIPTION", text(body)},
      {"VEVENT.STATUS", w.status},
      {"VEVENT.X-MICROSOFT-CDO-BUSYSTATUS", w.busy},
      {"VEVENT.X-MICROSOFT-CDO-IMPORTANCE",
       item.importance ? std::to_string(static_cast<int32_t>(item.importance)) : ""}};
  for (const auto& [key, value] : optional) {
    if (!value.empty()) v.emplace_back(key, value);
  }
  std::sort(v.begin(), v.end());
  return v;
}

void PrintTo(const EventCase& c, std::ostream* os) { *os << c.name; }

class ICalendarReadBackTest
    : public testing::BerlinTest,
      public ::testing::WithParamInterface<std::tuple<EventCase, TextMode>> {};

// Every value, and no line more: a value of `expected` that is kAny takes whatever was read.
TEST_P(ICalendarReadBackTest, ReaderFindsEveryValue) {
  const auto& [event, mode] = GetParam();
  Record record;
  Item item;
  event.fill(&record, &item);
  const std::string file = ComposeICalendar(record, item, mode);
  testing::ExpectWellFormedLines(file);

  const testing::ReadBack read =
      testing::ReadWithPython(kReadICalendar, file, ".ics", testing::Codec(mode), "icalendar");
  if (read.skipped) GTEST_SKIP() << read.skip_reason;
  ASSERT_EQ(read.failure, "") << file;
  const Values expected = Expected(event.want, record, item, mode);
  ASSERT_EQ(read.values.size(), expected.size()) << ::testing::PrintToString(read.values) << file;
  for (size_t i = 0; i < expected.size(); ++i) {
    EXPECT_EQ(read.values[i].first, expected[i].first) << file;
    if (expected[i].second != kAny) {
      EXPECT_EQ(read.values[i].second, expected[i].second) << file;
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Events, ICalendarReadBackTest,
                         ::testing::Combine(::testing::ValuesIn(kEventCases),
                                            ::testing::ValuesIn(testing::kModes)),
                         testing::CaseName<EventCase>);

TEST(ICalendarWriterTest, StartsAtTheLocalClockTimeInAnyZone) {
  for (const char* zone : {"Europe/Berlin", "America/New_York", "Asia/Tokyo", "UTC"}) {
    testing::ScopedZone scoped(zone);
    Record record;
    record.start_time = Local(2021, 6, 15, 9, 0);
    record.end_time = Local(2021, 6, 15, 10, 0);
    const std::string file = ComposeICalendar(record, {}, {});
    EXPECT_NE(file.find("\r\nDTSTART:20210615T090000\r\n"), std::string::npos) << zone << file;
    EXPECT_NE(file.find("\r\nDTEND:20210615T100000\r\n"), std::string::npos) << zone << file;
  }
}

TEST(ICalendarWriterTest, DerivedUidIsStableAndTellsItemsApart) {
  Record a;
  a.start_time = Utc(2021, 1, 1, 9, 0);
  Item item;
  item.subject = "One";
  auto uid = [&] {
    const std::string file = ComposeICalendar(a, item, {});
    const size_t at = file.find("\r\nUID:") + 6;
    return file.substr(at, file.find("\r\n", at) - at);
  };
  const std::string first = uid();
  EXPECT_EQ(uid(), first);
  item.subject = "Two";
  EXPECT_NE(uid(), first);
}

}  // namespace
}  // namespace tarnwell::render
