#include "vv/searches.h"

#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>

#include "common/lock_file.h"
#include "ktree/client/calls.h"
#include "tree_layout.h"

namespace vv {
namespace {

using ktree::client::CallResult;
using platform::TreeReader;
namespace key = remvol::key;

constexpr char kUnknown[] = "unknown";  // the tool's word for a file system that is not recognised

bool forget(const char* path) {
  return ktree::client::del(remvol::kGeneralSocket, path) != CallResult::kUnreachable;
}

}  // namespace

SearchTurn::SearchTurn() : lock_(platform::open_lock_file("vv-search.lock")) {
  if (lock_ >= 0) platform::take_lock(lock_, LOCK_EX);
  // A search that fails or finds nothing leaves what an earlier one has found.
  reachable_ = forget(key::kSearch) && forget(key::kLunSearch);
}

SearchTurn::~SearchTurn() {
  if (lock_ >= 0) close(lock_);
}

FoundTargets found_targets(const TreeReader& tree) {
  FoundTargets found;
  found.done = tree.number(0, key::kSearchDone) == 1;
  for (int n = 1;; n++) {
    const std::string name = tree.value(key::kSearchName, n);
    if (name.empty()) break;
    found.names.push_back(name);
  }
  // A target is offered once for each address of its portals.
  found.names.erase(std::unique(found.names.begin(), found.names.end()), found.names.end());
  return found;
}

FoundLuns found_luns(const TreeReader& tree, const std::string& target) {
  FoundLuns found;
  const int code = tree.number(-1, key::kLunSearchError);
  found.done = code == remvol::kLunSearchDone;
  found.login_failed = code == remvol::kLunSearchLoginFailed;
  if (!found.done || tree.value(key::kLunSearchTarget) != target) return found;
  const int count = tree.number(0, key::kLunSearchCount);
  for (int n = 1; n <= count && !tree.value(key::kLunSearchLun, n).empty(); n++) {
    FoundLun lun;
    lun.number = tree.number(-1, key::kLunSearchLun, n);
    lun.size = strtoull(tree.value(key::kLunSearchSize, n).c_str(), nullptr, 10);
    lun.available = tree.number(0, key::kLunSearchAvailable, n) != 0;
    lun.file_system = tree.value(key::kLunSearchFsType, n);
    if (lun.file_system == kUnknown) lun.file_system.clear();
    found.luns.push_back(lun);
  }
  return found;
}

FoundTargets read_found_targets() {
  return found_targets(TreeReader(remvol::kGeneralSocket, key::kTemporary));
}

FoundLuns read_found_luns(const std::string& target) {
  return found_luns(TreeReader(remvol::kGeneralSocket, key::kTemporary), target);
}

}  // namespace vv
