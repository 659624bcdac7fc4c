// Importing an iCalendar file into the message model: its first VEVENT as an
// appointment ("IPM.Appointment"), or, when it has none, its first VTODO as a
// task ("IPM.Task").
//
// Times become UTC FILETIMEs: "...Z" times are UTC already; a TZID names a
// VTIMEZONE of the file, whose observances (with yearly BYMONTH/BYDAY rules)
// give the offset in force at that local time; a floating time, or a TZID the
// file does not define, is taken as this machine's local time, which is what
// the iCalendar writer writes. A date without a time is local midnight and
// makes the appointment an all-day one.
//
//   VEVENT  SUMMARY, DESCRIPTION       subject, body
//           DTSTART, DTEND / DURATION  start and end: PidLidAppointmentStartWhole/EndWhole,
//                                      PidLidCommonStart/End, PidTagStartDate/EndDate, and
//                                      the duration in minutes
//           LOCATION                   PidLidLocation
//           X-MICROSOFT-CDO-BUSYSTATUS, TRANSP, STATUS   PidLidBusyStatus
//           ORGANIZER, ATTENDEE        sender and recipients (ROLE OPT-PARTICIPANT: Cc,
//                                      NON-PARTICIPANT: Bcc); attendees make it a meeting
//           CLASS, PRIORITY, X-MICROSOFT-CDO-IMPORTANCE   sensitivity, importance
//           CREATED, LAST-MODIFIED     creation and modification times
//   VTODO   SUMMARY, DESCRIPTION, DTSTART, DUE, STATUS, PERCENT-COMPLETE, COMPLETED
//           → subject, body and the PSETID_Task start, due, status, percent complete,
//           completion date and complete flag
//
// Recurrence rules of events are not turned into recurrence patterns: the
// item keeps its first occurrence.
#ifndef TARNWELL_MAPI_IMPORT_ICALENDAR_IMPORT_H_
#define TARNWELL_MAPI_IMPORT_ICALENDAR_IMPORT_H_

#include <optional>
#include <string_view>

#include "base/status.h"
#include "mapi/property_bag.h"

namespace tarnwell::mapi {

inline constexpr size_t kMaxCalendarLines = 200000;
inline constexpr int kMaxComponentDepth = 8;

// Fills `out` from `text`. Corruption when the file holds no VEVENT and no
// VTODO.
Status ImportICalendar(std::string_view text, Message* out);

// An iCalendar DURATION ("P1DT2H", "-PT15M", "P2W") in seconds.
std::optional<int64_t> ParseICalDuration(std::string_view text);

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_IMPORT_ICALENDAR_IMPORT_H_
