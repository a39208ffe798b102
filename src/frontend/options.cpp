#include "frontend/options.h"

#include <arpa/inet.h>
#include <getopt.h>
#include <netdb.h>
#include <sys/socket.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frontend/commands.h"
#include "frontend/log.h"
#include "frontend/request.h"
#include "support/result.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr int kVersion = 1;
constexpr size_t kAddressSize = sizeof(TargetEntry::ip);

constexpr char kSecretOption = 'P';
constexpr char kShortOptions[] = "i:p:n:s:vc:U:P:d:l:ho:w:";

ParseEnd choose_command(int index) {
  if (command_row >= 0) {
    LOG(1, "Command parameter check failed, %d & %d", command_row, index);
    return ParseEnd::kFail;
  }
  gs_str_command = kCommands[index].name;
  if (optarg != nullptr) printf(" with arg %s", optarg);
  putchar('\n');
  command_row = index;
  return ParseEnd::kReady;
}

void log_option(int option) {
  LOG(1, "opt('%c') with arg '%s'", option, option == kSecretOption ? kMaskedSecret : optarg);
  LOG(1, "OPT_FLAG: %08x", OPT_FLAG);
}

// Returns whether the argument fits into a field of `size` bytes; logs when it does not.
bool fits_field(int option, size_t size) {
  if (strlen(optarg) < size) return true;
  LOG(0, "Command parameter check failed, -%c takes at most %zu bytes", option, size - 1);
  return false;
}

template <size_t N>
ParseEnd take_name(int option, unsigned bit, char (&field)[N]) {
  if (check_name(optarg) < 0) {
    LOG(1, "Command parameter check failed, wrong name: '%s'", optarg);
    return ParseEnd::kFail;
  }
  if (!fits_field(option, N)) return ParseEnd::kFail;
  OPT_FLAG |= bit;
  copy_text(field, optarg);
  log_option(option);
  return ParseEnd::kReady;
}

ParseEnd take_number(int option, unsigned bit, int32_t* field) {
  OPT_FLAG |= bit;
  *field = atoi(optarg);
  log_option(option);
  return ParseEnd::kReady;
}

// User and secret count only behind "-c 1"; given earlier they are dropped without a word. Callers rely on
// that order.
template <size_t N>
ParseEnd take_credential(int option, char (&field)[N]) {
  if (request_target.chap != 1) return ParseEnd::kReady;
  if (!fits_field(option, N)) return ParseEnd::kFail;
  copy_text(field, optarg);
  log_option(option);
  return ParseEnd::kReady;
}

ParseEnd take_secret() {
  const ParseEnd end = take_credential(kSecretOption, request_target.chap_pwd);
  explicit_bzero(optarg, strlen(optarg));
  return end;
}

// Returns how many characters stand before the secret in its argument.
int move_secret(char** argument, char* secret) {
  const int before = static_cast<int>(secret - *argument);
  char* const copy = strdup(*argument);
  if (copy == nullptr) return before;  // take_secret overwrites it
  explicit_bzero(secret, strlen(secret));
  *argument = copy;
  return before;
}

ParseEnd take_address() {
  OPT_FLAG |= kOptAddress;
  log_option('i');
  if (_resovle_net_address_to_ip(request_target.ip, &request_target.inet_type, optarg) != 0) {
    LOG(0, "ip address %s -> error", optarg);
    return ParseEnd::kFail;
  }
  LOG(1, "get ip address %s = %s, inet_type = %s", optarg, request_target.ip,
      request_target.inet_type == AF_INET ? "AF_INET" : "AF_INET6");
  return ParseEnd::kReady;
}

ParseEnd store_debug_level() {
  const NumberText value("%d", atoi(optarg));
  LOG(kNote, "ktreec_set %s=%s", key::kDebugLevel, value.c_str());
  if (tree_write(key::kDebugLevel, value) != kOk) LOG(0, "ktreec_set(%s) failed ", key::kDebugLevel);
  return ParseEnd::kExit;
}

