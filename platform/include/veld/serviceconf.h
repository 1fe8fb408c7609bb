/* SPDX-License-Identifier: Apache-2.0 */
/* libveldserviceconf: the registry of network services and their ports. */
#ifndef VELD_SERVICECONF_H
#define VELD_SERVICECONF_H

#include "veld/core.h"

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/* Protocols of a port list. */
#define VELDFW_SERVICE_TCP 1
#define VELDFW_SERVICE_UDP 2
#define VELDFW_SERVICE_TCP_UDP 3
#define VELDFW_SERVICE_ICMP 4
#define VELDFW_SERVICE_IGMP 32

typedef struct VELDFWService {
    const char *szName;
    int data;         /* 0: the record is empty, not to be used */
    int protocolKind; /* protocol of the destination list, of the source list when that one is empty */
    int srcProtocol;
    PVLIBCSZLIST srcPorts; /* ports "80" and ranges "1000-2000"; never NULL */
    int dstProtocol;
    PVLIBCSZLIST dstPorts;
} VELDFWSERVICE;

typedef struct VELDFWServiceList *VELDFWSERVICE_HANDLE;

/* Reads the registry: the number of services, 0 or negative on failure (with *handle NULL). */
int VELDFwServiceEnum(VELDFWSERVICE_HANDLE *handle);
/* The record of that name, owned by the handle, or NULL. */
const VELDFWSERVICE *VELDFWServiceFind(VELDFWSERVICE_HANDLE handle, const char *name);
/* Frees the registry and its records; NULL is allowed. */
void VELDFwServiceFree(VELDFWSERVICE_HANDLE handle);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
