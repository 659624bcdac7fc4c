#include "export/export_log.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "base/paths.h"
#include "base/text.h"

namespace tarnwell::exporter {
namespace {

std::string ReadUtf16File(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::string bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  EXPECT_GE(bytes.size(), 2u);
  EXPECT_EQ(uint8_t(bytes[0]), 0xFF);
  EXPECT_EQ(uint8_t(bytes[1]), 0xFE);
  return Utf16LEToUtf8(
      ByteView(reinterpret_cast<const uint8_t*>(bytes.data()) + 2, bytes.size() - 2));
}

TEST(ExportLogTest, WritesTheRunInUtf16WithItsVocabulary) {
  setenv("TZ", "UTC", 1);
  tzset();
  std::string dir;
  ASSERT_TRUE(MakeTempDir("tarnwell-log", &dir).ok());
  const std::time_t start = 1780000000;  // 2026-05-28 20:26:40 UTC
  ExportLog log;
  ASSERT_TRUE(log.Open(dir, start, "/data/priv1.edb", "/out/Tarnwell_x", "EML"));
  EXPECT_EQ(std::filesystem::path(log.path()).filename(), "Edblog_28-5-2026_20-26-40.txt");
  log.StartTime(start);
  log.Write("Processing Checked items in tree..\r\n");
  log.FolderStart("Mailbox/Inbox");
  log.ItemsFound(3);
  log.ItemsSaved(2);
  log.End("/out/Tarnwell_x", start, start + 3725);
  log.Close();
  const std::string text = ReadUtf16File(log.path());
  const std::string want = std::string(149, '*') +
                           "\r\nSource File:\t/data/priv1.edb\r\n"
                           "Save Path:\t/out/Tarnwell_x\r\n"
                           "Save Items as:\tEML\t\r\n"
                           " Saving Process Start Time:\t28-5-2026::20-26-40\r\n"
                           "Processing Checked items in tree..\r\n"
                           "\r\n Saving Folder: Mailbox/Inbox\r\n"
                           "Items Found: 3\r\n"
                           "Items Saved: 2\r\n\r\n"
                           "\r\n Data is extracted in path /out/Tarnwell_x\r\n" +
                           std::string(90, '/') +
                           "\r\n\r\nSave Process Completed Successfully\r\n"
                           "Elapse Time: 1:2:5\r\n\r\n";
  EXPECT_EQ(text, want);

  // A second run in the same second appends; no second byte-order mark.
  ExportLog again;
  ASSERT_TRUE(again.Open(dir, start, "/data/priv2.edb", "", "", "someone@example.com"));
  again.Close();
  const std::string both = ReadUtf16File(log.path());
  EXPECT_EQ(both.find("\xEF\xBB\xBF"), std::string::npos);
  EXPECT_NE(both.find("User Name:\tsomeone@example.com\r\n"), std::string::npos);
  std::filesystem::remove_all(dir);
}

TEST(ExportLogTest, UnopenableLogIsSilent) {
  ExportLog log;
  EXPECT_FALSE(log.Open("/nonexistent/folder", 0, "a", "b", "EML"));
  log.ItemsFound(1);  // no crash, nothing written
  EXPECT_FALSE(log.is_open());
}

}  // namespace
}  // namespace tarnwell::exporter
