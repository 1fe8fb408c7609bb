// SPDX-License-Identifier: Apache-2.0
// A plan as rules over packets.
#ifndef VELDFWCTL_RULESET_H
#define VELDFWCTL_RULESET_H

#include <string>
#include <vector>

#include "model/packetRules.h"
#include "system/plan.h"

namespace veldfwctl {

/// rules[i] is plan[i].
struct Ruleset {
    Plan plan;
    std::vector<std::string> interfaceNames;
    InterfaceNumbers interfaces{{}};
    std::vector<PacketRule> rules;
};

/// @param interfaces names that are asked about, beside those in the plan
Ruleset rulesetBuild(Plan plan, const std::vector<std::string> &interfaces);

}  // namespace veldfwctl

#endif
