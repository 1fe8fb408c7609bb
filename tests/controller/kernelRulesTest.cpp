// SPDX-License-Identifier: Apache-2.0
// Profiles in the real kernel: the rules that iptables lists back, and what a client then reaches.
#include "connections.h"
#include "files.h"
#include "firewallTest.h"
#include "network.h"
#include "realIptables.h"

using namespace veldtest;
using testing::ElementsAreArray;
using testing::IsEmpty;

namespace {

/// A server with an address of each family on eth0, and a client namespace that has two of each.
class KernelRules : public FirewallTest, public testing::WithParamInterface<const char *> {
protected:
    void SetUp() override {
        if (!useIptablesBackend(GetParam()))
            GTEST_SKIP() << "no iptables-" << GetParam() << " on this machine";
        std::string reason;
        if (!realIptables(&reason))
            GTEST_SKIP() << "iptables-" << GetParam() << " does not work here: " << reason;
        addVethPair("eth0", client, "client0");
        for (const char *address : {"10.1.0.1/24", "fd01::1/64"})
            addAddress("eth0", address);
        for (const char *address : {"10.1.0.2/24", "10.1.0.3/24", "fd01::2/64", "fd01::3/64"})
            addAddress("client0", address, &client);
        setUp("eth0");
        setUp("client0", &client);
        createFirewallChains();
    }

