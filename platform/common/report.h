// What a program has to say about itself: lines on standard error, which begin with their priority as "<N>"
// (sd-daemon(3)) where that is a stream to systemd's journal.
#ifndef PLATFORM_COMMON_REPORT_H
#define PLATFORM_COMMON_REPORT_H

#include <syslog.h>

namespace platform {

// Returns whether `fd` is a stream to the journal.
bool is_journal(int fd);

// Writes a line; the newline is added. `priority` is that of syslog(3): LOG_ERR for what cannot be done,
// LOG_WARNING for what goes on with less, LOG_NOTICE for what is well again.
[[gnu::format(printf, 2, 3)]] void report(int priority, const char* format, ...);

// Prints what was asked for, such as a help text, on standard output. Returns the exit status: 0, or 1 when
// it cannot be written, which is said.
int print_asked_for(const char* text);

}  // namespace platform

#endif
