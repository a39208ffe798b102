#include "tasks/requested_lun.h"

#include "frontend/log.h"
#include "support/result.h"
#include "tree/entry.h"

namespace remvol {

Result find_requested_lun(const TargetEntry& request, int* dbidx, int* lun_dbidx) {
  *dbidx = ktree_get_dbidx_by_targetname(request.target_name);
  if (*dbidx < 1) {
    LOG(0, "Can not find: %s", request.target_name);
    return kNotStored;
  }
  *lun_dbidx = ktree_get_dbidx_by_lun(*dbidx, request.lun);
  if (*lun_dbidx < 1) {
    LOG(0, "Can not find lun %d under target %s", request.lun, request.target_name);
    return kNotStored;
  }
  return kOk;
}

Result read_requested_lun(const TargetEntry& request, TargetEntry* entry, int dbidx, int lun_dbidx) {
  if (ktree_get_found_lun_entry(entry, dbidx, lun_dbidx, request.lun) == kOk) return kOk;
  LOG(0, "Can not get lun entry %d under target %s", request.lun, request.target_name);
  return kFailed;
}

}  // namespace remvol
