#include "tasks/start_stop.h"

#include "frontend/log.h"
#include "iscsi/iface.h"
#include "iscsi/initiator.h"
#include "iscsi/settings_daemon.h"
#include "tasks/whole_target.h"
#include "tree/state.h"
#include "upgrade/remvol_ver_upgrade.h"
#include "volume/share_services.h"
#include "volume/unmount.h"

namespace remvol {

int task_init() {
  const LogScope scope;
  LOG(2, "start");
  // Without a version the tree is dumped over no settings.
  if (start_settings_daemon()) {
    if (is_remvol_ver_changed() != 0) (void)version_upgrade();
    (void)set_remvol_ver_to_db(kSettingsVersion);
  }
  const InitiatorName name = start_initiator();
  (void)Iface_Config_Gen();
  (void)ktree_update_initiator_iqn(name);
  (void)Target_load_all();
  LOG(2, "end");
  return 0;
}

int task_deinit(int system_off) {
  const LogScope scope;
  LOG(2, system_off != 0 ? "system off" : "deinit start");
  Target_umount_all();
  (void)log_out_all();
  bool succeeded = stop_initiator();
  LOG(2, "deinit end");
  if (system_off == 0) {
    LOG(1, "update share folder status");
    reload_share_services();
    LOG(1, "finish share folder status");
    succeeded = unload_modules();
  }
  stop_settings_daemon();
  return succeeded ? 0 : 1;
}

}  // namespace remvol
