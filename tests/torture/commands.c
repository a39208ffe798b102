/* The external commands of a torture, one program under many names: they keep the state of world.h, take a
 * realistic little time, and write into the log what they did. What must never happen is logged as a
 * violation, whoever asked for it. */
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <linux/mount.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mount.h>
#include <sys/sem.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <time.h>
#include <unistd.h>

#include "lasting.h"
#include "sysfs.h"
#include "world.h"

enum { DISK_BYTES = 256 << 20 };

static struct world* world;
static int muted; /* a fault: it is done, but nothing is printed */

static void nap(int milliseconds) {
  long long wait = 1000LL * milliseconds * world->pace / 100;
  struct timespec time = {wait / 1000000, wait % 1000000 * 1000};
  if (wait > 0) clock_nanosleep(CLOCK_MONOTONIC, 0, &time, NULL);
}

static int some(int least, int most) {
  struct timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return least + (int)((now.tv_nsec / 1000 ^ getpid() * 7919) % (most - least + 1));
}

/* --- what a run may touch: its TORTURE_RUN is "NUMBER:COMMAND:TARGET:LUN", "-" for one that it did not name
 * --- */

struct run {
  char command[32];
  int target; /* 0: any */
  int lun;    /* -1: any */
};

static struct run whose_run(void) {
  struct run run = {"", 0, -1};
  const char* text = getenv("TORTURE_RUN");
  char target[16] = "-";
  char lun[16] = "-";
  if (text != NULL) sscanf(text, "%*[^:]:%31[^:]:%15[^:]:%15s", run.command, target, lun);
  if (target[0] != '-') run.target = atoi(target);
  if (lun[0] != '-') run.lun = atoi(lun);
  return run;
}

static int is_one_of(const char* word, const char* list) {
  char padded[64];
  snprintf(padded, sizeof padded, " %s ", word);
  return strstr(list, padded) != NULL;
}

/* Whether the run's own arguments cover the LUN at all. */
static int covers(const struct run* run, int target, int number) {
  if (run->command[0] == '\0') return 1; /* the torture itself */
  if (run->target != 0 && run->target != target && !is_one_of(run->command, " recover status init "))
    return 0;
  /* An add brings only its own LUN, a format and a deletion of a LUN touch nothing else. */
  return run->lun < 0 || run->lun == number || !is_one_of(run->command, " add format del_lun ");
}

/* What is about to be overwritten: does anybody want that? */
static void judge_overwriting(const char* what, const char* node, struct lun* lun, int target, int number) {
  struct run run = whose_run();
  char where[2048];
  if (!covers(&run, target, number)) {
    world_log("V", "foreign-disk: %s of %s, which is LUN %d of t%d", what, node, number, target);
  }
  if (is_one_of(run.command, " status check_share_name disconnect del del_lun deinit system_off reopen ")) {
    world_log("V", "not-its-work: %s of %s by a %s", what, node, run.command);
  }
  if (world_mounted(node, where, sizeof where)) {
    world_log("V", "mounted-disk: %s of %s (LUN %d of t%d), mounted at %s", what, node, number, target,
              where);
  }
  if (lun->content == CONTENT_EXT4 && run.command[0] != '\0' && strcmp(run.command, "format") != 0) {
    world_log("V", "data-lost: %s of %s (LUN %d of t%d) with data %d", what, node, number, target,
              lun->stamp);
  }
  if (lun->opener != 0 && kill(lun->opener, 0) == 0) {
    world_log("V", "two-at-once: %s of %s while process %d writes to it", what, node, lun->opener);
  }
  world_log("E", "%s %s t%d lun%d content=%d stamp=%d", what, node, target, number, lun->content, lun->stamp);
}

/* --- the initiator --- */

static const char* option(char** argv, const char* name) {
  for (; *argv != NULL; argv++) {
    if (strcmp(*argv, name) == 0 && argv[1] != NULL) return argv[1];
  }
  return NULL;
}

static int has(char** argv, const char* word) {
  for (; *argv != NULL; argv++) {
    if (strcmp(*argv, word) == 0) return 1;
  }
  return 0;
}

static int target_number(char** argv) {
  const char* name = option(argv, "-T");
  int number = 0;
  if (name == NULL || sscanf(name, NAME_BASE "%d", &number) != 1) return 0;
  return number < 1 || number > TARGETS ? 0 : number;
}

