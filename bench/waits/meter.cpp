// Loaded into a run of the tool in front of its libraries (LD_PRELOAD): says where the time of the run goes.
// Each call that is listed below is booked to an account from its begin to its end; of calls inside of calls
// the innermost has the time, so nothing counts twice. What the booking itself takes is measured at the start
// and has an account of its own. At its end the run appends to the file that BENCH_METER names, times in
// nanoseconds:
//   program COMMAND               a shell command or a child was started
//   wait CALL TIME                the tool waited, and how long
//   spent ACCOUNT TIME PROCESSOR  by the clock, and of the processor, in the whole run
//   alive BEGIN END               what the clock said after the loading of the libraries, and at the end
// Programs that the run starts are not measured.
#include <dlfcn.h>
#include <fcntl.h>
#include <poll.h>
#include <sched.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/sem.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "ktreec.h"
#include "ostel_common.h"
#include "sysaux.h"

namespace {

enum Account { kOwn, kWaits, kPrograms, kTree, kDisks, kKernel, kMeter, kAccounts };
constexpr const char* kAccountNames[kAccounts] = {"own",   "waits",  "programs", "tree",
                                                  "disks", "kernel", "meter"};

struct Moment {
  long long clock, processor;
};

long long read_clock(clockid_t id) {
  timespec now;
  clock_gettime(id, &now);
  return static_cast<long long>(now.tv_sec) * 1'000'000'000 + now.tv_nsec;
}

Moment now() {
  return {read_clock(CLOCK_MONOTONIC), read_clock(CLOCK_PROCESS_CPUTIME_ID)};
}

const char* report_path;
Moment began, last;
Account current = kMeter;  // before the begin and after the end
Moment spent[kAccounts];
long long bookings[kAccounts];
Moment inside, outside;  // what a booking adds to its own account, and to the one around it
char report[1 << 18];
size_t report_length;

[[gnu::format(printf, 1, 2)]] void note(const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  const size_t room = sizeof report - report_length;
  const int length = vsnprintf(report + report_length, room, format, arguments);
  va_end(arguments);
  if (length > 0 && static_cast<size_t>(length) < room) report_length += static_cast<size_t>(length);
}

void note_program(const char* command) {
  note("program %.*s\n", static_cast<int>(strcspn(command, "\n")), command);
}

// Books what has passed, and goes on with that account.
void go_on_with(Account account) {
  const Moment moment = now();
  spent[current].clock += moment.clock - last.clock;
  spent[current].processor += moment.processor - last.processor;
  last = moment;
  current = account;
}

class Booked {
 public:
  explicit Booked(Account account) : outer_(current) {
    go_on_with(account);
    bookings[account]++;
  }
  ~Booked() { go_on_with(outer_); }
  Booked(const Booked&) = delete;
  Booked& operator=(const Booked&) = delete;

 private:
  Account outer_;
};

constexpr int kMaxStreams = 8;
FILE* streams[kMaxStreams];  // that come from programs

bool exchange_stream(FILE* from, FILE* to) {
  for (FILE*& stream : streams) {
    if (stream != from) continue;
    stream = to;
    return true;
  }
  return false;
}

Account account_of(FILE* stream) {
  for (const FILE* each : streams) {
    if (stream != nullptr && each == stream) return kPrograms;
  }
  return current;
}

Moment share_of(Moment all, long long parts) {
  return {all.clock / parts, all.processor / parts};
}

void try_booking() {
  constexpr int kTries = 200;
  last = now();
  current = kOwn;
  for (int i = 0; i < kTries; i++) const Booked booked(kKernel);
  inside = share_of(spent[kKernel], kTries);
  outside = share_of(spent[kOwn], kTries);
  memset(spent, 0, sizeof spent);
  memset(bookings, 0, sizeof bookings);
}

// Takes what so many bookings took off an account.
void take_off(Account account, long long times, const Moment& each) {
  const Moment taken = {std::min(times * each.clock, spent[account].clock),
                        std::min(times * each.processor, spent[account].processor)};
  spent[account].clock -= taken.clock;
  spent[account].processor -= taken.processor;
  spent[kMeter].clock += taken.clock;
  spent[kMeter].processor += taken.processor;
}

void take_bookings_off() {
  long long all = 0;
  for (int i = 0; i < kAccounts; i++) {
    take_off(static_cast<Account>(i), bookings[i], inside);
    all += bookings[i];
  }
  take_off(kOwn, all, outside);  // few are inside of another
}

[[gnu::constructor]] void begin() {
  report_path = getenv("BENCH_METER");
  unsetenv("BENCH_METER");
  unsetenv("LD_PRELOAD");
  try_booking();
  began = last = now();
}

[[gnu::destructor]] void end() {
  go_on_with(kMeter);
  take_bookings_off();
  for (int i = 0; i < kAccounts; i++) {
    note("spent %s %lld %lld\n", kAccountNames[i], spent[i].clock, spent[i].processor);
  }
  note("alive %lld %lld\n", began.clock, last.clock);
  const int file = report_path != nullptr ? open(report_path, O_WRONLY | O_APPEND | O_CLOEXEC) : -1;
  if (file < 0 || write(file, report, report_length) != static_cast<ssize_t>(report_length)) {
    perror("bench_meter");
  }
}

}  // namespace

