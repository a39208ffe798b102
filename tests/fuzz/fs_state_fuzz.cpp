// A disk with any bytes in the place of the superblock, perhaps with a checksum that fits them: it wants a
// check only when it is an ext file system at all, and a known one always does that says so or is damaged.
// One that is plain but for what it says of its state is taken at its word.
#include <ext2fs/ext2_fs.h>
#include <ext2fs/ext2fs.h>
#include <sys/mman.h>
#include <unistd.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <cstring>

#include "require.h"
#include "sysaux/modules.h"

namespace {

constexpr off_t kPlace = 1024;
using Super = ext2_super_block;

// crc32c as the kernel keeps it, without the last inversion.
uint32_t checksum_of(const Super& super) {
  static const auto table = [] {
    std::array<uint32_t, 256> made{};
    for (uint32_t i = 0; i < made.size(); i++) {
      made[i] = i;
      for (int bit = 0; bit < 8; bit++) made[i] = made[i] >> 1 ^ ((made[i] & 1) != 0 ? 0x82F63B78U : 0);
    }
    return made;
  }();
  uint32_t sum = ~0U;
  const auto* bytes = reinterpret_cast<const uint8_t*>(&super);
  for (size_t i = 0; i < offsetof(Super, s_checksum); i++) sum = sum >> 8 ^ table[(sum ^ bytes[i]) & 0xFF];
  return sum;
}

int state_of(const Super& super) {
  static const int disk = memfd_create("disk", MFD_CLOEXEC);
  static char path[32];
  snprintf(path, sizeof path, "/proc/self/fd/%d", disk);
  require(pwrite(disk, &super, sizeof super, kPlace) == sizeof super);
  return sysaux_state_check_fs_state(path);
}

bool says_so(const Super& super) {
  return (super.s_state & 1) == 0 || (super.s_state & 2) != 0 || (super.s_feature_incompat & 4) != 0;
}

bool has_checksum(const Super& super) {
  return (super.s_feature_ro_compat & EXT4_FEATURE_RO_COMPAT_METADATA_CSUM) != 0;
}

// Whether it is of a form and has features only that libext2fs knows. A journal by itself is no file system.
bool is_known(const Super& super) {
  if (has_checksum(super) && super.s_checksum_type != EXT2_CRC32C_CHKSUM) return false;
  return super.s_magic == 0xEF53 && super.s_rev_level <= 1 &&
         (super.s_feature_incompat | EXT2_LIB_FEATURE_INCOMPAT_SUPP) == EXT2_LIB_FEATURE_INCOMPAT_SUPP &&
         (super.s_feature_incompat & EXT3_FEATURE_INCOMPAT_JOURNAL_DEV) == 0;
}

Super plain() {
  Super super{};
  super.s_magic = 0xEF53;
  super.s_blocks_count = 8192;
  super.s_inodes_count = 2048;
  super.s_first_data_block = 1;
  super.s_blocks_per_group = 8192;
  super.s_clusters_per_group = 8192;
  super.s_inodes_per_group = 2048;
  return super;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1 || size > sizeof(Super) + 1) return 0;
  Super super{};
  memcpy(&super, data + 1, size - 1);
  if ((data[0] & 1) != 0) super.s_checksum = checksum_of(super);
  const int state = state_of(super);
  require(state == 0 || state == 1);
  if (super.s_magic != 0xEF53) require(state == 0);
  if (is_known(super)) {
    const bool is_damaged = has_checksum(super) && super.s_checksum != checksum_of(super);
    if (says_so(super) || is_damaged) require(state == 1);
  }
  Super sound = plain();
  sound.s_state = super.s_state;
  sound.s_feature_incompat = super.s_feature_incompat & 4;
  require(state_of(sound) == (says_so(sound) ? 1 : 0));
  return 0;
}
