// The command line, on any words (parts of the input between NULs): fields stay ended and hold what was
// given, and a secret is gone from the arguments.
#include <netdb.h>

#include <cstdint>
#include <cstdio>
#include <string>
#include <vector>

#include <getopt.h>

#include "frontend/commands.h"
#include "frontend/log.h"
#include "frontend/options.h"
#include "frontend/request.h"
#include "ktreec.h"
#include "require.h"

using namespace remvol;

extern "C" {

int ktreec_set(const char*, unsigned, const char*, const char*) {
  return 0;
}

int __real_getaddrinfo(const char* host, const char* service, const addrinfo* hints, addrinfo** found);

// Names are not looked for in the network: those that begin with a digit are addresses.
int __wrap_getaddrinfo(const char* host, const char* service, const addrinfo* hints, addrinfo** found) {
  addrinfo wanted = hints != nullptr ? *hints : addrinfo{};
  wanted.ai_flags |= AI_NUMERICHOST;
  return __real_getaddrinfo(host, service, &wanted, found);
}

int LLVMFuzzerInitialize(int*, char***) {
  debug_level = -1;
  return freopen("/dev/null", "w", stdout) != nullptr ? 0 : -1;
}

}  // extern "C"

namespace {

std::vector<std::string> words_of(const uint8_t* data, size_t size) {
  std::vector<std::string> words = {"remvol"};
  std::string word;
  for (size_t i = 0; i <= size && words.size() < 64; i++) {
    if (i < size && data[i] != '\0') {
      word += static_cast<char>(data[i]);
      continue;
    }
    words.push_back(word);
    word.clear();
  }
  return words;
}

void check_record() {
  require_ended(request_target.target_name);
  require_ended(request_target.share);
  require_ended(request_target.chap_name);
  require_ended(request_target.chap_pwd);
  require_ended(request_target.ip);
  require((OPT_FLAG & ~0x6fU) == 0);
  require((OPT_FLAG & kOptName) != 0 || request_target.target_name[0] == '\0');
  require((OPT_FLAG & kOptShare) != 0 || request_target.share[0] == '\0');
}

// The word of a secret that was taken is overwritten. "-P" counts behind a word that wants no further one.
void check_secret(const std::vector<std::string>& before, const std::vector<std::string>& after) {
  for (size_t i = 2; i + 1 < before.size(); i++) {
    if (before[i - 1] == "--") return;  // no options from here on
    if (before[i] != "-P" || before[i - 1] != "-Uu") continue;
    const bool taken = request_target.chap_pwd[0] != '\0' && before[i + 1] == request_target.chap_pwd;
    if (taken) require(after[i + 1].c_str()[0] == '\0');
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  std::vector<std::string> words = words_of(data, size);
  const std::vector<std::string> before = words;
  std::vector<char*> argv;
  for (std::string& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);
  request_target = {};
  OPT_FLAG = 0;
  gs_str_command = nullptr;
  output_file = nullptr;
  command_row = -1;
  wait_seconds = 0;
  optind = 0;
  opterr = 0;
  const ParseEnd end = parse_options(static_cast<int>(words.size()), argv.data());
  require(command_row >= -1 && command_row < kCommandCount);
  check_record();
  if (end != ParseEnd::kReady) return 0;
  if (command_row >= 0) require(strcmp(gs_str_command, kCommands[command_row].name) == 0);
  check_secret(before, words);
  return 0;
}
