// SPDX-License-Identifier: Apache-2.0
// Switching on, applying and switching off: the exact commands, and every way to fail on the way.
#include <json/json.h>

#include "commandRecorder.h"
#include "files.h"
#include "firewallTest.h"

using namespace veldtest;
using testing::Contains;
using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;

namespace {

using Lines = std::vector<std::string>;

const Lines SET_DROP = {"/sbin/iptables --policy INPUT DROP", "/sbin/iptables --policy FORWARD DROP",
                        "/sbin/ip6tables --policy INPUT DROP", "/sbin/ip6tables --policy FORWARD DROP"};
const Lines SET_ACCEPT = {"/sbin/iptables --policy INPUT ACCEPT", "/sbin/iptables --policy FORWARD ACCEPT",
                          "/sbin/ip6tables --policy INPUT ACCEPT", "/sbin/ip6tables --policy FORWARD ACCEPT"};
const Lines FLUSH = {"/sbin/iptables -F INPUT_FIREWALL", "/sbin/ip6tables -F INPUT_FIREWALL",
                     "/sbin/iptables -F FORWARD_FIREWALL", "/sbin/ip6tables -F FORWARD_FIREWALL"};

Lines operator+(Lines first, const Lines &second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
}

/// The commands of the profile with one rule that denies tcp port 23.
Lines profileCommands(bool keepEstablished) {
    Lines lines;
    const auto preamble = [&](const std::string &program, bool ipv6) {
        for (const std::string chain : {"INPUT_FIREWALL", "FORWARD_FIREWALL"}) {
            const std::string append = "/sbin/" + program + " -A " + chain;
            lines.push_back(append + " -i lo -j ACCEPT");
            for (const std::string type : {"router-solicitation", "router-advertisement"})
                if (ipv6)
                    lines.push_back(append + " -s fe80::/10 -p icmpv6 --icmpv6-type " + type + " -j ACCEPT");
            for (const std::string type : {"neighbour-solicitation", "neighbour-advertisement"})
                if (ipv6)
                    lines.push_back(append + " -p icmpv6 --icmpv6-type " + type + " -j ACCEPT");
            if (ipv6)
                lines.push_back(append + " -s fe80::/10 -p icmpv6 --icmpv6-type 137 -j ACCEPT");
            if (keepEstablished)
                lines.push_back(append + " -m state --state ESTABLISHED,RELATED -j ACCEPT");
        }
    };
    preamble("iptables", false);
    lines.emplace_back("/sbin/iptables -t filter -A FORWARD_FIREWALL -p tcp --dport 23 -j DROP");
    lines.emplace_back("/sbin/iptables -t filter -A INPUT_FIREWALL -p tcp --dport 23 -j DROP");
    preamble("ip6tables", true);
    return lines;
}

class Lifecycle : public FirewallTest {
protected:
    Lifecycle() {
        storeRules({portRule("23", FW::FW_POLICY_DENY)});
        installNotingHooks();
    }

    /// On, with "default" active, and nothing noted yet.
    void switchOn() {
        ASSERT_TRUE(firewall.fwEnable()) << log.text();
        recorder.clear();
        log.clear();
        removeAll("/run/hook-runs");
    }

