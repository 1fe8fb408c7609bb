// SPDX-License-Identifier: Apache-2.0
// Block queries beside a naive model: tables of states instead of branches, ports as sets of numbers.
#include "fw/blockQuery.h"

#include <array>
#include <bitset>

#include "check.h"

using veldfuzz::Bytes;
using veldfuzz::check;

namespace {

constexpr int MOST_PORTS = 16;
using PortSet = std::bitset<MOST_PORTS>;

PortSet setOf(int low, int high) {
    PortSet ports;
    for (int port = low; port <= high; ++port) {
        ports.set(static_cast<size_t>(port));
    }
    return ports;
}

struct Ports {
    std::string text;
    PortSet set;
};

Ports drawPorts(Bytes &bytes) {
    const int low = bytes.below(MOST_PORTS);
    if (bytes.below(2) == 0) {
        return {std::to_string(low), setOf(low, low)};
    }
    const int high = low + bytes.below(MOST_PORTS - low);
    return {std::to_string(low) + "-" + std::to_string(high), setOf(low, high)};
}

struct ModelRule {
    FW::FWRULE rule;
    std::vector<PortSet> sets;
};

/// The service "s" of every run.
FW::ServPort servicePorts() {
    FW::ServPort ports;
    ports.srcPorts[FW::FW_PROTO_UDP] = {"3"};
    ports.dstPorts[FW::FW_PROTO_TCP] = {"1-4", "9"};
    ports.dstPorts[FW::FW_PROTO_TCP_UDP] = {"12"};
    return ports;
}

bool portsMatch(int side, int protocol, const std::vector<PortSet> &sets, bool denies, const FW::PortCompareST &query,
                const PortSet &asked) {
    const bool protocolMatches = protocol == query.protocol || protocol == 3 || (denies && query.protocol == 3);
    bool matches = false;
    for (const PortSet &set : sets) {
        matches = matches || (denies ? (set & asked).any() : (asked & ~set).none());
    }
    return side == query.portDirect && protocolMatches && matches;
}

bool ruleMatches(const ModelRule &model, const FW::PortCompareST &query, const PortSet &asked) {
    const FW::FWRULE &rule = model.rule;
    const bool denies = rule.policy == FW::FW_POLICY_DENY;
    if (!rule.enable || rule.portGroup > 3) {
        return false;
    }
    if (rule.portGroup == 3) {
        return true;
    }
    if (rule.portGroup == 1) {
        return portsMatch(rule.portDirect, rule.protocol, model.sets, denies, query, asked);
    }
    if (rule.portList.empty()) {
        return false;
    }
    return query.portDirect == 1 ? portsMatch(1, 2, {setOf(3, 3)}, denies, query, asked)
                                 : portsMatch(0, 1, {setOf(1, 4), setOf(9, 9)}, denies, query, asked) ||
                                       portsMatch(0, 3, {setOf(12, 12)}, denies, query, asked);
}

/// By state and policy (allow, deny, none): the next state, and 10 more where the list ends.
constexpr std::array<std::array<int, 3>, 6> ANY_SOURCE = {
    {{10, 11, 12}, {10, 11, 12}, {10, 11, 12}, {10, 10, 10}, {10, 14, 10}, {15, 11, 10}}};
constexpr std::array<std::array<int, 3>, 6> SOME_SOURCES = {
    {{0, 5, 0}, {4, 0, 0}, {4, 5, 0}, {10, 10, 10}, {0, 13, 10}, {13, 0, 10}}};

int evaluate(const std::vector<ModelRule> &rules, const FW::PortCompareST &query, const PortSet &asked, int state) {
    for (const ModelRule &model : rules) {
        if (!ruleMatches(model, query, asked)) {
            continue;
        }
        const auto &table = model.rule.ipGroup == 5 ? ANY_SOURCE : SOME_SOURCES;
        const int next = table.at(static_cast<size_t>(state)).at(static_cast<size_t>(model.rule.policy));
        state = next % 10;
        if (next >= 10) {
            break;
        }
    }
    return state;
}

using ModelRules = std::map<std::string, std::vector<ModelRule>>;

std::map<std::string, int> expected(const FW::FWPROFILE &profile, const ModelRules &rules,
                                    const FW::PortCompareST &query, const PortSet &asked, const std::string &adapter) {
    std::map<std::string, int> result = {{"global", 2}};
    for (const auto &[name, policy] : profile.adapterPolicyMap) {
        if (adapter.empty() || adapter == name) {
            result[name] = policy;
        }
    }
    const auto global = rules.find("global");
    if (global != rules.end()) {
        const int outcome = evaluate(global->second, query, asked, result["global"]);
        result["global"] = outcome;
        if (outcome == 0 || outcome == 1 || outcome == 3) {
            for (const auto &[name, policy] : profile.adapterPolicyMap) {
                if (adapter.empty()) {
                    result[name] = outcome;
                }
            }
            if (!adapter.empty()) {
                result[adapter] = outcome;
            }
            return result;
        }
    }
    if (!adapter.empty() && profile.adapterPolicyMap.count(adapter) == 0) {
        result[adapter] = 0;
        if (global == rules.end()) {
            return result;
        }
    }
    for (const auto &[name, list] : rules) {
        if (adapter.empty() || adapter == name) {
            result[name] = evaluate(list, query, asked, result[name]);
        }
    }
    for (auto &[name, verdict] : result) {
        verdict = verdict > 3 ? 3 : verdict;
    }
    return result;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    Bytes bytes(data, size);
    const std::vector<std::string> adapters = {"global", "eth0", "pppoe"};
    FW::PortCompareST query;
    query.portDirect = bytes.below(2);
    query.protocol = static_cast<FW::FW_PORT_PROTOCOL>(1 + bytes.below(4));
    const Ports asked = drawPorts(bytes);
    query.port = asked.text;
    const auto adapter = bytes.oneOf<std::string>({"", "global", "eth0", "pppoe", "absent"});
    FW::FWPROFILE profile;
    for (const std::string &name : adapters) {
        const int policy = bytes.below(4);
        if (policy < 3 && name != "global") {
            profile.adapterPolicyMap[name] = static_cast<FW::FW_POLICY>(policy);
        }
    }
    profile.adapterPolicyMap["global"] = FW::FW_POLICY_NONE;
    ModelRules model;
    while (!bytes.isEmpty()) {
        ModelRule drawn;
        FW::FWRULE &rule = drawn.rule;
        const std::string name = bytes.oneOf(adapters);
        rule.enable = bytes.below(8) != 0;
        rule.policy = static_cast<FW::FW_POLICY>(bytes.below(3));
        rule.ipGroup = bytes.below(2) == 0 ? 5 : bytes.below(7);
        rule.portGroup = bytes.below(5);
        rule.portDirect = bytes.below(2);
        rule.protocol = 1 + bytes.below(4);
        for (int count = bytes.below(4); count > 0; --count) {
            const Ports ports = drawPorts(bytes);
            rule.portList.push_back(rule.portGroup == 1 ? ports.text : "s");
            drawn.sets.push_back(ports.set);
        }
        profile.rules[name].push_back(rule);
        model[name].push_back(drawn);
    }
    const FW::ServiceExpander expand = [](const std::vector<std::string> &services, FW::ServPort &ports) {
        if (!services.empty()) {
            ports = servicePorts();
        }
        return true;
    };
    FW::PolicyMap verdicts;
    FW::profileEvaluate(profile, query, adapter, expand, verdicts);
    std::map<std::string, int> found(verdicts.begin(), verdicts.end());
    check(found == expected(profile, model, query, asked.set, adapter), "the verdicts are those of the model");
    return 0;
}
