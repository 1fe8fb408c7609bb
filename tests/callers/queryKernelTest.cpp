// SPDX-License-Identifier: Apache-2.0
// Block queries against the kernel: generated profiles are loaded, packets sent from several addresses, and what gets
// through is compared with the query's verdict.
//
// A query looks at the stored rules only and keeps one mark per adapter, so it is exact for a class of profiles. Left
// out of the generated ones, because the verdict is documented to differ there (LeftOutConstructions shows how):
//   - a rule for some sources whose policy is already the state (a second one of the same policy, a deny under a
//     default of deny): it sets the state back to allow;
//   - the same with allow under a default of allow, when a deny for all sources follows: the exception is forgotten;
//   - global rules that leave a mark (some sources, no rule that decides): the adapters' verdicts are formed
//     without it;
//   - rules for some sources that overlap, or that together name every source: the query does not compare addresses;
//   - rules that yield no command (address group "none", unknown countries) or act on something else than the query
//     sees (destination addresses, outgoing interfaces, one address family, other tables): they count all the same;
//   - policy and default "none" on an adapter: the verdict is "no decision", the kernel goes on and accepts;
//   - queries for tcp and udp at once or for a range of ports: one verdict for several outcomes;
//   - "vpn" and "pppoe", which the query takes for names while the kernel has their interfaces.
#include "caseTable.h"
#include "connections.h"
#include "probeBatch.h"
#include "realIptables.h"
#include "storedConfiguration.h"

#include <gtest/gtest.h>
#include <veldfirewall/veldFW.h>

#include <algorithm>
#include <iostream>
#include <memory>
#include <random>

using namespace FW;
using namespace veldtest;

namespace {

const std::vector<std::string> adapters = {"eth0", "eth1"};
const std::vector<int> hosts = {2, 3, 4, 5};  // last number of the client's addresses; rules never name the last one
constexpr uint16_t firstPort = 21;
constexpr uint16_t lastPort = 28;
constexpr uint16_t firstSourcePort = 701;
constexpr uint16_t lastSourcePort = 703;
constexpr uint16_t portWithoutRules = 99;

std::string network(const std::string &adapter) {
    return adapter == "eth0" ? "10.1.0." : "10.2.0.";
}

struct Query {
    std::string adapter;
    int direct;
    FW_PORT_PROTOCOL protocol;
    uint16_t port;
};

std::vector<Query> allQueries() {
    std::vector<Query> queries;
    for (const std::string &adapter : adapters) {
        for (uint16_t port = firstPort; port <= lastPort; ++port) {
            queries.push_back({adapter, 0, FW_PROTO_TCP, port});
            queries.push_back({adapter, 0, FW_PROTO_UDP, port});
        }
        for (uint16_t port = firstSourcePort; port <= lastSourcePort; ++port)
            queries.push_back({adapter, 1, FW_PROTO_UDP, port});
    }
    return queries;
}

/// A rule and, in the test's own words, the packets that it is for.
struct KnownRule {
    FWRULE rule;
    int direct = 0;
    bool anyPort = false;
    bool tcp = false;
    bool udp = false;
    std::vector<uint16_t> ports;

    bool isLimited() const { return rule.ipGroup != FW_IP_GROUP_ANY; }
    bool isFor(const Query &query) const {
        return rule.enable && (anyPort || (direct == query.direct && (query.protocol == FW_PROTO_TCP ? tcp : udp) &&
                                           std::count(ports.begin(), ports.end(), query.port) != 0));
    }
};

using KnownRules = std::vector<KnownRule>;

struct KnownService {
    std::string name;
    int direct;
    bool tcp;
    bool udp;
    std::vector<uint16_t> ports;
};

const std::vector<KnownService> services = {{"files", 0, true, false, {21, 23}},
                                            {"names", 0, true, true, {25, 26}},
                                            {"media", 0, false, true, {22, 23, 24}},
                                            {"clock", 1, false, true, {701}},
                                            {"no-such-service", 0, true, true, {}}};

class Generator {
public:
    explicit Generator(unsigned seed) : m_random(seed) {}

    int below(int bound) { return static_cast<int>(m_random() % static_cast<unsigned>(bound)); }
    bool chance(int percent) { return below(100) < percent; }

