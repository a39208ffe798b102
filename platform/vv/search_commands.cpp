#include "vv/search_commands.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/utf8.h"
#include "vv/job.h"
#include "vv/list.h"
#include "vv/searches.h"
#include "vvstat/columns.h"

namespace vv {
namespace {

using vvstat::Row;

// The shares of the target's volumes.
std::string shares_on(const Look& look, const std::string& name) {
  const vvstat::Target* target = look.target(name);
  std::string shares;
  if (target == nullptr) return shares;
  for (const Row* row : look.volumes_of(*target)) append(shares, row->volume->share);
  return shares;
}

std::string size_of(const FoundLun& lun, bool bytes) {
  return bytes ? std::to_string(lun.size) : vvstat::readable_size(lun.size);
}

Table table_of(const Look& look, const std::string& target, const FoundLuns& found, bool json) {
  Table table{"luns", {{"LUN", true}, {"SIZE", true}, {"FSTYPE"}, {"SHARE"}}, {}};
  for (const FoundLun& lun : found.luns) {
    const Row* row = look.lun(target, lun.number);
    table.rows.push_back({std::to_string(lun.number), size_of(lun, json), lun.file_system,
                          row != nullptr ? row->volume->share : ""});
  }
  return table;
}

bool general_tree_answers(Job& job, const SearchTurn& turn) {
  return turn.reachable() || job.refuse(kUnreachable, why_unreachable("general", "remvol-general-tree"));
}

// Fills the portal that the options name, or that is stored of the target.
bool find_portal(Job& job, const std::string& target_name, Portal& portal) {
  std::string why;
  if (!job.options.portal.empty()) {
    return read_portal(job.options.portal, portal, why) || job.refuse(kUsage, platform::printable(why));
  }
  const vvstat::Target* target = job.before.target(target_name);
  if (target == nullptr) {
    return job.refuse(kUsage, "no share or target of this name is configured here; a target needs --portal");
  }
  portal = stored_portal(target->address, target->port);
  return true;
}

// Whether the target's session is there and has lost its connection: it shows no LUN, or those of before.
bool is_lost(const Look& look, const std::string& name) {
  const vvstat::Target* target = look.target(name);
  if (target == nullptr) return false;
  const std::vector<const Row*> rows = look.volumes_of(*target);
  return std::any_of(rows.begin(), rows.end(),
                     [](const Row* row) { return !row->session.empty() && row->session != "LOGGED_IN"; });
}

int tell_luns_failed(Job& job, const FoundLuns& found, const ToolRun& run) {
  Failure failure = job.explain(run, found.login_failed ? kLoginStep : kLunsStep);
  if (run.output.find("authorization") != std::string::npos) {
    failure.advice = "give those of the storage server: --user NAME, and --password-file FILE";
  }
  return job.failed("the target's LUNs cannot be listed", failure);
}

}  // namespace

bool discover_targets(Job& job, const Portal& portal, std::vector<std::string>& names) {
  const SearchTurn turn;
  if (!general_tree_answers(job, turn)) return false;
  const ToolRun run = job.run(search_arguments(portal), "");
  const FoundTargets found = read_found_targets();
  if (!run.succeeded() || !found.done) {
    return job.refuse(kFailed, "the portal " + portal.text() + " cannot be asked for its targets",
                      job.explain(run, kDiscoveryStep));
  }
  names = found.names;
  return true;
}

int discover(const Options& options) {
  Job job(options);
  Portal portal;
  std::string why;
  std::vector<std::string> names;
  if (!job.can_look()) return job.end();
  if (!read_portal(options.name, portal, why)) {
    job.refuse(kUsage, platform::printable(why));
    return job.end();
  }
  if (!discover_targets(job, portal, names)) return job.end();
  Table table{"targets", {{"TARGET"}, {"SHARES"}}, {}};
  for (const std::string& name : names) table.rows.push_back({name, shares_on(job.before, name)});
  if (names.empty() && !options.json) return job.done("the portal offers no target to " + this_machine());
  put(shown(table, options.json));
  return finish(kDone);
}

int luns(const Options& options) {
  Job job(options);
  if (!job.can_look()) return job.end();
  const Row* share = job.before.share(options.name);
  const std::string name = share != nullptr ? share->target->name : options.name;
  Portal portal;
  Credentials credentials;
  if (!find_portal(job, name, portal)) return job.end();
  if (is_lost(job.before, name)) {
    return job.failed(
        "the target's LUNs cannot be listed",
        {kLoginStep, "the connection was lost", "look at the network and the storage server", {}});
  }
  if (!job.read_credentials(credentials)) return job.end();
  if (credentials.user.empty()) credentials = stored_credentials(name);
  const SearchTurn turn;
  if (!general_tree_answers(job, turn)) return job.end();
  const ToolRun run = job.run(search_lun_arguments(name, portal, credentials), "");
  const FoundLuns found = read_found_luns(name);
  if (!run.succeeded() || !found.done) return tell_luns_failed(job, found, run);
  if (found.luns.empty() && !options.json) return job.done("the target offers no LUN to " + this_machine());
  put(shown(table_of(job.before, name, found, options.json), options.json));
  return finish(kDone);
}

int status(const Options& options) {
  char name[] = "vvstat";
  options.rest[-1] = name;
  execvp(name, options.rest - 1);
  fprintf(stderr, "vv: %s: %s\n", name, strerror(errno));
  return kFailed;
}

}  // namespace vv
