// A command at work: what it is done to, the run of the tool, and how it ended.
#ifndef PLATFORM_VV_JOB_H
#define PLATFORM_VV_JOB_H

#include <string>

#include "vv/kernel_log.h"
#include "vv/options.h"
#include "vv/output.h"
#include "vv/tool.h"
#include "vv/volumes.h"

namespace vv {

class Job {
 public:
  explicit Job(const Options& options);

  const Options& options;
  const Look before;                       // how it is at the beginning
  const vvstat::Row* row = nullptr;        // the volume that the command is for; null for a whole target
  const vvstat::Target* target = nullptr;  // its target

  // Finds the volume, or the whole target, that the command line names. Returns false after keeping why not.
  bool find_share_or_target();

  // The same for a volume alone.
  bool find_share();

  // Fills the credentials as the options say. Returns false after keeping why that cannot be.
  bool read_credentials(Credentials& credentials);

  // Asks, unless the options say that nothing is to be asked. Returns false after keeping that it is refused.
  bool confirm(const std::string& question);

  // Runs the tool, and shows how it gets on with the target.
  ToolRun run(const Arguments& arguments, const std::string& target_name);

  // What a run of the tool that failed is put down to: its output, or how it ended.
  Failure explain(const ToolRun& run, const char* step) const;

  // Keeps how the command ends, and returns false.
  bool refuse(int status, const std::string& message, const Failure& failure = {});

  // Tells how the command ended. They return the exit status.
  int done(const std::string& message);
  int failed(const std::string& message, const Failure& failure);
  int end();  // as it was kept

  // The same after the tool was to bring up the volume `share` of the target, or all of its volumes when
  // `share` is empty.
  int tell_brought_up(const std::string& target_name, const std::string& share, const ToolRun& run);

  // Returns false, after keeping why, when the tree does not answer.
  bool can_look();

 private:
  int tell_not_up(const vvstat::Row& ailing, const ToolRun& run);
  Failure with_name(Failure failure) const;

  Outcome outcome_;
  std::vector<std::string> warnings_;  // of the run
  KernelLog kernel_;
};

// Why the tree cannot be read, for a message.
std::string why_unreachable(const char* tree, const char* unit);

// "this machine", with the name that a storage server knows it by.
std::string this_machine();

}  // namespace vv

#endif
