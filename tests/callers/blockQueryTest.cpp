// SPDX-License-Identifier: Apache-2.0
// The evaluation of block queries: the state table row by row, port matches, the order of lists, the merge.
#include "fw/blockQuery.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>

using namespace FW;

namespace {

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

const PortCompareST tcp80 = {0, FW_PROTO_TCP, "80"};
constexpr int limited = FW_IP_GROUP_ADDRESS;

// One row per state before. Columns: the rule's policy 0, 1, 2, 3 and 9, first for rules of any source, then for rules
// of some sources. An entry is the state after; "!" ends the list.
const char *const stateTable = R"(
0   0! 1! 2! 3! 9!    0  5  0  0  0
1   0! 1! 2! 3! 9!    4  0  0  0  0
2   0! 1! 2! 3! 9!    4  5  0  0  0
3   0! 0! 0! 0! 0!    0! 0! 0! 0! 0!
4   0! 4! 0! 0! 0!    0  3! 0! 0! 0!
5   5! 1! 0! 0! 0!    3! 0  0! 0! 0!
6   0! 0! 0! 0! 0!    0! 0! 0! 0! 0!
-1  0! 0! 0! 0! 0!    0! 0! 0! 0! 0!
)";

TEST(StateTable, EveryRowHolds) {
    std::istringstream rows(stateTable);
    int entries = 0;
    for (int before = 0; rows >> before;) {
        for (const bool anySource : {true, false}) {
            for (const int policy : {0, 1, 2, 3, 9}) {
                std::string after;
                rows >> after;
                const VerdictStep step = verdictAfter(policyOf(before), anySource, policyOf(policy));
                const std::string got = std::to_string(static_cast<int>(step.verdict)) + (step.stop ? "!" : "");
                EXPECT_EQ(got, after) << "state " << before << ", any source " << anySource << ", policy " << policy;
                ++entries;
            }
        }
    }
    EXPECT_EQ(entries, 8 * 2 * 5);
}

struct PortCase {
    int policy;
    int ruleDirect;
    int ruleProtocol;
    std::vector<std::string> rulePorts;
    PortCompareST query;
    bool matches;
};

