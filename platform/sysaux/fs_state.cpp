// The state that an ext2, ext3 or ext4 file system records about itself.

#include <ext2fs/ext2fs.h>
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "sysaux/modules.h"

// How libext2fs reads the device. Its own way, unix_io_manager, begins with an fsync of the device; that
// makes the disk write out its cache, to no end where only a superblock is read. A thread has one device open
// at a time.
namespace {

extern struct_io_manager plain_reads;
thread_local struct_io_channel channel;
thread_local int channel_fd = -1;

errcode_t open_channel(const char* name, int, io_channel* opened) {
  channel_fd = open(name, O_RDONLY | O_CLOEXEC);
  if (channel_fd < 0) return errno;
  channel = {};
  channel.magic = EXT2_ET_MAGIC_IO_CHANNEL;
  channel.manager = &plain_reads;
  channel.block_size = 1024;
  channel.refcount = 1;
  *opened = &channel;
  return 0;
}

errcode_t close_channel(io_channel) {
  close(channel_fd);
  channel_fd = -1;
  return 0;
}

errcode_t set_block_size(io_channel of, int size) {
  of->block_size = size;
  return 0;
}

// A negative count is one of bytes.
errcode_t read_blocks(io_channel of, unsigned long long block, int count, void* data) {
  const size_t size = static_cast<size_t>(count < 0 ? -count : count * of->block_size);
  const off_t at = static_cast<off_t>(block) * of->block_size;
  const ssize_t got = pread(channel_fd, data, size, at);
  if (got < 0) return errno;
  return static_cast<size_t>(got) == size ? 0 : EXT2_ET_SHORT_READ;
}

errcode_t read_low_blocks(io_channel of, unsigned long block, int count, void* data) {
  return read_blocks(of, block, count, data);
}

struct_io_manager make_plain_reads() {
  struct_io_manager manager{};
  manager.magic = EXT2_ET_MAGIC_IO_MANAGER;
  manager.name = "plain reads";
  manager.open = open_channel;
  manager.close = close_channel;
  manager.set_blksize = set_block_size;
  manager.read_blk = read_low_blocks;
  manager.read_blk64 = read_blocks;
  return manager;
}

struct_io_manager plain_reads = make_plain_reads();

}  // namespace

// Only the superblock is read, so the size of the file system costs nothing.
int sysaux_state_check_fs_state(const char* node) {
  constexpr int kFlags =
      EXT2_FLAG_SUPER_ONLY | EXT2_FLAG_SOFTSUPP_FEATURES | EXT2_FLAG_64BITS | EXT2_FLAG_SKIP_MMP;
  ext2_filsys file_system = nullptr;
  if (node == nullptr) return 0;
  const errcode_t error = ext2fs_open(node, kFlags, 0, 0, &plain_reads, &file_system);
  const bool is_damaged = error == EXT2_ET_SB_CSUM_INVALID || error == EXT2_ET_CORRUPT_SUPERBLOCK ||
                          error == EXT2_ET_BAD_DESC_SIZE;
  if (is_damaged) return 1;
  if (error != 0) return 0;
  // On a 32-bit processor Debian 12's library has times of 32 bits, unlike this code: what stands behind the
  // structure's `now` is elsewhere for it.
  const ext2_super_block* super = file_system->super;
  const bool wants_check = (super->s_state & EXT2_VALID_FS) == 0 || (super->s_state & EXT2_ERROR_FS) != 0 ||
                           (super->s_feature_incompat & EXT3_FEATURE_INCOMPAT_RECOVER) != 0;
  ext2fs_free(file_system);
  return wants_check ? 1 : 0;
}
