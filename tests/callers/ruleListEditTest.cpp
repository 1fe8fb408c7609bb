// SPDX-License-Identifier: Apache-2.0
// Edits of rule lists: profile before, profile after.
#include "fw/ruleListEdit.h"

#include <gtest/gtest.h>

#include <sstream>

using namespace FW;

namespace {

// A list in short form, a word per rule: kind (R reserved, S service, P ports, r reserved for some sources), policy,
// "-" when disabled, ":" and the names: "R0:ssh,smb S1:ftp R1-:ssh".
std::vector<FWRULE> rulesOf(const std::string &text) {
    std::vector<FWRULE> rules;
    std::istringstream words(text);
    for (std::string word; words >> word;) {
        FWRULE rule;
        const char kind = word[0];
        rule.portGroup = kind == 'S'   ? FW_PORT_GROUP_SERVICE
                         : kind == 'P' ? FW_PORT_GROUP_PORT
                                       : FW_PORT_GROUP_RESERVED;
        rule.ipGroup = kind == 'r' ? FW_IP_GROUP_ADDRESS : FW_IP_GROUP_ANY;
        rule.policy = static_cast<FW_POLICY>(word[1] - '0');
        rule.enable = word[2] != '-';
        std::istringstream names(word.substr(word.find(':') + 1));
        for (std::string name; std::getline(names, name, ',');) {
            rule.portList.push_back(name);
        }
        rules.push_back(rule);
    }
    return rules;
}

std::string textOf(const std::vector<FWRULE> &rules) {
    std::string text;
    for (const FWRULE &rule : rules) {
        const char kind = rule.portGroup == FW_PORT_GROUP_SERVICE ? 'S'
                          : rule.portGroup == FW_PORT_GROUP_PORT  ? 'P'
                          : rule.ipGroup == FW_IP_GROUP_ANY       ? 'R'
                                                                  : 'r';
        text += (text.empty() ? "" : " ") + std::string(1, kind) + std::to_string(rule.policy) +
                (rule.enable ? "" : "-") + ":";
        for (const std::string &name : rule.portList) {
            text += (text.back() == ':' ? "" : ",") + name;
        }
    }
    return text;
}

struct ReserveCase {
    const char *before;
    int policy;
    const char *after;
};

TEST(Reserve, AServiceLivesInTheFrontRuleOfTheLastPolicyAskedFor) {
    const ReserveCase cases[] = {
        {"", 0, "R0:ssh"},
        {"R0:smb", 0, "R0:smb,ssh"},
        {"R0:ssh,smb", 0, "R0:ssh,smb"},
        {"R0:smb R1:ssh", 0, "R0:smb,ssh R1:ssh"},     // a fitting front rule: nothing else changes
        {"R0: S1:", 0, "R0:ssh S1:"},                  // not even dead rules
        {"R0:ssh,smb", 1, "R1:ssh R0:smb"},            // moved from allow to deny
        {"R0:ssh", 1, "R1:ssh"},                       // an allow rule left empty is dropped
        {"R0-:ssh,smb", 0, "R0:ssh R0-:smb"},          // a disabled front rule does not fit
        {"r0:ssh,smb", 0, "R0:ssh r0:ssh,smb"},        // neither does one for some sources, which keeps it
        {"S0:ssh R0:smb", 0, "R0:ssh S0:ssh R0:smb"},  // nor a plain service rule, which keeps it too
        {"P1:22 R0:ssh,smb R1:ssh,ftp", 0, "R0:ssh P1:22 R0:smb R1:ftp"},
        {"R1:ssh,ssh", 0, "R0:ssh R1:ssh"},              // the first occurrence in each rule only
        {"R1:smb S0: P0: R0:", 0, "R0:ssh R1:smb P0:"},  // dead service rules go, port rules stay
        {"R2:smb", 2, "R2:smb,ssh"},
    };
    for (const ReserveCase &entry : cases) {
        SCOPED_TRACE(entry.before);
        FWPROFILE profile;
        profile.rules = {{"eth0", rulesOf(entry.before)}, {"eth1", rulesOf("R1:ssh")}};
        serviceReserve(profile, "eth0", "ssh", static_cast<FW_POLICY>(entry.policy));
        EXPECT_EQ(textOf(profile.rules["eth0"]), entry.after);
        EXPECT_EQ(textOf(profile.rules["eth1"]), "R1:ssh");
        EXPECT_TRUE(profile.adapterPolicyMap.empty());
    }
}

TEST(Reserve, TheNewRuleHasTheFieldsOfAReservedRule) {
    FWPROFILE profile;
    serviceReserve(profile, "vpn", "ssh", FW_POLICY_DENY);
    ASSERT_EQ(profile.rules.size(), 1u);
    ASSERT_EQ(profile.rules["vpn"].size(), 1u);
    const FWRULE &rule = profile.rules["vpn"][0];
    EXPECT_EQ(rule.ruleIndex, 0);
    EXPECT_TRUE(rule.enable);
    EXPECT_EQ(rule.adapterDirect, 1);
    EXPECT_EQ(rule.policy, FW_POLICY_DENY);
    EXPECT_FALSE(rule.blLog);
    EXPECT_TRUE(rule.labelList.empty());
    EXPECT_EQ(rule.name, "Service");
    EXPECT_EQ(rule.table, "filter");
    EXPECT_EQ(rule.chainList, (std::set<std::string>{"FORWARD_FIREWALL", "INPUT_FIREWALL"}));
    EXPECT_EQ(rule.ipType, 2);
    EXPECT_EQ(rule.ipDirect, 1);
    EXPECT_EQ(rule.ipGroup, 5);
    EXPECT_TRUE(rule.ipList.empty());
    EXPECT_EQ(rule.portDirect, 0);
    EXPECT_EQ(rule.portGroup, 2);
    EXPECT_EQ(rule.protocol, 3);
    EXPECT_EQ(rule.portList, std::vector<std::string>{"ssh"});
}

TEST(Remove, EveryServiceRuleOfEveryAdapterLosesTheServiceAndDeadRulesGo) {
    const std::pair<const char *, const char *> cases[] = {
        {"S0:ssh R1:ssh r0:ssh,smb", "r0:smb"},
        {"S0:smb,ssh,ssh", "S0:smb,ssh"},  // the first occurrence
        {"P0:ssh", "P0:ssh"},              // ports, not services
        {"S1-:ssh S1-:smb", "S1-:smb"},
        {"S0: P0: R0:smb", "P0: R0:smb"},
    };
    for (const auto &[before, after] : cases) {
        FWPROFILE profile;
        profile.rules = {{"eth0", rulesOf(before)}, {"global", rulesOf(before)}};
        serviceRemove(profile, "ssh");
        EXPECT_EQ(textOf(profile.rules["eth0"]), after) << before;
        EXPECT_EQ(textOf(profile.rules["global"]), after) << before;
    }
}

using Policies = std::map<std::string, FW_POLICY>;
using Lists = std::map<std::string, std::string>;

struct RenameCase {
    const char *what;
    Policies policies;
    Lists rules;
    Policies policiesAfter;
    Lists rulesAfter;
    bool hadPolicy;
};

TEST(Rename, PolicyAndRulesMoveAndReplaceWhatIsThere) {
    const FW_POLICY allow = FW_POLICY_ALLOW, deny = FW_POLICY_DENY;
    const RenameCase cases[] = {
        {"both", {{"eth0", deny}}, {{"eth0", "S0:a"}}, {{"bond0", deny}}, {{"bond0", "S0:a"}}, true},
        {"onto another",
         {{"bond0", allow}, {"eth0", deny}},
         {{"bond0", "S1:b P0:1"}, {"eth0", "S0:a"}},
         {{"bond0", deny}},
         {{"bond0", "S0:a"}},
         true},
        {"rules only", {{"bond0", deny}}, {{"eth0", "S0:a"}}, {{"bond0", deny}}, {{"bond0", "S0:a"}}, false},
        {"policy only", {{"eth0", deny}}, {{"bond0", "S1:b"}}, {{"bond0", deny}}, {{"bond0", "S1:b"}}, true},
        {"neither", {{"eth1", deny}}, {{"bond0", "S1:b"}}, {{"eth1", deny}}, {{"bond0", "S1:b"}}, false},
    };
    for (const RenameCase &entry : cases) {
        SCOPED_TRACE(entry.what);
        FWPROFILE profile;
        profile.adapterPolicyMap = entry.policies;
        for (const auto &[adapter, text] : entry.rules) {
            profile.rules[adapter] = rulesOf(text);
        }
        EXPECT_EQ(adapterRename(profile, "eth0", "bond0"), entry.hadPolicy);
        Lists after;
        for (const auto &[adapter, rules] : profile.rules) {
            after[adapter] = textOf(rules);
        }
        EXPECT_EQ(profile.adapterPolicyMap, entry.policiesAfter);
        EXPECT_EQ(after, entry.rulesAfter);
    }
}

TEST(Rename, AnAdapterRenamedToItselfLosesNothing) {
    FWPROFILE profile;
    profile.adapterPolicyMap = {{"eth0", FW_POLICY_DENY}};
    profile.rules["eth0"] = rulesOf("S0:a R1:b");
    EXPECT_TRUE(adapterRename(profile, "eth0", "eth0"));
    EXPECT_EQ(profile.adapterPolicyMap, (Policies{{"eth0", FW_POLICY_DENY}}));
    EXPECT_EQ(textOf(profile.rules["eth0"]), "S0:a R1:b");
}

}  // namespace
