#include "vv/explanation.h"

#include <algorithm>

#include "common/utf8.h"
#include "tree_layout.h"

namespace vv {
namespace {

using vvstat::Row;

constexpr size_t kMostLines = 4;

#define TEXT_OF(words) #words
#define NUMBER_TEXT(macro) TEXT_OF(macro)

// What is heard of a failure, and what it means. The first that is found counts.
constexpr struct {
  const char* heard;
  const char* why;
  const char* advice;
  const char* step = nullptr;  // that failed, where this tells it; what else was said matters then
} kReasons[] = {
    {"SendTargets discovery: iSCSI login failed due to authorization",
     "the portal wants a user and a password before it names its targets",
     "have the storage server name them without; vv luns, and vv add with --target, need no discovery"},
    {"authorization", "the target refused the user name or the password",
     "set those of the storage server: vv password SHARE --user NAME"},
    {"Connection refused", "the storage server's machine answers, but nothing listens at that port",
     "look at the port, and whether the storage server's iSCSI service runs"},
    {"No route to host", "the storage server's machine does not answer",
     "look at the address, the cable and the storage server"},
    {"Network is unreachable", "no network of this machine leads to that address",
     "look at the address and at this machine's network"},
    {" timed out", "the storage server does not answer",
     "look at the address, the cable and the storage server"},
    {"No portals found", "the portal offers no target to this machine",
     "see whether the storage server lets MACHINE in"},
    {"target likely not connected", "the target is not connected", ""},
    {"could not connect to iscsid", "the initiator's daemon does not run",
     "systemctl start remvol && systemctl restart remvol-keeper; see journalctl -u remvol-keeper"},
    {"iSCSI driver not found", "the kernel has no iSCSI", "/usr/lib/remvol/modules says what is missing"},
    {"non-retryable iSCSI login failure", "the storage server refused the login",
     "see whether the target is still there, and lets MACHINE in"},
    {"No records found", "the target's record could not be made",
     "look at the target's name and at the initiator's records: /etc/iscsi/nodes, /var/lib/iscsi/nodes"},
    {"is not the disk of", "the disk's name is another disk's by now", "connect it again"},
    {"is in use, it is not formatted", "something besides the volume uses the disk",
     "see what does: lsblk, and the holders in /sys/class/block"},
    {"Create Format FAILED", "no file system could be made on it",
     "look at the storage server and at the kernel's log: dmesg", kFormatStep},
    {"has benn used", "another volume has that share name", "choose another name"},
    {"can not add target", "at most " NUMBER_TEXT(REMVOL_MAX_LUNS) " volumes can be configured",
     "delete one that is not needed"},
    {"disconnect it before modifying its address", "the target is connected", "disconnect it first"},
    {" at IP: ", "the target is not offered there", "see what is: vv discover PORTAL"},
    {"the configuration tree was started anew", "the configuration tree was started anew meanwhile",
     "try it again"},
};

// "(src.cpp:task_add:12): " in front of what the tool says itself.
std::string_view without_prefix(std::string_view line) {
  if (!line.starts_with('(')) return line;
  const size_t end = line.find("): ");
  return end == std::string_view::npos ? line : line.substr(end + 3);
}

// What is said in every run, or says less than the line behind it.
bool says_nothing(std::string_view line) {
  constexpr std::string_view kPlain[] = {"execute failed.",
                                         "Logging in to ",
                                         "Login to ",
                                         "Logging out of ",
                                         "Logout of ",
                                         "New iSCSI node ",
                                         "iscsiadm: using tpgt ",
                                         "ip: ",
                                         "vector size: ",
                                         "Got FS type = ",
                                         "semget(...) == -1",
                                         "lun"};
  return line.empty() || std::any_of(std::begin(kPlain), std::end(kPlain),
                                     [line](std::string_view plain) { return line.starts_with(plain); });
}

// The last one, which is the most precise.
const std::string* line_with(const std::vector<std::string>& lines, std::string_view heard) {
  const auto found = std::find_if(lines.rbegin(), lines.rend(), [heard](const std::string& line) {
    return line.find(heard) != std::string::npos;
  });
  return found == lines.rend() ? nullptr : &*found;
}

const char* step_of(const Row& row) {
  if (row.target->connect_state != remvol::kConnected || row.session != "LOGGED_IN") return kLoginStep;
  if (row.volume->format_state == remvol::kFormatFailed) return kFormatStep;
  return row.volume->device.empty() ? kDiskStep : kMountStep;
}

}  // namespace

std::vector<std::string> telling_lines(std::string_view output) {
  std::vector<std::string> lines;
  while (!output.empty()) {
    const std::string_view line = output.substr(0, output.find('\n'));
    output.remove_prefix(std::min(line.size() + 1, output.size()));
    const std::string_view text = without_prefix(line.substr(0, line.find('\r')));
    if (says_nothing(text)) continue;
    std::string shown = platform::printable(text);
    if (lines.empty() || lines.back() != shown) lines.push_back(std::move(shown));
  }
  return lines;
}

std::vector<std::string> warnings_in(std::string_view output) {
  std::vector<std::string> warnings = telling_lines(output);
  std::erase_if(warnings, [](const std::string& line) {
    return !line.starts_with("remvol: ") && !line.starts_with("ktreec_dump(");
  });
  return warnings;
}

Failure explain_output(std::string_view output, const char* step) {
  Failure failure{step, "", "", telling_lines(output)};
  for (const auto& reason : kReasons) {
    const std::string* line = line_with(failure.details, reason.heard);
    if (line == nullptr) continue;
    failure.why = reason.why;
    failure.advice = reason.advice;
    if (reason.step == nullptr) {
      failure.details = {*line};
    } else {
      failure.step = reason.step;
    }
    break;
  }
  std::vector<std::string>& lines = failure.details;
  if (lines.size() > kMostLines) lines.erase(lines.begin(), lines.end() - kMostLines);
  return failure;
}

Failure explain_volume(const Row& row, std::string_view output) {
  Failure failure = explain_output(output, step_of(row));
  if (!failure.why.empty()) return failure;
  failure.why = row.problem.what;
  failure.advice = row.problem.advice;
  if (!failure.why.empty()) return failure;
  failure.why = row.volume->enabled ? "its target was logged in to, but showed no disk of it"
                                    : "it is switched off in the settings";
  if (row.volume->enabled) {
    failure.advice = "see whether the storage server still offers its LUN, and to MACHINE";
  }
  return failure;
}

}  // namespace vv
