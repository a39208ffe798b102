#include "common/utf8.h"
#include "shares/share_name.h"
#include "tree_layout.h"
#include "vv/job.h"
#include "vv/list.h"
#include "vv/search_commands.h"
#include "vv/volume_commands.h"

namespace vv {
namespace {

using vvstat::Row;
using vvstat::Target;

constexpr size_t kLongestShare = 127;  // bytes

// What is wrong with the name as a new share's; empty when nothing is.
std::string fault_of_name(const Look& look, const std::string& share) {
  if (share.size() > kLongestShare) return "a share's name has at most 127 bytes";
  const char* refusal = shares::name_refusal(share, shares::kSambaNames);
  if (refusal != nullptr) return platform::printable(share) + " cannot be the name of a share: " + refusal;
  for (const Row& row : look.rows()) {
    if (row.volume == nullptr || shares::folded_name(row.volume->share) != shares::folded_name(share)) {
      continue;
    }
    return "there is a share " + platform::printable(row.volume->share) + " already: LUN " +
           std::to_string(row.volume->lun) + " of " + platform::printable(row.target->name);
  }
  return {};
}

size_t volumes_in(const Look& look) {
  size_t count = 0;
  for (const Row& row : look.rows()) count += row.volume != nullptr ? 1 : 0;
  return count;
}

// The one target of the portal.
bool choose_target(Job& job, const Portal& portal, std::string& target) {
  std::vector<std::string> names;
  if (!discover_targets(job, portal, names)) return false;
  if (names.size() == 1) {
    target = names.front();
    return true;
  }
  std::string message = "the portal " + portal.text();
  message += names.empty() ? " offers no target to " + this_machine() : " offers several targets, name one";
  for (const std::string& name : names) {
    message += "\n  --target " + platform::printable(vvstat::quoted(name));
  }
  return job.refuse(kUsage, message);
}

// What would do in place of a portal.
std::string other_place(const Job& job) {
  std::string names;
  for (const Target& target : job.before.targets()) append(names, platform::printable(target.name));
  return names.empty() || !job.options.target.empty() ? "for a target that is not configured yet"
                                                      : "or --target with one that is configured: " + names;
}

// Fills portal and target from the options, the tree and, if need be, the portal itself.
bool find_place(Job& job, Portal& portal, std::string& target) {
  const Options& options = job.options;
  const Target* stored = options.target.empty() ? nullptr : job.before.target(options.target);
  target = options.target;
  if (options.portal.empty()) {
    if (stored == nullptr) return job.refuse(kUsage, "add needs --portal, " + other_place(job));
    portal = stored_portal(stored->address, stored->port);
    return true;
  }
  std::string why;
  if (!read_portal(options.portal, portal, why)) return job.refuse(kUsage, platform::printable(why));
  return !target.empty() || choose_target(job, portal, target);
}

// A stored target is changed by its own commands alone: the tool would overwrite its settings.
bool fits_what_is_stored(Job& job, const Portal& portal, const std::string& target) {
  if (const Row* row = job.before.lun(target, job.options.lun)) {
    return job.refuse(kUsage, "LUN " + std::to_string(job.options.lun) + " of this target is the share " +
                                  platform::printable(row->volume->share) + " already");
  }
  if (volumes_in(job.before) >= remvol::kMaxLuns) {
    return job.refuse(kUsage,
                      std::to_string(remvol::kMaxLuns) + " volumes are configured, which is the most");
  }
  const Target* stored = job.before.target(target);
  if (stored == nullptr && job.before.targets().size() >= remvol::kMaxTargets) {
    return job.refuse(kUsage,
                      std::to_string(remvol::kMaxTargets) + " targets are configured, which is the most");
  }
  if (stored == nullptr) return true;
  const Portal there = stored_portal(stored->address, stored->port);
  if (there.text() == portal.text()) return true;
  return job.refuse(kUsage, "this target is configured with the portal " + there.text() +
                                "; to move it: vv rename-portal " +
                                platform::printable(vvstat::quoted(target)) + " --portal " + portal.text());
}

int tell_added(Job& job, const std::string& target, const ToolRun& run) {
  const std::string& share = job.options.name;
  const std::string name = platform::printable(share);
  const Look after;
  const Row* row = after.share(share);
  if (row == nullptr) return job.failed(name + " was not added", job.explain(run, kStoreStep));
  if (!row->session.empty()) return job.tell_brought_up(target, share, run);
  if (!run.succeeded()) return job.failed(name + " was not added", job.explain(run, kStoreStep));
  return job.done(name + " is added: LUN " + std::to_string(row->volume->lun) + " of " +
                  platform::printable(target) +
                  "\nconnect it: " + platform::printable(vvstat::vv_command("connect", share)));
}

}  // namespace

int add(const Options& options) {
  Job job(options);
  Portal portal;
  std::string target;
  if (!job.can_look()) return job.end();
  const std::string fault = fault_of_name(job.before, options.name);
  if (!fault.empty()) {
    job.refuse(kUsage, fault);
    return job.end();
  }
  if (!find_place(job, portal, target) || !fits_what_is_stored(job, portal, target)) return job.end();
  Credentials credentials;
  if (!job.read_credentials(credentials)) return job.end();
  if (credentials.user.empty()) credentials = stored_credentials(target);
  const ToolRun run = job.run(add_arguments(target, options.lun, options.name, portal, credentials), target);
  return tell_added(job, target, run);
}

}  // namespace vv
