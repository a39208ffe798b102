// LUN search: what a target offers.
#ifndef REMVOL_ISCSI_LUN_SEARCH_H
#define REMVOL_ISCSI_LUN_SEARCH_H

namespace remvol {

// Handler of search_lun: publishes the LUNs of the requested target, logging in for the time of the search
// when it is not connected. Returns 0, or -1.
int task_search_lun();

}  // namespace remvol

#endif
