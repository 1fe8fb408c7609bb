// SPDX-License-Identifier: Apache-2.0
// Faults of rules that can be seen in their records.
#ifndef VELDFWCTL_RULELINT_H
#define VELDFWCTL_RULELINT_H

#include <veldfirewall/fwRecords.h>

#include <functional>
#include <set>
#include <string>
#include <vector>

#include "model/commandOrigin.h"
#include "model/ruleRequest.h"

namespace veldfwctl {

/// One fault of a profile.
struct Finding {
    std::string kind;  ///< a word for scripts: "service", "country", "adapter", "address", "shadowed", ...
    std::string adapter;
    size_t number = 0;  ///< of the rule in its adapter's list, from 1; 0 when no rule is to blame
    std::string name;   ///< of the rule
    std::string where;  ///< the place in words
    std::string why;
    std::string mend;  ///< what to do
};

/// Whether a service can be used in rules.
enum class ServiceState { UNKNOWN, SWITCHED_OFF, USABLE };

/// What the system knows, asked only for what a profile names.
struct LintKnowledge {
    std::set<std::string> adapters;  ///< those that rules can be bound to now
    std::function<ServiceState(const std::string &service)> service;
    std::function<CountryData(const std::string &country)> country;
};

/// A fault of a rule, or with number 0 of an adapter's default policy.
Finding findingAt(const std::string &kind, const RuleCommands &rule, const std::string &why, const std::string &mend);

/// The faults in a profile's records. Rules that are switched off have none.
/// @param rules all rules of the profile with the commands that they yield, in the order of ruleCommandsBuild()
std::vector<Finding> recordsLint(const FW::FWPROFILE &profile, const std::vector<RuleCommands> &rules,
                                 const LintKnowledge &system);

}  // namespace veldfwctl

#endif
