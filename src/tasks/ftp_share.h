// The second mount of a volume, in the public FTP area, while the volume is out of service.
#ifndef REMVOL_TASKS_FTP_SHARE_H
#define REMVOL_TASKS_FTP_SHARE_H

#include "support/result.h"
#include "tree/record.h"

namespace remvol {

using FtpPath = char[512];

// Unmounts the FTP mount of the entry's volume and leaves its path in `path`, empty when there is none. Logs
// in the innermost scope's name. Returns 0, or -105 when the mount table cannot be read.
Result take_ftp_share_down(const TargetEntry* entry, FtpPath& path);

}  // namespace remvol

#endif
