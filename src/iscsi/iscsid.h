// The commands that configure, start and end iscsid(8): every text of them stands here.
#ifndef REMVOL_ISCSI_ISCSID_H
#define REMVOL_ISCSI_ISCSID_H

#include "support/text.h"

namespace remvol {

// Where it looks for its configuration.
inline constexpr const char* kIscsidFolder = "/etc/iscsi";
inline constexpr const char* kIscsidConf = "/etc/iscsi/iscsid.conf";

// Starts it in the background.
[[nodiscard]] CommandText start_iscsid_command();

// End it; the second form says nothing when it does not run.
[[nodiscard]] CommandText end_iscsid_command();
[[nodiscard]] CommandText end_iscsid_quietly_command();

// Writes the settings, whose lines end in the two characters "\n", into its configuration.
[[nodiscard]] CommandText configure_iscsid_command(const char* settings);

// Gives the initiator its name.
[[nodiscard]] CommandText name_initiator_command(const char* name);

}  // namespace remvol

#endif
