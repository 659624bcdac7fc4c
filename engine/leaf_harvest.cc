#include "engine/leaf_harvest.h"

#include "engine/tree_walk.h"

namespace tarnwell::engine {
namespace {

constexpr int kPermille = 1000;
constexpr size_t kProgressEvery = 100;

bool BranchWithSiblings(const Page& page) {
  return !page.is_leaf() && (page.header().previous != 0 || page.header().next != 0);
}

}  // namespace

void LeafHarvest::PushNodes(const Page& page, uint32_t page_number) {
  if (object_filter_ != 0 && page.header().object_id != object_filter_) return;
  const auto& nodes = page.nodes();
  for (size_t tag = 1; tag < nodes.size(); ++tag) {
    if (!running_.load()) return;
    RecordRef ref;
    if (DecodeNode(page, uint16_t(tag), &ref, want_keys_) != NodeDecode::kOk) continue;
    ref.page_number = page_number;
    ref.kind = LeafKind(page.flags());
    ref.file_position = RecordFilePosition(file_, page_number, nodes[tag].offset);
    ref.object_id = page.header().object_id;
    records_->push_back(std::move(ref));
  }
}

int LeafHarvest::CollectLeafPageRecords(const std::vector<LeafPageEntry>& list) {
  progress_.Range(0, kPermille);
  progress_.Position(0);
  for (size_t i = 0; i < list.size(); ++i) {
    if (!running_.load()) break;
    if (i % kProgressEvery == 0) progress_.Position(int(i * kPermille / list.size()));
    const LeafPageEntry& entry = list[i];
    const int64_t number = file_.PageNumberAt(entry.file_position);
    if (number <= 0 || uint64_t(number) > file_.total_pages()) continue;
    if (!visited_.insert(uint32_t(number)).second) continue;
    Page page;
    if (!file_.ReadPage(uint64_t(number), &page).ok()) continue;
    if (BranchWithSiblings(page)) {
      progress_.Message(kWrongPreviousPageMessage);
      continue;
    }
    PushNodes(page, uint32_t(number));
    if (!running_.load()) break;
    if (!FollowLeafChain(page.header().next)) break;
  }
  visited_.clear();
  running_.store(true);
  return 1;
}

bool LeafHarvest::FollowLeafChain(uint32_t page_number) {
  if (!running_.load()) return false;
  uint32_t n = page_number;
  while (n != 0 && n < file_.total_pages()) {
    if (!running_.load()) return true;
    Page page;
    if (!file_.ReadPage(n, &page).ok()) return true;
    if (page.header().next >= file_.total_pages()) return true;
    if (!visited_.insert(n).second) return true;
    if (page.is_index() || page.is_long_value()) return true;
    if (BranchWithSiblings(page)) {
      progress_.Message(kWrongPreviousPageMessage);
      return true;
    }
    if (page.nodes().empty()) {
      progress_.Message(kPageValueNullMessage);
      return true;
    }
    PushNodes(page, n);
    n = page.header().next;
  }
  return true;
}

}  // namespace tarnwell::engine
