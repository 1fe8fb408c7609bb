// SPDX-License-Identifier: Apache-2.0
// The plain functions of the tool: parsing and formatting, as tables.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "frame/errors.h"
#include "frame/libraryCall.h"
#include "model/addresses.h"
#include "model/applyFailure.h"
#include "model/backupDocument.h"
#include "model/commandOrigin.h"
#include "model/kernelChains.h"
#include "model/numbers.h"
#include "model/ports.h"
#include "model/progressText.h"
#include "model/ruleEdit.h"
#include "model/table.h"
#include "toolFixture.h"

namespace veldfwctl {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

/// What a parser makes of a text: its result in words, or "refused: " and the message.
template <typename Parse> std::string outcome(const Parse &parse) {
    try {
        return parse();
    } catch (const UsageError &error) {
        return std::string("refused: ") + error.what();
    }
}

TEST(AddressMatch, IsParsedOrRefusedByName) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        // group, family, list
        {"any", "5 2 "},
        {"10.0.0.5", "0 0 10.0.0.5"},
        {"2001:DB8:0::5", "0 1 2001:db8::5"},
        {"203.0.113.0/24", "1 0 203.0.113.0 24"},
        {"10.0.0.0/255.255.252.0", "1 0 10.0.0.0 22"},
        {"0.0.0.0/0", "1 0 0.0.0.0 0"},
        {"2001:db8::/33", "1 1 2001:db8:: 33"},
        {"10.0.0.5-10.0.0.9", "4 0 10.0.0.5 10.0.0.9"},
        {"fe80::1-fe80::1", "4 1 fe80::1 fe80::1"},
        {"", "refused: \"\" is no IPv4 or IPv6 address"},
        {"10.0.0.256", "refused: \"10.0.0.256\" is no IPv4"},
        {"10.0.0.05x/24", "refused: \"10.0.0.05x\" in \"10.0.0.05x/24\" is no IPv4"},
        {"10.0.0.1 ", "refused: \"10.0.0.1 \" is no IPv4"},
        {"host.example", "refused: \"host.example\" is no IPv4"},
        {"10.0.0.0/33", "refused: \"33\" in \"10.0.0.0/33\" is no prefix length of IPv4; it goes from 0 to 32"},
        {"10.0.0.0/", "refused: \"\" in \"10.0.0.0/\" is no prefix"},
        {"10.0.0.0/+8", "refused: \"+8\" in"},
        {"10.0.0.0/255.0.255.0", "refused: \"255.0.255.0\" in"},
        {"2001:db8::/255.0.0.0", "refused: \"255.0.0.0\" in \"2001:db8::/255.0.0.0\" is no prefix length of IPv6"},
        {"2001:db8::/129", "it goes from 0 to 128"},
        {"10.0.0.7/24", "write 10.0.0.0/24 for the network or 10.0.0.7 for the address"},
        {"10.0.0.9-10.0.0.5", "ends before it begins; write 10.0.0.5-10.0.0.9"},
        {"10.0.0.5-::1", "mixes IPv4 and IPv6"},
        {"10.0.0.5-9", "refused: \"9\" in \"10.0.0.5-9\" is no IPv4"},
    };
    for (const auto &[text, expected] : cases) {
        EXPECT_THAT(outcome([&, &input = text] {
                        const AddressMatch match = addressMatchParse(input);
                        return std::to_string(match.ipGroup) + " " + std::to_string(match.ipType) + " " +
                               join(match.ipList, " ");
                    }),
                    HasSubstr(expected))
            << text;
    }
}

