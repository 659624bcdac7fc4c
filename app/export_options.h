// ExportOptions: everything an export needs, collected before its job
// starts, and the checks each option page makes before it lets the user on.
// The desktop pages and the command line fill the same record and get the
// same messages.
#ifndef TARNWELL_APP_EXPORT_OPTIONS_H_
#define TARNWELL_APP_EXPORT_OPTIONS_H_

#include <cstdint>
#include <ctime>
#include <string>
#include <vector>

#include "base/status.h"

namespace tarnwell::app {

enum class OutputFormat : uint32_t {
  kEml = 1,
  kMsg = 2,
  kMsgUnicode = 3,
  kRtf = 4,
  kHtml = 5,
  kText = 6,
  kMbox = 7,
  kPdf = 8,
};

enum class DateMode : uint32_t {
  kAllTime = 0,  // "All Time"
  kInside = 1,   // "Save items in selected date range"
  kExclude = 2,  // "Exclude items in selected date range"
};

struct CalendarDate {
  int year = 0, month = 0, day = 0;
  bool operator==(const CalendarDate&) const = default;
  auto operator<=>(const CalendarDate&) const = default;
};

struct DateRange {
  CalendarDate start, end;
  bool operator==(const DateRange&) const = default;
};

struct ExportOptions {
  bool pst_target = false;        // "Save in PST"
  bool office365_target = false;  // "Save in Office 365"
  DateMode date_mode = DateMode::kAllTime;
  std::vector<DateRange> date_ranges;
  bool dedup_on = false;
  // To, From, Subject, Created Date, Modify Date, Arrival Date.
  bool dedup_by[6] = {true, true, true, true, true, true};
  // PST page.
  uint32_t pst_mode = 0;  // 1 new PST, 2 existing PST
  std::string save_path;
  std::string existing_pst;
  bool split_by_user = false;
  bool split_enabled = false;
  uint64_t split_size = 0;  // bytes
  // Format page.
  OutputFormat format = OutputFormat::kEml;
  bool keep_hierarchy = false;
  bool name_by[4] = {true, true, true, true};  // To, From, Subject, Date
  std::string destination;
  // Office 365.
  std::string user, password;
};

// The messages the option pages show.
inline constexpr char kEndBeforeStart[] = "End date should be greater than Start date";
inline constexpr char kNoDedupCriteria[] =
    "Please select at least one item for duplicate remove criteria.";
inline constexpr char kNoDateRange[] = "Please add date range in list control to continue";
inline constexpr char kNoSavePath[] = "Please browse save path.";
inline constexpr char kNoSplitSize[] = "Split Size Cannot be left blank.";
inline constexpr char kSplitTooSmall[] = "Minimum Split Size Cannot be less than 100 MB";
inline constexpr char kNoExistingPst[] = "Please browse Pst file.";
inline constexpr char kNoNamingOption[] =
    "Please select atleast one option from naming convention for saving.";
inline constexpr char kNoDestination[] = "Please browse destination Location.";

// Adds a range; refuses an end before the start; a range already listed is
// not listed twice (still success).
Status AddDateRange(std::vector<DateRange>* ranges, const DateRange& range);

// The filter page's Next: duplicate criteria, then the date ranges.
Status CheckFilterPage(const ExportOptions& options);
// The PST page's Next. `split_size_text` is what the size box holds.
Status CheckPstPage(ExportOptions* options, bool create_new, const std::string& path, bool split,
                    const std::string& split_size_text, bool gigabytes);
// The format page's Next: naming, then the destination folder, which
// becomes folder + "/Tarnwell_" + the local date and time.
Status CheckFormatPage(ExportOptions* options, const std::string& folder, std::time_t now);

// "EML", "MSG", "MSG Unicode", "RTF", "HTML", "Text", "Mbox", "Pdf".
const char* FormatName(OutputFormat format);
// The name the export log uses ("PDF" where the page says "Pdf").
const char* FormatLogName(OutputFormat format);

// Whether a date lies in a range field by field: year within the years,
// month within the months, day within the days.
bool InRange(const CalendarDate& date, const DateRange& range);

}  // namespace tarnwell::app

#endif  // TARNWELL_APP_EXPORT_OPTIONS_H_
