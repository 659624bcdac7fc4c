#include "base/date_text.h"

#include <cstdio>
#include <ctime>
#include <string>

#include "base/date_time.h"

namespace tarnwell {
namespace {

constexpr int kTmYearBase = 1900;

}  // namespace

std::optional<uint64_t> FileTimeFromDateText(std::string_view text) {
  const std::string s(text);
  int day, month, year, hour, minute, second;
  char tail;
  if (std::sscanf(s.c_str(), "%2d/%2d/%4d %2d:%2d:%2d%c", &day, &month, &year, &hour, &minute,
                  &second, &tail) != 6) {
    return std::nullopt;
  }
  std::tm tm{};
  tm.tm_year = year - kTmYearBase;
  tm.tm_mon = month - 1;
  tm.tm_mday = day;
  tm.tm_hour = hour;
  tm.tm_min = minute;
  tm.tm_sec = second;
  tm.tm_isdst = -1;
  const std::tm asked = tm;
  const std::time_t t = std::mktime(&tm);
  if (tm.tm_mday != asked.tm_mday || tm.tm_mon != asked.tm_mon || tm.tm_year != asked.tm_year ||
      tm.tm_hour != asked.tm_hour || tm.tm_min != asked.tm_min || tm.tm_sec != asked.tm_sec) {
    return std::nullopt;
  }
  return UnixTimeToFileTime(t);
}

}  // namespace tarnwell
