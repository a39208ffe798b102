// Bringing the initiator up and down: the handlers of init, deinit and system_off.
#ifndef REMVOL_ISCSI_INITIATOR_H
#define REMVOL_ISCSI_INITIATOR_H

namespace remvol {

// Brings the whole initiator up. Always returns 0: a failed step is logged and the next one runs.
int task_init();

// Takes it down; `system_off` non-zero leaves modules and shares as they are, since the machine is about to
// stop. Returns 0, or 1 when the last command of the teardown failed.
int task_deinit(int system_off);

}  // namespace remvol

#endif
