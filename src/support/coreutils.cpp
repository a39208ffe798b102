#include "support/coreutils.h"

#include "support/shell_text.h"

namespace remvol {

namespace {

constexpr char kMakeFolder[] = "mkdir -p";

}  // namespace

CommandText make_folder_command(const char* path) {
  return command_on_path(kMakeFolder, path);
}

CommandText make_system_folder_command(const char* path) {
  return command_on_node(kMakeFolder, path);
}

CommandText remove_folder_command(const char* path) {
  return command_on_path("rm -rf", path);
}

CommandText open_folder_command(const char* path) {
  return command_on_path("chmod 777", path);
}

CommandText wipe_beginning_command(const char* node) {
  return shell_command("dd if=/dev/zero of=%s bs=1M count=1", node);
}

}  // namespace remvol
