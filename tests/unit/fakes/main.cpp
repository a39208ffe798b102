// A test program has semaphores and mounts of its own where it may (root), so that tests beside it and the
// machine are left alone.
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>

int main(int argc, char** argv) {
  testing::InitGoogleTest(&argc, argv);
  if (unshare(CLONE_NEWNS | CLONE_NEWIPC) == 0) mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr);
  return RUN_ALL_TESTS();
}
