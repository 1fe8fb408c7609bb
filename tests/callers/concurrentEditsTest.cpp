// SPDX-License-Identifier: Apache-2.0
// Processes that edit all profiles at the same time.
#include "processes.h"
#include "storedConfiguration.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <veldfirewall/veldFW.h>

#include <algorithm>
#include <functional>

using namespace FW;
using namespace veldtest;

namespace {

constexpr int profileCount = 6;
constexpr int rounds = 60;

std::string profileName(int number) {
    return "profile " + std::to_string(number);
}

/// The reserved services of the profile; what else is in it must be as it was.
std::vector<std::string> reservedIn(const FWPROFILE &profile) {
    EXPECT_EQ(profile.rules.at("eth0").size(), 3u) << profile.name;
    const auto global = profile.rules.find("global");
    if (global == profile.rules.end())
        return {};
    EXPECT_EQ(global->second.size(), 1u) << profile.name;
    return global->second.at(0).portList;
}

TEST(ConcurrentEdits, LeaveEveryProfileReadableAndOneOfTheTwoResults) {
    for (int i = 0; i < profileCount; ++i) {
        const std::vector<FWRULE> rules(3, portRule(FW_POLICY_DENY, "80", "10.0.0.1"));
        storeProfile(std::to_string(i) + ".json", {profileName(i), {{"eth0", rules}}, {{"eth0", FW_POLICY_ALLOW}}});
    }
    storeSettings(false, profileName(0));
    using Edit = std::function<bool(VELDFW_PROFILE & profiles)>;
    const Edit edits[] = {
        [](VELDFW_PROFILE &p) { return p.profileAddServToReserve("global", "web", FW_POLICY_ALLOW, false); },
        [](VELDFW_PROFILE &p) { return p.profileRemoveServ("web"); }};
    std::vector<pid_t> editors;
    for (const Edit &edit : edits) {
        editors.push_back(startChild([&edit] {
            VELDFW_PROFILE profiles;
            int done = 0;
            while (done < rounds && edit(profiles))
                ++done;
            return done == rounds ? 0 : 1;
        }));
    }
    int seenWith = 0;
    int seenWithout = 0;
    const auto look = [&] {
        std::map<std::string, FWPROFILE> profiles;
        ASSERT_TRUE(VELDFW_PROFILE().profileEnum(profiles));
        ASSERT_EQ(profiles.size(), static_cast<size_t>(profileCount));
        for (const auto &[name, profile] : profiles) {
            const std::vector<std::string> services = reservedIn(profile);
            ASSERT_TRUE(services.empty() || services == std::vector<std::string>{"web"}) << name;
            ++(services.empty() ? seenWithout : seenWith);
        }
    };
    const auto isRunning = [](pid_t child) {
        siginfo_t state = {};
        return waitid(P_PID, static_cast<id_t>(child), &state, WEXITED | WNOHANG | WNOWAIT) == 0 && state.si_pid == 0;
    };
    while (!HasFatalFailure() && std::any_of(editors.begin(), editors.end(), isRunning))
        look();
    for (const pid_t editor : editors)
        EXPECT_EQ(waitForChild(editor), 0);
    // Otherwise the two never met, and nothing was shown.
    EXPECT_GT(seenWith, 0);
    EXPECT_GT(seenWithout, 0);
}

}  // namespace
