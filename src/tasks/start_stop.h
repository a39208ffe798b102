// Bringing the appliance up and down: the handlers of init, deinit and system_off.
#ifndef REMVOL_TASKS_START_STOP_H
#define REMVOL_TASKS_START_STOP_H

namespace remvol {

// Brings everything up, from the settings to the volumes. Always returns 0: a failed step is logged and the
// next one runs.
[[nodiscard]] int task_init();

// Takes it down; `system_off` non-zero leaves modules and shares as they are, since the machine is about to
// stop. Returns 0, or 1 when the last command of the teardown failed.
[[nodiscard]] int task_deinit(int system_off);

}  // namespace remvol

#endif
