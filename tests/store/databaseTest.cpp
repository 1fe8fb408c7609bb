// SPDX-License-Identifier: Apache-2.0
// The profile database: names, file names, edits, messages, how often it reads the files, and broken and hostile ones,
// which hide nothing but themselves.
#include "openCounter.h"
#include "storeFixture.h"

#include <sys/stat.h>
#include <unistd.h>

#include <ctime>

using namespace veldtest;
using testing::ElementsAre;

namespace {

class Database : public Store {};

TEST_F(Database, FailuresAreNamedInTheLogAndChangeNothing) {
    FW::FWPROFILE profile;
    EXPECT_FALSE(db.profileCreate("a"));
    EXPECT_THAT(takeErrors(), ElementsAre("fwDB.cpp Fail to read file from " + profileDirectory,
                                          "fwDB.cpp Failed to create meta json from " + profileDirectory,
                                          "fwDB.cpp Failed to profileDbDump()", "fwDB.cpp Failed to profileSet"));
    store("1.json", namedDocument("a"));
    store("2.json", namedDocument("b"));
    storeSettings("a");
    EXPECT_FALSE(db.profileExist("c"));
    EXPECT_FALSE(db.profileGet("c", profile));
    EXPECT_FALSE(db.profileCreate("b"));
    EXPECT_FALSE(db.profileRename("a", "b"));
    EXPECT_FALSE(db.profileRename("a", "a"));
    EXPECT_FALSE(db.profileRename("c", "d"));
    EXPECT_TRUE(db.profileDbRemove("c"));
    makeDirectories(profileDirectory + "1.json.tmp");  // in the way of the write
    EXPECT_FALSE(db.profileSet("a", {}));
    EXPECT_FALSE(db.profileRename("a", "c"));
    EXPECT_EQ(takeErrors().back(), "fwDB.cpp Failed to jsonFileDump [" + profileDirectory + "1.json]");
    EXPECT_EQ(storedText("1.json"), namedDocument("a"));
    EXPECT_EQ(storedText("2.json"), namedDocument("b"));
}

TEST_F(Database, OfTwoFilesWithOneNameTheFirstInByteOrderCounts) {
    store("10.json", "{\"name\": \"a\", \"adapterPolicyMap\": {\"eth0\": 1}}");
    store("9.json", "{\"name\": \"a\", \"adapterPolicyMap\": {\"eth0\": 2}}");
    store("b.json", namedDocument("Z"));
    store("B.json", "{\"name\": \"Z\", \"rules\": null}");
    EXPECT_THAT(names(), ElementsAre("Z", "a"));
    EXPECT_EQ(db.profilePathGet("a"), profileDirectory + "10.json");
    EXPECT_EQ(db.profilePathGet("Z"), profileDirectory + "B.json");
    std::map<std::string, FW::FWPROFILE> profiles;
    EXPECT_TRUE(db.profileEnum(profiles));
    EXPECT_EQ(profiles["a"].adapterPolicyMap["eth0"], FW::FW_POLICY_DENY);
    FW::FWPROFILE profile;
    EXPECT_TRUE(db.profileGet("a", profile));
    EXPECT_EQ(profile.adapterPolicyMap["eth0"], FW::FW_POLICY_DENY);
    EXPECT_TRUE(db.profileRename("a", "c"));
    EXPECT_EQ(storedJson("10.json")["name"], "c");
    EXPECT_EQ(db.profilePathGet("a"), profileDirectory + "9.json");
}

TEST_F(Database, NoNewFileReplacesOneThatIsInvisibleToTheScan) {
    const std::time_t now = std::time(nullptr);
    for (std::time_t number = now - 5; number < now + 95; ++number)
        store(std::to_string(number) + ".json", "broken");
    store("1.json", namedDocument("a"));
    for (int i = 0; i < 5; ++i)
        EXPECT_TRUE(db.profileCreate("new " + std::to_string(i)));
    EXPECT_EQ(names().size(), 6u);
    EXPECT_EQ(listDirectory(profileDirectory).size(), 106u);
}

TEST_F(Database, RenamingKeepsTheFileAndFollowsInTheSettings) {
    store("1.json", "{\"name\": \"a\", \"rules\": {\"eth0\": [{\"name\": \"r\"}]}}");
    store("2.json", namedDocument("b"));
    writeFile(settingsPath, "{\"status\": true, \"profile\": \"a\", \"extra\": 1}");
    EXPECT_TRUE(db.profileRename("b", "c"));
    EXPECT_EQ(storedJson("firewall_settings.json")["profile"], "a");
    EXPECT_TRUE(db.profileRename("a", "d"));
    EXPECT_EQ(storedJson("firewall_settings.json"), json("{'status': true, 'profile': 'd', 'extra': 1}"));
    EXPECT_EQ(storedJson("1.json")["name"], "d");
    EXPECT_EQ(storedJson("1.json")["rules"]["eth0"][0]["name"], "r");
    EXPECT_TRUE(storedJson("1.json")["adapterPolicyMap"].isNull()) << "renaming completes no policies";
    EXPECT_EQ(storedJson("2.json")["name"], "c");
    EXPECT_THAT(takeErrors(), ElementsAre());
}

TEST_F(Database, StoringCompletesThePolicies) {
    store("1.json", namedDocument("a"));
    FW::FWPROFILE profile;
    profile.name = "b";
    profile.rules["pppoe"].resize(1);
    profile.rules["eth0"].resize(1);
    profile.adapterPolicyMap = {{"global", FW::FW_POLICY_DENY}, {"eth0", FW::FW_POLICY_DENY}};
    EXPECT_TRUE(db.profileSet("b", profile));
    EXPECT_EQ(profile.adapterPolicyMap.size(), 2u);
    Json::Value value;
    EXPECT_TRUE(db.profileDbLoad("b", value));
    EXPECT_EQ(value["adapterPolicyMap"], json("{'eth0': 1, 'global': 2, 'pppoe': 0}"));
    EXPECT_TRUE(db.profileCreate("c"));
    EXPECT_TRUE(db.profileDbLoad("c", value));
    EXPECT_EQ(value, json("{'name': 'c', 'rules': null, 'adapterPolicyMap': {'global': 2}}"));
}

TEST_F(Database, EachOperationReadsEachProfileOnce) {
    for (const std::string name : {"a", "b", "c"})
        store(name + ".json", namedDocument(name));
    storeSettings("a");
    FW::VELDFW_PROFILE manager;
    FW::FWPROFILE profile;
    std::vector<std::string> found;
    std::map<std::string, FW::FWPROFILE> profiles;
    Json::Value out;
    const std::pair<const char *, std::function<bool()>> operations[] = {
        {"profileGet", [&] { return manager.profileGet("b", profile); }},
        {"profileEnum of names", [&] { return manager.profileEnum(found); }},
        {"profileEnum", [&] { return manager.profileEnum(profiles); }},
        {"profileExist", [&] { return manager.profileExist("b"); }},
        {"profileSet", [&] { return manager.profileSet("b", profile); }},
        {"profileRename", [&] { return manager.profileRename("a", "d"); }},
        {"profileRename back", [&] { return manager.profileRename("d", "a"); }},
        {"profileCreate", [&] { return manager.profileCreate("e"); }},
        {"profileDelete", [&] { return manager.profileDelete("c"); }},
        {"exportConfig", [&] { return manager.exportConfig(out); }},
    };
    OpenCounter counter(profileDirectory);
    for (const auto &[what, operation] : operations) {
        SCOPED_TRACE(what);
        const auto files = listDirectory(profileDirectory);
        counter.take();
        EXPECT_TRUE(operation());
        auto counts = counter.take();
        for (const std::string &file : files)
            EXPECT_EQ(counts[file], file == "firewall_settings.json" ? counts[file] : 1) << file;
    }
}

class HostileFiles : public Store {
protected:
    void expectOnlyItselfHidden(const std::string &what, bool reported) {
        SCOPED_TRACE(what);
        store("1.json", namedDocument("first"));
        store("7.json", namedDocument("last"));
        storeSettings("first");
        FW::VELDFW_PROFILE manager;
        takeErrors();
        EXPECT_THAT(names(), ElementsAre("first", "last"));
        EXPECT_EQ(log.count("Failed to load json from " + profileDirectory), reported ? 1u : 0u);
        FW::FWPROFILE profile;
        EXPECT_TRUE(manager.profileGet("last", profile));
        std::map<std::string, FW::FWPROFILE> profiles;
        EXPECT_TRUE(manager.profileEnum(profiles));
        EXPECT_EQ(profiles.size(), 2u);
        EXPECT_TRUE(manager.profileSet("last", profile));
        EXPECT_TRUE(manager.profileRename("last", "renamed"));
        Json::Value exported;
        EXPECT_TRUE(db.exportConfig(exported));
        EXPECT_EQ(exported["config_profiles"].size(), 2u);
        EXPECT_TRUE(manager.profileDelete("renamed"));
        EXPECT_THAT(names(), ElementsAre("first"));
        removeAll(hostile);
    }

