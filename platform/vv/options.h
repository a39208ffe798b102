// The options, and what a command takes of them.
#ifndef PLATFORM_VV_OPTIONS_H
#define PLATFORM_VV_OPTIONS_H

#include <span>
#include <string>
#include <vector>

namespace vv {

// Exit statuses, a documented interface.
inline constexpr int kDone = 0, kFailed = 1, kUsage = 2, kUnreachable = 3, kRefused = 4;

struct Command;

struct Options {
  const Command* command = nullptr;
  std::string name;  // of a share, a target, or a portal
  std::string portal, target, user, password_file;
  int lun = -1;  // not given
  bool no_password = false;
  bool yes = false;
  bool destroy_data = false;
  bool json = false;
  char** rest = nullptr;  // the words after a command whose words are another program's, ended by a null
};

// Options that a command takes, as bits.
enum : unsigned {
  kPortal = 1,
  kTarget = 2,
  kLun = 4,
  kUser = 8,  // with --password-file
  kNoPassword = 16,
  kYes = 32,
  kDestroyData = 64,
};

struct Command {
  const char* name;
  const char* argument;  // as the help names it; null: its words are another program's
  unsigned takes;
  unsigned needs;
  int (*run)(const Options& options);
  const char* help;
};

// What stands for an option that has no letter.
enum : int {
  kPortalOption = 256,
  kTargetOption,
  kLunOption,
  kUserOption,
  kPasswordFileOption,
  kPasswordOption,
  kNoPasswordOption,
  kDestroyDataOption,
  kYesOption,
  kJsonOption
};

// One option of the command line.
struct OptionRow {
  int letter;
  unsigned bit;  // of the commands that take it; 0: all do
  const char* name;
  const char* argument;  // null: it takes none
  const char* help;      // null: it is not told of
};

// All of them, in the order of the help text.
std::span<const OptionRow> option_rows();

// True when the command takes that option.
bool takes(const Command& command, const OptionRow& row);

// The options that the command takes, as "--lun".
std::vector<std::string> options_of(const Command& command);

// True for an option that a value follows.
bool takes_value(const std::string& option);

}  // namespace vv

#endif
