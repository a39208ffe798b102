#include "vvstat/health.h"

#include <algorithm>

#include "tree_layout.h"

namespace vvstat {
namespace {

const Problem kNone;

// By the name of a volume's share, which is shorter than its target's.
std::string connect_command_of(const Target& target, const Volume* volume) {
  return volume != nullptr ? vv_command("connect", volume->share) : connect_command(target.name);
}

// A connection alone leaves what is mounted as it is.
std::string mount_anew(const Volume& volume) {
  return vv_command("disconnect", volume.share) + " && " + vv_command("connect", volume.share);
}

// The tool stores that a target is not to be connected when somebody disconnects it, but also when a login
// fails that somebody asked for.
bool is_wanted(const Target& target) {
  return target.wanted || target.connect_state == remvol::kConnected ||
         target.connect_state == remvol::kConnecting || target.connect_state == remvol::kConnectError;
}

// The tool's texts.
constexpr char kRunning[] = "Running", kRunningReadOnly[] = "Running ( Read Only )";
constexpr char kHealsItself[] = "look at the network and the storage server; it heals by itself";

// It stores the same when a session shows no disk at start-up; only the volumes' state tells that from a
// disconnection.
Problem given_up(const Target& target, const Volume& volume) {
  return {Ailment::kFailed, "Given Up", "was given up at start-up: its target showed no disk",
          "see whether the storage server still offers its LUNs", connect_command_of(target, &volume)};
}

// Nothing of a target's volumes can be had while it has a problem. `volume` is the one whose problem it is;
// null: the target has none.
Problem problem_of_target(const Target& target, const Volume* volume, const TargetFacts& facts) {
  switch (target.connect_state) {
    case remvol::kConnected:
      break;
    case remvol::kConnecting:
      return {Ailment::kBusy, "Connecting", "is being connected", "wait a minute", ""};
    case remvol::kRecovering:
      return {Ailment::kLost, "Reconnecting", "the connection was lost", kHealsItself, ""};
    case remvol::kConnectError:
      return {Ailment::kFailed, "Connect Error", "the login failed",
              "check the address, the password and the cable", connect_command_of(target, volume)};
    default:
      return {Ailment::kFailed, "Disconnected", "is not connected", "connect it",
              connect_command_of(target, volume)};
  }
  if (facts.session.empty()) {
    return {Ailment::kLost, "No Session", "the target's session is gone, although nobody disconnected it",
            "connect it again", connect_command_of(target, volume)};
  }
  if (facts.session != "LOGGED_IN") {
    return {Ailment::kLost, "Reconnecting", "the connection was lost", kHealsItself, ""};
  }
  return kNone;
}

Problem problem_of_unmounted(const Target& target, const Volume& volume, bool worked_on) {
  const std::string format = vv_command("format --destroy-data", volume.share);
  if (volume.format_state == remvol::kFormatFailed) {
    return {Ailment::kFailed, "Format Failed", "its format failed",
            "look at the storage server and the kernel's log; a new format destroys what is on the disk",
            format};
  }
  if (volume.volume_state == remvol::kVolumeUnsupported) {
    return {Ailment::kFailed, "Unsupported", "what is on its disk cannot be mounted here",
            "the data is left as it is; a new format destroys it", format};
  }
  if (volume.volume_state == remvol::kVolumeFailed) {
    return {Ailment::kFailed, "Failed", "its partition, format or mount failed",
            "look at the kernel's log for errors of the disk", connect_command_of(target, &volume)};
  }
  // Also while its disk is being looked for: the tree says already that the target is connected.
  if (worked_on)
    return {Ailment::kBusy, "Busy", "is not mounted while a command works on its target", "wait", ""};
  if (volume.device.empty()) {
    return {Ailment::kFailed, "No Disk", "its LUN has no disk here",
            "see whether the storage server still offers it", connect_command_of(target, &volume)};
  }
  return {Ailment::kFailed, "Not Mounted", "is not mounted", "mount it again",
          connect_command_of(target, &volume)};
}

Problem problem_of(const Target& target, const Volume& volume, const VolumeFacts& facts) {
  if (volume.format_state == remvol::kFormatting) {
    return {Ailment::kBusy, "Formatting", "is being formatted, " + std::to_string(volume.progress) + "%",
            "wait", ""};
  }
  if (volume.format_state == remvol::kFormatWaiting) {
    return {Ailment::kBusy, "Wait to Format", "waits until another volume is formatted", "wait", ""};
  }
  if (volume.volume_state == remvol::kVolumeCreating) {
    return {Ailment::kBusy, "Creating", "is being created", "wait", ""};
  }
  if (!facts.mounted) return problem_of_unmounted(target, volume, facts.worked_on);
  if (facts.disk_lost) {
    return {Ailment::kFailed, "No Disk", "its disk is gone, though its target is connected",
            "have it mounted anew", mount_anew(volume)};
  }
  if (facts.shut_down) {
    return {Ailment::kFailed, "Shut Down", "its file system has shut itself down after an error",
            "have it mounted anew; if it shuts itself down again, check its file system with xfs_repair",
            mount_anew(volume)};
  }
  // A write-protected LUN is read-only from the beginning, and the tree says so.
  if (facts.read_only && !(facts.disk_read_only && volume.read_only)) {
    return {Ailment::kReadOnly, "Read Only",
            "became read-only: its file system has errors, or the LUN was write-protected",
            "have it mounted anew; if it becomes so again, check its file system with e2fsck",
            mount_anew(volume)};
  }
  return kNone;
}

// The tree's texts are as old as the last command that wrote them.
std::string otherwise(const Row& row, const std::string& text) {
  if (!row.wanted || text.empty() || text == row.status) return {};
  return "the configuration tree says \"" + text + "\"";
}

Row row_of(const Target& target, const TargetFacts& facts, const Volume* volume) {
  Row row{&target,           volume, target.status, facts.session, facts.address, false, false, 0, 0,
          is_wanted(target), {}};
  if (row.wanted) row.problem = problem_of_target(target, volume, facts);
  if (!row.healthy()) row.status = row.problem.status;
  return row;
}

Row row_without_volume(const Target& target, const TargetFacts& facts) {
  Row row = row_of(target, facts, nullptr);
  row.otherwise = otherwise(row, target.status);
  return row;
}

// What the tree says of a volume is kept unless the kernel knows better.
std::string status_of(const Volume& volume, const Row& row) {
  if (row.wanted && row.healthy() && row.mounted) return row.read_only ? kRunningReadOnly : kRunning;
  const bool tells_so = row.healthy() || !volume.status.starts_with(kRunning);
  return tells_so && !volume.status.empty() ? volume.status : row.problem.status;
}

Row row_of_volume(const Target& target, const TargetFacts& target_facts, size_t at) {
  const Volume& volume = target.volumes[at];
  const VolumeFacts& facts = target_facts.volumes[at];
  Row row = row_of(target, target_facts, &volume);
  row.mounted = facts.mounted;
  row.read_only = facts.mounted ? facts.read_only : volume.read_only;
  row.used = facts.used;
  row.size = facts.size;
  row.made = facts.made;
  row.options = facts.options;
  if (!row.wanted && volume.volume_state == remvol::kVolumeLost) {
    row.wanted = true;
    row.problem = given_up(target, volume);
  }
  row.wanted = row.wanted && volume.enabled;
  if (!row.wanted) row.problem = kNone;
  const bool lost = !row.healthy();
  if (row.wanted && !lost) row.problem = problem_of(target, volume, facts);
  row.status = lost ? row.problem.status : status_of(volume, row);
  row.otherwise = otherwise(row, volume.status);
  return row;
}

size_t number_of_rows(const Status& status) {
  size_t number = 0;
  for (const Target& target : status.targets) number += std::max<size_t>(1, target.volumes.size());
  return number;
}

}  // namespace

std::vector<Row> assess(const Status& status, const std::vector<TargetFacts>& facts) {
  std::vector<Row> rows;
  rows.reserve(number_of_rows(status));
  for (size_t at = 0; at < status.targets.size(); at++) {
    const Target& target = status.targets[at];
    if (target.volumes.empty()) rows.push_back(row_without_volume(target, facts[at]));
    for (size_t n = 0; n < target.volumes.size(); n++) rows.push_back(row_of_volume(target, facts[at], n));
  }
  return rows;
}

std::string quoted(const std::string& name) {
  constexpr char kPlain[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789.:-_";
  if (!name.empty() && name.find_first_not_of(kPlain) == std::string::npos) return name;
  std::string word = "'";
  for (const char byte : name) byte == '\'' ? word += "'\\''" : word += byte;
  return word += "'";
}

std::string vv_command(const std::string& command, const std::string& name) {
  return "vv " + command + (name.starts_with('-') ? " -- " : " ") + quoted(name);
}

std::string connect_command(const std::string& target_name) {
  return "remvol --connect -n " + quoted(target_name);
}

bool all_healthy(const std::vector<Row>& rows) {
  return std::all_of(rows.begin(), rows.end(), [](const Row& row) { return row.healthy(); });
}

}  // namespace vvstat
