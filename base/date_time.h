// FILETIME values and the dates shown to the user.
//
// A FILETIME is an unsigned 64-bit count of 100-nanosecond ticks since 1601-01-01 00:00:00
// UTC; the database and every Windows file format store times that way. The rules:
//
//   valid range   0 (1601-01-01 00:00:00 UTC) to kMaxFileTime (9999-12-31 23:59:59.9999999
//                 UTC). Anything larger, which includes every value whose top bit is set
//                 (a negative number to Windows), is invalid.
//   local time    The process time zone, through localtime_r. Whoever changes TZ calls
//                 tzset() afterwards. A time whose local date falls outside the years
//                 1601-9999 cannot be shown either (FILETIME 0 west of Greenwich), just as
//                 Windows refuses a local FILETIME below zero.
//   DateText      "" for an absent time, kInvalidDateText when the time is invalid or the
//                 conversion fails, else the local time as "%d/%m/%Y %H:%M:%S".
//
// Formatting never depends on the C library's locale: month and day names in mail headers
// are English whatever LC_TIME says.
#ifndef TARNWELL_BASE_DATE_TIME_H_
#define TARNWELL_BASE_DATE_TIME_H_

#include <cstdint>
#include <ctime>
#include <optional>
#include <string>
#include <string_view>

namespace tarnwell {

inline constexpr uint64_t kFileTimeTicksPerSecond = 10'000'000;
inline constexpr uint32_t kNanosecondsPerFileTimeTick = 100;
// Seconds from 1601-01-01 to 1970-01-01.
inline constexpr int64_t kFileTimeEpochOffsetSeconds = 11'644'473'600;
// 9999-12-31 23:59:59 UTC in Unix seconds.
inline constexpr int64_t kMaxUnixSeconds = 253'402'300'799;
inline constexpr int64_t kMinUnixSeconds = -kFileTimeEpochOffsetSeconds;
inline constexpr uint64_t kMaxFileTime =
    uint64_t(kMaxUnixSeconds + kFileTimeEpochOffsetSeconds) * kFileTimeTicksPerSecond +
    (kFileTimeTicksPerSecond - 1);

inline constexpr std::string_view kInvalidDateText = "Invalid DateTime";

struct UnixTime {
  int64_t seconds = 0;       // may be negative (before 1970)
  uint32_t nanoseconds = 0;  // 0 to 999'999'999, added to seconds
};

inline bool IsValidFileTime(uint64_t filetime) { return filetime <= kMaxFileTime; }

// Absent when filetime is invalid.
std::optional<UnixTime> FileTimeToUnixTime(uint64_t filetime);
// Absent outside 1601-9999 or when nanoseconds is not below one second. Precision below
// 100 ns is dropped.
std::optional<uint64_t> UnixTimeToFileTime(int64_t seconds, uint32_t nanoseconds = 0);
uint64_t CurrentFileTime();

enum class Zone { kLocal, kUtc };

// Broken-down time (tm_gmtoff and tm_zone filled in), or absent as described above.
std::optional<std::tm> FileTimeToTm(uint64_t filetime, Zone zone = Zone::kLocal);

std::string DateText(std::optional<uint64_t> filetime);

// strftime with `pattern`; absent when the time cannot be converted. Locale-dependent
// conversions (%a, %b, %c, ...) follow LC_TIME, so mail headers use Rfc5322Date instead.
std::optional<std::string> FormatFileTime(uint64_t filetime, std::string_view pattern,
                                          Zone zone = Zone::kLocal);

// "Fri, 05 Mar 2021 14:07:09 +0100" in local time; absent when the time cannot be converted.
// Offsets with a seconds part (local mean time before time zones existed) are cut to whole
// minutes, and the clock time shown moves with them so that the header stays exact.
std::optional<std::string> Rfc5322Date(uint64_t filetime);

}  // namespace tarnwell

#endif  // TARNWELL_BASE_DATE_TIME_H_
