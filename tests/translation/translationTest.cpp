// SPDX-License-Identifier: Apache-2.0
// Every case in cases/ is a test; and what a case cannot show: caches, the overloads, steps called by themselves.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <syslog.h>

#include <algorithm>
#include <filesystem>

#include "caseFile.h"
#include "caseSystem.h"
#include "files.h"
#include "network.h"
#include "systemLog.h"
#include "veldfirewall/fwIptables.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

constexpr const char *CHAINS[] = {"INPUT_FIREWALL", "FORWARD_FIREWALL"};

std::vector<std::string> caseNames() {
    std::vector<std::string> names;
    for (const auto &entry : std::filesystem::directory_iterator(VELD_CASE_DIRECTORY)) {
        if (entry.path().extension() == ".case")
            names.push_back(entry.path().stem());
    }
    std::sort(names.begin(), names.end());
    return names;
}

/// Puts the fixed commands without connection tracking, as the cases about the preamble spell them out, in front.
void addPreamble(TranslationCase &wanted) {
    std::vector<std::string> v4;
    std::vector<std::string> v6;
    for (const std::string chain : CHAINS) {
        v4.push_back("-A " + chain + " -i lo -j ACCEPT");
        v6.push_back("-A " + chain + " -i lo -j ACCEPT");
        for (const std::string text :
             {"-s fe80::/10 -p icmpv6 --icmpv6-type router-solicitation",
              "-s fe80::/10 -p icmpv6 --icmpv6-type router-advertisement",
              "-p icmpv6 --icmpv6-type neighbour-solicitation", "-p icmpv6 --icmpv6-type neighbour-advertisement",
              "-s fe80::/10 -p icmpv6 --icmpv6-type 137"})
            v6.push_back("-A " + chain + " " + text + " -j ACCEPT");
    }
    for (auto [group, preamble] : {std::pair("v4 global", &v4), std::pair("v6 global", &v6)}) {
        auto &commands = wanted.commands[group];
        commands.insert(commands.begin(), preamble->begin(), preamble->end());
    }
}

std::string toText(const std::map<std::string, std::vector<std::string>> &commands) {
    std::string text;
    for (const auto &[group, lines] : commands) {
        text += group + "\n";
        for (const std::string &line : lines)
            text += "    " + line + "\n";
    }
    return text;
}

std::string toText(const Json::Value &cmdList) {
    std::map<std::string, std::vector<std::string>> commands;
    for (const std::string &family : cmdList.getMemberNames()) {
        for (const std::string &group : cmdList[family].getMemberNames()) {
            for (const Json::Value &command : cmdList[family][group])
                commands[family + " " + group].push_back(command.asString());
        }
    }
    std::string text = toText(commands);
    return text;
}

/// What the translation wrote, without line numbers.
std::vector<std::string> libraryMessages(SystemLog &log) {
    std::vector<std::string> texts;
    for (const LogMessage &message : log.messages()) {
        const size_t colon = message.text.find(':');
        const std::string source = message.text.substr(0, colon);
        if (source != "fwIptables.cpp" && source != "fwGeoip.cpp")
            continue;
        const std::string text = message.text.substr(message.text.find(' ') + 1);
        texts.push_back(std::string(message.priority == LOG_ERR ? "error" : "debug") + " " + source + " " + text);
    }
    return texts;
}

class Translation : public testing::TestWithParam<std::string> {};

TEST_P(Translation, GivesTheCommandsOfTheCase) {
    TranslationCase wanted = readCase(std::string(VELD_CASE_DIRECTORY "/") + GetParam() + ".case");
    if (!wanted.preambleSpelledOut)
        addPreamble(wanted);
    const CaseSystem system(wanted);
    SystemLog log;
    FW::VELDFW_IPTABLES_RULES translator;
    Json::Value cmdList;
    translator.jIptablesCmdInit(cmdList);
    const auto &[rules, policies] = std::tie(wanted.profile.rules, wanted.profile.adapterPolicyMap);
    const bool outcome =
        wanted.hasClient
            ? translator.fwRulesToIptablesRules(wanted.keepEstablished, rules, policies, cmdList, wanted.client)
            : translator.fwRulesToIptablesRules(wanted.keepEstablished, rules, policies, cmdList);
    EXPECT_EQ(outcome, !wanted.fails);
    EXPECT_EQ(toText(cmdList), toText(wanted.commands));
    EXPECT_EQ(libraryMessages(log), wanted.log) << log.text();
    if (wanted.toolRunsGiven) {
        std::vector<std::string> runs;
        for (const std::string &interface : wanted.toolRuns)
            runs.push_back("--get-ipv6-router-interface " + interface);
        EXPECT_EQ(CaseSystem::toolRuns(), runs);
    }
}

INSTANTIATE_TEST_SUITE_P(Case, Translation, testing::ValuesIn(caseNames()),
                         [](const auto &entry) { return entry.param; });

TEST(Translator, TwoRunsOnOneListGiveEverythingTwice) {
    const CaseSystem system({});
    FW::VELDFW_IPTABLES_RULES translator;
    Json::Value cmdList;
    translator.jIptablesCmdInit(cmdList);
    for (int run = 1; run <= 2; ++run) {
        EXPECT_TRUE(translator.fwRulesToIptablesRules(true, {}, {}, cmdList));
        EXPECT_EQ(cmdList["v4"]["global"].size(), 4u * static_cast<unsigned>(run));
        EXPECT_EQ(cmdList["v6"]["global"].size(), 14u * static_cast<unsigned>(run));
    }
}

