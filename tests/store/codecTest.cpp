// SPDX-License-Identifier: Apache-2.0
// Profile documents to records and back, with the quirks that stored profiles rely on.
#include "caseTable.h"
#include "storeFixture.h"

using namespace veldtest;

namespace {

/// What a document becomes by being read and written.
Json::Value rewritten(const Json::Value &document) {
    FW::FWPROFILE profile;
    FW::VELDFW_JSON_DB().jsonToProfile(document, profile);
    Json::Value result;
    FW::VELDFW_JSON_DB().profileToJson(profile, result);
    return result;
}

TEST(ProfileCodec, RuleMembersAreReadLenientlyWrittenInFullAndNumberedByPosition) {
    for (const auto &row : readCases(caseDirectory + "ruleDocuments.cases", 2)) {
        Json::Value document = json("{'rules': {'eth0': [{}]}}"),
                    expected = json(readFile(caseDirectory + "emptyRule.json"));
        document["rules"]["eth0"][1] = json(row[0]);
        const Json::Value changes = json(row[1]);
        for (const std::string &name : changes.getMemberNames())
            expected[name] = changes[name];
        expected["ruleIndex"] = 1u;
        EXPECT_EQ(rewritten(document)["rules"]["eth0"][1].toStyledString(), expected.toStyledString()) << row[0];
    }
}

TEST(ProfileCodec, DocumentsAreReadLenientlyAndImpossibleValuesThrow) {
    for (const auto &row : readCases(caseDirectory + "profileDocuments.cases", 2)) {
        if (row[1] == "throws")
            EXPECT_THROW(rewritten(json(row[0])), Json::LogicError) << row[0];
        else
            EXPECT_EQ(rewritten(json(row[0])).toStyledString(), json(row[1]).toStyledString()) << row[0];
    }
}

TEST(ProfileCodec, ReadingAppendsToWhatTheProfileHolds) {
    FW::FWPROFILE profile;
    profile.rules["eth0"].resize(1);
    profile.adapterPolicyMap = {{"eth0", FW::FW_POLICY_DENY}, {"eth1", FW::FW_POLICY_DENY}};
    FW::VELDFW_JSON_DB().jsonToProfile(json("{'rules': {'eth0': [{'ruleID': -4}]}, 'adapterPolicyMap': {'eth0': 0}}"),
                                       profile);
    ASSERT_EQ(profile.rules["eth0"].size(), 2u);
    EXPECT_EQ(profile.rules["eth0"][1].ruleIndex, -4);
    EXPECT_EQ(profile.adapterPolicyMap["eth0"], FW::FW_POLICY_ALLOW);
    EXPECT_EQ(profile.adapterPolicyMap["eth1"], FW::FW_POLICY_DENY);
}

}  // namespace
