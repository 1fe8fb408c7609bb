// SPDX-License-Identifier: Apache-2.0
// A refused apply leaves everything as it was, and tells what stopped it.
#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <thread>
#include <tuple>

#include "caseTable.h"
#include "files.h"
#include "kernelTest.h"
#include "processes.h"
#include "textEscapes.h"

using namespace veldtest;
using testing::HasSubstr;

namespace {

void runShell(const std::string &script) {
    runChecked({"/bin/sh", "-ec", script});
}

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

    /// Tries to apply these rules.
    /// @param expected its message is a part of what comes
    void expectAsBefore(const std::vector<FW::FWRULE> &rules, const FW::FwApplyFailure &expected) {
        store(profileOf(rules));
        const std::string before = allRules();
        FW::FwApplyFailure failure;
        log.clear();
        EXPECT_FALSE(firewall.fwReloadAtomic(true, failure));
        EXPECT_EQ(allRules(), before);
        EXPECT_TRUE(isSwitchedOn());
        EXPECT_TRUE(execLockIsFree());
        const auto whole = [](const FW::FwApplyFailure &told) {
            return std::tie(told.profile, told.adapter, told.rulePosition, told.ruleName, told.family, told.command);
        };
        EXPECT_EQ(whole(failure), whole(expected));
        EXPECT_THAT(failure.message, HasSubstr(expected.message));
        std::string logged = "the old ones stay in force: profile default";
        if (failure.rulePosition >= 0)
            logged += ": adapter " + failure.adapter + ": rule " + std::to_string(failure.rulePosition) + " \"" +
                      failure.ruleName + "\": " + failure.family + ": \"" + failure.command + "\": ";
        EXPECT_TRUE(log.contains(logged)) << log.text();
        EXPECT_FALSE(log.contains("put the old rules")) << log.text();
    }
};

/// A rule of cases/refusedRules.cases.
FW::FWRULE ruleOf(const std::string &text) {
    const size_t equals = text.find('=');
    const bool isMangle = text.rfind("mangle ", 0) == 0;
    FW::FWRULE rule =
        addressRule(text.substr(isMangle ? 7 : 0, equals - (isMangle ? 7 : 0)), unescaped(text.substr(equals + 1)));
    rule.ipType = rule.ipList[0][0] == 'f' ? FW::FW_IP_TYPE_V6 : FW::FW_IP_TYPE_V4;
    rule.ipType = rule.name == "both" ? FW::FW_IP_TYPE_BOTH : rule.ipType;
    rule.table = isMangle ? "mangle" : "filter";
    return rule;
}

TEST_P(AtomicFailure, OfARuleLeavesEverythingAsItWasAndNamesIt) {
    for (const auto &row : readCases(VELD_CASE_DIRECTORY "refusedRules.cases", 4)) {
        SCOPED_TRACE(row[0]);
        std::vector<FW::FWRULE> rules;
        for (const std::string &text : split(row[0], ';'))
            rules.push_back(ruleOf(text.substr(text.find_first_not_of(' '))));
        const int position = std::stoi(row[1]);
        const FW::FWRULE &refused = rules.at(static_cast<size_t>(position));
        const std::string family = row[2].substr(0, 2);
        const std::string command = (family == "v4" ? "/sbin/iptables -t " : "/sbin/ip6tables -t ") + refused.table +
                                    " -A " + row[2].substr(3) + " -i eth0 -s " + refused.ipList[0] + " -j DROP";
        expectAsBefore(rules, {"default", "eth0", position, refused.name, family, command, row[3]});
    }
}

TEST_P(AtomicFailure, OfWhatTheSystemLacksLeavesEverythingAsItWas) {
    const auto expectFailure = [this](const std::string &family, const std::string &message) {
        SCOPED_TRACE(message);
        expectAsBefore({addressRule("new", "10.0.0.1")}, {"default", "", -1, "", family, "", message});
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
    const std::string name = std::string("/usr/sbin/ip6tables-") + GetParam() + "-restore";
    writeFile("/sbin/ip6tables-real", "#!/bin/sh\nexec " + name + " \"$@\"\n", 0755);
    for (const auto &[ending, message] :
         {std::pair("echo no luck >&2; exit 3", "no luck"), std::pair("kill -9 $$", "killed by signal 9"),
          std::pair("/sbin/ip6tables-real \"$@\"; kill -9 $$", "killed by signal 9")}) {
        SCOPED_TRACE(ending);
        writeFile("/sbin/ip6tables-restore",
                  std::string("#!/bin/sh\ncase \"$*\" in *--test* | *--counters*) exec /sbin/ip6tables-real "
                              "\"$@\";; esac\niptables -S > /tmp/meanwhile\n") +
                      ending,
                  0755);
        expectAsBefore({addressRule("new", "10.0.0.1")}, {"default", "", -1, "", "v6", "", message});
        EXPECT_THAT(readFile("/tmp/meanwhile"), HasSubstr("10.0.0.1")) << "the first family was not committed before";
        EXPECT_EQ(v4(), before);
    }
}

TEST_P(AtomicFailure, OfTheLockEndsAndWaitingForItSucceeds) {
    if (std::string(GetParam()) == "nft")
        GTEST_SKIP() << "iptables-nft takes no lock";
    const auto hold = [](unsigned seconds) {
        const pid_t holder = startChild([seconds] {
            return flock(open("/run/xtables.lock", O_RDWR | O_CREAT | O_CLOEXEC, 0600), LOCK_EX) +
                   static_cast<int>(sleep(seconds));
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(200));
        return holder;
    };
    const pid_t shortHolder = hold(1);
    store(profileOf({addressRule("new", "10.0.0.1")}));
    EXPECT_TRUE(firewall.fwReloadAtomic(true)) << log.text();
    EXPECT_EQ(waitForChild(shortHolder), 0);

    const pid_t holder = hold(600);
    store(profileOf({addressRule("bad", "10.0.0.1/33")}));
    FW::FwApplyFailure failure;
    EXPECT_FALSE(firewall.fwReloadAtomic(true, failure));
    EXPECT_EQ(failure.ruleName, "bad") << "the trial needs no lock: " << failure.message;
    expectAsBefore({addressRule("new", "10.0.0.2")}, {"default", "", -1, "", "v4", "", "xtables lock"});
    kill(holder, SIGKILL);
    waitForChild(holder);
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
