// The command table: one row for each long option, in the order of its index.
#ifndef REMVOL_FRONTEND_COMMANDS_H
#define REMVOL_FRONTEND_COMMANDS_H

namespace remvol {

// Runs a command's handler with what it needs of the request. Returns the handler's result, 0 for success.
using Handler = int (*)();

struct Command {
  const char* name;         // long option
  Handler run;              // null: the command takes the failure path
  unsigned required;        // bits of OPT_FLAG that must all be set
  const char* failure;      // logged when the handler fails
  bool persists;            // a success copies the settings to flash and reloads the shares
  bool reports_value;       // the handler's result is the command's answer, never a failure
  const char* failure_all;  // instead of `failure` when -n is absent; null where that makes no difference
  bool ends_tree = false;   // the tree's daemon is gone behind it
};

constexpr int kCommandCount = 19;
constexpr int kHelpCommand = 18;

extern const Command kCommands[kCommandCount];

}  // namespace remvol

#endif
