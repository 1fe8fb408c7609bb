// SPDX-License-Identifier: Apache-2.0
// The tool on a pseudo-terminal, and against the real kernel.
#include <gmock/gmock.h>
#include <pty.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <thread>

#include "commandRecorder.h"
#include "connections.h"
#include "files.h"
#include "network.h"
#include "realIptables.h"
#include "toolFixture.h"

namespace veldtest {

namespace {

using testing::HasSubstr;
using testing::Not;

/// The tool with a terminal as its standard input, output and error.
class TerminalRun {
public:
    explicit TerminalRun(std::vector<std::string> arguments, const char *noColor = nullptr) {
        winsize size = {24, 120, 0, 0};
        m_process = forkpty(&m_terminal, nullptr, nullptr, &size);
        if (m_process == 0) {
            setenv("TERM", "xterm", 1);
            noColor != nullptr ? setenv("NO_COLOR", noColor, 1) : unsetenv("NO_COLOR");
            arguments.insert(arguments.begin(), VELDFWCTL);
            std::vector<char *> words;
            words.reserve(arguments.size() + 1);
            for (std::string &argument : arguments) {
                words.push_back(argument.data());
            }
            words.push_back(nullptr);
            execv(VELDFWCTL, words.data());
            _exit(127);
        }
    }
    ~TerminalRun() {
        if (m_terminal >= 0) {
            close(m_terminal);
        }
    }
    TerminalRun(const TerminalRun &) = delete;
    TerminalRun &operator=(const TerminalRun &) = delete;

    void type(const std::string &text) {
        ASSERT_EQ(static_cast<ssize_t>(text.size()), write(m_terminal, text.data(), text.size()));
    }
    /// Reads until the text appears or the tool has ended.
    void waitFor(const std::string &text) {
        while (m_output.find(text) == std::string::npos && readMore()) {
        }
        EXPECT_THAT(m_output, HasSubstr(text));
    }
    /// Closes the terminal, as when a connection breaks.
    void hangUp() {
        close(m_terminal);
        m_terminal = -1;
    }
    int finish() {
        while (m_terminal >= 0 && readMore()) {
        }
        return waitForChild(m_process);
    }
    const std::string &output() const { return m_output; }

private:
    bool readMore() {
        char buffer[1024];
        const ssize_t count = read(m_terminal, buffer, sizeof buffer);
        if (count > 0) {
            m_output.append(buffer, static_cast<size_t>(count));
        }
        return count > 0;
    }

    int m_terminal = -1;
    pid_t m_process = -1;
    std::string m_output;
};

class TerminalTest : public ToolTest {};

TEST_F(TerminalTest, TablesAndColoursAreOnlyForTerminalsThatTakeThem) {
    TerminalRun coloured({"rule", "list"});
    EXPECT_EQ(0, coloured.finish());
    EXPECT_THAT(coloured.output(), HasSubstr("ADAPTER"));
    EXPECT_THAT(coloured.output(), HasSubstr("\033[32mallow\033[0m"));
    TerminalRun plain({"rule", "list"}, "1");
    EXPECT_EQ(0, plain.finish());
    EXPECT_THAT(plain.output(), HasSubstr("ADAPTER"));
    EXPECT_THAT(plain.output(), Not(HasSubstr("\033")));
    EXPECT_THAT(runTool({"rule", "list"}).output, Not(HasSubstr("ADAPTER")));
}

TEST_F(TerminalTest, AQuestionIsAskedAndNoChangesNothing) {
    TerminalRun no({"rule", "remove", "1", "--adapter", "eth0"});
    no.waitFor("[y/N]");
    no.type("\n");
    EXPECT_EQ(1, no.finish());
    EXPECT_EQ(1u, storedProfile("default")["rules"]["eth0"].size());
    TerminalRun yes({"rule", "remove", "1", "--adapter", "eth0"});
    yes.waitFor("[y/N]");
    yes.type("y\n");
    EXPECT_EQ(0, yes.finish());
    EXPECT_TRUE(storedProfile("default")["rules"].empty());
}

TEST_F(TerminalTest, AnApplicationThatTakesLongShowsHowFarItIs) {
    CommandRecorder recorder;
    recorder.setDelay(80);
    TerminalRun run({"enable"});
    run.waitFor("commands, ");
    EXPECT_EQ(0, run.finish());
    EXPECT_THAT(run.output(), testing::ContainsRegex("\\[#*\\.*\\] +[0-9]+ of [0-9]+ commands"));
}

TEST_F(TerminalTest, AnApplicationGoesOnWhenTheTerminalHangsUpOrIsInterrupted) {
    for (const bool interrupt : {false, true}) {
        CommandRecorder recorder;
        recorder.setDelay(80);
        TerminalRun run({interrupt ? "reload" : "enable"});
        run.waitFor("commands, ");
        if (interrupt) {
            run.type("\003");
        } else {
            run.hangUp();
        }
        run.finish();
        // The policies of the built-in chains come last: without them the machine would stay closed.
        for (int i = 0; i < 600 && recorder.lines().back() != "/sbin/ip6tables --policy FORWARD ACCEPT"; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        }
        EXPECT_EQ("/sbin/ip6tables --policy FORWARD ACCEPT", recorder.lines().back());
        EXPECT_EQ("on", parseJson(runTool({"status", "--json"}).output)["enabled"].asBool() ? "on" : "off");
    }
}

TEST_F(ToolTest, StatusCountsWhatTheKernelHoldsAndDropped) {
    std::string reason;
    if (!realIptables(&reason)) {
        GTEST_SKIP() << reason;
    }
    EXPECT_THAT(runTool({"status"}).output, HasSubstr("missing"));
    createFirewallChains();
    const NetworkNamespace client("client");
    addVethPair("eth9", client, "eth0");
    addAddress("eth9", "10.9.0.1/24");
    addAddress("eth0", "10.9.0.2/24", &client);
    setUp("eth9");
    setUp("eth0", &client);
    ASSERT_EQ(0, runTool({"rule", "add", "-a", "eth9", "--deny", "--port", "81/tcp"}).status);
    const ProgramResult enabled = runTool({"enable"});
    ASSERT_EQ(0, enabled.status) << enabled.errors;
    EXPECT_EQ(ProbeResult::timedOut, probeTcp({"10.9.0.1", 81}, &client));
    EXPECT_EQ(ProbeResult::refused, probeTcp({"10.9.0.1", 80}, &client));
    const Json::Value status = parseJson(runTool({"status", "--json"}).output);
    EXPECT_TRUE(status["enabled"].asBool());
    EXPECT_GE(status["dropped"].asUInt(), 1u);
    const auto live = static_cast<size_t>(status["live"]["IPv4"]["INPUT_FIREWALL"]["rules"].asUInt());
    EXPECT_EQ(listRules("/sbin/iptables", "INPUT_FIREWALL").size() - 1, live);  // "-N" is no rule
    EXPECT_EQ(0, runTool({"disable"}).status);
    EXPECT_EQ(0u, parseJson(runTool({"status", "--json"}).output)["live"]["IPv4"]["INPUT_FIREWALL"]["rules"].asUInt());
}

}  // namespace

}  // namespace veldtest