    /// @param adapter empty: a list for all adapters
    /// @param start default policy; exceptions from it are generated more often than what says the same again
    KnownRules list(int maxLength, const std::string &adapter, FW_POLICY start) {
        KnownRules rules;
        FW_POLICY exceptionTo = start;
        size_t unusedHost = 0;
        for (int length = below(maxLength + 1); length > 0; --length) {
            KnownRule rule = chance(35) ? serviceRule() : portRule();
            rule.rule.policy = chance(50) ? FW_POLICY_ALLOW : FW_POLICY_DENY;
            rule.rule.enable = chance(92);
            rule.rule.ipType = chance(80) ? FW_IP_TYPE_V4 : FW_IP_TYPE_BOTH;
            rule.rule.ipGroup = FW_IP_GROUP_ANY;
            if (chance(60) && unusedHost + 1 < hosts.size()) {
                limit(rule.rule, adapter, unusedHost);
                if (chance(80))
                    rule.rule.policy = exceptionTo == FW_POLICY_DENY ? FW_POLICY_ALLOW : FW_POLICY_DENY;
                exceptionTo = rule.rule.policy;
            }
            rules.push_back(rule);
        }
        return rules;
    }

private:
    /// Lets the rule hold for hosts that no rule of the list has named.
    void limit(FWRULE &rule, const std::string &adapter, size_t &unusedHost) {
        const std::string host = std::to_string(hosts[unusedHost++]);
        rule.ipType = FW_IP_TYPE_V4;
        if (adapter.empty()) {  // that host behind every adapter
            rule.ipGroup = FW_IP_GROUP_NETWORK;
            rule.ipList = {"10.0.0." + host, "255.0.0.255"};
        } else if (chance(40)) {
            rule.ipGroup = FW_IP_GROUP_ADDRESS;
            rule.ipList = {network(adapter) + host};
        } else if (chance(50) && unusedHost + 1 < hosts.size()) {
            rule.ipGroup = FW_IP_GROUP_RANGE;
            rule.ipList = {network(adapter) + host, network(adapter) + std::to_string(hosts[unusedHost++])};
        } else {
            rule.ipGroup = FW_IP_GROUP_NETWORK;
            rule.ipList = {network(adapter) + host, "32"};
        }
    }

    KnownRule serviceRule() {
        const KnownService &service = services[static_cast<size_t>(below(static_cast<int>(services.size())))];
        KnownRule rule;
        rule.rule.portList = {service.name};
        rule.direct = service.direct;
        rule.tcp = service.tcp;
        rule.udp = service.udp;
        rule.ports = service.ports;
        rule.rule.portGroup = chance(50) ? FW_PORT_GROUP_SERVICE : FW_PORT_GROUP_RESERVED;
        return rule;
    }

    KnownRule portRule() {
        KnownRule rule;
        if (chance(15)) {
            rule.anyPort = true;
            rule.rule.portGroup = FW_PORT_GROUP_ANY;
            return rule;
        }
        rule.direct = rule.rule.portDirect = chance(20) ? 1 : 0;
        rule.rule.portGroup = FW_PORT_GROUP_PORT;
        const int protocol = rule.direct == 1 ? FW_PROTO_UDP : 1 + below(3);
        rule.rule.protocol = protocol;
        rule.tcp = protocol != FW_PROTO_UDP;
        rule.udp = protocol != FW_PROTO_TCP;
        const int first = rule.direct == 1 ? firstSourcePort : firstPort;
        const int last = rule.direct == 1 ? lastSourcePort : lastPort;
        for (int count = 1 + below(3); count > 0; --count) {
            const int low = first + below(last - first + 1);
            const int high = chance(40) ? low + below(last - low + 1) : low;
            rule.rule.portList.push_back(std::to_string(low) + (high > low ? "-" + std::to_string(high) : ""));
            for (int port = low; port <= high; ++port)
                rule.ports.push_back(static_cast<uint16_t>(port));
        }
        return rule;
    }

