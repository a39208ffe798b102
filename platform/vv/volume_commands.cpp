#include "vv/volume_commands.h"

#include "common/utf8.h"
#include "vv/job.h"
#include "vv/list.h"
#include "vv/search_commands.h"

namespace vv {
namespace {

using vvstat::Row;
using vvstat::Target;

// "Backup, Photos": the mounted volumes of the target but the one given.
std::string others_mounted(const Job& job) {
  std::string names;
  for (const Row* row : job.before.volumes_of(*job.target)) {
    if (row != job.row && row->mounted) append(names, platform::printable(row->volume->share));
  }
  return names;
}

std::string shown_name(const Job& job) {
  return platform::printable(job.options.name);
}

}  // namespace

int connect(const Options& options) {
  Job job(options);
  if (!job.find_share_or_target()) return job.end();
  const std::string share = job.row != nullptr ? job.row->volume->share : "";
  // The tool logs out of a target that shows no disk of a volume.
  if (job.before.volumes_of(*job.target).empty()) {
    job.refuse(kUsage, "no share is configured of this target");
    return job.end();
  }
  const ToolRun run = job.run(target_arguments("--connect", job.target->name), job.target->name);
  return job.tell_brought_up(job.target->name, share, run);
}

int disconnect(const Options& options) {
  Job job(options);
  if (!job.find_share_or_target()) return job.end();
  const std::string others = job.row != nullptr ? others_mounted(job) : "";
  if (!others.empty() && !job.confirm("This disconnects the whole target, also " + others + ". Go on?")) {
    return job.end();
  }
  const ToolRun run = job.run(target_arguments("--disconnect", job.target->name), job.target->name);
  if (!run.succeeded() || Look().in_use(job.target->name)) {
    return job.failed(shown_name(job) + " is not disconnected", job.explain(run, kUnmountStep));
  }
  return job.done(shown_name(job) + " is disconnected, and stays so until it is connected");
}

// The data stays on the storage server; what is lost is that it is a share here.
int remove(const Options& options) {
  Job job(options);
  if (!job.find_share_or_target()) return job.end();
  const bool whole = job.row == nullptr;
  std::string names = shown_name(job);
  if (whole) {
    names.clear();
    for (const Row* row : job.before.volumes_of(*job.target)) {
      append(names, platform::printable(row->volume->share));
    }
    names = shown_name(job) + " with " + (names.empty() ? "no share" : names);
  }
  if (!job.confirm("This ends the use of " + names + " here; the data stays on the storage server. Go on?")) {
    return job.end();
  }
  const Arguments arguments = whole ? target_arguments("--del", job.target->name)
                                    : lun_arguments("--del_lun", job.target->name, job.row->volume->lun);
  const ToolRun run = job.run(arguments, job.target->name);
  const Look after;
  const bool gone = whole ? after.target(options.name) == nullptr : after.share(options.name) == nullptr;
  if (!run.succeeded() || !gone) {
    return job.failed(shown_name(job) + " is not deleted", job.explain(run, kStoreStep));
  }
  return job.done(names + " is deleted; the data is still on the storage server");
}

}  // namespace vv
