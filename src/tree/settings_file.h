// The settings file on disk beside the tree that it is made of: no dump may cost settings.
#ifndef REMVOL_TREE_SETTINGS_FILE_H
#define REMVOL_TREE_SETTINGS_FILE_H

namespace remvol {

// Returns whether there is a file at `path` that does not end like a settings file: it is empty or cut off.
[[nodiscard]] bool settings_file_is_torn(const char* path);

// Returns whether the settings file at `path` is there and cannot be read just now. No regular file is none.
[[nodiscard]] bool settings_file_is_unreadable(const char* path);

// Returns the file that a dump would lose the settings of, kSettingsFile or kFlashCopy: it has a settings
// version and the tree has none, or it is of version 0, which has none, and the tree holds nothing of such
// settings either, so the tree was started and never loaded. A look at the first mebibytes of its text, not a
// check; one that cannot be read may hold anything. Returns null when there is none.
[[nodiscard]] const char* unloaded_settings();

// Waits for a tree that was started anew until it has loaded its settings, at most 5 s in a run, and the time
// that the looks take. Returns whether it has: one that was not loaded from them knows nothing, whatever
// others have stored in it by now.
[[nodiscard]] bool await_loaded_settings();

// Dumps the tree to kSettingsFile. A dump that is withheld or fails is logged at level 0 in the innermost
// scope's name; one for which there is no folder is told on standard error. Returns whether what
// kSettingsFile holds then may go to the configuration flash.
[[nodiscard]] bool store_settings();

// Keeps kSettingsFile, which could not be loaded, under the name kDamagedSettingsFile as well.
void keep_damaged_settings();

inline constexpr char kFlashCopy[] = "/usr/local/config/vv.xml";
inline constexpr char kDamagedSettingsFile[] = "/etc/NAS_CFG/vv.xml.damaged";

}  // namespace remvol

#endif
