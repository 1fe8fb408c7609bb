// SPDX-License-Identifier: Apache-2.0
// Edits that span all stored profiles: which are stored, what is logged, when the firewall is reloaded.
#include "commandRecorder.h"
#include "files.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <veldfirewall/veldFW.h>

#include <functional>

using namespace FW;
using namespace veldtest;
using testing::IsEmpty;

namespace {

class ProfileEdit : public testing::Test {
protected:
    void SetUp() override {
        installPlatformData();
        const std::vector<FWRULE> rules = {serviceRule(FW_POLICY_DENY, {"ssh"})};
        storeProfile("1.json", {"a", {{"eth0", rules}}, {{"eth0", FW_POLICY_DENY}, {"global", FW_POLICY_ALLOW}}});
        storeProfile("2.json", {"b", {{"eth0", rules}}, {}});
        storeProfile("3.json", {"c", {}, {}});
        storeSettings(true, "a");
    }
    static std::string text(const std::string &file) { return readFile(profileDirectory + file); }
    bool reloaded() {
        const bool any = !recorder.lines().empty();
        recorder.clear();
        return any;
    }

    CommandRecorder recorder;
    SystemLog log;
    VELDFW_PROFILE profiles;
};

TEST_F(ProfileEdit, EveryProfileGetsTheReservedRuleAndTheFirewallIsReloadedOnRequest) {
    EXPECT_TRUE(profiles.profileAddServToReserve("eth1", "web", FW_POLICY_DENY, false));
    for (const char *name : {"a", "b", "c"}) {
        const FWPROFILE profile = storedProfile(name);
        ASSERT_EQ(profile.rules.count("eth1"), 1u) << name;
        EXPECT_EQ(profile.rules.at("eth1").at(0).portList, std::vector<std::string>{"web"});
        EXPECT_EQ(profile.adapterPolicyMap.at("eth1"), FW_POLICY_ALLOW);
        EXPECT_EQ(profile.adapterPolicyMap.at("global"), FW_POLICY_NONE);
    }
    EXPECT_EQ(listDirectory(profileDirectory).size(), 4u) << "each in its own file";
    EXPECT_FALSE(reloaded());
    EXPECT_TRUE(profiles.profileAddServToReserve("eth1", "web", FW_POLICY_DENY, true));
    EXPECT_TRUE(reloaded());
    storeSettings(false, "a");
    EXPECT_TRUE(profiles.profileAddServToReserve("eth1", "web", FW_POLICY_DENY, true));
    EXPECT_FALSE(reloaded());
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(ProfileEdit, ARemovedServiceLeavesEveryProfileAndNothingIsReloaded) {
    EXPECT_TRUE(profiles.profileRemoveServ("ssh"));
    EXPECT_THAT(storedProfile("a").rules, IsEmpty());
    EXPECT_THAT(storedProfile("b").rules, IsEmpty());
    EXPECT_EQ(storedProfile("c").adapterPolicyMap.at("global"), FW_POLICY_NONE);  // stored, although not concerned
    EXPECT_FALSE(reloaded());
}

TEST_F(ProfileEdit, ARenamedAdapterReloadsOnlyWhenTheActiveProfilesPoliciesNamedIt) {
    EXPECT_TRUE(profiles.profileChangeAdapter("eth0", "bond0", false));
    EXPECT_FALSE(reloaded());
    EXPECT_EQ(storedProfile("a").adapterPolicyMap.at("bond0"), FW_POLICY_DENY);
    EXPECT_EQ(storedProfile("a").rules.count("eth0"), 0u);
    EXPECT_EQ(storedProfile("b").rules.count("bond0"), 1u);
    EXPECT_TRUE(profiles.profileChangeAdapter("bond0", "bond1", true));
    EXPECT_TRUE(reloaded());
    // The active profile names the adapter in its rules alone, another profile in its policies.
    storeProfile("1.json", {"a", {{"eth0", {serviceRule(FW_POLICY_DENY, {"ssh"})}}}, {}});
    storeProfile("2.json", {"b", {}, {{"eth0", FW_POLICY_DENY}}});
    EXPECT_TRUE(profiles.profileChangeAdapter("eth0", "eth5", true));
    EXPECT_FALSE(reloaded());
    writeFile(settingsFile, R"({"status": true})");
    const std::string before = text("2.json");
    EXPECT_FALSE(profiles.profileChangeAdapter("eth5", "eth6", true)) << "needs the name of the active profile";
    EXPECT_EQ(text("2.json"), before);
}

TEST_F(ProfileEdit, TheFirstProfileThatCannotBeStoredEndsTheEdit) {
    struct Edit {
        std::function<bool()> run;
        std::string error;
    };
    const Edit edits[] = {
        {[&] { return profiles.profileAddServToReserve("eth0", "web", FW_POLICY_ALLOW, true); },
         "veldFW.cpp Failed to set profile"},
        {[&] { return profiles.profileRemoveServ("ssh"); }, "veldFW.cpp Failed to profile set [b]"},
        {[&] { return profiles.profileChangeAdapter("eth0", "eth1", true); }, "veldFW.cpp Failed to profile set [b]"},
    };
    makeDirectories(profileDirectory + "2.json.tmp");  // in the way of the write
    for (const Edit &edit : edits) {
        SetUp();
        const std::string first = text("1.json"), others = text("2.json") + text("3.json");
        EXPECT_FALSE(edit.run());
        EXPECT_NE(text("1.json"), first);
        EXPECT_EQ(text("2.json") + text("3.json"), others);
        EXPECT_FALSE(reloaded());
        EXPECT_EQ(lastError(log), edit.error);
    }
}

}  // namespace
