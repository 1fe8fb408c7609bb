// SPDX-License-Identifier: Apache-2.0
// What the controller learns from the system: services for stored profiles, adapters for callers.
#include "files.h"
#include "firewallTest.h"
#include "network.h"

using namespace veldtest;
using testing::ElementsAre;
using testing::UnorderedElementsAre;

namespace {

std::string serviceJson(const std::string &name, const std::string &protocol, bool enabled = true) {
    return R"({"name": ")" + name + R"(", "enabled": )" + (enabled ? "true" : "false") +
           R"(, "destination": {"protocol": ")" + protocol + R"(", "ports": ["7"]}})";
}

struct Refresh {
    const char *name;
    int portGroup;
    std::vector<std::string> before;
    std::vector<std::string> after;  ///< empty: the rule is gone
    int protocol;                    ///< afterwards; 32 before
};

class Update : public FirewallTest, public testing::WithParamInterface<Refresh> {
protected:
    Update() {
        for (const char *protocol : {"tcp", "udp", "tcp+udp", "icmp"})
            writeFile(std::string("/usr/veld/etc/services.d/") + protocol + ".json",
                      serviceJson(std::string("svc-") + protocol, protocol));
        writeFile("/usr/veld/etc/services.d/off.json", serviceJson("svc-off", "tcp", false));
    }
};

TEST_P(Update, BringsAServiceRuleInLineWithTheServices) {
    const Refresh &refresh = GetParam();
    FW::FWRULE rule = portRule("", FW::FW_POLICY_DENY);
    rule.portGroup = refresh.portGroup;
    rule.portList = refresh.before;
    rule.protocol = FW::FW_PROTO_IGMP;
    FW::FWRULE last = portRule("80", FW::FW_POLICY_ALLOW);
    last.name = "last";
    storeRules({rule, last});
    EXPECT_TRUE(firewall.fwUpdate()) << log.text();
    FW::FWPROFILE stored;
    ASSERT_TRUE(FW::VELDFW_PROFILE().profileGet("default", stored));
    const auto &rules = stored.rules["global"];
    ASSERT_EQ(rules.size(), refresh.after.empty() ? 1u : 2u);
    EXPECT_EQ(rules.back().name, "last");
    if (!refresh.after.empty()) {
        EXPECT_EQ(rules[0].portList, refresh.after);
        EXPECT_EQ(rules[0].protocol, refresh.protocol);
        EXPECT_EQ(rules[0].policy, FW::FW_POLICY_DENY);
    }
    EXPECT_THAT(errors(), ElementsAre());
}

INSTANTIATE_TEST_SUITE_P(
    Case, Update,
    testing::Values(
        Refresh{"Tcp", 0, {"svc-tcp"}, {"svc-tcp"}, 1}, Refresh{"Udp", 2, {"svc-udp"}, {"svc-udp"}, 2},
        Refresh{"TcpAndUdp", 0, {"svc-udp", "svc-tcp"}, {"svc-udp", "svc-tcp"}, 3},
        Refresh{"ServiceOfBothCountsForNeither", 0, {"svc-tcp+udp"}, {"svc-tcp+udp"}, 32},
        Refresh{"ServiceOfBothAndUdp", 0, {"svc-tcp+udp", "svc-udp"}, {"svc-tcp+udp", "svc-udp"}, 2},
        Refresh{"Icmp", 2, {"svc-icmp"}, {"svc-icmp"}, 32},
        Refresh{"UnknownAndDisabledLeave", 0, {"gone", "svc-tcp", "svc-off", "discard"}, {"svc-tcp", "discard"}, 1},
        Refresh{"RuleLeftWithoutServices", 2, {"gone", "svc-off"}, {}, 0},
        Refresh{"PortsAreNoServices", 1, {"gone"}, {"gone"}, 32}),
    [](const auto &entry) { return entry.param.name; });

TEST_F(FirewallTest, UpdateFailsWithoutServicesOrProfiles) {
    writeFile("/etc/services", "");
    EXPECT_FALSE(firewall.fwUpdate());
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Failed to enum FW services"));
}

TEST_F(FirewallTest, AdaptersAreInterfacesOnceAndTheThreeVirtualOnes) {
    std::set<std::string> adapters = {"before"};
    EXPECT_TRUE(firewall.fwAdapterEnum(adapters));
    EXPECT_THAT(adapters, UnorderedElementsAre("before", "global", "pppoe", "vpn"));
    addDummyInterface("eth0");
    addDummyInterface("vpn");
    writeFile("/etc.defaults/veldinfo.conf", "support_wireless=\"yes\"\n");
    adapters.clear();
    EXPECT_TRUE(firewall.fwAdapterEnum(adapters));
    EXPECT_THAT(adapters, UnorderedElementsAre("eth0", "global", "pppoe", "vpn", "wlan0"));
    removeAll("/etc.defaults/veldinfo.conf");
    for (int i = 1; i <= 31; ++i)
        addDummyInterface("lan" + std::to_string(i));
    adapters.clear();
    EXPECT_TRUE(firewall.fwAdapterEnum(adapters));
    EXPECT_EQ(adapters.size(), 32u + 2u) << "32 interfaces, of which one is named vpn";
    EXPECT_EQ(adapters.count("lan30"), 1u);
    EXPECT_EQ(adapters.count("lan31"), 0u);
    for (int i = 1; i <= 31; ++i)
        removeInterface("lan" + std::to_string(i));
    removeInterface("vpn");
    removeInterface("eth0");
}

TEST_F(FirewallTest, CommandListOfAnUnknownProfileIsUntouched) {
    Json::Value commands = "untouched";
    EXPECT_FALSE(firewall.fwIptablesRulesEnum("gone", commands, true));
    EXPECT_EQ(commands, "untouched");
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Failed to profileGet(gone)"));
}

TEST_F(FirewallTest, CommandListWithAClientKeepsTheOthersConnections) {
    Json::Value plain;
    Json::Value client;
    Json::Value bad;
    EXPECT_TRUE(firewall.fwIptablesRulesEnum("default", plain, false));
    EXPECT_EQ(plain["v4"]["global"].size(), 2u);
    EXPECT_TRUE(firewall.fwIptablesRulesEnum("default", client, "10.0.0.9"));
    EXPECT_EQ(client["v4"]["global"][1],
              "-A INPUT_FIREWALL ! -s 10.0.0.9 -m state --state ESTABLISHED,RELATED -j ACCEPT");
    EXPECT_EQ(client["v6"]["global"][6], "-A INPUT_FIREWALL -m state --state ESTABLISHED,RELATED -j ACCEPT");
    EXPECT_FALSE(firewall.fwIptablesRulesEnum("default", bad, "somewhere"));
    EXPECT_THAT(errors(), testing::Contains("veldFW.cpp Failed to fwRulesToIptablesRules()"));
}

}  // namespace
