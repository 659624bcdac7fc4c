#include "base/date_time.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

namespace tarnwell {
namespace {

constexpr uint64_t kUnixEpoch = 116'444'736'000'000'000;
constexpr uint64_t kMar5 = 132'594'232'290'000'000;           // 2021-03-05 13:07:09 UTC
constexpr uint64_t kSpringLastCet = 132'613'667'990'000'000;  // 2021-03-28 00:59:59 UTC
constexpr uint64_t kSpringFirstCest = kSpringLastCet + kFileTimeTicksPerSecond;
constexpr uint64_t kAutumnLastCest = 132'801'155'990'000'000;  // 2021-10-31 00:59:59 UTC
constexpr uint64_t kAutumnFirstCet = kAutumnLastCest + kFileTimeTicksPerSecond;

constexpr char kPosixBerlin[] = "CET-1CEST,M3.5.0,M10.5.0/3";
constexpr char kPosixNewYork[] = "EST5EDT,M3.2.0,M11.1.0";

// Sets TZ for one test and puts the old value back afterwards.
class TimeZoneTest : public ::testing::Test {
 protected:
  void SetUp() override {
    const char* old = std::getenv("TZ");
    had_tz_ = old != nullptr;
    if (had_tz_) old_tz_ = old;
  }
  void TearDown() override {
    if (had_tz_) {
      setenv("TZ", old_tz_.c_str(), 1);
    } else {
      unsetenv("TZ");
    }
    tzset();
  }
  static void UseZone(const char* zone) {
    setenv("TZ", zone, 1);
    tzset();
  }
  // Without the file glibc would quietly use UTC and the test would fail for the wrong reason.
  static bool HaveZoneFile(const char* zone) {
    return access((std::string("/usr/share/zoneinfo/") + zone).c_str(), R_OK) == 0;
  }

