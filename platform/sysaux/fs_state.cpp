// The state that an ext2, ext3 or ext4 file system records about itself.
#include <ext2fs/ext2fs.h>

#include "modules.h"

// Only the superblock is read, so the size of the file system costs nothing.
int sysaux_disk_check_fs_state(const char* node) {
  constexpr int kFlags =
      EXT2_FLAG_SUPER_ONLY | EXT2_FLAG_SOFTSUPP_FEATURES | EXT2_FLAG_64BITS | EXT2_FLAG_SKIP_MMP;
  ext2_filsys file_system = nullptr;
  if (node == nullptr) return 0;
  const errcode_t error = ext2fs_open(node, kFlags, 0, 0, unix_io_manager, &file_system);
  if (error == EXT2_ET_SB_CSUM_INVALID || error == EXT2_ET_CORRUPT_SUPERBLOCK) return 1;
  if (error != 0) return 0;
  const ext2_super_block* super = file_system->super;
  const bool wants_check = (super->s_state & EXT2_VALID_FS) == 0 || (super->s_state & EXT2_ERROR_FS) != 0 ||
                           (super->s_feature_incompat & EXT3_FEATURE_INCOMPAT_RECOVER) != 0;
  ext2fs_free(file_system);
  return wants_check ? 1 : 0;
}
