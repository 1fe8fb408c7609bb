// SPDX-License-Identifier: Apache-2.0
// The plain functions of the tool, as a table in cases/model.cases.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <veldfirewall/veldFW.h>

#include <functional>
#include <map>
#include <random>
#include <regex>
#include <set>

#include "caseTable.h"
#include "frame/errors.h"
#include "frame/libraryCall.h"
#include "model/addresses.h"
#include "model/applyFailure.h"
#include "model/backupDocument.h"
#include "model/chainSetup.h"
#include "model/diagnosis.h"
#include "model/kernelChains.h"
#include "model/numbers.h"
#include "model/packetQuery.h"
#include "model/packetWalk.h"
#include "model/ports.h"
#include "model/progressText.h"
#include "model/restoreText.h"
#include "model/ruleDrift.h"
#include "model/ruleEdit.h"
#include "model/table.h"
#include "toolFixture.h"

namespace veldfwctl {
namespace {

using testing::HasSubstr;
using Parts = std::vector<std::string>;

const std::vector<std::string> INTERFACES = {"eth0", "eth1", "lo", "tun0"};

NumberSet countryAddresses(const std::string &country, bool isV6) {
    return country == "DE" && !isV6
               ? NumberSet({{{0, 0x0A000000}, {0, 0x0A0001FF}}, {{0, 0xC0000200}, {0, 0xC0000202}}})
               : NumberSet();
}

/// Rules in short, all for INPUT_FIREWALL unless they begin with "F ": "-i eth0 -j DROP".
std::vector<PacketRule> rulesOf(const Parts &shortRules, bool isV6) {
    std::vector<PacketRule> rules;
    for (const std::string &text : shortRules) {
        const bool isForward = text.rfind("F ", 0) == 0;
        rules.push_back(
            packetRuleParse(std::string("/sbin/iptables -A ") +
                                (isForward ? "FORWARD_FIREWALL " + text.substr(2) : "INPUT_FIREWALL " + text),
                            isV6, InterfaceNumbers(INTERFACES), countryAddresses));
    }
    return rules;
}

std::string decide(const Parts &parts) {
    Parts packet = split(parts[0], ' ');
    packet.resize(3);
    PacketQuery query;
    query.from = packet[0];
    query.toPort = packet[1];
    query.in = packet[2];
    const PacketSet packets = query.packets(InterfaceNumbers(INTERFACES));
    const auto rules = rulesOf({parts.begin() + 1, parts.end()}, query.isV6());
    Parts deciders;
    for (const Decision &decision : packetsDecide(packets, rules, query.isV6(), "INPUT_FIREWALL")) {
        const bool isEnd = decision.rule == Decision::CHAIN_END;
        deciders.push_back((isEnd ? "end" : std::to_string(decision.rule + 1)) + (decision.isCertain ? "" : "?"));
    }
    return join(deciders, " ");
}

Shadow shadowOf(const std::vector<PacketRule> &rules, size_t index) {
    const bool isForward = rules[index].chain == "FORWARD_FIREWALL";
    return shadowFind(rules, index, packetUniverse(false, isForward, InterfaceNumbers(INTERFACES)));
}

std::string shadow(const Parts &parts) {
    const Shadow found = shadowOf(rulesOf(parts, false), parts.size() - 1);
    Parts by;
    for (const size_t index : found.by) {
        by.push_back(std::to_string(index + 1));
    }
    EXPECT_EQ(found.isShadowed, found.isImpossible || !by.empty());
    return found.isImpossible ? "impossible" : join(by, " ");
}

std::string move(const Parts &parts) {
    FW::FWPROFILE profile;
    for (const char *name : {"a", "b", "c", "d"}) {
        profile.rules["eth0"].emplace_back().name = name;
    }
    ruleMove(profile, parts[0], std::stoi(parts[1]), std::stoi(parts[2]));
    Parts names;
    for (const FW::FWRULE &rule : profile.rules["eth0"]) {
        names.push_back(rule.name);
    }
    return join(names, " ");
}

std::string drift(const Parts &parts) {
    Parts texts;
    for (const Drift &found : driftFind(split(parts[0], ' '), split(parts[1], ' '))) {
        texts.push_back(found.kind == Drift::Kind::MISSING ? "-" + std::to_string(found.expected)
                        : found.kind == Drift::Kind::FOREIGN
                            ? "+" + std::to_string(found.live)
                            : "~" + std::to_string(found.live) + ">" + std::to_string(found.expected));
    }
    return join(texts, " ");
}

std::string setup(const Parts &parts) {
    const ChainPlan plan = chainPlanMake(
        "-P INPUT ACCEPT\n-N INPUT_FIREWALL\n-N FORWARD_FIREWALL\n-A FORWARD -j FORWARD_FIREWALL\n" + parts[0]);
    const std::string changes = std::regex_replace(plan.restoreInput, std::regex("\\*filter\n|COMMIT\n"), "");
    return plan.items[1].lack + (changes.empty() ? "" : ": ") + changes;
}

std::string chain(const Parts &parts) {
    const auto found = kernelChainsParse(parts[1]).at(parts[0]);
    return std::to_string(found.rules) + " rules, " + std::to_string(found.droppedPackets) + " dropped" +
           (found.isReached ? ", reached" : "");
}

std::string backup(const Json::Value &changes) {
    Json::Value document = veldtest::parseJson(R"({"config_version": 1, "config_profiles": {"1.json": {"name": "p"}},
                                                   "config_firewall_settings": {"status": true, "profile": "p"}})");
    for (const std::string &member : changes.getMemberNames()) {
        document[member] = changes[member];
    }
    return join(backupProblems(document), "; ");
}

const std::map<std::string, std::function<std::string(const Parts &)>> FUNCTIONS = {
    {"address",
     [](const Parts &parts) {
         const AddressMatch match = addressMatchParse(parts[0]);
         return join({std::to_string(match.ipGroup), std::to_string(match.ipType), join(match.ipList, " ")}, " ");
     }},
    {"ports",
     [](const Parts &parts) {
         const PortMatch match = portMatchParse(split(parts[0], ' '));
         return portsText(match.protocol, match.ports);
     }},
    {"networks",
     [](const Parts &parts) {
         return join(rangeNetworks(*addressFromText(parts[0]), *addressFromText(parts[1])), " ");
     }},
    {"move", move},
    {"drift", drift},
    {"restore", restoreTextWrite},
    {"setup", setup},
    {"others",
     [](const Parts &parts) {
         const auto findings = othersJudge({parts[0]}, parts[1], parts[2]);
         return std::to_string(static_cast<int>(findings.at(0).verdict)) + " " + findings[0].text;
     }},
    {"modules",
     [](const Parts &parts) {
         const Parts loaded = split(parts[1], ' ');
         return join(modulesMissing(split(parts[0], ' '), {loaded.begin(), loaded.end()}, split(parts[2], ',')), " ");
     }},
    {"chain", chain},
    {"messages", [](const Parts &parts) { return join(logMessagesParse(parts[0]), ";"); }},
    {"failed",
     [](const Parts &parts) {
         const FailedCommand failed = failedCommandFind(parts);
         return failed.command + ": " + failed.said + ": " + messagesJoin(failed.rest);
     }},
    {"progress",
     [](const Parts &parts) {
         const Parts commands = {"a", "b", "a", "c"};
         return std::to_string(commandsDone(commands, std::stoul(parts[0]), parts[1]));
     }},
    {"backup",
     [](const Parts &parts) {
         Json::Value changes;
         changes["config_profiles"][parts[0]] = veldtest::parseJson(parts[1]);
         return backup(changes);
     }},
    {"backup with", [](const Parts &parts) { return backup(veldtest::parseJson(parts[0])); }},
    {"decide", decide},
    {"shadow", shadow},
};

TEST(Model, EachFunctionGivesWhatTheTableSays) {
    for (const auto &row : veldtest::readCases(VELD_CASES "model.cases", 3)) {
        SCOPED_TRACE(row[0] + ": " + row[1]);
        const auto unfold = [](const std::string &text) {
            const bool isQuoted = text.size() > 1 && text.front() == '"' && text.back() == '"';
            const std::string inside = isQuoted ? text.substr(1, text.size() - 2) : text;
            return std::regex_replace(inside, std::regex("\\\\n"), "\n");
        };
        std::string result;
        try {
            result = FUNCTIONS.at(row[0])(split(unfold(row[1]), ';'));
        } catch (const UsageError &error) {
            result = std::string("refused: ") + error.what();
        } catch (const std::runtime_error &error) {
            result = std::string("failed: ") + error.what();
        }
        if (row[2].rfind("~ ", 0) == 0) {
            EXPECT_THAT(result, HasSubstr(row[2].substr(2)));
        } else {
            EXPECT_EQ(unfold(row[2]), result);
        }
    }
}

TEST(Table, IsAlignedByCharactersAndCannotBeSteeredByItsContent) {
    const Table table{{"NAME", "X"}, {{"Zürich", "1"}, {{"a\033[2Jb", Shade::BAD}, "2\t3"}}};
    EXPECT_EQ("NAME    X\nZürich  1\na [2Jb  2 3\n", tableText(table, false));
    EXPECT_EQ("Zürich\t1\na [2Jb\t2 3\n", tableFields(table));
    EXPECT_THAT(tableText(table, true), HasSubstr("\033[31ma [2Jb\033[0m"));
    EXPECT_LT(progressLine("Applying", 2, 4, 3, 40).size(), 40u);
}

TEST(NumberSet, KeepsItsRangesApart) {
    const NumberSet ports({{{0, 20}, {0, 30}}, {{0, 31}, {0, 40}}, {{0, 9}, {0, 5}}, {{0, 50}, {0, 60}}});
    EXPECT_EQ(2u, ports.ranges().size());
    EXPECT_EQ(NumberSet::range(35, 40).unite(NumberSet::range(50, 55)), ports.intersect(NumberSet::range(35, 55)));
    EXPECT_EQ(ports, ports.complement().complement());
    EXPECT_EQ(NumberSet::all(), NumberSet().complement());
    EXPECT_FALSE(ports.meets(NumberSet::range(41, 49)));
    // Across the halves of a number.
    const Number low = {0, ~uint64_t{0}};
    const Number high = {1, 0};
    EXPECT_EQ(1u, NumberSet({{low, low}, {high, high}}).ranges().size());
    EXPECT_EQ(NumberSet({{high, {~uint64_t{0}, ~uint64_t{0}}}}), NumberSet({{{0, 0}, low}}).complement());
}

TEST(ShadowFind, NeverBlamesARuleThatDecidesForSomePacket) {
    // Few values, so that rules often take each other's packets.
    const Parts ins = {"", "-i eth0 ", "-i eth1 "};
    const Parts sources = {"", "-s 10.0.0.0/30 ", "-s 10.0.0.2 ", "-d 10.0.0.0/31 ",
                           "-m iprange --src-range 10.0.0.1-10.0.0.2 "};
    const Parts ports = {"", "-p tcp -m multiport --dports 21:23 ", "-p tcp --dport 22 ", "-p udp --dport 22 "};
    std::mt19937 random(1);
    const auto oneOf = [&random](const Parts &values) { return values[random() % values.size()]; };
    int shadowed = 0;
    int alive = 0;
    for (int round = 0; round < 60; ++round) {
        Parts shortRules;
        for (int i = 0; i < 12; ++i) {
            shortRules.push_back(oneOf(ins) + oneOf(sources) + oneOf(ports) + "-j DROP");
        }
        const std::vector<PacketRule> rules = rulesOf(shortRules, false);
        std::set<size_t> deciding;
        for (unsigned packet = 0; packet < 3 * 2 * 4 * 4 * 4; ++packet) {
            PacketQuery query;
            query.in = Parts{"eth0", "eth1", "tun0"}[packet % 3];
            query.from = "10.0.0." + std::to_string(packet / 6 % 4);
            query.to = "10.0.0." + std::to_string(packet / 24 % 4);
            query.toPort = std::to_string(21 + packet / 96) + (packet / 3 % 2 == 0 ? "/tcp" : "/udp");
            query.fromPort = "1000";
            deciding.insert(
                packetsDecide(query.packets(InterfaceNumbers(INTERFACES)), rules, false, "INPUT_FIREWALL")[0].rule);
        }
        for (size_t i = 0; i < rules.size(); ++i) {
            const bool isShadowed = shadowOf(rules, i).isShadowed;
            (isShadowed ? shadowed : alive) += 1;
            EXPECT_FALSE(isShadowed && deciding.count(i) != 0) << i + 1 << ": " << join(shortRules, "; ");
        }
    }
    EXPECT_GT(shadowed, 50);
    EXPECT_GT(alive, 50);
}

}  // namespace
}  // namespace veldfwctl
