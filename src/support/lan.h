// The two LAN ports of the appliance, "egiga0" and "egiga1".
#ifndef REMVOL_SUPPORT_LAN_H
#define REMVOL_SUPPORT_LAN_H

namespace remvol {

inline constexpr char kLan0[] = "egiga0";
inline constexpr char kLan1[] = "egiga1";

// Format the port's hardware address into `text`, which holds at least 32 bytes: 17 characters, the second
// octet in lower case; port 1 with a trailing newline. Return 0, or -1 when the port has none.
[[nodiscard]] int get_lan0_mac_text(char* text);
[[nodiscard]] int get_lan1_mac_text(char* text);

// Return 1 when the port has a link, else 0.
[[nodiscard]] int is_lan0_linked();
[[nodiscard]] int is_lan1_linked();

}  // namespace remvol

#endif
