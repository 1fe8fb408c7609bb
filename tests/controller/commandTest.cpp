// SPDX-License-Identifier: Apache-2.0
// Running one command and a command list: limits, order, the stop at a failure, what the log says.
#include <sstream>

#include "commandRecorder.h"
#include "firewallTest.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

const std::string PROGRAM = "/sbin/iptables";

/// A command whose arguments, the program included, take exactly this many bytes with a NUL each.
std::string commandOfBytes(size_t bytes) {
    return PROGRAM + " " + std::string(bytes - (PROGRAM.size() + 1) - 1, 'x');
}

class Command : public FirewallTest {
protected:
    bool runList(const std::string &commands) {
        Json::Value json;
        std::istringstream(commands) >> json;
        recorder.clear();
        return firewall.fwExec(json);
    }

    CommandRecorder recorder;
};

TEST_F(Command, IsSplitAtSingleBlanksAndEndsArgumentsAtANul) {
    EXPECT_TRUE(firewall.cmdExec("  /sbin/iptables  -A  \"a\tb  c\"\n -j   DROP \t "));
    EXPECT_THAT(recorder.commands().at(0).arguments, ElementsAre("-A", "\"a\tb", "c\"\n", "-j", "DROP", "\t"));
    EXPECT_TRUE(firewall.cmdExec(PROGRAM + std::string(" -A\0B C", 7)));
    EXPECT_THAT(recorder.commands().at(1).arguments, ElementsAre("-A", "C"));
}

TEST_F(Command, LimitsAreExact) {
    const std::string tooMany = "veldFW.cpp #Arguments exceeds limit";
    const std::string tooLong = "veldFW.cpp cmd is empty or arguments exceeding limit";
    std::string of254Arguments = PROGRAM;
    for (int i = 0; i < 254; ++i)
        of254Arguments += " a";
    const std::pair<std::string, std::string> cases[] = {
        {"", tooLong},
        {"   ", tooLong},
        {of254Arguments, ""},
        {of254Arguments + " a", tooMany},
        {commandOfBytes(1024), ""},
        {commandOfBytes(1025), tooLong},
        {commandOfBytes(1022) + " a", ""},
        {commandOfBytes(1022) + " ab", tooLong},
        {commandOfBytes(1023) + " a", tooMany},
        {commandOfBytes(3000) + " a", tooMany},
    };
    for (const auto &[command, message] : cases) {
        SCOPED_TRACE(std::to_string(command.size()) + " bytes: " + command.substr(0, 40));
        recorder.clear();
        log.clear();
        EXPECT_EQ(firewall.cmdExec(command), message.empty());
        EXPECT_EQ(recorder.lines(), std::vector<std::string>(message.empty() ? 1 : 0, command));
        EXPECT_EQ(errors(), std::vector<std::string>(message.empty() ? 0 : 1, message));
    }
}

TEST_F(Command, ListRunsIpv4FirstAndGlobalBeforeTheOthersInByteOrder) {
    EXPECT_TRUE(runList(R"({"v6": {"global": ["6"], "eth0": ["7"]},
        "v4": {"vpn": ["5"], "b": ["3", "4"], "global": ["0", "1"], "Z": ["2"]}, "v5": {"global": ["x"]}})"));
    EXPECT_THAT(recorder.lines(),
                ElementsAre("/sbin/iptables 0", "/sbin/iptables 1", "/sbin/iptables 2", "/sbin/iptables 3",
                            "/sbin/iptables 4", "/sbin/iptables 5", "/sbin/ip6tables 6", "/sbin/ip6tables 7"));
    EXPECT_TRUE(runList(R"({"v4": null, "v6": {"global": ["x"]}})"));
    EXPECT_THAT(recorder.lines(), ElementsAre("/sbin/ip6tables x"));
}

TEST_F(Command, RefusedStopsTheListAndTheLogTellsWhichAndWhy) {
    recorder.failMatching("-A B", 2, "iptables v1.8.9: unknown option \"--nonsense\"");
    Json::Value commands;
    for (const char *command : {"-A A", "-A B", "-A C"})
        commands["v4"]["eth0"].append(command);
    commands["v6"]["global"].append("-A D");
    EXPECT_FALSE(firewall.fwExec(commands));
    EXPECT_THAT(recorder.lines(), ElementsAre("/sbin/iptables -A A", "/sbin/iptables -A B"));
    EXPECT_TRUE(log.contains("/sbin/iptables -A B: iptables v1.8.9: unknown option \"--nonsense\"")) << log.text();
    EXPECT_FALSE(firewall.cmdExec("/no/such/program -A"));
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp Failed to execute /sbin/iptables",
                                      "veldFW.cpp Failed to execute \"/sbin/iptables -A B\"",
                                      "veldFW.cpp Failed to execute /no/such/program"));
}

}  // namespace
