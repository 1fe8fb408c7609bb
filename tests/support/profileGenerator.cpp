// SPDX-License-Identifier: Apache-2.0
// Drawn profiles.
#include "profileGenerator.h"

namespace veldtest {

using namespace FW;

std::string hostAddress(const std::string &adapter, int host, bool isV6) {
    const std::string net = adapter == "eth1" ? "2" : "1";
    return (isV6 ? "fd00:" + net + "::" : "10." + net + ".0.") + std::to_string(host);
}

FWPROFILE ProfileGenerator::profile(const std::string &name, int rulesPerAdapter) {
    FWPROFILE profile;
    profile.name = name;
    for (const std::string adapter : {"global", "eth0", "eth1"}) {
        const int count = below(adapter == "global" ? rulesPerAdapter / 2 + 1 : rulesPerAdapter + 1);
        for (int i = 0; i < count; ++i) {
            profile.rules[adapter].push_back(rule(adapter));
            profile.rules[adapter].back().name = adapter + " " + std::to_string(i + 1);
        }
        profile.adapterPolicyMap[adapter] =
            adapter == "global" && chance(80) ? FW_POLICY_NONE : static_cast<FW_POLICY>(below(3));
    }
    return profile;
}

FWPROFILE ProfileGenerator::wildProfile(const std::string &name, int rulesPerAdapter) {
    FWPROFILE profile = this->profile(name, rulesPerAdapter);
    profile.rules["vpn"] = {rule("eth0"), rule("eth1")};
    profile.rules["absent"] = {rule("eth0")};
    for (auto &[adapter, rules] : profile.rules) {
        for (FWRULE &rule : rules) {
            rule.name = "a \"name\" " + std::to_string(below(1000));
            rule.labelList = {"a \"label\"", "#"};
            rule.policy = oneOf<FW_POLICY>({FW_POLICY_ALLOW, FW_POLICY_DENY, FW_POLICY_NONE});
            rule.table = oneOf<std::string>({"filter", "filter", "filter", "filter", "mangle", "raw"});
            if (chance(2)) {
                rule.ipType = FW_IP_TYPE_BOTH;  // one family refuses the address
            }
        }
    }
    return profile;
}

FWPROFILE ProfileGenerator::exactProfile(const std::string &name) {
    FWPROFILE profile;
    profile.name = name;
    for (const std::string adapter : {"eth0", "eth1", "global"}) {
        const bool isGlobal = adapter == "global";
        const FW_POLICY start = isGlobal ? FW_POLICY_NONE : oneOf<FW_POLICY>({FW_POLICY_ALLOW, FW_POLICY_DENY});
        profile.adapterPolicyMap[adapter] = start;
        std::vector<FWRULE> &rules = profile.rules[adapter];
        for (int count = 1 + below(isGlobal ? 1 : 5); count > 0; --count) {
            FWRULE rule;
            rule.enable = chance(92);
            rule.policy = oneOf<FW_POLICY>({FW_POLICY_ALLOW, FW_POLICY_DENY});
            rule.ipType = chance(80) ? FW_IP_TYPE_V4 : FW_IP_TYPE_BOTH;
            rule.ipGroup = FW_IP_GROUP_ANY;
            limitPorts(rule);
            rules.push_back(rule);
        }
        FWRULE some = rules.front();
        some.ipType = FW_IP_TYPE_V4;
        some.ipGroup = FW_IP_GROUP_NETWORK;
        some.ipList = {"10.0.0." + std::to_string(2 + below(4)), "255.0.0.255"};  // that host behind every adapter
        if (!isGlobal) {
            some.policy = start == FW_POLICY_DENY ? FW_POLICY_ALLOW : FW_POLICY_DENY;
            some.portList.clear();
            limitPorts(some);
        }
        rules.insert(rules.begin(), some);
    }
    return profile;
}

FWRULE ProfileGenerator::rule(const std::string &adapter) {
    FWRULE rule;
    rule.policy = chance(50) ? FW_POLICY_ALLOW : FW_POLICY_DENY;
    rule.enable = chance(90);
    rule.blLog = chance(10);
    rule.adapterDirect = chance(92) ? 1 : 0;
    if (chance(8)) {
        rule.chainList = {chance(50) ? FW_CHAIN_INPUT : FW_CHAIN_FORWARD};
    }
    limitAddress(rule, adapter);
    limitPorts(rule);
    return rule;
}

void ProfileGenerator::limitAddress(FWRULE &rule, const std::string &adapter) {
    const std::string behind = adapter == "global" ? (chance(50) ? "eth0" : "eth1") : adapter;
    const bool isV6 = chance(40);
    const int first = 2 + below(4);
    const int last = first + below(6 - first);
    rule.ipType = isV6 ? FW_IP_TYPE_V6 : FW_IP_TYPE_V4;
    rule.ipDirect = chance(85) ? 1 : 0;
    switch (below(5)) {
    case 0:
        rule.ipGroup = FW_IP_GROUP_ADDRESS;
        rule.ipList = {hostAddress(behind, rule.ipDirect != 0 ? first : 1, isV6)};
        break;
    case 1:
        rule.ipGroup = FW_IP_GROUP_NETWORK;
        rule.ipList = {hostAddress(behind, first, isV6), std::to_string((isV6 ? 128 : 32) - below(4))};
        break;
    case 2:
        rule.ipGroup = FW_IP_GROUP_RANGE;
        rule.ipList = {hostAddress(behind, first, isV6), hostAddress(behind, last, isV6)};
        break;
    case 3:  // a mask with a hole: that host behind every adapter
        rule.ipGroup = FW_IP_GROUP_NETWORK;
        rule.ipType = FW_IP_TYPE_V4;
        rule.ipList = {"10.0.0." + std::to_string(first), chance(50) ? "255.0.0.255" : "255.255.255.0"};
        break;
    default:
        rule.ipGroup = FW_IP_GROUP_ANY;
        rule.ipType = chance(50) ? FW_IP_TYPE_BOTH : rule.ipType;
    }
}

std::string ProfileGenerator::range(int first, int last) {
    const int low = first + below(last - first + 1);
    const int high = chance(40) ? low + below(last - low + 1) : low;
    return std::to_string(low) + (high > low ? "-" + std::to_string(high) : "");
}

void ProfileGenerator::limitPorts(FWRULE &rule) {
    static const std::vector<std::string> services = {
        "ftp", "ssh", "smtp", "dns", "vpn_server_ipsec", "no-such-service"};
    switch (below(5)) {
    case 0:
        rule.portGroup = FW_PORT_GROUP_ANY;
        break;
    case 1:
        rule.portGroup = chance(50) ? FW_PORT_GROUP_SERVICE : FW_PORT_GROUP_RESERVED;
        for (int count = 1 + below(3); count > 0; --count) {
            rule.portList.push_back(oneOf(services));
        }
        break;
    case 2:
        rule.portGroup = FW_PORT_GROUP_PORT;
        rule.protocol = chance(70) ? FW_PROTO_ICMP : FW_PROTO_IGMP;
        break;
    default:
        rule.portGroup = FW_PORT_GROUP_PORT;
        rule.protocol = 1 + below(3);
        rule.portDirect = chance(20) ? 1 : 0;
        for (int count = 1 + below(10); count > 0; --count) {
            rule.portList.push_back(rule.portDirect == 1 ? range(701, 703) : range(21, 28));
        }
    }
}

}  // namespace veldtest
