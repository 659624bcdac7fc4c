#include "engine/page_checksum.h"

#include <gtest/gtest.h>

#include <cctype>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <ostream>
#include <random>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::engine {
namespace {

namespace fs = std::filesystem;

constexpr size_t kHeaderPageSizeOffset = 236;
constexpr size_t kFlagBit = kPageFlagsOffset * 8 + 13;  // flag 0x2000

Bytes ReadFile(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

// The fixtures keep some databases gzip-compressed; they are inflated in memory
// so the read-only originals are never touched.
Bytes Gunzip(const fs::path& path) {
  Bytes out;
  const std::string command = "gzip -dc '" + path.string() + "'";
  FILE* pipe = popen(command.c_str(), "r");
  if (pipe == nullptr) return out;
  uint8_t buffer[1 << 16];
  size_t n;
  while ((n = fread(buffer, 1, sizeof buffer, pipe)) > 0) out.insert(out.end(), buffer, buffer + n);
  if (pclose(pipe) != 0) out.clear();
  return out;
}

void FlipBit(uint8_t* page, size_t bit) { page[bit / 8] ^= uint8_t(1u << (bit % 8)); }

// ---------------------------------------------------------------------------
// Real databases written by Windows.

struct RealFile {
  const char* path;  // below the external fixtures folder
  size_t page_size;
  ChecksumScheme scheme;
  size_t checked_pages;  // non-empty pages whose checksum must hold
  uint32_t junk_from;    // first page number of a tail that is not ESE's; 0 if none
};

const RealFile kRealFiles[] = {
    {"dissect-esedb/basic.edb.gz", 4096, ChecksumScheme::kXorEcc, 23, 0},
    {"dissect-esedb/binary.edb.gz", 4096, ChecksumScheme::kXorEcc, 25, 0},
    {"dissect-esedb/default.edb.gz", 4096, ChecksumScheme::kXorEcc, 23, 0},
    {"dissect-esedb/index.edb.gz", 4096, ChecksumScheme::kXorEcc, 47, 0},
    {"dissect-esedb/multi.edb.gz", 4096, ChecksumScheme::kXorEcc, 34, 0},
    {"dissect-esedb/text.edb.gz", 4096, ChecksumScheme::kXorEcc, 32, 0},
    {"dissect-esedb/Current.mdb.gz", 4096, ChecksumScheme::kXorEcc, 102, 0},
    // The last 16 blocks of this file hold UTF-16 text and memory-like data
    // that ESE never wrote as pages; they must fail, not verify by accident.
    {"dissect-esedb/SRUDB.dat.gz", 4096, ChecksumScheme::kXorEcc, 79, 143},
    {"dissect-esedb/large.edb.gz", 32768, ChecksumScheme::kLargePage, 381, 0},
    {"go-ese/qmgr.db", 16384, ChecksumScheme::kLargePage, 43, 0},
    {"plaso/Catalog1.edb", 4096, ChecksumScheme::kXorEcc, 209, 0},
    {"plaso/{C519A76A-D9B5-4F85-B667-5FAC08E0E1B4}.mdb", 4096, ChecksumScheme::kXorEcc, 49, 0},
    {"strozfriedberg-ese_parser/test.edb", 4096, ChecksumScheme::kXorEcc, 45, 0},
    {"strozfriedberg-ese_parser/decompress_test.edb", 8192, ChecksumScheme::kXorEcc, 18, 0},
};

void PrintTo(const RealFile& rf, std::ostream* os) { *os << rf.path; }

class RealFileChecksumTest : public ::testing::TestWithParam<RealFile> {};

TEST_P(RealFileChecksumTest, EveryPageVerifiesAndEccNamesFlippedBits) {
  const RealFile& rf = GetParam();
  const fs::path folder = TARNWELL_EXTERNAL_FIXTURES;
  if (!fs::is_directory(folder)) {
    GTEST_SKIP() << "external fixtures folder " << folder << " is absent";
  }
  const fs::path path = folder / rf.path;
  if (!fs::exists(path)) GTEST_SKIP() << path << " is absent from the fixtures folder";
  const Bytes file = path.extension() == ".gz" ? Gunzip(path) : ReadFile(path);
  const size_t ps = rf.page_size;
  ASSERT_GE(file.size(), 3 * ps) << path;
  ASSERT_EQ(file.size() % ps, 0u);
  ASSERT_EQ(LoadU32LE(file.data() + kHeaderPageSizeOffset), ps);

  // Header and shadow.
  EXPECT_EQ(LoadU32LE(file.data()), ComputeHeaderChecksum(file.data(), ps));
  EXPECT_EQ(LoadU32LE(file.data() + ps), ComputeHeaderChecksum(file.data() + ps, ps));

  std::vector<uint32_t> verified;
  size_t junk = 0;
  for (size_t block = 2; block < file.size() / ps; ++block) {
    const uint8_t* page = file.data() + block * ps;
    const uint32_t pgno = static_cast<uint32_t>(block - 1);
    if (IsEmptyPage(page, ps)) continue;
    if (rf.junk_from != 0 && pgno >= rf.junk_from) {
      EXPECT_FALSE(VerifyPageChecksum(page, ps, pgno)) << "junk page " << pgno;
      ++junk;
      continue;
    }
    EXPECT_TRUE(VerifyPageChecksum(page, ps, pgno)) << "page " << pgno;
    EXPECT_FALSE(VerifyPageChecksum(page, ps, pgno + 1)) << "page " << pgno << " as its neighbour";
    EXPECT_EQ(SchemeForPage(ps, LoadU32LE(page + kPageFlagsOffset)), rf.scheme) << "page " << pgno;
    verified.push_back(pgno);
  }
  EXPECT_EQ(verified.size(), rf.checked_pages);
  if (rf.junk_from != 0) {
    EXPECT_GT(junk, 0u);
  }

  // The ECC that Windows stored names single flipped bits: in the checksum
  // words, in the header, at block edges and at the end of the page.
  ASSERT_FALSE(verified.empty());
  const std::vector<size_t> bits = {
      0, 33, 63, 64, 300, 8 * ps / 4 - 1, 8 * ps / 4, 8 * ps / 2 + 77, 8 * ps - 1};
  for (uint32_t pgno : {verified.front(), verified.back()}) {
    Bytes page(file.begin() + (pgno + 1) * ps, file.begin() + (pgno + 2) * ps);
    for (size_t bit : bits) {
      FlipBit(page.data(), bit);
      EXPECT_FALSE(VerifyPageChecksum(page.data(), ps, pgno)) << "page " << pgno << " bit " << bit;
      EXPECT_EQ(LocateFlippedBit(page.data(), ps, pgno), bit) << "page " << pgno;
      FlipBit(page.data(), bit);
    }
  }
}

std::string RealFileName(const ::testing::TestParamInfo<RealFile>& info) {
  std::string name = fs::path(info.param.path).filename().string();
  for (char& c : name) {
    if (!isalnum(static_cast<unsigned char>(c))) c = '_';
  }
  return name;
}

INSTANTIATE_TEST_SUITE_P(External, RealFileChecksumTest, ::testing::ValuesIn(kRealFiles),
                         RealFileName);

// ---------------------------------------------------------------------------
// Stamp, verify and damage every scheme.

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

class SchemeTest : public ::testing::TestWithParam<SchemeCase> {
 protected:
  // A page of pseudo-random bytes with the case's flags, stamped.
  Bytes StampedPage(uint32_t pgno) const {
    const SchemeCase& c = GetParam();
    std::mt19937 rng(static_cast<uint32_t>(c.page_size + c.flags));
    Bytes page(c.page_size);
    for (uint8_t& b : page) b = static_cast<uint8_t>(rng());
    StoreU32LE(page.data() + kPageFlagsOffset, c.flags);
    StampPageChecksum(page.data(), c.page_size, pgno);
    return page;
  }
};

TEST_P(SchemeTest, StampedPageVerifiesOnlyUnderItsOwnNumber) {
  const SchemeCase& c = GetParam();
  const Bytes page = StampedPage(1234);
  EXPECT_EQ(SchemeForPage(c.page_size, c.flags), c.scheme);
  EXPECT_TRUE(VerifyPageChecksum(page.data(), c.page_size, 1234));
  EXPECT_FALSE(VerifyPageChecksum(page.data(), c.page_size, 1235));
  EXPECT_FALSE(VerifyPageChecksum(page.data(), c.page_size, 1234 ^ 0x10000));
  // Stamping is a pure function of the contents.
  Bytes again = page;
  StampPageChecksum(again.data(), c.page_size, 1234);
  EXPECT_EQ(again, page);
}

TEST_P(SchemeTest, EverySingleBitFlipFailsAndEccNamesIt) {
  const SchemeCase& c = GetParam();
  const uint32_t pgno = 77;
  Bytes page = StampedPage(pgno);
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
