/* Put in front of the programs of a test box by LD_PRELOAD: writes what they ask of the system into the box's
 * log, makes sleeps instant, and lets the script answer in place of the real function.
 *
 * A rule's result and errno are returned; its text is what the function hands out (see each function). A rule
 * with `through` only acts (side effect, delay, signal) and lets the real function go on. */
#undef _FILE_OFFSET_BITS /* fcntl and fcntl64 would be one name */
#undef _TIME_BITS
#include <arpa/inet.h>
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <netdb.h>
#include <stdarg.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/sem.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

#include "script.h"

#define PUBLIC __attribute__((visibility("default")))

/* The next function of this name: the one that would have been called without this library. */
#define REAL(name) ((__typeof__(&name))(uintptr_t)real_function(#name))

static void* real_function(const char* name) {
  void* found = dlsym(RTLD_NEXT, name);
  if (found == NULL) {
    log_call("unscripted", name, "", "", "(no such function)", (char*)NULL);
    abort();
  }
  return found;
}

/* Says whether the script answers for this call; then `rule` has been acted on and is to be freed. */
static int answered(const char* function, const char* subject, const char* value, struct rule* rule) {
  int saved = errno;
  char* args[] = {(char*)subject, (char*)value, NULL};
  if (script_find(function, subject, value, rule) != 0) {
    errno = saved;
    return 0;
  }
  rule_act(rule, args);
  if (rule->through) rule_free(rule);
  errno = rule->through || rule->error == 0 ? saved : rule->error;
  return !rule->through;
}

static long long take_result(struct rule* rule) {
  int error = errno;
  rule_free(rule);
  errno = error;
  return rule->result;
}

/* For functions whose result is all that they give. */
static int answered_number(const char* function, const char* subject, const char* value, long long* result) {
  struct rule rule;
  if (!answered(function, subject, value, &rule)) return 0;
  *result = take_result(&rule);
  return 1;
}

static const char* number_text(char buffer[32], long long number) {
  snprintf(buffer, 32, "%lld", number);
  return buffer;
}

/* --- commands and time --- */

PUBLIC int system(const char* command) {
  long long result;
  if (command == NULL) return REAL(system)(command);
  log_call("system", command, (char*)NULL);
  if (answered_number("system", command, "", &result)) return (int)result;
  return REAL(system)(command);
}

PUBLIC FILE* popen(const char* command, const char* mode) {
  long long result;
  log_call("popen", command, mode, (char*)NULL);
  if (answered_number("popen", command, mode, &result)) return NULL;
  return REAL(popen)(command, mode);
}

PUBLIC int pclose(FILE* stream) {
  long long result;
  int status = REAL(pclose)(stream);
  return answered_number("pclose", "", "", &result) ? (int)result : status;
}

/* A sleep takes no time, or FAKE_SLEEP_MS milliseconds when other processes are to get on meanwhile. */
static void nap(void) {
  const char* text = getenv("FAKE_SLEEP_MS");
  long wait = text == NULL ? 0 : atol(text);
  struct timespec time = {wait / 1000, wait % 1000 * 1000000};
  if (wait > 0) clock_nanosleep(CLOCK_MONOTONIC, 0, &time, NULL);
}

PUBLIC unsigned sleep(unsigned seconds) {
  char text[32];
  long long result = 0;
  log_call("sleep", number_text(text, seconds), (char*)NULL);
  if (!answered_number("sleep", text, "", &result)) nap();
  return (unsigned)result;
}

PUBLIC int usleep(useconds_t microseconds) {
  char text[32];
  long long result = 0;
  log_call("usleep", number_text(text, microseconds), (char*)NULL);
  if (!answered_number("usleep", text, "", &result)) nap();
  return (int)result;
}

/* --- files --- */

PUBLIC int mknod(const char* path, mode_t mode, dev_t device) {
  char kind[64];
  long long result;
  snprintf(kind, sizeof kind, "%o %u:%u", mode, (unsigned)(device >> 8 & 0xfff), (unsigned)(device & 0xff));
  log_call("mknod", path, kind, (char*)NULL);
  if (answered_number("mknod", path, kind, &result)) return (int)result;
  return REAL(mknod)(path, mode, device);
}

PUBLIC char* strdup(const char* text) {
  long long result;
  if (answered_number("strdup", text, "", &result)) return NULL;
  return REAL(strdup)(text);
}

