// The wishes that targets be connected, which the tool takes back when it meets a session without a disk.
#ifndef PLATFORM_KEEPER_WISH_H
#define PLATFORM_KEEPER_WISH_H

#include <map>
#include <string>
#include <vector>

#include "common/sessions.h"
#include "common/tree_reader.h"

namespace keeper {

// Storage whose portal answers before its LUNs are there, as after a power failure, is to be tried again,
// whoever has given its target up: a try, a recovery, or the start-up.
class Wishes {
 public:
  // Compares the settings with those of the look before. A target that was given up since is wanted once
  // more: it has lost its wish, with volumes that have failed, while nobody disconnected or deleted it. Its
  // connection has failed then, and such volumes are offline, so that a later disconnection is taken for
  // none of these. Returns true when the settings were changed, and are to be read again.
  // `starting` is true while the tool's start-up runs.
  bool look(const platform::TreeReader& tree, const std::vector<platform::Session>& sessions, bool starting);

  // True for a target that is wanted, or would be had the tool not given it up.
  bool has(const std::string& target) const { return wanted_.count(target) != 0; }

 private:
  std::map<std::string, unsigned> wanted_;  // the failed volumes of each target, a bit for each slot
  bool first_ = true;                       // what the start-up has given up was not yet looked for
};

// Does that to one target, unless it is wanted.
void want_again(const std::string& target);

}  // namespace keeper

#endif
