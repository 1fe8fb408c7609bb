// SPDX-License-Identifier: Apache-2.0
// The plain functions: results, NULL, error codes, messages, the values of `reload`.
#include "commandRecorder.h"
#include "files.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <veld/core.h>
#include <veldfirewall/veldFW.h>
#include <veldfirewall/veldIptablesModule.h>
#include <veldfirewall/veldfirewall_c.h>

#include <algorithm>

using namespace FW;
using namespace veldtest;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class PlainFunctions : public testing::Test {
protected:
    void SetUp() override {
        installPlatformData();
        defineService("ssh", "tcp", "\"22\"");
        defineService("web", "tcp", "\"80\", \"443\"");
        storeProfile("1.json", {"a", {}, {{"eth0", FW_POLICY_ALLOW}}});
        storeProfile("2.json", {"b", {}, {}});
        storeSettings(true, "a");
        VLIBCErrSetEx(0, "none", 0);
    }
    /// How many programs ran since the last call.
    size_t runs() {
        const size_t count = recorder.lines().size();
        recorder.clear();
        return count;
    }
    static bool badParameterIsSet() {
        const bool isSet = VLIBCErrGet() == 0x0D00 && std::string(VLIBCErrorGetFile()) == "veldfirewall_c.cpp";
        VLIBCErrSetEx(0, "none", 0);
        return isSet;
    }

    CommandRecorder recorder;
    SystemLog log;
};

TEST_F(PlainFunctions, CheckTellsOneForAllowedZeroForAnythingLessAndMinusOneForAnError) {
    const std::pair<std::vector<FWRULE>, int> cases[] = {
        {{portRule(FW_POLICY_DENY, "81")}, 1},
        {{portRule(FW_POLICY_DENY, "443")}, 0},
        {{portRule(FW_POLICY_DENY, "443", "10.0.0.1")}, 0},  // blocked for some addresses
        {{serviceRule(FW_POLICY_DENY, {"web"})}, 0},
    };
    for (const auto &[rules, result] : cases) {
        storeSettings(true, "a");
        storeProfile("1.json", {"a", {{"eth0", rules}}, {{"eth0", FW_POLICY_ALLOW}, {"eth1", FW_POLICY_ALLOW}}});
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", "web"), result);
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter(nullptr, "web"), result);
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth1", "web"), 1);
        storeSettings(false, "a");
        EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", "web"), 1);
    }
    EXPECT_THAT(errorsOf(log), IsEmpty());
    writeFile(settingsFile, "{");
    EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", "web"), -1);
    EXPECT_EQ(lastError(log), "veldfirewall_c.cpp Failed to check web is block or not");
    EXPECT_EQ(VLIBCErrGet(), 0);
    EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", nullptr), -1);
    EXPECT_THAT(lastError(log), testing::MatchesRegex("veldfirewall_c\\.cpp Bad parameters\\[0x0D00 "
                                                      "veldfirewall_c\\.cpp:[0-9]+\\]"));
    EXPECT_TRUE(badParameterIsSet());
}

/// The policy of the profile's front rule and the services that it reserves.
std::string reserved(const std::string &profile) {
    const auto rules = storedProfile(profile).rules["global"];
    std::string text = rules.empty() ? "" : std::to_string(rules[0].policy) + ":";
    for (const std::string &name : rules.empty() ? std::vector<std::string>() : rules[0].portList)
        text += "[" + name + "]";
    return text;
}

