// The diagnostic log: lines "(FILE:FUNCTION:LINE): message" on standard output, shown when the debug level is
// at least the message's level (0 errors, 1 flow, 2 detail, 3 fine detail) and flushed at once, so that they
// survive a crash and interleave with the output of the shell commands that the tool runs.
#ifndef REMVOL_FRONTEND_LOG_H
#define REMVOL_FRONTEND_LOG_H

namespace remvol {

// What stands in messages in place of a CHAP secret.
inline constexpr char kMaskedSecret[] = "***";

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

// Prints the prefix when the debug level is at least `level`; flushes standard output in every case.
void log_prefix(int level, const char* file, const char* function, int line);

// Prints prefix, message and a newline when the debug level is at least `level`; flushes in every case. The
// secret in a command of iscsiadm is masked.
[[gnu::format(printf, 5, 6)]] void log_message(int level, const char* file, const char* function, int line,
                                               const char* format, ...);

}  // namespace remvol

// Every module of the tool logs under one file name; the two that have their own define it before this line.
#ifndef LOG_SOURCE
#define LOG_SOURCE "src.cpp"
#endif

// LOG(1, "get %s db_idx=%d", name, n); logs in the name of the enclosing function.
#define LOG(level, ...) ::remvol::log_message(level, LOG_SOURCE, __func__, __LINE__, __VA_ARGS__)

// LOG_AT(caller, 0, "..."); logs in the name of `caller`.
#define LOG_AT(caller, level, ...) \
  ::remvol::log_message(level, LOG_SOURCE, (caller).function, (caller).line, __VA_ARGS__)

#endif
