// SPDX-License-Identifier: Apache-2.0
// What a client notices while rules are replaced.
#include <functional>
#include <iostream>

#include "kernelTest.h"
#include "realIptables.h"
#include "windowProbe.h"

using namespace veldtest;

namespace {

class TrafficWindow : public KernelTest {
protected:
    void SetUp() override {
        std::string reason;
        if (!useIptablesBackend(GetParam()) || !realIptables(&reason))
            GTEST_SKIP() << "iptables-" << GetParam() << " does not work here: " << reason;
        probed.host.run(createFirewallChains);
        setSwitch(true);
    }

    /// A hundred rules, the last of which allow what the probe sends to its allowed ports.
    static FW::FWPROFILE hundredRules(const std::string &network) {
        std::vector<FW::FWRULE> rules;
        for (int i = 1; i < 99; ++i)
            rules.push_back(addressRule("", network + std::to_string(i)));
        for (const uint16_t port : {veldbench::ALLOWED_PORT, veldbench::TRANSFER_PORT}) {
            rules.push_back(portRule(std::to_string(port), FW::FW_POLICY_ALLOW));
            rules.back().ipType = FW::FW_IP_TYPE_BOTH;
            rules.back().protocol = FW::FW_PROTO_TCP_UDP;
        }
        return profileOf(rules);
    }

    veldbench::WindowResult during(const char *what, const std::function<void()> &work) {
        veldbench::WindowProbe probe(probed);
        probed.host.run(work);
        const veldbench::WindowResult result = probe.stop();
        std::cout << what << ": " << result.ticks << " probes, " << result.allowedLost << " allowed ones lost, "
                  << result.deniedPassed << " denied ones passed, " << result.retransmissions
                  << " packets of the transfer sent again\n";
        return result;
    }

    veldbench::ProbedHost probed{"host"};
};

TEST_P(TrafficWindow, IsNoneInTheAtomicWayAndIsSeenInTheSpecifiedOne) {
    const int reloads = 20;
    store(hundredRules("10.7.0."));
    probed.host.run([&] { ASSERT_TRUE(firewall.fwReloadAtomic(true)) << log.text(); });
    const auto atomically = during("20 atomic reloads", [&] {
        for (int i = 0; i < reloads; ++i) {
            store(hundredRules(i % 2 == 0 ? "10.8.0." : "10.7.0."));
            EXPECT_TRUE(firewall.fwReloadAtomic(true)) << log.text();
        }
    });
    EXPECT_GT(atomically.ticks, static_cast<uint64_t>(reloads));
    EXPECT_EQ(atomically.allowedLost, 0u);
    EXPECT_EQ(atomically.deniedPassed, 0u);
    EXPECT_EQ(atomically.retransmissions, 0u);
    // The other way shows that a loss would have been seen.
    const auto specified = during("1 specified reload", [&] { EXPECT_TRUE(firewall.fwReload(true)) << log.text(); });
    EXPECT_GT(specified.allowedLost, 0u);
}

INSTANTIATE_TEST_SUITE_P(Backend, TrafficWindow, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
