#include "render/mbox_writer.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "base/paths.h"

namespace tarnwell::render {
namespace {

TEST(MboxWriterTest, QuotesFromLinesSoEveryMessageReadsBackWhole) {
  const std::string body = "From me\r\n>From you\r\nFromage\r\nx From y\r\n";
  const Bytes quoted =
      QuoteFromLines(ByteView(reinterpret_cast<const uint8_t*>(body.data()), body.size()));
  EXPECT_EQ(ByteView(quoted).ToString(), ">From me\r\n>>From you\r\nFromage\r\nx From y\r\n");

  if (std::system("/usr/bin/python3 -c 'import mailbox' 2>/dev/null") != 0) {
    GTEST_SKIP() << "/usr/bin/python3 is needed to read the mailbox back";
  }
  std::string dir;
  ASSERT_TRUE(MakeTempDir("tarnwell-mbox", &dir).ok());
  const std::string path = dir + "/" + kMboxFileName;
  MboxWriter writer;
  ASSERT_TRUE(writer.Open(path).ok());
  const std::string first = "Subject: one\r\n\r\nFirst line\r\nFrom the start of a line\r\n";
  const std::string second = "Subject: two\r\n\r\nno final line end";
  ASSERT_TRUE(
      writer.Append(ByteView(reinterpret_cast<const uint8_t*>(first.data()), first.size()), 0)
          .ok());
  // The streamed form, fed in pieces that split a "From " line.
  MimeSink* sink = writer.Begin(0);
  ASSERT_NE(sink, nullptr);
  sink->Write("Subject: two\r\n\r\nFr");
  sink->Write("om split\r\n");
  sink->Write(second.substr(16));
  ASSERT_TRUE(writer.End().ok());
  writer.Close();
  const std::string script =
      "import mailbox, sys\n"
      "box = mailbox.mbox(sys.argv[1])\n"
      "msgs = list(box)\n"
      "print(len(msgs))\n"
      "for m in msgs: print(m['subject'], repr(m.get_payload()))\n";
  std::ofstream(dir + "/read.py") << script;
  ASSERT_EQ(
      std::system(
          ("/usr/bin/python3 " + dir + "/read.py " + path + " > " + dir + "/out.txt").c_str()),
      0);
  std::ifstream in(dir + "/out.txt");
  std::string count, line1, line2;
  std::getline(in, count);
  std::getline(in, line1);
  std::getline(in, line2);
  EXPECT_EQ(count, "2");
  EXPECT_NE(line1.find(">From the start of a line"), std::string::npos) << line1;
  EXPECT_NE(line2.find(">From split"), std::string::npos) << line2;
  EXPECT_NE(line2.find("no final line end"), std::string::npos) << line2;
  // The separator names the export's date.
  EXPECT_EQ(MboxSeparator(0).rfind("From - ", 0), 0u);
  std::filesystem::remove_all(dir);
}

}  // namespace
}  // namespace tarnwell::render
