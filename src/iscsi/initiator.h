// The initiator of the system: its kernel modules, its daemon and the files that it reads. A step that fails
// is logged in the innermost scope's name, and the next one runs.
#ifndef REMVOL_ISCSI_INITIATOR_H
#define REMVOL_ISCSI_INITIATOR_H

#include "iscsi/initiator_name.h"

namespace remvol {

// Starts it anew, with modules and files of this appliance. Returns the name that it has now.
[[nodiscard]] InitiatorName start_initiator();

// Has its daemon end. Returns whether there was one to tell so.
[[nodiscard]] bool stop_initiator();

// Unloads its modules. Returns whether the last one was unloaded.
[[nodiscard]] bool unload_modules();

}  // namespace remvol

#endif
