// SPDX-License-Identifier: Apache-2.0
// What the tool plans and finds in the kernel, over generated profiles and both kinds of iptables.
#include <gmock/gmock.h>
#include <veldfirewall/veldFW.h>

#include <algorithm>
#include <iostream>
#include <regex>

#include "caseTable.h"
#include "commandRecorder.h"
#include "files.h"
#include "network.h"
#include "profileGenerator.h"
#include "realIptables.h"
#include "toolFixture.h"

namespace veldtest {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

void store(const FW::FWPROFILE &profile) {
    ASSERT_TRUE(FW::VELDFW_PROFILE().profileSet("default", profile));
}

TEST_F(ToolTest, ThePlanIsWhatAnApplicationRuns) {
    addDummyInterface("eth1");
    CommandRecorder recorder;
    for (unsigned seed = 1; seed <= 5; ++seed) {
        SCOPED_TRACE(seed);
        store(ProfileGenerator(seed).profile("default", 6));
        recorder.clear();
        ASSERT_EQ(0, runTool({"enable"}).status);
        // Policies of the built-in chains, then the flushes, before; policies after.
        std::vector<std::string> appends = recorder.lines();
        ASSERT_GT(appends.size(), 8u + 18u + 4u);
        appends = {appends.begin() + 8, appends.end() - 4};
        std::vector<std::string> planned;
        for (const std::string &line : split(runTool({"plan"}).output, '\n')) {
            if (line[0] != '#') {  // the program gets no empty arguments
                planned.push_back(std::regex_replace(line, std::regex(" +"), " "));
            }
        }
        EXPECT_EQ(appends, planned);
    }
}

class DriftOnKernel : public ToolTest, public testing::WithParamInterface<const char *> {
protected:
    void SetUp() override {
        if (!useIptablesBackend(GetParam())) {
            GTEST_SKIP() << "no iptables-" << GetParam();
        }
        std::string reason;
        if (!realIptables(&reason)) {
            GTEST_SKIP() << reason;
        }
        ToolTest::SetUp();
        addDummyInterface("eth1");
        createFirewallChains();
    }
    static std::vector<std::string> drifts() {
        const ProgramResult result = runTool({"diff", "--json"});
        const Json::Value json = parseJson(result.output);
        std::vector<std::string> found;
        for (const Json::Value &drift : json["drift"]) {
            found.push_back(drift["kind"].asString() + " " + drift["family"].asString() + " " +
                            drift["rule"].asString());
        }
        EXPECT_EQ(found.empty() ? 0 : 1, result.status) << result.errors;
        return found;
    }
};

TEST_P(DriftOnKernel, NothingDiffersAfterAnApplicationAndEverySingleChangeIsFound) {
    int changes = 0;
    for (unsigned seed = 1; seed <= 8 && !HasFailure(); ++seed) {
        SCOPED_TRACE(seed);
        ProfileGenerator generator(seed);
        store(generator.profile("default", 7));
        const ProgramResult applied = runTool({"enable"});
        ASSERT_EQ(0, applied.status) << applied.errors;
        ASSERT_THAT(drifts(), ElementsAre());

        for (const std::string chain : {"INPUT_FIREWALL", "FORWARD_FIREWALL"}) {
            const bool isV6 = generator.chance(50);
            const std::string program = isV6 ? "/sbin/ip6tables" : "/sbin/iptables";
            const std::string family = isV6 ? "IPv6 " : "IPv4 ";
            std::vector<std::string> rules = listRules(program, chain);
            rules.erase(rules.begin());  // "-N"
            const int number = 1 + generator.below(static_cast<int>(rules.size()));
            const std::string rule = rules[static_cast<size_t>(number) - 1];
            std::vector<std::string> words = split(rule.substr(rule.find(' ', 3) + 1), ' ');
            const auto change = [&](const std::vector<std::string> &what, const std::vector<std::string> &match) {
                std::vector<std::string> command = {program};
                command.insert(command.end(), what.begin(), what.end());
                command.insert(command.end(), match.begin(), match.end());
                runChecked(command);
                ++changes;
            };
            change({"-D", chain, std::to_string(number)}, {});
            EXPECT_THAT(drifts(), ElementsAre("missing " + family + rule));
            change({"-I", chain, std::to_string(number)}, words);
            ASSERT_THAT(drifts(), ElementsAre());

            change({"-I", chain, std::to_string(number)}, {"-p", "tcp", "--dport", "9999", "-j", "ACCEPT"});
            EXPECT_THAT(drifts(),
                        ElementsAre("foreign " + family + "-A " + chain + " -p tcp -m tcp --dport 9999 -j ACCEPT"));
            change({"-D", chain, std::to_string(number)}, {});

            // Equal rules, one after the other, are in the same order wherever they are put.
            const auto place = std::find_if(rules.begin() + number, rules.end(),
                                            [&](const std::string &other) { return other != rule; });
            if (std::count(rules.begin(), rules.end(), rule) == 1 && place != rules.end()) {
                change({"-A", chain}, words);
                change({"-D", chain, std::to_string(number)}, {});
                // Of two neighbours that changed places either can be the one that moved.
                EXPECT_THAT(drifts(),
                            ElementsAre(testing::AnyOf("moved " + family + rule, "moved " + family + rules.back())));
            }
            ASSERT_EQ(0, runTool({"reload"}).status);
        }
    }
    std::cout << changes << " changes found\n";
    ASSERT_EQ(0, runTool({"disable"}).status);
    EXPECT_THAT(drifts(), ElementsAre());
    runChecked({"/sbin/iptables", "-A", "FORWARD_FIREWALL", "-j", "DROP"});
    EXPECT_THAT(runTool({"diff"}).output, HasSubstr("+ foreign IPv4 -A FORWARD_FIREWALL -j DROP"));
}

TEST_P(DriftOnKernel, ARestoreOfThePlanIsAnApplication) {
    store(ProfileGenerator(3).profile("default", 7));
    ASSERT_EQ(0, runTool({"enable"}).status);
    for (const std::string family : {"v4", "v6"}) {
        const std::string program = family == "v4" ? "/sbin/iptables" : "/sbin/ip6tables";
        runChecked({program, "-F", "INPUT_FIREWALL"});
        writeFile("/tmp/restore", runTool({"plan", "--restore", family}).output);
        runChecked({"/bin/sh", "-c", program + "-" + GetParam() + "-restore --noflush < /tmp/restore"});
    }
    EXPECT_THAT(drifts(), ElementsAre());
}

INSTANTIATE_TEST_SUITE_P(Backends, DriftOnKernel, testing::Values("nft", "legacy"),
                         [](const auto &backend) { return std::string(backend.param); });

}  // namespace
}  // namespace veldtest
