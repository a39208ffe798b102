#include "sysaux/content.h"

#include <blkid/blkid.h>

#include <cstdio>
#include <cstring>

#include "sysaux/block.h"
#include "sysaux/copies.h"

namespace sysaux {

namespace {

enum class Finding { kFound, kNothing, kAmbivalent, kFailed };

// The answers of blkid_do_safeprobe. Its manual has -1 for an error; the library passes on any negative
// errno.
Finding answer_of(int result) {
  switch (result) {
    case 0:
      return Finding::kFound;
    case 1:
      return Finding::kNothing;
    case -2:
      return Finding::kAmbivalent;
    default:
      return Finding::kFailed;
  }
}

int collect(blkid_partlist table, Extent* extents, int max) {
  const int all = table != nullptr ? blkid_partlist_numof_partitions(table) : 0;
  int count = 0;
  for (int i = 0; i < all && count < max; i++) {
    blkid_partition partition = blkid_partlist_get_partition(table, i);
    long long size = blkid_partition_get_size(partition);
    // The kernel shows no more of a container than its first two sectors, so that nobody formats it.
    if (blkid_partition_is_extended(partition) && size > 2) size = 2;
    extents[count++] = {blkid_partition_get_partno(partition), blkid_partition_get_start(partition), size};
  }
  return count;
}

class Probe {
 public:
  explicit Probe(int device) : probe_(blkid_new_probe()) {
    if (probe_ == nullptr || blkid_probe_set_device(probe_, device, 0, 0) != 0) return;
    blkid_probe_enable_superblocks(probe_, 1);
    blkid_probe_enable_partitions(probe_, 1);
    // The backup GPT counts also where the first sectors were overwritten.
    blkid_probe_set_partitions_flags(probe_, BLKID_PARTS_FORCE_GPT);
    ready_ = true;
  }
  ~Probe() { blkid_free_probe(probe_); }
  Probe(const Probe&) = delete;
  Probe& operator=(const Probe&) = delete;

  // Leaves out ZFS, or looks for everything again.
  void leave_out_zfs(bool leave_out) {
    char zfs[] = "zfs_member";
    char* names[] = {zfs, nullptr};
    if (!ready_) return;
    if (leave_out) {
      blkid_probe_filter_superblocks_type(probe_, BLKID_FLTR_NOTIN, names);
    } else {
      blkid_probe_reset_superblocks_filter(probe_);
    }
  }

  Finding run(int superblock_flags) {
    if (!ready_) return Finding::kFailed;
    blkid_probe_set_superblocks_flags(probe_, BLKID_SUBLKS_TYPE | superblock_flags);
    const Finding answer = answer_of(blkid_do_safeprobe(probe_));
    return answer == Finding::kFailed && has_several() ? Finding::kAmbivalent : answer;
  }

  const char* value(const char* tag) const {
    const char* text = nullptr;
    return blkid_probe_lookup_value(probe_, tag, &text, nullptr) == 0 ? text : nullptr;
  }

  // A protective MBR whose GPT cannot be used: the disk shrank, its sectors changed their size, or the table
  // is damaged. What partitions there are is not known then.
  bool has_lost_gpt() const {
    const char* type = value("PTTYPE");
    return type != nullptr && strcmp(type, "PMBR") == 0;
  }

  // The kind of a table with partitions that a probe is silent about: libblkid shows those of a BSD disk
  // label to who asks for partitions alone. Null without one.
  const char* silent_table() {
    blkid_partlist table = blkid_probe_get_partitions(probe_);
    if (table == nullptr || blkid_partlist_numof_partitions(table) <= 0) return nullptr;
    return blkid_parttable_get_type(blkid_partition_get_table(blkid_partlist_get_partition(table, 0)));
  }

  // The partitions in the table. An empty table of another kind may hide a GPT, so that is looked for then.
  int partitions(Extent* extents, int max) {
    if (!ready_) return 0;
    const int count = collect(blkid_probe_get_partitions(probe_), extents, max);
    if (count > 0) return count;
    char gpt[] = "gpt";
    char* only[] = {gpt, nullptr};
    blkid_probe_filter_partitions_type(probe_, BLKID_FLTR_ONLYIN, only);
    return collect(blkid_probe_get_partitions(probe_), extents, max);
  }

 private:
  // Several signatures, all of them read: libblkid 2.41 calls that an error like any other.
  bool has_several() {
    int count = 0, result = 0;
    blkid_reset_probe(probe_);
    while ((result = blkid_do_probe(probe_)) == 0) {
      if (value("TYPE") != nullptr) count++;
    }
    return result == 1 && count > 1;
  }

  blkid_probe probe_;
  bool ready_ = false;
};

bool table_has_partitions(Probe& probe) {
  Extent first;
  return probe.has_lost_gpt() || probe.partitions(&first, 1) > 0;
}

// What ends like a boot sector without a partition. Whoever makes a partition table gives it a number, so one
// without belongs to something else: a file system whose first bytes are lost, or one that is not known here.
bool is_unknown_boot_sector(Probe& probe) {
  const char* table = probe.value("PTTYPE");
  return table != nullptr && strcmp(table, "dos") == 0 && probe.value("PTUUID") == nullptr &&
         !table_has_partitions(probe);
}

// What there is where a probe finds nothing.
Content recognise_hidden(int device, Probe& probe, char name[16]) {
  const char* found = probe.silent_table();
  if (found == nullptr && !find_copy(device, &found)) return Content::kUnreadable;
  if (found == nullptr) return Content::kNothing;
  snprintf(name, 16, "%.15s", found);
  return Content::kSignature;
}

}  // namespace

Content recognise(int device, char name[16]) {
  name[0] = '\0';
  Probe probe(device);
  // The labels of ZFS are a mebibyte, which takes most of the time, and the two at the end of a disk outlive
  // a format with something else: so they are read where nothing else is found.
  probe.leave_out_zfs(true);
  Finding answer = probe.run(0);
  if (answer == Finding::kFound && probe.value("TYPE") != nullptr) {
    snprintf(name, 16, "%.15s", probe.value("TYPE"));
    return Content::kSignature;
  }
  probe.leave_out_zfs(false);
  answer = probe.run(0);
  if (answer != Finding::kAmbivalent && answer != Finding::kFailed && probe.value("TYPE") == nullptr) {
    answer = probe.run(BLKID_SUBLKS_BADCSUM);
  }
  if (answer == Finding::kNothing) return recognise_hidden(device, probe, name);
  if (answer != Finding::kFound && answer != Finding::kAmbivalent) return Content::kUnreadable;
  const char* type = answer == Finding::kFound ? probe.value("TYPE") : "ambivalent";
  const char* found = type != nullptr ? type : probe.value("PTTYPE");
  snprintf(name, 16, "%.15s", found != nullptr ? found : "unknown");
  if (type != nullptr || is_unknown_boot_sector(probe)) return Content::kSignature;
  return table_has_partitions(probe) ? Content::kPartitions : Content::kEmptyTable;
}

int read_table(int disk, Extent* extents, int max) {
  Probe probe(disk);
  if (probe.run(0) == Finding::kFailed || probe.has_lost_gpt()) return -1;
  return probe.partitions(extents, max);
}

}  // namespace sysaux
