// SPDX-License-Identifier: Apache-2.0
// Edits of rule lists: profile before, profile after.
#include "fw/ruleListEdit.h"
#include "caseTable.h"
#include "files.h"

#include <gtest/gtest.h>
#include <json/reader.h>
#include <veldfirewall/fwDB.h>

#include <sstream>

using namespace FW;
using namespace veldtest;

namespace {

const std::string caseDirectory = VELD_CASE_DIRECTORY;

// The short form of cases/reserve.cases: "R0:ssh,smb S1:ftp R1-:ssh".
std::vector<FWRULE> rulesOf(const std::string &text) {
    std::vector<FWRULE> rules;
    for (const std::string &word : split(text, ' ')) {
        FWRULE rule;
        const char kind = word[0];
        rule.portGroup = FW_PORT_GROUP_RESERVED;
        if (kind == 'S')
            rule.portGroup = FW_PORT_GROUP_SERVICE;
        if (kind == 'P')
            rule.portGroup = FW_PORT_GROUP_PORT;
        rule.ipGroup = kind == 'r' ? FW_IP_GROUP_ADDRESS : FW_IP_GROUP_ANY;
        rule.policy = static_cast<FW_POLICY>(word[1] - '0');
        rule.enable = word[2] != '-';
        rule.portList = split(word.substr(word.find(':') + 1), ',');
        rules.push_back(rule);
    }
    return rules;
}

std::string textOf(const std::vector<FWRULE> &rules) {
    std::string text;
    for (const FWRULE &rule : rules) {
        char kind = rule.ipGroup == FW_IP_GROUP_ANY ? 'R' : 'r';
        if (rule.portGroup != FW_PORT_GROUP_RESERVED)
            kind = rule.portGroup == FW_PORT_GROUP_SERVICE ? 'S' : 'P';
        text += (text.empty() ? "" : " ") + std::string(1, kind) + std::to_string(rule.policy);
        text += rule.enable ? ":" : "-:";
        for (const std::string &name : rule.portList)
            text += (text.back() == ':' ? "" : ",") + name;
    }
    return text;
}

TEST(Reserve, AServiceLivesInTheFrontRuleOfTheLastPolicyAskedFor) {
    for (const auto &row : readCases(caseDirectory + "reserve.cases", 3)) {
        SCOPED_TRACE(row[0]);
        FWPROFILE profile;
        profile.rules = {{"eth0", rulesOf(row[0])}, {"eth1", rulesOf("R1:ssh")}};
        serviceReserve(profile, "eth0", "ssh", static_cast<FW_POLICY>(std::stoi(row[1])));
        EXPECT_EQ(textOf(profile.rules["eth0"]), row[2]);
        EXPECT_EQ(textOf(profile.rules["eth1"]), "R1:ssh");
        EXPECT_TRUE(profile.adapterPolicyMap.empty());
    }
}

TEST(Reserve, TheNewRuleHasTheFieldsOfAReservedRule) {
    FWPROFILE profile;
    serviceReserve(profile, "vpn", "ssh", FW_POLICY_DENY);
    Json::Value expected, written;
    std::istringstream(readFile(caseDirectory + "reservedRule.json")) >> expected;
    VELDFW_JSON_DB().ruleListToJson(profile.rules, written);
    EXPECT_EQ(written.toStyledString(), expected.toStyledString());
}

TEST(Remove, EveryServiceRuleOfEveryAdapterLosesTheServiceAndDeadRulesGo) {
    for (const auto &row : readCases(caseDirectory + "remove.cases", 2)) {
        FWPROFILE profile;
        profile.rules = {{"eth0", rulesOf(row[0])}, {"global", rulesOf(row[0])}};
        serviceRemove(profile, "ssh");
        EXPECT_EQ(textOf(profile.rules["eth0"]), row[1]) << row[0];
        EXPECT_EQ(textOf(profile.rules["global"]), row[1]) << row[0];
    }
}

TEST(Rename, PolicyAndRulesMoveAndReplaceWhatIsThere) {
    for (const auto &row : readCases(caseDirectory + "rename.cases", 6)) {
        SCOPED_TRACE(row[0] + ", " + row[1] + " to " + row[2]);
        FWPROFILE profile;
        for (const std::string &word : split(row[0], ' '))
            profile.adapterPolicyMap[split(word, '=')[0]] = static_cast<FW_POLICY>(std::stoi(split(word, '=')[1]));
        for (const std::string &word : split(row[1], ' '))
            profile.rules[split(word, '=')[0]] = rulesOf(split(word, '=')[1]);
        EXPECT_EQ(adapterRename(profile, "eth0", row[2]), row[5] == "yes");
        std::string policies, rules;
        for (const auto &[adapter, policy] : profile.adapterPolicyMap)
            policies += adapter + "=" + std::to_string(policy);
        for (const auto &[adapter, list] : profile.rules)
            rules += adapter + "=" + textOf(list);
        EXPECT_EQ(policies, row[3]);
        EXPECT_EQ(rules, row[4]);
    }
}

}  // namespace
