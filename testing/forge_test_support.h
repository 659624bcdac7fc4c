// What the writer's tests share: scratch directories, the independent
// validators' command lines and whole files read back.
#ifndef TARNWELL_TESTING_FORGE_TEST_SUPPORT_H_
#define TARNWELL_TESTING_FORGE_TEST_SUPPORT_H_

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>
#include <vector>

namespace tarnwell::forge {

inline bool HaveTool(const char* name) {
  return std::system((std::string("command -v ") + name + " >/dev/null 2>&1").c_str()) == 0;
}

// Runs `cmd` with its output in `log`; the exit status.
inline int RunTool(const std::string& cmd, const std::string& log) {
  return std::system((cmd + " >'" + log + "' 2>&1 </dev/null").c_str());
}

inline std::string ReadFileText(const std::filesystem::path& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

inline std::vector<std::string> SplitText(const std::string& text, char separator) {
  std::vector<std::string> out;
  std::istringstream in(text);
  for (std::string field; std::getline(in, field, separator);) out.push_back(field);
  return out;
}

// A fresh directory under the test temp dir, removed afterwards unless the
// test failed (then it is left for a look).
class ScratchDir {
 public:
  explicit ScratchDir(const std::string& tag) {
    static int counter = 0;
    path_ = std::filesystem::path(::testing::TempDir()) /
            (tag + "_" + std::to_string(getpid()) + "_" + std::to_string(++counter));
    std::filesystem::remove_all(path_);
    std::filesystem::create_directories(path_);
  }
  ~ScratchDir() {
    if (!::testing::Test::HasFailure()) std::filesystem::remove_all(path_);
  }
  ScratchDir(const ScratchDir&) = delete;
  ScratchDir& operator=(const ScratchDir&) = delete;

  const std::filesystem::path& path() const { return path_; }
  std::string operator/(const std::string& name) const { return (path_ / name).string(); }

 private:
  std::filesystem::path path_;
};

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_FORGE_TEST_SUPPORT_H_
