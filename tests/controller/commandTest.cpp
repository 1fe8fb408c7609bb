// SPDX-License-Identifier: Apache-2.0
// Running one command and a command list: limits, order, the stop at a failure, what the log says.
#include <sstream>

#include "commandRecorder.h"
#include "firewallTest.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

class Command : public FirewallTest {
protected:
    CommandRecorder recorder;
};

// Where the limits lie, and how a line is split, the fuzz target knows.
TEST_F(Command, IsRunWithItsArgumentsOrRefusedWithAReason) {
    EXPECT_TRUE(firewall.cmdExec("/sbin/iptables  -A  \"a\tb  c\"\n"));
    EXPECT_THAT(recorder.commands().at(0).arguments, ElementsAre("-A", "\"a\tb", "c\"\n"));
    EXPECT_THAT(recorder.commands().at(0).program, "/sbin/iptables");
    EXPECT_TRUE(errors().empty());
    std::string of255Arguments = "/sbin/iptables";
    for (int i = 0; i < 255; ++i)
        of255Arguments += " a";
    for (const std::string &refused : {std::string(), of255Arguments, "/sbin/iptables " + std::string(1024, 'x')})
        EXPECT_FALSE(firewall.cmdExec(refused));
    EXPECT_FALSE(firewall.cmdExec("/no/such/program -A"));
    EXPECT_EQ(recorder.commands().size(), 1u);
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp cmd is empty or arguments exceeding limit",
                                      "veldFW.cpp #Arguments exceeds limit",
                                      "veldFW.cpp cmd is empty or arguments exceeding limit",
                                      "veldFW.cpp Failed to execute /no/such/program"));
}

TEST_F(Command, ListRunsIpv4FirstAndGlobalBeforeTheOthersInByteOrderUntilOneIsRefused) {
    recorder.failMatching("--bad", 2, "iptables v1.8.9: unknown option \"--bad\"");
    Json::Value commands;
    std::istringstream(R"({"v6": {"global": ["6"], "eth0": ["--bad", "7"]}, "v5": {"global": ["x"]},
        "v4": {"vpn": ["5"], "b": ["3", "4"], "global": ["0", "1"], "Z": ["2"]}})") >>
        commands;
    EXPECT_FALSE(firewall.fwExec(commands));
    EXPECT_THAT(recorder.lines(),
                ElementsAre("/sbin/iptables 0", "/sbin/iptables 1", "/sbin/iptables 2", "/sbin/iptables 3",
                            "/sbin/iptables 4", "/sbin/iptables 5", "/sbin/ip6tables 6", "/sbin/ip6tables --bad"));
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Failed to execute /sbin/ip6tables",
                                      "veldFW.cpp Failed to execute \"/sbin/ip6tables --bad\""));
    EXPECT_TRUE(log.contains("/sbin/ip6tables --bad: iptables v1.8.9: unknown option \"--bad\"")) << log.text();
    commands["v4"] = Json::Value();
    commands["v6"].removeMember("eth0");
    recorder.clear();
    EXPECT_TRUE(firewall.fwExec(commands));
    EXPECT_THAT(recorder.lines(), ElementsAre("/sbin/ip6tables 6"));
}

}  // namespace
