#include "base/date_text.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <ctime>
#include <string>

#include "base/date_time.h"

namespace tarnwell {
namespace {

TEST(DateTextTest, ReadsBackWhatDateTextShowsAndNothingElse) {
  const char* old = std::getenv("TZ");
  const std::string saved = old ? old : "";
  for (const char* zone : {"UTC0", "CET-1CEST,M3.5.0,M10.5.0/3"}) {
    setenv("TZ", zone, 1);
    tzset();
    for (int64_t unix_seconds : {0, 1044072306, 1614949629, 1625000000}) {
      const uint64_t t = *UnixTimeToFileTime(unix_seconds);
      EXPECT_EQ(FileTimeFromDateText(DateText(t)), t) << zone << " " << DateText(t);
    }
  }
  setenv("TZ", "UTC0", 1);
  tzset();
  EXPECT_EQ(FileTimeFromDateText("01/02/2003 04:05:06"), *UnixTimeToFileTime(1044072306));
  for (const char* bad : {"", "31/02/2021 10:00:00", "01/02/2003 04:05:60", "1/2/2003",
                          "Invalid DateTime", "01/02/2003 04:05:06 extra"}) {
    EXPECT_FALSE(FileTimeFromDateText(bad)) << bad;
  }
  if (old) {
    setenv("TZ", saved.c_str(), 1);
  } else {
    unsetenv("TZ");
  }
  tzset();
}

}  // namespace
}  // namespace tarnwell