PUBLIC int access(const char* path, int mode) {
  long long result;
  if (answered_number("access", path, "", &result)) return (int)result;
  return REAL(access)(path, mode);
}

/* Record locks alone: the subject is "lock", "unlock" or "wait" (the blocking form). */
static int locked(int fd, int command, void* argument, long long* result) {
  const struct flock* lock = argument;
  const int at_once = command == F_SETLK || command == F_SETLK64;
  if (!at_once && command != F_SETLKW && command != F_SETLKW64) return 0;
  const char* what = lock->l_type == F_UNLCK ? "unlock" : at_once ? "lock" : "wait";
  char link[64];
  char path[256] = "";
  snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
  if (readlink(link, path, sizeof path - 1) < 0) path[0] = '\0';
  log_call("fcntl", what, path, (char*)NULL);
  return answered_number("fcntl", what, path, result);
}

#define DEFINE_FCNTL(name)                                          \
  PUBLIC int name(int fd, int command, ...) {                       \
    va_list list;                                                   \
    long long result;                                               \
    va_start(list, command);                                        \
    void* argument = va_arg(list, void*);                           \
    va_end(list);                                                   \
    if (locked(fd, command, argument, &result)) return (int)result; \
    return REAL(name)(fd, command, argument);                       \
  }
DEFINE_FCNTL(fcntl)
DEFINE_FCNTL(fcntl64)
#if __TIMESIZE == 32 /* the names of what has 64-bit times */
int __fcntl_time64(int fd, int command, ...);
DEFINE_FCNTL(__fcntl_time64)
#endif

/* --- semaphores --- */

PUBLIC int semget(key_t key, int count, int flags) {
  char text[64];
  long long result;
  snprintf(text, sizeof text, "%d %d %o", (int)key, count, (unsigned)flags);
  log_call("semget", text, (char*)NULL);
  if (answered_number("semget", text, "", &result)) return (int)result;
  return REAL(semget)(key, count, flags);
}

/* Logs the call; answered when this is 1. */
static int semctl_answered(int command, void* argument, long long* result) {
  const char* what = command == SETVAL     ? "SETVAL"
                     : command == GETNCNT  ? "GETNCNT"
                     : command == IPC_RMID ? "IPC_RMID"
                     : command == IPC_STAT ? "IPC_STAT"
                     : command == IPC_SET  ? "IPC_SET"
                                           : "other";
  char value[32] = "";
  if (command == SETVAL) number_text(value, (int)(intptr_t)argument);
  if (command == IPC_SET)
    snprintf(value, sizeof value, "%o", ((const struct semid_ds*)argument)->sem_perm.mode);
  if (command != IPC_STAT) log_call("semctl", what, value, (char*)NULL);
  return answered_number("semctl", what, value, result);
}

#define DEFINE_SEMCTL(name)                                              \
  PUBLIC int name(int id, int number, int command, ...) {                \
    va_list list;                                                        \
    long long result;                                                    \
    va_start(list, command);                                             \
    void* argument = va_arg(list, void*);                                \
    va_end(list);                                                        \
    if (semctl_answered(command, argument, &result)) return (int)result; \
    return REAL(name)(id, number, command, argument);                    \
  }
DEFINE_SEMCTL(semctl)
#if __TIMESIZE == 32
int __semctl64(int id, int number, int command, ...);
DEFINE_SEMCTL(__semctl64)
#endif

PUBLIC int semop(int id, struct sembuf* operations, size_t count) {
  char text[64];
  long long result;
  snprintf(text, sizeof text, "%d%s%s", operations[0].sem_op,
           operations[0].sem_flg & SEM_UNDO ? " SEM_UNDO" : "",
           operations[0].sem_flg & IPC_NOWAIT ? " IPC_NOWAIT" : "");
  log_call("semop", text, (char*)NULL);
  if (answered_number("semop", text, "", &result)) return (int)result;
  return REAL(semop)(id, operations, count);
}

/* --- addresses: the text is a list of addresses parted by blanks, "unix" for one of another family --- */

