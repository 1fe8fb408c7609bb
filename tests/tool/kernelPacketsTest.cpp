// SPDX-License-Identifier: Apache-2.0
// What block queries and "explain" say about packets, and what happens to them: generated profiles in the kernel,
// packets over both families, both protocols and two interfaces.
#include <gmock/gmock.h>
#include <veldfirewall/veldFW.h>

#include <iostream>
#include <memory>

#include "connections.h"
#include "files.h"
#include "model/packetQuery.h"
#include "model/packetWalk.h"
#include "network.h"
#include "probeBatch.h"
#include "profileGenerator.h"
#include "realIptables.h"
#include "system/ruleset.h"
#include "toolFixture.h"

namespace veldtest {
namespace {

using veldfwctl::Decision;

constexpr uint16_t EPHEMERAL_PORT = 40000;  // stands for what the kernel chooses: no rule names ports there
constexpr uint16_t PORT_WITHOUT_RULES = 99;
constexpr int FIRST_HOST = 2;
constexpr int LAST_HOST = 5;

struct KnownProbe {
    BatchProbe probe;
    std::string adapter;
    bool isV6 = false;
};

std::vector<KnownProbe> allProbes() {
    std::vector<KnownProbe> probes;
    for (const std::string adapter : {"eth0", "eth1"}) {
        for (int n = 0; n < 2 * (LAST_HOST - FIRST_HOST + 1); ++n) {
            const bool isV6 = n % 2 != 0;
            const std::string from = hostAddress(adapter, FIRST_HOST + n / 2, isV6);
            const std::string to = hostAddress(adapter, 1, isV6);
            for (uint16_t port = 21; port <= 28; ++port) {
                probes.push_back({{false, from, 0, to, port}, adapter, isV6});
                probes.push_back({{true, from, 0, to, port}, adapter, isV6});
            }
            for (uint16_t port = 701; port <= 703; ++port) {
                probes.push_back({{true, from, port, to, PORT_WITHOUT_RULES}, adapter, isV6});
            }
        }
    }
    return probes;
}

class PacketsOnKernel : public ToolTest {
protected:
    void SetUp() override {
        std::string reason;
        if (!realIptables(&reason)) {
            GTEST_SKIP() << reason;
        }
        ToolTest::SetUp();
        removeInterface("eth0");
        createFirewallChains();
        for (const std::string adapter : {"eth0", "eth1"}) {
            addVethPair(adapter, m_client, "c" + adapter);
            setUp(adapter);
            setUp("c" + adapter, &m_client);
            for (const bool isV6 : {false, true}) {
                const std::string prefix = isV6 ? "/64" : "/24";
                addAddress(adapter, hostAddress(adapter, 1, isV6) + prefix);
                for (int host = FIRST_HOST; host <= LAST_HOST; ++host) {
                    addAddress("c" + adapter, hostAddress(adapter, host, isV6) + prefix, &m_client);
                }
            }
        }
        std::vector<uint16_t> ports = {PORT_WITHOUT_RULES};
        for (uint16_t port = 21; port <= 28; ++port) {
            ports.push_back(port);
        }
        m_server = std::make_unique<EchoServer>(ports);
        FW::VELDFW().configSet(parseJson(R"({"status": true})"));
        for (const KnownProbe &known : m_probes) {
            m_batch.push_back(known.probe);
        }
    }

    /// Whether the rule that is named lets the packet through, and that rule.
    std::pair<bool, std::string> explain(const KnownProbe &known, const veldfwctl::Ruleset &ruleset) {
        veldfwctl::PacketQuery query;
        query.from = known.probe.source;
        query.to = known.probe.address;
        query.in = known.adapter;
        query.toPort = std::to_string(known.probe.port) + (known.probe.udp ? "/udp" : "/tcp");
        query.fromPort = std::to_string(known.probe.sourcePort != 0 ? known.probe.sourcePort : EPHEMERAL_PORT);
        const std::vector<Decision> decisions =
            packetsDecide(query.packets(ruleset.interfaces), ruleset.rules, known.isV6, FW::FW_CHAIN_INPUT);
        EXPECT_TRUE(decisions.size() == 1 && decisions[0].isCertain);  // all is said of the packet
        const size_t rule = decisions.at(0).rule;
        if (rule == Decision::CHAIN_END) {
            return {true, "end"};
        }
        m_byRules += ruleset.plan[rule].origin->number != 0 ? 1 : 0;
        return {ruleset.rules[rule].target != "DROP", ruleset.plan[rule].command};
    }

