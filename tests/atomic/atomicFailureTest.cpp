// SPDX-License-Identifier: Apache-2.0
// A refused apply leaves everything as it was, and tells what stopped it.
#include <unistd.h>

#include <chrono>
#include <functional>
#include <thread>

#include "files.h"
#include "kernelTest.h"
#include "processes.h"

using namespace veldtest;
using testing::HasSubstr;

namespace {

void runShell(const std::string &script) {
    runChecked({"/bin/sh", "-ec", script});
}

FW::FWRULE mangleRule(const std::string &name, const std::string &address) {
    FW::FWRULE rule = addressRule(name, address);
    rule.table = "mangle";
    return rule;
}

/// A match that the kernel refuses in these chains, and only at the commit.
const std::string ownerMatch = " -m owner --uid-owner 0";

class AtomicFailure : public KernelTest {
protected:
    /// Old rules with counters in the firewall chains, a neighbour's chain, rules of other tables.
    void SetUp() override {
        KernelTest::SetUp();
        if (IsSkipped())
            return;
        store(profileOf({addressRule("old", "10.0.0.9"), addressRule("old", "fd00::9", FW::FW_IP_TYPE_V6)}));
        ASSERT_TRUE(firewall.fwReloadAtomic(true)) << log.text();
        for (const std::string program : {"iptables", "ip6tables"}) {
            runShell(program + " -N NEIGHBOUR && " + program +
                     " -A NEIGHBOUR -m comment --comment 'a \"b\\' -j DROP && " + program +
                     " -A INPUT -j NEIGHBOUR && " + program + " -t raw -A PREROUTING -i eth0 -j RETURN && " + program +
                     " -t mangle -A PREROUTING -j RETURN && " + program + " -A INPUT_FIREWALL -c 5 500 -j LOG");
        }
    }

    struct Case {
        const char *what;
        std::vector<FW::FWRULE> rules;
        FW::FwApplyFailure expected;  ///< texts that the failure holds; position and adapter exact
    };

