// The mirror: what the daemon writes into it, and what clients read while it does.
#include "ktree/mirror.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <optional>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "ktree/client/mirror_map.h"
#include "ktree/mirror_writer.h"
#include "ktree_support.h"

namespace {

size_t memory_left = SIZE_MAX;
unsigned refusals = 0;

}  // namespace

// The function's name where offsets of 64 bits are not the processor's own.
#if __SIZEOF_LONG__ == 4
#define __real_fallocate __real_fallocate64
#define __wrap_fallocate __wrap_fallocate64
#endif

// The memory of a file, of which there may be little.
extern "C" int __real_fallocate(int fd, int mode, off_t offset, off_t size);
extern "C" int __wrap_fallocate(int fd, int mode, off_t offset, off_t size) {
  if (memory_left < static_cast<size_t>(size)) {
    refusals++;
    errno = ENOSPC;
    return -1;
  }
  memory_left -= static_cast<size_t>(size);
  return __real_fallocate(fd, mode, offset, size);
}

namespace ktree {
namespace {

constexpr char kNotThere[] = "to be asked for";

class MirrorTest : public testing::Test {
 protected:
  MirrorTest() { memory_left = SIZE_MAX; }
  ~MirrorTest() override { client::unmap_mirror(words_); }

  void open() {
    fd_ = writer_.descriptor();
    words_ = client::map_mirror(fd_);
    ASSERT_NE(words_, nullptr);
  }
  void set(const std::string& text, const std::string& value) {
    Path path;
    ASSERT_TRUE(parse_path(text, path));
    ASSERT_TRUE(tree_.set(path, value));
    writer_.set(text, value);
  }
  void del(const std::string& text) {
    Path path;
    ASSERT_TRUE(parse_path(text, path));
    writer_.before_removal(path);
    ASSERT_TRUE(tree_.remove(path));
    writer_.after_removal(path);
  }
  std::string read(const std::string& path, size_t most = 1000) {
    std::string buffer(1000, '#');
    const int size = mirror::read(words_, path, buffer.data(), most);
    if (size < 0) return kNotThere;
    EXPECT_LE(static_cast<size_t>(size), most);
    EXPECT_EQ(buffer[static_cast<size_t>(size)], '#') << "written behind the value";
    return buffer.substr(0, static_cast<size_t>(size));
  }

