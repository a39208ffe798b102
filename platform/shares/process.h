// What the share reloads do as processes: their log, their turn, the programs they run.
#ifndef PLATFORM_SHARES_PROCESS_H
#define PLATFORM_SHARES_PROCESS_H

#include <syslog.h>

#include <string>
#include <vector>

namespace shares {

// Opens the log under the program's name: lines go to the system's log, and to standard error unless that is
// the journal, which has them then.
void open_log(const char* program);

// Logs a line of a priority; see syslog(3).
void log_line(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));

// Waits until no other reload of the same lock file runs and keeps others waiting until this process ends.
// Makes the folder of the generated files. Returns false, with errno, when it cannot be used.
bool take_turn(const char* lock_file);

// Runs a program found through PATH; what it prints goes into `output`, or nowhere. Returns its exit status;
// -1 when it is not there, when a signal ended it, or when it took longer than 5 seconds (it is then killed).
int run(const std::vector<std::string>& words, std::string* output = nullptr);

// True when a program of this name is found through PATH.
bool is_installed(const char* program);

}  // namespace shares

#endif
