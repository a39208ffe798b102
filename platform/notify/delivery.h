// How an event reaches people and programs.
#ifndef PLATFORM_NOTIFY_DELIVERY_H
#define PLATFORM_NOTIFY_DELIVERY_H

#include <string>
#include <string_view>
#include <vector>

#include "notify/history.h"

namespace notify {

// remvol.conf(5): words and habits are those of mdadm.conf(5).
struct Config {
  std::string mail_address;  // empty: no mail
  std::string mail_from;     // empty: root
  std::string program;       // empty: none
};

// Reads the text of the file; small letters do for the words as well. A line that is not known, or has no
// value, is named on standard error.
Config parse_config(std::string_view text);

// Writes each event to the journal, with its priority, a MESSAGE_ID that the catalog explains, EVENT=,
// TARGET= and SHARE=; mails each by sendmail(8); then, for each, runs the program of the configuration and
// those in /etc/remvol/events.d. They start one after the other, but none waits longer than a second for the
// one before it. Each is ended after 30 seconds. Returns false when something of it failed, which is said on
// standard error.
bool deliver(const std::vector<Event>& events, const Config& config);

}  // namespace notify

#endif
