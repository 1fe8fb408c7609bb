// SPDX-License-Identifier: Apache-2.0
// Trials against the real kernel: what was before must come back whatever happens to the tool, its terminal, the disks.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <pty.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <optional>
#include <thread>

#include "connections.h"
#include "files.h"
#include "network.h"
#include "realIptables.h"
#include "toolFixture.h"

namespace veldtest {

namespace {

using testing::Contains;
using testing::HasSubstr;
using testing::Not;

using Listing = std::vector<std::string>;

const std::string PROFILES = "/usr/veld/etc/firewall.d/";
const ProbeTarget SERVER = {"10.9.0.1", 7777, {}};

Listing rulesOf(const std::string &program) {
    return listRules(program);
}

/// Writes files until neither a byte nor a name has room.
void fill(const std::string &directory) {
    const std::string block(4096, 'x');
    for (int i = 0; i < 1000; ++i) {
        const int file = open((directory + "/fill" + std::to_string(i)).c_str(), O_WRONLY | O_CREAT, 0600);
        if (file < 0) {
            return;
        }
        while (write(file, block.data(), block.size()) > 0) {
        }
        close(file);
    }
    FAIL() << directory << " does not fill up";
}

class TryTest : public ToolTest {
protected:
    void SetUp() override {
        std::string reason;
        if (!realIptables(&reason)) {
            GTEST_SKIP() << reason;
        }
        ToolTest::SetUp();
        createFirewallChains();
        writeFile(PROFILES + "1.json", R"({"name": "default", "adapterPolicyMap": {"eth9": 0}})");
        writeFile(PROFILES + "2.json", R"({"name": "closed", "adapterPolicyMap": {"eth9": 1}, "rules": null})");
        m_client.emplace("client");
        addVethPair("eth9", *m_client, "eth0");
        addAddress("eth9", "10.9.0.1/24");
        addAddress("eth0", "10.9.0.2/24", &*m_client);
        setUp("eth9");
        setUp("eth0", &*m_client);
        m_server.emplace(std::vector<uint16_t>{SERVER.port});
    }

    void enable() {
        const ProgramResult result = runTool({"enable"});
        ASSERT_EQ(0, result.status) << result.errors;
    }
    void begin(const std::vector<std::string> &options = {"--timeout", "600"}) {
        std::vector<std::string> command = {"try", "closed"};
        command.insert(command.end(), options.begin(), options.end());
        const ProgramResult result = runTool(command);
        ASSERT_EQ(0, result.status) << result.errors;
    }
    ProbeResult probe() { return probeTcp(SERVER, &*m_client); }
    static Json::Value status() { return parseJson(runTool({"try", "--status", "--json"}).output); }
    /// Waits for the end of the trial. @return its phase
    static std::string ended() {
        Json::Value now = status();
        for (int i = 0; i < 600 && now["trial"].asBool(); ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
            now = status();
        }
        return now["phase"].asString();
    }
    static bool hasTrialCopy() { return !storedProfile(".test_closed").isNull(); }

