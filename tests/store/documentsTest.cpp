// SPDX-License-Identifier: Apache-2.0
// What documents are read as: profiles, with the quirks that stored ones rely on, settings, and whole configurations,
// trusted and hostile.
#include "caseTable.h"
#include "storeFixture.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

const std::string caseDirectory = VELD_CASE_DIRECTORY;

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
    // Reading appends to what the profile holds.
    FW::FWPROFILE profile = {
        "", {{"eth0", {FW::FWRULE()}}}, {{"eth0", FW::FW_POLICY_DENY}, {"eth1", FW::FW_POLICY_DENY}}};
    FW::VELDFW_JSON_DB().jsonToProfile(json("{'rules': {'eth0': [{'ruleID': -4}]}, 'adapterPolicyMap': {'eth0': 0}}"),
                                       profile);
    ASSERT_EQ(profile.rules["eth0"].size(), 2u);
    EXPECT_EQ(profile.rules["eth0"][1].ruleIndex, -4);
    EXPECT_EQ(profile.adapterPolicyMap["eth0"], FW::FW_POLICY_ALLOW);
    EXPECT_EQ(profile.adapterPolicyMap["eth1"], FW::FW_POLICY_DENY);
}

class Settings : public Store {
protected:
    FW::VELDFW firewall;
};

TEST_F(Settings, FirstUseStoresTheDefaultsIfItCan) {
    bool enabled = true;
    EXPECT_TRUE(firewall.fwStatus(enabled));
    EXPECT_FALSE(enabled);
    EXPECT_EQ(readFile(settingsPath), "{\n   \"profile\" : \"default\",\n   \"status\" : false\n}\n");
    removeAll(profileDirectory);
    Json::Value config = json("{'other': 1, 'status': true}");
    EXPECT_TRUE(firewall.configGet(config));
    EXPECT_EQ(config, json("{'other': 1, 'status': false, 'profile': 'default'}"));
}

TEST_F(Settings, ChangesAreMergedMemberByMember) {
    for (const auto &row : readCases(caseDirectory + "settingsChanges.cases", 3)) {
        removeAll(settingsPath);
        if (!row[0].empty())
            writeFile(settingsPath, json(row[0]).toStyledString());
        EXPECT_TRUE(firewall.configSet(json(row[1])));
        EXPECT_EQ(json(readFile(settingsPath)), json(row[2])) << row[0] << row[1];
    }
}

