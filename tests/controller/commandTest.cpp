// SPDX-License-Identifier: Apache-2.0
// Running one command and a command list: limits, order, the stop at a failure, what the log says.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include "commandRecorder.h"
#include "files.h"
#include "systemLog.h"
#include "veldfirewall/veldFW.h"

using namespace veldtest;
using testing::ElementsAre;
using testing::HasSubstr;

namespace {

const std::string PROGRAM = "/sbin/iptables";

std::string repeated(const std::string &text, size_t count) {
    std::string result;
    for (size_t i = 0; i < count; ++i)
        result += text;
    return result;
}

/// A command whose arguments, the program included, take exactly this many bytes with a NUL each.
std::string commandOfBytes(size_t bytes) {
    return PROGRAM + " " + std::string(bytes - (PROGRAM.size() + 1) - 1, 'x');
}

class Command : public testing::Test {
protected:
    CommandRecorder recorder;
    SystemLog log;
    FW::VELDFW firewall;
};

TEST_F(Command, IsSplitAtSingleBlanksAndNowhereElse) {
    EXPECT_TRUE(firewall.cmdExec("  /sbin/iptables  -A  \"a\tb  c\"\n -j   DROP \t "));
    EXPECT_EQ(recorder.commands().at(0).arguments,
              (std::vector<std::string>{"-A", "\"a\tb", "c\"\n", "-j", "DROP", "\t"}));
}

TEST_F(Command, EndsAnArgumentAtAnEmbeddedNul) {
    EXPECT_TRUE(firewall.cmdExec(PROGRAM + std::string(" -A\0B C", 7)));
    EXPECT_EQ(recorder.commands().at(0).arguments, (std::vector<std::string>{"-A", "C"}));
}

struct Limit {
    const char *name;
    std::string command;
    size_t arguments;     ///< that the program receives; 0: it must not run
    const char *message;  ///< when it must not run
};

class CommandLimit : public testing::TestWithParam<Limit> {};

constexpr const char *TOO_MANY = "#Arguments exceeds limit";
constexpr const char *TOO_LONG = "cmd is empty or arguments exceeding limit";

TEST_P(CommandLimit, IsExact) {
    CommandRecorder recorder;
    SystemLog log;
    const Limit &limit = GetParam();
    EXPECT_EQ(FW::VELDFW().cmdExec(limit.command), limit.arguments > 0);
    const auto commands = recorder.commands();
    if (limit.arguments > 0) {
        ASSERT_EQ(commands.size(), 1u);
        EXPECT_EQ(commands[0].arguments.size(), limit.arguments);
        std::string words;
        for (const std::string &argument : commands[0].arguments)
            words += " " + argument;
        EXPECT_EQ(PROGRAM + words, limit.command);
    } else {
        EXPECT_TRUE(commands.empty());
        ASSERT_EQ(log.messages().size(), 1u) << log.text();
        EXPECT_THAT(log.messages()[0].text, testing::MatchesRegex(std::string("veldFW\\.cpp:[0-9]+ ") + limit.message));
    }
}

INSTANTIATE_TEST_SUITE_P(
    Case, CommandLimit,
    testing::Values(Limit{"Empty", "", 0, TOO_LONG}, Limit{"OnlyBlanks", "   ", 0, TOO_LONG},
                    Limit{"Arguments255", PROGRAM + repeated(" a", 254), 254, ""},
                    Limit{"Arguments256", PROGRAM + repeated(" a", 255), 0, TOO_MANY},
                    Limit{"Bytes1023", commandOfBytes(1023), 1, ""}, Limit{"Bytes1024", commandOfBytes(1024), 1, ""},
                    Limit{"Bytes1025", commandOfBytes(1025), 0, TOO_LONG},
                    Limit{"OneLastByteBehind1022", commandOfBytes(1022) + " a", 2, ""},
                    Limit{"TwoLastBytesBehind1022", commandOfBytes(1022) + " ab", 0, TOO_LONG},
                    Limit{"FurtherPieceBehind1023", commandOfBytes(1023) + " a", 0, TOO_MANY},
                    Limit{"FurtherPieceBehindAFullBuffer", commandOfBytes(1024) + " a", 0, TOO_MANY},
                    Limit{"FurtherPieceBehindACutOne", commandOfBytes(3000) + " a", 0, TOO_MANY}),
    [](const auto &entry) { return entry.param.name; });

TEST_F(Command, ThatCannotBeStartedIsNamed) {
    EXPECT_FALSE(firewall.cmdExec("/no/such/program -A"));
    EXPECT_TRUE(log.contains("Failed to execute /no/such/program")) << log.text();
}

Json::Value parse(const std::string &text) {
    Json::Value json;
    std::istringstream(text) >> json;
    return json;
}

TEST_F(Command, ListRunsIpv4FirstAndGlobalBeforeTheOthersInByteOrder) {
    EXPECT_TRUE(firewall.fwExec(parse(R"({"v6": {"global": ["6"], "eth0": ["7"]},
        "v4": {"vpn": ["5"], "b": ["3", "4"], "global": ["0", "1"], "Z": ["2"]}})")));
    EXPECT_THAT(recorder.lines(),
                ElementsAre("/sbin/iptables 0", "/sbin/iptables 1", "/sbin/iptables 2", "/sbin/iptables 3",
                            "/sbin/iptables 4", "/sbin/iptables 5", "/sbin/ip6tables 6", "/sbin/ip6tables 7"));
}

TEST_F(Command, ListWithoutAFamilyRunsTheOther) {
    for (const char *empty : {"{}", "{\"v4\": null, \"v6\": null}", "{\"v5\": {\"global\": [\"x\"]}}"})
        EXPECT_TRUE(firewall.fwExec(parse(empty))) << empty;
    EXPECT_TRUE(recorder.lines().empty());
    EXPECT_TRUE(firewall.fwExec(parse(R"({"v6": {"global": ["x"]}})")));
    EXPECT_THAT(recorder.lines(), ElementsAre("/sbin/ip6tables x"));
}

TEST_F(Command, RefusedStopsTheListAndTheLogTellsWhichAndWhy) {
    for (const unsigned refused : {1u, 3u}) {
        recorder.clear();
        log.clear();
        recorder.failAt(refused, 2, "iptables v1.8.9: unknown option \"--nonsense\"");
        EXPECT_FALSE(firewall.fwExec(
            parse(R"({"v4": {"global": ["-A G"], "eth0": ["-A A", "-A B", "-A C"]}, "v6": {"global": ["-A D"]}})")));
        EXPECT_EQ(recorder.lines().size(), refused);
        const std::string command = refused == 1 ? "/sbin/iptables -A G" : "/sbin/iptables -A B";
        EXPECT_TRUE(log.contains("Failed to execute \"" + command + "\"")) << log.text();
        std::vector<std::string> reasons;
        for (const LogMessage &message : log.messages()) {
            if (message.text.find("unknown option \"--nonsense\"") != std::string::npos)
                reasons.push_back(message.text);
        }
        EXPECT_THAT(reasons, ElementsAre(HasSubstr(command))) << log.text();
    }
}

}  // namespace
