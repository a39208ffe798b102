#include "iscsi/session.h"

#include <unistd.h>

#include <cstdlib>
#include <ctime>

#include "frontend/log.h"
#include "iscsi/iscsiadm.h"
#include "iscsi/session_check.h"
#include "iscsi/session_listing.h"
#include "support/disk_look.h"
#include "support/files.h"
#include "support/program.h"
#include "support/result.h"
#include "support/run_lock.h"
#include "support/temp_file.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/lun_slots.h"
#include "tree/slots.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr int kPollsPerSecond = 10;
constexpr useconds_t kPollInterval = 1'000'000 / kPollsPerSecond;
constexpr long long kMinLunSize = 1048577;  // bytes; a smaller LUN holds no volume
constexpr int kDrawnNumbers = 100;          // in the names of temporary files
constexpr char kDevicesLock[] = "devices.lock";
constexpr int kMaxDraws = 100 * kDrawnNumbers;

// What ktree_update_dev found in the listing.
struct DeviceUpdate {
  int result = kOk;
  bool found = false;
};

// Reads on to the next usable LUN of the target called `name`. Returns false when there is no further one.
bool next_usable_lun(FILE* file, DetailedListing* listing, char (&line)[kListingLineSize], const char* name) {
  while (fgets(line, sizeof line, file) != nullptr) {
    const ListingLine what = read_listing_line(listing, line, name);
    if (what == ListingLine::kHost) LOG(2, "get host num = %u", listing->host);
    if (what == ListingLine::kLun) LOG(2, "get lun = %u", listing->lun);
    if (what == ListingLine::kDisk) return true;
    if (what == ListingLine::kEnd) return false;
  }
  return false;
}

Text<64> device_name(const DetailedListing& listing) {
  return Text<64>("%.*s", static_cast<int>(listing.device_length), listing.disk);
}

void log_disk(const DetailedListing& listing) {
  LOG(2, "ptr: '%s', len: %d", listing.disk, static_cast<int>(listing.device_length) + 1);
}

// Draws a name that no file has, so that concurrent runs keep apart. After kMaxDraws the last one is taken:
// left-over files of all names must not hang the tool.
PathText draw_temp_path(const char* user) {
  srand(static_cast<unsigned>(time(nullptr)));
  PathText path;
  for (int draws = 0; draws < kMaxDraws; draws++) {
    path = PathText("/tmp/%s_session_%s_lun_%d.tmp", program_name(), user, rand() % kDrawnNumbers);
    if (check_path_exist(path) != 0) break;
  }
  return path;
}

// Lists the sessions in detail into the drawn file `path`, which a listing without result does not leave
// behind.
int list_in_detail(const char* path) {
  const CommandText command = session_luns_command(path);
  LOG(2, "run cmd: %s", command.c_str());
  const int listed = list_sessions(command);
  if (listed != 0) (void)_remove_file(path);
  return listed;
}

// Returns 0, or -1 after logging what is wrong with the name.
int check_target_name(const char* name) {
  if (name == nullptr) {
    LOG(0, "parameter error");
    return kFailed;
  }
  if (name[0] == '\0') {
    LOG(0, "target name error");
    return kFailed;
  }
  return kOk;
}

// Stores the device name of one usable LUN, when the tree holds the LUN.
void store_device(TargetEntry* entry, const DetailedListing& listing, DeviceUpdate* update) {
  const int lun_dbidx = ktree_get_dbidx_by_lun(entry->db_idx, listing.lun);
  if (lun_dbidx < 1) return;
  log_disk(listing);
  copy_text(entry->dev, device_name(listing));
  const HeldSlot slot(entry->db_idx, lun_dbidx);
  const int stored = slot ? tree_write_once(KeyText(key::kLunDev, slot.target(), slot.lun()), entry->dev)
                          : tree_write_failed();
  if (stored != kOk) update->result = stored;
  update->found = true;
}

// Replaces the stored device names of the target by those in the listing at `path`, in one step for other
// runs: a LUN that is attached never reads as if it had no disk.
int store_listed_devices(TargetEntry* entry, const char* path) {
  const SlotsHeld held(SlotsHeld::kChange);
  const int cleaned = ktree_clean_target_dev(entry);
  if (cleaned != kOk) {
    LOG(0, "ktree_clean_target_dev for %s failed", entry != nullptr ? entry->target_name : "");
    return cleaned;
  }
  copy_text(entry->dev, "");
  const File file(fopen(path, "re"));
  if (file == nullptr) return kOk;

  DetailedListing listing = kDeviceListing;
  char line[kListingLineSize];
  DeviceUpdate update;
  while (next_usable_lun(file.get(), &listing, line, entry->target_name)) {
    store_device(entry, listing, &update);
  }
  if (update.result == kOk && listing.match == 0) update.result = kTargetNotListed;
  if (update.result == kOk && !update.found) update.result = kNoRunningDisk;
  LOG(2, "end");
  return update.result;
}

