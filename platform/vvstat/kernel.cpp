#include "kernel.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

#include <cstdio>

#include "sessions.h"

namespace vvstat {
namespace {

using platform::Link;
using platform::Session;

// statx(2) tells the root of a mount since Linux 5.8, from the inode at hand.
bool is_mount_point(const std::string& path) {
  struct statx info {};
  constexpr int kFlags = AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC | AT_SYMLINK_NOFOLLOW;
  return statx(AT_FDCWD, path.c_str(), kFlags, 0, &info) == 0 &&
         (info.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

bool is_read_only_disk(const std::string& name) {
  if (name.empty() || name.find('/') != std::string::npos) return false;
  FILE* file = fopen(("/sys/class/block/" + name + "/ro").c_str(), "re");
  if (file == nullptr) return false;
  const bool read_only = fgetc(file) == '1';
  fclose(file);
  return read_only;
}

VolumeFacts facts_of(const Volume& volume) {
  VolumeFacts facts;
  facts.disk_read_only = is_read_only_disk(volume.device);
  struct statvfs space {};
  if (volume.mount_point.empty() || !is_mount_point(volume.mount_point) ||
      statvfs(volume.mount_point.c_str(), &space) != 0)
    return facts;
  facts.mounted = true;
  facts.read_only = (space.f_flag & ST_RDONLY) != 0;
  facts.size = static_cast<unsigned long long>(space.f_blocks) * space.f_frsize;
  facts.used = static_cast<unsigned long long>(space.f_blocks - space.f_bfree) * space.f_frsize;
  return facts;
}

const Session* session_of(const Target& target, const std::vector<Session>& sessions) {
  const Session* found = nullptr;
  for (const Session& session : sessions) {
    if (session.target == target.name && (found == nullptr || session.link == Link::kUp)) found = &session;
  }
  return found;
}

}  // namespace

std::vector<TargetFacts> read_facts(const Status& status) {
  const std::vector<Session> sessions = platform::read_sessions();
  std::vector<TargetFacts> all;
  for (const Target& target : status.targets) {
    TargetFacts facts;
    if (const Session* session = session_of(target, sessions)) {
      facts.session = session->state;
      facts.address = platform::address_of(*session);
    }
    for (const Volume& volume : target.volumes) facts.volumes.push_back(facts_of(volume));
    all.push_back(facts);
  }
  return all;
}

}  // namespace vvstat
