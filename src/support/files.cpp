#include "support/files.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "support/memory.h"
#include "support/text.h"

namespace remvol {

namespace {

// The slash that ends the parent of `path`; the first character is no such slash. Null when there is none.
char* last_slash(char* path) {
  char* slash = strrchr(path, '/');
  return slash == path ? nullptr : slash;
}

constexpr int kDeepestFolder = 32;

// Removes `name` in the open folder, a folder with all that is in it. Every step goes by descriptor and
// follows no link: the owner of a planted folder may exchange what is below it meanwhile.
void remove_at(int folder, const char* name, int depth) {
  if (unlinkat(folder, name, 0) == 0 || depth == kDeepestFolder) return;
  const int fd = openat(folder, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  DIR* entries = fd >= 0 ? fdopendir(fd) : nullptr;
  if (entries == nullptr) return;
  while (const dirent* entry = readdir(entries)) {
    if (strcmp(entry->d_name, ".") == 0 || strcmp(entry->d_name, "..") == 0) continue;
    remove_at(fd, entry->d_name, depth + 1);
  }
  closedir(entries);
  unlinkat(folder, name, AT_REMOVEDIR);
}

constexpr int kClaimTries = 10;

bool is_own_folder(const struct stat& found) {
  return S_ISDIR(found.st_mode) && found.st_uid == geteuid();
}

// Removes what is at `path`, or puts it aside, unless it is a folder of our own user.
void drop_foreign_folder(const char* path) {
  struct stat found;
  if (lstat(path, &found) != 0 || is_own_folder(found)) return;
  remove_path(path);
  // What its owner fills as fast as it is emptied is put aside.
  rename(path, Text<PATH_MAX>("%s.foreign-%d", path, static_cast<int>(getpid())));
}

}  // namespace

int check_path_exist(const char* path) {
  const LogScope scope;
  if (path == nullptr || path[0] == '\0') return -1;
  if (access(path, F_OK) == 0) return 0;
  LOG(2, "file path is not vaild : %s", path);
  return -1;
}

int make_dir_include_parent(const char* path, mode_t mode) {
  const LogScope scope;
  if (path == nullptr) return -1;
  if (mode == 0) mode = 0700;
  const Memory<char> copy(strdup(path));
  if (copy == nullptr) {
    LOG(0, "strdup fail");
    return -1;
  }
  if (char* slash = last_slash(copy.get())) {
    *slash = '\0';
    const int result = make_dir_include_parent(copy.get(), mode);
    if (result != 0) return result;
  }
  if (mkdir(path, mode) == 0) {
    LOG(2, "mkdir %s - successed", path);
    return 0;
  }
  if (errno == EEXIST) return 0;
  LOG(0, "mkdir %s failed", path);
  return -1;
}

int _remove_file(const char* path) {
  const LogScope scope;
  LOG(2, "unlink %s ", path);
  return unlink(path) == 0 || errno == ENOENT ? 0 : -1;
}

void remove_path(const char* path) {
  remove_at(AT_FDCWD, path, 0);
}

bool claim_folder(const char* path) {
  for (int tries = 0; tries < kClaimTries; tries++) {
    drop_foreign_folder(path);
    (void)mkdir(path, 0700);
    struct stat found;
    const int fd = open(path, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    const bool own = fd >= 0 && fstat(fd, &found) == 0 && is_own_folder(found);
    const bool closed = own && ((found.st_mode & 077) == 0 || fchmod(fd, found.st_mode & 07700) == 0);
    if (fd >= 0) close(fd);
    if (closed) return true;
    if (fd < 0 && errno != ENOENT && errno != ELOOP && errno != ENOTDIR) return false;
  }
  return false;
}

}  // namespace remvol
