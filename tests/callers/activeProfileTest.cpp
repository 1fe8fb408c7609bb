// SPDX-License-Identifier: Apache-2.0
// Making a stored profile the active one.
#include "commandRecorder.h"
#include "files.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <veldfirewall/veldFW.h>

using namespace FW;
using namespace veldtest;
using testing::Contains;
using testing::ElementsAre;

namespace {

class ActiveProfile : public testing::Test {
protected:
    void SetUp() override {
        installPlatformData();
        storeProfile("1.json", {"home", {{"global", {portRule(FW_POLICY_DENY, "80")}}}, {}});
        storeProfile("2.json", {"away", {{"global", {portRule(FW_POLICY_DENY, "81")}}}, {}});
        writeFile(settingsFile, R"({"status": true, "profile": "home", "foreign": [1]})");
    }
    static std::string active() {
        std::string name;
        EXPECT_TRUE(VELDFW().fwProfileConfigGet(name));
        return name;
    }

    CommandRecorder recorder;
    SystemLog log;
};

const std::string dropPort81 = "/sbin/iptables -t filter -A INPUT_FIREWALL -p tcp --dport 81 -j DROP";

TEST_F(ActiveProfile, IsStoredBesideOtherSettingsAndAppliedOnlyOnRequest) {
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("away", false));
    EXPECT_EQ(active(), "away");
    EXPECT_THAT(readFile(settingsFile), testing::HasSubstr("foreign"));
    EXPECT_THAT(recorder.lines(), ElementsAre());
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("away", true));
    EXPECT_THAT(recorder.lines(), Contains(dropPort81));
    EXPECT_THAT(recorder.lines(), Contains("/sbin/iptables -A INPUT_FIREWALL -m state --state ESTABLISHED,RELATED -j "
                                           "ACCEPT"));
    EXPECT_THAT(errorsOf(log), ElementsAre());
}

TEST_F(ActiveProfile, IsOnlyStoredWhileTheFirewallIsOff) {
    storeSettings(false, "home");
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("away", true));
    EXPECT_EQ(active(), "away");
    EXPECT_THAT(recorder.lines(), ElementsAre());
}

TEST_F(ActiveProfile, UnknownNamesAreRefusedAlsoWhenOnlyTheLetterCaseDiffers) {
    for (const std::string name : {"Home", "", "gone"}) {
        log.clear();
        EXPECT_FALSE(VELDFW().fwProfileConfigSet(name, true));
        EXPECT_THAT(errorsOf(log), ElementsAre("veldFW.cpp Profile " + name + " is not in database"));
    }
    EXPECT_EQ(active(), "home");
    EXPECT_THAT(recorder.lines(), ElementsAre());
}

TEST_F(ActiveProfile, StaysWhenItsRulesAreRefused) {
    recorder.failMatching("--dport 81");
    EXPECT_FALSE(VELDFW().fwProfileConfigSet("away", true));
    EXPECT_EQ(active(), "away");
    EXPECT_FALSE(storedStatus());
    EXPECT_THAT(errorsOf(log), Contains("veldFW.cpp Failed to reload firewall"));
}

TEST_F(ActiveProfile, EachFailureHasItsMessage) {
    writeFile(settingsFile, "[");
    EXPECT_FALSE(VELDFW().fwProfileConfigSet("away", false));
    EXPECT_THAT(errorsOf(log), Contains("veldFW.cpp Falied to configGet()"));
    storeSettings(true, "home");
    makeDirectories(settingsFile + ".tmp");  // in the way of the write
    EXPECT_FALSE(VELDFW().fwProfileConfigSet("away", false));
    EXPECT_THAT(errorsOf(log), Contains("veldFW.cpp Falied to configSet()"));
    EXPECT_EQ(active(), "home");
    removeAll(profileDirectory);
    EXPECT_FALSE(VELDFW().fwProfileConfigSet("away", false));
    EXPECT_THAT(errorsOf(log), Contains("veldFW.cpp Failed to profileEnum()"));
}

}  // namespace
