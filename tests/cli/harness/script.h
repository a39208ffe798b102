/* The script of a test box, shared by the fake commands and the preloaded library: what a call is answered
 * with, and the log in which every call is written down.
 *
 * All of it lives in the box's folder /fake:
 *   script    the rules, one a line, fields separated by tabs (see script_find)
 *   counters  a 32-bit counter a rule: how often it was met
 *   log       one line a call, fields separated by tabs
 * In a field a backslash, a control character and a byte above 0x7e are written as \xHH. */
#ifndef HARNESS_SCRIPT_H
#define HARNESS_SCRIPT_H

#include <stddef.h>

struct rule {
  char* text;      /* what the other pointers point into */
  const char* how; /* "any", "exact", "words" (the words it begins with), "prefix", "regex" */
  const char* pattern;
  const char* value; /* a second subject that must be equal; "\n" (the default) fits any */
  const char *out, *err, *effect;
  long long result;
  int error, signal, through, real;
  unsigned delay_ms, number;
};

/* Finds the first rule for `name` that fits and is not used up, and counts it. Returns 0 and fills `rule`, to
 * be given to rule_free; -1 when there is none. */
int script_find(const char* name, const char* subject, const char* value, struct rule* rule);
void rule_free(struct rule* rule);

/* Waits, runs the side effect (with `args` as its arguments) and sends the signal that the rule asks for.
 * Returns the exit status of the side effect, 0 without one. */
int rule_act(const struct rule* rule, char* const* args);

/* Adds a line to the log: the kind, the process number, then the fields up to a null pointer. */
void log_call(const char* kind, ...) __attribute__((sentinel));
void log_fields(const char* kind, const char* const* fields, size_t count);

#endif
