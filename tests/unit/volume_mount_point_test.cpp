// Mount points: which share names are refused, how commands quote a path, and what a removal must not reach.
#include "volume/mount_point.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "volume/bare_folder.h"
#include "volume/cover.h"
#include "volume_fixture.h"

using namespace remvol;

namespace {

int synced = 0;
int empty_reads = 0;  // so many readings of the mount table that come show nothing

}  // namespace

// In front of the C library's: counts what the removal of a mount point has written out.
extern "C" int syncfs(int) noexcept {
  synced++;
  return 0;
}

// In front of the C library's: the kernel may skip lines of the table while another process unmounts.
extern "C" FILE* fopen(const char* path, const char* mode) {
  static const auto real = reinterpret_cast<FILE* (*)(const char*, const char*)>(dlsym(RTLD_NEXT, "fopen"));
  const bool hidden = std::string(path) == "/proc/self/mountinfo" && empty_reads-- > 0;
  return real(hidden ? "/dev/null" : path, mode);
}

namespace {

class MountPoint : public VolumeTest {};

// A file system of the test's own below /mnt.
class MountedPath : public VolumeTest {
 protected:
  MountedPath() {
    cover("/mnt");
    std::filesystem::create_directories(path);
  }
  ~MountedPath() override { uncover("/mnt"); }

  void put_layer() {
    cover(path.c_str());
    std::ofstream(path + "/file") << "data";
  }

  const std::string path = "/mnt/VV/Data";
};

}  // namespace

TEST_F(MountPoint, NamesThatLeaveTheRootAreRefused) {
  for (const char* share : {"..", "../x", "a/..", "a/../../etc", "a/b/../c", "../../etc/passwd", ".", "/",
                            "./", "//", "/..", "a/../", "/./", "./."}) {
    const std::string log = fakes::output_of([share] { EXPECT_FALSE(is_share_inside_root(share)) << share; });
    EXPECT_TRUE(has(log, std::string("share name ") + share + " leaves /mnt/VV/"));
  }
}

TEST_F(MountPoint, OtherNamesAreTaken) {
  for (const char* share :
       {"Data", "a b", "..a", "a..", "...", "a/b", "./a", "/a", "a.b", ".hidden", "\"$`\\", "-rf"}) {
    EXPECT_TRUE(is_share_inside_root(share)) << share;
  }
}

TEST_F(MountPoint, ThePathIsTheRootAndTheShare) {
  EXPECT_STREQ(mount_point_of("Backup"), "/mnt/VV/Backup");
  const std::string longest(127, 'x');
  EXPECT_EQ(std::string(mount_point_of(longest.c_str())), "/mnt/VV/" + longest);
}

TEST_F(MountedPath, AFolderThatIsNotMountedMayBeRemoved) {
  EXPECT_FALSE(is_removal_unsafe(path.c_str()));
  EXPECT_FALSE(is_removal_unsafe("/mnt/VV/never made"));
  const std::string unseen =
      "/mnt/VV/" + std::string(300, 'x');  // longer than a name may be: it cannot be looked at
  EXPECT_TRUE(is_removal_unsafe(unseen.c_str()));
}

TEST_F(MountedPath, AMountIsNotRemoved) {
  put_layer();
  const std::string log = fakes::output_of([this] { EXPECT_TRUE(is_removal_unsafe(path.c_str())); });
  EXPECT_TRUE(has(log, path + " is not removed, tmpfs is mounted on " + path));
  EXPECT_TRUE(is_removal_unsafe("/mnt/VV//./Data/")) << "by another name of the same path";
}

TEST_F(MountedPath, AMountBelowIsNotRemoved) {
  std::filesystem::create_directories(path + "/deeper/with a blank");
  cover((path + "/deeper/with a blank").c_str());
  EXPECT_TRUE(is_removal_unsafe(path.c_str()));
  EXPECT_FALSE(is_removal_unsafe("/mnt/VV/Dat"));
  EXPECT_FALSE(is_removal_unsafe((path + "/deeper/with").c_str()));
}

TEST_F(MountedPath, ADetachedVolumeIsHeldByNobody) {
  put_layer();
  fakes::on("sys_mount_point", path).returns(1).times(1);
  fakes::on("sys_mount_point", path).returns(0);
  detach_mounts(path.c_str());
  for (const auto& open_one : std::filesystem::directory_iterator("/proc/self/fd")) {
    std::error_code gone;  // the folder that is walked through is one of them
    EXPECT_EQ(std::filesystem::read_symlink(open_one, gone).string().find("Data"), std::string::npos)
        << "an open folder keeps the disk busy";
    EXPECT_NE(std::filesystem::read_symlink(open_one, gone), "/") << "which is how a detached one shows";
  }
}

