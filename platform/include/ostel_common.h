/* LAN ports of the appliance. Usable from C and C++. */
#ifndef OSTEL_COMMON_H
#define OSTEL_COMMON_H

#ifdef __cplusplus
extern "C" {
#endif

/* Returns the link speed of LAN port 0 (egiga0) or 1 (egiga1) in Mbit/s; 0 without a link or for another
 * port. */
int LIB_Get_Lan_Link_Speed(int port);

#ifdef __cplusplus
}
#endif

#endif
