#include "tasks/requested_lun.h"

#include "frontend/request.h"
#include "support/result.h"
#include "tree/entry.h"

namespace remvol {

int find_requested_lun(int* dbidx, int* lun_dbidx) {
  const TargetEntry& wanted = request_target;
  *dbidx = ktree_get_dbidx_by_targetname(wanted.target_name);
  if (*dbidx < 1) {
    LOG(0, "Can not find: %s", wanted.target_name);
    return kNotStored;
  }
  *lun_dbidx = ktree_get_dbidx_by_lun(*dbidx, wanted.lun);
  if (*lun_dbidx < 1) {
    LOG(0, "Can not find lun %d under target %s", wanted.lun, wanted.target_name);
    return kNotStored;
  }
  return kOk;
}

int read_requested_lun(TargetEntry* entry, int dbidx, int lun_dbidx) {
  if (ktree_get_found_lun_entry(entry, dbidx, lun_dbidx, request_target.lun) == kOk) return kOk;
  LOG(0, "Can not get lun entry %d under target %s", request_target.lun, request_target.target_name);
  return kFailed;
}

}  // namespace remvol
