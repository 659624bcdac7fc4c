// Tagged values in their stored forms (compressed in the record by every
// scheme, multi-valued with plain and separated elements, two-valued), read
// back from written databases through the record walk and the column
// decoder, and through `tarnwell dump --json`.
#include "engine/column_decoder.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include "engine/engine_test_support.h"
#include "testing/forge_record.h"
#include "testing/forge_value.h"

namespace tarnwell::engine {
namespace {

using Kind = DecodedColumn::Kind;
using forge::Compression;

constexpr uint32_t kColumnFlagMultiValued = 0x400;
constexpr uint32_t kIdColumn = 1;
constexpr uint64_t kAttachmentLv = 9;

struct ValueCase {
  const char* name;
  forge::ColumnLayout column;
  forge::Cell cell;
  std::string expect;  // what the decoder makes of the value, as Render shows it
};

const std::string kAsciiText =
    "Compressed in the record: seven bits a character, eight characters in seven bytes.";
const std::string kLongText =
    "Xpress likes repetition. Xpress likes repetition. Xpress likes repetition! "
    "LZ4 likes it just as much, and so does every dictionary coder there is.";

Bytes Blob(size_t size) {
  Bytes b(size);
  for (size_t i = 0; i < size; ++i) b[i] = uint8_t((i * 7) % 23 + (i / 64));
  return b;
}

forge::Cell Compressed(uint32_t column, const Bytes& plain, Compression scheme) {
  forge::Cell cell;
  EXPECT_TRUE(forge::CompressedCell(column, ByteView(plain), scheme, &cell));
  return cell;
}

const std::string kAttachment = "an attachment that lives in the long-value tree";

std::vector<ValueCase> Cases() {
  return {
      {"seven_bit_ascii",
       {256, "AsciiText", forge::kColumnLongText, 0, 1252},
       Compressed(256, forge::Ascii(kAsciiText), Compression::kSevenBitAscii),
       "text " + kAsciiText},
      {"seven_bit_unicode",
       {257, "UnicodeText", forge::kColumnLongText, 0, 1200},
       Compressed(257, forge::Utf16(kAsciiText), Compression::kSevenBitUnicode),
       "text " + kAsciiText},
      {"seven_bit_unicode_in_an_8_bit_column",
       {258, "Subject", forge::kColumnText, 255, 1252},
       Compressed(258, forge::Utf16("Re: status"), Compression::kSevenBitUnicode),
       "text Re: status"},
      {"xpress_text",
       {259, "XpressText", forge::kColumnLongText, 0, 1200},
       Compressed(259, forge::Utf16(kLongText), Compression::kXpress),
       "text " + kLongText},
      {"xpress_binary",
       {260, "XpressBlob", forge::kColumnLongBinary},
       Compressed(260, Blob(600), Compression::kXpress),
       "binary " + ToHex(ByteView(Blob(600)))},
      {"lz4_binary",
       {261, "Lz4Blob", forge::kColumnLongBinary},
       Compressed(261, Blob(700), Compression::kLz4),
       "binary " + ToHex(ByteView(Blob(700)))},
      {"lz4_text",
       {262, "Lz4Text", forge::kColumnLongText, 0, 1252},
       Compressed(262, forge::Ascii(kLongText), Compression::kLz4),
       "text " + kLongText},
      {"xpress9_is_unsupported",
       {263, "Xpress9Blob", forge::kColumnLongBinary},
       Compressed(263, Blob(100), Compression::kXpress9),
       "unsupported unsupported compression: Xpress9"},
      {"multi_valued_text",
       {264, "Keywords", forge::kColumnText, 255, 1252, kColumnFlagMultiValued},
       forge::MultiValueCell(
           264, {{forge::Ascii("red")}, {forge::Ascii("")}, {forge::Ascii("green and blue")}}),
       "multi text red|text |text green and blue"},
      {"multi_valued_long",
       {265, "Numbers", forge::kColumnLong, 0, 0, kColumnFlagMultiValued},
       forge::MultiValueCell(265, {{forge::LittleEndian(7, 4)},
                                   {forge::LittleEndian(uint32_t(-2), 4)},
                                   {forge::LittleEndian(100000, 4)}}),
       "multi signed 7|signed -2|signed 100000"},
      {"multi_valued_with_a_separated_element",
       {266, "Parts", forge::kColumnLongText, 0, 1252, kColumnFlagMultiValued},
       forge::MultiValueCell(266, {{forge::Ascii("inline part")},
                                   {forge::LongValueId(kAttachmentLv), true},
                                   {forge::Ascii("last")}}),
       "multi text inline part|text " + kAttachment + "|text last"},
      {"two_values",
       {267, "Pair", forge::kColumnText, 255, 1252, kColumnFlagMultiValued},
       {267, forge::EncodeTwoValues(forge::Ascii("first"), forge::Ascii("second value")),
        forge::kTaggedTwoValues},
       "multi text first|text second value"},
      {"separated_text",
       {268, "Body", forge::kColumnLongText, 0, 1252},
       forge::SeparatedCell(268, kAttachmentLv),
       "text " + kAttachment},
  };
}

// One row per case holding only that case's column, plus the long value
// the separated cases refer to.
forge::DatabaseLayout ValuesDatabase(const Format& f, const std::vector<ValueCase>& cases) {
  forge::DatabaseLayout layout;
  layout.page_size = f.page_size;
  layout.format_revision = f.revision;
  forge::TableLayout t;
  t.name = "Values";
  t.columns.push_back({kIdColumn, "Id", forge::kColumnLong});
  for (const ValueCase& c : cases) t.columns.push_back(c.column);
  for (size_t i = 0; i < cases.size(); ++i) {
    forge::RowLayout row;
    row.cells.push_back({kIdColumn, forge::LittleEndian(i + 1, 4)});
    row.cells.push_back(cases[i].cell);
    t.rows.push_back(std::move(row));
  }
  forge::LongValueLayout lv;
  lv.id = kAttachmentLv;
  lv.data = forge::Ascii(kAttachment);
  t.long_values.push_back(lv);
  layout.tables.push_back(std::move(t));
  return layout;
}

// The kind and the value of a decoded column; a list's elements '|'-joined.
std::string Render(const DecodedColumn& d) {
  switch (d.kind) {
    case Kind::kText:
      return "text " + d.text;
    case Kind::kSigned:
      return "signed " + std::to_string(d.i);
    case Kind::kBinary:
      return "binary " + ToHex(ByteView(d.bytes));
    case Kind::kUnsupported:
      return "unsupported " + d.text;
    case Kind::kMulti: {
      std::string joined = "multi ";
      for (size_t k = 0; k < d.values.size(); ++k) joined += (k ? "|" : "") + Render(d.values[k]);
      return joined;
    }
    default:
      return "kind " + std::to_string(int(d.kind)) + " " + d.text;
  }
}

class ColumnDecoderTest : public ::testing::TestWithParam<Format> {};

TEST_P(ColumnDecoderTest, StoredFormsDecodeToTheirValues) {
  const std::vector<ValueCase> cases = Cases();
  TempDatabase db(ValuesDatabase(GetParam(), cases));
  std::unique_ptr<EdbClass> reader = OpenWithCatalog(db.path());
  ASSERT_TRUE(reader);
  const TableDef* table = reader->FindTable("Values");
  ASSERT_TRUE(table && table->long_value);
  ASSERT_EQ(table->columns.size(), cases.size() + 1);
  const LongValueReader lvs = reader->long_values();
  const ColumnDecoder decoder(&lvs, table->long_value->root_page());

  size_t row = 0;
  auto check_row = [&](const RecordRef&, RecordColumns& columns) {
    if (row >= cases.size()) return false;
    SCOPED_TRACE(cases[row].name);
    for (size_t i = 1; i < table->columns.size(); ++i) {
      const DecodedColumn d = decoder.Decode(table->columns[i], columns.at(i));
      if (i == row + 1) {
        EXPECT_EQ(Render(d), cases[row].expect);
      } else {
        EXPECT_EQ(d.kind, Kind::kAbsent) << "column " << i;
      }
    }
    ++row;
    return true;
  };
  ASSERT_EQ(reader->ForEachRecord(*table, check_row), 1);
  EXPECT_EQ(row, cases.size());
}

// The command line shows the same values; an unsupported scheme is named,
// not hidden.
TEST_P(ColumnDecoderTest, DumpCommandPrintsDecodedValues) {
  const std::string tool = std::string(TARNWELL_BINARY_DIR) + "/cli/tarnwell";
  if (!std::filesystem::exists(tool)) GTEST_SKIP() << tool << " not built";
  TempDatabase db(ValuesDatabase(GetParam(), Cases()));
  const std::string out_path = db.dir() + "/dump.json";
  const std::string cmd =
      "'" + tool + "' dump '" + db.path() + "' Values --json >'" + out_path + "' 2>&1 </dev/null";
  ASSERT_EQ(std::system(cmd.c_str()), 0);
  std::ifstream in(out_path);
  const std::string json{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
  for (const std::string& want : {
           "\"AsciiText\":\"" + kAsciiText + "\"",
           "\"UnicodeText\":\"" + kAsciiText + "\"",
           "\"XpressText\":\"" + kLongText + "\"",
           "\"Lz4Blob\":\"" + ToHex(ByteView(Blob(700))) + "\"",
           std::string("\"Xpress9Blob\":{\"unsupported\":\"unsupported compression: Xpress9\"}"),
           std::string("\"Numbers\":[7,-2,100000]"),
           std::string("\"Pair\":[\"first\",\"second value\"]"),
           std::string("\"Parts\":[\"inline part\",\"an attachment that lives in the "
                       "long-value tree\",\"last\"]"),
       }) {
    EXPECT_NE(json.find(want), std::string::npos) << want << "\n" << json.substr(0, 2000);
  }
}

INSTANTIATE_TEST_SUITE_P(PageSizes, ColumnDecoderTest, ::testing::ValuesIn(kFormats),
                         [](const ::testing::TestParamInfo<Format>& info) {
                           return std::string(info.param.name);
                         });

}  // namespace
}  // namespace tarnwell::engine
