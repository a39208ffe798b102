// The volumes that are mounted from the disks of iSCSI sessions, by the kernel's own tables: a session that
// is closed under a volume takes what was not yet written with it.
#ifndef REMVOL_VOLUME_SESSION_VOLUMES_H
#define REMVOL_VOLUME_SESSION_VOLUMES_H

#include "frontend/log.h"

namespace remvol {

// Returns whether a volume is mounted below "/mnt/VV/" from a disk of a session to the target, or to any
// target when it is null. Where the kernel's tables cannot be read there is none.
[[nodiscard]] bool has_session_volume(const char* target_name);

// Unmounts those volumes: what the tree does not know, or another run has mounted meanwhile. Returns whether
// none is left; one that is is logged at level 0 in the caller's name.
[[nodiscard]] bool unmount_session_volumes(const char* target_name, Caller caller = Caller());

}  // namespace remvol

#endif
