// SPDX-License-Identifier: Apache-2.0
// What the controller learns from the system: services for stored profiles, adapters for callers.
#include "files.h"
#include "firewallTest.h"
#include "network.h"

using namespace veldtest;
using testing::ElementsAre;
using testing::UnorderedElementsAre;

namespace {

void defineService(const std::string &name, const std::string &protocol, bool enabled) {
    writeFile("/usr/veld/etc/services.d/" + name + ".json",
              R"({"name": ")" + name + R"(", "enabled": )" + (enabled ? "true" : "false") +
                  R"(, "destination": {"protocol": ")" + protocol + R"(", "ports": ["7"]}})");
}

TEST_F(FirewallTest, UpdateBringsServiceRulesInLineWithTheServices) {
    for (const char *protocol : {"tcp", "udp", "tcp+udp", "icmp"})
        defineService(protocol, protocol, true);
    defineService("off", "tcp", false);
    constexpr int services = FW::FW_PORT_GROUP_SERVICE;
    struct Row {
        int portGroup;
        std::vector<std::string> before;
        std::vector<std::string> after;  ///< empty: the rule is gone
        int protocol;                    ///< afterwards; 32 before
    };
    const Row rows[] = {
        {services, {"tcp"}, {"tcp"}, 1},
        {services, {"udp"}, {"udp"}, 2},
        {services, {"udp", "tcp"}, {"udp", "tcp"}, 3},
        {services, {"tcp+udp"}, {"tcp+udp"}, 32},  // counts for neither
        {services, {"tcp+udp", "udp"}, {"tcp+udp", "udp"}, 2},
        {services + 2, {"icmp"}, {"icmp"}, 32},
        {services, {"gone", "tcp", "off", "discard"}, {"tcp", "discard"}, 1},
        {services + 2, {"gone", "off"}, {}, 0},
        {FW::FW_PORT_GROUP_PORT, {"gone"}, {"gone"}, 32},
    };
    std::vector<FW::FWRULE> rules;
    for (const Row &row : rows) {
        rules.push_back(portRule("", FW::FW_POLICY_DENY));
        rules.back().portGroup = row.portGroup;
        rules.back().portList = row.before;
        rules.back().protocol = FW::FW_PROTO_IGMP;
    }
    storeProfile({{"global", rules}});
    EXPECT_TRUE(firewall.fwUpdate()) << log.text();
    FW::FWPROFILE stored;
    ASSERT_TRUE(FW::VELDFW_PROFILE().profileGet("default", stored));
    auto rule = stored.rules["global"].begin();
    for (const Row &row : rows) {
        if (row.after.empty())
            continue;
        ASSERT_NE(rule, stored.rules["global"].end());
        EXPECT_EQ(rule->portList, row.after);
        EXPECT_EQ(rule->protocol, row.protocol) << row.after[0];
        ++rule;
    }
    EXPECT_EQ(rule, stored.rules["global"].end());
    EXPECT_THAT(errors(), ElementsAre());
    removeAll("/usr/veld/etc/services.d");
    writeFile("/etc/services", "");
    EXPECT_FALSE(firewall.fwUpdate());
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Failed to enum FW services"));
}

TEST_F(FirewallTest, AdaptersAreAtMost32InterfacesOnceAndTheThreeVirtualOnes) {
    addDummyInterface("eth0");
    addDummyInterface("vpn");
    writeFile("/etc.defaults/veldinfo.conf", "support_wireless=\"yes\"\n");
    std::set<std::string> adapters;
    EXPECT_TRUE(firewall.fwAdapterEnum(adapters));
    EXPECT_THAT(adapters, UnorderedElementsAre("eth0", "global", "pppoe", "vpn", "wlan0"));
    removeAll("/etc.defaults/veldinfo.conf");
    for (int i = 1; i <= 31; ++i)
        addDummyInterface("lan" + std::to_string(i));
    adapters.clear();
    EXPECT_TRUE(firewall.fwAdapterEnum(adapters));
    EXPECT_EQ(adapters.size(), 32u + 2u) << "of the interfaces one is named vpn";
    EXPECT_EQ(adapters.count("lan31"), 0u);
}

TEST_F(FirewallTest, CommandListNeedsAProfileAndKeepsTheOthersConnections) {
    Json::Value commands = "untouched";
    EXPECT_FALSE(firewall.fwIptablesRulesEnum("gone", commands, true));
    EXPECT_EQ(commands, "untouched");
    EXPECT_FALSE(firewall.fwIptablesRulesEnum("default", commands, "somewhere"));
    EXPECT_THAT(errors(), testing::IsSupersetOf({"veldFW.cpp Failed to profileGet(gone)",
                                                 "veldFW.cpp Failed to fwRulesToIptablesRules()"}));
    Json::Value client;
    EXPECT_TRUE(firewall.fwIptablesRulesEnum("default", client, "10.0.0.9"));
    EXPECT_EQ(client["v4"]["global"][1],
              "-A INPUT_FIREWALL ! -s 10.0.0.9 -m state --state ESTABLISHED,RELATED -j ACCEPT");
    EXPECT_EQ(client["v6"]["global"][6], "-A INPUT_FIREWALL -m state --state ESTABLISHED,RELATED -j ACCEPT");
}

}  // namespace