TEST_F(MountedPath, AMountBelowARootThatIsALinkIsNotRemoved) {
  put_layer();
  std::filesystem::rename("/mnt/VV", "/mnt/volumes");
  std::filesystem::create_directory_symlink("/mnt/volumes", "/mnt/VV");
  const std::string log = fakes::output_of([this] { EXPECT_TRUE(is_removal_unsafe(path.c_str())); });
  EXPECT_TRUE(has(log, path + " is not removed, tmpfs is mounted on /mnt/volumes/Data"));
}

// The table writes such characters as octal numbers, and /proc/mounts shifts its columns without a source.
TEST_F(MountedPath, AMountWhosePathOrSourceIsOddIsNotRemoved) {
  const std::string odd = "/mnt/VV/a b\tc\nd\\e#f";
  std::filesystem::create_directories(odd);
  ASSERT_EQ(mount("", odd.c_str(), "tmpfs", 0, nullptr), 0);
  EXPECT_TRUE(is_removal_unsafe(odd.c_str()));
  EXPECT_FALSE(is_removal_unsafe("/mnt/VV/a"));
}

TEST_F(MountedPath, AFolderInsideAnotherVolumeIsNotRemoved) {
  put_layer();
  const std::string inner = path + "/inner";
  std::filesystem::create_directory(inner);
  const std::string log = fakes::output_of([&inner] { EXPECT_TRUE(is_removal_unsafe(inner.c_str())); });
  EXPECT_TRUE(has(log, inner + " is not removed, it is not on the file system of /mnt/VV/"));
}

TEST_F(MountedPath, ATableThatMissesALineIsReadAgain) {
  put_layer();
  empty_reads = 1;
  EXPECT_TRUE(is_removal_unsafe(path.c_str()));
  empty_reads = 0;
}

TEST_F(MountedPath, WithoutATableThePathIsAsked) {
  cover("/proc");
  fakes::on("sys_mount_point", path).returns(1).times(1);
  const std::string log = fakes::output_of([this] { EXPECT_TRUE(is_removal_unsafe(path.c_str())); });
  fakes::on("sys_mount_point", path).returns(0);
  const bool removed = !is_removal_unsafe(path.c_str());
  uncover("/proc");
  EXPECT_TRUE(has(log, path + " is not removed, it is a mount point"));
  EXPECT_TRUE(removed);
}

TEST_F(MountedPath, LinksBelowTheRootAreRefused) {
  std::filesystem::create_directory_symlink("/tmp", "/mnt/VV/link");
  std::filesystem::create_symlink("/nowhere", path + "/dangling");
  for (const char* share : {"link", "link/", "/link", "link/a", "./link/a/b", "Data/dangling"}) {
    const std::string log = fakes::output_of([share] { EXPECT_FALSE(is_share_inside_root(share)) << share; });
    EXPECT_TRUE(
        has(log, std::string("share name ") + share + " leads through a symbolic link below /mnt/VV/"));
  }
  for (const char* share : {"lin", "links", "Data", "Data/link"}) EXPECT_TRUE(is_share_inside_root(share));
  const std::string log = fakes::output_of([] { EXPECT_TRUE(is_removal_unsafe("/mnt/VV/link/a")); });
  EXPECT_TRUE(has(log, "share name link/a leads through a symbolic link below /mnt/VV/"));
}

// --- the bare folder ---

TEST_F(MountedPath, ABareFolderTakesNoFile) {
  make_bare_folder(path.c_str());
  std::ofstream file(path + "/file");
  EXPECT_FALSE(file.is_open()) << "not even root's";
  make_bare_folder(path.c_str());
  drop_bare_folder(path.c_str());
  EXPECT_FALSE(std::filesystem::exists(path));
}

TEST_F(MountedPath, ABareFolderWithFilesIsLeftToTheRemoval) {
  std::ofstream(path + "/file") << "data";
  make_bare_folder(path.c_str());
  drop_bare_folder(path.c_str());
  EXPECT_FALSE(is_immutable(path));
  EXPECT_TRUE(std::filesystem::exists(path + "/file"));
}

TEST_F(MountedPath, TheRootOfAVolumeIsNeverFlagged) {
  put_layer();
  make_bare_folder(path.c_str());
  EXPECT_FALSE(is_immutable(path));
  make_bare_folder((path + "/inner").c_str());
  EXPECT_FALSE(is_immutable(path + "/inner")) << "nor a folder in it";
  drop_bare_folder(path.c_str());
  drop_bare_folder((path + "/inner").c_str());
  EXPECT_TRUE(std::filesystem::exists(path + "/inner"));
}

// Runs in the process aside; the others' view is that of its parent.
bool others_cannot_write(const void* path) {
  const auto* name = static_cast<const char*>(path);
  std::string file = "/proc/" + std::to_string(getppid()) + "/root" + name + "/file";
  const bool refused = open(file.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0600) < 0 && errno == EROFS;
  file = std::string(name) + "/aside";
  return refused && open(file.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0600) >= 0 &&
         unlink(file.c_str()) == 0;
}

