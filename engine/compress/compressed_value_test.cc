#include "engine/compress/compressed_value.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <optional>
#include <ostream>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "engine/compress/decompress_value.h"

namespace tarnwell::engine {
namespace {

Bytes FromHex(const std::string& hex) {
  Bytes out;
  for (size_t i = 0; i + 1 < hex.size();) {
    if (hex[i] == ' ') {
      ++i;
      continue;
    }
    out.push_back(static_cast<uint8_t>(std::stoi(hex.substr(i, 2), nullptr, 16)));
    i += 2;
  }
  return out;
}

std::string Text(const Bytes& b) { return std::string(b.begin(), b.end()); }

// UTF-16LE to ASCII; '?' for anything outside it.
std::string Narrow(const Bytes& utf16) {
  std::string out;
  for (size_t i = 0; i + 1 < utf16.size(); i += 2) {
    out += (utf16[i + 1] == 0 && utf16[i] < 0x80) ? static_cast<char>(utf16[i]) : '?';
  }
  return out;
}

struct DispatchCase {
  const char* name;
  const char* value;
  DecodeStatus status;
  CompressionScheme scheme;
  std::string text;  // ASCII view of the decoded bytes
  bool utf16;
};

void PrintTo(const DispatchCase& c, std::ostream* os) { *os << c.name; }

const DispatchCase kDispatch[] = {
    {"ascii", "0dc834", DecodeStatus::kOk, CompressionScheme::kSevenBitAscii, "Hi", false},
    {"unicode", "15c834", DecodeStatus::kOk, CompressionScheme::kSevenBitUnicode, "Hi", true},
    {"unicode_header_only", "17", DecodeStatus::kOk, CompressionScheme::kSevenBitUnicode, "", true},
    {"xpress", "18 0900 ffffff1f 616263 1300", DecodeStatus::kOk, CompressionScheme::kXpress,
     "abcabcabc", false},
    {"xpress_empty", "18 0000 ffffffff", DecodeStatus::kOk, CompressionScheme::kXpress, "", false},
    // The stream stops short of the announced size: what it gave is kept.
    {"xpress_short_stream", "18 0a00 ffffff1f 616263 1300", DecodeStatus::kMalformed,
     CompressionScheme::kXpress, "abcabcabc", false},
    {"xpress_damaged", "18 0900 ffffff1f 616263 2300", DecodeStatus::kMalformed,
     CompressionScheme::kXpress, "abc", false},
    {"xpress_no_size", "18 09", DecodeStatus::kMalformed, CompressionScheme::kXpress, "", false},
    {"lz4", "38 0500 50 68656c6c6f", DecodeStatus::kOk, CompressionScheme::kLz4, "hello", false},
    {"lz4_wrong_size", "38 0600 50 68656c6c6f", DecodeStatus::kMalformed, CompressionScheme::kLz4,
     "", false},
    {"lz4_truncated", "38 0500 50 6865", DecodeStatus::kMalformed, CompressionScheme::kLz4, "",
     false},
    {"lz4_no_block", "38 0500", DecodeStatus::kMalformed, CompressionScheme::kLz4, "", false},
    {"scrubbed", "20 000000", DecodeStatus::kScrubbed, CompressionScheme::kScrubbed, "", false},
    {"xpress9", "28 01020304 0506", DecodeStatus::kUnsupported, CompressionScheme::kXpress9, "",
     false},
    {"xpress10", "30 0900 00000000 0000000000000000 61", DecodeStatus::kUnsupported,
     CompressionScheme::kXpress10, "", false},
    {"scheme_zero", "00 61", DecodeStatus::kUnsupported, CompressionScheme::kUnknown, "", false},
    {"scheme_eight", "40 61", DecodeStatus::kUnsupported, CompressionScheme::kUnknown, "", false},
    {"empty", "", DecodeStatus::kMalformed, CompressionScheme::kUnknown, "", false},
};

class CompressedValueTest : public ::testing::TestWithParam<DispatchCase> {};

TEST_P(CompressedValueTest, Dispatches) {
  const DispatchCase& c = GetParam();
  const Bytes value = FromHex(c.value);
  EXPECT_EQ(SchemeOf(value), c.scheme);
  const DecodedValue v = DecodeCompressedValue(value);
  EXPECT_EQ(v.status, c.status) << v.message;
  EXPECT_EQ(v.scheme, c.scheme);
  EXPECT_EQ(v.is_utf16, c.utf16);
  EXPECT_EQ(c.utf16 ? Narrow(v.bytes) : Text(v.bytes), c.text);
  EXPECT_EQ(v.ok(), v.message.empty());
}

INSTANTIATE_TEST_SUITE_P(Schemes, CompressedValueTest, ::testing::ValuesIn(kDispatch),
                         [](const auto& info) { return std::string(info.param.name); });

// ---- Values written by Windows (files in the external fixture folder) ----

std::string FixturePath(const std::string& relative) {
  return std::string(TARNWELL_EXTERNAL_FIXTURES) + "/" + relative;
}

std::optional<Bytes> ReadFixture(const std::string& relative) {
  std::ifstream f(FixturePath(relative), std::ios::binary);
  if (!f) return std::nullopt;
  return Bytes(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
}

constexpr size_t kSmallPageHeaderSize = 40;
constexpr size_t kTagCountOffset = 34;
constexpr size_t kTagSize = 4;
constexpr uint16_t kTagValueMask = 0x1fff;
constexpr uint16_t kTaggedHasFlagsByte = 0x4000;
constexpr uint8_t kTaggedCompressed = 0x02;

// One record of test_table: its four tagged columns 256..259, flag bytes kept.
struct TestTableRecord {
  Bytes column[4];
};

// Finds test_table's records on the leaf pages of an 8 KiB-page file without
// a full reader: each record's tagged part is four entries (column id u16,
// offset u16 with flag 0x4000) for columns 256..259, offsets counted from the
// first entry; the last value runs to the end of the record.
std::vector<TestTableRecord> FindTestTableRecords(const Bytes& file, size_t page_size) {
  std::vector<TestTableRecord> records;
  for (size_t page = page_size * 2; page + page_size <= file.size(); page += page_size) {
    const ByteView p(file.data() + page, page_size);
    const uint16_t tags = p.U16LE(kTagCountOffset);
    for (size_t t = 1; t < tags; ++t) {
      const size_t tag_pos = page_size - kTagSize * (t + 1);
      if (tag_pos < kSmallPageHeaderSize) break;
      const size_t size = p.U16LE(tag_pos) & kTagValueMask;
      const size_t offset = p.U16LE(tag_pos + 2) & kTagValueMask;
      const ByteView rec = p.Sub(kSmallPageHeaderSize + offset, size);
      for (size_t i = 0; i + 16 <= rec.size(); ++i) {
        bool match = true;
        for (uint16_t k = 0; k < 4 && match; ++k) {
          match = rec.U16LE(i + kTagSize * k) == 256 + k &&
                  (rec.U16LE(i + kTagSize * k + 2) & kTaggedHasFlagsByte) != 0;
        }
        if (!match) continue;
        TestTableRecord r;
        for (size_t k = 0; k < 4; ++k) {
          const size_t begin = i + (rec.U16LE(i + kTagSize * k + 2) & kTagValueMask);
          const size_t end =
              k < 3 ? i + (rec.U16LE(i + kTagSize * (k + 1) + 2) & kTagValueMask) : rec.size();
          if (begin < end) r.column[k] = rec.Sub(begin, end - begin).ToBytes();
        }
        records.push_back(std::move(r));
        break;
      }
    }
  }
  return records;
}

std::string TrimRight(std::string s) {
  while (!s.empty() && s.back() == ' ') s.pop_back();
  return s;
}

// Rows of test_table in the golden text dump: |unicode|ascii|binary|usual_text|
std::vector<std::vector<std::string>> GoldenRows(const std::string& dump) {
  std::vector<std::vector<std::string>> rows;
  std::istringstream in(dump);
  std::string line;
  bool in_table = false;
  bool header_seen = false;
  while (std::getline(in, line)) {
    if (line.rfind("table ", 0) == 0) {
      in_table = line == "table test_table";
      header_seen = false;
      continue;
    }
    if (!in_table || line.empty() || line[0] != '|') continue;
    if (!header_seen) {
      header_seen = true;
      continue;
    }
    std::vector<std::string> fields;
    size_t start = 1;
    for (size_t bar; (bar = line.find('|', start)) != std::string::npos; start = bar + 1) {
      fields.push_back(TrimRight(line.substr(start, bar - start)));
    }
    rows.push_back(fields);
  }
  return rows;
}

// decompress_test.edb holds ten rows whose three compressed columns repeat
// the uncompressed usual_text column; the golden dump of the same rows comes
// from Windows' own ESE.
TEST(RealCompressedValuesTest, SevenBitColumnsMatchPlainColumnAndGoldenDump) {
  const auto file = ReadFixture("strozfriedberg-ese_parser/decompress_test.edb");
  const auto dump = ReadFixture("strozfriedberg-ese_parser/esentoutput2.txt");
  if (!file || !dump) GTEST_SKIP() << "external fixtures not found at " << FixturePath("");
  const auto records = FindTestTableRecords(*file, 8192);
  ASSERT_EQ(records.size(), 10u);
  std::set<std::string> decoded_texts;
  for (const TestTableRecord& r : records) {
    const Bytes& plain = r.column[3];
    ASSERT_FALSE(plain.empty());
    EXPECT_EQ(plain[0] & kTaggedCompressed, 0);
    const std::string text = Text(Bytes(plain.begin() + 1, plain.end()));
    const CompressionScheme expected[3] = {CompressionScheme::kSevenBitUnicode,
                                           CompressionScheme::kSevenBitAscii,
                                           CompressionScheme::kSevenBitAscii};
    for (int k = 0; k < 3; ++k) {
      SCOPED_TRACE("record " + text + ", column " + std::to_string(256 + k));
      ASSERT_GE(r.column[k].size(), 2u);
      EXPECT_NE(r.column[k][0] & kTaggedCompressed, 0);
      const ByteView value = ByteView(r.column[k]).From(1);
      const DecodedValue v = DecodeCompressedValue(value);
      ASSERT_TRUE(v.ok()) << v.message;
      EXPECT_EQ(v.scheme, expected[k]);
      EXPECT_EQ(v.is_utf16 ? Narrow(v.bytes) : Text(v.bytes), text);
      if (v.is_utf16) {
        EXPECT_EQ(v.bytes.size(), 2 * text.size());
      }
      // 17 characters: 119 bits, so 7 bits used in the last of 15 bytes.
      EXPECT_EQ(value[0] & 0x07, 6);
    }
    decoded_texts.insert(text);
  }
  const auto rows = GoldenRows(Text(*dump));
  ASSERT_EQ(rows.size(), 10u);
  std::set<std::string> golden_texts;
  for (const auto& row : rows) {
    ASSERT_EQ(row.size(), 4u);
    EXPECT_EQ(row[0], row[3]);
    EXPECT_EQ(row[1], row[3]);
    golden_texts.insert(row[3]);
  }
  EXPECT_EQ(decoded_texts, golden_texts);
}

// Property values as Exchange 2013+ stores them, Xpress-compressed: four
// literals and one 2055-byte match through the 16-bit length form. One file
// carries a stray byte after the stream.
TEST(RealCompressedValuesTest, ExchangeXpressValues) {
  const struct {
    const char* file;
    uint8_t first;
    bool stray_byte;
  } kValues[] = {{"gromox-blobs/eps_1_01_03.b", 0xb2, false},
                 {"gromox-blobs/eps_1_02.b", 0xa2, true},
                 {"gromox-blobs/eps_1_04.b", 0xa2, false},
                 {"gromox-blobs/eps_2_05.b", 0xba, false}};
  for (const auto& c : kValues) {
    SCOPED_TRACE(c.file);
    const auto value = ReadFixture(c.file);
    if (!value) GTEST_SKIP() << "external fixtures not found at " << FixturePath("");
    const DecodedValue v = DecodeCompressedValue(*value);
    ASSERT_TRUE(v.ok()) << v.message;
    EXPECT_EQ(v.scheme, CompressionScheme::kXpress);
    Bytes expected(2059, 0);
    expected[0] = c.first;
    expected[1] = expected[2] = 0x01;
    EXPECT_EQ(v.bytes, expected);
    // The strict buffer decoder ends only at the end marker.
    Bytes out(2059);
    int error = -1;
    const size_t n = DecompressValue(kValueFormatXpress, value->data() + 3, value->size() - 3,
                                     out.data(), out.size(), &error);
    EXPECT_EQ(n, 2059u);
    EXPECT_EQ(error, c.stray_byte ? kDecompressInputMalformed : kDecompressOk);
  }
}

// test.edb keeps a long text value as Xpress-compressed chunks of 4014 bytes:
// UTF-16 text cycling through letters and digits, the second chunk carrying
// on where the first stopped.
TEST(RealCompressedValuesTest, XpressLongValueChunks) {
  const auto file = ReadFixture("strozfriedberg-ese_parser/test.edb");
  if (!file) GTEST_SKIP() << "external fixtures not found at " << FixturePath("");
  const std::string cycle = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz1234567890";
  constexpr size_t kPageSize = 4096;
  std::vector<std::string> chunks;
  // Candidates: a scheme byte 0x18 and a size; the stream runs at most to the page end.
  for (size_t i = 0; i + 3 < file->size(); ++i) {
    if ((*file)[i] != 0x18) continue;
    const size_t size = LoadU16LE(file->data() + i + 1);
    if (size < 1024) continue;
    const size_t page_end = (i / kPageSize + 1) * kPageSize;
    const DecodedValue v = DecodeCompressedValue(ByteView(file->data() + i, page_end - i));
    if (!v.ok()) continue;
    const std::string text = Narrow(v.bytes);
    if (text.find_first_not_of(cycle) != std::string::npos) continue;
    chunks.push_back(text);
  }
  ASSERT_EQ(chunks.size(), 2u);
  const std::string joined = chunks[0] + chunks[1];
  ASSERT_EQ(joined.size(), 4014u);
  for (size_t i = 0; i < joined.size(); ++i) {
    ASSERT_EQ(joined[i], cycle[i % cycle.size()]) << "character " << i;
  }
}

}  // namespace
}  // namespace tarnwell::engine
