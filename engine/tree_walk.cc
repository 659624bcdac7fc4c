#include "engine/tree_walk.h"

namespace tarnwell::engine {

uint64_t RecordFilePosition(const PageFile& file, uint32_t page_number, uint16_t node_offset) {
  const int64_t p = int64_t(file.page_size());
  return uint64_t((int64_t(page_number) - 1) * p + file.adjustment() + int64_t(file.base_offset()) +
                  node_offset);
}

int TreeWalker::Walk(uint32_t root_page, const LeafVisitor& visit) {
  visited_.clear();
  bool stop = false;
  return WalkPage(root_page, 0, visit, &stop);
}

int TreeWalker::WalkPage(uint32_t page_number, int depth, const LeafVisitor& visit, bool* stop) {
  if (depth > kMaxTreeDepth) {
    ++stats_.too_deep;
    return 0;
  }
  if (!visited_.insert(page_number).second) {
    ++stats_.revisited_pages;
    return 0;
  }
  Page page;
  if (!file_.ReadPage(page_number, &page).ok()) return 0;
  ++stats_.pages;
  const bool leaf = page.is_leaf();
  if (!leaf && (page.header().previous != 0 || page.header().next != 0)) {
    progress_.Message(kWrongPreviousPageMessage);
    return 0;
  }
  const auto& nodes = page.nodes();
  for (size_t tag = 1; tag < nodes.size(); ++tag) {
    if (!running_.load()) {
      *stop = true;
      return 1;
    }
    RecordRef ref;
    switch (DecodeNode(page, uint16_t(tag), &ref, want_keys_)) {
      case NodeDecode::kOk:
        break;
      case NodeDecode::kDeleted:
        continue;
      case NodeDecode::kDamaged:
        ++stats_.damaged_nodes;
        continue;
      case NodeDecode::kRootPrefix:
      case NodeDecode::kPrefixTooLong:
        // The page's keys cannot be trusted: give up on this subtree.
        ++stats_.damaged_nodes;
        return 0;
    }
    ref.page_number = page_number;
    ref.object_id = page.header().object_id;
    ref.file_position = RecordFilePosition(file_, page_number, nodes[tag].offset);
    if (leaf) {
      ref.kind = LeafKind(page.flags());
      if (!visit(page, ref)) {
        *stop = true;
        return 1;
      }
      continue;
    }
    ref.kind = kKindBranch;
    const uint32_t child = BranchChild(page, ref);
    if (child != 0) {
      // A failed child does not stop its parent: its siblings may be sound.
      WalkPage(child, depth + 1, visit, stop);
      if (*stop) return 1;
    }
  }
  return 1;
}

}  // namespace tarnwell::engine
