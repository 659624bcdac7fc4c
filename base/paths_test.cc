#include "base/paths.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <random>
#include <string>

#include "base/text.h"

namespace tarnwell {
namespace {

using std::string_literals::operator""s;

std::string Repeat(std::string_view unit, size_t times) {
  std::string out;
  for (size_t i = 0; i < times; ++i) out += unit;
  return out;
}

// What every SafeFileName result must satisfy, whatever went in.
void ExpectSafe(const std::string& in, size_t max_bytes, const std::string& out) {
  SCOPED_TRACE(::testing::PrintToString(in) + " -> " + ::testing::PrintToString(out));
  ASSERT_FALSE(out.empty());
  EXPECT_LE(out.size(), std::max(max_bytes, kFallbackFileName.size()));
  EXPECT_TRUE(IsValidUtf8(out));
  EXPECT_NE(out, ".");
  EXPECT_NE(out, "..");
  for (char c : out) {
    EXPECT_TRUE(uint8_t(c) >= 0x20 && c != 0x7F) << "control byte " << int(c);
    EXPECT_EQ(std::string_view("\\/:*?\"<>|").find(c), std::string_view::npos) << c;
  }
  EXPECT_NE(out.front(), ' ');
  EXPECT_NE(out.front(), '.');
  EXPECT_NE(out.back(), ' ');
  EXPECT_NE(out.back(), '.');
  EXPECT_EQ(SafeFileName(out, max_bytes), out) << "not idempotent";
  EXPECT_TRUE(IsInside("/dest", JoinPath("/dest", out)));
}

struct NameCase {
  std::string in;
  size_t max_bytes;
  std::string out;
};
void PrintTo(const NameCase& c, std::ostream* os) { *os << ::testing::PrintToString(c.in); }

class SafeFileNameTest : public ::testing::TestWithParam<NameCase> {};

TEST_P(SafeFileNameTest, MakesOneHarmlessComponent) {
  const NameCase& c = GetParam();
  const std::string out = SafeFileName(c.in, c.max_bytes);
  EXPECT_EQ(out, c.out);
  ExpectSafe(c.in, c.max_bytes, out);
}

INSTANTIATE_TEST_SUITE_P(
    Hostile, SafeFileNameTest,
    ::testing::Values(
        NameCase{"Inbox", 255, "Inbox"}, NameCase{"../../etc/passwd", 255, "etc passwd"},
        NameCase{"a/b", 255, "a b"}, NameCase{"\x01\x02", 255, "unnamed"},
        NameCase{"", 255, "unnamed"}, NameCase{".", 255, "unnamed"}, NameCase{"..", 255, "unnamed"},
        NameCase{" . . ", 255, "unnamed"}, NameCase{".hidden", 255, "hidden"},
        NameCase{"report.pdf. . ", 255, "report.pdf"}, NameCase{"Re: Offer?", 255, "Re  Offer"},
        NameCase{"C:\\Windows\\<x>|\"*\"", 255, "C  Windows  x"},
        NameCase{"tab\there\r\n", 255, "tab here"}, NameCase{"a\0b"s, 255, "a b"},
        NameCase{"a\xC2\x85"
                 "b",
                 255, "a b"},  // C1 control NEL
        NameCase{"a\xFF"
                 "b",
                 255,
                 "a\xEF\xBF\xBD"
                 "b"},                                                  // ill-formed UTF-8
        NameCase{"invoice\xE2\x80\xAEtxt.exe", 255, "invoicetxt.exe"},  // RLO dropped
        NameCase{"CON", 255, "_CON"}, NameCase{"con.txt", 255, "_con.txt"},
        NameCase{"nul .txt", 255, "_nul .txt"}, NameCase{"Com1", 255, "_Com1"},
        NameCase{"COM10", 255, "COM10"}, NameCase{"CONSOLE", 255, "CONSOLE"},
        NameCase{"CON     abc", 7, "_CON"},  // the cut exposes the device name
        NameCase{"abcdef gh", 7, "abcdef"}, NameCase{"abcdefghij", 0, "abcdefg"},
        NameCase{"abcdef\xC3\xA9", 7, "abcdef"},
        NameCase{Repeat("\xE2\x82\xAC", 1000), 255, Repeat("\xE2\x82\xAC", 85)},
        NameCase{Repeat("\xF0\x9F\x98\x80", 250), 255, Repeat("\xF0\x9F\x98\x80", 63)},
        NameCase{Repeat("a", 300) + ".eml", 255, Repeat("a", 255)}));

TEST(SafeFileNameRandomTest, EveryResultIsSafe) {
  // Names assembled from the pieces that cause trouble, with small limits so that cuts
  // land everywhere.
  const std::string kPieces[] = {".",
                                 " ",
                                 "/",
                                 "\\",
                                 "\0"s,
                                 "a",
                                 "C",
                                 "O",
                                 "N",
                                 "1",
                                 ":",
                                 "\xC3",
                                 "\xA9",
                                 "\xE2\x80\xAE",
                                 "\xF0\x9F\x98\x80",
                                 "\x7F"};
  std::mt19937 rng(20240601);
  for (int i = 0; i < 3000; ++i) {
    std::string in;
    const int pieces = int(rng() % 16);
    for (int p = 0; p < pieces; ++p) in += kPieces[rng() % std::size(kPieces)];
    const size_t max_bytes = rng() % 16;
    ExpectSafe(in, max_bytes, SafeFileName(in, max_bytes));
  }
}

TEST(PathTest, JoinsAndNormalises) {
  EXPECT_EQ(JoinPath("/out", "a"), "/out/a");
  EXPECT_EQ(JoinPath("/out//", "//a"), "/out/a");
  EXPECT_EQ(JoinPath("/", "a"), "/a");
  EXPECT_EQ(JoinPath("", "/a"), "a");
  EXPECT_EQ(JoinPath("/out", ""), "/out");

  const std::pair<const char*, const char*> kNormal[] = {
      {"/a/./b//c/", "/a/b/c"},
      {"/../a", "/a"},
      {"a/../../b", "../b"},
      {"a/b/..", "a"},
      {"", "."},
      {"./", "."},
      {"/", "/"},
      {"../..", "../.."},
  };
  for (const auto& [in, out] : kNormal) EXPECT_EQ(NormalizePath(in), out) << in;
}

TEST(PathTest, IsInsideCatchesEveryEscape) {
  struct Case {
    const char* root;
    std::string candidate;
    bool inside;
  };
  const Case kCases[] = {
      {"/out", "/out/a/b", true},
      {"/out", "/out", true},
      {"/out", "", true},
      {"/out/", "/out/a/./b/../c", true},
      {"/out", "a/b", true},
      {"/", "/etc", true},
      {"out", "x", true},
      {"/out", "/outside", false},
      {"/out", "/out/../etc", false},
      {"/out", "/out/a/../../etc", false},
      {"/out", "a/../../etc/passwd", false},
      {"/out", "..", false},
      {"/out", "/etc", false},
      {"out", "/out/x", false},
      {"..", "../x", false},
      {"../up", "../x", false},
      {"/out", "x\0/../../etc"s, false},
  };
  for (const Case& c : kCases) {
    EXPECT_EQ(IsInside(c.root, c.candidate), c.inside)
        << c.root << " vs " << ::testing::PrintToString(c.candidate);
  }
}

class TempDirTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(MakeTempDir("tarnwell-paths-", &dir_).ok()); }
  void TearDown() override { std::filesystem::remove_all(dir_); }
  static void Touch(const std::string& path) {
    int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL, 0600);
    ASSERT_GE(fd, 0) << path;
    ::close(fd);
  }
  std::string dir_;
};

