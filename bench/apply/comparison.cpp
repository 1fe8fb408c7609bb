// SPDX-License-Identifier: Apache-2.0
// All ways of applying a profile side by side, and a hundred atomic reloads as clients see them.
#include "comparison.h"

#include "applyWay.h"
#include "otherFirewalls.h"
#include "realIptables.h"
#include "windowProbe.h"

#include <algorithm>
#include <cstdio>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <stdexcept>

#include "fw/commandList.h"

namespace veldbench {

namespace {

constexpr double SLOW_MILLISECONDS = 2000;
constexpr size_t RULES_OF_BARS = 1000;  // below, the start of the programs is most of the time

struct WayResult {
    std::string name;
    const ProbedHost *host = nullptr;
    std::function<void()> check;  ///< throws when the kernel does not hold what the way should have put there
    std::function<long()> daemonPeak = [] { return 0L; };
    std::vector<double> times = {};
    std::vector<double> processorTimes = {};
    long peakKilobytes = 0;
    std::optional<WindowResult> window = {};
};

double median(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    return values[values.size() / 2];
}

std::vector<std::string> rulesIn(const ProbedHost &host) {
    std::vector<std::string> rules;
    host.host.run([&] {
        for (const std::string program : {FW::IPTABLES_PROGRAM, FW::IP6TABLES_PROGRAM}) {
            const std::vector<std::string> ofFamily = veldtest::listRules(program);
            rules.insert(rules.end(), ofFamily.begin(), ofFamily.end());
        }
    });
    return rules;
}

/// The first way tells what the others must leave as well.
std::function<void()> sameRules(const ProbedHost &host, std::vector<std::string> &expected) {
    return [&host, &expected] {
        const std::vector<std::string> rules = rulesIn(host);
        if (expected.empty()) {
            expected = rules;
        }
        if (rules != expected) {
            std::string text = "the ways do not leave the same rules; now:\n";
            for (const std::string &rule : rules) {
                text += rule + "\n";
            }
            throw std::runtime_error(text);
        }
    };
}

void runOnce(WayResult &way) {
    const ApplyCost cost = applyIn(way.host->host, way.name);
    way.times.push_back(cost.milliseconds);
    way.processorTimes.push_back(cost.processorMilliseconds);
    way.peakKilobytes = std::max({way.peakKilobytes, cost.peakKilobytes, way.daemonPeak()});
    way.check();
}

/// Whether it changes the kernel's rules one by one. The kernel is busy for a while afterwards.
bool isOneByOne(const WayResult &way) {
    return way.name == SPECIFIED_RELOAD || way.name == PROCESS_LOOP;
}

/// In turn, back and forth, so that a slow minute of the machine hits all ways; those that go rule by rule on their
/// own.
void measureTimes(std::vector<WayResult> &ways, const ComparisonPlan &plan) {
    for (const bool oneByOne : {false, true}) {
        for (int round = 0; round < plan.rounds; ++round) {
            for (size_t i = 0; i < ways.size(); ++i) {
                WayResult &way = ways[round % 2 == 0 ? i : ways.size() - 1 - i];
                if (isOneByOne(way) == oneByOne && (round < plan.slowRounds || way.times.back() < SLOW_MILLISECONDS)) {
                    runOnce(way);
                }
            }
        }
    }
}

void measureWindow(WayResult &way) {
    WindowProbe probe(*way.host);
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
    applyIn(way.host->host, way.name);
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
    way.window = probe.stop();
}

Json::Value windowDocument(const WindowResult &window) {
    Json::Value document;
    document["probes"] = Json::UInt64(window.ticks);
    document["intervalMs"] = window.interval;
    document["longestIntervalMs"] = window.longestInterval;
    document["windowMs"] = window.window;
    document["allowedLost"] = Json::UInt64(window.allowedLost);
    document["deniedPassed"] = Json::UInt64(window.deniedPassed);
    document["transferRetransmissions"] = Json::UInt64(window.retransmissions);
    document["transferLongestGapMs"] = window.longestGap;
    return document;
}

Json::Value wayDocument(const WayResult &way) {
    Json::Value document;
    document["way"] = way.name;
    document["medianMs"] = median(way.times);
    document["processorMs"] = median(way.processorTimes);
    document["runs"] = Json::UInt64(way.times.size());
    document["peakKilobytes"] = Json::Int64(way.peakKilobytes);
    if (way.window) {
        document["probe"] = windowDocument(*way.window);
    }
    return document;
}

void print(const WayResult &way) {
    std::printf("  %-24s %4zu runs %10.1f ms (processor %8.1f ms) %8.1f MB", way.name.c_str(), way.times.size(),
                median(way.times), median(way.processorTimes), static_cast<double>(way.peakKilobytes) / 1024);
    if (way.window) {
        std::printf("   closed %9.1f ms, %6llu lost, %5llu denied passed", way.window->window,
                    static_cast<unsigned long long>(way.window->allowedLost),
                    static_cast<unsigned long long>(way.window->deniedPassed));
    }
    std::printf("\n");
    std::fflush(stdout);
}

struct Bar {
    const char *text;
    double figure;
    bool met;
};

/// Median of the rounds' ratios, of the rounds that all of the ways were run in.
double medianRatio(const std::vector<const WayResult *> &over, const std::vector<const WayResult *> &under) {
    size_t rounds = over.front()->times.size();
    for (const WayResult *way : over) {
        rounds = std::min(rounds, way->times.size());
    }
    for (const WayResult *way : under) {
        rounds = std::min(rounds, way->times.size());
    }
    const auto sum = [](const std::vector<const WayResult *> &ways, size_t round) {
        double time = 0;
        for (const WayResult *way : ways) {
            time += way->times[round];
        }
        return time;
    };
    std::vector<double> ratios;
    for (size_t round = 0; round < rounds; ++round) {
        ratios.push_back(sum(over, round) / sum(under, round));
    }
    return median(ratios);
}

/// The bars, as far as their ways were measured.
std::vector<Bar> barsOf(const std::vector<WayResult> &ways) {
    std::map<std::string, const WayResult *> named;
    for (const WayResult &way : ways) {
        named[way.name] = &way;
    }
    const WayResult *atomic = named.at(ATOMIC_RELOAD);
    const double restore = medianRatio({atomic}, {named.at(BARE_RESTORE), named.at(LOAD)});
    std::vector<Bar> bars = {{"atomic reload / (bare restore + profile load) <= 1.5", restore, restore <= 1.5}};
    if (named.count(FIREWALLD_RELOAD) != 0) {
        const double ratio = medianRatio({named[FIREWALLD_RELOAD]}, {atomic});
        bars.push_back({"firewall-cmd --reload / atomic reload >= 10", ratio, ratio >= 10});
    }
    if (named.count(UFW_RELOAD) != 0) {
        const double ratio = medianRatio({named[UFW_RELOAD]}, {atomic});
        bars.push_back({"ufw reload / atomic reload >= 20", ratio, ratio >= 20});
    }
    return bars;
}

Json::Value compareAt(const ComparisonPlan &plan, const std::string &backend, size_t size) {
    const ProbedHost own("own");
    own.host.run([] { veldtest::createFirewallChains(); });
    const size_t kernelRules = profilePrepare(own.host, size);
    std::printf("\n%s, %zu profile rules, %zu kernel rules\n", backend.c_str(), size, kernelRules);

    std::vector<std::string> expected;
    std::vector<WayResult> ways;
    ways.push_back({LOAD, &own, [] {}});
    for (const char *way : {BARE_RESTORE, ATOMIC_RELOAD, SPECIFIED_RELOAD, PROCESS_LOOP}) {
        ways.push_back({way, &own, sameRules(own, expected)});
        if (!plan.oneByOne && isOneByOne(ways.back())) {
            ways.pop_back();
        }
    }
    std::unique_ptr<ProbedHost> ufwHost;
    std::unique_ptr<Ufw> ufw;
    if (const std::string reason = Ufw::unavailable(); reason.empty()) {
        ufwHost = std::make_unique<ProbedHost>("ufw");
        ufw = std::make_unique<Ufw>(ufwHost->host, kernelRules);
        ways.push_back({UFW_RELOAD, ufwHost.get(), [&] { ufw->check(); }});
    } else {
        std::printf("  %-24s skipped: %s\n", UFW_RELOAD, reason.c_str());
    }
    std::unique_ptr<ProbedHost> firewalldHost;
    std::unique_ptr<Firewalld> firewalld;
    if (const std::string reason = Firewalld::unavailable(); reason.empty()) {
        firewalldHost = std::make_unique<ProbedHost>("firewalld");
        firewalld = std::make_unique<Firewalld>(firewalldHost->host, kernelRules, backend);
        ways.push_back({FIREWALLD_RELOAD, firewalldHost.get(), [&] { firewalld->check(); },
                        [&] { return firewalld->peakKilobytes(); }});
    } else {
        std::printf("  %-24s skipped: %s\n", FIREWALLD_RELOAD, reason.c_str());
    }

    measureTimes(ways, plan);
    Json::Value document;
    document["backend"] = backend;
    document["profileRules"] = Json::UInt64(size);
    document["kernelRules"] = Json::UInt64(kernelRules);
    for (WayResult &way : ways) {
        if (way.name != LOAD) {
            measureWindow(way);
        }
        print(way);
        document["ways"].append(wayDocument(way));
    }
    for (const Bar &bar : barsOf(ways)) {
        std::printf("  %-56s %8.2f  %s\n", bar.text, bar.figure,
                    size < RULES_OF_BARS ? ""
                    : bar.met            ? "met"
                                         : "NOT MET");
        document["bars"][bar.text] = bar.figure;
    }
    std::fflush(stdout);
    return document;
}

/// The reloads happen in `reloaded`, clients look at `probed`.
WindowResult probeReloads(const ProbedHost &probed, const ProbedHost &reloaded, int reloads) {
    applyIn(probed.host, ATOMIC_RELOAD);
    WindowProbe probe(probed);
    for (int i = 0; i < reloads; ++i) {
        applyIn(reloaded.host, ATOMIC_RELOAD);
    }
    return probe.stop();
}

void print(const char *title, const WindowResult &result) {
    std::printf("  %-26s %8llu probes every %.2f ms (longest %.1f), %llu lost, %llu denied passed; transfer: "
                "%llu retransmissions, longest gap %.1f ms\n",
                title, static_cast<unsigned long long>(result.ticks), result.interval, result.longestInterval,
                static_cast<unsigned long long>(result.allowedLost),
                static_cast<unsigned long long>(result.deniedPassed),
                static_cast<unsigned long long>(result.retransmissions), result.longestGap);
    std::fflush(stdout);
}

/// Beside the same reloads in another namespace, so that the machine is as busy.
Json::Value continuity(const ComparisonPlan &plan, const std::string &backend) {
    const ProbedHost own("own");
    const ProbedHost other("other");
    for (const ProbedHost *host : {&own, &other}) {
        host->host.run([] { veldtest::createFirewallChains(); });
    }
    profilePrepare(own.host, plan.continuityRules);
    std::printf("\n%s, %d atomic reloads of %zu profile rules\n", backend.c_str(), plan.continuityReloads,
                plan.continuityRules);
    Json::Value document;
    document["backend"] = backend;
    document["profileRules"] = Json::UInt64(plan.continuityRules);
    document["reloads"] = plan.continuityReloads;
    const WindowResult elsewhere = probeReloads(own, other, plan.continuityReloads);
    print("reloads elsewhere", elsewhere);
    document["elsewhere"] = windowDocument(elsewhere);
    const WindowResult here = probeReloads(own, own, plan.continuityReloads);
    print("reloads here", here);
    document["here"] = windowDocument(here);
    return document;
}

}  // namespace

Json::Value compare(const ComparisonPlan &plan) {
    Json::Value document;
    for (const std::string &backend : plan.backends) {
        if (!veldtest::useIptablesBackend(backend)) {
            std::printf("\n%s: skipped: the machine does not have that iptables\n", backend.c_str());
            continue;
        }
        for (const size_t size : plan.sizes) {
            document["comparisons"].append(compareAt(plan, backend, size));
        }
        if (plan.continuityReloads > 0) {
            document["continuity"].append(continuity(plan, backend));
        }
    }
    return document;
}

}  // namespace veldbench
