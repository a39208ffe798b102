// The diagnostic log: lines "(FILE:FUNCTION:LINE): message" on standard output, shown when the debug level is
// at least the message's level (0 errors, 1 flow, 2 detail, 3 fine detail) and flushed at once, so that they
// survive a crash and interleave with the output of the shell commands that the tool runs.
//
// Where standard output is a stream to systemd's journal, every line begins with its priority as "<N>"
// (sd-daemon(3)), which the journal takes off: a failure is found by "journalctl -p warning".
#ifndef REMVOL_FRONTEND_LOG_H
#define REMVOL_FRONTEND_LOG_H

#include <cstdio>

namespace remvol {

// What stands in messages in place of a CHAP secret.
inline constexpr char kMaskedSecret[] = "***";

// What a message matters: its level, and its priority in the journal (syslog(3)).
struct Weight {
  int level, priority;

  // A message of a plain level: at 0 something has failed, above it is flow or detail.
  constexpr Weight(int message_level)
      : level(message_level),
        priority(message_level < 1    ? 4
                 : message_level == 1 ? 6
                                      : 7) {}
  constexpr Weight(int message_level, int journal_priority)
      : level(message_level), priority(journal_priority) {}
};

// Shown as an error is, and none: what is told at level 0 although it is as it should be.
inline constexpr Weight kNote(0, 6);

// The command has failed.
inline constexpr Weight kCommandFailed(0, 3);

// The process-wide debug level. Negative silences everything. Set once by main.
extern int debug_level;

// Where a message comes from. As a default argument it names the function that made the call, so that a
// shared helper logs in its caller's name.
struct Caller {
  const char* function;
  int line;

  constexpr Caller(const char* function_name = __builtin_FUNCTION(), int line_number = __builtin_LINE())
      : function(function_name), line(line_number) {}
};

// Begins a line that is no message of the log, on standard output or standard error: the journal gets the
// weight's priority. The level is not looked at.
void begin_line(Weight weight, FILE* stream = stdout);

// Prints a text that has no newline of its own on standard output, whatever the debug level: programs know it
// as it is. In the journal it is a line.
[[gnu::format(printf, 2, 3)]] void print_open(Weight weight, const char* format, ...);

// Prints the prefix when the debug level is at least the message's; flushes standard output in every case.
void log_prefix(Weight weight, const char* file, const char* function, int line);

// Prints prefix, message and a newline when the debug level is at least the message's; flushes in every case.
// The secret in a command of iscsiadm is masked.
[[gnu::format(printf, 5, 6)]] void log_message(Weight weight, const char* file, const char* function,
                                               int line, const char* format, ...);

}  // namespace remvol

// Every module of the tool logs under one file name; the two that have their own define it before this line.
#ifndef LOG_SOURCE
#define LOG_SOURCE "src.cpp"
#endif

// LOG(1, "get %s db_idx=%d", name, n); logs in the name of the enclosing function. In place of a level stands
// a weight where the priority is another than the level's: LOG(kNote, "ip: %s", address).
#define LOG(weight, ...) ::remvol::log_message(weight, LOG_SOURCE, __func__, __LINE__, __VA_ARGS__)

// LOG_AT(caller, 0, "..."); logs in the name of `caller`.
#define LOG_AT(caller, weight, ...) \
  ::remvol::log_message(weight, LOG_SOURCE, (caller).function, (caller).line, __VA_ARGS__)

#endif
