#include "engine/compress/compressed_value.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "engine/compress/compress_test_support.h"
#include "engine/compress/decompress_value.h"

namespace tarnwell::engine {
namespace {

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

// Values written by Windows, from the external fixture folder. (Columns of a
// real database compressed in the record are checked against Windows' own
// dump through the reader, in engine/real_files_test.cc.)
std::optional<Bytes> ReadFixture(const std::string& relative) {
  std::ifstream f(std::string(TARNWELL_EXTERNAL_FIXTURES) + "/" + relative, std::ios::binary);
  if (!f) return std::nullopt;
  return Bytes(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
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
    if (!value) GTEST_SKIP() << "external fixture not found: " << c.file;
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
  if (!file) GTEST_SKIP() << "external fixture test.edb not found";
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
