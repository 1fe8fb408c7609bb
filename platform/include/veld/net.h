/* SPDX-License-Identifier: Apache-2.0 */
/* libveldnetsdk: network interfaces and address checks. */
#ifndef VELD_NET_H
#define VELD_NET_H

#include <net/if.h>

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

typedef struct VLIBNetInterfaceInfo {
    char szName[IF_NAMESIZE]; /* NUL-terminated; must stay the first member */
    int index;                /* kernel index */
    unsigned int flags;       /* IFF_* */
} VLIBNETINTERFACEINFO;

/* All interfaces but loopback, the kind that firewall rules are bound to. */
#define VLIBNET_KIND_ALL 8

/* Fills at most `max` records: their number, or negative on failure (with the last-error record set). */
int VLIBNetGetInterfaceInfo(VLIBNETINTERFACEINFO *records, int max, int kind);

/* Non-zero when the text is an IPv4 address in dotted form, or an IPv6 address. NULL is none. */
int BlVLIBIsIpAddr(const char *text);
int BlVLIBIsv6IpAddrValid(const char *text);

/* Writes the name of the interface that carries PPPoE: its length, or negative when there is none. */
int VELDPPPoeIntfGet(char *buf, int size);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
