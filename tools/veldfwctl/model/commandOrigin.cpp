// SPDX-License-Identifier: Apache-2.0
// Leads an iptables command back to the rule that it was made from.
#include "model/commandOrigin.h"

#include <veldfirewall/fwIptables.h>

#include <algorithm>

namespace veldfwctl {

namespace {

constexpr const char *IPTABLES = "/sbin/iptables ";
constexpr const char *IP6TABLES = "/sbin/ip6tables ";

bool translate(FW::VELDFW_IPTABLES_RULES &translator, const std::map<std::string, std::vector<FW::FWRULE>> &rules,
               const std::map<std::string, FW::FW_POLICY> &policies, std::vector<std::string> &commands) {
    Json::Value list;
    translator.jIptablesCmdInit(list);
    const bool succeeded = translator.fwRulesToIptablesRules(false, rules, policies, list);
    commands = commandsInOrder(list);
    return succeeded;
}

}  // namespace

std::vector<std::string> commandsInOrder(const Json::Value &commandList) {
    std::vector<std::string> commands;
    const auto groupAppend = [&commands](const char *program, const Json::Value &group) {
        for (const Json::Value &arguments : group) {
            commands.push_back(program + arguments.asString());
        }
    };
    for (const auto &[program, family] : {std::pair(IPTABLES, "v4"), std::pair(IP6TABLES, "v6")}) {
        const Json::Value &section = commandList[family];
        if (!section.isObject()) {
            continue;
        }
        groupAppend(program, section[FW::FW_ADAPTER_GLOBAL]);
        for (auto group = section.begin(); group != section.end(); ++group) {
            if (group.name() != FW::FW_ADAPTER_GLOBAL) {
                groupAppend(program, *group);
            }
        }
    }
    return commands;
}

std::vector<RuleCommands> ruleCommandsBuild(const FW::FWPROFILE &profile) {
    FW::VELDFW_IPTABLES_RULES translator;
    std::vector<std::string> preamble;  // comes with every translation
    translate(translator, {}, {}, preamble);

    std::vector<RuleCommands> all;
    const auto ruleAppend = [&](const std::string &adapter, size_t number, const std::string &name,
                                const std::map<std::string, std::vector<FW::FWRULE>> &rules,
                                const std::map<std::string, FW::FW_POLICY> &policies) {
        RuleCommands entry{adapter, number, name, {}, true};
        std::vector<std::string> commands;
        entry.isTranslated = translate(translator, rules, policies, commands);
        // None of the commands of a rule or a policy is one of the preamble: those end in "-j ACCEPT".
        for (std::string &command : commands) {
            if (std::find(preamble.begin(), preamble.end(), command) == preamble.end()) {
                entry.commands.push_back(std::move(command));
            }
        }
        all.push_back(std::move(entry));
    };
    std::map<std::string, std::vector<FW::FWRULE>> rulesAndPolicies = profile.rules;
    for (const auto &entry : profile.adapterPolicyMap) {
        rulesAndPolicies[entry.first];
    }
    for (const auto &[adapter, rules] : rulesAndPolicies) {
        for (size_t i = 0; i < rules.size(); ++i) {
            ruleAppend(adapter, i + 1, rules[i].name, {{adapter, {rules[i]}}}, {});
        }
        if (const auto policy = profile.adapterPolicyMap.find(adapter); policy != profile.adapterPolicyMap.end()) {
            ruleAppend(adapter, 0, "", {}, {*policy});
        }
    }
    return all;
}

std::optional<RuleCommands> commandOrigin(const std::vector<RuleCommands> &rules, const std::string &command) {
    for (const RuleCommands &rule : rules) {
        if (std::find(rule.commands.begin(), rule.commands.end(), command) != rule.commands.end()) {
            return rule;
        }
    }
    return std::nullopt;
}

std::string originText(const RuleCommands &origin) {
    const std::string name = origin.name.empty() ? "" : " \"" + origin.name + "\"";
    return "adapter " + origin.adapter + ", " +
           (origin.number == 0 ? "default policy" : "rule " + std::to_string(origin.number) + name);
}

}  // namespace veldfwctl
