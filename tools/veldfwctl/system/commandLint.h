// SPDX-License-Identifier: Apache-2.0
// Faults of a profile that only its commands show.
#ifndef VELDFWCTL_COMMANDLINT_H
#define VELDFWCTL_COMMANDLINT_H

#include <string>
#include <vector>

#include "model/packetQuery.h"
#include "model/ruleLint.h"
#include "system/ruleset.h"

namespace veldfwctl {

/// Rules with a command that is longer than the library runs.
std::vector<Finding> limitsLint(const Plan &plan);

/// Rules that never decide, because earlier ones take all their packets.
std::vector<Finding> shadowsLint(const Ruleset &ruleset);

/// What drops the packets by which the machine is being administered.
std::vector<Finding> clientLint(const Ruleset &ruleset, const PacketQuery &query);

}  // namespace veldfwctl

#endif
