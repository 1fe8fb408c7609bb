// SPDX-License-Identifier: Apache-2.0
// The commands that an application of a profile runs.
#ifndef VELDFWCTL_PLAN_H
#define VELDFWCTL_PLAN_H

#include <json/value.h>

#include <optional>
#include <string>
#include <vector>

#include "model/commandOrigin.h"

namespace veldfwctl {

/// One command and where it comes from.
struct PlannedCommand {
    bool isV6 = false;
    std::string group;                   ///< adapter, or the interface of a tunnel, as the command list has it
    std::string command;                 ///< program and arguments
    std::optional<RuleCommands> origin;  ///< nothing for the firewall's own rules
};

/// The commands in the order in which they are run.
using Plan = std::vector<PlannedCommand>;

/// Builds them as an application does. @throws Failure when the library cannot; UsageError for an unknown profile
Plan planBuild(const std::string &profile);

/// "adapter eth0, rule 3 \"old scanner\"", or "the firewall's own rule".
std::string plannedText(const PlannedCommand &planned);
/// {"adapter", "number", "name"}, 0 for a default policy; null for the firewall's own rules.
Json::Value originJson(const PlannedCommand &planned);

/// The commands of one family, in order.
std::vector<std::string> familyCommands(const Plan &plan, bool isV6);

}  // namespace veldfwctl

#endif
