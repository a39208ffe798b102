#include "world.h"

#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

/* The preload library counts the calls of the C library: what is done here must not be among them. */
static int raw_open(const char* path, int flags) {
  return (int)syscall(SYS_openat, AT_FDCWD, path, flags | O_CLOEXEC, 0666);
}

/* As early as can be: a fault below the C library (--system-calls) would take this world for the tool. */
__attribute__((constructor)) static void map_early(void) {
  world_map();
}

struct world* world_map(void) {
  static struct world* world;
  if (world != NULL) return world;
  int fd = raw_open("/fake/world/state", O_RDWR);
  if (fd < 0) return NULL;
  void* map = (void*)syscall(SYS_mmap, NULL, sizeof *world, PROT_READ | PROT_WRITE, MAP_SHARED, (long)fd, 0L);
  syscall(SYS_close, fd);
  if (map != MAP_FAILED) world = map;
  return world;
}

int world_lock(void) {
  int fd = raw_open("/fake/world/lock", O_RDWR | O_CREAT);
  while (syscall(SYS_flock, fd, LOCK_EX) != 0 && errno == EINTR) {
  }
  return fd; /* without the lock where it cannot be had: nobody meets anybody then, but for a fault */
}

void world_unlock(int lock) {
  syscall(SYS_close, lock);
}

struct lun* world_disk(struct world* world, const char* node, int* target, int* number, int* partition) {
  if (strncmp(node, "/dev/", 5) == 0) node += 5;
  if (strncmp(node, "sd", 2) != 0 || node[2] < FIRST_LETTER || node[2] > LAST_LETTER) return NULL;
  if (node[3] != '\0' && strcmp(node + 3, "1") != 0) return NULL;
  for (int t = 1; t <= TARGETS; t++) {
    for (int l = 0; l < LUNS; l++) {
      struct lun* lun = &world->targets[t].luns[l];
      if (lun->letter != node[2]) continue;
      *target = t;
      *number = l;
      *partition = node[3] == '1';
      return lun;
    }
  }
  return NULL;
}

static void append(const char* path, const char* text, size_t size) {
  int fd = raw_open(path, O_WRONLY | O_APPEND | O_CREAT);
  syscall(SYS_write, fd, text, size);
  syscall(SYS_close, fd);
}

void world_log(const char* kind, const char* format, ...) {
  char text[2048];
  struct timespec now;
  va_list list;
  const char* run = getenv("TORTURE_RUN");
  clock_gettime(CLOCK_MONOTONIC, &now);
  int size = snprintf(text, sizeof text, "%s\t%lld\t%s\t", kind, now.tv_sec * 1000LL + now.tv_nsec / 1000000,
                      run == NULL ? "" : run);
  va_start(list, format);
  size += vsnprintf(text + size, sizeof text - (size_t)size - 2, format, list);
  va_end(list);
  if (size > (int)sizeof text - 2) size = (int)sizeof text - 2;
  text[size++] = '\n';
  append("/fake/world/log", text, (size_t)size);
}

int fault_due(enum fault_class class, const char* name, const char* subject) {
  struct world* world = world_map();
  if (world == NULL || !world->faults.active) return 0;
  struct faults* faults = &world->faults;
  int number = __atomic_add_fetch(&faults->count[class], 1, __ATOMIC_SEQ_CST);
  if (faults->traced) {
    char text[512];
    int size = snprintf(text, sizeof text - 1, "%d\t%d\t%s\t%s\n", (int)class, number, name, subject);
    if (size > (int)sizeof text - 2) size = (int)sizeof text - 2;
    append("/fake/world/calls", text, (size_t)size);
  }
  if (faults->index == 0 || faults->class != (int)class || number < faults->index) return 0;
  if (number > faults->index && !faults->forever) return 0;
  faults->fired++;
  return 1;
}

/* Octal escapes as the kernel writes them. */
static void unescape(char* text) {
  char* to = text;
  for (char* from = text; *from != '\0'; to++) {
    if (from[0] == '\\' && from[1] >= '0' && from[1] <= '3') {
      *to = (char)((from[1] - '0') * 64 + (from[2] - '0') * 8 + (from[3] - '0'));
      from += 4;
    } else {
      *to = *from++;
    }
  }
  *to = '\0';
}

int world_mounted(const char* node, char* where, unsigned size) {
  char line[4096];
  int found = 0;
  FILE* table = fopen("/proc/self/mountinfo", "re");
  while (table != NULL && !found && fgets(line, sizeof line, table) != NULL) {
    char point[2048] = "";
    char source[1024] = "";
    char* dash = strstr(line, " - ");
    if (dash == NULL || sscanf(line, "%*s %*s %*s %*s %2047s", point) != 1) continue;
    if (sscanf(dash + 3, "%*s %1023s", source) != 1 || strcmp(source, node) != 0) continue;
    unescape(point);
    snprintf(where, size, "%s", point);
    found = 1;
  }
  if (table != NULL) fclose(table);
  return found;
}
