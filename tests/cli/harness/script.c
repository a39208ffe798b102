#include "script.h"

#include <errno.h>
#include <fcntl.h>
#include <regex.h>
#include <signal.h>
#include <spawn.h>
#include <stdarg.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

enum { COUNTERS = 4096, FIELDS = 16 };

extern char** environ;

static char* read_script(void) {
  int fd = open("/fake/script", O_RDONLY | O_CLOEXEC);
  struct stat st;
  char* text = NULL;
  if (fd < 0) return NULL;
  if (fstat(fd, &st) == 0 && (text = malloc((size_t)st.st_size + 1)) != NULL) {
    ssize_t got = read(fd, text, (size_t)st.st_size);
    text[got < 0 ? 0 : got] = '\0';
  }
  close(fd);
  return text;
}

static int hex(char c) {
  return c <= '9' ? c - '0' : (c | 0x20) - 'a' + 10;
}

static void unescape(char* text) {
  char* to = text;
  for (const char* from = text; *from != '\0'; to++) {
    if (from[0] == '\\' && from[1] == 'x') {
      *to = (char)(hex(from[2]) * 16 + hex(from[3]));
      from += 4;
    } else {
      *to = *from++;
    }
  }
  *to = '\0';
}

/* Counts a meeting of the rule and says whether it is this rule's turn: `skip` meetings pass by, then `times`
 * are answered (below 0: all). */
