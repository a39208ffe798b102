#include "vv/searches.h"

#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>

#include "ktree/client/calls.h"
#include "shares/lock_file.h"

#define TARGETS "/temp/vv_search"
#define LUNS "/temp/vv_search_lun"

namespace vv {
namespace {

using ktree::client::CallResult;
using platform::TreeReader;

constexpr char kRoot[] = "/temp";
constexpr char kUnknown[] = "unknown";  // the tool's word for a file system that is not recognised
constexpr int kLoginFailed = 100;

bool forget(const char* path) {
  return ktree::client::del(platform::kGeneralTree, path) != CallResult::kUnreachable;
}

}  // namespace

SearchTurn::SearchTurn() : lock_(open_lock_file("vv-search.lock")) {
  if (lock_ >= 0) take_lock(lock_, LOCK_EX);
  // A search that fails or finds nothing leaves what an earlier one has found.
  reachable_ = forget(TARGETS) && forget(LUNS);
}

SearchTurn::~SearchTurn() {
  if (lock_ >= 0) close(lock_);
}

FoundTargets found_targets(const TreeReader& tree) {
  FoundTargets found;
  found.done = tree.number(0, TARGETS "/search_done") == 1;
  for (int n = 1;; n++) {
    const std::string name = tree.value(TARGETS "/id:%d/name", n);
    if (name.empty()) break;
    found.names.push_back(name);
  }
  // A target is offered once for each address of its portals.
  found.names.erase(std::unique(found.names.begin(), found.names.end()), found.names.end());
  return found;
}

FoundLuns found_luns(const TreeReader& tree, const std::string& target) {
  FoundLuns found;
  const int code = tree.number(-1, LUNS "/err_code");
  found.done = code == 0;
  found.login_failed = code == kLoginFailed;
  if (!found.done || tree.value(LUNS "/target_name") != target) return found;
  const int count = tree.number(0, LUNS "/lun/count");
  for (int n = 1; n <= count && !tree.value(LUNS "/lun/id:%d/lun", n).empty(); n++) {
    FoundLun lun;
    lun.number = tree.number(-1, LUNS "/lun/id:%d/lun", n);
    lun.size = strtoull(tree.value(LUNS "/lun/id:%d/size", n).c_str(), nullptr, 10);
    lun.available = tree.number(0, LUNS "/lun/id:%d/avaliable", n) != 0;
    lun.file_system = tree.value(LUNS "/lun/id:%d/fstype", n);
    if (lun.file_system == kUnknown) lun.file_system.clear();
    found.luns.push_back(lun);
  }
  return found;
}

FoundTargets read_found_targets() {
  return found_targets(TreeReader(platform::kGeneralTree, kRoot));
}

FoundLuns read_found_luns(const std::string& target) {
  return found_luns(TreeReader(platform::kGeneralTree, kRoot), target);
}

}  // namespace vv
