// Reading back the date text of base/date_time.h ("%d/%m/%Y %H:%M:%S", local time), which is
// how the item list of the database shows its times.
//
// A text is a date only when the local clock really shows it: mktime would quietly move
// "31/02/2021" to 3 March, and such a text is not a date. kInvalidDateText is not a date
// either.
#ifndef TARNWELL_BASE_DATE_TEXT_H_
#define TARNWELL_BASE_DATE_TEXT_H_

#include <cstdint>
#include <optional>
#include <string_view>

namespace tarnwell {

// The FILETIME that DateText() shows as `text`; absent when `text` is not such a date.
std::optional<uint64_t> FileTimeFromDateText(std::string_view text);

}  // namespace tarnwell

#endif  // TARNWELL_BASE_DATE_TEXT_H_