    /// Asks about each port, for the adapter and for all, and compares with what became of the hosts' packets.
    void compareQueries(const std::vector<bool> &answered) {
        std::map<std::tuple<std::string, bool, uint16_t>, std::vector<bool>> byPort;
        for (size_t i = 0; i < m_probes.size(); ++i) {
            const BatchProbe &probe = m_probes[i].probe;
            if (!m_probes[i].isV6) {
                const uint16_t port = probe.sourcePort != 0 ? probe.sourcePort : probe.port;
                byPort[{m_probes[i].adapter, probe.udp, port}].push_back(answered[i]);
            }
        }
        for (const auto &[key, passed] : byPort) {
            const auto &[adapter, isUdp, port] = key;
            const auto through = std::count(passed.begin(), passed.end(), true);
            const auto all = static_cast<std::ptrdiff_t>(passed.size());
            const FW::FW_POLICY seen = through == 0     ? FW::FW_POLICY_DENY
                                       : through == all ? FW::FW_POLICY_ALLOW
                                                        : FW::FW_POLICY_PARTIAL;
            for (const std::string &asked : {adapter, std::string()}) {
                std::map<std::string, FW::FW_POLICY> verdicts;
                const FW::PortCompareST query = {port > 700 ? 1 : 0, isUdp ? FW::FW_PROTO_UDP : FW::FW_PROTO_TCP,
                                                 std::to_string(port)};
                ASSERT_TRUE(FW::VELDFW().fwPortIsBlocked(query, asked, verdicts));
                EXPECT_EQ(seen, verdicts.at(adapter)) << adapter << " port " << port << (isUdp ? "/udp" : "/tcp");
            }
            ++m_verdicts[seen];
        }
    }

    NetworkNamespace m_client{"client"};
    std::unique_ptr<EchoServer> m_server;
    const std::vector<KnownProbe> m_probes = allProbes();
    std::vector<BatchProbe> m_batch;
    int m_byRules = 0;
    std::map<FW::FW_POLICY, int> m_verdicts;
};

TEST_F(PacketsOnKernel, GoAsExplainAndBlockQueriesSayForGeneratedProfiles) {
    constexpr unsigned PROFILES = 20;
    int dropped = 0;
    for (unsigned seed = 1; seed <= PROFILES && !HasFailure(); ++seed) {
        SCOPED_TRACE(seed);
        const bool isExact = seed % 2 == 0;
        ProfileGenerator generator(seed);
        ASSERT_TRUE(FW::VELDFW_PROFILE().profileSet("default", isExact ? generator.exactProfile("default")
                                                                       : generator.profile("default", 8)));
        // Without established connections: a datagram from before would belong to one.
        ASSERT_TRUE(FW::VELDFW().fwReload(false));
        const veldfwctl::Ruleset ruleset = veldfwctl::rulesetBuild(veldfwctl::planBuild("default"), {"eth0", "eth1"});
        std::vector<bool> expected;
        std::vector<std::string> by;
        for (const KnownProbe &known : m_probes) {
            const auto [passes, rule] = explain(known, ruleset);
            expected.push_back(passes);
            by.push_back(rule);
            dropped += passes ? 0 : 1;
        }
        std::vector<bool> answered = probeAll(m_batch, m_client, std::chrono::milliseconds(250));
        if (answered != expected) {  // a machine under load may be late
            answered = probeAll(m_batch, m_client, std::chrono::seconds(3));
        }
        for (size_t i = 0; i < m_batch.size(); ++i) {
            EXPECT_EQ(expected[i], answered[i]) << m_batch[i].source << ":" << m_batch[i].sourcePort << " to "
                                                << m_batch[i].port << (m_batch[i].udp ? "/udp: " : "/tcp: ") << by[i];
        }
        if (isExact) {
            compareQueries(answered);
        }
    }
    const int all = static_cast<int>(PROFILES * m_probes.size());
    std::cout << all << " packets, " << dropped << " dropped, " << m_byRules
              << " decided by rules; ports: " << m_verdicts[FW::FW_POLICY_ALLOW] << " open, "
              << m_verdicts[FW::FW_POLICY_DENY] << " blocked, " << m_verdicts[FW::FW_POLICY_PARTIAL] << " partly\n";
    // The profiles must reach all verdicts, or the agreement says little.
    EXPECT_GT(dropped, all / 10);
    EXPECT_LT(dropped, all * 9 / 10);
    EXPECT_GT(m_byRules, all / 10);
    for (const FW::FW_POLICY policy : {FW::FW_POLICY_ALLOW, FW::FW_POLICY_DENY, FW::FW_POLICY_PARTIAL}) {
        EXPECT_GE(m_verdicts[policy], 40) << policy;
    }
}

/// Two hosts, each with a connection that the active profile lets through, and trials of one that denies.
class TrialOnKernel : public PacketsOnKernel {
protected:
    static constexpr std::chrono::seconds UNTIL_SENT_AGAIN{60};  // TCP waits longer after each lost packet

