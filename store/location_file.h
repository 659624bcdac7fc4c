// Location files ("Msgid.txt", "Attachid.txt"): where the record of ordinal k
// lies, so it can be read again without a search. Despite the extension they
// are binary, a plain sequence of 6-byte entries without header:
//
//   offset        width  meaning
//   (k - 1) * 6   4      page number (u32 little-endian)
//   + 4           2      node (tag) index in that page (u16 little-endian)
#ifndef TARNWELL_STORE_LOCATION_FILE_H_
#define TARNWELL_STORE_LOCATION_FILE_H_

#include <cstdint>
#include <cstdio>
#include <optional>
#include <string>
#include <vector>

#include "base/status.h"

namespace tarnwell::store {

inline constexpr char kMessageLocationFile[] = "Msgid.txt";
inline constexpr char kAttachmentLocationFile[] = "Attachid.txt";
constexpr size_t kRecordLocationSize = 6;

struct RecordLocation {
  uint32_t page_number = 0;
  uint16_t tag_index = 0;
};

class LocationFile {
 public:
  LocationFile() = default;
  ~LocationFile();
  LocationFile(const LocationFile&) = delete;
  LocationFile& operator=(const LocationFile&) = delete;

  // Creates (truncates) the file for writing and reading.
  Status Create(const std::string& path);
  // Opens an existing file for reading.
  Status Open(const std::string& path);
  void Close();
  bool is_open() const { return file_ != nullptr; }
  const std::string& path() const { return path_; }

  // Appends the entry of the next ordinal.
  Status Append(const RecordLocation& location);
  // Writes buffered entries to the file, for readers of the file itself.
  void Flush();
  // The entry of ordinal k (from 1); nothing past the end.
  std::optional<RecordLocation> Read(uint64_t ordinal);
  uint64_t count() const { return count_; }

 private:
  FILE* file_ = nullptr;
  std::string path_;
  uint64_t count_ = 0;
};

// Drops the entries of `dropped` walk positions (from 1, ascending) from a
// file written one entry per walk position, so that entry k is ordinal k.
void CompactLocations(LocationFile* file, const std::vector<uint64_t>& dropped);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_LOCATION_FILE_H_
