// The commands that configure, start and end iscsid(8): every text of them stands here.
#ifndef REMVOL_ISCSI_ISCSID_H
#define REMVOL_ISCSI_ISCSID_H

#include "support/text.h"

namespace remvol {

// Where it looks for its configuration.
inline constexpr const char* kIscsidFolder = "/etc/iscsi";
inline constexpr const char* kIscsidConf = "/etc/iscsi/iscsid.conf";

// The name of its socket, without the zero in front that makes it an abstract one (unix(7)); seen with 2.1.8
// and 2.1.11.
inline constexpr char kIscsidSocket[] = "ISCSIADM_ABSTRACT_NAMESPACE";

// Starts it in the background.
[[nodiscard]] CommandText start_iscsid_command();

// End it; the second form says nothing when it does not run.
[[nodiscard]] CommandText end_iscsid_command();
[[nodiscard]] CommandText end_iscsid_quietly_command();

// Waits until one that was told to end is gone, at most 10 seconds: while it answers those that ask it, under
// the name of its socket (kIscsidSocket), another one ends as soon as it is started. Returns whether the name
// is free, or cannot be asked for.
[[nodiscard]] bool await_iscsid_end();

// Writes the settings, whose lines end in the two characters "\n", into its configuration.
[[nodiscard]] CommandText configure_iscsid_command(const char* settings);

// Gives the initiator its name.
[[nodiscard]] CommandText name_initiator_command(const char* name);

}  // namespace remvol

#endif
