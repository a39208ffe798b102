#include "volume/mount_command.h"

#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "support/files.h"
#include "support/shell_text.h"
#include "support/text.h"
#include "volume/mount_point.h"

namespace remvol {

namespace {

constexpr int kMountRetries = 3;
constexpr unsigned kMountRetryWait = 500000;  // microseconds

constexpr char kDriverList[] = "/proc/filesystems";
constexpr char kUfsd[] = "ufsd";
constexpr char kUfsdMount[] = "mount -t ufsd -o rw,nls=utf8,fmask=0,dmask=0,force,user_xattr";

// The partition's node and the quoted mount point follow the texts.
struct MountCommand {
  const char* fs_type;
  const char* text;
  const char* stock;  // the same with a driver that stock kernels have, for those without "ufsd"
};
constexpr MountCommand kMountCommands[] = {
    {"ext2", "mount -t ext2", nullptr},
    {"ext3", "mount -t ext3", nullptr},
    {"ext4", "mount -t ext4", nullptr},
    {"vfat", "mount -t vfat -o umask=0,iocharset=utf8,shortname=winnt", nullptr},
    {"ntfs", kUfsdMount, "mount -t ntfs3 -o rw,iocharset=utf8,fmask=0,dmask=0"},
    {"hfsplus", kUfsdMount, "mount -t hfsplus -o rw,nls=utf8,umask=0"},
    {"xfs", "mount -t xfs -o rw,attr2", nullptr},
};

const MountCommand* find_command(const char* fs_type) {
  for (const MountCommand& command : kMountCommands) {
    if (strcmp(command.fs_type, fs_type) == 0) return &command;
  }
  return nullptr;
}

CommandText full_command(const char* text, const char* node, const char* mount_point) {
  return command_on_path(command_on_node(text, node), mount_point);
}

// Returns whether the mount took hold within its tries.
bool run_with_retries(const char* command) {
  LOG(1, "cmd = %s", command);
  for (int retries = 0; system(command) != 0; retries++) {
    if (retries == kMountRetries) return false;
    LOG(0, "system() of cmd '%s' failed", command);
    LOG(kNote, "wait %u micro seconds", kMountRetryWait);
    usleep(kMountRetryWait);
  }
  return true;
}

// Returns whether the running kernel lacks the driver. One that is a module is listed once a mount has asked
// for it.
bool lacks_driver(const char* name) {
  const File list(fopen(kDriverList, "re"));
  if (!list) return false;
  char line[128];
  while (fgets(line, sizeof line, list.get()) != nullptr) {
    line[strcspn(line, "\n")] = '\0';
    const char* driver = strchr(line, '\t');  // "nodev" or nothing stands before it
    if (driver != nullptr && strcmp(driver + 1, name) == 0) return false;
  }
  return true;
}

}  // namespace

bool is_mountable(const char* fs_type) {
  return find_command(fs_type) != nullptr;
}

void run_mount(const char* fs_type, const char* node, const char* mount_point) {
  const MountCommand* mount = find_command(fs_type);
  if (run_with_retries(full_command(mount->text, node, mount_point))) return;
  if (mount->stock == nullptr || !lacks_driver(kUfsd)) return;
  const CommandText command = full_command(mount->stock, node, mount_point);
  LOG(1, "cmd = %s", command.c_str());
  if (system(command) != 0) LOG(0, "system() of cmd '%s' failed", command.c_str());
}

}  // namespace remvol
