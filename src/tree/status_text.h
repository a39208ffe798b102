// The status texts which the user interface shows, composed from state numbers and from what was found out:
// facts in, text out.
#ifndef REMVOL_TREE_STATUS_TEXT_H
#define REMVOL_TREE_STATUS_TEXT_H

#include "support/text.h"
#include "tree/state.h"

namespace remvol {

using StatusText = Text<64>;

// A target's status: its text, and the connect state that goes with it; -1 when that stays as it is.
struct TargetStatus {
  const char* text;
  int state;
};

// The status of a target that is logged in or not and whose connect state is `state`.
[[nodiscard]] TargetStatus target_status(bool connected, int state);

// The status of a target that is being recovered.
inline constexpr char kReconnecting[] = "Reconnecting";

// The text of a LUN that is not enabled, and of one without a disk.
inline constexpr char kLunDisabled[] = "Disable";
inline constexpr char kLunOffline[] = "Offline";

// The text of a LUN that is being formatted, `progress` in percent.
[[nodiscard]] StatusText formatting_text(int progress);

// The text of a mounted LUN, `right` an AccessRight.
[[nodiscard]] StatusText running_text(int right);

// The text of a LUN on which a file system is that is not mounted, and of one on which none was recognised.
// `progress` in percent counts while the state is kFormatting.
[[nodiscard]] StatusText unmounted_text(const LunState& state, int right, int progress);
[[nodiscard]] StatusText unformatted_text(const LunState& state, int right, int progress);

// Returns whether the status text of a target or a LUN tells of work that goes on.
[[nodiscard]] bool tells_of_work(const char* text);

}  // namespace remvol

#endif
