#include "vv/tool.h"

#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstring>

#include "common/file_text.h"
#include "common/program.h"

namespace vv {
namespace {

constexpr int kLookEvery = 200;  // milliseconds

// User and secret count only behind "-c 1".
Arguments with_credentials(Arguments arguments, const Credentials& credentials) {
  const bool any = !credentials.user.empty();
  arguments.insert(arguments.end(), {"-c", any ? "1" : "0"});
  if (any) arguments.insert(arguments.end(), {"-U", credentials.user, "-P", credentials.secret});
  return arguments;
}

Arguments with_portal(Arguments arguments, const Portal& portal) {
  arguments.insert(arguments.end(), {"-i", portal.address, "-p", std::to_string(portal.port)});
  return arguments;
}

// What the tool prints goes into a memory file: unlike a pipe it has room for everything, and the tool may go
// on writing to it when the reader is gone.
pid_t start_tool(const Arguments& arguments, int output) {
  std::vector<const char*> words = platform::arguments_of(arguments);
  words.insert(words.begin(), platform::kTool);
  return platform::start(platform::kTool, words.data(), {platform::kNowhere, output, output});
}

int wait_for(pid_t process, const std::function<void()>& look) {
  while (!platform::ends_within(process, kLookEvery)) look();
  const int status = platform::end_of(process);
  look();
  return status;
}

}  // namespace

Credentials::~Credentials() {
  explicit_bzero(secret.data(), secret.size());
}

Arguments search_arguments(const Portal& portal) {
  return with_portal({"--search"}, portal);
}

Arguments search_lun_arguments(const std::string& target, const Portal& portal,
                               const Credentials& credentials) {
  return with_credentials(with_portal({"--search_lun", "-n", target}, portal), credentials);
}

Arguments add_arguments(const std::string& target, int lun, const std::string& share, const Portal& portal,
                        const Credentials& credentials) {
  Arguments arguments = with_portal({"--add", "-n", target, "-l", std::to_string(lun)}, portal);
  arguments.insert(arguments.end(), {"-s", share});
  return with_credentials(std::move(arguments), credentials);
}

Arguments modify_arguments(const std::string& target, const Credentials& credentials) {
  return with_credentials({"--modify", "-n", target}, credentials);
}

Arguments modify_address_arguments(const std::string& target, const Portal& portal) {
  return with_portal({"--modify_address", "-n", target}, portal);
}

Arguments target_arguments(const char* command, const std::string& target) {
  return {command, "-n", target};
}

Arguments lun_arguments(const char* command, const std::string& target, int lun) {
  return {command, "-n", target, "-l", std::to_string(lun)};
}

ToolRun run_tool(const Arguments& arguments, const std::function<void()>& look) {
  ToolRun run;
  const int output = memfd_create("output", MFD_CLOEXEC);
  if (output < 0) return run;
  const pid_t process = start_tool(arguments, output);
  if (process > 0) {
    const sighandler_t interrupt = signal(SIGINT, SIG_IGN), quit = signal(SIGQUIT, SIG_IGN);
    const int status = wait_for(process, look);
    run.started = true;
    run.status = platform::exit_status(status);
    run.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
    signal(SIGINT, interrupt);
    signal(SIGQUIT, quit);
  }
  run.output = platform::content_of(output);
  close(output);
  return run;
}

}  // namespace vv
