// Depth-first walks of a B+ tree from its root, in tag order, so that leaf
// records arrive in key order.
//
// The walk bounds itself: a page already visited in this walk is not entered
// again (a damaged branch that points back up, or to itself) and the depth is
// limited, so a damaged file ends the walk with what was found.
#ifndef TARNWELL_ENGINE_TREE_WALK_H_
#define TARNWELL_ENGINE_TREE_WALK_H_

#include <cstdint>
#include <functional>
#include <unordered_set>

#include "base/progress_sink.h"
#include "engine/page_file.h"
#include "engine/record_ref.h"

namespace tarnwell::engine {

// Deeper than any real tree: ESE trees of billions of records are 5-6 deep.
constexpr int kMaxTreeDepth = 32;

inline constexpr char kWrongPreviousPageMessage[] = "Error..Wrong Previous Page No.";
inline constexpr char kPageValueNullMessage[] = "Error.. Page value null.";

// The record-vector position of a node: two page sizes before its true byte
// position, as record references have always stored it.
uint64_t RecordFilePosition(const PageFile& file, uint32_t page_number, uint16_t node_offset);

// What a walk met besides records.
struct WalkStats {
  uint64_t pages = 0;
  uint64_t damaged_nodes = 0;
  uint64_t revisited_pages = 0;  // cycles cut short
  uint64_t too_deep = 0;
};

class TreeWalker {
 public:
  // Called for every non-deleted leaf node (kinds 'r', 'l' and 'i'); `page`
  // is the leaf holding it. Returning false stops the walk.
  using LeafVisitor = std::function<bool(const Page& page, const RecordRef& ref)>;

  TreeWalker(const PageFile& file, ProgressSink& progress, RunningFlag& running)
      : file_(file), progress_(progress), running_(running) {}

  // Keys are copied into the references only when asked for.
  void set_want_keys(bool want) { want_keys_ = want; }

  // 1 when the root page was walked, 0 when it failed (unreadable, a branch
  // page with siblings, or a node that cannot be decoded on the root).
  int Walk(uint32_t root_page, const LeafVisitor& visit);

  const WalkStats& stats() const { return stats_; }

 private:
  // 1 walked, 0 failed; `*stop` set when the visitor or the user stopped.
  int WalkPage(uint32_t page_number, int depth, const LeafVisitor& visit, bool* stop);

  const PageFile& file_;
  ProgressSink& progress_;
  RunningFlag& running_;
  bool want_keys_ = true;
  std::unordered_set<uint32_t> visited_;
  WalkStats stats_;
};

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_TREE_WALK_H_
