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
  const size_t n = keys_.size();
  // Walk positions sorted by (key, position): the first of equal keys is the
  // one that keeps an ordinal.
  ordinals_.resize(n);
  std::iota(ordinals_.begin(), ordinals_.end(), 0u);
  std::stable_sort(ordinals_.begin(), ordinals_.end(),
                   [this](uint32_t a, uint32_t b) { return keys_[a] < keys_[b]; });
  std::vector<bool> dropped(n, false);
  for (size_t i = 1; i < n; ++i) {
    if (keys_[ordinals_[i]] == keys_[ordinals_[i - 1]]) dropped[ordinals_[i]] = true;
  }
  // Ordinal of a kept position = 1 + kept positions before it.
  std::vector<uint64_t> dropped_positions;
  std::vector<uint32_t> rank(n, 0);
  uint32_t next = 0;
  for (size_t p = 0; p < n; ++p) {
    if (dropped[p]) {
      dropped_positions.push_back(p + 1);
    } else {
      rank[p] = ++next;
    }
  }
  // Sorted keys with their ordinals, repeats removed.
  std::vector<uint64_t> sorted_keys;
  std::vector<uint32_t> sorted_ordinals;
  sorted_keys.reserve(next);
  sorted_ordinals.reserve(next);
  for (uint32_t p : ordinals_) {
    if (dropped[p]) continue;
    sorted_keys.push_back(keys_[p]);
    sorted_ordinals.push_back(rank[p]);
  }
  keys_ = std::move(sorted_keys);
  ordinals_ = std::move(sorted_ordinals);
  keys_.shrink_to_fit();
  ordinals_.shrink_to_fit();
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
