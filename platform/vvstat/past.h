// What is remembered of the volumes: since when each is as it is, and what was wrong with it last. The
// notifier (remvol-notify) writes it, in a file that goes with the machine's run time.
#ifndef PLATFORM_VVSTAT_PAST_H
#define PLATFORM_VVSTAT_PAST_H

#include <ctime>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "vvstat/health.h"

namespace vvstat {

struct Past {
  Ailment now = Ailment::kNone;
  time_t since = 0;          // it has been so
  unsigned told = 0;         // what was told of it since it was well: a bit for each ailment
  bool formatting = false;   // it was being formatted
  bool nearly_full = false;  // and that was told
  std::string error;         // what was wrong last, printable text; empty: nothing was
  time_t error_time = 0;     // that began
  time_t made = 0;           // a file system that was made later is a format that is not told; 0: not known
  bool operator==(const Past&) const = default;
};

// By key_of().
using History = std::map<std::string, Past>;

inline constexpr char kHistoryFile[] = "/run/remvol/history";

// The name of a row in the history, printable text; no two volumes share it.
std::string key_of(const Row& row);

// The history as text, one line for each volume, and back; a line that is none is left out.
std::string text_of(const History& history);
History history_of(std::string_view text);

// The history as it is in the file; empty when it cannot be read.
History read_history();

// Adds to the rows what is remembered of them. Of one that has changed since the notifier's last look it is
// not known since when.
void recall(const History& history, std::vector<Row>& rows);

}  // namespace vvstat

#endif
