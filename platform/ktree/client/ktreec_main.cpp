// ktreec: the command line client of the configuration tree.

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "begin.h"
#include "ktree/client/calls.h"
#include "tree_layout.h"

namespace {

using ktree::client::CallResult;
using ktree::client::Reason;

constexpr int kNo = 1;  // the node is missing, or the daemon refused
constexpr int kUsageError = 2;
constexpr int kUnreachable = 3;

constexpr char kUsage[] =
    "Usage: ktreec [-S SOCKET] OPERATION\n"
    "Reads and changes the configuration tree of the ktree daemon on SOCKET\n"
    "(/var/run/ktree_sock).\n"
    "\n"
    "  -g PATH        print the value\n"
    "  -s PATH VALUE  set the value\n"
    "  -d PATH        delete the node and all below it\n"
    "  -t [PATH]      print the subtree, a line `path=value` for every value\n"
    "  -l FILE        make the tree what the settings file FILE holds\n"
    "  -D FILE        write the settings file FILE; - is standard output\n"
    "  -h, --help     print this text and exit\n"
    "  -V, --version  print the version and exit\n"
    "\n"
    "Exit status: 0 done, 1 missing or refused, 2 wrong usage,\n"
    "3 the daemon cannot be reached.\n";

struct CommandLine {
  const char* socket;
  const char* operands[2];
};

int complain(const char* subject, const char* text) {
  fprintf(stderr, "ktreec: %s: %s\n", subject, text);
  return kNo;
}

// The exit status for `result`. What went wrong is told with `subject`; a node that is missing goes without a
// word.
int conclude(const CommandLine& arguments, CallResult result, const char* subject, const char* reason) {
  switch (result) {
    case CallResult::kDone:
      return EXIT_SUCCESS;
    case CallResult::kMissing:
      return kNo;
    case CallResult::kRefused:
      return complain(subject, "not a path or a value that the tree can take");
    case CallResult::kDamaged:
    case CallResult::kFailed:
      return complain(subject, reason);
    case CallResult::kUnreachable:
      break;
  }
  const char* socket = arguments.socket == nullptr ? remvol::kGeneralSocket : arguments.socket;
  complain(socket, "the daemon cannot be reached");
  return kUnreachable;
}

int do_get(const CommandLine& arguments) {
  static char value[ktree::kMaxValueBytes + 1];
  size_t size = 0;
  const CallResult result =
      ktree::client::get(arguments.socket, arguments.operands[0], value, ktree::kMaxValueBytes, size);
  if (result == CallResult::kDone) {
    value[size] = '\n';
    if (fwrite(value, 1, size + 1, stdout) != size + 1 || fflush(stdout) != 0) {
      return complain("standard output", strerror(errno));
    }
  }
  return conclude(arguments, result, arguments.operands[0], "");
}

int do_set(const CommandLine& arguments) {
  const CallResult result =
      ktree::client::set(arguments.socket, arguments.operands[0], arguments.operands[1]);
  return conclude(arguments, result, arguments.operands[0], "");
}

int do_del(const CommandLine& arguments) {
  const CallResult result = ktree::client::del(arguments.socket, arguments.operands[0]);
  return conclude(arguments, result, arguments.operands[0], "");
}

int do_list(const CommandLine& arguments) {
  const char* path = arguments.operands[0] == nullptr ? "/" : arguments.operands[0];
  Reason reason;
  const CallResult result = ktree::client::list_to(arguments.socket, path, STDOUT_FILENO, reason);
  return conclude(arguments, result, path, reason.text);
}

int do_load(const CommandLine& arguments) {
  Reason reason;
  const CallResult result = ktree::client::load(arguments.socket, arguments.operands[0], reason);
  return conclude(arguments, result, arguments.operands[0], reason.text);
}

int do_dump(const CommandLine& arguments) {
  const char* file = arguments.operands[0];
  Reason reason;
  if (strcmp(file, "-") == 0) {
    const CallResult result = ktree::client::dump_to(arguments.socket, STDOUT_FILENO, reason);
    return conclude(arguments, result, "standard output", reason.text);
  }
  return conclude(arguments, ktree::client::dump(arguments.socket, file, reason), file, reason.text);
}

struct ClientOperation {
  const char* option;
  int least_operands;
  int most_operands;
  int (*run)(const CommandLine& arguments);
};

constexpr ClientOperation kOperations[] = {
    {"-g", 1, 1, do_get},  {"-s", 2, 2, do_set},  {"-d", 1, 1, do_del},
    {"-t", 0, 1, do_list}, {"-l", 1, 1, do_load}, {"-D", 1, 1, do_dump},
};

const ClientOperation* find_operation(const char* option) {
  for (const ClientOperation& operation : kOperations) {
    if (strcmp(operation.option, option) == 0) return &operation;
  }
  return nullptr;
}

int usage_error(const char* text) {
  fprintf(stderr, "ktreec: %s; see ktreec --help\n", text);
  return kUsageError;
}

// Takes the words after the program's name: the socket and one operation with its operands. Operands are
// taken by their place, so a value may begin with a dash. Returns null, or what is wrong.
const char* parse(char** word, CommandLine& arguments, const ClientOperation*& operation) {
  while (*word != nullptr) {
    if (strcmp(*word, "-S") == 0) {
      if (*++word == nullptr) return "-S wants a socket";
      arguments.socket = *word++;
      continue;
    }
    if (operation != nullptr) return "one operation at a time";
    operation = find_operation(*word++);
    if (operation == nullptr) return "no such operation";
    int taken = 0;
    for (; taken < operation->most_operands && *word != nullptr; taken++) arguments.operands[taken] = *word++;
    if (taken < operation->least_operands) return "an operand is missing";
  }
  return operation == nullptr ? "no operation" : nullptr;
}

bool is_one_of(const char* word, const char* one, const char* other) {
  return strcmp(word, one) == 0 || strcmp(word, other) == 0;
}

}  // namespace

int main(int argc, char** argv) {
  remvol::begin();
  if (argc == 2 && is_one_of(argv[1], "-h", "--help")) {
    fputs(kUsage, stdout);
    return EXIT_SUCCESS;
  }
  if (argc == 2 && is_one_of(argv[1], "-V", "--version")) {
    puts("ktreec " REMVOL_VERSION);
    return EXIT_SUCCESS;
  }
  CommandLine arguments = {};
  const ClientOperation* operation = nullptr;
  const char* wrong = argc == 0 ? "no operation" : parse(argv + 1, arguments, operation);
  return wrong == nullptr ? operation->run(arguments) : usage_error(wrong);
}