    std::optional<NetworkNamespace> m_client;
    std::optional<EchoServer> m_server;
};

TEST_F(TryTest, WhatWasBeforeComesBackWithoutAWord) {
    for (const bool isOn : {false, true}) {
        if (isOn) {
            enable();
        }
        const Listing v4 = rulesOf("/sbin/iptables");
        const Listing v6 = rulesOf("/sbin/ip6tables");
        for (const bool atomic : {false, true}) {
            begin(atomic ? Listing{"--timeout", "3", "--atomic"} : Listing{"--timeout", "3"});
            EXPECT_EQ(ProbeResult::timedOut, probe());
            EXPECT_EQ("on trial", status()["phase"].asString());
            EXPECT_EQ("taken back", ended());
            EXPECT_EQ(v4, rulesOf("/sbin/iptables"));
            EXPECT_EQ(v6, rulesOf("/sbin/ip6tables"));
            EXPECT_EQ(ProbeResult::connected, probe());
            EXPECT_FALSE(hasTrialCopy());
            EXPECT_EQ(isOn, parseJson(runTool({"status", "--json"}).output)["enabled"].asBool());
        }
    }
}

TEST_F(TryTest, AConfirmedProfileIsActiveAndInForceAlsoOnTheFirstStart) {
    for (const bool isOn : {false, true}) {
        begin();
        const ProgramResult result = runTool({"try", "--confirm"});
        EXPECT_EQ(0, result.status) << result.errors;
        EXPECT_EQ("kept", ended());
        EXPECT_EQ(ProbeResult::timedOut, probe());
        const Json::Value now = parseJson(runTool({"status", "--json"}).output);
        EXPECT_EQ("closed", now["profile"].asString());
        EXPECT_TRUE(now["enabled"].asBool()) << isOn;
        EXPECT_FALSE(hasTrialCopy());
        EXPECT_EQ(3, runTool({"try", "--confirm"}).status);
        EXPECT_EQ(2, runTool({"try", "closed"}).status);  // nothing to go back to
        EXPECT_EQ(0, runTool({"profile", "use", "default"}).status);
    }
}

TEST_F(TryTest, TheWatchOutlivesTheToolItsTerminalAndItsGroup) {
    enable();
    for (const int number : {SIGKILL, SIGHUP}) {
        int terminal = -1;
        const pid_t tool = forkpty(&terminal, nullptr, nullptr, nullptr);
        if (tool == 0) {
            execl(VELDFWCTL, "veldfwctl", "try", "closed", "--timeout", "3", static_cast<char *>(nullptr));
            _exit(127);
        }
        for (int i = 0; i < 600 && !status()["trial"].asBool(); ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        ASSERT_TRUE(status()["trial"].asBool());
        kill(-tool, number);  // while the rules are being applied, or right after
        close(terminal);
        waitForChild(tool);
        EXPECT_EQ("taken back", ended());
        EXPECT_EQ(ProbeResult::connected, probe());
        EXPECT_FALSE(hasTrialCopy());
    }
}

TEST_F(TryTest, FullDisksDoNotKeepTheWatchFromGoingBack) {
    enable();
    const Listing v4 = rulesOf("/sbin/iptables");
    for (const std::string directory : {"/usr/veld/etc/firewall.d", "/run/veld", "/var/lock/firewall", "/tmp"}) {
        makeDirectories(directory);
        const std::string copy = "/usr/veld/copy" + std::filesystem::path(directory).filename().string();
        std::filesystem::copy(directory, copy, std::filesystem::copy_options::recursive);
        ASSERT_EQ(0, mount("tmpfs", directory.c_str(), "tmpfs", 0, "size=256k,nr_inodes=64,mode=1777"));
        std::filesystem::copy(copy, directory, std::filesystem::copy_options::recursive);
    }
    for (const std::string end : {"", "--revert"}) {
        begin({"--timeout", end.empty() ? "3" : "600"});
        for (const char *directory : {"/usr/veld/etc/firewall.d", "/run/veld", "/var/lock/firewall", "/tmp"}) {
            fill(directory);
        }
        if (!end.empty()) {
            const ProgramResult kept = runTool({"try", "--confirm"});
            EXPECT_EQ(3, kept.status);
            EXPECT_THAT(kept.errors, HasSubstr("it stays on trial"));
            EXPECT_EQ(0, runTool({"try", end}).status);
        }
        EXPECT_EQ("taken back", ended());
        EXPECT_EQ(v4, rulesOf("/sbin/iptables"));
        EXPECT_TRUE(parseJson(runTool({"status", "--json"}).output)["enabled"].asBool());
        // With the disks still full no trial begins, and nothing changes.
        const ProgramResult refused = runTool({"try", "closed"});
        EXPECT_EQ(3, refused.status);
        EXPECT_THAT(refused.errors, HasSubstr("nothing was changed"));
        EXPECT_EQ(v4, rulesOf("/sbin/iptables"));
        for (const char *directory : {"/usr/veld/etc/firewall.d", "/run/veld", "/var/lock/firewall", "/tmp"}) {
            for (const std::string &name : listDirectory(directory)) {
                if (name.rfind("fill", 0) == 0) {
                    removeAll(directory + std::string("/") + name);
                }
            }
        }
        EXPECT_FALSE(hasTrialCopy());
    }
}

TEST_F(TryTest, AClientThatIsCutOffGetsItsConnectionBack) {
    enable();
    Connection mine(SERVER, &*m_client);
    ASSERT_EQ(ProbeResult::connected, mine.exchange());
    begin({"--timeout", "4", "--client", "10.9.0.2"});
    EXPECT_EQ(ProbeResult::timedOut, mine.exchange());
    EXPECT_EQ("taken back", ended());
    EXPECT_EQ(ProbeResult::connected, probe());
    // The first exchange may find the lines that were lost meanwhile.
    ProbeResult result = ProbeResult::timedOut;
    for (int i = 0; i < 10 && result != ProbeResult::connected; ++i) {
        result = mine.exchange();
    }
    EXPECT_EQ(ProbeResult::connected, result);
}

TEST_F(TryTest, OfManyAnswersAtOnceExactlyOneCounts) {
    for (int round = 0; round < 3; ++round) {
        enable();
        begin();
        std::vector<pid_t> askers;
        for (int i = 0; i < 6; ++i) {
            askers.push_back(startChild([i] {
                return runTool({"try", i % 2 == 0 ? "--confirm" : "--revert"}).status;
            }));
        }
        std::optional<bool> kept;
        for (size_t i = 0; i < askers.size(); ++i) {
            const int result = waitForChild(askers[i]);
            EXPECT_THAT(result, testing::AnyOf(0, 3));
            if (result == 0) {
                EXPECT_FALSE(kept.has_value()) << "two answers counted";
                kept = i % 2 == 0;
            }
        }
        ASSERT_TRUE(kept.has_value());
        EXPECT_EQ(*kept ? "kept" : "taken back", ended());
        EXPECT_EQ(*kept ? ProbeResult::timedOut : ProbeResult::connected, probe());
        EXPECT_EQ(*kept ? "closed" : "default", parseJson(runTool({"status", "--json"}).output)["profile"].asString());
        EXPECT_EQ(0, runTool({"profile", "use", "default"}).status);
    }
}

TEST_F(TryTest, AProfileThatCannotBeAppliedLeavesEverythingAsItWas) {
    writeFile(PROFILES + "2.json", R"({"name": "closed", "adapterPolicyMap": {"eth9": 1}, "rules": {
      "eth9": [{"name": "bad", "enable": true, "adapterDirect": 1, "protocol": 1, "policy": 1, "blLog": false,
                "table": "filter", "ipType": 0, "ipDirect": 1, "ipGroup": 0, "ipList": ["300.1.1.1"], "portDirect": 0,
                "portGroup": 3, "portList": []}]}})");
    for (const bool isOn : {false, true}) {
        if (isOn) {
            enable();
        }
        const Listing v4 = rulesOf("/sbin/iptables");
        for (const bool atomic : {false, true}) {
            const ProgramResult result = runTool({"try", "closed", atomic ? "--atomic" : "--timeout=60"});
            EXPECT_EQ(3, result.status);
            EXPECT_THAT(result.errors, HasSubstr("Cannot apply profile \"closed\""));
            EXPECT_THAT(result.errors, HasSubstr("300.1.1.1"));
            EXPECT_EQ(v4, rulesOf("/sbin/iptables"));
            EXPECT_EQ(isOn, parseJson(runTool({"status", "--json"}).output)["enabled"].asBool());
            EXPECT_FALSE(status()["trial"].asBool());
        }
    }
}

TEST_F(TryTest, AnAtomicApplyHoldsNothingUpAndAFailedOneLeavesTheFirewallOn) {
    const ProgramResult enabled = runTool({"enable", "--atomic"});
    EXPECT_EQ(0, enabled.status) << enabled.errors;
    EXPECT_THAT(enabled.output, HasSubstr("New traffic was not held up.\nThe firewall is on"));
    EXPECT_GT(parseJson(runTool({"reload", "--json"}).output)["heldUpMilliseconds"].asInt(), 0);
    EXPECT_EQ(0, parseJson(runTool({"reload", "--atomic", "--json"}).output)["heldUpMilliseconds"].asInt());
    const Listing v4 = rulesOf("/sbin/iptables");
    writeFile(PROFILES + "1.json", readFile(PROFILES + "1.json")
                                       .replace(0, 1,
                                                R"({"rules": {
      "eth9": [{"name": "bad", "enable": true, "adapterDirect": 1, "protocol": 1, "policy": 1, "blLog": false,
                "table": "filter", "ipType": 0, "ipDirect": 1, "ipGroup": 0, "ipList": ["300.1.1.1"], "portDirect": 0,
                "portGroup": 3, "portList": []}]}, "n": )"
                                                "0, "));
    for (const std::string verb : {"reload", "enable"}) {
        const ProgramResult failed = runTool({verb, "--atomic"});
        EXPECT_EQ(3, failed.status);
        EXPECT_THAT(failed.errors, HasSubstr("adapter eth9, rule 1 \"bad\""));
        EXPECT_THAT(failed.errors, HasSubstr("300.1.1.1"));
        EXPECT_THAT(failed.errors, HasSubstr("still marked as on"));
        EXPECT_EQ(v4, rulesOf("/sbin/iptables"));
    }
}