// Makes a node for one usable LUN. Returns null when it is too small, or out of memory.
LunNode* make_lun_node(const DetailedListing& listing, DeviceNodeMaker make_node) {
  const Text<64> device = device_name(listing);
  log_disk(listing);
  LOG(2, "get dev_node = %s", device.c_str());
  (void)make_node(device);
  const long long size = sys_get_disk_space("/dev/%s", device.c_str());
  LOG(2, "get size = %lld", size);
  if (size < kMinLunSize) return nullptr;
  LunNode* node = lun_node_new();
  if (node == nullptr) return nullptr;
  node->host = listing.host;
  node->lun = listing.lun;
  copy_text(node->dev, device);
  node->size = size;
  return node;
}

void read_fs_type(LunNode* node) {
  const Text<32> partition("/dev/%s1", node->dev);
  bool known = false;
  if (check_path_exist(partition) == 0) {
    LOG(2, "try to get_fs_type from %s", partition.c_str());
    const DiskLook look(partition);
    known = sys_get_fs_type(node->fs_type, partition) == 0;
  }
  if (!known) copy_text(node->fs_type, "unknown");
  LOG(2, "get fstype = %s", node->fs_type);
}

}  // namespace

int ktree_clean_target_dev(TargetEntry* entry) {
  const LogScope scope;
  if (entry == nullptr) return kFailed;
  if (entry->db_idx < 1) {
    if (entry->target_name[0] == '\0') return kFailed;
    entry->db_idx = ktree_get_dbidx_by_targetname(entry->target_name);
    if (entry->db_idx < 1) return kFailed;
  }
  const HeldSlot slot(entry->db_idx);
  if (!slot) return kFailed;
  const int n = slot.target();
  int result = kOk;
  for (const int m : stored_luns_at(n)) {
    if (tree_write_once(KeyText(key::kLunDev, n, m), "") != kOk) result = kTreeFailed;
  }
  return result;
}

int ktree_update_dev(TargetEntry* entry) {
  const LogScope scope;
  LOG(2, "start");
  // One run after another lists and stores, so that what is stored is the newest listing. It lasts no longer
  // than the listing.
  RunLock devices;
  devices.take(kDevicesLock, LockMode::kExclusive);
  const TempFile path(PathText("/tmp/%s.tmp", program_name()));
  const int listed = list_sessions(session_devices_command(path));
  // No session at all changes nothing: the stored device names stay.
  if (listed != kSessionsListed) return listed < 0 ? listed : kOk;
  return store_listed_devices(entry, path);
}

int _wait_sess_lun_ready(const char* name, int wait_seconds) {
  const LogScope scope;
  if (check_target_name(name) != kOk) return kFailed;
  const PathText drawn = draw_temp_path("wait");
  DetailedListing listing = kLunListing;
  bool ready = false;
  for (int polls = wait_seconds == 0 ? 1 : wait_seconds * kPollsPerSecond; !ready && polls > 0;) {
    usleep(kPollInterval);
    polls--;
    LOG(1, "wait lun ready iter = %d", polls);
    const TempFile path(drawn);
    const int listed = list_in_detail(path);
    if (listed != kSessionsListed) return listed < 0 ? listed : kOk;
    const File file(fopen(path, "re"));
    if (file == nullptr) continue;
    // The count of targets and a LOGGED_IN seen by an earlier poll stay.
    listing.match = kLunListing.match;
    listing.after_lun = false;
    char line[kListingLineSize];
    ready = next_usable_lun(file.get(), &listing, line, name);
    (void)_remove_file(path);
  }
  return ready ? kOk : kNoLunReady;
}

int _get_sess_lun_list(LunNode** head, const char* name, DeviceNodeMaker make_node) {
  const LogScope scope;
  if (check_target_name(head != nullptr ? name : nullptr) != kOk) return kFailed;
  const TempFile path(draw_temp_path("get"));
  const int listed = list_in_detail(path);
  if (listed != kSessionsListed) return listed < 0 ? listed : kOk;
  *head = nullptr;
  const File file(fopen(path, "re"));
  if (file == nullptr) return 0;

  DetailedListing listing = kLunListing;
  char line[kListingLineSize];
  while (next_usable_lun(file.get(), &listing, line, name)) {
    LunNode* node = make_lun_node(listing, make_node);
    if (node == nullptr) continue;
    read_fs_type(node);
    if (*head == nullptr) {
      *head = node;
    } else {
      lun_node_append(*head, node);
    }
  }
  (void)_remove_file(path);
  return 0;
}

void print_lun_list(const LunNode* head, const char* name) {
  if (name == nullptr) return;
  puts("---------------------------------- Avaliable LUN List -----------------------------------");
  printf("| Target : %s\n", name);
  puts("|----------------------------------------------------------------------------------------");
  for (const LunNode* node = head; node != nullptr; node = node->next) {
    printf("|-- LUN: %u , Size : %llu bytes, Type of File System (first partition): %s \n",
           static_cast<unsigned>(node->lun), static_cast<unsigned long long>(node->size), node->fs_type);
  }
  if (head == nullptr) puts("| None of avaliable LUN is found ");
  puts("-----------------------------------------------------------------------------------------");
}

}  // namespace remvol
