// Heap pages. Every block of a heap is one page:
//
//   page header, by block index:
//     block 0          HNHDR (12 bytes)
//       0   2  ibHnpm       offset of the page map in this block
//       2   1  bSig         0xEC
//       3   1  bClientSig   what is built on the heap (0x7C table, 0xBC properties, 0xB5 BTH)
//       4   4  hidUserRoot  the client's root allocation
//       8   4  rgbFillLevel fill levels of blocks 0-7, one nibble each, low nibble first
//     8, 136, 264, ...  HNBITMAPHDR (66 bytes)
//       0   2  ibHnpm
//       2  64  rgbFillLevel fill levels of this block and the 127 after it
//     any other block  HNPAGEHDR (2 bytes)
//       0   2  ibHnpm
//   allocations, back to back
//   page map (HNPAGEMAP) at ibHnpm, 2-byte aligned:
//       0   2  cAlloc
//       2   2  cFree
//       4  2*(cAlloc+1)  rgibAlloc: start of each allocation, then the end of the last
//
// A fill level says how much room a block has left (0: 3584 bytes or more,
// 0xF: under 8); readers ignore it, writers use it to find space quickly.
#include "mapi/pst/heap_on_node.h"

#include <algorithm>
#include <string>

#include "mapi/pst/node.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr uint8_t kHeapSignature = 0xEC;
constexpr size_t kHnhdrSize = 12;
constexpr size_t kHnpageHdrSize = 2;
constexpr size_t kHnbitmapHdrSize = 66;
constexpr size_t kHnhdrSignature = 2;
constexpr size_t kHnhdrClient = 3;
constexpr size_t kHnhdrUserRoot = 4;
constexpr size_t kHnhdrFillLevel = 8;
constexpr size_t kHnhdrFillBlocks = 8;
constexpr size_t kBitmapFillLevel = 2;
constexpr size_t kBitmapFirstBlock = 8;
constexpr size_t kBitmapInterval = 128;
constexpr size_t kPageMapFixed = 4;  // cAlloc, cFree
constexpr size_t kMaxAllocationsPerPage = 0x7FF;
constexpr uint32_t kHidTypeMask = 0x1F;

bool IsBitmapPage(size_t index) {
  return index >= kBitmapFirstBlock && (index - kBitmapFirstBlock) % kBitmapInterval == 0;
}

size_t HeaderSizeOf(size_t index) {
  if (index == 0) return kHnhdrSize;
  return IsBitmapPage(index) ? kHnbitmapHdrSize : kHnpageHdrSize;
}

uint8_t FillLevel(size_t free_bytes) {
  static constexpr size_t kThresholds[] = {3584, 2560, 2048, 1792, 1536, 1280, 1024, 768,
                                           512,  256,  128,  64,   32,   16,   8};
  uint8_t level = 0;
  for (size_t t : kThresholds) {
    if (free_bytes >= t) return level;
    ++level;
  }
  return level;  // 0xF
}

void PutFillLevel(uint8_t* levels, size_t slot, uint8_t level) {
  levels[slot / 2] |= uint8_t((slot % 2 == 0) ? level : (level << 4));
}

}  // namespace

HeapBuilder::HeapBuilder(uint8_t client_signature) : client_signature_(client_signature) {
  pages_.push_back(Page{HeaderSizeOf(0), {}, {}});
}

size_t HeapBuilder::PageSize(size_t header, size_t payload, size_t allocations) {
  size_t map_at = header + payload;
  map_at += map_at % 2;
  return map_at + kPageMapFixed + 2 * (allocations + 1);
}

bool HeapBuilder::Fits(const Page& page, size_t size) const {
  return page.ends.size() < kMaxAllocationsPerPage &&
         PageSize(page.header_size, page.payload.size() + size, page.ends.size() + 1) <=
             kMaxBlockData;
}

Status HeapBuilder::Reserve(size_t size, Hid* hid) {
  if (size > kMaxHeapAllocation) {
    return Status::InvalidArgument("heap allocation of " + std::to_string(size) +
                                   " bytes is too large");
  }
  size_t index = 0;
  while (index < pages_.size() && !Fits(pages_[index], size)) ++index;
  if (index == pages_.size()) {
    if (index > 0xFFFF) return Status::InvalidArgument("heap has too many pages");
    pages_.push_back(Page{HeaderSizeOf(index), {}, {}});
  }
  Page& page = pages_[index];
  page.payload.resize(page.payload.size() + size);
  page.ends.push_back(uint16_t(page.payload.size()));
  *hid = MakeHid(uint32_t(index), uint32_t(page.ends.size()));
  return Status::Ok();
}

Status HeapBuilder::Allocate(ByteView bytes, Hid* hid) {
  Status s = Reserve(bytes.size(), hid);
  if (!s.ok()) return s;
  return Fill(*hid, bytes);
}

Status HeapBuilder::Fill(Hid hid, ByteView bytes) {
  const uint32_t page_index = HidPage(hid);
  const uint32_t index = HidIndex(hid);
  if ((hid & kHidTypeMask) != 0 || page_index >= pages_.size() || index == 0 ||
      index > pages_[page_index].ends.size()) {
    return Status::InvalidArgument("no heap allocation " + std::to_string(hid));
  }
  Page& page = pages_[page_index];
  const size_t begin = index == 1 ? 0 : page.ends[index - 2];
  const size_t end = page.ends[index - 1];
  if (bytes.size() != end - begin) {
    return Status::InvalidArgument("heap allocation filled with the wrong size");
  }
  std::copy(bytes.data(), bytes.data() + bytes.size(), page.payload.begin() + begin);
  return Status::Ok();
}

