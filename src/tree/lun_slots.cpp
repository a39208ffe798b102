#include "tree/lun_slots.h"

#include "tree/slots.h"

namespace remvol {

namespace {

bool is_lun_slot_taken(int n, int m) {
  return !is_lun_slot_free(n, m);
}

}  // namespace

LunSlots stored_luns(int dbidx) {
  return {dbidx, is_lun_stored};
}

LunSlots stored_luns_at(int n) {
  return {n, is_lun_stored_at};
}

LunSlots taken_luns_at(int n) {
  return {n, is_lun_slot_taken};
}

}  // namespace remvol
