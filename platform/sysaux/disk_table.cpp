// The module that changes disks: writes the one partition, grows it. Both hold an exclusive lock on the whole
// disk's node meanwhile, which keeps udev from re-reading the table in between
// (https://systemd.io/BLOCK_DEVICE_LOCKING).

#include <fcntl.h>
#include <libfdisk/libfdisk.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <ctime>

#include "common/fd.h"
#include "sysaux/block.h"
#include "sysaux/content.h"
#include "sysaux/modules.h"
#include "sysaux/partitions.h"

using namespace sysaux;

namespace {

constexpr char kLinuxFilesystem[] = "0FC63DAF-8483-4772-8E79-3D69D8477DE4";
constexpr timespec kPause{0, 50'000'000};

// A whole disk, locked until the end of the scope. The locked descriptor is one that only reads: closing the
// one that wrote makes udev look at the disk, and it must find the lock still held then.
struct LockedDisk {
  char name[32];  // the kernel's
  platform::Fd block_dir;
  platform::Fd device;
};

bool lock(int device) {
  constexpr int kTries = 600;  // 30 seconds
  for (int i = 0; i < kTries; i++) {
    if (flock(device, LOCK_EX | LOCK_NB) == 0) return true;
    nanosleep(&kPause, nullptr);
  }
  return false;
}

bool open_locked(const char* path, LockedDisk* disk) {
  disk->block_dir.reset(open_block_dir(path));
  if (!disk->block_dir.ok() || faccessat(disk->block_dir.get(), "partition", F_OK, 0) == 0) return false;
  if (!kernel_name(path, disk->name, sizeof disk->name)) return false;
  disk->device.reset(open(path, O_RDONLY | O_CLOEXEC));
  return disk->device.ok() && lock(disk->device.get());
}

// udev answers the closing of a written disk a moment later by re-reading its table, unless the disk is
// locked just then; partition nodes vanish and come back meanwhile. sfdisk(8) waits as long.
void outlast_udev() {
  constexpr timespec kReaction{0, 250'000'000};
  if (access("/run/udev/control", F_OK) == 0) nanosleep(&kReaction, nullptr);
}

// libfdisk's view of a disk: the table in memory, written by write().
class DiskTable {
 public:
  DiskTable(const char* path, int device) : context_(fdisk_new_context()), device_(device) {
    if (context_ == nullptr) return;
    fdisk_disable_dialogs(context_, 1);
    ready_ = fdisk_assign_device_by_fd(context_, device, path, 0) == 0;
  }
  ~DiskTable() {
    if (ready_) fdisk_deassign_device(context_, 1);
    fdisk_unref_context(context_);
  }
  DiskTable(const DiskTable&) = delete;
  DiskTable& operator=(const DiskTable&) = delete;

  bool ready() const { return ready_; }
  fdisk_context* context() const { return context_; }

  // Errors that a write into the page cache did not see come with the sync; libfdisk does not sync a DOS
  // table.
  bool write() { return fdisk_write_disklabel(context_) == 0 && fsync(device_) == 0; }

  long long to_kernel_units(fdisk_sector_t sectors) const {
    return static_cast<long long>(sectors) * static_cast<long long>(fdisk_get_sector_size(context_)) /
           kSectorBytes;
  }
  Extent extent_of(fdisk_partition* entry) const {
    return {static_cast<int>(fdisk_partition_get_partno(entry)) + 1,
            to_kernel_units(fdisk_partition_get_start(entry)),
            to_kernel_units(fdisk_partition_get_size(entry))};
  }

