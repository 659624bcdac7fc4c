// ExportLog: the plain-text report every export run writes.
//
// The file is UTF-16 little-endian, two bytes a character, lines ending in
// CR LF, named "Edblog_" + the local date and time ("%d-%d-%d_%d-%d-%d": day,
// month, year, hour, minute, second, unpadded) + ".txt" in the user's
// desktop folder. A new file starts with a byte-order mark so that editors
// recognise it; a second run in the same second appends to the same file.
// When the file cannot be opened the export runs all the same, unlogged.
#ifndef TARNWELL_EXPORT_EXPORT_LOG_H_
#define TARNWELL_EXPORT_EXPORT_LOG_H_

#include <cstdint>
#include <cstdio>
#include <ctime>
#include <string>

namespace tarnwell::exporter {

// The folder logs go to: the XDG desktop folder, else ~/Desktop when it
// exists, else the home folder, else the current folder.
std::string DesktopFolder();

// "Edblog_6-12-2026_14-3-9.txt" for that local time.
std::string LogFileName(const std::tm& local);

class ExportLog {
 public:
  ExportLog() = default;
  ~ExportLog() { Close(); }
  ExportLog(const ExportLog&) = delete;
  ExportLog& operator=(const ExportLog&) = delete;

  // Creates or appends to the log named for `now` in `folder`, and writes the
  // header: the star line, "Source File:", "Save Path:" and, when not empty,
  // "Save Items as:" (file formats) or "User Name:" (Office 365).
  bool Open(const std::string& folder, std::time_t now, const std::string& source,
            const std::string& save_path, const std::string& format_name,
            const std::string& user_name = "");
  void Close();
  bool is_open() const { return file_ != nullptr; }
  const std::string& path() const { return path_; }

  // Appends text as it stands (the caller supplies the line ends).
  void Write(const std::string& text);

  // The vocabulary of a run.
  void StartTime(std::time_t now);
  void FolderStart(const std::string& folder_path);
  void ItemsFound(uint64_t count);
  void ItemsSaved(uint64_t count);
  void Error(const std::string& text);  // "ERROR:" + text
  void End(const std::string& destination, std::time_t started, std::time_t now);

 private:
  FILE* file_ = nullptr;
  std::string path_;
};

}  // namespace tarnwell::exporter

#endif  // TARNWELL_EXPORT_EXPORT_LOG_H_
