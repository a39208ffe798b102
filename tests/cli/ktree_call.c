/* Calls the tree's client library as it is told on standard input, in one process that lives as long as its
 * test wants, and prints a line for every call. Written in C, because the header promises to be usable from
 * C.
 *
 *   set PATH VALUE | get PATH SIZE | del PATH | dump FILE | load FILE
 *   fork PATH            a child reads PATH and exits, then this process does
 *   clone PATH           the same, but the C library does not know of the child
 *   threads PATH COUNT   eight threads read PATH, COUNT times each
 *   sh COMMAND           what a command started from here prints, in one line */
#include <pthread.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include "ktreec.h"

static const char* socket_path;

static void get(const char* path, size_t size) {
  static char buffer[70000];
  memset(buffer, '#', sizeof buffer);
  const int result = ktreec_get_wb(socket_path, 0, path, buffer, size);
  if (size < sizeof buffer && buffer[size] != '#') abort();
  printf("%d %s\n", result, size > 0 ? buffer : "");
}

static pid_t fork_unseen(void) {
  return (pid_t)syscall(SYS_clone, SIGCHLD, 0, 0, 0, 0);
}

static void fork_and_get(const char* path, pid_t (*make_child)(void)) {
  fflush(stdout);
  const pid_t child = make_child();
  get(path, 1000);
  if (child == 0) {
    fflush(stdout);
    _exit(0);
  }
  waitpid(child, NULL, 0);
}

struct reader {
  pthread_t thread;
  const char* path;
  int count;
  int good;
};

static void* read_often(void* data) {
  struct reader* reader = data;
  for (int i = 0; i < reader->count; i++) {
    char own[64];
    char path[200];
    char value[64];
    snprintf(own, sizeof own, "%p-%d", data, i);
    snprintf(path, sizeof path, "%s/t_%zx", reader->path, (size_t)data);
    reader->good += ktreec_set(socket_path, 0, path, own) == 0 &&
                    ktreec_get_wb(socket_path, 0, path, value, sizeof value) == (int)strlen(own) &&
                    !strcmp(own, value);
  }
  return NULL;
}

static void threads(const char* path, int count) {
  struct reader readers[8];
  int good = 0;
  for (int i = 0; i < 8; i++) {
    readers[i] = (struct reader){.path = path, .count = count};
    pthread_create(&readers[i].thread, NULL, read_often, &readers[i]);
  }
  for (int i = 0; i < 8; i++) {
    pthread_join(readers[i].thread, NULL);
    good += readers[i].good;
  }
  printf("%d\n", good);
}

static void shell(const char* command) {
  FILE* out = popen(command, "r");
  for (int c = fgetc(out); c != EOF; c = fgetc(out)) {
    putchar(c == '\n' ? ' ' : c);
  }
  pclose(out);
  putchar('\n');
}

static void call(char* line) {
  char* save = NULL;
  const char* word = strtok_r(line, " ", &save);
  if (!strcmp(word, "sh")) {
    shell(save);
    return;
  }
  const char* first = strtok_r(NULL, " ", &save);
  if (!strcmp(word, "set")) {
    printf("%d\n", ktreec_set(socket_path, 0, first, save));
  } else if (!strcmp(word, "get")) {
    get(first, (size_t)strtoul(save, NULL, 10));
  } else if (!strcmp(word, "del")) {
    printf("%d\n", ktreec_del(socket_path, 0, first));
  } else if (!strcmp(word, "dump")) {
    printf("%d\n", ktreec_dump(socket_path, 0, first));
  } else if (!strcmp(word, "load")) {
    printf("%d\n", ktreec_load(socket_path, 0, first));
  } else if (!strcmp(word, "fork")) {
    fork_and_get(first, fork);
  } else if (!strcmp(word, "clone")) {
    fork_and_get(first, fork_unseen);
  } else if (!strcmp(word, "threads")) {
    threads(first, atoi(save));
  }
}

/* What no daemon is needed for. */
static int refusals(void) {
  char buffer[4] = "abc";
  return ktreec_set(socket_path, 0, NULL, "x") == -1 && ktreec_set(socket_path, 0, "/a", NULL) == -1 &&
         ktreec_del(socket_path, 0, NULL) == -1 && ktreec_dump(socket_path, 0, NULL) == -1 &&
         ktreec_load(socket_path, 0, NULL) == -1 && ktreec_get_wb(socket_path, 0, "/a", NULL, 10) == -1 &&
         ktreec_get_wb(socket_path, 0, "/a", buffer, 0) == -1 && buffer[0] == 'a' &&
         ktreec_get_wb(socket_path, 0, NULL, buffer, 4) == -1 && buffer[0] == '\0';
}

int main(int argc, char** argv) {
  static char line[70000];
  socket_path = argc > 1 ? argv[1] : NULL;
  printf("%s\n", refusals() ? "ready" : "wrong");
  fflush(stdout);
  while (fgets(line, sizeof line, stdin) != NULL) {
    line[strcspn(line, "\n")] = '\0';
    call(line);
    fflush(stdout);
  }
  return 0;
}
