// Result codes that travel between the layers. 0 is success; a few operations define further codes of their
// own, which their headers name. Every result has to be looked at ([[nodiscard]]); a step that goes on
// whatever came of it says so by a (void) in front, where the order of the steps is settled to be so.
#ifndef REMVOL_SUPPORT_RESULT_H
#define REMVOL_SUPPORT_RESULT_H

namespace remvol {

enum [[nodiscard]] Result : int;
enum Result : int {
  kOk = 0,
  kNotStored = 1,                // the requested target or LUN
  kNotDeleted = 2,               // its slot
  kSessionStays = 3,             // a volume on it cannot be unmounted, or its disk is in use elsewhere
  kFailed = -1,                  // bad argument or generic failure
  kTreeFailed = -103,            // the tree refused a write, or an entry or a free slot was not found
  kNoFtpShare = -104,            // the volume has no mount in the public FTP area
  kMountTableUnreadable = -105,  // /proc/mounts cannot be opened
  kListingFailed = -106,         // a session listing command failed
  kLockFileFailed = -108,        // the lock directory or a lock file cannot be made or opened
};

}  // namespace remvol

#endif
