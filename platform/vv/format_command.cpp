#include <algorithm>
#include <string_view>

#include "common/utf8.h"
#include "sysaux.h"
#include "vv/job.h"
#include "vv/volume_commands.h"
#include "vvstat/columns.h"

namespace vv {
namespace {

using vvstat::Row;

constexpr size_t kTypeSize = 16, kListSize = 1024;  // as sysaux.h has them

// What is on a disk, as far as it can be told.
struct DiskContent {
  bool readable = false;
  std::string what;  // such as "ext4 on sdb1"; empty when nothing is recognised
};

// Adds what is on a node. Returns false when it cannot be read.
bool look_at(const std::string& name, DiskContent& content) {
  char type[kTypeSize] = "";
  const int result = sys_get_fs_type(type, ("/dev/" + name).c_str());
  if (result == 0) content.what += (content.what.empty() ? "" : ", ") + std::string(type) + " on " + name;
  return result >= 0;
}

DiskContent read_content(const std::string& disk) {
  DiskContent content;
  char names[kListSize] = "";
  const int count = sys_get_partition_list(names, ("/dev/" + disk).c_str());
  content.readable = count > 0 || (count == 0 && look_at(disk, content));
  for (std::string_view rest = names; content.readable && !rest.empty();) {
    const std::string_view name = rest.substr(0, rest.find(','));
    content.readable = look_at(std::string(name), content);
    rest.remove_prefix(std::min(name.size() + 1, rest.size()));
  }
  return content;
}

// The volume's disk, found by the kernel's own word on whose it is. Returns false after keeping why there is
// none.
bool find_disk(Job& job, std::string& disk) {
  const Row& row = *job.row;
  const std::string connect = platform::printable(vvstat::vv_command("connect", row.volume->share));
  disk = disk_of(row.target->name, row.volume->lun);
  if (disk.empty()) {
    return job.refuse(kFailed, platform::printable(row.volume->share) + " has no disk",
                      {kDiskStep, "its target is not connected, or shows no disk of it", connect, {}});
  }
  if (disk == row.volume->device) return true;
  return job.refuse(kFailed, platform::printable(row.volume->share) + " has another disk by now",
                    {kDiskStep, "it was " + row.volume->device + " and is " + disk, connect, {}});
}

// Returns false after keeping that there is data, or that nobody can tell.
bool may_overwrite(Job& job, const std::string& disk, DiskContent& content) {
  const std::string share = platform::printable(job.row->volume->share);
  content = read_content(disk);
  if (!content.readable) {
    return job.refuse(kFailed, "the disk of " + share + " cannot be read",
                      {kDiskStep, "what is on it is not known", "look at the kernel's log: dmesg", {}});
  }
  if (content.what.empty() || job.options.destroy_data) return true;
  return job.refuse(kRefused,
                    share + " carries data: " + content.what +
                        (job.row->mounted ? ", " + vvstat::readable_size(job.row->used) + " used" : "") +
                        "\n  --destroy-data means that it may be destroyed");
}

}  // namespace

int format(const Options& options) {
  Job job(options);
  std::string disk;
  DiskContent content;
  if (!job.find_share() || !find_disk(job, disk) || !may_overwrite(job, disk, content)) return job.end();
  const std::string share = platform::printable(options.name);
  const std::string loss =
      content.what.empty() ? "Nothing is recognised on it." : "This destroys " + content.what + ".";
  if (!job.confirm("The LUN of " + share + ", " + disk + ", is formatted. " + loss + " Go on?")) {
    return job.end();
  }
  const vvstat::Volume& volume = *job.row->volume;
  const ToolRun run = job.run(lun_arguments("--format", job.target->name, volume.lun), job.target->name);
  return job.tell_brought_up(job.target->name, options.name, run);
}

}  // namespace vv
