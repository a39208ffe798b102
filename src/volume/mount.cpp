#include "volume/mount.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "support/coreutils.h"
#include "support/result.h"
#include "support/session_hold.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/lun_walk.h"
#include "tree/state.h"
#include "volume/bare_folder.h"
#include "volume/degrade.h"
#include "volume/disk_identity.h"
#include "volume/file_systems.h"
#include "volume/format.h"
#include "volume/lun_status.h"
#include "volume/mount_command.h"
#include "volume/mount_point.h"
#include "volume/mount_table.h"
#include "volume/partition.h"
#include "volume/share_services.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

// A device node held open.
class HeldNode {
 public:
  HeldNode() = default;
  ~HeldNode() { release(); }
  HeldNode(const HeldNode&) = delete;
  HeldNode& operator=(const HeldNode&) = delete;

  void hold(const char* node) {
    release();
    fd_ = open(node, O_RDONLY | O_NONBLOCK | O_CLOEXEC);  // it may be no disk but a pipe
  }
  void release() {
    if (fd_ >= 0) close(fd_);
    fd_ = -1;
  }

 private:
  int fd_ = -1;
};

// What the steps of a mount hand on.
struct Mounting {
  TargetEntry* entry;
  int force_format;
  bool asked;        // for a format, whatever there is
  bool looks_empty;  // the format is forced only because no partition carries anything that is recognised
  PartitionList partitions;
  Text<64> node;  // of the chosen partition, or of the last one examined
  // While a node is open the kernel keeps what was read of it, so that the looks at a file system which
  // follow one another read the disk once. It is not open during a format, which kills whoever uses the node,
  // nor longer than the looks, since an unmount by another run does that too.
  HeldNode held;
  char fs_type[64];  // on the node; empty when none is known
  ContentMark mark;  // the node's when the format was decided
  bool standing;     // at the last look: the node is mounted on the volume's own mount point already
  bool stood;        // at an earlier one
  MountPointText mount_point;
};

MountResult check_entry(const TargetEntry* entry) {
  if (entry == nullptr || entry->dev[0] == '\0') {
    LOG(0, "Error entry");
    return kMountFailed;
  }
  if (entry->db_idx <= 0 || entry->lun_db_idx <= 0) {
    LOG(0, "Error entry - db_idx or lun_db_idx is not given");
    return kMountFailed;
  }
  if (entry->share[0] == '\0') {
    LOG(0, "Error entry - share name is empty");
    return kMountFailed;
  }
  if (!is_share_inside_root(entry->share)) return kMountNoMountPoint;
  return kMounted;
}

// Takes the result of an update of the LUN's states; a failure is logged. Returns whether it was stored.
bool note_update(int result) {
  if (result != kOk) LOG(0, "Update ktree FAILED");
  return result == kOk;
}

// Returns whether the tree took it.
bool record_access_right(const TargetEntry* entry, int right) {
  const int result = ktree_update_lun_vol_access_right(right, entry->db_idx, entry->lun_db_idx);
  if (result == kOk) return true;
  LOG(0, "ktree_update_lun_vol_access_right to %s, FAILED, ret = %d", right == VOL_AC_RW ? "RW" : "RO",
      result);
  return false;
}

bool detect_fs(Mounting* volume) {
  memset(volume->fs_type, 0, sizeof volume->fs_type);
  if (sys_get_fs_type(volume->fs_type, volume->node) != 0) volume->fs_type[0] = '\0';
  return volume->fs_type[0] != '\0';
}

// Returns whether it names what is left of a file system whose beginning is lost, not a file system: after a
// format that failed, of the one that was to be overwritten.
bool is_remains(const char* fs_type) {
  constexpr char kDamaged[] = "damaged_";
  return strncmp(fs_type, kDamaged, strlen(kDamaged)) == 0;
}

bool is_usable(Mounting* volume) {
  volume->held.hold(volume->node);
  return sys_check_dev(volume->node) == 0;
}

bool is_recognised(Mounting* volume) {
  return is_usable(volume) && detect_fs(volume);
}

bool is_standing(Mounting* volume) {
  MountLine mount;
  volume->standing = is_mounted_from(volume->node, volume->mount_point, &mount);
  if (volume->standing && !detect_fs(volume)) copy_text(volume->fs_type, mount.type);
  return volume->standing;
}

// Takes the first partition that passes the test. Returns whether there is one.
bool find_partition(Mounting* volume, bool (*passes)(Mounting*)) {
  PartitionList names;
  copy_text(names, volume->partitions);
  char* rest = nullptr;
  for (char* name = strtok_r(names, " ,", &rest); name != nullptr; name = strtok_r(nullptr, " ,", &rest)) {
    volume->node = Text<64>("/dev/%s", name);
    if (passes(volume)) return true;
  }
  return false;
}

