// The command line: from arguments into the request.
#ifndef REMVOL_FRONTEND_OPTIONS_H
#define REMVOL_FRONTEND_OPTIONS_H

namespace remvol {

// How the reading of the command line ended.
enum class ParseEnd {
  kReady,  // run the command
  kFail,   // take the failure path
  kUsage,  // the same after the usage text
  kExit,   // nothing more to do, exit status 0
};

// The process list shows a process's arguments to everybody: moves every argument with a secret (-P) into
// memory of the tool's own, overwrites the secret where it stood and points `argv` to the copy. Puts into
// `shown` (`argc` numbers) how many characters of each argument may be shown, -1 for all.
void hide_secrets(int argc, char** argv, int* shown);

// Reads the arguments into the request. -d and -v do their work at once and end the reading. A value that is
// longer than its field fails; cut, two long names would become one.
[[nodiscard]] ParseEnd parse_options(int argc, char** argv);

// The one place where rules for target and share names would stand. Returns 0 to accept `name`, which it
// always does, or a negative number.
[[nodiscard]] int check_name(const char* name);

// Resolves a host name or address to the numeric text of its first result (IPv6 in square brackets) in
// `address`, which holds at least 48 bytes, and its family in `family`. Returns 0 or -1.
[[nodiscard]] int _resovle_net_address_to_ip(char* address, int* family, const char* host);

}  // namespace remvol

#endif
