// The files by which the tool's runs, and the platform's programs, know of each other while the machine runs.
#ifndef REMVOL_RUN_FILES_H
#define REMVOL_RUN_FILES_H

#include <cstdint>

namespace remvol {

inline constexpr char kRunDir[] = "/run/remvol";  // only root may enter it

// The name of a run's lock file, by printf(3): the kind, and name_hash() of the target's name. A run that
// works on a target as a whole has the file of the kind kTargetLock locked alone (flock(2), LOCK_EX); one
// that works on a LUN of it has that shared, and the file of the kind kLunLock, with the LUN's number, alone.
inline constexpr char kLockFormat[] = "%s-%016llx.lock";
inline constexpr char kTargetLock[] = "target";
inline constexpr char kLunLock[] = "lun-%d";

// Whoever uses the numbers of the tree's slots has it locked shared, and who adds or deletes slots alone.
inline constexpr char kSlotsLock[] = "slots.lock";

// The run that recovers has a record lock on it (fcntl(2), F_WRLCK).
inline constexpr char kRecoverLock[] = "/var/lock/virtual_volume/remvol_recover.lock";

// FNV-1a.
constexpr unsigned long long name_hash(const char* name) {
  uint64_t hash = 14695981039346656037U;
  for (; *name != '\0'; name++) hash = (hash ^ static_cast<unsigned char>(*name)) * 1099511628211U;
  return hash;
}

}  // namespace remvol

#endif
