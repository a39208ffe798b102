// What is mounted from the disks of iSCSI sessions, by the kernel's own tables: a session that is closed
// under a file system takes what was not yet written with it.
#ifndef REMVOL_VOLUME_SESSION_VOLUMES_H
#define REMVOL_VOLUME_SESSION_VOLUMES_H

namespace remvol {

// Returns whether a volume is mounted below "/mnt/VV/" from a disk of a session to the target, or to any
// target when it is null. A table of mounts that is there and cannot be read may show one.
[[nodiscard]] bool has_session_volume(const char* target_name);

// Unmounts the volumes that are mounted from the target's session, or from any for null, also where one is
// mounted a second time inside the public FTP area. Returns whether none is left below "/mnt/VV/", which is
// logged at level 0 when it is; a second mount may stay. A table of mounts that is there and cannot be read
// may show one.
[[nodiscard]] bool unmount_session_volumes(const char* target_name);

// Returns whether somebody uses a disk of the target's sessions, or of any session for null: it is mounted,
// or has holders, or the kernel says that it is in use. That of a target is logged at level 0.
[[nodiscard]] bool is_session_used(const char* target_name);

// Closes the target's session by the command `logout`. Volumes that are mounted still, since the tree does
// not know them or another run has mounted them meanwhile, are unmounted before; no run mounts one until the
// command has ended. Returns 0; or 1 when the command failed, or a volume stays mounted or the kernel's table
// of mounts cannot be read, which is logged at level 0 in the innermost scope's name: then the command does
// not run.
[[nodiscard]] int close_sessions(const char* target_name, const char* logout);

}  // namespace remvol

#endif
