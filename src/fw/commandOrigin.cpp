// SPDX-License-Identifier: Apache-2.0
// Which rule of a profile a command comes from.
#include "fw/commandOrigin.h"

#include <json/value.h>

#include "veldfirewall/fwIptables.h"

namespace FW {

namespace {

constexpr const char *IGNORED_ADAPTER = "ppp0";  // its rules are not translated; those of "pppoe" look the same

bool isInAnyGroup(const Json::Value &section, const std::string &arguments) {
    for (const Json::Value &group : section) {
        for (const Json::Value &command : group) {
            if (command.asString() == arguments) {
                return true;
            }
        }
    }
    return false;
}

}  // namespace

bool commandOriginFind(const FWPROFILE &profile, const std::string &family, const std::string &arguments,
                       CommandOrigin &origin) {
    VELDFW_IPTABLES_RULES translator;
    for (const auto &[adapter, rules] : profile.rules) {
        if (adapter == IGNORED_ADAPTER) {
            continue;
        }
        for (size_t i = 0; i < rules.size(); ++i) {
            const FWRULE &rule = rules[i];
            if (!rule.enable || rule.policy == FW_POLICY_NONE || !translator.adapterIsEnabled(adapter)) {
                continue;
            }
            Json::Value args;
            Json::Value commands;
            translator.iptablesRulesInit(args);
            if (!translator.FwRuleToIptablesArg(adapter, rule, args)) {
                continue;
            }
            translator.iptablesArgToCmd(adapter, rule, args, commands);
            translator.iptables6in4ToCmd(adapter, rule, commands);
            if (isInAnyGroup(commands[family], arguments)) {
                origin = {adapter, static_cast<int32_t>(i), rule.name};
                return true;
            }
        }
    }
    return false;
}

}  // namespace FW
