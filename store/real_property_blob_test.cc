#include "store/real_property_blob.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "engine/catalog_entry.h"
#include "engine/compress/compressed_value.h"
#include "store/store_test_support.h"

namespace tarnwell::store {
namespace {

using test_support::Cat;
using test_support::kWithNearArea;
using test_support::Le32;
using test_support::Le64;
using test_support::NearRef;
using test_support::ServerBlob;

Bytes Text(const std::string& s) { return Bytes(s.begin(), s.end()); }

const Bytes kGuid = {0x33, 0x22, 0x11, 0x00, 0x55, 0x44, 0x77, 0x66,
                     0x88, 0x99, 0xAA, 0xBB, 0xCC, 0xDD, 0xEE, 0xFF};

struct EncodingCase {
  const char* what;
  uint8_t type;
  Bytes encoded;
  const char* prefix;  // of the name, before the id 1234
  uint32_t engine_type;
  Bytes value;
  BlobValueState state = BlobValueState::kValue;
  size_t items = 0;
};

const std::vector<EncodingCase>& EncodingCases() {
  constexpr uint32_t kBin = engine::kColumnBinary, kBit = engine::kColumnBit,
                     kI16 = engine::kColumnShort, kI32 = engine::kColumnLong,
                     kI64 = engine::kColumnLongLong, kCur = engine::kColumnCurrency,
                     kF32 = engine::kColumnFloat, kF64 = engine::kColumnDouble,
                     kGid = engine::kColumnGuid, kTxt = engine::kColumnText;
  constexpr auto kUnknown = BlobValueState::kUnknownEncoding;
  constexpr auto kValue = BlobValueState::kValue;
  const char* kEuroX = "\xE2\x82\xACx";
  const Bytes eight = {1, 2, 3, 4, 5, 6, 7, 8};
  // clang-format off
  static const std::vector<EncodingCase> cases = {
      {"bool false", 0x08, {0x08}, "B", kBit, {0}},
      {"bool true", 0x08, {0x09}, "B", kBit, {1}},
      {"int16 zero", 0x10, {0x10}, "I", kI16, {0, 0}},
      {"int16 1 byte negative", 0x10, {0x11, 0xFE}, "I", kI16, {0xFE, 0xFF}},
      {"int16 2 bytes", 0x10, {0x12, 0x34, 0x12}, "I", kI16, {0x34, 0x12}},
      {"int32 zero", 0x18, {0x18}, "L", kI32, {0, 0, 0, 0}},
      {"int32 1 byte positive", 0x18, {0x19, 0x7F}, "L", kI32, {0x7F, 0, 0, 0}},
      {"int32 1 byte negative", 0x18, {0x19, 0x80}, "L", kI32, {0x80, 0xFF, 0xFF, 0xFF}},
      {"int32 2 bytes negative", 0x18, {0x1A, 0, 0x80}, "L", kI32, {0, 0x80, 0xFF, 0xFF}},
      {"int32 4 bytes", 0x18, {0x1B, 0x78, 0x56, 0x34, 0x12}, "L", kI32, {0x78, 0x56, 0x34, 0x12}},
      {"int64 zero", 0x20, {0x20}, "Q", kI64, Bytes(8, 0)},
      {"int64 1 byte", 0x20, {0x21, 0xFF}, "Q", kI64, Bytes(8, 0xFF)},
      {"int64 2 bytes", 0x20, {0x22, 1, 2}, "Q", kI64, {1, 2, 0, 0, 0, 0, 0, 0}},
      {"int64 4 bytes neg", 0x20, {0x23, 0, 0, 0, 0x80}, "Q", kI64, Le64(0xFFFFFFFF80000000ull)},
      {"int64 8 bytes", 0x20, Cat({{0x24}, eight}), "Q", kI64, eight},
      {"currency", 0x24, Cat({{0x24}, eight}), "Q", kCur, eight},
      {"currency zero", 0x24, {0x20}, "Q", kCur, Bytes(8, 0)},
      {"float", 0x28, {0x28, 0, 0, 0x80, 0x3F}, "D", kF32, {0, 0, 0x80, 0x3F}},
      {"float zero", 0x28, {0x2A}, "D", kF32, Bytes(4, 0)},
      {"double", 0x30, Cat({{0x30}, eight}), "D", kF64, eight},
      {"double zero", 0x30, {0x32}, "D", kF64, Bytes(8, 0)},
      {"app-time", 0x34, Cat({{0x30}, eight}), "D", kF64, eight},
      {"time", 0x38, Cat({{0x38}, eight}), "T", kI64, eight},
      {"time, short form kept unread", 0x38, {0x39, 1, 2, 3, 4}, "T", kBin, {1, 2, 3, 4}, kUnknown},
      {"guid", 0x40, Cat({{0x40}, kGuid}), "G", kGid, kGuid},
      {"string empty", 0x48, {0x48}, "S", kTxt, {}},
      {"string 8-bit, u8 length", 0x48, {0x4D, 3, 'a', 'b', 0xE9}, "S", kTxt, Text("ab\xC3\xA9")},
      {"string 8-bit, u16 length", 0x48, {0x4E, 2, 0, 'h', 'i'}, "S", kTxt, Text("hi")},
      {"string UTF-16, u8 length", 0x48, {0x49, 4, 0xAC, 0x20, 'x', 0}, "S", kTxt, Text(kEuroX)},
      {"string UTF-16, u16 length", 0x48, {0x4A, 2, 0, 'y', 0}, "S", kTxt, Text("y")},
      {"binary empty", 0x50, {0x50}, "N", kBin, {}},
      {"binary, u8 length", 0x50, {0x51, 2, 0xAA, 0xBB}, "N", kBin, {0xAA, 0xBB}},
      {"binary, u16 length", 0x50, {0x52, 1, 0, 0xCC}, "N", kBin, {0xCC}},
      {"multi int16 u8 n", 0x90, {0x91, 2, 1, 0, 2, 0}, "MI", kBin, {1, 0, 2, 0}, kValue, 2},
      {"multi int32 u16 n", 0x98, {0x9A, 1, 0, 7, 0, 0, 0}, "ML", kBin, {7, 0, 0, 0}, kValue, 1},
      {"multi time, none", 0xB8, {0xB9, 0}, "MT", kBin, {}, kValue, 0},
      {"multi guid", 0xC0, Cat({{0xC1, 1}, kGuid}), "MG", kBin, kGuid, kValue, 1},
      {"multi string, mixed", 0xC8, {0xC9, 3, 0x4D, 1, 'a', 0x48, 0x49, 2, 'b', 0}, "MS", kTxt,
       Text("a;;b"), kValue, 3},
      {"multi binary", 0xD0, {0xD2, 2, 0, 0x51, 1, 0xAA, 0x50}, "MN", kBin, {}, kValue, 2},
      {"deleted", 0x18, {0x00}, "L", kI32, {}, BlobValueState::kDeleted},
  };
  // clang-format on
  return cases;
}

TEST(RealPropertyBlobTest, EveryEncodingDecodes) {
  for (const EncodingCase& c : EncodingCases()) {
    SCOPED_TRACE(c.what);
    const Bytes blob = ServerBlob({{c.type, 0x1234}}, c.encoded);
    ASSERT_TRUE(IsRealLayout(blob));
    const RealBlob parsed = ParseRealBlob(blob);
    EXPECT_TRUE(parsed.complete) << parsed.problem;
    ASSERT_EQ(parsed.entries.size(), 1u);
    const BlobEntry& e = parsed.entries[0];
    EXPECT_EQ(e.name, c.prefix + std::string("1234"));
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
  std::vector<test_support::BlobProperty> props;
  Bytes values;
  for (size_t i = 0; i < EncodingCases().size(); ++i) {
    props.push_back({EncodingCases()[i].type, uint16_t(0x100 + i)});
    values.insert(values.end(), EncodingCases()[i].encoded.begin(),
                  EncodingCases()[i].encoded.end());
  }
  const Bytes blob = ServerBlob(props, values);
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
  const Bytes values = Cat({NearRef(kNearArea, 0x48, 7),
                            test_support::FarRef(3, 5, 0x50, 7),
                            {0x4D, 5, 'h', 'e', 'l', 'l', 'o'}});
  const Bytes blob = ServerBlob({{0x48, 0x37}, {0x50, 0x1000}}, values, kWithNearArea, kNearArea);
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
  StoreU16LE(blob.data() + 6, count);
  return blob;
}

// A bool, then an entry of `type` whose value is `value`.
Bytes AfterBool(uint8_t type, const Bytes& value) {
  return ServerBlob({{0x08, 1}, {type, 2}}, Cat({{0x09}, value}));
}

// A bool, then a string whose near value lies at `offset`.
Bytes NearBlob(uint32_t near_area, uint32_t offset, uint32_t length) {
  const Bytes values = Cat({{0x09}, NearRef(offset, 0x48, length), {0x4D, 1, 'z'}});
  return ServerBlob({{0x08, 1}, {0x48, 2}}, values, kWithNearArea, near_area);
}

TEST(RealPropertyBlobTest, DamageStopsBeforeTheBadEntry) {
  const std::vector<DamageCase> cases = {
      {"count larger than the entry table", WithCount(ServerBlob({{0x08, 1}}, {0x09}), 0xFFFF), 0},
      {"count one more than the values", WithCount(AfterBool(0x08, {0x08}), 3), 0},
      {"element count past the end", AfterBool(0x98, {0x9A, 0xFF, 0xFF, 1}), 1},
      {"string length past the end", AfterBool(0x48, {0x4E, 0xFF, 0xFF}), 1},
      {"unknown type", AfterBool(0x0C, {0x0C}), 1},
      {"encoding of another type", AfterBool(0x18, {0x38}), 1},
      {"bytes after the last value", ServerBlob({{0x08, 1}}, {0x09, 0x00}), 1},
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
