// SPDX-License-Identifier: Apache-2.0
// The input of iptables-restore: read back, refused, undone and found again by line number.
#include "fw/restoreInput.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <random>

#include "caseTable.h"
#include "restoreReader.h"
#include "textEscapes.h"

using namespace veldtest;
using FW::RestoreInput;
using testing::ElementsAre;

namespace {

/// The input of these commands, or the position of the one that is refused.
std::optional<size_t> write(const std::vector<std::string> &arguments, RestoreInput &input) {
    std::vector<FW::ListedCommand> commands;
    for (const std::string &text : arguments)
        commands.push_back({"v4", "global", 0, "/sbin/iptables " + text});
    const auto refusal = FW::restoreInputWrite(commands, input);
    EXPECT_FALSE(refusal && refusal->reason.empty());
    return refusal ? std::optional<size_t>(refusal->command) : std::nullopt;
}

RestoreInput written(const std::vector<std::string> &arguments) {
    RestoreInput input;
    EXPECT_FALSE(write(arguments, input));
    return input;
}

TEST(RestoreInput, TakesEachCaseOfTheTable) {
    const std::string append = "-A INPUT_FIREWALL";
    auto rows = readCases(VELD_CASE_DIRECTORY "restoreInput.cases", 3);
    std::string many;
    for (int i = 0; i < 300; ++i)
        many += " x";
    for (const std::string &tooMuch : {std::string(1100, 'x'), many})
        rows.push_back({"refused", "... " + tooMuch, ""});
    for (const auto &row : rows) {
        SCOPED_TRACE(row[0] + " " + row[1]);
        std::string text = unescaped(row[1]);
        if (row[0] == "line") {
            EXPECT_EQ(FW::restoreFailedLine(text), std::stoul(row[2]));
        } else if (row[0] == "argument") {
            const RestoreInput input = written({append + "  --comment " + text + " " + text + "  -j DROP "});
            const std::vector<std::string> words = {"-A", "INPUT_FIREWALL", "--comment", text, text, "-j", "DROP"};
            EXPECT_EQ(restoreArguments(input.line(4)), words);
            EXPECT_EQ(input.line(5), "COMMIT");
        } else {
            text.replace(0, text.rfind("...", 0) == 0 ? 3 : 0, text.rfind("...", 0) == 0 ? append : "");
            RestoreInput input;
            const auto refused = write({append + " -j DROP", text}, input);
            EXPECT_EQ(refused, row[0] == "refused" ? std::optional<size_t>(1) : std::nullopt);
        }
    }
}

TEST(RestoreInput, IsReadBackWhateverTheBytesAre) {
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

TEST(RestoreInput, HasASectionForEachTableAndKnowsTheCommandOfEachLine) {
    const RestoreInput input = written({"-t mangle -A PREROUTING -i eth0 -j DROP", "-A INPUT_FIREWALL -i lo -j ACCEPT",
                                        "-t filter -A OTHER -j RETURN", "-t raw -A PREROUTING -j RETURN",
                                        "-t mangle -A PREROUTING -j RETURN"});
    EXPECT_EQ(input.text, "*filter\n-F INPUT_FIREWALL\n-F FORWARD_FIREWALL\n"
                          "-A INPUT_FIREWALL -i lo -j ACCEPT\n-A OTHER -j RETURN\nCOMMIT\n"
                          "*mangle\n-A PREROUTING -i eth0 -j DROP\n-A PREROUTING -j RETURN\nCOMMIT\n"
                          "*raw\n-A PREROUTING -j RETURN\nCOMMIT\n");
    constexpr size_t own = RestoreInput::NO_COMMAND;
    EXPECT_THAT(input.commandOfLine, ElementsAre(own, own, own, 1, 2, own, own, 0, 4, own, own, 3, own));
    // The part that is tried to find a culprit: the rules in force and the first lines, as a whole.
    const std::string saved = "*filter\nCOMMIT\n";
    EXPECT_EQ(FW::restoreInputOfTrial(input, saved, 0), saved);
    EXPECT_EQ(FW::restoreInputOfTrial(input, saved, 2), saved + "*filter\n-F INPUT_FIREWALL\nCOMMIT\n");
    EXPECT_EQ(FW::restoreInputOfTrial(input, saved, 6), saved + input.text.substr(0, input.text.find("*mangle")));
    EXPECT_EQ(FW::restoreInputOfTrial(input, saved, 100), saved + input.text);
}

TEST(RestoreUndo, PutsBackWhatChangedAndNothingElse) {
    const std::string before = "# Generated\n*filter\n:INPUT ACCEPT [9:9]\n:INPUT_FIREWALL - [0:0]\n"
                               "[1:2] -A INPUT -j INPUT_FIREWALL\n"
                               "[3:4] -A INPUT_FIREWALL -m comment --comment \"a \\\"b\" -j DROP\nCOMMIT\n"
                               "*mangle\n[0:0] -A PREROUTING -j A\n[0:0] -A PREROUTING -j N\nCOMMIT\n"
                               "*raw\n[0:0] -A INPUT_FIREWALL -j X\nCOMMIT\n";
    const RestoreInput input =
        written({"-A INPUT_FIREWALL -j RETURN", "-t mangle -A PREROUTING -j A", "-t mangle -A PREROUTING -j B"});
    const auto undo = [&](const std::string &firewallRule, const std::string &mangleRules) {
        return FW::restoreInputOfUndo(input, before,
                                      "*filter\n[0:0] -A INPUT -j INPUT_FIREWALL\n" + firewallRule +
                                          "COMMIT\n*mangle\n" + mangleRules + "COMMIT\n");
    };
    const std::string old = "[7:7] -A INPUT_FIREWALL -m comment --comment \"a \\\"b\" -j DROP\n";
    const std::string oldMangle = "[5:5] -A PREROUTING -j A\n[0:0] -A PREROUTING -j N\n";
    const std::string ours = "[0:0] -A PREROUTING -j A\n[0:0] -A PREROUTING -j B\n";
    const std::string filterBack = "*filter\n-F INPUT_FIREWALL\n[3:4]" + old.substr(5) + "COMMIT\n";
    EXPECT_EQ(FW::restoreInputOfUndo(input, before, before), "");
    EXPECT_EQ(undo(old, oldMangle), "") << "other counters";
    EXPECT_EQ(undo("[0:0] -A INPUT_FIREWALL -j RETURN\n", oldMangle), filterBack);
    EXPECT_EQ(undo("", oldMangle + ours), filterBack + "*mangle\n-D PREROUTING 3\n-D PREROUTING 3\nCOMMIT\n");
    EXPECT_EQ(undo(old, oldMangle + "[0:0] -A PREROUTING -j M\n" + ours),
              "*mangle\n-D PREROUTING -j B\n-D PREROUTING -j A\nCOMMIT\n")
        << "a neighbour's rule in between";
    // A line break in a rule of the firewall's chains, which no input can hold.
    EXPECT_FALSE(FW::savedRulesHoldLineBreak(before));
    EXPECT_FALSE(FW::savedRulesHoldLineBreak("*filter\n-A INPUT --comment \"a\nb\"\n-A INPUT_FIREWALL -j X\n"));
    EXPECT_TRUE(FW::savedRulesHoldLineBreak("*filter\n[0:0] -A INPUT_FIREWALL --comment \"a\nb\"\nCOMMIT\n"));
}

}  // namespace
