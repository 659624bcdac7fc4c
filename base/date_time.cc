#include "base/date_time.h"

#include <cstdio>
#include <cstdlib>

namespace tarnwell {
namespace {

constexpr int kMinYear = 1601;
constexpr int kMaxYear = 9999;
constexpr int kTmYearBase = 1900;
constexpr int kSecondsPerMinute = 60;
constexpr int kSecondsPerHour = 3600;
constexpr uint32_t kNanosecondsPerSecond = 1'000'000'000;
// strftime output longer than this is refused rather than grown without bound.
constexpr size_t kMaxFormattedSize = 64 * 1024;

constexpr const char* kDayNames[] = {"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
constexpr const char* kMonthNames[] = {"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                       "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};

std::optional<std::tm> UnixToTm(int64_t seconds, Zone zone) {
  const std::time_t t = seconds;
  std::tm tm{};
  if ((zone == Zone::kLocal ? localtime_r(&t, &tm) : gmtime_r(&t, &tm)) == nullptr) {
    return std::nullopt;
  }
  const int year = tm.tm_year + kTmYearBase;
  if (year < kMinYear || year > kMaxYear) return std::nullopt;
  return tm;
}

}  // namespace

std::optional<UnixTime> FileTimeToUnixTime(uint64_t filetime) {
  if (!IsValidFileTime(filetime)) return std::nullopt;
  UnixTime out;
  out.seconds = int64_t(filetime / kFileTimeTicksPerSecond) - kFileTimeEpochOffsetSeconds;
  out.nanoseconds = uint32_t(filetime % kFileTimeTicksPerSecond) * kNanosecondsPerFileTimeTick;
  return out;
}

std::optional<uint64_t> UnixTimeToFileTime(int64_t seconds, uint32_t nanoseconds) {
  if (nanoseconds >= kNanosecondsPerSecond) return std::nullopt;
  if (seconds < kMinUnixSeconds || seconds > kMaxUnixSeconds) return std::nullopt;
  return uint64_t(seconds + kFileTimeEpochOffsetSeconds) * kFileTimeTicksPerSecond +
         nanoseconds / kNanosecondsPerFileTimeTick;
}

uint64_t CurrentFileTime() {
  std::timespec now{};
  std::timespec_get(&now, TIME_UTC);
  return UnixTimeToFileTime(now.tv_sec, uint32_t(now.tv_nsec)).value_or(0);
}

std::optional<std::tm> FileTimeToTm(uint64_t filetime, Zone zone) {
  std::optional<UnixTime> unix_time = FileTimeToUnixTime(filetime);
  if (!unix_time) return std::nullopt;
  return UnixToTm(unix_time->seconds, zone);
}

std::string DateText(std::optional<uint64_t> filetime) {
  if (!filetime) return "";
  std::optional<std::tm> tm = FileTimeToTm(*filetime, Zone::kLocal);
  if (!tm) return std::string(kInvalidDateText);
  char text[80];  // room for any int fields, so the compiler can see nothing is cut
  std::snprintf(text, sizeof text, "%02d/%02d/%04d %02d:%02d:%02d", tm->tm_mday, tm->tm_mon + 1,
                tm->tm_year + kTmYearBase, tm->tm_hour, tm->tm_min, tm->tm_sec);
  return text;
}

std::optional<std::string> FormatFileTime(uint64_t filetime, std::string_view pattern, Zone zone) {
  std::optional<std::tm> tm = FileTimeToTm(filetime, zone);
  if (!tm) return std::nullopt;
  // strftime returns 0 both for an empty result and for a buffer too small; a trailing
  // character that is always there tells the two apart.
  std::string format(pattern);
  format.push_back('.');
  std::string out(format.size() * 4 + 64, '\0');
  for (;;) {
    size_t length = std::strftime(out.data(), out.size(), format.c_str(), &*tm);
    if (length > 0) {
      out.resize(length - 1);
      return out;
    }
    if (out.size() >= kMaxFormattedSize) return std::nullopt;
    out.resize(out.size() * 2);
  }
}

std::optional<std::string> Rfc5322Date(uint64_t filetime) {
  std::optional<UnixTime> unix_time = FileTimeToUnixTime(filetime);
  if (!unix_time) return std::nullopt;
  std::optional<std::tm> tm = UnixToTm(unix_time->seconds, Zone::kLocal);
  if (!tm) return std::nullopt;
  long offset = tm->tm_gmtoff;
  if (offset % kSecondsPerMinute != 0) {
    offset -= offset % kSecondsPerMinute;
    tm = UnixToTm(unix_time->seconds + offset, Zone::kUtc);
    if (!tm) return std::nullopt;
  }
  const char sign = offset < 0 ? '-' : '+';
  const long magnitude = std::labs(offset);
  char text[96];
  std::snprintf(text, sizeof text, "%s, %02d %s %04d %02d:%02d:%02d %c%02ld%02ld",
                kDayNames[tm->tm_wday], tm->tm_mday, kMonthNames[tm->tm_mon],
                tm->tm_year + kTmYearBase, tm->tm_hour, tm->tm_min, tm->tm_sec, sign,
                magnitude / kSecondsPerHour, magnitude % kSecondsPerHour / kSecondsPerMinute);
  return text;
}

}  // namespace tarnwell
