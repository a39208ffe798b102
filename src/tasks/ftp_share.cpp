#include "tasks/ftp_share.h"

#include <cstring>

#include "frontend/log.h"
#include "support/result.h"
#include "volume/unmount.h"

namespace remvol {

Result take_ftp_share_down(const TargetEntry* entry, FtpPath& path) {
  memset(path, 0, sizeof path);
  switch (get_ftp_share_path(entry, path)) {
    case kMountTableUnreadable:
      LOG(2, "Can not read /proc/mounts");
      return kMountTableUnreadable;
    case kNoFtpShare:
      LOG(2, "Can not find ftp share folder");
      return kOk;
    default:
      LOG(1, "umount_ftp : FTP SHARE PATH = %s", path);
      (void)Target_umount_ftp(entry, path);
      return kOk;
  }
}

}  // namespace remvol
