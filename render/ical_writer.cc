#include "render/ical_writer.h"

#include <cstdio>
#include <ctime>
#include <optional>

#include "base/date_text.h"
#include "base/date_time.h"
#include "base/text.h"

namespace tarnwell::render {
namespace {

constexpr std::string_view kProductId = "-//Tarnwell//Tarnwell Store Converter//EN";
constexpr std::string_view kUidDomain = "@tarnwell";
constexpr std::string_view kLocalFormat = "%Y%m%dT%H%M%S";
constexpr std::string_view kUtcFormat = "%Y%m%dT%H%M%SZ";
constexpr std::string_view kCharsetUtf8 = ";CHARSET=utf-8";

constexpr std::string_view kBusyStatusTexts[] = {"FREE", "TENTATIVE", "BUSY", "OUTOFOFFICE",
                                                 "WORKINGELSEWHERE"};
constexpr std::string_view kTentative = "TENTATIVE";
constexpr std::string_view kConfirmed = "CONFIRMED";
constexpr std::string_view kEventStatuses[] = {kTentative, kConfirmed, "CANCELLED"};

constexpr uint64_t kFnvOffsetBasis = 0xcbf29ce484222325ULL;
constexpr uint64_t kFnvPrime = 0x100000001b3ULL;

class Fnv1a {
 public:
  void Add(std::string_view bytes) {
    for (char c : bytes) {
      hash_ ^= static_cast<unsigned char>(c);
      hash_ *= kFnvPrime;
    }
    // The length keeps ("ab", "c") apart from ("a", "bc").
    AddNumber(bytes.size());
  }
  void Add(const store::FileTime& time) { AddNumber(time ? *time + 1 : 0); }
  void AddNumber(uint64_t v) {
    for (int i = 0; i < 8; ++i) {
      hash_ ^= (v >> (8 * i)) & 0xFF;
      hash_ *= kFnvPrime;
    }
  }
  uint64_t hash() const { return hash_; }

 private:
  uint64_t hash_ = kFnvOffsetBasis;
};

std::string DerivedUid(const store::AppointmentRecord& r, const AppointmentItem& item) {
  Fnv1a h;
  h.Add(r.start_time);
  h.Add(r.end_time);
  h.Add(r.creation_time);
  h.Add(item.subject);
  h.Add(item.organizer);
  h.Add(r.body_text);
  h.Add(std::string_view(reinterpret_cast<const char*>(r.conversation_index.data()),
                         r.conversation_index.size()));
  char hex[17];
  std::snprintf(hex, sizeof hex, "%016llx", static_cast<unsigned long long>(h.hash()));
  return std::string(hex).append(kUidDomain);
}

// An address as the path of a mailto URI: characters that cannot stand in a URI are
// percent-encoded, so that nothing in it can end the line.
std::string MailtoPath(std::string_view address) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  const std::string valid = ToValidUtf8(address);
  std::string out;
  for (char c : valid) {
    const unsigned char b = static_cast<unsigned char>(c);
    if (b <= ' ' || b == 0x7F || c == '"' || c == '%') {
      out.push_back('%');
      out.push_back(kHex[b >> 4]);
      out.push_back(kHex[b & 0xF]);
    } else {
      out.push_back(c);
    }
  }
  return out;
}

template <size_t N>
bool Contains(const std::string_view (&list)[N], std::string_view text) {
  for (std::string_view entry : list) {
    if (entry == text) return true;
  }
  return false;
}

std::string AsciiUpper(std::string_view text) {
  std::string out(text);
  for (char& c : out) {
    if (c >= 'a' && c <= 'z') c = char(c - 'a' + 'A');
  }
  return out;
}

std::string Duration(uint64_t start, uint64_t end) {
  return "PT" + std::to_string((end - start) / kFileTimeTicksPerSecond) + "S";
}

class ICalComposer {
 public:
  explicit ICalComposer(TextMode mode) : mode_(mode), writer_(mode) {}

