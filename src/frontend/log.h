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

// How much a message matters: its level, and its priority in the journal (syslog(3)).
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

// Shown as an error is, but none: what is told at level 0 although it is as it should be.
inline constexpr Weight kNote(0, 6);

// The command has failed.
inline constexpr Weight kCommandFailed(0, 3);

// The process-wide debug level. Negative silences everything. Set once by main.
extern int debug_level;

// The function in whose name messages are told: it has an object of this at its beginning. What it calls that
// has none of its own logs in its name, so that a reader of the log finds the step, and not the helper of
// many steps.
class LogScope {
 public:
  // As a default argument __builtin_FUNCTION() names the function that has the object.
  explicit LogScope(const char* function = __builtin_FUNCTION());
  ~LogScope();
  LogScope(const LogScope&) = delete;
  LogScope& operator=(const LogScope&) = delete;

  // Returns the name of the innermost function that has one.
  static const char* function() { return innermost_ != nullptr ? innermost_->function_ : "main"; }

 private:
  static const LogScope* innermost_;
  const char* function_;
  const LogScope* outer_;
};

// Begins a line that is no message of the log, on standard output or standard error: the journal gets the
// weight's priority. The level is not looked at.
void begin_line(Weight weight, FILE* stream = stdout);

// Prints a text that has no newline of its own on standard output, whatever the debug level: programs know it
// as it is. In the journal it is a line.
[[gnu::format(printf, 2, 3)]] void print_open(Weight weight, const char* format, ...);

// Prints the prefix, with the innermost scope's function, when the debug level is at least the message's;
// flushes standard output in every case.
void log_prefix(Weight weight, const char* file, int line);

// Prints prefix, message and a newline when the debug level is at least the message's; flushes in every case.
// The secret in a command of iscsiadm is masked.
[[gnu::format(printf, 4, 5)]] void log_message(Weight weight, const char* file, int line, const char* format,
                                               ...);

}  // namespace remvol

// Every module of the tool logs under one file name; the two that have their own define it before this line.
#ifndef LOG_SOURCE
#define LOG_SOURCE "src.cpp"
#endif

// LOG(1, "get %s db_idx=%d", name, n); logs in the name of the innermost scope. In place of a level stands a
// weight where the priority is another than the level's: LOG(kNote, "ip: %s", address).
#define LOG(weight, ...) ::remvol::log_message(weight, LOG_SOURCE, __LINE__, __VA_ARGS__)

#endif