TEST_F(PlainFunctions, ReserveSplitsAtCommasAndTakesZeroForDeny) {
    struct Case {
        const char *list;
        int allow;
        const char *front;
    };
    const Case cases[] = {{"ssh,web", 0, "1:[ssh][web]"}, {"ssh,,web", -7, "0:[ssh][web]"}, {",ssh,", 1, "0:[][ssh]"}};
    for (const Case &entry : cases) {
        SetUp();
        EXPECT_EQ(VLIBFwRuleReserveServInsert(entry.list, entry.allow, 0), 0);
        EXPECT_EQ(reserved("a"), entry.front);
        EXPECT_EQ(reserved("b"), entry.front);
    }
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(PlainFunctions, ReserveReloadsOnceForOneAndStopsAtTheFirstFailure) {
    for (const int reload : {0, 2, -1}) {
        EXPECT_EQ(VLIBFwRuleReserveServInsert("ssh,web", 1, reload), 0);
        EXPECT_EQ(runs(), 0u) << reload;
    }
    EXPECT_EQ(VLIBFwRuleReserveServInsert("ssh,web", 1, 1), 0);
    const auto lines = recorder.lines();
    EXPECT_EQ(std::count(lines.begin(), lines.end(), "/sbin/iptables --policy INPUT DROP"), 1);
    EXPECT_THAT(lines, Contains("/sbin/iptables -t filter -A INPUT_FIREWALL -p tcp -m multiport --dports 22,80,443 -j "
                                "RETURN"));
    SetUp();
    runs();
    makeDirectories(profileDirectory + "2.json.tmp");  // in the way of the write
    EXPECT_EQ(VLIBFwRuleReserveServInsert("ssh,web", 1, 1), -1);
    EXPECT_EQ(lastError(log), "veldfirewall_c.cpp Failed to assign serv [ssh]");
    EXPECT_EQ(reserved("a"), "0:[ssh]");
    EXPECT_EQ(reserved("b"), "");
    EXPECT_EQ(VELDFwRuleHup(), -1) << "no reload after a failed update";
    EXPECT_EQ(runs(), 0u);
}

TEST_F(PlainFunctions, RemoveAndRenameEditEveryProfile) {
    EXPECT_EQ(VLIBFwRuleReserveServInsert("ssh,web", 1, 0), 0);
    EXPECT_EQ(VLIBFwServRemoveRec("ssh"), 0);
    EXPECT_EQ(reserved("a"), "0:[web]");
    EXPECT_EQ(reserved("b"), "0:[web]");
    EXPECT_EQ(VLIBFwChangeAdatper("eth0", "eth1", 2), 0);
    EXPECT_EQ(storedProfile("a").adapterPolicyMap.count("eth1"), 1u);
    EXPECT_EQ(runs(), 0u);
    EXPECT_EQ(VLIBFwChangeAdatper("eth1", "eth0", 1), 0);
    EXPECT_GT(runs(), 0u);
}

TEST_F(PlainFunctions, NullIsRefusedAndNoExceptionReachesAProgramThatCannotCatchIt) {
    for (const char *list : {static_cast<const char *>(nullptr), ""}) {
        EXPECT_EQ(VLIBFwRuleReserveServInsert(list, 1, 1), -1);
        EXPECT_TRUE(badParameterIsSet());
    }
    EXPECT_EQ(VLIBFwServRemoveRec(nullptr), -1);
    EXPECT_EQ(VLIBFwChangeAdatper("eth0", nullptr, 1), -1);
    EXPECT_EQ(VLIBFwChangeAdatper(nullptr, nullptr, 1), -1);
    EXPECT_EQ(VLIBCErrGet(), 0);
    EXPECT_THAT(log.messages(), IsEmpty());
    writeFile(profileDirectory + "1.json", R"({"name": "a", "rules": {"eth0": [{"policy": {}}]}})");
    EXPECT_EQ(VELDFwRuleHup(), -1);
    EXPECT_EQ(lastError(log), "veldfirewall_c.cpp Ended by an exception: Value is not convertible to Int.");
    EXPECT_EQ(VLIBFwServRemoveRec("ssh"), -1);
    EXPECT_EQ(VLIBFwChangeAdatper("eth0", "eth1", 1), -1);
    EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", "ssh"), -1);
    EXPECT_EQ(VLIBFwRuleReserveServInsert("ssh", 1, 1), -1);
    EXPECT_EQ(runs(), 0u);
}

TEST_F(PlainFunctions, HupUpdatesAndReloadsAndResetSwitchesOff) {
    storeProfile("1.json", {"a", {{"eth0", {serviceRule(FW_POLICY_DENY, {"gone", "ssh"})}}}, {}});
    EXPECT_EQ(VELDFwRuleHup(), 0);
    EXPECT_EQ(storedProfile("a").rules.at("eth0").at(0).portList, std::vector<std::string>{"ssh"});
    EXPECT_THAT(recorder.lines(), Contains("/sbin/iptables -A INPUT_FIREWALL -m state --state ESTABLISHED,RELATED -j "
                                           "ACCEPT"));
    recorder.clear();
    VELDFwReset();
    EXPECT_FALSE(storedStatus());
    EXPECT_THAT(recorder.lines(), Contains("/sbin/ip6tables -F FORWARD_FIREWALL"));
}

TEST_F(PlainFunctions, ModulesAreMarkedForTheirOwner) {
    using Functions = std::pair<int (*)(const char *), int (*)(const char *)>;
    for (const auto &[load, unload] : {Functions{VELDIptablesCodeModeLoad, VELDIptablesCoreModUnload},
                                       Functions{VELDIptablesNATModLoad, VELDIptablesNATModUnload}}) {
        EXPECT_EQ(load("nas"), 0);
        EXPECT_TRUE(VELD_IPTABLES_MODULES::isModuleLoad("nas"));
        EXPECT_EQ(unload("nas"), 0);
        EXPECT_FALSE(VELD_IPTABLES_MODULES::isModuleLoad("nas"));
        EXPECT_EQ(load(nullptr), -1);
        EXPECT_EQ(unload(nullptr), -1);
        EXPECT_THAT(errorsOf(log),
                    ElementsAre("veldIptablesModule.cpp servName is NULL", "veldIptablesModule.cpp servName is NULL"));
        log.clear();
    }
}

}  // namespace
