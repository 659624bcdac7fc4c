#include "mapi/pst/node.h"

#include <algorithm>

namespace tarnwell::mapi::pst {

Bytes NodeContent::Joined() const {
  Bytes out;
  for (const Bytes& b : blocks) out.insert(out.end(), b.begin(), b.end());
  return out;
}

std::vector<Bytes> NodeContent::Split(ByteView stream) {
  std::vector<Bytes> out;
  for (size_t at = 0; at < stream.size(); at += kMaxBlockData) {
    size_t n = std::min(kMaxBlockData, stream.size() - at);
    out.emplace_back(stream.data() + at, stream.data() + at + n);
  }
  return out;
}

}  // namespace tarnwell::mapi::pst
