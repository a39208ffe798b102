/* The first process of a test box: makes a private world and starts programs in it on request.
 *
 * usage: box SOCKET KEEP...
 * SOCKET is the number of an inherited SOCK_SEQPACKET socket; KEEP are folders that stay visible as they are
 * (the repository, the build). The box has mount, IPC, network, host name and process namespaces of its own;
 * its root is the machine's root with a layer in memory on top (seen in /fake/upper), so nothing that is done
 * in it stays. /run, /tmp, /mnt, /root and /dev start empty (/dev with the harmless devices), /sys/block
 * shows no disk, /etc/mtab is there as on any booted system, and what the machine has set up for its own
 * initiator, file servers and volumes (absent[]) is not.
 *
 * First answer: "ready PID" (seen from outside), or "failed TEXT". Then a request is fields separated by NUL,
 *   run ID FOLDER ARGUMENTS-COUNT ARGUMENT... VARIABLE...   with three descriptors: the standard streams
 *   kill ID SIGNAL                                          to the program's process group
 * and answers are "started ID PID" and "ended ID WAIT-STATUS". End of file ends the box. */
#include <errno.h>
#include <fcntl.h>
#include <net/if.h>
#include <poll.h>
#include <sched.h>
#include <signal.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <sys/wait.h>
#include <unistd.h>

enum { PROGRAMS = 256, REQUEST = 1 << 20, WORDS = 4096 };

static int control;
static struct {
  long id;
  pid_t pid;
} programs[PROGRAMS];

__attribute__((format(printf, 1, 2))) static void answer(const char* format, ...) {
  char text[512];
  va_list list;
  va_start(list, format);
  vsnprintf(text, sizeof text, format, list);
  va_end(list);
  if (send(control, text, strlen(text), MSG_NOSIGNAL) < 0) _exit(1);
}

static void must(int result, const char* what) {
  if (result >= 0) return;
  answer("failed %s: %s", what, strerror(errno));
  _exit(1);
}

static void make_folders(char* path) {
  for (char* slash = strchr(path + 1, '/'); slash != NULL; slash = strchr(slash + 1, '/')) {
    *slash = '\0';
    mkdir(path, 0755);
    *slash = '/';
  }
  mkdir(path, 0755);
}

static void memory_at(const char* path, const char* options) {
  mkdir(path, 0755);
  must(mount("tmpfs", path, "tmpfs", 0, options), path);
}

static void device(const char* name, unsigned kind, unsigned major_number, unsigned minor_number) {
  must(mknod(name, kind | 0666, makedev(major_number, minor_number)), name);
  chmod(name, 0666);
}

static void make_devices(void) {
  memory_at("dev", "mode=755");
  device("dev/null", S_IFCHR, 1, 3);
  device("dev/zero", S_IFCHR, 1, 5);
  device("dev/full", S_IFCHR, 1, 7);
  device("dev/random", S_IFCHR, 1, 8);
  device("dev/urandom", S_IFCHR, 1, 9);
  device("dev/tty", S_IFCHR, 5, 0);
  device("dev/loop-control", S_IFCHR, 10, 237);
  must(symlink("/proc/self/fd", "dev/fd"), "dev/fd");
  must(mkdir("dev/shm", 01777), "dev/shm");
}

/* What a machine may have set up for itself. In a layer above it, a device 0:0 says that the file is not
 * there. */
static void leave_out(void) {
  static const char* const absent[] = {"fake",      "etc/iscsi",        "etc/NAS_CFG",       "etc/netatalk",
                                       "etc/samba", "usr/local/config", "usr/local/modules", "var/lib/iscsi"};
  for (size_t i = 0; i < sizeof absent / sizeof *absent; i++) {
    char path[64];
    snprintf(path, sizeof path, "/tmp/upper/%s", absent[i]);
    char* name = strrchr(path, '/');
    *name = '\0';
    make_folders(path);
    *name = '/';
    must(mknod(path, S_IFCHR, makedev(0, 0)), path);
  }
}