TEST(PortMatch, IsParsedOrRefusedByName) {
    const std::vector<std::pair<std::vector<std::string>, std::string>> cases = {
        {{"445/tcp"}, "445/tcp"},
        {{"53"}, "53/tcp+udp"},
        {{"80,443/tcp", "8000-8010/tcp"}, "80,443,8000-8010/tcp"},
        {{"8080-8080/udp"}, "8080/udp"},
        {{"53/tcp", "53/udp"}, "53/tcp+udp"},
        {{"080/tcp"}, "80/tcp"},
        {{"53/tcp", "80/udp"}, "refused: Ports 53/tcp and 80/udp have different protocols"},
        {{"53", "80/udp"}, "refused: Ports 53/tcp+udp and 80/udp have different"},
        {{"0/tcp"}, "refused: \"0\" in \"0/tcp\" is no port"},
        {{"65536"}, "refused: \"65536\" in"},
        {{"99999999999"}, "refused: \"99999999999\" in"},
        {{"-80/tcp"}, "refused: \"\" in \"-80/tcp\""},
        {{"http/tcp"}, "refused: \"http\" in"},
        {{"80,/tcp"}, "refused: \"\" in \"80,/tcp\""},
        {{"90-80/tcp"}, "write 80-90"},
        {{"80/sctp"}, "refused: \"sctp\" in \"80/sctp\" is no protocol with ports"},
        {{"80/"}, "refused: \"\" in \"80/\" is no protocol"},
    };
    for (const auto &[entries, expected] : cases) {
        EXPECT_THAT(outcome([&, &input = entries] {
                        const PortMatch match = portMatchParse(input);
                        return portsText(match.protocol, match.ports);
                    }),
                    HasSubstr(expected))
            << testing::PrintToString(entries);
    }
}

TEST(RangeNetworks, CoverTheRangeExactly) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"10.0.0.0-10.0.1.255", "10.0.0.0/23"},
        {"192.0.2.0-192.0.2.2", "192.0.2.0/31 192.0.2.2/32"},
        {"10.0.0.1-10.0.0.6", "10.0.0.1/32 10.0.0.2/31 10.0.0.4/31 10.0.0.6/32"},
        {"0.0.0.0-255.255.255.255", "0.0.0.0/0"},
        {"255.255.255.254-255.255.255.255", "255.255.255.254/31"},
        {"2001:db8::-2001:db8::f", "2001:db8::/124"},
        {"::-ffff:ffff:ffff:ffff:ffff:ffff:ffff:ffff", "::/0"},
    };
    for (const auto &[range, expected] : cases) {
        const size_t dash = range.find('-');
        EXPECT_EQ(expected,
                  join(rangeNetworks(*addressFromText(range.substr(0, dash)), *addressFromText(range.substr(dash + 1))),
                       " "));
    }
}

TEST(RuleMove, GivesTheRuleItsNewNumber) {
    const std::vector<std::tuple<int, int, std::string>> cases = {
        {1, 4, "b c d a"}, {4, 1, "d a b c"}, {2, 3, "a c b d"}, {3, 3, "a b c d"}};
    for (const auto &[from, to, expected] : cases) {
        FW::FWPROFILE profile;
        for (const char *name : {"a", "b", "c", "d"}) {
            FW::FWRULE rule;
            rule.name = name;
            ruleInsert(profile, "eth0", 0, rule);
        }
        ruleMove(profile, "eth0", from, to);
        std::vector<std::string> names;
        for (const FW::FWRULE &rule : profile.rules["eth0"]) {
            names.push_back(rule.name);
        }
        EXPECT_EQ(expected, join(names, " "));
        EXPECT_THROW(ruleMove(profile, "eth0", 1, 5), UsageError);
        EXPECT_THROW(ruleMove(profile, "eth1", 1, 1), UsageError);
        EXPECT_THROW(ruleInsert(profile, "eth0", 6, {}), UsageError);
    }
}