    CommandRecorder recorder;
};

TEST_F(Lifecycle, EnableReloadAndDisableRunExactlyTheseCommands) {
    EXPECT_TRUE(firewall.fwEnable());
    EXPECT_THAT(recorder.lines(), ElementsAreArray(SET_DROP + FLUSH + profileCommands(true) + SET_ACCEPT));
    EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0", "enable post 0"));
    EXPECT_TRUE(isSwitchedOn());
    EXPECT_EQ(readFile(MODULE_STATE), "firewall=\"yes\"\n");
    for (const RecordedCommand &command : recorder.commands())
        EXPECT_THAT(command.inheritedHandles, IsEmpty()) << command.line();

    recorder.clear();
    EXPECT_TRUE(firewall.fwReload(false));
    EXPECT_THAT(recorder.lines(), ElementsAreArray(SET_DROP + FLUSH + profileCommands(false) + SET_ACCEPT));

    recorder.clear();
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_THAT(recorder.lines(), ElementsAreArray(FLUSH));
    EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0", "enable post 0", "disable pre 0", "disable post 0"));
    EXPECT_FALSE(isSwitchedOn());
    EXPECT_EQ(readFile(MODULE_STATE), "firewall=\"no\"\n");

    recorder.clear();
    EXPECT_TRUE(firewall.fwReload(true));
    EXPECT_THAT(recorder.lines(), IsEmpty()) << "a reload of a firewall that is off";
    EXPECT_EQ(readFile(MODULE_STATE), "firewall=\"no\"\n");
    EXPECT_TRUE(firewall.fwReset());
    EXPECT_THAT(recorder.lines(), ElementsAreArray(FLUSH));
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(Lifecycle, HooksRunAroundAllCommands) {
    const std::string hook = "/usr/veld/etc/hooks.d/net/firewall_enable/90-record";
    const CommandRecorder all({"/sbin/iptables", "/sbin/ip6tables", hook});
    EXPECT_TRUE(firewall.fwEnable());
    const auto commands = all.commands();
    ASSERT_EQ(commands.size(), 2 + (SET_DROP + FLUSH + profileCommands(true) + SET_ACCEPT).size());
    EXPECT_EQ(commands.front().line(), hook + " pre");
    EXPECT_EQ(commands.back().line(), hook + " post");
    for (const RecordedCommand &command : commands)
        EXPECT_THAT(command.inheritedHandles, IsEmpty()) << command.line();
}

TEST_F(Lifecycle, EveryCommandThatFailsLeavesADefinedState) {
    const Lines whole = SET_DROP + FLUSH + profileCommands(true) + SET_ACCEPT;
    const size_t listBegin = SET_DROP.size() + FLUSH.size();
    const size_t listEnd = whole.size() - SET_ACCEPT.size();
    for (size_t n = 1; n <= whole.size(); ++n) {
        SCOPED_TRACE("command " + std::to_string(n) + " fails: " + whole[n - 1]);
        ASSERT_TRUE(firewall.fwDisable());
        recorder.clear();
        log.clear();
        removeAll("/run/hook-runs");
        recorder.failAt(static_cast<unsigned>(n), 2, "refused");
        const bool outcome = firewall.fwEnable();
        const Lines reached(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(n));
        EXPECT_THAT(errors(), Contains("veldFW.cpp Failed to execute \"" + whole[n - 1] + "\""));
        EXPECT_TRUE(execLockIsFree());
        if (n <= SET_DROP.size()) {
            EXPECT_FALSE(outcome);
            EXPECT_TRUE(isSwitchedOn()) << "nothing was replaced yet";
            EXPECT_EQ(recorder.lines(), reached);
            EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0", "enable post -1"));
            EXPECT_THAT(errors(), Contains("veldFW.cpp Failed to fwExec() to set default drop."));
        } else if (n <= listBegin) {
            EXPECT_TRUE(outcome) << "a chain that cannot be flushed stops nothing";
            EXPECT_TRUE(isSwitchedOn());
            EXPECT_EQ(recorder.lines(), whole);
            EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0", "enable post 0"));
        } else {
            const bool inList = n <= listEnd;
            EXPECT_FALSE(outcome);
            EXPECT_FALSE(isSwitchedOn());
            EXPECT_EQ(recorder.lines(), reached + FLUSH + (inList ? SET_ACCEPT : Lines()));
            EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0", "disable pre 0", "disable post 0", "enable post -1"));
            EXPECT_THAT(errors(), Contains(inList ? "veldFW.cpp Failed to fwExec() so disable firewall"
                                                  : "veldFW.cpp Failed to fwExec() to set default accept."));
            EXPECT_EQ(readFile(MODULE_STATE), "firewall=\"no\"\n");
        }
        if (!outcome) {
            EXPECT_EQ(errors().back(), "veldFW.cpp Failed to apply firewall rules");
        }
    }
}

TEST_F(Lifecycle, ProfileThatCannotBeConvertedRestoresAcceptAndPassesTheError) {
    switchOn();
    writeFile(PROFILE, R"({"name": "default", "rules": {"global": [{"policy": {}}]}})");
    EXPECT_THROW(firewall.fwReload(true), Json::Exception);
    EXPECT_THAT(recorder.lines(), ElementsAreArray(SET_DROP + FLUSH + SET_ACCEPT));
    EXPECT_TRUE(execLockIsFree());
    recorder.clear();
    EXPECT_THROW(firewall.fwEnable(), Json::Exception);
    EXPECT_THAT(recorder.lines(), ElementsAreArray(SET_DROP + FLUSH + SET_ACCEPT));
    EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0", "enable post -1"));
    EXPECT_TRUE(execLockIsFree());
    EXPECT_TRUE(isSwitchedOn());
}

struct BrokenStore {
    const char *name;
    std::string settings;
    FW::FW_POLICY policy;  ///< of the rule in "default"
    std::vector<std::string> errors;
};

class BrokenProfile : public Lifecycle, public testing::WithParamInterface<BrokenStore> {};

TEST_P(BrokenProfile, IsNotAppliedAndTheFirewallStaysOn) {
    switchOn();
    storeRules({portRule("23", GetParam().policy)});
    writeFile(SETTINGS, GetParam().settings);
    EXPECT_FALSE(firewall.fwReload(true));
    EXPECT_THAT(recorder.lines(), ElementsAreArray(SET_DROP + FLUSH + SET_ACCEPT));
    EXPECT_EQ(errors(), GetParam().errors);
    EXPECT_TRUE(isSwitchedOn());
    EXPECT_THAT(hookRuns(), IsEmpty());
    EXPECT_TRUE(execLockIsFree());
}

INSTANTIATE_TEST_SUITE_P(
    Case, BrokenProfile,
    testing::Values(
        BrokenStore{"NoActiveProfile",
                    R"({"status": true})",
                    FW::FW_POLICY_DENY,
                    {"veldFW.cpp There are no key: profile in config", "veldFW.cpp Failed to fwProfileConfigGet()"}},
        BrokenStore{"UnknownProfile",
                    R"({"status": true, "profile": "gone"})",
                    FW::FW_POLICY_DENY,
                    {"veldFW.cpp Failed to profileGet(gone)", "veldFW.cpp Failed to fwIptablesRulesEnum()"}},
        BrokenStore{"UnknownPolicy",
                    R"({"status": true, "profile": "default"})",
                    static_cast<FW::FW_POLICY>(9),
                    {"fwIptables.cpp Unknown policy 9", "fwIptables.cpp Failed to policyToIptablesArg()",
                     "veldFW.cpp Failed to fwRulesToIptablesRules()", "veldFW.cpp Failed to fwIptablesRulesEnum()"}}),
    [](const auto &entry) { return entry.param.name; });

TEST_F(Lifecycle, SettingsThatCannotBeReadStopEverySwitch) {
    switchOn();
    writeFile(SETTINGS, "{ broken");
    EXPECT_FALSE(firewall.fwReload(true));
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Falied to configGet()", "veldFW.cpp Failed to check status"));
    log.clear();
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_THAT(recorder.lines(), IsEmpty());
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Falied to config.configGet()", "veldFW.cpp Falied to configSet()"));
    EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0", "enable post -1"));
    removeAll("/run/hook-runs");
    EXPECT_FALSE(firewall.fwDisable());
    EXPECT_THAT(recorder.lines(), ElementsAreArray(FLUSH));
    EXPECT_THAT(hookRuns(), ElementsAre("disable pre 0", "disable post -1"));
    EXPECT_TRUE(execLockIsFree());
}

TEST_F(Lifecycle, WithoutTheModuleListNothingIsTouched) {
    removeAll(MODULE_LIST);
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_THAT(hookRuns(), IsEmpty());
    EXPECT_FALSE(pathExists(SETTINGS));
    EXPECT_THAT(
        errors(),
        ElementsAre("veldIptablesModule.cpp Failed to get key KERNEL_MODULES_CORE from " + std::string(MODULE_LIST),
                    "veldIptablesModule.cpp Failed to coreCommonModuleLoad()",
                    "veldFW.cpp Failed to iptablesCoreModLoad", "veldFW.cpp Failed to firewallModLoad()"));
    writeFile(SETTINGS, R"({"status": true, "profile": "default"})");
    EXPECT_FALSE(firewall.fwReload(true));
    EXPECT_THAT(recorder.lines(), IsEmpty());
    EXPECT_TRUE(execLockIsFree());
}

TEST_F(Lifecycle, LoadedModulesAreLoadedOnce) {
    switchOn();
    removeAll(MODULE_LIST);
    EXPECT_TRUE(firewall.fwReload(true)) << "the state file says that they are loaded";
    EXPECT_TRUE(firewall.fwDisable()) << "a failure to unload stops nothing";
    EXPECT_THAT(errors(), Contains("veldFW.cpp Failed to iptablesCoreModLoad"));
    EXPECT_FALSE(isSwitchedOn());
}

TEST_F(Lifecycle, FlushGoesOnPastFailures) {
    recorder.failMatching("/sbin/iptables -F", 1, "refused");
    EXPECT_FALSE(firewall.fwClear());
    EXPECT_EQ(recorder.lines(), FLUSH);
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Failed to execute /sbin/iptables",
                                      "veldFW.cpp Failed to execute \"/sbin/iptables -F INPUT_FIREWALL\"",
                                      "veldFW.cpp Failed to execute /sbin/iptables",
                                      "veldFW.cpp Failed to execute \"/sbin/iptables -F FORWARD_FIREWALL\""));
}

}  // namespace
