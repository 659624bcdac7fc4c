// ByteView: a non-owning window on bytes whose every read is bounds-checked.
//
// Decoders in this program never trust a file: a read that would cross the end
// of the view fails (returns false, or the caller's fallback) instead of
// touching memory it does not own. Integers are little-endian unless the
// method name says BE.
#ifndef TARNWELL_BASE_BYTE_VIEW_H_
#define TARNWELL_BASE_BYTE_VIEW_H_

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

namespace tarnwell {

using Bytes = std::vector<uint8_t>;

// Unchecked loads; callers use them only after checking the range.
inline uint16_t LoadU16LE(const uint8_t* p) { return uint16_t(p[0] | (p[1] << 8)); }
inline uint32_t LoadU32LE(const uint8_t* p) {
  return uint32_t(p[0]) | (uint32_t(p[1]) << 8) | (uint32_t(p[2]) << 16) | (uint32_t(p[3]) << 24);
}
inline uint64_t LoadU64LE(const uint8_t* p) {
  return uint64_t(LoadU32LE(p)) | (uint64_t(LoadU32LE(p + 4)) << 32);
}
inline uint16_t LoadU16BE(const uint8_t* p) { return uint16_t((p[0] << 8) | p[1]); }
inline uint32_t LoadU32BE(const uint8_t* p) {
  return (uint32_t(p[0]) << 24) | (uint32_t(p[1]) << 16) | (uint32_t(p[2]) << 8) | uint32_t(p[3]);
}
inline uint64_t LoadU64BE(const uint8_t* p) {
  return (uint64_t(LoadU32BE(p)) << 32) | uint64_t(LoadU32BE(p + 4));
}

inline void StoreU16LE(uint8_t* p, uint16_t v) {
  p[0] = uint8_t(v);
  p[1] = uint8_t(v >> 8);
}
inline void StoreU32LE(uint8_t* p, uint32_t v) {
  for (int i = 0; i < 4; ++i) p[i] = uint8_t(v >> (8 * i));
}
inline void StoreU64LE(uint8_t* p, uint64_t v) {
  for (int i = 0; i < 8; ++i) p[i] = uint8_t(v >> (8 * i));
}
inline void StoreU32BE(uint8_t* p, uint32_t v) {
  for (int i = 0; i < 4; ++i) p[i] = uint8_t(v >> (8 * (3 - i)));
}

class ByteView {
 public:
  ByteView() = default;
  ByteView(const uint8_t* data, size_t size) : data_(data), size_(data ? size : 0) {}
  ByteView(const Bytes& bytes) : data_(bytes.data()), size_(bytes.size()) {}  // NOLINT

  const uint8_t* data() const { return data_; }
  size_t size() const { return size_; }
  bool empty() const { return size_ == 0; }
  uint8_t operator[](size_t i) const { return data_[i]; }  // caller checks i < size()

  // True when [offset, offset + width) lies inside the view; overflow-safe.
  bool Has(size_t offset, size_t width) const { return offset <= size_ && width <= size_ - offset; }

  // A sub-view; empty when the range does not lie wholly inside this view.
  ByteView Sub(size_t offset, size_t length) const {
    return Has(offset, length) ? ByteView(data_ + offset, length) : ByteView();
  }
  // The bytes from offset to the end; empty past the end.
  ByteView From(size_t offset) const {
    return offset <= size_ ? ByteView(data_ + offset, size_ - offset) : ByteView();
  }

  bool ReadU8(size_t offset, uint8_t* out) const {
    if (!Has(offset, 1)) return false;
    *out = data_[offset];
    return true;
  }
  bool ReadU16LE(size_t offset, uint16_t* out) const {
    if (!Has(offset, 2)) return false;
    *out = LoadU16LE(data_ + offset);
    return true;
  }
  bool ReadU32LE(size_t offset, uint32_t* out) const {
    if (!Has(offset, 4)) return false;
    *out = LoadU32LE(data_ + offset);
    return true;
  }
  bool ReadU64LE(size_t offset, uint64_t* out) const {
    if (!Has(offset, 8)) return false;
    *out = LoadU64LE(data_ + offset);
    return true;
  }
  bool ReadU32BE(size_t offset, uint32_t* out) const {
    if (!Has(offset, 4)) return false;
    *out = LoadU32BE(data_ + offset);
    return true;
  }

  // Reads with a fallback for out-of-range offsets; for fields whose absence
  // and zero mean the same thing.
  uint8_t U8(size_t offset, uint8_t fallback = 0) const {
    return Has(offset, 1) ? data_[offset] : fallback;
  }
  uint16_t U16LE(size_t offset, uint16_t fallback = 0) const {
    return Has(offset, 2) ? LoadU16LE(data_ + offset) : fallback;
  }
  uint32_t U32LE(size_t offset, uint32_t fallback = 0) const {
    return Has(offset, 4) ? LoadU32LE(data_ + offset) : fallback;
  }
  uint64_t U64LE(size_t offset, uint64_t fallback = 0) const {
    return Has(offset, 8) ? LoadU64LE(data_ + offset) : fallback;
  }

  Bytes ToBytes() const { return Bytes(data_, data_ + size_); }
  std::string ToString() const { return std::string(reinterpret_cast<const char*>(data_), size_); }

 private:
  const uint8_t* data_ = nullptr;
  size_t size_ = 0;
};

// Lower-case hexadecimal of the bytes, two digits each.
std::string ToHex(ByteView bytes);

}  // namespace tarnwell

#endif  // TARNWELL_BASE_BYTE_VIEW_H_
