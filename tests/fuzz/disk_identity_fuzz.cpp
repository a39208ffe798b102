// Where sysfs leads from a disk, and what its session is called, on any texts: the disk is ours when the
// first session on the way has the target's name and the way ends in the LUN's number, and never otherwise.
#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <string>

#include "frontend/log.h"
#include "require.h"
#include "support/text.h"
#include "volume/disk_identity.h"
#include "wrapped_files.h"

using namespace remvol;

namespace {

constexpr char kNode[] = "/dev/sdb1";
std::string device;  // where the disk's link leads; nowhere when it is empty
std::string asked;   // the file that was read last

bool is_number(const std::string& text) {
  return !text.empty() && text.find_first_not_of("0123456789") == std::string::npos;
}

// Returns the file with the name of the first session on the way; empty when none is on it.
std::string name_file_of(const std::string& path) {
  for (size_t start = 0, end; (end = path.find('/', start + 1)) != std::string::npos; start = end) {
    const std::string part = path.substr(start + 1, end - start - 1);
    if (part.starts_with("session") && is_number(part.substr(7)))
      return path.substr(0, end) + "/iscsi_session/" + part + "/targetname";
  }
  return {};
}

// Returns the LUN's number as the kernel writes it, behind three others and their colons; -1 for anything
// else.
long long lun_of(const std::string& path) {
  std::string rest = path.substr(path.rfind('/') + 1);
  for (int i = 0; i < 3; i++) {
    const size_t colon = rest.find(':');
    if (colon == std::string::npos || !is_number(rest.substr(0, colon))) return -1;
    rest.erase(0, colon + 1);
  }
  return is_number(rest) && rest.size() < 10 ? atoll(rest.c_str()) : -1;
}

DiskOwner owner(const std::string& target_name, int lun) {
  TargetEntry entry{};
  copy_text(entry.target_name, target_name.c_str());
  entry.lun = lun;
  return disk_owner(&entry, kNode);
}

void check_session_disk(const std::string& name) {
  require(is_session_disk(kNode, nullptr) == SessionDisk::kYes);
  const SessionDisk own = is_session_disk(kNode, name.c_str());
  require(own == (name.empty() ? SessionDisk::kNo : SessionDisk::kYes));
  require(is_session_disk(kNode, (name + "2").c_str()) == SessionDisk::kNo);
}

}  // namespace

extern "C" char* __wrap_realpath(const char* path, char* resolved) {
  require(strcmp(path, "/sys/block/sdb/device") == 0);
  errno = ENOENT;
  return device.empty() ? nullptr : strcpy(resolved, device.c_str());
}

// The link's end, a null character, the text of every file.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  debug_level = -1;
  on_file = [](const char* path) { asked = path; };
  const uint8_t* end = std::find(data, data + size, 0);
  device.assign(data, end);
  if (end == data + size || device.size() > PATH_MAX - 2) return 0;
  if (!device.empty()) device.insert(0, "/");
  const std::string text(end + 1, data + size);
  give_file(text);
  asked.clear();
  const std::string name_file = name_file_of(device);
  if (name_file.empty()) {
    require(owner("iqn.t1", 0) == (device.empty() ? kDiskUnknown : kDiskForeign));
    require(is_session_disk(kNode, nullptr) == SessionDisk::kNo && asked.empty());
    return 0;
  }
  if (name_file.size() >= PATH_MAX) return 0;  // no kernel opens it
  const std::string name = std::string(text.substr(0, text.find('\n')).c_str()).substr(0, 255);
  check_session_disk(name);
  require(asked == name_file);
  const long long lun = lun_of(device);
  require(owner("", 0) == kDiskUnknown);
  require(owner("iqn.t1", 0) != kDiskOurs || (name == "iqn.t1" && lun <= 0));
  if (lun < 0) return 0;
  const int number = static_cast<int>(lun);
  require(owner(name, number) == (name.empty() ? kDiskUnknown : kDiskOurs));
  if (name.empty() || name.size() == 255) return 0;
  require(owner(name, number + 1) == kDiskForeign);
  require(owner("-" + name, number) == kDiskForeign);
  return 0;
}
