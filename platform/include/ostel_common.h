/* LAN ports of the appliance. Usable from C and C++. */
#ifndef OSTEL_COMMON_H
#define OSTEL_COMMON_H

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/* Returns the link speed of LAN port 0 (egiga0) or 1 (egiga1) in Mbit/s; 0 without a link or for another
 * port. A link whose driver does not tell a speed counts as 1000. */
int LIB_Get_Lan_Link_Speed(int port);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
