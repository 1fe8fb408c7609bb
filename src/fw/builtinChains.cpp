// SPDX-License-Identifier: Apache-2.0
// The commands that set the policy of the built-in chains.
#include "fw/builtinChains.h"

#include <string>

#include "veldfirewall/fwRecords.h"

namespace FW {

Json::Value builtinPolicyCommands(const char *policy) {
    Json::Value commands;
    for (const char *family : {"v4", "v6"}) {
        for (const char *chain : {"INPUT", "FORWARD"}) {
            commands[family][FW_ADAPTER_GLOBAL].append(std::string("--policy ") + chain + " " + policy);
        }
    }
    return commands;
}

}  // namespace FW
