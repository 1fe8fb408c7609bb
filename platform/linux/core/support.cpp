// SPDX-License-Identifier: Apache-2.0
// Capabilities of the system.
#include "veld/core.h"

int VLIBCSupportGet(const char *key) {
    return VLIBCFileCheckKeyValue("/etc.defaults/veldinfo.conf", key, "yes", 0);
}
