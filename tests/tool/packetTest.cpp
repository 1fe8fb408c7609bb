// SPDX-License-Identifier: Apache-2.0
// Packets and the rules that take them: the plain functions, as tables.
#include <gtest/gtest.h>

#include <random>
#include <set>

#include "frame/errors.h"
#include "model/numbers.h"
#include "model/packetQuery.h"
#include "model/packetWalk.h"

namespace veldfwctl {
namespace {

const std::vector<std::string> INTERFACES = {"eth0", "eth1", "lo", "tun0"};

NumberSet countryAddresses(const std::string &country, bool isV6) {
    // 10.0.0.0-10.0.1.255 and 192.0.2.0-192.0.2.2
    return country == "DE" && !isV6
               ? NumberSet({{{0, 0x0A000000}, {0, 0x0A0001FF}}, {{0, 0xC0000200}, {0, 0xC0000202}}})
               : NumberSet();
}

/// Rules in short, all for INPUT_FIREWALL unless they begin with "F ": "-i eth0 -j DROP".
std::vector<PacketRule> rulesOf(const std::vector<std::string> &shortRules, bool isV6) {
    std::vector<PacketRule> rules;
    for (const std::string &text : shortRules) {
        const bool isForward = text.rfind("F ", 0) == 0;
        rules.push_back(
            packetRuleParse(std::string("/sbin/iptables -A ") +
                                (isForward ? "FORWARD_FIREWALL " + text.substr(2) : "INPUT_FIREWALL " + text),
                            isV6, InterfaceNumbers(INTERFACES), countryAddresses));
    }
    return rules;
}

TEST(NumberSet, KeepsItsRangesApart) {
    const NumberSet ports({{{0, 20}, {0, 30}}, {{0, 31}, {0, 40}}, {{0, 9}, {0, 5}}, {{0, 50}, {0, 60}}});
    EXPECT_EQ(2u, ports.ranges().size());
    EXPECT_EQ(NumberSet::range(35, 40).unite(NumberSet::range(50, 55)), ports.intersect(NumberSet::range(35, 55)));
    EXPECT_EQ(ports, ports.complement().complement());
    EXPECT_TRUE(NumberSet::all().complement().isEmpty());
    EXPECT_EQ(NumberSet::all(), NumberSet().complement());
    EXPECT_FALSE(ports.meets(NumberSet::range(41, 49)));
    // Across the halves of a number.
    const Number low = {0, ~uint64_t{0}};
    const Number high = {1, 0};
    EXPECT_EQ(1u, NumberSet({{low, low}, {high, high}}).ranges().size());
    EXPECT_EQ(NumberSet({{high, {~uint64_t{0}, ~uint64_t{0}}}}), NumberSet({{{0, 0}, low}}).complement());
}

TEST(PacketsDecide, NamesTheRuleThatTakesThePacket) {
    struct Case {
        std::string from, toPort, in;
        std::vector<std::string> rules;
        std::string deciders;  ///< numbers from 1, "end", "?" after a doubtful one
    };
    const std::vector<Case> cases = {
        {"10.0.0.5", "22/tcp", "eth0", {"-i eth1 -j DROP", "-i eth0 -p tcp --dport 22 -j DROP"}, "2"},
        {"10.0.0.5", "22/tcp", "eth0", {"-p udp --dport 22 -j DROP", "-p tcp --sport 22 -j DROP"}, "2 end"},
        {"10.0.0.5", "22", "eth0", {"-p udp --dport 22 -j DROP"}, "1 end"},
        {"10.0.0.5", "22/tcp", "eth0", {"-j LOG", "-p 6  -j RETURN"}, "2"},
        {"10.0.0.5", "25/tcp", "eth0", {"-p tcp -m multiport --dports 22,24:26 -j DROP"}, "1"},
        {"10.0.0.5", "22/tcp", "eth0", {"-s 10.0.0.4/30 -j DROP"}, "1"},
        {"10.0.0.5", "22/tcp", "eth0", {"-s 10.0.0.9/255.255.255.252 -j DROP", "! -s 10.0.0.5 -j DROP"}, "end"},
        {"10.0.0.5", "22/tcp", "eth0", {"-s 10.0.0.5/255.0.0.255 -j DROP", "-j RETURN"}, "1"},
        {"10.0.0.5", "22/tcp", "eth0", {"-s 10.0.0.4/255.0.0.255 -j DROP", "-j RETURN"}, "2"},
        {"10.0.0.5", "22/tcp", "eth0", {"-d 10.0.0.4/255.0.0.255 -j DROP", "-j RETURN"}, "1? 2"},
        {"10.0.0.5", "22/tcp", "eth0", {"-m iprange --src-range 10.0.0.1-10.0.0.4 -j DROP"}, "end"},
        {"10.0.1.5", "22/tcp", "eth0", {"-m geoip --source-country FR,DE -j DROP"}, "1"},
        {"10.0.2.5", "22/tcp", "eth0", {"-m geoip --source-country DE -j DROP"}, "end"},
        {"10.0.0.5", "22/tcp", "eth0", {"-o eth0 -j DROP", "F -j DROP"}, "end"},
        {"10.0.0.5", "22/tcp", "eth0", {"-i eth+ -j DROP"}, "1"},
        {"10.0.0.5", "22/tcp", "eth0", {"-m state --state ESTABLISHED,RELATED -j ACCEPT"}, "end"},
        {"10.0.0.5", "22/tcp", "eth0", {"-s example.org -j DROP", "-j RETURN"}, "1? 2"},
        {"10.0.0.5", "22/tcp", "eth0", {"-s fe80::1 -j DROP"}, "1? end"},
        {"10.0.0.5", "22/tcp", "eth0", {"-p icmp  -j DROP", "-p 47  -j DROP"}, "end"},
        {"10.0.0.5", "22/tcp", "", {"-i lo -j ACCEPT", "-i eth0 -j DROP"}, "1 2 end"},
        {"2001:db8::5", "22/tcp", "eth0", {"-s 2001:db8::/33 -j DROP"}, "1"},
        {"2001:db8:8000::5", "22/tcp", "eth0", {"-s 2001:db8::/33 -j DROP"}, "end"},
        {"fe80::1", "22/tcp", "eth0", {"-s fe80::/10 -p icmpv6 --icmpv6-type 137 -j ACCEPT", "-j DROP"}, "2"},
    };
    for (const Case &entry : cases) {
        PacketQuery query;
        query.from = entry.from;
        query.toPort = entry.toPort;
        query.in = entry.in;
        const std::vector<PacketRule> rules = rulesOf(entry.rules, query.isV6());
        std::string deciders;
        for (const Decision &decision :
             packetsDecide(query.packets(InterfaceNumbers(INTERFACES)), rules, query.isV6(), "INPUT_FIREWALL")) {
            deciders += (deciders.empty() ? "" : " ") +
                        (decision.rule == Decision::CHAIN_END ? "end" : std::to_string(decision.rule + 1)) +
                        (decision.isCertain ? "" : "?");
        }
        EXPECT_EQ(entry.deciders, deciders) << entry.from << " " << entry.toPort << ": " << join(entry.rules, "; ");
    }
}

TEST(PacketQuery, RefusesWhatIsNoPacket) {
    PacketQuery good;
    good.from = "10.0.0.5";
    const InterfaceNumbers interfaces(INTERFACES);
    EXPECT_NO_THROW(good.packets(interfaces));
    for (const auto &[field, value] :
         std::vector<std::pair<std::string PacketQuery::*, std::string>>{{&PacketQuery::from, "10.0.0.0/8"},
                                                                         {&PacketQuery::to, "::1"},
                                                                         {&PacketQuery::toPort, "ssh"},
                                                                         {&PacketQuery::toPort, "70000"},
                                                                         {&PacketQuery::fromPort, "0"},
                                                                         {&PacketQuery::protocol, "ospfx"}}) {
        PacketQuery bad = good;
        bad.*field = value;
        EXPECT_THROW(bad.packets(interfaces), UsageError) << value;
    }
}

TEST(ShadowFind, NeedsAllPacketsToBeTaken) {
    struct Case {
        std::vector<std::string> rules;  ///< the last one is asked about
        std::string by;                  ///< numbers from 1, "impossible", or "" for a rule that can decide
    };
    const std::vector<Case> cases = {
        {{"-s 10.0.0.0/8 -j RETURN", "-s 10.1.0.0/16 -p tcp --dport 22 -j DROP"}, "1"},
        {{"-s 10.1.0.0/16 -j RETURN", "-s 10.0.0.0/8 -j DROP"}, ""},
        {{"-p tcp --dport 22 -j DROP", "-p udp --dport 22 -j DROP"}, ""},
        {{"-i lo -j ACCEPT", "-s 10.0.0.0/9 -j DROP", "-s 10.128.0.0/9 -j RETURN", "-s 10.0.0.0/8 -j DROP"}, "2 3"},
        {{"-i eth0 -j DROP", "-i eth1 -j DROP", "-s 10.0.0.1 -j DROP"}, ""},  // there can be other interfaces
        {{"-i lo -j ACCEPT", "-i lo -p tcp --dport 22 -j DROP"}, "1"},
        {{"-m state --state ESTABLISHED,RELATED -j ACCEPT", "-j DROP"}, ""},
        {{"-j LOG", "-i eth0 -j DROP"}, ""},
        {{"-s 10.0.0.0/255.0.0.255 -j DROP", "-s 10.0.0.0 -j DROP"}, ""},  // a mask with holes shadows nothing
        {{"-s 10.0.0.0/8 -j DROP", "-s 10.0.0.7/255.0.0.255 -j DROP"}, "1"},
        {{"-s nosuch -j DROP", "-s nosuch -j DROP"}, ""},
        {{"-m geoip --source-country DE -j DROP", "-s 10.0.1.0/24 -j RETURN"}, "1"},
        {{"-m iprange --src-range 10.0.0.1-10.0.0.4 -j DROP", "-m iprange --src-range 10.0.0.5-10.0.0.9 -j DROP",
          "-m iprange --src-range 10.0.0.2-10.0.0.7 -j DROP"},
         "1 2"},
        {{"F -j DROP", "-j DROP"}, ""},
        {{"F -o eth0 -j DROP", "F -i tun0 -o eth0 -j DROP"}, "1"},
        {{"-o eth0 -j DROP"}, "impossible"},
        {{"-p tcp -m multiport --dports 1:99 -j DROP", "-p tcp -m multiport --dports 100:65535 -j DROP",
          "-p tcp -m multiport --dports 80:200 -j RETURN"},
         "1 2"},
    };
    for (const Case &entry : cases) {
        const std::vector<PacketRule> rules = rulesOf(entry.rules, false);
        const bool isForward = rules.back().chain == "FORWARD_FIREWALL";
        const Shadow shadow =
            shadowFind(rules, rules.size() - 1, packetUniverse(false, isForward, InterfaceNumbers(INTERFACES)));
        std::vector<std::string> by = {};
        for (const size_t index : shadow.by) {
            by.push_back(std::to_string(index + 1));
        }
        EXPECT_EQ(entry.by, shadow.isImpossible ? "impossible" : join(by, " ")) << join(entry.rules, "; ");
        EXPECT_EQ(!entry.by.empty(), shadow.isShadowed);
    }
}

TEST(ShadowFind, NeverBlamesARuleThatDecidesForSomePacket) {
    const InterfaceNumbers interfaces(INTERFACES);
    std::mt19937 random(1);
    const auto below = [&random](unsigned bound) { return random() % bound; };
    int shadowed = 0;
    int alive = 0;
    for (int round = 0; round < 60; ++round) {
        std::vector<std::string> shortRules;
        for (int i = 0; i < 12; ++i) {
            // Few values, so that rules often take each other's packets.
            static const std::vector<std::string> ins = {"", "-i eth0 ", "-i eth1 "};
            static const std::vector<std::string> sources = {"", "-s 10.0.0.0/30 ", "-s 10.0.0.2 ", "-d 10.0.0.0/31 ",
                                                             "-m iprange --src-range 10.0.0.1-10.0.0.2 "};
            static const std::vector<std::string> ports = {"", "-p tcp -m multiport --dports 21:23 ",
                                                           "-p tcp --dport 22 ", "-p udp --dport 22 "};
            shortRules.push_back(ins[below(3)] + sources[below(5)] + ports[below(4)] + "-j DROP");
        }
        const std::vector<PacketRule> rules = rulesOf(shortRules, false);
        std::set<size_t> deciding;
        for (const char *in : {"eth0", "eth1", "tun0"}) {
            for (const char *protocol : {"/tcp", "/udp"}) {
                for (unsigned packet = 0; packet < 4 * 4 * 4; ++packet) {
                    PacketQuery query;
                    query.in = in;
                    query.from = "10.0.0." + std::to_string(packet % 4);
                    query.to = "10.0.0." + std::to_string(packet / 4 % 4);
                    query.toPort = std::to_string(21 + packet / 16) + protocol;
                    query.fromPort = "1000";
                    deciding.insert(packetsDecide(query.packets(interfaces), rules, false, "INPUT_FIREWALL")[0].rule);
                }
            }
        }
        for (size_t i = 0; i < rules.size(); ++i) {
            const bool isShadowed = shadowFind(rules, i, packetUniverse(false, false, interfaces)).isShadowed;
            (isShadowed ? shadowed : alive) += 1;
            EXPECT_FALSE(isShadowed && deciding.count(i) != 0) << i + 1 << ": " << join(shortRules, "; ");
        }
    }
    EXPECT_GT(shadowed, 50);
    EXPECT_GT(alive, 50);
}

}  // namespace
}  // namespace veldfwctl