TEST_F(Settings, ContentsOfEveryKindAreReadOrReported) {
    auto cases = readCases(caseDirectory + "settings.cases", 3);
    cases.push_back({std::string(100'000, '['), "-", "-"});
    for (const auto &row : cases) {
        SCOPED_TRACE(row[0].substr(0, 60));
        writeFile(settingsPath, row[0]);
        bool enabled = true;
        const bool known = firewall.fwStatus(enabled);
        EXPECT_EQ(!known ? "-" : enabled ? "on" : "off", row[1]);
        EXPECT_EQ(takeErrors().empty(), known);
        std::string name;
        const bool found = firewall.fwProfileConfigGet(name);
        EXPECT_EQ(found ? name : "-", row[2]);
        EXPECT_EQ(takeErrors().empty(), found);
        EXPECT_EQ(readFile(settingsPath), row[0]);
    }
}

TEST_F(Settings, UnreadableOnesAreNotOverwrittenAndTheActiveProfileIsNotDeleted) {
    FW::VELDFW_PROFILE manager;
    store("1.json", namedDocument("default"));
    store("2.json", namedDocument("other"));
    EXPECT_FALSE(manager.profileDelete("default")) << "protected by the defaults of missing settings";
    EXPECT_THAT(takeErrors(), ElementsAre("veldFW.cpp The profile default is used now so cannot remove"));
    storeSettings("other");
    EXPECT_FALSE(manager.profileDelete("other"));
    EXPECT_TRUE(manager.profileDelete("default"));
    writeFile(settingsPath, "[1]");
    EXPECT_FALSE(firewall.configSet(json("{'status': true}")));
    EXPECT_FALSE(manager.profileDelete("other"));
    EXPECT_FALSE(db.profileRename("other", "new"));
    EXPECT_EQ(readFile(settingsPath), "[1]");
    EXPECT_THAT(names(), ElementsAre("other"));
}

class Backup : public Store {
protected:
    Backup() {
        store("1700000001.json", "{\"name\": \"a\", \"rules\": {\"eth0\": \"kept as it is\"}}");
        store("odd.name.json", namedDocument("b"));
        storeSettings("a");
    }

    Json::Value out;
};

TEST_F(Backup, ImportBringsBackWhatWasExportedAndRemovesWhatCameAfter) {
    ASSERT_TRUE(db.exportConfig(out));
    EXPECT_EQ(out.toStyledString(),
              json("{'config_firewall_settings': {'status': false, 'profile': 'a'},"
                   " 'config_profiles': {'1700000001.json': {'name': 'a', 'rules': {'eth0': 'kept as it is'}},"
                   "                     'odd.name.json': {'name': 'b'}},"
                   " 'config_version': 1}")
                  .toStyledString());
    const auto files = listDirectory(profileDirectory);
    ASSERT_TRUE(db.profileCreate("later"));
    ASSERT_TRUE(db.profileDelete("b"));
    ASSERT_TRUE(FW::VELDFW().configSet(json("{'status': true, 'profile': 'later', 'extra': 1}")));
    EXPECT_TRUE(db.importConfig(out));
    EXPECT_EQ(listDirectory(profileDirectory), files);
    EXPECT_EQ(storedJson("1700000001.json"), out["config_profiles"]["1700000001.json"]);
    EXPECT_EQ(storedJson("firewall_settings.json"), json("{'status': false, 'profile': 'a', 'extra': 1}"));
    EXPECT_THAT(takeErrors(), ElementsAre());
}

TEST_F(Backup, AnUnreadableProfileIsLeftOutUnlessItIsTheActiveOne) {
    store("odd.name.json", "broken");
    EXPECT_TRUE(db.exportConfig(out));
    EXPECT_THAT(out["config_profiles"].getMemberNames(), ElementsAre("1700000001.json"));
    store("odd.name.json", namedDocument("b"));
    store("1700000001.json", "broken");
    EXPECT_FALSE(db.exportConfig(out));
    EXPECT_EQ(takeErrors().back(), "fwDB.cpp Failed to load json from [" + profileDirectory +
                                       "1700000001.json] for profile [a] which is the current one.");
    removeAll(profileDirectory + "1700000001.json");
    EXPECT_TRUE(db.exportConfig(out)) << "an active profile that was never stored is not missed";
}

TEST_F(Backup, DocumentsOfEveryKindAreImportedAsTheyAre) {
    for (const auto &row : readCases(caseDirectory + "imports.cases", 3)) {
        SCOPED_TRACE(row[0]);
        removeAll(profileDirectory);
        store("1700000001.json", namedDocument("a"));
        storeSettings("a");
        EXPECT_TRUE(db.importConfig(json(row[0])));
        std::vector<std::string> files = split(row[1], ' ');
        files.emplace_back("firewall_settings.json");
        EXPECT_THAT(listDirectory(profileDirectory), testing::UnorderedElementsAreArray(files));
        EXPECT_EQ(storedJson("firewall_settings.json"), json(row[2]));
    }
    EXPECT_TRUE(pathExists("/usr/veld/escaped.json")) << "member names are file names, unchanged";
    EXPECT_THAT(listDirectory("/usr/veld/etc"), ElementsAre("firewall.d"));
}

TEST_F(Backup, WhatCannotHaveMembersThrowsBeforeAnythingIsDeletedAndUnreadableSettingsFailBoth) {
    for (const char *document : {"5", "[]", "'text'"})
        EXPECT_THROW(db.importConfig(json(document)), Json::LogicError) << document;
    EXPECT_THAT(names(), ElementsAre("a", "b"));
    writeFile(settingsPath, "[]");
    EXPECT_FALSE(db.exportConfig(out));
    EXPECT_EQ(takeErrors().back(), "fwDB.cpp Falied to get firewall settings.");
    EXPECT_FALSE(db.importConfig(json("{'config_profiles': {'1.json': {'name': 'n'}}}")));
    EXPECT_EQ(takeErrors().back(), "fwDB.cpp Falied to set firewall settings.");
    EXPECT_THAT(names(), ElementsAre("n"));
}

}  // namespace
