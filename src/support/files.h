// Paths and files.
#ifndef REMVOL_SUPPORT_FILES_H
#define REMVOL_SUPPORT_FILES_H

#include <dirent.h>
#include <sys/types.h>

#include <cstdio>
#include <memory>

namespace remvol {

struct FileCloser {
  void operator()(FILE* file) const { fclose(file); }
};

// A stdio file that closes itself.
using File = std::unique_ptr<FILE, FileCloser>;

struct DirectoryCloser {
  void operator()(DIR* directory) const { closedir(directory); }
};

// A folder held open to list it, which closes itself.
using Directory = std::unique_ptr<DIR, DirectoryCloser>;

// Returns 0 when `path` exists, -1 when it is null, empty or absent.
[[nodiscard]] int check_path_exist(const char* path);

// Makes the directory `path` and its missing parents with `mode` (0 means 0700). Returns 0, also when it
// exists, or -1.
[[nodiscard]] int make_dir_include_parent(const char* path, mode_t mode);

// Removes the file `path`. Returns 0 when it is gone or was absent, else -1.
[[nodiscard]] int _remove_file(const char* path);

// Removes whatever is at `path`, a folder with all that is in it. Follows no link.
void remove_path(const char* path);

// Makes sure that `path` is a folder of our own user which nobody else may enter: what is there and is not is
// replaced. Its parent has to exist. Returns whether it is.
[[nodiscard]] bool claim_folder(const char* path);

}  // namespace remvol

#endif
