#include "tree/recover_queue.h"

#include <cstring>

#include "frontend/log.h"
#include "support/result.h"
#include "support/run_lock.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

namespace {

// Whoever adds an entry or takes one has this alone: the later ones move down when one is taken.
constexpr char kEntriesLock[] = "recover_queue.lock";

}  // namespace

int ktree_get_free_recover_queue_db_idx() {
  const LogScope scope;
  for (int q = 1; q <= kMaxRecoverQueue; q++) {
    if (!tree_slot_is_free(KeyText(key::kRecoverName, q))) continue;
    LOG(3, "free ent id: %d", q);
    return q;
  }
  return kFailed;
}

int ktree_insert_recover_queue(const char* target_name) {
  const LogScope scope;
  RunLock lock;
  lock.take(kEntriesLock, LockMode::kExclusive);
  const int q = ktree_get_free_recover_queue_db_idx();
  if (q < 1) {
    LOG(0, "db failed or exceed max queue length");
    return kFailed;
  }
  return tree_write_once(KeyText(key::kRecoverName, q), target_name);
}

bool recover_queue_is_empty() {
  return !tree_present(KeyText(key::kRecoverName, 1));
}

int ktree_pop_recover_queue(char* target_name) {
  const LogScope scope;
  RunLock lock;
  lock.take(kEntriesLock, LockMode::kExclusive);
  TreeValue name;
  if (!tree_read(KeyText(key::kRecoverName, 1), name)) return kFailed;
  memcpy(target_name, name, sizeof name);
  LOG(2, "pop %s", target_name);
  const KeyText entry(key::kRecoverEntry, 1);
  if (tree_delete(entry) == kOk) return kOk;
  LOG(0, "ktreec_del() of path '%s' failed", entry.c_str());
  return kTreeFailed;
}

}  // namespace remvol
