#include "support/files.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"

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

}  // namespace

int check_path_exist(const char* path) {
  if (path == nullptr || path[0] == '\0') return -1;
  if (access(path, F_OK) == 0) return 0;
  LOG(2, "file path is not vaild : %s", path);
  return -1;
}

int make_dir_include_parent(const char* path, mode_t mode) {
  if (path == nullptr) return -1;
  if (mode == 0) mode = 0700;
  const std::unique_ptr<char, decltype(&free)> copy(strdup(path), &free);
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
  LOG(2, "unlink %s ", path);
  return unlink(path) == 0 || errno == ENOENT ? 0 : -1;
}

void clear_temp_path(const char* path) {
  struct stat found;
  if (lstat(path, &found) != 0) return;
  const bool own_file = S_ISREG(found.st_mode) && found.st_uid == geteuid() && found.st_nlink == 1;
  if (!own_file) remove_at(AT_FDCWD, path, 0);
}

}  // namespace remvol
