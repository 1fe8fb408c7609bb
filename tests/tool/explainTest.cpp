// SPDX-License-Identifier: Apache-2.0
// What the tool says about packets, and what happens to them: generated profiles in the kernel, packets over both
// families, both protocols and two interfaces.
#include <gmock/gmock.h>
#include <veldfirewall/veldFW.h>

#include <iostream>
#include <memory>

#include "connections.h"
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

class ExplainOnKernel : public ToolTest {
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
                for (int host = 2; host <= 5; ++host) {
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
    }

    static std::vector<BatchProbe> allProbes() {
        std::vector<BatchProbe> probes;
        for (const std::string adapter : {"eth0", "eth1"}) {
            for (const bool isV6 : {false, true}) {
                for (int host = 2; host <= 5; ++host) {
                    const std::string from = hostAddress(adapter, host, isV6);
                    const std::string to = hostAddress(adapter, 1, isV6);
                    for (uint16_t port = 21; port <= 28; ++port) {
                        probes.push_back({false, from, 0, to, port});
                        probes.push_back({true, from, 0, to, port});
                    }
                    for (uint16_t port = 701; port <= 703; ++port) {
                        probes.push_back({true, from, port, to, PORT_WITHOUT_RULES});
                    }
                }
            }
        }
        return probes;
    }

    static veldfwctl::PacketQuery queryOf(const BatchProbe &probe) {
        veldfwctl::PacketQuery query;
        query.from = probe.source;
        query.to = probe.address;
        query.in = probe.address == hostAddress("eth0", 1, false) || probe.address == hostAddress("eth0", 1, true)
                       ? "eth0"
                       : "eth1";
        query.toPort = std::to_string(probe.port) + (probe.udp ? "/udp" : "/tcp");
        query.fromPort = std::to_string(probe.sourcePort != 0 ? probe.sourcePort : EPHEMERAL_PORT);
        return query;
    }

    NetworkNamespace m_client{"client"};
    std::unique_ptr<EchoServer> m_server;
};

TEST_F(ExplainOnKernel, TheRuleNamedDecidesForGeneratedProfiles) {
    constexpr unsigned PROFILES = 15;
    const std::vector<BatchProbe> probes = allProbes();
    int dropped = 0;
    int byRules = 0;
    for (unsigned seed = 1; seed <= PROFILES && !HasFailure(); ++seed) {
        SCOPED_TRACE(seed);
        ASSERT_TRUE(FW::VELDFW_PROFILE().profileSet("default", ProfileGenerator(seed).profile("default", 8)));
        // Without established connections: a datagram from before would belong to one.
        ASSERT_TRUE(FW::VELDFW().fwReload(false));
        const veldfwctl::Ruleset ruleset = veldfwctl::rulesetBuild(veldfwctl::planBuild("default"), {"eth0", "eth1"});
        std::vector<bool> expected;
        std::vector<std::string> by;
        for (const BatchProbe &probe : probes) {
            const veldfwctl::PacketQuery query = queryOf(probe);
            const std::vector<Decision> decisions =
                packetsDecide(query.packets(ruleset.interfaces), ruleset.rules, query.isV6(), FW::FW_CHAIN_INPUT);
            ASSERT_EQ(1u, decisions.size());  // all is said of the packet
            ASSERT_TRUE(decisions[0].isCertain);
            const bool isEnd = decisions[0].rule == Decision::CHAIN_END;
            expected.push_back(isEnd || ruleset.rules[decisions[0].rule].target != "DROP");
            by.push_back(isEnd ? "end" : ruleset.plan[decisions[0].rule].command);
            dropped += expected.back() ? 0 : 1;
            byRules += isEnd || ruleset.plan[decisions[0].rule].origin->number == 0 ? 0 : 1;
        }
        std::vector<bool> answered = probeAll(probes, m_client, std::chrono::milliseconds(250));
        if (answered != expected) {  // a machine under load may be late
            answered = probeAll(probes, m_client, std::chrono::seconds(3));
        }
        for (size_t i = 0; i < probes.size(); ++i) {
            EXPECT_EQ(expected[i], answered[i]) << probes[i].source << ":" << probes[i].sourcePort << " to "
                                                << probes[i].port << (probes[i].udp ? "/udp: " : "/tcp: ") << by[i];
        }
    }
    const int all = static_cast<int>(PROFILES * probes.size());
    std::cout << all << " packets, " << dropped << " dropped, " << byRules << " decided by rules\n";
    // The profiles must reach both verdicts, or the agreement says little.
    EXPECT_GT(dropped, all / 10);
    EXPECT_LT(dropped, all * 9 / 10);
    EXPECT_GT(byRules, all / 10);
}

}  // namespace
}  // namespace veldtest