TEST(PortMatch, IsStrictForAllowAndLooseForDeny) {
    const auto tcp = FW_PROTO_TCP;
    const auto both = FW_PROTO_TCP_UDP;
    const PortCase cases[] = {
        {1, 0, 1, {"1000-2000"}, {0, tcp, "1500-2500"}, true},  // overlap is enough to deny
        {0, 0, 1, {"1000-2000"}, {0, tcp, "1500-2500"}, false},
        {0, 0, 1, {"1000-2000"}, {0, tcp, "1200-1300"}, true},
        {2, 0, 1, {"1000-2000"}, {0, tcp, "1500-2500"}, false},  // every policy but deny is strict
        {3, 0, 1, {"1000-2000"}, {0, tcp, "1000-2000"}, true},
        {1, 0, 1, {"1000-2000"}, {0, tcp, "2000-2001"}, true},  // the bounds belong to the range
        {1, 0, 1, {"1000-2000"}, {0, tcp, "1-1000"}, true},
        {1, 0, 1, {"1000-2000"}, {0, tcp, "2001-2002"}, false},
        {1, 0, 1, {"1000-2000"}, {0, tcp, "999"}, false},
        {0, 0, 1, {"80", "1000-2000"}, {0, tcp, "1000-2001"}, false},
        {0, 0, 1, {"80", "81"}, {0, tcp, "80-81"}, false},  // one entry must cover the query
        {0, 0, 1, {"79", "80"}, {0, tcp, "80"}, true},
        {1, 0, 1, {}, tcp80, false},
        {0, 0, 1, {}, tcp80, false},
        // protocols
        {1, 0, 1, {"80"}, {0, both, "80"}, true},
        {0, 0, 1, {"80"}, {0, both, "80"}, false},
        {0, 0, 3, {"80"}, {0, both, "80"}, true},
        {0, 0, 3, {"80"}, {0, FW_PROTO_UDP, "80"}, true},
        {1, 0, 3, {"80"}, {0, FW_PROTO_UDP, "80"}, true},
        {1, 0, 1, {"80"}, {0, FW_PROTO_UDP, "80"}, false},
        {1, 0, 4, {"80"}, {0, FW_PROTO_ICMP, "80"}, true},
        {1, 0, 4, {"80"}, {0, both, "80"}, true},
        {1, 0, 9, {"80"}, tcp80, false},
        // directions
        {1, 1, 1, {"80"}, tcp80, false},
        {1, 0, 1, {"80"}, {1, tcp, "80"}, false},
        {0, 1, 1, {"80"}, {1, tcp, "80"}, true},
        {1, 2, 1, {"80"}, {1, tcp, "80"}, false},  // compared as numbers
        // port text goes through strtol: what is no number is 0, what follows a number is ignored
        {1, 0, 1, {"http"}, {0, tcp, "0"}, true},
        {1, 0, 1, {""}, {0, tcp, "0"}, true},
        {1, 0, 1, {" 80x"}, tcp80, true},
        {1, 0, 1, {"0x50"}, tcp80, false},
        {1, 0, 1, {"80-"}, tcp80, false},  // 80 to 0
        {1, 0, 1, {"80-"}, {0, tcp, "0"}, false},
        {0, 0, 1, {"-80"}, tcp80, true},       // 0 to 80
        {0, 0, 1, {"70--90"}, tcp80, false},   // 70 to -90
        {0, 0, 1, {"70-90-75"}, tcp80, true},  // split at the first "-"
        {1, 0, 1, {"90-70"}, tcp80, false},
        {1, 0, 1, {"1-99999999999999999999"}, tcp80, true},
        {0, 0, 1, {"1-100"}, {0, tcp, "90-10"}, true},
    };
    for (const PortCase &entry : cases) {
        SCOPED_TRACE("case " + std::to_string(&entry - cases) + ": query " + entry.query.port);
        EXPECT_EQ(
            portsMatch(entry.ruleDirect, entry.ruleProtocol, entry.rulePorts, policyOf(entry.policy), entry.query),
            entry.matches);
    }
}

TEST(RuleMatch, FollowsThePortGroup) {
    FWRULE rule = portRule(1, "80");
    EXPECT_TRUE(ruleMatches(rule, tcp80, noServices));
    rule.enable = false;
    EXPECT_FALSE(ruleMatches(rule, tcp80, noServices));
    rule.portGroup = FW_PORT_GROUP_ANY;
    EXPECT_FALSE(ruleMatches(rule, tcp80, noServices));
    rule.enable = true;
    EXPECT_TRUE(ruleMatches(rule, {1, FW_PROTO_IGMP, ""}, noServices));
    for (const int unknown : {4, -1}) {
        rule.portGroup = unknown;
        EXPECT_FALSE(ruleMatches(rule, tcp80, noServices));
    }
}

TEST(RuleMatch, ServicesCountBySideAndTheRulesOwnDirectionAndProtocolDoNot) {
    const auto expand = [](const std::vector<std::string> &names, ServPort &ports) {
        if (names == std::vector<std::string>{"broken"}) {
            return false;
        }
        EXPECT_EQ(names, (std::vector<std::string>{"web", "mail"}));
        ports.srcPorts[FW_PROTO_UDP] = {"500"};
        ports.dstPorts[FW_PROTO_TCP] = {"25", "80-90"};
        ports.dstPorts[FW_PROTO_TCP_UDP] = {"53"};
        return true;
    };
    for (const int group : {FW_PORT_GROUP_SERVICE, FW_PORT_GROUP_RESERVED}) {
        FWRULE rule;
        rule.portGroup = group;
        rule.portDirect = 1;
        rule.protocol = FW_PROTO_IGMP;
        rule.portList = {"web", "mail"};
        const std::pair<PortCompareST, bool> cases[] = {
            {{0, FW_PROTO_TCP, "80"}, true},  {{0, FW_PROTO_TCP, "25"}, true},  {{0, FW_PROTO_UDP, "25"}, false},
            {{0, FW_PROTO_UDP, "53"}, true},  {{1, FW_PROTO_UDP, "500"}, true}, {{0, FW_PROTO_UDP, "500"}, false},
            {{1, FW_PROTO_TCP, "80"}, false}, {{2, FW_PROTO_TCP, "80"}, false}};
        for (const auto &[query, matches] : cases) {
            EXPECT_EQ(ruleMatches(rule, query, expand), matches) << query.portDirect << " " << query.port;
        }
        rule.portList = {"broken"};
        EXPECT_FALSE(ruleMatches(rule, tcp80, expand));
    }
}

