/* Goes before the C library and the platform's libraries in `remvol` (LD_PRELOAD): the platform answers from
 * the world of world.h, sleeps are short, and the call that a fault is planned for fails. In every other
 * program it does nothing. */
#include <dirent.h>
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <mntent.h>
#include <netdb.h>
#include <signal.h>
#include <stdarg.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/sem.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

#include "sysfs.h"
#include "world.h"

#define PUBLIC __attribute__((visibility("default")))
#define REAL(name) (__extension__(__typeof__(&name)) real(#name))

enum { DISK_BYTES = 256 << 20 };

extern char* program_invocation_short_name;
static int in_tool; /* 0 until the program runs: what its libraries do before is not the tool's doing */
static __thread int inside;

static void* real(const char* name) {
  void* found = dlsym(RTLD_NEXT, name);
  if (found == NULL) abort();
  return found;
}

__attribute__((constructor)) static void begin(void) {
  in_tool = strcmp(program_invocation_short_name, "remvol") == 0 && world_map() != NULL;
}

/* What one part of the C library calls in another is no call of the tool. */
static int due(enum fault_class class, const char* name, const char* subject) {
  if (!in_tool || inside) return 0;
  inside = 1;
  int failing = fault_due(class, name, subject == NULL ? "" : subject);
  inside = 0;
  if (!failing) return 0;
  struct world* world = world_map();
  if (world->faults.kind == KIND_KILL) syscall(SYS_kill, getpid(), SIGKILL);
  errno = class == FAULT_MEMORY ? ENOMEM : world->faults.error;
  return 1;
}

/* --- memory: the sanitizers have their own --- */

#ifndef SANITIZED

void* __libc_malloc(size_t size);
void* __libc_calloc(size_t count, size_t size);
void* __libc_realloc(void* block, size_t size);

PUBLIC void* malloc(size_t size) {
  return due(FAULT_MEMORY, "malloc", "") ? NULL : __libc_malloc(size);
}

PUBLIC void* calloc(size_t count, size_t size) {
  return due(FAULT_MEMORY, "calloc", "") ? NULL : __libc_calloc(count, size);
}

PUBLIC void* realloc(void* block, size_t size) {
  return due(FAULT_MEMORY, "realloc", "") ? NULL : __libc_realloc(block, size);
}

PUBLIC char* strdup(const char* text) {
  if (due(FAULT_MEMORY, "strdup", text)) return NULL;
  char* copy = __libc_malloc(strlen(text) + 1);
  return copy == NULL ? NULL : strcpy(copy, text);
}

#endif

/* --- calls of the C library --- */

