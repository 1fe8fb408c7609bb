// SPDX-License-Identifier: Apache-2.0
// The support for tests holds what it promises.
#include "commandRecorder.h"
#include "connections.h"
#include "files.h"
#include "network.h"
#include "processes.h"
#include "realIptables.h"
#include "sandbox.h"
#include "systemLog.h"

#include <gtest/gtest.h>
#include <syslog.h>
#include <unistd.h>

#include <csignal>

using namespace veldtest;

namespace {

TEST(Sandbox, AnyPathCanBeCreatedOrReplaced) {
    ASSERT_TRUE(inSandbox());
    for (const std::string path :
         {"/usr/veld/etc/firewall.d/1.json", "/etc.defaults/veldinfo.conf", "/var/lock/firewall/a.lock",
          "/sbin/iptables", "/usr/share/xt_geoip/DE.iv4", "/lib/modules/test/modules.dep", "/etc/services",
          "/run/ppp-pppoe.pid", "/tmp/iptables_serv_mod_list"}) {
        writeFile(path, "text of " + path);
        EXPECT_EQ(readFile(path), "text of " + path);
    }
}

TEST(Sandbox, WhatBelongsToTheMachineIsHidden) {
    for (const char *directory : {"/usr/veld", "/var/lock", "/sys/module", "/lib/modules"})
        EXPECT_TRUE(listDirectory(directory).empty()) << directory;
    EXPECT_FALSE(pathExists("/dev/log"));
    EXPECT_EQ(runProgram({"dd", "if=/dev/zero", "of=/dev/full", "count=1"}).status, 1);
    const auto links = runChecked({"ip", "-br", "link", "show"});
    EXPECT_EQ(links.substr(0, 3), "lo ");
    EXPECT_EQ(links.find('\n'), links.size() - 1) << links;
}

TEST(Processes, ResultsOfChildrenAndProgramsAreSeen) {
    EXPECT_EQ(runInChild([] { return raise(SIGKILL); }), 128 + SIGKILL);
    const auto result = runProgram({"sh", "-c", "echo out; echo err >&2; exit 3"});
    EXPECT_EQ(result.status, 3);
    EXPECT_EQ(result.output, "out\n");
    EXPECT_EQ(result.errors, "err\n");
    EXPECT_THROW(runProgram({"/no/such/program"}), std::exception);
}

TEST(SystemLog, MessagesArriveInOrderEvenInLargeNumbersAndAtASecondLog) {
    for (int turn = 0; turn < 2; ++turn) {
        SystemLog log;
        openlog("tester", LOG_PID, LOG_DAEMON);
        for (int i = 0; i < 2000; ++i)
            syslog(LOG_ERR, "veldFW.cpp:%d message", i);
        runInChild([] {
            syslog(LOG_DEBUG, "from: a child");
            return 0;
        });
        const auto messages = log.messages();
        ASSERT_EQ(messages.size(), 2001u);
        EXPECT_EQ(messages[1999].text, "veldFW.cpp:1999 message");
        EXPECT_EQ(messages[1999].priority, LOG_ERR);
        EXPECT_EQ(messages[2000].text, "from: a child");
        EXPECT_EQ(messages[2000].priority, LOG_DEBUG);
    }
}

TEST(CommandRecorder, RunsAreToldApartAndFailAsTold) {
    {
        CommandRecorder recorder;
        const int leaked = dup(1);  // without close-on-exec
        runProgram({"/sbin/iptables", "-A", "two words", "", "x\ny"});
        close(leaked);
        recorder.failAt(2, 4, "locked");
        recorder.failMatching("-j BAD", 2, "Bad argument");
        const auto second = runProgram({"/sbin/ip6tables", "-F"});
        EXPECT_EQ(second.status, 4);
        EXPECT_EQ(second.errors, "locked\n");
        EXPECT_EQ(runProgram({"/sbin/iptables", "-F"}).status, 0);
        EXPECT_EQ(runProgram({"/sbin/iptables", "-A", "X", "-j", "BAD"}).errors, "Bad argument\n");
        const auto commands = recorder.commands();
        ASSERT_EQ(commands.size(), 4u);
        EXPECT_EQ(commands[0].arguments, (std::vector<std::string>{"-A", "two words", "", "x\ny"}));
        EXPECT_EQ(commands[0].inheritedHandles, std::vector<int>{leaked});
        EXPECT_TRUE(commands[1].inheritedHandles.empty());
        EXPECT_EQ(commands[3].line(), "/sbin/iptables -A X -j BAD");
        recorder.clear();
        EXPECT_EQ(runProgram({"/sbin/iptables", "-A", "X", "-j", "BAD"}).status, 0);
        EXPECT_EQ(recorder.lines().size(), 1u);
    }
    EXPECT_EQ(runProgram({"/sbin/iptables", "--version"}).output.substr(0, 8), "iptables");
}

class TwoNetworks : public testing::TestWithParam<const char *> {
protected:
    void SetUp() override {
        addVethPair("eth0", m_client, "client0");
        for (const char *address : {"10.1.0.1/24", "fd01::1/64"})
            addAddress("eth0", address);
        for (const char *address : {"10.1.0.2/24", "fd01::2/64"})
            addAddress("client0", address, &m_client);
        setUp("eth0");
        setUp("client0", &m_client);
    }

    NetworkNamespace m_client{"client"};
};

TEST_P(TwoNetworks, RealRulesDecideWhatAClientReaches) {
    if (!useIptablesBackend(GetParam()))
        GTEST_SKIP() << "no iptables-" << GetParam() << " on this machine";
    std::string reason;
    if (!realIptables(&reason))
        GTEST_SKIP() << "iptables-" << GetParam() << " does not work here: " << reason;
    createFirewallChains();
    EchoServer server({80, 81});
    Connection established({"10.1.0.1", 81}, &m_client);
    for (const auto &[program, address] : {std::pair{"/sbin/iptables", "10.1.0.1"}, {"/sbin/ip6tables", "fd01::1"}}) {
        SCOPED_TRACE(program);
        EXPECT_EQ(probeTcp({address, 81}, &m_client), ProbeResult::connected);
        EXPECT_EQ(probeUdp({address, 81}, &m_client), ProbeResult::connected);
        EXPECT_EQ(probeTcp({address, 82}, &m_client), ProbeResult::refused);
        EXPECT_EQ(probeUdp({address, 82}, &m_client), ProbeResult::refused);
        runChecked({program, "-A", "INPUT_FIREWALL", "-p", "tcp", "--dport", "81", "-j", "DROP"});
        runChecked({program, "-A", "INPUT_FIREWALL", "-p", "udp", "--dport", "81", "-j", "DROP"});
        EXPECT_EQ(probeTcp({address, 80}, &m_client), ProbeResult::connected);
        EXPECT_EQ(probeTcp({address, 81}, &m_client), ProbeResult::timedOut);
        EXPECT_EQ(probeUdp({address, 81}, &m_client), ProbeResult::timedOut);
        EXPECT_EQ(listRules(program, "INPUT_FIREWALL").size(), 3u);
    }
    EXPECT_EQ(established.exchange(), ProbeResult::timedOut);
    runChecked({"/sbin/iptables", "-F", "INPUT_FIREWALL"});
    EXPECT_EQ(established.exchange(std::chrono::seconds(10)), ProbeResult::connected);
}

INSTANTIATE_TEST_SUITE_P(Backends, TwoNetworks, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
