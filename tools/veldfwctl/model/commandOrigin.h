// SPDX-License-Identifier: Apache-2.0
// Leads an iptables command back to the rule that it was made from.
#ifndef VELDFWCTL_COMMANDORIGIN_H
#define VELDFWCTL_COMMANDORIGIN_H

#include <json/value.h>
#include <veldfirewall/fwRecords.h>

#include <optional>
#include <string>
#include <vector>

namespace veldfwctl {

/// The commands of one rule, or of the default policy of an adapter.
struct RuleCommands {
    std::string adapter;
    size_t number = 0;  ///< position of the rule in its adapter's list, from 1; 0 for the default policy
    std::string name;
    std::vector<std::string> commands;  ///< with the program: "/sbin/iptables -t filter ..."
    bool isTranslated = true;           ///< false: the library cannot convert the rule
};

/// Translates a profile rule by rule, with the library's own translation, in the order of the whole translation.
std::vector<RuleCommands> ruleCommandsBuild(const FW::FWPROFILE &profile);

/// The first rule that yields exactly this command (program and arguments).
std::optional<RuleCommands> commandOrigin(const std::vector<RuleCommands> &rules, const std::string &command);

/// "adapter eth0, rule 3 \"old scanner\"" or "adapter eth0, default policy".
std::string originText(const RuleCommands &origin);

/// The commands of a command list as the library runs them one after another, with their programs.
std::vector<std::string> commandsInOrder(const Json::Value &commandList);

}  // namespace veldfwctl

#endif
