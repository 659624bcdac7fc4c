// BTree-on-heap layout.
//
//   BTHHEADER (8 bytes, a heap allocation):
//     0  1  bType       0xB5
//     1  1  cbKey       key size: 2, 4, 8 or 16
//     2  1  cbEnt       record data size: 1-32
//     3  1  bIdxLevels  intermediate levels above the leaves (0: the root is a leaf)
//     4  4  hidRoot     the root node; 0 for an empty tree
//   intermediate node (a heap allocation): entries of
//     cbKey  key           the first key below this entry
//     4      hidNextLevel  the node one level down
//   leaf node (a heap allocation): records of
//     cbKey  key
//     cbEnt  data
//
// Keys are little-endian integers and every node is sorted by them. A node
// is one allocation, so it holds what fits in kMaxHeapAllocation.
#include "mapi/pst/bth.h"

#include <algorithm>
#include <string>

namespace tarnwell::mapi::pst {
namespace {

constexpr uint8_t kBthSignature = 0xB5;
constexpr size_t kBthHeaderSize = 8;
constexpr size_t kHeaderKeySize = 1;
constexpr size_t kHeaderDataSize = 2;
constexpr size_t kHeaderLevels = 3;
constexpr size_t kHeaderRoot = 4;
constexpr size_t kChildHidSize = 4;
constexpr uint8_t kMaxDataSize = 32;

bool ValidKeySize(uint8_t k) { return k == 2 || k == 4 || k == 8 || k == 16; }

// Little-endian keys compare from their last byte.
bool KeyLess(const uint8_t* a, const uint8_t* b, size_t size) {
  for (size_t i = size; i-- > 0;) {
    if (a[i] != b[i]) return a[i] < b[i];
  }
  return false;
}

// Sizes of the nodes of each level, leaves first.
std::vector<std::vector<size_t>> NodeSizes(size_t count, size_t key_size, size_t data_size) {
  std::vector<std::vector<size_t>> levels;
  if (count == 0) return levels;
  size_t entries = count;
  size_t entry_size = key_size + data_size;
  do {
    const size_t per_node = kMaxHeapAllocation / entry_size;
    std::vector<size_t> sizes;
    for (size_t done = 0; done < entries; done += per_node) {
      sizes.push_back(std::min(per_node, entries - done) * entry_size);
    }
    entries = sizes.size();
    levels.push_back(std::move(sizes));
    entry_size = key_size + kChildHidSize;
  } while (entries > 1);
  return levels;
}

class TreeReader {
 public:
  TreeReader(const HeapReader& heap, size_t key_size, size_t data_size, std::vector<Bytes>* records)
      : heap_(heap), key_size_(key_size), data_size_(data_size), records_(records) {}

  void Walk(Hid node, int level) {
    // A well-formed tree visits each allocation once; more means a cycle or a
    // shared subtree.
    if (++visited_ > heap_.allocation_count()) {
      status_ = Status::Corruption("BTH visits more nodes than the heap has");
      return;
    }
    ByteView bytes;
    Status s = heap_.Read(node, &bytes);
    if (!s.ok()) {
      status_ = s;
      return;
    }
    const size_t entry = level == 0 ? key_size_ + data_size_ : key_size_ + kChildHidSize;
    if (bytes.size() % entry != 0) {
      status_ = Status::Corruption("BTH node size is not a whole number of entries");
    }
    for (size_t at = 0; at + entry <= bytes.size(); at += entry) {
      if (level == 0) {
        records_->push_back(bytes.Sub(at, entry).ToBytes());
      } else {
        Walk(bytes.U32LE(at + key_size_), level - 1);
      }
    }
  }

  const Status& status() const { return status_; }

