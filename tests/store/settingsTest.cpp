// SPDX-License-Identifier: Apache-2.0
// The settings file: defaults, merging, broken contents, and the profile it protects.
#include "caseTable.h"
#include "storeFixture.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

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
        const std::string state = enabled ? "on" : "off";
        EXPECT_EQ(known ? state : "-", row[1]);
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

}  // namespace
