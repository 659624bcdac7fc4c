#include "export/export_log.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "base/text.h"

namespace tarnwell::exporter {
namespace {

namespace fs = std::filesystem;

constexpr int kStarLineLength = 149;
constexpr int kSlashLineLength = 90;
constexpr uint8_t kByteOrderMark[] = {0xFF, 0xFE};

std::string SixFields(const std::tm& t, const char* format) {
  char buf[64];
  std::snprintf(buf, sizeof buf, format, t.tm_mday, t.tm_mon + 1, t.tm_year + 1900, t.tm_hour,
                t.tm_min, t.tm_sec);
  return buf;
}

std::tm Local(std::time_t t) {
  std::tm tm{};
  localtime_r(&t, &tm);
  return tm;
}

// The XDG user-dirs file names the desktop as XDG_DESKTOP_DIR="$HOME/...".
std::string XdgDesktop(const std::string& home) {
  const char* config = std::getenv("XDG_CONFIG_HOME");
  const std::string dirs =
      (config && *config ? std::string(config) : home + "/.config") + "/user-dirs.dirs";
  std::ifstream in(dirs);
  std::string line;
  while (std::getline(in, line)) {
    const std::string key = "XDG_DESKTOP_DIR=";
    if (line.rfind(key, 0) != 0) continue;
    std::string value = line.substr(key.size());
    if (value.size() >= 2 && value.front() == '"' && value.back() == '"') {
      value = value.substr(1, value.size() - 2);
    }
    if (value.rfind("$HOME", 0) == 0) value = home + value.substr(5);
    return value;
  }
  return "";
}

}  // namespace

std::string DesktopFolder() {
  const char* home_env = std::getenv("HOME");
  const std::string home = home_env && *home_env ? home_env : "";
  std::error_code ec;
  if (!home.empty()) {
    const std::string xdg = XdgDesktop(home);
    if (!xdg.empty() && fs::is_directory(xdg, ec)) return xdg;
    if (fs::is_directory(home + "/Desktop", ec)) return home + "/Desktop";
    if (fs::is_directory(home, ec)) return home;
  }
  return ".";
}

std::string LogFileName(const std::tm& local) {
  return "Edblog_" + SixFields(local, "%d-%d-%d_%d-%d-%d") + ".txt";
}

bool ExportLog::Open(const std::string& folder, std::time_t now, const std::string& source,
                     const std::string& save_path, const std::string& format_name,
                     const std::string& user_name) {
  Close();
  path_ = (fs::path(folder) / LogFileName(Local(now))).string();
  std::error_code ec;
  const bool existed = fs::exists(path_, ec);
  file_ = std::fopen(path_.c_str(), "ab");
  if (!file_) return false;
  if (!existed) std::fwrite(kByteOrderMark, 1, sizeof kByteOrderMark, file_);
  Write(std::string(kStarLineLength, '*') + "\r\n");
  Write("Source File:\t" + source + "\r\n");
  Write("Save Path:\t" + save_path + "\r\n");
  if (!user_name.empty()) Write("User Name:\t" + user_name + "\r\n");
  if (!format_name.empty()) Write("Save Items as:\t" + format_name + "\t\r\n");
  return true;
}

void ExportLog::Close() {
  if (file_) std::fclose(file_);
  file_ = nullptr;
}

void ExportLog::Write(const std::string& text) {
  if (!file_) return;
  const Bytes utf16 = Utf8ToUtf16LE(text);
  std::fwrite(utf16.data(), 1, utf16.size(), file_);
  std::fflush(file_);
}

void ExportLog::StartTime(std::time_t now) {
  Write(" Saving Process Start Time:\t" + SixFields(Local(now), "%d-%d-%d::%d-%d-%d") + "\r\n");
}

void ExportLog::FolderStart(const std::string& folder_path) {
  Write("\r\n Saving Folder: " + folder_path + "\r\n");
}

void ExportLog::ItemsFound(uint64_t count) {
  Write("Items Found: " + std::to_string(count) + "\r\n");
}

void ExportLog::ItemsSaved(uint64_t count) {
  Write("Items Saved: " + std::to_string(count) + "\r\n\r\n");
}

void ExportLog::Error(const std::string& text) { Write("ERROR:" + text); }

void ExportLog::End(const std::string& destination, std::time_t started, std::time_t now) {
  const long elapsed = long(now >= started ? now - started : 0);
  char buf[64];
  std::snprintf(buf, sizeof buf, "%ld:%ld:%ld", elapsed / 3600, (elapsed / 60) % 60, elapsed % 60);
  Write("\r\n Data is extracted in path " + destination);
  Write("\r\n" + std::string(kSlashLineLength, '/') + "\r\n\r\n");
  Write("Save Process Completed Successfully\r\n");
  Write(std::string("Elapse Time: ") + buf + "\r\n\r\n");
}

}  // namespace tarnwell::exporter
