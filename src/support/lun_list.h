// The list of LUNs found in a session. Whoever holds its head owns it and frees it whole.
#ifndef REMVOL_SUPPORT_LUN_LIST_H
#define REMVOL_SUPPORT_LUN_LIST_H

#include <cstdint>

namespace remvol {

struct LunNode {
  int32_t host;      // SCSI host number of the session
  int32_t lun;       // LUN number
  char dev[16];      // kernel name of the disk, such as sdb
  int64_t size;      // bytes of the whole disk
  char fs_type[16];  // file system of the first partition, or "unknown"
  LunNode* next;     // null at the end
};

// Returns a node with all fields zero, or null when out of memory.
[[nodiscard]] LunNode* lun_node_new();

// Frees every node of the list. Null is an empty list.
void lun_node_free_list(LunNode* head);

// Links `node` behind the last node of the list; nothing when either is null.
void lun_node_append(LunNode* head, LunNode* node);

}  // namespace remvol

#endif
