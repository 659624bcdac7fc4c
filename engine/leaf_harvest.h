// The leaf-page harvest: reads every listed leaf page and follows its chain
// of next-page links, so that every leaf record of every tree in the file
// lands in the record vector, whether or not its tree is still reachable.
//
// Each page is harvested at most once (the visited-page set), whether it is
// reached from its own list entry or along a chain. Pages without a next
// page are harvested too: a tree whose data fits in one leaf (a small
// catalog) has no chain to be reached through, and the last page of a chain
// whose earlier pages are damaged would be lost.
#ifndef TARNWELL_ENGINE_LEAF_HARVEST_H_
#define TARNWELL_ENGINE_LEAF_HARVEST_H_

#include <cstdint>
#include <set>
#include <vector>

#include "base/progress_sink.h"
#include "engine/leaf_page_scan.h"
#include "engine/page_file.h"
#include "engine/record_ref.h"

namespace tarnwell::engine {

class LeafHarvest {
 public:
  LeafHarvest(const PageFile& file, ProgressSink& progress, RunningFlag& running,
              std::vector<RecordRef>* records)
      : file_(file), progress_(progress), running_(running), records_(records) {}

  // Harvests the pages of `list`. Always 1; a stop by the user ends it early
  // with what was found.
  int CollectLeafPageRecords(const std::vector<LeafPageEntry>& list);

  // Harvests the chain starting at page n. False when the user stopped.
  bool FollowLeafChain(uint32_t page_number);

  // Keys are not copied by default: the catalog needs none, and millions of
  // references must stay small.
  void set_want_keys(bool want) { want_keys_ = want; }
  // Keeps only the records of pages that belong to this tree (0: all). The
  // catalog harvest of a large mailbox database would otherwise hold a
  // reference for every message in memory.
  void set_object_filter(uint32_t object_id) { object_filter_ = object_id; }

 private:
  void PushNodes(const Page& page, uint32_t page_number);

  const PageFile& file_;
  ProgressSink& progress_;
  RunningFlag& running_;
  std::vector<RecordRef>* records_;
  std::set<uint32_t> visited_;
  bool want_keys_ = false;
  uint32_t object_filter_ = 0;
};

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_LEAF_HARVEST_H_
