#include "mapi/import/icalendar_import.h"

#include <algorithm>
#include <climits>
#include <cstdlib>
#include <ctime>
#include <map>
#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "base/date_time.h"
#include "base/text.h"
#include "mapi/import/internet_message_import.h"
#include "mapi/import/vcard_import.h"
#include "mapi/property_tags.h"

namespace tarnwell::mapi {
namespace {

constexpr std::string_view kAppointmentClass = "IPM.Appointment";
constexpr std::string_view kTaskClass = "IPM.Task";
constexpr int kTmYearBase = 1900;
constexpr int64_t kSecondsPerMinute = 60;
constexpr int64_t kSecondsPerHour = 3600;
constexpr int64_t kSecondsPerDay = 86400;
constexpr int64_t kSecondsPerWeek = 7 * kSecondsPerDay;
constexpr int kDaysPerWeek = 7;
constexpr int kWeekdayOf19700101 = 4;  // a Thursday, counting Sunday as 0
constexpr double kPercentScale = 100.0;
constexpr int32_t kSensitivityPrivate = 2;
constexpr int32_t kSensitivityConfidential = 3;
constexpr int32_t kBusyFree = 0, kBusyTentative = 1, kBusyBusy = 2;

constexpr std::string_view kBusyNames[] = {"FREE", "TENTATIVE", "BUSY", "OOF", "WORKINGELSEWHERE"};
constexpr std::string_view kBusyOutOfOffice = "OUTOFOFFICE";
constexpr int32_t kBusyOof = 3;
constexpr std::string_view kWeekdays[] = {"SU", "MO", "TU", "WE", "TH", "FR", "SA"};

std::string AsciiUpper(std::string_view text) {
  std::string out(text);
  for (char& c : out) {
    if (c >= 'a' && c <= 'z') c = char(c - 'a' + 'A');
  }
  return out;
}

// A number from the file, clamped so that nothing computed from it can overflow: every
// number read here is small when it is valid at all.
int SmallNumber(const std::string& text) {
  constexpr long kLimit = 100000;
  const long v = std::strtol(text.c_str(), nullptr, 10);
  return int(std::clamp(v, -kLimit, kLimit));
}

// ---- The component tree

struct Component {
  std::string name;
  std::vector<const ContentLine*> properties;
  std::vector<std::unique_ptr<Component>> children;

