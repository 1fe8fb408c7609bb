// SPDX-License-Identifier: Apache-2.0
// The inner functions behind block queries (the state table row by row, port matches, the order of lists, the merge)
// and behind edits of rule lists, as tables.
#include "caseTable.h"
#include "fw/blockQuery.h"
#include "fw/ruleListEdit.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>
#include <veldfirewall/fwDB.h>

using namespace FW;
using namespace veldtest;

namespace {

const std::string caseDirectory = VELD_CASE_DIRECTORY;
const PortCompareST tcp80 = {0, FW_PROTO_TCP, "80"};

FW_POLICY policyOf(int number) {
    return static_cast<FW_POLICY>(number);
}

bool noServices(const std::vector<std::string> &, ServPort &) {
    ADD_FAILURE() << "no service was to be expanded";
    return false;
}

FWRULE portRule(int policy, const std::string &port, int ipGroup = FW_IP_GROUP_ANY) {
    FWRULE rule;
    rule.policy = policyOf(policy);
    rule.ipGroup = ipGroup;
    rule.portGroup = FW_PORT_GROUP_PORT;
    rule.portList = {port};
    return rule;
}

TEST(StateTable, EveryRowHolds) {
    const auto rows = readCases(caseDirectory + "stateTable.cases", 3);
    EXPECT_EQ(rows.size(), 8u);
    for (const auto &row : rows) {
        for (const bool anySource : {true, false}) {
            std::string after;
            for (const int policy : {0, 1, 2, 3, 9}) {
                const VerdictStep step = verdictAfter(policyOf(std::stoi(row[0])), anySource, policyOf(policy));
                const std::string state = std::to_string(static_cast<int>(step.verdict)) + (step.stop ? "!" : " ");
                after += (after.empty() ? "" : " ") + state;
            }
            after.erase(after.find_last_not_of(' ') + 1);
            EXPECT_EQ(after, row[anySource ? 1 : 2]) << "state " << row[0] << ", any source " << anySource;
        }
    }
}

TEST(PortMatch, IsStrictForAllowAndLooseForDeny) {
    for (const auto &row : readCases(caseDirectory + "portMatches.cases", 8)) {
        const auto number = [&](size_t column) { return std::stoi(row[column]); };
        const PortCompareST query = {number(4), static_cast<FW_PORT_PROTOCOL>(number(5)), row[6]};
        const bool matches = portsMatch(number(1), number(2), split(row[3], ','), policyOf(number(0)), query);
        EXPECT_EQ(matches, row[7] == "yes") << testing::PrintToString(row);
    }
}

TEST(RuleMatch, FollowsThePortGroup) {
    const std::map<std::string, int> groups = {{"port", FW_PORT_GROUP_PORT},
                                               {"any", FW_PORT_GROUP_ANY},
                                               {"service", FW_PORT_GROUP_SERVICE},
                                               {"reserved", FW_PORT_GROUP_RESERVED},
                                               {"9", 9}};
    const auto expand = [](const std::vector<std::string> &names, ServPort &ports) {
        EXPECT_EQ(names, (std::vector<std::string>{"web", "mail"}));
        ports.srcPorts[FW_PROTO_UDP] = {"500"};
        ports.dstPorts[FW_PROTO_TCP] = {"25", "80-90"};
        ports.dstPorts[FW_PROTO_TCP_UDP] = {"53"};
        return true;
    };
    for (const auto &row : readCases(caseDirectory + "ruleMatches.cases", 3)) {
        FWRULE rule = portRule(1, "80");
        rule.portGroup = groups.at(split(row[0], ' ')[0]);
        rule.enable = split(row[0], ' ').size() == 1;
        if (rule.portGroup == FW_PORT_GROUP_SERVICE || rule.portGroup == FW_PORT_GROUP_RESERVED) {
            rule.portDirect = 1;
            rule.protocol = FW_PROTO_IGMP;
            rule.portList = {"web", "mail"};
        }
        const auto query = split(row[1], ' ');
        const PortCompareST compared = {std::stoi(query[0]), static_cast<FW_PORT_PROTOCOL>(std::stoi(query[1])),
                                        query[2]};
        EXPECT_EQ(ruleMatches(rule, compared, expand), row[2] == "yes") << testing::PrintToString(row);
    }
}

TEST(RuleList, EveryAddressGroupButAnyIsForSomeSources) {
    for (const int group : {0, 1, 2, 3, 4, 6})
        EXPECT_EQ(ruleListEvaluate({portRule(1, "80", group)}, tcp80, FW_POLICY_ALLOW, noServices), 5) << group;
}

/// "eth0=1 global=2"
PolicyMap policiesOf(const std::string &text) {
    PolicyMap policies;
    for (const std::string &word : split(text, ' '))
        policies[split(word, '=')[0]] = policyOf(std::stoi(split(word, '=')[1]));
    return policies;
}

/// The letters of cases/profileVerdicts.cases.
FWRULE ruleOf(char letter) {
    if (letter == 'o')
        return portRule(FW_POLICY_DENY, "81");
    if (letter == 'N')
        return portRule(FW_POLICY_NONE, "80");
    const bool allows = letter == 'A' || letter == 'a';
    const bool anySource = letter == 'A' || letter == 'D';
    return portRule(allows ? 0 : 1, "80", anySource ? FW_IP_GROUP_ANY : FW_IP_GROUP_ADDRESS);
}

TEST(Profile, GlobalRulesDecideFirstThenEachAdapterForItself) {
    for (const auto &row : readCases(caseDirectory + "profileVerdicts.cases", 5)) {
        FWPROFILE profile = {"p", {}, policiesOf(row[1])};
        for (const std::string &word : split(row[2], ' ')) {
            std::vector<FWRULE> &list = profile.rules[split(word, '=')[0]];
            for (const char letter : word.substr(word.find('=') + 1))
                list.push_back(ruleOf(letter));
        }
        PolicyMap result = {{"old", FW_POLICY_DENY}};
        profileEvaluate(profile, tcp80, row[3], noServices, result);
        EXPECT_EQ(result, policiesOf("old=1 " + row[4])) << row[0];
    }
}

TEST(Merge, TheSeverestVerdictStays) {
    const int rank[] = {1, 3, 0, 2, 0, 0};  // of the verdicts 0 to 5
    for (int first = 0; first <= 5; ++first) {
        for (int second = 0; second <= 5; ++second) {
            PolicyMap result = {{"eth0", policyOf(first)}};
            verdictsMerge({{"eth0", policyOf(second)}, {"eth1", policyOf(second)}}, result);
            EXPECT_EQ(result["eth0"], policyOf(rank[second] > rank[first] ? second : first)) << first << second;
            EXPECT_EQ(result["eth1"], policyOf(second));
        }
    }
}

// The short form of cases/edits.cases: "R0:ssh,smb S1:ftp R1-:ssh".
std::vector<FWRULE> rulesOf(const std::string &text) {
    std::vector<FWRULE> rules;
    for (const std::string &word : split(text, ' ')) {
        const char kind = word[0];
        FWRULE &rule = rules.emplace_back();
        rule.portGroup = kind == 'S'   ? FW_PORT_GROUP_SERVICE
                         : kind == 'P' ? FW_PORT_GROUP_PORT
                                       : FW_PORT_GROUP_RESERVED;
        rule.ipGroup = kind == 'r' ? FW_IP_GROUP_ADDRESS : FW_IP_GROUP_ANY;
        rule.policy = policyOf(word[1] - '0');
        rule.enable = word[2] != '-';
        rule.portList = split(word.substr(word.find(':') + 1), ',');
        if (kind == 'R') {  // as reserving makes it
            rule.name = "Service";
            rule.ipType = FW_IP_TYPE_BOTH;
            rule.protocol = FW_PROTO_TCP_UDP;
        }
    }
    return rules;
}

Json::Value jsonOf(const FWPROFILE &profile) {
    Json::Value json;
    VELDFW_JSON_DB().profileToJson(profile, json);
    return json;
}

FWPROFILE profileOf(const std::string &policies, const std::string &lists) {
    FWPROFILE profile = {"p", {}, policiesOf(policies)};
    for (const std::string &list : split(lists, ';'))
        profile.rules[split(list, '=')[0]] = rulesOf(list.substr(list.find('=') + 1));
    return profile;
}

TEST(RuleListEdit, LeavesWhatTheTableSays) {
    for (const auto &row : readCases(caseDirectory + "edits.cases", 5)) {
        SCOPED_TRACE(row[0] + ": " + row[1] + ", " + row[2]);
        const auto edit = split(row[0], ' ');
        FWPROFILE profile = profileOf(row[1], row[2]);
        if (edit[0] == "reserve")
            serviceReserve(profile, "eth0", "ssh", policyOf(std::stoi(edit[1])));
        else if (edit[0] == "remove")
            serviceRemove(profile, "ssh");
        else
            EXPECT_EQ(adapterRename(profile, "eth0", edit[1]), edit[2] == "yes");
        EXPECT_EQ(jsonOf(profile), jsonOf(profileOf(row[3], row[4])));
    }
}

}  // namespace
