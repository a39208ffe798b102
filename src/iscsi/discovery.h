// Target discovery: what a portal offers.
#ifndef REMVOL_ISCSI_DISCOVERY_H
#define REMVOL_ISCSI_DISCOVERY_H

#include "tree/record.h"

namespace remvol {

enum PortalSearch : int {
  kSearched = 0,
  kSearchFailed = 1,  // no interface could be chosen, the discovery failed or its end could not be published
  kSearchUnread = 2,  // the output of the discovery could not be read
};

// Handler of search: publishes the names of the targets that the requested portal offers, in a tree of its
// own that is dumped into `output_file` when that is not null. Returns a PortalSearch.
[[nodiscard]] int task_search(const TargetEntry& request, const char* output_file);

enum PortalOffer : int {
  kNotOffered = 0,  // or the discovery failed
  kOffered = 1,
  kLoggedInAlready = 2,  // the portal was not asked
};

// Returns whether the portal offers the target, as a PortalOffer; -1 on bad arguments or when no interface
// could be chosen.
[[nodiscard]] int Portal_search_target(const char* name, const char* address, int port);

}  // namespace remvol

#endif