TEST(KernelChains, CountRulesAndDroppedPackets) {
    const auto chains = kernelChainsParse("-P INPUT ACCEPT -c 10 840\n"
                                          "-N INPUT_FIREWALL\n-N FORWARD_FIREWALL\n-N other\n"
                                          "-A INPUT -c 4 336 -j INPUT_FIREWALL\n"
                                          "-A other -c 9 9 -j DROP\n"
                                          "-A INPUT_FIREWALL -i lo -c 1 84 -j ACCEPT\n"
                                          "-A INPUT_FIREWALL -s 10.0.0.0/8 -c 3 252 -j LOG\n"
                                          "-A INPUT_FIREWALL -s 10.0.0.0/8 -c 3 252 -j DROP\n"
                                          "-A INPUT_FIREWALL -i eth0 -c 2 168 -j DROP\n");
    ASSERT_EQ(2u, chains.size());
    EXPECT_EQ(4u, chains.at("INPUT_FIREWALL").rules);
    EXPECT_EQ(5u, chains.at("INPUT_FIREWALL").droppedPackets);
    EXPECT_TRUE(chains.at("INPUT_FIREWALL").isReached);
    EXPECT_EQ(0u, chains.at("FORWARD_FIREWALL").rules);
    EXPECT_FALSE(chains.at("FORWARD_FIREWALL").isReached);
}

TEST(LogMessages, AreStrippedOfTheirPlaceAndJoined) {
    EXPECT_THAT(logMessagesParse("veldfwctl[12]: fwDB.cpp:34 no such: profile\nveldfwctl: plain\n  goes on\nveldfwctl["
                                 "12]: plain\n"),
                ElementsAre("no such: profile", "plain   goes on", "plain"));
    EXPECT_EQ("a; b", messagesJoin({"a", "b", "a"}));
}

TEST(FailedCommand, IsFoundWithWhatItSaid) {
    const FailedCommand failed = failedCommandFind(
        {"/sbin/iptables -A X: iptables: No chain/target/match by that name.", "/sbin/iptables -A X: exit status 1",
         "Failed to execute /sbin/iptables", "Failed to execute \"/sbin/iptables -A X\"", "cannot unload"});
    EXPECT_EQ("/sbin/iptables -A X", failed.command);
    EXPECT_EQ("iptables: No chain/target/match by that name., exit status 1", failed.said);
    EXPECT_THAT(failed.rest, ElementsAre("cannot unload"));
    EXPECT_EQ("", failedCommandFind({"TIMEOUT: getting lock"}).command);
}

TEST(CommandsDone, GoesForwardOnly) {
    const std::vector<std::string> commands = {"a", "b", "a", "c"};
    EXPECT_EQ(1u, commandsDone(commands, 0, "b"));
    EXPECT_EQ(2u, commandsDone(commands, 1, "a"));
    EXPECT_EQ(2u, commandsDone(commands, 2, "b"));
    EXPECT_EQ(2u, commandsDone(commands, 2, ""));
    EXPECT_LT(progressLine("Applying", 2, 4, 3, 40).size(), 40u);
    EXPECT_THAT(progressLine("Applying", 2, 4, 3, 100), HasSubstr("[###############...............]  2 of 4 commands"));
}

TEST(Table, IsAlignedByCharactersAndCannotBeSteeredByItsContent) {
    const Table table{{"NAME", "X"}, {{"Zürich", "1"}, {{"a\033[2Jb", Shade::BAD}, "2\t3"}}};
    EXPECT_EQ("NAME    X\nZürich  1\na [2Jb  2 3\n", tableText(table, false));
    EXPECT_EQ("Zürich\t1\na [2Jb\t2 3\n", tableFields(table));
    EXPECT_THAT(tableText(table, true), HasSubstr("\033[31ma [2Jb\033[0m"));
}

