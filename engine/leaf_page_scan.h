// The whole-file page scan: lists every leaf data page of the file by reading
// each page's header, whether or not any tree still reaches the page.
//
// A page is taken when its flags are non-zero, mark a leaf, and mark neither
// an index nor a long-value tree. Nothing else is checked: free pages and
// pages of deleted tables enter the list too; later stages filter by content.
#ifndef TARNWELL_ENGINE_LEAF_PAGE_SCAN_H_
#define TARNWELL_ENGINE_LEAF_PAGE_SCAN_H_

#include <cstdint>
#include <vector>

#include "base/progress_sink.h"
#include "engine/page_file.h"

namespace tarnwell::engine {

struct LeafPageEntry {
  int64_t file_position = 0;  // adjustment and base offset included
  uint32_t next = 0;
  uint32_t previous = 0;
};

// True for the flags of a leaf page of a data tree.
bool IsLeafDataPage(uint32_t flags);

// Scans from `skip` bytes after the database start to the end of the file.
// Positions before page 1 (the header blocks, or bytes a negative adjustment
// puts before the file) are not pages and are stepped over. When `running`
// drops, the scan raises it again and returns what it found so far.
std::vector<LeafPageEntry> ScanLeafPages(const PageFile& file, uint64_t skip, RunningFlag& running,
                                         ProgressSink& progress);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_LEAF_PAGE_SCAN_H_
