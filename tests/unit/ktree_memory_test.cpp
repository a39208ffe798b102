// A daemon whose memory runs out at any allocation of a request: the tree is as it was, or as it should be.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <new>

#include "ktree/service.h"
#include "ktree_support.h"

namespace {

int allocations_left = 0;  // above 0: so many more, and the last of them fails

void* allocate(size_t size) {
  if (allocations_left > 0 && --allocations_left == 0) return nullptr;
  return malloc(size);
}

}  // namespace

// Not inline, where gcc 12 would take their malloc for a mismatched pair.
[[gnu::noinline]] void* operator new(size_t size) {
  void* block = allocate(size);
  if (block == nullptr) throw std::bad_alloc();
  return block;
}
[[gnu::noinline]] void* operator new(size_t size, const std::nothrow_t&) noexcept {
  return allocate(size);
}
[[gnu::noinline]] void* operator new[](size_t size) {
  return operator new(size);
}
[[gnu::noinline]] void operator delete[](void* block) noexcept {
  free(block);
}
[[gnu::noinline]] void operator delete[](void* block, size_t) noexcept {
  free(block);
}
[[gnu::noinline]] void operator delete(void* block) noexcept {
  free(block);
}
[[gnu::noinline]] void operator delete(void* block, size_t) noexcept {
  free(block);
}

namespace ktree {
namespace {

constexpr char kBefore[] =
    "<config><a>one</a><b><id>x</id><id><c>three</c></id></b><long>a value that no string keeps in "
    "itself</long></config>";
constexpr char kOther[] =
    "<config><p>1</p><q><r>a value that no string keeps in itself</r><r/><r/></q><s encoding=\"base64\">"
    "YQ0=</s></config>";

// A memory file that holds `text`.
class File {
 public:
  explicit File(std::string_view text) : fd_(memfd_create("test", MFD_CLOEXEC)) {
    if (write(fd_, text.data(), text.size()) != static_cast<ssize_t>(text.size())) abort();
    lseek(fd_, 0, SEEK_SET);
  }
  File(const File&) = delete;
  File& operator=(const File&) = delete;
  ~File() { close(fd_); }
  int fd() const { return fd_; }
  std::string text() const {
    std::string text(static_cast<size_t>(lseek(fd_, 0, SEEK_END)), '\0');
    EXPECT_EQ(pread(fd_, text.data(), text.size(), 0), static_cast<ssize_t>(text.size()));
    return text;
  }

 private:
  int fd_;
};

std::string listing_of(Service& service) {
  const File file("");
  EXPECT_EQ(service.handle({Operation::kList, "/", "", file.fd()}).status, ReplyStatus::kDone);
  return file.text();
}

void load(Service& service, const char* document) {
  const File file(document);
  ASSERT_EQ(service.handle({Operation::kLoad, "", "", file.fd()}).status, ReplyStatus::kDone);
}

struct Case {
  const char* name;
  Operation operation;
  const char* path;
  const char* value;
  const char* document;  // null: none is passed
  int at_least;          // allocations
};

class Memory : public testing::TestWithParam<Case> {};

TEST_P(Memory, RunsOutAtEveryAllocation) {
  const Case& request = GetParam();
  Service after;
  load(after, kBefore);
  const std::string before = listing_of(after);
  int failures = 0;
  for (int n = 1;; n++) {
    Service service;
    load(service, kBefore);
    const File file(request.document == nullptr ? "" : request.document);
    const int document = request.document == nullptr ? -1 : file.fd();
    allocations_left = n;
    const ReplyStatus status =
        service.handle({request.operation, request.path, request.value, document}).status;
    const bool ran_out = allocations_left == 0;
    allocations_left = 0;
    if (!ran_out) {
      EXPECT_EQ(status, ReplyStatus::kDone);
      break;
    }
    failures++;
    EXPECT_EQ(status, ReplyStatus::kFailed) << n;
    EXPECT_EQ(listing_of(service), before) << n;
    // The count of what the tree holds is right as well: it takes what it took before, and gives it back.
    EXPECT_EQ(service.handle({Operation::kSet, "/new/id:3", "v", -1}).status, ReplyStatus::kDone);
    EXPECT_EQ(service.handle({Operation::kDel, "/new", "", -1}).status, ReplyStatus::kDone);
    EXPECT_EQ(listing_of(service), before) << n;
  }
  EXPECT_GE(failures, request.at_least);
}

INSTANTIATE_TEST_SUITE_P(Requests, Memory,
                         testing::Values(Case{"replace", Operation::kSet, "/a", "another value", nullptr, 1},
                                         Case{"branch", Operation::kSet,
                                              "/new/branch:3/with/id:5/a_name_that_no_string_keeps", "v",
                                              nullptr, 20},
                                         Case{"sibling", Operation::kSet, "/b/id:9/c", "v", nullptr, 8},
                                         Case{"second_group", Operation::kSet, "/b/a", "v", nullptr, 3},
                                         Case{"del", Operation::kDel, "/b/id:1", "", nullptr, 0},
                                         Case{"dump", Operation::kDump, "", "", "", 0},
                                         Case{"load", Operation::kLoad, "", "", kOther, 20},
                                         Case{"list", Operation::kList, "/", "", "", 0}),
                         [](const auto& instance) { return std::string(instance.param.name); });

// What a tree reckons that it holds is exact after a set that ran out of memory.
TEST(TreeMemory, NothingIsCountedTwice) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a/b", "1"));
  const size_t nodes = tree.node_count();
  for (int n = 1; n < 30; n++) {
    allocations_left = n;
    try {
      (void)set(tree, "/x:5/y:5", "v");
      break;
    } catch (const std::bad_alloc&) {
      EXPECT_EQ(tree.node_count(), nodes);
      EXPECT_EQ(list(tree), "/a/b=1\n");
    }
    allocations_left = 0;
  }
  allocations_left = 0;
  EXPECT_EQ(get(tree, "/x:5/y:5"), "v");
}

}  // namespace
}  // namespace ktree
