// The commands that drive fuser(1): every text of them stands here. They end every process that uses what is
// mounted from a device, or on a path, and the path itself.
//
// One puts the device between double quotes and one does not. What watches this tool's commands knows them
// so.
#ifndef REMVOL_SUPPORT_FUSER_H
#define REMVOL_SUPPORT_FUSER_H

#include "support/text.h"

namespace remvol {

// For a mount point, or for a device that is about to be formatted.
[[nodiscard]] CommandText end_users_command(const char* path);

// For the device that was mounted.
[[nodiscard]] CommandText end_node_users_command(const char* node);

}  // namespace remvol

#endif
