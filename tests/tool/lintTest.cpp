// SPDX-License-Identifier: Apache-2.0
// Faults planted in profiles, and those that must not be seen where there are none.
#include <gmock/gmock.h>

#include <cstdlib>

#include "caseTable.h"
#include "files.h"
#include "network.h"
#include "toolFixture.h"

namespace veldtest {
namespace {

/// "kind adapter/number" of each finding.
std::string findings(const std::string &client = "") {
    const ProgramResult result =
        runTool(client.empty() ? std::vector<std::string>{"lint", "--json"}
                               : std::vector<std::string>{"lint", "--json", "--client", client});
    const Json::Value found = parseJson(result.output.empty() ? "{}" : result.output)["findings"];
    EXPECT_TRUE(found.isArray()) << result.errors;
    EXPECT_EQ(found.empty() ? 0 : 1, result.status);
    std::string text;
    for (const Json::Value &finding : found) {
        EXPECT_FALSE(finding["why"].asString().empty() || finding["mend"].asString().empty());
        text += (text.empty() ? "" : ", ") + finding["kind"].asString() + " " + finding["adapter"].asString() + "/" +
                finding["number"].asString();
    }
    return text;
}

void membersSet(Json::Value &value, const Json::Value &members) {
    for (const std::string &member : members.getMemberNames()) {
        value[member] = members[member];
    }
}

Json::Value parsed(const std::string &text) {
    return parseJson(text.empty() ? "{}" : text);
}

class LintTest : public ToolTest {
protected:
    void SetUp() override {
        unsetenv("SSH_CONNECTION");
        ToolTest::SetUp();
        addDummyInterface("eth1");
        addAddress("eth1", "192.168.7.1/24");
        setUp("eth1");
    }

    /// Stores the profile of lint.json, which has no fault, with further rules and policies.
    static void store(const Json::Value &rules = {}, const Json::Value &policies = {}) {
        Json::Value profile = parseJson(readFile(VELD_CASES "lint.json"));
        profile["name"] = "default";
        membersSet(profile["adapterPolicyMap"], policies);
        for (const std::string &adapter : rules.getMemberNames()) {
            for (const Json::Value &rule : rules[adapter]) {
                profile["rules"][adapter].append(rule);
            }
        }
        for (Json::Value &list : profile["rules"]) {
            for (Json::Value &rule : list) {
                Json::Value whole = profile["rule"];
                membersSet(whole, rule);
                rule = whole;
            }
        }
        writeFile("/usr/veld/etc/firewall.d/1.json", profile.toStyledString());
    }
};

TEST_F(LintTest, TheShippedProfileHasNoFault) {
    writeFile("/usr/veld/etc/firewall.d/1.json", readFile(VELD_DATA_DIR "/firewall.d/1.json"));
    EXPECT_EQ("", findings());
    EXPECT_EQ("", findings("192.168.7.9"));
    EXPECT_EQ("connection global/10", findings("203.0.113.7"));
}

TEST_F(LintTest, EachPlantedFaultIsFoundAndNothingElse) {
    for (const auto &row : readCases(VELD_CASES "lint.cases", 4)) {
        SCOPED_TRACE(testing::PrintToString(row));
        Json::Value planted = parsed(row[1]);
        if (planted.get("table", "") == "LONG") {
            planted["table"] = std::string(1100, 'x');
        }
        Json::Value rules = parsed(row[2]);
        rules["eth0"].append(planted);
        store(rules, parsed(row[3]));
        EXPECT_EQ(row[0], findings()) << runTool({"lint"}).output;
    }
}

TEST_F(LintTest, ACutConnectionIsFoundFromTheEnvironmentOrTheCommandLine) {
    store();
    for (const auto &row : readCases(VELD_CASES "connections.cases", 3)) {
        SCOPED_TRACE(testing::PrintToString(row));
        row[0].empty() ? unsetenv("SSH_CONNECTION") : setenv("SSH_CONNECTION", row[0].c_str(), 1);
        EXPECT_EQ(row[2], findings(row[1]));
    }
    EXPECT_THAT(runTool({"lint", "--client", "192.168.7.8"}).output,
                testing::HasSubstr(
                    "adapter eth1, default policy: drops new connections from 192.168.7.8 to port 22/tcp on eth1"));
    EXPECT_EQ(2, runTool({"lint", "--client", "somebody"}).status);
    EXPECT_EQ(2, runTool({"lint", "--client", "192.168.7.8:x"}).status);
}

}  // namespace
}  // namespace veldtest
