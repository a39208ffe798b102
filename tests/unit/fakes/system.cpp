// The calls of the C library that the tool makes by name.
#include <arpa/inet.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <netdb.h>
#include <sys/sem.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sstream>

#include "fakes.h"

namespace {

template <typename Function>
Function* real(const char* name) {
  void* found = dlsym(RTLD_NEXT, name);
  if (found == nullptr) abort();
  return reinterpret_cast<Function*>(found);
}

std::map<FILE*, int>& streams() {
  static std::map<FILE*, int> open_ones;  // what pclose is to return
  return open_ones;
}

bool answered_number(const char* function, const std::vector<std::string>& arguments, int* result) {
  fakes::Answer answer;
  if (!fakes::answered(function, arguments, &answer)) return false;
  *result = static_cast<int>(answer.result);
  return true;
}

addrinfo* make_address(const std::string& text, int socktype) {
  // freeaddrinfo(3) of the C library frees record and address as one piece.
  auto* made = static_cast<addrinfo*>(calloc(1, sizeof(addrinfo) + sizeof(sockaddr_storage)));
  made->ai_addr = reinterpret_cast<sockaddr*>(made + 1);
  made->ai_socktype = socktype;
  if (text.find(':') != std::string::npos) {
    made->ai_family = AF_INET6;
    made->ai_addrlen = sizeof(sockaddr_in6);
    inet_pton(AF_INET6, text.c_str(), &reinterpret_cast<sockaddr_in6*>(made->ai_addr)->sin6_addr);
  } else if (text == "unix") {
    made->ai_family = AF_UNIX;
    made->ai_addrlen = sizeof(sockaddr_un);
  } else {
    made->ai_family = AF_INET;
    made->ai_addrlen = sizeof(sockaddr_in);
    inet_pton(AF_INET, text.c_str(), &reinterpret_cast<sockaddr_in*>(made->ai_addr)->sin_addr);
  }
  made->ai_addr->sa_family = static_cast<sa_family_t>(made->ai_family);
  return made;
}

// Record locks alone are of interest.
bool locked(int command, void* argument, int* result) {
  if (command != F_SETLK && command != F_SETLKW) return false;
  const auto* lock = static_cast<const struct flock*>(argument);
  const char* what = lock->l_type == F_UNLCK ? "unlock" : command == F_SETLK ? "lock" : "wait";
  fakes::record("fcntl", {what});
  return answered_number("fcntl", {what}, result);
}

}  // namespace

