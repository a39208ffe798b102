// The commands that drive e2fsck(8), mke2fs(8) and resize2fs(8): every text of them stands here.
#ifndef REMVOL_VOLUME_E2FSPROGS_H
#define REMVOL_VOLUME_E2FSPROGS_H

#include "support/text.h"

namespace remvol {

// As the process list names them.
inline constexpr char kMke2fs[] = "mke2fs";
inline constexpr char kResize2fs[] = "resize2fs";

// Make a file system on the node.
[[nodiscard]] CommandText make_ext2_command(const char* node);
[[nodiscard]] CommandText make_ext3_command(const char* node);
[[nodiscard]] CommandText make_ext4_command(const char* node);

// Looks at the file system on the node and changes nothing.
[[nodiscard]] CommandText check_ext_command(const char* node);

// Has the file system on the node fill it, in the background.
[[nodiscard]] CommandText grow_ext_command(const char* node);

}  // namespace remvol

#endif