    /// Expects that the client can connect, or that it gets no answer.
    void expectReached(bool reached, const std::string &address, uint16_t port, const std::string &source = "") {
        // What is let through may need neighbour discovery first, which can take more than a second.
        const auto patience = reached ? std::chrono::milliseconds(15'000) : probeTimeout;
        EXPECT_STREQ(toText(probeTcp({address, port, source}, &client, patience)),
                     toText(reached ? ProbeResult::connected : ProbeResult::timedOut))
            << address << " port " << port << " from " << source;
    }

    NetworkNamespace client{"client"};
};

FW::FWRULE rule(FW::FW_POLICY policy, int ipType, int ipGroup, std::vector<std::string> ipList, int portGroup,
                std::vector<std::string> portList, int protocol = FW::FW_PROTO_TCP) {
    FW::FWRULE result;
    result.policy = policy;
    result.ipType = ipType;
    result.ipGroup = ipGroup;
    result.ipList = std::move(ipList);
    result.portGroup = portGroup;
    result.portList = std::move(portList);
    result.protocol = protocol;
    return result;
}

TEST_P(KernelRules, AreListedBackAsMeant) {
    addDummyInterface("tun0");
    writeFile("/usr/veld/etc/services.d/vpn.json",
              R"({"name": "vpn_server_pptp", "destination": {"protocol": "tcp", "ports": ["1723"]}})");
    FW::FWRULE logging =
        rule(FW::FW_POLICY_DENY, 0, FW::FW_IP_GROUP_NETWORK, {"10.9.0.0", "16"}, FW::FW_PORT_GROUP_ANY, {});
    logging.blLog = true;
    logging.adapterDirect = 1;
    storeProfile(
        {{"global",
          {rule(FW::FW_POLICY_ALLOW, 2, FW::FW_IP_GROUP_ANY, {}, 1, {"80", "443", "1000-2000"}),
           rule(FW::FW_POLICY_ALLOW, 2, FW::FW_IP_GROUP_ANY, {}, 1, {}, FW::FW_PROTO_ICMP),
           rule(FW::FW_POLICY_ALLOW, 0, FW::FW_IP_GROUP_ANY, {}, 1, {}, FW::FW_PROTO_IGMP),
           rule(FW::FW_POLICY_ALLOW, 0, FW::FW_IP_GROUP_ANY, {}, 0, {"vpn_server_pptp"}),
           rule(FW::FW_POLICY_DENY, 0, FW::FW_IP_GROUP_RANGE, {"10.8.0.1", "10.8.0.9"}, 1, {"53"}, FW::FW_PROTO_UDP)}},
         {"eth0", {logging, rule(FW::FW_POLICY_ALLOW, 1, FW::FW_IP_GROUP_ADDRESS, {"fd01::2"}, 3, {})}},
         {"vpn", {rule(FW::FW_POLICY_ALLOW, 2, FW::FW_IP_GROUP_ANY, {}, 1, {"8080-8080"})}}},
        {{"eth0", FW::FW_POLICY_DENY}, {"vpn", FW::FW_POLICY_DENY}});
    ASSERT_TRUE(firewall.fwEnable()) << log.text();
    for (const std::string chain : {"INPUT_FIREWALL", "FORWARD_FIREWALL"}) {
        const std::string append = "-A " + chain + " ";
        EXPECT_THAT(listRules("/sbin/iptables", chain),
                    ElementsAreArray({"-N " + chain, append + "-i lo -j ACCEPT",
                                      append + "-m state --state RELATED,ESTABLISHED -j ACCEPT",
                                      append + "-p tcp -m multiport --dports 80,443,1000:2000 -j RETURN",
                                      append + "-p icmp -j RETURN", append + "-p igmp -j RETURN",
                                      append + "-p tcp -m tcp --dport 1723 -j RETURN", append + "-p gre -j RETURN",
                                      append + "-p udp -m iprange --src-range 10.8.0.1-10.8.0.9 -m udp --dport 53 "
                                               "-j DROP",
                                      append + "-s 10.9.0.0/16 -i eth0 -j LOG",
                                      append + "-s 10.9.0.0/16 -i eth0 -j DROP", append + "-i eth0 -j DROP",
                                      append + "-i tun0 -p tcp -m multiport --dports 8080 -j RETURN",
                                      append + "-i tun0 -j DROP"}));
        const std::string icmpv6 = "-p ipv6-icmp -m icmp6 --icmpv6-type ";
        EXPECT_THAT(
            listRules("/sbin/ip6tables", chain),
            ElementsAreArray(
                {"-N " + chain, append + "-i lo -j ACCEPT", append + "-s fe80::/10 " + icmpv6 + "133 -j ACCEPT",
                 append + "-s fe80::/10 " + icmpv6 + "134 -j ACCEPT", append + icmpv6 + "135 -j ACCEPT",
                 append + icmpv6 + "136 -j ACCEPT", append + "-s fe80::/10 " + icmpv6 + "137 -j ACCEPT",
                 append + "-m state --state RELATED,ESTABLISHED -j ACCEPT",
                 append + "-p tcp -m multiport --dports 80,443,1000:2000 -j RETURN", append + "-p ipv6-icmp -j RETURN",
                 append + "-s fd01::2/128 -i eth0 -j RETURN", append + "-i eth0 -j DROP",
                 append + "-i tun0 -p tcp -m multiport --dports 8080 -j RETURN", append + "-i tun0 -j DROP"}));
    }
    EXPECT_TRUE(firewall.fwDisable());
    for (const char *program : {"/sbin/iptables", "/sbin/ip6tables"}) {
        EXPECT_THAT(listRules(program, "INPUT_FIREWALL"), ElementsAreArray({"-N INPUT_FIREWALL"}));
        EXPECT_THAT(listRules(program, "INPUT"), ElementsAreArray({"-P INPUT ACCEPT", "-A INPUT -j INPUT_FIREWALL"}));
        EXPECT_THAT(listRules(program, "FORWARD"),
                    ElementsAreArray({"-P FORWARD ACCEPT", "-A FORWARD -j FORWARD_FIREWALL"}));
    }
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_P(KernelRules, DecideWhatAClientReaches) {
    storeProfile({{"eth0",
                   {rule(FW::FW_POLICY_DENY, 0, FW::FW_IP_GROUP_ADDRESS, {"10.1.0.3"}, 3, {}),
                    rule(FW::FW_POLICY_DENY, 1, FW::FW_IP_GROUP_ADDRESS, {"fd01::3"}, 3, {}),
                    rule(FW::FW_POLICY_ALLOW, 2, FW::FW_IP_GROUP_ANY, {}, 1, {"80"})}}},
                 {{"eth0", FW::FW_POLICY_DENY}});
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
    storeProfile({{"eth0", {rule(FW::FW_POLICY_ALLOW, 2, FW::FW_IP_GROUP_ANY, {}, 1, {"80"})}}},
                 {{"eth0", FW::FW_POLICY_DENY}});
    const EchoServer server({80});
    ASSERT_TRUE(firewall.fwEnable()) << log.text();
    Connection tester({"10.1.0.1", 80, "10.1.0.2"}, &client);
    Connection other({"10.1.0.1", 80, "10.1.0.3"}, &client);
    Connection ipv6({"fd01::1", 80}, &client);
    storeProfile({}, {{"eth0", FW::FW_POLICY_DENY}});
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
    storeProfile({{"eth0", {rule(FW::FW_POLICY_DENY, 0, FW::FW_IP_GROUP_ADDRESS, {"10.1.0.300"}, 3, {})}}},
                 {{"eth0", FW::FW_POLICY_DENY}});
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_FALSE(isSwitchedOn());
    for (const char *program : {"/sbin/iptables", "/sbin/ip6tables"}) {
        EXPECT_THAT(listRules(program, "INPUT_FIREWALL"), ElementsAreArray({"-N INPUT_FIREWALL"}));
        EXPECT_EQ(listRules(program, "INPUT")[0], "-P INPUT ACCEPT");
        EXPECT_EQ(listRules(program, "FORWARD")[0], "-P FORWARD ACCEPT");
    }
    const std::string command = "/sbin/iptables -t filter -A FORWARD_FIREWALL -i eth0 -s 10.1.0.300 -j DROP";
    EXPECT_THAT(errors(), testing::Contains("veldFW.cpp Failed to execute \"" + command + "\""));
    EXPECT_TRUE(log.contains("host/network `10.1.0.300' not found")) << log.text();
}

INSTANTIATE_TEST_SUITE_P(Backend, KernelRules, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
