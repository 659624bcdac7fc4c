#include "mapi/pst/property_context.h"

#include <gtest/gtest.h>

#include <algorithm>

#include "mapi/pst/heap_on_node.h"
#include "mapi/pst/pst_test_support.h"

namespace tarnwell::mapi::pst {
namespace {

PropertyValue Raw(uint16_t type, Bytes data) {
  PropertyValue v;
  v.type = type;
  v.data = std::move(data);
  return v;
}

PropertyValue Multi(uint16_t type, std::vector<Bytes> elements) {
  PropertyValue v;
  v.type = type | kMultiFlag;
  v.elements = std::move(elements);
  return v;
}

TaggedValue Tagged(uint16_t id, PropertyValue v) { return TaggedValue{MakeTag(id, v.type), v}; }

// One property of every type, with sizes on both sides of the heap limit.
std::vector<TaggedValue> EveryType() {
  const Bytes guid = Pattern(16, 3);
  return {
      Tagged(0x0E07, PropertyValue::Int32(-5)),
      Tagged(0x0017, PropertyValue::Int16(-2)),
      Tagged(0x1000, PropertyValue::Unicode("Body text, ünïcödé")),
      Tagged(0x0037, PropertyValue::Unicode("")),
      Tagged(0x0E06, PropertyValue::SysTime(0x01D2'3456'789A'BCDEull)),
      Tagged(0x0057, PropertyValue::Boolean(true)),
      Tagged(0x0058, PropertyValue::Boolean(false)),
      Tagged(0x3FDE, Raw(kTypeFloat, {0, 0, 0x80, 0x3F})),
      Tagged(0x3FDF, PropertyValue::Double(2.5)),
      Tagged(0x3FE0, Raw(kTypeCurrency, Pattern(8, 9))),
      Tagged(0x3FE1, PropertyValue::AppTime(40000.25)),
      Tagged(0x3FE2, Raw(kTypeError, {0x0F, 0x01, 0x04, 0x80})),
      Tagged(0x3FE3, PropertyValue::Int64(-1234567890123ll)),
      Tagged(0x3FE4, PropertyValue::Guid(guid)),
      Tagged(0x3FE5, PropertyValue::String8("plain")),
      Tagged(0x3FE6, PropertyValue::Binary(Pattern(kMaxHeapAllocation, 1))),
      Tagged(0x3FE7, PropertyValue::Binary(Pattern(kMaxHeapAllocation + 1, 2))),
      Tagged(0x3FE8, PropertyValue::Binary(Pattern(3 * kMaxBlockData + 5, 3))),
      Tagged(0x3FE9, PropertyValue::Unicode(std::string(1790, 'x'))),  // 3580 bytes
      Tagged(0x3FEA, PropertyValue::Unicode(std::string(1791, 'y'))),  // 3582 bytes
      Tagged(0x3701, Raw(kTypeObject, {0x3F, 0, 0, 0, 0x10, 0, 0, 0})),
      Tagged(0x3FEB, Multi(kTypeInt16, {{1, 0}, {2, 0}})),
      Tagged(0x3FEC, Multi(kTypeInt32, {{1, 0, 0, 0}, {2, 0, 0, 0}, {3, 0, 0, 0}})),
      Tagged(0x3FED, Multi(kTypeInt64, {Pattern(8, 1)})),
      Tagged(0x3FEE, Multi(kTypeSysTime, {Pattern(8, 4), Pattern(8, 5)})),
      Tagged(0x3FEF, Multi(kTypeGuid, {guid, Pattern(16, 7)})),
      Tagged(0x3FF0, PropertyValue::MultiUnicode({"one", "", "three"})),
      Tagged(0x3FF1, Multi(kTypeString8, {{'a'}, {'b', 'c'}})),
      Tagged(0x3FF2, PropertyValue::MultiBinary({Pattern(2000, 1), Pattern(2000, 2)})),
      Tagged(0x3FF3, Multi(kTypeUnicode, {})),
      Tagged(0x3FF4, Multi(kTypeBinary, {})),
  };
}

std::vector<TaggedValue> SortedById(std::vector<TaggedValue> v) {
  std::sort(v.begin(), v.end(),
            [](const TaggedValue& a, const TaggedValue& b) { return TagId(a.tag) < TagId(b.tag); });
  return v;
}

void ExpectSame(const std::vector<TaggedValue>& want, const std::vector<TaggedValue>& got) {
  ASSERT_EQ(want.size(), got.size());
  for (size_t i = 0; i < want.size(); ++i) {
    EXPECT_EQ(want[i].tag, got[i].tag) << i;
    EXPECT_EQ(want[i].value, got[i].value) << std::hex << want[i].tag;
  }
}

// Every type round trips; large values go to new subnodes beside the ones
// the node has already.
TEST(PropertyContextTest, EveryTypeRoundTrips) {
  const std::vector<TaggedValue> props = EveryType();
  NodeContent node;
  const Nid taken = MakeNid(kNidTypeLtp, 1);
  node.subnodes[taken].blocks = {Bytes{1, 2, 3}};
  node.subnodes[0x692].blocks = {Bytes{4}};
  ASSERT_TRUE(EncodePropertyContext(props, &node).ok());
  for (const Bytes& b : node.blocks) EXPECT_LE(b.size(), kMaxBlockData);
  // 3581-byte binary, the 3-block binary, the 3582-byte string and the
  // 4012-byte multi-valued binary live in subnodes; 3580 bytes still fit.
  ASSERT_EQ(node.subnodes.size(), 6u);
  EXPECT_EQ(node.subnodes.at(taken).blocks, (std::vector<Bytes>{Bytes{1, 2, 3}}));
  EXPECT_EQ(node.subnodes.at(0x692).blocks, std::vector<Bytes>{Bytes{4}});
  size_t four_blocks = 0;
  for (const auto& [nid, sub] : node.subnodes) {
    if (nid != 0x692) {
      EXPECT_EQ(NidTypeOf(nid), kNidTypeLtp);
    }
    four_blocks += sub.blocks.size() == 4;
  }
  EXPECT_EQ(four_blocks, 1u);

  std::vector<TaggedValue> got;
  ASSERT_TRUE(DecodePropertyContext(node, &got).ok());
  ExpectSame(SortedById(props), got);
}

// What other readers look at first: heap header, BTH header, inline values.
TEST(PropertyContextTest, RecordsAreLaidOutForOtherReaders) {
  NodeContent node;
  ASSERT_TRUE(EncodePropertyContext({Tagged(0x3001, PropertyValue::Unicode("Hi")),
                                     Tagged(0x0E07, PropertyValue::Int32(0x12345678)),
                                     Tagged(0x0057, PropertyValue::Boolean(true))},
                                    &node)
                  .ok());
  ASSERT_EQ(node.blocks.size(), 1u);
  ByteView b(node.blocks[0]);
  EXPECT_EQ(b[2], 0xEC);
  EXPECT_EQ(b[3], 0xBC);
  EXPECT_EQ(b.U32LE(4), 0x20u);  // the BTH header is the first allocation
  HeapReader heap;
  ASSERT_TRUE(heap.Open(node.blocks).ok());
  ByteView header, leaf, text;
  ASSERT_TRUE(heap.Read(0x20, &header).ok());
  EXPECT_EQ(header.ToBytes(), (Bytes{0xB5, 2, 6, 0, 0x40, 0, 0, 0}));
  ASSERT_TRUE(heap.Read(0x40, &leaf).ok());
  ASSERT_EQ(leaf.size(), 24u);
  EXPECT_EQ(leaf.Sub(0, 8).ToBytes(), (Bytes{0x57, 0, 0x0B, 0, 1, 0, 0, 0}));
  EXPECT_EQ(leaf.Sub(8, 8).ToBytes(), (Bytes{0x07, 0x0E, 0x03, 0, 0x78, 0x56, 0x34, 0x12}));
  EXPECT_EQ(leaf.U16LE(16), 0x3001);
  EXPECT_EQ(leaf.U16LE(18), kTypeUnicode);
  ASSERT_TRUE(heap.Read(leaf.U32LE(20), &text).ok());
  EXPECT_EQ(text.ToBytes(), (Bytes{'H', 0, 'i', 0}));
}

TEST(PropertyContextTest, ManyPropertiesSpanBlocksAndLevels) {
  std::vector<TaggedValue> props;
  for (uint16_t i = 0; i < 1500; ++i) {
    props.push_back(Tagged(uint16_t(0x8000 + i), PropertyValue::Binary(Pattern(40 + i % 90, i))));
  }
  NodeContent node;
  ASSERT_TRUE(EncodePropertyContext(props, &node).ok());
  EXPECT_GT(node.blocks.size(), 9u);  // past the first bitmap page
  std::vector<TaggedValue> got;
  ASSERT_TRUE(DecodePropertyContext(node, &got).ok());
  ExpectSame(props, got);
}

TEST(PropertyContextTest, BadInputIsRefused) {
  NodeContent node;
  const struct {
    const char* name;
    std::vector<TaggedValue> props;
  } cases[] = {
      {"same id twice",
       {Tagged(0x3001, PropertyValue::Int32(1)), Tagged(0x3001, PropertyValue::Unicode("a"))}},
      {"tag and value disagree", {{MakeTag(0x3001, kTypeUnicode), PropertyValue::Int32(1)}}},
      {"short fixed value", {Tagged(0x3001, Raw(kTypeInt32, {1, 2}))}},
      {"short 8-byte value", {Tagged(0x3001, Raw(kTypeSysTime, {1, 2}))}},
      {"short multi element", {Tagged(0x3001, Multi(kTypeInt32, {{1}}))}},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(EncodePropertyContext(c.props, &node).code(), Status::Code::kInvalidArgument)
        << c.name;
  }
}

TEST(PropertyContextTest, DamagedValuesAreSkippedAndReported) {
  NodeContent node;
  ASSERT_TRUE(EncodePropertyContext(
                  {Tagged(0x0E07, PropertyValue::Int32(7)),
                   Tagged(0x1000, PropertyValue::Binary(Pattern(kMaxHeapAllocation + 1, 1))),
                   Tagged(0x3001, PropertyValue::Unicode("name"))},
                  &node)
                  .ok());
  NodeContent lost_subnode = node;
  lost_subnode.subnodes.clear();
  std::vector<TaggedValue> got;
  EXPECT_EQ(DecodePropertyContext(lost_subnode, &got).code(), Status::Code::kCorruption);
  EXPECT_EQ(got.size(), 2u);  // the others still read

  // Point the string's record at an allocation that does not exist.
  NodeContent bad_hid = node;
  HeapReader heap;
  ASSERT_TRUE(heap.Open(bad_hid.blocks).ok());
  ByteView leaf;
  ASSERT_TRUE(heap.Read(0x40, &leaf).ok());
  const size_t leaf_at = size_t(leaf.data() - bad_hid.blocks[0].data());
  StoreU32LE(bad_hid.blocks[0].data() + leaf_at + 16 + 4, MakeHid(0, 0x700));
  EXPECT_EQ(DecodePropertyContext(bad_hid, &got).code(), Status::Code::kCorruption);
  EXPECT_EQ(got.size(), 2u);

  NodeContent table = node;
  table.blocks[0][3] = 0x7C;
  EXPECT_EQ(DecodePropertyContext(table, &got).code(), Status::Code::kCorruption);
}

// Any single damaged byte gives a result or a Corruption, never a crash or
// an out-of-bounds read (run under the sanitizer build).
TEST(PropertyContextTest, EverySingleByteDamageIsSurvived) {
  NodeContent node;
  ASSERT_TRUE(EncodePropertyContext({Tagged(0x0E07, PropertyValue::Int32(7)),
                                     Tagged(0x3001, PropertyValue::Unicode("name")),
                                     Tagged(0x3FF0, PropertyValue::MultiUnicode({"a", "bc"})),
                                     Tagged(0x3FEF, Multi(kTypeGuid, {Pattern(16, 1)}))},
                                    &node)
                  .ok());
  for (size_t at = 0; at < node.blocks[0].size(); ++at) {
    for (uint8_t v : {uint8_t(0x00), uint8_t(0xFF), uint8_t(0x41)}) {
      NodeContent damaged = node;
      damaged.blocks[0][at] = v;
      std::vector<TaggedValue> got;
      Status s = DecodePropertyContext(damaged, &got);
      EXPECT_TRUE(s.ok() || s.code() == Status::Code::kCorruption) << at;
    }
  }
}

}  // namespace
}  // namespace tarnwell::mapi::pst
