// The commands that drive mount(8) and umount(8): every text of them stands here.
#ifndef REMVOL_VOLUME_MOUNT_COMMAND_H
#define REMVOL_VOLUME_MOUNT_COMMAND_H

#include "support/memory.h"
#include "support/text.h"
#include "volume/file_systems.h"

namespace remvol {

// Mounts the node, which carries `file_system`, on the mount point, in up to four tries half a second apart.
// On a kernel without the driver that the command names, the stock kernel's own driver for that file system
// is tried once after them. Failures are logged; whether the mount took hold is for the caller to ask.
void run_mount(const FileSystem& file_system, const char* node, const char* mount_point);

// Unmounts the path, by force.
[[nodiscard]] CommandText umount_command(const char* path);

// The command that mounts what is mounted on a path anew in place, for a path of any length.
class RemountCommand {
 public:
  // Has room for the command. False when memory is short.
  explicit RemountCommand(const char* path);
  explicit operator bool() const { return escaped_ && text_; }

  // Returns the command.
  const char* text();

 private:
  const char* path_;
  size_t size_;
  Memory<char> escaped_;
  Memory<char> text_;
};

}  // namespace remvol

#endif