static int any_session(void) {
  for (int t = 1; t <= TARGETS; t++) {
    if (world->targets[t].online) return 1;
  }
  return 0;
}

static int list_sessions(int details) {
  if (!any_session()) {
    fprintf(stderr, "iscsiadm: No active sessions.\n");
    return 21;
  }
  if (muted) return 0;
  if (details) printf("iSCSI Transport Class version 2.0-870\nversion 2.1.8\n");
  for (int t = 1; t <= TARGETS; t++) {
    struct target* target = &world->targets[t];
    if (!target->online) continue;
    if (!details) {
      printf("tcp: [%d] 10.9.0.%d:3260,1 " NAME_BASE "%d (non-flash)\n", target->session, t, t);
      continue;
    }
    printf("Target: " NAME_BASE
           "%d (non-flash)\n\tCurrent Portal: 10.9.0.%d:3260,1\n"
           "\tPersistent Portal: 10.9.0.%d:3260,1\n\t\tSID: %d\n\t\tiSCSI Connection State: LOGGED IN\n"
           "\t\tiSCSI Session State: LOGGED_IN\n\t\tInternal iscsid Session State: NO CHANGE\n"
           "\t\tHost Number: %d\tState: running\n",
           t, t, t, target->session, target->session);
    for (int l = 0; l < LUNS; l++) {
      if (!target->luns[l].offered) continue;
      printf("\t\tscsi%d Channel 00 Id 0 Lun: %d\n", target->session, l);
      if (target->luns[l].letter != 0) {
        printf("\t\t\tAttached scsi disk sd%c\t\tState: running\n", target->luns[l].letter);
      }
    }
  }
  return 0;
}

static int letter_in_use(int letter) {
  char node[32];
  char where[2048];
  for (int t = 1; t <= TARGETS; t++) {
    for (int l = 0; l < LUNS; l++) {
      if (world->targets[t].luns[l].letter == letter) return 1;
    }
  }
  snprintf(node, sizeof node, "/dev/sd%c1", letter);
  return world_mounted(node, where, sizeof where);
}

static int log_in(int t) {
  struct target* target = &world->targets[t];
  if (t == 0 || !target->record) {
    fprintf(stderr, "iscsiadm: No records found\n");
    return 21;
  }
  if (target->online) {
    fprintf(stderr, "iscsiadm: default: 1 session requested, but 1 already present.\n");
    return 15;
  }
  if (target->secrets != HAS_BOTH) {
    fprintf(stderr,
            "iscsiadm: initiator reported error (24 - iSCSI login failed due to authorization failure)\n");
    return 24;
  }
  target->online = 1;
  target->session = ++world->sessions;
  for (int l = 0; l < LUNS; l++) {
    if (!target->luns[l].offered) continue;
    int letter = FIRST_LETTER;
    while (letter < LAST_LETTER && letter_in_use(letter)) letter++;
    target->luns[l].letter = letter;
    sysfs_add(t, l, &target->luns[l], target->session);
  }
  world_log("E", "login t%d", t);
  if (!muted)
    printf("Login to [iface: default, target: " NAME_BASE "%d, portal: 10.9.0.%d,3260] successful.\n", t, t);
  return 0;
}

static int log_out(int t) {
  struct target* target = &world->targets[t];
  struct run run = whose_run();
  if (t == 0 || !target->online) {
    fprintf(stderr, "iscsiadm: No matching sessions found\n");
    return 21;
  }
  if (!covers(&run, t, run.lun)) world_log("V", "foreign-session: logout of t%d", t);
  for (int l = 0; l < LUNS; l++) {
    struct lun* lun = &target->luns[l];
    char node[32];
    char where[2048];
    if (lun->letter == 0) continue;
    snprintf(node, sizeof node, "/dev/sd%c1", lun->letter);
    if (world_mounted(node, where, sizeof where)) {
      world_log("V", "pulled: logout of t%d while %s is mounted at %s", t, node, where);
    }
    sysfs_remove(lun);
    lun->letter = 0;
    if (lun->opener != 0) world_log("E", "disk of t%d lun%d goes while it is written", t, l);
  }
  sysfs_remove_session(target->session);
  target->online = 0;
  world_log("E", "logout t%d", t);
  return 0;
}

