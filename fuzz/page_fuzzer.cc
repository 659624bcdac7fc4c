// Page and node decoding of both families. The first input byte picks the
// page size (and with it the family); the rest is the page, cut or padded
// with zeros to that size.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "engine/page.h"
#include "engine/record_ref.h"
#include "engine/version.h"

namespace {

using namespace tarnwell;
using namespace tarnwell::engine;

constexpr uint32_t kPageSizes[] = {4096, 8192, 32768};

// Reads every byte of a view so that the sanitizer sees a view reaching past
// its buffer even when nothing else would touch the bytes.
uint32_t Touch(ByteView v) {
  uint32_t sum = 0;
  for (size_t i = 0; i < v.size(); ++i) sum += v[i];
  return sum;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1) return 0;
  const uint32_t page_size = kPageSizes[data[0] % std::size(kPageSizes)];
  const PageFamily family = FamilyForPageSize(page_size);
  Bytes bytes(page_size, 0);
  const size_t body = size - 1 < page_size ? size - 1 : page_size;
  std::copy(data + 1, data + 1 + body, bytes.begin());

  Page page(std::move(bytes), family);
  volatile uint32_t sink = 0;
  const auto& nodes = page.nodes();
  size_t damaged = 0;
  for (size_t tag = 0; tag < nodes.size(); ++tag) {
    const NodeEntry& node = nodes[tag];
    if (node.damaged) {
      ++damaged;
      if (!node.bytes.empty()) std::abort();
      continue;
    }
    if (node.bytes.size() != node.size) std::abort();
    sink = sink + Touch(node.bytes);
    for (bool want_key : {true, false}) {
      RecordRef ref;
      const NodeDecode d = DecodeNode(page, uint16_t(tag), &ref, want_key);
      if (d != NodeDecode::kOk) continue;
      if (want_key && ref.key.size() != ref.key_length) std::abort();
      if (size_t(ref.data_offset) + ref.data_size != node.size) std::abort();
      ByteView data_part = NodeData(page, ref);
      if (data_part.size() != ref.data_size) std::abort();
      sink = sink + Touch(data_part) + BranchChild(page, ref) + uint8_t(LeafKind(page.flags()));
    }
  }
  if (damaged != page.damaged_nodes()) std::abort();
  // Tags past the table are refused, not read.
  RecordRef ref;
  if (DecodeNode(page, uint16_t(nodes.size()), &ref) != NodeDecode::kDamaged) std::abort();
  return 0;
}
