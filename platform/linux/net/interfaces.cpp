// SPDX-License-Identifier: Apache-2.0
// VLIBNetGetInterfaceInfo(): the interfaces that firewall rules can be bound to.
#include "veld/net.h"

#include "common/log.h"
#include "net/routeDump.h"

int VLIBNetGetInterfaceInfo(VLIBNETINTERFACEINFO *records, int max, int kind) {
    return veld::guarded(__func__, -1, [&] {
        if (records == nullptr || max < 0 || kind != VLIBNET_KIND_ALL) {
            VELD_SET_ERROR(veld::kBadParameter);
            return -1;
        }
        std::vector<veld::Link> links;
        if (const int error = veld::readLinks(links); error != 0) {
            VELD_LOG(LOG_ERR, "the kernel does not tell its interfaces: %s", veld::errorText(error).c_str());
            VELD_SET_ERROR(veld::systemErrorCode(error));
            return -1;
        }
        int count = 0;
        for (const veld::Link &link : links) {
            if ((link.flags & IFF_LOOPBACK) != 0)
                continue;
            if (count == max)
                break;
            VLIBNETINTERFACEINFO &record = records[count++];
            record = {};
            link.name.copy(record.szName, sizeof record.szName - 1);
            record.index = link.index;
            record.flags = link.flags;
        }
        return count;
    });
}