/* A look at the upper layer that changes nothing. */
static int upper_layer(void) {
  struct mount_attr read_only = {.attr_set = MOUNT_ATTR_RDONLY};
  int upper = (int)syscall(SYS_open_tree, AT_FDCWD, "/tmp/upper", OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC);
  must(upper, "upper layer");
  must((int)syscall(SYS_mount_setattr, upper, "", AT_EMPTY_PATH, &read_only, sizeof read_only),
       "upper layer");
  return upper;
}

/* The root's lower layer is one file system: what else is mounted below it is not in the box. */
static void make_root(char** keep) {
  int kept[16];
  int count = 0;
  must(mount(NULL, "/", NULL, MS_REC | MS_PRIVATE, NULL), "private mounts");
  for (; keep[count] != NULL && count < 16; count++) {
    kept[count] = (int)syscall(SYS_open_tree, AT_FDCWD, keep[count],
                               OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC | AT_RECURSIVE);
    must(kept[count], keep[count]);
  }
  must(mount("tmpfs", "/tmp", "tmpfs", 0, "mode=755"), "memory");
  must(mkdir("/tmp/upper", 0755), "upper layer");
  int upper = upper_layer();
  must(mkdir("/tmp/work", 0755), "work folder");
  must(mkdir("/tmp/root", 0755), "root");
  leave_out();
  must(mount("overlay", "/tmp/root", "overlay", 0, "lowerdir=/,upperdir=/tmp/upper,workdir=/tmp/work"),
       "overlay");
  must(chdir("/tmp/root"), "root");
  must(mount("proc", "proc", "proc", 0, NULL), "proc");
  must(mount("sysfs", "sys", "sysfs", 0, NULL), "sysfs");
  memory_at("sys/block", "mode=755");
  memory_at("run", "mode=755");
  memory_at("tmp", "mode=1777");
  memory_at("mnt", "mode=755");
  memory_at("root", "mode=700");
  mkdir("run/lock", 01777);
  if (symlink("../proc/self/mounts", "etc/mtab") < 0 && errno != EEXIST) must(-1, "etc/mtab");
  make_devices();
  must(mkdir("fake", 0777), "fake");
  must(mkdir("fake/upper", 0755), "fake/upper");
  must((int)syscall(SYS_move_mount, upper, "", AT_FDCWD, "fake/upper", MOVE_MOUNT_F_EMPTY_PATH),
       "fake/upper");
  for (int i = 0; i < count; i++) {
    char path[4096];
    snprintf(path, sizeof path, "/tmp/root%s", keep[i]);
    make_folders(path);
    must((int)syscall(SYS_move_mount, kept[i], "", AT_FDCWD, path, MOVE_MOUNT_F_EMPTY_PATH), keep[i]);
  }
  must((int)syscall(SYS_pivot_root, ".", "."), "pivot_root");
  must(umount2(".", MNT_DETACH), "old root");
  must(chdir("/"), "root");
}

static void raise_loopback(void) {
  struct ifreq request = {.ifr_name = "lo"};
  int fd = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  request.ifr_flags = IFF_UP | IFF_RUNNING;
  must(ioctl(fd, SIOCSIFFLAGS, &request), "loopback");
  close(fd);
}

static void become(char** words, size_t count, const int* streams) {
  size_t args = (size_t)atol(words[3]);
  char** argv = calloc(args + 1, sizeof *argv);
  char** env = calloc(count - 4 - args + 1, sizeof *env);
  sigset_t none;
  memcpy(argv, words + 4, args * sizeof *argv);
  memcpy(env, words + 4 + args, (count - 4 - args) * sizeof *env);
  for (int i = 0; i < 3; i++) dup2(streams[i], i);
  close_range(3, ~0U, 0);
  setsid();
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, NULL);
  if (chdir(words[2]) == 0) {
    environ = env;
    execvp(argv[0], argv);
  }
  dprintf(2, "box: %s: %s\n", argv[0], strerror(errno));
  _exit(127);
}

