// What the engine tests share: the page formats they run over, a database
// file in a temporary folder of its own, and a reader with its catalog read.
#ifndef TARNWELL_ENGINE_ENGINE_TEST_SUPPORT_H_
#define TARNWELL_ENGINE_ENGINE_TEST_SUPPORT_H_

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <ostream>
#include <string>

#include "base/paths.h"
#include "engine/catalog.h"
#include "engine/edb_class.h"
#include "testing/ese_writer.h"

namespace tarnwell::engine {

struct Format {
  const char* name;
  uint32_t page_size;
  uint32_t revision;
  int version;  // the Exchange version that revision names
};

inline constexpr Format kFormats[] = {
    {"4k", 4096, 9, kExchange2000},
    {"8k", 8192, 12, kExchange2007},
    {"32k", 32768, 17, kExchange2010},
    {"32k_2013", 32768, 20, kExchange2013},
};

inline void PrintTo(const Format& f, std::ostream* os) { *os << f.name; }

// A database file that goes away with the object: written by the test writer
// from a layout, or as the given bytes (a damaged copy).
class TempDatabase {
 public:
  explicit TempDatabase(const forge::DatabaseLayout& layout, const forge::FileDamage& damage = {}) {
    if (!MakeDir()) return;
    const Status s = forge::WriteDatabase(layout, path_, &manifest_, damage);
    EXPECT_TRUE(s.ok()) << s.ToString();
  }
  explicit TempDatabase(const Bytes& bytes) {
    if (!MakeDir()) return;
    std::ofstream out(path_, std::ios::binary);
    out.write(reinterpret_cast<const char*>(bytes.data()), std::streamsize(bytes.size()));
    EXPECT_TRUE(out.good()) << path_;
  }
  ~TempDatabase() {
    if (!dir_.empty()) std::filesystem::remove_all(dir_);
  }
  TempDatabase(const TempDatabase&) = delete;
  TempDatabase& operator=(const TempDatabase&) = delete;

  const std::string& dir() const { return dir_; }
  const std::string& path() const { return path_; }
  const forge::Manifest& manifest() const { return manifest_; }

 private:
  bool MakeDir() {
    const Status s = MakeTempDir("tarnwell-engine", &dir_);
    EXPECT_TRUE(s.ok()) << s.ToString();
    path_ = dir_ + "/test.edb";
    return s.ok();
  }

  std::string dir_, path_;
  forge::Manifest manifest_;
};

// Opened by the file's own header, with the catalog walked and parsed.
inline std::unique_ptr<EdbClass> OpenWithCatalog(const std::string& path) {
  std::unique_ptr<EdbClass> reader;
  const Status s = InspectDatabase(path, &reader);
  EXPECT_TRUE(s.ok()) << s.ToString();
  if (!reader) return reader;
  EXPECT_EQ(reader->CollectTreeRecords(kCatalogRootPage), 1);
  reader->ParseCatalogRecords();
  return reader;
}

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_ENGINE_TEST_SUPPORT_H_
