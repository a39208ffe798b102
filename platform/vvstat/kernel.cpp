#include "vvstat/kernel.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>

#include "common/fd.h"
#include "common/mounts.h"
#include "common/sessions.h"

#include "run_files.h"

namespace vvstat {
namespace {

using platform::Link;
using platform::Session;

// The table of mounts, read when it is first asked for: the kernel writes all of it anew for every reader.
class MountTable {
 public:
  const platform::Mount* on(std::string_view point) {
    if (!read_) mounts_ = platform::read_mounts();
    read_ = true;
    return platform::mount_on(mounts_, point);
  }

 private:
  std::vector<platform::Mount> mounts_;
  bool read_ = false;
};

// Asks for mount points, which have one folder as a rule: that is looked for once. Where it is missing, so
// are they.
class MountPoints {
 public:
  // Returns whether there is an answer; errno says why not.
  bool ask(const std::string& path, struct statx& info) {
    const size_t slash = path.rfind('/');
    const bool has_folder = slash != std::string::npos && slash > 0 && slash + 1 < path.size();
    if (has_folder && path.compare(0, slash, folder_) != 0) enter(path.substr(0, slash));
    if (!has_folder || !(file_.ok() || is_missing_)) return ask(AT_FDCWD, path.c_str(), info);
    if (is_missing_) errno = ENOENT;
    return !is_missing_ && ask(file_.get(), path.c_str() + slash + 1, info);
  }

 private:
  static bool ask(int folder, const char* path, struct statx& info) {
    constexpr int kFlags = AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC | AT_SYMLINK_NOFOLLOW;
    return statx(folder, path, kFlags, STATX_BTIME, &info) == 0;
  }