static void start(char** words, size_t count, const int* streams) {
  size_t place = 0;
  while (place < PROGRAMS && programs[place].pid != 0) place++;
  if (place == PROGRAMS || count < 5) {
    answer("ended %s %d", words[1], 126 << 8);
    return;
  }
  pid_t pid = fork();
  if (pid == 0) become(words, count, streams);
  programs[place].id = atol(words[1]);
  programs[place].pid = pid;
  answer("started %s %d", words[1], (int)pid);
}

static void handle_request(void) {
  static char text[REQUEST];
  char* words[WORDS];
  size_t count = 0;
  int streams[3] = {-1, -1, -1};
  char ancillary[CMSG_SPACE(sizeof streams)];
  struct iovec part = {text, sizeof text - 1};
  struct msghdr message = {
      .msg_iov = &part, .msg_iovlen = 1, .msg_control = ancillary, .msg_controllen = sizeof ancillary};
  ssize_t size = recvmsg(control, &message, MSG_CMSG_CLOEXEC);
  if (size <= 0) _exit(0);
  text[size] = '\0';
  struct cmsghdr* header = CMSG_FIRSTHDR(&message);
  if (header != NULL) memcpy(streams, CMSG_DATA(header), sizeof streams);
  for (char* at = text; at < text + size && count < WORDS; at += strlen(at) + 1) words[count++] = at;
  if (count > 3 && strcmp(words[0], "run") == 0) start(words, count, streams);
  if (count > 2 && strcmp(words[0], "kill") == 0) {
    for (size_t i = 0; i < PROGRAMS; i++) {
      if (programs[i].pid != 0 && programs[i].id == atol(words[1])) kill(-programs[i].pid, atoi(words[2]));
    }
  }
  for (int i = 0; i < 3; i++) {
    if (streams[i] >= 0) close(streams[i]);
  }
}

static void reap(void) {
  int status;
  pid_t pid;
  while ((pid = waitpid(-1, &status, WNOHANG)) > 0) {
    for (size_t i = 0; i < PROGRAMS; i++) {
      if (programs[i].pid != pid) continue;
      programs[i].pid = 0;
      answer("ended %ld %d", programs[i].id, status);
    }
  }
}

static void serve(void) {
  sigset_t set;
  struct signalfd_siginfo info;
  sigemptyset(&set);
  sigaddset(&set, SIGCHLD);
  sigprocmask(SIG_BLOCK, &set, NULL);
  int children = signalfd(-1, &set, SFD_CLOEXEC);
  struct pollfd ready[2] = {{.fd = control, .events = POLLIN}, {.fd = children, .events = POLLIN}};
  for (;;) {
    if (poll(ready, 2, -1) < 0) continue;
    if (ready[1].revents != 0 && read(children, &info, sizeof info) > 0) reap();
    if (ready[0].revents != 0) handle_request();
  }
}

int main(int argc, char** argv) {
  if (argc < 2) return 2;
  control = atoi(argv[1]);
  fcntl(control, F_SETFD, FD_CLOEXEC);
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  must(unshare(CLONE_NEWNS | CLONE_NEWIPC | CLONE_NEWNET | CLONE_NEWUTS | CLONE_NEWPID), "namespaces");
  int gate[2];
  must(pipe2(gate, O_CLOEXEC), "pipe");
  pid_t pid = fork();
  must(pid, "fork");
  if (pid > 0) {
    char outside[32];
    int length = snprintf(outside, sizeof outside, "%d", (int)pid);
    if (write(gate[1], outside, (size_t)length + 1) < 0) return 1;
    close(control);
    waitpid(pid, NULL, 0);
    return 0;
  }
  char outside[32] = "";
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  must((int)read(gate[0], outside, sizeof outside), "pipe");
  umask(0);
  make_root(argv + 2);
  umask(022);
  raise_loopback();
  must(sethostname("appliance", 9), "host name");
  answer("ready %s", outside);
  serve();
}
