// SPDX-License-Identifier: Apache-2.0
// Trials of a profile: the test copy and the commands.
#include "commandRecorder.h"
#include "files.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <veldfirewall/veldFW.h>
#include <veldfirewall/veldIptablesModule.h>

using namespace FW;
using namespace veldtest;
using testing::Contains;
using testing::IsEmpty;

namespace {

FWPROFILE profileNamed(const std::string &name, const std::vector<FWRULE> &globalRules) {
    return {name, {{"global", globalRules}}, {{"global", FW_POLICY_NONE}}};
}

TEST(TestCopy, IsStoredBesideTheProfileReplacedByTheNextAndAdopted) {
    SystemLog log;
    VELDFW_PROFILE profiles;
    const auto portOf = [](const std::string &name) { return storedProfile(name).rules["global"].at(0).portList[0]; };
    storeProfile("1.json", profileNamed("p", {portRule(FW_POLICY_DENY, "1")}));
    storeSettings(true, "p");
    EXPECT_FALSE(profiles.AdoptTestProfile("p"));
    EXPECT_EQ(lastError(log), "veldFW.cpp profile does not exist");
    EXPECT_TRUE(profiles.RemoveTestProfile("p"));  // the database deletes what is not there
    for (const std::string port : {"2", "3"}) {
        EXPECT_TRUE(profiles.CreateTestProfile("p", profileNamed("other", {portRule(FW_POLICY_DENY, port)})));
        EXPECT_EQ(portOf(".test_p"), port);
        EXPECT_EQ(portOf("p"), "1");
        EXPECT_EQ(listDirectory(profileDirectory).size(), 3u);
    }
    makeDirectories(profileDirectory + "1.json.tmp");  // in the way of the write
    EXPECT_FALSE(profiles.AdoptTestProfile("p"));
    EXPECT_EQ(lastError(log), "veldFW.cpp failed to profileSet()");
    removeAll(profileDirectory + "1.json.tmp");
    EXPECT_TRUE(profiles.AdoptTestProfile("p"));
    EXPECT_EQ(storedProfile("p").name, "p");
    EXPECT_EQ(portOf("p"), "3");
    EXPECT_TRUE(profiles.profileExist(".test_p"));
    storeSettings(true, ".test_p");  // in force, so that it cannot be deleted
    EXPECT_FALSE(profiles.CreateTestProfile("p", {}));
    EXPECT_FALSE(profiles.RemoveTestProfile("p"));
    EXPECT_EQ(lastError(log), "veldFW.cpp failed to profileDelete()");
    storeSettings(true, "p");
    EXPECT_TRUE(profiles.RemoveTestProfile("p"));
    EXPECT_FALSE(profiles.profileExist(".test_p"));
    EXPECT_EQ(portOf("p"), "3");
}

class TrialCommands : public testing::Test {
protected:
    void SetUp() override {
        installPlatformData();
        storeProfile("1.json", profileNamed("p", {}));
        storeSettings(false, "p");
        ASSERT_TRUE(VELDFW_PROFILE().CreateTestProfile("p", profileNamed("p", {portRule(FW_POLICY_DENY, "80")})));
    }
    CommandRecorder recorder;
    SystemLog log;
};

const std::vector<std::string> dropPolicies = {
    "/sbin/iptables --policy INPUT DROP", "/sbin/iptables --policy FORWARD DROP", "/sbin/ip6tables --policy INPUT DROP",
    "/sbin/ip6tables --policy FORWARD DROP"};
const std::vector<std::string> acceptPolicies = {
    "/sbin/iptables --policy INPUT ACCEPT", "/sbin/iptables --policy FORWARD ACCEPT",
    "/sbin/ip6tables --policy INPUT ACCEPT", "/sbin/ip6tables --policy FORWARD ACCEPT"};
const std::vector<std::string> flushes = {"/sbin/iptables -F INPUT_FIREWALL", "/sbin/ip6tables -F INPUT_FIREWALL",
                                          "/sbin/iptables -F FORWARD_FIREWALL", "/sbin/ip6tables -F FORWARD_FIREWALL"};

TEST_F(TrialCommands, ClientDecidesWhoseEstablishedConnectionsAreKept) {
    for (const std::string client : {"", "10.1.0.2"}) {
        recorder.clear();
        EXPECT_TRUE(VELDFW().TestApplyingProfile("p", client));
        std::vector<std::string> established;  // program, chain and address of each rule that accepts those
        std::vector<std::string> others;
        for (const std::string &line : recorder.lines()) {
            const size_t end = line.find(" -m state --state ESTABLISHED,RELATED -j ACCEPT");
            (end == std::string::npos ? others : established).push_back(line.substr(0, end));
        }
        EXPECT_EQ(established, client.empty()
                                   ? std::vector<std::string>()
                                   : (std::vector<std::string>{"/sbin/iptables -A INPUT_FIREWALL ! -s 10.1.0.2",
                                                               "/sbin/iptables -A FORWARD_FIREWALL ! -s 10.1.0.2",
                                                               "/sbin/ip6tables -A INPUT_FIREWALL",
                                                               "/sbin/ip6tables -A FORWARD_FIREWALL"}));
        ASSERT_GT(others.size(), 12u);
        const auto first = [&others](std::ptrdiff_t begin, std::ptrdiff_t end) {
            return std::vector<std::string>(others.begin() + begin, others.begin() + end);
        };
        const auto last = static_cast<std::ptrdiff_t>(others.size());
        EXPECT_EQ(first(0, 4), dropPolicies);
        EXPECT_EQ(first(4, 8), flushes);
        EXPECT_EQ(first(last - 4, last), acceptPolicies);
        EXPECT_THAT(others, Contains("/sbin/iptables -t filter -A INPUT_FIREWALL -p tcp --dport 80 -j DROP"));
    }
    EXPECT_TRUE(VELD_IPTABLES_MODULES::isModuleLoad("firewall"));
    EXPECT_FALSE(storedStatus()) << "a trial leaves the switch alone";
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(TrialCommands, AFailureNeverLeavesTheMachineLockedOut) {
    struct Failure {
        const char *profile, *client;
        std::string refused;  ///< part of the command
        std::string lastRun;
        bool statusAfter;  ///< the switch, on before
        std::string error;
    };
    const std::string opened = acceptPolicies.back(), flushed = flushes.back();
    const Failure failures[] = {
        {"p", "", "INPUT DROP", dropPolicies[0], true, "Failed to fwExec() to set default drop."},
        {"p", "", "ip6tables -F INPUT", opened, true, "Failed to fwClear()"},
        {"p", "nonsense", "nothing", opened, true, "Failed to fwIptablesRulesEnum()"},
        {"unknown", "", "nothing", opened, true, "Failed to fwIptablesRulesEnum()"},
        {"p", "", "--dport 80", opened, false, "Failed to fwExec() so disable firewall"},
        {"p", "", "ip6tables --policy INPUT ACCEPT", flushed, false, "Failed to fwExec() to set default accept."},
    };
    for (const Failure &failure : failures) {
        SCOPED_TRACE(failure.error);
        storeSettings(true, "p");
        recorder.clear();
        recorder.failMatching(failure.refused);
        EXPECT_FALSE(VELDFW().TestApplyingProfile(failure.profile, failure.client));
        EXPECT_EQ(recorder.lines().back(), failure.lastRun);
        EXPECT_EQ(storedStatus(), failure.statusAfter);
        EXPECT_EQ(lastError(log), "veldFW.cpp " + failure.error);
    }
}

}  // namespace
