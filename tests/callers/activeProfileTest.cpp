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
using testing::IsEmpty;

namespace {

std::string active() {
    std::string name;
    EXPECT_TRUE(VELDFW().fwProfileConfigGet(name));
    return name;
}

TEST(ActiveProfile, IsStoredBesideOtherSettingsAndAppliedOnlyOnRequest) {
    CommandRecorder recorder;
    SystemLog log;
    installPlatformData();
    storeProfile("1.json", {"home", {}, {}});
    storeProfile("2.json", {"away", {{"global", {portRule(FW_POLICY_DENY, "81")}}}, {}});
    writeFile(settingsFile, R"({"status": true, "profile": "home", "foreign": [1]})");
    for (const std::string name : {"Home", "", "gone"}) {
        EXPECT_FALSE(VELDFW().fwProfileConfigSet(name, true));
        EXPECT_EQ(lastError(log), "veldFW.cpp Profile " + name + " is not in database");
    }
    EXPECT_EQ(active(), "home");
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("away", false));
    EXPECT_EQ(active(), "away");
    EXPECT_THAT(readFile(settingsFile), testing::HasSubstr("foreign"));
    EXPECT_THAT(recorder.lines(), IsEmpty());
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("away", true));
    EXPECT_THAT(recorder.lines(), Contains("/sbin/iptables -t filter -A INPUT_FIREWALL -p tcp --dport 81 -j DROP"));
    recorder.failMatching("--dport 81");
    EXPECT_FALSE(VELDFW().fwProfileConfigSet("away", true));
    EXPECT_EQ(active(), "away");
    EXPECT_FALSE(storedStatus());
    recorder.clear();
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("home", true)) << "only stored while the firewall is off";
    EXPECT_EQ(active(), "home");
    EXPECT_THAT(recorder.lines(), IsEmpty());
    makeDirectories(settingsFile + ".tmp");  // in the way of the write
    EXPECT_FALSE(VELDFW().fwProfileConfigSet("away", false));
    EXPECT_EQ(lastError(log), "veldFW.cpp Falied to configSet()");
    EXPECT_EQ(active(), "home");
}

}  // namespace
