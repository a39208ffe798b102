#include "volume/partition.h"

#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "support/files.h"
#include "support/result.h"
#include "support/session_hold.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/state.h"
#include "volume/device.h"
#include "volume/disk_identity.h"
#include "volume/disk_use.h"

namespace remvol {

namespace {

constexpr long long kUnusableDiskSize = 1048576;  // bytes; a disk that is not larger may be a fake one
constexpr long long kExpandMargin = 100000000;    // bytes; alignment and partition tables stay far below it

int list_partitions(const char* device, PartitionList& partitions) {
  memset(partitions, 0, sizeof partitions);
  return sys_get_partition_list(partitions, device);
}

bool create_partition(const TargetEntry* entry, const char* device) {
  LOG(2, "No partitions found on %s, try to create partition...", device);
  (void)ktree_update_volume_state(entry, kVolumeCreating);
  LOG(2, "Creating partition on %s", device);
  const SessionKept kept(entry->target_name);
  if (is_foreign_disk(entry, device) || sys_create_1_partition(device) != 0) {
    LOG(0, "Create partition FAILED");
    (void)ktree_update_volume_state(entry, kVolumeFailed);
    return false;
  }
  (void)ktree_update_volume_state(entry, kVolumeNormal);
  (void)_create_device_node(entry->dev);
  return true;
}

// A partition that could not be grown is used as it is; the volume state then stays "creating" until a later
// step sets it.
void expand_partition(const TargetEntry* entry, const char* device) {
  LOG(2, "%s, try to expand partition...", device);
  LOG(2, "Expanding partition on %s", device);
  (void)ktree_update_volume_state(entry, kVolumeCreating);
  const SessionKept kept(entry->target_name);
  if (is_foreign_disk(entry, device) || sys_expand_1_partition(device) != 0) {
    LOG(0, "Expand partition FAILED");
    return;
  }
  (void)ktree_update_volume_state(entry, kVolumeNormal);
  (void)_create_device_node(entry->dev);
}

// Gives an empty disk its partition, which is to be formatted then. A partition that the kernel did not have
// (`had_one`) and has by now is another run's: it is taken as it is. Returns false when there is none.
bool fill_disk(const TargetEntry* entry, const char* device, bool had_one, int* force_format) {
  const auto filled_elsewhere = [&] { return !had_one && has_partition(entry->dev); };
  if (filled_elsewhere()) return true;
  if (!create_partition(entry, device)) return filled_elsewhere();
  *force_format = 1;
  return true;
}

// Returns false when an empty disk could not be given its partition.
bool adjust_partitions(const TargetEntry* entry, const char* device, PartitionList& partitions,
                       int* force_format) {
  const bool had_one = has_partition(entry->dev);
  const int count = list_partitions(device, partitions);
  if (count == 0) {
    if (!fill_disk(entry, device, had_one, force_format)) return false;
    list_partitions(device, partitions);
  } else if (count == 1) {
    LOG(2, "one partition found on %s", device);
    if (check_1part_disk_need_to_expand(device) == kPartitionShort) {
      expand_partition(entry, device);
      list_partitions(device, partitions);
    }
  }
  return true;
}

}  // namespace

PartitionFit check_1part_disk_need_to_expand(const char* device) {
  const LogScope scope;
  if (device == nullptr || device[0] == '\0') {
    LOG(0, "dev string error!");
    return kPartitionError;
  }
  PartitionList partitions;
  if (list_partitions(device, partitions) != 1) {
    LOG(2, "more than 1 partition or no part, skip!");
    return kPartitionFits;
  }
  partitions[strcspn(partitions, ",")] = '\0';
  const long long disk_size = sys_get_disk_space("%s", device);
  const long long part_size = sys_get_partition_size(partitions);
  LOG(2, "disk_size = %lld, part_size = %lld", disk_size, part_size);
  return part_size + kExpandMargin < disk_size ? kPartitionShort : kPartitionFits;
}

MountResult prepare_partitions(const TargetEntry* entry, PartitionList& partitions, int* force_format) {
  const Text<64> device("/dev/%s", entry->dev);
  if (is_foreign_disk(entry, device)) return kMountTooSmall;  // the LUN itself has no disk here
  const long long disk_size = sys_get_disk_space("%s", device.c_str());
  LOG(2, "get disk_size = %lld", disk_size);
  if (disk_size <= kUnusableDiskSize) {
    LOG(0, "The disk size < 1MB, it might be a fake one. treat this disk as offline");
    return kMountTooSmall;
  }
  if (!adjust_partitions(entry, device, partitions, force_format)) return kMountNoPartition;
  if (partitions[0] == '\0') {
    LOG(0, "Create partition FAILED");
    (void)ktree_update_volume_state(entry, kVolumeFailed);
    return kMountNoPartition;
  }
  if (check_path_exist(device) != 0 && _create_device_node(entry->dev) != kOk) {
    LOG(0, "create device node failed");
    return kMountFailed;
  }
  return kMounted;
}

}  // namespace remvol
