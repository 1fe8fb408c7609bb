// SPDX-License-Identifier: Apache-2.0
// Block queries of the stored configuration: what is read, how often, and what is told when that fails.
#include "files.h"
#include "openCounter.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <veldfirewall/veldFW.h>

using namespace FW;
using namespace veldtest;
using testing::ElementsAre;

namespace {

using Verdicts = std::map<std::string, FW_POLICY>;
const PortCompareST tcp80 = {0, FW_PROTO_TCP, "80"};

FWPROFILE profileWith(const std::vector<FWRULE> &rules) {
    return {"home", {{"eth0", rules}}, {{"eth0", FW_POLICY_ALLOW}, {"global", FW_POLICY_NONE}}};
}

TEST(StoredQuery, SwitchedOffAllowsTheAskedAdapterWithoutReadingAProfile) {
    storeSettings(false, "no such profile");
    defineService("web", "tcp", "\"80\"");
    SystemLog log;
    Verdicts result = {{"eth0", FW_POLICY_DENY}, {"old", FW_POLICY_DENY}};
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "", result));
    EXPECT_EQ(result, (Verdicts{{"eth0", FW_POLICY_DENY}, {"old", FW_POLICY_DENY}}));
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
    EXPECT_EQ(result, (Verdicts{{"eth0", FW_POLICY_ALLOW}, {"old", FW_POLICY_DENY}}));
    Verdicts merged = {{"eth0", FW_POLICY_DENY}};  // the severer of the two stays
    EXPECT_TRUE(VELDFW().fwServIsBlocked("web", "eth0", merged));
    EXPECT_TRUE(VELDFW().fwServIsBlocked("web", "eth1", merged));
    EXPECT_TRUE(VELDFW().fwServIsBlocked("web", "", merged));
    EXPECT_EQ(merged, (Verdicts{{"eth0", FW_POLICY_DENY}, {"eth1", FW_POLICY_ALLOW}}));
    EXPECT_THAT(errorsOf(log), ElementsAre());
}

TEST(StoredQuery, EveryFailureIsToldAndNothingIsThrown) {
    defineService("web", "tcp", "\"80\"");
    storeProfile("1.json", profileWith({}));
    writeFile(profileDirectory + "2.json", R"({"name": "odd", "rules": {"eth0": [{"policy": {}}]}})");
    const std::pair<const char *, const char *> cases[] = {
        // settings, last error
        {"{", "veldFW.cpp Failed to check firewall status"},
        {R"({"status": {}, "profile": "home"})", "veldFW.cpp Failed to check firewall status"},
        {R"({"status": true})", "veldFW.cpp Failed to fwProfileConfigGet()"},
        {R"({"status": true, "profile": "gone"})", "veldFW.cpp Failed to profileGet(gone)"},
        {R"({"status": true, "profile": "odd"})", "veldFW.cpp Failed to profileGet(odd)"},
    };
    for (const auto &[settings, error] : cases) {
        SCOPED_TRACE(settings);
        writeFile(settingsFile, settings);
        Verdicts result = {{"eth0", FW_POLICY_PARTIAL}};
        SystemLog log;
        EXPECT_FALSE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
        EXPECT_EQ(lastError(log), error);
        EXPECT_FALSE(VELDFW().fwServIsBlocked("web", "eth0", result));
        EXPECT_EQ(lastError(log), "veldFW.cpp Failed to fwPortIsBlocked()");
        EXPECT_EQ(result, (Verdicts{{"eth0", FW_POLICY_PARTIAL}}));
    }
}

TEST(StoredQuery, AServiceIsAsBlockedAsItsWorstPort) {
    storeSettings(true, "home");
    defineService("mixed", "tcp", "\"80\", \"81\", \"82-84\"");
    defineService("open", "tcp", "\"85\"");
    const std::pair<std::vector<FWRULE>, FW_POLICY> cases[] = {
        {{portRule(FW_POLICY_DENY, "84-90")}, FW_POLICY_DENY},
        {{portRule(FW_POLICY_DENY, "81", "10.0.0.1")}, FW_POLICY_PARTIAL},
        {{portRule(FW_POLICY_DENY, "81", "10.0.0.1"), portRule(FW_POLICY_DENY, "80")}, FW_POLICY_DENY},
        {{serviceRule(FW_POLICY_DENY, {"gone", "mixed"})}, FW_POLICY_DENY},
        {{serviceRule(FW_POLICY_DENY, {"open"})}, FW_POLICY_ALLOW},
    };
    for (const auto &[rules, verdict] : cases) {
        storeProfile("1.json", profileWith(rules));
        Verdicts result;
        EXPECT_TRUE(VELDFW().fwServIsBlocked("mixed", "eth0", result));
        EXPECT_EQ(result, (Verdicts{{"eth0", verdict}, {"global", FW_POLICY_NONE}}));
    }
}

TEST(StoredQuery, ARuleWhoseServicesCannotBeExpandedIsPassedOver) {
    storeSettings(true, "home");
    storeProfile("1.json", profileWith({serviceRule(FW_POLICY_DENY, {"ssh"}), portRule(FW_POLICY_DENY, "80")}));
    SystemLog log;
    Verdicts result;
    EXPECT_TRUE(VELDFW().fwServIsBlocked("no-such-service", "eth0", result)) << "it has no ports";
    EXPECT_TRUE(result.empty());
    writeFile("/etc/services", "");
    EXPECT_TRUE(VELDFW().fwPortIsBlocked(tcp80, "eth0", result));
    EXPECT_EQ(result["eth0"], FW_POLICY_DENY);
    EXPECT_FALSE(VELDFW().fwServIsBlocked("ssh", "eth0", result));
    EXPECT_EQ(lastError(log), "veldFW.cpp Failed to servToPorts()");
}

TEST(StoredQuery, SettingsAndProfileAreReadOncePerCallHoweverManyPortsTheServiceHas) {
    storeSettings(true, "home");
    storeProfile("1.json", profileWith({portRule(FW_POLICY_DENY, "80")}));
    storeProfile("2.json", {"away", {}, {}});
    defineService("many", "tcp+udp", "\"1\", \"2\", \"3\", \"4\", \"5\", \"6\", \"7\"");
    OpenCounter counter(profileDirectory);
    Verdicts result;
    EXPECT_TRUE(VELDFW().fwServIsBlocked("many", "", result));
    // The scan of the directory opens the settings file as well, which is a JSON file beside the profiles.
    EXPECT_EQ(counter.take(),
              (std::map<std::string, int>{{"1.json", 1}, {"2.json", 1}, {"firewall_settings.json", 2}}));
}

}  // namespace