// The function of this name that the tool would have called.
#define REAL(name) static auto* const real = reinterpret_cast<decltype(&name)>(dlsym(RTLD_NEXT, #name))

#define BOOKED(account, result, name, parameters, ...) \
  result name parameters {                             \
    REAL(name);                                        \
    const Booked booked(account);                      \
    return real(__VA_ARGS__);                          \
  }

// For what the libraries call as well: there it is that library's own.
#define OF_TOOL(account, result, name, parameters, ...) \
  result name parameters {                              \
    REAL(name);                                         \
    if (current != kOwn) return real(__VA_ARGS__);      \
    const Booked booked(account);                       \
    return real(__VA_ARGS__);                           \
  }

// Its time is the wait's wherever it is called, but for the tree's library, which waits for the tree.
#define WAIT(result, name, parameters, ...)                              \
  result name parameters {                                               \
    REAL(name);                                                          \
    if (current == kTree) return real(__VA_ARGS__);                      \
    const Booked booked(kWaits);                                         \
    const long long before = last.clock;                                 \
    const result answer = real(__VA_ARGS__);                             \
    note("wait " #name " %lld\n", read_clock(CLOCK_MONOTONIC) - before); \
    return answer;                                                       \
  }

#define FORMATTED(account, result, name)                                           \
  result name(const char* format, ...) {                                           \
    REAL(name);                                                                    \
    const Booked booked(account);                                                  \
    char* text = nullptr;                                                          \
    va_list arguments;                                                             \
    va_start(arguments, format);                                                   \
    const int length = vasprintf(&text, format, arguments);                        \
    va_end(arguments);                                                             \
    const result answer = length < 0 ? static_cast<result>(-1) : real("%s", text); \
    free(text);                                                                    \
    return answer;                                                                 \
  }

extern "C" {

// The checked forms, which a build may choose.
char* __fgets_chk(char* text, size_t room, int size, FILE* stream);
int __poll_chk(pollfd* polled, nfds_t count, int timeout, size_t room);

WAIT(unsigned, sleep, (unsigned seconds), seconds)
WAIT(int, usleep, (useconds_t microseconds), microseconds)
WAIT(int, nanosleep, (const timespec* wanted, timespec* left_over), wanted, left_over)

int system(const char* command) {
  REAL(system);
  const Booked booked(kPrograms);
  note_program(command);
  return real(command);
}

FILE* popen(const char* command, const char* mode) {
  REAL(popen);
  const Booked booked(kPrograms);
  note_program(command);
  FILE* stream = real(command, mode);
  exchange_stream(nullptr, stream);
  return stream;
}

int pclose(FILE* stream) {
  REAL(pclose);
  const Booked booked(kPrograms);
  exchange_stream(stream, nullptr);
  return real(stream);
}

pid_t fork() noexcept {
  REAL(fork);
  const Booked booked(kPrograms);
  note_program("(a child)");
  return real();
}

OF_TOOL(kPrograms, pid_t, waitpid, (pid_t child, int* status, int options), child, status, options)
OF_TOOL(kPrograms, int, poll, (pollfd * polled, nfds_t count, int timeout), polled, count, timeout)
OF_TOOL(kPrograms, int, __poll_chk, (pollfd * polled, nfds_t count, int timeout, size_t room), polled, count,
        timeout, room)
BOOKED(account_of(stream), char*, fgets, (char* text, int size, FILE* stream), text, size, stream)
BOOKED(account_of(stream), char*, __fgets_chk, (char* text, size_t room, int size, FILE* stream), text, room,
       size, stream)

// The kernel's calls that the tool makes itself.
int open(const char* path, int flags, ...) {
  REAL(open);
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = (flags & (O_CREAT | __O_TMPFILE)) != 0 ? va_arg(arguments, mode_t) : 0;
  va_end(arguments);
  if (current != kOwn) return real(path, flags, mode);
  const Booked booked(kKernel);
  return real(path, flags, mode);
}

OF_TOOL(kKernel, int, access, (const char* path, int mode), path, mode)
OF_TOOL(kKernel, int, close, (int file), file)
OF_TOOL(kKernel, int, flock, (int file, int operation), file, operation)
OF_TOOL(kKernel, int, fstat, (int file, struct stat* info), file, info)
OF_TOOL(kKernel, int, fsync, (int file), file)
OF_TOOL(kKernel, int, ftruncate, (int file, off_t size), file, size)
OF_TOOL(kKernel, int, getrusage, (__rusage_who_t who, rusage* usage), who, usage)
OF_TOOL(kKernel, int, lstat, (const char* path, struct stat* info), path, info)
OF_TOOL(kKernel, int, mkdir, (const char* path, mode_t mode), path, mode)
OF_TOOL(kKernel, int, mknod, (const char* path, mode_t mode, dev_t device), path, mode, device)
OF_TOOL(kKernel, int, mount,
        (const char* from, const char* path, const char* type, unsigned long flags, const void* data), from,
        path, type, flags, data)
OF_TOOL(kKernel, ssize_t, pread, (int file, void* data, size_t size, off_t offset), file, data, size, offset)
OF_TOOL(kKernel, ssize_t, read, (int file, void* data, size_t size), file, data, size)
OF_TOOL(kKernel, int, rename, (const char* from, const char* to), from, to)
OF_TOOL(kKernel, int, rmdir, (const char* path), path)
OF_TOOL(kKernel, int, semop, (int set, sembuf* operations, size_t count), set, operations, count)
OF_TOOL(kKernel, int, stat, (const char* path, struct stat* info), path, info)
OF_TOOL(kKernel, int, statx, (int folder, const char* path, int flags, unsigned mask, struct statx* info),
        folder, path, flags, mask, info)
OF_TOOL(kKernel, int, syncfs, (int file), file)
OF_TOOL(kKernel, int, umount2, (const char* path, int flags), path, flags)
OF_TOOL(kKernel, int, unlink, (const char* path), path)
OF_TOOL(kKernel, int, unshare, (int flags), flags)
OF_TOOL(kKernel, ssize_t, write, (int file, const void* data, size_t size), file, data, size)

BOOKED(kTree, int, ktreec_set, (const char* socket, unsigned flags, const char* path, const char* value),
       socket, flags, path, value)
BOOKED(kTree, int, ktreec_get_wb,
       (const char* socket, unsigned flags, const char* path, char* buffer, size_t size), socket, flags, path,
       buffer, size)
BOOKED(kTree, int, ktreec_del, (const char* socket, unsigned flags, const char* path), socket, flags, path)
BOOKED(kTree, int, ktreec_dump, (const char* socket, unsigned flags, const char* file), socket, flags, file)
BOOKED(kTree, int, ktreec_load, (const char* socket, unsigned flags, const char* file), socket, flags, file)

// The command that it runs is booked as one, by system().
FORMATTED(kDisks, int, System)
FORMATTED(kDisks, long long, sys_get_disk_space)
BOOKED(kDisks, int, sys_get_mac_addr, (const char* interface, unsigned char* mac), interface, mac)
BOOKED(kDisks, int, sys_hostname, (char* out, size_t size), out, size)
BOOKED(kDisks, int, sys_get_partition_list, (char* out, const char* device), out, device)
BOOKED(kDisks, int, sys_create_1_partition, (const char* device), device)
BOOKED(kDisks, int, sys_expand_1_partition, (const char* device), device)
BOOKED(kDisks, long long, sys_get_partition_size, (const char* name), name)
BOOKED(kDisks, int, sys_check_dev, (const char* node), node)
BOOKED(kDisks, int, sys_get_fs_type, (char* out, const char* node), out, node)
BOOKED(kDisks, int, sys_check_fs_state, (const char* node), node)
BOOKED(kDisks, int, sys_mount_point, (const char* path), path)
BOOKED(kDisks, int, sys_get_df_info,
       (const char* path, unsigned long long* total, unsigned long long* used, unsigned long long* available),
       path, total, used, available)
BOOKED(kDisks, int, LIB_Get_Lan_Link_Speed, (int port), port)

}  // extern "C"
