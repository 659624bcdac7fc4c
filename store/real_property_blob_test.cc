#include "store/real_property_blob.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "engine/catalog_entry.h"
#include "engine/compress/compressed_value.h"

namespace tarnwell::store {
namespace {

constexpr uint16_t kPlain = 0x0400;
constexpr uint16_t kWithNearArea = 0x0401;

struct Property {
  uint8_t type;
  uint16_t id;
};

void Append(Bytes* out, const Bytes& more) { out->insert(out->end(), more.begin(), more.end()); }
void AppendU16(Bytes* out, uint16_t v) { Append(out, {uint8_t(v), uint8_t(v >> 8)}); }
void AppendU32(Bytes* out, uint32_t v) {
  AppendU16(out, uint16_t(v));
  AppendU16(out, uint16_t(v >> 16));
}

// A blob of the server layout with the given entries and value bytes.
Bytes Blob(const std::vector<Property>& props, const Bytes& values, uint16_t flags = kPlain,
           uint32_t near_area = 0) {
  Bytes b = {'P', 'r', 'o', 'P'};
  AppendU16(&b, flags);
  AppendU16(&b, uint16_t(props.size()));
  if (flags == kWithNearArea) AppendU32(&b, near_area);
  for (const Property& p : props) {
    b.push_back(p.type);
    AppendU16(&b, p.id);
  }
  Append(&b, values);
  return b;
}

Bytes Text(const std::string& s) { return Bytes(s.begin(), s.end()); }

const Bytes kGuid = {0x33, 0x22, 0x11, 0x00, 0x55, 0x44, 0x77, 0x66,
                     0x88, 0x99, 0xAA, 0xBB, 0xCC, 0xDD, 0xEE, 0xFF};

struct EncodingCase {
  const char* what;
  uint8_t type;
  Bytes encoded;
  const char* name;  // for id 0x1234
  uint32_t engine_type;
  Bytes value;
  BlobValueState state = BlobValueState::kValue;
  size_t items = 0;
};

Bytes Cat(Bytes a, const Bytes& b) {
  Append(&a, b);
  return a;
}

const std::vector<EncodingCase>& EncodingCases() {
  using engine::kColumnBinary, engine::kColumnBit, engine::kColumnShort, engine::kColumnLong,
      engine::kColumnLongLong, engine::kColumnCurrency, engine::kColumnFloat, engine::kColumnDouble,
      engine::kColumnGuid, engine::kColumnText;
  const Bytes eight = {1, 2, 3, 4, 5, 6, 7, 8};
  static const std::vector<EncodingCase> cases = {
      {"bool false", 0x08, {0x08}, "B1234", kColumnBit, {0}},
      {"bool true", 0x08, {0x09}, "B1234", kColumnBit, {1}},
      {"int16 zero", 0x10, {0x10}, "I1234", kColumnShort, {0, 0}},
      {"int16 one byte, negative", 0x10, {0x11, 0xFE}, "I1234", kColumnShort, {0xFE, 0xFF}},
      {"int16 two bytes", 0x10, {0x12, 0x34, 0x12}, "I1234", kColumnShort, {0x34, 0x12}},
      {"int32 zero", 0x18, {0x18}, "L1234", kColumnLong, {0, 0, 0, 0}},
      {"int32 one byte, positive", 0x18, {0x19, 0x7F}, "L1234", kColumnLong, {0x7F, 0, 0, 0}},
      {"int32 one byte, negative",
       0x18,
       {0x19, 0x80},
       "L1234",
       kColumnLong,
       {0x80, 0xFF, 0xFF, 0xFF}},
      {"int32 two bytes, negative",
       0x18,
       {0x1A, 0x00, 0x80},
       "L1234",
       kColumnLong,
       {0x00, 0x80, 0xFF, 0xFF}},
      {"int32 four bytes",
       0x18,
       {0x1B, 0x78, 0x56, 0x34, 0x12},
       "L1234",
       kColumnLong,
       {0x78, 0x56, 0x34, 0x12}},
      {"int64 zero", 0x20, {0x20}, "Q1234", kColumnLongLong, Bytes(8, 0)},
      {"int64 one byte", 0x20, {0x21, 0xFF}, "Q1234", kColumnLongLong, Bytes(8, 0xFF)},
      {"int64 two bytes",
       0x20,
       {0x22, 0x01, 0x02},
       "Q1234",
       kColumnLongLong,
       {1, 2, 0, 0, 0, 0, 0, 0}},
      {"int64 four bytes, negative",
       0x20,
       {0x23, 0, 0, 0, 0x80},
       "Q1234",
       kColumnLongLong,
       {0, 0, 0, 0x80, 0xFF, 0xFF, 0xFF, 0xFF}},
      {"int64 eight bytes", 0x20, Cat({0x24}, eight), "Q1234", kColumnLongLong, eight},
      {"currency", 0x24, Cat({0x24}, eight), "Q1234", kColumnCurrency, eight},
      {"currency zero", 0x24, {0x20}, "Q1234", kColumnCurrency, Bytes(8, 0)},
      {"float", 0x28, {0x28, 0, 0, 0x80, 0x3F}, "D1234", kColumnFloat, {0, 0, 0x80, 0x3F}},
      {"float zero", 0x28, {0x2A}, "D1234", kColumnFloat, Bytes(4, 0)},
      {"double", 0x30, Cat({0x30}, eight), "D1234", kColumnDouble, eight},
      {"double zero", 0x30, {0x32}, "D1234", kColumnDouble, Bytes(8, 0)},
      {"app-time", 0x34, Cat({0x30}, eight), "D1234", kColumnDouble, eight},
      {"time", 0x38, Cat({0x38}, eight), "T1234", kColumnLongLong, eight},
      {"time, short form kept unread",
       0x38,
       {0x39, 1, 2, 3, 4},
       "T1234",
       kColumnBinary,
       {1, 2, 3, 4},
       BlobValueState::kUnknownEncoding},
      {"guid", 0x40, Cat({0x40}, kGuid), "G1234", kColumnGuid, kGuid},
      {"string empty", 0x48, {0x48}, "S1234", kColumnText, {}},
      {"string 8-bit, u8 length",
       0x48,
       {0x4D, 3, 'a', 'b', 0xE9},
       "S1234",
       kColumnText,
       Text("ab\xC3\xA9")},
      {"string 8-bit, u16 length", 0x48, {0x4E, 2, 0, 'h', 'i'}, "S1234", kColumnText, Text("hi")},
      {"string UTF-16, u8 length",
       0x48,
       {0x49, 4, 0xAC, 0x20, 'x', 0},
       "S1234",
       kColumnText,
       Text("\xE2\x82\xACx")},
      {"string UTF-16, u16 length", 0x48, {0x4A, 2, 0, 'y', 0}, "S1234", kColumnText, Text("y")},
      {"binary empty", 0x50, {0x50}, "N1234", kColumnBinary, {}},
      {"binary, u8 length", 0x50, {0x51, 2, 0xAA, 0xBB}, "N1234", kColumnBinary, {0xAA, 0xBB}},
      {"binary, u16 length", 0x50, {0x52, 1, 0, 0xCC}, "N1234", kColumnBinary, {0xCC}},
      {"multi int16, u8 count",
       0x90,
       {0x91, 2, 1, 0, 2, 0},
       "MI1234",
       kColumnBinary,
       {1, 0, 2, 0},
       BlobValueState::kValue,
       2},
      {"multi int32, u16 count",
       0x98,
       {0x9A, 1, 0, 7, 0, 0, 0},
       "ML1234",
       kColumnBinary,
       {7, 0, 0, 0},
       BlobValueState::kValue,
       1},
      {"multi time, none", 0xB8, {0xB9, 0}, "MT1234", kColumnBinary, {}, BlobValueState::kValue, 0},
      {"multi guid", 0xC0, Cat({0xC1, 1}, kGuid), "MG1234", kColumnBinary, kGuid,
       BlobValueState::kValue, 1},
      {"multi string, mixed encodings",
       0xC8,
       {0xC9, 3, 0x4D, 1, 'a', 0x48, 0x49, 2, 'b', 0},
       "MS1234",
       kColumnText,
       Text("a;;b"),
       BlobValueState::kValue,
       3},
      {"multi binary",
       0xD0,
       {0xD2, 2, 0, 0x51, 1, 0xAA, 0x50},
       "MN1234",
       kColumnBinary,
       {},
       BlobValueState::kValue,
       2},
      {"deleted", 0x18, {0x00}, "L1234", kColumnLong, {}, BlobValueState::kDeleted},
  };
  return cases;
}

TEST(RealPropertyBlobTest, EveryEncodingDecodes) {
  for (const EncodingCase& c : EncodingCases()) {
    SCOPED_TRACE(c.what);
    const Bytes blob = Blob({{c.type, 0x1234}}, c.encoded);
    ASSERT_TRUE(IsRealLayout(blob));
    const RealBlob parsed = ParseRealBlob(blob);
    EXPECT_TRUE(parsed.complete) << parsed.problem;
    ASSERT_EQ(parsed.entries.size(), 1u);
    const BlobEntry& e = parsed.entries[0];
    EXPECT_EQ(e.name, c.name);
    EXPECT_EQ(e.id, 0x1234);
    EXPECT_EQ(e.state, c.state);
    if (c.state == BlobValueState::kDeleted) continue;
    EXPECT_EQ(e.engine_type, c.engine_type);
    EXPECT_EQ(e.value, c.value);
    EXPECT_EQ(e.items.size(), c.items);
  }
}

// All encodings in one blob, cut at every length: never a read outside the
// cut, and what comes out is a prefix of the whole.
TEST(RealPropertyBlobTest, TruncationGivesAPrefix) {
  std::vector<Property> props;
  Bytes values;
  for (size_t i = 0; i < EncodingCases().size(); ++i) {
    props.push_back({EncodingCases()[i].type, uint16_t(0x100 + i)});
    Append(&values, EncodingCases()[i].encoded);
  }
  const Bytes blob = Blob(props, values);
  const RealBlob whole = ParseRealBlob(blob);
  ASSERT_TRUE(whole.complete) << whole.problem;
  ASSERT_EQ(whole.entries.size(), props.size());
  for (size_t cut = 0; cut < blob.size(); ++cut) {
    SCOPED_TRACE(cut);
    // A copy of exactly `cut` bytes, so that a sanitizer sees any overread.
    const Bytes part(blob.begin(), blob.begin() + cut);
    const RealBlob parsed = ParseRealBlob(part);
    EXPECT_FALSE(parsed.complete);
    ASSERT_LT(parsed.entries.size(), whole.entries.size());
    for (size_t i = 0; i < parsed.entries.size(); ++i) {
      EXPECT_EQ(parsed.entries[i].name, whole.entries[i].name);
      EXPECT_EQ(parsed.entries[i].value, whole.entries[i].value);
    }
  }
}

TEST(RealPropertyBlobTest, NearAndFarValues) {
  // Header 12 + 2 entries 6 = 18; two references of 13 bytes end at 44.
  constexpr uint32_t kNearArea = 44;
  Bytes values = {0x78};
  AppendU16(&values, 0);
  AppendU32(&values, kNearArea);
  AppendU16(&values, 0x48);
  AppendU32(&values, 7);
  values.push_back(0x7A);
  AppendU16(&values, 3);  // slot
  AppendU32(&values, 5);  // size hint
  AppendU16(&values, 0x50);
  AppendU32(&values, 7);
  Append(&values, {0x4D, 5, 'h', 'e', 'l', 'l', 'o'});
  const Bytes blob = Blob({{0x48, 0x37}, {0x50, 0x1000}}, values, kWithNearArea, kNearArea);
  ASSERT_EQ(blob.size(), kNearArea + 7);

  const RealBlob parsed = ParseRealBlob(blob);
  ASSERT_TRUE(parsed.complete) << parsed.problem;
  ASSERT_EQ(parsed.entries.size(), 2u);
  EXPECT_EQ(parsed.entries[0].name, "S37");
  EXPECT_EQ(parsed.entries[0].value, Text("hello"));

  BlobEntry far = parsed.entries[1];
  EXPECT_EQ(far.state, BlobValueState::kFarValue);
  EXPECT_EQ(far.far_slot, 3);
  EXPECT_EQ(far.far_family, 0x50);
  EXPECT_EQ(far.far_length, 7u);
  EXPECT_EQ(SeparatedPropertyColumn(far.far_slot), "SeparatedProperty03");
  // A value of another type, or with bytes left over, is not taken.
  EXPECT_FALSE(ResolveFarValue(Bytes{0x4D, 1, 'x'}, &far));
  EXPECT_FALSE(ResolveFarValue(Bytes{0x51, 1, 9, 9}, &far));
  EXPECT_EQ(far.state, BlobValueState::kFarValue);
  ASSERT_TRUE(ResolveFarValue(Bytes{0x51, 5, 1, 2, 3, 4, 5}, &far));
  EXPECT_EQ(far.state, BlobValueState::kValue);
  EXPECT_EQ(far.value, (Bytes{1, 2, 3, 4, 5}));
}

struct DamageCase {
  const char* what;
  Bytes blob;
  size_t entries;  // read before the damage
};

Bytes WithCount(Bytes blob, uint16_t count) {
  blob[6] = uint8_t(count);
  blob[7] = uint8_t(count >> 8);
  return blob;
}

// A bool, then a string whose near value lies at `offset`.
Bytes NearBlob(uint32_t near_area, uint32_t offset, uint32_t length) {
  Bytes values = {0x09, 0x78};
  AppendU16(&values, 0);
  AppendU32(&values, offset);
  AppendU16(&values, 0x48);
  AppendU32(&values, length);
  Append(&values, {0x4D, 1, 'z'});
  return Blob({{0x08, 1}, {0x48, 2}}, values, kWithNearArea, near_area);
}

TEST(RealPropertyBlobTest, DamageStopsBeforeTheBadEntry) {
  const std::vector<DamageCase> cases = {
      {"count larger than the entry table", WithCount(Blob({{0x08, 1}}, {0x09}), 0xFFFF), 0},
      {"count one more than the values", WithCount(Blob({{0x08, 1}, {0x08, 2}}, {0x09, 0x08}), 3),
       0},
      {"element count past the end", Blob({{0x08, 1}, {0x98, 2}}, {0x09, 0x9A, 0xFF, 0xFF, 1}), 1},
      {"string length past the end", Blob({{0x08, 1}, {0x48, 2}}, {0x09, 0x4E, 0xFF, 0xFF}), 1},
      {"unknown type", Blob({{0x08, 1}, {0x0C, 2}}, {0x09, 0x0C}), 1},
      {"encoding of another type", Blob({{0x08, 1}, {0x18, 2}}, {0x09, 0x38}), 1},
      {"bytes after the last value", Blob({{0x08, 1}}, {0x09, 0x00}), 1},
      {"near area before the entries", NearBlob(4, 32, 3), 0},
      {"near area past the end", NearBlob(1000, 32, 3), 0},
      {"near value inside the inline values", NearBlob(32, 20, 3), 1},
      {"near value past the end", NearBlob(32, 32, 4), 1},
      {"near value shorter than its encoding", NearBlob(32, 32, 2), 1},
  };
  for (const DamageCase& c : cases) {
    SCOPED_TRACE(c.what);
    const RealBlob parsed = ParseRealBlob(c.blob);
    EXPECT_FALSE(parsed.complete);
    EXPECT_FALSE(parsed.problem.empty());
    EXPECT_EQ(parsed.entries.size(), c.entries);
  }
  EXPECT_TRUE(ParseRealBlob(NearBlob(32, 32, 3)).complete) << "the undamaged near blob";
  EXPECT_FALSE(IsRealLayout(Bytes{'P', 'r', 'o', 'P', 0, 0, 0, 0}));
  EXPECT_FALSE(IsRealLayout(Bytes{'P', 'r', 'o', 'P', 0, 4}));
}

// Real blobs written by Exchange servers.
class RealSampleTest : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = std::filesystem::path(TARNWELL_EXTERNAL_FIXTURES) / "gromox-blobs";
    if (!std::filesystem::is_directory(dir_)) GTEST_SKIP() << "no samples at " << dir_;
  }
  Bytes Read(const std::string& name) {
    std::ifstream in(dir_ / name, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
  }
  std::filesystem::path dir_;
};

TEST_F(RealSampleTest, EveryBlobParsesToItsEnd) {
  for (const char* name : {"epv_1.b", "epv_2.b", "epv_3.b", "epv_4.b"}) {
    SCOPED_TRACE(name);
    const Bytes blob = Read(name);
    ASSERT_TRUE(IsRealLayout(blob));
    const RealBlob parsed = ParseRealBlob(blob);
    EXPECT_TRUE(parsed.complete) << parsed.problem;
    EXPECT_EQ(parsed.entries.size(), blob[6] | (blob[7] << 8));
  }
  EXPECT_EQ(Read("epv_1.b")[4], 0x01) << "the sample with a near-value area";
}

// The small samples are the compressed "SeparatedPropertyNN" values of far
// entries: eps_<blob>_<slot>[_<slot>].b.
TEST_F(RealSampleTest, SeparatedValuesResolveFarEntries) {
  struct Sample {
    const char* file;
    const char* blob;
    std::vector<uint16_t> slots;
  };
  const std::vector<Sample> samples = {
      {"eps_1_01_03.b", "epv_1.b", {1, 3}},
      {"eps_1_02.b", "epv_1.b", {2}},
      {"eps_1_04.b", "epv_1.b", {4}},
      {"eps_2_05.b", "epv_2.b", {5}},
  };
  for (const Sample& sample : samples) {
    SCOPED_TRACE(sample.file);
    const engine::DecodedValue decoded = engine::DecodeCompressedValue(Read(sample.file));
    ASSERT_TRUE(decoded.ok()) << decoded.message;
    const RealBlob blob = ParseRealBlob(Read(sample.blob));
    for (uint16_t slot : sample.slots) {
      const BlobEntry* far = nullptr;
      for (const BlobEntry& e : blob.entries) {
        if (e.state == BlobValueState::kFarValue && e.far_slot == slot) far = &e;
      }
      ASSERT_NE(far, nullptr) << "slot " << slot;
      EXPECT_EQ(decoded.bytes.size(), far->far_length);
      BlobEntry resolved = *far;
      ASSERT_TRUE(ResolveFarValue(decoded.bytes, &resolved)) << far->name;
      EXPECT_EQ(resolved.items.size(), 257u);
      EXPECT_EQ(resolved.value.size(), 257u * 8);
    }
  }
}

}  // namespace
}  // namespace tarnwell::store
