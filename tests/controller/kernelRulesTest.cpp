// SPDX-License-Identifier: Apache-2.0
// Profiles in the real kernel: the rules that iptables lists back, and what a client then reaches.
#include "caseTable.h"
#include "connections.h"
#include "files.h"
#include "firewallTest.h"
#include "realIptables.h"

using namespace veldtest;
using testing::IsEmpty;

namespace {

const std::map<std::string, std::string> PROGRAMS = {{"iptables", "/sbin/iptables"}, {"ip6tables", "/sbin/ip6tables"}};

/// A server with an address of each family on eth0, and a client namespace that has two of each.
class KernelRules : public FirewallTest, public testing::WithParamInterface<const char *> {
protected:
    void SetUp() override {
        std::string reason = "none on this machine";
        if (!useIptablesBackend(GetParam()) || !realIptables(&reason))
            GTEST_SKIP() << "iptables-" << GetParam() << ": " << reason;
        addVethPair("eth0", client, "client0");
        for (const char *address : {"10.1.0.1/24", "fd01::1/64"})
            addAddress("eth0", address);
        for (const char *address : {"10.1.0.2/24", "10.1.0.3/24", "fd01::2/64", "fd01::3/64"})
            addAddress("client0", address, &client);
        setUp("eth0");
        setUp("client0", &client);
        createFirewallChains();
    }

    static void install(const std::string &profile) {
        writeFile(PROFILE, readFile(VELD_CASE_DIRECTORY + profile + ".json"));
    }

    /// Expects that the client can connect, or that it gets no answer.
    void expectReached(bool reached, const std::string &address, uint16_t port, const std::string &source = "") {
        // What is let through may need neighbour discovery first, which can take more than a second.
        const auto patience = reached ? std::chrono::milliseconds(15'000) : probeTimeout;
        EXPECT_STREQ(toText(probeTcp({address, port, source}, &client, patience)), reached ? "connected" : "timed out")
            << address << " port " << port << " from " << source;
    }

    /// Expects that the chains of the firewall are empty and that nothing is dropped.
    static void expectOpen() {
        for (const auto &[name, program] : PROGRAMS) {
            EXPECT_EQ(listRules(program, "INPUT_FIREWALL").size(), 1u);
            for (const std::string chain : {"INPUT", "FORWARD"})
                EXPECT_THAT(
                    listRules(program, chain),
                    testing::ElementsAre("-P " + chain + " ACCEPT", "-A " + chain + " -j " + chain + "_FIREWALL"));
        }
    }

    NetworkNamespace client{"client"};
};

TEST_P(KernelRules, AreListedBackAsMeant) {
    addDummyInterface("tun0");
    writeFile("/usr/veld/etc/services.d/vpn.json",
              R"({"name": "vpn_server_pptp", "destination": {"protocol": "tcp", "ports": ["1723"]}})");
    install("everyKindOfRule");
    ASSERT_TRUE(firewall.fwEnable()) << log.text();
    for (const auto &[name, program] : PROGRAMS) {
        for (const std::string chain : {"INPUT_FIREWALL", "FORWARD_FIREWALL"}) {
            std::vector<std::string> expected = {"-N " + chain};
            for (const std::string &rule : split(readFile(VELD_CASE_DIRECTORY "everyKindOfRule." + name), '\n'))
                expected.push_back("-A " + chain + " " + rule);
            EXPECT_EQ(listRules(program, chain), expected);
        }
    }
    EXPECT_TRUE(firewall.fwDisable());
    expectOpen();
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_P(KernelRules, DecideWhatAClientReaches) {
    install("deniedClients");
    const EchoServer server({80, 81});
    const auto expectAll = [this](bool isOn) {
        for (const auto &[address, allowedSource, deniedSource] :
             {std::tuple("10.1.0.1", "10.1.0.2", "10.1.0.3"), {"fd01::1", "fd01::2", "fd01::3"}}) {
            SCOPED_TRACE(isOn ? "switched on" : "switched off");
            expectReached(true, address, 80, allowedSource);
            expectReached(!isOn, address, 81, allowedSource);
            expectReached(!isOn, address, 80, deniedSource);
        }
    };
    expectAll(false);
    ASSERT_TRUE(firewall.fwEnable()) << log.text();
    expectAll(true);
    ASSERT_TRUE(firewall.fwDisable());
    expectAll(false);
}

TEST_P(KernelRules, KeepEstablishedConnectionsOnlyWhenToldToAndOfOtherClients) {
    // The kernel tracks connections only while a rule asks for it: they have to begin with the firewall on.
    install("openPort");
    const EchoServer server({80});
    ASSERT_TRUE(firewall.fwEnable()) << log.text();
    Connection tester({"10.1.0.1", 80, "10.1.0.2"}, &client);
    Connection other({"10.1.0.1", 80, "10.1.0.3"}, &client);
    Connection ipv6({"fd01::1", 80}, &client);
    install("nothingOpen");
    ASSERT_TRUE(firewall.fwReload(true)) << log.text();
    expectReached(false, "10.1.0.1", 80);
    for (Connection *connection : {&tester, &other, &ipv6})
        EXPECT_EQ(connection->exchange(std::chrono::seconds(10)), ProbeResult::connected);
    Json::Value commands;
    ASSERT_TRUE(firewall.fwIptablesRulesEnum("default", commands, "10.1.0.2"));
    ASSERT_TRUE(firewall.fwClear() && firewall.fwExec(commands)) << log.text();
    EXPECT_EQ(other.exchange(std::chrono::seconds(10)), ProbeResult::connected);
    EXPECT_EQ(tester.exchange(), ProbeResult::timedOut);
    ASSERT_TRUE(firewall.fwReload(false)) << log.text();
    for (Connection *connection : {&other, &ipv6})
        EXPECT_EQ(connection->exchange(), ProbeResult::timedOut);
}

TEST_P(KernelRules, ThatTheKernelRefusesSwitchTheFirewallOffAndAreExplained) {
    install("badAddress");
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_FALSE(isSwitchedOn());
    expectOpen();
    const std::string command = "/sbin/iptables -t filter -A FORWARD_FIREWALL -i eth0 -s 10.1.0.300 -j DROP";
    EXPECT_THAT(errors(), testing::Contains("veldFW.cpp Failed to execute \"" + command + "\""));
    EXPECT_TRUE(log.contains("host/network `10.1.0.300' not found")) << log.text();
}

INSTANTIATE_TEST_SUITE_P(Backend, KernelRules, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
