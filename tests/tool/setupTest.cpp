// SPDX-License-Identifier: Apache-2.0
// "setup" on an empty machine, on one that is set up, and on ones that others have been at.
#include <gmock/gmock.h>

#include "files.h"
#include "model/chainSetup.h"
#include "realIptables.h"
#include "toolFixture.h"

namespace veldtest {

namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::Not;

const std::vector<std::string> PROGRAMS = {"/sbin/iptables", "/sbin/ip6tables"};

TEST(ChainPlanTest, FindsEveryLackAndMendsItInOneTransaction) {
    const struct {
        std::string listing;
        std::string lack;  // of the jump from INPUT
        std::string input;
    } cases[] = {
        {"-A INPUT -j INPUT_FIREWALL\n-A INPUT -j ACCEPT\n", "", ""},
        {"-A INPUT -j ACCEPT\n", "missing", "-I INPUT 1 -j INPUT_FIREWALL\n"},
        {"-A INPUT -j ACCEPT\n-A INPUT -j INPUT_FIREWALL\n", "at position 2",
         "-D INPUT -j INPUT_FIREWALL\n-I INPUT 1 -j INPUT_FIREWALL\n"},
        {"-A INPUT -i eth0 -m comment --comment \"a b\" -j INPUT_FIREWALL\n", "with conditions",
         "-D INPUT -i eth0 -m comment --comment \"a b\" -j INPUT_FIREWALL\n-I INPUT 1 -j INPUT_FIREWALL\n"},
        {"-A INPUT -j INPUT_FIREWALL\n-A INPUT -g INPUT_FIREWALL\n", "2 times",
         "-D INPUT -j INPUT_FIREWALL\n-D INPUT -g INPUT_FIREWALL\n-I INPUT 1 -j INPUT_FIREWALL\n"},
        {"-A INPUT -j MY_INPUT_FIREWALL\n-A INPUT_X -j INPUT_FIREWALL\n", "missing", "-I INPUT 1 -j INPUT_FIREWALL\n"},
    };
    const std::string rest =
        "-P INPUT ACCEPT\n-N INPUT_FIREWALL\n-N FORWARD_FIREWALL\n-A FORWARD -j FORWARD_FIREWALL\n";
    for (const auto &item : cases) {
        const veldfwctl::ChainPlan plan = veldfwctl::chainPlanMake(rest + item.listing);
        EXPECT_EQ(item.lack, plan.items[1].lack) << item.listing;
        EXPECT_EQ(item.input.empty() ? "" : "*filter\n" + item.input + "COMMIT\n", plan.restoreInput);
    }
    EXPECT_EQ("*filter\n-N INPUT_FIREWALL\n-N FORWARD_FIREWALL\n-I INPUT 1 -j INPUT_FIREWALL\n"
              "-I FORWARD 1 -j FORWARD_FIREWALL\nCOMMIT\n",
              veldfwctl::chainPlanMake("").restoreInput);
}

class SetupTest : public ToolTest {
protected:
    void SetUp() override {
        std::string reason;
        if (!realIptables(&reason)) {
            GTEST_SKIP() << reason;
        }
        ToolTest::SetUp();
        removeAll("/usr/veld/etc/firewall.d");
        removeAll("/var/lock/firewall");
        writeFile("/usr/veld/etc.defaults/firewall.d/1.json",
                  readFile(std::string(VELD_DATA_DIR) + "/firewall.d/1.json"));
    }
};

TEST_F(SetupTest, AnEmptyMachineIsReadyAfterOneRunAndTheSecondChangesNothing) {
    for (const std::string backend : {"nft", "legacy"}) {
        if (!useIptablesBackend(backend)) {
            std::cout << "no iptables of backend " << backend << "\n";
            continue;
        }
        const ProgramResult first = runTool({"setup"});
        EXPECT_EQ(0, first.status) << first.output << first.errors;
        EXPECT_THAT(first.output, HasSubstr("IPv6 jump from FORWARD to FORWARD_FIREWALL\tdone\tcreated"));
        const ProgramResult second = runTool({"setup"});
        EXPECT_EQ(0, second.status) << second.errors;
        EXPECT_THAT(second.output, Not(HasSubstr("\tdone")));
        EXPECT_EQ(0, runTool({"enable"}).status);
        EXPECT_EQ(0, runTool({"disable"}).status);
    }
}

TEST_F(SetupTest, AStoredProfileAndForeignRulesStay) {
    writeFile("/usr/veld/etc/firewall.d/7.json", R"({"name": "default", "adapterPolicyMap": null, "rules": null})");
    for (const std::string &program : PROGRAMS) {
        runChecked({program, "-N", "INPUT_FIREWALL"});
        runChecked({program, "-A", "INPUT_FIREWALL", "-s", program == PROGRAMS[0] ? "192.0.2.1" : "2001:db8::1", "-j",
                    "DROP"});
        runChecked({program, "-A", "INPUT", "-p", "tcp", "-j", "ACCEPT"});
        runChecked({program, "-A", "INPUT", "-j", "INPUT_FIREWALL"});
        runChecked({program, "-A", "INPUT", "-i", "eth0", "-j", "INPUT_FIREWALL"});
    }
    const ProgramResult result = runTool({"setup"});
    EXPECT_EQ(0, result.status) << result.output << result.errors;
    EXPECT_THAT(listDirectory("/usr/veld/etc/firewall.d"), ElementsAre("7.json", "firewall_settings.json"));
    for (const std::string &program : PROGRAMS) {
        EXPECT_THAT(listRules(program, "INPUT"),
                    ElementsAre("-P INPUT ACCEPT", "-A INPUT -j INPUT_FIREWALL", "-A INPUT -p tcp -j ACCEPT"));
        EXPECT_EQ(2u, listRules(program, "INPUT_FIREWALL").size());
    }
}

TEST_F(SetupTest, WhatCannotBeDoneIsNamedAndTheRestIsDone) {
    writeFile("/usr/veld/etc/firewall.d", "a file in the place of the directory");
    const ProgramResult result = runTool({"setup", "--json"});
    EXPECT_EQ(3, result.status);
    EXPECT_THAT(result.errors, HasSubstr("could not be set up"));
    std::map<std::string, std::string> states;
    for (const Json::Value &item : parseJson(result.output)) {
        states[item["item"].asString()] = item["state"].asString();
    }
    EXPECT_EQ("failed", states["directory /usr/veld/etc/firewall.d"]);
    EXPECT_EQ("failed", states["profiles in /usr/veld/etc/firewall.d"]);
    EXPECT_EQ("done", states["IPv4 chain INPUT_FIREWALL"]);
}

}  // namespace

}  // namespace veldtest
