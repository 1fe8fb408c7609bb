// SPDX-License-Identifier: Apache-2.0
// The settings file: defaults, merging, broken contents, and the profile it protects.
#include "storeFixture.h"

using namespace veldtest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class Settings : public Store {
protected:
    FW::VELDFW firewall;
};

TEST_F(Settings, FirstUseStoresTheDefaults) {
    bool enabled = true;
    EXPECT_TRUE(firewall.fwStatus(enabled));
    EXPECT_FALSE(enabled);
    EXPECT_EQ(readFile(settingsPath), "{\n   \"profile\" : \"default\",\n   \"status\" : false\n}\n");
    std::string name;
    EXPECT_TRUE(firewall.fwProfileConfigGet(name));
    EXPECT_EQ(name, "default");
    EXPECT_THAT(takeErrors(), IsEmpty());
}

TEST_F(Settings, DefaultsAreReportedEvenWhenTheyCannotBeStored) {
    removeAll(profileDirectory);
    Json::Value config = json("{'other': 1, 'status': true}");
    EXPECT_TRUE(firewall.configGet(config));
    EXPECT_EQ(config, json("{'other': 1, 'status': false, 'profile': 'default'}"));
}

TEST_F(Settings, ChangesAreMergedMemberByMember) {
    const struct {
        const char *stored, *changes, *result;
    } cases[] = {
        {nullptr, "{}", "{'status': false, 'profile': 'default'}"},
        {nullptr, "{'status': true}", "{'status': true, 'profile': 'default'}"},
        {"{'x': {'a': 1}}", "{'x': {'b': 2}, 'y': []}", "{'x': {'b': 2}, 'y': []}"},
        {"{'x': 1, 'profile': 'p'}", "{'status': true}", "{'x': 1, 'profile': 'p', 'status': true}"},
        {"{'x': 1}", "null", "{'x': 1}"},
        {"null", "{'status': true}", "{'status': true}"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.changes);
        removeAll(settingsPath);
        if (c.stored != nullptr)
            writeFile(settingsPath, json(c.stored).toStyledString());
        EXPECT_TRUE(firewall.configSet(json(c.changes)));
        EXPECT_EQ(json(readFile(settingsPath)), json(c.result));
    }
    EXPECT_THAT(takeErrors(), IsEmpty());
}

TEST_F(Settings, ContentsOfEveryKindAreReadOrReported) {
    const std::string noObject = "veldFW.cpp " + settingsPath + " holds no object";
    const std::string noJson = "utils.cpp Failed to parse Json value of " + settingsPath;
    const std::string unreadable = "veldFW.cpp Falied to configGet()";
    const std::string noKey = "veldFW.cpp There are no key: profile in config";
    const std::string noBool = "veldFW.cpp The value of status in " + settingsPath + " is no boolean";
    const std::string noText = "veldFW.cpp The value of profile in " + settingsPath + " is no string";
    const struct {
        std::string text;
        const char *status;   // as read; "-" for a failure
        const char *profile;  // as read; "-" for a failure
        std::vector<std::string> errors;
    } cases[] = {
        {"{\"status\": true, \"profile\": \"p\"}", "on", "p", {}},
        {"{\"profile\": \"p\"}", "off", "p", {}},
        {"{\"status\": true}", "on", "-", {noKey}},
        {"{}", "off", "-", {noKey}},
        {"null", "off", "-", {noKey}},
        {"{\"status\": 1, \"profile\": 7}", "on", "7", {}},
        {"{\"status\": null, \"profile\": null}", "off", "", {}},
        {"{\"status\": \"true\", \"profile\": [\"p\"]}", "-", "-", {noBool, noText}},
        {"{\"status\": {}, \"profile\": {}}", "-", "-", {noBool, noText}},
        {"[true]", "-", "-", {noObject, unreadable, noObject, unreadable}},
        {"\"on\"", "-", "-", {noObject, unreadable, noObject, unreadable}},
        {"", "-", "-", {noJson, unreadable, noJson, unreadable}},
        {"{\"status\": tr", "-", "-", {noJson, unreadable, noJson, unreadable}},
        {std::string(100'000, '['), "-", "-", {noJson, unreadable, noJson, unreadable}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.text.substr(0, 60));
        writeFile(settingsPath, c.text);
        bool enabled = true;
        const bool known = firewall.fwStatus(enabled);
        EXPECT_STREQ(!known ? "-" : enabled ? "on" : "off", c.status);
        EXPECT_TRUE(known || enabled) << "changed by a failure";
        std::string name = "before";
        const bool found = firewall.fwProfileConfigGet(name);
        EXPECT_EQ(found ? name : "-", c.profile);
        EXPECT_TRUE(found || name == "before") << "changed by a failure";
        EXPECT_EQ(takeErrors(), c.errors);
        EXPECT_EQ(readFile(settingsPath), c.text);
    }
}

TEST_F(Settings, UnreadableSettingsAreNotOverwritten) {
    writeFile(settingsPath, "[1]");
    store("1.json", namedDocument("a"));
    EXPECT_FALSE(firewall.configSet(json("{'status': true}")));
    EXPECT_FALSE(FW::VELDFW_PROFILE().profileDelete("a"));
    EXPECT_FALSE(db.profileRename("a", "b"));
    EXPECT_EQ(readFile(settingsPath), "[1]");
    EXPECT_THAT(names(), ElementsAre("a"));
    const std::string noObject = "veldFW.cpp " + settingsPath + " holds no object";
    EXPECT_THAT(takeErrors(), ElementsAre(noObject, "veldFW.cpp Falied to config.configGet()",  //
                                          noObject, "veldFW.cpp Falied to config.configGet()",  //
                                          noObject, "fwDB.cpp Falied to config.configGet()"));
}

TEST_F(Settings, TheActiveProfileIsNotDeleted) {
    FW::VELDFW_PROFILE manager;
    for (const std::string name : {"default", "Default", "other"})
        store(name + ".json", namedDocument(name));
    EXPECT_FALSE(manager.profileDelete("default")) << "protected by the defaults of missing settings";
    EXPECT_THAT(takeErrors(), ElementsAre("veldFW.cpp The profile default is used now so cannot remove"));
    EXPECT_TRUE(manager.profileDelete("Default"));
    EXPECT_THAT(names(), ElementsAre("default", "other"));
    storeSettings("other");
    EXPECT_FALSE(manager.profileDelete("other"));
    EXPECT_TRUE(manager.profileDelete("default"));
    EXPECT_THAT(names(), ElementsAre("other"));
    EXPECT_TRUE(db.profileDelete("other")) << "the database itself protects nothing";
}

}  // namespace
