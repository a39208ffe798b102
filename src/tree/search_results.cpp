#include "tree/search_results.h"

#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "support/result.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/slots.h"
#include "tree_layout.h"

namespace remvol {

namespace {

int publish(const char* socket, const char* key, const char* value) {
  return tree_write_logged_to(socket, key, value, 1);
}

// Publishes the k-th LUN found. `dbidx` is the slot of its target, below 1 when the target is not stored.
int publish_lun(const char* socket, const LunNode* lun, int k, int dbidx) {
  const NumberText number("%u", static_cast<unsigned>(lun->lun));
  const NumberText size("%llu", static_cast<unsigned long long>(lun->size));
  int result = publish(socket, KeyText(key::kLunSearchLun, k), number);
  if (result == kOk) result = publish(socket, KeyText(key::kLunSearchSize, k), size);
  if (result != kOk) return result;
  const int in_system = dbidx >= 1 && ktree_get_dbidx_by_lun(dbidx, lun->lun) >= 1 ? 1 : 0;
  const int available = 1 - in_system;
  printf("lun%d, insys=%d, avail=%d\n", lun->lun, in_system, available);
  result = publish(socket, KeyText(key::kLunSearchAvailable, k), NumberText("%d", available));
  if (result != kOk) return result;
  return publish(socket, KeyText(key::kLunSearchFsType, k), lun->fs_type);
}

// The walk ends at the first slot without a share, not without a LUN number: shares are all that it reads.
bool share_is_used_in(int dbidx, const char* share) {
  for (int m = 1; m <= kMaxLunsPerTarget; m++) {
    TreeValue stored;
    if (!tree_read(KeyText(key::kLunShare, dbidx, m), stored)) return false;
    if (strcmp(stored, share) == 0) return true;
  }
  return false;
}

}  // namespace

int ktree_update_search_lun_result(const char* socket, const LunNode* luns, const char* target_name) {
  const LogScope scope;
  if (target_name == nullptr) return kFailed;
  const int dbidx = ktree_get_dbidx_by_targetname(target_name);
  int result = publish(socket, key::kLunSearchTarget, target_name);
  if (result != kOk) return result;
  int count = 0;
  for (const LunNode* lun = luns; lun != nullptr; lun = lun->next) {
    result = publish_lun(socket, lun, ++count, dbidx);
    if (result != kOk) return result;
  }
  return publish(socket, key::kLunSearchCount, NumberText("%d", count));
}

int ktree_update_search_lun_err_code(const char* socket, int code) {
  const LogScope scope;
  return tree_write_with_tries_to(socket, key::kLunSearchError, NumberText("%d", code));
}

int ktree_check_duplicate_share_name(const char* share) {
  const LogScope scope;
  const SlotsHeld held;
  for (int n = 1; n <= kMaxTargets; n++) {
    if (!share_is_used_in(n, share)) continue;
    LOG(1, "Found %s", share);
    return 1;
  }
  return 0;
}

}  // namespace remvol
