// SPDX-License-Identifier: Apache-2.0
// Switching on, applying and switching off: the exact commands, the hooks, the lock, and every way to fail on the way.
#include <unistd.h>
#include <veld/core.h>

#include <csignal>
#include <sstream>

#include "commandRecorder.h"
#include "files.h"
#include "firewallTest.h"
#include "processes.h"

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

class Lifecycle : public FirewallTest {
protected:
    Lifecycle() {
        FW::VELDFW_PROFILE().profileSet("default", {"default", {{"global", {portRule("23", FW::FW_POLICY_DENY)}}}, {}});
        installNotingHooks();
    }

    /// Forgets what was noted up to now.
    void startAnew() {
        recorder.clear();
        log.clear();
        takeHookRuns();
    }

    /// Everything that applies the profile.
    Lines applying(bool keepEstablished) {
        Json::Value commands;
        EXPECT_TRUE(firewall.fwIptablesRulesEnum("default", commands, keepEstablished));
        Lines lines = SET_DROP + FLUSH;
        for (const auto &[family, program] : {std::pair("v4", "/sbin/iptables "), {"v6", "/sbin/ip6tables "}}) {
            for (const Json::Value &command : commands[family]["global"])
                lines.push_back(program + command.asString());
        }
        EXPECT_EQ(lines.size(), keepEstablished ? 28u : 24u);
        return lines + SET_ACCEPT;
    }

    CommandRecorder recorder;
};

TEST_F(Lifecycle, EnableReloadAndDisableRunExactlyTheseCommands) {
    EXPECT_TRUE(firewall.fwEnable());
    EXPECT_THAT(recorder.lines(), ElementsAreArray(applying(true)));
    EXPECT_THAT(takeHookRuns(), ElementsAre("enable pre 0", "enable post 0"));
    EXPECT_TRUE(isSwitchedOn());
    EXPECT_EQ(readFile(MODULE_STATE), "firewall=\"yes\"\n");
    recorder.clear();
    EXPECT_TRUE(firewall.fwReload(false));
    EXPECT_THAT(recorder.lines(), ElementsAreArray(applying(false)));
    recorder.clear();
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_TRUE(firewall.fwReload(true)) << "of a firewall that is off";
    EXPECT_THAT(recorder.lines(), ElementsAreArray(FLUSH));
    EXPECT_THAT(takeHookRuns(), ElementsAre("disable pre 0", "disable post 0"));
    EXPECT_FALSE(isSwitchedOn());
    EXPECT_EQ(readFile(MODULE_STATE), "firewall=\"no\"\n");
    recorder.clear();
    EXPECT_TRUE(firewall.fwReset());
    EXPECT_THAT(recorder.lines(), ElementsAreArray(FLUSH));
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(Lifecycle, HooksRunAroundAllCommandsAndNothingInheritsDescriptors) {
    const std::string hook = "/usr/veld/etc/hooks.d/net/firewall_enable/90-record";
    const CommandRecorder all({"/sbin/iptables", "/sbin/ip6tables", hook});
    EXPECT_TRUE(firewall.fwEnable());
    EXPECT_THAT(all.lines(), ElementsAreArray(Lines{hook + " pre"} + applying(true) + Lines{hook + " post"}));
    for (const RecordedCommand &command : all.commands())
        EXPECT_THAT(command.inheritedHandles, IsEmpty()) << command.line();
}

TEST_F(Lifecycle, EveryCommandThatFailsLeavesADefinedState) {
    const Lines whole = applying(true);
    const size_t listBegin = SET_DROP.size() + FLUSH.size();
    const size_t listEnd = whole.size() - SET_ACCEPT.size();
    for (size_t n = 1; n <= whole.size(); ++n) {
        SCOPED_TRACE("command " + std::to_string(n) + " fails: " + whole[n - 1]);
        ASSERT_TRUE(firewall.fwDisable());
        startAnew();
        recorder.failAt(static_cast<unsigned>(n), 2, "refused");
        const bool outcome = firewall.fwEnable();
        const Lines reached(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(n));
        EXPECT_THAT(errors(), Contains("veldFW.cpp Failed to execute \"" + whole[n - 1] + "\""));
        EXPECT_TRUE(execLockIsFree());
        if (n <= SET_DROP.size()) {
            EXPECT_TRUE(isSwitchedOn()) << "nothing was replaced yet";
            EXPECT_EQ(recorder.lines(), reached);
            EXPECT_THAT(takeHookRuns(), ElementsAre("enable pre 0", "enable post -1"));
            EXPECT_THAT(errors(), Contains("veldFW.cpp Failed to fwExec() to set default drop."));
        } else if (n <= listBegin) {
            EXPECT_TRUE(isSwitchedOn()) << "a chain that cannot be flushed stops nothing";
            EXPECT_EQ(recorder.lines(), whole);
            EXPECT_THAT(takeHookRuns(), ElementsAre("enable pre 0", "enable post 0"));
        } else {
            const bool inList = n <= listEnd;
            EXPECT_FALSE(isSwitchedOn());
            EXPECT_EQ(recorder.lines(), reached + FLUSH + (inList ? SET_ACCEPT : Lines()));
            EXPECT_THAT(takeHookRuns(),
                        ElementsAre("enable pre 0", "disable pre 0", "disable post 0", "enable post -1"));
            EXPECT_THAT(errors(), Contains(inList ? "veldFW.cpp Failed to fwExec() so disable firewall"
                                                  : "veldFW.cpp Failed to fwExec() to set default accept."));
            EXPECT_EQ(readFile(MODULE_STATE), "firewall=\"no\"\n");
        }
        EXPECT_EQ(outcome, n > SET_DROP.size() && n <= listBegin);
        EXPECT_EQ(errors().back() == "veldFW.cpp Failed to apply firewall rules", !outcome);
    }
}

TEST_F(Lifecycle, ProfileThatCannotBeAppliedRestoresAcceptAndTheFirewallStaysOn) {
    ASSERT_TRUE(firewall.fwEnable()) << log.text();
    takeHookRuns();
    // The settings, the policy of a rule, and the last error; none: an exception of the conversion passes.
    const std::tuple<std::string, std::string, std::string> rows[] = {
        {R"({"status": true})", "1", "veldFW.cpp Failed to fwProfileConfigGet()"},
        {R"({"status": true, "profile": "gone"})", "1", "veldFW.cpp Failed to fwIptablesRulesEnum()"},
        {R"({"status": true, "profile": "default"})", "9", "veldFW.cpp Failed to fwIptablesRulesEnum()"},
        {R"({"status": true, "profile": "default"})", "{}", ""},
    };
    for (const auto &[settings, policy, error] : rows) {
        SCOPED_TRACE(settings + ", policy " + policy);
        writeFile(SETTINGS, settings);
        writeFile(PROFILE, R"({"name": "default", "rules": {"global": [{"enable": true, "policy": )" + policy + "}]}}");
        recorder.clear();
        log.clear();
        if (error.empty()) {
            EXPECT_THROW(firewall.fwReload(true), Json::Exception);
        } else {
            EXPECT_FALSE(firewall.fwReload(true));
            ASSERT_THAT(errors(), Contains(error));
        }
        EXPECT_THAT(recorder.lines(), ElementsAreArray(SET_DROP + FLUSH + SET_ACCEPT));
        EXPECT_TRUE(isSwitchedOn());
        EXPECT_TRUE(execLockIsFree());
    }
    EXPECT_THROW(firewall.fwEnable(), Json::Exception);
    EXPECT_THAT(takeHookRuns(), ElementsAre("enable pre 0", "enable post -1"));
}

TEST_F(Lifecycle, SettingsThatCannotBeReadStopEverySwitch) {
    ASSERT_TRUE(firewall.fwEnable()) << log.text();
    startAnew();
    writeFile(SETTINGS, "{ broken");
    EXPECT_FALSE(firewall.fwReload(true));
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_THAT(recorder.lines(), IsEmpty());
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Falied to configGet()", "veldFW.cpp Failed to check status",
                                      "veldFW.cpp Falied to config.configGet()", "veldFW.cpp Falied to configSet()"));
    EXPECT_FALSE(firewall.fwDisable());
    EXPECT_THAT(recorder.lines(), ElementsAreArray(FLUSH));
    EXPECT_THAT(takeHookRuns(), ElementsAre("enable pre 0", "enable post -1", "disable pre 0", "disable post -1"));
    EXPECT_TRUE(execLockIsFree());
}