static int log_out_all(void) {
  if (!any_session()) return 21;
  for (int t = 1; t <= TARGETS; t++) {
    if (world->targets[t].online) log_out(t);
  }
  return 0;
}

/* One of the record's secrets is set, the first or, with something behind it, a later one: another target's
   is a violation, an empty one does not let in. */
static void set_secret(int t, int which, const char* what, const char* value) {
  char wanted[64];
  snprintf(wanted, sizeof wanted, which == HAS_USER ? "user%d" : "secret%dsecret%d", t, t);
  int right = strncmp(value, wanted, strlen(wanted)) == 0;
  if (!right && value[0] != '\0') world_log("V", "foreign-value: %s %s for t%d", what, value, t);
  world->targets[t].secrets &= ~which;
  if (right) world->targets[t].secrets |= which;
}

static int update_record(int t, char** argv) {
  const char* value = option(argv, "-v");
  if (!world->targets[t].record) return 21;
  if (value == NULL) return 7;
  if (has(argv, "node.session.auth.username")) set_secret(t, HAS_USER, "user", value);
  if (has(argv, "node.session.auth.password")) set_secret(t, HAS_SECRET, "secret", value);
  return 0;
}

static int node_record(char** argv) {
  int t = target_number(argv);
  const char* operation = option(argv, "-o");
  struct run run = whose_run();
  if (t == 0) return 7;
  if (!covers(&run, t, run.lun)) world_log("V", "foreign-record: -o %s of t%d", operation, t);
  if (strcmp(operation, "new") == 0) {
    world->targets[t].record = 1;
    world->targets[t].secrets = 0;
  }
  if (strcmp(operation, "update") == 0) return update_record(t, argv);
  if (strcmp(operation, "delete") != 0) return 0;
  if (world->targets[t].online) return 15;
  if (!world->targets[t].record) return 21;
  world->targets[t].record = 0;
  return 0;
}

/* A portal offers every target with a LUN; a record is made for those that have none. */
static int discover(char** argv) {
  const char* portal = option(argv, "-p");
  if (portal == NULL) return 7;
  for (int t = 1; t <= TARGETS; t++) {
    struct target* target = &world->targets[t];
    if (!target->luns[0].offered) continue;
    target->record = 1;
    if (!muted) printf("%s,1 " NAME_BASE "%d\n", portal, t);
  }
  return 0;
}

static int do_iscsiadm(char** argv) {
  const char* mode = option(argv, "-m");
  int login = has(argv, "--login");
  nap(login ? some(10, 40) : some(2, 8));
  int lock = world_lock();
  int status = 7;
  if (mode == NULL) {
  } else if (strcmp(mode, "session") == 0) {
    status = list_sessions(has(argv, "-P3") || has(argv, "-P"));
  } else if (strcmp(mode, "iface") == 0) {
    status = 0;
  } else if (strcmp(mode, "discovery") == 0) {
    status = discover(argv);
  } else if (login) {
    status = log_in(target_number(argv));
  } else if (has(argv, "--logout")) {
    /* An empty name is every session's. */
    const char* name = option(argv, "-T");
    status = name != NULL && name[0] == '\0' ? log_out_all() : log_out(target_number(argv));
  } else if (has(argv, "-u")) {
    status = log_out_all();
  } else if (option(argv, "-o") != NULL) {
    status = node_record(argv);
  }
  world_unlock(lock);
  if (login) nap(some(2, 15));
  return status;
}

/* --- disks --- */

/* The last argument, or what follows "of=". */
static const char* node_of(char** argv) {
  const char* node = "";
  for (; *argv != NULL; argv++) {
    if (strncmp(*argv, "of=", 3) == 0) return *argv + 3;
    node = *argv;
  }
  return node;
}

static struct lun* begin_writing(const char* what, const char* node, int* target, int* number) {
  int partition = 0;
  int lock = world_lock();
  struct lun* lun = world_disk(world, node, target, number, &partition);
  if (lun == NULL || !partition || lun->parts == 0) {
    world_log("E", "%s of %s, which is not there", what, node);
    lun = NULL;
  } else {
    judge_overwriting(what, node, lun, *target, *number);
    lun->content = CONTENT_TORN;
    lun->stamp = 0;
    lun->opener = getpid();
  }
  world_unlock(lock);
  return lun;
}

