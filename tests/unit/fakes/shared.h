// What the fakes keep in memory shared with forked children.
#ifndef FAKES_SHARED_H
#define FAKES_SHARED_H

#include <atomic>
#include <cstddef>

namespace fakes {

struct Node {
  int parent;  // index; -1 for the root of a socket's tree, whose name is the socket
  bool live, has_value;
  char name[128];
  char value[2048];
};

struct Shared {
  std::atomic_flag busy;
  std::atomic<unsigned> counters[4096];
  size_t node_count;
  Node nodes[4096];
  size_t log_size;
  char log[16 << 20];  // lines; fields parted by 0x1f, lines ended by NUL
};

Shared& shared();

// Holds the shared memory for itself.
class Hold {
 public:
  Hold() {
    while (shared().busy.test_and_set()) {
    }
  }
  ~Hold() { shared().busy.clear(); }
  Hold(const Hold&) = delete;
  Hold& operator=(const Hold&) = delete;
};

}  // namespace fakes

#endif
