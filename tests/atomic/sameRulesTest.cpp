// SPDX-License-Identifier: Apache-2.0
// Both ways of applying a profile leave the same rules in the kernel, or both refuse it.
#include <algorithm>
#include <cstdlib>
#include <iostream>

#include "caseTable.h"
#include "files.h"
#include "kernelTest.h"
#include "network.h"
#include "processes.h"
#include "profileGenerator.h"
#include "textEscapes.h"

using namespace veldtest;

namespace {

class SameRules : public KernelTest {
protected:
    static std::string usedTables() { return rulesOf() + rulesOf("mangle") + rulesOf("raw"); }

    /// Puts something into the firewall chains that no reload may leave, and switches the firewall on.
    static void startOver() {
        const std::string flush = "-F INPUT_FIREWALL\n-F FORWARD_FIREWALL\n";
        writeFile("/tmp/start", "*filter\n" + flush + "-A INPUT_FIREWALL -j RETURN\nCOMMIT\n*mangle\n" + flush +
                                    "COMMIT\n*raw\n" + flush + "COMMIT\n");
        for (const std::string program : {"/sbin/iptables", "/sbin/ip6tables"})
            runChecked({program + "-restore", "--noflush", "/tmp/start"});
        setSwitch(true);
    }

    /// Applies the stored profile both ways. @return whether they took it
    bool compare(bool keepEstablished) {
        startOver();
        log.clear();
        const bool applied = firewall.fwReload(keepEstablished);
        const std::string specified = usedTables();
        startOver();
        const std::string before = usedTables();
        EXPECT_EQ(firewall.fwReloadAtomic(keepEstablished), applied) << log.text();
        EXPECT_EQ(usedTables(), applied ? specified : before) << log.text();
        EXPECT_TRUE(isSwitchedOn());
        m_lines += applied ? std::count(specified.begin(), specified.end(), '\n') : 0;
        return applied;
    }

    std::ptrdiff_t m_lines = 0;
};

TEST_P(SameRules, AreLeftByBothWaysForGeneratedProfiles) {
    for (const char *interface : {"eth1", "tun0", "tun1"})
        addDummyInterface(interface);
    for (const std::string &file : listDirectory(VELD_DATA_DIR "/services.d"))
        writeFile("/usr/veld/etc/services.d/" + file, readFile(VELD_DATA_DIR "/services.d/" + file));
    const unsigned seed = std::getenv("VELD_SEED") != nullptr ? unsigned(std::stoul(std::getenv("VELD_SEED"))) : 1;
    const int profiles = 100;
    ProfileGenerator generator(seed);
    int refused = 0;
    for (int i = 0; i < profiles && !HasFailure(); ++i) {
        SCOPED_TRACE("seed " + std::to_string(seed) + ", profile " + std::to_string(i));
        store(generator.wildProfile("default", 3));
        refused += compare(i % 2 == 0) ? 0 : 1;
    }
    std::cout << profiles << " profiles, " << refused << " of them refused by both; " << m_lines << " lines compared\n";
    EXPECT_GT(refused, 0);
    EXPECT_LT(refused, profiles / 2);
}

TEST_P(SameRules, AreLeftByBothWaysForAnyStringOrItIsRefusedBeforeAnythingChanges) {
    std::vector<FW::FWRULE> rules;
    for (const auto &row : readCases(VELD_CASE_DIRECTORY "restoreInput.cases", 3)) {
        if (row[0] == "argument")
            rules.push_back(addressRule("odd", "10.0.0.2 -m comment --comment " + unescaped(row[1])));
    }
    store(profileOf(rules));
    EXPECT_TRUE(compare(true)) << log.text();
    EXPECT_GT(m_lines, 30);
    // What the specified way takes, and restore would read as something else.
    const std::string before = usedTables();
    for (const std::string text : {"a\nb", "a\n-A INPUT_FIREWALL -j ACCEPT", "\n", "x -h", "x --version", "x -t nat",
                                   "x -4", "x --wait", "x -s 10.2.0.0/16"}) {
        SCOPED_TRACE(text);
        store(
            profileOf({addressRule("first", "10.0.0.1"), addressRule("odd", "10.0.0.2 -m comment --comment " + text)}));
        FW::FwApplyFailure failure;
        EXPECT_FALSE(firewall.fwReloadAtomic(true, failure));
        EXPECT_EQ(usedTables(), before);
        EXPECT_EQ(failure.rulePosition, 1);
    }
    // A rule with a line break, left by the specified way, cannot be put back: it is not touched either.
    store(profileOf({addressRule("odd", "10.0.0.2 -m comment --comment a\nb")}));
    ASSERT_TRUE(firewall.fwReload(true)) << log.text();
    const std::string specified = usedTables();
    store(profileOf({}));
    FW::FwApplyFailure failure;
    EXPECT_FALSE(firewall.fwReloadAtomic(true, failure));
    EXPECT_THAT(failure.message, testing::HasSubstr("line break"));
    EXPECT_EQ(usedTables(), specified);
}

INSTANTIATE_TEST_SUITE_P(Backend, SameRules, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
