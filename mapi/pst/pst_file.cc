#include "mapi/pst/pst_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <map>

#include "mapi/pst/allocation_map.h"
#include "mapi/pst/block_io.h"
#include "mapi/pst/btree_page.h"
#include "mapi/pst/pst_header.h"
#include "mapi/pst/subnode_tree.h"

namespace tarnwell::mapi::pst {
namespace {

constexpr uint64_t kFirstBid = 4;
constexpr uint64_t kFirstPageBid = 1;
// A block referenced once: one count for the index, one for its referrer.
constexpr uint16_t kSingleRefCount = 2;
constexpr uint16_t kUnreferencedCount = 1;
constexpr size_t kWriteBufferSize = 1 << 20;
constexpr uint32_t kMaxNidIndex = (1u << (32 - kNidTypeBits)) - 1;
// Slack in a read's block budget beyond one visit of every indexed block.
constexpr uint64_t kBudgetSlack = 16;

Status ErrnoStatus(const std::string& what, const std::string& path) {
  return Status::IoError(what + " " + path + ": " + std::strerror(errno));
}

class PstFileImpl final : public PstFile,
                          public BlockStore,
                          public PageIo,
                          public AllocationMap::Io {
 public:
  PstFileImpl(std::string path, int fd, bool writable)
      : path_(std::move(path)), fd_(fd), writable_(writable), amap_(this) {}
  ~PstFileImpl() override {
    // Deliberately no flush: without Commit the file keeps its last state.
    ::close(fd_);
  }

  Status InitNew(CryptMethod crypt);
  Status Load();

  // PstFile.
  bool writable() const override { return writable_; }
  CryptMethod crypt_method() const override { return crypt_; }
  bool HasNode(Nid nid) const override { return nodes_.count(nid) != 0; }
  std::vector<NodeEntry> ListNodes() const override;
  Status ReadNode(Nid nid, NodeContent* out) const override;
  Nid AllocateNid(uint8_t type) override;
  Status WriteNode(Nid nid, Nid parent, const NodeContent& content) override;
  Status DeleteNode(Nid nid) override;
  Status Commit() override;
  uint64_t file_size() const override { return std::max(physical_size_, amap_.file_end()); }

  // BlockStore, PageIo, AllocationMap::Io.
  Status FindBlock(uint64_t bid, BlockRef* out) const override;
  Status ReadAt(uint64_t ib, size_t size, uint8_t* out) const override;
  uint64_t NewBid(bool internal) override;
  Status AppendBlock(uint64_t bid, ByteView data) override;
  Status AllocatePage(uint64_t* ib, uint64_t* bid) override;
  Status WriteAt(uint64_t ib, ByteView data) override;
  Status Extend(uint64_t size) override;

 private:
  Status CheckWritable() const;
  Status FlushBuffer() const;
  Status WriteDirect(uint64_t ib, ByteView data) const;
  Status Sync() const;
  void AddBlock(const BbtEntry& e);
  BbtEntry* LookupBlock(uint64_t bid);
  void ReleaseBlocks(uint64_t bid_data, uint64_t bid_sub);
  ReadBudget MakeBudget() const;

  std::string path_;
  int fd_;
  bool writable_;
  bool failed_ = false;  // a write failed; the session cannot commit any more
  CryptMethod crypt_ = CryptMethod::kNone;
  PstHeader header_;
  std::map<Nid, NbtEntry> nodes_;
  std::vector<BbtEntry> blocks_;  // sorted by bid
  AllocationMap amap_;
  mutable uint64_t physical_size_ = 0;
  // Appends are gathered into one contiguous write.
  mutable uint64_t buffer_at_ = 0;
  mutable Bytes buffer_;
};

Status PstFileImpl::CheckWritable() const {
  if (!writable_) return Status::InvalidArgument("PST file " + path_ + " is open read-only");
  if (failed_) return Status::IoError("PST file " + path_ + ": an earlier write failed");
  return Status::Ok();
}

Status PstFileImpl::WriteDirect(uint64_t ib, ByteView data) const {
  size_t done = 0;
  while (done < data.size()) {
    ssize_t n = ::pwrite(fd_, data.data() + done, data.size() - done, off_t(ib + done));
    if (n < 0) {
      if (errno == EINTR) continue;
      return ErrnoStatus("cannot write", path_);
    }
    done += size_t(n);
  }
  physical_size_ = std::max(physical_size_, ib + data.size());
  return Status::Ok();
}

Status PstFileImpl::FlushBuffer() const {
  if (buffer_.empty()) return Status::Ok();
  Status s = WriteDirect(buffer_at_, buffer_);
  buffer_.clear();
  return s;
}

Status PstFileImpl::Sync() const {
  Status s = FlushBuffer();
  if (!s.ok()) return s;
  if (::fsync(fd_) != 0) return ErrnoStatus("cannot sync", path_);
  return Status::Ok();
}

Status PstFileImpl::WriteAt(uint64_t ib, ByteView data) {
  if (!buffer_.empty() && ib == buffer_at_ + buffer_.size() &&
      buffer_.size() + data.size() <= kWriteBufferSize) {
    buffer_.insert(buffer_.end(), data.data(), data.data() + data.size());
    return Status::Ok();
  }
  Status s = FlushBuffer();
  if (!s.ok()) return s;
  if (data.size() >= kWriteBufferSize) return WriteDirect(ib, data);
  buffer_at_ = ib;
  buffer_.assign(data.data(), data.data() + data.size());
  return Status::Ok();
}

Status PstFileImpl::ReadAt(uint64_t ib, size_t size, uint8_t* out) const {
  if (!buffer_.empty() && ib < buffer_at_ + buffer_.size() && buffer_at_ < ib + size) {
    Status s = FlushBuffer();
    if (!s.ok()) return s;
  }
  size_t done = 0;
  while (done < size) {
    ssize_t n = ::pread(fd_, out + done, size - done, off_t(ib + done));
    if (n < 0) {
      if (errno == EINTR) continue;
      return ErrnoStatus("cannot read", path_);
    }
    if (n == 0) return Status::Corruption("PST file " + path_ + " ends early");
    done += size_t(n);
  }
  return Status::Ok();
}

Status PstFileImpl::Extend(uint64_t size) {
  if (size <= physical_size_) return Status::Ok();
  Status s = FlushBuffer();
  if (!s.ok()) return s;
  if (::ftruncate(fd_, off_t(size)) != 0) return ErrnoStatus("cannot grow", path_);
  physical_size_ = size;
  return Status::Ok();
}

uint64_t PstFileImpl::NewBid(bool internal) {
  uint64_t bid = header_.bid_next_block;
  header_.bid_next_block += kBidIncrement;
  return internal ? bid | kBidInternalFlag : bid;
}

void PstFileImpl::AddBlock(const BbtEntry& e) {
  if (blocks_.empty() || blocks_.back().bid < e.bid) {
    blocks_.push_back(e);
    return;
  }
  auto it = std::lower_bound(blocks_.begin(), blocks_.end(), e.bid,
                             [](const BbtEntry& a, uint64_t b) { return a.bid < b; });
  if (it != blocks_.end() && it->bid == e.bid) {
    *it = e;
  } else {
    blocks_.insert(it, e);
  }
}

BbtEntry* PstFileImpl::LookupBlock(uint64_t bid) {
  uint64_t key = bid & ~kBidReservedBit;
  auto it = std::lower_bound(
      blocks_.begin(), blocks_.end(), key,
      [](const BbtEntry& a, uint64_t b) { return (a.bid & ~kBidReservedBit) < b; });
  if (it == blocks_.end() || (it->bid & ~kBidReservedBit) != key) return nullptr;
  return &*it;
}

Status PstFileImpl::FindBlock(uint64_t bid, BlockRef* out) const {
  BbtEntry* e = const_cast<PstFileImpl*>(this)->LookupBlock(bid);
  if (e == nullptr) {
    char buf[64];
    snprintf(buf, sizeof buf, "PST: block 0x%llx is not in the block index",
             static_cast<unsigned long long>(bid));
    return Status::Corruption(buf);
  }
  out->ib = e->ib;
  out->cb = e->cb;
  return Status::Ok();
}

Status PstFileImpl::AppendBlock(uint64_t bid, ByteView data) {
  uint64_t ib;
  Status s = amap_.Allocate(BlockDiskSize(data.size()), kBlockAlignment, &ib);
  if (!s.ok()) return s;
  s = WriteAt(ib, EncodeBlock(data, bid, ib));
  if (!s.ok()) return s;
  AddBlock({bid, ib, uint16_t(data.size()), kSingleRefCount});
  return Status::Ok();
}

Status PstFileImpl::AllocatePage(uint64_t* ib, uint64_t* bid) {
  Status s = amap_.Allocate(kPageSize, kPageSize, ib);
  if (!s.ok()) return s;
  *bid = header_.bid_next_page++;
  return Status::Ok();
}

ReadBudget PstFileImpl::MakeBudget() const {
  return {uint64_t(blocks_.size()) + kBudgetSlack, file_size()};
}

std::vector<NodeEntry> PstFileImpl::ListNodes() const {
  std::vector<NodeEntry> out;
  out.reserve(nodes_.size());
  for (const auto& [nid, e] : nodes_) out.push_back({nid, e.parent});
  return out;
}

Status PstFileImpl::ReadNode(Nid nid, NodeContent* out) const {
  auto it = nodes_.find(nid);
  if (it == nodes_.end()) return Status::NotFound("PST: no node " + std::to_string(nid));
  ReadBudget budget = MakeBudget();
  return ReadNodeContent(*this, it->second.bid_data, it->second.bid_sub, &budget, out);
}

Nid PstFileImpl::AllocateNid(uint8_t type) {
  if (type >= kNidCounterCount) return 0;
  uint32_t index = std::max<uint32_t>(header_.nid_counters[type], 1);
  while (index <= kMaxNidIndex && nodes_.count(MakeNid(type, index)) != 0) ++index;
  if (index > kMaxNidIndex) return 0;
  header_.nid_counters[type] = index + 1;
  return MakeNid(type, index);
}

void PstFileImpl::ReleaseBlocks(uint64_t bid_data, uint64_t bid_sub) {
  std::vector<uint64_t> bids;
  ReadBudget budget = MakeBudget();
  // A damaged old node keeps its counts; leaking space is harmless.
  if (!CollectNodeBids(*this, bid_data, bid_sub, &budget, &bids).ok()) return;
  for (uint64_t bid : bids) {
    BbtEntry* e = LookupBlock(bid);
    if (e != nullptr && e->cref > kUnreferencedCount) --e->cref;
  }
}

Status PstFileImpl::WriteNode(Nid nid, Nid parent, const NodeContent& content) {
  Status s = CheckWritable();
  if (!s.ok()) return s;
  if (nid == 0) return Status::InvalidArgument("PST: node id 0");
  NbtEntry e{nid, 0, 0, parent};
  s = WriteNodeContent(*this, content, &e.bid_data, &e.bid_sub);
  if (!s.ok()) {
    if (s.code() == Status::Code::kIoError) failed_ = true;
    return s;
  }
  auto it = nodes_.find(nid);
  if (it != nodes_.end()) ReleaseBlocks(it->second.bid_data, it->second.bid_sub);
  nodes_[nid] = e;
  uint8_t type = NidTypeOf(nid);
  if (NidIndexOf(nid) >= header_.nid_counters[type]) {
    header_.nid_counters[type] = NidIndexOf(nid) + 1;
  }
  return Status::Ok();
}

Status PstFileImpl::DeleteNode(Nid nid) {
  Status s = CheckWritable();
  if (!s.ok()) return s;
  auto it = nodes_.find(nid);
  if (it == nodes_.end()) return Status::NotFound("PST: no node " + std::to_string(nid));
  ReleaseBlocks(it->second.bid_data, it->second.bid_sub);
  nodes_.erase(it);
  return Status::Ok();
}

Status PstFileImpl::Commit() {
  Status s = CheckWritable();
  if (!s.ok()) return s;
  s = [&]() -> Status {
    std::vector<NbtEntry> nbt;
    nbt.reserve(nodes_.size());
    for (const auto& [nid, e] : nodes_) nbt.push_back(e);
    Bref nbt_root, bbt_root;
    Status st = WriteNbt(*this, nbt, &nbt_root);
    if (!st.ok()) return st;
    st = WriteBbt(*this, blocks_, &bbt_root);
    if (!st.ok()) return st;
    // Everything the new header will point at is on disk before the maps
    // and the header change.
    st = Sync();
    if (!st.ok()) return st;
    st = amap_.Flush();
    if (!st.ok()) return st;
    st = WriteAt(kDListOffset, EncodeEmptyDList(header_.bid_next_page));
    if (!st.ok()) return st;
    st = Sync();
    if (!st.ok()) return st;
    header_.root.nbt = nbt_root;
    header_.root.bbt = bbt_root;
    header_.root.file_eof = amap_.file_end();
    header_.root.amap_last = amap_.last_amap();
    header_.root.amap_free = amap_.amap_free();
    if (!amap_.valid()) {
      header_.root.amap_valid = kAMapInvalid;
    } else if (header_.root.amap_valid == kAMapInvalid) {
      header_.root.amap_valid = kAMapValid2;
    }
    ++header_.unique;
    st = WriteDirect(0, EncodeHeader(header_));
    if (!st.ok()) return st;
    return Sync();
  }();
  if (!s.ok() && s.code() == Status::Code::kIoError) failed_ = true;
  return s;
}

Status PstFileImpl::InitNew(CryptMethod crypt) {
  crypt_ = crypt;
  header_ = PstHeader();
  header_.bid_next_block = kFirstBid;
  header_.bid_next_page = kFirstPageBid;
  header_.unique = uint32_t(std::chrono::system_clock::now().time_since_epoch().count());
  header_.nid_counters = InitialNidCounters();
  // Outlook fills the obsolete free maps with 0xFF.
  header_.free_map.fill(0xFF);
  header_.free_page_map.fill(0xFF);
  header_.crypt_method = uint8_t(crypt);
  header_.root.amap_valid = kAMapValid2;
  Status s = amap_.InitNew();
  if (!s.ok()) return s;
  return Commit();
}

Status PstFileImpl::Load() {
  struct stat st;
  if (::fstat(fd_, &st) != 0) return ErrnoStatus("cannot stat", path_);
  physical_size_ = uint64_t(st.st_size);
  uint8_t raw[kHeaderSize];
  if (physical_size_ < kHeaderSize)
    return Status::Corruption(path_ + " is too short for a PST file");
  Status s = ReadAt(0, kHeaderSize, raw);
  if (!s.ok()) return s;
  s = DecodeHeader(ByteView(raw, kHeaderSize), &header_);
  if (!s.ok())
    return Status(s.code() == Status::Code::kNotSupported
                      ? Status::NotSupported(path_ + ": " + s.message())
                      : Status::Corruption(path_ + ": " + s.message()));
  if (header_.crypt_method > uint8_t(CryptMethod::kCyclic)) {
    return Status::NotSupported(path_ + ": unknown PST encryption method");
  }
  crypt_ = CryptMethod(header_.crypt_method);
  std::vector<NbtEntry> nbt;
  s = ReadNbt(*this, header_.root.nbt, &nbt);
  if (!s.ok()) return Status::Corruption(path_ + ": node index: " + s.message());
  s = ReadBbt(*this, header_.root.bbt, &blocks_);
  if (!s.ok()) return Status::Corruption(path_ + ": block index: " + s.message());
  std::stable_sort(blocks_.begin(), blocks_.end(),
                   [](const BbtEntry& a, const BbtEntry& b) { return a.bid < b.bid; });
  blocks_.erase(std::unique(blocks_.begin(), blocks_.end(),
                            [](const BbtEntry& a, const BbtEntry& b) { return a.bid == b.bid; }),
                blocks_.end());
  for (const NbtEntry& e : nbt) nodes_.emplace(e.nid, e);
  if (writable_) {
    // Never hand out an id the file already uses, whatever the header says.
    uint64_t after =
        blocks_.empty() ? kFirstBid : (blocks_.back().bid & ~(kBidIncrement - 1)) + kBidIncrement;
    header_.bid_next_block =
        std::max(header_.bid_next_block & ~(kBidIncrement - 1), std::max(after, kFirstBid));
    header_.bid_next_page = std::max<uint64_t>(header_.bid_next_page, kFirstPageBid);
    s = amap_.InitExisting(header_.root);
    if (!s.ok()) return s;
  }
  return Status::Ok();
}

}  // namespace

Status PstFile::Create(const std::string& path, CryptMethod crypt, std::unique_ptr<PstFile>* out) {
  if (crypt > CryptMethod::kCyclic) return Status::InvalidArgument("PST: unknown encryption");
  int fd = ::open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
  if (fd < 0) return ErrnoStatus("cannot create", path);
  auto file = std::make_unique<PstFileImpl>(path, fd, true);
  Status s = file->InitNew(crypt);
  if (!s.ok()) return s;
  *out = std::move(file);
  return Status::Ok();
}

Status PstFile::Open(const std::string& path, bool writable, std::unique_ptr<PstFile>* out) {
  int fd = ::open(path.c_str(), (writable ? O_RDWR : O_RDONLY) | O_CLOEXEC);
  if (fd < 0) return ErrnoStatus("cannot open", path);
  auto file = std::make_unique<PstFileImpl>(path, fd, writable);
  Status s = file->Load();
  if (!s.ok()) return s;
  *out = std::move(file);
  return Status::Ok();
}

}  // namespace tarnwell::mapi::pst
