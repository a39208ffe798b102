// The command that drives flashrun: its only text stands here.
#ifndef REMVOL_SUPPORT_FLASHRUN_H
#define REMVOL_SUPPORT_FLASHRUN_H

#include "support/text.h"

namespace remvol {

// Copies the file to the configuration flash, which is writable for that one command.
[[nodiscard]] CommandText copy_to_flash_command(const char* path);

}  // namespace remvol

#endif