#define CALL(type, failed, name, subject, parameters, arguments) \
  PUBLIC type name parameters {                                  \
    if (due(FAULT_CALL, #name, subject)) return failed;          \
    int outer = inside;                                          \
    inside = 1;                                                  \
    type returned = REAL(name) arguments;                        \
    inside = outer;                                              \
    return returned;                                             \
  }

CALL(FILE*, NULL, fdopen, "", (int fd, const char* mode), (fd, mode))
CALL(FILE*, NULL, setmntent, path, (const char* path, const char* mode), (path, mode))
CALL(DIR*, NULL, opendir, path, (const char* path), (path))
CALL(DIR*, NULL, fdopendir, "", (int fd), (fd))
CALL(struct dirent*, NULL, readdir, "", (DIR * folder), (folder))
CALL(ssize_t, -1, read, "", (int fd, void* data, size_t size), (fd, data, size))
CALL(ssize_t, -1, write, "", (int fd, const void* data, size_t size), (fd, data, size))
CALL(ssize_t, -1, pread, "", (int fd, void* data, size_t size, off_t at), (fd, data, size, at))
CALL(ssize_t, -1, readlink, path, (const char* path, char* to, size_t size), (path, to, size))
CALL(ssize_t, -1, readlinkat, path, (int fd, const char* path, char* to, size_t size), (fd, path, to, size))
CALL(int, -1, fsync, "", (int fd), (fd))
CALL(int, -1, syncfs, "", (int fd), (fd))
CALL(int, -1, lstat, path, (const char* path, struct stat* st), (path, st))
CALL(int, -1, fstat, "", (int fd, struct stat* st), (fd, st))
CALL(int, -1, fstatat, path, (int fd, const char* path, struct stat* st, int flags), (fd, path, st, flags))
CALL(int, -1, access, path, (const char* path, int mode), (path, mode))
CALL(int, -1, mkdir, path, (const char* path, mode_t mode), (path, mode))
CALL(int, -1, rename, from, (const char* from, const char* to), (from, to))
CALL(int, -1, unlink, path, (const char* path), (path))
CALL(int, -1, unlinkat, path, (int fd, const char* path, int flags), (fd, path, flags))
CALL(int, -1, rmdir, path, (const char* path), (path))
CALL(int, -1, mknod, path, (const char* path, mode_t mode, dev_t device), (path, mode, device))
CALL(int, -1, umount2, path, (const char* path, int flags), (path, flags))
CALL(int, -1, flock, "", (int fd, int operation), (fd, operation))
CALL(int, -1, fchmod, "", (int fd, mode_t mode), (fd, mode))
CALL(int, -1, socket, "", (int family, int type, int protocol), (family, type, protocol))
CALL(int, -1, connect, "", (int fd, __CONST_SOCKADDR_ARG to, socklen_t size), (fd, to, size))
CALL(ssize_t, -1, sendmsg, "", (int fd, const struct msghdr* message, int flags), (fd, message, flags))
CALL(ssize_t, -1, recvmsg, "", (int fd, struct msghdr* message, int flags), (fd, message, flags))
CALL(int, -1, setpgid, "", (pid_t pid, pid_t group), (pid, group))
CALL(pid_t, -1, fork, "", (void), ())
CALL(int, -1, semget, "", (key_t key, int count, int flags), (key, count, flags))
CALL(int, -1, semop, "", (int id, struct sembuf* what, size_t count), (id, what, count))
CALL(FILE*, NULL, popen, command, (const char* command, const char* mode), (command, mode))
CALL(int, EAI_MEMORY, getaddrinfo, node,
     (const char* node, const char* service, const struct addrinfo* hints, struct addrinfo** result),
     (node, service, hints, result))

/* The stream ends early, as a read error looks to one who reads lines. */
CALL(char*, NULL, fgets, "", (char* text, int size, FILE* stream), (text, size, stream))
char* __fgets_chk(char* text, size_t room, int size, FILE* stream);
CALL(char*, NULL, __fgets_chk, "", (char* text, size_t room, int size, FILE* stream),
     (text, room, size, stream))
CALL(ssize_t, -1, __getdelim, "", (char** text, size_t* size, int end, FILE* stream),
     (text, size, end, stream))
CALL(size_t, 0, fread, "", (void* data, size_t size, size_t count, FILE* stream), (data, size, count, stream))

/* --- a volume is memory here: to the tool it has the number of the disk that it is mounted from --- */

/* The disk in a line of the kernel's table, and where its number stands; 0 for another mount. */
static dev_t disk_of_line(const char* line, int* begin, int* end) {
  const char* source = strstr(line, " - tmpfs /dev/sd");
  *end = 0;
  if (source == NULL || sscanf(line, "%*d %*d %n%*d:%*d%n", begin, end) != 0 || *end == 0) return 0;
  return makedev(DISK_MAJOR, DISK_NUMBER(source[16]) + (source[17] == '1'));
}

static FILE* table_of_disks(FILE* table) {
  char line[8192];
  int begin;
  int end;
  FILE* made = fdopen(memfd_create("mountinfo", MFD_CLOEXEC), "w+");
  while (made != NULL && table != NULL && fgets(line, sizeof line, table) != NULL) {
    const dev_t disk = disk_of_line(line, &begin, &end);
    if (disk == 0) {
      fputs(line, made);
    } else {
      fprintf(made, "%.*s%u:%u%s", begin, line, major(disk), minor(disk), line + end);
    }
  }
  if (table != NULL) fclose(table);
  if (made != NULL) rewind(made);
  return made;
}

static void put_disk_number(struct stat* st) {
  char line[8192];
  int begin;
  int end;
  unsigned high;
  unsigned low;
  FILE* table = REAL(fopen)("/proc/self/mountinfo", "re");
  while (table != NULL && fgets(line, sizeof line, table) != NULL) {
    const dev_t disk = disk_of_line(line, &begin, &end);
    if (disk != 0 && sscanf(line + begin, "%u:%u", &high, &low) == 2 && makedev(high, low) == st->st_dev) {
      st->st_dev = disk;
      break;
    }
  }
  if (table != NULL) fclose(table);
}

PUBLIC int stat(const char* path, struct stat* st) {
  if (due(FAULT_CALL, "stat", path)) return -1;
  int outer = inside;
  inside = 1;
  int status = REAL(stat)(path, st);
  if (in_tool && !outer && status == 0 && strncmp(path, "/mnt/VV/", 8) == 0) put_disk_number(st);
  inside = outer;
  return status;
}

PUBLIC FILE* fopen(const char* path, const char* mode) {
  if (due(FAULT_CALL, "fopen", path)) return NULL;
  int outer = inside;
  inside = 1;
  FILE* stream = REAL(fopen)(path, mode);
  if (stream != NULL && in_tool && !outer && strcmp(path, "/proc/self/mountinfo") == 0)
    stream = table_of_disks(stream);
  inside = outer;
  return stream;
}

/* The stream is closed all the same. */
PUBLIC int pclose(FILE* stream) {
  int failing = due(FAULT_CALL, "pclose", "");
  int status = REAL(pclose)(stream);
  return failing ? -1 : status;
}

PUBLIC int fclose(FILE* stream) {
  int failing = due(FAULT_CALL, "fclose", "");
  int outer = inside;
  inside = 1;
  int status = REAL(fclose)(stream);
  inside = outer;
  return failing ? EOF : status;
}

#define OPEN(name, parameters, arguments)                                     \
  PUBLIC int name parameters {                                                \
    va_list list;                                                             \
    va_start(list, flags);                                                    \
    mode_t mode = flags & (O_CREAT | __O_TMPFILE) ? va_arg(list, mode_t) : 0; \
    va_end(list);                                                             \
    if (due(FAULT_CALL, #name, path)) return -1;                              \
    return REAL(name) arguments;                                              \
  }
OPEN(open, (const char* path, int flags, ...), (path, flags, mode))
OPEN(open64, (const char* path, int flags, ...), (path, flags, mode))
OPEN(openat, (int fd, const char* path, int flags, ...), (fd, path, flags, mode))
OPEN(openat64, (int fd, const char* path, int flags, ...), (fd, path, flags, mode))

#define LAST_POINTER(name, first, second, label) \
  PUBLIC int name(first a, second b, ...) {      \
    va_list list;                                \
    va_start(list, b);                           \
    void* last = va_arg(list, void*);            \
    va_end(list);                                \
    if (due(FAULT_CALL, label, "")) return -1;   \
    return REAL(name)(a, b, last);               \
  }
LAST_POINTER(fcntl, int, int, "fcntl")
LAST_POINTER(fcntl64, int, int, "fcntl")
LAST_POINTER(ioctl, int, unsigned long, "ioctl")

PUBLIC int semctl(int id, int number, int command, ...) {
  va_list list;
  va_start(list, command);
  void* last = va_arg(list, void*);
  va_end(list);
  if (due(FAULT_CALL, "semctl", "")) return -1;
  return REAL(semctl)(id, number, command, last);
}

/* --- time: a second, which is short here, is long enough for a daemon to start or to end --- */

enum { DAEMON_TRIES = 5000 }; /* one a millisecond */

static int is_listening(const char* path) {
  struct sockaddr_un to = {.sun_family = AF_UNIX};
  int fd = (int)syscall(SYS_socket, AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  snprintf(to.sun_path, sizeof to.sun_path, "%s", path);
  long status = syscall(SYS_connect, fd, &to, sizeof to);
  syscall(SYS_close, fd);
  return status == 0;
}

static void await_daemon(const char* command) {
  const struct timespec pause = {0, 1000000};
  char path[100];
  if (sscanf(command, "ktree -n config -s %99s", path) != 1) return;
  for (int i = 0; i < DAEMON_TRIES && !is_listening(path); i++)
    clock_nanosleep(CLOCK_MONOTONIC, 0, &pause, NULL);
}

PUBLIC int system(const char* command) {
  if (due(FAULT_CALL, "system", command)) return -1;
  int outer = inside;
  inside = 1;
  int status = REAL(system)(command);
  if (in_tool && command != NULL) await_daemon(command);
  inside = outer;
  return status;
}

PUBLIC int kill(pid_t pid, int number) {
  const struct timespec pause = {0, 1000000};
  if (due(FAULT_CALL, "kill", "")) return -1;
  int status = REAL(kill)(pid, number);
  for (int i = 0; in_tool && number == SIGTERM && i < DAEMON_TRIES && REAL(kill)(pid, 0) == 0; i++) {
    clock_nanosleep(CLOCK_MONOTONIC, 0, &pause, NULL);
  }
  return status;
}

static void nap(long long microseconds) {
  microseconds = microseconds * world_map()->pace / 5000;
  struct timespec time = {microseconds / 1000000, microseconds % 1000000 * 1000};
  if (microseconds > 0) clock_nanosleep(CLOCK_MONOTONIC, 0, &time, NULL);
}

PUBLIC unsigned sleep(unsigned seconds) {
  if (!in_tool) return REAL(sleep)(seconds);
  nap(seconds * 1000000LL);
  return 0;
}

PUBLIC int usleep(useconds_t microseconds) {
  if (!in_tool) return REAL(usleep)(microseconds);
  /* Whoever looks again and again waits for others, which are as slow as they are. */
  nap(10LL * microseconds);
  return 0;
}

/* --- the configuration tree --- */

int ktreec_set(const char* socket, unsigned flags, const char* path, const char* value);
int ktreec_get_wb(const char* socket, unsigned flags, const char* path, char* buffer, size_t size);
int ktreec_del(const char* socket, unsigned flags, const char* path);
int ktreec_dump(const char* socket, unsigned flags, const char* file);
int ktreec_load(const char* socket, unsigned flags, const char* file);

#define TREE_CALL(name, parameters, arguments)   \
  PUBLIC int name parameters {                   \
    if (due(FAULT_TREE, #name, path)) return -1; \
    return REAL(name) arguments;                 \
  }
TREE_CALL(ktreec_set, (const char* socket, unsigned flags, const char* path, const char* value),
          (socket, flags, path, value))
TREE_CALL(ktreec_get_wb, (const char* socket, unsigned flags, const char* path, char* buffer, size_t size),
          (socket, flags, path, buffer, size))
TREE_CALL(ktreec_del, (const char* socket, unsigned flags, const char* path), (socket, flags, path))
TREE_CALL(ktreec_dump, (const char* socket, unsigned flags, const char* path), (socket, flags, path))
TREE_CALL(ktreec_load, (const char* socket, unsigned flags, const char* path), (socket, flags, path))

/* --- the platform's utilities: disks as the world has them --- */

struct look {
  struct lun lun; /* as it was at the call */
  int target, number, partition;
};

static int look_at(const char* node, struct look* look) {
  int lock = world_lock();
  struct lun* lun = world_disk(world_map(), node, &look->target, &look->number, &look->partition);
  if (lun != NULL) look->lun = *lun;
  world_unlock(lock);
  if (lun == NULL) return 0;
  return !look->partition || look->lun.parts > 0;
}

/* A failing call of the platform is one that knows nothing. */
#define KNOWN(name, subject, look) (!due(FAULT_CALL, name, subject) && look_at(subject, look))

long long sys_get_disk_space(const char* format, ...) __attribute__((format(printf, 1, 2)));
PUBLIC long long sys_get_disk_space(const char* format, ...) {
  char path[4096];
  struct look look;
  va_list list;
  va_start(list, format);
  vsnprintf(path, sizeof path, format, list);
  va_end(list);
  return KNOWN("sys_get_disk_space", path, &look) ? DISK_BYTES : -1;
}

int sys_get_partition_list(char* out, const char* device);
PUBLIC int sys_get_partition_list(char* out, const char* device) {
  struct look look;
  out[0] = '\0';
  if (!KNOWN("sys_get_partition_list", device, &look) || look.lun.parts == 0) return 0;
  sprintf(out, "sd%c1", (char)look.lun.letter);
  return 1;
}

int sys_create_1_partition(const char* device);
PUBLIC int sys_create_1_partition(const char* device) {
  int target = 0;
  int number = 0;
  int partition = 0;
  int status = -1;
  if (due(FAULT_CALL, "sys_create_1_partition", device)) return -1;
  inside++;
  int lock = world_lock();
  struct lun* lun = world_disk(world_map(), device, &target, &number, &partition);
  if (lun != NULL && lun->parts == 0) {
    const char* run = getenv("TORTURE_RUN");
    int named = 0;
    if (run != NULL && sscanf(run, "%*[^:]:%*[^:]:%d", &named) == 1 && named != target &&
        strstr(run, ":recover:") == NULL) {
      world_log("V", "foreign-disk: partition on %s, which is LUN %d of t%d", device, number, target);
    }
    lun->parts = 1;
    sysfs_add_partition(lun);
    world_log("E", "partition %s t%d lun%d", device, target, number);
    status = 0;
  } else if (lun != NULL) {
    world_log("E", "partition of %s, which has one", device);
  }
  world_unlock(lock);
  inside--;
  return status;
}

int sys_expand_1_partition(const char* device);
PUBLIC int sys_expand_1_partition(const char* device) {
  return due(FAULT_CALL, "sys_expand_1_partition", device) ? -1 : 0;
}

long long sys_get_partition_size(const char* name);
PUBLIC long long sys_get_partition_size(const char* name) {
  struct look look;
  return KNOWN("sys_get_partition_size", name, &look) ? DISK_BYTES - (1 << 20) : -1;
}

int sys_check_dev(const char* node);
PUBLIC int sys_check_dev(const char* node) {
  struct look look;
  return KNOWN("sys_check_dev", node, &look) ? 0 : -1;
}

int sys_get_fs_type(char* out, const char* node);
PUBLIC int sys_get_fs_type(char* out, const char* node) {
  struct look look;
  out[0] = '\0';
  if (!KNOWN("sys_get_fs_type", node, &look) || look.lun.content != CONTENT_EXT4 || !look.partition)
    return -1;
  strcpy(out, "ext4");
  return 0;
}

int sys_check_fs_state(const char* node);
PUBLIC int sys_check_fs_state(const char* node) {
  return due(FAULT_CALL, "sys_check_fs_state", node);
}

int sys_mount_point(const char* path);
PUBLIC int sys_mount_point(const char* path) {
  return due(FAULT_CALL, "sys_mount_point", path) ? 0 : REAL(sys_mount_point)(path);
}

int sys_get_df_info(const char* path, unsigned long long* total, unsigned long long* used,
                    unsigned long long* available);
PUBLIC int sys_get_df_info(const char* path, unsigned long long* total, unsigned long long* used,
                           unsigned long long* available) {
  return due(FAULT_CALL, "sys_get_df_info", path) ? -1 : REAL(sys_get_df_info)(path, total, used, available);
}

int str_insert_back_slash(char* out, size_t size, const char* text);
PUBLIC int str_insert_back_slash(char* out, size_t size, const char* text) {
  if (!due(FAULT_CALL, "str_insert_back_slash", text)) return REAL(str_insert_back_slash)(out, size, text);
  if (size > 0) out[0] = '\0';
  return -1;
}

int sys_hostname(char* out, size_t size);
PUBLIC int sys_hostname(char* out, size_t size) {
  return due(FAULT_CALL, "sys_hostname", "") ? -1 : REAL(sys_hostname)(out, size);
}

int sys_get_mac_addr(const char* interface, unsigned char mac[6]);
PUBLIC int sys_get_mac_addr(const char* interface, unsigned char mac[6]) {
  static const unsigned char made_up[6] = {0x02, 0, 0, 0x1b, 0x2c, 0x3d};
  if (due(FAULT_CALL, "sys_get_mac_addr", interface)) return -1;
  memcpy(mac, made_up, sizeof made_up);
  return 0;
}

int LIB_Get_Lan_Link_Speed(int port);
PUBLIC int LIB_Get_Lan_Link_Speed(int port) {
  return due(FAULT_CALL, "LIB_Get_Lan_Link_Speed", "") ? 0 : port == 0 ? 1000 : 0;
}
