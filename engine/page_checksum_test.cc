// Stamping, verifying and damaging pages of every checksum scheme. Real
// databases written by Windows are checked page by page in real_files_test.cc.
#include "engine/page_checksum.h"

#include <gtest/gtest.h>

#include <optional>
#include <ostream>
#include <random>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::engine {
namespace {

constexpr size_t kFlagBit = kPageFlagsOffset * 8 + 13;  // flag 0x2000

void FlipBit(uint8_t* page, size_t bit) { page[bit / 8] ^= uint8_t(1u << (bit % 8)); }

struct SchemeCase {
  size_t page_size;
  uint32_t flags;
  ChecksumScheme scheme;
};

const SchemeCase kSchemeCases[] = {
    {4096, 0x0003, ChecksumScheme::kXor},        {8192, 0x0003, ChecksumScheme::kXor},
    {2048, 0x2803, ChecksumScheme::kXorEcc},     {4096, 0x2803, ChecksumScheme::kXorEcc},
    {8192, 0x2803, ChecksumScheme::kXorEcc},     {16384, 0x2803, ChecksumScheme::kLargePage},
    {32768, 0x2803, ChecksumScheme::kLargePage},
};

void PrintTo(const SchemeCase& c, std::ostream* os) {
  *os << c.page_size << "-byte page, flags 0x" << std::hex << c.flags;
}

class SchemeTest : public ::testing::TestWithParam<SchemeCase> {};

TEST_P(SchemeTest, StampedPageVerifiesOnlyAsItselfAndEccNamesFlippedBits) {
  const SchemeCase& c = GetParam();
  EXPECT_EQ(SchemeForPage(c.page_size, c.flags), c.scheme);
  // A page of pseudo-random bytes with the case's flags, stamped.
  const uint32_t pgno = 1234;
  std::mt19937 rng(static_cast<uint32_t>(c.page_size + c.flags));
  Bytes page(c.page_size);
  for (uint8_t& b : page) b = static_cast<uint8_t>(rng());
  StoreU32LE(page.data() + kPageFlagsOffset, c.flags);
  StampPageChecksum(page.data(), c.page_size, pgno);
  EXPECT_TRUE(VerifyPageChecksum(page.data(), c.page_size, pgno));
  EXPECT_FALSE(VerifyPageChecksum(page.data(), c.page_size, pgno + 1));
  EXPECT_FALSE(VerifyPageChecksum(page.data(), c.page_size, pgno ^ 0x10000));
  // Stamping is a pure function of the contents.
  Bytes again = page;
  StampPageChecksum(again.data(), c.page_size, pgno);
  EXPECT_EQ(again, page);

  const size_t nbits = 8 * c.page_size;
  std::vector<size_t> bits = {0, 31, 32, 63, 64, kFlagBit, 40 * 8, 63 * 8 + 7, 64 * 8, nbits - 1};
  for (size_t block = 1; block < 4; ++block) {
    bits.push_back(block * nbits / 4 - 1);
    bits.push_back(block * nbits / 4);
    bits.push_back(block * nbits / 4 + 63);
  }
  for (size_t bit = 5; bit < nbits; bit += nbits / 509) bits.push_back(bit);

  for (size_t bit : bits) {
    FlipBit(page.data(), bit);
    EXPECT_FALSE(VerifyPageChecksum(page.data(), c.page_size, pgno)) << "bit " << bit;
    const std::optional<size_t> located = LocateFlippedBit(page.data(), c.page_size, pgno);
    if (c.scheme == ChecksumScheme::kXor) {
      EXPECT_EQ(located, std::nullopt) << "bit " << bit;
    } else if (c.scheme == ChecksumScheme::kXorEcc && bit == kFlagBit) {
      // Without the flag the page reads as plain XOR, which cannot locate.
      EXPECT_EQ(located, std::nullopt);
    } else {
      EXPECT_EQ(located, bit);
    }
    FlipBit(page.data(), bit);
  }
  EXPECT_TRUE(VerifyPageChecksum(page.data(), c.page_size, pgno));

  // Two flips are beyond repair, in one block or in two.
  for (size_t second : {size_t{800}, nbits / 2 + 3, nbits - 9}) {
    FlipBit(page.data(), 700);
    FlipBit(page.data(), second);
    EXPECT_FALSE(VerifyPageChecksum(page.data(), c.page_size, pgno));
    EXPECT_EQ(LocateFlippedBit(page.data(), c.page_size, pgno), std::nullopt) << second;
    FlipBit(page.data(), 700);
    FlipBit(page.data(), second);
  }
}

std::string SchemeCaseName(const ::testing::TestParamInfo<SchemeCase>& info) {
  static const char* const kNames[] = {"Xor", "XorEcc", "Large"};
  return kNames[static_cast<int>(info.param.scheme)] + std::to_string(info.param.page_size);
}

INSTANTIATE_TEST_SUITE_P(AllSchemes, SchemeTest, ::testing::ValuesIn(kSchemeCases), SchemeCaseName);

TEST(PageChecksumTest, EmptyPagesAndOddSizes) {
  for (size_t size : {size_t{4096}, size_t{32768}}) {
    Bytes zero(size);
    EXPECT_TRUE(VerifyPageChecksum(zero.data(), size, 9));
    StampPageChecksum(zero.data(), size, 9);  // unused pages stay zero, as ESE leaves them
    EXPECT_TRUE(IsEmptyPage(zero.data(), size));
  }
  for (size_t size : {size_t{0}, size_t{1024}, size_t{4000}, size_t{12288}, size_t{65536}}) {
    Bytes page(size, 0x5A);
    StampPageChecksum(page.data(), size, 3);
    EXPECT_EQ(page, Bytes(size, 0x5A)) << size;
    EXPECT_FALSE(VerifyPageChecksum(page.data(), size, 3)) << size;
    EXPECT_EQ(LocateFlippedBit(page.data(), size, 3), std::nullopt) << size;
  }
  EXPECT_FALSE(VerifyPageChecksum(nullptr, 4096, 1));
}

}  // namespace
}  // namespace tarnwell::engine