    void SetUp() override {
        PacketsOnKernel::SetUp();
        if (IsSkipped()) {
            return;
        }
        writeFile("/usr/veld/etc/firewall.d/1.json", R"({"name": "default", "adapterPolicyMap": {"eth0": 0}})");
        writeFile("/usr/veld/etc/firewall.d/2.json", R"({"name": "closed", "adapterPolicyMap": {"eth0": 1}})");
        ASSERT_TRUE(FW::VELDFW().fwReload(true));
        for (const ProbeTarget &target : m_targets) {
            m_connections.emplace_back(target, &m_client);
            ASSERT_EQ(ProbeResult::connected, m_connections.back().exchange());
        }
    }
    void tryProfile(const std::vector<FW::FWRULE> &rules, const std::string &client) {
        FW::VELDFW_PROFILE profiles;
        ASSERT_TRUE(
            profiles.CreateTestProfile("closed", {"closed", {{"eth0", rules}}, {{"eth0", FW::FW_POLICY_DENY}}}));
        ASSERT_TRUE(FW::VELDFW().TestApplyingProfile("closed", client));
        ASSERT_TRUE(profiles.RemoveTestProfile("closed"));
    }
    void expectConnections(bool testers, bool others) {
        for (const auto &[connection, lives] : {std::pair(0, testers), {1, others}}) {
            EXPECT_EQ(lives ? ProbeResult::connected : ProbeResult::timedOut,
                      m_connections[connection].exchange(lives ? UNTIL_SENT_AGAIN : probeTimeout));
        }
    }
    void expectNewConnections(bool testers, bool others) {
        for (const auto &[target, connects] : {std::pair(0, testers), {1, others}}) {
            EXPECT_EQ(connects ? ProbeResult::connected : ProbeResult::timedOut,
                      probeTcp(m_targets[target], &m_client));
        }
    }

    const std::string m_tester = hostAddress("eth0", FIRST_HOST, false);
    const ProbeTarget m_targets[2] = {{hostAddress("eth0", 1, false), 21, m_tester},
                                      {hostAddress("eth0", 1, false), 21, hostAddress("eth0", LAST_HOST, false)}};
    std::vector<Connection> m_connections;
};

TEST_F(TrialOnKernel, CutsOffTheClientsConnectionOnlyUnlessTheProfileLetsItLive) {
    tryProfile({}, m_tester);
    expectConnections(false, true);
    expectNewConnections(false, false);
    ASSERT_TRUE(FW::VELDFW().fwReload(true));
    expectNewConnections(true, true);
    FW::FWRULE rule;
    rule.ipList = {m_tester};
    rule.portGroup = FW::FW_PORT_GROUP_PORT;
    rule.portList = {"21"};
    tryProfile({rule}, m_tester);
    expectConnections(true, true);
    expectNewConnections(true, false);
}

TEST_F(TrialOnKernel, WithoutAClientCutsOffEverybodyUntilTheFirewallIsEnabled) {
    ASSERT_TRUE(FW::VELDFW().fwDisable());
    tryProfile({}, "");
    expectConnections(false, false);
    expectNewConnections(false, false);
    ASSERT_TRUE(FW::VELDFW().fwEnable());
    expectNewConnections(true, true);
}

TEST_F(TrialOnKernel, ByTheToolGivesTheConnectionBackAtItsEnd) {
    ASSERT_EQ(0, runTool({"try", "closed", "--timeout", "5", "--client", m_tester}).status);
    expectConnections(false, true);
    EXPECT_GE(parseJson(runTool({"status", "--json"}).output)["dropped"].asInt(), 1);
    expectConnections(true, true);
    expectNewConnections(true, true);
}

}  // namespace
}  // namespace veldtest
