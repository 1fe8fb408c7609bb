// SPDX-License-Identifier: Apache-2.0
// Export and import of the whole configuration, trusted and hostile.
#include "storeFixture.h"

#include <unistd.h>

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
    EXPECT_EQ(takeErrors().back(), "fwDB.cpp Failed to load json from [" + profileDirectory +
                                       "1700000001.json] for profile [a] which is the current one.");
    removeAll(profileDirectory + "1700000001.json");
    EXPECT_TRUE(db.exportConfig(second)) << "an active profile that was never stored is not missed";
}

TEST_F(Backup, AnExportNeedsTheSettings) {
    for (const char *settings : {"broken", "[]", "{\"profile\": {}}"}) {
        writeFile(settingsPath, settings);
        Json::Value out;
        EXPECT_FALSE(db.exportConfig(out)) << settings;
        EXPECT_EQ(takeErrors().back(), "fwDB.cpp Falied to get firewall settings.");
    }
}

TEST_F(Backup, DocumentsOfEveryKindAreImportedAsTheyAre) {
    const auto dumpFailed = [](const std::string &name) {
        return "fwDB.cpp Failed to jsonFileDump [" + profileDirectory + name + "].";
    };
    const auto openFailed = [](const std::string &name) {
        return "utils.cpp Failed to open json file " + profileDirectory + name + ".tmp";
    };
    const std::string longName(251, 'n');
    const struct {
        std::string document;
        std::vector<std::string> files;  // afterwards, beside the settings
        const char *settings;
        std::vector<std::string> errors;
    } cases[] = {
        {"null", {}, "{'profile': 'a', 'status': false}", {}},
        {"{}", {}, "{'profile': 'a', 'status': false}", {}},
        {"{'config_profiles': 5, 'config_firewall_settings': 'x', 'config_version': {}}",
         {},
         "{'profile': 'a', 'status': false}",
         {}},
        {"{'config_firewall_settings': {'status': 'x'}}", {}, "{'profile': 'a', 'status': 'x'}", {}},
        {"{'config_profiles': {'1.json': 5, '2.json': {'name': 'n'}, 'no extension': [], '.json': null}}",
         {".json", "1.json", "2.json", "no extension"},
         "{'profile': 'a', 'status': false}",
         {}},
        {"{'config_profiles': {'../../escaped.json': {}, 'sub/1.json': {}, '2.json': {}}}",
         {"2.json"},
         "{'profile': 'a', 'status': false}",
         {openFailed("sub/1.json"), dumpFailed("sub/1.json")}},
        {"{'config_profiles': {'..': {}, '1.json': {}}}",
         {"1.json"},
         "{'profile': 'a', 'status': false}",
         {"utils.cpp Failed to rename to " + profileDirectory + "..", dumpFailed("..")}},
        {"{'config_profiles': [{'name': 'n'}]}",
         {},
         "{'profile': 'a', 'status': false}",
         {"utils.cpp Failed to rename to " + profileDirectory, dumpFailed("")}},
        {"{'config_profiles': {'" + longName + "': {}, 'z': {}}}",
         {"z"},
         "{'profile': 'a', 'status': false}",
         {"utils.cpp Failed to open json file " + profileDirectory + longName +
              ": the name is too long for its lock file",
          dumpFailed(longName)}},
        {"{'config_profiles': {'firewall_settings.json': {'profile': 'x'}}}", {}, "{'profile': 'x'}", {}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.document.substr(0, 100));
        removeAll(profileDirectory);
        store("1700000001.json", namedDocument("a"));
        storeSettings("a");
        EXPECT_TRUE(db.importConfig(json(c.document)));
        EXPECT_EQ(takeErrors(), c.errors);
        std::vector<std::string> files = c.files;
        files.emplace_back("firewall_settings.json");
        EXPECT_THAT(listDirectory(profileDirectory), testing::UnorderedElementsAreArray(files));
        EXPECT_EQ(storedJson("firewall_settings.json"), json(c.settings));
    }
    EXPECT_TRUE(pathExists("/usr/veld/escaped.json")) << "member names are file names, unchanged";
    EXPECT_THAT(listDirectory("/usr/veld/etc"), ElementsAre("firewall.d"));
}

TEST_F(Backup, AValueThatCannotHaveMembersThrowsBeforeAnythingIsDeleted) {
    for (const char *document : {"5", "[]", "'text'"}) {
        EXPECT_THROW(db.importConfig(json(document)), Json::LogicError) << document;
        EXPECT_THAT(names(), ElementsAre("a", "b"));
    }
}

TEST_F(Backup, SettingsThatCannotBeStoredFailTheImport) {
    writeFile(settingsPath, "[]");
    EXPECT_FALSE(db.importConfig(json("{'config_profiles': {'1.json': {'name': 'n'}}}")));
    EXPECT_THAT(takeErrors(),
                ElementsAre("veldFW.cpp " + settingsPath + " holds no object",
                            "veldFW.cpp Falied to config.configGet()", "fwDB.cpp Falied to set firewall settings."));
    EXPECT_THAT(names(), ElementsAre("n"));
}

}  // namespace
