// The commands that drive insmod(8) and rmmod(8): every text of them stands here.
#ifndef REMVOL_ISCSI_KMOD_H
#define REMVOL_ISCSI_KMOD_H

#include "support/text.h"

namespace remvol {

// Loads a module, by its file's name, from the folder of the appliance's drivers.
[[nodiscard]] CommandText load_module_command(const char* module);

// Unload a module; the second form says nothing when it is not loaded.
[[nodiscard]] CommandText unload_module_command(const char* module);
[[nodiscard]] CommandText unload_module_quietly_command(const char* module);

}  // namespace remvol

#endif