  const ContentLine* Find(std::string_view property) const {
    for (const ContentLine* line : properties) {
      if (line->name == property) return line;
    }
    return nullptr;
  }
  const Component* FindChild(std::string_view child) const {
    for (const auto& c : children) {
      if (c->name == child) return c.get();
    }
    for (const auto& c : children) {
      if (const Component* found = c->FindChild(child)) return found;
    }
    return nullptr;
  }
};

Component BuildTree(const std::vector<ContentLine>& lines) {
  Component root;
  std::vector<Component*> stack{&root};
  size_t ignored_depth = 0;  // components nested deeper than we follow
  for (const ContentLine& line : lines) {
    if (line.name == "BEGIN") {
      if (ignored_depth > 0 || stack.size() > size_t(kMaxComponentDepth)) {
        ++ignored_depth;
        continue;
      }
      auto child = std::make_unique<Component>();
      child->name = AsciiUpper(line.raw_value);
      Component* raw = child.get();
      stack.back()->children.push_back(std::move(child));
      stack.push_back(raw);
    } else if (line.name == "END") {
      if (ignored_depth > 0) {
        --ignored_depth;
        continue;
      }
      // An END that closes nothing open is ignored; one that closes an outer component
      // closes the inner ones the file left open too.
      const std::string name = AsciiUpper(line.raw_value);
      for (size_t i = stack.size(); i-- > 1;) {
        if (stack[i]->name == name) {
          stack.resize(i);
          break;
        }
      }
    } else if (ignored_depth == 0) {
      stack.back()->properties.push_back(&line);
    }
  }
  return root;
}

// ---- Local times and zones

struct LocalTime {
  int year = 0, month = 0, day = 0, hour = 0, minute = 0, second = 0;
  bool date_only = false;
  bool utc = false;
};

bool Digits(std::string_view s, size_t at, size_t count, int* out) {
  if (at + count > s.size()) return false;
  int v = 0;
  for (size_t i = at; i < at + count; ++i) {
    if (s[i] < '0' || s[i] > '9') return false;
    v = v * 10 + (s[i] - '0');
  }
  *out = v;
  return true;
}

// "YYYYMMDD" or "YYYYMMDDTHHMMSS", optionally with "Z".
std::optional<LocalTime> ParseLocalTime(std::string_view v) {
  constexpr size_t kDateLength = 8, kDateTimeLength = 15;
  LocalTime t;
  if (!Digits(v, 0, 4, &t.year) || !Digits(v, 4, 2, &t.month) || !Digits(v, 6, 2, &t.day)) {
    return std::nullopt;
  }
  if (v.size() == kDateLength) {
    t.date_only = true;
  } else {
    if (v.size() < kDateTimeLength || (v[kDateLength] != 'T' && v[kDateLength] != 't') ||
        !Digits(v, 9, 2, &t.hour) || !Digits(v, 11, 2, &t.minute) || !Digits(v, 13, 2, &t.second)) {
      return std::nullopt;
    }
    t.utc = v.size() > kDateTimeLength && (v[kDateTimeLength] == 'Z' || v[kDateTimeLength] == 'z');
  }
  if (t.month < 1 || t.month > 12 || t.day < 1 || t.day > 31 || t.hour > 23 || t.minute > 59 ||
      t.second > 60) {
    return std::nullopt;
  }
  return t;
}

std::tm ToTm(const LocalTime& t) {
  std::tm tm{};
  tm.tm_year = t.year - kTmYearBase;
  tm.tm_mon = t.month - 1;
  tm.tm_mday = t.day;
  tm.tm_hour = t.hour;
  tm.tm_min = t.minute;
  tm.tm_sec = t.second;
  tm.tm_isdst = -1;
  return tm;
}

// The wall-clock reading as seconds, as if it were UTC.
int64_t WallSeconds(const LocalTime& t) {
  std::tm tm = ToTm(t);
  return int64_t(timegm(&tm));
}

// "+0100", "-0500", "+013000" as seconds east of UTC.
std::optional<int64_t> ParseOffset(std::string_view s) {
  int h, m, sec = 0;
  if (s.size() < 5 || (s[0] != '+' && s[0] != '-') || !Digits(s, 1, 2, &h) ||
      !Digits(s, 3, 2, &m) || (s.size() >= 7 && !Digits(s, 5, 2, &sec))) {
    return std::nullopt;
  }
  const int64_t v = h * kSecondsPerHour + m * kSecondsPerMinute + sec;
  return s[0] == '-' ? -v : v;
}

int DaysInMonth(int year, int month) {
  static constexpr int kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  const bool leap = (year % 4 == 0 && year % 100 != 0) || year % 400 == 0;
  return month == 2 && leap ? 29 : kDays[month - 1];
}

int WeekdayOf(int year, int month, int day) {
  LocalTime t;
  t.year = year;
  t.month = month;
  t.day = day;
  const int64_t days = WallSeconds(t) / kSecondsPerDay;
  return int(((days % kDaysPerWeek) + kDaysPerWeek + kWeekdayOf19700101) % kDaysPerWeek);
}

// One STANDARD or DAYLIGHT part of a VTIMEZONE.
struct Observance {
  LocalTime start;
  int64_t offset_to = 0;
  // A yearly rule: the ordinal'th weekday of month (negative: counted from the end), or the
  // first weekday on or after month_day.
  int month = 0, weekday = -1, ordinal = 0, month_day = 0;