TEST_F(Lifecycle, FailureOfAHookIsToldAndNeverDecidesTheSwitch) {
    for (const char *action : {"enable", "disable"})
        installHook(action, "10-fails", "echo no mail server >&2; exit 3");
    EXPECT_TRUE(firewall.fwEnable());
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_FALSE(isSwitchedOn());
    EXPECT_THAT(takeHookRuns(), ElementsAre("enable pre 0", "enable post 0", "disable pre 0", "disable post 0"));
    std::vector<std::string> expected;
    for (const std::string action : {"enable", "disable"}) {
        for (const std::string moment : {"pre", "post"}) {
            expected.push_back("fwHook.cpp Failed to run hook: net/firewall_" + action);
            expected.push_back("veldFW.cpp Failed to run firewall " + action + " " + moment + "-hook.");
        }
    }
    EXPECT_EQ(errors(), expected);
    EXPECT_EQ(log.count("no mail server"), 4u) << log.text();
}

TEST_F(Lifecycle, ReloadsWaitForEachOther) {
    ASSERT_TRUE(firewall.fwEnable());
    startAnew();
    int lock = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile(EXEC_LOCK, 1, 0, &lock), 1);
    std::vector<pid_t> processes;
    for (int i = 0; i < 4; ++i)
        processes.push_back(startChild([this] { return firewall.fwReload(true) ? 0 : 1; }));
    sleep(1);
    EXPECT_THAT(recorder.lines(), IsEmpty()) << "commands ran while the lock was held";
    VLIBCFileUnlockByFile(lock);
    for (const pid_t process : processes)
        EXPECT_EQ(waitForChild(process), 0) << log.text();
    const Lines once = applying(true);
    EXPECT_EQ(recorder.lines(), once + once + once + once);
}

TEST_F(Lifecycle, LockIsFreeWhileADaemonThatAHookLeftBehindStillRuns) {
    // The hook of disabling runs below a reload that holds the lock, because a command is refused.
    for (const char *action : {"enable", "disable"})
        installHook(action, "50-daemon", "sleep 600 &\necho $! >> /run/hook-daemons");
    recorder.failMatching("-i lo", 2, "refused");
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_TRUE(execLockIsFree());
    std::istringstream daemons(readFile("/run/hook-daemons"));
    int alive = 0;
    for (pid_t daemon = 0; daemons >> daemon;)
        alive += kill(daemon, SIGKILL) == 0 ? 1 : 0;
    EXPECT_EQ(alive, 4) << "daemons that were there to the end";
}

}  // namespace
