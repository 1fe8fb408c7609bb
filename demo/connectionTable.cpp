// SPDX-License-Identifier: Apache-2.0
// The connections of the demonstration: what the profile says of each and what the network does.
#include "connectionTable.h"

#include <veldfirewall/veldFW.h>

#include <array>
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
            {family, "allowed port", family->outside, tcp, portHttps, allow, true, {}, {}, {}},
            {family, "denied port", family->local, tcp, portTelnet, deny, false, {}, {}, {}},
            {family, "file sharing", family->local, tcp, portSmb, partial, true, {}, {}, {}},
            {family, "file sharing", family->denied, tcp, portSmb, partial, false, {}, {}, {}},
            {family, "file sharing", family->outside, tcp, portSmb, partial, false, {}, {}, {}},
            {family, "name service", family->local, udp, portDns, partial, true, {}, {}, {}},
            {family, "name service", family->outside, udp, portDns, partial, false, {}, {}, {}},
            {family,
             "session since before",
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

namespace {

/// Expected against seen, of one row. @return number of differences
int countWrong(const Row &row) {
    int wrong = 0;
    for (size_t i = 0; i < row.observations.size(); ++i) {
        const bool on = static_cast<Phase>(i) == Phase::enabled;
        const auto &seen = row.observations[i];
        const auto network = !on || row.connects ? veldtest::ProbeResult::connected : veldtest::ProbeResult::timedOut;
        wrong += seen.network != network ? 1 : 0;
        wrong += seen.verdict != (on ? row.verdict : FW::FW_POLICY_ALLOW) ? 1 : 0;
    }
    // A lasting connection is let through before any rule of the profile is asked.
    if (contradict(row.verdict, row.decision) || (!row.lasting && row.decision.allowed != row.connects))
        ++wrong;
    return wrong;
}

/// One line of the table; also the head, so that the columns agree.
void printLine(const std::array<std::string, 10> &cells) {
    constexpr std::array<int, 10> widths = {23, 7, 7, 6, 9, 6, 30, 9, 9, 9};
    for (size_t i = 0; i < cells.size(); ++i)
        std::printf("%s%-*s", i == 3 || i == 7 ? " | " : "  ", widths.at(i), cells.at(i).c_str());
    std::printf("\n");
}

void printFamily(const Addresses &family) {
    std::printf("\n  %s: appliance %s; client local %s, denied %s, outside %s\n",
                &family == &addressesV4 ? "IPv4" : "IPv6", family.appliance, family.local, family.denied,
                family.outside);
    printLine({"", "", "", "the profile says", "", "", "", "the network did", "", ""});
    printLine(
        {"connection", "from", "port", "before", "enabled", "after", "deciding rule", "before", "enabled", "after"});
}

std::string sourceName(const Row &row) {
    return row.source == row.addresses->local ? "local" : row.source == row.addresses->denied ? "denied" : "outside";
}

}  // namespace

int printTable(const std::vector<Row> &rows) {
    int wrong = 0;
    const Addresses *family = nullptr;
    for (const auto &row : rows) {
        if (row.addresses != family)
            printFamily(*(family = row.addresses));
        const int wrongHere = countWrong(row);
        const std::string port = std::to_string(row.port) + (row.protocol == FW::FW_PROTO_UDP ? "/udp" : "/tcp");
        // The sign is what the rule does to a new connection.
        const std::string decision =
            row.lasting ? "+ established traffic" : (row.decision.allowed ? "+ " : "- ") + row.decision.rule;
        const auto &seen = row.observations;
        printLine({row.title, sourceName(row), port, toText(seen.at(0).verdict), toText(seen.at(1).verdict),
                   toText(seen.at(2).verdict), decision, veldtest::toText(seen.at(0).network),
                   veldtest::toText(seen.at(1).network), veldtest::toText(seen.at(2).network)});
        if (wrongHere > 0)
            std::printf("  ^^^ %d results of this line are NOT AS EXPECTED\n", wrongHere);
        wrong += wrongHere;
    }
    return wrong;
}

}  // namespace demo