TEST(Translator, KeepsItsViewOfTheSystemForItsLife) {
    TranslationCase wanted;
    wanted.interfaces = {"eth0", "ppp0", "tun5"};
    wanted.pppoeInterface = "ppp0";
    wanted.services = {{"app", true, {{"destination", {"tcp", {"1"}}}}}};
    const CaseSystem system(wanted);
    FW::VELDFW_IPTABLES_RULES old;
    FW::ServPort ports;
    EXPECT_TRUE(old.adapterIsEnabled("eth0") && old.adapterIsEnabled("vpn") && old.adapterIsEnabled("pppoe"));
    EXPECT_TRUE(old.servToPorts({"app"}, ports));
    for (const char *name : {"eth0", "ppp0", "tun5"})
        removeInterface(name);
    addDummyInterface("eth9");
    removeAll("/run/ppp-pppoe.pid");
    removeAll("/usr/veld/etc/services.d");
    EXPECT_TRUE(old.adapterIsEnabled("eth0") && old.adapterIsEnabled("vpn") && old.adapterIsEnabled("pppoe"));
    EXPECT_FALSE(old.adapterIsEnabled("eth9"));
    EXPECT_TRUE(old.servToPorts({"app"}, ports));
    EXPECT_THAT(ports.dstPorts[FW::FW_PROTO_TCP], ElementsAre("1", "1"));

    FW::VELDFW_IPTABLES_RULES fresh;
    EXPECT_FALSE(fresh.adapterIsEnabled("eth0") || fresh.adapterIsEnabled("vpn") || fresh.adapterIsEnabled("pppoe"));
    EXPECT_TRUE(fresh.adapterIsEnabled("eth9"));
    EXPECT_FALSE(fresh.adapterIsEnabled("ETH9"));
    removeInterface("eth9");
}

TEST(Translator, AbsentNormalStateIsAskedForAgain) {
    const CaseSystem system({});
    FW::VELDFW_IPTABLES_RULES translator;
    EXPECT_FALSE(translator.adapterIsEnabled("pppoe"));
    EXPECT_FALSE(translator.adapterIsEnabled("vpn"));
    addDummyInterface("ppp0");
    addDummyInterface("tun0");
    writeFile("/run/ppp-pppoe.pid", "4711\nppp0\n");
    EXPECT_TRUE(translator.adapterIsEnabled("pppoe"));
    EXPECT_TRUE(translator.adapterIsEnabled("vpn"));
    removeInterface("ppp0");
    removeInterface("tun0");
}

TEST(Translator, WirelessSystemWithoutInterfacesHasExactlyWlan0) {
    TranslationCase wanted;
    wanted.wireless = true;
    const CaseSystem system(wanted);
    FW::VELDFW_IPTABLES_RULES translator;
    EXPECT_TRUE(translator.adapterIsEnabled("wlan0"));
    EXPECT_FALSE(translator.adapterIsEnabled("lo"));
}

TEST(RuleArguments, VpnWithoutInterfacesNamesNoRealInterface) {
    const CaseSystem system({});
    FW::VELDFW_IPTABLES_RULES translator;
    FW::FWRULE rule;
    rule.adapterDirect = 0;
    Json::Value args;
    translator.iptablesRulesInit(args);
    EXPECT_TRUE(translator.adapterToIptablesArg("vpn", rule, args));
    ASSERT_EQ(args["adapter"].size(), 1u);
    EXPECT_EQ(args["adapter"][0], "-o vpn");
}

TEST(RuleArguments, PppoeWithoutLinkFailsTheRule) {
    const CaseSystem system({});
    SystemLog log;
    FW::VELDFW_IPTABLES_RULES translator;
    Json::Value args;
    translator.iptablesRulesInit(args);
    EXPECT_FALSE(translator.FwRuleToIptablesArg("pppoe", FW::FWRULE(), args));
    EXPECT_THAT(libraryMessages(log), ElementsAre("debug fwIptables.cpp Failed to VELDPPPoeIntfGet()",
                                                  "error fwIptables.cpp pppoe interface is empty",
                                                  "error fwIptables.cpp Failed to adapterToIptablesArg()"));
    EXPECT_TRUE(args["chain"].empty());
}

TEST(RuleArguments, CommandWithoutTargetKeepsItsLastBlank) {
    const CaseSystem system({});
    FW::VELDFW_IPTABLES_RULES translator;
    FW::FWRULE rule;
    rule.policy = FW::FW_POLICY_NONE;
    rule.blLog = true;
    rule.ipGroup = FW::FW_IP_GROUP_ANY;
    rule.portGroup = FW::FW_PORT_GROUP_ANY;
    rule.chainList = {"INPUT_FIREWALL"};
    Json::Value args;
    translator.iptablesRulesInit(args);
    ASSERT_TRUE(translator.FwRuleToIptablesArg("eth0", rule, args));
    Json::Value cmdList;
    translator.iptablesArgToCmd("eth0", rule, args, cmdList);
    EXPECT_EQ(toText(cmdList), "v4 eth0\n"
                               "    -t filter -A INPUT_FIREWALL -i eth0 -j LOG\n"
                               "    -t filter -A INPUT_FIREWALL -i eth0 \n");
}

}  // namespace
