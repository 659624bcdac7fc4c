// KeyOrdinalMap: the MessageMap and AttachmentMap. Maps a 64-bit record key
// to its ordinal (from 1, dense, in the order the table's records were met;
// a key met again gets no ordinal).
//
// Built for millions of messages: keys go into a flat vector while the table
// is walked, and Finish() sorts them in place and drops repeats, leaving 12
// bytes per key (8-byte key, 4-byte ordinal) and a binary search per lookup.
#ifndef TARNWELL_STORE_KEY_ORDINAL_MAP_H_
#define TARNWELL_STORE_KEY_ORDINAL_MAP_H_

#include <cstdint>
#include <optional>
#include <vector>

namespace tarnwell::store {

class KeyOrdinalMap {
 public:
  // Records the next key in walk order; returns its walk position (from 1).
  uint64_t Add(uint64_t key);
  // Sorts the keys and drops every key met before. Returns the walk
  // positions (from 1, ascending) that were dropped, so that a location file
  // written per walk position can be compacted to ordinals.
  std::vector<uint64_t> Finish();

  // The ordinal of a key; nothing when unknown. Only after Finish().
  std::optional<uint64_t> Find(uint64_t key) const;
  size_t size() const { return keys_.size(); }
  bool finished() const { return finished_; }
  // The keys in ordinal order (for listing and snapshots).
  std::vector<uint64_t> KeysByOrdinal() const;

 private:
  std::vector<uint64_t> keys_;      // walk order, then key order
  std::vector<uint32_t> ordinals_;  // parallel to keys_ after Finish()
  bool finished_ = false;
};

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_KEY_ORDINAL_MAP_H_