  // The onset in `year`, as wall seconds; nullopt when there is none that year.
  std::optional<int64_t> OnsetIn(int year) const {
    if (month == 0) {
      if (year != start.year) return std::nullopt;
      return WallSeconds(start);
    }
    if (year < start.year) return std::nullopt;
    LocalTime t = start;
    t.year = year;
    t.month = month;
    const int days = DaysInMonth(year, month);
    if (weekday < 0) {
      t.day = std::min(start.day, days);
    } else if (month_day > 0) {
      t.day =
          month_day + (weekday - WeekdayOf(year, month, month_day) + kDaysPerWeek) % kDaysPerWeek;
    } else if (ordinal >= 0) {
      const int first = 1 + (weekday - WeekdayOf(year, month, 1) + kDaysPerWeek) % kDaysPerWeek;
      t.day = first + kDaysPerWeek * (std::max(ordinal, 1) - 1);
    } else {
      const int last =
          days - (WeekdayOf(year, month, days) - weekday + kDaysPerWeek) % kDaysPerWeek;
      t.day = last + kDaysPerWeek * (ordinal + 1);
    }
    if (t.day < 1 || t.day > days) return std::nullopt;
    return WallSeconds(t);
  }
};

void ParseRule(std::string_view rule, Observance* o) {
  for (std::string_view part : SplitStructured(rule, ';')) {
    const size_t eq = part.find('=');
    if (eq == std::string_view::npos) continue;
    const std::string key = AsciiUpper(part.substr(0, eq));
    const std::string value = AsciiUpper(part.substr(eq + 1));
    if (key == "BYMONTH") {
      o->month = SmallNumber(value);
      if (o->month < 1 || o->month > 12) o->month = 0;
    } else if (key == "BYDAY") {
      const std::string first = value.substr(0, value.find(','));
      if (first.size() < 2) continue;
      const std::string day = first.substr(first.size() - 2);
      for (size_t i = 0; i < std::size(kWeekdays); ++i) {
        if (day == kWeekdays[i]) o->weekday = int(i);
      }
      o->ordinal = SmallNumber(first.substr(0, first.size() - 2));
      constexpr int kMaxWeeksInMonth = 5;
      if (o->ordinal > kMaxWeeksInMonth || o->ordinal < -kMaxWeeksInMonth) o->weekday = -1;
    } else if (key == "BYMONTHDAY") {
      o->month_day = SmallNumber(value);
      if (o->month_day < 1 || o->month_day > 31) o->month_day = 0;
    }
  }
}

class ZoneTable {
 public:
  explicit ZoneTable(const Component& root) { Collect(root); }

  // Seconds east of UTC in force at local time t in zone tzid; nullopt for an unknown zone.
  std::optional<int64_t> OffsetAt(const std::string& tzid, const LocalTime& t) const {
    auto it = zones_.find(tzid);
    if (it == zones_.end() || it->second.empty()) return std::nullopt;
    const int64_t wall = WallSeconds(t);
    std::optional<int64_t> best_onset;
    int64_t offset = it->second.front().offset_to;
    for (const Observance& o : it->second) {
      for (int year : {t.year - 1, t.year}) {
        std::optional<int64_t> onset = o.OnsetIn(year);
        if (onset && *onset <= wall && (!best_onset || *onset > *best_onset)) {
          best_onset = onset;
          offset = o.offset_to;
        }
      }
    }
    return offset;
  }

 private:
  void Collect(const Component& c) {
    if (c.name == "VTIMEZONE") {
      const ContentLine* id = c.Find("TZID");
      if (!id) return;
      std::vector<Observance>& list = zones_[id->Text()];
      for (const auto& part : c.children) {
        Observance o;
        const ContentLine* to = part->Find("TZOFFSETTO");
        const ContentLine* start = part->Find("DTSTART");
        std::optional<int64_t> offset = to ? ParseOffset(to->raw_value) : std::nullopt;
        std::optional<LocalTime> when = start ? ParseLocalTime(start->raw_value) : std::nullopt;
        if (!offset || !when) continue;
        o.offset_to = *offset;
        o.start = *when;
        if (const ContentLine* rule = part->Find("RRULE")) ParseRule(rule->raw_value, &o);
        // A rule without a month repeats on the start's month.
        if (part->Find("RRULE") && o.month == 0) o.month = o.start.month;
        list.push_back(o);
      }
      return;
    }
    for (const auto& child : c.children) Collect(*child);
  }