  void enter(const std::string& folder) {
    folder_ = folder;
    file_.reset(open(folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    is_missing_ = !file_.ok() && (errno == ENOENT || errno == ENOTDIR);
  }

  std::string folder_;
  platform::Fd file_;
  bool is_missing_ = false;
};

// What is asked for all volumes together.
struct Tables {
  MountTable mounts;
  MountPoints points;
};

// statx(2) tells the root of a mount since Linux 5.8, from the inode at hand, and with it when that was made:
// the file system's own beginning. An XFS that has shut itself down fails even that; it is mounted all the
// same.
bool find_mount(const std::string& path, Tables& tables, VolumeFacts& facts, dev_t& device) {
  struct statx info {};
  if (tables.points.ask(path, info)) {
    device = makedev(info.stx_dev_major, info.stx_dev_minor);
    if ((info.stx_mask & STATX_BTIME) != 0) facts.made = static_cast<time_t>(info.stx_btime.tv_sec);
    return (info.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
  }
  if (errno != EIO) return false;
  const platform::Mount* mount = tables.mounts.on(path);
  if (mount == nullptr) return false;
  facts.shut_down = true;
  device = mount->device;
  return true;
}

// The kernel's name of a disk or partition, such as "sdb1"; empty when there is none, or no more.
std::string disk_name_of(dev_t device) {
  const std::string link =
      "/sys/dev/block/" + std::to_string(major(device)) + ":" + std::to_string(minor(device));
  char target[PATH_MAX] = "";
  const ssize_t size = readlink(link.c_str(), target, sizeof target - 1);
  if (size <= 0) return {};
  const std::string path(target, static_cast<size_t>(size));
  return path.substr(path.rfind('/') + 1);
}

// The beginning of a file of sysfs, which holds a number; empty when it cannot be read.
std::string number_in(const std::string& path) {
  char text[32];
  const platform::Fd file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  const ssize_t size = file.ok() ? read(file.get(), text, sizeof text) : 0;
  return {text, size > 0 ? static_cast<size_t>(size) : 0};
}

bool is_read_only_disk(const std::string& name) {
  if (name.empty() || name.find('/') != std::string::npos) return false;
  return number_in("/sys/class/block/" + name + "/ro").starts_with('1');
}

// Whether the ext4 on that disk or partition has met an error since it was made or repaired.
bool has_met_errors(const std::string& name) {
  return strtoul(number_in("/sys/fs/ext4/" + name + "/errors_count").c_str(), nullptr, 10) != 0;
}

// Linux 6.1.192, 6.12 and 6.13 show nothing of an ext4 that refuses every write since it met an error: only a
// try tells. One that has met none is not tried.
bool refuses_writes(const std::string& mount_point, const std::string& disk) {
  if (!has_met_errors(disk)) return false;
  const platform::Fd file(open(mount_point.c_str(), O_TMPFILE | O_WRONLY | O_CLOEXEC, 0600));
  return !file.ok() && (errno == EROFS || errno == EIO);
}

std::string options_of(const std::string& mount_point, MountTable& mounts) {
  const platform::Mount* mount = mounts.on(mount_point);
  return mount != nullptr ? mount->options : std::string();
}

VolumeFacts facts_of(const Volume& volume, bool answering, Detail detail, Tables& tables) {
  VolumeFacts facts;
  dev_t device{};
  struct statvfs space {};
  if (volume.mount_point.empty() || !find_mount(volume.mount_point, tables, facts, device) ||
      statvfs(volume.mount_point.c_str(), &space) != 0) {
    return {};
  }
  const std::string disk = disk_name_of(device);
  facts.mounted = true;
  facts.disk_lost = major(device) != 0 && disk.empty() && access("/sys/dev/block", F_OK) == 0;
  facts.read_only = (space.f_flag & ST_RDONLY) != 0 || facts.shut_down ||
                    (answering && !disk.empty() && refuses_writes(volume.mount_point, disk));
  facts.disk_read_only = facts.read_only && is_read_only_disk(volume.device);
  facts.size = static_cast<unsigned long long>(space.f_blocks) * space.f_frsize;
  facts.used = static_cast<unsigned long long>(space.f_blocks - space.f_bfree) * space.f_frsize;
  if (detail == Detail::kAll) facts.options = options_of(volume.mount_point, tables.mounts);
  return facts;
}

// Whether a run of the tool has that lock for itself. What is tried in vain is held for a moment otherwise.
bool is_held(const char* kind, const std::string& target) {
  char name[64];
  snprintf(name, sizeof name, remvol::kLockFormat, kind, remvol::name_hash(target.c_str()));
  const std::string path = std::string(remvol::kRunDir) + "/" + name;
  const platform::Fd lock(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
  return lock.ok() && flock(lock.get(), LOCK_SH | LOCK_NB) != 0 && errno == EWOULDBLOCK;
}

bool is_worked_on(const Volume& volume, const std::string& target) {
  char lun[32];
  snprintf(lun, sizeof lun, remvol::kLunLock, volume.lun);
  return is_held(remvol::kTargetLock, target) || is_held(lun, target);
}

const Session* session_of(const Target& target, const std::vector<Session>& sessions) {
  const Session* found = nullptr;
  for (const Session& session : sessions) {
    if (session.target == target.name && (found == nullptr || session.link == Link::kUp)) found = &session;
  }
  return found;
}

}  // namespace

std::vector<TargetFacts> read_facts(const Status& status, Detail detail) {
  const std::vector<Session> sessions = platform::read_sessions();
  Tables tables;
  std::vector<TargetFacts> all;
  for (const Target& target : status.targets) {
    TargetFacts facts;
    const Session* session = session_of(target, sessions);
    if (session != nullptr) {
      facts.session = session->state;
      if (detail == Detail::kAll) facts.address = platform::address_of(*session);
    }
    const bool answering = session != nullptr && session->link == Link::kUp;
    facts.volumes.reserve(target.volumes.size());
    for (const Volume& volume : target.volumes) {
      VolumeFacts& of_volume = facts.volumes.emplace_back(facts_of(volume, answering, detail, tables));
      of_volume.worked_on = answering && !of_volume.mounted && is_worked_on(volume, target.name);
    }
    all.push_back(std::move(facts));
  }
  return all;
}

}  // namespace vvstat
