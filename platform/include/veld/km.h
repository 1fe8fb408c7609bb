/* SPDX-License-Identifier: Apache-2.0 */
/* libveldkm: kernel modules. */
#ifndef VELD_KM_H
#define VELD_KM_H

#include "veld/core.h"

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/* Insert, remove the modules of `list` (file names such as "xt_mac.ko") in list order on behalf of `owner`, which is
 * only used for messages. 0 on success, negative on failure. Empty names are skipped. */
int VLIBIptablesModInsert(const char *owner, const VLIBCSZLIST *list);
int VLIBIptablesModRemove(const char *owner, const VLIBCSZLIST *list);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
