// Runs commands in turn, many rounds: bench_spawn ROUNDS COMMAND [ARGUMENT...] [-- COMMAND ...]. Prints a
// line a round, the wall time of each in microseconds, and a last one, the most memory that one of its runs
// had resident, in KiB. Their output is thrown away, and an exit status above 1 ends it all. In a round every
// command runs once, so that what else the machine does hits all alike.
#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

namespace {

struct Command {
  std::vector<char*> arguments;  // ends with a null
  std::vector<double> microseconds;
  long resident = 0;  // KiB
};

std::vector<Command> read_commands(char** arguments) {
  std::vector<Command> commands(1);
  for (; *arguments != nullptr; arguments++) {
    if (strcmp(*arguments, "--") == 0) {
      commands.emplace_back();
    } else {
      commands.back().arguments.push_back(*arguments);
    }
  }
  for (Command& command : commands) command.arguments.push_back(nullptr);
  return commands;
}

// Returns whether the command ended with status 0 or 1.
bool run(Command& command, const posix_spawn_file_actions_t& actions) {
  const auto begin = std::chrono::steady_clock::now();
  pid_t child = 0;
  if (posix_spawnp(&child, command.arguments[0], &actions, nullptr, command.arguments.data(), environ) != 0) {
    return false;
  }
  int status = 0;
  rusage usage = {};
  if (wait4(child, &status, 0, &usage) != child) return false;
  const std::chrono::duration<double, std::micro> taken = std::chrono::steady_clock::now() - begin;
  command.microseconds.push_back(taken.count());
  command.resident = std::max(command.resident, usage.ru_maxrss);
  return WIFEXITED(status) && WEXITSTATUS(status) <= 1;
}

}  // namespace

int main(int argc, char** argv) {
  const int rounds = argc > 2 ? atoi(argv[1]) : 0;
  if (rounds < 1) {
    fputs("usage: bench_spawn ROUNDS COMMAND [ARGUMENT...] [-- COMMAND ...]\n", stderr);
    return 2;
  }
  std::vector<Command> commands = read_commands(argv + 2);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
  for (int i = 0; i < rounds; i++) {
    for (Command& command : commands) {
      if (run(command, actions)) continue;
      fprintf(stderr, "bench_spawn: %s failed\n", command.arguments[0]);
      return 2;
    }
  }
  for (int i = 0; i < rounds; i++) {
    for (const Command& command : commands) printf("%.1f ", command.microseconds[static_cast<size_t>(i)]);
    puts("");
  }
  for (const Command& command : commands) printf("%ld ", command.resident);
  puts("");
  return 0;
}
