// SPDX-License-Identifier: Apache-2.0
// Reloads, edits, queries, a neighbour that changes rules of its own and a held lock, all at once, under both backends.
// VELD_SOAK_SECONDS (10) and VELD_SEED in the environment. Prints figures.
#include "actors.h"
#include "files.h"
#include "network.h"
#include "processes.h"
#include "realIptables.h"
#include "systemLog.h"

#include <gmock/gmock.h>
#include <sys/mman.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <iostream>
#include <map>
#include <new>
#include <random>
#include <thread>

#include "veldfirewall/veldFW.h"

using namespace veldsoak;

namespace {

constexpr long MAX_GROWTH_KILOBYTES = 2048;  // the allocator's play; a leak per round would be more

using Rules = std::vector<std::string>;

unsigned fromEnvironment(const char *name, unsigned otherwise) {
    const char *text = std::getenv(name);
    return text != nullptr ? static_cast<unsigned>(std::stoul(text)) : otherwise;
}

Rules firewallRules() {
    Rules rules;
    for (const std::string program : {"/sbin/iptables", "/sbin/ip6tables"}) {
        for (const char *chain : FW::FW_CHAINS) {
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
    EXPECT_TRUE(FW::VELDFW().fwProfileConfigGet(active) && FW::VELDFW().fwIptablesRulesEnum(active, commands, true));
    Rules rules;
    const veldtest::NetworkNamespace fresh("fresh");
    fresh.run([&] {
        veldtest::createFirewallChains();
        EXPECT_TRUE(FW::VELDFW().fwExec(commands));
        rules = firewallRules();
    });
    return rules;
}

void checkTally(const char *name, const Tally &tally) {
    std::cout << name << ": " << tally.done << ", failed " << tally.failed << "\n";
    EXPECT_GT(tally.done, 0u) << name;
    EXPECT_EQ(tally.failed, 0u) << name;
}

void checkFootprint(const char *name, const Footprint &early, const Footprint &late) {
    if (early.kilobytes == 0) {  // on a loaded machine a short run ends before the process is warm
        std::cout << "skipped: growth of " << name << ": too few rounds in this time to measure it\n";
        return;
    }
    std::cout << name << " holds " << early.descriptors << " descriptors and " << early.kilobytes
              << " kB after its start, " << late.descriptors << " and " << late.kilobytes << " kB at the end\n";
    EXPECT_EQ(late.descriptors, early.descriptors);
    EXPECT_LE(late.kilobytes - early.kilobytes, MAX_GROWTH_KILOBYTES);
}

void checkEnd(const Shared &shared) {
    checkTally("specified reloads", shared.specifiedReloads);
    checkTally("atomic reloads", shared.atomicReloads);
    checkTally("edits", shared.edits);
    std::cout << "deleted profiles that an edit of all profiles had read before and wrote again: "
              << shared.profilesBroughtBack << "\n";
    checkTally("queries", shared.queries);
    checkTally("neighbour's commands", shared.neighbourSteps);
    checkTally("times the lock was held", shared.heldLocks);
    checkFootprint("the reloading process", shared.reloaderEarly, shared.reloaderLate);
    checkFootprint("the querying process", shared.querierEarly, shared.querierLate);

    const std::string noted = veldtest::readFile(NEIGHBOUR_RULES);
    EXPECT_FALSE(noted.empty());
    EXPECT_EQ(neighbourRules(), noted);
    bool enabled = false;
    EXPECT_TRUE(FW::VELDFW().fwStatus(enabled) && enabled);
    for (const std::string program : {"/sbin/iptables", "/sbin/ip6tables"}) {
        EXPECT_EQ(veldtest::listRules(program, "INPUT").at(0), "-P INPUT ACCEPT") << program;
        EXPECT_EQ(veldtest::listRules(program, "FORWARD").at(0), "-P FORWARD ACCEPT") << program;
    }
    std::map<std::string, FW::FWPROFILE> profiles;
    EXPECT_TRUE(FW::VELDFW_PROFILE().profileEnum(profiles));
    EXPECT_GE(profiles.size(), static_cast<size_t>(PROFILES));

    const Rules planned = plannedRules();
    EXPECT_TRUE(FW::VELDFW().fwReload(true));
    EXPECT_EQ(firewallRules(), planned);
    EXPECT_TRUE(FW::VELDFW().fwReloadAtomic(true));
    EXPECT_EQ(firewallRules(), planned);
    EXPECT_EQ(neighbourRules(), noted);
}

class Soak : public testing::TestWithParam<const char *> {};

TEST_P(Soak, LeavesRulesAndProfilesAsTheyShouldBe) {
    veldtest::SystemLog log;
    std::string reason;
    if (!veldtest::useIptablesBackend(GetParam()) || !veldtest::realIptables(&reason)) {
        GTEST_SKIP() << "iptables-" << GetParam() << " does not work here: " << reason;
    }
    const std::chrono::seconds time(fromEnvironment("VELD_SOAK_SECONDS", 10));
    unsigned seed = fromEnvironment("VELD_SEED", std::random_device()() % 1000000);
    std::cout << time.count() << " s, seed " << seed << std::endl;
    worldPrepare(seed);
    veldtest::createFirewallChains();
    void *memory = mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    auto &shared = *new (memory) Shared();
    std::vector<pid_t> actors;
    for (const auto &actor : {reload, edit, edit, query, neighbour, holdLock}) {
        ++seed;
        actors.push_back(veldtest::startChild([&shared, actor, seed] { return actor(shared, seed); }));
    }
    std::this_thread::sleep_for(time);
    shared.stop = true;
    for (const pid_t actor : actors) {
        EXPECT_EQ(veldtest::waitForChild(actor), 0);
    }
    checkEnd(shared);
    munmap(memory, sizeof(Shared));
    if (HasFailure()) {
        const std::string text = log.text();
        std::cout << "end of the system log:\n" << text.substr(text.size() - std::min<size_t>(text.size(), 4000));
    }
}

INSTANTIATE_TEST_SUITE_P(Backend, Soak, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
