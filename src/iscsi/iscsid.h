// The commands that configure, start and end iscsid(8): every text of them stands here.
#ifndef REMVOL_ISCSI_ISCSID_H
#define REMVOL_ISCSI_ISCSID_H

#include "support/text.h"

namespace remvol {

// Where it looks for its configuration.
inline constexpr const char* kIscsidFolder = "/etc/iscsi";
inline constexpr const char* kIscsidConf = "/etc/iscsi/iscsid.conf";

// Starts it in the background.
inline constexpr const char* kStartIscsidCommand = "iscsid -f >/dev/null 2>&1 &";

// End it; the second form says nothing when it does not run.
inline constexpr const char* kEndIscsidCommand = "killall -SIGTERM iscsid";
inline constexpr const char* kEndIscsidQuietlyCommand = "killall -q -SIGTERM iscsid";

// Writes the settings, whose lines end in the two characters "\n", into its configuration.
[[nodiscard]] CommandText configure_iscsid_command(const char* settings);

// Gives the initiator its name.
[[nodiscard]] CommandText name_initiator_command(const char* name);

}  // namespace remvol

#endif
