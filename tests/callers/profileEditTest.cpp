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
using testing::ElementsAre;
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
    /// The text of the three profile files.
    static std::vector<std::string> files() {
        std::vector<std::string> texts;
        for (const std::string name : {"1", "2", "3"}) {
            texts.push_back(readFile(profileDirectory + name + ".json"));
        }
        return texts;
    }
    bool reloaded() {
        const bool any = !recorder.lines().empty();
        recorder.clear();
        return any;
    }

    CommandRecorder recorder;
    SystemLog log;
    VELDFW_PROFILE profiles;
};

TEST_F(ProfileEdit, EveryProfileGetsTheReservedRuleAndIsStoredInItsOwnFile) {
    EXPECT_TRUE(profiles.profileAddServToReserve("eth1", "web", FW_POLICY_DENY, false));
    for (const char *name : {"a", "b", "c"}) {
        const FWPROFILE profile = storedProfile(name);
        ASSERT_EQ(profile.rules.count("eth1"), 1u) << name;
        EXPECT_EQ(profile.rules.at("eth1").at(0).portList, std::vector<std::string>{"web"});
        EXPECT_EQ(profile.adapterPolicyMap.at("eth1"), FW_POLICY_ALLOW);
        EXPECT_EQ(profile.adapterPolicyMap.at("global"), FW_POLICY_NONE);
    }
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre("1.json", "2.json", "3.json", "firewall_settings.json"));
    EXPECT_FALSE(reloaded());
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(ProfileEdit, ARemovedServiceLeavesEveryProfileAndNothingIsReloaded) {
    EXPECT_TRUE(profiles.profileRemoveServ("ssh"));
    EXPECT_THAT(storedProfile("a").rules, IsEmpty());
    EXPECT_THAT(storedProfile("b").rules, IsEmpty());
    EXPECT_EQ(storedProfile("c").adapterPolicyMap.at("global"), FW_POLICY_NONE);  // stored, although not concerned
    EXPECT_FALSE(reloaded());
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(ProfileEdit, AReservationReloadsOnRequestWhicheverProfileIsActive) {
    EXPECT_TRUE(profiles.profileAddServToReserve("eth1", "web", FW_POLICY_DENY, true));
    EXPECT_TRUE(reloaded());
    storeSettings(false, "a");
    EXPECT_TRUE(profiles.profileAddServToReserve("eth1", "web", FW_POLICY_DENY, true));
    EXPECT_FALSE(reloaded());
    EXPECT_THAT(errorsOf(log), IsEmpty());
    storeSettings(true, "gone");
    EXPECT_FALSE(profiles.profileAddServToReserve("eth1", "web", FW_POLICY_DENY, true));
    EXPECT_EQ(errorsOf(log).back(), "veldFW.cpp Failed to firewall reload");
}

TEST_F(ProfileEdit, ARenamedAdapterReloadsOnlyWhenTheActiveProfilesPoliciesNamedIt) {
    EXPECT_TRUE(profiles.profileChangeAdapter("eth0", "bond0", false));
    EXPECT_FALSE(reloaded());
    EXPECT_EQ(storedProfile("a").adapterPolicyMap.at("bond0"), FW_POLICY_DENY);
    EXPECT_EQ(storedProfile("a").rules.count("eth0"), 0u);
    EXPECT_EQ(storedProfile("b").rules.count("bond0"), 1u);
    EXPECT_TRUE(profiles.profileChangeAdapter("bond0", "bond1", true));
    EXPECT_TRUE(reloaded());
    EXPECT_TRUE(profiles.profileChangeAdapter("eth9", "bond9", true));
    EXPECT_FALSE(reloaded());
    // The active profile names the adapter in its rules alone, another profile in its policies.
    storeProfile("1.json", {"a", {{"eth0", {serviceRule(FW_POLICY_DENY, {"ssh"})}}}, {}});
    storeProfile("2.json", {"b", {}, {{"eth0", FW_POLICY_DENY}}});
    EXPECT_TRUE(profiles.profileChangeAdapter("eth0", "eth5", true));
    EXPECT_FALSE(reloaded());
    EXPECT_THAT(errorsOf(log), IsEmpty());
    recorder.failMatching("-j");
    EXPECT_FALSE(profiles.profileChangeAdapter("eth5", "eth6", true));
    EXPECT_EQ(errorsOf(log).back(), "veldFW.cpp Failed to reload firewall");
    EXPECT_EQ(storedProfile("b").adapterPolicyMap.count("eth6"), 1u);
}

struct Edit {
    const char *name;
    std::function<bool(VELDFW_PROFILE &)> run;
    std::string storeError;
};

const std::vector<Edit> edits = {
    {"reserve", [](VELDFW_PROFILE &p) { return p.profileAddServToReserve("eth0", "web", FW_POLICY_ALLOW, true); },
     "veldFW.cpp Failed to set profile"},
    {"remove", [](VELDFW_PROFILE &p) { return p.profileRemoveServ("ssh"); }, "veldFW.cpp Failed to profile set [b]"},
    {"rename", [](VELDFW_PROFILE &p) { return p.profileChangeAdapter("eth0", "eth1", true); },
     "veldFW.cpp Failed to profile set [b]"},
};

TEST_F(ProfileEdit, TheFirstProfileThatCannotBeStoredEndsTheEdit) {
    for (const Edit &edit : edits) {
        SCOPED_TRACE(edit.name);
        SetUp();
        log.clear();
        makeDirectories(profileDirectory + "2.json.tmp");  // in the way of the write
        const auto before = files();
        EXPECT_FALSE(edit.run(profiles));
        const auto after = files();
        EXPECT_NE(after[0], before[0]);
        EXPECT_EQ(after[1], before[1]);
        EXPECT_EQ(after[2], before[2]);
        EXPECT_FALSE(reloaded());
        EXPECT_EQ(errorsOf(log).back(), edit.storeError);
        removeAll(profileDirectory + "2.json.tmp");
    }
}

TEST_F(ProfileEdit, AStoreThatCannotBeReadFailsTheEditAndChangesNothing) {
    for (const Edit &edit : edits) {
        SCOPED_TRACE(edit.name);
        SetUp();
        writeFile(profileDirectory + "3.json", R"({"name": "c", "rules": {"eth0": [{"policy": {}}]}})");
        const auto before = files();
        log.clear();
        EXPECT_FALSE(edit.run(profiles));
        EXPECT_EQ(errorsOf(log).back(), "veldFW.cpp Failed to profileEnum()");
        EXPECT_EQ(files(), before);
    }
    removeAll(profileDirectory);
    for (const Edit &edit : edits) {
        SCOPED_TRACE(edit.name);
        log.clear();
        EXPECT_FALSE(edit.run(profiles));
        EXPECT_THAT(errorsOf(log), ElementsAre("fwDB.cpp Fail to read file from " + profileDirectory,
                                               "fwDB.cpp Failed to create meta json from " + profileDirectory,
                                               "veldFW.cpp Failed to profileEnum()"));
    }
}

TEST_F(ProfileEdit, ARenameNeedsTheNameOfTheActiveProfile) {
    writeFile(settingsFile, R"({"status": true})");
    const auto before = files();
    EXPECT_FALSE(profiles.profileChangeAdapter("eth0", "eth1", true));
    EXPECT_EQ(errorsOf(log).back(), "veldFW.cpp Failed to fwProfileConfigGet()");
    EXPECT_EQ(files(), before);
}

}  // namespace