  std::string Compose(const store::AppointmentRecord& r, const AppointmentItem& item) {
    writer_.Property("BEGIN", "VCALENDAR");
    writer_.Property("VERSION", "2.0");
    writer_.Property("PRODID", EscapeText(kProductId));
    writer_.Property("BEGIN", "VEVENT");
    writer_.Property("UID", EscapeText(item.uid.empty() ? DerivedUid(r, item) : item.uid));

    std::optional<std::string> stamp;
    if (r.creation_time) stamp = FormatFileTime(*r.creation_time, kUtcFormat, Zone::kUtc);
    if (!stamp) stamp = FormatFileTime(CurrentFileTime(), kUtcFormat, Zone::kUtc);
    writer_.Property("DTSTAMP", stamp.value_or(""));

    if (!item.organizer.empty()) {
      writer_.Property("ORGANIZER", "MAILTO:" + MailtoPath(item.organizer));
    }
    Created(r, item);
    Times(r);
    if (!item.subject.empty()) {
      std::string name = "SUMMARY";
      if (mode_.utf8) name += kCharsetUtf8;
      writer_.Property(name, EscapeText(item.subject));
    }
    const std::string& body = r.body_text.empty() ? item.second_body : r.body_text;
    if (!body.empty()) writer_.Property("DESCRIPTION", EscapeText(body));
    Status(item.busy_status.empty() && r.value_present ? BusyStatusText(r.value)
                                                       : std::string_view(item.busy_status));
    if (item.importance != 0) {
      writer_.Property("X-MICROSOFT-CDO-IMPORTANCE",
                       std::to_string(static_cast<int32_t>(item.importance)));
    }
    writer_.Property("END", "VEVENT");
    writer_.Property("END", "VCALENDAR");
    return writer_.Take();
  }

 private:
  void Created(const store::AppointmentRecord& r, const AppointmentItem& item) {
    std::optional<uint64_t> created = r.creation_time;
    if (!created && !item.created_text.empty()) created = FileTimeFromDateText(item.created_text);
    if (!created) return;
    if (std::optional<std::string> text = FormatFileTime(*created, kUtcFormat, Zone::kUtc)) {
      writer_.Property("CREATED", *text);
    }
  }

  void Times(const store::AppointmentRecord& r) {
    const store::FileTime end = r.end_time ? r.end_time : r.named_time_2;
    store::FileTime start = r.start_time ? r.start_time : r.named_time_2;
    std::optional<std::string> start_text;
    for (const store::FileTime& candidate : {start, end, r.creation_time}) {
      if (candidate && (start_text = FormatFileTime(*candidate, kLocalFormat, Zone::kLocal))) {
        start = candidate;
        break;
      }
    }
    if (!start_text) {
      start = CurrentFileTime();
      start_text = FormatFileTime(*start, kLocalFormat, Zone::kLocal);
    }
    if (end && *end > *start) {
      std::optional<std::string> end_text = FormatFileTime(*end, kLocalFormat, Zone::kLocal);
      // Times without a zone are compared as written: when the clock went back the written
      // end may not be later than the written start, and only a duration keeps the event.
      if (end_text && *end_text > start_text.value_or("")) {
        writer_.Property("DTEND", *end_text);
      } else if (end_text) {
        writer_.Property("DURATION", Duration(*start, *end));
      }
    }
    writer_.Property("DTSTART", start_text.value_or(""));
  }

  // STATUS only has room for the confirmation of an event; the busy status itself goes into
  // the property calendar programs keep it in.
  void Status(std::string_view busy) {
    if (busy.empty()) return;
    const std::string upper = AsciiUpper(busy);
    if (Contains(kBusyStatusTexts, upper)) {
      writer_.Property("STATUS", upper == kTentative ? kTentative : kConfirmed);
      writer_.Property("X-MICROSOFT-CDO-BUSYSTATUS", upper);
    } else if (Contains(kEventStatuses, upper)) {
      writer_.Property("STATUS", upper);
    } else {
      writer_.Property("X-MICROSOFT-CDO-BUSYSTATUS", EscapeText(busy));
    }
  }

  TextMode mode_;
  ContentWriter writer_;
};

}  // namespace

std::string_view BusyStatusText(uint32_t value) {
  return value < std::size(kBusyStatusTexts) ? kBusyStatusTexts[value] : std::string_view();
}

std::string ComposeICalendar(const store::AppointmentRecord& record, const AppointmentItem& item,
                             TextMode mode) {
  return ICalComposer(mode).Compose(record, item);
}

}  // namespace tarnwell::render
