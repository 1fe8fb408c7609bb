// SPDX-License-Identifier: Apache-2.0
// Reloads, edits, queries, a neighbour that changes rules of its own and a held lock, all at once, under both backends.
//
//   veld_soak [--seconds=N] [--seed=N]
//
// Prints figures; exit status 1 when anything failed, was lost or grew.
#include "actors.h"
#include "files.h"
#include "network.h"
#include "processes.h"
#include "realIptables.h"
#include "sandbox.h"
#include "systemLog.h"

#include <sys/mman.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <functional>
#include <map>
#include <new>
#include <random>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "veldfirewall/veldFW.h"

using namespace veldsoak;

namespace {

constexpr long MAX_GROWTH_KILOBYTES = 2048;  // the allocator's play; a leak per round would be more

int faults = 0;

void expect(bool holds, const std::string &what) {
    std::printf("  %-6s %s\n", holds ? "ok" : "FAULT", what.c_str());
    faults += holds ? 0 : 1;
}

using Rules = std::vector<std::string>;

Rules firewallRules() {
    Rules rules;
    for (const std::string program : {"/sbin/iptables", "/sbin/ip6tables"}) {
        for (const char *chain : {FW::FW_CHAIN_INPUT, FW::FW_CHAIN_FORWARD}) {
            for (const std::string &rule : veldtest::listRules(program, chain)) {
                rules.push_back(program + " " + rule);
            }
        }
    }
    return rules;
}

/// The rules that a machine has on which nothing but the commands of the active profile was ever run, one by one.
Rules plannedRules() {
    std::string active;
    Json::Value commands;
    if (!FW::VELDFW().fwProfileConfigGet(active) || !FW::VELDFW().fwIptablesRulesEnum(active, commands, true)) {
        throw std::runtime_error("the active profile cannot be translated");
    }
    Rules rules;
    const veldtest::NetworkNamespace fresh("fresh");
    fresh.run([&] {
        veldtest::createFirewallChains();
        if (!FW::VELDFW().fwExec(commands)) {
            throw std::runtime_error("fwExec() failed");
        }
        rules = firewallRules();
    });
    return rules;
}

void expectSameRules(const Rules &live, const Rules &planned, const std::string &when) {
    expect(live == planned, when + " the live rules equal the plan: " + std::to_string(live.size()) + " lines");
    if (live == planned) {
        return;
    }
    const auto [at, other] = std::mismatch(live.begin(), live.end(), planned.begin(), planned.end());
    std::printf("         live: %s\n         plan: %s\n", at == live.end() ? "(end)" : at->c_str(),
                other == planned.end() ? "(end)" : other->c_str());
}

void printTally(const char *name, const Tally &tally) {
    expect(tally.done > 0 && tally.failed == 0,
           std::string(name) + ": " + std::to_string(tally.done) + ", failed " + std::to_string(tally.failed));
}

void printFootprint(const char *name, const Footprint &early, const Footprint &late) {
    if (early.kilobytes == 0) {  // on a loaded machine a short run ends before the process is warm
        std::printf("  skip   growth of %s: too few rounds in this time to measure it\n", name);
        return;
    }
    std::ostringstream text;
    text << name << " holds " << early.descriptors << " descriptors and " << early.kilobytes << " kB after its start, "
         << late.descriptors << " and " << late.kilobytes << " kB at the end";
    expect(late.descriptors == early.descriptors && late.kilobytes - early.kilobytes <= MAX_GROWTH_KILOBYTES,
           text.str());
}

void checkEnd(const Shared &shared) {
    printTally("specified reloads", shared.specifiedReloads);
    printTally("atomic reloads", shared.atomicReloads);
    printTally("edits", shared.edits);
    std::printf("         deleted profiles that an edit of all profiles had read before and wrote again: %lu\n",
                shared.profilesBroughtBack.load());
    printTally("queries", shared.queries);
    printTally("neighbour's commands", shared.neighbourSteps);
    printTally("times the lock was held", shared.heldLocks);
    printFootprint("the reloading process", shared.reloaderEarly, shared.reloaderLate);
    printFootprint("the querying process", shared.querierEarly, shared.querierLate);

    const std::string noted = veldtest::readFile(NEIGHBOUR_RULES);
    expect(!noted.empty() && neighbourRules() == noted,
           "the neighbour's " + std::to_string(std::count(noted.begin(), noted.end(), '\n')) +
               " chains and rules are those that it left");
    bool enabled = false;
    expect(FW::VELDFW().fwStatus(enabled) && enabled, "the firewall is switched on");
    for (const std::string program : {"/sbin/iptables", "/sbin/ip6tables"}) {
        for (const char *chain : {"INPUT", "FORWARD"}) {
            const std::string policy = veldtest::listRules(program, chain).at(0);
            expect(policy == std::string("-P ") + chain + " ACCEPT", program + " has \"" + policy + "\"");
        }
    }
    std::map<std::string, FW::FWPROFILE> profiles;
    const bool readable = FW::VELDFW_PROFILE().profileEnum(profiles) && profiles.size() >= PROFILES;
    expect(readable, "all " + std::to_string(profiles.size()) + " profiles are readable");

    const Rules planned = plannedRules();
    expect(FW::VELDFW().fwReload(true), "a last specified reload");
    expectSameRules(firewallRules(), planned, "after it");
    expect(FW::VELDFW().fwReloadAtomic(true), "a last atomic reload");
    expectSameRules(firewallRules(), planned, "after it");
    expect(neighbourRules() == noted, "and the neighbour still has its own");
}

void soak(const std::string &backend, std::chrono::seconds time, unsigned seed) {
    std::printf("\n%s, %lld s, seed %u\n", backend.c_str(), static_cast<long long>(time.count()), seed);
    std::fflush(stdout);
    worldPrepare(seed);
    veldtest::createFirewallChains();
    void *memory = mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    auto &shared = *new (memory) Shared();

    std::vector<pid_t> actors;
    unsigned actorSeed = seed;
    for (const auto &actor : {reload, edit, edit, query, neighbour, holdLock}) {
        ++actorSeed;
        actors.push_back(veldtest::startChild([&shared, actor, actorSeed] { return actor(shared, actorSeed); }));
    }
    std::this_thread::sleep_for(time);
    shared.stop = true;
    for (const pid_t actor : actors) {
        const int status = veldtest::waitForChild(actor);
        if (status != 0) {
            expect(false, "an actor ended with status " + std::to_string(status));
        }
    }
    checkEnd(shared);
    munmap(memory, sizeof(Shared));
}

int soakAll(std::chrono::seconds time, unsigned seed) {
    veldtest::SystemLog log;
    std::string reason;
    if (!veldtest::realIptables(&reason)) {
        std::printf("skipped: no working iptables: %s\n", reason.c_str());
        return std::getenv("CI") != nullptr ? 1 : 0;
    }
    for (const std::string backend : {"nft", "legacy"}) {
        if (!veldtest::useIptablesBackend(backend)) {
            std::printf("\n%s: skipped: the machine does not have that iptables\n", backend.c_str());
            continue;
        }
        // A process and a network of its own, so that one backend's rules are not the other's.
        const int status = veldtest::runInChild([&] {
            veldtest::removeAll("/usr/veld/etc");
            const veldtest::NetworkNamespace network(backend);
            network.run([&] { soak(backend, time / 2, seed); });
            return faults;
        });
        faults += status;
    }
    std::printf("\n%d faults\n", faults);
    if (faults != 0) {
        const std::string text = log.text();
        std::printf("end of the system log:\n%s\n",
                    text.substr(text.size() - std::min<size_t>(text.size(), 4000)).c_str());
    }
    return faults == 0 ? 0 : 1;
}

}  // namespace

int main(int argc, char **argv) {
    int seconds = 240;
    unsigned seed = std::random_device()() % 1000000;
    for (int i = 1; i < argc; ++i) {
        const bool read =
            std::sscanf(argv[i], "--seconds=%d", &seconds) == 1 || std::sscanf(argv[i], "--seed=%u", &seed) == 1;
        if (!read || seconds < 2) {
            std::fprintf(stderr, "usage: %s [--seconds=N] [--seed=N]\n", argv[0]);
            return 2;
        }
    }
    return veldtest::runInSandbox(
        [&] {
            try {
                return soakAll(std::chrono::seconds(seconds), seed);
            } catch (const std::exception &error) {
                std::printf("%s\n", error.what());
                return 1;
            }
        },
        [](const std::string &reason) {
            std::printf("skipped: no sandbox: %s\n", reason.c_str());
            return std::getenv("CI") != nullptr ? 1 : 0;
        });
}