std::vector<Bytes> HeapBuilder::Finish() const {
  std::vector<Bytes> blocks;
  blocks.reserve(pages_.size());
  for (size_t i = 0; i < pages_.size(); ++i) {
    const Page& page = pages_[i];
    const size_t size = PageSize(page.header_size, page.payload.size(), page.ends.size());
    const size_t map_at = size - kPageMapFixed - 2 * (page.ends.size() + 1);
    Bytes block(size, 0);
    StoreU16LE(block.data(), uint16_t(map_at));
    std::copy(page.payload.begin(), page.payload.end(), block.begin() + page.header_size);
    uint8_t* map = block.data() + map_at;
    StoreU16LE(map, uint16_t(page.ends.size()));
    StoreU16LE(map + 2, 0);
    StoreU16LE(map + kPageMapFixed, uint16_t(page.header_size));
    for (size_t a = 0; a < page.ends.size(); ++a) {
      StoreU16LE(map + kPageMapFixed + 2 * (a + 1), uint16_t(page.header_size + page.ends[a]));
    }
    blocks.push_back(std::move(block));
  }
  // Fill levels need every page's final size.
  Bytes& first = blocks[0];
  first[kHnhdrSignature] = kHeapSignature;
  first[kHnhdrClient] = client_signature_;
  StoreU32LE(first.data() + kHnhdrUserRoot, user_root_);
  for (size_t b = 0; b < blocks.size() && b < kHnhdrFillBlocks; ++b) {
    PutFillLevel(first.data() + kHnhdrFillLevel, b, FillLevel(kMaxBlockData - blocks[b].size()));
  }
  for (size_t i = kBitmapFirstBlock; i < blocks.size(); i += kBitmapInterval) {
    for (size_t b = i; b < blocks.size() && b < i + kBitmapInterval; ++b) {
      PutFillLevel(blocks[i].data() + kBitmapFillLevel, b - i,
                   FillLevel(kMaxBlockData - blocks[b].size()));
    }
  }
  return blocks;
}

Status HeapReader::Open(const std::vector<Bytes>& blocks) {
  pages_.clear();
  allocation_count_ = 0;
  if (blocks.empty()) return Status::Corruption("heap has no blocks");
  ByteView first(blocks[0]);
  if (first.size() < kHnhdrSize || first[kHnhdrSignature] != kHeapSignature) {
    return Status::Corruption("node data is not a heap");
  }
  client_signature_ = first[kHnhdrClient];
  user_root_ = first.U32LE(kHnhdrUserRoot);
  pages_.resize(blocks.size());
  for (size_t i = 0; i < blocks.size(); ++i) {
    Page& page = pages_[i];
    page.block = ByteView(blocks[i]);
    const size_t header = HeaderSizeOf(i);
    uint16_t map_at = 0, count = 0;
    if (page.block.size() < header || !page.block.ReadU16LE(0, &map_at) || map_at < header ||
        !page.block.ReadU16LE(map_at, &count) ||
        !page.block.Has(map_at + kPageMapFixed, 2 * (size_t(count) + 1))) {
      continue;
    }
    page.offsets.resize(size_t(count) + 1);
    bool ordered = true;
    for (size_t a = 0; a <= count; ++a) {
      page.offsets[a] = page.block.U16LE(map_at + kPageMapFixed + 2 * a);
      const uint16_t floor = a == 0 ? uint16_t(header) : page.offsets[a - 1];
      if (page.offsets[a] < floor || page.offsets[a] > map_at) ordered = false;
    }
    if (!ordered) {
      page.offsets.clear();
      continue;
    }
    page.valid = true;
    allocation_count_ += count;
  }
  return Status::Ok();
}

Status HeapReader::Read(Hid hid, ByteView* out) const {
  *out = ByteView();
  const uint32_t page_index = HidPage(hid);
  const uint32_t index = HidIndex(hid);
  if ((hid & kHidTypeMask) != 0 || index == 0 || page_index >= pages_.size()) {
    return Status::Corruption("heap id " + std::to_string(hid) + " names no allocation");
  }
  const Page& page = pages_[page_index];
  if (!page.valid) {
    return Status::Corruption("heap page " + std::to_string(page_index) + " is damaged");
  }
  if (index >= page.offsets.size()) {
    return Status::Corruption("heap id " + std::to_string(hid) + " names no allocation");
  }
  const uint16_t begin = page.offsets[index - 1];
  *out = page.block.Sub(begin, page.offsets[index] - begin);
  return Status::Ok();
}

Status HnidWriter::Store(ByteView bytes, uint32_t* hnid) {
  *hnid = 0;
  if (bytes.empty()) return Status::Ok();
  if (bytes.size() <= kMaxHeapAllocation) return heap_->Allocate(bytes, hnid);
  *hnid = AddSubnode(NodeContent::Split(bytes));
  return Status::Ok();
}

Nid HnidWriter::AddSubnode(std::vector<Bytes> blocks) {
  Nid nid = MakeNid(kNidTypeLtp, next_index_);
  while (node_->subnodes.count(nid) != 0) nid = MakeNid(kNidTypeLtp, ++next_index_);
  ++next_index_;
  node_->subnodes[nid].blocks = std::move(blocks);
  return nid;
}

Status ReadHnid(const HeapReader& heap, const NodeContent& node, uint32_t hnid, Bytes* out) {
  out->clear();
  if (hnid == 0) return Status::Ok();
  if (NidTypeOf(hnid) == kNidTypeHid) {
    ByteView bytes;
    Status s = heap.Read(hnid, &bytes);
    *out = bytes.ToBytes();
    return s;
  }
  auto it = node.subnodes.find(hnid);
  if (it == node.subnodes.end()) {
    return Status::Corruption("value subnode " + std::to_string(hnid) + " is missing");
  }
  *out = it->second.Joined();
  return Status::Ok();
}

}  // namespace tarnwell::mapi::pst