static int end_writing(const char* what, const char* node, struct lun* lun, int content) {
  int target = 0;
  int number = 0;
  int partition = 0;
  char where[2048];
  int lock = world_lock();
  int there = world_disk(world, node, &target, &number, &partition) == lun;
  if (there && world_mounted(node, where, sizeof where)) {
    world_log("V", "mounted-disk: %s of %s ends, mounted at %s", what, node, where);
  }
  if (there) lun->content = content;
  if (there && content == CONTENT_EXT4) lun->stamp = ++world->stamps;
  if (lun->opener == getpid()) lun->opener = 0;
  if (there) world_log("E", "%s %s done stamp=%d", what, node, lun->stamp);
  world_unlock(lock);
  return there ? 0 : 1;
}

static int do_dd(char** argv) {
  int target;
  int number;
  struct lun* lun = begin_writing("dd", node_of(argv), &target, &number);
  if (lun == NULL) return 1;
  nap(some(2, 8));
  return end_writing("dd", node_of(argv), lun, CONTENT_TORN);
}

static void redraw(int done, int all) {
  char text[32];
  int length = snprintf(text, sizeof text, "%d/%d", done, all);
  printf("%s", text);
  for (int i = 0; i < length; i++) putchar('\b');
  fflush(stdout);
}

static int do_mke2fs(char** argv) {
  int target;
  int number;
  struct lun* lun = begin_writing("mke2fs", node_of(argv), &target, &number);
  if (lun == NULL) return 1;
  if (!muted) printf("Allocating group tables: ");
  for (int i = 0; i < 6 && !muted; i++) redraw(i, 6);
  nap(some(10, 40));
  if (!muted) printf("done   \nWriting inode tables: ");
  for (int i = 0; i < 6; i++) {
    if (!muted) redraw(i, 6);
    nap(some(2, 10));
  }
  if (!muted) printf("done   \n");
  return end_writing("mke2fs", node_of(argv), lun, CONTENT_EXT4);
}

/* The processes that use a disk are the ones that write to it; a mounted volume has no users here. */
static int do_fuser(char** argv) {
  struct run run = whose_run();
  const char* subject = node_of(argv);
  int target = 0;
  int number = 0;
  int partition = 0;
  int found = 0;
  struct stat st;
  nap(some(2, 6));
  int lock = world_lock();
  struct lun* lun = world_disk(world, subject, &target, &number, &partition);
  if (lun != NULL) {
    if (!covers(&run, target, number)) {
      world_log("V", "foreign-disk: fuser -mk %s, which is LUN %d of t%d", subject, number, target);
    }
    if (lun->opener != 0 && kill(lun->opener, SIGKILL) == 0) {
      world_log("E", "fuser ends process %d on %s", lun->opener, subject);
      found = 1;
    }
    lun->opener = 0;
  } else if (strncmp(subject, "/mnt/", 5) == 0 && stat(subject, &st) == 0) {
    struct stat above;
    if (stat("/mnt", &above) == 0 && above.st_dev == st.st_dev) {
      world_log("V", "root-users: fuser -mk %s, where nothing is mounted", subject);
    }
  }
  world_unlock(lock);
  return found ? 0 : 1;
}

static void write_mark(const char* point, int target, int number, int stamp) {
  char path[4096];
  snprintf(path, sizeof path, "%s/.data", point);
  FILE* file = fopen(path, "we");
  if (file == NULL) return;
  fprintf(file, "%d %d %d\n", target, number, stamp);
  fclose(file);
}

