// Handler of search_lun.
#ifndef REMVOL_TASKS_SEARCH_LUN_H
#define REMVOL_TASKS_SEARCH_LUN_H

#include "tree/record.h"

namespace remvol {

// Publishes the LUNs of the requested target, in a tree of its own that is dumped into `output_file` when
// that is not null. Logs in for the time of the search when the target is not connected. Returns 0, or -1.
[[nodiscard]] int task_search_lun(const TargetEntry& request, const char* output_file);

}  // namespace remvol

#endif
