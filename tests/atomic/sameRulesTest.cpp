// SPDX-License-Identifier: Apache-2.0
// Both ways of applying a profile leave the same rules in the kernel, or both refuse it.
#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <random>

#include "files.h"
#include "kernelTest.h"
#include "network.h"
#include "processes.h"
#include "realIptables.h"

using namespace veldtest;

namespace {

/// Draws profiles of all kinds of rules. One profile in some has a rule that iptables refuses.
class ProfileGenerator {
public:
    explicit ProfileGenerator(unsigned seed) : random(seed) {}

    FW::FWPROFILE profile() {
        FW::FWPROFILE profile;
        profile.name = "default";
        for (const char *adapter : {"global", "eth0", "eth1", "vpn", "absent"}) {
            for (size_t count = below(4); count > 0; --count)
                profile.rules[adapter].push_back(rule());
            if (below(2) == 0)
                profile.adapterPolicyMap[adapter] = FW::FW_POLICY(below(3));
        }
        return profile;
    }

private:
    size_t below(size_t limit) { return random() % limit; }
    template <typename Value> Value oneOf(const std::vector<Value> &values) { return values[below(values.size())]; }

    FW::FWRULE rule() {
        FW::FWRULE rule;
        rule.name = "rule " + std::to_string(random());
        rule.labelList = {"a \"label\"", "#"};
        rule.enable = below(8) != 0;
        rule.policy = FW::FW_POLICY(below(3));
        rule.blLog = below(4) == 0;
        rule.adapterDirect = below(4) == 0 ? 0 : 1;
        rule.ipDirect = static_cast<int>(below(2));
        rule.portDirect = static_cast<int>(below(2));
        if (below(10) == 0)
            rule.table = oneOf<std::string>({"mangle", "raw"});
        addresses(rule);
        ports(rule);
        return rule;
    }

    void addresses(FW::FWRULE &rule) {
        rule.ipType = static_cast<int>(below(2));
        const bool v6 = rule.ipType == FW::FW_IP_TYPE_V6;
        if (below(40) == 0)
            rule.ipType = FW::FW_IP_TYPE_BOTH;  // one family refuses the address
        rule.ipGroup = oneOf<int>({FW::FW_IP_GROUP_ADDRESS, FW::FW_IP_GROUP_NETWORK, FW::FW_IP_GROUP_RANGE,
                                   FW::FW_IP_GROUP_ANY, FW::FW_IP_GROUP_NONE});
        const std::string number = std::to_string(1 + below(200));
        const std::string base = v6 ? "fd00::" : "10.0.0.";
        if (rule.ipGroup == FW::FW_IP_GROUP_ADDRESS)
            rule.ipList = {base + number};
        else if (rule.ipGroup == FW::FW_IP_GROUP_NETWORK)
            rule.ipList = {base + number,
                           v6 ? std::to_string(below(129))
                              : oneOf<std::string>({"8", "24", "31", "255.255.0.0", "255.0.255.0", "0"})};
        else if (rule.ipGroup == FW::FW_IP_GROUP_RANGE)
            rule.ipList = {base + number, base + (v6 ? "ffff" : "254")};
        else if (rule.ipGroup == FW::FW_IP_GROUP_ANY)
            rule.ipType = static_cast<int>(below(3));
    }

    void ports(FW::FWRULE &rule) {
        rule.portGroup = static_cast<int>(below(4));
        rule.protocol = oneOf<int>({1, 1, 2, 3, 4, 32});
        if (rule.portGroup == FW::FW_PORT_GROUP_PORT) {
            for (size_t count = oneOf<size_t>({1, 2, 7, 8, 20}); count > 0; --count) {
                const size_t port = 1 + below(60000);
                const size_t last = port + below(3) * below(100);
                rule.portList.push_back(std::to_string(port) + (last > port ? "-" + std::to_string(last) : ""));
            }
        } else if (rule.portGroup != FW::FW_PORT_GROUP_ANY) {
            rule.portList = {oneOf<std::string>({"one", "many", "ranges", "ping", "vpn_server_ipsec", "unknown"})};
        }
    }

    std::mt19937 random;
};

void defineServices() {
    const std::pair<const char *, const char *> services[] = {
        {"one", R"("destination": {"protocol": "tcp", "ports": ["22"]})"},
        {"many", R"("source": {"protocol": "udp", "ports": ["1","2","3","4","5","6","7","8","9"]})"},
        {"ranges", R"("source": {"protocol": "tcp", "ports": ["5-9"]},
                      "destination": {"protocol": "tcp+udp", "ports": ["100-200", "300"]})"},
        {"ping", R"("destination": {"protocol": "icmp", "ports": ["0"]})"},
        {"vpn_server_ipsec", R"("destination": {"protocol": "udp", "ports": ["500", "4500"]})"}};
    for (const auto &[name, sides] : services)
        writeFile("/usr/veld/etc/services.d/" + std::string(name) + ".json",
                  "{\"name\": \"" + std::string(name) + "\", \"enabled\": true, " + sides + "}");
}

class SameRules : public KernelTest {
protected:
    static std::string usedTables() { return rulesOf() + rulesOf("mangle") + rulesOf("raw"); }

