// What the tool's searches have found. They leave it in the machine's general tree.
#ifndef PLATFORM_VV_SEARCHES_H
#define PLATFORM_VV_SEARCHES_H

#include <string>
#include <vector>

#include "common/tree_reader.h"

namespace vv {

// One search at a time: a second one would overwrite what the first has found. Waits for the others, and
// removes what they left.
class SearchTurn {
 public:
  SearchTurn();
  ~SearchTurn();
  SearchTurn(const SearchTurn&) = delete;
  SearchTurn& operator=(const SearchTurn&) = delete;

  // False when the general tree does not answer.
  bool reachable() const { return reachable_; }

 private:
  int lock_;
  bool reachable_;
};

struct FoundTargets {
  bool done = false;               // the search came to its end
  std::vector<std::string> names;  // in ascending order, each once
};

struct FoundLun {
  int number;
  unsigned long long size;  // bytes
  bool available;           // not configured here yet
  std::string file_system;  // empty when none is recognised
};

struct FoundLuns {
  bool done = false;          // the search came to its end
  bool login_failed = false;  // it did not come to a session
  std::vector<FoundLun> luns;
};

FoundTargets found_targets(const platform::TreeReader& tree);
FoundLuns found_luns(const platform::TreeReader& tree, const std::string& target);

// What the last search left.
FoundTargets read_found_targets();
FoundLuns read_found_luns(const std::string& target);

}  // namespace vv

#endif