static int takes_turn(unsigned id, long skip, long times, unsigned* number) {
  static uint32_t* counters;
  if (counters == NULL) {
    int fd = open("/fake/counters", O_RDWR | O_CLOEXEC);
    void* map = mmap(NULL, COUNTERS * sizeof *counters, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    close(fd);
    if (map == MAP_FAILED || id >= COUNTERS) abort();
    counters = map;
  }
  long met = (long)__atomic_fetch_add(&counters[id % COUNTERS], 1, __ATOMIC_SEQ_CST);
  *number = (unsigned)(met + 1);
  return met >= skip && (times < 0 || met < skip + times);
}

static int regex_fits(const char* pattern, const char* subject) {
  regex_t regex;
  if (regcomp(&regex, pattern, REG_EXTENDED | REG_NOSUB) != 0) {
    log_call("bad-regex", pattern, (char*)NULL);
    return 0;
  }
  int fits = regexec(&regex, subject, 0, NULL, 0) == 0;
  regfree(&regex);
  return fits;
}

static int subject_fits(const char* how, const char* pattern, const char* subject) {
  size_t length = strlen(pattern);
  if (strcmp(how, "any") == 0) return 1;
  if (strcmp(how, "exact") == 0) return strcmp(pattern, subject) == 0;
  if (strcmp(how, "regex") == 0) return regex_fits(pattern, subject);
  if (strncmp(pattern, subject, length) != 0) return 0;
  return strcmp(how, "prefix") == 0 || subject[length] == '\0' || subject[length] == ' ' || length == 0;
}

int script_find(const char* name, const char* subject, const char* value, struct rule* rule) {
  char* text = read_script();
  char* next = text;
  char* line;
  while (next != NULL && (line = strsep(&next, "\n")) != NULL) {
    char* field[FIELDS];
    size_t count = 0;
    while (line != NULL && count < FIELDS) field[count++] = strsep(&line, "\t");
    if (count < FIELDS || strcmp(field[1], name) != 0) continue;
    for (size_t i = 3; i < FIELDS; i++) unescape(field[i]);
    if (!subject_fits(field[2], field[3], subject)) continue;
    if (strcmp(field[4], "\n") != 0 && strcmp(field[4], value) != 0) continue;
    unsigned number = 0;
    if (!takes_turn((unsigned)atol(field[0]), atol(field[5]), atol(field[6]), &number)) continue;
    *rule = (struct rule){.text = text,
                          .how = field[2],
                          .pattern = field[3],
                          .value = field[4],
                          .result = atoll(field[7]),
                          .error = atoi(field[8]),
                          .out = field[9],
                          .err = field[10],
                          .effect = field[11],
                          .delay_ms = (unsigned)atol(field[12]),
                          .signal = atoi(field[13]),
                          .through = atoi(field[14]),
                          .real = atoi(field[15]),
                          .number = number};
    return 0;
  }
  free(text);
  return -1;
}

void rule_free(struct rule* rule) {
  free(rule->text);
}

/* The side effect is a shell's work: it sees the real commands and is not written into the log. */
static int run_effect(const struct rule* rule, char* const* args) {
  size_t count = 0;
  size_t kept = 0;
  while (args[count] != NULL) count++;
  char** argv = calloc(count + 5, sizeof *argv);
  size_t size = 0;
  while (environ[size] != NULL) size++;
  char** env = calloc(size + 3, sizeof *env);
  char number[32];
  pid_t pid;
  int status = 0;
  if (argv == NULL || env == NULL) abort();
  argv[0] = (char*)"sh";
  argv[1] = (char*)"-c";
  argv[2] = (char*)rule->effect;
  argv[3] = (char*)"effect";
  memcpy(argv + 4, args, count * sizeof *args);
  snprintf(number, sizeof number, "FAKE_N=%u", rule->number);
  env[kept++] = number;
  for (size_t i = 0; i < size; i++) {
    if (strncmp(environ[i], "LD_PRELOAD=", 11) != 0 && strncmp(environ[i], "PATH=", 5) != 0) {
      env[kept++] = environ[i];
    }
  }
  char* path = getenv("PATH");
  char real_path[4096];
  if (path != NULL && strncmp(path, "/fake/bin:", 10) == 0) path += 10;
  snprintf(real_path, sizeof real_path, "PATH=%s", path == NULL ? "/usr/sbin:/usr/bin:/sbin:/bin" : path);
  env[kept++] = real_path;
  if (posix_spawn(&pid, "/bin/sh", NULL, NULL, argv, env) != 0) abort();
  while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  free(argv);
  free(env);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

int rule_act(const struct rule* rule, char* const* args) {
  int status = 0;
  if (rule->delay_ms > 0) {
    struct timespec wait = {rule->delay_ms / 1000, (long)(rule->delay_ms % 1000) * 1000000};
    clock_nanosleep(CLOCK_MONOTONIC, 0, &wait, NULL);
  }
  if (rule->effect[0] != '\0') status = run_effect(rule, args);
  if (rule->signal > 0) raise(rule->signal);
  return status;
}

static char* escape(char* to, const char* from) {
  for (; *from != '\0'; from++) {
    unsigned char c = (unsigned char)*from;
    if (c < 0x20 || c > 0x7e || c == '\\') {
      to += sprintf(to, "\\x%02x", c);
    } else {
      *to++ = (char)c;
    }
  }
  return to;
}

void log_fields(const char* kind, const char* const* fields, size_t count) {
  int saved = errno;
  size_t size = strlen(kind) + 32;
  for (size_t i = 0; i < count; i++) size += 4 * strlen(fields[i]) + 1;
  int fd = open("/fake/log", O_WRONLY | O_APPEND | O_CLOEXEC);
  char* line = fd < 0 ? NULL : malloc(size);
  if (line != NULL) {
    char* end = line + sprintf(line, "%s\t%d", kind, (int)getpid());
    for (size_t i = 0; i < count; i++) {
      *end++ = '\t';
      end = escape(end, fields[i]);
    }
    *end++ = '\n';
    if (write(fd, line, (size_t)(end - line)) < 0) abort();
  }
  free(line);
  if (fd >= 0) close(fd);
  errno = saved;
}

void log_call(const char* kind, ...) {
  const char* fields[8];
  size_t count = 0;
  va_list list;
  va_start(list, kind);
  while (count < 8 && (fields[count] = va_arg(list, const char*)) != NULL) count++;
  va_end(list);
  log_fields(kind, fields, count);
}
