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
    for (const auto &[name, program] : PROGRAMS) {
        EXPECT_EQ(listRules(program, "INPUT_FIREWALL").size(), 1u);
        EXPECT_EQ(listRules(program, "INPUT")[0], "-P INPUT ACCEPT");
        EXPECT_EQ(listRules(program, "FORWARD")[0], "-P FORWARD ACCEPT");
    }
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

INSTANTIATE_TEST_SUITE_P(Backend, KernelRules, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