ParseEnd print_version() {
  printf("\n\rremvol version: %d\n\r", kVersion);
  return ParseEnd::kExit;
}

ParseEnd take_option(int option, int index) {
  switch (option) {
    case 0:
      return choose_command(index);
    case 'n':
      return take_name(option, kOptName, request_target.target_name);
    case 's':
      return take_name(option, kOptShare, request_target.share);
    case 'c':
      return take_number(option, kOptChap, &request_target.chap);
    case 'p':
      return take_number(option, kOptPort, &request_target.port);
    case 'l':
      return take_number(option, kOptLun, &request_target.lun);
    case 'i':
      return take_address();
    case 'U':
      return take_credential(option, request_target.chap_name);
    case kSecretOption:
      return take_secret();
    case 'o':
      output_file = optarg;
      return ParseEnd::kReady;
    case 'w':
      wait_seconds = atoi(optarg);
      return ParseEnd::kReady;
    case 'd':
      return store_debug_level();
    case 'v':
      return print_version();
    default:
      return ParseEnd::kUsage;
  }
}

int format_ipv4(char* address, const sockaddr_in& socket) {
  char text[kAddressSize] = "";
  if (inet_ntop(AF_INET, &socket.sin_addr, text, sizeof text) == nullptr) LOG(1, "inet_ntop failed");
  memcpy(address, text, sizeof text);
  return kOk;
}

int format_ipv6(char* address, const sockaddr_in6& socket) {
  char text[INET6_ADDRSTRLEN] = "";
  if (inet_ntop(AF_INET6, &socket.sin6_addr, text, sizeof text) == nullptr) {
    puts("get address failed");
    LOG(1, "inet_ntop failed");
    return kFailed;
  }
  snprintf(address, kAddressSize, "[%s]", text);
  return kOk;
}

}  // namespace

void hide_secrets(int argc, char** argv, int* shown) {
  for (int i = 0; i < argc; i++) shown[i] = -1;
  const Text<64> in_order("-%s", kShortOptions);  // the arguments stay in their order; getopt_long(3)
  opterr = 0;
  int option = 0;
  while ((option = getopt_long(argc, argv, in_order, long_options(), nullptr)) != -1) {
    if (option != kSecretOption) continue;
    const int index = optind - 1;
    shown[index] = move_secret(&argv[index], optarg);
  }
  opterr = 1;
  optind = 0;  // the reading begins anew
}

ParseEnd parse_options(int argc, char** argv) {
  const option* const commands = long_options();
  int index = 0;
  int option = 0;
  while ((option = getopt_long(argc, argv, kShortOptions, commands, &index)) != -1) {
    const ParseEnd end = take_option(option, index);
    if (end != ParseEnd::kReady) return end;
  }
  return ParseEnd::kReady;
}

int check_name(const char*) {
  return 0;
}

int _resovle_net_address_to_ip(char* address, int* family, const char* host) {
  const LogScope scope;
  if (address == nullptr || family == nullptr || host == nullptr || host[0] == '\0') return kFailed;
  addrinfo hints = {};
  hints.ai_socktype = SOCK_STREAM;
  addrinfo* found = nullptr;
  const int error = getaddrinfo(host, nullptr, &hints, &found);
  if (error != 0) {
    LOG(1, "getaddrinfo return %s\n", gai_strerror(error));
    return kFailed;
  }
  *family = found->ai_family;
  sockaddr_storage socket = {};
  memcpy(&socket, found->ai_addr, found->ai_addrlen);
  freeaddrinfo(found);
  if (*family == AF_INET) return format_ipv4(address, reinterpret_cast<const sockaddr_in&>(socket));
  if (*family == AF_INET6) return format_ipv6(address, reinterpret_cast<const sockaddr_in6&>(socket));
  LOG(1, "get ip address failed\n");
  return kFailed;
}

}  // namespace remvol
