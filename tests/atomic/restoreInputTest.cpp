// SPDX-License-Identifier: Apache-2.0
// The input of iptables-restore: read back, refused, undone and found again by line number.
#include "fw/restoreInput.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <random>
#include <sstream>

#include "files.h"
#include "processes.h"
#include "realIptables.h"
#include "restoreReader.h"

using namespace veldtest;
using FW::ListedCommand;
using FW::RestoreInput;
using testing::ElementsAre;
using testing::HasSubstr;

namespace {

std::vector<ListedCommand> commandsOf(const std::vector<std::string> &arguments) {
    std::vector<ListedCommand> commands;
    for (const std::string &text : arguments)
        commands.push_back({"v4", "global", 0, "/sbin/iptables " + text});
    return commands;
}

/// The written input; fails the test when it is refused.
RestoreInput written(const std::vector<std::string> &arguments) {
    RestoreInput input;
    const auto refusal = FW::restoreInputWrite(commandsOf(arguments), input);
    EXPECT_FALSE(refusal) << refusal->reason;
    return input;
}

std::vector<std::string> piecesOf(const std::string &text) {
    std::vector<std::string> pieces;
    size_t begin = 0;
    while (begin < text.size()) {
        const size_t end = std::min(text.find(' ', begin), text.size());
        if (end > begin)
            pieces.push_back(text.substr(begin, end - begin));
        begin = end + 1;
    }
    return pieces;
}

const std::vector<std::string> strangeArguments = {
    "\"",     "\\",  "#",        "#x",   "a\tb",  "\t",   "!",          "a\"b",   "a\\b",    "\\\"", "\"\"",  "'a'",
    "a'b",    "$x",  "`id`",     "%s",   "a\rb",  "\x01", "\xc3\xa4",   "\xff",   "*filter", ":X",   "[1:2]", "COMMIT",
    "a\"\tb", "a\\", "a\\\tb\"", "a;b|", "<a>&b", "\v\f", "\"\\\"\\\"", "~{a,b}", "x\"",     "\"x",  "-j\"",  "--\tx"};

TEST(RestoreInputText, IsReadBackAsTheSameArguments) {
    for (const std::string &argument : strangeArguments) {
        const std::string command =
            "-A INPUT_FIREWALL  -m comment --comment " + argument + " " + argument + "  -j DROP ";
        const RestoreInput input = written({command});
        EXPECT_EQ(restoreArguments(input.line(4)), piecesOf(command)) << argument;
        EXPECT_EQ(input.line(5), "COMMIT") << argument;
    }
}

TEST(RestoreInputText, IsReadBackWhateverTheBytesAre) {
    std::mt19937 random(7);
    const std::string frequent = "\"\\\t #-!'a";
    for (int round = 0; round < 20000; ++round) {
        std::string argument;
        const size_t length = 1 + random() % 12;
        while (argument.size() < length) {
            const auto byte = static_cast<char>(random() % 2 != 0 ? frequent[random() % frequent.size()]
                                                                  : static_cast<char>(1 + random() % 255));
            argument += byte == '\n' ? 'n' : byte;
        }
        ASSERT_EQ(restoreArguments(FW::restoreQuoted(argument)), std::vector{argument}) << round;
    }
}

TEST(RestoreInputText, HasASectionForEachTableAndKnowsTheCommandOfEachLine) {
    const RestoreInput input = written({"-t mangle -A PREROUTING -i eth0 -j DROP", "-A INPUT_FIREWALL -i lo -j ACCEPT",
                                        "-t filter -A OTHER -j RETURN", "-t raw -A PREROUTING -j RETURN",
                                        "-t mangle -A PREROUTING -j RETURN"});
    EXPECT_EQ(input.text, "*filter\n-F INPUT_FIREWALL\n-F FORWARD_FIREWALL\n"
                          "-A INPUT_FIREWALL -i lo -j ACCEPT\n-A OTHER -j RETURN\nCOMMIT\n"
                          "*mangle\n-A PREROUTING -i eth0 -j DROP\n-A PREROUTING -j RETURN\nCOMMIT\n"
                          "*raw\n-A PREROUTING -j RETURN\nCOMMIT\n");
    constexpr size_t own = RestoreInput::NO_COMMAND;
    EXPECT_THAT(input.commandOfLine, ElementsAre(own, own, own, 1, 2, own, own, 0, 4, own, own, 3, own));
    EXPECT_THAT(input.tables, ElementsAre("filter", "mangle", "raw"));
}

TEST(RestoreInputText, IsRefusedWhereTheTwoProgramsDiffer) {
    const std::string append = "-A INPUT_FIREWALL ";
    const std::vector<std::string> refused = {"",
                                              "-F INPUT_FIREWALL",
                                              "-D INPUT_FIREWALL -j DROP",
                                              "-I INPUT_FIREWALL -j DROP",
                                              "-P INPUT DROP",
                                              "-A",
                                              "--append INPUT_FIREWALL",
                                              "-AINPUT_FIREWALL -j DROP",
                                              "-t",
                                              "-t nat",
                                              "-t nat\tx -A X -j DROP",
                                              "-t -A X",
                                              "-t nat -t filter -A X -j DROP",
                                              "-w -A INPUT_FIREWALL -j DROP",
                                              "--wait 5 -A INPUT_FIREWALL -j DROP",
                                              "--table nat -A X -j DROP",
                                              "-tnat -A X -j DROP",
                                              append + "-j DROP\n-A INPUT_FIREWALL -j ACCEPT",
                                              append + std::string("-s 1.2.3.4\0 -j DROP", 18),
                                              append + "-t nat",
                                              append + "-tnat",
                                              append + "--table nat",
                                              append + "--table=nat",
                                              append + "--t nat",
                                              append + "--tab=nat",
                                              append + "-4",
                                              append + "-6",
                                              append + "--ipv4",
                                              append + "--ipv6",
                                              append + "-w",
                                              append + "-w5",
                                              append + "-W 5",
                                              append + "--wait=5",
                                              append + "--wait-interval 5",
                                              append + "-M x",
                                              append + "--modprobe=x",
                                              append + "-vt nat",
                                              append + "-nxt nat",
                                              append + "-ft nat",
                                              append + "-bt nat",
                                              append + "-h",
                                              append + "-V",
                                              append + "--help",
                                              append + "--he",
                                              append + "--version",
                                              append + "--v",
                                              append + "-fh",
                                              append + "-hx",
                                              append + "-Vx",
                                              append + std::string(1100, 'x'),
                                              append + [] {
                                                  std::string many;
                                                  for (int i = 0; i < 300; ++i)
                                                      many += "x ";
                                                  return many;
                                              }()};
    for (const std::string &command : refused) {
        RestoreInput input;
        const auto refusal = FW::restoreInputWrite(commandsOf({append + "-j DROP", command}), input);
        ASSERT_TRUE(refusal) << command;
        EXPECT_EQ(refusal->command, 1u) << command;
        EXPECT_FALSE(refusal->reason.empty()) << command;
    }
    for (const std::string accepted : {"--tcp-flags SYN,ACK SYN", "--helper ftp", "--to 1", "-f", "--hl-eq 5",
                                       "-m time --timestart 1:00", "--version-x", "--", "-", "--icmp-type 4"})
        written({append + accepted});
}

TEST(RestoreFailedLine, IsTheOneThatTheProgramMeans) {
    const std::pair<const char *, size_t> messages[] = {
        {"iptables-restore: line 17 failed", 17},
        {"iptables-nft-restore: line 2 failed: No chain/target/match by that name.", 2},
        {"iptables-nft-restore v1.8.9 (nf_tables): \nline 3: RULE_APPEND failed (Invalid argument): rule in chain X",
         3},
        {"iptables-restore v1.8.9 (legacy): host/network `line:7' not found\nError occurred at line: 12\nTry `x -h'",
         12},
        {"ip6tables-restore v1.8.9 (legacy): ip6tables-restore: unable to initialize table 'x'\n"
         "Error occurred at line: 1\n",
         1},
        {"Bad argument `line\t9'\nError occurred at line: 20", 20},
        {"Bad argument `-restore: line 9'", 0},
        {"Another app is currently holding the xtables lock. Stopped waiting after 10s.", 0},
        {"cannot be started: No such file or directory", 0},
        {"", 0}};
    for (const auto &[message, line] : messages)
        EXPECT_EQ(FW::restoreFailedLine(message), line) << message;
}

constexpr const char *savedBefore = "# Generated\n*filter\n:INPUT ACCEPT [9:9]\n:INPUT_FIREWALL - [0:0]\n"
                                    "[1:2] -A INPUT -j INPUT_FIREWALL\n"
                                    "[3:4] -A INPUT_FIREWALL -m comment --comment \"a \\\"b\" -j DROP\nCOMMIT\n"
                                    "*mangle\n[0:0] -A PREROUTING -j A\n[0:0] -A PREROUTING -j N\nCOMMIT\n"
                                    "*raw\n[0:0] -A INPUT_FIREWALL -j X\nCOMMIT\n";

TEST(RestoreUndo, PutsBackWhatChangedAndNothingElse) {
    const RestoreInput input =
        written({"-A INPUT_FIREWALL -j RETURN", "-t mangle -A PREROUTING -j A", "-t mangle -A PREROUTING -j B"});
    EXPECT_EQ(FW::restoreInputOfUndo(input, savedBefore, savedBefore), "");
    const auto now = [](const std::string &firewallRule, const std::string &mangleRules) {
        return "*filter\n[0:0] -A INPUT -j INPUT_FIREWALL\n" + firewallRule + "COMMIT\n*mangle\n" + mangleRules +
               "COMMIT\n";
    };
    const std::string old = "[7:7] -A INPUT_FIREWALL -m comment --comment \"a \\\"b\" -j DROP\n";
    const std::string oldMangle = "[5:5] -A PREROUTING -j A\n[0:0] -A PREROUTING -j N\n";
    const std::string ours = "[0:0] -A PREROUTING -j A\n[0:0] -A PREROUTING -j B\n";
    const std::string filterBack =
        "*filter\n-F INPUT_FIREWALL\n[3:4] -A INPUT_FIREWALL -m comment --comment \"a \\\"b\" "
        "-j DROP\nCOMMIT\n";
    EXPECT_EQ(FW::restoreInputOfUndo(input, savedBefore, now(old, oldMangle)), "") << "other counters";
    EXPECT_EQ(FW::restoreInputOfUndo(input, savedBefore, now("[0:0] -A INPUT_FIREWALL -j RETURN\n", oldMangle)),
              filterBack);
    EXPECT_EQ(FW::restoreInputOfUndo(input, savedBefore, now("", oldMangle + ours)),
              filterBack + "*mangle\n-D PREROUTING 3\n-D PREROUTING 3\nCOMMIT\n");
    EXPECT_EQ(FW::restoreInputOfUndo(input, savedBefore, now(old, oldMangle + "[0:0] -A PREROUTING -j M\n" + ours)),
              "*mangle\n-D PREROUTING -j B\n-D PREROUTING -j A\nCOMMIT\n")
        << "a neighbour's rule in between";
}

TEST(RestoreUndo, KnowsRulesThatNoInputCanHold) {
    EXPECT_FALSE(FW::savedRulesHoldLineBreak(savedBefore));
    EXPECT_FALSE(
        FW::savedRulesHoldLineBreak("*filter\n-A INPUT -m comment --comment \"a\nb\"\n-A INPUT_FIREWALL -j X\n"));
    EXPECT_TRUE(FW::savedRulesHoldLineBreak("*filter\n[0:0] -A INPUT_FIREWALL -m comment --comment \"a\n"
                                            "-A INPUT_FIREWALL -j ACCEPT\"\nCOMMIT\n"));
}

TEST(RestoreTrial, HasTheRulesInForceAndTheFirstLines) {
    const RestoreInput input = written({"-A INPUT_FIREWALL -j DROP", "-t raw -A PREROUTING -j DROP"});
    const std::string saved = "*filter\nCOMMIT\n";
    EXPECT_EQ(FW::restoreInputOfTrial(input, saved, 0), saved);
    EXPECT_EQ(FW::restoreInputOfTrial(input, saved, 2), saved + "*filter\n-F INPUT_FIREWALL\nCOMMIT\n");
    EXPECT_EQ(FW::restoreInputOfTrial(input, saved, 5), saved + input.text.substr(0, input.text.find("*raw")));
    EXPECT_EQ(FW::restoreInputOfTrial(input, saved, 100), saved + input.text);
}

class RestorePrograms : public testing::TestWithParam<const char *> {};

TEST_P(RestorePrograms, ReadBackEachArgumentAsWritten) {
    std::string reason;
    if (!useIptablesBackend(GetParam()) || !realIptables(&reason))
        GTEST_SKIP() << "iptables-" << GetParam() << " does not work here: " << reason;
    createFirewallChains();
    for (const char *program : {"/sbin/iptables", "/sbin/ip6tables"}) {
        std::vector<std::string> expected;
        std::vector<std::string> commands;
        for (const std::string &argument : strangeArguments)
            commands.push_back("-A INPUT_FIREWALL -m comment --comment " + argument);
        writeFile("/tmp/input", written(commands).text);
        runChecked({"/bin/sh", "-c", std::string(program) + "-restore --noflush < /tmp/input"});
        // The same by argument vectors, in the chain that the input has flushed.
        for (const std::string &argument : strangeArguments)
            runChecked({program, "-A", "FORWARD_FIREWALL", "-m", "comment", "--comment", argument});
        for (const std::string &rule : listRules(program, "FORWARD_FIREWALL"))
            expected.push_back(rule.substr(0, 3) + "INPUT" + rule.substr(rule.find('_')));
        EXPECT_EQ(listRules(program, "INPUT_FIREWALL"), expected);
        EXPECT_EQ(expected.size(), strangeArguments.size() + 1);
    }
}

INSTANTIATE_TEST_SUITE_P(Backend, RestorePrograms, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
