// SPDX-License-Identifier: Apache-2.0
// Rules and policies in an administrator's words.
#include "model/ruleText.h"

#include <veldfirewall/fwDB.h>

#include <set>

#include "frame/errors.h"
#include "model/numbers.h"
#include "model/ports.h"

namespace veldfwctl {

std::string policyText(FW::FW_POLICY policy) {
    switch (policy) {
    case FW::FW_POLICY_ALLOW:
        return "allow";
    case FW::FW_POLICY_DENY:
        return "deny";
    case FW::FW_POLICY_NONE:
        return "none";
    case FW::FW_POLICY_PARTIAL:
        return "partly";
    }
    return "policy " + std::to_string(policy);
}

FW::FW_POLICY policyParse(const std::string &text) {
    for (const FW::FW_POLICY policy : {FW::FW_POLICY_ALLOW, FW::FW_POLICY_DENY, FW::FW_POLICY_NONE}) {
        if (text == policyText(policy)) {
            return policy;
        }
    }
    throw UsageError("\"" + text + "\" is no policy; use allow, deny or none");
}

Shade policyShade(FW::FW_POLICY policy) {
    switch (policy) {
    case FW::FW_POLICY_ALLOW:
        return Shade::GOOD;
    case FW::FW_POLICY_DENY:
    case FW::FW_POLICY_PARTIAL:
        return Shade::BAD;
    default:
        return Shade::FAINT;
    }
}

std::string ruleAddressText(const FW::FWRULE &rule) {
    const std::string side = rule.ipDirect != 0 ? "from " : "to ";
    switch (rule.ipGroup) {
    case FW::FW_IP_GROUP_ADDRESS:
        return side + (rule.ipList.empty() ? "?" : rule.ipList.front());
    case FW::FW_IP_GROUP_NETWORK:
        return side + join(rule.ipList, "/");
    case FW::FW_IP_GROUP_NONE:
        return "nothing";
    case FW::FW_IP_GROUP_COUNTRY:
        return side + "country " + join(rule.ipList, ",");
    case FW::FW_IP_GROUP_RANGE:
        return side + join(rule.ipList, "-");
    case FW::FW_IP_GROUP_ANY:
        return rule.ipType == FW::FW_IP_TYPE_BOTH ? "any" : rule.ipType == FW::FW_IP_TYPE_V6 ? "any IPv6" : "any IPv4";
    default:
        return "address kind " + std::to_string(rule.ipGroup);
    }
}

std::string rulePortText(const FW::FWRULE &rule) {
    switch (rule.portGroup) {
    case FW::FW_PORT_GROUP_SERVICE:
        return "service " + join(rule.portList, ",");
    case FW::FW_PORT_GROUP_RESERVED:
        return "reserved " + join(rule.portList, ",");
    case FW::FW_PORT_GROUP_ANY:
        return "any";
    case FW::FW_PORT_GROUP_PORT:
        if (rule.protocol == FW::FW_PROTO_ICMP || rule.protocol == FW::FW_PROTO_IGMP) {
            return protocolText(rule.protocol);
        }
        return (rule.portDirect != 0 ? "source port " : "port ") + portsText(rule.protocol, rule.portList);
    default:
        return "port kind " + std::to_string(rule.portGroup);
    }
}

std::string ruleText(const FW::FWRULE &rule) {
    std::string text = policyText(rule.policy) + " " + ruleAddressText(rule);
    if (rule.portGroup != FW::FW_PORT_GROUP_ANY) {
        text += " " + rulePortText(rule);
    }
    text += rule.adapterDirect != 0 ? "" : ", outgoing";
    text += rule.blLog ? ", log" : "";
    text += rule.enable ? "" : ", disabled";
    return text + (rule.name.empty() ? "" : ", \"" + rule.name + "\"");
}

Json::Value ruleJson(const std::string &adapter, size_t number, const FW::FWRULE &rule) {
    Json::Value stored;
    FW::VELDFW_JSON_DB().ruleListToJson({{adapter, {rule}}}, stored);
    Json::Value json;
    json["adapter"] = adapter;
    json["number"] = static_cast<Json::UInt64>(number);
    json["text"] = ruleText(rule);
    json["rule"] = stored[adapter][0];
    json["rule"]["ruleIndex"] = static_cast<Json::UInt64>(number - 1);
    return json;
}

Table ruleTable(const FW::FWPROFILE &profile, const std::string &adapter) {
    Table table;
    table.headings = {"ADAPTER", "NO", "STATE", "ACTION", "ADDRESS", "PORTS", "LOG", "NAME"};
    std::set<std::string> adapters;
    for (const auto &entry : profile.rules) {
        adapters.insert(entry.first);
    }
    for (const auto &entry : profile.adapterPolicyMap) {
        adapters.insert(entry.first);
    }
    for (const std::string &name : adapters) {
        if (!adapter.empty() && name != adapter) {
            continue;
        }
        if (const auto rules = profile.rules.find(name); rules != profile.rules.end()) {
            size_t number = 0;
            for (const FW::FWRULE &rule : rules->second) {
                table.rows.push_back({name + (rule.adapterDirect != 0 ? "" : " (out)"),
                                      std::to_string(++number),
                                      {rule.enable ? "on" : "off", rule.enable ? Shade::PLAIN : Shade::FAINT},
                                      {policyText(rule.policy), policyShade(rule.policy)},
                                      ruleAddressText(rule),
                                      rulePortText(rule),
                                      rule.blLog ? "log" : "-",
                                      rule.name});
            }
        }
        const auto policy = profile.adapterPolicyMap.find(name);
        if (policy != profile.adapterPolicyMap.end() && policy->second != FW::FW_POLICY_NONE) {
            table.rows.push_back({name,
                                  "-",
                                  "on",
                                  {policyText(policy->second), policyShade(policy->second)},
                                  "any",
                                  "any",
                                  "-",
                                  "(default policy)"});
        }
    }
    return table;
}

}  // namespace veldfwctl