TEST(RuleList, PassesOverRulesThatDoNotMatchAndEndsWhereTheTableSays) {
    const auto verdict = [](const std::vector<FWRULE> &rules, int start) {
        return static_cast<int>(ruleListEvaluate(rules, tcp80, policyOf(start), noServices));
    };
    EXPECT_EQ(verdict({}, 2), 2);
    EXPECT_EQ(verdict({portRule(1, "81")}, 0), 0);
    EXPECT_EQ(verdict({portRule(1, "81"), portRule(1, "80"), portRule(0, "80")}, 0), 1);
    EXPECT_EQ(verdict({portRule(1, "80", limited)}, 0), 5);
    EXPECT_EQ(verdict({portRule(0, "80", limited)}, 1), 4);
    EXPECT_EQ(verdict({portRule(0, "80", limited), portRule(1, "80", limited), portRule(0, "80")}, 1), 3);
    EXPECT_EQ(verdict({portRule(1, "80", limited), portRule(1, "80"), portRule(0, "80")}, 0), 1);
    EXPECT_EQ(verdict({portRule(0, "80", limited), portRule(1, "80")}, 1), 4);
    EXPECT_EQ(verdict({portRule(0, "80", limited), portRule(0, "80", limited)}, 1), 0);  // the asymmetric entry
    for (const int group : {0, 1, 2, 3, 4, 6}) {                                         // all but "any" are limited
        EXPECT_EQ(verdict({portRule(1, "80", group)}, 0), 5) << group;
    }
}

struct ProfileCase {
    const char *what;
    PolicyMap defaults;
    std::map<std::string, std::vector<FWRULE>> rules;
    const char *adapter;
    PolicyMap verdicts;
};

