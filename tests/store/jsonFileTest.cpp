// SPDX-License-Identifier: Apache-2.0
// What the locked JSON files look like, where their lock files lie, and which texts are no documents.
#include "storeFixture.h"

#include <sys/stat.h>
#include <unistd.h>

using namespace veldtest;
using testing::ElementsAre;

namespace {

class JsonFile : public Store {};

mode_t modeOf(const std::string &path) {
    struct stat status = {};
    EXPECT_EQ(lstat(path.c_str(), &status), 0) << path;
    return status.st_mode;
}

TEST_F(JsonFile, DocumentIsStyledTextAndKeepsThePermissionsOfTheOldFile) {
    const mode_t oldMask = umask(0);
    const std::string path = profileDirectory + "1.json";
    ASSERT_TRUE(FW::jsonFileDump(json("{'b': [1, 'x'], 'a': null}"), path));
    EXPECT_EQ(readFile(path), "{\n   \"a\" : null,\n   \"b\" : [ 1, \"x\" ]\n}\n");
    EXPECT_EQ(modeOf(path), S_IFREG | 0666u);
    EXPECT_EQ(modeOf(lockDirectory), S_IFDIR | 0770u);
    EXPECT_EQ(modeOf(lockDirectory + "1.json.lock"), S_IFREG | 0660u);
    chmod(path.c_str(), 0600);
    store("1.json.tmp", std::string(10000, 'x'));  // left by a killed process
    ASSERT_TRUE(FW::jsonFileDump(json("{}"), path));
    EXPECT_EQ(modeOf(path), S_IFREG | 0600u);
    EXPECT_EQ(readFile(path), "{}\n");
    EXPECT_THAT(listDirectory(profileDirectory), ElementsAre("1.json"));
    umask(oldMask);
}

TEST_F(JsonFile, LockFileIsNamedAfterTheLastPathComponent) {
    const std::pair<std::string, std::string> cases[] = {
        {"/usr/veld/a.json", "a.json.lock"},
        {"/somewhere/else/a.json", "a.json.lock"},  // shared with the one before
        {"b", "b.lock"},
        {"/c/", "c.lock"},
        {"/" + std::string(1021, 'd') + "/e.json", std::string(1021, 'd') + ".lock"},  // only 1023 bytes are looked at
    };
    for (const auto &[path, name] : cases) {
        EXPECT_EQ(FW::getLockFile(path), lockDirectory + name);
        EXPECT_EQ(pathExists(lockDirectory + name), name.size() <= 255);
    }
}

TEST_F(JsonFile, WithoutTheLockDirectoryLocksLieInTheTemporaryDirectoryAndPlantedOnesAreReplaced) {
    writeFile("/var/lock/firewall", "in the way");
    writeFile("/etc/victim", "text");
    ASSERT_EQ(symlink("/etc/victim", "/tmp/1.json.lock"), 0);
    writeFile("/tmp/2.json.lock", "", 0666);
    const bool canPlant = chown("/tmp/2.json.lock", 1234, 1234) == 0;
    for (const std::string name : {"1.json", "2.json", "3.json"}) {
        SCOPED_TRACE(name);
        const std::string lockPath = "/tmp/" + name + ".lock";
        EXPECT_EQ(FW::getLockFile(profileDirectory + name), lockPath);
        EXPECT_TRUE(FW::jsonFileDump(json("{}"), profileDirectory + name));
        struct stat status = {};
        ASSERT_EQ(lstat(lockPath.c_str(), &status), 0);
        EXPECT_TRUE(S_ISREG(status.st_mode));
        EXPECT_EQ(status.st_uid, 0u);
    }
    EXPECT_EQ(readFile("/etc/victim"), "text");
    if (!canPlant)
        GTEST_SKIP() << "this user namespace has one user only: the file of another user was not tried";
}

TEST_F(JsonFile, ANameThatLeavesNoRoomForTheLockFilesIsRefused) {
    const std::string path = profileDirectory + std::string(246, 'n') + ".json";
    store(std::string(246, 'n') + ".json", "{}");
    Json::Value value;
    EXPECT_FALSE(FW::jsonFileLoad(value, path));
    EXPECT_FALSE(FW::jsonFileDump(value, path));
    const std::string message =
        "utils.cpp Failed to open json file " + path + ": the name is too long for its lock file";
    EXPECT_THAT(takeErrors(), ElementsAre(message, message));
    EXPECT_TRUE(FW::jsonFileDump(value, profileDirectory + std::string(245, 'n') + ".json"));
}

}  // namespace
