// SPDX-License-Identifier: Apache-2.0
// Which rule of a profile a command comes from.
#ifndef VELDFIREWALL_SRC_COMMANDORIGIN_H
#define VELDFIREWALL_SRC_COMMANDORIGIN_H

#include <string>

#include "veldfirewall/fwRecords.h"

namespace FW {

struct CommandOrigin {
    std::string adapter;
    int32_t rulePosition;
    std::string ruleName;
};

/// Finds the first rule of the profile that translates into the command, by translating rule after rule.
/// @param arguments of the command, as the command list has them
/// @return false when none does: the command belongs to the preamble, or to a default policy
bool commandOriginFind(const FWPROFILE &profile, const std::string &family, const std::string &arguments,
                       CommandOrigin &origin);

}  // namespace FW

#endif