extern "C" {

int system(const char* command) {
  int result = 0;
  fakes::record("system", {command});
  answered_number("system", {command}, &result);
  return result;
}

FILE* popen(const char* command, const char*) {
  fakes::Answer answer;
  fakes::record("popen", {command});
  if (!fakes::needs_answer("popen", {command}, &answer) || answer.result < 0) return nullptr;
  FILE* stream = tmpfile();
  if (stream == nullptr) return nullptr;
  fputs(answer.text.c_str(), stream);
  rewind(stream);
  streams()[stream] = static_cast<int>(answer.result);
  return stream;
}

int pclose(FILE* stream) {
  int result = streams()[stream];
  streams().erase(stream);
  fclose(stream);
  answered_number("pclose", {}, &result);
  return result;
}

unsigned sleep(unsigned seconds) {
  int result = 0;
  fakes::record("sleep", {std::to_string(seconds)});
  answered_number("sleep", {std::to_string(seconds)}, &result);
  return static_cast<unsigned>(result);
}

int usleep(useconds_t microseconds) {
  int result = 0;
  fakes::record("usleep", {std::to_string(microseconds)});
  answered_number("usleep", {std::to_string(microseconds)}, &result);
  return result;
}

int mknod(const char* path, mode_t mode, dev_t device) noexcept {
  int result = 0;
  char text[64];
  snprintf(text, sizeof text, "%o %u:%u", mode, major(device), minor(device));
  fakes::record("mknod", {path, text});
  answered_number("mknod", {path, text}, &result);
  return result;
}

char* strdup(const char* text) noexcept {
  int result = 0;
  if (answered_number("strdup", {text}, &result)) return nullptr;
  return real<decltype(strdup)>("strdup")(text);
}

int access(const char* path, int mode) noexcept {
  int result = 0;
  if (answered_number("access", {path}, &result)) return result;
  return real<decltype(access)>("access")(path, mode);
}

int fsync(int fd) {
  int result = 0;
  if (answered_number("fsync", {}, &result)) return result;
  return real<decltype(fsync)>("fsync")(fd);
}

int fcntl(int fd, int command, ...) {
  int result = 0;
  va_list list;
  va_start(list, command);
  void* argument = va_arg(list, void*);
  va_end(list);
  if (locked(command, argument, &result)) return result;
  return real<decltype(fcntl)>("fcntl")(fd, command, argument);
}

int semget(key_t key, int count, int flags) noexcept {
  int result = 0;
  char text[64];
  snprintf(text, sizeof text, "%d %d %o", key, count, static_cast<unsigned>(flags));
  fakes::record("semget", {text});
  if (answered_number("semget", {text}, &result)) return result;
  return real<decltype(semget)>("semget")(key, count, flags);
}

int semctl(int id, int number, int command, ...) noexcept {
  int result = 0;
  va_list list;
  va_start(list, command);
  void* argument = va_arg(list, void*);
  va_end(list);
  std::string what = command == SETVAL     ? "SETVAL"
                     : command == GETNCNT  ? "GETNCNT"
                     : command == IPC_RMID ? "IPC_RMID"
                     : command == IPC_STAT ? "IPC_STAT"
                     : command == IPC_SET  ? "IPC_SET"
                                           : "other";
  std::vector<std::string> fields = {what};
  if (command == SETVAL) {
    fields.push_back(std::to_string(static_cast<int>(reinterpret_cast<intptr_t>(argument))));
  }
  if (command == IPC_SET) {
    char mode[16];
    snprintf(mode, sizeof mode, "%o", static_cast<const semid_ds*>(argument)->sem_perm.mode);
    fields.push_back(mode);
  }
  if (command != IPC_STAT) fakes::record("semctl", fields);
  if (answered_number("semctl", fields, &result)) return result;
  return real<decltype(semctl)>("semctl")(id, number, command, argument);
}

int semop(int id, sembuf* operations, size_t count) noexcept {
  int result = 0;
  std::string text = std::to_string(operations[0].sem_op);
  if ((operations[0].sem_flg & SEM_UNDO) != 0) text += " SEM_UNDO";
  if ((operations[0].sem_flg & IPC_NOWAIT) != 0) text += " IPC_NOWAIT";
  fakes::record("semop", {text});
  if (answered_number("semop", {text}, &result)) return result;
  return real<decltype(semop)>("semop")(id, operations, count);
}

// The text of the rule is a list of addresses parted by blanks; "unix" stands for one of another family.
int getaddrinfo(const char* node, const char* service, const addrinfo* hints, addrinfo** found) {
  fakes::Answer answer;
  const std::string name = node == nullptr ? "" : node;
  fakes::record("getaddrinfo", {name});
  if (!fakes::answered("getaddrinfo", {name}, &answer)) {
    return real<decltype(getaddrinfo)>("getaddrinfo")(node, service, hints, found);
  }
  std::istringstream words(answer.text);
  addrinfo** end = found;
  *found = nullptr;
  for (std::string word; words >> word; end = &(*end)->ai_next) {
    *end = make_address(word, hints == nullptr ? 0 : hints->ai_socktype);
  }
  return static_cast<int>(answer.result);
}

const char* inet_ntop(int family, const void* address, char* buffer, socklen_t size) noexcept {
  int result = 0;
  if (answered_number("inet_ntop", {family == AF_INET ? "AF_INET" : "AF_INET6"}, &result)) return nullptr;
  return real<decltype(inet_ntop)>("inet_ntop")(family, address, buffer, size);
}

}  // extern "C"
