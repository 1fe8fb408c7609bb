// SPDX-License-Identifier: Apache-2.0
// The hooks that announce a switch.
#include "commandRecorder.h"
#include "files.h"
#include "firewallTest.h"
#include "veldfirewall/fwHook.h"

using namespace veldtest;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

const std::string HOOKS = "/usr/veld/etc/hooks.d/net/firewall_";

class Hook : public FirewallTest {
protected:
    FW::VeldFwHook hook;
};

TEST_F(Hook, EachOperationNamesItsHookMomentAndResult) {
    installNotingHooks();
    EXPECT_TRUE(hook.RunFwEnablePreHook());
    EXPECT_TRUE(hook.RunFwEnablePostHook(true));
    EXPECT_TRUE(hook.RunFwEnablePostHook(false));
    EXPECT_TRUE(hook.RunFwDisablePreHook());
    EXPECT_TRUE(hook.RunFwDisablePostHook(true));
    EXPECT_TRUE(hook.RunFwDisablePostHook(false));
    EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0", "enable post 0", "enable post -1", "disable pre 0",
                                        "disable post 0", "disable post -1"));
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(Hook, NobodyToTellIsSuccess) {
    EXPECT_TRUE(hook.RunFwEnablePreHook());
    EXPECT_TRUE(hook.RunFwDisablePostHook(false));
    EXPECT_TRUE(log.messages().empty()) << log.text();
}

TEST_F(Hook, FailureIsToldAndTheOthersStillRun) {
    installNotingHooks();
    writeFile(HOOKS + "enable/10-fails", "#!/bin/sh\necho no mail server >&2\nexit 3\n", 0755);
    writeFile(HOOKS + "enable/20-no-program", "", 0755);
    EXPECT_FALSE(hook.RunFwEnablePreHook());
    EXPECT_THAT(hookRuns(), ElementsAre("enable pre 0"));
    EXPECT_THAT(errors(), ElementsAre("fwHook.cpp Failed to run hook: net/firewall_enable"));
    EXPECT_TRUE(log.contains("no mail server")) << log.text();
    EXPECT_FALSE(hook.RunFwHook("../../outside", FW::VeldFwHook::HOOK_PRE, true));
    EXPECT_THAT(errors(), Contains("fwHook.cpp Failed to init hook plugin"));
}

TEST_F(Hook, FailureNeverDecidesTheSwitch) {
    const CommandRecorder recorder;
    for (const std::string name : {"enable", "disable"})
        writeFile(HOOKS + name + "/10-fails", "#!/bin/sh\nexit 1\n", 0755);
    EXPECT_TRUE(firewall.fwEnable());
    EXPECT_TRUE(isSwitchedOn());
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_FALSE(isSwitchedOn());
    EXPECT_THAT(errors(), ElementsAre("fwHook.cpp Failed to run hook: net/firewall_enable",
                                      "veldFW.cpp Failed to run firewall enable pre-hook.",
                                      "fwHook.cpp Failed to run hook: net/firewall_enable",
                                      "veldFW.cpp Failed to run firewall enable post-hook.",
                                      "fwHook.cpp Failed to run hook: net/firewall_disable",
                                      "veldFW.cpp Failed to run firewall disable pre-hook.",
                                      "fwHook.cpp Failed to run hook: net/firewall_disable",
                                      "veldFW.cpp Failed to run firewall disable post-hook."));
}

TEST_F(Hook, ThatHangsIsEndedAndTheOthersStillRun) {
    installNotingHooks();
    writeFile(HOOKS + "enable/10-hangs", "#!/bin/sh\ntrap '' TERM\nsleep 600\necho survived >> /run/hook-runs\n", 0755);
    EXPECT_FALSE(hook.RunFwEnablePostHook(false));
    EXPECT_THAT(hookRuns(), ElementsAre("enable post -1"));
    EXPECT_TRUE(log.contains("10-hangs")) << log.text();
}

}  // namespace
