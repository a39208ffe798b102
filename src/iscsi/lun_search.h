// LUN search: what a target offers.
#ifndef REMVOL_ISCSI_LUN_SEARCH_H
#define REMVOL_ISCSI_LUN_SEARCH_H

#include "iscsi/session.h"

namespace remvol {

// Lists the LUNs of the target's session and publishes them in the tree behind `socket`; `make_node` as for
// _get_sess_lun_list. A list that is empty although a LUN was ready, since all are too small, is neither
// printed nor stored. Returns 0, also when no LUN is ready, or -1.
[[nodiscard]] int publish_luns(const char* socket, const char* name, DeviceNodeMaker make_node);

}  // namespace remvol

#endif