static int do_mount(char** argv) {
  size_t count = 0;
  while (argv[count] != NULL) count++;
  const char* point = argv[count - 1];
  const char* node = count > 1 ? argv[count - 2] : "";
  int target = 0;
  int number = 0;
  int partition = 0;
  int status = 32;
  char where[2048];
  nap(some(3, 10));
  if (has(argv, "remount")) return 0;
  struct run run = whose_run();
  int lock = world_lock();
  struct lun* lun = world_disk(world, node, &target, &number, &partition);
  if (lun != NULL && partition && lun->content == CONTENT_EXT4) {
    if (!covers(&run, target, number))
      world_log("V", "foreign-disk: mount of %s, LUN %d of t%d", node, number, target);
    if (lun->opener != 0 && kill(lun->opener, 0) == 0)
      world_log("V", "mounted-disk: mount of %s while it is written", node);
    if (world_mounted(node, where, sizeof where)) {
      if (strcmp(where, point) != 0) world_log("V", "mounted-twice: %s at %s and %s", node, where, point);
    } else if (mount(node, point, "tmpfs", 0, "size=64k") == 0) {
      write_mark(point, target, number, lun->stamp);
      world_log("E", "mount %s at %s t%d lun%d stamp=%d", node, point, target, number, lun->stamp);
      status = 0;
    }
  }
  world_unlock(lock);
  return status;
}

/* Whether the topmost mount at the point is one of a disk. */
static int shows_disk(const char* point) {
  char line[4096];
  int disk = 0;
  FILE* table = fopen("/proc/self/mounts", "re");
  while (table != NULL && fgets(line, sizeof line, table) != NULL) {
    char source[1024];
    char where[2048];
    if (sscanf(line, "%1023s %2047s", source, where) == 2 && strcmp(where, point) == 0) {
      disk = strncmp(source, "/dev/sd", 7) == 0;
    }
  }
  if (table != NULL) fclose(table);
  return disk;
}

static int do_umount(char** argv) {
  const char* point = node_of(argv);
  struct run run = whose_run();
  char path[4096];
  int target = 0;
  int number = 0;
  int stamp = 0;
  nap(some(3, 10));
  int lock = world_lock();
  snprintf(path, sizeof path, "%s/.data", point);
  FILE* mark = fopen(path, "re");
  if (mark != NULL) {
    if (fscanf(mark, "%d %d %d", &target, &number, &stamp) != 3) target = 0;
    fclose(mark);
  }
  int volume = shows_disk(point);
  int status = umount2(point, 0) == 0 ? 0 : 32;
  if (status == 0 && volume) {
    world_log("E", "umount %s t%d lun%d stamp=%d", point, target, number, stamp);
    if (target == 0) {
      world_log("V", "files-lost: the files of the volume at %s were gone before it was unmounted", point);
    } else if (!covers(&run, target, number)) {
      world_log("V", "foreign-disk: umount of %s, LUN %d of t%d", point, number, target);
    }
  }
  world_unlock(lock);
  return status;
}

/* --- the rest --- */

static int do_ps(void) {
  DIR* folder = opendir("/proc");
  struct dirent* entry;
  while (folder != NULL && (entry = readdir(folder)) != NULL) {
    char path[512];
    char text[4096];
    snprintf(path, sizeof path, "/proc/%s/cmdline", entry->d_name);
    FILE* file = atoi(entry->d_name) > 0 ? fopen(path, "re") : NULL;
    if (file == NULL) continue;
    size_t size = fread(text, 1, sizeof text - 1, file);
    fclose(file);
    text[size] = '\0';
    for (size_t i = 0; i + 1 < size; i++) {
      if (text[i] == '\0') text[i] = ' ';
    }
    if (!muted) printf("%5s ?        00:00:00 %s\n", entry->d_name, text);
  }
  if (folder != NULL) closedir(folder);
  return 0;
}

/* The real command; what is put before the C library has nothing to do in it. */
static int run_real(const char* name, char** argv) {
  static char path[8192];
  const char* all = getenv("PATH");
  if (all != NULL && strncmp(all, "/fake/bin:", 10) == 0) all += 10;
  unsetenv("LD_PRELOAD");
  snprintf(path, sizeof path, "%s", all == NULL ? "/usr/sbin:/usr/bin:/sbin:/bin" : all);
  for (char* folder = strtok(path, ":"); folder != NULL; folder = strtok(NULL, ":")) {
    char file[4096];
    snprintf(file, sizeof file, "%s/%s", folder, name);
    execv(file, argv);
  }
  return 127;
}

/* The file system turns read-only by itself: it says so, the mount does not. */
static int degrade(const char* point) {
  int fs = (int)syscall(SYS_fspick, AT_FDCWD, point, 0);
  if (fs < 0 || syscall(SYS_fsconfig, fs, FSCONFIG_SET_FLAG, "ro", NULL, 0) != 0) return 1;
  return syscall(SYS_fsconfig, fs, FSCONFIG_CMD_RECONFIGURE, NULL, NULL, 0) == 0 ? 0 : 1;
}