  Tree tree_;
  MirrorWriter writer_{tree_};
  int fd_ = -1;
  const mirror::Word* words_ = nullptr;
};

TEST_F(MirrorTest, HoldsWhatWasThereBeforeAnybodyAsked) {
  set("/iscsi/initiator/id:2/lun/id:1/share", "Photos");
  open();
  EXPECT_EQ(read("/iscsi/initiator/id:2/lun/id:1/share"), "Photos");
  EXPECT_EQ(read("/iscsi/initiator/id:2/lun/id:2/share"), kNotThere);
}

TEST_F(MirrorTest, IsOneForAll) {
  open();
  EXPECT_EQ(writer_.descriptor(), fd_);
}

TEST_F(MirrorTest, FollowsEverySet) {
  open();
  const std::string longest(255, 'y');
  for (const std::string& value : {std::string("x"), std::string(), longest, std::string("short")}) {
    set("/a", value);
    EXPECT_EQ(read("/a"), value);
  }
  set("/b", "another");
  EXPECT_EQ(read("/a"), "short");
  EXPECT_EQ(read("/b"), "another");
}

TEST_F(MirrorTest, KnowsEverySpelling) {
  open();
  set("/id/a:1/b:11", "x");
  for (const char* path : {"/id:1/a/b:11", "/id/a/b:11", "/id:1/a:1/b:11", "/id/a:1/b:11"})
    EXPECT_EQ(read(path), "x") << path;
  for (const char* path :
       {"", "/", ":1", "/id", "/id/a/b", "/id/a/b:1", "/id:1:1/a/b:11", "/id:01/a/b:11", "/id:/a/b:11",
        "/id/a/b:111", "/id/a/b:11:1", "/id:1:1/a:1/b:11:1", ":1/id/a/b:11", "/:1/id/a/b:11"}) {
    EXPECT_EQ(read(path), kNotThere) << path;
  }
}

TEST_F(MirrorTest, GivesAtMostWhatIsWanted) {
  open();
  set("/a", "0123456789");
  EXPECT_EQ(read("/a", 10), "0123456789");
  EXPECT_EQ(read("/a", 9), "012345678");
  EXPECT_EQ(read("/a", 0), "");
}

TEST_F(MirrorTest, NodesWithoutAValueAreNotInIt) {
  open();
  set("/a:3/b", "x");
  EXPECT_EQ(read("/a"), kNotThere);
  EXPECT_EQ(read("/a:3"), kNotThere);
}

TEST_F(MirrorTest, ValuesAndPathsThatAreTooLongAreNotInIt) {
  open();
  set("/a", "short");
  set("/a", std::string(256, 'x'));
  EXPECT_EQ(read("/a"), kNotThere);
  set("/a", "short again");
  EXPECT_EQ(read("/a"), "short again");
  const std::string longest = "/" + std::string(254, 'p');
  set(longest, "x");
  set(longest + "p", "y");
  EXPECT_EQ(read(longest), "x");
  EXPECT_EQ(read(longest + "p"), kNotThere);
  EXPECT_EQ(read(longest + ":1"), "x");
  EXPECT_EQ(read(longest + ":"), kNotThere);
  EXPECT_EQ(read(longest + ":2"), kNotThere);
  writer_.fill();
  EXPECT_EQ(read(longest), "x");
  EXPECT_EQ(read(longest + "p"), kNotThere);
}

TEST_F(MirrorTest, ADeletionMovesTheLaterOnes) {
  open();
  for (const char* number : {"1", "2", "3"}) set(std::string("/id:") + number + "/share", number);
  del("/id:2");
  EXPECT_EQ(read("/id:1/share"), "1");
  EXPECT_EQ(read("/id:2/share"), "3");
  EXPECT_EQ(read("/id:3/share"), kNotThere);
}

// A tree that grows has its heads made more, and one that shrinks again loses nothing.
TEST_F(MirrorTest, ManyValues) {
  open();
  const auto name = [](unsigned i) {
    return "/a:" + std::to_string(i / 4000 + 2) + "/b:" + std::to_string(i % 4000 + 2);
  };
  for (unsigned i = 0; i < 20000; i++) set(name(i), std::to_string(i));
  for (unsigned i = 0; i < 20000; i++) ASSERT_EQ(read(name(i)), std::to_string(i));
  for (unsigned i = 0; i < 1000; i++) del("/a:3/b:2");
  EXPECT_EQ(read("/a:3/b:2"), "5000");
  EXPECT_EQ(read("/a:3/b:3001"), "7999");
  EXPECT_EQ(read("/a:3/b:3002"), kNotThere);
  EXPECT_EQ(read("/a:4/b:2"), "8000");
}

// More than it has room for: what is in it is right, the rest has to be asked for.
TEST_F(MirrorTest, ItMayBeFull) {
  open();
  memory_left = 1 << 20;
  const std::string value(200, 'v');
  for (unsigned i = 1; i <= 4096; i++) set("/a:" + std::to_string(i), value);
  for (unsigned i = 1; i <= 4096; i++) set("/b:" + std::to_string(i), value);
  EXPECT_EQ(read("/a:4"), value);
  EXPECT_EQ(read("/b:4096"), kNotThere);
  set("/a:4", "x");
  EXPECT_EQ(read("/a:4"), "x");
  set("/b:4095", value + "y");
  EXPECT_EQ(read("/b:4095"), kNotThere);
  memory_left = SIZE_MAX;
  set("/b:4096", "z");
  EXPECT_EQ(read("/b:4096"), "z");
}

// Many nodes, of which few have values, and no memory for as many heads.
TEST_F(MirrorTest, WithFewHeadsItIsNotFilledAnewAllTheTime) {
  open();
  memory_left = 3 << 16;
  for (unsigned i = 1; i <= 40; i++) set("/n:" + std::to_string(i) + "/i:4096", "x");
  for (unsigned i = 1; i <= 4096; i++) set("/v:" + std::to_string(i), "x");
  for (unsigned i = 1; i <= 4096; i++) set("/w:" + std::to_string(i), "x");
  EXPECT_EQ(read("/v:4"), "x");
  refusals = 0;
  for (unsigned i = 0; i < 1000; i++) set("/v:4", std::to_string(i % 10));
  EXPECT_LT(refusals, 5U);
}

// Paths whose entries all are in one chain, more of them than a reader looks through.
TEST_F(MirrorTest, WhatIsFarDownAChainIsTakenOut) {
  open();
  std::vector<std::string> paths;
  for (unsigned i = 0; paths.size() < 1100; i++) {
    mirror::Key key;
    ASSERT_TRUE(make_key("/p" + std::to_string(i), key));
    if (key.hash % 1024 == 0) paths.push_back("/p" + std::to_string(i));
  }
  for (const std::string& path : paths) set(path, "old");
  ASSERT_EQ(words_[mirror::kHeadsCount], 1024U);
  EXPECT_EQ(read(paths[0]), kNotThere);
  EXPECT_EQ(read(paths[1099]), "old");
  set(paths[0], "another");
  del(paths[0]);
  for (unsigned i = 200; i < 1100; i++) del(paths[i]);
  EXPECT_EQ(read(paths[0]), kNotThere);
  EXPECT_EQ(read(paths[1]), "old");
}

// A page that nobody has had memory for would be taken by the look itself, or end the reader when there is
// none.
TEST_F(MirrorTest, AReaderTouchesNothingThatHasNoMemory) {
  const int fd = memfd_create("test", MFD_CLOEXEC);
  ASSERT_EQ(ftruncate(fd, mirror::kBytes), 0);
  void* map = mmap(nullptr, mirror::kBytes, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
  ASSERT_NE(map, MAP_FAILED);
  auto* words = static_cast<mirror::Word*>(map);
  mirror::Key key;
  ASSERT_TRUE(make_key("/a", key));
  words[mirror::kEnd] = 8192;
  words[mirror::kHeadsPlace] = mirror::kFirstPlace;
  words[mirror::kHeadsCount] = 1;
  struct stat before = {};
  struct stat after = {};
  memset(words + 2000, 0xFF,
         (8192 - 2000) * sizeof(mirror::Word));  // what is a value, and looks like an entry
  ASSERT_EQ(fstat(fd, &before), 0);
  char buffer[300];
  for (const mirror::Word place : {8192U, 1000000U, 8191U, 8190U, 2000U}) {
    words[mirror::kFirstPlace] = place;
    EXPECT_EQ(mirror::read(words, "/a", buffer, sizeof buffer), -1);
  }
  words[mirror::kHeadsPlace] = 1000000;
  EXPECT_EQ(mirror::read(words, "/a", buffer, sizeof buffer), -1);
  ASSERT_EQ(fstat(fd, &after), 0);
  EXPECT_EQ(after.st_blocks, before.st_blocks);
  munmap(map, mirror::kBytes);
  close(fd);
}

// A value that grows again and again leaves its old places behind; they are had back.
TEST_F(MirrorTest, OldPlacesAreUsedAgain) {
  open();
  set("/stays", "here");
  for (unsigned i = 0; i < 100000; i++) set("/a:" + std::to_string(i % 7 + 1), std::string(i % 255, 'x'));
  for (unsigned i = 0; i < 7; i++) {
    const unsigned last = 99999 - (99999 - i) % 7;
    EXPECT_EQ(read(i == 0 ? "/a" : "/a:" + std::to_string(i + 1)), std::string(last % 255, 'x'));
  }
  EXPECT_EQ(read("/stays"), "here");
}

TEST_F(MirrorTest, WithoutMemoryThereIsNone) {
  memory_left = 0;
  EXPECT_EQ(writer_.descriptor(), -1);
  EXPECT_EQ(writer_.descriptor(), -1);
  set("/a", "x");
  del("/a");
  writer_.fill();
  memory_left = SIZE_MAX;
  set("/b", "y");
  open();
  EXPECT_EQ(read("/b"), "y");
}

TEST_F(MirrorTest, NobodyElseCanWriteOrCutIt) {
  open();
  EXPECT_EQ(mmap(nullptr, mirror::kBytes, PROT_READ | PROT_WRITE, MAP_SHARED, fd_, 0), MAP_FAILED);
  EXPECT_NE(ftruncate(fd_, 0), 0);
  EXPECT_NE(ftruncate(fd_, 2 * mirror::kBytes), 0);
  EXPECT_LT(pwrite(fd_, "x", 1, 0), 0);
  EXPECT_NE(fcntl(fd_, F_ADD_SEALS, F_SEAL_WRITE), 0);
}

TEST(MirrorMap, TakesNothingElse) {
  const int file = open("/etc/passwd", O_RDONLY | O_CLOEXEC);
  EXPECT_EQ(client::map_mirror(file), nullptr);
  close(file);
  EXPECT_EQ(client::map_mirror(-1), nullptr);
  const int unsealed = memfd_create("test", MFD_CLOEXEC | MFD_ALLOW_SEALING);
  ASSERT_EQ(ftruncate(unsealed, mirror::kBytes), 0);
  EXPECT_EQ(client::map_mirror(unsealed), nullptr);
  ASSERT_EQ(ftruncate(unsealed, 4096), 0);
  ASSERT_EQ(fcntl(unsealed, F_ADD_SEALS, F_SEAL_SHRINK), 0);
  EXPECT_EQ(client::map_mirror(unsealed), nullptr);
  close(unsealed);
}

// A library and a daemon of different versions meet whenever one of them was updated and the other still
// runs.
TEST(MirrorMap, TakesNoOtherLayout) {
  const int fd = memfd_create("test", MFD_CLOEXEC | MFD_ALLOW_SEALING);
  ASSERT_EQ(ftruncate(fd, mirror::kBytes), 0);
  ASSERT_EQ(fcntl(fd, F_ADD_SEALS, F_SEAL_SHRINK), 0);
  for (const mirror::Word layout : {mirror::kThisLayout, mirror::kThisLayout + 1, mirror::Word{0}}) {
    ASSERT_EQ(pwrite(fd, &layout, sizeof layout, mirror::kLayout * sizeof layout), 4);
    const mirror::Word* words = client::map_mirror(fd);
    EXPECT_EQ(words != nullptr, layout == mirror::kThisLayout) << layout;
    client::unmap_mirror(words);
  }
  close(fd);
}

// Random changes: whatever the mirror answers is what the tree holds.
TEST_F(MirrorTest, AgreesWithTheTree) {
  open();
  std::mt19937 random(7);
  const auto below = [&](unsigned limit) {
    return std::uniform_int_distribution<unsigned>(0, limit - 1)(random);
  };
  const auto any_path = [&] {
    std::string path;
    for (unsigned depth = 1 + below(3); depth > 0; depth--) {
      const unsigned number = 1 + below(4);
      const std::string name = below(2) == 0 ? "id" : "a";
      path += "/" + name + (number > 1 || name == "id" ? ":" + std::to_string(number) : "");
    }
    return path;
  };
  unsigned answered = 0;
  for (int i = 0; i < 20000; i++) {
    const std::string path = any_path();
    if (below(8) == 0 && exists(tree_, path)) {
      del(path);
    } else {
      set(path, std::string(below(4) == 0 ? below(300) : below(20), static_cast<char>('a' + below(26))));
    }
    const std::string asked = any_path();
    const std::string answer = read(asked);
    const std::optional<std::string> value = get(tree_, asked);
    if (answer == kNotThere) {
      EXPECT_TRUE(!value || value->size() > mirror::kLongestValue) << asked;
    } else {
      answered++;
      ASSERT_EQ(answer, value) << asked;
    }
  }
  EXPECT_GT(answered, 5000U);
}

// Values of one letter each, in all lengths: a reader must never see two letters, or a length that no letter
// has.
TEST_F(MirrorTest, AReaderNeverSeesHalfOfAChange) {
  set("/a", "aaa");
  open();
  std::atomic<bool> over = false;
  std::thread reader([&] {
    unsigned seen = 0;
    for (unsigned i = 0; !over.load() || seen == 0; i++) {
      char buffer[256];
      const int size = mirror::read(words_, i % 2 == 0 ? "/a" : "/id:2/b", buffer, sizeof buffer);
      if (size <= 0) continue;
      seen++;
      ASSERT_EQ(size % 26, (buffer[0] - 'a' + 3) % 26);
      for (int at = 1; at < size; at++) ASSERT_EQ(buffer[at], buffer[0]);
    }
  });
  for (unsigned i = 0; i < 200000; i++) {
    const unsigned size = 1 + (i * 37) % 255;
    const std::string value(size, static_cast<char>('a' + (size + 23) % 26));
    set(i % 2 == 0 ? "/a" : "/id:2/b", value);
    if (i % 1000 == 999) del("/id:2/b");
  }
  over = true;
  reader.join();
}

}  // namespace
}  // namespace ktree
