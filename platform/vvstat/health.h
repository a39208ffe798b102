// What is well and what is not: the tree and the kernel compared.
#ifndef PLATFORM_VVSTAT_HEALTH_H
#define PLATFORM_VVSTAT_HEALTH_H

#include <ctime>
#include <string>
#include <vector>

#include "vvstat/kernel.h"
#include "vvstat/status.h"

namespace vvstat {

// What is wrong with a volume or its target. Texts are ASCII without ends of lines, except for the target's
// name in the command.
enum class Ailment {
  kNone,
  kBusy,      // it will be well by itself: it is being connected, created or formatted
  kLost,      // the connection is gone, and comes back by itself or not
  kReadOnly,  // it became read-only
  kFailed,    // it waits for a person
};

struct Problem {
  Ailment ailment = Ailment::kNone;
  std::string status;   // for the status column, where the tree's text says that all is well
  std::string what;     // goes behind "Photos: "; empty when nothing is wrong
  std::string advice;   // what a person does about it
  std::string command;  // that does it, if there is one
};

// A line of the report: a volume, or a target that has none.
struct Row {
  const Target* target;
  const Volume* volume;  // null for a target without volumes
  std::string status;    // as it is now
  std::string session;   // the kernel's word for the session's state; empty without a session
  std::string address;   // that the session is connected with
  bool mounted;
  bool read_only;           // mounted, and not to be written
  unsigned long long used;  // bytes; 0 while it is not mounted
  unsigned long long size;
  bool wanted;            // it should be connected, as far as can be told, and is not switched off
  Problem problem;        // of one that is wanted
  time_t made = 0;        // its file system was, as far as is known; 0 while it is not mounted
  std::string options{};  // of its mount
  // How the configuration tree has it, where that is not how it is; empty: it is as the tree says.
  std::string otherwise{};
  // What recall() adds.
  time_t since = 0;       // it is healthy, or not; 0: not known
  std::string error{};    // what was wrong with it last; empty: nothing, as far as is known
  time_t error_time = 0;  // that began

  bool healthy() const { return problem.ailment == Ailment::kNone; }
};

// The rows in the order of the tree. They point into `status`.
std::vector<Row> assess(const Status& status, const std::vector<TargetFacts>& facts);

// A name as a word of the shell, since people copy commands.
std::string quoted(const std::string& name);

// The command of vv(8), such as "connect", for a share or a target, to be given to a shell: the name is one
// word of it, whatever it holds.
std::string vv_command(const std::string& command, const std::string& name);

// The command that connects a target without volumes, of which vv has no share to show.
std::string connect_command(const std::string& target_name);

// True when nothing that is wanted has a problem.
bool all_healthy(const std::vector<Row>& rows);

}  // namespace vvstat

#endif
