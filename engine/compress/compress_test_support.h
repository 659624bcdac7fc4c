// Test inputs shared by the decoder tests here and the encoder tests in
// testing/encoders: streams written out in hex, and deterministic noise.
#ifndef TARNWELL_ENGINE_COMPRESS_COMPRESS_TEST_SUPPORT_H_
#define TARNWELL_ENGINE_COMPRESS_COMPRESS_TEST_SUPPORT_H_

#include <cstdint>
#include <string>

#include "base/byte_view.h"

namespace tarnwell::engine {

// "3f000000 6162" -> bytes; spaces only group the digits for the reader.
inline Bytes FromHex(const std::string& hex) {
  Bytes out;
  for (size_t i = 0; i + 1 < hex.size();) {
    if (hex[i] == ' ') {
      ++i;
      continue;
    }
    out.push_back(static_cast<uint8_t>(std::stoi(hex.substr(i, 2), nullptr, 16)));
    i += 2;
  }
  return out;
}

// Bytes no dictionary coder can shrink: a fixed linear congruential sequence.
inline Bytes Noise(size_t n, uint32_t seed) {
  Bytes out(n);
  for (auto& b : out) {
    seed = seed * 1664525u + 1013904223u;
    b = static_cast<uint8_t>(seed >> 24);
  }
  return out;
}

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_COMPRESS_COMPRESS_TEST_SUPPORT_H_