    /// Puts something into the firewall chains that no reload may leave.
    static void startOver() {
        for (const std::string program : {"/sbin/iptables", "/sbin/ip6tables"}) {
            writeFile("/tmp/start",
                      "*filter\n-F INPUT_FIREWALL\n-F FORWARD_FIREWALL\n-A INPUT_FIREWALL -j RETURN\nCOMMIT\n"
                      "*mangle\n-F INPUT_FIREWALL\n-F FORWARD_FIREWALL\nCOMMIT\n*raw\n-F INPUT_FIREWALL\n-F "
                      "FORWARD_FIREWALL\nCOMMIT\n");
            runChecked({program + "-restore", "--noflush", "/tmp/start"});
        }
    }
};

TEST_P(SameRules, AreLeftByBothWaysForGeneratedProfiles) {
    addDummyInterface("eth1");
    addDummyInterface("tun0");
    addDummyInterface("tun1");
    defineServices();
    const unsigned seed = std::getenv("VELD_SEED") != nullptr ? unsigned(std::stoul(std::getenv("VELD_SEED"))) : 1;
    const int profiles = 120;
    ProfileGenerator generator(seed);
    int refused = 0;
    size_t lines = 0;
    for (int i = 0; i < profiles; ++i) {
        SCOPED_TRACE("seed " + std::to_string(seed) + ", profile " + std::to_string(i));
        store(generator.profile());
        setSwitch(true);
        const bool keepEstablished = i % 2 == 0;
        startOver();
        log.clear();
        const bool applied = firewall.fwReload(keepEstablished);
        const std::string specified = usedTables();
        setSwitch(true);
        startOver();
        const std::string before = usedTables();
        ASSERT_EQ(firewall.fwReloadAtomic(keepEstablished), applied) << log.text();
        ASSERT_EQ(usedTables(), applied ? specified : before) << log.text();
        EXPECT_TRUE(isSwitchedOn());
        refused += applied ? 0 : 1;
        lines += static_cast<size_t>(std::count(specified.begin(), specified.end(), '\n'));
    }
    std::cout << profiles << " profiles, " << refused << " of them refused by both; " << lines << " lines compared\n";
    EXPECT_GT(refused, 0);
    EXPECT_LT(refused, profiles / 2);
}

/// Strings of a profile, each behind "--comment "; whether the atomic way may refuse it.
const struct {
    std::string text;
    bool isRefused;
} profileStrings[] = {{"a\"b", false},        {"\"", false},
                      {"\\", false},          {"a\\\"", false},
                      {"#", false},           {"#x", false},
                      {"\t", false},          {"a\tb", false},
                      {"'x'", false},         {"a\rb", false},
                      {"$(id)", false},       {"%s%n", false},
                      {"\xc3\xa4", false},    {"COMMIT", false},
                      {"*nat", false},        {"x -s 10.2.0.0/16", false},
                      {"x ! -i eth1", false}, {"\" -s 10.2.0.0/16 \"", false},
                      {"a\nb", true},         {"a\n-A INPUT_FIREWALL -j ACCEPT", true},
                      {"\n", true},           {"x -h", true},
                      {"x --version", true},  {"x -t nat", true},
                      {"x -4", true},         {"x --wait", true}};

TEST_P(SameRules, AreLeftByBothWaysForAnyStringOrItIsRefusedBeforeAnythingChanges) {
    for (const auto &[text, isRefused] : profileStrings) {
        SCOPED_TRACE(text);
        store(
            profileOf({addressRule("first", "10.0.0.1"), addressRule("odd", "10.0.0.2 -m comment --comment " + text)}));
        setSwitch(true);
        startOver();
        const bool applied = firewall.fwReload(true);
        const std::string specified = usedTables();
        setSwitch(true);
        startOver();
        const std::string before = usedTables();
        FW::FwApplyFailure failure;
        const bool appliedAtomically = firewall.fwReloadAtomic(true, failure);
        EXPECT_EQ(appliedAtomically, applied && !isRefused) << failure.message;
        EXPECT_EQ(usedTables(), appliedAtomically ? specified : before);
        if (isRefused) {
            EXPECT_EQ(failure.ruleName, "odd");
            EXPECT_EQ(failure.rulePosition, 1);
        }
        // A rule with a line break, left by the specified way, cannot be put back: it is not touched either.
        if (text == "a\nb") {
            setSwitch(true);
            ASSERT_TRUE(firewall.fwReload(true)) << log.text();
            store(profileOf({}));
            EXPECT_FALSE(firewall.fwReloadAtomic(true, failure));
            EXPECT_THAT(failure.message, testing::HasSubstr("line break"));
            EXPECT_EQ(usedTables(), specified);
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Backend, SameRules, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
