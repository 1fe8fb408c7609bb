/* SPDX-License-Identifier: Apache-2.0 */
/*
 * Plain functions for programs that do not use the classes; C11 and C++.
 *
 * Strings are NUL-terminated, read only during the call and never kept. Unless a function says otherwise it returns 0
 * on success and -1 on failure, and the reason is in the system log, except for a NULL or empty argument. Calls block
 * until the work is done. Nothing is thrown.
 */
#ifndef VELDFIREWALL_C_H
#define VELDFIREWALL_C_H

#include "veldfirewall/export.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Brings the stored profiles in line with the registered services, then applies the active profile if the firewall is
 * on. No reload after a failed update. */
VELDFIREWALL_API int VELDFwRuleHup(void);

/* Switches the firewall off. A failure is only in the log. */
VELDFIREWALL_API void VELDFwReset(void);

/* Takes a service out of every service rule of every profile; rules left without one are dropped. Does not reload. NULL
 * gives -1. */
VELDFIREWALL_API int VLIBFwServRemoveRec(const char *servName);

/* Moves rules and default policy of one adapter to another name in every profile; reload == 1 applies the active
 * profile if it was concerned, other values do not. newAdapter NULL gives -1; oldAdapter must not be NULL. */
VELDFIREWALL_API int VLIBFwChangeAdatper(const char *oldAdapter, const char *newAdapter, int reload);

/* Whether all ports of a service are open: 1 yes, 0 no (also when only some source addresses are blocked), -1 error.
 * adapter NULL means all adapters of the active profile. servName NULL gives -1 and sets the platform's last error to
 * 0x0D00 (bad parameter). */
VELDFIREWALL_API int VELDFwPortsCheckAllowByAdapter(const char *adapter, const char *servName);

/* Reserves a rule for services, a comma-separated list, on the adapter "global" of every profile: allow 0 denies, other
 * values allow. reload == 1 applies the active profile afterwards. Stops at the first service that fails; those before
 * it stay. servList NULL or empty gives -1 and sets the platform's last error to 0x0D00. */
VELDFIREWALL_API int VLIBFwRuleReserveServInsert(const char *servList, int allow, int reload);

/* Load or unload the iptables kernel modules on behalf of an owner: core, or core and NAT. NULL gives -1. */
VELDFIREWALL_API int VELDIptablesCodeModeLoad(const char *servName);
VELDFIREWALL_API int VELDIptablesCoreModUnload(const char *servName);
VELDFIREWALL_API int VELDIptablesNATModLoad(const char *servName);
VELDFIREWALL_API int VELDIptablesNATModUnload(const char *servName);

#ifdef __cplusplus
}
#endif

#endif
