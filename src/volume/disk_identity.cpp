#include "volume/disk_identity.h"

#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "support/files.h"
#include "support/text.h"
#include "volume/device.h"
#include "volume/mount_table.h"

namespace remvol {

namespace {

constexpr const char* kBlockDisks = "/sys/block";
constexpr const char* kSession = "/session";

using SysfsPath = char[PATH_MAX];

// Resolves the disk's `device` link: .../host2/session1/target2:0:0/2:0:0:1 for a LUN. A virtual device has
// none. A failure leaves its reason in errno.
bool find_device(const char* node, SysfsPath& path) {
  const Text<256> disk = disk_of_node(node);
  errno = ENOENT;
  return !disk.empty() &&
         realpath(PathText("%s/%s/%s", kBlockDisks, disk.c_str(), "device"), path) != nullptr;
}

// Returns the end of the path's component sessionN, or null when it has none.
const char* find_session_end(const char* path) {
  for (const char* at = path; (at = strstr(at, kSession)) != nullptr; at++) {
    const char* number = at + strlen(kSession);
    const char* end = number + strspn(number, "0123456789");
    if (end != number && *end == '/') return end;
  }
  return nullptr;
}

// Reads the target's name from sessionN/iscsi_session/sessionN/targetname. Returns whether it has one; a
// failure leaves its reason in errno.
bool read_session_target(const char* path, const char* session_end, char (&name)[256]) {
  const Text<PATH_MAX> session("%.*s", static_cast<int>(session_end - path), path);
  const char* session_name = strrchr(session, '/');
  return read_session_name(Text<PATH_MAX>("%s/iscsi_session%s/targetname", session.c_str(), session_name),
                           name);
}

// Reads the LUN from the last component, H:C:T:L. It is the number that the session listing shows and the
// tree holds: of a LUN above 255 with the bits of its addressing method (256 is 16640, 0x4100).
bool read_lun(const char* path, long long* lun) {
  return sscanf(strrchr(path, '/'), "/%*u:%*u:%*u:%lld", lun) == 1;
}

// The disk that this run was last told to be its entry's own.
struct OwnDisk {
  Text<256> disk;
  char target_name[sizeof TargetEntry::target_name];
  int lun;
};

OwnDisk own_disk;

void remember_own_disk(const TargetEntry* entry, const char* node) {
  own_disk.disk = disk_of_node(node);
  copy_text(own_disk.target_name, entry->target_name);
  own_disk.lun = entry->lun;
}

bool was_own_disk(const TargetEntry* entry, const char* node) {
  return strcmp(own_disk.disk, disk_of_node(node)) == 0 &&
         strcmp(own_disk.target_name, entry->target_name) == 0 && own_disk.lun == entry->lun;
}

void log_foreign(const TargetEntry* entry, const char* node) {
  LOG(0, "%s is not the disk of LUN %d of %s, it is left alone", node, entry->lun, entry->target_name);
}

// Whether a look has failed for what is not there. That alone tells nothing: memory or descriptors that have
// run out, and a disk that goes away just then, make no disk ours, nor nobody's.
bool is_absent() {
  return errno == ENOENT || errno == ENOTDIR || errno == ENAMETOOLONG;
}

DiskOwner owner_unseen() {
  return is_absent() ? kDiskUnknown : kDiskForeign;
}

SessionDisk session_unseen() {
  return is_absent() ? SessionDisk::kNo : SessionDisk::kUnseen;
}

// Looks for the session in the path of a disk, if it was found.
SessionDisk session_of(bool found, const char* path, const char* target_name) {
  if (!found) return session_unseen();
  const char* session_end = find_session_end(path);
  if (session_end == nullptr) return SessionDisk::kNo;
  if (target_name == nullptr) return SessionDisk::kYes;
  char name[256];
  if (!read_session_target(path, session_end, name)) return session_unseen();
  return strcmp(name, target_name) == 0 ? SessionDisk::kYes : SessionDisk::kNo;
}

struct EntryPath {
  const TargetEntry* entry;
  const char* path;
};

// A disk keeps its name for as long as it is mounted.
bool is_others_mount(const MountLine& mount, const void* what) {
  const auto* wanted = static_cast<const EntryPath*>(what);
  return strcmp(mount.path, wanted->path) == 0 && disk_owner(wanted->entry, mount.source) == kDiskForeign;
}

}  // namespace

DiskOwner disk_owner(const TargetEntry* entry, const char* node) {
  SysfsPath path;
  if (entry->target_name[0] == '\0') return kDiskUnknown;
  if (!find_device(node, path)) return owner_unseen();
  const char* session_end = find_session_end(path);
  if (session_end == nullptr) return kDiskForeign;
  char name[256];
  long long lun = 0;
  if (!read_session_target(path, session_end, name)) return owner_unseen();
  if (!read_lun(path, &lun)) return kDiskUnknown;
  return strcmp(name, entry->target_name) == 0 && lun == entry->lun ? kDiskOurs : kDiskForeign;
}

SessionDisk is_session_disk(const char* node, const char* target_name) {
  SysfsPath path;
  return session_of(find_device(node, path), path, target_name);
}

SessionDisk is_session_device(dev_t device, const char* target_name) {
  SysfsPath path;
  const PathText link("/sys/dev/block/%u:%u", major(device), minor(device));
  return session_of(realpath(link, path) != nullptr, path, target_name);
}

bool read_session_name(const char* file_path, char (&name)[256]) {
  const File file(fopen(file_path, "re"));
  if (file) errno = ENOENT;  // also for an empty one
  if (!file || fgets(name, sizeof name, file.get()) == nullptr) return false;
  name[strcspn(name, "\n")] = '\0';
  return name[0] != '\0';
}

bool has_disk(const char* node) {
  return access(PathText("/sys/block/%s", disk_of_node(node).c_str()), F_OK) == 0;
}

bool is_foreign_disk(const TargetEntry* entry, const char* node) {
  const DiskOwner owner = disk_owner(entry, node);
  if (owner == kDiskOurs) remember_own_disk(entry, node);
  if (owner == kDiskOurs || (owner == kDiskUnknown && !was_own_disk(entry, node))) return false;
  log_foreign(entry, node);
  return true;
}

bool is_foreign_mount(const TargetEntry* entry, const char* path) {
  char real[PATH_MAX];
  const EntryPath wanted = {entry, realpath(path, real) != nullptr ? real : path};
  MountLine mount;
  if (find_mount(is_others_mount, &wanted, &mount) != Mounted::kYes) return false;
  log_foreign(entry, mount.source);
  return true;
}

}  // namespace remvol
