// A test program has semaphores, mounts and locks (in /run) of its own where it may (root), so that tests
// beside it and the machine are left alone.
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>

namespace {

void leave_the_machine_alone() {
  if (unshare(CLONE_NEWNS | CLONE_NEWIPC) != 0 ||
      mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0)
    return;
  if (mount("tmpfs", "/run", "tmpfs", 0, "mode=755") == 0) mkdir("/run/lock", 01777);
}

}  // namespace

int main(int argc, char** argv) {
  testing::InitGoogleTest(&argc, argv);
  leave_the_machine_alone();
  return RUN_ALL_TESTS();
}
