// The commands that drive ping(8): every text of them stands here.
#ifndef REMVOL_SUPPORT_PING_H
#define REMVOL_SUPPORT_PING_H

namespace remvol {

// Pings `address` (IPv6 may stand in square brackets) twice, from `interface` unless that is null or empty.
// Returns 1 when it answers, else 0 (also for a null or empty address).
[[nodiscard]] int ping_ip(const char* address, const char* interface);

}  // namespace remvol

#endif
