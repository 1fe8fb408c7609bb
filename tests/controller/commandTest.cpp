// SPDX-License-Identifier: Apache-2.0
// Running one command and a command list: limits, order, the stop at a failure, what the log says.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include <sstream>

#include "commandRecorder.h"
#include "systemLog.h"
#include "veldfirewall/veldFW.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

const std::string PROGRAM = "/sbin/iptables";

/// The program and that many arguments.
std::string commandOfArguments(size_t count) {
    std::string command = PROGRAM;
    for (size_t i = 0; i < count; ++i)
        command += " a";
    return command;
}

/// A command whose arguments, the program included, take exactly this many bytes with a NUL each.
std::string commandOfBytes(size_t bytes) {
    return PROGRAM + " " + std::string(bytes - (PROGRAM.size() + 1) - 1, 'x');
}

Json::Value parse(const std::string &text) {
    Json::Value json;
    std::istringstream(text) >> json;
    return json;
}

class Command : public testing::Test {
protected:
    CommandRecorder recorder;
    SystemLog log;
    FW::VELDFW firewall;
};

TEST_F(Command, IsSplitAtSingleBlanksAndEndsArgumentsAtANul) {
    EXPECT_TRUE(firewall.cmdExec("  /sbin/iptables  -A  \"a\tb  c\"\n -j   DROP \t "));
    EXPECT_THAT(recorder.commands().at(0).arguments, ElementsAre("-A", "\"a\tb", "c\"\n", "-j", "DROP", "\t"));
    EXPECT_TRUE(firewall.cmdExec(PROGRAM + std::string(" -A\0B C", 7)));
    EXPECT_THAT(recorder.commands().at(1).arguments, ElementsAre("-A", "C"));
}

TEST_F(Command, LimitsAreExact) {
    const std::string runs;
    const std::string tooMany = "#Arguments exceeds limit";
    const std::string tooLong = "cmd is empty or arguments exceeding limit";
    const std::pair<std::string, std::string> cases[] = {
        {"", tooLong},
        {"   ", tooLong},
        {commandOfArguments(254), runs},
        {commandOfArguments(255), tooMany},
        {commandOfBytes(1024), runs},
        {commandOfBytes(1025), tooLong},
        {commandOfBytes(1022) + " a", runs},
        {commandOfBytes(1022) + " ab", tooLong},
        {commandOfBytes(1023) + " a", tooMany},
        {commandOfBytes(3000) + " a", tooMany},
    };
    for (const auto &[command, message] : cases) {
        SCOPED_TRACE(std::to_string(command.size()) + " bytes: " + command.substr(0, 40));
        recorder.clear();
        log.clear();
        EXPECT_EQ(firewall.cmdExec(command), message == runs);
        EXPECT_EQ(recorder.lines(), std::vector<std::string>(message == runs ? 1 : 0, command));
        EXPECT_EQ(log.count(message.empty() ? "limit" : message), message == runs ? 0u : 1u) << log.text();
    }
}

TEST_F(Command, ListRunsIpv4FirstAndGlobalBeforeTheOthersInByteOrder) {
    EXPECT_TRUE(firewall.fwExec(parse(R"({"v6": {"global": ["6"], "eth0": ["7"]},
        "v4": {"vpn": ["5"], "b": ["3", "4"], "global": ["0", "1"], "Z": ["2"]}, "v5": {"global": ["x"]}})")));
    EXPECT_THAT(recorder.lines(),
                ElementsAre("/sbin/iptables 0", "/sbin/iptables 1", "/sbin/iptables 2", "/sbin/iptables 3",
                            "/sbin/iptables 4", "/sbin/iptables 5", "/sbin/ip6tables 6", "/sbin/ip6tables 7"));
    recorder.clear();
    EXPECT_TRUE(firewall.fwExec(parse(R"({"v4": null, "v6": {"global": ["x"]}})")));
    EXPECT_THAT(recorder.lines(), ElementsAre("/sbin/ip6tables x"));
}

TEST_F(Command, RefusedStopsTheListAndTheLogTellsWhichAndWhy) {
    recorder.failMatching("-A B", 2, "iptables v1.8.9: unknown option \"--nonsense\"");
    EXPECT_FALSE(firewall.fwExec(
        parse(R"({"v4": {"global": ["-A G"], "eth0": ["-A A", "-A B", "-A C"]}, "v6": {"global": ["-A D"]}})")));
    EXPECT_THAT(recorder.lines(), ElementsAre("/sbin/iptables -A G", "/sbin/iptables -A A", "/sbin/iptables -A B"));
    EXPECT_TRUE(log.contains("Failed to execute \"/sbin/iptables -A B\"")) << log.text();
    EXPECT_TRUE(log.contains("/sbin/iptables -A B: iptables v1.8.9: unknown option \"--nonsense\"")) << log.text();
    EXPECT_FALSE(firewall.cmdExec("/no/such/program -A"));
    EXPECT_TRUE(log.contains("Failed to execute /no/such/program")) << log.text();
}

}  // namespace
