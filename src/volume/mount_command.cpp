#include "volume/mount_command.h"

#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "support/files.h"
#include "support/shell_text.h"
#include "sysaux.h"

namespace remvol {

namespace {

constexpr int kMountRetries = 3;
constexpr unsigned kMountRetryWait = 500000;  // microseconds

constexpr char kDriverList[] = "/proc/filesystems";
constexpr char kRareDriver[] = "ufsd";  // of all that are named, the one that stock kernels lack
// The text of mount(8) without its operands, which is what a refusal tells of.
using MountText = Text<128>;

CommandText mount_command(const char* words, const char* node, const char* mount_point) {
  return command_on_path(command_on_node(MountText("mount %s", words), node), mount_point);
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
// for it. A list that cannot be read to its end tells nothing.
bool lacks_driver(const char* name) {
  const File list(fopen(kDriverList, "re"));
  if (!list) return false;
  char* line = nullptr;
  size_t size = 0;
  bool found = false;
  while (!found && getline(&line, &size, list.get()) > 0) {
    line[strcspn(line, "\n")] = '\0';
    const char* driver = strchr(line, '\t');  // "nodev" or nothing stands before it
    found = driver != nullptr && strcmp(driver + 1, name) == 0;
  }
  const Memory<char> owner(line);
  return !found && feof(list.get()) != 0;
}

}  // namespace

void run_mount(const FileSystem& file_system, const char* node, const char* mount_point) {
  if (run_with_retries(mount_command(file_system.mount, node, mount_point))) return;
  if (file_system.stock_mount == nullptr || !lacks_driver(kRareDriver)) return;
  const CommandText command = mount_command(file_system.stock_mount, node, mount_point);
  LOG(1, "cmd = %s", command.c_str());
  if (system(command) != 0) LOG(0, "system() of cmd '%s' failed", command.c_str());
}

CommandText umount_command(const char* path) {
  return command_on_path("umount -f", path);
}

RemountCommand::RemountCommand(const char* path)
    : path_(path),
      size_(2 * (strlen(path) + 25)),  // as if every character were escaped
      escaped_(allocate<char>(size_)),
      text_(allocate<char>(size_)) {}

const char* RemountCommand::text() {
  str_insert_back_slash(escaped_.get(), size_, path_);
  snprintf(text_.get(), size_, "mount -o remount \"%s\"", escaped_.get());
  return text_.get();
}

}  // namespace remvol
