#include "common/sessions.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string_view>

namespace platform {
namespace {

constexpr char kFolder[] = "/sys/class/iscsi_session";
constexpr std::string_view kSession = "session";
constexpr std::string_view kScsiTarget = "target";

std::string read_line(const std::string& path) {
  char text[512];
  const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return {};
  const ssize_t size = read(fd, text, sizeof text);
  close(fd);
  const std::string_view line(text, size > 0 ? static_cast<size_t>(size) : 0);
  return std::string(line.substr(0, line.find('\n')));
}

// Calls `take(name)` for the entries of a folder until it returns false.
template <typename Take>
void for_entries(const std::string& path, Take take) {
  DIR* folder = opendir(path.c_str());
  if (folder == nullptr) return;
  while (const dirent* entry = readdir(folder)) {
    if (!take(std::string_view(entry->d_name))) break;
  }
  closedir(folder);
}

// The first entry of a folder that passes the test; empty when there is none.
template <typename Passes>
std::string find_entry(const std::string& path, Passes passes) {
  std::string found;
  for_entries(path, [&found, passes](std::string_view name) {
    if (passes(name)) found = name;
    return found.empty();
  });
  return found;
}

bool is_scsi_target(std::string_view name) {
  return name.starts_with(kScsiTarget);
}

// A session gets a SCSI target when the first login is through and a LUN was found; without one no volume
// depends on it.
bool had_luns(const std::string& session) {
  return !find_entry(session + "/device", is_scsi_target).empty();
}

// The state "FREE" is both the first one and that of a session whose recovery took too long.
Link link_of(const std::string& session, const std::string& state) {
  if (state == "LOGGED_IN") return Link::kUp;
  return had_luns(session) ? Link::kDown : Link::kNew;
}

}  // namespace

bool is_any_session() {
  return !find_entry(kFolder, [](std::string_view name) { return name.starts_with(kSession); }).empty();
}

std::vector<Session> read_sessions() {
  std::vector<Session> sessions;
  for_entries(kFolder, [&sessions](std::string_view name) {
    if (!name.starts_with(kSession)) return true;
    const std::string path = std::string(kFolder) + "/" + std::string(name);
    const std::string target = read_line(path + "/targetname");
    const auto number = static_cast<uint32_t>(strtoul(name.data() + kSession.size(), nullptr, 10));
    const std::string state = read_line(path + "/state");
    if (!target.empty()) sessions.push_back({number, target, state, link_of(path, state)});
    return true;
  });
  return sessions;
}

std::string address_of(const Session& session) {
  return read_line("/sys/class/iscsi_connection/connection" + std::to_string(session.number) +
                   ":0/persistent_address");
}

// Below the session are the SCSI target, the LUN's SCSI device, and the disk, whose names are those of the
// kernel: target2:0:0/2:0:0:1/block/sdb.
std::string running_disk(const Session& session, int lun) {
  const std::string session_device =
      std::string(kFolder) + "/" + std::string(kSession) + std::to_string(session.number) + "/device";
  const std::string target = find_entry(session_device, is_scsi_target);
  if (target.empty()) return {};
  const std::string device =
      session_device + "/" + target + "/" + target.substr(kScsiTarget.size()) + ":" + std::to_string(lun);
  if (read_line(device + "/state") != "running") return {};
  return find_entry(device + "/block", [](std::string_view name) { return name.front() != '.'; });
}

}  // namespace platform
