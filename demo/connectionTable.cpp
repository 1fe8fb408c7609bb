// SPDX-License-Identifier: Apache-2.0
// The connections of the demonstration: what the profile says of each and what the network does.
#include "connectionTable.h"

#include <veldfirewall/veldFW.h>

#include <cstdio>
#include <map>
#include <stdexcept>

namespace demo {
namespace {

const char *toText(FW::FW_POLICY verdict) {
    switch (verdict) {
    case FW::FW_POLICY_ALLOW:
        return "open";
    case FW::FW_POLICY_DENY:
        return "blocked";
    case FW::FW_POLICY_PARTIAL:
        return "by source";
    case FW::FW_POLICY_NONE:
        break;
    }
    return "undecided";
}

FW::FW_POLICY askLibrary(const Row &row) {
    FW::PortCompareST query;
    query.protocol = row.protocol;
    query.port = std::to_string(row.port);
    std::map<std::string, FW::FW_POLICY> verdicts;
    if (!FW::VELDFW().fwPortIsBlocked(query, "eth0", verdicts))
        throw std::runtime_error("the block query failed");
    return verdicts.at("eth0");
}

veldtest::ProbeResult askNetwork(const Row &row, const veldtest::NetworkNamespace &client) {
    if (row.lasting) {
        // Its packets may have been dropped while the rules were replaced; TCP sends them again, ever more slowly.
        return row.lasting->exchange(std::chrono::seconds(10));
    }
    const veldtest::ProbeTarget target = {row.addresses->appliance, row.port, row.source};
    return row.protocol == FW::FW_PROTO_UDP ? veldtest::probeUdp(target, &client) : veldtest::probeTcp(target, &client);
}

/// A verdict and a decision that cannot both be right: "by source" leaves it to the rules.
bool contradict(FW::FW_POLICY verdict, const Decision &decision) {
    return (verdict == FW::FW_POLICY_ALLOW && !decision.allowed) ||
           (verdict == FW::FW_POLICY_DENY && decision.allowed) || verdict == FW::FW_POLICY_NONE;
}

}  // namespace

std::vector<Row> makeRows(const veldtest::NetworkNamespace &client, const FW::FWPROFILE &profile) {
    const auto tcp = FW::FW_PROTO_TCP;
    const auto udp = FW::FW_PROTO_UDP;
    const auto allow = FW::FW_POLICY_ALLOW;
    const auto deny = FW::FW_POLICY_DENY;
    const auto partial = FW::FW_POLICY_PARTIAL;
    std::vector<Row> rows;
    for (const auto *family : {&addressesV4, &addressesV6}) {
        const std::vector<Row> added = {
            {family, "allowed port, from outside", family->outside, tcp, portHttps, allow, true, {}, {}, {}},
            {family, "denied port, from the local network", family->local, tcp, portTelnet, deny, false, {}, {}, {}},
            {family, "file sharing, from the local network", family->local, tcp, portSmb, partial, true, {}, {}, {}},
            {family, "file sharing, from a denied address", family->denied, tcp, portSmb, partial, false, {}, {}, {}},
            {family, "file sharing, from outside", family->outside, tcp, portSmb, partial, false, {}, {}, {}},
            {family, "name service, from the local network", family->local, udp, portDns, partial, true, {}, {}, {}},
            {family, "name service, from outside", family->outside, udp, portDns, partial, false, {}, {}, {}},
            {family,
             "established, on the denied port",
             family->local,
             tcp,
             portTelnet,
             deny,
             true,
             std::make_shared<veldtest::Connection>(veldtest::ProbeTarget{family->appliance, portTelnet, family->local},
                                                    &client),
             {},
             {}}};
        rows.insert(rows.end(), added.begin(), added.end());
    }
    for (auto &row : rows)
        row.decision = decide(profile, {row.source, row.protocol, row.port});
    return rows;
}

void observe(std::vector<Row> &rows, const veldtest::NetworkNamespace &client) {
    for (auto &row : rows)
        row.observations.push_back({askLibrary(row), askNetwork(row, client)});
}

int printTable(const std::vector<Row> &rows) {
    int wrong = 0;
    const Addresses *family = nullptr;
    const char *const format = "  %-37s %-15s %-8s| %-9s -> %-11s| %-9s %-30s -> %-11s| %-9s -> %-11s%s\n";
    for (const auto &row : rows) {
        if (row.addresses != family) {
            family = row.addresses;
            std::printf("\n  %s, to %s\n", family == &addressesV4 ? "IPv4" : "IPv6", family->appliance);
            std::printf("  %-62s| %-24s| %-55s| %s\n", "", "before", "while enabled", "after disabling");
            std::printf(format, "connection", "from", "port", "profile", "network", "profile", "deciding rule",
                        "network", "profile", "network", "");
        }
        int wrongHere = 0;
        for (size_t i = 0; i < row.observations.size(); ++i) {
            const bool on = static_cast<Phase>(i) == Phase::enabled;
            const auto &seen = row.observations[i];
            const auto network =
                !on || row.connects ? veldtest::ProbeResult::connected : veldtest::ProbeResult::timedOut;
            wrongHere += seen.network != network ? 1 : 0;
            wrongHere += seen.verdict != (on ? row.verdict : FW::FW_POLICY_ALLOW) ? 1 : 0;
        }
        // A lasting connection is let through before any rule is asked.
        const bool kept = row.lasting != nullptr;
        if (contradict(row.verdict, row.decision) || (!kept && row.decision.allowed != row.connects))
            ++wrongHere;
        const auto rule = kept ? "established traffic" : row.decision.rule;
        const std::string port = std::to_string(row.port) + (row.protocol == FW::FW_PROTO_UDP ? "/udp" : "/tcp");
        const auto &seen = row.observations;
        std::printf(format, row.title, row.source, port.c_str(), toText(seen.at(0).verdict),
                    veldtest::toText(seen.at(0).network), toText(seen.at(1).verdict), rule.c_str(),
                    veldtest::toText(seen.at(1).network), toText(seen.at(2).verdict),
                    veldtest::toText(seen.at(2).network), wrongHere > 0 ? " <-- NOT AS EXPECTED" : "");
        wrong += wrongHere;
    }
    return wrong;
}

}  // namespace demo