static struct addrinfo* make_address(const char* text, int socktype) {
  struct addrinfo* made = calloc(1, sizeof *made + sizeof(struct sockaddr_storage));
  if (made == NULL) abort();
  made->ai_addr = (struct sockaddr*)(made + 1);
  made->ai_socktype = socktype;
  if (strchr(text, ':') != NULL) {
    struct sockaddr_in6* six = (struct sockaddr_in6*)(void*)made->ai_addr;
    made->ai_family = AF_INET6;
    made->ai_addrlen = sizeof *six;
    inet_pton(AF_INET6, text, &six->sin6_addr);
  } else if (strcmp(text, "unix") == 0) {
    made->ai_family = AF_UNIX;
    made->ai_addrlen = sizeof(struct sockaddr_un);
  } else {
    struct sockaddr_in* four = (struct sockaddr_in*)(void*)made->ai_addr;
    made->ai_family = AF_INET;
    made->ai_addrlen = sizeof *four;
    inet_pton(AF_INET, text, &four->sin_addr);
  }
  made->ai_addr->sa_family = (sa_family_t)made->ai_family;
  return made;
}

PUBLIC int getaddrinfo(const char* node, const char* service, const struct addrinfo* hints,
                       struct addrinfo** result) {
  struct rule rule;
  char text[128];
  snprintf(text, sizeof text, "flags=%d family=%d type=%d protocol=%d service=%s",
           hints ? hints->ai_flags : 0, hints ? hints->ai_family : 0, hints ? hints->ai_socktype : 0,
           hints ? hints->ai_protocol : 0, service ? service : "none");
  log_call("getaddrinfo", node ? node : "", text, (char*)NULL);
  if (!answered("getaddrinfo", node ? node : "", text, &rule))
    return REAL(getaddrinfo)(node, service, hints, result);
  struct addrinfo** end = result;
  *result = NULL;
  char* list = strcpy(calloc(1, strlen(rule.out) + 1), rule.out);
  for (char* word = strtok(list, " "); word != NULL; word = strtok(NULL, " ")) {
    *end = make_address(word, hints ? hints->ai_socktype : SOCK_STREAM);
    end = &(*end)->ai_next;
  }
  free(list);
  return (int)take_result(&rule);
}

PUBLIC void freeaddrinfo(struct addrinfo* list) {
  while (list != NULL) {
    struct addrinfo* next = list->ai_next;
    free(list->ai_canonname);
    free(list);
    list = next;
  }
}

PUBLIC const char* inet_ntop(int family, const void* address, char* buffer, socklen_t size) {
  long long result;
  if (answered_number("inet_ntop", family == AF_INET ? "AF_INET" : "AF_INET6", "", &result)) return NULL;
  return REAL(inet_ntop)(family, address, buffer, size);
}

/* --- the configuration tree: the subject is the path, the value that of a set --- */

int ktreec_set(const char* socket, unsigned flags, const char* path, const char* value);
int ktreec_get_wb(const char* socket, unsigned flags, const char* path, char* buffer, size_t size);
int ktreec_del(const char* socket, unsigned flags, const char* path);
int ktreec_dump(const char* socket, unsigned flags, const char* file);

PUBLIC int ktreec_set(const char* socket, unsigned flags, const char* path, const char* value) {
  long long result;
  log_call("set", path, value, socket, (char*)NULL);
  if (answered_number("ktreec_set", path, value, &result)) return (int)result;
  return REAL(ktreec_set)(socket, flags, path, value);
}

/* The text of the rule is the value that is read, its result what is returned. */
PUBLIC int ktreec_get_wb(const char* socket, unsigned flags, const char* path, char* buffer, size_t size) {
  struct rule rule;
  if (!answered("ktreec_get_wb", path, "", &rule))
    return REAL(ktreec_get_wb)(socket, flags, path, buffer, size);
  snprintf(buffer, size, "%s", rule.out);
  return (int)take_result(&rule);
}

PUBLIC int ktreec_del(const char* socket, unsigned flags, const char* path) {
  long long result;
  log_call("del", path, socket, (char*)NULL);
  if (answered_number("ktreec_del", path, "", &result)) return (int)result;
  return REAL(ktreec_del)(socket, flags, path);
}

PUBLIC int ktreec_dump(const char* socket, unsigned flags, const char* file) {
  long long result;
  log_call("dump", file, socket, (char*)NULL);
  if (answered_number("ktreec_dump", file, "", &result)) return (int)result;
  return REAL(ktreec_dump)(socket, flags, file);
}

/* --- system utilities: the subject is the first text argument --- */

