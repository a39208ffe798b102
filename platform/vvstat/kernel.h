// What the kernel says of the targets and volumes of the tree: it is newer than the tree, whose texts are as
// old as the last command that wrote them.
#ifndef PLATFORM_VVSTAT_KERNEL_H
#define PLATFORM_VVSTAT_KERNEL_H

#include <ctime>
#include <string>
#include <vector>

#include "vvstat/status.h"

namespace vvstat {

// How much is to be known.
enum class Detail {
  kHealth,
  kAll,  // also what only a long report shows
};

struct VolumeFacts {
  bool mounted = false;         // something is mounted on its mount point
  bool disk_lost = false;       // its disk is gone, though a disk may be there anew
  bool read_only = false;       // that mount is, or its file system refuses writes
  bool disk_read_only = false;  // and so is the disk itself: the LUN is write-protected
  unsigned long long used = 0;  // bytes, while it is mounted
  unsigned long long size = 0;
  bool shut_down = false;  // its file system refuses everything
  time_t made = 0;         // its file system was; 0: it is not mounted, or does not tell
  bool worked_on = false;  // a run of the tool has it; known of one that is not mounted though its target
                           // is logged in
  std::string options{};   // of the mount; of Detail::kAll
};

struct TargetFacts {
  std::string session;  // its state: LOGGED_IN, FAILED, FREE; empty without a session
  std::string address;  // the portal that it is connected with, without its port; of Detail::kAll
  std::vector<VolumeFacts> volumes;  // in the order of the tree
};

// Reads /sys/class/iscsi_session, and of what is mounted statx(2), statvfs(3), the disk's
// /sys/class/block/NAME/ro and the errors that an ext4 has counted; none of it waits for a disk. One with
// errors, whose target answers, is asked for a file without a name, which leaves nothing behind: only that
// tells whether it refuses writes. A run of the tool is known by its lock (run_files.h). For all there is to
// know, and where a file system has shut itself down, also /proc/self/mountinfo. The facts are in the order
// of status.targets; what cannot be read counts as not there. Of several sessions of one target the one that
// is logged in counts.
std::vector<TargetFacts> read_facts(const Status& status, Detail detail);

}  // namespace vvstat

#endif
