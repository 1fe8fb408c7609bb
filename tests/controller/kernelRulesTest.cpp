// SPDX-License-Identifier: Apache-2.0
// A profile with every kind of rule in the real kernel: what iptables lists back. What clients then reach is seen by
// the tests of block queries, trials and reloads.
#include "caseTable.h"
#include "files.h"
#include "firewallTest.h"
#include "network.h"
#include "realIptables.h"

using namespace veldtest;

namespace {

class KernelRules : public FirewallTest, public testing::WithParamInterface<const char *> {};

TEST_P(KernelRules, AreListedBackAsMeant) {
    std::string reason = "none on this machine";
    if (!useIptablesBackend(GetParam()) || !realIptables(&reason))
        GTEST_SKIP() << "iptables-" << GetParam() << ": " << reason;
    createFirewallChains();
    for (const char *interface : {"eth0", "tun0"})
        addDummyInterface(interface);
    writeFile("/usr/veld/etc/services.d/vpn.json",
              R"({"name": "vpn_server_pptp", "destination": {"protocol": "tcp", "ports": ["1723"]}})");
    writeFile(PROFILE, readFile(VELD_CASE_DIRECTORY "everyKindOfRule.json"));
    ASSERT_TRUE(firewall.fwEnable()) << log.text();
    const std::vector<std::string> programs = {"iptables", "ip6tables"};
    for (const std::string &program : programs) {
        for (const std::string chain : {"INPUT_FIREWALL", "FORWARD_FIREWALL"}) {
            std::vector<std::string> expected = {"-N " + chain};
            for (const std::string &rule : split(readFile(VELD_CASE_DIRECTORY "everyKindOfRule." + program), '\n'))
                expected.push_back("-A " + chain + " " + rule);
            EXPECT_EQ(listRules("/sbin/" + program, chain), expected);
        }
    }
    EXPECT_TRUE(firewall.fwDisable());
    for (const std::string &program : programs) {
        EXPECT_EQ(listRules("/sbin/" + program, "INPUT_FIREWALL").size(), 1u);
        for (const std::string chain : {"INPUT", "FORWARD"})
            EXPECT_EQ(listRules("/sbin/" + program, chain)[0], "-P " + chain + " ACCEPT");
    }
    EXPECT_THAT(errors(), testing::IsEmpty());
}

INSTANTIATE_TEST_SUITE_P(Backend, KernelRules, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
