// SPDX-License-Identifier: Apache-2.0
// Whether a profile would block a port.
#include "fw/blockQuery.h"

#include <algorithm>
#include <cstdlib>

namespace FW {

namespace {

struct PortRange {
    long low;
    long high;
};

PortRange portRange(const std::string &text) {
    const size_t dash = text.find('-');
    const long low = std::strtol(text.substr(0, dash).c_str(), nullptr, 10);
    if (dash == std::string::npos) {
        return {low, low};
    }
    return {low, std::strtol(text.c_str() + dash + 1, nullptr, 10)};
}

bool protocolMatches(int32_t protocol, FW_POLICY rulePolicy, FW_PORT_PROTOCOL queried) {
    const bool queriedBoth = rulePolicy == FW_POLICY_DENY && queried == FW_PROTO_TCP_UDP;
    return protocol == FW_PROTO_TCP_UDP || protocol == queried || queriedBoth;
}

bool servicesMatch(const FWRULE &rule, const PortCompareST &query, const ServiceExpander &expand) {
    ServPort ports;
    if (!expand(rule.portList, ports)) {
        return false;
    }
    const int32_t direct = query.portDirect == 1 ? 1 : 0;
    const auto &side = direct == 1 ? ports.srcPorts : ports.dstPorts;
    return std::any_of(side.begin(), side.end(), [&](const auto &entry) {
        return portsMatch(direct, entry.first, entry.second, rule.policy, query);
    });
}

/// Nothing decided yet, or a default policy that the rules may still limit.
VerdictStep afterDefault(FW_POLICY verdict, FW_POLICY rulePolicy) {
    if (rulePolicy == verdict) {
        return {FW_POLICY_ALLOW, false};
    }
    switch (rulePolicy) {
    case FW_POLICY_ALLOW:
        return {VERDICT_ALLOWED_FOR_SOME, false};
    case FW_POLICY_DENY:
        return {VERDICT_DENIED_FOR_SOME, false};
    default:
        return {FW_POLICY_ALLOW, false};
    }
}

/// A rule for every address: it ends the list.
FW_POLICY afterAnySource(FW_POLICY verdict, FW_POLICY rulePolicy) {
    switch (static_cast<int>(verdict)) {
    case FW_POLICY_ALLOW:
    case FW_POLICY_DENY:
    case FW_POLICY_NONE:
        return rulePolicy;
    case VERDICT_ALLOWED_FOR_SOME:
        return rulePolicy == FW_POLICY_DENY ? VERDICT_ALLOWED_FOR_SOME : FW_POLICY_ALLOW;
    case VERDICT_DENIED_FOR_SOME:
        if (rulePolicy == FW_POLICY_ALLOW) {
            return VERDICT_DENIED_FOR_SOME;
        }
        return rulePolicy == FW_POLICY_DENY ? FW_POLICY_DENY : FW_POLICY_ALLOW;
    default:
        return FW_POLICY_ALLOW;
    }
}

/// A rule for some addresses: later rules may speak of the others.
VerdictStep afterSomeSources(FW_POLICY verdict, FW_POLICY rulePolicy) {
    switch (static_cast<int>(verdict)) {
    case FW_POLICY_ALLOW:
    case FW_POLICY_DENY:
    case FW_POLICY_NONE:
        return afterDefault(verdict, rulePolicy);
    case VERDICT_ALLOWED_FOR_SOME:
        if (rulePolicy == FW_POLICY_DENY) {
            return {FW_POLICY_PARTIAL, true};
        }
        return {FW_POLICY_ALLOW, rulePolicy != FW_POLICY_ALLOW};
    case VERDICT_DENIED_FOR_SOME:
        if (rulePolicy == FW_POLICY_ALLOW) {
            return {FW_POLICY_PARTIAL, true};
        }
        return {FW_POLICY_ALLOW, rulePolicy != FW_POLICY_DENY};
    default:
        return {FW_POLICY_ALLOW, true};
    }
}

bool isDecided(FW_POLICY verdict) {
    return verdict == FW_POLICY_ALLOW || verdict == FW_POLICY_DENY || verdict == FW_POLICY_PARTIAL;
}

int severity(FW_POLICY verdict) {
    switch (static_cast<int>(verdict)) {
    case FW_POLICY_DENY:
        return 3;
    case FW_POLICY_PARTIAL:
        return 2;
    case FW_POLICY_ALLOW:
        return 1;
    default:
        return 0;
    }
}

}  // namespace

VerdictStep verdictAfter(FW_POLICY verdict, bool anySource, FW_POLICY rulePolicy) {
    return anySource ? VerdictStep{afterAnySource(verdict, rulePolicy), true} : afterSomeSources(verdict, rulePolicy);
}

bool portsMatch(int32_t portDirect, int32_t protocol, const std::vector<std::string> &ports, FW_POLICY rulePolicy,
                const PortCompareST &query) {
    if (portDirect != query.portDirect || !protocolMatches(protocol, rulePolicy, query.protocol)) {
        return false;
    }
    const PortRange queried = portRange(query.port);
    return std::any_of(ports.begin(), ports.end(), [&](const std::string &port) {
        const PortRange range = portRange(port);
        return rulePolicy == FW_POLICY_DENY ? range.high >= queried.low && range.low <= queried.high
                                            : range.low <= queried.low && range.high >= queried.high;
    });
}

bool ruleMatches(const FWRULE &rule, const PortCompareST &query, const ServiceExpander &expand) {
    if (!rule.enable) {
        return false;
    }
    switch (rule.portGroup) {
    case FW_PORT_GROUP_PORT:
        return portsMatch(rule.portDirect, rule.protocol, rule.portList, rule.policy, query);
    case FW_PORT_GROUP_SERVICE:
    case FW_PORT_GROUP_RESERVED:
        return servicesMatch(rule, query, expand);
    case FW_PORT_GROUP_ANY:
        return true;
    default:
        return false;
    }
}

FW_POLICY ruleListEvaluate(const std::vector<FWRULE> &rules, const PortCompareST &query, FW_POLICY verdict,
                           const ServiceExpander &expand) {
    for (const FWRULE &rule : rules) {
        if (!ruleMatches(rule, query, expand)) {
            continue;
        }
        const VerdictStep step = verdictAfter(verdict, rule.ipGroup == FW_IP_GROUP_ANY, rule.policy);
        verdict = step.verdict;
        if (step.stop) {
            break;
        }
    }
    return verdict;
}

void profileEvaluate(const FWPROFILE &profile, const PortCompareST &query, const std::string &adapter,
                     const ServiceExpander &expand, PolicyMap &result) {
    const PolicyMap &defaults = profile.adapterPolicyMap;
    const bool allAdapters = adapter.empty();
    result[FW_ADAPTER_GLOBAL] = FW_POLICY_NONE;
    for (const auto &[name, policy] : defaults) {
        if (allAdapters || name == adapter) {
            result[name] = policy;
        }
    }

    const auto globalRules = profile.rules.find(FW_ADAPTER_GLOBAL);
    if (globalRules != profile.rules.end()) {
        FW_POLICY &global = result[FW_ADAPTER_GLOBAL];
        global = ruleListEvaluate(globalRules->second, query, global, expand);
        if (isDecided(global)) {
            const FW_POLICY decided = global;
            if (!allAdapters) {
                result[adapter] = decided;
                return;
            }
            for (const auto &[name, policy] : defaults) {
                result[name] = decided;
            }
            return;
        }
    }
    if (!allAdapters && defaults.count(adapter) == 0) {
        result[adapter] = FW_POLICY_ALLOW;
        if (globalRules == profile.rules.end()) {
            return;
        }
    }
    for (const auto &[name, rules] : profile.rules) {
        if (allAdapters || name == adapter) {
            FW_POLICY &verdict = result[name];
            verdict = ruleListEvaluate(rules, query, verdict, expand);
        }
    }
    for (auto &[name, verdict] : result) {
        if (verdict == VERDICT_ALLOWED_FOR_SOME || verdict == VERDICT_DENIED_FOR_SOME) {
            verdict = FW_POLICY_PARTIAL;
        }
    }
}

std::vector<PortCompareST> serviceQueries(const ServPort &ports) {
    std::vector<PortCompareST> queries;
    const auto append = [&](int32_t direct, const std::map<FW_PORT_PROTOCOL, std::vector<std::string>> &side) {
        for (const auto &[protocol, list] : side) {
            for (const std::string &port : list) {
                queries.push_back({direct, protocol, port});
            }
        }
    };
    append(1, ports.srcPorts);
    append(0, ports.dstPorts);
    return queries;
}

void verdictsMerge(const PolicyMap &verdicts, PolicyMap &result) {
    for (const auto &[adapter, verdict] : verdicts) {
        FW_POLICY &merged = result.emplace(adapter, verdict).first->second;
        if (severity(verdict) > severity(merged)) {
            merged = verdict;
        }
    }
}

}  // namespace FW
