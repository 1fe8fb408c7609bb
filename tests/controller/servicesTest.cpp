// SPDX-License-Identifier: Apache-2.0
// What is learnt from the system: services for stored profiles, adapters and countries for callers.
#include "caseTable.h"
#include "files.h"
#include "firewallTest.h"
#include "network.h"
#include "veldfirewall/fwGeoip.h"

using namespace veldtest;
using testing::ElementsAre;
using testing::UnorderedElementsAre;

namespace {

TEST_F(FirewallTest, UpdateBringsServiceRulesInLineWithTheServices) {
    for (const std::string name : {"tcp", "udp", "tcp+udp", "icmp", "off"})
        writeFile("/usr/veld/etc/services.d/" + name + ".json",
                  R"({"name": ")" + name + R"(", "enabled": )" + (name == "off" ? "false" : "true") +
                      R"(, "destination": {"ports": ["7"], "protocol": ")" + (name == "off" ? "tcp" : name) + "\"}}");
    FW::FWPROFILE profile;
    std::vector<FW::FWRULE> &rules = profile.rules["global"];
    std::vector<std::string> expected;
    for (const auto &row : readCases(VELD_CASE_DIRECTORY "serviceRules.cases", 4)) {
        rules.push_back(portRule("", FW::FW_POLICY_DENY));
        rules.back().portGroup = std::stoi(row[0]);
        rules.back().portList = split(row[1], ' ');
        rules.back().protocol = FW::FW_PROTO_IGMP;
        if (row[2] != "-")
            expected.push_back(row[2] + " " + row[3]);
    }
    FW::VELDFW_PROFILE profiles;
    ASSERT_TRUE(profiles.profileSet("default", {"default", profile.rules, {}}));
    EXPECT_TRUE(firewall.fwUpdate()) << log.text();
    FW::FWPROFILE stored;
    ASSERT_TRUE(profiles.profileGet("default", stored));
    std::vector<std::string> updated;
    for (const FW::FWRULE &rule : stored.rules["global"]) {
        std::string text;
        for (const std::string &service : rule.portList)
            text += service + " ";
        updated.push_back(text + std::to_string(rule.protocol));
    }
    EXPECT_EQ(updated, expected);
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
    writeFile("/etc.defaults/veldinfo.conf", "support_wireless=\"no\"\n");
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
    Json::Value kept;
    EXPECT_TRUE(firewall.fwIptablesRulesEnum("default", kept, "10.0.0.9"));
    EXPECT_EQ(kept["v4"]["global"][1],
              "-A INPUT_FIREWALL ! -s 10.0.0.9 -m state --state ESTABLISHED,RELATED -j ACCEPT");
}

// What country files give is checked by their fuzz target.
TEST_F(FirewallTest, CountriesAreThoseWithIv4AnywhereInANameAndUsableWithEightBytes) {
    const std::string directory = "/usr/share/xt_geoip/";
    for (const char *name : {"DE.iv4", "de.iv4.old", "FR.iv6", "x.iv4", "README", "USA.iv4"})
        writeFile(directory + name, name == std::string("DE.iv4") ? "8 bytes." : "7 bytes");
    FW::FW_GEOIP geoip;
    std::vector<std::string> countries = {"before"};
    EXPECT_TRUE(geoip.countryEnum(countries));
    EXPECT_THAT(countries, testing::UnorderedElementsAre("before", "DE", "de", "x.", "US"));
    std::vector<std::string> usable;
    EXPECT_TRUE(geoip.geoipSanctify({"USA", "DE", "XX", "DE"}, false, usable));
    EXPECT_THAT(usable, ElementsAre("DE", "DE"));
    EXPECT_TRUE(geoip.geoipSanctify({"XX"}, false, usable)) << "what was usable before counts";
    usable.clear();
    EXPECT_FALSE(geoip.geoipSanctify({"FR", "DE"}, true, usable)) << "of that family";
    EXPECT_FALSE(geoip.geoipSanctify({}, true, usable));
    removeAll(directory);
    EXPECT_FALSE(geoip.countryEnum(countries));
    Json::Value none;
    EXPECT_FALSE(geoip.countryIPGet("XX", true, none));
    for (const char *message : {"There are no country", "Failed to opendir /usr/share/xt_geoip/",
                                "Failed to open file /usr/share/xt_geoip/XX.iv6", "Failed to read geoip database"})
        EXPECT_TRUE(log.contains(message)) << log.text();
}

}  // namespace