TEST(Profile, GlobalRulesDecideFirstThenEachAdapterForItself) {
    const FW_POLICY allow = FW_POLICY_ALLOW, deny = FW_POLICY_DENY, none = FW_POLICY_NONE, partial = FW_POLICY_PARTIAL;
    const auto allowAll = portRule(0, "80"), denyAll = portRule(1, "80");
    const auto allowSome = portRule(0, "80", limited), denySome = portRule(1, "80", limited);
    const auto other = portRule(1, "81");
    const ProfileCase cases[] = {
        {"empty profile", {}, {}, "", {{"global", none}}},
        {"empty profile, one adapter", {}, {}, "eth0", {{"global", none}, {"eth0", allow}}},
        {"defaults only", {{"eth0", deny}, {"global", none}}, {}, "", {{"global", none}, {"eth0", deny}}},
        {"default of one adapter", {{"eth0", deny}, {"eth1", deny}}, {}, "eth0", {{"global", none}, {"eth0", deny}}},
        {"a default for global counts", {{"global", deny}}, {}, "", {{"global", deny}}},
        {"rules without default start from allow",
         {},
         {{"eth0", {denySome}}},
         "",
         {{"global", none}, {"eth0", partial}}},
        {"without default the rules of one adapter are not reached when global has no list",
         {},
         {{"eth0", {denyAll}}},
         "eth0",
         {{"global", none}, {"eth0", allow}}},
        {"with a global list they are",
         {},
         {{"eth0", {denyAll}}, {"global", {other}}},
         "eth0",
         {{"global", none}, {"eth0", deny}}},
        {"an empty global list is a list",
         {},
         {{"eth0", {denyAll}}, {"global", {}}},
         "eth0",
         {{"global", none}, {"eth0", deny}}},
        {"global decides for all adapters of the defaults, not for those with rules only",
         {{"eth0", allow}, {"global", none}},
         {{"eth0", {allowAll}}, {"eth1", {allowAll}}, {"global", {denyAll}}},
         "",
         {{"global", deny}, {"eth0", deny}}},
        {"global allows all",
         {{"eth0", deny}},
         {{"eth0", {denyAll}}, {"global", {allowAll}}},
         "eth0",
         {{"global", allow}, {"eth0", allow}}},
        {"global decides for an unknown adapter",
         {},
         {{"global", {denyAll}}},
         "eth9",
         {{"global", deny}, {"eth9", deny}}},
        {"global is partly open",
         {{"eth0", allow}},
         {{"global", {denySome, allowSome}}},
         "eth0",
         {{"global", partial}, {"eth0", partial}}},
        {"a mark of global does not decide",
         {{"eth0", deny}, {"global", none}},
         {{"eth0", {allowAll}}, {"global", {denySome}}},
         "eth0",
         {{"global", partial}, {"eth0", allow}}},
        {"for all adapters the global list runs twice, on from its own mark",
         {{"eth0", deny}, {"global", none}},
         {{"eth0", {allowSome}}, {"global", {denySome}}},
         "",
         {{"global", allow}, {"eth0", partial}}},
        {"the second run ends where a rule for all sources says",
         {{"eth0", allow}, {"global", none}},
         {{"global", {denySome, other, denyAll}}},
         "",
         {{"global", deny}, {"eth0", deny}}},
        {"the adapter global itself is asked",
         {{"global", none}},
         {{"global", {allowSome}}},
         "global",
         {{"global", allow}}},
        {"other adapters do not matter",
         {{"eth0", allow}, {"eth1", allow}},
         {{"eth1", {denyAll}}},
         "eth0",
         {{"global", none}, {"eth0", allow}}},
        {"marks of defaults become partial",
         {{"eth0", policyOf(4)}, {"eth1", policyOf(5)}},
         {},
         "",
         {{"global", none}, {"eth0", partial}, {"eth1", partial}}},
        {"rule policy none ends the list undecided",
         {{"eth0", deny}},
         {{"eth0", {portRule(2, "80")}}},
         "eth0",
         {{"global", none}, {"eth0", none}}},
    };
    for (const ProfileCase &entry : cases) {
        SCOPED_TRACE(entry.what);
        PolicyMap result;
        profileEvaluate({"p", entry.rules, entry.defaults}, tcp80, entry.adapter, noServices, result);
        EXPECT_EQ(result, entry.verdicts);
    }
}

TEST(Profile, EntriesAlreadyInTheResultStay) {
    PolicyMap result = {{"old", FW_POLICY_DENY}, {"eth0", FW_POLICY_DENY}};
    profileEvaluate({"p", {}, {{"eth0", FW_POLICY_ALLOW}}}, tcp80, "", noServices, result);
    EXPECT_EQ(result, (PolicyMap{{"old", FW_POLICY_DENY}, {"eth0", FW_POLICY_ALLOW}, {"global", FW_POLICY_NONE}}));
}

TEST(ServiceQuery, AsksSourcePortsFirstInMapAndListOrder) {
    ServPort ports;
    ports.srcPorts[FW_PROTO_UDP] = {"9"};
    ports.dstPorts[FW_PROTO_UDP] = {"5"};
    ports.dstPorts[FW_PROTO_TCP] = {"7", "6"};
    std::string order;
    for (const PortCompareST &query : serviceQueries(ports)) {
        order += std::to_string(query.portDirect) + "/" + std::to_string(query.protocol) + "/" + query.port + " ";
    }
    EXPECT_EQ(order, "1/2/9 0/1/7 0/1/6 0/2/5 ");
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

}  // namespace
