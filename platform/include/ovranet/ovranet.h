/* SPDX-License-Identifier: Apache-2.0 */
#pragma once

/* Network library: interfaces and the PPPoE link. */

#define OVRA_NET_EXPORT __attribute__((visibility("default")))

enum {
    OLIB_NET_SELECT_IPV4 = 2,  /* selector bit: IPv4 addresses */
    OLIB_NET_SELECT_IPV6 = 16, /* selector bit: global IPv6 addresses */
    OLIB_NET_STATUS_DOWN = 1,
    OLIB_NET_STATUS_UP = 2 /* the interface is up and has a carrier */
};

#ifdef __cplusplus
extern "C" {
#endif

typedef struct OLIBNetInterface {
    char name[64];
    char address[64]; /* numeric text; "" if it has none */
    int status;
} OLIBNetInterface;

/* Fills table with at most `size` addresses of the machine's interfaces; loopback, link-local and
 * PPP addresses are left out. Returns how many entries were filled, or -1. */
OVRA_NET_EXPORT int OLIBNetGetInterfaceInfo(OLIBNetInterface *table, int size, int selector);

/* 1 if the PPPoE link `index` (1 is the first) is up, otherwise 0. */
OVRA_NET_EXPORT int OVRAPPPoECheckStatus(int index);
/* Writes the local address of the first PPPoE link that is up. The last two: 0. Returns 0 on
 * success. */
OVRA_NET_EXPORT int OVRAPPPoeNetInfoGet(char *buffer, int size, int unit, int flags);

#ifdef __cplusplus
}
#endif