#define DEFINE_QUERY(type, name)                                           \
  type name(const char* subject);                                          \
  PUBLIC type name(const char* subject) {                                  \
    long long result;                                                      \
    if (answered_number(#name, subject, "", &result)) return (type)result; \
    return REAL(name)(subject);                                            \
  }

#define DEFINE_ACTION(name)                                               \
  int name(const char* subject);                                          \
  PUBLIC int name(const char* subject) {                                  \
    long long result;                                                     \
    log_call(#name, subject, (char*)NULL);                                \
    if (answered_number(#name, subject, "", &result)) return (int)result; \
    return REAL(name)(subject);                                           \
  }

DEFINE_QUERY(int, sys_check_dev)
DEFINE_QUERY(int, sys_check_fs_state)
DEFINE_QUERY(int, sys_mount_point)
DEFINE_QUERY(long long, sys_get_partition_size)
DEFINE_ACTION(sys_create_1_partition)
DEFINE_ACTION(sys_expand_1_partition)

/* The text of the rule is what is put into `out`. */
#define DEFINE_TEXT_QUERY(name)                                                \
  int name(char* out, const char* subject);                                    \
  PUBLIC int name(char* out, const char* subject) {                            \
    struct rule rule;                                                          \
    if (!answered(#name, subject, "", &rule)) return REAL(name)(out, subject); \
    strcpy(out, rule.out);                                                     \
    return (int)take_result(&rule);                                            \
  }

DEFINE_TEXT_QUERY(sys_get_partition_list)
DEFINE_TEXT_QUERY(sys_get_fs_type)

int str_insert_back_slash(char* out, size_t size, const char* text);
PUBLIC int str_insert_back_slash(char* out, size_t size, const char* text) {
  struct rule rule;
  if (!answered("str_insert_back_slash", text, "", &rule))
    return REAL(str_insert_back_slash)(out, size, text);
  snprintf(out, size, "%s", rule.out);
  return (int)take_result(&rule);
}

long long sys_get_disk_space(const char* format, ...) __attribute__((format(printf, 1, 2)));
PUBLIC long long sys_get_disk_space(const char* format, ...) {
  char path[4096];
  long long result;
  va_list list;
  va_start(list, format);
  vsnprintf(path, sizeof path, format, list);
  va_end(list);
  if (answered_number("sys_get_disk_space", path, "", &result)) return result;
  return REAL(sys_get_disk_space)("%s", path);
}

/* The text of the rule is "aa:bb:cc:dd:ee:ff". */
int sys_get_mac_addr(const char* interface, unsigned char mac[6]);
PUBLIC int sys_get_mac_addr(const char* interface, unsigned char mac[6]) {
  struct rule rule;
  if (!answered("sys_get_mac_addr", interface, "", &rule)) return REAL(sys_get_mac_addr)(interface, mac);
  const char* at = rule.out;
  for (int i = 0; i < 6 && *at != '\0'; i++) {
    char* end;
    mac[i] = (unsigned char)strtoul(at, &end, 16);
    at = *end == ':' ? end + 1 : end;
  }
  return (int)take_result(&rule);
}

int sys_hostname(char* out, size_t size);
PUBLIC int sys_hostname(char* out, size_t size) {
  struct rule rule;
  if (!answered("sys_hostname", "", "", &rule)) return REAL(sys_hostname)(out, size);
  snprintf(out, size, "%s", rule.out);
  return (int)take_result(&rule);
}

/* The text of the rule is "TOTAL USED AVAILABLE". */
int sys_get_df_info(const char* path, unsigned long long* total, unsigned long long* used,
                    unsigned long long* available);
PUBLIC int sys_get_df_info(const char* path, unsigned long long* total, unsigned long long* used,
                           unsigned long long* available) {
  struct rule rule;
  if (!answered("sys_get_df_info", path, "", &rule))
    return REAL(sys_get_df_info)(path, total, used, available);
  char* at = (char*)rule.out;
  if (*at != '\0') {
    *total = strtoull(at, &at, 10);
    *used = strtoull(at, &at, 10);
    *available = strtoull(at, &at, 10);
  }
  return (int)take_result(&rule);
}

int LIB_Get_Lan_Link_Speed(int port);
PUBLIC int LIB_Get_Lan_Link_Speed(int port) {
  char text[32];
  long long result;
  if (answered_number("LIB_Get_Lan_Link_Speed", number_text(text, port), "", &result)) return (int)result;
  return REAL(LIB_Get_Lan_Link_Speed)(port);
}
