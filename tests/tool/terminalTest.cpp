// SPDX-License-Identifier: Apache-2.0
// The tool on a pseudo-terminal, and trials against the real kernel: what was before must come back whatever happens to
// the tool, its terminal, the disks.
#include <gmock/gmock.h>
#include <pty.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <optional>
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
            std::string program = VELDFWCTL;
            std::vector<char *> words = {program.data()};
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
    pid_t process() const { return m_process; }
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

TEST_F(TerminalTest, ALongApplicationShowsHowFarItIsAndGoesOnWithoutItsTerminalOrWhenInterrupted) {
    for (const std::string event : {"none", "interrupt", "hang-up"}) {
        SCOPED_TRACE(event);
        CommandRecorder recorder;
        recorder.setDelay(80);
        TerminalRun run({"enable"});
        run.waitFor("commands, ");
        EXPECT_THAT(run.output(), testing::ContainsRegex("\\[#*\\.*\\] +[0-9]+ of [0-9]+ commands"));
        if (event == "interrupt") {
            run.type("\003");
        } else if (event == "hang-up") {
            run.hangUp();
        }
        const int status = run.finish();
        EXPECT_TRUE(event != "none" || status == 0);
        // The policies of the built-in chains come last: without them the machine would stay closed.
        for (int i = 0; i < 600 && recorder.lines().back() != "/sbin/ip6tables --policy FORWARD ACCEPT"; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        }
        EXPECT_EQ("/sbin/ip6tables --policy FORWARD ACCEPT", recorder.lines().back());
        EXPECT_TRUE(parseJson(runTool({"status", "--json"}).output)["enabled"].asBool());
    }
}

/// A client with a connection to a server on this machine, and a profile that cuts it off.
class TryTest : public ToolTest {
protected:
    static constexpr uint16_t port = 7777;

    void SetUp() override {
        std::string reason;
        if (!realIptables(&reason)) {
            GTEST_SKIP() << reason;
        }
        ToolTest::SetUp();
        createFirewallChains();
        writeFile("/usr/veld/etc/firewall.d/1.json", R"({"name": "default", "adapterPolicyMap": {"eth9": 0}})");
        writeFile("/usr/veld/etc/firewall.d/2.json", R"({"name": "closed", "adapterPolicyMap": {"eth9": 1}})");
        addVethPair("eth9", m_client, "eth0");
        addAddress("eth9", "10.9.0.1/24");
        addAddress("eth0", "10.9.0.2/24", &m_client);
        setUp("eth9");
        setUp("eth0", &m_client);
        m_server.emplace(std::vector<uint16_t>{port});
        ASSERT_EQ(0, runTool({"enable"}).status);
        m_connection.emplace(m_target, &m_client);
        ASSERT_EQ(ProbeResult::connected, m_connection->exchange());
    }

    static Json::Value trial() { return parseJson(runTool({"try", "--status", "--json"}).output); }
    void expectEnd() {
        Json::Value now = trial();
        for (int i = 0; i < 600 && now["trial"].asBool(); ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
            now = trial();
        }
        EXPECT_EQ("taken back", now["phase"].asString());
        EXPECT_EQ(ProbeResult::connected, probeTcp(m_target, &m_client));
        EXPECT_TRUE(storedProfile(".test_closed").isNull());
        EXPECT_EQ(ProbeResult::connected, m_connection->exchange(std::chrono::seconds(20)));
    }

    const ProbeTarget m_target = {"10.9.0.1", port, {}};
    NetworkNamespace m_client{"client"};
    std::optional<EchoServer> m_server;
    std::optional<Connection> m_connection;
};

TEST_F(TryTest, OutlivesTheToolItsTerminalAndItsGroup) {
    for (const int number : {SIGKILL, SIGHUP}) {
        TerminalRun run({"try", "closed", "--timeout", "3"});
        for (int i = 0; i < 600 && !trial()["trial"].asBool(); ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        ASSERT_TRUE(trial()["trial"].asBool());
        kill(-run.process(), number);  // while the rules are being applied, or right after
        run.hangUp();
        run.finish();
        expectEnd();
    }
}

TEST_F(TryTest, OfAClientThatIsCutOffGivesItsConnectionBack) {
    ASSERT_EQ(0, runTool({"try", "closed", "--timeout", "4", "--client", "10.9.0.2"}).status);
    EXPECT_EQ(ProbeResult::timedOut, m_connection->exchange());
    EXPECT_EQ(ProbeResult::timedOut, probeTcp(m_target, &m_client));
    expectEnd();
}

}  // namespace

}  // namespace veldtest
