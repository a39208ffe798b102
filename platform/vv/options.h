// The command line.
#ifndef PLATFORM_VV_OPTIONS_H
#define PLATFORM_VV_OPTIONS_H

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
  char** rest = nullptr;  // the words behind a command whose words are another program's, ended by a null
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

// The command of that name; null when there is none.
const Command* find_command(const char* name);

// The options that the command takes, as "--lun".
std::vector<std::string> options_of(const Command& command);

// True for an option that a value follows.
bool takes_value(const std::string& option);

// Reads the command line. Returns -1 to go on, or the exit status to end with.
int read_options(int argc, char** argv, Options& options);

}  // namespace vv

#endif
