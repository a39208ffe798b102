#include "vv/target_commands.h"

#include "common/utf8.h"
#include "vv/job.h"
#include "vv/list.h"

namespace vv {
namespace {

using vvstat::Row;
using vvstat::Target;

// The mounted volumes of the target: they are away for the time of a change.
std::string mounted_shares(const Job& job) {
  std::string names;
  for (const Row* row : job.before.volumes_of(*job.target)) {
    if (row->mounted) append(names, platform::printable(row->volume->share));
  }
  return names;
}

bool is_stored(const std::string& target, const Credentials& credentials) {
  const Credentials stored = stored_credentials(target);
  return stored.user == credentials.user && stored.secret == credentials.secret;
}

}  // namespace

int password(const Options& options) {
  Job job(options);
  Credentials credentials;
  if (!job.find_share_or_target()) return job.end();
  if (!job.read_credentials(credentials)) return job.end();
  const std::string names = mounted_shares(job);
  if (!names.empty() &&
      !job.confirm(names +
                   " goes away for a moment; programs that have files open there are ended. Go on?")) {
    return job.end();
  }
  const Target target = *job.target;
  const ToolRun run = job.run(modify_arguments(target.name, credentials), target.name);
  if (!run.succeeded() || !is_stored(target.name, credentials)) {
    return job.failed("the password is not changed", job.explain(run, kStoreStep));
  }
  if (target.wanted) return job.tell_brought_up(target.name, job.row != nullptr ? options.name : "", run);
  return job.done("the password is stored\nconnect it: " +
                  platform::printable(vvstat::vv_command("connect", options.name)));
}

int rename_portal(const Options& options) {
  Job job(options);
  Portal portal;
  std::string why;
  if (!job.find_share_or_target()) return job.end();
  if (!read_portal(options.portal, portal, why)) {
    job.refuse(kUsage, platform::printable(why));
    return job.end();
  }
  const std::string name = platform::printable(options.name);
  const std::string target = job.target->name;
  if (job.before.in_use(target)) {
    return job.failed(name + " is connected, and its portal is not changed",
                      {kStoreStep,
                       "a portal is changed while the target is not connected",
                       platform::printable(vvstat::vv_command("disconnect", options.name)),
                       {}});
  }
  const ToolRun run = job.run(modify_address_arguments(target, portal), target);
  const Look after;
  const Target* now = after.target(target);
  // The tool succeeds as well when it refuses.
  if (!run.succeeded() || now == nullptr || stored_portal(now->address, now->port).text() != portal.text()) {
    return job.failed("the portal of " + name + " is not changed", job.explain(run, kDiscoveryStep));
  }
  return job.done(name + " is reached at " + portal.text() + " from now on\nconnect it: " +
                  platform::printable(vvstat::vv_command("connect", options.name)));
}

}  // namespace vv
