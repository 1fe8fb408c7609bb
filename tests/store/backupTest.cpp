// SPDX-License-Identifier: Apache-2.0
// Export and import of the whole configuration, trusted and hostile.
#include "caseTable.h"
#include "storeFixture.h"

using namespace veldtest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class Backup : public Store {
protected:
    Backup() {
        store("1700000001.json", "{\"name\": \"a\", \"rules\": {\"eth0\": \"kept as it is\"}}");
        store("odd.name.json", namedDocument("b"));
        storeSettings("a");
    }
};

TEST_F(Backup, AnExportHoldsSettingsAndProfilesByFileName) {
    Json::Value out;
    EXPECT_TRUE(db.exportConfig(out));
    EXPECT_EQ(out.toStyledString(),
              json("{'config_firewall_settings': {'status': false, 'profile': 'a'},"
                   " 'config_profiles': {'1700000001.json': {'name': 'a', 'rules': {'eth0': 'kept as it is'}},"
                   "                     'odd.name.json': {'name': 'b'}},"
                   " 'config_version': 1}")
                  .toStyledString());
    EXPECT_TRUE(out["config_version"].isUInt());
}

TEST_F(Backup, ImportReplacesWhatCameAfterTheExport) {
    Json::Value out;
    ASSERT_TRUE(db.exportConfig(out));
    const auto files = listDirectory(profileDirectory);
    ASSERT_TRUE(db.profileCreate("later"));
    ASSERT_TRUE(db.profileDelete("b"));
    ASSERT_TRUE(FW::VELDFW().configSet(json("{'status': true, 'profile': 'later', 'extra': 1}")));
    EXPECT_TRUE(db.importConfig(out));
    EXPECT_EQ(listDirectory(profileDirectory), files);
    EXPECT_EQ(storedJson("1700000001.json"), out["config_profiles"]["1700000001.json"]);
    EXPECT_EQ(storedJson("firewall_settings.json"), json("{'status': false, 'profile': 'a', 'extra': 1}"));
    EXPECT_THAT(takeErrors(), IsEmpty());
}

TEST_F(Backup, AnUnreadableProfileIsLeftOutUnlessItIsTheActiveOne) {
    store("odd.name.json", "broken");
    Json::Value out;
    EXPECT_TRUE(db.exportConfig(out));
    EXPECT_THAT(out["config_profiles"].getMemberNames(), ElementsAre("1700000001.json"));
    store("odd.name.json", namedDocument("b"));
    store("1700000001.json", "broken");
    takeErrors();
    Json::Value second;
    EXPECT_FALSE(db.exportConfig(second));
    EXPECT_EQ(takeLastError(), "fwDB.cpp Failed to load json from [" + profileDirectory +
                                   "1700000001.json] for profile [a] which is the current one.");
    removeAll(profileDirectory + "1700000001.json");
    EXPECT_TRUE(db.exportConfig(second)) << "an active profile that was never stored is not missed";
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
    Json::Value out;
    EXPECT_FALSE(db.exportConfig(out));
    EXPECT_EQ(takeLastError(), "fwDB.cpp Falied to get firewall settings.");
    EXPECT_FALSE(db.importConfig(json("{'config_profiles': {'1.json': {'name': 'n'}}}")));
    EXPECT_EQ(takeLastError(), "fwDB.cpp Falied to set firewall settings.");
    EXPECT_THAT(names(), ElementsAre("n"));
}

}  // namespace
