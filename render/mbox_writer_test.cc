#include "render/mbox_writer.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "base/paths.h"
#include "render/writer_test_support.h"

namespace tarnwell::render {
namespace {

ByteView View(std::string_view s) {
  return ByteView(reinterpret_cast<const uint8_t*>(s.data()), s.size());
}

constexpr const char* kReadMbox = R"PY(
for i, m in enumerate(mailbox.mbox(path)):
    print('%d\t%s' % (i, (m['subject'] + '|' + m.get_payload()).encode().hex()))
)PY";

TEST(MboxWriterTest, QuotesFromLinesSoEveryMessageReadsBackWhole) {
  EXPECT_EQ(
      ByteView(QuoteFromLines(View("From me\r\n>From you\r\nFromage\r\nx From y\r\n"))).ToString(),
      ">From me\r\n>>From you\r\nFromage\r\nx From y\r\n");
  // The separator names the export's date.
  EXPECT_EQ(MboxSeparator(0).rfind("From - ", 0), 0u);

  std::string dir;
  ASSERT_TRUE(MakeTempDir("tarnwell-mbox", &dir).ok());
  const std::string path = dir + "/" + kMboxFileName;
  MboxWriter writer;
  ASSERT_TRUE(writer.Open(path).ok());
  ASSERT_TRUE(
      writer.Append(View("Subject: one\r\n\r\nFirst line\r\nFrom the start of a line\r\n"), 0)
          .ok());
  // The streamed form, fed in pieces that split a "From " line.
  MimeSink* sink = writer.Begin(0);
  ASSERT_NE(sink, nullptr);
  for (const char* piece : {"Subject: two\r\n\r\nFr", "om split\r\n", "no final line end"}) {
    sink->Write(piece);
  }
  ASSERT_TRUE(writer.End().ok());
  writer.Close();
  std::stringstream file;
  file << std::ifstream(path, std::ios::binary).rdbuf();
  std::filesystem::remove_all(dir);

  const testing::ReadBack read =
      testing::ReadWithPython(kReadMbox, file.str(), ".mbx", "utf-8", "mailbox");
  if (read.skipped) GTEST_SKIP() << read.skip_reason;
  ASSERT_EQ(read.failure, "") << file.str();
  ASSERT_EQ(read.values.size(), 2u) << file.str();
  EXPECT_EQ(read.values[0].second, "one|First line\r\n>From the start of a line\r\n\r\n");
  EXPECT_EQ(read.values[1].second, "two|>From split\r\nno final line end\r\n\r\n");
}

}  // namespace
}  // namespace tarnwell::render
