// SPDX-License-Identifier: Apache-2.0
// The hooks that announce a switch.
#include "commandRecorder.h"
#include "firewallTest.h"
#include "veldfirewall/fwHook.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

class Hook : public FirewallTest {
protected:
    Hook() { installNotingHooks(); }

    FW::VeldFwHook hook;
};

TEST_F(Hook, EachOperationNamesItsHookMomentAndResult) {
    EXPECT_TRUE(hook.RunFwEnablePreHook());
    EXPECT_TRUE(hook.RunFwDisablePreHook());
    for (const bool result : {true, false}) {
        EXPECT_TRUE(hook.RunFwEnablePostHook(result));
        EXPECT_TRUE(hook.RunFwDisablePostHook(result));
    }
    EXPECT_THAT(takeHookRuns(), ElementsAre("enable pre 0", "disable pre 0", "enable post 0", "disable post 0",
                                            "enable post -1", "disable post -1"));
    EXPECT_TRUE(log.messages().empty()) << log.text();
}

TEST_F(Hook, FailureIsToldAndNeverDecidesTheSwitch) {
    const CommandRecorder recorder;
    for (const char *action : {"enable", "disable"})
        installHook(action, "10-fails", "echo no mail server >&2; exit 3");
    EXPECT_TRUE(firewall.fwEnable());
    EXPECT_TRUE(isSwitchedOn());
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

TEST_F(Hook, ThatHangsIsEndedAndTheOthersStillRun) {
    installHook("enable", "10-hangs", "trap '' TERM; sleep 600; echo survived >> /run/hook-runs");
    EXPECT_FALSE(hook.RunFwEnablePostHook(false));
    EXPECT_THAT(takeHookRuns(), ElementsAre("enable post -1"));
    EXPECT_TRUE(log.contains("10-hangs")) << log.text();
}

}  // namespace
