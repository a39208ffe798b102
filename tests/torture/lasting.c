#include "lasting.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/fs.h>
#include <linux/mount.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/sem.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

enum { DEEPEST = 16 };

/* The layer of the root file system that took every change, and what is mounted above it. */
static const char* const places[] = {"/fake/upper", "/run", "/tmp", "/mnt", "/root", "/dev"};

static int failed;

static int ends_with(const char* text, const char* end) {
  size_t length = strlen(text);
  size_t size = strlen(end);
  return length >= size && strcmp(text + length - size, end) == 0;
}

static void show_content(int folder, const char* name) {
  char data[65536];
  ssize_t size;
  int fd = openat(folder, name, O_RDONLY | O_NOFOLLOW | O_CLOEXEC);
  if (fd < 0) failed = 1;
  while (fd >= 0 && (size = read(fd, data, sizeof data)) > 0) fwrite(data, 1, (size_t)size, stdout);
  if (fd >= 0) close(fd);
}

static unsigned flags_of(int folder, const char* name) {
  int flags = 0;
  int fd = openat(folder, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
  if (fd >= 0 && ioctl(fd, FS_IOC_GETFLAGS, &flags) != 0) flags = 0;
  if (fd >= 0) close(fd);
  return (unsigned)flags;
}

static int by_name(const struct dirent** one, const struct dirent** two) {
  return strcmp((*one)->d_name, (*two)->d_name);
}

static void show_folder(int folder, int depth);

static void show_entry(int folder, const char* name, int depth) {
  struct stat st;
  char to[4096];
  if (fstatat(folder, name, &st, AT_SYMLINK_NOFOLLOW) != 0) {
    failed = 1;
    return;
  }
  printf("%*s%s %o %u %u", depth, "", name, st.st_mode, st.st_uid, st.st_gid);
  if (S_ISREG(st.st_mode) || S_ISDIR(st.st_mode)) printf(" flags %x", flags_of(folder, name));
  if (S_ISBLK(st.st_mode) || S_ISCHR(st.st_mode)) printf(" device %lx", (unsigned long)st.st_rdev);
  if (S_ISLNK(st.st_mode)) {
    ssize_t size = readlinkat(folder, name, to, sizeof to - 1);
    printf(" to %.*s", (int)(size < 0 ? 0 : size), to);
  }
  putchar('\n');
  if (S_ISREG(st.st_mode) && !ends_with(name, ".pid")) show_content(folder, name);
  if (!S_ISDIR(st.st_mode)) return;
  int inner = openat(folder, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  if (inner < 0) failed = 1;
  if (inner >= 0) show_folder(inner, depth + 1);
}

/* Takes the descriptor. */
static void show_folder(int folder, int depth) {
  struct dirent** entries = NULL;
  int count = depth > DEEPEST ? -1 : scandirat(folder, ".", &entries, NULL, by_name);
  if (count < 0) failed = 1;
  for (int i = 0; i < count; i++) {
    const char* name = entries[i]->d_name;
    int own = strcmp(name, ".") == 0 || strcmp(name, "..") == 0 || (depth == 0 && strcmp(name, "fake") == 0);
    if (!own) show_entry(folder, name, depth);
    free(entries[i]);
  }
  free(entries);
  close(folder);
}

/* The file system at the point alone, without what is mounted inside it. */
static void show_place(const char* point) {
  int tree = (int)syscall(SYS_open_tree, AT_FDCWD, point, OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC);
  int folder = tree < 0 ? -1 : openat(tree, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (tree >= 0) close(tree);
  printf("place %s\n", point);
  if (folder < 0) {
    failed = 1;
    return;
  }
  show_folder(folder, 0);
}

/* Point, options and source of every mount below /mnt; the numbers that differ from box to box are left out.
 */
static void show_mounts(void) {
  char line[4096];
  char point[2048];
  FILE* table = fopen("/proc/self/mountinfo", "re");
  if (table == NULL) failed = 1;
  while (table != NULL && fgets(line, sizeof line, table) != NULL) {
    int at = 0;
    if (sscanf(line, "%*s %*s %*s %*s %2047s%n", point, &at) != 1 || strncmp(point, "/mnt/", 5) != 0)
      continue;
    printf("mount %s%s", point, line + at);
    show_place(point);
  }
  if (table != NULL) fclose(table);
}

static void show_semaphores(void) {
  char line[512];
  FILE* table = fopen("/proc/sysvipc/sem", "re");
  if (table == NULL) failed = 1;
  while (table != NULL && fgets(line, sizeof line, table) != NULL) {
    int key;
    int id;
    unsigned mode;
    int count;
    if (sscanf(line, "%d %d %o %d", &key, &id, &mode, &count) != 4) continue;
    printf("semaphore %d %o %d:", key, mode, count);
    for (int i = 0; i < count; i++) printf(" %d", semctl(id, i, GETVAL));
    putchar('\n');
  }
  if (table != NULL) fclose(table);
}

int lasting_show(void) {
  for (size_t i = 0; i < sizeof places / sizeof *places; i++) show_place(places[i]);
  show_mounts();
  show_semaphores();
  return failed;
}
