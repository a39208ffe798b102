// Target discovery: what a portal offers.
#ifndef REMVOL_ISCSI_DISCOVERY_H
#define REMVOL_ISCSI_DISCOVERY_H

#include "tree/record.h"

namespace remvol {

// Handler of search: publishes the names of the targets that the requested portal offers, in a tree of its
// own that is dumped into `output_file` when that is not null. Returns 0; 1 when no interface could be
// chosen, the discovery failed or its end could not be published; 2 when its output could not be read.
[[nodiscard]] int task_search(const TargetEntry& request, const char* output_file);

// Returns 1 when the portal offers the target; 0 when not, or the discovery failed; 2 when the target is
// logged in already; -1 on bad arguments or when no interface could be chosen.
[[nodiscard]] int Portal_search_target(const char* name, const char* address, int port);

}  // namespace remvol

#endif
