// The commands that drive chmod(1), dd(1), mkdir(1) and rm(1): every text of them stands here. Values reach
// them only as text; see shell_text.h.
#ifndef REMVOL_SUPPORT_COREUTILS_H
#define REMVOL_SUPPORT_COREUTILS_H

#include "support/text.h"

namespace remvol {

// Makes the folder, and those that are missing above it.
[[nodiscard]] CommandText make_folder_command(const char* path);

// The same for a path of the system's own, without quotes.
[[nodiscard]] CommandText make_system_folder_command(const char* path);

// Removes the folder with all that is in it.
[[nodiscard]] CommandText remove_folder_command(const char* path);

// Gives everybody every right to the folder.
[[nodiscard]] CommandText open_folder_command(const char* path);

// Overwrites the first mebibyte of the device.
[[nodiscard]] CommandText wipe_beginning_command(const char* node);

}  // namespace remvol

#endif