TEST(BackupProblems, NameEachFault) {
    const std::string profile = R"({"name": "p", "rules": null, "adapterPolicyMap": null})";
    const auto document = [&](const std::string &files, const std::string &settings, int version = 1) {
        return veldtest::parseJson("{\"config_version\": " + std::to_string(version) + ", \"config_profiles\": " +
                                   files + ", \"config_firewall_settings\": " + settings + "}");
    };
    const std::string settings = R"({"status": true, "profile": "p"})";
    const std::vector<std::pair<Json::Value, std::string>> cases = {
        {document("{\"1.json\": " + profile + "}", settings), ""},
        {Json::Value("x"), "the document is no object"},
        {document("{\"1.json\": " + profile + "}", settings, 2), "\"config_version\" is not 1"},
        {document("{}", settings), "holds no profile"},
        {document("[]", settings), "holds no profile"},
        {document("{\"../1.json\": " + profile + "}", settings),
         "\"../1.json\" in \"config_profiles\" begins with a dot"},
        {document("{\"a/1.json\": " + profile + "}", settings), "is no plain file name"},
        {document("{\".json\": " + profile + "}", settings), "does not end in .json"},
        {document("{\"firewall_settings.json\": " + profile + "}", settings), "is the name of the settings file"},
        {document("{\"1.json\": " + profile + ", \"2.json\": " + profile + "}", settings), "are both named \"p\""},
        {document(R"({"1.json": {"rules": null}})", settings), "has no \"name\""},
        {document(R"({"1.json": {"name": "p", "rules": 3}})", settings), "that is no object"},
        {document(R"({"1.json": {"name": "p", "rules": {"eth0": {}}}})", settings),
         "rules of \"eth0\" that are no list"},
        {document(R"({"1.json": {"name": "p", "rules": {"eth0": [{"policy": []}]}}})", settings), "does not decode"},
        {document("{\"1.json\": " + profile + "}", R"({"status": true, "profile": "q"})"),
         "the active profile \"q\" is not in it"},
        {document("{\"1.json\": " + profile + "}", R"({"status": 1, "profile": "p"})"), "lacks \"status\""},
    };
    for (const auto &[input, expected] : cases) {
        const std::string problems = join(backupProblems(input), "; ");
        EXPECT_THAT(problems, HasSubstr(expected));
        EXPECT_EQ(expected.empty(), problems.empty()) << problems;
    }
}

class CommandOrigin : public veldtest::ToolTest {};

TEST_F(CommandOrigin, LeadsEveryCommandOfAProfileBackToItsRule) {
    FW::FWPROFILE profile;
    FW::FWRULE rule;
    rule.ipGroup = FW::FW_IP_GROUP_ANY;
    rule.ipType = FW::FW_IP_TYPE_BOTH;
    rule.portGroup = FW::FW_PORT_GROUP_PORT;
    rule.portList = {"22"};
    rule.name = "shell";
    rule.blLog = true;
    FW::FWRULE off = rule;
    off.enable = false;
    FW::FWRULE web = rule;
    web.portList = {"80"};
    profile.rules = {{"eth0", {off, rule}}, {"global", {web}}};
    profile.adapterPolicyMap = {{"eth0", FW::FW_POLICY_DENY}, {"global", FW::FW_POLICY_NONE}};
    const std::vector<RuleCommands> rules = ruleCommandsBuild(profile);

    const std::vector<std::pair<std::string, std::string>> cases = {
        {"/sbin/iptables -t filter -A INPUT_FIREWALL -i eth0 -p tcp --dport 22 -j LOG",
         "adapter eth0, rule 2 \"shell\""},
        {"/sbin/ip6tables -t filter -A FORWARD_FIREWALL -i eth0 -j DROP", "adapter eth0, default policy"},
        {"/sbin/ip6tables -t filter -A FORWARD_FIREWALL -p tcp --dport 80 -j RETURN",
         "adapter global, rule 1 \"shell\""},
        {"/sbin/iptables -A INPUT_FIREWALL -i lo -j ACCEPT", ""},
    };
    for (const auto &[command, expected] : cases) {
        const auto origin = commandOrigin(rules, command);
        EXPECT_EQ(expected, origin ? originText(*origin) : "") << command;
    }
}

}  // namespace
}  // namespace veldfwctl