/* What the format semaphore stands at; nothing when there is none. */
static int show_semaphore(void) {
  int id = semget(90111, 1, 0);
  if (id >= 0) printf("%d\n", semctl(id, 0, GETVAL));
  return 0;
}

/* The kernel's view of the sessions that the state holds, and volumes mounted as they were. */
static int restore(char** argv) {
  for (int t = 1; t <= TARGETS; t++) {
    struct target* target = &world->targets[t];
    for (int l = 0; l < LUNS; l++) {
      if (target->luns[l].letter != 0) sysfs_add(t, l, &target->luns[l], target->session);
    }
  }
  mkdir("/mnt/VV", 0755);
  for (; argv[0] != NULL && argv[1] != NULL; argv += 2) {
    char* words[] = {argv[0], argv[1], NULL};
    if (mkdir(argv[1], 0777) != 0 || do_mount(words) != 0 || chmod(argv[1], 0777) != 0) return 1;
  }
  return 0;
}

/* Before anything else: a sysfs without a disk. */
static int begin(void) {
  const char* const folders[] = {"/sys/block", "/sys/class", "/sys/class/block", "/sys/class/iscsi_session"};
  if (mount("sys", "/sys", "tmpfs", 0, "") != 0) return 1;
  for (size_t i = 0; i < sizeof folders / sizeof *folders; i++) {
    if (mkdir(folders[i], 0755) != 0) return 1;
  }
  return 0;
}

/* `world ...`: the torture itself calls it. */
static int do_world(char** argv) {
  const char* what = argv[0] == NULL ? "" : argv[0];
  if (strcmp(what, "begin") == 0) return begin();
  if (strcmp(what, "restore") == 0) return restore(argv + 1); /* NODE POINT... of what was mounted */
  if (strcmp(what, "degrade") == 0 && argv[1] != NULL) return degrade(argv[1]);
  if (strcmp(what, "semaphore") == 0) return show_semaphore();
  if (strcmp(what, "lasting") == 0) return lasting_show();
  return 2;
}

static int is_plain(const char* name) {
  return is_one_of(name,
                   " iscsid insmod rmmod e2fsck ping killall winshare_reload macshare_reload udevadm sync ");
}

static int perform(const char* name, char** argv) {
  if (strcmp(name, "iscsiadm") == 0) return do_iscsiadm(argv);
  if (strcmp(name, "dd") == 0) return do_dd(argv);
  if (strcmp(name, "mke2fs") == 0) return do_mke2fs(argv);
  if (strcmp(name, "fuser") == 0) return do_fuser(argv);
  if (strcmp(name, "mount") == 0) return do_mount(argv);
  if (strcmp(name, "umount") == 0) return do_umount(argv);
  if (strcmp(name, "ps") == 0) return do_ps();
  if (strcmp(name, "world") == 0) return do_world(argv + 1);
  if (strcmp(name, "resize2fs") == 0) nap(some(10, 30));
  if (strcmp(name, "resize2fs") == 0 || is_plain(name)) return 0;
  return run_real(name, argv);
}

static void join(char* text, size_t size, char** argv) {
  size_t length = 0;
  text[0] = '\0';
  for (; *argv != NULL && length < size - 1; argv++) {
    length += (size_t)snprintf(text + length, size - length, "%s%s", length ? " " : "", *argv);
  }
}

int main(int argc, char** argv) {
  char words[400];
  const char* name = strrchr(argv[0], '/');
  name = name == NULL ? argv[0] : name + 1;
  world = world_map();
  if (world == NULL || argc < 1) return 99;
  join(words, sizeof words, argv + 1);
  if (!fault_due(FAULT_COMMAND, name, words)) return perform(name, argv);
  world_log("F", "%s %s (kind %d)", name, words, world->faults.kind);
  if (world->faults.kind == KIND_KILL) raise(SIGKILL);
  if (world->faults.kind == KIND_FAIL) return 1;
  if (world->faults.kind == KIND_NOTHING) return 0;
  if (world->faults.kind == KIND_MUTE) {
    muted = 1;
    return perform(name, argv);
  }
  perform(name, argv);
  return 1;
}
