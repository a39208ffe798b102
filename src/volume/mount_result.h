// What becomes of the mount of a volume.
#ifndef REMVOL_VOLUME_MOUNT_RESULT_H
#define REMVOL_VOLUME_MOUNT_RESULT_H

namespace remvol {

enum [[nodiscard]] MountResult : int;
enum MountResult : int {
  kMounted = 0,             // or never took hold: the volume state tells
  kMountFailed = -1,        // a bad entry, no file system after formatting, or no device node
  kMountNoPartition = -2,   // none could be made, or none is usable
  kMountFormatFailed = -3,  // formatting failed
  kMountNoMountPoint = -4,  // could not be made, lies outside "/mnt/VV/", or another disk is mounted there
  kMountUnsupported = -6,   // not a file system that can be mounted; volume state 5 is recorded
  kMountReadOnly = -7,      // mounted but not writable; VOL_AC_RO is recorded, no share service is reloaded
  kMountTooSmall = -8,      // a disk of 1 MiB or less, or of another LUN by now: the LUN is offline
  kMountUnrecorded = -103,  // the tree refused a write
};

}  // namespace remvol

#endif
