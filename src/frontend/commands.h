// The command table: one row for each long option, in the order of its index; and the text that lists them.
#ifndef REMVOL_FRONTEND_COMMANDS_H
#define REMVOL_FRONTEND_COMMANDS_H

struct option;  // getopt_long(3)

namespace remvol {

// Runs a command's handler with what it needs of the request. Returns the handler's result, 0 for success.
using Handler = int (*)();

struct CommandRow {
  const char* name;         // long option
  Handler run;              // null: the command takes the failure path
  unsigned required;        // bits of OPT_FLAG that must all be set
  const char* failure;      // logged when the handler fails
  bool persists;            // a success copies the settings to flash and reloads the shares
  bool reports_value;       // the handler's result is the command's answer, never a failure
  const char* failure_all;  // instead of `failure` when -n is absent; null where that makes no difference
  bool ends_tree = false;   // the tree's daemon is gone behind it
};

extern const CommandRow kCommands[];
extern const int kCommandCount;

// Returns the rows as getopt_long(3) takes them. Help, which has no handler, stands for the letter h.
[[nodiscard]] const option* long_options();

// Prints how to call the tool.
void print_usage();

}  // namespace remvol

#endif
