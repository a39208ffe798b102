#include "volume/bare_folder.h"

#include <fcntl.h>
#include <ftw.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <cstdio>
#include <cstring>

#include "support/text.h"
#include "volume/cover.h"
#include "volume/mount_point.h"

namespace remvol {

namespace {

constexpr int kOpenFolders = 16;  // that a walk may hold open
using FolderPath = Text<PATH_MAX>;

// The folder held open, so that what is asked and what is done concern the same one.
class Folder {
 public:
  explicit Folder(const char* path) : fd_(open(path, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC)) {}
  ~Folder() {
    if (fd_ >= 0) close(fd_);
  }
  Folder(const Folder&) = delete;
  Folder& operator=(const Folder&) = delete;

  // Whether it is a folder of the mount root's file system, and not the root of one mounted there.
  bool is_bare() const {
    struct stat root;
    struct stat own;
    struct statx place;
    if (fd_ < 0 || stat(kMountRoot, &root) != 0 || fstat(fd_, &own) != 0) return false;
    if (statx(fd_, "", AT_EMPTY_PATH | AT_STATX_DONT_SYNC, 0, &place) != 0) return false;
    return own.st_dev == root.st_dev && (place.stx_attributes & STATX_ATTR_MOUNT_ROOT) == 0;
  }

  bool knows_flags() const {
    int flags = 0;
    return ioctl(fd_, FS_IOC_GETFLAGS, &flags) == 0;
  }

  bool is_immutable() const {
    int flags = 0;
    return ioctl(fd_, FS_IOC_GETFLAGS, &flags) == 0 && (flags & FS_IMMUTABLE_FL) != 0;
  }

  void set_immutable(bool on) const {
    int flags = 0;
    if (ioctl(fd_, FS_IOC_GETFLAGS, &flags) != 0) return;
    const int wanted = on ? flags | FS_IMMUTABLE_FL : flags & ~FS_IMMUTABLE_FL;
    if (wanted != flags) ioctl(fd_, FS_IOC_SETFLAGS, &wanted);
  }

 private:
  int fd_;
};

void release(const char* path) {
  const Folder folder(path);
  if (folder.is_bare()) folder.set_immutable(false);
}

int release_below(const char* path, const struct stat*, int type, struct FTW* place) {
  if (type == FTW_D && place->level > 0) release(path);
  return 0;
}

// Calls `act` with every folder between the mount root and the path: a share's name may hold slashes.
template <typename Act>
void walk_to(const char* path, Act act) {
  for (const char* end = strchr(path + strlen(kMountRoot), '/'); end != nullptr; end = strchr(end + 1, '/')) {
    act(FolderPath("%.*s", static_cast<int>(end - path), path).c_str());
  }
}

struct Renaming {
  const char* from;
  const char* to;
};

bool rename_folder(const void* what) {
  const auto* renaming = static_cast<const Renaming*>(what);
  return renameat2(AT_FDCWD, renaming->from, AT_FDCWD, renaming->to, RENAME_NOREPLACE) == 0;
}

// The name that a folder is made under. A killed run may have left it.
FolderPath draft_of(const char* path) {
  const char* name = strrchr(path, '/') + 1;
  return FolderPath("%.*s.new-%s", static_cast<int>(name - path), path, name);
}

// Makes the folder under another name first, so that it has the flag before anybody can reach it under its
// own. Does nothing where that cannot be had.
void make_unseen(const char* path) {
  const FolderPath draft = draft_of(path);
  lift_left_cover(draft);
  rmdir(draft);
  if (access(path, F_OK) == 0 || mkdir(draft, 0777) != 0) return;
  const Folder folder(draft);
  const Renaming renaming = {draft, path};
  if (folder.is_bare() && folder.knows_flags() && run_covered(draft, rename_folder, &renaming)) {
    folder.set_immutable(true);
    lift_cover(path);
  } else {
    rmdir(draft);
  }
}

struct Removal {
  const Folder* folder;
  const char* path;
};

bool remove_folder(const void* what) {
  const auto* removal = static_cast<const Removal*>(what);
  removal->folder->set_immutable(false);
  return rmdir(removal->path) == 0;
}

}  // namespace

void make_bare_folder(const char* path) {
  mkdir(kMountRoot, 0777);
  lift_left_cover(path);
  walk_to(path, [](const char* parent) {
    release(parent);  // a killed run may have left it, of a share that is named so
    mkdir(parent, 0777);
  });
  make_unseen(path);
  mkdir(path, 0777);
  const Folder folder(path);
  if (folder.is_bare()) folder.set_immutable(true);
}

void drop_bare_folder(const char* path) {
  walk_to(path, release);
  rmdir(draft_of(path));
  nftw(path, release_below, kOpenFolders, FTW_PHYS | FTW_MOUNT);
  const Folder folder(path);
  if (!folder.is_bare() || !folder.is_immutable()) return;
  const Removal removal = {&folder, path};
  if (!run_covered(path, remove_folder, &removal)) remove_folder(&removal);
}

}  // namespace remvol
