// The record that carries one target's settings together with the fields of one of its LUNs.
#ifndef REMVOL_TREE_RECORD_H
#define REMVOL_TREE_RECORD_H

#include <cstdint>

#include "tree_layout.h"

namespace remvol {

// Called a target entry when only its target fields are filled, a LUN entry when the fields of exactly one
// LUN are filled too. The caller owns it; every operation that fills one clears it first.
struct TargetEntry {
  char target_name[256];
  int32_t chap;         // 1: CHAP is used
  char chap_name[128];  // CHAP user
  char chap_pwd[128];   // CHAP secret
  char share[128];      // LUN: share name of the volume
  char dev[8];          // LUN: kernel name of its disk, such as sdb; empty: not attached
  int32_t lun;          // LUN: number on the target
  int32_t inet_type;    // AF_INET or AF_INET6, from the command line; not stored
  char ip[48];          // numeric portal address, IPv6 in square brackets
  int32_t port;         // portal TCP port
  int32_t conn_set;     // what the user asked for: 1 connected, 0 disconnected
  int32_t db_idx;       // slot of the target, from 1; 0: not yet known
  int32_t lun_db_idx;   // slot of the LUN, from 1; 0: not yet known
  char iface[32];       // iface record that a login uses, filled by get_iface_name; not stored
  char mnt_dev[1024];   // LUN: node that is mounted, such as /dev/sdb1
  char mnt[1024];       // LUN: mount point
};

}  // namespace remvol

#endif
