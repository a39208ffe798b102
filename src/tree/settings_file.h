// The settings file on disk beside the tree that it is made of: no dump may cost settings.
#ifndef REMVOL_TREE_SETTINGS_FILE_H
#define REMVOL_TREE_SETTINGS_FILE_H

namespace remvol {

// Returns whether the settings file at `path` holds a settings version. A look at the first mebibytes of its
// text, not a check of the file.
[[nodiscard]] bool settings_file_has_version(const char* path);

// The same for a settings version or, as those of version 0 have none, a count of targets.
[[nodiscard]] bool settings_file_has_targets(const char* path);

// Returns whether there is a file at `path` that does not end like a settings file: it is empty or cut off.
[[nodiscard]] bool settings_file_is_torn(const char* path);

// Returns whether a dump would lose settings: the tree has no settings version and kSettingsFile has one, so
// the tree was started and never loaded.
[[nodiscard]] bool dump_would_bury_settings();

// Dumps the tree to kSettingsFile. A dump that is withheld or fails is logged at level 0 in the innermost
// scope's name; one for which there is no folder is told on standard error. Returns whether what
// kSettingsFile holds then may go to the configuration flash.
[[nodiscard]] bool store_settings();

// Keeps kSettingsFile, which could not be loaded, under the name kDamagedSettingsFile as well.
void keep_damaged_settings();

inline constexpr char kDamagedSettingsFile[] = "/etc/NAS_CFG/vv.xml.damaged";

}  // namespace remvol

#endif
