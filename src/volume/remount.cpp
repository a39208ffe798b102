#include "volume/remount.h"

#include <unistd.h>

#include <cstdlib>

#include "frontend/log.h"
#include "sysaux.h"
#include "volume/mount_command.h"

namespace remvol {

namespace {

constexpr int kShortestRemountWait = 3;  // seconds

}  // namespace

Result remount_mnt_path(const char* path, int wait_seconds) {
  const LogScope scope;
  if (path == nullptr) {
    LOG(0, "mnt_path not vaild");
    return kFailed;
  }
  RemountCommand remount(path);
  if (!remount) {
    LOG(0, "malloc failed");
    return kFailed;
  }
  if (sys_mount_point(path) == 0) return kOk;
  LOG(2, "start remount path %s", path);
  const char* command = remount.text();
  Result result = kOk;
  if (system(command) != 0) {
    LOG(0, "cmd '%s' failed", command);
    result = kFailed;
  }
  if (wait_seconds > 0) {
    if (wait_seconds <= kShortestRemountWait) wait_seconds = kShortestRemountWait;
    LOG(2, "sleep %d seconds to wait remount done...", wait_seconds);
    sleep(static_cast<unsigned>(wait_seconds));
  }
  return result;
}

}  // namespace remvol
