// SPDX-License-Identifier: Apache-2.0
// Edits of a profile's rule lists.
#include "fw/ruleListEdit.h"

#include <algorithm>

namespace FW {

namespace {

bool isReservedRule(const FWRULE &rule) {
    return rule.portGroup == FW_PORT_GROUP_RESERVED && rule.ipGroup == FW_IP_GROUP_ANY;
}

FWRULE reservedRule(const std::string &servName, FW_POLICY policy) {
    FWRULE rule;
    rule.policy = policy;
    rule.name = "Service";
    rule.ipType = FW_IP_TYPE_BOTH;
    rule.ipGroup = FW_IP_GROUP_ANY;
    rule.portGroup = FW_PORT_GROUP_RESERVED;
    rule.protocol = FW_PROTO_TCP_UDP;
    rule.portList = {servName};
    return rule;
}

void firstOccurrenceErase(std::vector<std::string> &names, const std::string &name) {
    const auto found = std::find(names.begin(), names.end(), name);
    if (found != names.end()) {
        names.erase(found);
    }
}

void deadRulesErase(std::vector<FWRULE> &rules) {
    rules.erase(std::remove_if(rules.begin(), rules.end(),
                               [](const FWRULE &rule) { return isServiceRule(rule) && rule.portList.empty(); }),
                rules.end());
}

template <typename Value>
bool keyRename(std::map<std::string, Value> &entries, const std::string &oldKey, const std::string &newKey) {
    const auto old = entries.find(oldKey);
    if (old == entries.end()) {
        return false;
    }
    if (oldKey != newKey) {  // a rename to itself must not erase what it renames
        entries[newKey] = std::move(old->second);
        entries.erase(oldKey);
    }
    return true;
}

void serviceRuleRefresh(FWRULE &rule, const ServiceKind &kindOf) {
    bool hasTcp = false;
    bool hasUdp = false;
    const auto isGone = [&](const std::string &service) {
        const int kind = kindOf(service);
        hasTcp = hasTcp || kind == FW_PROTO_TCP;
        hasUdp = hasUdp || kind == FW_PROTO_UDP;
        return kind < 0;
    };
    std::vector<std::string> &services = rule.portList;
    services.erase(std::remove_if(services.begin(), services.end(), isGone), services.end());
    if (hasTcp || hasUdp) {
        rule.protocol = hasTcp && hasUdp ? FW_PROTO_TCP_UDP : hasTcp ? FW_PROTO_TCP : FW_PROTO_UDP;
    }
}

}  // namespace

bool isServiceRule(const FWRULE &rule) {
    return rule.portGroup == FW_PORT_GROUP_SERVICE || rule.portGroup == FW_PORT_GROUP_RESERVED;
}

void serviceReserve(FWPROFILE &profile, const std::string &adapter, const std::string &servName, FW_POLICY policy) {
    const auto known = profile.rules.find(adapter);
    if (known == profile.rules.end()) {
        profile.rules[adapter] = {reservedRule(servName, policy)};
        return;
    }
    std::vector<FWRULE> &rules = known->second;
    if (!rules.empty()) {
        FWRULE &front = rules.front();
        if (isReservedRule(front) && front.enable && front.policy == policy) {
            std::vector<std::string> &services = front.portList;
            if (std::find(services.begin(), services.end(), servName) == services.end()) {
                services.push_back(servName);
            }
            return;
        }
    }
    for (FWRULE &rule : rules) {
        if (isReservedRule(rule)) {
            firstOccurrenceErase(rule.portList, servName);
        }
    }
    deadRulesErase(rules);
    rules.insert(rules.begin(), reservedRule(servName, policy));
}

void serviceRemove(FWPROFILE &profile, const std::string &servName) {
    for (auto &[adapter, rules] : profile.rules) {
        for (FWRULE &rule : rules) {
            if (isServiceRule(rule)) {
                firstOccurrenceErase(rule.portList, servName);
            }
        }
        deadRulesErase(rules);
    }
}

bool adapterRename(FWPROFILE &profile, const std::string &oldAdapter, const std::string &newAdapter) {
    const bool hadPolicy = keyRename(profile.adapterPolicyMap, oldAdapter, newAdapter);
    keyRename(profile.rules, oldAdapter, newAdapter);
    return hadPolicy;
}

void servicesRefresh(FWPROFILE &profile, const ServiceKind &kindOf) {
    for (auto &[adapter, rules] : profile.rules) {
        for (FWRULE &rule : rules) {
            if (isServiceRule(rule)) {
                serviceRuleRefresh(rule, kindOf);
            }
        }
        deadRulesErase(rules);
    }
}

}  // namespace FW
