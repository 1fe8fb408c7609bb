// SPDX-License-Identifier: Apache-2.0
// Trials of a profile: the test copy, the commands, and what connections feel of it on the real kernel.
#include "commandRecorder.h"
#include "connections.h"
#include "files.h"
#include "network.h"
#include "realIptables.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <veldfirewall/veldFW.h>
#include <veldfirewall/veldIptablesModule.h>

#include <algorithm>
#include <memory>

using namespace FW;
using namespace veldtest;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

FWPROFILE profileNamed(const std::string &name, const std::vector<FWRULE> &globalRules) {
    return {name, {{"global", globalRules}}, {{"global", FW_POLICY_NONE}}};
}

std::vector<std::string> portsOf(const std::string &profile) {
    std::vector<std::string> ports;
    const FWPROFILE stored = storedProfile(profile);
    for (const FWRULE &rule : stored.rules.at("global"))
        ports.push_back(rule.portList.at(0));
    return ports;
}

class TestCopy : public testing::Test {
protected:
    void SetUp() override {
        storeProfile("1.json", profileNamed("p", {portRule(FW_POLICY_DENY, "1")}));
        storeSettings(true, "p");
    }

    SystemLog log;
    VELDFW_PROFILE profiles;
};

TEST_F(TestCopy, IsStoredBesideTheProfileAndReplacedByTheNext) {
    EXPECT_TRUE(profiles.CreateTestProfile("p", profileNamed("p", {portRule(FW_POLICY_DENY, "2")})));
    EXPECT_TRUE(profiles.CreateTestProfile("p", profileNamed("p", {portRule(FW_POLICY_DENY, "3")})));
    EXPECT_EQ(storedProfile(".test_p").name, ".test_p");
    EXPECT_THAT(portsOf(".test_p"), ElementsAre("3"));
    EXPECT_THAT(portsOf("p"), ElementsAre("1"));
    EXPECT_EQ(listDirectory(profileDirectory).size(), 3u);
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(TestCopy, AdoptedReplacesTheProfileAndStays) {
    EXPECT_TRUE(profiles.CreateTestProfile("p", profileNamed("other", {portRule(FW_POLICY_DENY, "2")})));
    EXPECT_TRUE(profiles.AdoptTestProfile("p"));
    EXPECT_EQ(storedProfile("p").name, "p");
    EXPECT_THAT(portsOf("p"), ElementsAre("2"));
    EXPECT_TRUE(profiles.profileExist(".test_p"));
    EXPECT_TRUE(profiles.RemoveTestProfile("p"));
    EXPECT_FALSE(profiles.profileExist(".test_p"));
    EXPECT_THAT(portsOf("p"), ElementsAre("2"));
    EXPECT_TRUE(profiles.CreateTestProfile("new", profileNamed("new", {portRule(FW_POLICY_DENY, "4")})));
    EXPECT_TRUE(profiles.AdoptTestProfile("new"));  // a profile that did not exist
    EXPECT_THAT(portsOf("new"), ElementsAre("4"));
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(TestCopy, EachFailureHasItsMessage) {
    const auto lastError = [&] { return errorsOf(log).empty() ? "" : errorsOf(log).back(); };
    const std::string before = readFile(profileDirectory + "1.json");
    EXPECT_FALSE(profiles.AdoptTestProfile("p"));
    EXPECT_THAT(errorsOf(log), ElementsAre("veldFW.cpp profile does not exist"));
    EXPECT_EQ(readFile(profileDirectory + "1.json"), before);
    EXPECT_TRUE(profiles.RemoveTestProfile("p"));  // the database deletes what is not there
    EXPECT_TRUE(profiles.CreateTestProfile("p", {}));
    makeDirectories(profileDirectory + "1.json.tmp");  // in the way of the write
    EXPECT_FALSE(profiles.AdoptTestProfile("p"));
    EXPECT_EQ(lastError(), "veldFW.cpp failed to profileSet()");
    storeSettings(true, ".test_p");  // in force, so that it cannot be deleted
    EXPECT_FALSE(profiles.RemoveTestProfile("p"));
    EXPECT_EQ(lastError(), "veldFW.cpp failed to profileDelete()");
    EXPECT_FALSE(profiles.CreateTestProfile("p", {}));
    EXPECT_EQ(lastError(), "veldFW.cpp failed to profileDelete()");
    removeAll(profileDirectory);
    EXPECT_FALSE(profiles.CreateTestProfile("p", {}));
    EXPECT_EQ(lastError(), "veldFW.cpp failed to profileCreate()");
}

class TrialCommands : public testing::Test {
protected:
    void SetUp() override {
        installPlatformData();
        storeProfile("1.json", profileNamed("p", {}));
        storeSettings(false, "p");
        ASSERT_TRUE(VELDFW_PROFILE().CreateTestProfile("p", profileNamed("p", {portRule(FW_POLICY_DENY, "80")})));
    }
    /// Program, chain and address of each rule that accepts established connections.
    std::vector<std::string> establishedRules() {
        std::vector<std::string> rules;
        for (const std::string &line : recorder.lines()) {
            const size_t end = line.find(" -m state --state ESTABLISHED,RELATED -j ACCEPT");
            if (end != std::string::npos)
                rules.push_back(line.substr(0, end));
        }
        return rules;
    }

    CommandRecorder recorder;
    SystemLog log;
};

const std::vector<std::string> dropPolicies = {
    "/sbin/iptables --policy INPUT DROP", "/sbin/iptables --policy FORWARD DROP", "/sbin/ip6tables --policy INPUT DROP",
    "/sbin/ip6tables --policy FORWARD DROP"};
const std::vector<std::string> flushes = {"/sbin/iptables -F INPUT_FIREWALL", "/sbin/ip6tables -F INPUT_FIREWALL",
                                          "/sbin/iptables -F FORWARD_FIREWALL", "/sbin/ip6tables -F FORWARD_FIREWALL"};
const std::vector<std::string> acceptPolicies = {
    "/sbin/iptables --policy INPUT ACCEPT", "/sbin/iptables --policy FORWARD ACCEPT",
    "/sbin/ip6tables --policy INPUT ACCEPT", "/sbin/ip6tables --policy FORWARD ACCEPT"};

TEST_F(TrialCommands, ClientDecidesWhoseEstablishedConnectionsAreKept) {
    struct Case {
        std::string client;
        std::vector<std::string> kept;
    };
    const Case cases[] = {
        {"", {}},
        {"10.1.0.2",
         {"/sbin/iptables -A INPUT_FIREWALL ! -s 10.1.0.2", "/sbin/iptables -A FORWARD_FIREWALL ! -s 10.1.0.2",
          "/sbin/ip6tables -A INPUT_FIREWALL", "/sbin/ip6tables -A FORWARD_FIREWALL"}},
        {"fd01::2",
         {"/sbin/iptables -A INPUT_FIREWALL", "/sbin/iptables -A FORWARD_FIREWALL",
          "/sbin/ip6tables -A INPUT_FIREWALL ! -s fd01::2", "/sbin/ip6tables -A FORWARD_FIREWALL ! -s fd01::2"}},
    };
    for (const Case &entry : cases) {
        SCOPED_TRACE(entry.client);
        recorder.clear();
        EXPECT_TRUE(VELDFW().TestApplyingProfile("p", entry.client));
        EXPECT_EQ(establishedRules(), entry.kept);
        const auto lines = recorder.lines();
        ASSERT_GT(lines.size(), 12u);
        EXPECT_TRUE(std::equal(dropPolicies.begin(), dropPolicies.end(), lines.begin()));
        EXPECT_TRUE(std::equal(flushes.begin(), flushes.end(), lines.begin() + 4));
        EXPECT_TRUE(std::equal(acceptPolicies.begin(), acceptPolicies.end(), lines.end() - 4));
        EXPECT_THAT(lines, Contains("/sbin/iptables -t filter -A INPUT_FIREWALL -p tcp --dport 80 -j DROP"));
    }
    const auto withEmptyClient = [&] {
        recorder.clear();
        EXPECT_TRUE(VELDFW().TestApplyingProfile("p", ""));
        return recorder.lines();
    }();
    recorder.clear();
    EXPECT_TRUE(VELDFW().TestApplyingProfile("p"));
    EXPECT_EQ(recorder.lines(), withEmptyClient);
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(TrialCommands, LoadsModulesButLeavesSwitchAndActiveProfileAlone) {
    EXPECT_FALSE(VELD_IPTABLES_MODULES::isModuleLoad("firewall"));
    EXPECT_TRUE(VELDFW().TestApplyingProfile("p"));
    EXPECT_TRUE(VELD_IPTABLES_MODULES::isModuleLoad("firewall"));
    EXPECT_FALSE(storedStatus());
    std::string active;
    EXPECT_TRUE(VELDFW().fwProfileConfigGet(active));
    EXPECT_EQ(active, "p");
}

struct FailureCase {
    const char *what;
    std::string failing;                ///< part of the command that is refused
    std::string client;                 ///
    std::vector<std::string> lastRuns;  ///< how the recorded commands end
    bool statusAfter;                   ///< the switch, on before
    std::string error;                  ///< last message of the trial itself
};

TEST_F(TrialCommands, AFailureNeverLeavesTheMachineLockedOut) {
    auto flushesAndAccept = flushes;
    flushesAndAccept.insert(flushesAndAccept.end(), acceptPolicies.begin(), acceptPolicies.end());
    const FailureCase cases[] = {
        {"drop is refused",
         "INPUT DROP",
         "",
         {dropPolicies[0]},
         true,
         "veldFW.cpp Failed to fwExec() to set default drop."},
        {"flush is refused", "ip6tables -F INPUT", "", flushesAndAccept, true, "veldFW.cpp Failed to fwClear()"},
        {"no address", "", "nonsense", flushesAndAccept, true, "veldFW.cpp Failed to fwIptablesRulesEnum()"},
        {"a rule is refused", "--dport 80", "", flushesAndAccept, false,
         "veldFW.cpp Failed to fwExec() so disable firewall"},
        {"accept is refused", "ip6tables --policy INPUT ACCEPT", "", flushes, false,
         "veldFW.cpp Failed to fwExec() to set default accept."},
    };
    for (const FailureCase &entry : cases) {
        SCOPED_TRACE(entry.what);
        storeSettings(true, "p");
        recorder.clear();
        log.clear();
        if (!entry.failing.empty())
            recorder.failMatching(entry.failing);
        EXPECT_FALSE(VELDFW().TestApplyingProfile("p", entry.client));
        const auto lines = recorder.lines();
        ASSERT_GE(lines.size(), entry.lastRuns.size());
        EXPECT_EQ(std::vector<std::string>(lines.end() - static_cast<long>(entry.lastRuns.size()), lines.end()),
                  entry.lastRuns);
        EXPECT_EQ(storedStatus(), entry.statusAfter);
        EXPECT_EQ(errorsOf(log).back(), entry.error);
    }
}

TEST_F(TrialCommands, NeedsATestCopyAndItsModules) {
    EXPECT_FALSE(VELDFW().TestApplyingProfile("unknown"));
    EXPECT_THAT(errorsOf(log), Contains("veldFW.cpp Failed to profileGet(.test_unknown)"));
    EXPECT_EQ(errorsOf(log).back(), "veldFW.cpp Failed to fwIptablesRulesEnum()");
    EXPECT_EQ(recorder.lines().back(), acceptPolicies.back());
    removeAll("/usr/veld/etc.defaults/iptables_modules_list");
    removeAll(moduleStateFile);
    recorder.clear();
    EXPECT_FALSE(VELDFW().TestApplyingProfile("p"));
    EXPECT_EQ(errorsOf(log).back(), "veldFW.cpp Failed to firewallModLoad()");
    EXPECT_THAT(recorder.lines(), IsEmpty());
}

/// Two hosts behind one interface, each with a connection to port 80 that the active profile lets through.
class TrialOnTheKernel : public testing::Test {
protected:
    static constexpr const char *tester = "10.1.0.2";
    static constexpr const char *otherHost = "10.1.0.3";
    static constexpr std::chrono::seconds untilSentAgain{20};  // TCP waits longer after each lost packet

    void SetUp() override {
        std::string reason;
        if (!realIptables(&reason))
            GTEST_SKIP() << "iptables does not work here: " << reason;
        installPlatformData();
        createFirewallChains();
        addVethPair("eth0", m_client, "client0");
        addAddress("eth0", "10.1.0.1/24");
        addAddress("client0", std::string(tester) + "/24", &m_client);
        addAddress("client0", std::string(otherHost) + "/24", &m_client);
        setUp("eth0");
        setUp("client0", &m_client);
        storeProfile("1.json", {"home", {}, {{"eth0", FW_POLICY_ALLOW}}});
        storeSettings(false, "home");
        ASSERT_TRUE(VELDFW().fwEnable());
        m_server = std::make_unique<EchoServer>(std::vector<uint16_t>{80});
        m_testers = std::make_unique<Connection>(target(tester), &m_client);
        m_others = std::make_unique<Connection>(target(otherHost), &m_client);
        ASSERT_EQ(m_testers->exchange(), ProbeResult::connected);
        ASSERT_EQ(m_others->exchange(), ProbeResult::connected);
    }
    static ProbeTarget target(const std::string &source) { return {"10.1.0.1", 80, source}; }
    /// Stores and applies a profile for eth0 whose default is to deny.
    static void tryProfile(const std::vector<FWRULE> &rules, const std::string &client) {
        ASSERT_TRUE(
            VELDFW_PROFILE().CreateTestProfile("home", {"home", {{"eth0", rules}}, {{"eth0", FW_POLICY_DENY}}}));
        ASSERT_TRUE(VELDFW().TestApplyingProfile("home", client));
    }
    void expectNewConnections(ProbeResult testers, ProbeResult others) {
        EXPECT_EQ(probeTcp(target(tester), &m_client), testers);
        EXPECT_EQ(probeTcp(target(otherHost), &m_client), others);
    }

    NetworkNamespace m_client{"client"};
    std::unique_ptr<EchoServer> m_server;
    std::unique_ptr<Connection> m_testers;
    std::unique_ptr<Connection> m_others;
};

TEST_F(TrialOnTheKernel, OfAClientCutsOffItsConnectionOnlyAndEndsWithTheNextReload) {
    tryProfile({}, tester);
    EXPECT_EQ(m_testers->exchange(), ProbeResult::timedOut);
    EXPECT_EQ(m_others->exchange(untilSentAgain), ProbeResult::connected);
    expectNewConnections(ProbeResult::timedOut, ProbeResult::timedOut);
    ASSERT_TRUE(VELDFW_PROFILE().RemoveTestProfile("home"));
    ASSERT_TRUE(VELDFW().fwReload(true));
    EXPECT_TRUE(storedStatus());
    expectNewConnections(ProbeResult::connected, ProbeResult::connected);
    EXPECT_EQ(m_testers->exchange(untilSentAgain), ProbeResult::connected);
    EXPECT_EQ(m_others->exchange(untilSentAgain), ProbeResult::connected);
}

TEST_F(TrialOnTheKernel, WithoutAClientCutsOffEverybody) {
    tryProfile({}, "");
    EXPECT_EQ(m_testers->exchange(), ProbeResult::timedOut);
    EXPECT_EQ(m_others->exchange(), ProbeResult::timedOut);
}

TEST_F(TrialOnTheKernel, LetsTheClientsConnectionLiveWhenTheProfileItselfDoes) {
    tryProfile({portRule(FW_POLICY_ALLOW, "80", tester)}, tester);
    EXPECT_EQ(m_testers->exchange(untilSentAgain), ProbeResult::connected);
    EXPECT_EQ(m_others->exchange(untilSentAgain), ProbeResult::connected);
    expectNewConnections(ProbeResult::connected, ProbeResult::timedOut);
}

TEST_F(TrialOnTheKernel, IsAppliedToASwitchedOffFirewallThatStaysOff) {
    ASSERT_TRUE(VELDFW().fwDisable());
    tryProfile({}, "");
    EXPECT_FALSE(storedStatus());
    expectNewConnections(ProbeResult::timedOut, ProbeResult::timedOut);
    ASSERT_TRUE(VELDFW().fwEnable());
    expectNewConnections(ProbeResult::connected, ProbeResult::connected);
}

}  // namespace
