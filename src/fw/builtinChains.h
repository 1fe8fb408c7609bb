// SPDX-License-Identifier: Apache-2.0
// The commands that set the policy of the built-in chains.
#ifndef VELDFIREWALL_SRC_BUILTINCHAINS_H
#define VELDFIREWALL_SRC_BUILTINCHAINS_H

#include <json/value.h>

namespace FW {

/// The command list that sets INPUT and FORWARD of both families to `policy` ("DROP" or "ACCEPT").
Json::Value builtinPolicyCommands(const char *policy);

}  // namespace FW

#endif
