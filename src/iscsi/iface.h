// The interface records of the initiator, and which of them a login uses.
#ifndef REMVOL_ISCSI_IFACE_H
#define REMVOL_ISCSI_IFACE_H

#include <cstddef>

#include "tree/record.h"

namespace remvol {

// Makes or updates the records iface0, iface1 and ifbond; a port without hardware address gets none. Returns
// 0.
[[nodiscard]] int Iface_Config_Gen();

// Fills the entry's iface when it is still empty, by its portal address. Returns 0, or -1 for a null entry or
// an empty address.
[[nodiscard]] int get_iface_name(TargetEntry* entry);

// Puts the name of the interface record for a portal address into `out` of `size` bytes. Returns 0, or -1 for
// a null argument or size 0.
[[nodiscard]] int _get_iface_name(char* out, size_t size, const char* address);

// Returns 1 when network bonding is on, 0 when off, -1 when unknown.
[[nodiscard]] int _ktree_get_bonding_mode_enable();

}  // namespace remvol

#endif
