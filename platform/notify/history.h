// What has happened to the volumes since the last look.
#ifndef PLATFORM_NOTIFY_HISTORY_H
#define PLATFORM_NOTIFY_HISTORY_H

#include <ctime>
#include <string>
#include <vector>

#include "vvstat/past.h"

namespace notify {

using vvstat::Ailment, vvstat::History, vvstat::Past;

enum class EventKind {
  kLost,
  kBack,
  kReadOnly,
  kRecoveryFailed,
  kVolumeFailed,
  kFormatDone,
  kNearlyFull,
  kTest
};

// What is the same for all events of a kind.
struct EventForm {
  EventKind kind;
  const char* name;
  int priority;            // syslog(3)
  const char* message_id;  // in packaging/remvol.catalog
};

const EventForm& form_of(EventKind kind);

struct Event {
  EventKind kind;
  std::string target;
  std::string share;    // empty for one of a target without volumes
  std::string message;  // a sentence for a person, of printable text
};

// Compares the rows with the history, brings it up to date, and returns what is to be told. What is
// wrong is told at once, and not again before the volume has been well for a minute, which is told then: a
// connection that comes and goes is one loss and one return. A format is known by its state, or by a file
// system that is younger than what was there before: it may have begun and ended between two looks.
// `last_look` is when the history was made; 0: it is none, and what is found is no news. Volumes that are no
// more are forgotten.
std::vector<Event> compare(const std::vector<vvstat::Row>& rows, time_t now, time_t last_look,
                           History& history);

}  // namespace notify

#endif