    std::mt19937 m_random;
};

/// The class of rule lists for which the verdict is exact; see the top of the file.
bool isExact(const KnownRules &list, const Query &query, FW_POLICY start) {
    std::vector<FW_POLICY> limited;
    FW_POLICY rest = start;  // of the sources that no limited rule names
    for (const KnownRule &rule : list) {
        if (!rule.isFor(query))
            continue;
        if (!rule.isLimited()) {
            rest = rule.rule.policy;
            break;
        }
        limited.push_back(rule.rule.policy);
    }
    const bool isGlobal = start == FW_POLICY_NONE;
    bool allowedAnyway = false;
    while (!isGlobal && start == FW_POLICY_ALLOW && !limited.empty() && limited.front() == FW_POLICY_ALLOW) {
        allowedAnyway = true;
        limited.erase(limited.begin());
    }
    if (limited.size() >= 2)
        return limited[0] != start && limited[1] != limited[0];
    if (isGlobal)
        return limited.empty() || limited[0] == rest;
    return (limited.empty() || limited[0] != start) && !(allowedAnyway && rest == FW_POLICY_DENY);
}

bool concerns(const KnownRules &list, const Query &query) {
    return std::any_of(list.begin(), list.end(), [&](const KnownRule &rule) { return rule.isFor(query); });
}

std::vector<FWRULE> plain(const KnownRules &rules) {
    std::vector<FWRULE> plainRules;
    for (const KnownRule &rule : rules)
        plainRules.push_back(rule.rule);
    return plainRules;
}

class QueryAndKernel : public testing::Test {
protected:
    void SetUp() override {
        std::string reason;
        if (!realIptables(&reason))
            GTEST_SKIP() << "iptables does not work here: " << reason;
        installPlatformData();
        defineService("files", "tcp", R"("21", "23")");
        defineService("names", "tcp+udp", R"("25", "26")");
        defineService("media", "udp", R"("22-24")");
        defineService("clock", "udp", R"("701")", Side::source);
        createFirewallChains();
        for (const std::string &adapter : adapters) {
            const std::string peer = "client_" + adapter;
            addVethPair(adapter, m_client, peer);
            addAddress(adapter, network(adapter) + "1/24");
            for (const int host : hosts)
                addAddress(peer, network(adapter) + std::to_string(host) + "/24", &m_client);
            setUp(adapter);
            setUp(peer, &m_client);
        }
        std::vector<uint16_t> ports = {portWithoutRules};
        for (uint16_t port = firstPort; port <= lastPort; ++port)
            ports.push_back(port);
        m_server = std::make_unique<EchoServer>(ports);
        storeSettings(true, "p");
    }

    void TearDown() override {
        if (!HasFailure())
            return;
        for (const std::string &rule : listRules("/sbin/iptables", "INPUT_FIREWALL"))
            std::cout << rule << "\n";
    }

    /// Without established connections: a UDP probe of the profile before would count as one.
    static void apply(const FWPROFILE &profile) {
        storeProfile("1.json", profile);
        ASSERT_TRUE(VELDFW().fwReload(false));
    }

    /// @param asked adapter that is asked for, empty for all
    static FW_POLICY verdict(const Query &query, const std::string &asked) {
        std::map<std::string, FW_POLICY> verdicts;
        EXPECT_TRUE(
            VELDFW().fwPortIsBlocked({query.direct, query.protocol, std::to_string(query.port)}, asked, verdicts));
        return verdicts.at(query.adapter);
    }

    /// What happens to packets of each query.
    std::vector<FW_POLICY> observe(const std::vector<Query> &queries, std::chrono::milliseconds timeout) {
        std::vector<BatchProbe> probes;
        for (const Query &query : queries) {
            const bool bySource = query.direct == 1;
            for (const int host : hosts) {
                probes.push_back({query.protocol == FW_PROTO_UDP, network(query.adapter) + std::to_string(host),
                                  bySource ? query.port : uint16_t{0}, network(query.adapter) + "1",
                                  bySource ? portWithoutRules : query.port});
            }
        }
        const std::vector<bool> answered = probeAll(probes, m_client, timeout);
        std::vector<FW_POLICY> observed;
        const auto all = static_cast<long>(hosts.size());
        for (auto first = answered.begin(); first != answered.end(); first += all) {
            const auto through = std::count(first, first + all, true);
            observed.push_back(through == 0 ? FW_POLICY_DENY : through == all ? FW_POLICY_ALLOW : FW_POLICY_PARTIAL);
        }
        return observed;
    }

    /// A machine under load may be late: what differs is looked at again with more time.
    void expectObserved(const std::vector<Query> &queries, const std::vector<FW_POLICY> &verdicts) {
        auto observed = observe(queries, std::chrono::milliseconds(250));
        if (observed != verdicts)
            observed = observe(queries, std::chrono::seconds(3));
        for (size_t i = 0; i < queries.size(); ++i) {
            const Query &query = queries[i];
            EXPECT_EQ(observed[i], verdicts[i]) << query.adapter << (query.direct == 1 ? " source" : " destination")
                                                << " port " << query.port << " protocol " << query.protocol;
        }
    }

