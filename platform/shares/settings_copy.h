// The copy of the settings on the configuration flash: whatever happens while it is written, a whole old one
// or a whole new one is there afterwards.
#ifndef PLATFORM_SHARES_SETTINGS_COPY_H
#define PLATFORM_SHARES_SETTINGS_COPY_H

#include <linux/limits.h>

namespace flash {

inline constexpr char kFlashFolder[] = "/usr/local/config";
inline constexpr char kSettingsName[] = "vv.xml";

// A command that does nothing but copy the settings: "cp [-f] SOURCE FOLDER[/[vv.xml]]", one line or words.
struct SettingsCopy {
  char source[PATH_MAX];

  // Takes `command` apart. Returns false when it is another one.
  bool parse(char** command);

  // Copies in one step: into another file, which is synced and takes the name. Returns an exit status; a
  // failure is told on standard error.
  int run() const;
};

// Keeps a copy of whole settings beside them while a command runs that may write into them. Settings that a
// command left torn are put back, by settle() or, when that was never reached, by the next KeptSettings or
// SettingsCopy. A command may remove the settings.
class KeptSettings {
 public:
  KeptSettings() = default;
  KeptSettings(const KeptSettings&) = delete;
  KeptSettings& operator=(const KeptSettings&) = delete;
  ~KeptSettings();

  // Returns false when there are no whole settings, or no room for a second copy of them.
  bool keep();

  // Writes the settings out. Returns false when they were torn and had to be put back, which is told on
  // standard error.
  bool settle();

 private:
  int folder_ = -1;
  int kept_ = -1;  // locked for as long as it is in use
  char name_[64] = "";
};

}  // namespace flash

#endif
