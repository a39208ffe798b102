/* The one program behind every fake command of a test box: writes its call into the log and answers from the
 * script. Without an answer it fails with status 99, and so does the test. */
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include "script.h"

static char* joined(char* const* args, int count) {
  size_t size = 1;
  for (int i = 0; i < count; i++) size += strlen(args[i]) + 1;
  char* text = calloc(1, size);
  if (text == NULL) abort();
  char* end = text;
  for (int i = 0; i < count; i++) {
    if (i > 0) *end++ = ' ';
    end = stpcpy(end, args[i]);
  }
  return text;
}

/* The text that the calling shell was started with, "" when the caller is no `sh -c`. */
static const char* shell_text(char* buffer, size_t size) {
  char path[64];
  snprintf(path, sizeof path, "/proc/%d/cmdline", (int)getppid());
  int fd = open(path, O_RDONLY | O_CLOEXEC);
  ssize_t got = fd < 0 ? -1 : read(fd, buffer, size - 1);
  if (fd >= 0) close(fd);
  if (got <= 0) return "";
  buffer[got] = '\0';
  if (got < 7 || memcmp(buffer, "sh\0-c\0", 6) != 0) return "";
  return strcmp(buffer + 6, "--") == 0 ? buffer + 9 : buffer + 6;
}

static void record(const char* kind, const char* name, char** args, int count) {
  static char shell[131072];
  char locale[128];
  const char** fields = calloc((size_t)count + 3, sizeof *fields);
  if (fields == NULL) abort();
  const char* all = getenv("LC_ALL");
  snprintf(locale, sizeof locale, "%s", all == NULL ? "" : all);
  fields[0] = name;
  fields[1] = shell_text(shell, sizeof shell);
  fields[2] = locale;
  for (int i = 0; i < count; i++) fields[3 + i] = args[i];
  log_fields(kind, fields, (size_t)count + 3);
  free(fields);
}

static void become_real(const char* name, char** argv) {
  const char* path = getenv("PATH");
  if (path != NULL && strncmp(path, "/fake/bin:", 10) == 0) setenv("PATH", path + 10, 1);
  execvp(name, argv);
  fprintf(stderr, "fake %s: no real one: %s\n", name, strerror(errno));
  exit(127);
}

int main(int argc, char** argv) {
  const char* slash = strrchr(argv[0], '/');
  const char* name = slash == NULL ? argv[0] : slash + 1;
  char* subject = joined(argv + 1, argc - 1);
  struct rule rule;
  if (script_find(name, subject, "", &rule) != 0) {
    record("unscripted", name, argv + 1, argc - 1);
    fprintf(stderr, "fake %s: no answer for '%s'\n", name, subject);
    return 99;
  }
  record("run", name, argv + 1, argc - 1);
  int status = rule_act(&rule, argv + 1);
  if (rule.real) become_real(name, argv);
  fputs(rule.out, stdout);
  fputs(rule.err, stderr);
  if (rule.result >= 0) status = (int)rule.result;
  rule_free(&rule);
  free(subject);
  return status;
}
