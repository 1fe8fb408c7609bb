// SPDX-License-Identifier: Apache-2.0
// Profile documents to records and back, with the quirks that stored profiles rely on.
#include "storeFixture.h"

using namespace veldtest;

namespace {

/// What a document becomes by being read and written.
std::string rewritten(const char *document) {
    FW::VELDFW_JSON_DB db;
    FW::FWPROFILE profile;
    db.jsonToProfile(json(document), profile);
    Json::Value result;
    db.profileToJson(profile, result);
    return result.toStyledString();
}

/// A rule object as written, with the given members in place of those of an empty rule object.
Json::Value writtenRule(unsigned position, const char *members = "{}") {
    Json::Value rule = json("{'enable': false, 'adapterDirect': 0, 'protocol': 0, 'policy': 0, 'blLog': false,"
                            " 'name': '', 'table': '', 'labelList': [], 'ipType': 0, 'ipDirect': 0, 'ipGroup': 0,"
                            " 'chainList': ['FORWARD_FIREWALL', 'INPUT_FIREWALL'], 'ipList': [], 'portDirect': 0,"
                            " 'portGroup': 0, 'portList': []}");
    rule["ruleIndex"] = position;
    const Json::Value changes = json(members);
    for (const std::string &name : changes.getMemberNames())
        rule[name] = changes[name];
    return rule;
}

TEST(ProfileCodec, RuleMembersAreReadLenientlyAndWrittenInFull) {
    const char *whole = "{'enable': true, 'adapterDirect': 1, 'protocol': 32, 'policy': 1, 'blLog': true, 'name': 'n',"
                        " 'table': 'nat', 'labelList': ['b', 'a', 'b'], 'ipType': 2, 'ipDirect': 3, 'ipGroup': 4,"
                        " 'ipList': ['2', '1', '2'], 'portDirect': 5, 'portGroup': 6, 'portList': ['9-10', '8']}";
    const struct {
        const char *read, *written;
    } cases[] = {
        {"{}", "{}"},
        {whole, whole},
        {"{'chainList': ['INPUT_FIREWALL']}", "{}"},
        {"{'chainList': ['X', 'A', 'X']}", "{'chainList': ['A', 'FORWARD_FIREWALL', 'INPUT_FIREWALL', 'X']}"},
        {"{'ruleIndex': 9, 'ruleID': 8, 'fileName': 'f', 'foreign': {}}", "{}"},
        {"{'enable': 1, 'adapterDirect': true, 'policy': 1.9, 'name': 5, 'table': true, 'ipType': null}",
         "{'enable': true, 'adapterDirect': 1, 'policy': 1, 'name': '5', 'table': 'true'}"},
        {"{'policy': 77, 'protocol': -1}", "{'policy': 77, 'protocol': -1}"},
        {"{'ipList': 'scalar', 'portList': {'b': '1', 'a': 2}, 'labelList': [null, true]}",
         "{'portList': ['2', '1'], 'labelList': ['', 'true']}"},
    };
    FW::VELDFW_JSON_DB db;
    for (const auto &c : cases) {
        SCOPED_TRACE(c.read);
        Json::Value rules;
        rules["eth0"].append(json(c.read));
        std::map<std::string, std::vector<FW::FWRULE>> records;
        db.jsonToRuleList(rules, records);
        Json::Value written;
        db.ruleListToJson(records, written);
        EXPECT_EQ(written["eth0"][0].toStyledString(), writtenRule(0, c.written).toStyledString());
    }
}

TEST(ProfileCodec, MembersOfADocumentAreReadLeniently) {
    const struct {
        const char *read, *written;
    } cases[] = {
        {"{}", "{'name': '', 'rules': null, 'adapterPolicyMap': null}"},
        {"null", "{'name': '', 'rules': null, 'adapterPolicyMap': null}"},
        {"{'name': 'n', 'rules': {}, 'adapterPolicyMap': {}}",
         "{'name': 'n', 'rules': null, 'adapterPolicyMap': null}"},
        {"{'name': 5, 'rules': 'x', 'adapterPolicyMap': 7}", "{'name': '5', 'rules': null, 'adapterPolicyMap': null}"},
        {"{'adapterPolicyMap': {'b': 2, 'a': true, 'c': null}, 'other': 1}",
         "{'name': '', 'rules': null, 'adapterPolicyMap': {'a': 1, 'b': 2, 'c': 0}}"},
    };
    for (const auto &c : cases)
        EXPECT_EQ(rewritten(c.read), json(c.written).toStyledString()) << c.read;
}

TEST(ProfileCodec, RulesAreNumberedPerAdapterByPosition) {
    Json::Value expected;
    for (const char *adapter : {"eth0", "vpn"}) {
        for (unsigned position = 0; position < 3; ++position)
            expected["rules"][adapter].append(writtenRule(position));
    }
    expected["name"] = "";
    expected["adapterPolicyMap"] = Json::Value();
    EXPECT_EQ(rewritten("{'rules': {'vpn': [{'ruleID': 7}, {}, {}], 'eth0': [{}, {'ruleIndex': 5}, null]}}"),
              expected.toStyledString());
}

TEST(ProfileCodec, AdaptersWithoutRulesMakeNoList) {
    for (const char *rules : {"{'eth0': []}", "{'eth0': null}", "{'eth0': 5}", "{'eth0': 'text'}", "{'eth0': {}}"}) {
        std::map<std::string, std::vector<FW::FWRULE>> records;
        FW::VELDFW_JSON_DB().jsonToRuleList(json(rules), records);
        EXPECT_TRUE(records.empty()) << rules;
    }
    Json::Value written;
    FW::VELDFW_JSON_DB().ruleListToJson({{"eth0", {}}}, written);
    EXPECT_TRUE(written.isNull());
}

TEST(ProfileCodec, ReadingAppendsToWhatTheProfileHolds) {
    FW::FWPROFILE profile;
    profile.name = "old";
    profile.rules["eth0"].resize(1);
    profile.adapterPolicyMap = {{"eth0", FW::FW_POLICY_DENY}, {"eth1", FW::FW_POLICY_DENY}};
    FW::VELDFW_JSON_DB().jsonToProfile(
        json("{'name': 'new', 'rules': {'eth0': [{'ruleID': -4}]}, 'adapterPolicyMap': {'eth0': 0}}"), profile);
    EXPECT_EQ(profile.name, "new");
    ASSERT_EQ(profile.rules["eth0"].size(), 2u);
    EXPECT_EQ(profile.rules["eth0"][1].ruleIndex, -4);
    EXPECT_EQ(profile.adapterPolicyMap["eth0"], FW::FW_POLICY_ALLOW);
    EXPECT_EQ(profile.adapterPolicyMap["eth1"], FW::FW_POLICY_DENY);
}

TEST(ProfileCodec, ValuesThatCannotBeConvertedThrowTheJsonLibrarysError) {
    for (const char *document :
         {"{'name': {}}", "{'rules': {'eth0': [5]}}", "{'rules': {'eth0': ['x']}}", "{'rules': {'eth0': [[]]}}",
          "{'rules': {'eth0': [{'ruleID': {}}]}}", "{'rules': {'eth0': [{'enable': 'true'}]}}",
          "{'rules': {'eth0': [{'policy': 4294967296}]}}", "{'rules': {'eth0': [{'ipList': [{}]}]}}",
          "{'adapterPolicyMap': {'eth0': '1'}}"}) {
        FW::FWPROFILE profile;
        EXPECT_THROW(FW::VELDFW_JSON_DB().jsonToProfile(json(document), profile), Json::LogicError) << document;
    }
}

TEST(Records, DefaultsAreThoseOfANewRule) {
    const FW::FWRULE rule;
    Json::Value written;
    FW::VELDFW_JSON_DB().ruleListToJson({{"a", {rule}}}, written);
    EXPECT_EQ(written["a"][0],
              writtenRule(0, "{'enable': true, 'adapterDirect': 1, 'ipDirect': 1, 'protocol': 1, 'table': 'filter'}"));
    EXPECT_EQ(rule.ruleIndex, 0);
}

}  // namespace
