// Runs of the tool. It wants its options in an order of its own, and says how it went in its exit status.
#ifndef PLATFORM_VV_TOOL_H
#define PLATFORM_VV_TOOL_H

#include <functional>
#include <string>
#include <vector>

#include "vv/portal.h"

namespace vv {

struct Credentials {
  std::string user;  // empty: none are used
  std::string secret;

  Credentials() = default;
  Credentials(Credentials&&) = default;
  Credentials& operator=(Credentials&&) = default;
  ~Credentials();  // leaves nothing of the secret in memory
};

using Arguments = std::vector<std::string>;

Arguments search_arguments(const Portal& portal);
Arguments search_lun_arguments(const std::string& target, const Portal& portal,
                               const Credentials& credentials);
Arguments add_arguments(const std::string& target, int lun, const std::string& share, const Portal& portal,
                        const Credentials& credentials);
Arguments modify_arguments(const std::string& target, const Credentials& credentials);
Arguments modify_address_arguments(const std::string& target, const Portal& portal);

// "--connect -n TARGET", and with a LUN "--format -n TARGET -l 1".
Arguments target_arguments(const char* command, const std::string& target);
Arguments lun_arguments(const char* command, const std::string& target, int lun);

struct ToolRun {
  bool started = false;
  int status = -1;     // its exit status; -1 when it was not started, or a signal ended it
  int signal = 0;      // that signal
  std::string output;  // all that it and its commands printed

  bool succeeded() const { return started && status == 0 && signal == 0; }
};

// Runs the tool and waits for it, and calls `look` several times a second meanwhile. It goes on when the
// caller is killed. A signal of the terminal reaches it and its commands alone, so that it can end what it
// has begun.
ToolRun run_tool(const Arguments& arguments, const std::function<void()>& look);

}  // namespace vv

#endif
