#include "store/property_blob.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

#include "engine/catalog_entry.h"
#include "store/store_test_support.h"

namespace tarnwell::store {
namespace {

using test_support::Append;
using test_support::Cat;
using test_support::Le16;
using test_support::Le32;
using test_support::Le64;
using test_support::ServerBlob;
using test_support::Wide;

constexpr uint16_t kB = 0x0808, kL = 0x1818, kT = 0x3838, kS = 0x4848, kN = 0x5050, kMS = 0xC8C8;

// One entry of a blob with 8-byte entries: an inline value, or the bytes laid
// out after the entry table (marker and length included).
struct Entry {
  uint16_t kind;
  uint16_t id;
  uint32_t inline_value = 0;
  Bytes value = {};
  bool bad_offset = false;  // point past the end of the blob
};

Bytes Blob(const std::vector<Entry>& entries, int count = -1) {
  Bytes b = Cat({{'P', 'r', 'o', 'P', 0, 0}, Le16(uint16_t(count < 0 ? entries.size() : count))});
  Bytes values;
  const size_t value_at = b.size() + 8 * entries.size();
  for (const Entry& e : entries) {
    const bool inline_value = e.kind == kB || e.kind == kL;
    const uint32_t offset = e.bad_offset ? 0xFFFFFFF0u : uint32_t(value_at + values.size());
    Append(&b, Cat({Le16(e.kind), Le16(e.id), Le32(inline_value ? e.inline_value : offset)}));
    if (!inline_value) Append(&values, e.value);
  }
  Append(&b, values);
  return b;
}

Bytes Str(const std::string& text, uint8_t marker = 'M') {
  return Cat({{marker, uint8_t(text.size())}, Bytes(text.begin(), text.end())});
}

Bytes Multi(const std::vector<std::string>& items) {
  Bytes b = {0xC9, uint8_t(items.size())};
  for (const std::string& item : items) Append(&b, Str(item));
  return b;
}

// Printable bytes as they are, others as <hex>.
std::string Text(const BlobEntry& e) {
  std::string out;
  for (uint8_t ch : e.value) {
    if (ch >= 0x20) {
      out += char(ch);
    } else {
      char hex[8];
      std::snprintf(hex, sizeof(hex), "<%02x>", ch);
      out += hex;
    }
  }
  return out;
}

std::string Names(const std::vector<BlobEntry>& entries) {
  std::string out;
  for (const BlobEntry& e : entries) out += e.name + "=" + Text(e) + " ";
  return out;
}

struct EdgeCase {
  const char* what;
  Bytes blob;
  std::string want;  // "name=value " per entry (texts only)
};

TEST(PropertyBlobTest, EdgeCases) {
  Bytes five_says_three = Blob({{kS, 1, 0, Str("x")},
                                {kS, 2, 0, Str("y")},
                                {kS, 3, 0, Str("z")},
                                {kS, 4, 0, Str("w")},
                                {kS, 5, 0, Str("v")}});
  // Keep the header and three entries only: the values are gone too.
  five_says_three.resize(8 + 3 * 8);
  const Bytes three_of_five = Blob({{kB, 1, 1}, {kB, 2, 0}, {kB, 3, 7}}, 5);
  Bytes cut_string = Blob({{kS, 0x37, 0, Str("abcdef")}});
  cut_string.pop_back();

  const std::vector<EdgeCase> cases = {
      {"count 5, three entries fit", three_of_five, "B1=<01> B2=<00> B3=<01> "},
      {"count 5, three entries fit, values cut away", five_says_three, ""},
      {"multi-valued a, b", Blob({{kMS, 0x8002, 0, Multi({"a", "b"})}}), "MS8002=a;b "},
      {"multi-valued, last item empty", Blob({{kMS, 0x8002, 0, Multi({"a", ""})}}), "MS8002=a; "},
      {"H ends the blob",
       Blob({{kS, 0x42, 0, Str("me")}, {kS, 0xe1d, 0, Str("", 'H')}, {kS, 0x3001, 0, Str("no")}}),
       "S42=me "},
      {"offset past the end skipped",
       Blob({{kS, 0x37, 0, Str("x"), true}, {kS, 0x3001, 0, Str("yes")}}), "S3001=yes "},
      {"length past the end skipped", cut_string, ""},
      {"unknown kind skipped", Blob({{0x1234, 1, 0, Str("?")}, {kS, 2, 0, Str("ok")}}), "S2=ok "},
      {"UTF-8 text", Blob({{kS, 0x37, 0, Str("caf\xC3\xA9")}}), "S37=caf\xC3\xA9 "},
      {"8-bit text that is not UTF-8", Blob({{kS, 0x37, 0, Str("caf\xE9")}}), "S37=caf\xC3\xA9 "},
      {"no magic", Bytes{'P', 'R', 'O', 'P', 0, 0, 1, 0, 0x08, 0x08, 1, 0, 1, 0, 0, 0}, ""},
      {"shorter than 9 bytes", Bytes{'P', 'r', 'o', 'P', 0, 0, 1, 0}, ""},
  };
  for (const EdgeCase& c : cases) {
    SCOPED_TRACE(c.what);
    EXPECT_EQ(Names(ParseBlobEntries(c.blob)), c.want);
  }
}

TEST(PropertyBlobTest, EntriesAreTypedLikeColumns) {
  const Bytes time = {0x00, 0x80, 0x3E, 0xD5, 0xDE, 0xB1, 0x9D, 0x01};
  const Bytes time_value = Cat({{'M', 8}, time});
  const std::vector<BlobEntry> entries =
      ParseBlobEntries(Blob({{kB, 0x63, 1},
                             {kL, 0x36, 0x01020304},
                             {kT, 0x3007, 0, time_value},
                             {kN, 0x71, 0, Bytes{'N', 2, 0xAA, 0xBB}}}));
  ASSERT_EQ(entries.size(), 4u);
  EXPECT_EQ(entries[0].name, "B63");
  EXPECT_EQ(entries[0].engine_type, engine::kColumnBit);
  EXPECT_EQ(entries[1].name, "L36");
  EXPECT_EQ(entries[1].value, (Bytes{4, 3, 2, 1}));
  EXPECT_EQ(entries[2].name, "T3007");
  EXPECT_EQ(entries[2].engine_type, engine::kColumnLongLong);
  EXPECT_EQ(entries[2].value, time);
  EXPECT_EQ(entries[3].name, "N71");
  EXPECT_EQ(entries[3].value, (Bytes{0xAA, 0xBB}));
}

struct ListCase {
  const char* what;
  Bytes blob;
  bool later_variant;
  std::string sender, cc, subject;
};

TEST(PropertyBlobTest, ListParser) {
  const Bytes doc_layout = Blob({{kS, 0x42, 0, Str("Ann")},
                                 {kS, 0xe03, 0, Str("Bob")},
                                 {kS, 0x70, 0, Str("Topic")},
                                 {kS, 0xe1d, 0, Str("Hello")}});
  // The same list fields in the layout servers write.
  const Bytes server_layout = ServerBlob({{0x48, 0x42}, {0x48, 0xE03}, {0x48, 0x70}, {0x48, 0xE1D}},
                                         Cat({Str("Ann"), Str("Bob"), Str("Topic"), Str("Hello")}));
  const Bytes topic_only = Blob({{kS, 0x70, 0, Str("Topic")}});
  const std::vector<ListCase> cases = {
      {"8-byte entries", doc_layout, false, "Ann", "", "Re: Hello"},
      {"8-byte entries, later variant", doc_layout, true, "Ann", "Bob", "Re: Hello"},
      {"server layout", server_layout, false, "Ann", "", "Re: Hello"},
      {"server layout, later variant", server_layout, true, "Ann", "Bob", "Re: Hello"},
      {"topic without subject", topic_only, false, "", "", "Re: "},
      {"topic without subject, later variant", topic_only, true, "", "", "Re: Topic"},
      {"not a blob", Bytes{1, 2, 3}, true, "", "", "Re: "},
  };
  for (const ListCase& c : cases) {
    SCOPED_TRACE(c.what);
    MessageSummary summary;
    summary.subject = "Re: ";  // a prefix column that came first
    BlobParserOptions options;
    options.later_2013_variant = c.later_variant;
    EXPECT_EQ(ParseBlobForList(c.blob, options, &summary), 1);
    EXPECT_EQ(summary.sender, c.sender);
    EXPECT_EQ(summary.cc, c.cc);
    EXPECT_EQ(summary.subject, c.subject);
  }
}

constexpr uint64_t kFileTime = 0x01D9B1DED53E8000ull;

// Both results must equal what was written.
template <typename A, typename B>
void ExpectBoth(const A& from_blob, const A& from_columns, const B& want) {
  EXPECT_EQ(from_blob, want);
  EXPECT_EQ(from_columns, want);
}

// A blob must fill the records exactly as columns of the same names do.
TEST(PropertyBlobTest, DetailParserFeedsTheColumnRules) {
  using engine::kColumnBinary, engine::kColumnBit, engine::kColumnLong, engine::kColumnLongLong,
      engine::kColumnLongText, engine::kColumnShort;
  PropertyDecoder decoder(kStoreExchange2013);
  InstallPropertyBlobParser(&decoder);
  struct Column {
    const char* name;
    uint32_t type;
    Bytes value;
  };
  ItemRecords from_blob, from_columns;
  const auto decode = [&](DecodePurpose purpose, const Bytes& blob,
                          const std::vector<Column>& columns) {
    EXPECT_EQ(
        decoder.Decode(purpose, "PropertyBlob", engine::kColumnLongBinary, 0, blob, &from_blob), 1);
    for (const Column& c : columns) {
      decoder.Decode(purpose, c.name, c.type, kCodePageUtf16LE, c.value, &from_columns);
    }
  };
  const Bytes time = Le64(kFileTime);

  // A message, from a blob with 8-byte entries.
  decode(DecodePurpose::kMessageDetail,
         Blob({{kS, 0x7d, 0, Str("Received: x")},
               {kL, 0x36, 2},
               {kT, 0x3007, 0, Cat({{'M', 8}, time})},
               {kB, 0x63, 1},
               {kN, 0x71, 0, Bytes{'N', 3, 1, 2, 3}},
               {kMS, 0x813a, 0, Multi({"p", "q"})}}),
         {{"S7d", kColumnLongText, Wide("Received: x")},
          {"L36", kColumnLong, Le32(2)},
          {"T3007", kColumnLongLong, time},
          {"B63", kColumnBit, {1}},
          {"N71", kColumnBinary, {1, 2, 3}},
          {"MS813a", kColumnLongText, Wide("p;q")}});
  const MessageRecord& a = from_blob.message;
  const MessageRecord& b = from_columns.message;
  ExpectBoth(a.transport_headers, b.transport_headers, "Received: x");
  ExpectBoth(a.sensitivity, b.sensitivity, 2u);
  ExpectBoth(a.creation_time, b.creation_time, kFileTime);
  ExpectBoth(a.response_requested, b.response_requested, 1);
  ExpectBoth(a.conversation_index, b.conversation_index, Bytes{1, 2, 3});
  ExpectBoth(a.named_multi_string, b.named_multi_string, "p;q");

  // A contact, from a blob of the server layout.
  const Bytes contact_blob =
      ServerBlob({{0x48, 0x3a06}, {0x38, 0x3a42}, {0x10, 0x3a4d}, {0x18, 0x8098}, {0xC8, 0x3a58}},
                 Cat({{0x49, 6, 'A', 0, 'n', 0, 'n', 0},  // UTF-16 "Ann"
                      {0x38},
                      time,
                      {0x11, 2},                                 // gender 2
                      {0x1B, 0x78, 0x56, 0x34, 0x12},            // 0x12345678
                      {0xC9, 2, 0x4D, 1, 'x', 0x4D, 1, 'y'}}));  // "x", "y"
  decode(DecodePurpose::kContactDetail, contact_blob,
         {{"S3a06", kColumnLongText, Wide("Ann")},
          {"T3a42", kColumnLongLong, time},
          {"I3a4d", kColumnShort, {2, 0}},
          {"L8098", kColumnLong, Le32(0x12345678)},
          {"MS3a58", kColumnLongText, Wide("x;y")}});
  const ContactRecord& c = from_blob.contact;
  const ContactRecord& d = from_columns.contact;
  EXPECT_EQ(c.strings.size(), 2u);
  EXPECT_EQ(c.strings, d.strings);
  ExpectBoth(c.birthday, d.birthday, kFileTime);
  ExpectBoth(c.gender, d.gender, 2);
  ExpectBoth(c.contact_value, d.contact_value, 0x12345678u);

  // A blob's entries never reach records whose purpose is off.
  ItemRecords untouched;
  EXPECT_EQ(decoder.Decode(DecodePurpose::kTaskDetail, "PropertyBlob", engine::kColumnLongBinary, 0,
                           contact_blob, &untouched),
            1);
  EXPECT_TRUE(untouched.contact.strings.empty());
  EXPECT_TRUE(untouched.task.strings.empty());
}

TEST(PropertyBlobTest, FarValuesComeFromTheRow) {
  // One string property whose value lives in "SeparatedProperty02".
  const Bytes blob = ServerBlob({{0x48, 0x7d}}, test_support::FarRef(2, 5, 0x48, 4));
  PropertyDecoder decoder(kStoreExchange2013);
  BlobParserOptions options;
  std::vector<uint16_t> asked;
  options.separated_value = [&](uint16_t slot) -> std::optional<Bytes> {
    asked.push_back(slot);
    return Bytes{0x4D, 2, 'h', 'i'};
  };
  ItemRecords records;
  EXPECT_EQ(ParseBlobForDetail(decoder, DecodePurpose::kMessageDetail, blob, options, &records), 1);
  EXPECT_EQ(asked, std::vector<uint16_t>{2});
  EXPECT_EQ(records.message.transport_headers, "hi");

  // Without a way to fetch it the value is left out.
  ItemRecords without;
  EXPECT_EQ(ParseBlobForDetail(decoder, DecodePurpose::kMessageDetail, blob, {}, &without), 1);
  EXPECT_EQ(without.message.transport_headers, "");
}

}  // namespace
}  // namespace tarnwell::store
