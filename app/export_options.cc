#include "app/export_options.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>

namespace tarnwell::app {
namespace {

constexpr uint64_t kMegabyte = uint64_t(1) << 20;
constexpr uint64_t kGigabyte = uint64_t(1) << 30;
constexpr uint64_t kMinimumSplitMegabytes = 100;
constexpr size_t kDedupFields = 6;
constexpr size_t kNamingFields = 4;

}  // namespace

Status AddDateRange(std::vector<DateRange>* ranges, const DateRange& range) {
  if (range.end < range.start) return Status::InvalidArgument(kEndBeforeStart);
  if (std::find(ranges->begin(), ranges->end(), range) == ranges->end()) ranges->push_back(range);
  return Status::Ok();
}

Status CheckFilterPage(const ExportOptions& options) {
  if (options.dedup_on &&
      std::none_of(options.dedup_by, options.dedup_by + kDedupFields, [](bool b) { return b; })) {
    return Status::InvalidArgument(kNoDedupCriteria);
  }
  if (options.date_mode != DateMode::kAllTime && options.date_ranges.empty()) {
    return Status::InvalidArgument(kNoDateRange);
  }
  return Status::Ok();
}

Status CheckPstPage(ExportOptions* options, bool create_new, const std::string& path, bool split,
                    const std::string& split_size_text, bool gigabytes) {
  if (create_new) {
    if (path.empty()) return Status::InvalidArgument(kNoSavePath);
    options->split_enabled = false;
    if (split) {
      if (split_size_text.empty()) return Status::InvalidArgument(kNoSplitSize);
      char* end = nullptr;
      const unsigned long long size = std::strtoull(split_size_text.c_str(), &end, 10);
      if (end == split_size_text.c_str() || *end != '\0') {
        return Status::InvalidArgument(kNoSplitSize);
      }
      if (!gigabytes && size < kMinimumSplitMegabytes) {
        return Status::InvalidArgument(kSplitTooSmall);
      }
      options->split_size = size * (gigabytes ? kGigabyte : kMegabyte);
      options->split_enabled = true;
    }
    options->save_path = path + "/";
    options->pst_mode = 1;
    return Status::Ok();
  }
  if (path.empty()) return Status::InvalidArgument(kNoExistingPst);
  options->existing_pst = path;
  options->pst_mode = 2;
  return Status::Ok();
}

Status CheckFormatPage(ExportOptions* options, const std::string& folder, std::time_t now) {
  if (std::none_of(options->name_by, options->name_by + kNamingFields, [](bool b) { return b; })) {
    return Status::InvalidArgument(kNoNamingOption);
  }
  if (folder.empty()) return Status::InvalidArgument(kNoDestination);
  std::tm t{};
  localtime_r(&now, &t);
  char stamp[64];
  std::snprintf(stamp, sizeof stamp, "%d_%d_%d_%d_%d_%d", t.tm_mday, t.tm_mon + 1, t.tm_year + 1900,
                t.tm_hour, t.tm_min, t.tm_sec);
  options->destination = folder + "/Tarnwell_" + stamp;
  return Status::Ok();
}

const char* FormatName(OutputFormat format) {
  switch (format) {
    case OutputFormat::kEml:
      return "EML";
    case OutputFormat::kMsg:
      return "MSG";
    case OutputFormat::kMsgUnicode:
      return "MSG Unicode";
    case OutputFormat::kRtf:
      return "RTF";
    case OutputFormat::kHtml:
      return "HTML";
    case OutputFormat::kText:
      return "Text";
    case OutputFormat::kMbox:
      return "Mbox";
    case OutputFormat::kPdf:
      return "Pdf";
  }
  return "";
}

const char* FormatLogName(OutputFormat format) {
  if (format == OutputFormat::kPdf) return "PDF";
  return FormatName(format);
}

bool InRange(const CalendarDate& d, const DateRange& r) {
  return d.year >= r.start.year && d.year <= r.end.year && d.month >= r.start.month &&
         d.month <= r.end.month && d.day >= r.start.day && d.day <= r.end.day;
}

}  // namespace tarnwell::app
