// What the tests of the volume modules share: a LUN in slot 3 of the target in slot 2, its disk sdb with the
// one partition sdb1, its share "Data", and the platform's answers for them.
#ifndef TESTS_VOLUME_FIXTURE_H
#define TESTS_VOLUME_FIXTURE_H

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/sem.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "fakes.h"
#include "frontend/log.h"
#include "support/format_semaphore.h"
#include "support/text.h"
#include "tree/record.h"

using Texts = std::vector<std::string>;

class VolumeTest : public fakes::Test {
 protected:
  VolumeTest() {
    cover("/sys/block");  // the machine may have an sdb of its own
    remvol::copy_text(entry.dev, "sdb");
    remvol::copy_text(entry.share, "Data");
    entry.db_idx = 2;
    entry.lun_db_idx = 3;
  }
  ~VolumeTest() override {
    uncover("/sys/block");
    remvol::debug_level = 0;
    // A format that could not write keeps the semaphore until its process ends; the tests are one process.
    remvol::format_sem_release_leftover();
    const int left = semget(90111, 1, 0666);
    if (left != -1) semctl(left, 0, IPC_RMID);
  }

  // The tree as a run finds it: what ktree_get_lun_entry_by_dbidx needs for `entry`.
  void store_entry() {
    fakes::tree_set(
        {{"/iscsi/initiator/id:2/target", "iqn.t"}, {lun("lun"), "0"}, {lun("share"), entry.share}});
  }

  // An empty folder of the test's own at `path`, which must exist.
  static void cover(const char* path) {
    ASSERT_EQ(mount("tmpfs", path, "tmpfs", 0, nullptr), 0) << path << ": the tests of volumes need root";
  }
  static void uncover(const char* path) { umount2(path, MNT_DETACH); }

  // Whether the folder takes no files, nobody's.
  static bool is_immutable(const std::string& path) {
    struct statx found {};
    return statx(AT_FDCWD, path.c_str(), 0, 0, &found) == 0 &&
           (found.stx_attributes & STATX_ATTR_IMMUTABLE) != 0;
  }

  static std::string lun(const std::string& key) { return "/iscsi/initiator/id:2/lun/id:3/" + key; }

  // The value of one of the LUN's keys, "" when it was never written.
  static std::string stored(const std::string& key) { return fakes::tree_get(lun(key)).value_or(""); }

  // Every value that was written to one of the LUN's keys, in order.
  static Texts written(const std::string& key) {
    const std::string start = "set " + lun(key) + "=";
    Texts values;
    for (const std::string& write : fakes::writes()) {
      if (write.rfind(start, 0) == 0) values.push_back(write.substr(start.size()));
    }
    return values;
  }

  remvol::TargetEntry entry{};
};

#endif