TEST_F(TempDirTest, UniquePathCountsUpUntilFree) {
  const std::string first = UniquePath(dir_, "Meeting", "eml");
  EXPECT_EQ(first, dir_ + "/Meeting.eml");
  Touch(first);
  const std::string second = UniquePath(dir_, "Meeting", ".eml");
  EXPECT_EQ(second, dir_ + "/Meeting (1).eml");
  Touch(second);
  // A dangling link is a name that is taken, and writing through it would go elsewhere.
  ASSERT_EQ(::symlink("/nonexistent/target", (dir_ + "/Meeting (2).eml").c_str()), 0);
  EXPECT_EQ(UniquePath(dir_, "Meeting", ".eml"), dir_ + "/Meeting (3).eml");
}

TEST_F(TempDirTest, UniquePathStaysInsideAndWithinLength) {
  const std::string hostile = UniquePath(dir_, "../../x", "/../../y");
  EXPECT_TRUE(IsInside(dir_, hostile)) << hostile;
  EXPECT_EQ(hostile.find('/', dir_.size() + 1), std::string::npos) << hostile;

  const std::string stem = Repeat("\xE2\x82\xAC", 200);
  for (int i = 0; i < 3; ++i) {
    const std::string path = UniquePath(dir_, stem, ".eml");
    const std::string name = path.substr(dir_.size() + 1);
    EXPECT_LE(name.size(), kMaxFileNameBytes);
    EXPECT_TRUE(IsValidUtf8(name));
    EXPECT_TRUE(name.ends_with(i == 0 ? "\xE2\x82\xAC.eml" : ").eml")) << name;
    Touch(path);  // the file system accepts the name
  }
}

TEST(MakeTempDirTest, HonoursTmpdirAndKeepsPrefixInside) {
  std::string base;
  ASSERT_TRUE(MakeTempDir("tarnwell-base-", &base).ok());
  const char* old = std::getenv("TMPDIR");
  const std::string old_value = old ? old : "";
  setenv("TMPDIR", base.c_str(), 1);

  std::string a;
  std::string b;
  EXPECT_TRUE(MakeTempDir("../escape-", &a).ok());
  EXPECT_TRUE(MakeTempDir("../escape-", &b).ok());
  EXPECT_NE(a, b);
  EXPECT_TRUE(IsInside(base, a)) << a;
  struct stat st;
  ASSERT_EQ(::stat(a.c_str(), &st), 0);
  EXPECT_TRUE(S_ISDIR(st.st_mode));
  EXPECT_EQ(st.st_mode & 0777, 0700u);

  setenv("TMPDIR", (base + "/missing").c_str(), 1);
  std::string c;
  Status status = MakeTempDir("x", &c);
  EXPECT_FALSE(status.ok());
  EXPECT_NE(status.message().find("missing"), std::string::npos) << status.ToString();

  if (old) {
    setenv("TMPDIR", old_value.c_str(), 1);
  } else {
    unsetenv("TMPDIR");
  }
  std::filesystem::remove_all(base);
}

}  // namespace
}  // namespace tarnwell
