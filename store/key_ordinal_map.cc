#include "store/key_ordinal_map.h"

#include <algorithm>
#include <numeric>

namespace tarnwell::store {

uint64_t KeyOrdinalMap::Add(uint64_t key) {
  keys_.push_back(key);
  finished_ = false;
  return keys_.size();
}

std::vector<uint64_t> KeyOrdinalMap::Finish() {
  // Everything happens in place, so that a map of millions of keys never
  // needs much more than its final 12 bytes a key.
  const size_t n = keys_.size();
  constexpr uint32_t kVisited = 0x80000000u;
  constexpr size_t kWordBits = 64;
  // Walk positions sorted by (key, position): the first of equal keys is the
  // one that keeps an ordinal.
  ordinals_.resize(n);
  std::iota(ordinals_.begin(), ordinals_.end(), 0u);
  std::sort(ordinals_.begin(), ordinals_.end(), [this](uint32_t a, uint32_t b) {
    return keys_[a] != keys_[b] ? keys_[a] < keys_[b] : a < b;
  });
  std::vector<uint64_t> dropped_bits((n + kWordBits - 1) / kWordBits, 0);
  for (size_t i = 1; i < n; ++i) {
    if (keys_[ordinals_[i]] == keys_[ordinals_[i - 1]]) {
      dropped_bits[ordinals_[i] / kWordBits] |= uint64_t(1) << (ordinals_[i] % kWordBits);
    }
  }
  // Put the keys in sorted order by following the permutation's cycles; the
  // top bit marks entries already placed.
  for (size_t i = 0; i < n; ++i) {
    if (ordinals_[i] & kVisited) continue;
    const uint64_t first = keys_[i];
    size_t j = i;
    for (;;) {
      const size_t from = ordinals_[j] & ~kVisited;
      ordinals_[j] |= kVisited;
      if (from == i) {
        keys_[j] = first;
        break;
      }
      keys_[j] = keys_[from];
      j = from;
    }
  }
  // Ordinal of a kept walk position p = p + 1 - (dropped positions before p).
  std::vector<uint32_t> dropped_before(dropped_bits.size(), 0);
  for (size_t w = 1; w < dropped_bits.size(); ++w) {
    dropped_before[w] = dropped_before[w - 1] + uint32_t(__builtin_popcountll(dropped_bits[w - 1]));
  }
  auto is_dropped = [&](size_t p) { return (dropped_bits[p / kWordBits] >> (p % kWordBits)) & 1; };
  size_t kept = 0;
  for (size_t i = 0; i < n; ++i) {
    const size_t p = ordinals_[i] & ~kVisited;
    if (is_dropped(p)) continue;
    const uint64_t below =
        p % kWordBits ? dropped_bits[p / kWordBits] & ((uint64_t(1) << (p % kWordBits)) - 1) : 0;
    const uint32_t dropped = dropped_before[p / kWordBits] + uint32_t(__builtin_popcountll(below));
    keys_[kept] = keys_[i];
    ordinals_[kept] = uint32_t(p + 1 - dropped);
    ++kept;
  }
  std::vector<uint64_t> dropped_positions;
  for (size_t p = 0; p < n; ++p) {
    if (is_dropped(p)) dropped_positions.push_back(p + 1);
  }
  // No shrink_to_fit: it would copy both arrays, and spare capacity that
  // was never written costs no memory.
  keys_.resize(kept);
  ordinals_.resize(kept);
  finished_ = true;
  return dropped_positions;
}

std::optional<uint64_t> KeyOrdinalMap::Find(uint64_t key) const {
  auto it = std::lower_bound(keys_.begin(), keys_.end(), key);
  if (it == keys_.end() || *it != key) return std::nullopt;
  return ordinals_[size_t(it - keys_.begin())];
}

std::vector<uint64_t> KeyOrdinalMap::KeysByOrdinal() const {
  std::vector<uint64_t> out(keys_.size());
  for (size_t i = 0; i < keys_.size(); ++i) out[ordinals_[i] - 1] = keys_[i];
  return out;
}

}  // namespace tarnwell::store
