// Moving or removing a folder that must take no data meanwhile. The immutable flag also forbids to rename and
// to remove a folder; without it there is a moment in which a busy writer gets a file in. So the folder is
// covered: everybody finds an empty read-only file system on it, but for one process, which has a mount
// namespace of its own and does the work there.
#ifndef REMVOL_VOLUME_COVER_H
#define REMVOL_VOLUME_COVER_H

namespace remvol {

// Runs `work(what)` in that process while the folder `path` is covered. Returns what it returns; false, and
// `work` has not run, when there can be no cover. The cover goes with a folder that is removed, comes along
// with one that is renamed (lift_cover takes it off), and is taken off when the work failed.
[[nodiscard]] bool run_covered(const char* path, bool (*work)(const void* what), const void* what);

// Takes the cover off the folder.
void lift_cover(const char* path);

// Takes off a cover that a killed run has left on the folder; what else is mounted there stays.
void lift_left_cover(const char* path);

}  // namespace remvol

#endif
