#include "vv/job.h"

#include <unistd.h>

#include <cstring>

#include "common/utf8.h"
#include "vv/list.h"
#include "vv/progress.h"
#include "vv/secret.h"
#include "vv/terminal.h"

namespace vv {
namespace {

using vvstat::Row;
using vvstat::Target;

constexpr char kLoggedIn[] = "LOGGED_IN";

// A volume that is up, and that could not be written from the beginning, is as it should be.
std::string up_message(const Row& row) {
  const std::string share = platform::printable(row.volume->share);
  return share + " is mounted on " + platform::printable(row.volume->mount_point) +
         (row.read_only ? ", read only" : "");
}

bool is_up(const Row& row) {
  return row.mounted && row.healthy() && row.session == kLoggedIn;
}

std::string shown_word(const std::string& name) {
  return platform::printable(vvstat::quoted(name));
}

constexpr struct {
  std::string_view stands;  // in an advice
  std::string (*name)(const Options& options);
} kNames[] = {
    {kShareToName, [](const Options& options) { return shown_word(options.name); }},
    {kPortalToName,
     [](const Options& options) {
       return shown_word(options.portal.empty() ? options.name : options.portal);
     }},
    {kMachineToName, [](const Options&) { return this_machine(); }},
};

}  // namespace

std::string why_unreachable(const char* tree, const char* unit) {
  if (geteuid() != 0) return "only root may do this";
  return std::string("the ") + tree + " tree cannot be reached; see systemctl status " + unit;
}

std::string this_machine() {
  const std::string name = initiator_name();
  return name.empty() ? "this machine" : "this machine (" + platform::printable(name) + ")";
}

Failure Job::explain(const ToolRun& run, const char* step) const {
  if (!run.started) return {kToolStep, "remvol cannot be run", "see whether it is installed", {}};
  Failure failure = explain_output(run.output, step);
  if (run.signal != 0) {
    failure.why = std::string("remvol was ended by a signal: ") + strsignal(run.signal);
    failure.advice = "vv status shows how things are now";
  } else if (failure.why.empty() && !failure.details.empty()) {
    failure.why = failure.details.back();
  }
  return with_name(failure);
}

Failure Job::with_name(Failure failure) const {
  for (const auto& [stands, name] : kNames) {
    const size_t place = failure.advice.find(stands);
    if (place == std::string::npos) continue;
    failure.advice.replace(place, stands.size(), name(options));
    break;
  }
  return failure;
}

Job::Job(const Options& given) : options(given), outcome_{given.command->name, "", "", kDone, "", {}} {}

bool Job::can_look() {
  return before.reachable() || refuse(kUnreachable, why_unreachable("configuration", "remvol-tree"));
}

bool Job::find_share() {
  if (!can_look()) return false;
  row = before.share(options.name);
  outcome_.share = options.name;
  if (row == nullptr) {
    const std::string names = before.share_names();
    return refuse(
        kUsage, "there is no share \"" + platform::printable(options.name) + "\"" +
                    (names.empty() ? "; none is configured" : "; there are: " + platform::printable(names)));
  }
  target = row->target;
  outcome_.target = target->name;
  return true;
}

bool Job::find_share_or_target() {
  target = before.target(options.name);
  if (target == nullptr || before.share(options.name) != nullptr) return find_share();
  outcome_.target = target->name;
  return true;
}

bool Job::read_credentials(Credentials& credentials) {
  std::string why;
  return vv::read_credentials(options, credentials, why) || refuse(kUsage, why);
}

bool Job::confirm(const std::string& question) {
  if (options.yes) return true;
  switch (ask(question)) {
    case Answer::kYes:
      return true;
    case Answer::kNo:
      return refuse(kRefused, "nothing was changed");
    default:
      return refuse(kRefused,
                    question + "\n  there is no terminal to ask at; --yes means that nothing is to be asked");
  }
}

ToolRun Job::run(const Arguments& arguments, const std::string& target_name) {
  outcome_.target = target_name;
  Progress progress(target_name, !options.json);
  ToolRun run = run_tool(arguments, [&progress] { progress.look(); });
  warnings_ = warnings_in(run.output);
  // It puts right what a run that was ended, or a format that failed, has left.
  if (run.started && !run.succeeded()) run_tool({"--status"}, [] {});
  return run;
}

bool Job::refuse(int status, const std::string& message, const Failure& failure) {
  outcome_.status = status;
  outcome_.message = message;
  outcome_.failure = failure;
  return false;
}

int Job::done(const std::string& message) {
  refuse(kDone, message, {"", "", "", warnings_});
  return end();
}

int Job::failed(const std::string& message, const Failure& failure) {
  refuse(kFailed, message, failure);
  return end();
}

int Job::end() {
  return tell(outcome_, options.json);
}

int Job::tell_not_up(const Row& ailing, const ToolRun& run) {
  Failure failure = with_name(explain_volume(ailing, run.output));
  for (const std::string& message : kernel_.messages_of(ailing.volume->device)) {
    failure.details.push_back("kernel: " + message);
  }
  outcome_.share = ailing.volume->share;
  return failed(platform::printable(ailing.volume->share) + " is not mounted as it should be", failure);
}

int Job::tell_brought_up(const std::string& target_name, const std::string& share, const ToolRun& run) {
  outcome_.share = share;
  const std::string name = platform::printable(share.empty() ? target_name : share);
  if (!run.started || run.signal != 0) {
    return failed(name + " was not brought up", explain(run, kToolStep));
  }
  const Look after;
  const Target* now = after.target(target_name);
  if (now == nullptr) return failed(name + " was deleted meanwhile", explain(run, kStoreStep));
  std::string message;
  for (const Row* each : after.volumes_of(*now)) {
    if (share.empty() ? !each->volume->enabled : each->volume->share != share) continue;
    if (!is_up(*each)) return tell_not_up(*each, run);
    append(message, up_message(*each), "\n");
  }
  if (!run.succeeded() || !after.in_use(target_name)) {
    return failed(name + " was not brought up", explain(run, kLoginStep));
  }
  return done(message.empty() ? name + " is connected" : message);
}

}  // namespace vv