 private:
  const HeapReader& heap_;
  size_t key_size_;
  size_t data_size_;
  std::vector<Bytes>* records_;
  size_t visited_ = 0;
  Status status_;
};

}  // namespace

Status BthWriter::Reserve(size_t count) {
  if (!ValidKeySize(key_size_) || data_size_ == 0 || data_size_ > kMaxDataSize) {
    return Status::InvalidArgument("unsupported BTH key or record size");
  }
  count_ = count;
  Status s = heap_->Reserve(kBthHeaderSize, &header_);
  const auto sizes = NodeSizes(count, key_size_, data_size_);
  levels_.assign(sizes.size(), {});
  // Root first, so a small tree reads header, root, then the leaves.
  for (size_t l = sizes.size(); s.ok() && l-- > 0;) {
    for (size_t size : sizes[l]) {
      Hid hid = 0;
      s = heap_->Reserve(size, &hid);
      if (!s.ok()) break;
      levels_[l].push_back(hid);
    }
  }
  return s;
}

Status BthWriter::Write(std::vector<Bytes> records) {
  const size_t record_size = size_t(key_size_) + data_size_;
  if (records.size() != count_) return Status::InvalidArgument("BTH record count changed");
  for (const Bytes& r : records) {
    if (r.size() != record_size) return Status::InvalidArgument("BTH record of the wrong size");
  }
  const size_t k = key_size_;
  std::sort(records.begin(), records.end(),
            [k](const Bytes& a, const Bytes& b) { return KeyLess(a.data(), b.data(), k); });
  for (size_t i = 1; i < records.size(); ++i) {
    if (!KeyLess(records[i - 1].data(), records[i].data(), k)) {
      return Status::InvalidArgument("duplicate BTH key");
    }
  }
  // Each level's entries: (first key below, content). Leaves first.
  std::vector<Bytes> entries = std::move(records);
  for (size_t l = 0; l < levels_.size(); ++l) {
    const size_t entry_size = l == 0 ? record_size : k + kChildHidSize;
    const size_t per_node = kMaxHeapAllocation / entry_size;
    std::vector<Bytes> parents;
    for (size_t n = 0; n < levels_[l].size(); ++n) {
      const size_t first = n * per_node;
      const size_t last = std::min(first + per_node, entries.size());
      Bytes node;
      for (size_t e = first; e < last; ++e)
        node.insert(node.end(), entries[e].begin(), entries[e].end());
      Status s = heap_->Fill(levels_[l][n], node);
      if (!s.ok()) return s;
      Bytes parent(entries[first].begin(), entries[first].begin() + k);
      parent.resize(k + kChildHidSize);
      StoreU32LE(parent.data() + k, levels_[l][n]);
      parents.push_back(std::move(parent));
    }
    entries = std::move(parents);
  }
  uint8_t header[kBthHeaderSize] = {kBthSignature, key_size_, data_size_, 0, 0, 0, 0, 0};
  if (!levels_.empty()) {
    header[kHeaderLevels] = uint8_t(levels_.size() - 1);
    StoreU32LE(header + kHeaderRoot, levels_.back()[0]);
  }
  return heap_->Fill(header_, ByteView(header, kBthHeaderSize));
}

Status ReadBth(const HeapReader& heap, Hid header, uint8_t* key_size, uint8_t* data_size,
               std::vector<Bytes>* records) {
  records->clear();
  ByteView bytes;
  Status s = heap.Read(header, &bytes);
  if (!s.ok()) return s;
  if (bytes.size() < kBthHeaderSize || bytes[0] != kBthSignature) {
    return Status::Corruption("not a BTH header");
  }
  *key_size = bytes[kHeaderKeySize];
  *data_size = bytes[kHeaderDataSize];
  const uint8_t levels = bytes[kHeaderLevels];
  const Hid root = bytes.U32LE(kHeaderRoot);
  if (!ValidKeySize(*key_size) || *data_size == 0 || *data_size > kMaxDataSize) {
    return Status::Corruption("BTH has an invalid key or record size");
  }
  if (levels > kMaxBthLevels) {
    return Status::Corruption("BTH is " + std::to_string(levels) + " levels deep");
  }
  if (root == 0) return Status::Ok();
  TreeReader reader(heap, *key_size, *data_size, records);
  reader.Walk(root, levels);
  return reader.status();
}

}  // namespace tarnwell::mapi::pst
