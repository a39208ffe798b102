// The kernel's table of mounts, on any text: a mount that is found is where it was looked for.
#include <string>

#include "frontend/log.h"
#include "require.h"
#include "volume/degrade.h"
#include "volume/mount_table.h"
#include "wrapped_files.h"

using namespace remvol;

namespace {

void check(const MountLine& mount) {
  require_ended(mount.path);
  require_ended(mount.type);
  require_ended(mount.source);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  debug_level = -1;
  file_data = data;
  file_size = size;
  static MountLine mount;
  const std::string root = "/mnt/VV/a";
  const Mounted below = find_mount_below(root.c_str(), &mount);
  require((below == Mounted::kUnknown) == (size == 0));
  if (below == Mounted::kYes) {
    check(mount);
    const std::string path = mount.path;
    require(path == root || path.compare(0, root.size() + 1, root + "/") == 0);
    const dev_t device = mount.device;
    require(find_mount_of(device, path.c_str(), &mount) == Mounted::kYes);
    require(mount.device == device && path == mount.path);
  }
  if (size == 0) return 0;
  const int right = get_proc_mount_access_right("/dev/sdb1");
  require(right >= kNotMounted && right <= kMountedUnclear);
  return 0;
}
