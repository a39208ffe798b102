#include "sysfs.h"

#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/wait.h>
#include <unistd.h>

#define SESSION "/sys/devices/platform/host%d/session%d"

static void folders(char* path) {
  for (char* slash = strchr(path + 1, '/'); slash != NULL; slash = strchr(slash + 1, '/')) {
    *slash = '\0';
    mkdir(path, 0755);
    *slash = '/';
  }
}

__attribute__((format(printf, 2, 3))) static void put(const char* text, const char* format, ...) {
  char path[512];
  va_list list;
  va_start(list, format);
  vsnprintf(path, sizeof path, format, list);
  va_end(list);
  folders(path);
  FILE* file = fopen(path, "we");
  if (file == NULL) return;
  fputs(text, file);
  fclose(file);
}

static void point(const char* link, const char* to) {
  char path[512];
  snprintf(path, sizeof path, "%s", link);
  folders(path);
  unlink(path);
  if (symlink(to, path) != 0) perror(path);
}

static void node(const char* name, int partition) {
  char path[64];
  mode_t mask = umask(0);
  snprintf(path, sizeof path, "/dev/%s%s", name, partition ? "1" : "");
  unlink(path);
  mknod(path, S_IFBLK | 0660, makedev(DISK_MAJOR, DISK_NUMBER(name[2]) + (partition ? 1 : 0)));
  umask(mask);
}

static void name_of(const struct lun* lun, char name[4]) {
  snprintf(name, 4, "sd%c", (char)lun->letter);
}

void sysfs_add(int target, int number, const struct lun* lun, int session) {
  char name[4];
  char place[256];
  char text[512];
  name_of(lun, name);
  snprintf(text, sizeof text, NAME_BASE "%d\n", target);
  put(text, SESSION "/iscsi_session/session%d/targetname", session, session, session);
  put("LOGGED_IN\n", SESSION "/iscsi_session/session%d/state", session, session, session);
  snprintf(text, sizeof text, "/sys/class/iscsi_session/session%d", session);
  snprintf(place, sizeof place, "../../devices/platform/host%d/session%d/iscsi_session/session%d", session,
           session, session);
  point(text, place);
  snprintf(place, sizeof place, "/sys/devices/platform/host%d/session%d/target%d:0:0/%d:0:0:%d", session,
           session, session, session, number);
  put("running\n", "%s/state", place);
  snprintf(text, sizeof text, "%d:%u\n", DISK_MAJOR, DISK_NUMBER(name[2]));
  put(text, "%s/block/%s/dev", place, name);
  put("524288\n", "%s/block/%s/size", place, name);
  snprintf(text, sizeof text, "%s/block/%s/device", place, name);
  char back[64];
  snprintf(back, sizeof back, "../../../%d:0:0:%d", session, number);
  point(text, back);
  char link[64];
  snprintf(text, sizeof text, "..%s/block/%s", place + 4, name);
  snprintf(link, sizeof link, "/sys/block/%s", name);
  point(link, text);
  snprintf(text, sizeof text, "../..%s/block/%s", place + 4, name);
  snprintf(link, sizeof link, "/sys/class/block/%s", name);
  point(link, text);
  node(name, 0);
  if (lun->parts > 0) sysfs_add_partition(lun);
}

void sysfs_add_partition(const struct lun* lun) {
  char name[4];
  char text[64];
  char link[64];
  name_of(lun, name);
  snprintf(text, sizeof text, "%d:%u\n", DISK_MAJOR, DISK_NUMBER(name[2]) + 1);
  put(text, "/sys/block/%s/%s1/dev", name, name);
  put("1\n", "/sys/block/%s/%s1/partition", name, name);
  put("522240\n", "/sys/block/%s/%s1/size", name, name);
  snprintf(text, sizeof text, "../../block/%s/%s1", name, name);
  snprintf(link, sizeof link, "/sys/class/block/%s1", name);
  point(link, text);
  node(name, 1);
}

static void remove_all(const char* path) {
  pid_t pid = fork();
  if (pid == 0) {
    execl("/bin/rm", "rm", "-rf", path, (char*)NULL);
    _exit(127);
  }
  waitpid(pid, NULL, 0);
}

void sysfs_remove(const struct lun* lun) {
  char name[4];
  char path[64];
  static const char* const places[] = {"/sys/block/", "/sys/class/block/", "/dev/"};
  name_of(lun, name);
  for (int i = 0; i < 3; i++) {
    for (int part = 0; part < 2; part++) {
      snprintf(path, sizeof path, "%s%s%s", places[i], name, part ? "1" : "");
      unlink(path);
    }
  }
}

void sysfs_remove_session(int session) {
  char path[128];
  snprintf(path, sizeof path, "/sys/class/iscsi_session/session%d", session);
  unlink(path);
  snprintf(path, sizeof path, "/sys/devices/platform/host%d", session);
  remove_all(path);
}