  std::map<std::string, std::vector<Observance>> zones_;
};

struct ResolvedTime {
  uint64_t filetime = 0;
  bool date_only = false;
};

std::optional<ResolvedTime> Resolve(const ContentLine* line, const ZoneTable& zones) {
  if (!line) return std::nullopt;
  std::optional<LocalTime> t = ParseLocalTime(line->raw_value);
  if (!t) return std::nullopt;
  int64_t seconds;
  const std::string tzid = line->Param("TZID");
  if (t->utc) {
    seconds = WallSeconds(*t);
  } else if (std::optional<int64_t> offset =
                 tzid.empty() ? std::nullopt : zones.OffsetAt(tzid, *t)) {
    seconds = WallSeconds(*t) - *offset;
  } else {
    std::tm tm = ToTm(*t);
    const std::time_t local = std::mktime(&tm);
    if (local == std::time_t(-1)) return std::nullopt;
    seconds = local;
  }
  std::optional<uint64_t> ft = UnixTimeToFileTime(seconds);
  if (!ft) return std::nullopt;
  return ResolvedTime{*ft, t->date_only};
}

// ---- Items

std::string TextOf(const Component& c, std::string_view name) {
  const ContentLine* line = c.Find(name);
  return line ? UnescapeText(line->Text()) : std::string();
}

void SetText(PropertyBag* bag, uint16_t id, const std::string& text) {
  if (!text.empty()) bag->Set(id, PropertyValue::Unicode(text));
}

void SetTime(PropertyBag* bag, const Guid& set, uint32_t lid, uint64_t filetime) {
  bag->SetNamed(NamedId(set, lid), PropertyValue::SysTime(filetime));
}

// "mailto:a@b" → "a@b".
std::string CalendarAddress(const ContentLine& line) {
  std::string v = UnescapeText(line.Text());
  constexpr std::string_view kMailto = "mailto:";
  if (v.size() >= kMailto.size() && EqualsIgnoreAsciiCase(v.substr(0, kMailto.size()), kMailto)) {
    v.erase(0, kMailto.size());
  }
  return v;
}

void CommonFields(const Component& c, const ZoneTable& zones, Message* out) {
  PropertyBag& bag = out->properties;
  const std::string subject = TextOf(c, "SUMMARY");
  if (!subject.empty()) {
    bag.Set(kPidSubject, PropertyValue::Unicode(subject));
    bag.Set(kPidNormalizedSubject, PropertyValue::Unicode(subject));
  }
  SetText(&bag, kPidBody, TextOf(c, "DESCRIPTION"));
  const std::string sensitivity = AsciiUpper(TextOf(c, "CLASS"));
  if (sensitivity == "PRIVATE") bag.Set(kPidSensitivity, PropertyValue::Int32(kSensitivityPrivate));
  if (sensitivity == "CONFIDENTIAL") {
    bag.Set(kPidSensitivity, PropertyValue::Int32(kSensitivityConfidential));
  }
  // CDO importance is MAPI's own scale; PRIORITY runs 1 (highest) to 9, 0 meaning none.
  const std::string cdo = TextOf(c, "X-MICROSOFT-CDO-IMPORTANCE");
  const std::string priority = TextOf(c, "PRIORITY");
  if (!cdo.empty() && cdo[0] >= '0' && cdo[0] <= '2') {
    bag.Set(kPidImportance, PropertyValue::Int32(cdo[0] - '0'));
  } else if (const int p = SmallNumber(priority); p >= 1 && p <= 9) {
    constexpr int kHighUpTo = 4, kNormal = 5;
    bag.Set(kPidImportance, PropertyValue::Int32(p <= kHighUpTo ? kImportanceHigh
                                                 : p == kNormal ? kImportanceNormal
                                                                : kImportanceLow));
  }
  if (std::optional<ResolvedTime> t = Resolve(c.Find("CREATED"), zones)) {
    bag.Set(kPidCreationTime, PropertyValue::SysTime(t->filetime));
  }
  if (std::optional<ResolvedTime> t = Resolve(c.Find("LAST-MODIFIED"), zones)) {
    bag.Set(kPidLastModificationTime, PropertyValue::SysTime(t->filetime));
  }
  bag.Set(kPidMessageFlags, PropertyValue::Int32(kMsgFlagRead));
}

int32_t BusyStatus(const Component& c) {
  for (const char* name : {"X-MICROSOFT-CDO-BUSYSTATUS", "X-MICROSOFT-CDO-INTENDEDSTATUS"}) {
    const std::string v = AsciiUpper(TextOf(c, name));
    if (v == kBusyOutOfOffice) return kBusyOof;
    for (size_t i = 0; i < std::size(kBusyNames); ++i) {
      if (v == kBusyNames[i]) return int32_t(i);
    }
  }
  if (AsciiUpper(TextOf(c, "TRANSP")) == "TRANSPARENT") return kBusyFree;
  if (AsciiUpper(TextOf(c, "STATUS")) == "TENTATIVE") return kBusyTentative;
  return kBusyBusy;
}

void People(const Component& c, Message* out) {
  PropertyBag& bag = out->properties;
  if (const ContentLine* organizer = c.Find("ORGANIZER")) {
    const std::string address = CalendarAddress(*organizer);
    std::string name = organizer->Param("CN");
    if (name.empty()) name = address;
    if (!address.empty()) {
      for (const auto& [name_id, type_id, address_id, smtp_id] :
           {std::tuple{kPidSentRepresentingName, kPidSentRepresentingAddressType,
                       kPidSentRepresentingEmailAddress, kPidSentRepresentingSmtpAddress},
            std::tuple{kPidSenderName, kPidSenderAddressType, kPidSenderEmailAddress,
                       kPidSenderSmtpAddress}}) {
        bag.Set(name_id, PropertyValue::Unicode(name));
        bag.Set(type_id, PropertyValue::Unicode("SMTP"));
        bag.Set(address_id, PropertyValue::Unicode(address));
        bag.Set(smtp_id, PropertyValue::Unicode(address));
      }
      PropertyBag r = SmtpRecipient(kRecipientTo, name, address);
      r.Set(kPidRecipientFlags,
            PropertyValue::Int32(kRecipientFlagSendable | kRecipientFlagOrganizer));
      out->recipients.push_back(std::move(r));
    }
  }
  bool meeting = false;
  std::string display[3];
  for (const ContentLine* line : c.properties) {
    if (line->name != "ATTENDEE") continue;
    const std::string address = CalendarAddress(*line);
    if (address.empty()) continue;
    const std::string role = AsciiUpper(line->Param("ROLE"));
    const int32_t type = role == "OPT-PARTICIPANT"   ? kRecipientCc
                         : role == "NON-PARTICIPANT" ? kRecipientBcc
                                                     : kRecipientTo;
    const std::string name = line->Param("CN");
    out->recipients.push_back(SmtpRecipient(type, name, address));
    std::string& d = display[type - kRecipientTo];
    if (!d.empty()) d += "; ";
    d += name.empty() ? address : name;
    meeting = true;
  }
  if (!meeting) return;
  const uint16_t display_ids[] = {kPidDisplayTo, kPidDisplayCc, kPidDisplayBcc};
  for (size_t i = 0; i < std::size(display_ids); ++i) SetText(&bag, display_ids[i], display[i]);
  bag.SetNamed(NamedId(kPsetidAppointment, kLidAppointmentStateFlags),
               PropertyValue::Int32(kAppointmentStateMeeting));
}

void ImportEvent(const Component& event, const ZoneTable& zones, Message* out) {
  PropertyBag& bag = out->properties;
  if (!bag.Find(kPidMessageClass)) {
    bag.Set(kPidMessageClass, PropertyValue::Unicode(std::string(kAppointmentClass)));
  }
  CommonFields(event, zones, out);
  std::optional<ResolvedTime> start = Resolve(event.Find("DTSTART"), zones);
  std::optional<ResolvedTime> end = Resolve(event.Find("DTEND"), zones);
  if (start && !end) {
    const ContentLine* duration = event.Find("DURATION");
    std::optional<int64_t> seconds =
        duration ? ParseICalDuration(duration->raw_value) : std::nullopt;
    if (!seconds) seconds = start->date_only ? kSecondsPerDay : 0;
    const int64_t ticks = *seconds * int64_t(kFileTimeTicksPerSecond);
    if ((ticks >= 0 && IsValidFileTime(start->filetime + uint64_t(ticks))) ||
        (ticks < 0 && uint64_t(-ticks) <= start->filetime)) {
      end = ResolvedTime{start->filetime + uint64_t(ticks), start->date_only};
    }
  }
  if (start) {
    SetTime(&bag, kPsetidAppointment, kLidAppointmentStartWhole, start->filetime);
    SetTime(&bag, kPsetidCommon, kLidCommonStart, start->filetime);
    bag.Set(kPidStartDate, PropertyValue::SysTime(start->filetime));
    if (start->date_only) {
      bag.SetNamed(NamedId(kPsetidAppointment, kLidAppointmentSubType),
                   PropertyValue::Boolean(true));
    }
  }
  if (end) {
    SetTime(&bag, kPsetidAppointment, kLidAppointmentEndWhole, end->filetime);
    SetTime(&bag, kPsetidCommon, kLidCommonEnd, end->filetime);
    bag.Set(kPidEndDate, PropertyValue::SysTime(end->filetime));
  }
  if (start && end && end->filetime >= start->filetime) {
    const uint64_t minutes =
        (end->filetime - start->filetime) / kFileTimeTicksPerSecond / uint64_t(kSecondsPerMinute);
    bag.SetNamed(NamedId(kPsetidAppointment, kLidAppointmentDuration),
                 PropertyValue::Int32(int32_t(std::min<uint64_t>(minutes, INT32_MAX))));
  }
  const std::string location = TextOf(event, "LOCATION");
  if (!location.empty()) {
    bag.SetNamed(NamedId(kPsetidAppointment, kLidLocation), PropertyValue::Unicode(location));
  }
  bag.SetNamed(NamedId(kPsetidAppointment, kLidBusyStatus),
               PropertyValue::Int32(BusyStatus(event)));
  People(event, out);
}

void ImportTodo(const Component& todo, const ZoneTable& zones, Message* out) {
  PropertyBag& bag = out->properties;
  if (!bag.Find(kPidMessageClass)) {
    bag.Set(kPidMessageClass, PropertyValue::Unicode(std::string(kTaskClass)));
  }
  CommonFields(todo, zones, out);
  if (std::optional<ResolvedTime> start = Resolve(todo.Find("DTSTART"), zones)) {
    SetTime(&bag, kPsetidTask, kLidTaskStartDate, start->filetime);
    SetTime(&bag, kPsetidCommon, kLidCommonStart, start->filetime);
  }
  if (std::optional<ResolvedTime> due = Resolve(todo.Find("DUE"), zones)) {
    SetTime(&bag, kPsetidTask, kLidTaskDueDate, due->filetime);
    SetTime(&bag, kPsetidCommon, kLidCommonEnd, due->filetime);
  }
  std::optional<ResolvedTime> completed = Resolve(todo.Find("COMPLETED"), zones);
  if (completed) SetTime(&bag, kPsetidTask, kLidTaskDateCompleted, completed->filetime);

  const std::string status = AsciiUpper(TextOf(todo, "STATUS"));
  std::optional<int32_t> status_value;
  if (status == "NEEDS-ACTION") status_value = 0;
  if (status == "IN-PROCESS") status_value = kTaskStatusInProgress;
  if (status == "COMPLETED") status_value = kTaskStatusComplete;
  if (status == "CANCELLED") status_value = kTaskStatusDeferred;
  std::optional<double> percent;
  const std::string percent_text = TextOf(todo, "PERCENT-COMPLETE");
  if (!percent_text.empty()) {
    const int p = SmallNumber(percent_text);
    if (p >= 0 && p <= int(kPercentScale)) percent = p / kPercentScale;
  }
  const bool complete = status_value == kTaskStatusComplete || (percent && *percent >= 1.0);
  if (complete) {
    status_value = kTaskStatusComplete;
    percent = 1.0;
  } else if (!status_value && percent && *percent > 0) {
    status_value = kTaskStatusInProgress;
  }
  if (status_value) {
    bag.SetNamed(NamedId(kPsetidTask, kLidTaskStatus), PropertyValue::Int32(*status_value));
  }
  if (percent)
    bag.SetNamed(NamedId(kPsetidTask, kLidPercentComplete), PropertyValue::Double(*percent));
  bag.SetNamed(NamedId(kPsetidTask, kLidTaskComplete), PropertyValue::Boolean(complete));
}

}  // namespace

std::optional<int64_t> ParseICalDuration(std::string_view text) {
  size_t i = 0;
  bool negative = false;
  if (i < text.size() && (text[i] == '+' || text[i] == '-')) negative = text[i++] == '-';
  if (i >= text.size() || (text[i] != 'P' && text[i] != 'p')) return std::nullopt;
  ++i;
  // Over two thousand years: far beyond any real duration, and safe to scale to FILETIME ticks.
  constexpr int64_t kMaxSeconds = int64_t(1) << 36;
  int64_t total = 0, number = 0;
  bool in_time = false, have_number = false, any = false;
  for (; i < text.size(); ++i) {
    const char c = char(text[i] & ~0x20);  // upper case for letters
    if (text[i] >= '0' && text[i] <= '9') {
      number = number * 10 + (text[i] - '0');
      if (number > kMaxSeconds) return std::nullopt;
      have_number = true;
      continue;
    }
    if (c == 'T') {
      in_time = true;
      continue;
    }
    if (!have_number) return std::nullopt;
    int64_t unit;
    if (c == 'W' && !in_time) {
      unit = kSecondsPerWeek;
    } else if (c == 'D' && !in_time) {
      unit = kSecondsPerDay;
    } else if (c == 'H' && in_time) {
      unit = kSecondsPerHour;
    } else if (c == 'M' && in_time) {
      unit = kSecondsPerMinute;
    } else if (c == 'S' && in_time) {
      unit = 1;
    } else {
      return std::nullopt;
    }
    total += number * unit;
    if (total > kMaxSeconds) return std::nullopt;
    number = 0;
    have_number = false;
    any = true;
  }
  if (!any || have_number) return std::nullopt;
  return negative ? -total : total;
}

Status ImportICalendar(std::string_view text, Message* out) {
  const std::vector<ContentLine> lines = ReadContentLines(text, kMaxCalendarLines);
  const Component root = BuildTree(lines);
  const ZoneTable zones(root);
  if (const Component* event = root.FindChild("VEVENT")) {
    ImportEvent(*event, zones, out);
    return Status::Ok();
  }
  if (const Component* todo = root.FindChild("VTODO")) {
    ImportTodo(*todo, zones, out);
    return Status::Ok();
  }
  return Status::Corruption("no VEVENT or VTODO in the calendar file");
}

}  // namespace tarnwell::mapi