    void expectAsBefore(const Case &test) {
        store(profileOf(test.rules));
        const std::string before = allRules();
        FW::FwApplyFailure failure;
        log.clear();
        EXPECT_FALSE(firewall.fwReloadAtomic(true, failure));
        EXPECT_EQ(allRules(), before);
        EXPECT_TRUE(isSwitchedOn());
        EXPECT_TRUE(execLockIsFree());
        EXPECT_EQ(failure.profile, "default");
        EXPECT_EQ(failure.family, test.expected.family);
        EXPECT_EQ(failure.adapter, test.expected.adapter);
        EXPECT_EQ(failure.rulePosition, test.expected.rulePosition);
        EXPECT_EQ(failure.ruleName, test.expected.ruleName);
        EXPECT_EQ(failure.command, test.expected.command);
        EXPECT_THAT(failure.message, HasSubstr(test.expected.message));
        std::string logged = "the old ones stay in force: profile default";
        if (failure.rulePosition >= 0)
            logged += ": adapter " + failure.adapter + ": rule " + std::to_string(failure.rulePosition) + " \"" +
                      failure.ruleName + "\": " + failure.family + ": \"" + failure.command + "\": ";
        EXPECT_TRUE(log.contains(logged)) << log.text();
        EXPECT_FALSE(log.contains("put the old rules")) << log.text();
    }
};

TEST_P(AtomicFailure, OfARuleLeavesEverythingAsItWasAndNamesIt) {
    const FW::FWRULE good = addressRule("good", "10.0.0.1");
    const bool nft = std::string(GetParam()) == "nft";
    FW::FWRULE jump = addressRule("jump", "10.0.0.2 -j NEIGHBOUR");
    jump.policy = FW::FW_POLICY_ALLOW;
    const Case cases[] = {
        {"refused when tried, v4",
         {good, addressRule("bad", "10.0.0.300")},
         {"default", "eth0", 1, "bad", "v4",
          "/sbin/iptables -t filter -A FORWARD_FIREWALL -i eth0 -s 10.0.0.300 -j DROP",
          "host/network `10.0.0.300' not found"}},
        {"refused when tried, v6",
         {good, good, addressRule("both", "10.0.0.1", FW::FW_IP_TYPE_BOTH)},
         {"default", "eth0", 2, "both", "v6",
          "/sbin/ip6tables -t filter -A FORWARD_FIREWALL -i eth0 -s 10.0.0.1 -j DROP",
          "host/network `10.0.0.1' not found"}},
        {"refused by the kernel at the commit, v6: v4 is committed before",
         {good, addressRule("local", "fd00::7" + ownerMatch, FW::FW_IP_TYPE_V6)},
         {"default", "eth0", 1, "local", "v6",
          "/sbin/ip6tables -t filter -A FORWARD_FIREWALL -i eth0 -s fd00::7" + ownerMatch + " -j DROP", "failed"}},
        {"refused by the kernel in another table: filter is committed before",
         {good, mangleRule("local", "10.0.0.7" + ownerMatch)},
         {"default", "eth0", 1, "local", "v4",
          "/sbin/iptables -t mangle -A INPUT_FIREWALL -i eth0 -s 10.0.0.7" + ownerMatch + " -j DROP", "failed"}},
        {"rules of another table are taken out again",
         {mangleRule("mangle", "10.0.0.7"), addressRule("local", "fd00::7" + ownerMatch, FW::FW_IP_TYPE_V6),
          mangleRule("mangle", "10.0.0.8")},
         {"default", "eth0", 1, "local", "v6",
          "/sbin/ip6tables -t filter -A FORWARD_FIREWALL -i eth0 -s fd00::7" + ownerMatch + " -j DROP", "failed"}},
        {"refused by the kernel at the commit only",
         {good, addressRule("local", "10.0.0.1" + ownerMatch), addressRule("local", "10.0.0.2")},
         {"default", "eth0", 1, "local", "v4",
          "/sbin/iptables -t filter -A FORWARD_FIREWALL -i eth0 -s 10.0.0.1" + ownerMatch + " -j DROP",
          nft ? "RULE_APPEND failed (Invalid argument)" : "failed"}},
        {"unknown target",
         {addressRule("local", "10.0.0.1 -m comment --comment \"#x"), addressRule("aim", "10.0.0.1 -g NOWHERE")},
         {"default", "eth0", 1, "aim", "v4",
          "/sbin/iptables -t filter -A FORWARD_FIREWALL -i eth0 -s 10.0.0.1 -g NOWHERE -j DROP", ""}},
        {"a string with a line break",
         {good, addressRule("two lines", "10.0.0.1\n-A INPUT_FIREWALL -j ACCEPT")},
         {"default", "eth0", 1, "two lines", "v4",
          "/sbin/iptables -t filter -A FORWARD_FIREWALL -i eth0 -s 10.0.0.1\n-A INPUT_FIREWALL -j ACCEPT -j DROP",
          "line break"}}};
    for (const Case &test : cases) {
        SCOPED_TRACE(test.what);
        expectAsBefore(test);
    }
}

TEST_P(AtomicFailure, OfWhatTheSystemLacksLeavesEverythingAsItWas) {
    const auto expectFailure = [this](const std::string &family, const std::string &message) {
        SCOPED_TRACE(message);
        expectAsBefore({"", {addressRule("new", "10.0.0.1")}, {"default", "", -1, "", family, "", message}});
    };
    rename("/sbin/ip6tables-restore", "/sbin/away");
    expectFailure("v6", "/sbin/ip6tables-restore: cannot be started: No such file or directory");
    rename("/sbin/away", "/sbin/ip6tables-restore");
    rename("/sbin/ip6tables-save", "/sbin/away");
    {  // the state is listed by the program that is away
        const std::string before = rulesOf();
        EXPECT_FALSE(firewall.fwReloadAtomic(true));
        EXPECT_EQ(rulesOf(), before);
    }
    rename("/sbin/away", "/sbin/ip6tables-save");
    runShell("ip6tables -D FORWARD -j FORWARD_FIREWALL; ip6tables -F FORWARD_FIREWALL; ip6tables -X FORWARD_FIREWALL");
    expectFailure("v6", "-F FORWARD_FIREWALL: ");
    runShell("iptables -D FORWARD -j FORWARD_FIREWALL; iptables -F FORWARD_FIREWALL; iptables -X FORWARD_FIREWALL");
    expectFailure("v4", "-F FORWARD_FIREWALL: ");
}

TEST_P(AtomicFailure, OfTheSecondFamilyPutsTheFirstBackWithItsCounters) {
    const auto v4 = [] { return runChecked({"/bin/sh", "-c", "iptables-save -c | grep -v '^#'"}); };
    const std::string before = v4();
    ASSERT_THAT(before, HasSubstr("[5:500] -A INPUT_FIREWALL"));
    const auto failAtCommit = [](const std::string &ending) {
        writeFile("/sbin/ip6tables-restore",
                  "#!/bin/sh\ncase \"$*\" in *--test*) exec /sbin/ip6tables-real \"$@\";; *--counters*) exec "
                  "/sbin/ip6tables-real \"$@\";; esac\niptables -S > /tmp/meanwhile\n" +
                      ending,
                  0755);
    };
    const std::string name = std::string("/usr/sbin/ip6tables-") + GetParam() + "-restore";
    writeFile("/sbin/ip6tables-real", "#!/bin/sh\nexec " + name + " \"$@\"\n", 0755);
    for (const auto &[ending, message] :
         {std::pair("echo no luck >&2; exit 3", "no luck"), std::pair("kill -9 $$", "killed by signal 9"),
          std::pair("/sbin/ip6tables-real \"$@\"; kill -9 $$", "killed by signal 9")}) {
        SCOPED_TRACE(ending);
        failAtCommit(ending);
        expectAsBefore({"", {addressRule("new", "10.0.0.1")}, {"default", "", -1, "", "v6", "", message}});
        EXPECT_THAT(readFile("/tmp/meanwhile"), HasSubstr("10.0.0.1")) << "the first family was not committed before";
        EXPECT_EQ(v4(), before);
    }
}

TEST_P(AtomicFailure, OfTheLockEndsAndWaitingForItSucceeds) {
    if (std::string(GetParam()) == "nft")
        GTEST_SKIP() << "iptables-nft takes no lock";
    store(profileOf({addressRule("new", "10.0.0.1")}));
    const pid_t holder = startChild([] {
        execlp("flock", "flock", "/run/xtables.lock", "sleep", "0.5", nullptr);
        return 1;
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
    EXPECT_TRUE(firewall.fwReloadAtomic(true)) << log.text();
    EXPECT_EQ(waitForChild(holder), 0);
}

TEST_P(AtomicFailure, OfABareCommandListIsToldToo) {
    const std::string before = allRules();
    Json::Value commands;
    // A chain of the neighbour's: nothing is flushed there, but what was appended is taken out.
    commands["v4"]["some"].append("-A NEIGHBOUR -m comment --comment a -j DROP");
    commands["v6"]["some"].append("-A INPUT_FIREWALL -j NOWHERE");
    EXPECT_FALSE(firewall.fwExecAtomic(commands));
    EXPECT_EQ(allRules(), before);
    commands = Json::Value();
    commands["v6"]["some"].append("-A INPUT_FIREWALL -j DROP");
    commands["v6"]["some"].append("-D INPUT_FIREWALL -j DROP");
    FW::FwApplyFailure failure;
    EXPECT_FALSE(firewall.fwExecAtomic(commands, failure));
    EXPECT_EQ(failure.command, "/sbin/ip6tables -D INPUT_FIREWALL -j DROP");
    EXPECT_EQ(failure.adapter, "some");
    EXPECT_EQ(failure.profile, "");
    EXPECT_EQ(allRules(), before);
    commands["v6"]["some"].resize(1);
    const std::string v4 = runChecked({"/sbin/iptables-save"});
    EXPECT_TRUE(firewall.fwExecAtomic(commands)) << log.text();
    EXPECT_EQ(runChecked({"/sbin/ip6tables", "-S", "INPUT_FIREWALL"}),
              "-N INPUT_FIREWALL\n-A INPUT_FIREWALL -j DROP\n");
    EXPECT_EQ(runChecked({"/sbin/ip6tables", "-S", "FORWARD_FIREWALL"}), "-N FORWARD_FIREWALL\n");
    EXPECT_THAT(runChecked({"/sbin/iptables", "-S"}), HasSubstr("10.0.0.9")) << "v4 is not in the list";
}

INSTANTIATE_TEST_SUITE_P(Backend, AtomicFailure, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