bool fails(const void*) {
  return false;
}

TEST_F(MountedPath, WhileAFolderIsChangedOthersFindACover) {
  EXPECT_TRUE(run_covered(path.c_str(), others_cannot_write, path.c_str()));
  MountLine cover;
  EXPECT_EQ(find_mount_below(path.c_str(), &cover), Mounted::kYes) << "the caller's to lift";
  lift_cover(path.c_str());
  EXPECT_EQ(find_mount_below(path.c_str(), &cover), Mounted::kNo);
}

TEST_F(MountedPath, ACoverGoesWhenTheWorkFails) {
  EXPECT_FALSE(run_covered(path.c_str(), fails, nullptr));
  MountLine cover;
  EXPECT_EQ(find_mount_below(path.c_str(), &cover), Mounted::kNo);
  EXPECT_FALSE(run_covered("/mnt/VV/none", others_cannot_write, path.c_str())) << "nothing to cover";
}

TEST_F(MountedPath, NothingIsLeftOfTheMakingAndTheRemoval) {
  std::filesystem::remove(path);
  std::filesystem::create_directory("/mnt/VV/.new-Data");  // of a killed run
  make_bare_folder(path.c_str());
  EXPECT_TRUE(is_immutable(path));
  EXPECT_FALSE(std::filesystem::exists("/mnt/VV/.new-Data"));
  MountLine cover;
  EXPECT_EQ(find_mount_below("/mnt/VV", &cover), Mounted::kNo);
  std::filesystem::create_directory("/mnt/VV/.new-Data");
  drop_bare_folder(path.c_str());
  EXPECT_TRUE(std::filesystem::is_empty("/mnt/VV"));
  EXPECT_EQ(find_mount_below("/mnt/VV", &cover), Mounted::kNo);
}

TEST_F(MountedPath, TheFirstFolderOfAMachineIsBareAsWell) {
  std::filesystem::remove_all("/mnt/VV");
  make_bare_folder(path.c_str());
  EXPECT_TRUE(is_immutable(path));
}

TEST_F(MountedPath, ACoverThatAKilledRunLeftIsTakenOff) {
  const std::string draft = "/mnt/VV/.new-Other";
  std::filesystem::create_directory(draft);
  for (const std::string& covered : {path, draft}) {
    ASSERT_TRUE(run_covered(covered.c_str(), others_cannot_write, covered.c_str()));
  }
  make_bare_folder(path.c_str());
  make_bare_folder("/mnt/VV/Other");
  EXPECT_TRUE(is_immutable(path));
  EXPECT_TRUE(is_immutable("/mnt/VV/Other"));
  EXPECT_FALSE(std::filesystem::exists(draft));
  MountLine cover;
  EXPECT_EQ(find_mount_below("/mnt/VV", &cover), Mounted::kNo);
}

TEST_F(MountedPath, AVolumeIsNoCoverEvenOnTopOfOne) {
  ASSERT_TRUE(run_covered(path.c_str(), others_cannot_write, path.c_str()));
  put_layer();
  make_bare_folder(path.c_str());
  EXPECT_TRUE(std::filesystem::exists(path + "/file"));
}

TEST_F(MountedPath, SharesBelowAFolderThatAKilledRunLeft) {
  make_bare_folder(path.c_str());
  make_bare_folder((path + "/a/b").c_str());
  EXPECT_FALSE(is_immutable(path));
  EXPECT_TRUE(is_immutable(path + "/a/b"));
  make_bare_folder(path.c_str());
  drop_bare_folder((path + "/a/b").c_str());
  EXPECT_FALSE(std::filesystem::exists(path + "/a/b"));
}

TEST_F(MountedPath, EveryLayerIsDetachedEvenWhenItIsInUse) {
  put_layer();
  put_layer();
  const int user = open((path + "/file").c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_GE(user, 0);
  fakes::on("sys_mount_point", path).returns(1);
  synced = 0;
  detach_mounts(path.c_str());
  EXPECT_GE(synced, 2) << "each layer is written out before it goes";
  EXPECT_FALSE(is_removal_unsafe(path.c_str()));
  EXPECT_TRUE(std::filesystem::is_empty(path));
  char text[8] = "";
  EXPECT_EQ(read(user, text, sizeof text), 4) << "the file of the detached layer lives on";
  close(user);
}

TEST_F(MountedPath, DetachingStopsAtThePlatformsWord) {
  put_layer();
  fakes::on("sys_mount_point", path).returns(0);
  detach_mounts(path.c_str());
  EXPECT_TRUE(is_removal_unsafe(path.c_str()));
}
