// Test support for the vCard and iCalendar writers.
//
// ReadWithPython reads a composed file back with an independent reader written in Python
// (Debian's /usr/bin/python3 and its packaged modules), so that the writers are checked by
// what another program understands rather than by their own idea of the format. The script
// prints one "key TAB hex(UTF-8 value)" line per value it read.
#ifndef TARNWELL_RENDER_WRITER_TEST_SUPPORT_H_
#define TARNWELL_RENDER_WRITER_TEST_SUPPORT_H_

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <optional>
#include <ostream>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "base/date_time.h"
#include "base/text.h"
#include "render/content_line.h"

namespace tarnwell::render {

inline void PrintTo(const TextMode& mode, std::ostream* os) {
  *os << (mode.utf8 ? "UTF-8" : "code page " + std::to_string(mode.ansi_code_page));
}

namespace testing {

inline constexpr const char* kPython = "/usr/bin/python3";
inline constexpr int kMissingModule = 77;

using Values = std::vector<std::pair<std::string, std::string>>;

struct ReadBack {
  bool skipped = false;  // the reader is not available
  std::string skip_reason;
  std::string failure;  // the reader refused the file
  Values values;        // sorted
};

inline std::string HexDecode(const std::string& hex) {
  std::string out;
  for (size_t i = 0; i + 1 < hex.size(); i += 2) {
    out.push_back(char(std::stoi(hex.substr(i, 2), nullptr, 16)));
  }
  return out;
}

inline std::filesystem::path ScratchDir() {
  static std::atomic<int> counter{0};
  std::filesystem::path dir =
      std::filesystem::path(::testing::TempDir()) /
      ("tarnwell_writers_" + std::to_string(getpid()) + "_" + std::to_string(counter++));
  std::filesystem::create_directories(dir);
  return dir;
}

// What every reader script starts with: the module it needs (or kMissingModule), the file's
// bytes as `data` and its codec as `codec`, and the check that every physical line decodes on
// its own, so that no line break cuts a character in two.
inline std::string PythonPrelude(const std::string& module) {
  return "import sys\ntry:\n    import " + module + "\nexcept ImportError:\n    sys.exit(" +
         std::to_string(kMissingModule) +
         ")\npath, codec = sys.argv[1], sys.argv[2]\ndata = open(path, 'rb').read()\n"
         "for line in data.split(b'\\r\\n'):\n    line.decode(codec)\n";
}

// Writes `file` and the prelude and `script` to a scratch folder and runs them on the file.
inline ReadBack ReadWithPython(const std::string& script, const std::string& file,
                               const std::string& extension, const std::string& codec,
                               const std::string& module) {
  ReadBack result;
  if (access(kPython, X_OK) != 0) {
    result.skipped = true;
    result.skip_reason = std::string(kPython) + " is not installed";
    return result;
  }
  const std::filesystem::path dir = ScratchDir();
  const std::filesystem::path script_path = dir / "read.py";
  const std::filesystem::path file_path = dir / ("item" + extension);
  std::ofstream(script_path, std::ios::binary) << PythonPrelude(module) << script;
  std::ofstream(file_path, std::ios::binary) << file;
  const std::string command = std::string(kPython) + " '" + script_path.string() + "' '" +
                              file_path.string() + "' " + codec + " 2>&1";
  FILE* pipe = popen(command.c_str(), "r");
  if (pipe == nullptr) {
    result.failure = "cannot start " + command;
    return result;
  }
  std::string output;
  char buffer[4096];
  size_t n;
  while ((n = fread(buffer, 1, sizeof buffer, pipe)) > 0) output.append(buffer, n);
  const int status = pclose(pipe);
  std::filesystem::remove_all(dir);
  if (WIFEXITED(status) && WEXITSTATUS(status) == kMissingModule) {
    result.skipped = true;
    result.skip_reason = "the Python module " + module + " is not installed";
    return result;
  }
  if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) {
    result.failure = output;
    return result;
  }
  size_t pos = 0;
  while (pos < output.size()) {
    size_t end = output.find('\n', pos);
    if (end == std::string::npos) end = output.size();
    const std::string line = output.substr(pos, end - pos);
    pos = end + 1;
    const size_t tab = line.find('\t');
    if (tab == std::string::npos) {
      result.failure += "unexpected output: " + line + "\n";
      continue;
    }
    result.values.emplace_back(line.substr(0, tab), HexDecode(line.substr(tab + 1)));
  }
  std::sort(result.values.begin(), result.values.end());
  return result;
}

// A FILETIME from a calendar time in UTC, or (Local) in the process time zone.
inline uint64_t Utc(int year, int month, int day, int hour, int minute, bool local = false) {
  std::tm tm{};
  tm.tm_year = year - 1900;
  tm.tm_mon = month - 1;
  tm.tm_mday = day;
  tm.tm_hour = hour;
  tm.tm_min = minute;
  tm.tm_isdst = -1;
  return *UnixTimeToFileTime(local ? mktime(&tm) : timegm(&tm));
}
inline uint64_t Local(int year, int month, int day, int hour, int minute) {
  return Utc(year, month, day, hour, minute, /*local=*/true);
}

inline std::string Repeat(std::string_view text, size_t times) {
  std::string out;
  for (size_t i = 0; i < times; ++i) out += text;
  return out;
}

// Every writer is read back in UTF-8 and in three ANSI code pages: a Western one, a Cyrillic
// one and the double-byte Japanese one, where folding could cut a character in two.
inline constexpr TextMode kModes[] = {
    {true, kDefaultCodePage}, {false, 1252}, {false, 1251}, {false, 932}};

// A test name for a case run in a text mode: "FullUtf8", "FullCp1252".
template <typename Case>
std::string CaseName(const ::testing::TestParamInfo<std::tuple<Case, TextMode>>& info) {
  const TextMode mode = std::get<1>(info.param);
  return std::string(std::get<0>(info.param).name) +
         (mode.utf8 ? "Utf8" : "Cp" + std::to_string(mode.ansi_code_page));
}

// The Python codec of a text mode's character set.
inline std::string Codec(TextMode mode) {
  return mode.utf8 ? "utf-8" : "cp" + std::to_string(mode.ansi_code_page);
}

// What a reader gets back for the text value `text`: ill-formed UTF-8 repaired, control
// characters gone, each line break (CR LF, CR or LF) as `line_break`, and in ANSI mode only
// what the code page can hold.
inline std::string ReadBackText(std::string_view text, std::string_view line_break, TextMode mode) {
  const std::string valid = ToValidUtf8(text);
  std::string out;
  for (size_t i = 0; i < valid.size(); ++i) {
    const char c = valid[i];
    const unsigned char b = static_cast<unsigned char>(c);
    if (c == '\r' || c == '\n') {
      if (c == '\r' && i + 1 < valid.size() && valid[i + 1] == '\n') ++i;
      out += line_break;
    } else if ((b >= 0x20 && b != 0x7F) || c == '\t') {
      out.push_back(c);
    }
  }
  if (mode.utf8) return out;
  const std::string bytes = Utf8ToCodePage(out, mode.ansi_code_page);
  return CodePageToUtf8(ByteView(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size()),
                        mode.ansi_code_page);
}

// Line ends are CR LF only; folded lines stay within 75 octets, quoted-printable ones within
// 76 with their soft break.
inline void ExpectWellFormedLines(const std::string& file) {
  ASSERT_GE(file.size(), 2u);
  EXPECT_EQ(file.substr(file.size() - 2), "\r\n");
  size_t start = 0;
  while (start < file.size()) {
    const size_t end = file.find("\r\n", start);
    ASSERT_NE(end, std::string::npos);
    const std::string line = file.substr(start, end - start);
    EXPECT_EQ(line.find_first_of("\r\n"), std::string::npos) << line;
    const size_t limit =
        !line.empty() && line.back() == '=' ? kMaxQuotedPrintableLine : kMaxLineOctets;
    EXPECT_LE(line.size(), limit) << line;
    start = end + 2;
  }
}

// Sets the process time zone for the life of the object.
class ScopedZone {
 public:
  explicit ScopedZone(const char* zone) {
    if (const char* tz = std::getenv("TZ")) saved_ = tz;
    setenv("TZ", zone, 1);
    tzset();
  }
  ~ScopedZone() {
    if (saved_) {
      setenv("TZ", saved_->c_str(), 1);
    } else {
      unsetenv("TZ");
    }
    tzset();
  }
  ScopedZone(const ScopedZone&) = delete;
  ScopedZone& operator=(const ScopedZone&) = delete;

 private:
  std::optional<std::string> saved_;
};

// Tests of local dates run in a zone whose date differs from UTC's around midnight.
class BerlinTest : public ::testing::Test {
 private:
  ScopedZone zone_{"Europe/Berlin"};
};

}  // namespace testing
}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_WRITER_TEST_SUPPORT_H_
