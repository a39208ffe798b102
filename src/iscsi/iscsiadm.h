// The commands that drive iscsiadm(8): every text of them stands here.
//
// Some put the target name between double quotes and some do not. What watches this tool's commands knows
// them so.
//
// Values reach iscsiadm only as text; see shell_command. Also refused, at level 0, is what would leave the
// initiator's records: a target name or address with a component "..", and a user or secret with a line
// break, behind which would stand another setting of the record. A refused command is one that fails.
#ifndef REMVOL_ISCSI_ISCSIADM_H
#define REMVOL_ISCSI_ISCSIADM_H

#include "support/text.h"
#include "tree/record.h"

namespace remvol {

// Makes an interface record, and binds it to the network port `netif`.
[[nodiscard]] CommandText new_iface_command(const char* iface);
[[nodiscard]] CommandText bind_iface_command(const char* iface, const char* netif);

// Writes the targets that the portal offers into the file `path`.
[[nodiscard]] CommandText discovery_command(const char* address, int port, const char* iface,
                                            const char* path);

// Writes the sessions into the file `path`: a line each; with their disks, for the stored device names; with
// their disks, for a target's LUNs.
[[nodiscard]] CommandText sessions_command(const char* path);
[[nodiscard]] CommandText session_devices_command(const char* path);
[[nodiscard]] CommandText session_luns_command(const char* path);

// Makes or deletes the node record of the entry's target, portal and interface.
[[nodiscard]] CommandText new_node_command(const TargetEntry& entry);
[[nodiscard]] CommandText delete_node_command(const TargetEntry& entry);

// Set one authentication setting of the node record each.
[[nodiscard]] CommandText no_auth_command(const TargetEntry& entry);
[[nodiscard]] CommandText chap_method_command(const TargetEntry& entry);
[[nodiscard]] CommandText chap_user_command(const TargetEntry& entry);
[[nodiscard]] CommandText chap_secret_command(const TargetEntry& entry);

// Logs in to the target; the second form is the one after `portal_logout_command` gave up a stale session.
[[nodiscard]] CommandText login_command(const TargetEntry& entry);
[[nodiscard]] CommandText portal_logout_command(const TargetEntry& entry);
[[nodiscard]] CommandText login_again_command(const TargetEntry& entry);

// Logs out of every session to the target; of every session.
[[nodiscard]] CommandText logout_command(const TargetEntry& entry);
[[nodiscard]] CommandText logout_all_command();

}  // namespace remvol

#endif
