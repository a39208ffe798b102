#include "volume/file_systems.h"

#include <cstring>

#include "volume/e2fsprogs.h"

namespace remvol {

namespace {

constexpr char kUfsd[] = "-t ufsd -o rw,nls=utf8,fmask=0,dmask=0,force,user_xattr";

constexpr FileSystem kFileSystems[] = {
    {"ext2", "-t ext2", nullptr, make_ext2_command, nullptr, nullptr},
    {"ext3", "-t ext3", nullptr, make_ext3_command, nullptr, nullptr},
    {"ext4", "-t ext4", nullptr, make_ext4_command, check_ext_command, grow_ext_command},
    {"vfat", "-t vfat -o umask=0,iocharset=utf8,shortname=winnt", nullptr, nullptr, nullptr, nullptr},
    {"ntfs", kUfsd, "-t ntfs3 -o rw,iocharset=utf8,fmask=0,dmask=0", nullptr, nullptr, nullptr},
    {"hfsplus", kUfsd, "-t hfsplus -o rw,nls=utf8,umask=0", nullptr, nullptr, nullptr},
    {"xfs", "-t xfs -o rw,attr2", nullptr, nullptr, nullptr, nullptr},
};

}  // namespace

const FileSystem* find_file_system(const char* type) {
  for (const FileSystem& file_system : kFileSystems) {
    if (strcmp(file_system.type, type) == 0) return &file_system;
  }
  return nullptr;
}

}  // namespace remvol