MountResult pick_partition(Mounting* volume) {
  if (find_partition(volume, is_recognised)) return kMounted;
  if (!volume->stood) {
    volume->looks_empty = volume->force_format == 0;
    volume->force_format = 1;
  }
  if (!find_partition(volume, is_usable)) return kMountNoPartition;
  return kMounted;
}

// Data that nobody asked to overwrite is never formatted: what is recognised on a second look is mounted, and
// what was recognised on the first, or stood mounted, is not taken for empty on the second, which only a
// fault can make of it. Returns whether the node can be used.
bool protect_data(Mounting* volume) {
  const bool known = volume->fs_type[0] != '\0';
  if (known && volume->looks_empty) volume->force_format = 0;
  if (known || volume->force_format != 0) return true;
  LOG(0, "%s carried a file system a moment ago and shows none now, it is left alone", volume->node.c_str());
  return false;
}

MountResult create_file_system(Mounting* volume) {
  LOG(kNote, "Got FS type = %s, creating volume", volume->fs_type);
  volume->held.release();
  const SeenContent seen = {volume->fs_type, volume->mark};
  const FormatResult result = Target_format(volume->entry, volume->node, volume->asked ? nullptr : &seen);
  if (result == kFormatted || (result == kFormatLeftAlone && !volume->asked)) return kMounted;
  if (result == kFormatNotWritable && !record_access_right(volume->entry, VOL_AC_RO)) return kMountUnrecorded;
  LOG(0, "Create Format FAILED");
  return kMountFormatFailed;
}

MountResult keep_file_system(Mounting* volume) {
  LOG(1, "Got FS type = %s, skip creating volume", volume->fs_type);
  const FileSystem* file_system = find_file_system(volume->fs_type);
  if (file_system != nullptr && file_system->check != nullptr && sys_check_fs_state(volume->node) != 0) {
    volume->held.release();  // the look takes its time, and another run may kill whoever holds the node
    System("%s", file_system->check(volume->node).c_str());
  }
  return note_update(ktree_update_formatting_state(volume->entry, kFormatIdle)) ? kMounted : kMountUnrecorded;
}

// Leaves the chosen partition with a known file system.
MountResult prepare_file_system(Mounting* volume) {
  LOG(2, "Got dev %s, force_format=%d", volume->node.c_str(), volume->force_format);
  volume->mark = content_mark(volume->node);
  detect_fs(volume);
  if (!protect_data(volume)) return kMountNoPartition;
  const MountResult result =
      volume->force_format != 0 ? create_file_system(volume) : keep_file_system(volume);
  if (result != kMounted) return result;
  const bool found = detect_fs(volume) && !(volume->force_format != 0 && is_remains(volume->fs_type));
  volume->held.release();
  return found ? kMounted : kMountFailed;
}

MountResult make_mount_point(const Mounting* volume) {
  const CommandText command = make_folder_command(volume->mount_point);
  LOG(1, "cmd = %s", command.c_str());
  make_bare_folder(volume->mount_point);
  if (system(command) == 0) return kMounted;
  LOG(0, "system() of cmd '%s' failed", command.c_str());
  return kMountNoMountPoint;
}

MountResult mount_file_system(const Mounting* volume) {
  if (const FileSystem* file_system = find_file_system(volume->fs_type)) {
    run_mount(*file_system, volume->node, volume->mount_point);
    return kMounted;
  }
  LOG(1, "Unsupported filesystem type %s", volume->fs_type);
  const bool noted = note_update(ktree_update_volume_state(volume->entry, kVolumeUnsupported));
  return noted ? kMountUnsupported : kMountUnrecorded;
}

MountResult record_read_only(const Mounting* volume) {
  return record_access_right(volume->entry, VOL_AC_RO) ? kMountReadOnly : kMountUnrecorded;
}

// Opens the volume to everybody and records whether that could be written.
MountResult open_to_everybody(const Mounting* volume) {
  if (system(open_folder_command(volume->mount_point)) == 0) {
    record_access_right(volume->entry, VOL_AC_RW);
    return kMounted;
  }
  LOG(1, "change mode 777 to %s failed, this might be a read only filesystem", volume->entry->share);
  return record_read_only(volume);
}

