#include "volume/e2fsprogs.h"

#include "support/shell_text.h"

namespace remvol {

// Blocks of 4096 bytes, none reserved. MKE2FS_SYNC has mke2fs sync after so many block groups; see mke2fs(8).
CommandText make_ext2_command(const char* node) {
  return command_on_node("MKE2FS_SYNC=100 mke2fs -m0 -b4096", node);
}

CommandText make_ext3_command(const char* node) {
  return command_on_node("MKE2FS_SYNC=100 mke2fs -j -m0 -b4096", node);
}

CommandText make_ext4_command(const char* node) {
  return command_on_node("MKE2FS_SYNC=100 mke2fs -j -m0 -b4096 -T ext4", node);
}

CommandText check_ext_command(const char* node) {
  return command_on_node("e2fsck -n -f", node);
}

CommandText grow_ext_command(const char* node) {
  return shell_command("resize2fs -fp %s &", node);
}

}  // namespace remvol