    NetworkNamespace m_client{"client"};
    std::unique_ptr<EchoServer> m_server;
};

TEST_F(QueryAndKernel, AgreeForGeneratedProfiles) {
    constexpr unsigned profileCount = 12;
    std::map<FW_POLICY, int> compared;
    int decidedByGlobal = 0;
    int leftOut = 0;
    for (unsigned seed = 1; seed <= profileCount && !HasFailure(); ++seed) {
        SCOPED_TRACE("seed " + std::to_string(seed));
        Generator generator(seed);
        const KnownRules globalRules = generator.list(2, "", FW_POLICY_NONE);
        std::map<std::string, KnownRules> known;
        FWPROFILE profile = {"p", {{"global", plain(globalRules)}}, {{"global", FW_POLICY_NONE}}};
        for (const std::string &adapter : adapters) {
            const FW_POLICY start = generator.chance(50) ? FW_POLICY_ALLOW : FW_POLICY_DENY;
            profile.adapterPolicyMap[adapter] = start;
            known[adapter] = generator.list(4, adapter, start);
            profile.rules[adapter] = plain(known[adapter]);
        }
        ASSERT_NO_FATAL_FAILURE(apply(profile));
        std::vector<Query> queries;
        std::vector<FW_POLICY> verdicts;
        for (const Query &query : allQueries()) {
            const bool global = concerns(globalRules, query);
            if (!(global ? isExact(globalRules, query, FW_POLICY_NONE)
                         : isExact(known[query.adapter], query, profile.adapterPolicyMap[query.adapter]))) {
                ++leftOut;
                continue;
            }
            queries.push_back(query);
            verdicts.push_back(verdict(query, query.adapter));
            EXPECT_EQ(verdict(query, ""), verdicts.back()) << query.adapter << " among all, port " << query.port;
            ++compared[verdicts.back()];
            decidedByGlobal += global ? 1 : 0;
        }
        expectObserved(queries, verdicts);
    }
    std::cout << "compared: " << compared[FW_POLICY_ALLOW] << " open, " << compared[FW_POLICY_DENY] << " blocked, "
              << compared[FW_POLICY_PARTIAL] << " partly; " << decidedByGlobal << " decided by global rules; "
              << leftOut << " left out\n";
    // The profiles must reach all verdicts, or the agreement says little.
    for (const FW_POLICY policy : {FW_POLICY_ALLOW, FW_POLICY_DENY, FW_POLICY_PARTIAL})
        EXPECT_GE(compared[policy], 40) << policy;
    EXPECT_GE(decidedByGlobal, 20);
}

/// Words of cases/leftOut.cases: "allow:2" for a host, "deny:" for all, "deny:none" for a rule without command.
std::vector<FWRULE> rulesOf(const std::string &text) {
    std::vector<FWRULE> rules;
    for (const std::string &word : split(text, ' ')) {
        const std::string host = word.substr(word.find(':') + 1);
        const bool isHost = !host.empty() && host != "none";
        const FW_POLICY policy = word[0] == 'a' ? FW_POLICY_ALLOW : FW_POLICY_DENY;
        rules.push_back(veldtest::portRule(policy, "21", isHost ? "10.1.0." + host : ""));
        if (host == "none")
            rules.back().ipGroup = FW_IP_GROUP_NONE;
    }
    return rules;
}

TEST_F(QueryAndKernel, LeftOutConstructionsDifferAsDescribed) {
    for (const auto &row : readCases(VELD_CASE_DIRECTORY "leftOut.cases", 6)) {
        SCOPED_TRACE(row[0]);
        const auto policy = [&](size_t column) { return static_cast<FW_POLICY>(std::stoi(row[column])); };
        FWPROFILE profile = {"p", {}, {{"eth0", policy(3)}, {"global", FW_POLICY_NONE}}};
        profile.rules["eth0"] = rulesOf(row[2]);
        if (!row[1].empty())
            profile.rules["global"] = rulesOf(row[1]);
        ASSERT_NO_FATAL_FAILURE(apply(profile));
        const Query query = {"eth0", 0, FW_PROTO_TCP, 21};
        EXPECT_EQ(verdict(query, "eth0"), policy(4));
        expectObserved({query}, {policy(5)});
    }
}

}  // namespace
