#include "testing/encoders/lz4_value_encoder.h"

#include <gtest/gtest.h>

#include <string>

#include "engine/compress/compress_test_support.h"
#include "engine/compress/compressed_value.h"

namespace tarnwell::forge {
namespace {

using engine::DecodeCompressedValue;
using engine::DecodedValue;
using engine::DecodeStatus;

Bytes Sample(size_t n, bool repetitive) {
  if (!repetitive) return engine::Noise(n, 12345);
  Bytes out(n);
  for (size_t i = 0; i < n; ++i) out[i] = static_cast<uint8_t>("mailbox "[i % 8]);
  return out;
}

TEST(Lz4ValueEncoderTest, RoundTripsAndRejectsDamage) {
  const struct {
    size_t size;
    bool repetitive;
  } kCases[] = {{0, false}, {1, false}, {13, true}, {1000, false}, {65535, true}};
  for (const auto& c : kCases) {
    SCOPED_TRACE("size " + std::to_string(c.size));
    const Bytes plain = Sample(c.size, c.repetitive);
    const Bytes value = EncodeEseLz4Value(plain);
    ASSERT_GE(value.size(), 4u);
    EXPECT_EQ(value[0], 0x38);
    const DecodedValue v = DecodeCompressedValue(value);
    ASSERT_TRUE(v.ok()) << v.message;
    EXPECT_TRUE(v.bytes == plain);
    if (c.repetitive && c.size > 1000) {
      EXPECT_LT(value.size(), c.size / 10);
    }
    // A cut block never passes for the whole value.
    const Bytes cut(value.begin(), value.end() - 1);
    EXPECT_EQ(DecodeCompressedValue(cut).status, DecodeStatus::kMalformed);
  }
  EXPECT_TRUE(EncodeEseLz4Value(Bytes(65536, 'x')).empty());
}

}  // namespace
}  // namespace tarnwell::forge
