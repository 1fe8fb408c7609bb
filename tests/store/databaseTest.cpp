// SPDX-License-Identifier: Apache-2.0
// The profile database: names, file names, edits, messages, and how often it reads the files.
#include "storeFixture.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <ctime>

using namespace veldtest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

const std::string unreadableDirectory = "fwDB.cpp Fail to read file from /usr/veld/etc/firewall.d/";
const std::string noMeta = "fwDB.cpp Failed to create meta json from /usr/veld/etc/firewall.d/";

class Database : public Store {};

TEST_F(Database, AnEmptyDirectoryFailsEveryOperation) {
    const struct {
        const char *what;
        std::function<bool()> operation;
        std::vector<std::string> errors;
    } cases[] = {
        {"meta",
         [&] {
             Json::Value meta;
             return db.profileMetaCreate(meta);
         },
         {unreadableDirectory}},
        {"names",
         [&] {
             std::vector<std::string> n;
             return db.profileEnum(n);
         },
         {unreadableDirectory, noMeta}},
        {"profiles",
         [&] {
             std::map<std::string, FW::FWPROFILE> p;
             return db.profileEnum(p);
         },
         {unreadableDirectory, noMeta}},
        {"path", [&] { return !db.profilePathGet("a").empty(); }, {unreadableDirectory, noMeta}},
        {"exist", [&] { return db.profileExist("a"); }, {unreadableDirectory, noMeta}},
        {"load",
         [&] {
             Json::Value value;
             return db.profileDbLoad("a", value);
         },
         {unreadableDirectory, noMeta, "utils.cpp File  does not exist"}},
        {"dump", [&] { return db.profileDbDump("a", json(namedDocument("a"))); }, {unreadableDirectory, noMeta}},
        {"get",
         [&] {
             FW::FWPROFILE p;
             return db.profileGet("a", p);
         },
         {unreadableDirectory, noMeta, "fwDB.cpp Failed to profileGet a due to not exist"}},
        {"set",
         [&] { return db.profileSet("a", {}); },
         {unreadableDirectory, noMeta, "fwDB.cpp Failed to profileDbDump()"}},
        {"create",
         [&] { return db.profileCreate("a"); },
         {unreadableDirectory, noMeta, "fwDB.cpp Failed to profileDbDump()", "fwDB.cpp Failed to profileSet"}},
        {"export",
         [&] {
             Json::Value out;
             return db.exportConfig(out);
         },
         {unreadableDirectory, noMeta}},
        {"import", [&] { return db.importConfig(json("{}")); }, {unreadableDirectory, noMeta}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_FALSE(c.operation());
        EXPECT_EQ(takeErrors(), c.errors);
        EXPECT_THAT(listDirectory(profileDirectory), IsEmpty());
    }
}

TEST_F(Database, FailuresAreNamedInTheLogAndChangeNothing) {
    const std::map<std::string, std::string> files = {{"1.json", namedDocument("a")}, {"2.json", namedDocument("b")}};
    for (const auto &[file, text] : files)
        store(file, text);
    storeSettings("a");
    const struct {
        const char *what;
        std::function<bool()> operation;
        std::vector<std::string> errors;
    } cases[] = {
        {"get",
         [&] {
             FW::FWPROFILE p;
             return db.profileGet("c", p);
         },
         {"fwDB.cpp Failed to profileGet c due to not exist"}},
        {"exist", [&] { return db.profileExist("c"); }, {}},
        {"load",
         [&] {
             Json::Value value;
             return db.profileDbLoad("c", value);
         },
         {"utils.cpp File  does not exist"}},
        {"create", [&] { return db.profileCreate("b"); }, {"fwDB.cpp The profile b already exist"}},
        {"rename to a taken name", [&] { return db.profileRename("a", "b"); }, {"fwDB.cpp profile b already exist"}},
        {"rename to itself", [&] { return db.profileRename("a", "a"); }, {"fwDB.cpp profile a already exist"}},
        {"rename of nothing",
         [&] { return db.profileRename("c", "d"); },
         {"fwDB.cpp Failed to profileGet c due to not exist", "fwDB.cpp Failed to get profile c"}},
        {"removal of nothing", [&] { return !db.profileDbRemove("c"); }, {}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_FALSE(c.operation());
        EXPECT_EQ(takeErrors(), c.errors);
        EXPECT_THAT(listDirectory(profileDirectory), ElementsAre("1.json", "2.json", "firewall_settings.json"));
        for (const auto &[file, text] : files)
            EXPECT_EQ(storedText(file), text);
    }
}

TEST_F(Database, FailedWritesAreNamedInTheLog) {
    store("1.json", namedDocument("a"));
    storeSettings("a");
    const std::string blocked = "utils.cpp Failed to open json file " + profileDirectory + "1.json.tmp";
    makeDirectories(profileDirectory + "1.json.tmp");
    EXPECT_FALSE(db.profileSet("a", {}));
    EXPECT_THAT(takeErrors(), ElementsAre(blocked, "fwDB.cpp Failed to profileDbDump()"));
    EXPECT_FALSE(db.profileRename("a", "b"));
    EXPECT_THAT(takeErrors(), ElementsAre(blocked, "fwDB.cpp Failed to jsonFileDump [" + profileDirectory + "1.json]"));
    removeAll(profileDirectory + "1.json.tmp");
    makeDirectories(settingsPath + ".tmp");
    EXPECT_FALSE(db.profileRename("a", "b"));
    EXPECT_THAT(takeErrors(), ElementsAre("utils.cpp Failed to open json file " + settingsPath + ".tmp",
                                          "fwDB.cpp Falied to config.configSet()"));
    EXPECT_THAT(names(), ElementsAre("b"));
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

TEST_F(Database, OnlyTheLastDotEndsAFileName) {
    store("1.old.json", namedDocument("a"));
    store(".hidden.json", namedDocument("h"));
    Json::Value meta;
    EXPECT_TRUE(db.profileMetaCreate(meta));
    EXPECT_EQ(meta, json("{'a': {'fileName': '1.old'}}"));
    FW::FWPROFILE profile;
    profile.name = "a";
    EXPECT_TRUE(db.profileSet("a", profile));
    EXPECT_TRUE(storedJson("1.old.json").isMember("rules"));
    EXPECT_TRUE(db.profileDelete("a"));
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre(".hidden.json"));
}

TEST_F(Database, NewFilesAreNamedAfterTheTimeAndNoTakenNameIsUsed) {
    const std::time_t before = std::time(nullptr);
    Json::Value meta;
    for (std::time_t number = before - before % 2; number < before + 300; number += 2)  // all even numbers
        meta["profile " + std::to_string(number)]["fileName"] = std::to_string(number);
    for (int i = 0; i < 50; ++i) {
        const std::string name = db.profilePathNameGen(meta);
        const std::time_t number = std::stol(name);
        EXPECT_EQ(name, std::to_string(number));
        EXPECT_EQ(number % 2, 1);
        EXPECT_GE(number, before);
        EXPECT_LE(number, std::time(nullptr) + 99);
    }
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

TEST_F(Database, ADocumentIsFoundUnderItsOwnName) {
    store("1.json", namedDocument("a"));
    EXPECT_TRUE(db.profileDbDump("a", json("{'name': 'b', 'extra': [1]}")));
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre("1.json"));
    EXPECT_THAT(names(), ElementsAre("b"));
    Json::Value value;
    EXPECT_TRUE(db.profileDbLoad("b", value));
    EXPECT_EQ(value, json("{'name': 'b', 'extra': [1]}"));
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
    EXPECT_THAT(takeErrors(), IsEmpty());
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

TEST_F(Database, DeletingTakesTheLockFileAlong) {
    store("1.json", namedDocument("a"));
    store("2.json", namedDocument("b"));
    EXPECT_TRUE(db.profileDelete("a"));
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre("2.json"));
    EXPECT_THAT(listDirectory(lockDirectory), ElementsAre("2.json.lock"));
}

/// Counts how often files in the profile directory are opened.
class OpenCounter {
public:
    OpenCounter() : handle(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
        inotify_add_watch(handle, profileDirectory.c_str(), IN_OPEN);
    }
    ~OpenCounter() { close(handle); }
    OpenCounter(const OpenCounter &) = delete;
    OpenCounter &operator=(const OpenCounter &) = delete;

    std::map<std::string, int> take() {
        std::map<std::string, int> counts;
        alignas(inotify_event) std::array<char, 65536> buffer;
        ssize_t length = 0;
        while ((length = read(handle, buffer.data(), buffer.size())) > 0) {
            for (ssize_t at = 0; at < length;) {
                const auto *event = reinterpret_cast<const inotify_event *>(buffer.data() + at);
                if (event->len > 0)
                    ++counts[event->name];
                at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
            }
        }
        return counts;
    }

private:
    int handle;
};

TEST_F(Database, EachOperationReadsEachProfileOnce) {
    for (const std::string name : {"a", "b", "c"})
        store(name + ".json", namedDocument(name));
    storeSettings("a");
    FW::VELDFW_PROFILE manager;
    const std::pair<const char *, std::function<bool()>> operations[] = {
        {"profileGet",
         [&] {
             FW::FWPROFILE p;
             return manager.profileGet("b", p);
         }},
        {"profileEnum of names",
         [&] {
             std::vector<std::string> n;
             return manager.profileEnum(n);
         }},
        {"profileEnum",
         [&] {
             std::map<std::string, FW::FWPROFILE> p;
             return manager.profileEnum(p);
         }},
        {"profileExist", [&] { return manager.profileExist("b"); }},
        {"profileSet",
         [&] {
             return manager.profileSet("b", {"b", {}, {}});
         }},
        {"profileRename", [&] { return manager.profileRename("a", "d"); }},
        {"profileRename back", [&] { return manager.profileRename("d", "a"); }},
        {"profileCreate", [&] { return manager.profileCreate("e"); }},
        {"profileDelete", [&] { return manager.profileDelete("c"); }},
        {"exportConfig",
         [&] {
             Json::Value out;
             return manager.exportConfig(out);
         }},
    };
    OpenCounter counter;
    for (const auto &[what, operation] : operations) {
        SCOPED_TRACE(what);
        const auto files = listDirectory(profileDirectory);
        counter.take();
        EXPECT_TRUE(operation());
        auto counts = counter.take();
        for (const std::string &file : files) {
            if (file != "firewall_settings.json") {
                EXPECT_EQ(counts[file], 1) << file;
            }
        }
    }
}

}  // namespace
