#include "vv/volumes.h"

#include <glob.h>

#include <algorithm>

#include "common/sessions.h"
#include "common/tree_reader.h"
#include "tree_layout.h"
#include "vv/list.h"

namespace vv {
namespace {

using vvstat::Row;
using vvstat::Target;

template <typename Is>
const Row* find_row(const std::vector<Row>& rows, Is is) {
  for (const Row& row : rows) {
    if (row.volume != nullptr && is(row)) return &row;
  }
  return nullptr;
}

}  // namespace

Look::Look() : Look(platform::TreeListing()) {}

Look::Look(const platform::TreeListing& tree)
    : status_(vvstat::read_status(tree)),
      rows_(vvstat::assess(status_, vvstat::read_facts(status_, vvstat::Detail::kHealth))) {}

const Row* Look::share(const std::string& name) const {
  return find_row(rows_, [&name](const Row& row) { return row.volume->share == name; });
}

const Row* Look::lun(const std::string& target, int number) const {
  return find_row(rows_,
                  [&](const Row& row) { return row.target->name == target && row.volume->lun == number; });
}

const Target* Look::target(const std::string& name) const {
  for (const Target& target : status_.targets) {
    if (target.name == name) return &target;
  }
  return nullptr;
}

std::vector<const Row*> Look::volumes_of(const Target& target) const {
  std::vector<const Row*> found;
  for (const Row& row : rows_) {
    if (row.volume != nullptr && row.target->name == target.name) found.push_back(&row);
  }
  return found;
}

bool Look::in_use(const std::string& target) const {
  return std::any_of(rows_.begin(), rows_.end(), [&target](const Row& row) {
    return row.target->name == target && (row.mounted || !row.session.empty());
  });
}

std::string Look::share_names() const {
  std::string names;
  for (const Row& row : rows_) {
    if (row.volume != nullptr) append(names, row.volume->share);
  }
  return names;
}

std::string initiator_name() {
  return platform::TreeReader().value(remvol::key::kInitiatorName);
}

Credentials stored_credentials(const std::string& target) {
  const platform::TreeReader tree;
  Credentials credentials;
  for (int n = 1; n <= remvol::kMaxTargets; n++) {
    if (tree.value(remvol::key::kTargetName, n) != target) continue;
    if (tree.number(0, remvol::key::kTargetChap, n) == 0) break;
    credentials.user = tree.value(remvol::key::kTargetChapName, n);
    credentials.secret = tree.value(remvol::key::kTargetChapPwd, n);
    break;
  }
  return credentials;
}

std::string disk_of(const std::string& target, int lun) {
  std::string disk;
  for (const platform::Session& session : platform::read_sessions()) {
    if (session.target != target) continue;
    const std::string pattern = "/sys/class/iscsi_session/session" + std::to_string(session.number) +
                                "/device/target*/*:*:*:" + std::to_string(lun) + "/block/*";
    glob_t found{};
    if (glob(pattern.c_str(), 0, nullptr, &found) == 0 && found.gl_pathc > 0) {
      disk = found.gl_pathv[0];
      disk = disk.substr(disk.rfind('/') + 1);
    }
    globfree(&found);
  }
  return disk;
}

}  // namespace vv