 private:
  bool had_tz_ = false;
  std::string old_tz_;
};

TEST(FileTimeTest, ConvertsToAndFromUnixTimeWithinRange) {
  struct Case {
    uint64_t filetime;
    int64_t seconds;
    uint32_t nanoseconds;
  };
  const Case kValid[] = {
      {0, kMinUnixSeconds, 0},
      {kUnixEpoch - 1, -1, 999'999'900},
      {kUnixEpoch, 0, 0},
      {kMar5 + 1234567, 1'614'949'629, 123'456'700},
      {kMaxFileTime, kMaxUnixSeconds, 999'999'900},
  };
  for (const Case& c : kValid) {
    std::optional<UnixTime> unix_time = FileTimeToUnixTime(c.filetime);
    ASSERT_TRUE(unix_time) << c.filetime;
    EXPECT_EQ(unix_time->seconds, c.seconds) << c.filetime;
    EXPECT_EQ(unix_time->nanoseconds, c.nanoseconds) << c.filetime;
    EXPECT_EQ(UnixTimeToFileTime(c.seconds, c.nanoseconds), c.filetime);
  }
  for (uint64_t bad : {kMaxFileTime + 1, uint64_t{1} << 63, ~uint64_t{0}}) {
    EXPECT_FALSE(FileTimeToUnixTime(bad)) << bad;
    EXPECT_FALSE(FileTimeToTm(bad, Zone::kUtc)) << bad;
  }
  EXPECT_FALSE(UnixTimeToFileTime(kMinUnixSeconds - 1));
  EXPECT_FALSE(UnixTimeToFileTime(kMaxUnixSeconds + 1));
  EXPECT_FALSE(UnixTimeToFileTime(0, 1'000'000'000));
  EXPECT_EQ(UnixTimeToFileTime(0, 199), kUnixEpoch + 1);  // below 100 ns is dropped
  std::optional<UnixTime> now = FileTimeToUnixTime(CurrentFileTime());
  ASSERT_TRUE(now);
  EXPECT_GT(now->seconds, 1'600'000'000);
}

struct LocalCase {
  const char* name;
  const char* zone;
  uint64_t filetime;
  const char* date_text;
  const char* rfc5322;  // nullptr: cannot be converted
};
void PrintTo(const LocalCase& c, std::ostream* os) { *os << c.name; }

class LocalTimeTest : public TimeZoneTest, public ::testing::WithParamInterface<LocalCase> {};

TEST_P(LocalTimeTest, FormatsInProcessZone) {
  const LocalCase& c = GetParam();
  // Olson names need the tz database; POSIX rule strings carry their own rules.
  const bool olson = std::string_view(c.zone).find(',') == std::string_view::npos &&
                     std::string_view(c.zone).find('/') != std::string_view::npos;
  if (olson && !HaveZoneFile(c.zone)) {
    GTEST_SKIP() << "no tz database entry for " << c.zone;
  }
  UseZone(c.zone);
  EXPECT_EQ(DateText(c.filetime), c.date_text);
  std::optional<std::string> rfc = Rfc5322Date(c.filetime);
  if (c.rfc5322 == nullptr) {
    EXPECT_FALSE(rfc) << *rfc;
  } else {
    EXPECT_EQ(rfc.value_or("(none)"), c.rfc5322);
  }
}

INSTANTIATE_TEST_SUITE_P(
    Cases, LocalTimeTest,
    ::testing::Values(
        LocalCase{"UtcEpoch1601", "UTC0", 0, "01/01/1601 00:00:00",
                  "Mon, 01 Jan 1601 00:00:00 +0000"},
        LocalCase{"UtcUnixEpoch", "UTC0", kUnixEpoch, "01/01/1970 00:00:00",
                  "Thu, 01 Jan 1970 00:00:00 +0000"},
        LocalCase{"UtcLast", "UTC0", kMaxFileTime, "31/12/9999 23:59:59",
                  "Fri, 31 Dec 9999 23:59:59 +0000"},
        LocalCase{"UtcPastLast", "UTC0", kMaxFileTime + 1, "Invalid DateTime", nullptr},
        LocalCase{"UtcNegative", "UTC0", ~uint64_t{0}, "Invalid DateTime", nullptr},
        LocalCase{"BerlinWinter", kPosixBerlin, kMar5, "05/03/2021 14:07:09",
                  "Fri, 05 Mar 2021 14:07:09 +0100"},
        LocalCase{"BerlinBeforeSpring", kPosixBerlin, kSpringLastCet, "28/03/2021 01:59:59",
                  "Sun, 28 Mar 2021 01:59:59 +0100"},
        LocalCase{"BerlinAfterSpring", kPosixBerlin, kSpringFirstCest, "28/03/2021 03:00:00",
                  "Sun, 28 Mar 2021 03:00:00 +0200"},
        LocalCase{"BerlinBeforeAutumn", kPosixBerlin, kAutumnLastCest, "31/10/2021 02:59:59",
                  "Sun, 31 Oct 2021 02:59:59 +0200"},
        LocalCase{"BerlinAfterAutumn", kPosixBerlin, kAutumnFirstCet, "31/10/2021 02:00:00",
                  "Sun, 31 Oct 2021 02:00:00 +0100"},
        // The last UTC second is already in the year 10000 in Berlin.
        LocalCase{"BerlinPastYear9999", kPosixBerlin, kMaxFileTime, "Invalid DateTime", nullptr},
        LocalCase{"OlsonBerlinAfterSpring", "Europe/Berlin", kSpringFirstCest,
                  "28/03/2021 03:00:00", "Sun, 28 Mar 2021 03:00:00 +0200"},
        LocalCase{"OlsonBerlinAfterAutumn", "Europe/Berlin", kAutumnFirstCet, "31/10/2021 02:00:00",
                  "Sun, 31 Oct 2021 02:00:00 +0100"},
        // Local mean time, +00:53:28: the header shows +0053 and a clock time to match it.
        LocalCase{"OlsonBerlinLocalMeanTime", "Europe/Berlin", 0, "01/01/1601 00:53:28",
                  "Mon, 01 Jan 1601 00:53:00 +0053"},
        LocalCase{"NewYorkSummer", kPosixNewYork, kAutumnFirstCet, "30/10/2021 21:00:00",
                  "Sat, 30 Oct 2021 21:00:00 -0400"},
        // West of Greenwich the first FILETIME is still in 1600 locally.
        LocalCase{"NewYorkBefore1601", kPosixNewYork, 0, "Invalid DateTime", nullptr}),
    [](const auto& info) { return std::string(info.param.name); });

TEST_F(TimeZoneTest, DateTextOfAbsentTimeIsEmpty) {
  UseZone("UTC0");
  EXPECT_EQ(DateText(std::nullopt), "");
}

TEST_F(TimeZoneTest, FormatsArbitraryPatterns) {
  UseZone(kPosixBerlin);
  EXPECT_EQ(FormatFileTime(kMar5, "%Y%m%dT%H%M%SZ", Zone::kUtc), "20210305T130709Z");
  EXPECT_EQ(FormatFileTime(kMar5, "%H:%M %z"), "14:07 +0100");
  EXPECT_EQ(FormatFileTime(kMar5, ""), "");
  std::string long_pattern;
  for (int i = 0; i < 300; ++i) long_pattern += "%Y";
  std::optional<std::string> long_text = FormatFileTime(kMar5, long_pattern);
  ASSERT_TRUE(long_text);
  EXPECT_EQ(long_text->size(), 1200u);
  EXPECT_FALSE(FormatFileTime(kMaxFileTime + 1, "%Y"));
}

}  // namespace
}  // namespace tarnwell