 private:
  fdisk_context* context_;
  int device_;
  bool ready_ = false;
};

// The entries in use, and the last of them in `only` (to be released by the caller) when there is just one.
int entries_in_use(const DiskTable& table, fdisk_partition** only) {
  fdisk_table* entries = nullptr;
  *only = nullptr;
  if (fdisk_get_partitions(table.context(), &entries) != 0) return -1;
  int count = 0;
  fdisk_iter* iterator = fdisk_new_iter(FDISK_ITER_FORWARD);
  fdisk_partition* entry = nullptr;
  while (fdisk_table_next_partition(entries, iterator, &entry) == 0) {
    if (fdisk_partition_is_used(entry) == 0) continue;
    if (++count == 1) *only = entry;
  }
  if (count == 1) {
    fdisk_ref_partition(*only);
  } else {
    *only = nullptr;
  }
  fdisk_free_iter(iterator);
  fdisk_unref_table(entries);
  return count;
}

// A disk that may get a new table: read in full at its start, no signature, no partition in any table or in
// the kernel.
bool is_blank(const LockedDisk& disk) {
  char name[16];
  DiskPartitions known;
  if (!read_partitions(disk.block_dir.get(), &known) || known.count > 0) return false;
  if (!first_mebibyte_readable(disk.device.get())) return false;
  const Content content = recognise(disk.device.get(), name);
  return content == Content::kNothing || content == Content::kEmptyTable;
}

// Adds the one partition from the first to the last aligned sector and tells where it is.
bool add_whole_disk_partition(const DiskTable& table, Extent* extent) {
  fdisk_context* context = table.context();
  fdisk_partition* entry = fdisk_new_partition();
  fdisk_parttype* type =
      fdisk_label_get_parttype_from_string(fdisk_get_label(context, nullptr), kLinuxFilesystem);
  size_t number = 0;
  fdisk_partition_set_type(entry, type);
  fdisk_partition_partno_follow_default(entry, 1);
  fdisk_partition_start_follow_default(entry, 1);
  fdisk_partition_end_follow_default(entry, 1);
  bool added = fdisk_add_partition(context, entry, &number) == 0;
  fdisk_unref_partition(entry);
  fdisk_unref_parttype(type);
  entry = nullptr;
  added = added && fdisk_get_partition(context, number, &entry) == 0;
  if (added) *extent = table.extent_of(entry);
  fdisk_unref_partition(entry);
  return added;
}

// Writes a new GPT with one partition. The open is exclusive, so a disk that is mounted or part of something
// else is refused. libfdisk's own reading of an old table is a second opinion: it lists also entries that
// libblkid takes for invalid.
bool write_new_table(const char* path, Extent* extent) {
  const platform::Fd device(open(path, O_RDWR | O_EXCL | O_CLOEXEC));
  if (!device.ok()) return false;
  DiskTable table(path, device.get());
  if (!table.ready()) return false;
  fdisk_partition* only = nullptr;
  if (fdisk_has_label(table.context()) != 0 && entries_in_use(table, &only) != 0) {
    fdisk_unref_partition(only);
    return false;
  }
  return fdisk_create_disklabel(table.context(), "gpt") == 0 && add_whole_disk_partition(table, extent) &&
         table.write();
}

// Has the kernel show the partition as it was written and waits for its node. A node that does not come in
// time is no failure: the kernel has the partition, and the caller can make the node.
bool publish(const LockedDisk& disk, const Extent& extent) {
  Partition shown;
  if (!announce_partition(disk.device.get(), disk.block_dir.get(), extent, &shown)) return false;
  wait_for_node(disk.block_dir.get(), disk.name, shown.name);
  outlast_udev();
  return true;
}

constexpr fdisk_sector_t kDosEnd = UINT32_MAX;  // a DOS table counts sectors in 32 bits

bool too_large_for_table(const DiskTable& table) {
  return fdisk_is_label(table.context(), DOS) && fdisk_get_last_lba(table.context()) >= kDosEnd;
}

// Where the partition could end: at the last aligned sector that the table can describe.
fdisk_sector_t last_possible_end(const DiskTable& table) {
  fdisk_context* context = table.context();
  const fdisk_sector_t end = too_large_for_table(table) ? kDosEnd : fdisk_get_last_lba(context) + 1;
  return end - end % (fdisk_get_grain_size(context) / fdisk_get_sector_size(context));
}

bool is_plain(const DiskTable& table, fdisk_partition* entry) {
  constexpr unsigned kProtectiveMbr = 0xEE;
  if (fdisk_is_label(table.context(), GPT)) return true;
  return fdisk_is_label(table.context(), DOS) && !fdisk_partition_is_container(entry) &&
         !fdisk_partition_is_nested(entry) &&
         fdisk_parttype_get_code(fdisk_partition_get_type(entry)) != kProtectiveMbr;
}

// The kernel must have no other partition than this one, and this one where the table has it.
bool kernel_agrees(const LockedDisk& disk, const Extent& extent) {
  DiskPartitions known;
  if (!read_partitions(disk.block_dir.get(), &known) || known.count > 1) return false;
  return known.count == 0 ||
         (known.at[0].extent.number == extent.number && known.at[0].extent.start == extent.start);
}

// Start and size are given: with "the default end" alone libfdisk changes nothing on an existing partition
// and reports success.
bool set_size(const DiskTable& table, fdisk_partition* entry, fdisk_sector_t size) {
  fdisk_partition* wanted = fdisk_new_partition();
  fdisk_partition_set_start(wanted, fdisk_partition_get_start(entry));
  fdisk_partition_set_size(wanted, size);
  fdisk_partition_size_explicit(wanted, 1);
  const bool set = fdisk_set_partition(table.context(), fdisk_partition_get_partno(entry), wanted) == 0;
  fdisk_unref_partition(wanted);
  return set;
}

// Grows the entry in the table when there is room, and writes it; the backup header of a GPT moves to the end
// of the disk with it. Tells where the partition is then.
bool grow_entry(const LockedDisk& disk, DiskTable* table, fdisk_partition* entry, Extent* extent) {
  *extent = table->extent_of(entry);
  if (!is_plain(*table, entry) || !kernel_agrees(disk, *extent)) return false;
  const fdisk_sector_t start = fdisk_partition_get_start(entry);
  const fdisk_sector_t end = last_possible_end(*table);
  if (end <= start + fdisk_partition_get_size(entry)) return !too_large_for_table(*table);
  if (!set_size(*table, entry, end - start) || !table->write()) return false;
  extent->size = table->to_kernel_units(end - start);
  return true;
}

bool write_grown_table(const char* path, const LockedDisk& disk, Extent* extent) {
  const platform::Fd device(open(path, O_RDWR | O_CLOEXEC));  // not exclusive: the volume may be mounted
  if (!device.ok()) return false;
  DiskTable table(path, device.get());
  if (!table.ready() || fdisk_has_label(table.context()) == 0) return false;
  fdisk_partition* only = nullptr;
  if (entries_in_use(table, &only) != 1) return false;
  const bool grown = grow_entry(disk, &table, only, extent);
  fdisk_unref_partition(only);
  return grown;
}

}  // namespace

int sysaux_disk_create_1_partition(const char* device) {
  LockedDisk disk;
  Extent extent;
  if (!open_locked(device, &disk) || !is_blank(disk)) return -1;
  if (!write_new_table(device, &extent)) return -1;
  return publish(disk, extent) ? 0 : -1;
}

int sysaux_disk_expand_1_partition(const char* device) {
  LockedDisk disk;
  Extent extent;
  if (!open_locked(device, &disk)) return -1;
  if (!write_grown_table(device, disk, &extent)) return -1;
  return publish(disk, extent) ? 0 : -1;
}
