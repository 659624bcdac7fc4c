#include "store/distribution_list.h"

#include <gtest/gtest.h>

#include "base/text.h"
#include "store/store_test_support.h"

namespace tarnwell::store {
namespace {

using test_support::Append;
using test_support::Cat;
using test_support::Wide;

// A member column: offset field, `gap` filler bytes, then the members.
Bytes MemberValue(const std::vector<ListMember>& members, size_t gap = 0) {
  Bytes out(kMemberListOffsetSize + gap, 0xEE);
  StoreU32LE(out.data(), uint32_t(kMemberListOffsetSize + gap));
  for (const ListMember& m : members) {
    out.insert(out.end(), kMemberHeaderSize, 0x5A);
    Append(&out, Cat({Wide(m.display_name), Wide(m.address_type), Wide(m.email_address)}));
  }
  return out;
}

const ListMember kAnna = {"Anna Berg", "SMTP", "anna@example.org"};
const ListMember kJose = {"Jos\xC3\xA9", "EX", "/o=Org/cn=jose"};

// Members as "name|type|address" texts, for comparisons.
std::vector<std::string> Flat(const std::vector<ListMember>& members) {
  std::vector<std::string> out;
  for (const ListMember& m : members) {
    out.push_back(m.display_name + "|" + m.address_type + "|" + m.email_address);
  }
  return out;
}

TEST(DistributionListTest, ParsesMembersInOrder) {
  EXPECT_EQ(Flat(ParseDistributionList(MemberValue({kAnna, kJose}))), Flat({kAnna, kJose}));
  // The offset field, not the position after it, says where members start.
  EXPECT_EQ(Flat(ParseDistributionList(MemberValue({kJose}, 6))), Flat({kJose}));
  EXPECT_EQ(Flat(ParseDistributionList(MemberValue({{"", "", ""}}))), Flat({{"", "", ""}}));
}

TEST(DistributionListTest, CutValuesKeepOnlyWholeMembers) {
  const Bytes whole = MemberValue({kAnna, kJose});
  const size_t first_end = MemberValue({kAnna}).size();
  struct Case {
    const char* what;
    size_t length;
    size_t members;
  } cases[] = {
      {"empty", 0, 0},
      {"offset field cut", 3, 0},
      {"offset only", kMemberListOffsetSize, 0},
      {"first header cut", kMemberListOffsetSize + kMemberHeaderSize - 1, 0},
      {"first name without terminator", kMemberListOffsetSize + kMemberHeaderSize + 4, 0},
      {"last terminator of first member cut in half", first_end - 1, 0},
      {"first member whole", first_end, 1},
      {"second header cut", first_end + 10, 1},
      {"second address cut", whole.size() - 2, 1},
      {"odd byte past the end", whole.size() - 1, 1},
      {"whole", whole.size(), 2},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    ASSERT_LE(c.length, whole.size());
    const std::vector<ListMember> got = ParseDistributionList(ByteView(whole.data(), c.length));
    ASSERT_EQ(got.size(), c.members);
    if (c.members > 0) {
      EXPECT_EQ(Flat({got[0]}), Flat({kAnna}));
    }
  }
}

TEST(DistributionListTest, OffsetsOutsideTheValue) {
  Bytes value = MemberValue({kAnna});
  for (uint32_t offset :
       {uint32_t(value.size()), uint32_t(value.size() + 1), 0xFFFFFFF0u, 0xFFFFFFFFu}) {
    StoreU32LE(value.data(), offset);
    EXPECT_TRUE(ParseDistributionList(value).empty()) << offset;
  }
  // An offset inside the offset field itself reads its own bytes as header:
  // no crash, and no member found, since the strings that follow are shifted.
  StoreU32LE(value.data(), 0);
  EXPECT_LE(ParseDistributionList(value).size(), 1u);
}

TEST(DistributionListTest, TextHasBomTabsAndCrLf) {
  const Bytes text = DistributionListText({kAnna, kJose});
  ASSERT_GE(text.size(), 2u);
  EXPECT_EQ(text[0], 0xFF);
  EXPECT_EQ(text[1], 0xFE);
  EXPECT_EQ(Utf16LEToUtf8(ByteView(text).From(2)),
            "Name:Anna Berg\tType:SMTP\tEmailID:anna@example.org\r\n"
            "Name:Jos\xC3\xA9\tType:EX\tEmailID:/o=Org/cn=jose\r\n");
  EXPECT_EQ(DistributionListText({}), (Bytes{0xFF, 0xFE}));
}

}  // namespace
}  // namespace tarnwell::store