    const std::string hostile = profileDirectory + "5.json";
};

std::string nested(const std::string &opening, size_t depth) {
    std::string result;
    for (size_t i = 0; i < depth; ++i)
        result += opening;
    return result;
}

TEST_F(HostileFiles, HideNothingButThemselves) {
    const std::string rules = "{\"name\": \"x\", \"rules\": ";
    const std::string broken[] = {"",
                                  rules + "{",
                                  "\x7f ELF",
                                  std::string(5000, '\0'),
                                  nested("[", 100'000),
                                  nested("{\"a\":", 100'000),
                                  rules + nested("[", 2000) + nested("]", 2000) + "}",
                                  std::string(100'000'000, ' ')};
    for (const std::string &text : broken) {
        writeFile(hostile, text);
        expectOnlyItselfHidden(text.substr(0, 30), true);
    }
    for (const char *foreign : {"[{\"name\": \"x\"}]", "\"name\"", "5", "null", "{\"rules\": {}}", "{\"name\": {}}"}) {
        writeFile(hostile, foreign);
        expectOnlyItselfHidden(foreign, false);
    }
    makeDirectories(hostile);
    expectOnlyItselfHidden("directory", true);
    ASSERT_EQ(mkfifo(hostile.c_str(), 0666), 0);
    expectOnlyItselfHidden("FIFO", true);
    for (const char *target : {"nowhere", "5.json", "/dev/zero"}) {
        ASSERT_EQ(symlink(target, hostile.c_str()), 0);
        expectOnlyItselfHidden(target, true);
    }
    store(std::string(250, 'x') + ".json", namedDocument("x"));
    expectOnlyItselfHidden("name that is too long for a lock file", true);
}

TEST_F(HostileFiles, WithValuesThatCannotBeConvertedFailWhatNeedsThemOnly) {
    store("7.json", namedDocument("good"));
    storeSettings("good");
    for (const std::string &rules :
         {std::string(R"({"eth0": [{"policy": {}}]})"), nested("[", 500) + nested("]", 500)}) {
        store("5.json", R"({"name": "bad", "rules": )" + rules + "}");
        EXPECT_THAT(names(), ElementsAre("bad", "good"));
        FW::FWPROFILE profile;
        std::map<std::string, FW::FWPROFILE> profiles;
        EXPECT_THROW(db.profileGet("bad", profile), Json::LogicError);
        EXPECT_THROW(db.profileEnum(profiles), Json::LogicError);
        EXPECT_TRUE(db.profileGet("good", profile));
        EXPECT_TRUE(db.profileSet("good", {"good", {}, {}}));
        Json::Value exported;
        EXPECT_TRUE(db.exportConfig(exported));
        EXPECT_EQ(exported["config_profiles"].size(), 2u);
        EXPECT_TRUE(FW::VELDFW_PROFILE().profileDelete("bad"));
    }
}

}  // namespace
