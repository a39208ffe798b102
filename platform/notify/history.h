// How every volume was at the last look, and since when; and what has happened to it since then.
#ifndef PLATFORM_NOTIFY_HISTORY_H
#define PLATFORM_NOTIFY_HISTORY_H

#include <ctime>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "health.h"

namespace notify {

using vvstat::Ailment;

struct Past {
  Ailment now = Ailment::kNone;
  time_t since = 0;               // it has been so
  Ailment told = Ailment::kNone;  // what was last told of it
  bool formatting = false;        // it was being formatted
  bool nearly_full = false;       // and that was told
  bool operator==(const Past&) const = default;
};

// By a name that no two volumes share.
using History = std::map<std::string, Past>;

enum class Kind { kLost, kBack, kReadOnly, kRecoveryFailed, kVolumeFailed, kFormatDone, kNearlyFull, kTest };

struct Event {
  Kind kind;
  std::string target;
  std::string share;    // empty for one of a target without volumes
  std::string message;  // a sentence for a person, of printable text
};

std::string name_of(Kind kind);

// Compares the rows with the history, brings it up to date, and returns what is to be told. A volume that
// gets worse is told of at once; that it is well again when it has been so for a minute: a connection that
// comes and goes is one loss and one return. Volumes that are no more are forgotten.
std::vector<Event> compare(const std::vector<vvstat::Row>& rows, time_t now, History& history);

// The history as text, a line a volume, and back; a line that is none is left out.
std::string text_of(const History& history);
History history_of(std::string_view text);

}  // namespace notify

#endif