TEST_F(TryTest, OneTrialAtATimeAndOneWithoutAWatchCanOnlyBeTakenBack) {
    enable();
    const Listing v4 = rulesOf("/sbin/iptables");
    begin();
    const ProgramResult second = runTool({"try", "closed"});
    EXPECT_EQ(3, second.status);
    EXPECT_THAT(second.errors, HasSubstr("Another trial is under way"));
    kill(status()["watch"].asInt(), SIGTERM);  // as when the machine shuts down
    EXPECT_EQ("taken back", ended());
    EXPECT_EQ(v4, rulesOf("/sbin/iptables"));
    begin();
    const pid_t watch = status()["watch"].asInt();
    ASSERT_GT(watch, 1);
    kill(watch, SIGKILL);
    for (int i = 0; i < 100 && status()["phase"] != "abandoned"; ++i) {
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    EXPECT_THAT(runTool({"try", "--confirm"}).errors, HasSubstr("is gone"));
    EXPECT_EQ(ProbeResult::timedOut, probe());
    EXPECT_EQ(0, runTool({"try", "--revert"}).status);
    EXPECT_EQ(v4, rulesOf("/sbin/iptables"));
    EXPECT_EQ(3, runTool({"try", "--revert"}).status);
}

TEST_F(TryTest, WrongUseChangesNothing) {
    const std::vector<std::vector<std::string>> cases = {
        {"try"},
        {"try", "closed", "--confirm"},
        {"try", "nowhere"},
        {"try", "closed", "--timeout", "0"},
        {"try", "closed", "--client", "host.example"},
    };
    for (const auto &command : cases) {
        EXPECT_EQ(2, runTool(command).status) << testing::PrintToString(command);
        EXPECT_EQ(1, runTool({"try", "--status"}).status);
    }
}

}  // namespace

}  // namespace veldtest
