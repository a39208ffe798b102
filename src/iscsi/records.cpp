#include "iscsi/records.h"

#include <ftw.h>
#include <sys/stat.h>
#include <unistd.h>

#include "frontend/log.h"

namespace remvol {

namespace {

// open-iscsi has them in /var/lib since 2.1.10 (Debian 13).
constexpr const char* kRecordFolders[] = {"/etc/iscsi/nodes", "/etc/iscsi/ifaces", "/var/lib/iscsi/nodes",
                                          "/var/lib/iscsi/ifaces"};
constexpr int kOpenFolders = 4;

int drop_when_empty(const char* path, const struct stat* info, int type, struct FTW* /*place*/) {
  const LogScope scope;
  if (type == FTW_F && S_ISREG(info->st_mode) && info->st_size == 0 && unlink(path) == 0) {
    LOG(0, "the empty record %s is removed", path);
  }
  return 0;
}

}  // namespace

void drop_empty_records() {
  for (const char* folder : kRecordFolders) nftw(folder, drop_when_empty, kOpenFolders, FTW_PHYS);
}

}  // namespace remvol
