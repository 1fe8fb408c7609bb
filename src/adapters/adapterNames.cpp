// SPDX-License-Identifier: Apache-2.0
// The interfaces of the system that rules can be bound to.
#include "adapters/adapterNames.h"

#include <veld/core.h>
#include <veld/net.h>

#include <array>

namespace FW {

namespace {

constexpr int INTERFACE_LIMIT = 32;
constexpr const char *WIRELESS_KEY = "support_wireless";
constexpr const char *SYSTEM_INFORMATION_FILE = "/etc.defaults/veldinfo.conf";
constexpr const char *WIRELESS_ADAPTER = "wlan0";

}  // namespace

int adapterNamesRead(std::vector<std::string> &names) {
    std::array<VLIBNETINTERFACEINFO, INTERFACE_LIMIT> records = {};
    const int count = VLIBNetGetInterfaceInfo(records.data(), INTERFACE_LIMIT, VLIBNET_KIND_ALL);
    if (count < 0) {
        return count;
    }
    for (int i = 0; i < count; ++i) {
        names.emplace_back(records[static_cast<size_t>(i)].szName);
    }
    if (VLIBCSupportGet(WIRELESS_KEY) != 0 &&
        VLIBCFileCheckKeyValue(SYSTEM_INFORMATION_FILE, WIRELESS_KEY, "yes", 0) != 0) {
        names.emplace_back(WIRELESS_ADAPTER);
    }
    return count;
}

}  // namespace FW