MountResult record_mount(const Mounting* volume) {
  (void)ktree_update_mount_info(volume->entry, volume->node, volume->mount_point, volume->fs_type);
  const FileSystem* file_system = find_file_system(volume->fs_type);
  if (file_system != nullptr && file_system->grow != nullptr) {
    System("%s", file_system->grow(volume->node).c_str());
  }
  note_update(ktree_update_volume_state(volume->entry, kVolumeNormal));
  return open_to_everybody(volume);
}

void record_failed_mount(const Mounting* volume) {
  note_update(ktree_update_volume_state(volume->entry, kVolumeFailed));
  const CommandText command = remove_folder_command(volume->mount_point);
  if (is_removal_unsafe(volume->mount_point)) return;
  drop_bare_folder(volume->mount_point);
  if (system(command) == 0) return;
  LOG(0, "system() of cmd '%s' failed", command.c_str());
}

MountResult record_outcome(const Mounting* volume) {
  if (sys_mount_point(volume->mount_point) != 0) return record_mount(volume);
  record_failed_mount(volume);
  return kMounted;
}

// A volume that is in use where it belongs is neither checked, formatted nor mounted over: its state is
// recorded as after a mount, with all that follows one (its partition may have grown). One that has turned
// read-only since may take the chmod in memory alone.
MountResult keep_standing(const Mounting* volume) {
  LOG(1, "%s is mounted on %s already", volume->node.c_str(), volume->mount_point.c_str());
  if (!note_update(ktree_update_formatting_state(volume->entry, kFormatIdle))) return kMountUnrecorded;
  const MountResult result = record_mount(volume);
  if (result != kMounted || !refuses_writes(volume->mount_point)) return result;
  LOG(1, "%s takes no writes any more", volume->mount_point.c_str());
  return record_read_only(volume);
}

// Mounts the file system and records what became of that. No other run closes the session meanwhile, or
// removes the mount point. The format may have taken long: since the first look another run may have mounted
// it, and a link may have been planted. A volume that stood and does not any more is not mounted: it has to
// be looked at first. One that stands where another run works for too long fails in the way that leaves its
// state as after a mount.
MountResult put_in_place(Mounting* volume) {
  const bool stands = volume->standing;
  const SessionKept kept(volume->entry->target_name);
  const MountPointHold hold(volume->mount_point);
  if (is_foreign_disk(volume->entry, volume->node)) return kMountTooSmall;
  if (hold.is_anothers(volume->mount_point)) return stands ? kMountFailed : kMountNoMountPoint;
  if (is_standing(volume)) return keep_standing(volume);
  if (stands) return kMounted;
  if (leads_through_link(volume->mount_point) || is_foreign_mount(volume->entry, volume->mount_point)) {
    return kMountNoMountPoint;
  }
  MountResult result = make_mount_point(volume);
  if (result == kMounted) result = mount_file_system(volume);
  if (result == kMounted) result = record_outcome(volume);
  return result;
}

MountResult bring_up(Mounting* volume) {
  MountResult result = prepare_partitions(volume->entry, volume->partitions, &volume->force_format);
  if (result == kMounted && !volume->asked && find_partition(volume, is_standing)) {
    result = put_in_place(volume);
    if (volume->standing) return result;
    volume->stood = true;
  }
  if (result == kMounted) result = pick_partition(volume);
  if (result == kMounted) result = prepare_file_system(volume);
  if (result == kMounted) result = put_in_place(volume);
  return result;
}

}  // namespace

MountResult Target_mount(TargetEntry* entry, int force_format, int update_share) {
  const LogScope scope;
  LOG(2, "start");
  MountResult result = check_entry(entry);
  if (result != kMounted) return result;
  Mounting volume{};
  volume.entry = entry;
  volume.asked = force_format != 0;
  volume.force_format = force_format;
  volume.mount_point = mount_point_of(entry->share);
  result = bring_up(&volume);
  if (result != kMounted) return result;
  LOG(1, "Update_sharefolder_status = %d", update_share);
  if (update_share != 0) reload_share_services();
  LOG(2, "end");
  return kMounted;
}

Result Target_mount_all_lun(TargetEntry* entry, int force_format, int update_share) {
  const LogScope scope;
  if (entry == nullptr || entry->db_idx < 1) return kFailed;
  LOG(2, "start");
  TargetEntry lun;
  LunWalk luns(entry->db_idx, LunWalk::kAtEmpty);
  while (luns.next(&lun)) {
    (void)Target_mount(&lun, force_format, update_share);
    (void)ktree_update_lun_status(&lun, 0);
    unmount_if_deleted(&lun);
  }
  LOG(2, "end");
  return kOk;
}

}  // namespace remvol
