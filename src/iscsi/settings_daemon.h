// The daemon of the configuration tree that holds all settings.
#ifndef REMVOL_ISCSI_SETTINGS_DAEMON_H
#define REMVOL_ISCSI_SETTINGS_DAEMON_H

namespace remvol {

// Starts it and loads the settings, unless it runs. Settings that are missing or damaged are replaced by
// their copy on the configuration flash. A failed step is logged in the innermost scope's name. Returns false
// when settings are there that could not be loaded, though nothing is said against them: the tree without
// them is not to be taken for theirs.
[[nodiscard]] bool start_settings_daemon();

// Has it end.
void stop_settings_daemon();

}  // namespace remvol

#endif
