#include "store/location_file.h"

#include <cerrno>
#include <cstring>

#include "base/byte_view.h"

namespace tarnwell::store {

LocationFile::~LocationFile() { Close(); }

void LocationFile::Close() {
  if (file_) std::fclose(file_);
  file_ = nullptr;
  count_ = 0;
}

Status LocationFile::Create(const std::string& path) {
  Close();
  file_ = std::fopen(path.c_str(), "w+b");
  if (!file_) return Status::IoError(path + ": " + std::strerror(errno));
  path_ = path;
  return Status::Ok();
}

Status LocationFile::Open(const std::string& path) {
  Close();
  file_ = std::fopen(path.c_str(), "rb");
  if (!file_) return Status::IoError(path + ": " + std::strerror(errno));
  path_ = path;
  if (std::fseek(file_, 0, SEEK_END) == 0)
    count_ = uint64_t(std::ftell(file_)) / kRecordLocationSize;
  return Status::Ok();
}

Status LocationFile::Append(const RecordLocation& location) {
  if (!file_) return Status::IoError("location file not open");
  uint8_t entry[kRecordLocationSize];
  StoreU32LE(entry, location.page_number);
  StoreU16LE(entry + 4, location.tag_index);
  if (std::fseek(file_, long(count_ * kRecordLocationSize), SEEK_SET) != 0 ||
      std::fwrite(entry, 1, sizeof entry, file_) != sizeof entry) {
    return Status::IoError(path_ + ": " + std::strerror(errno));
  }
  ++count_;
  return Status::Ok();
}

void LocationFile::Flush() {
  if (file_) std::fflush(file_);
}

std::optional<RecordLocation> LocationFile::Read(uint64_t ordinal) {
  if (!file_ || ordinal == 0 || ordinal > count_) return std::nullopt;
  uint8_t entry[kRecordLocationSize];
  if (std::fseek(file_, long((ordinal - 1) * kRecordLocationSize), SEEK_SET) != 0 ||
      std::fread(entry, 1, sizeof entry, file_) != sizeof entry) {
    return std::nullopt;
  }
  return RecordLocation{LoadU32LE(entry), LoadU16LE(entry + 4)};
}

void CompactLocations(LocationFile* file, const std::vector<uint64_t>& dropped) {
  file->Flush();
  if (dropped.empty() || !file->is_open()) return;
  const std::string path = file->path();
  const std::string tmp = path + ".tmp";
  LocationFile compact;
  if (!compact.Create(tmp).ok()) return;
  size_t d = 0;
  for (uint64_t pos = 1; pos <= file->count(); ++pos) {
    if (d < dropped.size() && dropped[d] == pos) {
      ++d;
      continue;
    }
    if (auto loc = file->Read(pos)) compact.Append(*loc);
  }
  compact.Close();
  file->Close();
  std::rename(tmp.c_str(), path.c_str());
  file->Open(path);
}

}  // namespace tarnwell::store
