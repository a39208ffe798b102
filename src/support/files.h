// Paths and files.
#ifndef REMVOL_SUPPORT_FILES_H
#define REMVOL_SUPPORT_FILES_H

#include <sys/types.h>

#include <cstdio>
#include <memory>

namespace remvol {

struct FileCloser {
  void operator()(FILE* file) const { fclose(file); }
};

// A stdio file that closes itself.
using File = std::unique_ptr<FILE, FileCloser>;

// Returns 0 when `path` exists, -1 when it is null, empty or absent.
int check_path_exist(const char* path);

// Makes the directory `path` and its missing parents with `mode` (0 means 0700). Returns 0, also when it
// exists, or -1.
int make_dir_include_parent(const char* path, mode_t mode);

// Removes the file `path`. Returns 0 when it is gone or was absent, else -1.
int _remove_file(const char* path);

// Prepares a temporary file with a name that others can guess: removes anything at `path` that is not a
// regular file of our own user, so that what is written next neither follows a planted link nor is refused by
// fs.protected_regular (proc_sys_fs(5)).
void clear_temp_path(const char* path);

}  // namespace remvol

#endif
