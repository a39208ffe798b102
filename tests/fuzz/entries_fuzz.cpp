// Values of the configuration tree as anybody may have set them, read into records.
#include <cstdint>
#include <string>

#include "frontend/log.h"
#include "hostile_tree.h"
#include "iscsi/initiator_name.h"
#include "require.h"
#include "sysaux.h"
#include "tree/entry.h"
#include "tree/recover_queue.h"

using namespace remvol;

extern "C" {

int ktreec_set(const char*, unsigned, const char*, const char*) {
  return next_value() == "-" ? -1 : 0;
}

int ktreec_del(const char*, unsigned, const char*) {
  return next_value() == "-" ? -1 : 0;
}

int sys_hostname(char* out, size_t size) {
  return ktreec_get_wb(nullptr, 0, nullptr, out, size) < 0 ? -1 : 0;
}

int sys_get_mac_addr(const char*, unsigned char mac[6]) {
  memcpy(mac, "\x00\x90\xa9\x1b\x2c\x3d", 6);
  return next_value() == "-" ? -1 : 0;
}

}  // extern "C"

namespace {

void check(const TargetEntry& entry) {
  require_ended(entry.target_name);
  require_ended(entry.chap_name);
  require_ended(entry.chap_pwd);
  require_ended(entry.share);
  require_ended(entry.dev);
  require_ended(entry.ip);
  require_ended(entry.iface);
  require_ended(entry.mnt_dev);
  require_ended(entry.mnt);
}

void check_lookups(const char* name) {
  TargetEntry entry;
  const int slot = ktree_get_dbidx_by_targetname(name);
  require(slot == -1 || (slot >= 1 && slot <= kMaxTargets));
  const int result = ktree_get_entry_by_targetname(name, &entry);
  require(result == 0 || result == -1);
  check(entry);
  if (result == 0) require(entry.db_idx >= 1 && entry.db_idx <= kMaxTargets);
  const int free_slot = ktree_get_free_dbidx();
  require(free_slot == -103 || (free_slot >= 1 && free_slot <= kMaxTargets));
}

void check_luns() {
  TargetEntry entry;
  if (ktree_get_lun_entry_by_dbidx(&entry, 2, 3) == 0) require(entry.db_idx == 2 && entry.lun_db_idx == 3);
  check(entry);
  const int total = ktree_get_total_luncnt();
  require(total >= 0 && total <= kMaxTargets * kMaxLunsPerTarget);
  int enable = -1;
  (void)ktree_get_lun_enable(&enable, 1, 1);
  require(enable == 0 || enable == 1);
  const int slot = ktree_get_dbidx_by_lun(1, 0);
  require(slot == -1 || (slot >= 1 && slot <= kMaxLunsPerTarget));
}

void check_queue() {
  char name[256];
  memset(name, 'x', sizeof name);
  const int result = ktree_pop_recover_queue(name);
  require(result == 0 || result == -1 || result == -103);
  if (result != -1) require_ended(name);
  const int free_place = ktree_get_free_recover_queue_db_idx();
  require(free_place == -1 || (free_place >= 1 && free_place <= kMaxRecoverQueue));
  (void)ktree_insert_recover_queue("iqn.t1");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  debug_level = -1;
  take_values(data, size);
  const std::string name = values.front();
  check_lookups(name.c_str());
  check_luns();
  check_queue();
  const InitiatorName initiator = make_initiator_name();
  const size_t length = strlen(initiator);
  // A name that is cut has its field full.
  require(strstr(initiator, "initiator") != nullptr || length == 255);
  return 0;
}
