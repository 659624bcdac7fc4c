// An appointment or meeting as an iCalendar file (".ics") holding one VEVENT.
//
// Lines, in this order:
//
//   BEGIN:VCALENDAR, VERSION:2.0, PRODID, BEGIN:VEVENT
//   UID          the caller's, else derived from the item's times and texts (stable across runs)
//   DTSTAMP      the creation time in UTC, else the present time
//   ORGANIZER    MAILTO: and the organizer's address        (when known)
//   CREATED      the creation time in UTC; without one, the item's created date text
//   DTEND        local time without a zone, when later than the start; a DURATION instead
//                when the local clock went back between start and end
//   DTSTART      local time without a zone
//   SUMMARY      the subject; ";CHARSET=utf-8" is added to the name with UTF-8 text
//   DESCRIPTION  the body text, or the second body when there is none
//   STATUS       TENTATIVE for a tentative appointment, else CONFIRMED (when the busy status
//                is known), and X-MICROSOFT-CDO-BUSYSTATUS with the busy status itself
//   X-MICROSOFT-CDO-IMPORTANCE   the importance, when not 0
//   END:VEVENT, END:VCALENDAR
//
// Without an end time the end comes from the record's second date field ("T8102"); the start
// too, and an appointment with no start at all starts at its end, creation or stamp time,
// because an event needs a start. Absent texts give no line.
#ifndef TARNWELL_RENDER_ICAL_WRITER_H_
#define TARNWELL_RENDER_ICAL_WRITER_H_

#include <cstdint>
#include <string>
#include <string_view>

#include "render/content_line.h"
#include "store/item_records.h"

namespace tarnwell::render {

// What the writer needs besides the appointment record: values of the item's message row.
struct AppointmentItem {
  std::string organizer;  // e-mail address
  std::string subject;
  std::string created_text;  // the created date text, "dd/mm/yyyy hh:mm:ss" local time
  std::string second_body;   // used when the record has no body text
  std::string busy_status;   // empty: from the record's appointment value (BusyStatusText)
  uint32_t importance = 0;
  std::string uid;  // empty: derived
};

// "FREE", "TENTATIVE", "BUSY", "OUTOFOFFICE", "WORKINGELSEWHERE" for the busy-status values 0
// to 4; empty for any other value.
std::string_view BusyStatusText(uint32_t value);

// The complete file.
std::string ComposeICalendar(const store::AppointmentRecord& record, const AppointmentItem& item,
                             TextMode mode);

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_ICAL_WRITER_H_
