// SPDX-License-Identifier: Apache-2.0
// The commands that an application of a profile runs.
#include "system/plan.h"

#include <map>

#include "frame/libraryCall.h"
#include "system/store.h"

namespace veldfwctl {

Plan planBuild(const std::string &profile) {
    const FW::FWPROFILE stored = profileRead(profile);
    Json::Value commands;
    std::vector<RuleCommands> rules;
    require("Cannot translate profile \"" + profile + "\"", "run \"veldfwctl lint\" to see which rule is at fault",
            [&] { return FW::VELDFW().fwIptablesRulesEnum(profile, commands, true); });
    require("Cannot translate the rules of profile \"" + profile + "\"", "look at the system log", [&] {
        rules = ruleCommandsBuild(stored);
        return true;
    });
    // Rules can yield the same command; the order among these is that of the rules.
    std::map<std::string, std::vector<const RuleCommands *>> origins;
    for (const RuleCommands &rule : rules) {
        for (const std::string &command : rule.commands) {
            origins[command].push_back(&rule);
        }
    }
    std::map<std::string, size_t> seen;
    Plan plan;
    for (const char *family : {"v4", "v6"}) {
        std::vector<std::string> groups = {FW::FW_ADAPTER_GLOBAL};
        for (const std::string &group :
             commands[family].isObject() ? commands[family].getMemberNames() : std::vector<std::string>()) {
            if (group != FW::FW_ADAPTER_GLOBAL) {
                groups.push_back(group);
            }
        }
        for (const std::string &group : groups) {
            Json::Value one;
            one[family][group] = commands[family].isObject() ? commands[family][group] : Json::Value();
            for (const std::string &command : commandsInOrder(one)) {
                PlannedCommand planned{family == std::string("v6"), group, command, std::nullopt};
                const auto &candidates = origins[command];
                if (const size_t which = seen[command]++; which < candidates.size()) {
                    planned.origin = *candidates[which];
                }
                plan.push_back(std::move(planned));
            }
        }
    }
    return plan;
}

std::string plannedText(const PlannedCommand &planned) {
    return planned.origin ? originText(*planned.origin) : "the firewall's own rule";
}

Json::Value originJson(const PlannedCommand &planned) {
    Json::Value json;
    if (planned.origin) {
        json["adapter"] = planned.origin->adapter;
        json["number"] = static_cast<Json::UInt64>(planned.origin->number);
        json["name"] = planned.origin->name;
    }
    return json;
}

std::vector<std::string> familyCommands(const Plan &plan, bool isV6) {
    std::vector<std::string> commands;
    for (const PlannedCommand &planned : plan) {
        if (planned.isV6 == isV6) {
            commands.push_back(planned.command);
        }
    }
    return commands;
}

}  // namespace veldfwctl
