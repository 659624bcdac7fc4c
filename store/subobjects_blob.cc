#include "store/subobjects_blob.h"

namespace tarnwell::store {
namespace {

struct Encoding {
  uint8_t byte;
  size_t width;  // bytes that follow
};

constexpr Encoding kEncodings[] = {
    {0x10, 0}, {0x11, 1}, {0x12, 2},                        // int16
    {0x18, 0}, {0x19, 1}, {0x1A, 2}, {0x1B, 4},             // int32
    {0x20, 0}, {0x21, 1}, {0x22, 2}, {0x23, 4}, {0x24, 8},  // int64
};

const Encoding* Find(uint8_t byte) {
  for (const Encoding& e : kEncodings) {
    if (e.byte == byte) return &e;
  }
  return nullptr;
}

}  // namespace

std::vector<int64_t> ParseSubobjectIds(ByteView value, bool* complete) {
  std::vector<int64_t> ids;
  size_t pos = 0;
  while (pos < value.size()) {
    const Encoding* e = Find(value[pos]);
    if (e == nullptr || !value.Has(pos + 1, e->width)) break;
    uint64_t v = 0;
    for (size_t i = 0; i < e->width; ++i) v |= uint64_t(value[pos + 1 + i]) << (8 * i);
    const unsigned shift = unsigned(64 - 8 * e->width);
    ids.push_back(e->width == 0 ? 0 : shift == 0 ? int64_t(v) : int64_t(v << shift) >> shift);
    pos += 1 + e->width;
  }
  if (complete) *complete = pos == value.size();
  return ids;
}

}  // namespace tarnwell::store
