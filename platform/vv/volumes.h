// What is configured, found by the names that people use.
#ifndef PLATFORM_VV_VOLUMES_H
#define PLATFORM_VV_VOLUMES_H

#include <string>
#include <vector>

#include "vv/tool.h"
#include "vvstat/health.h"
#include "vvstat/status.h"

namespace vv {

// What the tree and the kernel say at one moment. Rows point into the status.
class Look {
 public:
  Look();
  explicit Look(const platform::TreeListing& tree);
  Look(const Look&) = delete;
  Look& operator=(const Look&) = delete;

  bool reachable() const { return status_.reachable; }
  const std::vector<vvstat::Target>& targets() const { return status_.targets; }
  const std::vector<vvstat::Row>& rows() const { return rows_; }

  // The volume of that share; null when there is none.
  const vvstat::Row* share(const std::string& name) const;

  // The target of that name.
  const vvstat::Target* target(const std::string& name) const;

  // The volume that is this LUN.
  const vvstat::Row* lun(const std::string& target, int number) const;

  // The rows of the target's volumes.
  std::vector<const vvstat::Row*> volumes_of(const vvstat::Target& target) const;

  // True while the target has a session, or a volume of it is mounted.
  bool in_use(const std::string& target) const;

  // Names of all shares, for a message: "Backup, Photos".
  std::string share_names() const;

 private:
  vvstat::Status status_;
  std::vector<vvstat::Row> rows_;
};

// The name that this machine has as an initiator; empty when the tree has none.
std::string initiator_name();

// User and secret that the tree has of the target; none when it is not stored or uses none.
Credentials stored_credentials(const std::string& target);

// The kernel's name of the disk that is this LUN of the target's session, such as "sdb"; empty when there is
// none.
std::string disk_of(const std::string& target, int lun);

}  // namespace vv

#endif
