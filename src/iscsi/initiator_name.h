// The iSCSI name of this appliance as an initiator: PREFIX HOST ":initiator-" and the end of its hardware
// address.
#ifndef REMVOL_ISCSI_INITIATOR_NAME_H
#define REMVOL_ISCSI_INITIATOR_NAME_H

#include "support/text.h"

namespace remvol {

using InitiatorName = Text<256>;

// Builds the name. The prefix comes from the tree; what cannot be read is left out.
[[nodiscard]] InitiatorName make_initiator_name();

// Puts the last three octets of the first LAN port's hardware address into `out`, which holds at least 7
// bytes, as 6 characters: 00:90:A9:1B:2C:3D gives 1b2c3d. Returns 0 (with `out` unchanged when the address
// text is not 17 characters long), or -1 when there is no address or its text is malformed.
[[nodiscard]] int get_mac_as_unique_name(char* out);

// Lower-cases `text` in place.
void str_to_lower(char* text);

}  // namespace remvol

#endif
